// The simulated host's network as the host's tools see it: booting the host,
// and the hosts file that follows the host's name and management address.
//
// The network itself behaves like a host's: every uplink is cabled to one
// simulated physical network ("network/lan" in the state), whose VLANs may
// have a DHCP server, an IPv6 router sending router advertisements and a
// DHCPv6 server. A virtual NIC obtains its dynamic addresses from them when it
// is configured, renewed, enabled or when the host boots (see SimState.cpp
// for the fields of the state).
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

// Rewrites ROOT/etc/hosts (temporary file, flush, rename) so that it holds the
// host's own line for `state`: lines naming the host by one of its names, now
// or in `formerNames`, are replaced by that line (or dropped when there is
// none); the loopback lines and every other line stay as they are. A missing
// file is created. Throws HostCtlException naming the file on failure.
void SyncHostsFile(const std::string& root, const nlohmann::json& state,
                   const std::vector<std::string>& formerNames = {});

}  // namespace HostCtl::Lib
