// Logging in to the real console through PAM: the main menu after a
// successful login, the messages and log lines of refused logins, the
// login-disabled notice, and logging out again.
#include <algorithm>

#include "LoggedIn.hpp"

namespace E2e {
namespace {

using nlohmann::json;

// The text of the left pane's row that starts at `pos`, up to the width of
// the longest menu entry.
std::string EntryAt(const Terminal& t, Pos pos) { return t.RegionText(pos.col, pos.row, 28, 1); }

struct Entry {
    const char* text;  // "" for a blank row
    bool enabled = true;
};

// The menu on an unchanged host, on the local console.
std::vector<Entry> FullMenu() {
    return {{"Configure Password"},
            {"Configure Lockdown Mode"},
            {""},
            {"Configure DriverVM Devices"},
            {"Configure Management Network"},
            {"Restart Management Network"},
            {"Test Management Network"},
            {"Network Restore Options"},
            {""},
            {"Configure Keyboard"},
            {"Troubleshooting Options"},
            {""},
            {"View System Logs"},
            {""},
            {"View Support Information"},
            {""},
            {"Reset System Configuration"}};
}

std::vector<Entry> With(std::vector<Entry> entries, const std::string& text, bool enabled) {
    for (auto& e : entries)
        if (text == e.text) e.enabled = enabled;
    return entries;
}

std::vector<Entry> Without(std::vector<Entry> entries, const std::string& text) {
    std::erase_if(entries, [&](const Entry& e) { return text == e.text; });
    return entries;
}

struct MenuCase {
    const char* name;
    const char* term;
    std::vector<std::pair<std::string, json>> changes;  // JSON pointer, value, set before the start
    std::vector<Entry> entries;
};
void PrintTo(const MenuCase& c, std::ostream* os) { *os << c.name; }

class MenuTest : public ::testing::TestWithParam<MenuCase> {};

TEST_P(MenuTest, EntriesInOrderDisabledOnesGrey) {
    const MenuCase& c = GetParam();
    SimHost host;
    SetRootPassword(host);
    for (const auto& [pointer, value] : c.changes) host.Set(pointer, value);
    Terminal t(PamConsole(host, c.term));
    ASSERT_TRUE(WaitForWelcome(t));
    ASSERT_TRUE(LogInToMenu(t)) << t.Dump();

    // The selected entry's name also heads the right pane, above the menu.
    const std::vector<Pos> found = t.FindAll("Configure Password");
    ASSERT_EQ(found.size(), 2u) << t.Dump();
    const std::optional<Pos> first = found[0].row > found[1].row ? found[0] : found[1];
    for (size_t i = 0; i < c.entries.size(); ++i) {
        const Entry& e = c.entries[i];
        const Pos pos{first->col, first->row + int(i)};
        EXPECT_EQ(EntryAt(t, pos), e.text) << "menu row " << i << "\n" << t.Dump();
        if (*e.text && i > 0) {  // the first entry is the selected one
            const Cell cell = t.CellAt(pos.col, pos.row);
            EXPECT_EQ(cell.fg.IsIndex(6), !e.enabled)
                << "\"" << e.text << "\" fg " << ToString(cell.fg) << "\n"
                << t.Dump(true);
        }
    }
    EXPECT_EQ(EntryAt(t, {first->col, first->row + int(c.entries.size())}), "") << t.Dump();
}

const MenuCase kMenuCases[] = {
    {"LocalConsole", "linux", {}, FullMenu()},
    {"SerialLine", "xterm-256color", {}, Without(FullMenu(), "Configure Keyboard")},
    {"LockdownNotPossible",
     "linux",
     {{"/hostAgent/lockdownPossible", false}},
     With(FullMenu(), "Configure Lockdown Mode", false)},
    {"DriverVmState1",
     "linux",
     {{"/driverVm/state", 1}},
     With(FullMenu(), "Configure DriverVM Devices", false)},
    {"DriverVmState2", "linux", {{"/driverVm/state", 2}}, Without(FullMenu(), "Configure DriverVM Devices")},
    {"NoManagementInterface",
     "linux",
     {{"/network/managementInterface", ""}},
     With(With(With(FullMenu(), "Configure Management Network", false), "Restart Management Network", false),
          "Test Management Network", false)},
    {"PxeBoot",
     "linux",
     {{"/userOptions/PXEBootEnabled", "1"}},
     With(FullMenu(), "Reset System Configuration", false)},
};

INSTANTIATE_TEST_SUITE_P(Hosts, MenuTest, ::testing::ValuesIn(kMenuCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(LoginTest, SuccessIsLoggedAtEmergencyThenInfo) {
    SimHost host;
    SetRootPassword(host);
    Terminal t(PamConsole(host));
    ASSERT_TRUE(WaitForWelcome(t));
    t.SendKey("F2");
    ASSERT_TRUE(t.WaitForText("Login Name:"));
    EXPECT_TRUE(t.Contains("Enter an authorized login name and password for host1")) << t.Dump();
    EXPECT_TRUE(t.Contains("Configured Keyboard (US Default)")) << t.Dump();
    t.SendKey("Enter");
    t.Send(kRootPassword);
    t.SendKey("Enter");
    ASSERT_TRUE(WaitForMenu(t)) << t.Dump();

    const auto ok = host.ConsoleLog("Authentication of user root succeeded", t.Pid());
    ASSERT_EQ(ok.size(), 1u) << Joined(host.SyslogLines());
    EXPECT_NE(ok[0].find("auth.emerg: Authentication of user root succeeded"), std::string::npos) << ok[0];
    const auto in = host.ConsoleLog("User root logged in", t.Pid());
    ASSERT_EQ(in.size(), 1u) << Joined(host.SyslogLines());
    EXPECT_NE(in[0].find("user.info: User root logged in"), std::string::npos) << in[0];
    EXPECT_TRUE(host.ConsoleLog(kRootPassword).empty()) << "the password reached the log";
}

// A refused login: the message, its log line, and the dialog afterwards.
struct RefusedCase {
    const char* name;
    std::string user;  // "" keeps the prefilled "root"
    std::string password;
    const char* message;
    const char* logLine;  // with facility and level
};
void PrintTo(const RefusedCase& c, std::ostream* os) { *os << c.name; }

class RefusedLoginTest : public ::testing::TestWithParam<RefusedCase> {};

TEST_P(RefusedLoginTest, MessageLogAndFieldsAfterwards) {
    const RefusedCase& c = GetParam();
    SimHost host;
    SetRootPassword(host);
    Terminal t(PamConsole(host));
    ASSERT_TRUE(WaitForWelcome(t));
    ASSERT_TRUE(SubmitLogin(t, c.password, c.user));
    ASSERT_TRUE(t.WaitForText(c.message)) << t.Dump();
    EXPECT_TRUE(t.Contains("Authentication failed")) << t.Dump();
    ASSERT_TRUE(WaitForLog(host, c.logLine));

    // Esc does not close the message; Enter does.
    t.SendKey("Esc");
    ASSERT_TRUE(t.WaitQuiet());
    EXPECT_TRUE(t.Contains(c.message)) << t.Dump();
    t.SendKey("Enter");
    ASSERT_TRUE(t.WaitForTextGone(c.message)) << t.Dump();
    ASSERT_TRUE(t.Contains("Login Name:")) << t.Dump();

    const std::string user = c.user.empty() ? "root" : c.user;
    const std::optional<Pos> name = t.Find("Login Name:");
    const std::optional<Pos> secret = t.Find("Password:");
    ASSERT_TRUE(name && secret) << t.Dump();
    EXPECT_EQ(t.RegionText(name->col + 11, name->row, 40, 1), user) << t.Dump();
    EXPECT_EQ(t.RegionText(secret->col + 9, secret->row, 40, 1), "") << "password field not emptied\n"
                                                                     << t.Dump();
    EXPECT_TRUE(host.ConsoleLog("logged in").empty()) << Joined(host.SyslogLines());
    EXPECT_TRUE(host.ConsoleLog(c.password).empty()) << "the password reached the log";

    // The next attempt keeps the name: root's own password now gets in.
    if (user == "root") {
        t.Send(kRootPassword);
        t.SendKey("Enter");
        EXPECT_TRUE(WaitForMenu(t)) << t.Dump();
    }
}

const RefusedCase kRefusedCases[] = {
    {"WrongPassword", "", "not-the-password", "Invalid login or password.",
     "auth.err: Authentication of user root failed with authentication failure."},
    {"UnknownUser", "nobody", kRootPassword, "Invalid login or password.",
     "auth.err: Authentication of user nobody failed with authentication failure."},
    {"PermissionDenied", kGuest, kGuestPassword, "User does not have permission to login to VELK.",
     "auth.err: Authorization of user guest failed with permission denied error."},
};

INSTANTIATE_TEST_SUITE_P(Attempts, RefusedLoginTest, ::testing::ValuesIn(kRefusedCases),
                         [](const auto& info) { return std::string(info.param.name); });

class LoginDisabledTest : public ::testing::TestWithParam<const char*> {};

TEST_P(LoginDisabledTest, NoticeInsteadOfLogin) {
    SimHost host;
    SetRootPassword(host);
    host.RemoveFile("/var/run/zolva/show-velk-login");
    Terminal t(PamConsole(host));
    ASSERT_TRUE(WaitForWelcome(t));
    t.SendKey(GetParam());
    ASSERT_TRUE(t.WaitForText("Authentication Denied")) << t.Dump();
    const Pos title = *t.Find("Authentication Denied");
    EXPECT_EQ(t.RegionText(title.col, title.row + 1, 56, 4),
              "Direct console access has been disabled by the administrator for host1")
        << t.Dump();
    EXPECT_FALSE(t.Contains("Login Name:")) << t.Dump();
    t.SendKey("Enter");
    ASSERT_TRUE(t.WaitForTextGone("Authentication Denied")) << t.Dump();
    EXPECT_TRUE(t.Contains("Customize System/View Logs")) << t.Dump();
    EXPECT_TRUE(host.ConsoleLog("Authentication of user").empty()) << Joined(host.SyslogLines());
}

INSTANTIATE_TEST_SUITE_P(Keys, LoginDisabledTest, ::testing::Values("F2", "F12"));

TEST(LoginTest, EscCancelsTheLogin) {
    SimHost host;
    SetRootPassword(host);
    Terminal t(PamConsole(host));
    ASSERT_TRUE(WaitForWelcome(t));
    t.SendKey("F2");
    ASSERT_TRUE(t.WaitForText("Login Name:"));
    t.SendKey("Esc");
    ASSERT_TRUE(t.WaitForTextGone("Login Name:")) << t.Dump();
    EXPECT_TRUE(t.Contains("Customize System/View Logs")) << t.Dump();
    EXPECT_TRUE(host.ConsoleLog("User root").empty()) << Joined(host.SyslogLines());
}

TEST(LogoutTest, EscInTheMenuLogsOut) {
    SimHost host;
    SetRootPassword(host);
    Terminal t(PamConsole(host));
    ASSERT_TRUE(WaitForWelcome(t));
    ASSERT_TRUE(LogInToMenu(t)) << t.Dump();
    t.SendKey("Esc");
    ASSERT_TRUE(WaitForWelcome(t)) << t.Dump();
    EXPECT_FALSE(t.Contains("System Customization")) << t.Dump();
    const auto out = host.ConsoleLog("User root logged out.", t.Pid());
    ASSERT_EQ(out.size(), 1u) << Joined(host.SyslogLines());
    EXPECT_NE(out[0].find("user.info: "), std::string::npos) << out[0];
    // Logged out: F2 asks for the password again.
    t.SendKey("F2");
    EXPECT_TRUE(t.WaitForText("Login Name:")) << t.Dump();
}

}  // namespace
}  // namespace E2e
