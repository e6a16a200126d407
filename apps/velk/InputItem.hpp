// A text input field: a label, then an editable text on the right part of the
// row. A prefilled value starts "fresh": it behaves as selected, so the first
// printable key replaces it and the first Backspace or Delete erases it.
//
// The dialog passes keys to HandleKey. While the field is the list's current
// item, Draw moves the screen's cursor (Window::MoveCursor) to the editing
// position, and the list's final refresh puts the terminal cursor there; the
// dialog shows the cursor with Window::SetCursor(true) while an input field
// is current and hides it otherwise.
#pragma once

#include <string>

#include "Item.hpp"

namespace Velk {

class InputItem : public Item {
public:
    // fieldWidth -1: half the row width minus 1.
    InputItem(const std::string& label, const std::string& initialText, int fieldWidth = -1);
    ~InputItem() override;

    // Entering the field makes it fresh again, with the cursor at the end.
    void Changed() override;
    void Draw(TextArea* area) override;

    // Applies an editing key (Home, End, Left, Right, Delete, Backspace or a
    // printable character); false for any other key, which is ignored. A
    // printable character that would make the text longer than the maximum
    // length is ignored too (and answers true: the key was the field's).
    bool HandleKey(int key);

    // The keys that move within a field or delete from it: Backspace (the
    // byte 8 and curses' code), Delete, Left, Right, Home and End.
    static bool IsEditingKey(int key);

    // Caps the text at `length` characters; -1 (the default) sets no cap.
    void SetMaxLength(int length) { _maxLength = length; }

    // Replaces the text; the field is fresh again with the cursor at the end.
    void SetText(const std::string& text);
    const std::string& GetText() const { return _text; }
    // Overwrites the text's bytes and empties the field (password fields,
    // once their value was used).
    void WipeText();
    const std::string& GetLabel() const { return _label; }
    // Masked fields (passwords) show one "*" per character.
    void SetMasked(bool masked);
    bool IsMasked() const { return _masked; }

    int GetPosition() const { return _position; }
    int GetOffset() const { return _offset; }
    bool IsFresh() const { return _fresh; }
    // Column of the editing position within the row's text area, as placed by
    // the last Draw of the focused field.
    int GetCursorColumn() const { return _cursorColumn; }

private:
    void Clear();
    void ReserveSecretRoom(size_t needed);
    int Length() const { return static_cast<int>(_text.size()); }

    std::string _label;
    std::string _text;
    int _fieldWidth;
    bool _masked = false;
    int _maxLength = -1;
    int _position;
    int _offset = 0;
    bool _fresh = true;
    int _cursorColumn = 0;
};

}  // namespace Velk
