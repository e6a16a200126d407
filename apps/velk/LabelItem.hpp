// An item that shows a text (mark-up allowed): menu entries, blank rows.
#pragma once

#include <string>

#include "Item.hpp"

namespace Velk {

class LabelItem : public Item {
public:
    explicit LabelItem(const std::string& text, bool selectable = true);
    ~LabelItem() override;

    void Draw(TextArea* area) override;

    const std::string& GetText() const { return _text; }
    void SetText(const std::string& text) { _text = text; }

protected:
    std::string _text;
};

}  // namespace Velk
