// "Troubleshooting Mode Options": the shell and SSH switches (host agent, or
// init scripts when it fails), the timeouts and their limits, and the restart
// of the management agents with and without a live core.
#include "LoggedIn.hpp"

namespace E2e {
namespace {

using nlohmann::json;

const char kWindow[] = "Troubleshooting Mode Options";
const char kTimeouts[] = "Modify Tarni Shell and SSH timeouts";
const char kShellDialog[] = "Availability timeout";
const char kVelkDialog[] = "Set idle timeout for VELK access";
const char kVelkField[] = "VELK idle timeout";
const char kInvalidTitle[] = "Invalid timeout value";
const char kInvalidText[] = "Timeout value must be between 0 (disabled) and 1440 minutes";
const char kConfirm[] = "Restart management agents now?";
const char kLiveCore[] = "Collecting host agent live core information. Done.";
const char kStopping[] = "Stopping management agents.";
const char kStarted[] = "Starting management agents. Done.";

enum Entry { SHELL = 0, SSH, TIMEOUTS, VELK_TIMEOUT, RESTART_AGENTS };

// Each call of the tools as "tool [command] arg arg ...", in order.
std::vector<std::string> Calls(const SimHost& host, const std::vector<std::string>& tools) {
    std::vector<std::string> calls;
    for (const json& e : History(host, tools)) {
        std::string call = e.value("tool", "");
        if (e.contains("command")) call += " " + e["command"].get<std::string>();
        for (const json& a : e.value("args", json::array()))
            call += " " + (a.is_string() ? a.get<std::string>() : a.dump());
        calls.push_back(call);
    }
    return calls;
}

// The agent's service commands (not its questions) and who asked, in order.
std::vector<std::string> AgentSwitches(const SimHost& host) {
    std::vector<std::string> found;
    for (const json& e : History(host, {"hrm-cmd"})) {
        const std::string command = e.value("command", "");
        if (command.starts_with("hostsvc/")) found.push_back(e.value("user", "") + " " + command);
    }
    return found;
}

class TroubleshootingTest : public ConsoleTest {
protected:
    ::testing::AssertionResult Open() { return OpenEntry("Troubleshooting Options", kWindow); }

    ::testing::AssertionResult Select(int entry) {
        for (int i = 0; i < 5; ++i) t->SendKey("Up");
        for (int i = 0; i < entry; ++i) t->SendKey("Down");
        return t->WaitQuiet();
    }

    // Selects `entry`, presses Enter and waits for `shown`.
    ::testing::AssertionResult OpenDialog(int entry, const std::string& shown) {
        if (auto selected = Select(entry); !selected) return selected;
        t->SendKey("Enter");
        return t->WaitForText(shown);
    }

    // Keys(), then Enter; waits until `shown` (the dialog's own text) is gone.
    ::testing::AssertionResult Submit(const std::vector<std::string>& keys, const std::string& shown) {
        Keys(keys);
        t->SendKey("Enter");
        return t->WaitForTextGone(shown);
    }

    // The "Invalid timeout value" message is up; Enter closes it.
    ::testing::AssertionResult Refused() {
        if (auto shown = t->WaitForText(kInvalidTitle); !shown) return shown;
        if (auto text = t->Shows(kInvalidText); !text) return text;
        t->SendKey("Enter");
        return t->WaitForTextGone(kInvalidTitle);
    }

    // The text right of `label` in its dialog row (the lowest row that
    // shows the label: menu and heading may name it too).
    std::string FieldValue(const std::string& label) const {
        const auto all = t->FindAll(label);
        if (all.empty()) return "<no " + label + ">";
        std::string rest = t->RowText(all.back().row);
        const size_t start = rest.find(label) + label.size();
        rest = rest.substr(start, rest.find("\u2502", start) - start);
        const size_t first = rest.find_first_not_of(' ');
        const size_t last = rest.find_last_not_of(' ');
        return first == std::string::npos ? "" : rest.substr(first, last - first + 1);
    }

    bool IsGrey(const std::string& text) const {
        const auto at = t->Find(text);
        return at && t->CellAt(at->col, at->row).fg.IsIndex(6);
    }

    json Option(const std::string& name) const { return host.Get("/advancedOptions/~1UserVars~1" + name); }
};

TEST_F(TroubleshootingTest, SwitchesGoThroughTheHostAgentAndRelabel) {
    // The agent keeps the firewall in line itself: the console must not even
    // look at it.
    host.Fail("GetFirewallRulesetEnabled", "the firewall is not to be read");
    ASSERT_TRUE(Open());
    EXPECT_TRUE(t->Shows("Enable Tarni Shell"));
    EXPECT_TRUE(t->Shows("Enable SSH"));
    EXPECT_TRUE(t->Shows("Tarni Shell is Disabled"));
    EXPECT_TRUE(t->Shows("<Up/Down> Select"));
    // With neither service running, the timeouts entry is grey.
    EXPECT_TRUE(IsGrey(kTimeouts)) << t->Dump(true);

    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Disable Tarni Shell"));
    EXPECT_TRUE(t->Shows("Tarni Shell is Enabled"));
    EXPECT_FALSE(IsGrey(kTimeouts)) << t->Dump(true);
    EXPECT_TRUE(LoggedOnce(host, "user.info: User root enabled Tarni Shell", t->Pid()));

    ASSERT_TRUE(Select(SSH));
    EXPECT_TRUE(t->Shows("SSH is Disabled"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Disable SSH"));
    EXPECT_TRUE(t->Shows("SSH is Enabled"));
    // The agent opened the firewall itself: the console did not touch it.
    EXPECT_EQ(host.Get("/firewall/rulesets/sshServer/enabled"), true);
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Enable SSH"));
    EXPECT_EQ(host.Get("/firewall/rulesets/sshServer/enabled"), false);
    EXPECT_TRUE(LoggedOnce(host, "user.info: User root disabled SSH", t->Pid()));

    ASSERT_TRUE(Select(SHELL));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Enable Tarni Shell"));
    EXPECT_TRUE(IsGrey(kTimeouts)) << t->Dump(true);

    EXPECT_EQ(AgentSwitches(host),
              (std::vector<std::string>{"root hostsvc/start_tarn_shell", "root hostsvc/enable_tarn_shell",
                                        "root hostsvc/start_ssh", "root hostsvc/enable_ssh",
                                        "root hostsvc/stop_ssh", "root hostsvc/disable_ssh",
                                        "root hostsvc/stop_tarn_shell", "root hostsvc/disable_tarn_shell"}));
    // The init scripts were only asked for the state, once each.
    EXPECT_EQ(Calls(host, {"TarnShell", "SSH"}),
              (std::vector<std::string>{"TarnShell status", "SSH status"}));
    EXPECT_TRUE(Calls(host, {"hostctl"}).empty()) << host.Get("/history").dump(1);
    EXPECT_TRUE(NotLogged(host, "Unable to run hrm-cmd"));
    EXPECT_TRUE(NotLogged(host, "Failed to update firewall"));

    t->SendKey("Esc");
    EXPECT_TRUE(WaitForMenu(*t));
}

TEST_F(TroubleshootingTest, FailingAgentFallsBackToTheInitScripts) {
    host.Fail("hrm-cmd hostsvc/start_ssh", "The host agent is not responding");
    host.Fail("hrm-cmd hostsvc/enable_ssh", "The host agent is not responding");
    ASSERT_TRUE(Open());
    ASSERT_TRUE(Select(SSH));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Disable SSH"));
    EXPECT_TRUE(LoggedOnce(host, "user.warning: Unable to run hrm-cmd to start/stop ssh", t->Pid()));
    EXPECT_TRUE(LoggedOnce(host, "user.warning: Unable to run hrm-cmd to enable/disable ssh", t->Pid()));
    // The script started the service, nothing made it start with the host;
    // the console opened the firewall for it.
    EXPECT_EQ(host.Get("/services/ssh"), json({{"enabled", false}, {"running", true}}));
    EXPECT_EQ(host.Get("/firewall/rulesets/sshServer/enabled"), true);
    EXPECT_EQ(Calls(host, {"SSH", "hostctl"}),
              (std::vector<std::string>{"SSH status", "SSH start", "hostctl sshServer true"}));

    // A firewall that cannot be changed is logged; the switch still happens.
    host.Fail("SetFirewallRulesetEnabled", "the firewall is locked");
    host.Fail("hrm-cmd hostsvc/stop_ssh", "The host agent is not responding");
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Enable SSH"));
    EXPECT_TRUE(LoggedOnce(host, "Failed to update firewall sshServer ruleset status: the firewall is locked",
                           t->Pid()));
    EXPECT_EQ(host.Get("/services/ssh/running"), false);
    EXPECT_EQ(host.Get("/firewall/rulesets/sshServer/enabled"), true);

    // The shell falls back the same way, with no firewall step.
    host.Fail("hrm-cmd hostsvc/start_tarn_shell", "The host agent is not responding");
    ASSERT_TRUE(Select(SHELL));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Disable Tarni Shell"));
    EXPECT_TRUE(LoggedOnce(host, "user.warning: Unable to run hrm-cmd to start/stop Tarni Shell", t->Pid()));
    EXPECT_TRUE(NotLogged(host, "enable/disable Tarni Shell"));
    EXPECT_EQ(host.Get("/services/tarnShell"), json({{"enabled", true}, {"running", true}}));
    EXPECT_EQ(Calls(host, {"TarnShell"}), (std::vector<std::string>{"TarnShell status", "TarnShell start"}));
    EXPECT_EQ(Calls(host, {"hostctl"}).size(), 1u);
}

TEST_F(TroubleshootingTest, ShellTimeoutsKeepTheirLimitsAndRestartOnlyRunningServices) {
    host.Set("/services/tarnShell/running", true);
    host.Set("/advancedOptions/~1UserVars~1TarniShellTimeOut", 600);
    ASSERT_TRUE(Open());
    EXPECT_TRUE(t->Shows("Disable Tarni Shell"));
    EXPECT_TRUE(t->Shows("Enable SSH"));
    EXPECT_FALSE(IsGrey(kTimeouts)) << t->Dump(true);
    const std::vector<std::string> tools = {"tarncli", "localcli", "TarnShell", "SSH"};
    const size_t atStart = Calls(host, tools).size();

    // Untouched, and with letters and signs that the fields refuse.
    ASSERT_TRUE(OpenDialog(TIMEOUTS, kShellDialog));
    EXPECT_EQ(FieldValue(kShellDialog), "10");
    EXPECT_EQ(FieldValue("Idle timeout"), "0");
    ASSERT_TRUE(Submit({}, kShellDialog));
    ASSERT_TRUE(OpenDialog(TIMEOUTS, kShellDialog));
    t->Send("x-+");
    ASSERT_TRUE(t->WaitQuiet());
    EXPECT_EQ(FieldValue(kShellDialog), "10");
    t->Send("1441");
    t->SendKey("Enter");
    ASSERT_TRUE(Refused());
    // The idle field was left as it was: the dialog is done.
    ASSERT_TRUE(t->WaitForTextGone(kShellDialog));
    EXPECT_EQ(Calls(host, tools).size(), atStart);
    EXPECT_EQ(Option("TarniShellTimeOut"), 600);
    EXPECT_TRUE(NotLogged(host, "Shell timeout"));

    // The largest value: written, and only the running shell restarted.
    ASSERT_TRUE(OpenDialog(TIMEOUTS, kShellDialog));
    ASSERT_TRUE(Submit({"1440"}, kShellDialog));
    EXPECT_TRUE(WaitForLog(host, "user.info: Modified Shell timeout to 1440 minutes"));
    EXPECT_EQ(Option("TarniShellTimeOut"), 86400);
    std::vector<std::string> calls = Calls(host, tools);
    EXPECT_EQ(std::vector<std::string>(calls.begin() + std::ptrdiff_t(atStart), calls.end()),
              (std::vector<std::string>{
                  "tarncli system settings advanced set -o /UserVars/TarniShellTimeOut -i 86400",
                  "TarnShell status", "TarnShell restart", "SSH status"}));

    // The idle timeout alone restarts nothing.
    ASSERT_TRUE(OpenDialog(TIMEOUTS, kShellDialog));
    EXPECT_EQ(FieldValue(kShellDialog), "1440");
    ASSERT_TRUE(Submit({"Down", "30"}, kShellDialog));
    EXPECT_TRUE(WaitForLog(host, "user.info: Modified shell interactive timeout to 30 minutes"));
    EXPECT_EQ(Option("TarniShellInteractiveTimeOut"), 1800);
    EXPECT_EQ(Calls(host, tools).back(),
              "tarncli system settings advanced set -o /UserVars/TarniShellInteractiveTimeOut -i 1800");
    const size_t restarts = Calls(host, {"TarnShell"}).size();

    // Zero disables; without the host agent localcli writes it.
    host.Fail("tarncli", "Error: Connection to the host agent failed");
    ASSERT_TRUE(OpenDialog(TIMEOUTS, kShellDialog));
    ASSERT_TRUE(Submit({"0"}, kShellDialog));
    EXPECT_TRUE(WaitForLog(host, "user.info: Disabled Shell timeout"));
    EXPECT_EQ(Option("TarniShellTimeOut"), 0);
    calls = Calls(host, {"tarncli", "localcli"});
    ASSERT_GE(calls.size(), 2u);
    EXPECT_EQ(calls.back(), "localcli system settings advanced set -o /UserVars/TarniShellTimeOut -i 0");
    EXPECT_EQ(Calls(host, {"TarnShell"}).size(), restarts + 2);

    // An emptied field leaves its setting alone.
    ASSERT_TRUE(OpenDialog(TIMEOUTS, kShellDialog));
    ASSERT_TRUE(Submit({"Backspace", "Down", "Backspace"}, kShellDialog));
    ASSERT_TRUE(OpenDialog(TIMEOUTS, kShellDialog));
    ASSERT_TRUE(Submit({"Backspace", "Down", "0"}, kShellDialog));
    EXPECT_TRUE(WaitForLog(host, "user.info: Disabled shell interactive timeout"));
    EXPECT_EQ(Option("TarniShellTimeOut"), 0);
    EXPECT_EQ(Option("TarniShellInteractiveTimeOut"), 0);
    EXPECT_EQ(Calls(host, {"TarnShell"}).size(), restarts + 2);
    EXPECT_TRUE(LoggedOnce(host, "Disabled Shell timeout", t->Pid()));
}

TEST_F(TroubleshootingTest, ConsoleTimeoutKeepsItsLimitsAndReadsSixHundredWhenMissing) {
    ASSERT_TRUE(Open());
    ASSERT_TRUE(OpenDialog(VELK_TIMEOUT, kVelkDialog));
    EXPECT_EQ(FieldValue(kVelkField), "10");
    ASSERT_TRUE(Submit({}, kVelkDialog));
    ASSERT_TRUE(OpenDialog(VELK_TIMEOUT, kVelkDialog));
    t->Send("1441");
    t->SendKey("Enter");
    ASSERT_TRUE(Refused());
    // The dialog does not come back; Esc drops a typed value.
    ASSERT_TRUE(t->WaitForTextGone(kVelkDialog));
    ASSERT_TRUE(OpenDialog(VELK_TIMEOUT, kVelkDialog));
    t->Send("5");
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone(kVelkDialog));
    EXPECT_EQ(Option("VelkTimeOut"), 600);
    EXPECT_TRUE(NotLogged(host, "Velk timeout"));

    ASSERT_TRUE(OpenDialog(VELK_TIMEOUT, kVelkDialog));
    ASSERT_TRUE(Submit({"0"}, kVelkDialog));
    EXPECT_TRUE(WaitForLog(host, "user.info: Disabled Velk timeout"));
    EXPECT_EQ(Option("VelkTimeOut"), 0);
    ASSERT_TRUE(OpenDialog(VELK_TIMEOUT, kVelkDialog));
    EXPECT_EQ(FieldValue(kVelkField), "0");
    ASSERT_TRUE(Submit({"1440"}, kVelkDialog));
    EXPECT_TRUE(WaitForLog(host, "user.info: Modified Velk timeout to 1440 minutes"));
    EXPECT_EQ(Option("VelkTimeOut"), 86400);

    // Without the option the dialog offers ten minutes; nothing can be
    // written, and nothing claims it was.
    host.Remove("/advancedOptions/~1UserVars~1VelkTimeOut");
    ASSERT_TRUE(OpenDialog(VELK_TIMEOUT, kVelkDialog));
    EXPECT_EQ(FieldValue(kVelkField), "10");
    ASSERT_TRUE(Submit({"3"}, kVelkDialog));
    EXPECT_TRUE(WaitForLog(host, "Cannot set /UserVars/VelkTimeOut"));
    EXPECT_TRUE(NotLogged(host, "Modified Velk timeout to 3"));
    EXPECT_TRUE(LoggedOnce(host, "Disabled Velk timeout", t->Pid()));
}

TEST_F(TroubleshootingTest, AgentsRestartOnlyAfterF11AndWithoutLiveCoreWhenClear) {
    ASSERT_TRUE(Open());
    ASSERT_TRUE(OpenDialog(RESTART_AGENTS, kConfirm));
    EXPECT_TRUE(t->Shows("Restart Management Agents: Confirm"));
    EXPECT_TRUE(t->Shows("[ ] Collect extra troubleshooting information"));
    t->SendKey("Enter");
    t->Send("y");
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    EXPECT_TRUE(t->Shows(kConfirm));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone(kConfirm));
    EXPECT_TRUE(t->Shows(kWindow));
    EXPECT_TRUE(History(host, {"services.sh"}).empty());
    EXPECT_TRUE(NotLogged(host, "Restarting host agents"));

    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(kConfirm));
    t->SendKey("F11");
    ASSERT_TRUE(t->WaitForText(kStarted));
    EXPECT_TRUE(t->Shows("Stopping management agents. Done."));
    EXPECT_TRUE(t->Lacks("Collecting host agent"));
    EXPECT_TRUE(t->Shows("<Enter> OK"));
    EXPECT_EQ(Calls(host, {"services.sh", "qelbacktrace"}),
              (std::vector<std::string>{"services.sh stop", "services.sh start"}));
    EXPECT_EQ(host.Get("/hostAgent/running"), true);
    EXPECT_TRUE(LoggedOnce(host, "user.info: Restarting host agents", t->Pid()));
    EXPECT_NE(host.ReadFile("/var/log/obzd.log")
                  .find("(obz.user.velk.restarting.hostagents)Restarting host agents"),
              std::string::npos);

    // Only Enter closes it.
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    EXPECT_TRUE(t->Shows(kStarted));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone(kStarted));
    EXPECT_TRUE(NotLogged(host, "qelbacktrace"));
}

TEST_F(TroubleshootingTest, LiveCoreRunsBesideTheRestartWithoutBeingAwaited) {
    host.Slow("qelbacktrace", 4);
    host.Slow("services.sh stop", 1.5);
    ASSERT_TRUE(Open());
    ASSERT_TRUE(OpenDialog(RESTART_AGENTS, kConfirm));
    t->Send(" ");
    ASSERT_TRUE(t->WaitForText("[X] Collect extra troubleshooting information"));
    t->SendKey("F11");

    // While the agents stop, the live core is shown as done above the
    // running step, though the backtrace has only begun.
    ASSERT_TRUE(t->WaitForText(kStopping));
    const auto done = t->Find(kLiveCore);
    const auto running = t->Find(kStopping);
    ASSERT_TRUE(done && running) << t->Dump();
    EXPECT_EQ(done->row + 1, running->row) << t->Dump();
    EXPECT_TRUE(t->CellAt(done->col, done->row).fg.IsIndex(6)) << t->Dump(true);
    EXPECT_TRUE(t->CellAt(running->col, running->row).fg.IsIndex(0)) << t->Dump(true);
    EXPECT_TRUE(History(host, {"services.sh", "qelbacktrace"}).empty()) << host.Get("/history").dump(1);

    ASSERT_TRUE(t->WaitForText(kStarted));
    EXPECT_TRUE(History(host, {"qelbacktrace"}).empty()) << "the restart waited for the backtrace";
    ASSERT_TRUE(WaitForHistory(host, "qelbacktrace", Duration(15000)));
    EXPECT_EQ(Calls(host, {"services.sh", "qelbacktrace"}),
              (std::vector<std::string>{
                  "services.sh stop", "services.sh start",
                  "qelbacktrace -w -n corad -o corad-restart% -d " + host.Path("/var/log/")}));
    Eventually([&] { return host.Get("/system/systemAlert") == "Corad core dump completed"; },
               Duration(5000));
    EXPECT_EQ(host.Get("/system/systemAlert"), "Corad core dump completed");
    EXPECT_TRUE(LoggedOnce(host, "user.info: Executing qelbacktrace -c against corad", t->Pid()));

    // A backtrace that fails is only logged; the restart goes on as before.
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone(kStarted));
    host.Slow("qelbacktrace", 0);
    host.Slow("services.sh stop", 0);
    host.Fail("qelbacktrace", "qelbacktrace: no process named corad");
    host.Set("/system/systemAlert", "");
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(kConfirm));
    t->Send(" ");
    t->SendKey("F11");
    ASSERT_TRUE(t->WaitForText(kStarted));
    EXPECT_TRUE(t->Shows(kLiveCore));
    EXPECT_TRUE(WaitForLog(host, "user.err: qelbacktrace failed, probably corad was down"));
    EXPECT_EQ(host.Get("/system/systemAlert"), "");
    EXPECT_EQ(Calls(host, {"services.sh"}).size(), 4u);
}

// The one-minute wait runs once; its name puts it among the long cases.
using VelkIdleTimeoutTest = TroubleshootingTest;

TEST_F(VelkIdleTimeoutTest, OneMinuteSetInTheDialogLogsOutAfterAnIdleMinute) {
    ASSERT_TRUE(Open());
    ASSERT_TRUE(OpenDialog(VELK_TIMEOUT, kVelkDialog));
    ASSERT_TRUE(Submit({"1"}, kVelkDialog));
    ASSERT_TRUE(WaitForLog(host, "user.info: Modified Velk timeout to 1 minutes"));
    ASSERT_TRUE(t->WaitForText(kWindow));
    const auto idle = std::chrono::steady_clock::now();
    // The default was ten minutes: only the new value ends the session now.
    ASSERT_TRUE(WaitForWelcome(*t, Duration(80000)));
    EXPECT_GE(std::chrono::steady_clock::now() - idle, std::chrono::seconds(55));
    EXPECT_TRUE(LoggedOnce(host, "User root logged out.", t->Pid()));
    EXPECT_EQ(host.Get("/advancedOptions/~1UserVars~1VelkTimeOut"), 60);
}

}  // namespace
}  // namespace E2e
