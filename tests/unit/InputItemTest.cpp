// Editing keys of input fields, and how a field shows its text.
#include <curses.h>
#include <gtest/gtest.h>
#include <malloc.h>
#include <string.h>

#include <atomic>
#include <memory>
#include <string>
#include <vector>

#include "Console.hpp"
#include "FakeTerminal.hpp"
#include "InputItem.hpp"
#include "TextArea.hpp"
#include "Window.hpp"

namespace {

using Velk::InputItem;

TEST(InputItem, EditingKeys) {
    const std::string kAddress = "192.168.0.1";
    struct Case {
        const char* name;
        std::string initial;
        std::vector<int> keys;
        std::string text;
        int position;
        bool fresh;
    };
    const Case cases[] = {
        {"Untouched", kAddress, {}, kAddress, 11, true},
        {"PrintableReplacesFreshValue", kAddress, {'5'}, "5", 1, false},
        {"LeftThenTypeInsertsBeforeLastChar", kAddress, {KEY_LEFT, '5'}, "192.168.0.51", 11, false},
        {"BackspaceWhenFreshClears", kAddress, {KEY_BACKSPACE}, "", 0, false},
        {"BackspaceByteWhenFreshClears", kAddress, {8}, "", 0, false},
        {"DeleteWhenFreshClears", kAddress, {KEY_DC}, "", 0, false},
        {"BackspaceAfterEnd", kAddress, {KEY_END, KEY_BACKSPACE, KEY_BACKSPACE}, "192.168.0", 9, false},
        {"HomeThenDelete", kAddress, {KEY_HOME, KEY_DC}, "92.168.0.1", 0, false},
        {"HomeThenBackspaceDoesNothing", kAddress, {KEY_HOME, KEY_BACKSPACE}, kAddress, 0, false},
        {"DeleteAtEndDoesNothing", kAddress, {KEY_END, KEY_DC}, kAddress, 11, false},
        {"RightStopsAtEnd", kAddress, {KEY_RIGHT}, kAddress, 11, false},
        {"LeftStopsAtStart", "ab", {KEY_LEFT, KEY_LEFT, KEY_LEFT}, "ab", 0, false},
        {"RightAfterHome", "ab", {KEY_HOME, KEY_RIGHT, 'x'}, "axb", 2, false},
        {"EmptyFieldTyping", "", {'a', 'b', KEY_LEFT, 'c'}, "acb", 2, false},
        {"OtherKeysIgnored", kAddress, {KEY_F(2), KEY_UP, 27, '\n', '\t', 200, -1}, kAddress, 11, true},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        InputItem item("Label", c.initial, 20);
        for (int key : c.keys) item.HandleKey(key);
        EXPECT_EQ(item.GetText(), c.text);
        EXPECT_EQ(item.GetPosition(), c.position);
        EXPECT_EQ(item.IsFresh(), c.fresh);
    }
}

TEST(InputItem, HandleKeyTellsWhetherTheKeyWasUsedAndSetTextMakesTheFieldFreshAgain) {
    InputItem item("Label", "abc");
    EXPECT_FALSE(item.HandleKey(KEY_F(11)));
    EXPECT_FALSE(item.HandleKey('\n'));
    EXPECT_TRUE(item.HandleKey(KEY_HOME));
    item.SetText("10.0.0.1");
    EXPECT_TRUE(item.IsFresh());
    EXPECT_EQ(item.GetPosition(), 8);
    EXPECT_EQ(item.GetOffset(), 0);
    EXPECT_TRUE(item.HandleKey('7'));
    EXPECT_EQ(item.GetText(), "7");
}

// Drawing a field into a 20-column row.
class InputDrawTest : public ::testing::Test {
protected:
    void SetUp() override {
        testing_support::EnsureFakeTerminal();
        _parent = new Velk::Window(0, 0, 30, 3, Velk::BLACK, Velk::WHITE);
        _area = new Velk::TextArea(_parent, 2, 1, 20, 1, -1);
    }
    void TearDown() override { delete _parent; }

    // A focused field "Name" drawn once.
    InputItem& Field(const std::string& text = "abcdef", int width = 3) {
        _item = std::make_unique<InputItem>("Name", text, width);
        _item->SetFocus(true);
        _item->Draw(_area);
        return *_item;
    }
    std::string Row() const { return testing_support::RowText(_area->GetWindow(), 0); }
    int PairAt(int x) const { return testing_support::CellPair(_area->GetWindow(), 0, x); }
    static int Pair(int bg, int fg) { return static_cast<int>(PAIR_NUMBER(Velk::ColorAttr(bg, fg))); }

    Velk::Window* _parent = nullptr;
    Velk::TextArea* _area = nullptr;
    std::unique_ptr<InputItem> _item;
};

TEST_F(InputDrawTest, FocusedFieldScrollsToTheCursor) {
    InputItem& item = Field();
    // The field takes columns 16 to 18 and shows the end of the text.
    EXPECT_EQ(Row(), "Name            def ");
    EXPECT_EQ(item.GetOffset(), 3);
    EXPECT_EQ(item.GetCursorColumn(), 19);
    EXPECT_EQ(Velk::Window::_xCursor, 2 + 19);
    EXPECT_EQ(Velk::Window::_yCursor, 1);
    // Fresh: white field; once edited: black field.
    EXPECT_EQ(PairAt(16), Pair(Velk::WHITE, Velk::BLACK));
    item.HandleKey(KEY_LEFT);
    item.Draw(_area);
    EXPECT_EQ(PairAt(16), Pair(Velk::BLACK, Velk::WHITE));
    EXPECT_EQ(item.GetCursorColumn(), 18);
}

TEST_F(InputDrawTest, LeftAtTheOffsetScrollsBackAndBackspaceThereJumpsToTheEnd) {
    InputItem& item = Field();
    for (int i = 0; i < 4; ++i) item.HandleKey(KEY_LEFT);
    EXPECT_EQ(item.GetPosition(), 2);
    EXPECT_EQ(item.GetOffset(), 2);
    item.Draw(_area);
    EXPECT_EQ(Row(), "Name            cde ");

    InputItem& other = Field();
    for (int i = 0; i < 3; ++i) other.HandleKey(KEY_LEFT);
    EXPECT_EQ(other.GetOffset(), 3);
    other.HandleKey(KEY_BACKSPACE);
    EXPECT_EQ(other.GetText(), "abdef");
    EXPECT_EQ(other.GetOffset(), 0);
    EXPECT_EQ(other.GetPosition(), 5);
}

TEST_F(InputDrawTest, EnteringTheFieldAgainSelectsItsValue) {
    InputItem& item = Field();
    item.HandleKey(KEY_HOME);
    item.Draw(_area);
    EXPECT_EQ(Row(), "Name            abc ");
    item.SetFocus(false);
    item.Draw(_area);
    EXPECT_FALSE(item.IsFresh());
    item.SetFocus(true);
    EXPECT_TRUE(item.IsFresh());
    EXPECT_EQ(item.GetPosition(), 6);
    item.Draw(_area);
    EXPECT_EQ(Row(), "Name            def ");
    item.HandleKey('5');
    EXPECT_EQ(item.GetText(), "5");
}

TEST_F(InputDrawTest, DefaultWidthIsHalfTheRowMinusOne) {
    _item = std::make_unique<InputItem>("Name", "xy");
    _item->SetFocus(true);
    _item->Draw(_area);
    // Width 9 at columns 10 to 18, padded while focused.
    EXPECT_EQ(Row(), "Name      xy        ");
    EXPECT_EQ(PairAt(18), Pair(Velk::WHITE, Velk::BLACK));
    EXPECT_NE(PairAt(19), Pair(Velk::WHITE, Velk::BLACK));
}

TEST_F(InputDrawTest, MaskedFieldShowsStarsAndTypedBracesShowAsTyped) {
    InputItem masked("Password:", "secret", 10);
    masked.SetMasked(true);
    masked.Draw(_area);
    EXPECT_EQ(Row(), "Password:******     ");
    InputItem& item = Field("", 8);
    for (char c : std::string("{ip}")) item.HandleKey(c);
    item.Draw(_area);
    EXPECT_EQ(Row(), "Name       {ip}     ");
}

}  // namespace

// Every block freed while the watch is armed is searched for the watched
// text: a secret copied into a temporary and freed unwiped is found here.
namespace {
std::atomic<const char*> watchedText{nullptr};
std::atomic<int> freedCopies{0};

// Any 12 characters of the watched text in a row count as a copy.
void CheckFreed(void* block) {
    constexpr size_t kPiece = 12;
    const char* text = watchedText.load();
    if (!block || !text) return;
    const size_t size = malloc_usable_size(block);
    const size_t length = strlen(text);
    for (size_t at = 0; at + kPiece <= length; ++at) {
        if (memmem(block, size, text + at, kPiece)) {
            ++freedCopies;
            return;
        }
    }
}
}  // namespace

void* operator new(size_t size) {
    void* block = malloc(size ? size : 1);
    if (!block) throw std::bad_alloc();
    return block;
}
void operator delete(void* block) noexcept {
    CheckFreed(block);
    free(block);
}
void operator delete(void* block, size_t) noexcept {
    CheckFreed(block);
    free(block);
}

namespace {

TEST(InputItem, MaskedFieldLeavesNoCopyOfItsSecretInFreedMemory) {
    testing_support::EnsureFakeTerminal();
    // No 12 characters in a row repeat, so any piece of a copy is found.
    std::string secret = "Sesame-";
    for (int i = 1000; i < 1040; ++i) secret += std::to_string(i) + "-";
    for (const bool wipeFirst : {true, false}) {
        SCOPED_TRACE(wipeFirst ? "wiped, then closed" : "closed with the secret in it");
        Velk::Window parent(0, 0, 80, 3, Velk::BLACK, Velk::WHITE);
        auto* area = new Velk::TextArea(&parent, 1, 1, 78, 1, -1);
        freedCopies = 0;
        watchedText = secret.c_str();
        {
            // A field wide enough that a drawn piece of the text would not
            // fit a string's inline buffer.
            auto item = std::make_unique<InputItem>("Password:", "", 40);
            item->SetMasked(true);
            item->SetFocus(true);
            for (const char c : secret) {
                item->HandleKey(static_cast<unsigned char>(c));
                item->Draw(area);
            }
            EXPECT_EQ(item->GetText(), secret);
            EXPECT_EQ(testing_support::RowText(area->GetWindow(), 0).find_first_not_of("* ", 37),
                      std::string::npos);
            if (wipeFirst) item->WipeText();
        }
        watchedText = nullptr;
        EXPECT_EQ(freedCopies.load(), 0);
    }
}

}  // namespace
