// Malformed and extreme host states, met at the start and swapped in (with
// the refresh signal), on the welcome screen and on every page of the menu:
// the console keeps running inside its frame, or, where it cannot start, ends
// with one line saying why; the good state brings the normal screen back.
#include <signal.h>
#include <sys/wait.h>

#include "HostStates.hpp"
#include "LoggedIn.hpp"

namespace E2e {
namespace {

const char kHeading[] = "Tarni 8.0.2 (QELKernel 8.0.2 Build releasebuild-22380479)";

// The rows of the screen that hold anything.
std::vector<std::string> Lines(const Terminal& t) {
    std::vector<std::string> lines;
    for (int row = 0; row < t.Rows(); ++row)
        if (std::string line = t.RowTextTrimmed(row); !line.empty()) lines.push_back(line);
    return lines;
}

class HostStateTest : public ConsoleTestWithParam<HostStateCase> {
protected:
    // The normal welcome screen, inside its frame. The heading is read once:
    // a console that started on a broken state shows none (`heading` false).
    ::testing::AssertionResult NormalWelcome(bool heading = true) {
        for (const char* text :
             {"Acme Server 9", "2 x Acme Processor A9-2400 @ 2.40GHz", "16 GiB Memory", "http://host1/",
              "http://192.0.2.100/ (DHCP)", "Customize System/View Logs"}) {
            if (auto shown = t->WaitForText(text); !shown) return shown;
        }
        if (heading) {
            if (auto shown = t->Shows(kHeading); !shown) return shown;
        }
        return FrameIntact(*t);
    }

    HostFiles good{host};
};

TEST_P(HostStateTest, AtStartUp) {
    GetParam().apply(host);
    t.emplace(host.Console());
    // The welcome screen (or the welcome message) starts with its frame.
    WaitForFrame(*t);
    if (t->HasExited()) {
        // It could not start: one line says why, and the exit is an orderly one.
        const std::optional<int> status = t->WaitForExit();
        ASSERT_TRUE(status && WIFEXITED(*status)) << Terminal::DescribeStatus(status) << "\n" << t->Dump();
        const std::vector<std::string> lines = Lines(*t);
        EXPECT_EQ(lines.size(), 1u) << t->Dump();
        std::cout << GetParam().name << ": the console ended with " << Terminal::DescribeStatus(status)
                  << ": " << (lines.empty() ? "" : lines[0]) << "\n";
        // The good state starts it again.
        good.Restore();
        t.emplace(host.Console());
        EXPECT_TRUE(NormalWelcome());
        return;
    }
    EXPECT_TRUE(FrameIntact(*t));
    // A refresh on the same broken state draws the same way.
    t->Signal(SIGUSR1);
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    EXPECT_FALSE(t->HasExited()) << t->Dump();
    EXPECT_TRUE(FrameIntact(*t));

    good.Restore();
    t->Signal(SIGUSR1);
    EXPECT_TRUE(NormalWelcome(false));
    EXPECT_FALSE(t->HasExited());
}

TEST_P(HostStateTest, SwappedIn) {
    t.emplace(host.Console());
    ASSERT_TRUE(NormalWelcome());
    GetParam().apply(host);
    t->Signal(SIGUSR1);
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    ASSERT_FALSE(t->HasExited()) << Terminal::DescribeStatus(t->WaitForExit()) << "\n" << t->Dump();
    EXPECT_TRUE(FrameIntact(*t));

    good.Restore();
    t->Signal(SIGUSR1);
    EXPECT_TRUE(NormalWelcome());
    EXPECT_FALSE(t->HasExited());
}

// The menu logs in twice per state: a case of its own, run apart from the
// quick welcome-screen ones.
class HostStateMenuTest : public HostStateTest {
protected:
    // Walks the menu's 14 entries checking the frame at each, then logs out.
    void WalkMenu(const char* when) {
        SCOPED_TRACE(when);
        for (int i = 0; i < 14; ++i) {
            ASSERT_FALSE(t->HasExited()) << Terminal::DescribeStatus(t->WaitForExit()) << "\n" << t->Dump();
            EXPECT_TRUE(FrameIntact(*t)) << "entry " << i;
            t->SendKey("Down");
            ASSERT_TRUE(t->WaitQuiet());
        }
        t->SendKey("Esc");
        ASSERT_TRUE(t->WaitQuiet(Duration(300)));
        ASSERT_FALSE(t->HasExited()) << t->Dump();
    }
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
    ASSERT_TRUE(NormalWelcome(false));

    // The broken state swapped in under the menu.
    ASSERT_TRUE(LogInToMenu(*t));
    GetParam().apply(host);
    t->Signal(SIGUSR1);
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    WalkMenu("state swapped in under the menu");
    if (HasFatalFailure()) return;

    good.Restore();
    t->Signal(SIGUSR1);
    EXPECT_TRUE(NormalWelcome(false));
    EXPECT_FALSE(t->HasExited());
}

const auto kName = [](const auto& info) { return std::string(info.param.name); };
INSTANTIATE_TEST_SUITE_P(States, HostStateTest, ::testing::ValuesIn(HostStates::Cases()), kName);
INSTANTIATE_TEST_SUITE_P(States, HostStateMenuTest, ::testing::ValuesIn(HostStates::Cases()), kName);

}  // namespace
}  // namespace E2e
