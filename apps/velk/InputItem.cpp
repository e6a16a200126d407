#include "InputItem.hpp"

#include <curses.h>
#include <string.h>

#include <algorithm>
#include <cctype>

#include "Pam.hpp"
#include "TextArea.hpp"

namespace Velk {

namespace {
constexpr int kBackspaceByte = 8;
// Room a masked field keeps for its text, so typing a secret rarely moves it.
constexpr size_t kSecretRoom = 128;
}  // namespace

InputItem::InputItem(const std::string& label, const std::string& initialText, int fieldWidth)
    : Item(true),
      _label(label),
      _text(initialText),
      _fieldWidth(fieldWidth),
      _position(static_cast<int>(initialText.size())) {}

// A masked field closed without its secret being used (Esc) still leaves no
// copy behind.
InputItem::~InputItem() {
    if (_masked) WipeSecret(_text);
}

void InputItem::Changed() {
    // Entering the field selects its value again, as a prefilled value is at
    // the start: the first printable key replaces it.
    if (_focused) {
        _fresh = true;
        _position = Length();
        _offset = 0;
    }
}

void InputItem::SetMasked(bool masked) {
    _masked = masked;
    ReserveSecretRoom(kSecretRoom);
}

// A masked text grows only through here: the new buffer is filled, the old
// one wiped before it is freed, so no copy of a secret stays in freed memory.
// Reserving up front also keeps a secret out of the string's inline buffer,
// whose tail would survive a move to the heap.
void InputItem::ReserveSecretRoom(size_t needed) {
    if (!_masked || _text.capacity() >= needed) return;
    std::string bigger;
    bigger.reserve(std::max({needed, 2 * _text.capacity(), kSecretRoom}));
    bigger.assign(_text);
    explicit_bzero(_text.data(), _text.capacity());
    _text.swap(bigger);
}

void InputItem::SetText(const std::string& text) {
    if (_masked) {
        WipeSecret(_text);
        ReserveSecretRoom(text.size() + 1);
    }
    _text = text;
    _fresh = true;
    _offset = 0;
    _position = Length();
}

void InputItem::WipeText() {
    WipeSecret(_text);
    ReserveSecretRoom(kSecretRoom);
    _position = 0;
    _offset = 0;
    _fresh = true;
}

void InputItem::Clear() {
    if (_masked) explicit_bzero(_text.data(), _text.capacity());
    _text.clear();
    _position = 0;
    _offset = 0;
    _fresh = false;
}

bool InputItem::HandleKey(int key) {
    switch (key) {
        case KEY_HOME:
            _position = 0;
            _offset = 0;
            _fresh = false;
            return true;
        case KEY_LEFT:
            _fresh = false;
            if (_position > 0) {
                if (_position == _offset) _offset = _position - 1;
                --_position;
            }
            return true;
        case KEY_RIGHT:
            _fresh = false;
            if (_position < Length()) ++_position;
            return true;
        case KEY_END:
            _fresh = false;
            _position = Length();
            return true;
        case KEY_DC:
            if (_fresh) {
                Clear();
            } else if (_position < Length()) {
                _text.erase(static_cast<size_t>(_position), 1);
            }
            return true;
        case KEY_BACKSPACE:
        case kBackspaceByte:
            if (_fresh) {
                Clear();
            } else if (_position > 0) {
                _text.erase(static_cast<size_t>(_position - 1), 1);
                --_position;
                // Deleting into the hidden part of a scrolled field shows the
                // text from its start with the cursor at the end.
                if (_position < _offset) {
                    _offset = 0;
                    _position = Length();
                }
            }
            return true;
        default:
            break;
    }
    if (key < 0 || key > 255 || !std::isprint(key)) return false;
    if (_fresh) Clear();
    if (_maxLength >= 0 && Length() >= _maxLength) return true;
    ReserveSecretRoom(_text.size() + 1);
    _text.insert(static_cast<size_t>(_position), 1, static_cast<char>(key));
    ++_position;
    return true;
}

bool InputItem::IsEditingKey(int key) {
    switch (key) {
        case kBackspaceByte:
        case KEY_BACKSPACE:
        case KEY_DC:
        case KEY_LEFT:
        case KEY_RIGHT:
        case KEY_HOME:
        case KEY_END:
            return true;
        default:
            return false;
    }
}

void InputItem::Draw(TextArea* area) {
    const int areaWidth = area->GetWidth();
    int width = _fieldWidth == -1 ? areaWidth / 2 - 1 : _fieldWidth;
    if (width < 0) width = 0;
    if (width > Length()) _offset = 0;
    if (_position - _offset > width) _offset = _position - width;

    // A masked text is never copied, not even in part: only its length is.
    const size_t shownLength = _offset < Length() ? std::min<size_t>(static_cast<size_t>(Length() - _offset),
                                                                     static_cast<size_t>(width))
                                                  : 0;
    std::string shown = _masked ? std::string(shownLength, '*')
                        : shownLength == 0
                            ? std::string()
                            : TextArea::Escape(_text.substr(static_cast<size_t>(_offset), shownLength));

    // The field ends one column before the row's end, so that the cursor
    // after its last character stays inside the row.
    int labelWidth = areaWidth - width - 1;
    if (labelWidth < 0) labelWidth = 0;
    std::string row = "{align:padding:" + std::to_string(labelWidth) + "}" + _label + "{/align}";
    if (_focused) {
        shown.append(static_cast<size_t>(width) - shownLength, ' ');
        row += _fresh ? "{bgcolor:white}{color:black}" : "{bgcolor:black}{color:white}";
        row += shown + "{/color}{/bgcolor}";
    } else {
        row += shown;
    }
    area->SetText(row);
    if (_focused) {
        _cursorColumn = labelWidth + _position - _offset;
        area->MoveCursor(_cursorColumn, 0);
    }
}

}  // namespace Velk
