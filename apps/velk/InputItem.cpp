#include "InputItem.hpp"

#include <curses.h>

#include <cctype>

#include "Pam.hpp"
#include "TextArea.hpp"

namespace Velk {

namespace {
constexpr int kBackspaceByte = 8;
}  // namespace

InputItem::InputItem(const std::string& label, const std::string& initialText, int fieldWidth)
    : Item(true),
      _label(label),
      _text(initialText),
      _fieldWidth(fieldWidth),
      _position(static_cast<int>(initialText.size())) {}

InputItem::~InputItem() = default;

void InputItem::Changed() {
    // Entering the field selects its value again, as a prefilled value is at
    // the start: the first printable key replaces it.
    if (_focused) {
        _fresh = true;
        _position = Length();
        _offset = 0;
    }
}

void InputItem::SetText(const std::string& text) {
    _text = text;
    _fresh = true;
    _offset = 0;
    _position = Length();
}

void InputItem::WipeText() {
    WipeSecret(_text);
    _position = 0;
    _offset = 0;
    _fresh = true;
}

void InputItem::Clear() {
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

    std::string shown = _offset < Length()
                            ? _text.substr(static_cast<size_t>(_offset), static_cast<size_t>(width))
                            : std::string();
    const size_t shownLength = shown.size();
    shown = _masked ? std::string(shownLength, '*') : TextArea::Escape(shown);

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
