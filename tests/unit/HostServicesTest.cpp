// Commands run on a simulated host: the console's command runner and its
// host-agent helpers (against small scripts in a bare host root), command
// lines through the host's shell (QelCtl_Exec), the firewall rulesets and the
// console's assertions.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "Assertion.hpp"
#include "CommandRunner.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"
#include "hostctl/SimState.hpp"

namespace {

using nlohmann::json;
using Clock = std::chrono::steady_clock;

std::string ReadFile(const std::string& path) {
    std::ifstream in(path);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

size_t CountOf(const std::string& text, const std::string& needle) {
    size_t n = 0;
    for (size_t at = text.find(needle); at != std::string::npos; at = text.find(needle, at + 1)) ++n;
    return n;
}

struct Ran {
    int status;
    std::string out, err;
};

// A program run through the console's runner, 256 bytes of each stream kept.
Ran RunIt(const char* path, const std::vector<std::string>& args, int timeout = 0,
          const std::string& input = "") {
    std::vector<const char*> argv;
    for (const std::string& a : args) argv.push_back(a.c_str());
    argv.push_back(nullptr);
    char out[257] = {}, err[257] = {};
    size_t outLen = 256, errLen = 256;
    const int status = Velk::RunCommand(path, argv.data(), out, &outLen, err, &errLen,
                                        input.empty() ? nullptr : input.data(), input.size(), timeout);
    return {status, std::string(out, outLen), std::string(err, errLen)};
}

// A scratch host root that the console's host library points at.
class HostRootTest : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/velk-host-XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        _root = tmpl;
        HostCtl::Lib::UseSimulatedHost(_root);
    }
    void TearDown() override { std::filesystem::remove_all(_root); }

    // Installs an executable script at a host path.
    void Script(const std::string& hostPath, const std::string& body) {
        const std::string path = _root + hostPath;
        std::ofstream(path) << "#!/bin/sh\n" << body << "\n";
        chmod(path.c_str(), 0755);
    }
    std::string Log() const { return ReadFile(_root + "/var/log/syslog.log"); }
    std::string History() const { return ReadFile(_root + "/history"); }

    std::string _root;
};

// A bare root: a shell, and folders for the test's scripts.
class CommandRunnerTest : public HostRootTest {
protected:
    void SetUp() override {
        HostRootTest::SetUp();
        for (const char* dir : {"/bin", "/sbin", "/var", "/var/log"}) mkdir((_root + dir).c_str(), 0755);
        ASSERT_EQ(symlink("/bin/sh", (_root + "/bin/sh").c_str()), 0);
    }
};

TEST_F(CommandRunnerTest, StatusOutputAndInput) {
    struct Case {
        const char* script;
        std::string input;
        int status;
        std::string out, err;
    };
    const Case cases[] = {
        {"echo hello; echo oops >&2; exit 0", "", 0, "hello\n", "oops\n"},
        {"exit 7", "", 7, "", ""},
        {"cat", "fed through stdin", 0, "fed through stdin", ""},
        // Far more than a pipe holds, on both streams, with no time limit:
        // read while the child runs, so it ends; the first 256 bytes are kept.
        {"head -c 300000 /dev/zero | tr '\\0' 0; head -c 300000 /dev/zero | tr '\\0' e >&2; exit 3", "", 3,
         std::string(256, '0'), std::string(256, 'e')},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.script);
        const Ran r = RunIt("/bin/sh", {"sh", "-c", c.script}, 0, c.input);
        EXPECT_EQ(r.status, c.status);
        EXPECT_EQ(r.out, c.out);
        EXPECT_EQ(r.err, c.err);
    }
}

TEST_F(CommandRunnerTest, ChildGetsOnlyPythonHomeAndNoInheritedDescriptors) {
    setenv("VELK_RUNNER_LEAK", "visible", 1);
    int stray = fcntl(1, F_DUPFD, 50);  // a descriptor without close-on-exec
    ASSERT_GE(stray, 50);
    const Ran r =
        RunIt("/bin/sh", {"sh", "-c", "env; for f in /proc/self/fd/*; do echo \"fd ${f##*/}\"; done"});
    close(stray);
    unsetenv("VELK_RUNNER_LEAK");
    EXPECT_EQ(r.status, 0);
    // sh adds PWD (and perhaps SHLVL) itself; what came from us is PYTHONHOME alone.
    EXPECT_NE(r.out.find("PYTHONHOME=/\n"), std::string::npos) << r.out;
    EXPECT_EQ(r.out.find("VELK_RUNNER_LEAK"), std::string::npos) << r.out;
    EXPECT_EQ(r.out.find("PATH="), std::string::npos) << r.out;
    // The glob itself may hold one directory descriptor open; none beyond that.
    EXPECT_EQ(r.out.find("fd " + std::to_string(stray) + "\n"), std::string::npos) << r.out;
    EXPECT_EQ(r.out.find("fd 4\n"), std::string::npos) << r.out;
}

TEST_F(CommandRunnerTest, MissingProgramIsStatusOneAndTimeLimitKillsAndWarns) {
    EXPECT_EQ(RunIt("/bin/nothere", {"nothere"}).status, 1);

    const auto start = Clock::now();
    const Ran r = RunIt("/bin/sh", {"sh", "-c", "echo started; exec sleep 30"}, 1);
    const double seconds = std::chrono::duration<double>(Clock::now() - start).count();
    EXPECT_EQ(r.status, -1);
    EXPECT_EQ(r.out, "started\n");  // what it wrote before the kill is still returned
    EXPECT_GT(seconds, 0.9);
    EXPECT_LT(seconds, 5.0);
    const std::string log = Log();
    EXPECT_NE(log.find("warning: Killing process because 1 seconds timeout expired"), std::string::npos)
        << log;
    EXPECT_NE(log.find("err: Run Command did not terminate normally"), std::string::npos) << log;
}

TEST_F(CommandRunnerTest, HrmCmdFallsBackToOwnUserOnce) {
    // The agent refuses every user but the console's own with 255.
    Script("/bin/hrm-cmd",
           "echo \"$2 $3\" >> '" + _root + "/history'; [ \"$2\" = velk ] || exit 255; echo ok");
    char out[257];
    size_t outLen = 10;  // reset to 256 for the retry
    const char* argv[] = {"hrm-cmd", "-U", "alice", "internalsvc/refresh", nullptr};
    EXPECT_EQ(Velk::InvokeHrmCmd("/bin/hrm-cmd", argv, out, &outLen, nullptr, nullptr, nullptr, 0), 0);
    EXPECT_EQ(std::string(out, outLen), "ok\n");
    EXPECT_EQ(History(), "alice internalsvc/refresh\nvelk internalsvc/refresh\n");
    EXPECT_EQ(
        CountOf(Log(),
                "Unable to execute command hrm-cmd internalsvc/refresh using user alice. Using user velk"),
        1u);

    // A user the agent accepts is not retried.
    const std::string before = Log();
    const char* own[] = {"hrm-cmd", "-U", "velk", "internalsvc/refresh", nullptr};
    EXPECT_EQ(Velk::InvokeHrmCmd("/bin/hrm-cmd", own, nullptr, nullptr, nullptr, nullptr, nullptr, 0), 0);
    EXPECT_EQ(CountOf(Log(), "Unable to execute"), CountOf(before, "Unable to execute"));
}

TEST_F(CommandRunnerTest, FlagIsTrueOnlyWhenAnswerBeginsWithTrue) {
    struct Case {
        const char* answer;
        int status;
        bool expected;
    };
    const Case cases[] = {
        {"true\\n", 0, true},   {"trueish", 0, true}, {"True\\n", 0, false}, {" true\\n", 0, false},
        {"false\\n", 0, false}, {"true\\n", 3, true}, {"", 0, false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.answer);
        Script("/bin/hrm-cmd", std::string("printf '") + c.answer + "'; exit " + std::to_string(c.status));
        EXPECT_EQ(Velk::HrmGetFlag("hrmsvc/auth/lockdown_is_enabled"), c.expected);
    }
    EXPECT_NE(Log().find("info: hrm-cmd invocation: get hrmsvc/auth/lockdown_is_enabled"), std::string::npos);
}

// Shell commands find programs on the host only: the machine's own poweroff
// is never reached from a simulated host. (What the power entries run is
// checked end to end by PowerTest and ResetTest.)
TEST_F(CommandRunnerTest, ShellCommandsRunOnlyOnTheHost) {
    Script("/sbin/reboot", "echo \"reboot $*\" >> '" + _root + "/history'");
    Script("/sbin/firmwareConfig.sh", "echo \"firmwareConfig $*\" >> '" + _root + "/history'; exit 3");
    EXPECT_EQ(Velk::RunShellCommand("reboot -f"), 0);
    EXPECT_EQ(Velk::RunShellCommand("/sbin/firmwareConfig.sh --reset-only > /dev/null 2>&1"), 3);
    EXPECT_EQ(Velk::RunShellCommand("poweroff"), 127);
    EXPECT_EQ(History(), "reboot -f\nfirmwareConfig --reset-only\n");
}

// A bare root with the default host state, and /sbin/probe: it prints its
// arguments and a line on standard error; "fail" exits 3, "later FILE" writes
// FILE after a second.
class HostServicesTest : public CommandRunnerTest {
protected:
    void SetUp() override {
        CommandRunnerTest::SetUp();
        HostCtl::Lib::SimState(_root).Replace(HostCtl::Lib::DefaultHostState());
        Script("/sbin/probe",
               "echo \"args: $*\"\n"
               "echo 'to stderr' >&2\n"
               "[ \"$1\" = fail ] && exit 3\n"
               "[ \"$1\" = later ] && { /bin/sleep 1; echo done > \"$2\"; }\n"
               "exit 0");
    }
    json State() const { return json::parse(ReadFile(_root + "/host.json")); }
};

TEST_F(HostServicesTest, CommandLinesRunWithTheHostsShellAndTools) {
    using QelCtl::Util::QelCtl_Exec;
    // Absolute words are host paths (the null device excepted), the host's
    // own folders are the search path, and with logOutput both streams go
    // to the log line by line.
    EXPECT_EQ(QelCtl_Exec("/sbin/probe /var/log/x /dev/null", true, true, false), 0);
    EXPECT_NE(Log().find("args: " + _root + "/var/log/x /dev/null"), std::string::npos) << Log();
    EXPECT_NE(Log().find("user.info: to stderr"), std::string::npos) << Log();
    EXPECT_EQ(QelCtl_Exec("probe found-by-path", true, true, false), 0);
    EXPECT_NE(Log().find("args: found-by-path"), std::string::npos);

    // The status comes back, or throws when asked to; without logOutput
    // nothing reaches the log.
    EXPECT_EQ(QelCtl_Exec("/sbin/probe fail quietly", false, true, false), 3);
    EXPECT_EQ(Log().find("fail quietly"), std::string::npos);
    EXPECT_THROW(QelCtl_Exec("/sbin/probe fail", false, true, true), HostCtl::Lib::HostCtlException);
    EXPECT_EQ(QelCtl_Exec("no-such-tool", false, true, false), 127);

    // Not waited for: back at once, the command goes on alone.
    const auto start = Clock::now();
    EXPECT_EQ(QelCtl_Exec("/sbin/probe later /var/log/marker", true, false, true), 0);
    EXPECT_LT(Clock::now() - start, std::chrono::milliseconds(800));
    EXPECT_EQ(ReadFile(_root + "/var/log/marker"), "");
    for (int i = 0; i < 100 && ReadFile(_root + "/var/log/marker").empty(); ++i)
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    EXPECT_EQ(ReadFile(_root + "/var/log/marker"), "done\n");

    // A fault refuses the command unrun.
    HostCtl::Lib::SimState(_root).Update([](json& s) { s["faults"]["RunCommandLine"] = "no shell today"; });
    EXPECT_THROW(QelCtl_Exec("/sbin/probe refused", true, true, false), HostCtl::Lib::HostCtlException);
    EXPECT_EQ(Log().find("args: refused"), std::string::npos);
}

TEST_F(HostServicesTest, FirewallRulesetsByIdOnly) {
    QelCtl::System::SystemInfoImpl system;
    HostCtl::Firewall::Ruleset ssh = system.GetFirewallRulesetById("sshServer");
    EXPECT_FALSE(ssh.IsEnabled());
    ssh.SetEnabled(true);
    EXPECT_TRUE(ssh.IsEnabled());
    EXPECT_EQ(State()["firewall"]["rulesets"]["sshServer"]["enabled"], true);
    try {
        system.GetFirewallRulesetById("ntpClient");
        ADD_FAILURE() << "no exception";
    } catch (const HostCtl::Lib::HostCtlException& e) {
        EXPECT_NE(std::string(e.what()).find("no firewall ruleset \"ntpClient\""), std::string::npos)
            << e.what();
    }
}

// A class member, so that the message shows how the compiler names it.
struct Guarded {
    virtual ~Guarded() = default;
    virtual bool Check(const int* p) {
        VELK_ASSERT(p != NULL);
        return true;
    }
};

TEST(AssertionDeathTest, NamesTheConditionTheSourceAndTheFunction) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    int value = 0;
    EXPECT_TRUE(Guarded().Check(&value));
    EXPECT_DEATH(
        Guarded().Check(nullptr),
        "HostServicesTest\\.cpp:[0-9]+: virtual bool \\{anonymous\\}::Guarded::Check\\(const int\\*\\): "
        "Assertion `\\(p != __null\\)' failed\\.");
}

}  // namespace
