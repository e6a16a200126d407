// Lookup of the virtual NIC that carries the host's management network.
#pragma once

#include <memory>

#include "hostctl/HostCtl.hpp"

namespace Velk {

// The management interface, or null when the host has none. Host-control
// failures are left to the caller.
std::unique_ptr<HostCtl::Network::QelNic> GetManagementInterface();

// Whether the management interface sits on a distributed-switch port.
bool IsManagementInterfaceOnDvs();

}  // namespace Velk
