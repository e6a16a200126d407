// A radio button: "(o) label" or "( ) label". The dialog keeps one of a group
// selected.
#pragma once

#include <string>

#include "LabelItem.hpp"

namespace Velk {

class RadioItem : public LabelItem {
public:
    RadioItem(const std::string& label, bool selected);
    ~RadioItem() override;

    bool IsSelected() const { return _selected; }
    void SetSelected(bool selected);
    const std::string& GetLabel() const { return _label; }

private:
    void Rebuild();

    bool _selected;
    std::string _label;
};

}  // namespace Velk
