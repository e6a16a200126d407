// Value types and the exception of the host control library.
#pragma once

#include <cstdint>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

namespace HostCtl {

namespace Lib {

// Every failure of the library reaches the caller as this exception.
class HostCtlException : public std::runtime_error {
public:
    explicit HostCtlException(const std::string& what) : std::runtime_error(what) {}
};

}  // namespace Lib

namespace Network {

// An IPv4 address. Construction from text throws HostCtlException when the
// text is not a dotted quad.
class Ipv4Address {
public:
    Ipv4Address();  // 0.0.0.0
    explicit Ipv4Address(const std::string& text);
    static bool IsValidAddress(const std::string& text);
    std::string GetStringAddress() const;
    uint32_t GetHostOrder() const { return _addr; }
    static Ipv4Address FromHostOrder(uint32_t addr) {
        Ipv4Address a;
        a._addr = addr;
        return a;
    }
    bool IsZero() const { return _addr == 0; }
    // True for a netmask: ones from the top, then only zeros (0.0.0.0 and
    // 255.255.255.255 included).
    bool IsValidNetmask() const;
    bool operator==(const Ipv4Address&) const = default;

private:
    uint32_t _addr = 0;  // host byte order
};

// An IPv6 address, kept as 16 bytes; printed in its canonical short form.
class Ipv6Address {
public:
    Ipv6Address();  // ::
    explicit Ipv6Address(const std::string& text);
    static bool IsValidAddress(const std::string& text);
    std::string GetStringAddress() const;
    bool IsLinkLocal() const;  // fe80::/10
    bool IsZero() const;
    const uint8_t* Bytes() const { return _bytes; }
    bool operator==(const Ipv6Address&) const = default;

private:
    uint8_t _bytes[16] = {};
};

// Either kind of address (DNS servers mix both).
class IpAddress {
public:
    explicit IpAddress(const std::string& text);  // throws when neither kind
    bool IsIpv6() const { return _isV6; }
    std::string GetStringAddress() const;
    const Ipv4Address& V4() const { return _v4; }
    const Ipv6Address& V6() const { return _v6; }
    bool operator==(const IpAddress&) const = default;

private:
    bool _isV6 = false;
    Ipv4Address _v4;
    Ipv6Address _v6;
};

enum class Ipv6AddressType { Static = 0, Dhcp = 1, Autoconf = 2 };

// An IPv6 address with its prefix length and the way it was obtained.
class Ipv6Network {
public:
    Ipv6Network() = default;
    Ipv6Network(const Ipv6Address& addr, int prefix, Ipv6AddressType type = Ipv6AddressType::Static);
    // Parses "addr/prefix"; throws HostCtlException when invalid.
    explicit Ipv6Network(const std::string& text);
    static bool IsValidAddressAndNetmask(const std::string& text);
    const Ipv6Address& GetAddress() const { return _addr; }
    std::string GetStringAddress() const { return _addr.GetStringAddress(); }
    int GetPrefixLength() const { return _prefix; }
    Ipv6AddressType GetIpv6AddressType() const { return _type; }
    std::string ToString() const;  // "addr/prefix"
    bool operator==(const Ipv6Network&) const = default;

private:
    Ipv6Address _addr;
    int _prefix = 64;
    Ipv6AddressType _type = Ipv6AddressType::Static;
};

// The IP configuration of a virtual NIC: a value, read from the interface
// and written back to it as a whole (QelNic::SetIpConfig).
class IpConfig {
public:
    bool GetUseDhcp() const { return _useDhcp; }
    // How the interface gets its IPv4 address: from a DHCP server (useDhcp),
    // not at all (none), or statically (neither: the address and netmask held
    // here).
    void SetUseDhcp(bool useDhcp, bool none = false) {
        _useDhcp = useDhcp;
        _ipv4None = none && !useDhcp;
    }
    // A static address and netmask in one step. Throws HostCtlException when
    // they are no usable host address: an invalid or empty netmask, the
    // unspecified, loopback, multicast, reserved or broadcast address, or the
    // network or broadcast address of its own subnet (prefixes below 31).
    void SetUseDhcp(bool useDhcp, bool none, const Ipv4Address& address, const Ipv4Address& netmask);
    bool GetIpv4UseNone() const { return _ipv4None; }
    // IPv4 off: no DHCP, no address.
    void SetIpv4UseNone() { SetUseDhcp(false, true); }
    const Ipv4Address& GetIpv4Address() const { return _ipv4; }
    void SetIpv4Address(const Ipv4Address& a) { _ipv4 = a; }
    const Ipv4Address& GetIpv4Netmask() const { return _netmask; }
    void SetIpv4Netmask(const Ipv4Address& m) { _netmask = m; }

    // Every IPv6 address of the interface, each with the way it was obtained.
    // When written, only the static ones are taken; the interface obtains the
    // others itself (link-local, router advertisement, DHCPv6).
    const std::vector<Ipv6Network>& GetIpv6Network() const { return _ipv6; }
    void SetIpv6Network(const std::vector<Ipv6Network>& v) { _ipv6 = v; }
    bool GetUseIpv6Dhcp() const { return _ipv6Dhcp; }
    void SetUseIpv6Dhcp(bool v) { _ipv6Dhcp = v; }
    bool GetUseIpv6RouterAdvertised() const { return _ipv6Ra; }
    void SetUseIpv6RouterAdvertised(bool v) { _ipv6Ra = v; }

    // Whether DNS servers and the domain come from the DHCP server.
    bool GetDhcpDns() const { return _dhcpDns; }
    void SetDhcpDns(bool v) { _dhcpDns = v; }

    bool operator==(const IpConfig&) const = default;

private:
    bool _useDhcp = false;
    bool _ipv4None = false;
    Ipv4Address _ipv4;
    Ipv4Address _netmask;
    std::vector<Ipv6Network> _ipv6;
    bool _ipv6Dhcp = false;
    bool _ipv6Ra = false;
    bool _dhcpDns = false;
};

// Where a virtual NIC is connected: a port group of a standard switch (type
// 1), a port of a distributed switch (type 2) or an opaque network (type 3,
// managed outside the host).
class ConnectionPoint {
public:
    enum Type { None = 0, PortGroup = 1, DvsPort = 2, OpaqueNetwork = 3 };
    ConnectionPoint(int type, std::string name) : _type(type), _name(std::move(name)) {}
    int GetType() const { return _type; }
    // The port group's name, the distributed port's key or the opaque
    // network's id.
    const std::string& GetName() const { return _name; }
    // The switch the point belongs to: the standard switch that holds the port
    // group, or the distributed switch of the port. Asks the host; throws
    // HostCtlException when no switch holds it.
    std::string GetSwitchName() const;

private:
    int _type;
    std::string _name;
};

// A physical network adapter.
struct Pnic {
    std::string name;    // e.g. "zonic0"
    std::string mac;     // "00:50:56:aa:bb:cc"
    std::string driver;  // e.g. "e1000e"
    bool linkUp = true;
    int speedMbps = 1000;
    std::string description;
    std::string label;  // the PCI device's hardware label ("NIC 1"); may be empty
};

// A virtual NIC of the host kernel (the management interface is one).
// Reads and writes go to the host each time they are called.
class QelNic {
public:
    explicit QelNic(std::string name) : _name(std::move(name)) {}
    const std::string& GetName() const { return _name; }
    IpConfig GetIpConfig() const;
    // Configures the interface as `cfg` says: static addresses are set, a
    // DHCP lease and autoconfigured IPv6 addresses are obtained as asked.
    void SetIpConfig(const IpConfig& cfg);
    ConnectionPoint GetConnectionPoint() const;
    // Connects the interface to a port group (type 1, by name) or a
    // distributed port (type 2, by key); its IP configuration stays.
    void SetConnectionPoint(const ConnectionPoint& point);
    std::string GetMacAddress() const;
    void SetMacAddress(const std::string& mac);
    // Asks the DHCP servers (DHCPv4 and, when used, DHCPv6) for a lease again.
    void RenewDhcpLease();
    // Takes the interface down: its dynamic addresses are given up.
    void Disable();
    // Brings it up again: leases and autoconfigured addresses are obtained anew.
    void Enable();
    // Disable, then Enable.
    void Restart();

private:
    std::string _name;
};

// The uplinks a standard switch uses, in team order: active ones first,
// then standby ones.
struct TeamingPolicy {
    std::vector<std::string> activeUplinks;
    std::vector<std::string> standbyUplinks;
};

// A standard virtual switch of the host, by name; every call asks the host.
class VirtualSwitch {
public:
    explicit VirtualSwitch(std::string name) : _name(std::move(name)) {}
    const std::string& GetName() const { return _name; }
    // The physical NICs attached to the switch.
    std::vector<std::string> GetUplinks() const;
    TeamingPolicy GetTeamingPolicy() const;
    // How many uplinks the teaming policy may hold as active.
    unsigned GetMaxActiveUplinks() const;
    // Attaches the NIC to the switch and appends it to the active or standby
    // uplinks. A NIC attached to another switch is refused.
    void AddUplinkToTeamingPolicy(const std::string& pnic, bool standby);
    // Takes the NIC out of the teaming policy and off the switch.
    void RemoveUplinkFromTeamingPolicy(const std::string& pnic);
    std::vector<std::string> GetPortGroupNames() const;
    void AddPortGroup(const std::string& portGroup, uint16_t vlanId);
    // 0 when the port group has no VLAN, 4095 for all VLANs.
    uint16_t GetPortGroupVlanId(const std::string& portGroup) const;
    void SetPortGroupVlanId(const std::string& portGroup, uint16_t vlanId);

private:
    std::string _name;
};

// A distributed switch the host is a member of.
class DistributedSwitch {
public:
    // An uplink port of the switch on this host and the NIC that backs it
    // ("" when none does).
    struct UplinkPort {
        std::string key;
        std::string pnic;
    };

    // The properties of a port that the host sets.
    struct PortSettings {
        uint16_t vlanId = 0;   // 0: none, 4095: all
        bool blocked = false;  // a blocked port passes no traffic
        // Keys of the uplink ports its traffic may use; empty: all of them.
        std::vector<std::string> uplinks;
    };

    explicit DistributedSwitch(std::string name) : _name(std::move(name)) {}
    const std::string& GetName() const { return _name; }
    std::vector<UplinkPort> GetUplinkPorts() const;
    // The host's NICs that back uplink ports of the switch.
    std::vector<std::string> GetUsedUplinks() const;
    // Frees the uplink port the NIC backs.
    void RemoveUplink(const std::string& pnic);
    // Lets the NIC back the free uplink port `uplinkPortKey`; a NIC attached
    // to any switch is refused.
    void AddUplink(const std::string& uplinkPortKey, const std::string& pnic);
    PortSettings GetPortSettings(const std::string& portKey) const;
    // The VLAN of one of the switch's ports (0: none, 4095: all).
    uint16_t GetPortVlanId(const std::string& portKey) const;
    // Creates a port that lives on this host only, with `settings` and
    // defaults for every other property; returns its key.
    std::string AddHostLocalPort(const PortSettings& settings);
    // Removes a host-local port that nothing is connected to.
    void RemoveHostLocalPort(const std::string& portKey);

private:
    std::string _name;
};

}  // namespace Network

namespace Adv {

// An advanced option of the host, as found by name.
class AdvancedOption {
public:
    explicit AdvancedOption(std::string name) : _name(std::move(name)) {}
    virtual ~AdvancedOption() = default;
    const std::string& GetName() const { return _name; }

private:
    std::string _name;
};

class AdvancedIntegerOption : public AdvancedOption {
public:
    AdvancedIntegerOption(std::string name, int64_t current)
        : AdvancedOption(std::move(name)), _current(current) {}
    int64_t GetCurrent() const { return _current; }
    void SetCurrent(int64_t value);  // writes to the host

private:
    int64_t _current;
};

class AdvancedStringOption : public AdvancedOption {
public:
    AdvancedStringOption(std::string name, std::string current)
        : AdvancedOption(std::move(name)), _current(std::move(current)) {}
    const std::string& GetCurrent() const { return _current; }
    void SetCurrent(const std::string& value);  // writes to the host

private:
    std::string _current;
};

}  // namespace Adv

// Services and firewall.
namespace Firewall {

// A ruleset of the host's firewall, as found by id
// (QelCtl::System::SystemInfoImpl::GetFirewallRulesetById).
class Ruleset {
public:
    Ruleset(std::string id, bool enabled) : _id(std::move(id)), _enabled(enabled) {}
    const std::string& GetId() const { return _id; }
    // Whether the ruleset let its traffic in when it was found or last set.
    bool IsEnabled() const { return _enabled; }
    void SetEnabled(bool enabled);  // writes to the host

private:
    std::string _id;
    bool _enabled;
};

}  // namespace Firewall

}  // namespace HostCtl
