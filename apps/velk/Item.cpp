#include "Item.hpp"

namespace Velk {

Item::Item(bool selectable) : _selectable(selectable) {}

Item::~Item() = default;

void Item::SetFocus(bool focused) {
    if (focused == _focused) return;
    _focused = focused;
    Changed();
}

}  // namespace Velk
