// The command runner and the host-agent helpers, run against a scratch host
// root whose tools are small shell scripts.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>

#include "CommandRunner.hpp"
#include "Frame.hpp"
#include "hostctl/Host.hpp"

namespace {

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

class CommandRunnerTest : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/velk-runner-XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        _root = tmpl;
        for (const char* dir : {"/bin", "/sbin", "/var", "/var/log"}) mkdir((_root + dir).c_str(), 0755);
        ASSERT_EQ(symlink("/bin/sh", (_root + "/bin/sh").c_str()), 0);
        HostCtl::Lib::UseSimulatedHost(_root);
    }
    void TearDown() override {
        std::string cmd = "rm -rf '" + _root + "'";
        ASSERT_EQ(system(cmd.c_str()), 0);
    }

    // Installs an executable script at a host path.
    void Script(const std::string& hostPath, const std::string& body) {
        std::string path = _root + hostPath;
        std::ofstream(path) << "#!/bin/sh\n" << body << "\n";
        chmod(path.c_str(), 0755);
    }
    std::string Log() const { return ReadFile(_root + "/var/log/syslog.log"); }
    std::string History() const { return ReadFile(_root + "/history"); }

    std::string _root;
};

struct Captured {
    int status;
    std::string out;
    std::string err;
};

Captured RunIt(const char* path, const char* const argv[], int timeout = 0, const std::string& input = "") {
    char out[257];
    char err[257];
    size_t outLen = 256;
    size_t errLen = 256;
    int status = Velk::RunCommand(path, argv, out, &outLen, err, &errLen,
                                  input.empty() ? nullptr : input.data(), input.size(), timeout);
    return {status, std::string(out, outLen), std::string(err, errLen)};
}

TEST_F(CommandRunnerTest, StatusOutputAndInput) {
    struct Case {
        const char* script;
        std::string input;
        int status;
        std::string out;
        std::string err;
    };
    const Case cases[] = {
        {"echo hello; echo oops >&2; exit 0", "", 0, "hello\n", "oops\n"},
        {"exit 7", "", 7, "", ""},
        {"exit 255", "", 255, "", ""},
        {"cat", "fed through stdin", 0, "fed through stdin", ""},
        // 300 bytes: only the first 256 come back, and that is no error.
        {"i=0; while [ $i -lt 30 ]; do printf 0123456789; i=$((i+1)); done", "", 0,
         std::string("0123456789").append(std::string(246, 'x')), ""},
        // Far more than a pipe holds, on both streams, with no time limit:
        // read while the child runs, so it ends; the first bytes are kept.
        {"head -c 300000 /dev/zero | tr '\\0' 0; head -c 300000 /dev/zero | tr '\\0' e >&2; exit 3", "", 3,
         std::string(256, '0'), std::string(256, 'e')},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.script);
        const char* argv[] = {"sh", "-c", c.script, nullptr};
        Captured r = RunIt("/bin/sh", argv, 0, c.input);
        EXPECT_EQ(r.status, c.status);
        if (c.out.size() == 256 && c.out[1] == '1') {
            ASSERT_EQ(r.out.size(), 256u);
            for (size_t i = 0; i < 256; ++i) ASSERT_EQ(r.out[i], "0123456789"[i % 10]) << i;
        } else {
            EXPECT_EQ(r.out, c.out);
        }
        EXPECT_EQ(r.err, c.err);
    }
}

TEST_F(CommandRunnerTest, ChildGetsOnlyPythonHomeAndNoInheritedDescriptors) {
    setenv("VELK_RUNNER_LEAK", "visible", 1);
    int stray = fcntl(1, F_DUPFD, 50);  // a descriptor without close-on-exec
    ASSERT_GE(stray, 50);
    const char* argv[] = {"sh", "-c", "env; for f in /proc/self/fd/*; do echo \"fd ${f##*/}\"; done",
                          nullptr};
    Captured r = RunIt("/bin/sh", argv);
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

TEST_F(CommandRunnerTest, MissingProgramIsStatusOne) {
    const char* argv[] = {"nothere", nullptr};
    EXPECT_EQ(RunIt("/bin/nothere", argv).status, 1);
}

TEST_F(CommandRunnerTest, TimeLimitKillsAndWarns) {
    const char* argv[] = {"sh", "-c", "echo started; exec sleep 30", nullptr};
    auto start = std::chrono::steady_clock::now();
    Captured r = RunIt("/bin/sh", argv, 1);
    double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    EXPECT_EQ(r.status, -1);
    EXPECT_EQ(r.out, "started\n");  // what it wrote before the kill is still returned
    EXPECT_GT(seconds, 0.9);
    EXPECT_LT(seconds, 5.0);
    std::string log = Log();
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
    int status = Velk::InvokeHrmCmd("/bin/hrm-cmd", argv, out, &outLen, nullptr, nullptr, nullptr, 0);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(std::string(out, outLen), "ok\n");
    EXPECT_EQ(History(), "alice internalsvc/refresh\nvelk internalsvc/refresh\n");
    EXPECT_EQ(
        CountOf(Log(),
                "Unable to execute command hrm-cmd internalsvc/refresh using user alice. Using user velk"),
        1u);

    // A user the agent accepts is not retried.
    std::string before = Log();
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

TEST_F(CommandRunnerTest, PowerOffVmsAsksAgentFirstThenTool) {
    Script("/bin/hrm-cmd", "echo \"agent $2 $3\" >> '" + _root + "/history'");
    Script("/bin/powerOffVms", "echo \"powerOffVms $*\" >> '" + _root + "/history'");
    Velk::Frame::_loginName = "root";
    Velk::PowerOffVms(false);
    Velk::PowerOffVms(true);
    EXPECT_EQ(History(),
              "agent root hostsvc/autostartmanager/autostop\npowerOffVms --terminate\n"
              "agent root hostsvc/autostartmanager/autostop\npowerOffVms \n");
}

TEST_F(CommandRunnerTest, ShellCommandsFindProgramsOnlyOnTheHost) {
    Script("/sbin/reboot", "echo \"reboot $*\" >> '" + _root + "/history'");
    Script("/sbin/firmwareConfig.sh", "echo \"firmwareConfig $*\" >> '" + _root + "/history'; exit 3");
    EXPECT_EQ(Velk::RunShellCommand("reboot -f"), 0);
    EXPECT_EQ(Velk::RunShellCommand("/sbin/firmwareConfig.sh --reset-only > /dev/null 2>&1"), 3);
    // The machine's own poweroff is never reached from a simulated host.
    EXPECT_EQ(Velk::RunShellCommand("poweroff"), 127);
    EXPECT_EQ(History(), "reboot -f\nfirmwareConfig --reset-only\n");
}

}  // namespace
