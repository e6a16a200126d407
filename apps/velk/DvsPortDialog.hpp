// The properties of the host-local port that "Restore kDS" creates: its VLAN
// (checked as in the VLAN dialog, but without the VLAN of all VLANs), whether
// the port is unblocked, and the uplinks its traffic may use (chosen in
// "kDS Uplinks"). Filled in from the management port as it is.
#pragma once

#include <string>
#include <vector>

#include "CheckItem.hpp"
#include "Dialog.hpp"
#include "InputItem.hpp"
#include "ItemList.hpp"
#include "LabelItem.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class DvsPortDialog : public Dialog {
public:
    using PortSettings = HostCtl::Network::DistributedSwitch::PortSettings;
    using UplinkPort = HostCtl::Network::DistributedSwitch::UplinkPort;

    // `present`: the management port's properties; `ports`: the uplink ports
    // this host backs.
    DvsPortDialog(Frame* parent, const PortSettings& present, const std::vector<UplinkPort>& ports);
    ~DvsPortDialog() override;

    // true for OK (GetSettings then holds the new port's properties), false
    // for Esc.
    int Run() override;
    const PortSettings& GetSettings() const { return _settings; }

private:
    enum Row { VLAN_ROW, UNBLOCK_ROW, UPLINKS_ROW };

    void Draw();
    std::string UplinksText() const;
    void ChooseUplinks();
    // Checks the VLAN field; true when the dialog may end with OK.
    bool Accept();

    PortSettings _present;
    PortSettings _settings;
    std::vector<UplinkPort> _ports;
    InputItem* _vlan;
    CheckItem* _unblock;
    LabelItem* _uplinks;
    ItemList* _list;
};

}  // namespace Velk
