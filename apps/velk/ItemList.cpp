#include "ItemList.hpp"

#include <syslog.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>

#include "hostctl/Host.hpp"

namespace Velk {

namespace {

// Guards against dialogs built wrongly; never depends on user input.
void Require(bool condition, const char* text) {
    if (condition) return;
    HostCtl::Lib::Syslog(LOG_ERR, "ItemList: assertion \"%s\" failed", text);
    std::fprintf(stderr, "ItemList: assertion \"%s\" failed\n", text);
    std::abort();
}

}  // namespace

ItemList::ItemList(Window* parent, int x, int y, int width, int height)
    : Window(parent, x, y, width, height, -1, -1) {
    _content = NewChild(this, 0, 0, width - 1, height, -1, -1);
    _scrollBar = NewChild(this, width - 1, 0, 1, height, -1, -1);
    const int rowWidth = _content->GetWidth();
    for (int r = 0; r < _content->GetHeight(); ++r) {
        Window* row = NewChild(_content, 0, r, rowWidth, 1, -1, -1);
        _rows.push_back(row);
        _itemAreas.push_back(new TextArea(row, 1, 0, rowWidth - 2, 1, -1));
    }
}

// The rows, their areas and the scroll bar belong to the window tree; the
// items belong to the dialog.
ItemList::~ItemList() = default;

void ItemList::SetItems(const std::vector<Item*>& items) {
    _items = items;
    _top = 0;
    _pos = -1;
    _number = 0;
    for (size_t i = 0; i < _items.size(); ++i) {
        if (_items[i]->IsSelectable() && _items[i]->IsActive()) {
            _pos = static_cast<int>(i);
            break;
        }
        if (_items[i]->IsSelectable()) ++_number;
    }
    if (_pos >= 0) Require(static_cast<size_t>(_pos) < _itemAreas.size(), "_pos < _itemAreas.size()");
}

void ItemList::SetCurrent(int n) {
    int count = 0;
    for (size_t i = 0; i < _items.size(); ++i) {
        if (!_items[i]->IsSelectable()) continue;
        if (count++ != n) continue;
        const int index = static_cast<int>(i);
        const int rows = GetRowCount();
        // Scroll only when the item would be off the rows shown now.
        if (index < _top) _top = index;
        if (index >= _top + rows) _top = index - rows + 1;
        _pos = index - _top;
        _number = n;
        return;
    }
    Require(false, "false");
}

void ItemList::Down() {
    if (_pos < 0) return;
    int passed = 0;
    for (size_t i = static_cast<size_t>(_top + _pos) + 1; i < _items.size(); ++i) {
        if (!_items[i]->IsSelectable()) continue;
        ++passed;
        if (!_items[i]->IsActive()) continue;
        const int found = static_cast<int>(i);
        const int rows = GetRowCount();
        if (found > _top + rows - 1) _top = found - rows + 1;
        _pos = found - _top;
        _number += passed;
        Draw();
        return;
    }
}

void ItemList::Up() {
    if (_pos < 0) return;
    int passed = 0;
    for (int i = _top + _pos - 1; i >= 0; --i) {
        Item* item = _items[static_cast<size_t>(i)];
        if (!item->IsSelectable()) continue;
        ++passed;
        if (!item->IsActive()) continue;
        if (i < _top) {
            _top = i;
            _pos = 0;
        } else {
            _pos = i - _top;
        }
        _number -= passed;
        Draw();
        return;
    }
}

int ItemList::GetCurrentIndex() const {
    const auto it = std::find(_items.begin(), _items.end(), GetCurrent());
    return it == _items.end() ? -1 : static_cast<int>(it - _items.begin());
}

Item* ItemList::GetCurrent() const {
    if (_pos < 0) return nullptr;
    const size_t index = static_cast<size_t>(_top + _pos);
    return index < _items.size() ? _items[index] : nullptr;
}

void ItemList::Draw() {
    _content->Erase();
    const int rows = GetRowCount();
    for (int i = 0; i < rows && static_cast<size_t>(_top + i) < _items.size(); ++i) {
        Item* item = _items[static_cast<size_t>(_top + i)];
        item->SetFocus(i == _pos);
        if (i == _pos) {
            _rows[static_cast<size_t>(i)]->SetColors(BLACK, WHITE);
        } else {
            _rows[static_cast<size_t>(i)]->SetColors(item->GetBg(), item->GetFg());
            item->Draw(_itemAreas[static_cast<size_t>(i)]);
        }
    }
    if (static_cast<int>(_items.size()) > rows) {
        DrawScrollBar();
    } else {
        // A list that fits has no bar (one may be left from a longer list).
        _scrollBar->Erase();
    }
    _content->Refresh();
    // The current item comes last so that its cursor placement is the one
    // that stays.
    if (Item* current = GetCurrent(); current && _pos < rows)
        current->Draw(_itemAreas[static_cast<size_t>(_pos)]);
    wnoutrefresh(stdscr);
}

void ItemList::DrawScrollBar() {
    const int rows = GetRowCount();
    const int hidden = static_cast<int>(_items.size()) - rows;
    _scrollBar->Erase();
    for (int r = 0; r < rows; ++r) _scrollBar->Print(0, r, "\u2593");
    _scrollBar->Print(0, (_top * 100 / hidden) * (rows - 1) / 100, "\u2588");
    _scrollBar->Refresh();
}

}  // namespace Velk
