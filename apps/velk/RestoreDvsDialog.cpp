#include "RestoreDvsDialog.hpp"

#include <syslog.h>

#include "DvsPortDialog.hpp"
#include "MessageDialog.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

using HostCtl::Lib::HostCtlException;
using HostCtl::Lib::Syslog;
using HostCtl::Network::ConnectionPoint;
using HostCtl::Network::DistributedSwitch;
using HostCtl::Network::QelNic;

RestoreDvsDialog::RestoreDvsDialog(Frame* parent) : SwitchRestoreDialog(parent, 21, 11) {}

int RestoreDvsDialog::Run() {
    SetTitle(_factory->GetString(69));
    SetDescription(_factory->GetString(72));
    Refresh();

    // The port's present properties fill in the dialog; the uplinks on
    // offer are those this host backs.
    DistributedSwitch::PortSettings present;
    std::vector<DistributedSwitch::UplinkPort> uplinks;
    try {
        _portKey = ReadDvsPort().GetName();
        present = DistributedSwitch(_dvsName).GetPortSettings(_portKey);
        uplinks = ReadHostUplinks();
    } catch (const HostCtlException& e) {
        Syslog(LOG_ERR, "Reading the management port failed: %s", e.what());
        MessageDialog(this, 197, 198).Execute();
        return false;
    }
    if (uplinks.empty()) {
        Syslog(LOG_ERR, "No uplink of %s is on this host", _dvsName.c_str());
        MessageDialog(this, 205, 206).Execute();
        return false;
    }
    DvsPortDialog properties(this, present, uplinks);
    if (!properties.Execute()) return false;
    const DistributedSwitch::PortSettings settings = properties.GetSettings();

    const bool moved =
        Step(_factory->GetString(281) + _dvsName + ".", [&] { CreatePort(settings); }) &&
        Step(_factory->GetString(278) + _mgmtIntf->GetName() + ".", [this] { MoveInterface(); });
    if (moved)
        ShowAddress();
    else
        Undo();
    Finish("Restoring kDS port", "@&!*@*@(obz.user.velk.kds.port.restored)Restoring kDS port");
    if (!moved) MessageDialog(this, 197, 198).Execute();
    return moved;
}

void RestoreDvsDialog::CreatePort(const DistributedSwitch::PortSettings& settings) {
    DistributedSwitch dvs(_dvsName);
    _newPortKey = dvs.AddHostLocalPort(settings);
    Syslog(LOG_INFO, "Created port %s on %s with VLAN %u", _newPortKey.c_str(), _dvsName.c_str(),
           unsigned(settings.vlanId));
    const std::string dvsName = _dvsName, key = _newPortKey;
    AddUndo("Removing port " + key + " of " + dvsName,
            [dvsName, key] { DistributedSwitch(dvsName).RemoveHostLocalPort(key); });
}

// The restart makes the interface obtain its addresses through the new port.
void RestoreDvsDialog::MoveInterface() {
    const std::string name = _mgmtIntf->GetName();
    Syslog(LOG_INFO, "Moving management interface %s to port %s", name.c_str(), _newPortKey.c_str());
    _mgmtIntf->SetConnectionPoint(ConnectionPoint(ConnectionPoint::DvsPort, _newPortKey));
    const ConnectionPoint back(ConnectionPoint::DvsPort, _portKey);
    AddUndo("Moving management interface " + name + " back to port " + _portKey,
            [name, back] { QelNic(name).SetConnectionPoint(back); });
    _mgmtIntf->Disable();
    AddUndo(
        "Restarting management interface " + name, [name] { QelNic(name).Restart(); }, true);
    _mgmtIntf->Enable();
}

// What the interface obtained through its new port.
void RestoreDvsDialog::ShowAddress() {
    try {
        ShowLine(_factory->GetString(137) + _mgmtIntf->GetIpConfig().GetIpv4Address().GetStringAddress());
    } catch (const HostCtlException& e) {
        Syslog(LOG_ERR, "Reading the management interface's address failed: %s", e.what());
    }
}

}  // namespace Velk
