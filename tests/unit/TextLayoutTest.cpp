// The layout pass of the text mark-up, and the drawing of laid-out text into
// a text area on a fake terminal.
#include <gtest/gtest.h>

#include <map>
#include <string>

#include "Console.hpp"
#include "FakeTerminal.hpp"
#include "TextArea.hpp"
#include "Window.hpp"

namespace {

using testing_support::CellPair;
using testing_support::CellText;
using testing_support::RowText;
using Velk::TextArea;

bool FakeValues(const std::string& key, std::string& value) {
    static const std::map<std::string, std::string> values = {
        {"ip", "10.0.0.1"},       {"spaced", "aaa bbb"}, {"long", "abcdefghijkl"},
        {"brace", "{color:red}"}, {"eol", "N/A\n"},      {"empty", ""},
    };
    auto it = values.find(key);
    if (it == values.end()) return false;
    value = it->second;
    return true;
}

TEST(TextLayout, LaysOut) {
    struct Case {
        const char* name;
        std::string text;
        int width;
        std::string expected;
    };
    const Case cases[] = {
        // Word wrap.
        {"FitsOnOneLine", "hello world", 11, "hello world"},
        {"WrapsAtLastBlank", "one two three", 9, "one two\nthree"},
        {"BlankMeetingFullLineBecomesTheBreak", "hello world foo", 11, "hello world\nfoo"},
        {"WrappedWordKeepsItsColumns", "ab cdef gh", 6, "ab\ncdef\ngh"},
        {"LongWordBrokenHard", "abcdefghij", 4, "abcd\nefgh\nij"},
        {"LongWordAfterShortOne", "ab cdefghij", 4, "ab\ncdef\nghij"},
        {"NewlineRestartsTheCount", "abc\nabc def", 7, "abc\nabc def"},
        {"NewlineForgetsTheBlank", "a b\ncdefgh", 3, "a b\ncde\nfgh"},
        // Alignment.
        {"RightAlignOnEmptyLine", "{align:right}abcd{/align}", 20, std::string(16, ' ') + "abcd"},
        {"RightAlignedFooter", "<Enter> OK{align:right}<Esc> Exit{/align}", 24, "<Enter> OK    <Esc> Exit"},
        {"TextAfterRightAlignGoesToNextLine", "a b{align:right}cd{/align}e", 6, "a b cd\ne"},
        {"CenterRoundsDown", "{align:center}ab{/align}", 11, "    ab"},
        {"CenterInWhatIsLeft", "x{align:center}ab{/align}|", 11, "x    ab|"},
        {"PaddingTruncates", "{align:padding:5}abcdefgh{/align}X", 20, "abcdeX"},
        {"PaddingFillsShortText", "{align:padding:5}ab{/align}X", 20, "ab   X"},
        {"PaddingStopsAtLineEnd", "abc{align:padding:5}de{/align}", 6, "abcde "},
        {"PaddingTruncatesValue", "{align:padding:4}{long}{/align}|", 20, "abcd|"},
        {"AlignLeftIsNoAlignment", "{align:left}ab{/align}cd", 10, "abcd"},
        {"UnknownAlignIsNoAlignment", "{align:sideways}ab{/align}", 10, "ab"},
        {"BadPaddingCountIsNoAlignment", "{align:padding:x}abcdef{/align}", 10, "abcdef"},
        {"EndWithoutStartIgnored", "ab{/align}", 10, "ab"},
        // Values.
        {"ValueExpanded", "IP: {ip}", 20, "IP: 10.0.0.1"},
        {"ValueNotWrappedAtBlankBeforeIt", "IP: {ip}", 8, "IP: 10.0\n.0.1"},
        {"SameTextWithoutValueWraps", "IP: 10.0.0.1", 8, "IP:\n10.0.0.1"},
        {"BlankInValueIsNoBreakPoint", "{spaced}", 5, "aaa b\nbb"},
        {"FullLineInsideValueBreaksThere", "x {ip} yz", 9, "x 10.0.0.\n1 yz"},
        {"TextAfterValueWrapsBeforeIt", "x {ip}yz", 11, "x\n10.0.0.1yz"},
        {"ValueLineEndKept", "{eol}next", 10, "N/A\nnext"},
        {"EmptyValue", "a{empty}b", 10, "ab"},
        {"ValueBraceEscaped", "{brace}", 20, "{lbrace}color:red}"},
        // Tags.
        {"EmptyTagDropped", "a{}b", 10, "ab"},
        {"UnknownTagTakesNoColumns", "ab{nosuch}cd{x:y}", 4, "abcd"},
        {"UnterminatedTagDropped", "ab{color", 10, "ab"},
        {"ColourTagsTakeNoColumns", "{color:red}abcd{/color}ef", 4, "{color:red}abcd{/color}\nef"},
        {"WrapInsideColouredText", "{color:red}ab cd{/color}", 3, "{color:red}ab\ncd{/color}"},
        {"EscapedBraceTakesOneColumn", "{lbrace}ab}", 4, "{lbrace}ab}"},
        {"ControlCharactersDropped",
         "a\rb\x01"
         "c\td",
         10, "abc d"},
        // UTF-8: one column per character.
        {"WideTextCountsCharacters", "\u2593\u2593\u2593\u2593\u2593", 4, "\u2593\u2593\u2593\u2593\n\u2593"},
        // Display columns: CJK takes two, combining characters none, bytes that
        // are not UTF-8 one each, shown as U+FFFD.
        {"CjkWrapsByColumns", "\u4e2d\u6587\u4e2d\u6587\u4e2d", 4, "\u4e2d\u6587\n\u4e2d\u6587\n\u4e2d"},
        {"WideCharacterSkipsTheLastColumn", "abc\u4e2d", 4, "abc\n\u4e2d"},
        {"CjkWordWrapsAtTheBlank", "ab \u4e2d\u6587", 5, "ab\n\u4e2d\u6587"},
        {"BreakAtBlankLeavingTooLittleRoom", " ab\u4e2d", 3, " ab\n\u4e2d"},
        {"CombiningStaysOnItsLine", "abcde\u0301f", 5, "abcde\u0301\nf"},
        {"RightAlignCountsColumns", "{align:right}\u4e2d{/align}", 5, "   \u4e2d"},
        {"CenterCountsColumns", "{align:center}\u4e2d\u6587{/align}", 8, "  \u4e2d\u6587"},
        {"PaddingCutsBeforeHalfAWideCharacter", "{align:padding:4}a\u4e2d\u6587b{/align}|", 10, "a\u4e2d |"},
        {"PaddingDropsTheCutCharactersAccent", "{align:padding:1}ae\u0301{/align}|", 10, "a|"},
        {"WiderThanTheAreaIsReplaced", "\u4e2d", 1, "\uFFFD"},
        {"InvalidBytesAreReplaced", "a\xff\xe4\xb8Z", 10, "a\uFFFD\uFFFD\uFFFDZ"},
        {"DeleteDropped", "a\x7fZ", 10, "aZ"},
    };
    for (const Case& c : cases)
        EXPECT_EQ(TextArea::Layout(c.text, c.width, FakeValues), c.expected) << c.name << ": " << c.text;
}

TEST(TextHelpers, Escape) {
    EXPECT_EQ(TextArea::Escape("a{ip}b"), "a{lbrace}ip}b");
    EXPECT_EQ(TextArea::Layout(TextArea::Escape("{ip}"), 10, FakeValues), "{lbrace}ip}");
}

// Drawing: what lands in the cells of a text area.
class TextAreaDrawTest : public ::testing::Test {
protected:
    void SetUp() override {
        testing_support::EnsureFakeTerminal();
        _parent = new Velk::Window(0, 0, 30, 6, Velk::YELLOW, Velk::WHITE);
    }
    void TearDown() override { delete _parent; }

    static int Pair(int bg, int fg) { return static_cast<int>(PAIR_NUMBER(Velk::ColorAttr(bg, fg))); }

    Velk::Window* _parent = nullptr;
};

TEST_F(TextAreaDrawTest, RunsTakeTheirColours) {
    auto* area = new TextArea(_parent, 1, 1, 20, 2, Velk::BLACK);
    area->SetText("ab{color:red}cd{/color}e{bgcolor:white}f{/bgcolor}g");
    WINDOW* win = area->GetWindow();
    EXPECT_EQ(RowText(win, 0).substr(0, 7), "abcdefg");
    const int expected[] = {Pair(Velk::YELLOW, Velk::BLACK), Pair(Velk::YELLOW, Velk::BLACK),
                            Pair(Velk::YELLOW, Velk::RED),   Pair(Velk::YELLOW, Velk::RED),
                            Pair(Velk::YELLOW, Velk::BLACK), Pair(Velk::WHITE, Velk::BLACK),
                            Pair(Velk::YELLOW, Velk::BLACK)};
    for (int x = 0; x < 7; ++x) EXPECT_EQ(CellPair(win, 0, x), expected[x]) << "column " << x;
    // -1 takes the parent's colours.
    auto* inherits = new TextArea(_parent, 0, 0, 10, 1, -1, "x");
    EXPECT_EQ(CellPair(inherits->GetWindow(), 0, 0), Pair(Velk::YELLOW, Velk::WHITE));
}

TEST_F(TextAreaDrawTest, StopsAtTheAreasHeight) {
    // The area sits above a row of the parent that must stay untouched.
    auto* area = new TextArea(_parent, 0, 0, 10, 2, Velk::BLACK);
    area->SetText("one\ntwo\nthree four five six seven");
    EXPECT_EQ(RowText(area->GetWindow(), 0), "one       ");
    EXPECT_EQ(RowText(area->GetWindow(), 1), "two       ");
    EXPECT_EQ(RowText(_parent->GetWindow(), 2), std::string(30, ' '));
}

TEST_F(TextAreaDrawTest, CjkStaysInsideTheArea) {
    // Five columns between marked cells of the parent: two CJK characters
    // fill four, the third goes to the next row rather than over the mark.
    WINDOW* outer = _parent->GetWindow();
    for (int y = 0; y < 3; ++y) mvwaddstr(outer, y, 0, "#######");
    auto* area = new TextArea(_parent, 1, 0, 5, 2, Velk::BLACK);
    area->SetText("\u4e2d\u6587\u4e2d e\u0301\xff");
    WINDOW* win = area->GetWindow();
    EXPECT_EQ(CellText(win, 0, 0), "\u4e2d");
    EXPECT_EQ(CellText(win, 0, 2), "\u6587");
    EXPECT_EQ(CellText(win, 0, 4), " ");
    EXPECT_EQ(CellText(win, 1, 0), "\u4e2d");
    EXPECT_EQ(CellText(win, 1, 3), "e\u0301");
    EXPECT_EQ(CellText(win, 1, 4), "\uFFFD");
    for (int y = 0; y < 3; ++y) {
        EXPECT_EQ(CellText(outer, y, 0), "#") << "row " << y;
        EXPECT_EQ(CellText(outer, y, 6), "#") << "row " << y;
    }
    // Characters of more than one byte but one column take one cell each.
    area->SetText("\u2593\u2588{color:red}x{/color}{align:right}\u00e9{/align}");
    EXPECT_EQ(RowText(win, 0), "\u2593\u2588x \u00e9");
    EXPECT_EQ(CellPair(win, 0, 2), Pair(Velk::YELLOW, Velk::RED));
}

TEST_F(TextAreaDrawTest, SetAndAppendReplaceTheOldText) {
    auto* area = new TextArea(_parent, 0, 0, 10, 1, Velk::BLACK, "long old text");
    area->SetText("new");
    EXPECT_EQ(RowText(area->GetWindow(), 0), "new       ");
    area->AppendText(" {lbrace}x}");
    EXPECT_EQ(area->GetText(), "new {lbrace}x}");
    EXPECT_EQ(RowText(area->GetWindow(), 0), "new {x}   ");
}

TEST_F(TextAreaDrawTest, HiddenAreaIsDimmed) {
    auto* area = new TextArea(_parent, 0, 0, 10, 1, Velk::BLACK, "{color:red}ab{/color}c");
    _parent->Show(false);
    for (int x = 0; x < 3; ++x)
        EXPECT_EQ(CellPair(area->GetWindow(), 0, x), Pair(Velk::BLACK, Velk::DARK_GREY));
    _parent->Show(true);
    EXPECT_EQ(CellPair(area->GetWindow(), 0, 0), Pair(Velk::YELLOW, Velk::RED));
    EXPECT_EQ(CellPair(area->GetWindow(), 0, 2), Pair(Velk::YELLOW, Velk::BLACK));
}

}  // namespace
