// "Configure Keyboard": one radio button per keyboard layout the host offers.
// Space moves the mark to the layout under the cursor; Enter applies the
// marked layout (records it and loads its key mappings), Esc leaves.
#pragma once

#include <string>
#include <vector>

#include "Dialog.hpp"
#include "ItemList.hpp"
#include "RadioItem.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

class KeyboardDialog : public Dialog {
public:
    explicit KeyboardDialog(Frame* parent);
    ~KeyboardDialog() override;

    // 1 after a layout was applied, 0 on Esc.
    int Run() override;

private:
    QelCtl::System::SystemInfoImpl _systemInfo;
    std::vector<std::string> _layouts;
    std::vector<RadioItem*> _items;  // owned
    ItemList* _list;                 // owned by the window tree
    size_t _checkedIndex = 0;
};

}  // namespace Velk
