// "Configure Lockdown Mode" with the real console: the box shows the host
// agent's setting each time the dialog opens, only a changed box asks the
// agent for anything, and a refusal of the agent is only logged.
#include <signal.h>

#include "LoggedIn.hpp"

namespace E2e {
namespace {

using nlohmann::json;

const char kEntry[] = "Configure Lockdown Mode";
const char kItem[] = "Enable lockdown mode";

// The agent command of a history entry of hrm-cmd (a call failed by an
// injected fault records only its arguments, the command last).
std::string Command(const json& entry) {
    if (entry.contains("command")) return entry["command"];
    return entry["args"].empty() ? "" : entry["args"].back().get<std::string>();
}

// The requests to enter or leave lockdown mode, in order.
std::vector<json> Changes(const SimHost& host) {
    std::vector<json> changes;
    for (const json& e : History(host, {"hrm-cmd"}))
        if (Command(e).starts_with("hrmsvc/auth/lockdown_mode_")) changes.push_back(e);
    return changes;
}

class LockdownTest : public ConsoleTest {
protected:
    // Opens the dialog from the menu, where its entry stays selected.
    ::testing::AssertionResult Open() {
        if (!t) return OpenEntry(kEntry, kItem);
        t->SendKey("Enter");
        return t->WaitForText(kItem);
    }

    // Keys() in the dialog, then waits until it has closed.
    ::testing::AssertionResult Press(const std::vector<std::string>& keys) {
        Keys(keys);
        if (auto closed = t->WaitForTextGone(kItem); !closed) return closed;
        return WaitForMenu(*t);
    }
};

TEST_F(LockdownTest, OnlyAChangedBoxAsksTheAgent) {
    ASSERT_TRUE(Open());
    EXPECT_TRUE(t->Shows("[ ] Enable lockdown mode"));
    EXPECT_TRUE(t->Shows("<Space> Toggle Selected"));
    ASSERT_TRUE(Press({"Enter"}));
    // Toggled twice, or toggled and left with Esc: nothing to do either.
    ASSERT_TRUE(Open());
    ASSERT_TRUE(Press({" ", " ", "Enter"}));
    ASSERT_TRUE(Open());
    ASSERT_TRUE(Press({" ", "Esc"}));
    EXPECT_TRUE(Changes(host).empty()) << host.Get("/history").dump(1);
    EXPECT_TRUE(NotLogged(host, "Lockdown mode enabled"));

    ASSERT_TRUE(Open());
    EXPECT_TRUE(t->Shows("[ ] Enable lockdown mode"));
    ASSERT_TRUE(Press({" ", "Enter"}));
    EXPECT_TRUE(WaitForLog(host, "user.info: Lockdown mode enabled"));
    EXPECT_EQ(host.Get("/hostAgent/lockdownEnabled"), true);

    // Reopened, the dialog shows the agent's new setting; Enter alone asks
    // nothing again, unchecking leaves lockdown mode.
    ASSERT_TRUE(Open());
    EXPECT_TRUE(t->Shows("[X] Enable lockdown mode"));
    ASSERT_TRUE(Press({"Enter"}));
    ASSERT_TRUE(Open());
    ASSERT_TRUE(Press({" ", "Enter"}));
    EXPECT_TRUE(WaitForLog(host, "user.info: Lockdown mode disabled"));
    EXPECT_EQ(host.Get("/hostAgent/lockdownEnabled"), false);

    const std::vector<json> changes = Changes(host);
    ASSERT_EQ(changes.size(), 2u) << json(changes).dump(1);
    EXPECT_EQ(Command(changes[0]), "hrmsvc/auth/lockdown_mode_enter");
    EXPECT_EQ(Command(changes[1]), "hrmsvc/auth/lockdown_mode_exit");
    // As the console's own account, not as the logged-in root.
    for (const json& change : changes) EXPECT_EQ(change.value("user", ""), "velk") << change.dump();
    EXPECT_TRUE(LoggedOnce(host, "Lockdown mode enabled", t->Pid()));
}

TEST_F(LockdownTest, RefusalsAreLoggedWithTheToolsErrorAndChangeNothing) {
    host.Fail("hrm-cmd hrmsvc/auth/lockdown_mode_enter", "Lockdown mode is managed centrally");
    ASSERT_TRUE(Open());
    ASSERT_TRUE(Press({" ", "Enter"}));
    ASSERT_TRUE(WaitForLog(host, "Enabling lockdown mode failed"));
    EXPECT_TRUE(LoggedOnce(
        host, "user.err: Enabling lockdown mode failed with error: Lockdown mode is managed centrally",
        t->Pid()));
    EXPECT_TRUE(NotLogged(host, "Lockdown mode enabled"));
    // Nothing on screen but the menu.
    EXPECT_TRUE(t->Lacks("managed centrally"));
    EXPECT_EQ(Changes(host).size(), 1u);
    ASSERT_TRUE(Open());
    EXPECT_TRUE(t->Shows("[ ] Enable lockdown mode"));
    ASSERT_TRUE(Press({"Esc"}));

    // A host put into lockdown mode elsewhere: the dialog reads it afresh,
    // and leaving fails the same way.
    host.Set("/hostAgent/lockdownEnabled", true);
    host.Fail("hrm-cmd hrmsvc/auth/lockdown_mode_exit", "The host agent is busy");
    ASSERT_TRUE(Open());
    EXPECT_TRUE(t->Shows("[X] Enable lockdown mode"));
    ASSERT_TRUE(Press({" ", "Enter"}));
    ASSERT_TRUE(WaitForLog(host, "Disabling lockdown mode failed"));
    EXPECT_TRUE(LoggedOnce(
        host, "user.err: Disabling lockdown mode failed with error: The host agent is busy", t->Pid()));
    EXPECT_EQ(host.Get("/hostAgent/lockdownEnabled"), true);
    ASSERT_TRUE(Open());
    EXPECT_TRUE(t->Shows("[X] Enable lockdown mode"));
}

// A termination signal while a host tool runs ends the tool and the console
// at once: the console does not wait for the tool first.
TEST_F(LockdownTest, TerminationDuringAToolEndsTheConsoleAtOnce) {
    host.Slow("hrm-cmd hrmsvc/auth/lockdown_mode_enter", 60);
    ASSERT_TRUE(Open());
    t->Send(" ");
    t->SendKey("Enter");
    Eventually([&] { return !t->Children().empty(); }, Duration(5000));
    const auto children = t->Children();
    ASSERT_EQ(children.size(), 1u) << "the tool did not start";
    const auto start = std::chrono::steady_clock::now();
    t->Signal(SIGTERM);
    ASSERT_TRUE(t->ExitsWith(0, Duration(4000)));
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(3));
    EXPECT_TRUE(Ended(children[0].first)) << "the tool outlived the console";
    EXPECT_EQ(host.Get("/hostAgent/lockdownEnabled"), false);
}

}  // namespace
}  // namespace E2e
