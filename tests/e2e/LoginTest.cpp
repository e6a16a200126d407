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
    std::vector<Entry> entries;
    for (const char* text :
         {"Configure Password", "Configure Lockdown Mode", "", "Configure DriverVM Devices",
          "Configure Management Network", "Restart Management Network", "Test Management Network",
          "Network Restore Options", "", "Configure Keyboard", "Troubleshooting Options", "",
          "View System Logs", "", "View Support Information", "", "Reset System Configuration"})
        entries.push_back({text});
    return entries;
}

// `entries` with those named in `texts` greyed out.
std::vector<Entry> Disabled(std::vector<Entry> entries, const std::vector<std::string>& texts) {
    for (auto& e : entries) e.enabled = e.enabled && std::ranges::find(texts, e.text) == texts.end();
    return entries;
}

std::vector<Entry> Without(std::vector<Entry> entries, const std::string& text) {
    std::erase_if(entries, [&](const Entry& e) { return text == e.text; });
    return entries;
}

struct MenuCase {
    const char* name;
    std::vector<std::pair<std::string, json>> changes;  // JSON pointer, value, set before the start
    std::vector<Entry> entries;
    const char* term = "linux";
};
void PrintTo(const MenuCase& c, std::ostream* os) { *os << c.name; }

using MenuTest = ConsoleTestWithParam<MenuCase>;

TEST_P(MenuTest, EntriesInOrderDisabledOnesGrey) {
    const MenuCase& c = GetParam();
    for (const auto& [pointer, value] : c.changes) host.Set(pointer, value);
    ASSERT_TRUE(StartInMenu(c.term));

    // The selected entry's name also heads the right pane, above the menu.
    const std::vector<Pos> found = t->FindAll("Configure Password");
    ASSERT_EQ(found.size(), 2u) << t->Dump();
    const Pos first = found[0].row > found[1].row ? found[0] : found[1];
    for (size_t i = 0; i < c.entries.size(); ++i) {
        const Entry& e = c.entries[i];
        const Pos pos{first.col, first.row + int(i)};
        EXPECT_EQ(EntryAt(*t, pos), e.text) << "menu row " << i << "\n" << t->Dump();
        if (*e.text && i > 0) {  // the first entry is the selected one
            const Cell cell = t->CellAt(pos.col, pos.row);
            EXPECT_EQ(cell.fg.IsIndex(6), !e.enabled)
                << "\"" << e.text << "\" fg " << ToString(cell.fg) << "\n"
                << t->Dump(true);
        }
    }
    EXPECT_EQ(EntryAt(*t, {first.col, first.row + int(c.entries.size())}), "") << t->Dump();
}

const MenuCase kMenuCases[] = {
    {"LocalConsole", {}, FullMenu()},
    {"SerialLine", {}, Without(FullMenu(), "Configure Keyboard"), "xterm-256color"},
    {"LockdownNotPossible",
     {{"/hostAgent/lockdownPossible", false}},
     Disabled(FullMenu(), {"Configure Lockdown Mode"})},
    {"DriverVmState1", {{"/driverVm/state", 1}}, Disabled(FullMenu(), {"Configure DriverVM Devices"})},
    {"DriverVmState2", {{"/driverVm/state", 2}}, Without(FullMenu(), "Configure DriverVM Devices")},
    {"NoManagementInterface",
     {{"/network/managementInterface", ""}},
     Disabled(FullMenu(),
              {"Configure Management Network", "Restart Management Network", "Test Management Network"})},
    {"PxeBoot", {{"/userOptions/PXEBootEnabled", "1"}}, Disabled(FullMenu(), {"Reset System Configuration"})},
};

INSTANTIATE_TEST_SUITE_P(Hosts, MenuTest, ::testing::ValuesIn(kMenuCases),
                         [](const auto& info) { return std::string(info.param.name); });

using LoginTest = ConsoleTest;

TEST_F(LoginTest, LogInCancelAndLogOutAreLogged) {
    ASSERT_TRUE(StartInMenu());
    // Esc in the menu logs out; F2 then asks for the password again, and Esc
    // there cancels without logging anything.
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForWelcome(*t));
    EXPECT_TRUE(t->Lacks("System Customization"));
    t->SendKey("F2");
    ASSERT_TRUE(t->WaitForText("Login Name:"));
    EXPECT_TRUE(t->Shows("Enter an authorized login name and password for host1"));
    EXPECT_TRUE(t->Shows("Configured Keyboard (US Default)"));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone("Login Name:"));
    EXPECT_TRUE(t->Shows("Customize System/View Logs"));

    // The login at emergency level, then at informational level; one log-out.
    EXPECT_TRUE(LoggedOnce(host, "Authentication of user root", t->Pid()));
    EXPECT_TRUE(LoggedOnce(host, "auth.emerg: Authentication of user root succeeded", t->Pid()));
    EXPECT_TRUE(LoggedOnce(host, "User root logged in", t->Pid()));
    EXPECT_TRUE(LoggedOnce(host, "user.info: User root logged in", t->Pid()));
    EXPECT_TRUE(LoggedOnce(host, "User root logged out.", t->Pid()));
    EXPECT_TRUE(LoggedOnce(host, "user.info: User root logged out.", t->Pid()));
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

using RefusedLoginTest = ConsoleTestWithParam<RefusedCase>;

TEST_P(RefusedLoginTest, MessageLogAndFieldsAfterwards) {
    const RefusedCase& c = GetParam();
    ASSERT_TRUE(Start());
    ASSERT_TRUE(SubmitLogin(*t, c.password, c.user));
    ASSERT_TRUE(t->WaitForText(c.message));
    EXPECT_TRUE(t->Shows("Authentication failed"));
    ASSERT_TRUE(WaitForLog(host, c.logLine));

    // Esc does not close the message; Enter does.
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitQuiet());
    EXPECT_TRUE(t->Shows(c.message));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone(c.message));

    const std::string user = c.user.empty() ? "root" : c.user;
    const std::optional<Pos> name = t->Find("Login Name:");
    const std::optional<Pos> secret = t->Find("Password:");
    ASSERT_TRUE(name && secret) << t->Dump();
    EXPECT_EQ(t->RegionText(name->col + 11, name->row, 40, 1), user) << t->Dump();
    EXPECT_EQ(t->RegionText(secret->col + 9, secret->row, 40, 1), "") << "password field not emptied\n"
                                                                      << t->Dump();
    EXPECT_TRUE(NotLogged(host, "logged in"));
    EXPECT_TRUE(NotLogged(host, c.password));

    // The next attempt keeps the name: root's own password now gets in.
    if (user == "root") {
        t->Send(kRootPassword);
        t->SendKey("Enter");
        EXPECT_TRUE(WaitForMenu(*t));
    }
}

const RefusedCase kRefusedCases[] = {
    {"WrongPassword", "", "not-the-password", "Invalid login or password.",
     "auth.err: Authentication of user root failed with authentication failure."},
    {"PermissionDenied", kGuest, kGuestPassword, "User does not have permission to login to VELK.",
     "auth.err: Authorization of user guest failed with permission denied error."},
};

INSTANTIATE_TEST_SUITE_P(Attempts, RefusedLoginTest, ::testing::ValuesIn(kRefusedCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(LoginTest, DisabledLoginShowsANoticeInstead) {
    host.RemoveFile("/var/run/zolva/show-velk-login");
    ASSERT_TRUE(Start());
    t->SendKey("F2");
    ASSERT_TRUE(t->WaitForText("Authentication Denied"));
    const Pos title = *t->Find("Authentication Denied");
    EXPECT_EQ(t->RegionText(title.col, title.row + 1, 56, 4),
              "Direct console access has been disabled by the administrator for host1")
        << t->Dump();
    EXPECT_TRUE(t->Lacks("Login Name:"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("Authentication Denied"));
    EXPECT_TRUE(t->Shows("Customize System/View Logs"));
    EXPECT_TRUE(NotLogged(host, "Authentication of user"));
}

}  // namespace
}  // namespace E2e
