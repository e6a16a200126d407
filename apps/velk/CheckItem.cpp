#include "CheckItem.hpp"

namespace Velk {

CheckItem::CheckItem(const std::string& label, bool checked, int indent)
    : LabelItem("", true), _checked(checked), _label(label), _indent(indent) {
    Rebuild();
}

CheckItem::~CheckItem() = default;

void CheckItem::SetChecked(bool checked) {
    _checked = checked;
    Rebuild();
}

void CheckItem::Rebuild() {
    _text.assign(_indent > 0 ? static_cast<size_t>(_indent) : 0, ' ');
    _text += _checked ? "[X] " : "[ ] ";
    _text += _label;
}

}  // namespace Velk
