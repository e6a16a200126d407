#include "RestoreDvsDialog.hpp"

#include "ManagementInterface.hpp"
#include "StringFactory.hpp"

namespace Velk {

using HostCtl::Lib::HostCtlException;
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

void RestoreDvsDialog::ReadManagementPort() {
    _mgmtIntf = GetManagementInterface();
    if (!_mgmtIntf) throw HostCtlException("there is no management interface");
    const ConnectionPoint point = _mgmtIntf->GetConnectionPoint();
    if (point.GetType() != ConnectionPoint::DvsPort)
        throw HostCtlException("the management interface is not on a distributed switch");
    _dvsName = point.GetSwitchName();
    _portKey = point.GetName();
}

}  // namespace Velk
