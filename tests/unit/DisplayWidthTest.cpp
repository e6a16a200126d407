// Screen columns of UTF-8 text: wide characters, combining characters and
// bytes that are not UTF-8, measured and cut as the terminal shows them.
#include <gtest/gtest.h>

#include <string>

#include "AdaptersDialog.hpp"
#include "DisplayWidth.hpp"
#include "FakeTerminal.hpp"
#include "TextArea.hpp"
#include "Window.hpp"

namespace {

TEST(DisplayWidth, MeasuresShowsAndCuts) {
    const std::string kReplacement = "\uFFFD";
    struct Case {
        const char* name;
        std::string text;
        int columns;
        std::string shown;  // the text as written to the terminal
        int cutAt;          // a width to cut to
        std::string cut;    // what fits in it
    };
    const Case cases[] = {
        {"Ascii", "host1", 5, "host1", 3, "hos"},
        {"CjkTakesTwoColumns", "\u4e2d\u6587", 4, "\u4e2d\u6587", 3, "\u4e2d"},
        {"CjkNeverCutInHalf", "a\u4e2d", 3, "a\u4e2d", 2, "a"},
        {"KanaAndHangul", "\u30db\uac00", 4, "\u30db\uac00", 4, "\u30db\uac00"},
        {"CombiningTakesNone", "e\u0301", 1, "e\u0301", 1, "e\u0301"},
        {"CombiningStaysWithItsBase", "ae\u0301b", 3, "ae\u0301b", 2, "ae\u0301"},
        {"BlockCharacters", "\u2593\u2588", 2, "\u2593\u2588", 1, "\u2593"},
        {"InvalidByteIsOneReplacement", "a\xffZ", 3, "a" + kReplacement + "Z", 2, "a" + kReplacement},
        {"CutSequenceIsReplaced", "a\xe4\xb8", 3, "a" + kReplacement + kReplacement, 10,
         "a" + kReplacement + kReplacement},
        {"OverlongFormIsReplaced", "\xc0\xaf", 2, kReplacement + kReplacement, 10,
         kReplacement + kReplacement},
        {"SurrogateIsReplaced", "\xed\xa0\x80", 3, kReplacement + kReplacement + kReplacement, 1,
         kReplacement},
        {"C1ControlIsReplaced", "\xc2\x9b", 1, kReplacement, 1, kReplacement},
        {"Empty", "", 0, "", 0, ""},
        {"NothingFitsInZero", "\u4e2d", 2, "\u4e2d", 0, ""},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        EXPECT_EQ(Velk::DisplayColumns(c.text), c.columns);
        EXPECT_EQ(Velk::ShowableText(c.text), c.shown);
        EXPECT_EQ(Velk::CutToColumns(c.text, c.cutAt), c.cut);
    }
}

// Printing into a window stops at its right edge instead of wrapping onto
// the next row.
TEST(WindowPrint, CutsAtTheWindowsEdge) {
    testing_support::EnsureFakeTerminal();
    Velk::Window parent(0, 0, 12, 3, 0, 7);
    auto* row = new Velk::Window(&parent, 1, 1, 5, 1, 0, 7);
    row->Print(0, 0, "\u4e2d\u6587\u4e2d\u6587");
    EXPECT_EQ(testing_support::CellText(row->GetWindow(), 0, 0), "\u4e2d");
    EXPECT_EQ(testing_support::CellText(row->GetWindow(), 0, 2), "\u6587");
    EXPECT_EQ(testing_support::CellText(row->GetWindow(), 0, 4), " ");
    EXPECT_EQ(testing_support::RowText(parent.GetWindow(), 2), std::string(12, ' '));
    row->Print(2, 0, "abcdef");
    EXPECT_EQ(testing_support::CellText(row->GetWindow(), 0, 4), "c");
    EXPECT_EQ(testing_support::RowText(parent.GetWindow(), 2), std::string(12, ' '));
}

// The adapter list's columns stay in place when a hardware label is cut.
TEST(AdapterRow, WideLabelIsCutByColumns) {
    Velk::Adapter adapter;
    adapter.name = "zonic0";
    adapter.label = "\u7f51\u5361\u4e00\u53f7\u7f51\u5361\u4e8c\u53f7";  // 16 columns
    adapter.mac = "00:50:56:01:00:02";
    adapter.connected = true;
    const std::string row =
        Velk::TextArea::Layout(Velk::AdaptersDialog::RowText(adapter, "kSwitch0"), 80, nullptr);
    const size_t status = row.find("Connected");
    ASSERT_NE(status, std::string::npos) << row;
    EXPECT_EQ(Velk::DisplayColumns(row.substr(0, status)), 13 + 30) << row;
    EXPECT_NE(row.find("\u7f51\u5361\u4e00\u53f7\u7f51... (...:01:00:02)"), std::string::npos) << row;
}

}  // namespace
