// A check box: "[X] label" or "[ ] label", after `indent` blanks.
#pragma once

#include <string>

#include "LabelItem.hpp"

namespace Velk {

class CheckItem : public LabelItem {
public:
    CheckItem(const std::string& label, bool checked, int indent = 0);
    ~CheckItem() override;

    bool IsChecked() const { return _checked; }
    void SetChecked(bool checked);
    const std::string& GetLabel() const { return _label; }

private:
    void Rebuild();

    bool _checked;
    std::string _label;
    int _indent;
};

}  // namespace Velk
