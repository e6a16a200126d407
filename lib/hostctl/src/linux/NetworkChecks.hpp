// Whether a host's network works, asked of the link itself: an ARP probe for
// an address before it is set, and after a change the uplinks' carrier, the
// addresses' duplicate detection, the gateways' answers (the kernel's own
// neighbour resolution) and the name servers' answers. Every function is
// bounded; nothing is sent beyond the interface's link but the name
// servers' queries.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "hostctl/QelCtl.hpp"

namespace HostCtl::Lib::Linux {

using NetworkCheck = QelCtl::Network::NetworkCheck;

// An address in the kernel's canonical text ("2001:db8::a" for
// "2001:0db8::000a"); the text itself when it is no address.
std::string CanonicalAddress(const std::string& address);

// Asks the link of `iface` whether any machine uses the IPv4 `address`: ARP
// probes with the sender address 0.0.0.0, which no machine's cache takes
// in. Returns the MAC of the machine that answered, or nothing after about
// 1.5 s without an answer. Throws HostCtlException when the interface
// cannot send.
std::optional<std::string> ProbeIpv4(const std::string& iface, const std::string& address);

// The carrier of each physical uplink ("link of eno1"), waiting up to 2 s
// for one that has none yet (a NIC just brought up negotiates first). An
// uplink without carrier fails when no uplink has one, and is a warning
// when another one carries the traffic. No uplink at all fails as "link of
// `iface`".
std::vector<NetworkCheck> CheckLinks(const std::string& iface, const std::vector<std::string>& uplinks);

// The addresses of `iface` ("address 192.0.2.10"): each of `wanted` must be
// there, an IPv4 lease too when `dhcp4`, and no address may be a duplicate.
// Waits (bounded) while the duplicate detection of those runs; the
// addresses the kernel makes itself are judged only once theirs has ended.
std::vector<NetworkCheck> CheckAddresses(const std::string& iface, const std::vector<std::string>& wanted,
                                         bool dhcp4);

// Whether the gateway (IPv4 or IPv6, link-local ones too) answers on the
// link of `iface` ("gateway 192.0.2.1"): its neighbour entry is dropped,
// one empty UDP datagram bound to the interface makes the kernel resolve it
// again, and the entry tells whether the gateway answered (about 3 s when
// it does not).
NetworkCheck CheckGateway(const std::string& iface, const std::string& gateway);

// Whether the name server answers a query for `name` ("name server
// 192.0.2.53"): 1 s per try, 2 tries. A server that does not answer is a
// warning, never a failure.
NetworkCheck CheckNameServer(const std::string& server, const std::string& name);

}  // namespace HostCtl::Lib::Linux
