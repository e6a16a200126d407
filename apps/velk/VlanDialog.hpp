// "VLAN (optional)": the VLAN ID of the management network's port group, one
// field of up to five digits. Empty means no VLAN; 1 to 4095 are accepted,
// 4095 (all VLANs) only after a warning.
#pragma once

#include <cstdint>
#include <string>

#include "Dialog.hpp"
#include "InputItem.hpp"
#include "ItemList.hpp"

namespace Velk {

class VlanDialog : public Dialog {
public:
    VlanDialog(Frame* parent, uint16_t vlanId);
    ~VlanDialog() override;

    // true for OK (GetVlanId then holds the entered value), false for Esc.
    int Run() override;
    // The entered number, 0 when the field is empty.
    uint16_t GetVlanId() const;

    // How Enter takes the field's text.
    enum class Entry {
        Unset,     // empty: no VLAN
        Invalid,   // not a number from 1 to 4095
        Accepted,  // 1 to 4094
        AllVlans,  // 4095: accepted once the warning was shown
    };
    static Entry CheckText(const std::string& text);
    // The keys the field takes: digits and the editing keys.
    static bool IsFieldKey(int key);

private:
    void Draw();
    // Checks the field; true when the dialog may end with OK.
    bool Accept();

    InputItem* _field;
    ItemList* _list;
    uint16_t _vlanId;
};

}  // namespace Velk
