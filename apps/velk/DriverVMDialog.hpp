// "DriverVM Configuration": the devices the driver VM can take over, checked
// when it owns them. Devices of one group change owner together.
#pragma once

#include <vector>

#include "CheckItem.hpp"
#include "Dialog.hpp"
#include "ItemList.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

class DriverVMDialog : public Dialog {
public:
    explicit DriverVMDialog(Frame* parent);
    ~DriverVMDialog() override;

    // 1 when the ownership was written to the host, 0 when cancelled.
    int Run() override;

private:
    // Toggles the current device and the other devices of its group; warns
    // first when the group holds other devices whose owner changes.
    void ToggleCurrent();
    void Draw();

    std::vector<QelCtl::Hardware::DriverVmDevice> _devices;
    std::vector<CheckItem*> _items;
    ItemList* _list;
};

}  // namespace Velk
