// What a logged-in user does with the real console: shutting down and
// restarting the host, resetting its configuration, reading the logs,
// choosing the keyboard layout, changing the password, and being logged out
// after a time without keys.
#include <signal.h>

#include <cstring>

#include "LoggedIn.hpp"

namespace E2e {
namespace {

using nlohmann::json;

std::vector<std::string> Tools(const std::vector<json>& entries) {
    std::vector<std::string> tools;
    for (const auto& e : entries) tools.push_back(e.value("tool", ""));
    return tools;
}

// The host-agent requests and power tools of the history, in order; of the
// agent requests only the auto-stop.
std::vector<json> PowerHistory(const SimHost& host) {
    std::vector<json> found;
    for (const json& e :
         History(host, {"hrm-cmd", "powerOffVms", "poweroff", "reboot", "firmwareConfig.sh"})) {
        if (e.value("tool", "") == "hrm-cmd" && e.value("command", "") != "hostsvc/autostartmanager/autostop")
            continue;
        found.push_back(e);
    }
    return found;
}

struct PowerCase {
    const char* name;
    const char* key;  // in the shut-down dialog
    bool terminate;   // Space on "Forcefully terminate running VMs" first
    const char* tool;
    const char* logLine;
    const char* progressTitle;
    const char* progressText;
};
void PrintTo(const PowerCase& c, std::ostream* os) { *os << c.name; }

class PowerTest : public ConsoleTestWithParam<PowerCase> {
protected:
    // Logs in with F12 and waits for the shut-down dialog.
    ::testing::AssertionResult OpenShutdownDialog() {
        if (auto started = Start(); !started) return started;
        if (auto submitted = SubmitLogin(*t, kRootPassword, "", "F12"); !submitted) return submitted;
        return t->WaitForText("Forcefully terminate running VMs");
    }
};

TEST_P(PowerTest, StopsVmsThenPowersTheHost) {
    const PowerCase& c = GetParam();
    ASSERT_TRUE(OpenShutdownDialog());
    EXPECT_TRUE(t->Shows("Remote management software is recommended"));
    EXPECT_TRUE(t->Lacks("System Customization"));

    // Keys the dialog does not know change nothing.
    t->SendKey("Enter");
    t->SendKey("F3");
    ASSERT_TRUE(t->WaitQuiet());
    EXPECT_TRUE(t->Shows("Forcefully terminate running VMs"));
    if (c.terminate) {
        // Twice is clear again, three times set.
        for (int i = 0; i < 3; ++i) t->Send(" ");
        ASSERT_TRUE(t->WaitQuiet());
    }
    t->SendKey(c.key);
    ASSERT_TRUE(t->WaitForText(c.progressTitle));
    ASSERT_TRUE(WaitForHistory(host, c.tool));

    const std::vector<json> power = PowerHistory(host);
    ASSERT_EQ(Tools(power), (std::vector<std::string>{"hrm-cmd", "powerOffVms", c.tool}))
        << json(power).dump(1);
    EXPECT_EQ(power[0].value("user", ""), "root") << power[0].dump();
    EXPECT_EQ(power[1]["args"], c.terminate ? json{"--terminate"} : json::array()) << power[1].dump();
    EXPECT_EQ(power[2]["args"], json::array()) << power[2].dump();

    // Once, at informational level (the observation event repeats the text).
    EXPECT_TRUE(LoggedOnce(host, std::string("user.info: ") + c.logLine, t->Pid()));

    // The progress screen stays whatever is pressed.
    EXPECT_TRUE(t->Shows(c.progressText));
    for (const char* key : {"Esc", "Enter", "F2"}) t->SendKey(key);
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    EXPECT_TRUE(t->Shows(c.progressTitle));
    EXPECT_FALSE(t->HasExited());
    EXPECT_EQ(PowerHistory(host).size(), 3u) << host.Get("/history").dump(1);
}

const PowerCase kPowerCases[] = {
    {"ShutDown", "F2", false, "poweroff", "Shutting down host", "Shut Down Host", "Shutdown in progress..."},
    {"RestartTerminatingVms", "F11", true, "reboot", "Rebooting host", "Restart Host",
     "Restart in progress..."},
};

INSTANTIATE_TEST_SUITE_P(Keys, PowerTest, ::testing::ValuesIn(kPowerCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(PowerTest, EscLeavesTheShutdownDialogLoggedOut) {
    ASSERT_TRUE(OpenShutdownDialog());
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone("Forcefully terminate running VMs"));
    EXPECT_TRUE(t->Shows("Customize System/View Logs"));
    EXPECT_TRUE(PowerHistory(host).empty()) << host.Get("/history").dump(1);
    EXPECT_TRUE(LoggedOnce(host, "User root logged out.", t->Pid()));
}

using ResetTest = ConsoleTest;
using LogViewerTest = ConsoleTest;
using KeyboardTest = ConsoleTest;
using PasswordTest = ConsoleTest;
using IdleTimeoutTest = ConsoleTest;

TEST_F(ResetTest, F11ResetsThenEnterRestarts) {
    ASSERT_TRUE(OpenEntry("Reset System Configuration", "Reset System Configuration now?"));
    EXPECT_TRUE(t->Shows("Reset System Configuration: Confirm"));

    // Enter is not the confirming key.
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    EXPECT_TRUE(t->Shows("Reset System Configuration now?"));
    EXPECT_TRUE(PowerHistory(host).empty()) << host.Get("/history").dump(1);

    t->SendKey("F11");
    ASSERT_TRUE(t->WaitForText("Default settings are restored. Press <Enter> to"));
    EXPECT_TRUE(t->Shows("restart your host."));
    ASSERT_TRUE(WaitForHistory(host, "firmwareConfig.sh"));
    EXPECT_TRUE(WaitForLog(host, "user.info: Restoring factory defaults"));

    // No way back once the reset has run.
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    EXPECT_TRUE(t->Shows("Default settings are restored."));
    EXPECT_TRUE(t->Shows("<Enter> Restart Host"));
    EXPECT_EQ(Tools(PowerHistory(host)), std::vector<std::string>{"firmwareConfig.sh"});

    t->SendKey("Enter");
    ASSERT_TRUE(WaitForHistory(host, "reboot"));
    const std::vector<json> power = PowerHistory(host);
    ASSERT_EQ(Tools(power), (std::vector<std::string>{"firmwareConfig.sh", "reboot"})) << json(power).dump(1);
    EXPECT_EQ(power[0]["args"], json{"--reset-only"});
    EXPECT_EQ(power[1]["args"], json{"-f"});

    // The simulated host does not go down: the console waits for it without
    // burning a processor, and still ends on a termination signal.
    const long before = CpuTicks(t->Pid());
    std::this_thread::sleep_for(std::chrono::seconds(1));
    EXPECT_LT(CpuTicks(t->Pid()) - before, sysconf(_SC_CLK_TCK) / 5);
    t->Signal(SIGTERM);
    EXPECT_TRUE(t->ExitsWith(0, Duration(3000)));
}

// The pager opens on its digit and Q returns to the menu, which reads keys
// again. A termination or resize while the pager runs ends the pager and the
// console at once, instead of waiting for somebody to leave the pager.
TEST_F(LogViewerTest, PagerQuitsWithQAndEndsOnSignals) {
    const std::string marker = "e2e-marker-line for the pager";
    host.WriteFile("/var/log/syslog.log", host.ReadFile("/var/log/syslog.log") +
                                              "2024-01-01T00:00:00Z e2e[1]: user.info: " + marker + "\n");
    for (const int sig : {0, SIGTERM, SIGWINCH}) {
        if (!t) {
            ASSERT_TRUE(StartInMenu());
        }
        ASSERT_TRUE(SelectEntry(*t, "View System Logs"));
        ASSERT_TRUE(t->WaitForText("<1> Syslog"));
        t->Send("1");
        ASSERT_TRUE(t->WaitForText(marker));
        EXPECT_TRUE(t->Shows("<Q> Quit </> RegExp Search <H> Help"));
        EXPECT_TRUE(t->Lacks("System Customization"));
        if (!sig) {
            t->Send("q");
            ASSERT_TRUE(WaitForMenu(*t));
            EXPECT_TRUE(t->Lacks(marker));
            continue;
        }
        const auto children = t->Children();
        ASSERT_EQ(children.size(), 1u);
        t->Signal(sig);
        EXPECT_TRUE(t->ExitsWith(0, Duration(3000))) << strsignal(sig);
        EXPECT_TRUE(Eventually([&] { return Ended(children[0].first); }, Duration(2000)))
            << "the pager outlived the console";
        t.reset();
    }
}

const char kKeyboardHelp[] = "If you are having difficulty using your keyboard";

TEST_F(KeyboardTest, EscChangesNothingSpaceMarksEnterApplies) {
    ASSERT_TRUE(OpenEntry("Configure Keyboard", kKeyboardHelp));
    t->SendKey("Down");
    t->Send(" ");
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone(kKeyboardHelp));
    EXPECT_TRUE(t->Shows("System Customization"));
    EXPECT_EQ(host.Get("/system/keyboardLayout"), "US Default");
    EXPECT_TRUE(NotLogged(host, "Keyboard Layout changed"));

    // The list starts at the current layout's place or at the top: move to
    // the first entry, then two down ("Brazilian" -> "Croatian").
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(kKeyboardHelp));
    for (int i = 0; i < 40; ++i) t->SendKey("Up");
    t->SendKey("Down");
    t->SendKey("Down");
    t->Send(" ");
    t->SendKey("Enter");
    ASSERT_TRUE(WaitForMenu(*t));
    ASSERT_TRUE(WaitForLog(host, "user.info: Keyboard Layout changed to Croatian"));
    EXPECT_EQ(host.Get("/system/keyboardLayout"), "Croatian");
    EXPECT_EQ(host.Get("/system/loadedKeymap"), "Croatian");
}

TEST_F(PasswordTest, NewPasswordLogsIn) {
    const std::string fresh = "Fresh-pass-42";
    ASSERT_TRUE(OpenEntry("Configure Password", "Old Password:"));
    for (const std::string& field : {std::string(kRootPassword), fresh, fresh}) {
        t->Send(field);
        t->SendKey("Enter");
        ASSERT_TRUE(t->WaitQuiet());
    }
    ASSERT_TRUE(t->WaitForTextGone("Old Password:"));
    ASSERT_TRUE(WaitForMenu(*t));
    EXPECT_TRUE(NotLogged(host, fresh));
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForWelcome(*t));
    EXPECT_TRUE(LogInToMenu(*t, fresh));
}

// Both waits take a minute each; they share one console to keep the run short.
TEST_F(IdleTimeoutTest, LoginDialogThenMenuTimeOutToTheWelcomeScreen) {
    host.Set("/advancedOptions/~1UserVars~1VelkTimeOut", 60);
    ASSERT_TRUE(Start());

    // A login left unfinished: back to the welcome screen, nobody logged out.
    t->SendKey("F2");
    ASSERT_TRUE(t->WaitForText("Login Name:"));
    const auto opened = std::chrono::steady_clock::now();
    ASSERT_TRUE(t->WaitForTextGone("Login Name:", Duration(75000)));
    EXPECT_GE(std::chrono::steady_clock::now() - opened, std::chrono::seconds(55));
    ASSERT_TRUE(WaitForWelcome(*t));
    EXPECT_FALSE(t->HasExited());
    EXPECT_TRUE(NotLogged(host, "logged out"));

    ASSERT_TRUE(LogInToMenu(*t));
    const auto in = std::chrono::steady_clock::now();
    ASSERT_TRUE(WaitForWelcome(*t, Duration(75000)));
    EXPECT_GE(std::chrono::steady_clock::now() - in, std::chrono::seconds(55));
    EXPECT_TRUE(t->Lacks("System Customization"));
    EXPECT_TRUE(LoggedOnce(host, "User root logged out.", t->Pid()));
}

}  // namespace
}  // namespace E2e
