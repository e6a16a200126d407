#include "RadioItem.hpp"

namespace Velk {

RadioItem::RadioItem(const std::string& label, bool selected)
    : LabelItem("", true), _selected(selected), _label(label) {
    Rebuild();
}

RadioItem::~RadioItem() = default;

void RadioItem::SetSelected(bool selected) {
    _selected = selected;
    Rebuild();
}

void RadioItem::Rebuild() { _text = std::string(_selected ? "(o) " : "( ) ") + _label; }

}  // namespace Velk
