// Terminals the console cannot use, or only partly: it says why (on the
// terminal and in the log) instead of ending silently or drawing garbage,
// takes no keys for screens nobody can see, and never freezes on a stray
// flow-control key.
#include <signal.h>

#include "SimHost.hpp"
#include "Terminal.hpp"

namespace E2e {
namespace {

TEST(RefusedTermTest, SaysWhyAndFailsTheStart) {
    for (const auto& [term, reason] :
         {std::pair{"", "TERM is not set"},
          {"no-such-terminal-type", "unknown terminal type \"no-such-terminal-type\""},
          {"dumb", "terminal type \"dumb\" cannot place the cursor"}}) {
        SCOPED_TRACE(std::string("TERM=") + term);
        SimHost host;
        Terminal t(host.Console(term));
        ASSERT_TRUE(t.ExitsWith(1));
        EXPECT_TRUE(t.Shows(std::string("velk: cannot start: ") + reason));
        EXPECT_EQ(host.ConsoleLog(std::string("user.err: Cannot start on this terminal: ") + reason, t.Pid())
                      .size(),
                  1u);
        // An instance that never ran does not take the PID file.
        EXPECT_FALSE(host.Exists("/var/run/velk.pid"));
    }
}

// Standard input at its end from the start (no terminal at all): a clear
// refusal, not a loop on the end of input.
TEST(NoTerminalTest, InputFromDevNullIsRefusedAtOnce) {
    SimHost host;
    const TerminalOptions console = host.Console();
    // A console that keeps running is killed after ten seconds (exit 137).
    std::vector<std::string> args = {"/usr/bin/timeout", "-s", "KILL",      "10",
                                     "/usr/bin/env",     "-i", "TERM=linux"};
    args.insert(args.end(), console.env.begin(), console.env.end());
    args.push_back(console.program);
    const ProgramOutput run = RunProgram(args);
    EXPECT_EQ(Terminal::DescribeStatus(run.status), "exit 1") << run.err;
    EXPECT_EQ(run.out, "velk: cannot start: standard input and output must be a terminal\r\n");
}

// Columns and lines.
class SmallTerminalTest : public ::testing::TestWithParam<std::pair<int, int>> {};

// Below the smallest size every dialog fits in, nothing is drawn but the
// notice and no key is taken: a blind F2, name and password open no dialog
// and log nobody in. Signals still end the console.
TEST_P(SmallTerminalTest, ShowsTheNoticeAndTakesNoKeys) {
    SimHost host;
    Terminal t(host.Console("linux", GetParam().first, GetParam().second));
    ASSERT_TRUE(t.WaitForText("Terminal too small"));
    EXPECT_NE(t.RegionText(0, 0, t.Cols(), t.Rows()).find("at least 78 columns and 23 lines"),
              std::string::npos)
        << t.Dump();
    t.SendKey("F2");
    t.Send("root\tsecret\r");
    ASSERT_TRUE(t.WaitQuiet(Duration(300)));
    EXPECT_TRUE(t.Shows("too small"));
    EXPECT_TRUE(host.ConsoleLog("Authentication").empty());
    EXPECT_EQ(host.ConsoleLog("Terminal too small: " + std::to_string(GetParam().first) + "x" +
                                  std::to_string(GetParam().second) + ", the console needs at least 78x23",
                              t.Pid())
                  .size(),
              1u);
    t.Signal(SIGTERM);
    EXPECT_TRUE(t.ExitsWith(0));
}

INSTANTIATE_TEST_SUITE_P(Sizes, SmallTerminalTest,
                         ::testing::Values(std::pair{20, 5}, std::pair{40, 10}, std::pair{77, 25},
                                           std::pair{80, 22}));

// Ctrl-S stops nothing: the next key still opens the login dialog, and the
// termination signal ends the console at once.
TEST(FlowControlTest, CtrlSDoesNotFreezeTheConsole) {
    SimHost host;
    Terminal t(host.Console());
    ASSERT_TRUE(t.WaitForText("Shut Down/Restart"));
    EXPECT_EQ(t.Modes().c_iflag & IXON, 0u);
    t.Send("\x13");
    t.SendKey("F2");
    ASSERT_TRUE(t.WaitForText("Login Name"));
    t.Send("\x13");
    t.Signal(SIGTERM);
    EXPECT_TRUE(t.ExitsWith(0, Duration(3000)));
}

}  // namespace
}  // namespace E2e
