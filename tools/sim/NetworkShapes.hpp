// Variations of a new simulated host's network ("velk-simhost create
// --network single-nic,static"): each changes the configuration of the
// default host or of its physical network, and the host's network is then
// booted, so that its addresses are the ones the network rules give.
#pragma once

#include <nlohmann/json.hpp>
#include <string>
#include <vector>

namespace VelkTools {

// The shapes, in the order they are applied:
//   single-nic  only zonic0
//   dvs         the management interface on port "100" of the distributed
//               switch "kDS-1", whose uplinks are zonic0 and zonic1 (those of
//               them the host has), VLAN 0; kSwitch0 keeps neither
//   ipv4-off    the management interface without IPv4
//   ipv6-off    IPv6 off in the kernel and for the next boot
//   no-dhcp     no DHCP server on VLAN 0
//   static      static 192.0.2.10/255.255.255.0, gateway 192.0.2.1, DNS
//               192.0.2.53, no DNS from DHCP
const std::vector<std::string>& NetworkShapeNames();

// The shapes named in "SHAPE[,SHAPE...]", added to `shapes` (once each).
// Throws std::runtime_error for an unknown or empty name.
void ParseNetworkShapes(const std::string& text, std::vector<std::string>& shapes);

// Applies the shapes to a host state (the default one) and boots its network.
// Throws std::runtime_error for shapes that exclude each other (ipv4-off and
// static) and HostCtlException for a state the network cannot boot.
void ApplyNetworkShapes(nlohmann::json& state, const std::vector<std::string>& shapes);

}  // namespace VelkTools
