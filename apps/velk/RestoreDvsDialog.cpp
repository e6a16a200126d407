#include "RestoreDvsDialog.hpp"

#include "StringFactory.hpp"

namespace Velk {

using HostCtl::Network::ConnectionPoint;

RestoreDvsDialog::RestoreDvsDialog(Frame* parent) : SwitchRestoreDialog(parent, 21, 11) {}

int RestoreDvsDialog::Run() {
    if (!Confirm(_factory->GetString(69), _factory->GetString(72),
                 "Create a new host local port and move the management network to it?"))
        return false;
    const bool moved =
        Step("Reading the management port.", [this] { ReadManagementPort(); }) &&
        Step("Creating host local port on " + _dvsName + ".",
             [this] {
                 _newPortKey = HostCtl::Network::DistributedSwitch(_dvsName).AddHostLocalPort(_portKey);
             }) &&
        Step("Moving management interface " + _mgmtIntf->GetName() + " to port " + _newPortKey + ".", [this] {
            _mgmtIntf->SetConnectionPoint(ConnectionPoint(ConnectionPoint::DvsPort, _newPortKey));
            _mgmtIntf->Restart();
        });
    Finish("Restoring kDS port", "@&!*@*@(obz.user.velk.kds.port.restored)Restoring kDS port");
    return moved;
}

void RestoreDvsDialog::ReadManagementPort() { _portKey = ReadDvsPort().GetName(); }

}  // namespace Velk
