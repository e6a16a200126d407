// The welcome screen on malformed and extreme host states, each met at the
// start and swapped in while the console runs (followed by the refresh
// signal): the console keeps running, or, where it cannot start, ends with one
// line saying why; the screen stays inside its frame; and the good state,
// back again, brings back the normal welcome screen.
#include <signal.h>
#include <sys/wait.h>

#include "HostStates.hpp"

namespace E2e {
namespace {

const char kFooter[] = "Customize System/View Logs";

const char kHeading[] = "Tarni 8.0.2 (QELKernel 8.0.2 Build releasebuild-22380479)";

// The normal welcome screen of the default host, drawn inside its frame. The
// product heading is read once, at its first use: a console that started on
// a broken state shows none (`heading` false).
::testing::AssertionResult NormalWelcome(Terminal& t, bool heading = true) {
    for (const char* text : {"Acme Server 9", "2 x Acme Processor A9-2400 @ 2.40GHz", "16 GiB Memory",
                             "http://host1/", "http://192.0.2.100/ (DHCP)", kFooter}) {
        if (auto shown = t.WaitForText(text); !shown) return shown;
    }
    if (heading) {
        if (auto shown = t.Shows(kHeading); !shown) return shown;
    }
    return FrameIntact(t);
}

// The rows of the screen that hold anything.
std::vector<std::string> Lines(const Terminal& t) {
    std::vector<std::string> lines;
    for (int row = 0; row < t.Rows(); ++row)
        if (std::string line = t.RowTextTrimmed(row); !line.empty()) lines.push_back(line);
    return lines;
}

class HostStateTest : public ::testing::TestWithParam<HostStateCase> {
protected:
    SimHost host;
    HostFiles good{host};
};

TEST_P(HostStateTest, AtStartUp) {
    GetParam().apply(host);
    std::optional<Terminal> t(std::in_place, host.Console());
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
        EXPECT_TRUE(NormalWelcome(*t));
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
    EXPECT_TRUE(NormalWelcome(*t, false));
    EXPECT_FALSE(t->HasExited());
}

TEST_P(HostStateTest, SwappedIn) {
    Terminal t(host.Console());
    ASSERT_TRUE(NormalWelcome(t));
    GetParam().apply(host);
    t.Signal(SIGUSR1);
    ASSERT_TRUE(t.WaitQuiet(Duration(300)));
    ASSERT_FALSE(t.HasExited()) << Terminal::DescribeStatus(t.WaitForExit()) << "\n" << t.Dump();
    EXPECT_TRUE(FrameIntact(t));

    good.Restore();
    t.Signal(SIGUSR1);
    EXPECT_TRUE(NormalWelcome(t));
    EXPECT_FALSE(t.HasExited());
}

INSTANTIATE_TEST_SUITE_P(States, HostStateTest, ::testing::ValuesIn(HostStates::Cases()),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace E2e
