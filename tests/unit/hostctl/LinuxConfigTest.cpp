// The configuration file and the option file of a Debian host, in a scratch
// folder that the host path mapping points into.
#include <sys/stat.h>

#include "HostConfig.hpp"
#include "TestSupport.hpp"

namespace HostCtlTest {
namespace {

using HostCtl::Lib::Linux::HostConfig;
using HostCtl::Lib::Linux::OptionFile;

std::string Join(const std::vector<std::string>& words) {
    std::string text;
    for (const std::string& w : words) text += (text.empty() ? "" : ",") + w;
    return text;
}

// Every field, so that a row sees what else a line changed.
std::string Describe(const HostConfig& c) {
    return "mgmt=" + c.managementInterface + " nics=" + Join(c.physicalNics) +
           " agents=" + Join(c.agentServices) + " cert=" + c.certificate + " tty=" + c.shellTty +
           " logins=" + (c.consoleLogins ? "yes" : "no") + " welcome=" + c.welcomeMessageFile +
           " vmwait=" + std::to_string(c.vmShutdownTimeout);
}

class LinuxConfig : public ::testing::Test {
protected:
    void SetUp() override {
        std::filesystem::create_directories(_dir.Path() + "/var/log");
        HostCtl::Lib::UseSimulatedHost(_dir.Path());
    }
    std::string Path(const std::string& hostPath) const { return _dir.Path() + hostPath; }
    std::string OptionText() const { return ReadFile(Path("/etc/velk/options")); }
    void WriteOptions(const std::string& text) {
        std::filesystem::create_directories(Path("/etc/velk"));
        WriteFile(Path("/etc/velk/options"), text);
    }
    static int64_t Integer(const std::string& name) { return OptionFile::Get(name).value().integer; }
    static OptionFile::Value Int(int64_t v) { return {true, v, ""}; }

    TempDir _dir;
};

TEST_F(LinuxConfig, ParseTable) {
    const std::string defaults = Describe(HostConfig{});
    struct Row {
        const char* text;
        std::string expected;  // Describe() of the result
        std::vector<std::string> problems;
    };
    auto with = [&](const std::string& from, const std::string& to) {
        std::string d = defaults;
        d.replace(d.find(from), from.size(), to);
        return d;
    };
    const Row rows[] = {
        {"", defaults, {}},
        {"# a comment = x\n\n   \n\t# indented comment\n", defaults, {}},
        {"management-interface = vmbr0\n", with("mgmt=", "mgmt=vmbr0"), {}},
        {"physical-nics = veth* , eno1\tens[0-9]\n", with("nics=", "nics=veth*,eno1,ens[0-9]"), {}},
        {"agent-services = libvirtd, pvedaemon pveproxy\n",
         with("agents=", "agents=libvirtd,pvedaemon,pveproxy"),
         {}},
        {"certificate=/etc/velk/cert.pem\n",
         with("/etc/ssl/certs/ssl-cert-snakeoil.pem", "/etc/velk/cert.pem"),
         {}},
        {"shell-tty = tty12\n", with("tty=tty1", "tty=tty12"), {}},
        {"console-logins = no\n", with("logins=yes", "logins=no"), {}},
        {"welcome-message = /srv/motd\n", with("/etc/velk/welcome", "/srv/motd"), {}},
        {"vm-shutdown-timeout = 0\n", with("vmwait=300", "vmwait=0"), {}},
        // CRLF line ends, blanks around "=", the last value of a key given twice.
        {"shell-tty=tty3\r\nconsole-logins =  no \r\nshell-tty = tty4\r\n",
         with("tty=tty1 logins=yes", "tty=tty4 logins=no"),
         {}},
        // Problems: the line is skipped, the key keeps its default, the rest
        // of the file still counts.
        {"colour = blue\nshell-tty = tty5\n",
         with("tty=tty1", "tty=tty5"),
         {"line 1: unknown key \"colour\""}},
        {"just some words\n", defaults, {"line 1: expected \"key = value\""}},
        {"= yes\n", defaults, {"line 1: expected"}},
        {"console-logins = maybe\n", defaults, {"line 1: console-logins: expected \"yes\" or \"no\""}},
        {"\nshell-tty = tty64\nshell-tty = ttyS0\nshell-tty = tty01\n",
         defaults,
         {"line 2: shell-tty", "line 3: shell-tty", "line 4: shell-tty"}},
        {"management-interface = a/b\nmanagement-interface = sixteen-chars-xx\n",
         defaults,
         {"line 1: management-interface", "line 2: management-interface"}},
        {"agent-services = libvirtd --now\n",
         defaults,
         {"line 1: agent-services: \"--now\" is no service name"}},
        {"certificate = cert.pem\nwelcome-message = motd\n",
         defaults,
         {"line 1: certificate", "line 2: welcome"}},
        {"vm-shutdown-timeout = 3601\nvm-shutdown-timeout = 5s\nvm-shutdown-timeout = -1\n",
         defaults,
         {"line 1: vm-shutdown", "line 2: vm-shutdown", "line 3: vm-shutdown"}},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.text);
        std::vector<std::string> problems;
        EXPECT_EQ(Describe(HostConfig::Parse(row.text, problems)), row.expected);
        ASSERT_EQ(problems.size(), row.problems.size()) << Join(problems);
        for (size_t i = 0; i < problems.size(); ++i) {
            EXPECT_EQ(problems[i].rfind("velk.conf ", 0), 0u) << problems[i];
            EXPECT_NE(problems[i].find(row.problems[i]), std::string::npos) << problems[i];
        }
    }
}

TEST_F(LinuxConfig, AgentServicesDefaultToLibvirtdWhereTheHostHasIt) {
    std::vector<std::string> problems;
    EXPECT_TRUE(HostConfig::Parse("", problems).agentServices.empty());
    std::filesystem::create_directories(Path("/usr/sbin"));
    WriteFile(Path("/usr/sbin/libvirtd"), "");
    EXPECT_EQ(HostConfig::Parse("", problems).agentServices, std::vector<std::string>{"libvirtd"});
    // Named as none on purpose: none, even with libvirtd there.
    EXPECT_TRUE(HostConfig::Parse("agent-services =\n", problems).agentServices.empty());
    EXPECT_TRUE(problems.empty());
}

TEST_F(LinuxConfig, LoadReadsTheHostsFileAndLogsItsProblems) {
    EXPECT_EQ(Describe(HostConfig::Load()), Describe(HostConfig{}));  // no file: the defaults
    std::filesystem::create_directories(Path("/etc/velk"));
    WriteFile(Path("/etc/velk/velk.conf"), "shell-tty = tty6\nbogus = 1\n");
    EXPECT_EQ(HostConfig::Load().shellTty, "tty6");
    EXPECT_NE(ReadFile(Path("/var/log/syslog.log")).find("velk.conf line 2: unknown key \"bogus\""),
              std::string::npos);
}

TEST_F(LinuxConfig, OptionFileDefaultsAndUnknownOptions) {
    EXPECT_EQ(Integer("/UserVars/VelkTimeOut"), 600);
    EXPECT_EQ(Integer("/UserVars/TarniShellTimeOut"), 0);
    EXPECT_EQ(Integer("/UserVars/TarniShellInteractiveTimeOut"), 0);
    EXPECT_FALSE(OptionFile::Get("/UserVars/NoSuchOption").has_value());
    EXPECT_FALSE(std::filesystem::exists(Path("/etc/velk")));  // reading creates nothing

    // A value that is no integer is logged and read as the default; a value
    // that is one, with or without blanks around "=", is taken.
    WriteOptions("/UserVars/VelkTimeOut = ten\n/UserVars/TarniShellTimeOut=900\r\n");
    EXPECT_EQ(Integer("/UserVars/VelkTimeOut"), 600);
    EXPECT_EQ(Integer("/UserVars/TarniShellTimeOut"), 900);
    EXPECT_NE(ReadFile(Path("/var/log/syslog.log")).find("/UserVars/VelkTimeOut holds no integer"),
              std::string::npos);
}

TEST_F(LinuxConfig, OptionFileSetKeepsEverythingElse) {
    // No folder yet: the first write makes it.
    OptionFile::Set("/UserVars/VelkTimeOut", Int(1200));
    EXPECT_EQ(OptionText(), "/UserVars/VelkTimeOut = 1200\n");
    EXPECT_EQ(Integer("/UserVars/VelkTimeOut"), 1200);

    const std::string others = "# kept\r\n/Other/Name = x\n\n";
    WriteOptions(others + "/UserVars/TarniShellTimeOut = 60\n/UserVars/TarniShellTimeOut = 70");
    OptionFile::Set("/UserVars/TarniShellTimeOut", Int(0));
    OptionFile::Set("/UserVars/TarniShellInteractiveTimeOut", Int(-5));
    EXPECT_EQ(OptionText(),
              others + "/UserVars/TarniShellTimeOut = 0\n/UserVars/TarniShellInteractiveTimeOut = -5\n");
    EXPECT_EQ(Integer("/UserVars/TarniShellTimeOut"), 0);
    EXPECT_EQ(Integer("/UserVars/TarniShellInteractiveTimeOut"), -5);
    struct stat st;
    ASSERT_EQ(stat(Path("/etc/velk/options").c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0644u);

    // Refused writes change nothing.
    const std::string before = OptionText();
    const std::pair<std::string, OptionFile::Value> refused[] = {
        {"/UserVars/NoSuchOption", Int(1)},
        {"/Other/Name", Int(1)},  // in the file, but not an option of this host
        {"/UserVars/VelkTimeOut", OptionFile::Value{false, 0, "600"}},
    };
    for (const auto& [name, value] : refused) {
        SCOPED_TRACE(name);
        EXPECT_THROW(OptionFile::Set(name, value), HostCtlException);
        EXPECT_EQ(OptionText(), before);
    }
}

// Two writers of different options: neither ever finds its own last value
// overwritten by the other's copy of an older file.
TEST_F(LinuxConfig, OptionFileWritersNeverLoseAnUpdate) {
    auto writer = [](const std::string& name) {
        return [name] {
            for (int i = 1; i <= 100; ++i) {
                if (OptionFile::Get(name).value().integer != (i == 1 ? 0 : i - 1)) _exit(2);
                OptionFile::Set(name, OptionFile::Value{true, i, ""});
            }
        };
    };
    const pid_t a = Spawn(writer("/UserVars/TarniShellTimeOut"));
    const pid_t b = Spawn(writer("/UserVars/TarniShellInteractiveTimeOut"));
    ExpectExitedCleanly(a);
    ExpectExitedCleanly(b);
    EXPECT_EQ(Integer("/UserVars/TarniShellTimeOut"), 100);
    EXPECT_EQ(Integer("/UserVars/TarniShellInteractiveTimeOut"), 100);
}

}  // namespace
}  // namespace HostCtlTest
