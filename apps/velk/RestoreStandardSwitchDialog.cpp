#include "RestoreStandardSwitchDialog.hpp"

#include <algorithm>

#include "MessageDialog.hpp"
#include "StringFactory.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

using HostCtl::Network::ConnectionPoint;
using HostCtl::Network::DistributedSwitch;
using HostCtl::Network::QelNic;
using HostCtl::Network::VirtualSwitch;

namespace {

const char* const PORT_GROUP = "Management Network";

bool Contains(const std::vector<std::string>& list, const std::string& name) {
    return std::find(list.begin(), list.end(), name) != list.end();
}

}  // namespace

RestoreStandardSwitchDialog::RestoreStandardSwitchDialog(Frame* parent)
    : SwitchRestoreDialog(parent, 20, 7) {}

std::string RestoreStandardSwitchDialog::FreeName(const std::vector<std::string>& taken,
                                                  const std::string& base, int first) {
    for (int n = first;; ++n)
        if (!Contains(taken, base + std::to_string(n))) return base + std::to_string(n);
}

int RestoreStandardSwitchDialog::Run() {
    if (!Confirm(_factory->GetString(138), _factory->GetString(139), _factory->GetString(140))) return false;
    bool moved = Step(_factory->GetString(274), [this] { ReadManagementNetwork(); });
    if (moved) {
        const std::string& name = _mgmtIntf->GetName();
        moved = Step(_factory->GetString(275) + _switchName + ".", [this] { CreateSwitch(); }) &&
                Step(_factory->GetString(276) + _portGroup + ".", [this] { AddPortGroup(); }) &&
                MoveUplinks() && Step(_factory->GetString(278) + name + ".", [this] { MoveInterface(); }) &&
                Step(_factory->GetString(279), [this] { DisableOtherInterfaces(); });
        if (!moved) Undo();
    }
    if (_noUplinks) MessageDialog(this, 205, 206).Execute();
    Finish("Restoring standard switch",
           "@&!*@*@(obz.user.velk.standard.switch.restored)Restoring standard switch");
    return moved;
}

// What the new switch takes over: the distributed port's VLAN and the
// distributed switch's uplinks on this host; and free names for the switch
// and its port group.
void RestoreStandardSwitchDialog::ReadManagementNetwork() {
    _portKey = ReadDvsPort().GetName();
    _vlanId = DistributedSwitch(_dvsName).GetPortVlanId(_portKey);
    _uplinks = ReadHostUplinks();
    if (_uplinks.empty()) {
        _noUplinks = true;
        throw HostCtl::Lib::HostCtlException("no uplink of " + _dvsName + " is on this host");
    }

    QelCtl::Network::VirtualSwitchInfoImpl switches;
    const std::vector<std::string> names = switches.GetVirtualSwitchNames();
    _switchName = FreeName(names, "kSwitch", 0);
    std::vector<std::string> portGroups;
    for (const std::string& name : names) {
        for (const std::string& group : VirtualSwitch(name).GetPortGroupNames()) portGroups.push_back(group);
    }
    _portGroup = PORT_GROUP;
    // A port group of that name elsewhere: this is the second one.
    if (Contains(portGroups, _portGroup)) _portGroup = FreeName(portGroups, std::string(PORT_GROUP) + " ", 2);
}

void RestoreStandardSwitchDialog::CreateSwitch() {
    QelCtl::Network::VirtualSwitchInfoImpl().AddVirtualSwitch(_switchName);
    // Its port group and any uplink still on it go with it.
    const std::string name = _switchName;
    AddUndo("Removing standard switch " + name,
            [name] { QelCtl::Network::VirtualSwitchInfoImpl().RemoveVirtualSwitch(name); });
    _maxActive = VirtualSwitch(_switchName).GetMaxActiveUplinks();
}

void RestoreStandardSwitchDialog::AddPortGroup() {
    VirtualSwitch(_switchName).AddPortGroup(_portGroup, _vlanId);
}

// One step per NIC, active ones while the switch allows more, then standby.
bool RestoreStandardSwitchDialog::MoveUplinks() {
    unsigned active = 0;
    for (const DistributedSwitch::UplinkPort& port : _uplinks) {
        const bool standby = active >= _maxActive;
        if (!Step(_factory->GetString(277) + port.pnic + ".", [&] { MoveUplink(port, standby); }))
            return false;
        if (!standby) ++active;
    }
    return true;
}

// The NIC can be on one switch only: it leaves the distributed switch, and
// goes back to its uplink port when the new switch does not take it.
void RestoreStandardSwitchDialog::MoveUplink(const DistributedSwitch::UplinkPort& port, bool standby) {
    DistributedSwitch(_dvsName).RemoveUplink(port.pnic);
    auto added = std::make_shared<bool>(false);
    const std::string dvs = _dvsName, vswitch = _switchName;
    AddUndo("Putting uplink " + port.pnic + " back on " + dvs, [dvs, vswitch, port, added] {
        if (*added) VirtualSwitch(vswitch).RemoveUplinkFromTeamingPolicy(port.pnic);
        DistributedSwitch(dvs).AddUplink(port.key, port.pnic);
    });
    VirtualSwitch(_switchName).AddUplinkToTeamingPolicy(port.pnic, standby);
    *added = true;
}

// The interface keeps its IP configuration; the restart makes it obtain its
// addresses on the new switch.
void RestoreStandardSwitchDialog::MoveInterface() {
    const std::string name = _mgmtIntf->GetName();
    _mgmtIntf->SetConnectionPoint(ConnectionPoint(ConnectionPoint::PortGroup, _portGroup));
    const ConnectionPoint back(ConnectionPoint::DvsPort, _portKey);
    AddUndo("Moving management interface " + name + " back to port " + _portKey + " of " + _dvsName,
            [name, back] { QelNic(name).SetConnectionPoint(back); });
    _mgmtIntf->Disable();
    // Once the uplinks are back, the interface obtains its addresses anew on
    // its old port.
    AddUndo(
        "Restarting management interface " + name, [name] { QelNic(name).Restart(); }, true);
    _mgmtIntf->Enable();
}

void RestoreStandardSwitchDialog::DisableOtherInterfaces() {
    for (const std::string& name : QelCtl::Network::NetworkInfoImpl().GetVirtualNicNames()) {
        if (name == _mgmtIntf->GetName()) continue;
        QelNic(name).Disable();
        AddUndo("Enabling interface " + name, [name] { QelNic(name).Enable(); });
    }
}

}  // namespace Velk
