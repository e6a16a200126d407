// The system customization menu on malformed and extreme host states: logged
// in on a broken host, and with the broken state swapped in while the menu
// shows (followed by the refresh signal), every entry's page draws inside the
// frame and the console keeps running; the good state back, the welcome
// screen is the normal one again.
#include <signal.h>

#include "HostStates.hpp"
#include "LoggedIn.hpp"

namespace E2e {
namespace {

// Entries of the menu walked by Down from the first one.
constexpr int kMenuEntries = 14;

class HostStateMenuTest : public ConsoleTestWithParam<HostStateCase> {
protected:
    // Walks every entry of the menu, checking the frame at each; then logs
    // out. Fails when the console ends on the way.
    void WalkMenu(const char* when) {
        SCOPED_TRACE(when);
        for (int i = 0; i < kMenuEntries; ++i) {
            ASSERT_FALSE(t->HasExited()) << Terminal::DescribeStatus(t->WaitForExit()) << "\n" << t->Dump();
            EXPECT_TRUE(FrameIntact(*t)) << "entry " << i;
            t->SendKey("Down");
            ASSERT_TRUE(t->WaitQuiet());
        }
        t->SendKey("Esc");
        ASSERT_TRUE(t->WaitQuiet(Duration(300)));
        ASSERT_FALSE(t->HasExited()) << t->Dump();
    }

    ::testing::AssertionResult NormalWelcome() {
        for (const char* text :
             {"Acme Server 9", "http://host1/", "http://192.0.2.100/ (DHCP)", "Customize System/View Logs"}) {
            if (auto shown = t->WaitForText(text); !shown) return shown;
        }
        return FrameIntact(*t);
    }

    HostFiles good{host};
};

TEST_P(HostStateMenuTest, EveryEntryDrawsInsideTheFrame) {
    // Logged in on the broken host, when the console starts on it at all.
    GetParam().apply(host);
    t.emplace(PamConsole(host));
    if (WaitForFrame(*t)) {
        ASSERT_TRUE(SubmitLogin(*t, kRootPassword));
        if (t->WaitForText("System Customization", Duration(3000))) {
            WalkMenu("logged in on the broken state");
        } else {
            std::cout << GetParam().name << ": no menu after the login on the broken state\n" << t->Dump();
            EXPECT_TRUE(FrameIntact(*t));
        }
        if (HasFatalFailure()) return;
    }
    good.Restore();
    if (t->HasExited()) {
        t.emplace(PamConsole(host));
    } else {
        t->Signal(SIGUSR1);
    }
    ASSERT_TRUE(NormalWelcome());

    // The broken state swapped in under the menu.
    ASSERT_TRUE(LogInToMenu(*t));
    GetParam().apply(host);
    t->Signal(SIGUSR1);
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    WalkMenu("state swapped in under the menu");
    if (HasFatalFailure()) return;

    good.Restore();
    t->Signal(SIGUSR1);
    EXPECT_TRUE(NormalWelcome());
    EXPECT_FALSE(t->HasExited());
}

INSTANTIATE_TEST_SUITE_P(States, HostStateMenuTest, ::testing::ValuesIn(HostStates::Cases()),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace E2e
