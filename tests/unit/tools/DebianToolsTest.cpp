// The Debian host's tools, run as the console runs them, on a scratch host
// root (VELK_HOST_ROOT) whose systemctl, service, update-rc.d, virsh and ping
// are small scripts that record their arguments: nothing on the machine
// itself is started, stopped or pinged.
#include <fcntl.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <functional>

#include "ToolTestSupport.hpp"

namespace ToolTest {
namespace {

namespace fs = std::filesystem;

// Each fake records "<name> <args>" in $ROOT/calls.
const char* const FAKES[][2] = {
    {"bin/systemctl", R"(
case "$1" in
  is-active) [ -e "$ROOT/active/$3" ]; exit $? ;;
esac
echo "systemctl $*" >> "$ROOT/calls"
[ -e "$ROOT/fail-$1" ] && exit 5
case "$1" in
  start|restart) touch "$ROOT/active/$2" ;;
  stop) rm -f "$ROOT/active/$2"
        env > "$ROOT/child-env"
        [ -e /proc/$$/fd/37 ] && echo open > "$ROOT/child-fd37" || echo closed > "$ROOT/child-fd37" ;;
esac
)"},
    {"usr/sbin/service", R"(
echo "service $*" >> "$ROOT/calls"
[ "$2" = status ] && { [ -e "$ROOT/active/$1" ]; exit $?; }
exit 0
)"},
    {"usr/sbin/update-rc.d", R"(echo "update-rc.d $*" >> "$ROOT/calls")"},
    // Guests: files in vms/running and vms/autostart; one in vms/stubborn
    // ignores a shut-down request.
    {"usr/bin/virsh", R"(
[ -e "$ROOT/virsh-down" ] && exit 1
shift 3  # -c qemu:///system -q
case "$1" in
  list) for g in $(ls "$ROOT/vms/running"); do
          [ "$4" = --autostart ] && [ ! -e "$ROOT/vms/autostart/$g" ] && continue
          echo "$g"
        done; echo ;;
  shutdown) echo "virsh $*" >> "$ROOT/calls"; [ -e "$ROOT/vms/stubborn/$2" ] || rm "$ROOT/vms/running/$2" ;;
  destroy) echo "virsh $*" >> "$ROOT/calls"; rm "$ROOT/vms/running/$2" ;;
esac
)"},
    {"bin/ping", R"(echo "ping $*" >> "$ROOT/calls"; exit $(cat "$ROOT/ping-status" 2>/dev/null || echo 0))"},
};

// A process's command line as /proc shows it.
std::string Cmdline(std::initializer_list<std::string> args) {
    std::string text;
    for (const std::string& a : args) text += a + '\0';
    return text;
}

struct Row {
    std::vector<std::string> args;  // the tool's name, then its arguments
    int status;
    std::string out;
    std::string errMentions;  // "" when nothing may be printed on stderr
    std::string calls;        // what the fakes were asked, in order
    std::function<void()> before = nullptr;
};

class DebianTools : public ::testing::Test {
protected:
    void SetUp() override {
        fs::create_directories(VELK_TEST_TMPDIR);
        std::string tmpl = std::string(VELK_TEST_TMPDIR) + "/debian-XXXXXX";
        ASSERT_NE(mkdtemp(tmpl.data()), nullptr);
        _dir = tmpl;
        _root = _dir + "/root";
        for (const char* folder : {"var/log", "active", "vms/running", "vms/autostart", "vms/stubborn",
                                   "etc/velk", "sys/class/net/eth9", "proc"})
            fs::create_directories(_root + "/" + folder);
        for (const auto& [path, body] : FAKES) {
            fs::create_directories(fs::path(_root + "/" + path).parent_path());
            WriteFile(_root + "/" + path, "#!/bin/sh\nROOT='" + _root + "'\n" + body + "\n");
            chmod((_root + "/" + path).c_str(), 0755);
        }
    }
    void TearDown() override {
        std::error_code ec;
        fs::remove_all(_dir, ec);
    }

    void Touch(const std::string& path, const std::string& text = "") {
        fs::create_directories(fs::path(_root + "/" + path).parent_path());
        WriteFile(_root + "/" + path, text);
    }

    // Runs the program at `program` with `args`, the host root in its
    // environment beside a variable of its own, and descriptor 37 open.
    Result RunProgram(const std::string& program, const std::vector<std::string>& args) {
        posix_spawn_file_actions_t actions;
        posix_spawn_file_actions_init(&actions);
        posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
        posix_spawn_file_actions_addopen(&actions, 1, (_dir + "/out").c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                         0644);
        posix_spawn_file_actions_addopen(&actions, 2, (_dir + "/err").c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                         0644);
        posix_spawn_file_actions_addopen(&actions, 37, "/dev/null", O_RDONLY, 0);
        std::vector<std::string> argv = {program};
        argv.insert(argv.end(), args.begin(), args.end());
        std::vector<char*> cargv;
        for (std::string& a : argv) cargv.push_back(a.data());
        cargv.push_back(nullptr);
        std::string hostRoot = "VELK_HOST_ROOT=" + _root, leak = "LEAK=1";
        char* env[] = {hostRoot.data(), leak.data(), nullptr};
        pid_t pid = -1;
        const int rc = posix_spawn(&pid, program.c_str(), &actions, nullptr, cargv.data(), env);
        posix_spawn_file_actions_destroy(&actions);
        if (rc != 0) return {};
        int status = 0;
        waitpid(pid, &status, 0);
        return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, ReadFile(_dir + "/out"),
                ReadFile(_dir + "/err")};
    }

    void Check(const std::vector<Row>& rows) {
        for (const Row& row : rows) {
            std::string trace;
            for (const std::string& a : row.args) trace += a + " ";
            SCOPED_TRACE(trace);
            if (row.before) row.before();
            std::remove((_root + "/calls").c_str());
            const Result r = RunProgram(VELK_DEBIAN_TOOLS_BIN, row.args);
            EXPECT_EQ(r.status, row.status) << r.err;
            EXPECT_EQ(r.out, row.out);
            if (row.errMentions.empty())
                EXPECT_EQ(r.err, "");
            else
                EXPECT_NE(r.err.find(row.errMentions), std::string::npos) << r.err;
            EXPECT_EQ(ReadFile(_root + "/calls"), row.calls);
        }
    }

    std::string _dir;
    std::string _root;
};

TEST_F(DebianTools, ServicesUnderSystemd) {
    Touch("run/systemd/system/.keep");
    Touch("etc/velk/velk.conf", "shell-tty = tty3\nagent-services = libvirtd virtlogd\n");
    Check({
        {{"SSH", "status"}, 3, "SSH is not running\n", "", ""},
        {{"hrm-cmd", "-U", "root", "hostsvc/start_ssh"}, 0, "", "", "systemctl start ssh\n"},
        {{"SSH", "status"}, 0, "SSH is running\n", "", ""},
        {{"hrm-cmd", "-U", "velk", "hostsvc/enable_tarn_shell"},
         0,
         "",
         "",
         "systemctl enable getty@tty3.service\n"},
        {{"TarnShell", "restart"}, 0, "Starting TarnShell\n", "", "systemctl restart getty@tty3.service\n"},
        {{"TarnShell", "status"}, 0, "TarnShell is running\n", "", ""},
        {{"TarnShell", "stop"}, 0, "Stopping TarnShell\n", "", "systemctl stop getty@tty3.service\n"},
        {{"hrm-cmd", "-U", "root", "hostsvc/disable_tarn_shell"},
         0,
         "",
         "",
         "systemctl disable getty@tty3.service\n"},
        // A getty on the console's own terminal would stop the console.
        {{"hrm-cmd", "-U", "root", "hostsvc/start_tarn_shell"},
         1,
         "",
         "the console itself runs on tty3",
         "",
         [&] { Touch("active/velk@3.service"); }},
        {{"TarnShell", "start"}, 1, "Starting TarnShell\n", "the console itself runs on tty3", ""},
        {{"services.sh", "stop"},
         0,
         "Stopping the management agents\n",
         "",
         "systemctl stop virtlogd\nsystemctl stop libvirtd\n"},
        {{"services.sh", "restart"},
         0,
         "Starting the management agents\n",
         "",
         "systemctl restart libvirtd\nsystemctl restart virtlogd\n"},
        {{"services.sh", "start"},
         1,
         "Starting the management agents\n",
         "services.sh: cannot start libvirtd",
         "systemctl start libvirtd\nsystemctl start virtlogd\n",
         [&] { Touch("fail-start"); }},
        {{"hrm-cmd", "-U", "root", "hostsvc/start_ssh"},
         1,
         "",
         "hrm-cmd: cannot start ssh",
         "systemctl start ssh\n"},
        {{"SSH", "bogus"}, 1, "", "Usage: /etc/init.d/SSH {start|stop|restart|status}", ""},
        {{"services.sh"}, 1, "", "Usage: services.sh {start|stop|restart}", ""},
        {{"hrm-cmd", "-U", "root", "hostsvc/stop_ssh"}, 0, "", "", "systemctl stop ssh\n"},
    });
    // The service tool got a clean environment and none of the descriptors
    // the tool had beyond 0 to 2.
    EXPECT_EQ(ReadFile(_root + "/child-fd37"), "closed\n");
    const std::string env = ReadFile(_root + "/child-env");
    EXPECT_NE(env.find("PATH=/usr/sbin:/usr/bin:/sbin:/bin\n"), std::string::npos) << env;
    EXPECT_EQ(env.find("LEAK"), std::string::npos) << env;
    EXPECT_EQ(env.find("VELK_HOST_ROOT"), std::string::npos) << env;
}

TEST_F(DebianTools, ServicesWithoutSystemd) {
    Touch("usr/sbin/libvirtd");  // the default management agent
    Touch("proc/42/cmdline", Cmdline({"/sbin/getty", "38400", "tty2"}));
    Check({
        {{"SSH", "start"}, 0, "Starting SSH\n", "", "service ssh start\n"},
        {{"SSH", "status"}, 3, "SSH is not running\n", "", "service ssh status\n"},
        {{"hrm-cmd", "-U", "root", "hostsvc/disable_ssh"}, 0, "", "", "update-rc.d ssh disable\n"},
        // Gettys come from /etc/inittab: read from the processes, never switched.
        {{"TarnShell", "status"}, 3, "TarnShell is not running\n", "", ""},
        {{"TarnShell", "status"},
         0,
         "TarnShell is running\n",
         "",
         "",
         [&] {
             Touch("proc/43/cmdline", Cmdline({"/sbin/agetty", "--noclear", "tty1", "linux"}));
         }},
        {{"hrm-cmd", "-U", "root", "hostsvc/start_tarn_shell"}, 1, "", "/etc/inittab", ""},
        {{"services.sh", "start"}, 0, "Starting the management agents\n", "", "service libvirtd start\n"},
    });
}

TEST_F(DebianTools, VirtualMachines) {
    Touch("etc/velk/velk.conf", "vm-shutdown-timeout = 1\n");
    auto guests = [&](std::vector<std::string> running, std::vector<std::string> autostart,
                      std::vector<std::string> stubborn) {
        return [=, this] {
            for (const auto& g : running) Touch("vms/running/" + g);
            for (const auto& g : autostart) Touch("vms/autostart/" + g);
            for (const auto& g : stubborn) Touch("vms/stubborn/" + g);
        };
    };
    Check({
        // Auto-stop asks the guests with autostart set, and nothing else.
        {{"hrm-cmd", "-U", "root", "hostsvc/autostartmanager/autostop"},
         0,
         "",
         "",
         "virsh shutdown u1\n",
         guests({"u1", "u2", "u3"}, {"u1"}, {"u3"})},
        // A guest that does not shut down in time is powered off.
        {{"powerOffVms"},
         0,
         "",
         "1 virtual machines did not shut down in time",
         "virsh shutdown u2\nvirsh shutdown u3\nvirsh destroy u3\n"},
        {{"powerOffVms", "--terminate"},
         0,
         "",
         "",
         "virsh destroy u4\nvirsh destroy u5\n",
         guests({"u4", "u5"}, {}, {})},
        {{"powerOffVms"}, 0, "", "", ""},  // none running
        {{"powerOffVms", "--now"}, 1, "", "usage: powerOffVms [--terminate]", ""},
        {{"powerOffVms"}, 1, "", "cannot list the virtual machines", "", [&] { Touch("virsh-down"); }},
        // No libvirt: no virtual machines.
        {{"powerOffVms", "--terminate"}, 0, "", "", "", [&] { fs::remove(_root + "/usr/bin/virsh"); }},
        {{"hrm-cmd", "-U", "root", "hostsvc/autostartmanager/autostop"}, 0, "", "", ""},
    });
}

TEST_F(DebianTools, OptionTools) {
    const std::vector<std::string> set = {"system", "settings", "advanced", "set", "-o"};
    auto Set = [&](const std::string& tool, const std::string& option, const std::string& value) {
        std::vector<std::string> args = {tool};
        args.insert(args.end(), set.begin(), set.end());
        args.insert(args.end(), {option, "-i", value});
        return args;
    };
    Check({
        {{"tarncfg-advcfg", "-q", "-g", "/UserVars/TarniShellTimeOut"}, 0, "0\n", "", ""},
        {Set("localcli", "/UserVars/TarniShellTimeOut", "900"), 0, "", "", ""},
        {{"tarncfg-advcfg", "-g", "/UserVars/TarniShellTimeOut"},
         0,
         "Value of TarniShellTimeOut is 900\n",
         "",
         ""},
        {Set("tarncli", "/UserVars/VelkTimeOut", "60"), 0, "", "", ""},
        {{"tarncfg-advcfg", "-q", "-g", "/UserVars/VelkTimeOut"}, 0, "60\n", "", ""},
        {Set("tarncli", "/UserVars/VelkTimeOut", "12x"), 1, "", "Error: Invalid integer value 12x", ""},
        {Set("tarncli", "/UserVars/Nope", "1"), 1, "", "Error: Unable to find option /UserVars/Nope", ""},
        {{"tarncli", "system", "settings", "advanced", "set", "-o", "/UserVars/VelkTimeOut"},
         1,
         "",
         "Usage",
         ""},
        {{"tarncfg-advcfg", "-g", "/UserVars/Nope"}, 1, "", "no such option /UserVars/Nope", ""},
        {{"tarncfg-advcfg", "-q"}, 1, "", "Usage: tarncfg-advcfg [-q] -g OPTION", ""},
    });
    EXPECT_EQ(ReadFile(_root + "/etc/velk/options"),
              "/UserVars/TarniShellTimeOut = 900\n/UserVars/VelkTimeOut = 60\n");
}

TEST_F(DebianTools, AgentFirmwarePingAndDispatch) {
    Check({
        {{"hrm-cmd", "-U", "nobody", "internalsvc/refresh"}, 255, "", "nobody", ""},
        {{"hrm-cmd", "internalsvc/refresh"}, 1, "", "no user given (-U)", ""},
        {{"hrm-cmd", "-U", "root", "hostsvc/no_such_thing"}, 1, "", "Unknown command", ""},
        {{"hrm-cmd", "-U", "velk", "hrmsvc/auth/lockdown_is_possible"}, 0, "false\n", "", ""},
        {{"hrm-cmd", "-U", "velk", "hrmsvc/auth/lockdown_mode_enter"},
         1,
         "",
         "Lockdown mode does not exist",
         ""},
        {{"hrm-cmd", "-U", "root", "internalsvc/refresh"}, 0, "", "", ""},
        {{"firmwareConfig.sh", "--reset-only"}, 1, "", "does not exist on a Debian host", ""},
        {{"qelbacktrace", "-w", "-n", "corad", "-o", "x%", "-d", "/var/log/"}, 1, "", "do not exist", ""},
        // The firmware version from DMI, once the machine has one.
        {{"grabCIMData", "OMC_SMASHFirmwareIdentity", "VersionString"},
         1,
         "no instances of OMC_SMASHFirmwareIdentity\n",
         "",
         ""},
        {{"grabCIMData", "OMC_SMASHFirmwareIdentity", "VersionString"},
         0,
         "1.2.3\n",
         "",
         "",
         [&] { Touch("sys/class/dmi/id/bios_version", "1.2.3 \n"); }},
        {{"grabCIMData", "CIM_Chassis", "OtherIdentifyingInfo"}, 1, "no instances of CIM_Chassis\n", "", ""},
        {{"grabCIMData", "OMC_SMASHFirmwareIdentity", "Name"}, 1, "", "has no property Name", ""},
        {{"grabCIMData", "OMC_SMASHFirmwareIdentity"}, 1, "", "usage: grabCIMData CLASS PROPERTY", ""},
        // One ping, from the interface when one is named.
        {{"qelping", "192.0.2.1"}, 0, "", "", "ping -n -c 1 -W 2 -4 192.0.2.1\n"},
        {{"qelping", "2001:db8::1", "-I", "eth9"}, 0, "", "", "ping -n -c 1 -W 2 -6 -I eth9 2001:db8::1\n"},
        {{"qelping", "fe80::1%eth9"}, 0, "", "", "ping -n -c 1 -W 2 -6 -I eth9 fe80::1%eth9\n"},
        {{"qelping", "192.0.2.1"},
         1,
         "",
         "",
         "ping -n -c 1 -W 2 -4 192.0.2.1\n",
         [&] { Touch("ping-status", "1"); }},
        {{"qelping", "192.0.2.1"},
         1,
         "",
         "",
         "ping -n -c 1 -W 2 -4 192.0.2.1\n",
         [&] { Touch("ping-status", "2"); }},
        {{"qelping", "-I", "eth8", "192.0.2.1"}, 2, "", "unknown interface eth8", ""},
        {{"qelping", "-I", "../eth9", "192.0.2.1"}, 2, "", "unknown interface", ""},
        {{"qelping", "fe80::1%eth9", "-I", "eth8"}, 2, "", "is not the interface", ""},
        {{"qelping", "host.example.com"}, 2, "", "unknown host host.example.com", ""},
        {{"qelping", "192.0.2.1", "-c1"}, 2, "", "unknown option -c1", ""},
        {{"qelping"}, 2, "", "no target given", ""},
        {{"no-such-tool"}, 1, "", "usage: velk-debian-tools TOOL", ""},
        {{}, 1, "", "usage: velk-debian-tools TOOL", ""},
    });
    // Run under a tool's name, the program is that tool.
    fs::create_directories(_dir + "/links");
    fs::create_symlink(VELK_DEBIAN_TOOLS_BIN, _dir + "/links/hrm-cmd");
    const Result r = RunProgram(_dir + "/links/hrm-cmd", {"-U", "root", "hrmsvc/auth/lockdown_is_enabled"});
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out, "false\n");
}

}  // namespace
}  // namespace ToolTest
