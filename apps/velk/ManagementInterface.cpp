#include "ManagementInterface.hpp"

#include <syslog.h>

#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

std::unique_ptr<HostCtl::Network::QelNic> GetManagementInterface() {
    QelCtl::Network::NetworkInfoImpl networkInfo;
    networkInfo.UpdateManagementInterface();
    return networkInfo.GetManagementInterface();
}

bool IsManagementInterfaceOnDvs() {
    try {
        std::unique_ptr<HostCtl::Network::QelNic> mgmt = GetManagementInterface();
        if (!mgmt) {
            HostCtl::Lib::Syslog(LOG_ERR, "Could not locate the management interface");
            return false;
        }
        return mgmt->GetConnectionPoint().GetType() == HostCtl::Network::ConnectionPoint::DvsPort;
    } catch (const HostCtl::Lib::HostCtlException& e) {
        HostCtl::Lib::Syslog(LOG_ERR, "Could not determine if a DVS was in use: %s", e.what());
        return false;
    }
}

}  // namespace Velk
