// The standard switch that carries the management network, and the host's
// physical NICs as the adapter screens show them: which switch uses which
// NIC, and the rewrite of the management switch's team. Every host-control
// failure is logged with its own text and the exception's; reads that fail
// leave their result as far as it was read.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "hostctl/HostCtl.hpp"

namespace Velk {

// The port group of the management interface and the standard switch that
// holds it.
struct ManagementPort {
    std::string switchName;
    std::string portGroup;
};

// A physical NIC with what the adapter list shows of it.
struct Adapter {
    std::string name;
    std::string label;  // the PCI device's hardware label, may be empty
    std::string mac;
    bool connected = false;
    std::vector<std::string> usedBy;  // switches that use the NIC as an uplink

    // Used by a connection other than `switchName`.
    bool IsUsedElsewhere(const std::string& switchName) const;
};

// Receives one failure line ("Getting uplinks failed: ..."), already logged.
using FailureReport = std::function<void(const std::string&)>;

// Finds the management interface's port group and standard switch through
// its connection point. False (after logging why) when the interface is not
// on a port group of a standard switch.
bool FindManagementPort(const HostCtl::Network::QelNic& mgmt, ManagementPort& port);

// The uplinks of the switch in team order: active ones, then standby ones.
// Throws HostCtlException.
std::vector<std::string> ReadTeam(const std::string& switchName);

// Every physical NIC of the host with the switches that use it.
std::vector<Adapter> ReadAdapters();

// Makes `adapters` (team order) the team of the management switch: NICs that
// leave are removed from it; NICs that join are first taken off the switches
// that use them, then appended as active uplinks while the policy allows more
// active ones, else as standby. Then, when the management interface carries
// the MAC address of a former first uplink, it takes the new first uplink's.
// Each failure goes to `fail`, and the rest goes on; but when a NIC cannot be
// added, the teams this call changed are put back as they were.
void WriteTeam(const ManagementPort& port, HostCtl::Network::QelNic& mgmt,
               const std::vector<std::string>& adapters, const FailureReport& fail);

}  // namespace Velk
