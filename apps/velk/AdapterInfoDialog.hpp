// "Adapter Details": one physical NIC's name, hardware label, MAC address,
// link status and the connections that use it. Enter closes it.
#pragma once

#include "Dialog.hpp"
#include "ManagementSwitch.hpp"
#include "TextArea.hpp"

namespace Velk {

class AdapterInfoDialog : public Dialog {
public:
    AdapterInfoDialog(Frame* parent, const Adapter& adapter);

    int Run() override;

    // The detail lines, one per property.
    static std::string DetailText(const Adapter& adapter);

private:
    Adapter _adapter;
    TextArea* _details;  // owned by the window tree
};

}  // namespace Velk
