#include "RestoreStandardSwitchDialog.hpp"

#include <algorithm>

#include "StringFactory.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

using HostCtl::Network::ConnectionPoint;

namespace {

const char* const PORT_GROUP = "Management Network";

bool Contains(const std::vector<std::string>& list, const std::string& name) {
    return std::find(list.begin(), list.end(), name) != list.end();
}

std::string Joined(const std::vector<std::string>& names) {
    std::string text;
    for (const std::string& name : names) text += (text.empty() ? "" : ", ") + name;
    return text;
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
    const bool moved =
        Step("Reading the management network.", [this] { ReadManagementNetwork(); }) &&
        Step("Creating standard switch " + _switchName + " with port group " + _portGroup + ".",
             [this] { CreateSwitch(); }) &&
        Step(_uplinks.empty() ? "No uplink to move." : "Moving uplinks " + Joined(_uplinks) + ".",
             [this] { MoveUplinks(); }) &&
        Step("Moving management interface " + _mgmtIntf->GetName() + ".", [this] { MoveInterface(); }) &&
        Step("Disabling other interfaces.", [this] { DisableOtherInterfaces(); });
    Finish("Restoring standard switch",
           "@&!*@*@(obz.user.velk.standard.switch.restored)Restoring standard switch");
    return moved;
}

// What the new switch takes over: the distributed port's VLAN and the
// distributed switch's uplinks; and free names for the switch and its port
// group.
void RestoreStandardSwitchDialog::ReadManagementNetwork() {
    const ConnectionPoint point = ReadDvsPort();
    HostCtl::Network::DistributedSwitch dvs(_dvsName);
    _vlanId = dvs.GetPortVlanId(point.GetName());
    _uplinks = dvs.GetUsedUplinks();

    QelCtl::Network::VirtualSwitchInfoImpl switches;
    const std::vector<std::string> names = switches.GetVirtualSwitchNames();
    _switchName = FreeName(names, "kSwitch", 0);
    std::vector<std::string> portGroups;
    for (const std::string& name : names) {
        for (const std::string& group : HostCtl::Network::VirtualSwitch(name).GetPortGroupNames())
            portGroups.push_back(group);
    }
    _portGroup = PORT_GROUP;
    // A port group of that name elsewhere: this is the second one.
    if (Contains(portGroups, _portGroup)) _portGroup = FreeName(portGroups, std::string(PORT_GROUP) + " ", 2);
}

void RestoreStandardSwitchDialog::CreateSwitch() {
    QelCtl::Network::VirtualSwitchInfoImpl().AddVirtualSwitch(_switchName);
    HostCtl::Network::VirtualSwitch(_switchName).AddPortGroup(_portGroup, _vlanId);
}

void RestoreStandardSwitchDialog::MoveUplinks() {
    HostCtl::Network::DistributedSwitch dvs(_dvsName);
    HostCtl::Network::VirtualSwitch vswitch(_switchName);
    const unsigned maxActive = vswitch.GetMaxActiveUplinks();
    unsigned active = 0;
    for (const std::string& nic : _uplinks) {
        dvs.RemoveUplink(nic);
        const bool standby = active >= maxActive;
        vswitch.AddUplinkToTeamingPolicy(nic, standby);
        if (!standby) ++active;
    }
}

// The interface keeps its IP configuration; the restart makes it obtain its
// addresses on the new switch.
void RestoreStandardSwitchDialog::MoveInterface() {
    _mgmtIntf->SetConnectionPoint(ConnectionPoint(ConnectionPoint::PortGroup, _portGroup));
    _mgmtIntf->Restart();
}

void RestoreStandardSwitchDialog::DisableOtherInterfaces() {
    for (const std::string& name : QelCtl::Network::NetworkInfoImpl().GetVirtualNicNames())
        if (name != _mgmtIntf->GetName()) HostCtl::Network::QelNic(name).Disable();
}

}  // namespace Velk
