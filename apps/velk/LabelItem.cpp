#include "LabelItem.hpp"

#include "TextArea.hpp"

namespace Velk {

LabelItem::LabelItem(const std::string& text, bool selectable) : Item(selectable), _text(text) {}

LabelItem::~LabelItem() = default;

void LabelItem::Draw(TextArea* area) { area->SetText(_text); }

}  // namespace Velk
