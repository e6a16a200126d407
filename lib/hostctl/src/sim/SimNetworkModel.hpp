// The rules of the simulated host's network, applied to a state held in
// memory. The simulated backend runs them inside its locked updates; booting
// and creating a host run the same code, so every state they leave is one the
// rules could have produced.
#pragma once

#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "hostctl/HostCtl.hpp"
#include "hostctl/QelCtl.hpp"
#include "hostctl/SimState.hpp"

namespace HostCtl::Lib {

// Questions about the network part of a state. Lookups by name answer JSON
// pointers into the state and throw HostCtlException when nothing has the
// name; fields of the wrong shape throw errors naming the state file and the
// field.
class NetworkView {
public:
    NetworkView(const SimState& sim, const nlohmann::json& state) : _sim(sim), _view(state) {}

    std::string VnicPointer(const std::string& vnic) const;
    std::string PnicPointer(const std::string& pnic) const;
    std::string VswitchPointer(const std::string& vswitch) const;
    std::string PortGroupPointer(const std::string& vswitchPointer, const std::string& portGroup) const;
    std::string DvsPointer(const std::string& dvs) const;
    std::string DvsPortPointer(const std::string& dvsPointer, const std::string& port) const;

    // The switch that holds a connection point (ConnectionPoint::Type and its
    // name); throws when none does or the type has no switch on the host.
    std::string ConnectionPointSwitch(int type, const std::string& name) const;
    // The standard or distributed switch the NIC is attached to, or "".
    std::string SwitchOfPnic(const std::string& pnic) const;

    // Whether the virtual NIC is enabled and its switch has a teaming uplink
    // (or a distributed uplink port) whose NIC has link.
    bool HasLink(const std::string& vnicPointer) const;
    // The physical NICs the virtual NIC's traffic may leave by: the teaming
    // policy's active then standby uplinks of its port group's switch, or the
    // NICs behind the uplink ports its distributed port may use.
    std::vector<std::string> Uplinks(const std::string& vnicPointer) const;
    // Who else on the virtual NIC's VLAN segment holds `address`: a machine
    // of the segment (its "name", or a description without one), the
    // segment's router, or another client's DHCP lease (its MAC address);
    // "" when nobody does or the interface has no link to ask on.
    std::string Holder(const std::string& vnicPointer, const Network::IpAddress& address) const;
    // The checks of the virtual NIC after a change of its network, in order:
    // link of its uplinks, its addresses (present, not held by another
    // machine), the default gateways, the name servers (a warning when one
    // does not answer).
    std::vector<QelCtl::Network::NetworkCheck> Checks(const std::string& vnicPointer) const;
    // The VLAN of the virtual NIC's port group or distributed port, or -1
    // when it is connected to neither.
    int Vlan(const std::string& vnicPointer) const;

    // The machine that answers `target` from the virtual NIC: its entry in
    // "network/lan/<vlan>/hosts" or "network/remote" (an empty object for one
    // of the interface's own addresses), or null when nothing answers. The
    // interface needs link; a machine of its VLAN answers when the interface
    // has an address of the target's kind that reaches it (IPv4: the same
    // subnet; IPv6: any address for a link-local target, a global one
    // otherwise), a remote machine when the default gateway of its family
    // answers that way.
    const nlohmann::json* Reach(const std::string& vnicPointer, const Network::IpAddress& target) const;
    // The host resolver: the hosts file of the host's root first (a line
    // naming `name`, letter case aside), else the DNS zone of the simulated
    // network ("network/dnsZone"), asked through the first configured name
    // server that is a DNS server answering from the management interface.
    // Names without a dot are also tried with each search domain there.
    // Empty when the name does not resolve.
    std::vector<Network::IpAddress> Resolve(const std::string& name) const;

protected:
    // The pointer of the member of `list` whose "name" (or `key`) is `name`,
    // or "" when none is.
    std::string Find(const std::string& list, const std::string& name, const char* key = "name") const;
    bool PnicHasLink(const std::string& pnic) const;
    // Whether the virtual NIC is on a distributed port that passes nothing.
    bool PortBlocked(const std::string& vnicPointer) const;
    // The entry of `target` in the object of machines at `pointer` (keyed by
    // address), or null.
    const nlohmann::json* Machine(const std::string& pointer, const Network::IpAddress& target) const;
    bool IsOwnAddress(const std::string& vnicPointer, const Network::IpAddress& target) const;
    // The machine of the interface's VLAN segment that its addresses reach.
    const nlohmann::json* OnSegment(const std::string& vnicPointer, const Network::IpAddress& target) const;
    std::vector<Network::IpAddress> FromHostsFile(const std::string& name) const;
    std::vector<Network::IpAddress> FromDns(const std::string& name) const;

    const SimState& _sim;
    const nlohmann::json& _view;
};

// The network's changes. Each leaves the state as the host would be after it:
// addresses that are obtained from the simulated physical network are
// obtained (or lost) at once.
class NetworkModel : public NetworkView {
public:
    NetworkModel(const SimState& sim, nlohmann::json& state) : NetworkView(sim, state), _state(state) {}

    // Configures the interface anew from its configuration: static addresses
    // as configured, a DHCP lease, the link-local address, router-advertised
    // and DHCPv6 addresses obtained as far as the interface is up, has link
    // and the network answers. A disabled interface keeps only its static
    // addresses.
    void Configure(const std::string& vnicPointer);
    // Asks the DHCP servers again (DHCPv4 and, with IPv6, DHCPv6, as far as
    // the interface uses them); throws when it uses neither.
    void RenewLeases(const std::string& vnicPointer);
    // Takes the configuration (only the static IPv6 entries of its address
    // list) and configures the interface with it.
    void SetIpConfig(const std::string& vnicPointer, const Network::IpConfig& config);
    void SetMac(const std::string& vnicPointer, const std::string& mac);
    void SetEnabled(const std::string& vnicPointer, bool enabled);
    // Running DNS and routing from the saved ones, IPv6 as chosen for this
    // boot, every virtual NIC configured anew.
    void Boot();

    void AddUplink(const std::string& vswitch, const std::string& pnic, bool standby);
    void RemoveUplink(const std::string& vswitch, const std::string& pnic);
    void SetPortGroupVlan(const std::string& vswitch, const std::string& portGroup, unsigned vlan);
    void RemoveDvsUplink(const std::string& dvs, const std::string& pnic);
    // The NIC backs the free uplink port again; a NIC of any switch is refused.
    void AddDvsUplink(const std::string& dvs, const std::string& uplinkPort, const std::string& pnic);

    // Connects the interface to a port group of a standard switch (type 1)
    // or to a free port of a distributed switch (type 2), whose connectee
    // follows. Its IP configuration and addresses stay: the new network is
    // seen when the interface is configured, renewed or enabled next.
    void SetConnectionPoint(const std::string& vnicPointer, int type, const std::string& name);
    // A standard switch without uplinks or port groups.
    void AddVirtualSwitch(const std::string& vswitch);
    // Refused while a virtual NIC is connected to one of its port groups.
    void RemoveVirtualSwitch(const std::string& vswitch);
    // Port group names are unique on the host.
    void AddPortGroup(const std::string& vswitch, const std::string& portGroup, unsigned vlan);
    // A port that lives on this host only, with a new key, the given
    // properties and nothing connected; returns the key. Its uplinks must be
    // uplink ports of the switch.
    std::string AddDvsHostLocalPort(const std::string& dvs,
                                    const Network::DistributedSwitch::PortSettings& settings);
    // Refused for a port that is not host-local or that a virtual NIC uses.
    void RemoveDvsHostLocalPort(const std::string& dvs, const std::string& port);
    // Removes every virtual NIC, standard and distributed switch, the
    // management interface name, the default gateways and the name servers
    // (running and saved); refused while the network core dump sender is
    // enabled on an interface.
    void ClearConfig();
    // On a clear network: the network of a freshly installed host
    // ("network/factory"), a standard switch on the first NIC with link, its
    // management port group and interface (that NIC's MAC, DHCP with DNS,
    // router advertisements), configured at once.
    void AutoConfig();

private:
    nlohmann::json& At(const std::string& pointer);
    // The object at `pointer`; throws the state's error when it is missing or
    // no object.
    nlohmann::json& Object(const std::string& pointer);
    std::string Mac(const std::string& vnicPointer) const;
    // The pointer of a server of the VLAN ("dhcp", "routerAdvertisement",
    // "dhcpv6"), or "" when the VLAN has none.
    std::string Server(int vlan, const char* kind) const;
    void LeaseIpv4(const std::string& vnicPointer);
    // The IPv6 addresses the interface holds now, built from scratch.
    nlohmann::json Ipv6Addresses(const std::string& vnicPointer);
    // The DHCPv6 lease of the interface, added to `addresses` when there is one.
    void LeaseIpv6(const std::string& vnicPointer, nlohmann::json& addresses);

    nlohmann::json& _state;
};

}  // namespace HostCtl::Lib
