// Start and end of the real console: its first log lines, the PID file, the
// terminal argument, and the signals and keys that end it for the host to
// start it again.
#include <signal.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <functional>
#include <regex>

#include "SimHost.hpp"
#include "Terminal.hpp"

namespace E2e {
namespace {

const char kPidFile[] = "/var/run/velk.pid";
const char kMultiple[] = "Attempt to run multiple VELK instances, not updating /var/run/velk.pid";

::testing::AssertionResult WaitForWelcome(Terminal& t) { return t.WaitForText("Shut Down/Restart"); }

std::string Joined(const std::vector<std::string>& lines) {
    std::string all;
    for (const auto& l : lines) all += l + "\n";
    return all;
}

// The PID of a process that has ended.
pid_t DeadPid() {
    pid_t pid = fork();
    if (pid == 0) _exit(0);
    waitpid(pid, nullptr, 0);
    return pid;
}

TEST(StartupTest, LogsStartWithIdentityAndWritesPidFile) {
    SimHost host;
    ASSERT_FALSE(host.Exists(kPidFile));
    Terminal t(host.Console());
    ASSERT_TRUE(WaitForWelcome(t));
    const std::vector<std::string> starts = host.ConsoleLog("Starting VELK", t.Pid());
    ASSERT_EQ(starts.size(), 1u) << Joined(host.SyslogLines());
    const std::regex format(R"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d(\.\d+)?(Z|[+-]\d\d:?\d\d)? VELK\[)" +
                            std::to_string(t.Pid()) + R"(\]: user\.info: Starting VELK)");
    EXPECT_TRUE(std::regex_match(starts[0], format)) << starts[0];
    EXPECT_EQ(host.ReadFile(kPidFile), std::to_string(t.Pid()));
    EXPECT_TRUE(host.ConsoleLog("Invalid VT", t.Pid()).empty());
    EXPECT_TRUE(host.ConsoleLog(kMultiple, t.Pid()).empty());
}

struct PidFileCase {
    const char* name;
    std::function<std::string()> content;  // what the PID file holds before the start
    bool kept;                             // true: another live instance owns it
};
void PrintTo(const PidFileCase& c, std::ostream* os) { *os << c.name; }

class PidFileTest : public ::testing::TestWithParam<PidFileCase> {};

TEST_P(PidFileTest, OwnedOnlyByALiveInstance) {
    const PidFileCase& c = GetParam();
    SimHost host;
    const std::string before = c.content();
    host.WriteFile(kPidFile, before);
    Terminal t(host.Console());
    ASSERT_TRUE(WaitForWelcome(t));
    EXPECT_EQ(host.ReadFile(kPidFile), c.kept ? before : std::to_string(t.Pid()));
    const auto refused = host.ConsoleLog(std::string("user.err: ") + kMultiple, t.Pid());
    EXPECT_EQ(refused.size(), c.kept ? 1u : 0u) << Joined(host.SyslogLines());
    // A second instance is not refused: it runs on.
    EXPECT_FALSE(t.HasExited());
}

INSTANTIATE_TEST_SUITE_P(
    Contents, PidFileTest,
    ::testing::Values(PidFileCase{"StaleWithNewline", [] { return std::to_string(DeadPid()) + "\n"; }, false},
                      PidFileCase{"Empty", [] { return std::string(); }, false},
                      PidFileCase{"NotANumber", [] { return std::string("velk"); }, false},
                      PidFileCase{"Zero", [] { return std::string("0"); }, false},
                      PidFileCase{"Negative", [] { return std::string("-1"); }, false},
                      PidFileCase{"LiveProcess", [] { return std::to_string(getpid()); }, true},
                      PidFileCase{"LiveProcessWithNewline", [] { return std::to_string(getpid()) + "\n"; },
                                  true}),
    [](const auto& info) { return std::string(info.param.name); });

struct VtCase {
    const char* arg;
    bool valid;
};
void PrintTo(const VtCase& c, std::ostream* os) { *os << "\"" << c.arg << "\""; }

class VtArgumentTest : public ::testing::TestWithParam<VtCase> {};

TEST_P(VtArgumentTest, InvalidLoggedAndIgnored) {
    const VtCase& c = GetParam();
    SimHost host;
    Terminal t(host.Console("linux", 80, 25, {c.arg}));
    ASSERT_TRUE(WaitForWelcome(t));
    const auto invalid = host.ConsoleLog(std::string("Invalid VT specified for VELK: ") + c.arg, t.Pid());
    if (c.valid) {
        EXPECT_TRUE(invalid.empty()) << Joined(invalid);
        // Switching to a terminal also disables the suspend character.
        EXPECT_EQ(t.Modes().c_cc[VSUSP], 0) << "suspend character not disabled";
    } else {
        ASSERT_EQ(invalid.size(), 1u) << Joined(host.SyslogLines());
        // The line names the argument exactly, nothing after it.
        EXPECT_TRUE(invalid[0].ends_with(std::string(".err: Invalid VT specified for VELK: ") + c.arg))
            << invalid[0];
        EXPECT_EQ(t.Modes().c_cc[VSUSP], 'Z' & 0x1f) << "suspend character changed";
    }
    EXPECT_FALSE(t.HasExited());
    t.Signal(SIGTERM);
    EXPECT_TRUE(t.ExitsWith(0));
}

INSTANTIATE_TEST_SUITE_P(Args, VtArgumentTest,
                         ::testing::Values(VtCase{"0", false}, VtCase{"64", false}, VtCase{"-3", false},
                                           VtCase{"tty2", false}, VtCase{"", false},
                                           VtCase{"99999999999999999999", false}, VtCase{"1", true},
                                           VtCase{"63", true}),
                         [](const auto& info) {
                             std::string name;
                             for (char ch : std::string(info.param.arg))
                                 name += isalnum(static_cast<unsigned char>(ch)) ? ch : '_';
                             return "arg_" + name + (info.param.valid ? "_valid" : "_invalid");
                         });

// Ways the console ends with status 0 while nobody is logged in, each in
// good time: well before the last-resort exit five seconds after the signal.
struct EndCase {
    const char* name;
    const char* term;
    std::function<void(Terminal&)> act;
    const char* resized;            // expected "Resized window to ..." size, or null: no such line
    const char* logged = nullptr;   // another line it logs on the way out
    const char* welcome = nullptr;  // a welcome text of the host, shown instead of its values
    int withinMs = 4000;            // from the end of `act` to the exit
};
void PrintTo(const EndCase& c, std::ostream* os) { *os << c.name; }

class EndTest : public ::testing::TestWithParam<EndCase> {};

TEST_P(EndTest, ExitsWithStatusZero) {
    const EndCase& c = GetParam();
    SimHost host;
    if (c.welcome) host.Set("/system/welcomeMessage", c.welcome);
    Terminal t(host.Console(c.term, 80, 25));
    ASSERT_TRUE(c.welcome ? t.WaitForText(std::string(c.welcome, 20)) : WaitForWelcome(t));
    c.act(t);
    ASSERT_TRUE(t.ExitsWith(0, Duration(c.withinMs)));
    const auto resized = host.ConsoleLog("Resized window to ", t.Pid());
    if (c.resized) {
        ASSERT_EQ(resized.size(), 1u) << Joined(host.SyslogLines());
        EXPECT_TRUE(resized[0].ends_with(std::string("user.info: Resized window to ") + c.resized))
            << resized[0];
    } else {
        EXPECT_TRUE(resized.empty()) << Joined(resized);
    }
    if (c.logged) {
        EXPECT_EQ(host.ConsoleLog(c.logged, t.Pid()).size(), 1u) << Joined(host.SyslogLines());
    }
}

// Refresh requests queued before an ending signal do not hold it up: with a
// long welcome text to lay out, a thousand take seconds.
void RefreshFloodThen(Terminal& t, int sig) {
    // Paced, so that each request reaches the console instead of merging
    // with the one still pending.
    for (int i = 0; i < 1000; ++i) {
        t.Signal(SIGUSR1);
        std::this_thread::sleep_for(std::chrono::microseconds(100));
    }
    t.Signal(sig);
}
const char* LongWelcome() {
    static std::string text;
    while (text.size() < 10000) text += "Property of the lab, ask Dana before rebooting. ";
    text.resize(10000);
    return text.c_str();
}

INSTANTIATE_TEST_SUITE_P(
    Ways, EndTest,
    ::testing::Values(EndCase{"Sigterm", "linux", [](Terminal& t) { t.Signal(SIGTERM); }, nullptr},
                      EndCase{"Sigint", "linux", [](Terminal& t) { t.Signal(SIGINT); }, nullptr},
                      EndCase{"Sigquit", "vt100", [](Terminal& t) { t.Signal(SIGQUIT); }, nullptr},
                      EndCase{"PtyResized", "linux", [](Terminal& t) { t.Resize(100, 31); }, "100x31"},
                      EndCase{"SigwinchSameSize", "linux", [](Terminal& t) { t.Signal(SIGWINCH); }, "80x25"},
                      EndCase{"EscR", "linux", [](Terminal& t) { t.Send("\x1bR"); }, "80x25"},
                      EndCase{"EscRSerial", "vt100", [](Terminal& t) { t.Send("\x1bR"); }, "80x25"},
                      EndCase{"WinchAfterRefreshFlood", "linux",
                              [](Terminal& t) { RefreshFloodThen(t, SIGWINCH); }, "80x25", nullptr,
                              LongWelcome(), 1500},
                      EndCase{"PtyHangUp", "linux", [](Terminal& t) { t.HangUp(); }, nullptr,
                              "user.warning: Terminal hung up, exiting"}),
    [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace E2e
