// A window that shows items one per row, keeps a current item, scrolls, and
// draws a scroll bar when the items do not fit.
#pragma once

#include <vector>

#include "Item.hpp"
#include "TextArea.hpp"
#include "Window.hpp"

namespace Velk {

class ItemList : public Window {
public:
    // A child of parent with the parent's colours: the rows on the left, a
    // one-column scroll bar on the right.
    ItemList(Window* parent, int x, int y, int width, int height);
    ~ItemList() override;

    // Takes a new list (the caller keeps ownership of the items). The first
    // selectable and active item becomes current; it has to be on the first
    // screen, otherwise the program stops (a dialog built wrongly).
    void SetItems(const std::vector<Item*>& items);
    // Makes the n-th selectable item (counted from 0) current; the program
    // stops when there is none.
    void SetCurrent(int n);
    // Move the selection to the next or previous selectable, active item (no
    // wrap-around) and redraw.
    void Down();
    void Up();
    void Draw();

    // The current item, or null when the list has no selectable item.
    Item* GetCurrent() const;
    // The current item's index in the list given to SetItems, -1 when the
    // list has no selectable item.
    int GetCurrentIndex() const;
    // The current item's number among the selectable items.
    int GetCurrentNumber() const { return _number; }
    // Index of the first item shown.
    int GetTop() const { return _top; }
    // Row of the current item within the visible rows, -1 when there is none.
    int GetCurrentRow() const { return _pos; }
    int GetRowCount() const { return static_cast<int>(_itemAreas.size()); }
    TextArea* GetRowArea(int row) const { return _itemAreas[static_cast<size_t>(row)]; }
    Window* GetScrollBar() const { return _scrollBar; }

private:
    void DrawScrollBar();

    std::vector<Item*> _items;
    Window* _content;
    Window* _scrollBar;
    std::vector<Window*> _rows;
    std::vector<TextArea*> _itemAreas;
    int _pos = -1;
    int _top = 0;
    int _number = 0;
};

}  // namespace Velk
