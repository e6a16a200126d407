// One row of an ItemList: a label, a check box, a radio button or an input
// field. The list decides which item is current and gives each item the text
// area of its row to draw into.
#pragma once

#include "Console.hpp"

namespace Velk {

class TextArea;

class Item {
public:
    explicit Item(bool selectable);

    // Called after the focus flag changed.
    virtual void Changed() {}
    virtual ~Item();
    // Puts the item's text into its row.
    virtual void Draw(TextArea* area) = 0;
    // Stores the flag and calls Changed() when it differs.
    virtual void SetFocus(bool focused);

    Item(const Item&) = delete;
    Item& operator=(const Item&) = delete;

    // Selectable items take part in selection and in the numbering of
    // ItemList::SetCurrent; inactive ones are counted but passed over.
    bool IsSelectable() const { return _selectable; }
    bool IsFocused() const { return _focused; }
    bool IsActive() const { return _active; }
    void SetActive(bool active) { _active = active; }
    // Active and drawn in black, or passed over and drawn in dark grey (a
    // dialog's rows that the current choice makes meaningless).
    void SetEnabled(bool enabled) {
        _active = enabled;
        _fg = enabled ? BLACK : DARK_GREY;
    }
    // Colours of the row while the item is not the current one.
    int GetBg() const { return _bg; }
    int GetFg() const { return _fg; }
    void SetColors(int bg, int fg) {
        _bg = bg;
        _fg = fg;
    }

protected:
    bool _selectable;
    bool _focused = false;
    bool _active = true;
    int _bg = YELLOW;
    int _fg = BLACK;
};

}  // namespace Velk
