// Smart cards: a card in a reader offers its user id for a PIN login, and
// pulling the card of a card session ends the console (the host starts it
// again, logged out).
#include <csignal>

#include "LoggedIn.hpp"

namespace E2e {
namespace {

constexpr char kCardUser[] = "alice";
constexpr char kPin[] = "2468";

using SmartCardTest = ConsoleTest;

TEST_F(SmartCardTest, PinLoginThenPulledCardEndsTheConsole) {
    ASSERT_TRUE(Start());

    host.InsertCard(kCardUser, kPin);
    t->Signal(SIGUSR1);
    ASSERT_TRUE(WaitForLog(host, "user.info: Found smart card with user id 'alice'"));

    t->SendKey("F2");
    ASSERT_TRUE(t->WaitForText("Enter the smart card login PIN for host1"));
    const auto id = t->Find("Login Id:");
    ASSERT_TRUE(id) << t->Dump();
    EXPECT_NE(t->RowText(id->row).find(kCardUser), std::string::npos) << t->Dump();
    EXPECT_TRUE(t->Shows("PIN:"));
    EXPECT_TRUE(t->Shows("<F3> Switch PIN/Password Login"));

    // A wrong PIN is refused like a wrong password; the dialog stays in PIN mode.
    t->SendKey("Enter");
    t->Send("1111");
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Invalid login or password."));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("Invalid login or password."));
    EXPECT_TRUE(t->Shows("Login Id:"));

    t->Send(kPin);
    t->SendKey("Enter");
    ASSERT_TRUE(WaitForMenu(*t)) << t->Dump();
    EXPECT_TRUE(LoggedOnce(host, "User alice logged in", t->Pid()));
    EXPECT_TRUE(NotLogged(host, kPin));

    // While the card stays in, a refresh changes nothing.
    t->Signal(SIGUSR1);
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    EXPECT_FALSE(t->HasExited());
    EXPECT_TRUE(NotLogged(host, "Logging out user id"));

    host.PullCard();
    t->Signal(SIGUSR1);
    EXPECT_TRUE(t->ExitsWith(0)) << t->Dump();
    EXPECT_TRUE(LoggedOnce(host, "user.info: Logging out user id 'alice'", t->Pid()));
}

// A password session is not ended by a card leaving its reader, even when
// that card was offered at the login.
TEST_F(SmartCardTest, PasswordSessionOutlivesThePulledCard) {
    host.InsertCard(kCardUser, kPin);
    ASSERT_TRUE(Start());

    // No refresh signal: the login dialog looks for the card itself.
    t->SendKey("F2");
    ASSERT_TRUE(t->WaitForText("Enter the smart card login PIN for host1"));
    t->SendKey("F3");
    ASSERT_TRUE(t->WaitForText("Enter an authorized login name and password for host1"));
    const auto name = t->Find("Login Name:");
    ASSERT_TRUE(name) << t->Dump();
    EXPECT_NE(t->RowText(name->row).find("root"), std::string::npos) << t->Dump();
    EXPECT_TRUE(t->Shows("Password:"));
    EXPECT_TRUE(t->Lacks("Switch PIN/Password Login"));

    t->SendKey("Enter");
    t->Send(kRootPassword);
    t->SendKey("Enter");
    ASSERT_TRUE(WaitForMenu(*t)) << t->Dump();

    host.PullCard();
    t->Signal(SIGUSR1);
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    EXPECT_FALSE(t->HasExited()) << t->Dump();
    EXPECT_TRUE(t->Shows("System Customization"));
    EXPECT_TRUE(NotLogged(host, "Logging out user id"));
}

}  // namespace
}  // namespace E2e
