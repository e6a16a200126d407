// The simulated host's network as the host's tools see it: booting the host,
// the hosts file that follows the host's name and management address, and
// which machines of the network answer the host.
//
// The network itself behaves like a host's: every uplink is cabled to one
// simulated physical network ("network/lan" in the state), whose VLANs may
// have a DHCP server, an IPv6 router sending router advertisements and a
// DHCPv6 server. A virtual NIC obtains its dynamic addresses from them when it
// is configured, renewed, enabled or when the host boots (see SimState.cpp
// for the fields of the state). The machines on each VLAN's segment and those
// beyond the routers answer pings and DNS queries; nothing is ever sent to a
// real network.
#pragma once

#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "hostctl/SimState.hpp"

namespace HostCtl::Lib {

// Boots the network of `state` (held in memory, named after `sim`'s file in
// errors): the running DNS and routing configuration is the saved one, the
// kernel has IPv6 when it was switched on for this boot, and every enabled
// virtual NIC is configured anew (DHCP leases, router advertisements,
// DHCPv6). Throws HostCtlException for a state of the wrong shape; `state` may
// then be half changed.
void BootNetwork(const SimState& sim, nlohmann::json& state);

// Boots the simulated host in `root`: its network as BootNetwork does and the
// power state "on" in one locked update, then the hosts file. Throws
// HostCtlException (the state file unchanged) when the state is missing or
// malformed.
void BootSimulatedHost(const std::string& root);

// The host's own line of the hosts file, "<address>\t<fqdn> <short name>"
// (just "<address>\t<name>" without a domain), or "" when the management
// interface has no IPv4 address (or the state does not tell).
std::string HostsFileEntry(const nlohmann::json& state);

// What answers `target` (an IPv4 or IPv6 address) from the virtual NIC `vnic`
// in the simulated network of `state`: the machine's entry ("delayMs",
// "dns", ...), an empty object for one of the interface's own addresses, or
// null when nothing answers. The rules: the interface has link, and the
// target is one of its addresses; or a machine of its VLAN's segment
// ("network/lan/<vlan>/hosts") that an address of the interface reaches
// (IPv4: the same subnet; IPv6: any address for a link-local target, a global
// address otherwise); or a machine beyond the routers ("network/remote") when
// the default gateway of the target's family is reached that way. Throws
// HostCtlException for an unknown interface, a target that is no address, or
// a state of the wrong shape.
nlohmann::json ReachableHost(const SimState& sim, const nlohmann::json& state, const std::string& vnic,
                             const std::string& target);

// Makes the simulated network's DNS zone ("network/dnsZone") answer the host's
// fully qualified name with its management IPv4 address, as the network's
// administrators registered it when the host was installed; without such an
// address the name is not in the zone.
void RegisterHostInDnsZone(nlohmann::json& state);

// Rewrites ROOT/etc/hosts (temporary file, flush, rename) so that it holds the
// host's own line for `state`: lines naming the host by one of its names, now
// or in `formerNames`, are replaced by that line (or dropped when there is
// none); the loopback lines and every other line stay as they are. A missing
// file is created. Throws HostCtlException naming the file on failure.
void SyncHostsFile(const std::string& root, const nlohmann::json& state,
                   const std::vector<std::string>& formerNames = {});

}  // namespace HostCtl::Lib
