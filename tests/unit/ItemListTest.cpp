// Selection, scrolling and drawing of item lists on a fake terminal.
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "CheckItem.hpp"
#include "Console.hpp"
#include "FakeTerminal.hpp"
#include "ItemList.hpp"
#include "LabelItem.hpp"
#include "RadioItem.hpp"
#include "Window.hpp"

namespace {

using Velk::ItemList;
using Velk::LabelItem;

constexpr int kRows = 4;

// Entries "0", "1", ... "count-1".
std::vector<std::string> Numbered(int count) {
    std::vector<std::string> entries;
    for (int i = 0; i < count; ++i) entries.push_back(std::to_string(i));
    return entries;
}

class ItemListTest : public ::testing::Test {
protected:
    void SetUp() override {
        GTEST_FLAG_SET(death_test_style, "threadsafe");
        testing_support::EnsureFakeTerminal();
        _parent = new Velk::Window(0, 0, 40, 10, Velk::YELLOW, Velk::BLACK);
        _list = new ItemList(_parent, 2, 1, 20, kRows);
    }
    void TearDown() override { delete _parent; }
    // A new list, as each test starts with.
    void Fresh() {
        TearDown();
        SetUp();
    }

    // "-x": a row that is not selectable; "!x": selectable but inactive;
    // anything else: an ordinary entry.
    void Build(const std::vector<std::string>& entries) {
        _items.clear();
        for (const std::string& entry : entries) {
            const char mark = entry.empty() ? ' ' : entry[0];
            const bool marked = mark == '-' || mark == '!';
            _items.push_back(std::make_unique<LabelItem>(marked ? entry.substr(1) : entry, mark != '-'));
            if (mark == '!') _items.back()->SetActive(false);
        }
        std::vector<Velk::Item*> items;
        for (const auto& item : _items) items.push_back(item.get());
        _list->SetItems(items);
    }

    std::string CurrentText() const {
        auto* current = dynamic_cast<LabelItem*>(_list->GetCurrent());
        return current ? current->GetText() : "<none>";
    }

    std::string BarCell(int row) const {
        return testing_support::CellText(_list->GetScrollBar()->GetWindow(), row, 0);
    }
    std::string RowStart(int row, size_t length) const {
        return testing_support::RowText(_list->GetRowArea(row)->GetWindow(), 0).substr(0, length);
    }
    int RowPair(int row) const {
        return testing_support::CellPair(_list->GetRowArea(row)->GetWindow(), 0, 0);
    }
    static int Pair(int bg, int fg) { return static_cast<int>(PAIR_NUMBER(Velk::ColorAttr(bg, fg))); }

    Velk::Window* _parent = nullptr;
    ItemList* _list = nullptr;
    std::vector<std::unique_ptr<LabelItem>> _items;
};

TEST_F(ItemListTest, Navigation) {
    struct Case {
        const char* name;
        std::vector<std::string> items;
        std::string moves;  // 'D' down, 'U' up
        std::string current;
        int top, row, number;
    };
    const Case cases[] = {
        {"FirstSelectableAndActiveIsCurrent", {"-title", "!off", "a", "b"}, "", "a", 0, 2, 1},
        {"FirstSelectableOnTheLastRowIsAccepted", {"-0", "-1", "-2", "a", "b"}, "", "a", 0, 3, 0},
        {"DownSkipsBlankRowsAndInactiveItems", {"a", "-", "!off", "b"}, "D", "b", 0, 3, 2},
        {"DownFromTheLastChangesNothing", {"a", "b", "-"}, "DDD", "b", 0, 1, 1},
        {"UpFromTheFirstChangesNothing", {"-", "a", "b"}, "UU", "a", 0, 1, 0},
        {"UpSkipsBackToTheFirst", {"a", "-", "!off", "b"}, "DU", "a", 0, 0, 0},
        {"DownScrollsTheLastRowIntoView", Numbered(10), "DDDD", "4", 1, 3, 4},
        {"DownScrollsPastBlankRows", {"a", "b", "c", "d", "-", "-", "e"}, "DDDD", "e", 3, 3, 4},
        {"UpScrollsTheItemToTheTop", Numbered(10), "DDDDDDUUUUU", "1", 1, 0, 1},
        {"NoSelectableItems", {"-a", "-b"}, "DU", "<none>", 0, -1, 0},
        {"EmptyList", {}, "DDU", "<none>", 0, -1, 0},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        Fresh();
        Build(c.items);
        _list->Draw();
        for (char move : c.moves) move == 'D' ? _list->Down() : _list->Up();
        EXPECT_EQ(CurrentText(), c.current);
        EXPECT_EQ(_list->GetTop(), c.top);
        EXPECT_EQ(_list->GetCurrentRow(), c.row);
        if (c.row >= 0) {
            EXPECT_EQ(_list->GetCurrentNumber(), c.number);
        }
    }
}

TEST_F(ItemListTest, SetCurrentCountsSelectableItems) {
    Build({"-title", "a", "!b", "-", "c"});
    _list->SetCurrent(1);
    EXPECT_EQ(CurrentText(), "b");  // inactive items can still be made current
    EXPECT_EQ(_list->GetCurrentNumber(), 1);
    _list->SetCurrent(2);
    EXPECT_EQ(CurrentText(), "c");
    EXPECT_EQ(_list->GetCurrentRow(), 4 - _list->GetTop());
    _list->SetCurrent(0);
    EXPECT_EQ(CurrentText(), "a");
    EXPECT_EQ(_list->GetCurrentNumber(), 0);
    _list->Down();
    EXPECT_EQ(CurrentText(), "c");
    EXPECT_EQ(_list->GetCurrentNumber(), 2);

    // An item beyond the screen is scrolled to, and the list goes on from it.
    Build(Numbered(10));
    _list->SetCurrent(8);
    EXPECT_EQ(CurrentText(), "8");
    _list->Draw();
    EXPECT_EQ(RowPair(_list->GetCurrentRow()), Pair(Velk::BLACK, Velk::WHITE));
    _list->Up();
    EXPECT_EQ(CurrentText(), "7");
}

TEST_F(ItemListTest, SetCurrentWithoutSuchItemStops) {
    Build({"a", "-", "b"});
    EXPECT_DEATH(_list->SetCurrent(2), "assertion \"false\"");
}

TEST_F(ItemListTest, FirstSelectableBelowTheFirstScreenStops) {
    EXPECT_DEATH(Build({"-0", "-1", "-2", "-3", "a"}), "_pos < _itemAreas.size\\(\\)");
}

TEST_F(ItemListTest, DrawColoursTheCurrentRowAndFocusesItsItem) {
    Build({"-Title", "alpha", "beta"});
    _items[2]->SetColors(Velk::DARK_GREY, Velk::WHITE);
    _list->Draw();
    EXPECT_EQ(RowStart(0, 5), "Title");
    EXPECT_EQ(RowStart(1, 5), "alpha");
    EXPECT_EQ(RowStart(2, 4), "beta");
    EXPECT_EQ(RowPair(0), Pair(Velk::YELLOW, Velk::BLACK));
    EXPECT_EQ(RowPair(1), Pair(Velk::BLACK, Velk::WHITE));
    EXPECT_EQ(RowPair(2), Pair(Velk::DARK_GREY, Velk::WHITE));
    EXPECT_TRUE(_items[1]->IsFocused());
    EXPECT_FALSE(_items[2]->IsFocused());

    _list->Down();
    EXPECT_EQ(RowPair(1), Pair(Velk::YELLOW, Velk::BLACK));
    EXPECT_EQ(RowPair(2), Pair(Velk::BLACK, Velk::WHITE));
    EXPECT_FALSE(_items[1]->IsFocused());
    EXPECT_TRUE(_items[2]->IsFocused());
}

TEST_F(ItemListTest, ShortListClearsRowsOfAnEarlierLongerOne) {
    Build(Numbered(6));
    _list->Draw();
    ASSERT_EQ(BarCell(0), "\u2588");
    Build({"x"});
    _list->Draw();
    EXPECT_EQ(RowStart(1, 3), "   ");
    for (int row = 0; row < kRows; ++row) EXPECT_EQ(BarCell(row), " ") << "row " << row;
}

// The bar, and the rows showing the items from the top one on.
TEST_F(ItemListTest, ScrollBar) {
    struct Case {
        const char* name;
        int items, downs;
        int thumbRow;  // -1: no bar at all
    };
    const Case cases[] = {
        {"FewerItemsThanRows", 2, 0, -1},      {"AsManyItemsAsRows", kRows, 3, -1},
        {"OneMoreItemAtTop", kRows + 1, 0, 0}, {"OneMoreItemAtBottom", kRows + 1, 4, 3},
        {"TenItemsScrolledHalfway", 10, 6, 1},  // top 3 of 6: 50% of 3 rows
        {"TenItemsAtBottom", 10, 9, 3},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        Fresh();
        Build(Numbered(c.items));
        _list->Draw();
        for (int i = 0; i < c.downs; ++i) _list->Down();
        for (int row = 0; row < kRows; ++row) {
            std::string expected = " ";
            if (c.thumbRow >= 0) expected = row == c.thumbRow ? "\u2588" : "\u2593";
            EXPECT_EQ(BarCell(row), expected) << "row " << row;
            const int item = _list->GetTop() + row;
            if (item < c.items) {
                EXPECT_EQ(RowStart(row, 1), std::to_string(item)) << "row " << row;
            }
        }
    }
}

TEST(Items, CheckAndRadioTexts) {
    Velk::CheckItem check("Forcefully terminate running VMs", false, 2);
    EXPECT_EQ(check.GetText(), "  [ ] Forcefully terminate running VMs");
    check.SetChecked(true);
    EXPECT_EQ(check.GetText(), "  [X] Forcefully terminate running VMs");

    Velk::RadioItem radio("Use DHCPv6", true);
    EXPECT_EQ(radio.GetText(), "(o) Use DHCPv6");
    radio.SetSelected(false);
    EXPECT_EQ(radio.GetText(), "( ) Use DHCPv6");
}

// Changed() runs only when the focus flag really changes.
class CountingItem : public Velk::Item {
public:
    CountingItem() : Item(true) {}
    void Changed() override { ++changes; }
    void Draw(Velk::TextArea*) override {}
    int changes = 0;
};

TEST(Items, FocusNotifiesOnChangeOnly) {
    CountingItem item;
    item.SetFocus(false);
    EXPECT_EQ(item.changes, 0);
    item.SetFocus(true);
    item.SetFocus(true);
    EXPECT_EQ(item.changes, 1);
    item.SetFocus(false);
    EXPECT_EQ(item.changes, 2);
}

}  // namespace
