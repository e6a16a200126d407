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

struct ChoiceCase {
    const char* name;
    Available available;
    int digit;
    int row;  // -1: the key does nothing
};

class LogChoiceTest : public ::testing::TestWithParam<ChoiceCase> {};

TEST_P(LogChoiceTest, DigitOpensRow) {
    const ChoiceCase& c = GetParam();
    EXPECT_EQ(LogViewer::ChooseLog(c.available, c.digit), c.row);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, LogChoiceTest,
    ::testing::Values(
        ChoiceCase{"TwoLogs_1_Syslog", kSyslogCorad, 1, 0}, ChoiceCase{"TwoLogs_2_Corad", kSyslogCorad, 2, 3},
        // Past the list: the row at index "number listed", here
        // the missing boot log.
        ChoiceCase{"TwoLogs_5_Sysboot", kSyslogCorad, 5, 2},
        ChoiceCase{"TwoLogs_9_Sysboot", kSyslogCorad, 9, 2},
        ChoiceCase{"TwoLogs_0_Sysboot", kSyslogCorad, 0, 2}, ChoiceCase{"All_1_Syslog", kAll, 1, 0},
        ChoiceCase{"All_7_Obzd", kAll, 7, 6}, ChoiceCase{"All_8_Nothing", kAll, 8, -1},
        ChoiceCase{"All_9_Nothing", kAll, 9, -1}, ChoiceCase{"All_0_Nothing", kAll, 0, -1},
        // Row 0 missing: count is still 0 at row 0, so 0 opens it.
        ChoiceCase{"NoSyslog_0_Syslog", kNoSyslog, 0, 0}, ChoiceCase{"NoSyslog_1_Qelkernel", kNoSyslog, 1, 1},
        ChoiceCase{"NoSyslog_6_Obzd", kNoSyslog, 6, 6}, ChoiceCase{"NoSyslog_7_Obzd", kNoSyslog, 7, 6},
        ChoiceCase{"NoSyslog_9_Obzd", kNoSyslog, 9, 6}, ChoiceCase{"None_0_Syslog", kNone, 0, 0},
        ChoiceCase{"None_3_Syslog", kNone, 3, 0}),
    [](const ::testing::TestParamInfo<ChoiceCase>& info) { return std::string(info.param.name); });

class LogListingTest : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/velk-logs-XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        _root = tmpl;
        std::filesystem::create_directories(_root + "/var/log");
        HostCtl::Lib::UseSimulatedHost(_root);
    }
    void TearDown() override { std::filesystem::remove_all(_root); }
    void Touch(const std::string& path) { std::ofstream(_root + path) << "line\n"; }

    std::string _root;
};

TEST_F(LogListingTest, NumbersOnlyTheLogsThatExistAndKeysFollowThem) {
    Touch("/var/log/syslog.log");
    Touch("/var/log/corad.log");
    LogViewer viewer;
    EXPECT_EQ(viewer.Listing(),
              "{color:white}<1> {color:light-grey}Syslog{/color}\n"
              "{color:white}<2> {color:light-grey}Management Agent (corad){/color}\n"
              "Press the corresponding key to view a log.\nPress <Q> to return to this screen.");
    EXPECT_EQ(viewer.ChooseLog(2), 3);
    EXPECT_EQ(viewer.ChooseLog(5), 2);

    // A log that appears later is found at the next listing.
    Touch("/var/log/halvo.log");
    EXPECT_NE(viewer.Listing().find("<3> {color:light-grey}High Availibility Agent (halvo)"),
              std::string::npos);
    EXPECT_EQ(viewer.ChooseLog(3), 5);
}

TEST_F(LogListingTest, NoLogsListsOnlyTheHelp) {
    LogViewer viewer;
    EXPECT_EQ(viewer.Listing(),
              "Press the corresponding key to view a log.\nPress <Q> to return to this screen.");
}

struct PagesCase {
    const char* name;
    const char* text;
    std::vector<std::string> pages;
};

class SupportPagesTest : public ::testing::TestWithParam<PagesCase> {};

TEST_P(SupportPagesTest, SplitsAtSeparatorLines) {
    EXPECT_EQ(Velk::GeneralWindow::SplitPages(GetParam().text), GetParam().pages);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, SupportPagesTest,
    ::testing::Values(PagesCase{"OnePage", "a\nb\n", {"a\nb"}},
                      PagesCase{"ThreePages", "a\n%%\nb\nc\n%%\nd", {"a", "b\nc", "d"}},
                      // Only a line of "%%" alone separates pages.
                      PagesCase{"PercentInsideLine", "50%% done\n %%\n%%x\n", {"50%% done\n %%\n%%x"}},
                      PagesCase{"BlankLinesKeptInside", "a\n\nb\n\n\n%%\nc\n", {"a\n\nb", "c"}},
                      PagesCase{"Empty", "", {""}}),
    [](const ::testing::TestParamInfo<PagesCase>& info) { return std::string(info.param.name); });

}  // namespace
