// The log list of the system menu: which digit opens which log, the numbered
// listing of the logs that exist, and the paging of the support information.
#include <gtest/gtest.h>
#include <stdlib.h>

#include <array>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "GeneralWindow.hpp"
#include "LogViewer.hpp"
#include "hostctl/Host.hpp"

namespace {

using Velk::LogViewer;
using Available = std::array<bool, LogViewer::LOG_COUNT>;

constexpr Available kAll = {true, true, true, true, true, true, true};
constexpr Available kNone = {false, false, false, false, false, false, false};
// Only syslog (row 0) and the management agent log (row 3).
constexpr Available kSyslogCorad = {true, false, false, true, false, false, false};
constexpr Available kNoSyslog = {false, true, true, true, true, true, true};

TEST(LogChoice, DigitOpensRow) {
    // For each set of logs present: digit and the row it opens (-1: the key does nothing).
    const std::pair<Available, std::vector<std::pair<int, int>>> cases[] = {
        // Past the list: the row at index "number listed", here the missing boot log.
        {kSyslogCorad, {{1, 0}, {2, 3}, {5, 2}, {9, 2}, {0, 2}}},
        {kAll, {{1, 0}, {7, 6}, {8, -1}, {9, -1}, {0, -1}}},
        // Row 0 missing: count is still 0 at row 0, so 0 opens it.
        {kNoSyslog, {{0, 0}, {1, 1}, {6, 6}, {7, 6}, {9, 6}}},
        {kNone, {{0, 0}, {3, 0}}}};
    for (const auto& [available, choices] : cases) {
        std::string shown;
        for (bool a : available) shown += a ? '1' : '0';
        for (const auto& [digit, row] : choices)
            EXPECT_EQ(LogViewer::ChooseLog(available, digit), row) << shown << " digit " << digit;
    }
}

TEST(LogListing, NumbersOnlyTheLogsThatExistAndKeysFollowThem) {
    char tmpl[] = "/tmp/velk-logs-XXXXXX";
    ASSERT_NE(mkdtemp(tmpl), nullptr);
    const std::string root = tmpl;
    std::filesystem::create_directories(root + "/var/log");
    HostCtl::Lib::UseSimulatedHost(root);
    auto touch = [&](const char* log) { std::ofstream(root + "/var/log/" + log) << "line\n"; };
    const std::string help =
        "Press the corresponding key to view a log.\nPress <Q> to return to this screen.";

    LogViewer viewer;
    EXPECT_EQ(viewer.Listing(), help);  // no logs: only the help
    touch("syslog.log");
    touch("corad.log");
    EXPECT_EQ(viewer.Listing(),
              "{color:white}<1> {color:light-grey}Syslog{/color}\n"
              "{color:white}<2> {color:light-grey}Management Agent (corad){/color}\n" +
                  help);
    EXPECT_EQ(viewer.ChooseLog(2), 3);
    EXPECT_EQ(viewer.ChooseLog(5), 2);
    // A log that appears later is found at the next listing.
    touch("halvo.log");
    EXPECT_NE(viewer.Listing().find("<3> {color:light-grey}High Availibility Agent (halvo)"),
              std::string::npos);
    EXPECT_EQ(viewer.ChooseLog(3), 5);
    std::filesystem::remove_all(root);
}

TEST(SupportPages, SplitAtSeparatorLines) {
    const std::pair<const char*, std::vector<std::string>> cases[] = {
        {"a\nb\n", {"a\nb"}},
        {"a\n%%\nb\nc\n%%\nd", {"a", "b\nc", "d"}},
        // Only a line of "%%" alone separates pages.
        {"50%% done\n %%\n%%x\n", {"50%% done\n %%\n%%x"}},
        {"a\n\nb\n\n\n%%\nc\n", {"a\n\nb", "c"}},  // blank lines inside a page are kept
        {"", {""}},
    };
    for (const auto& [text, pages] : cases) EXPECT_EQ(Velk::GeneralWindow::SplitPages(text), pages) << text;
}

}  // namespace
