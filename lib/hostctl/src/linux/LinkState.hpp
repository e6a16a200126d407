// The running network of a Linux host as the kernel reports it: links,
// addresses and default routes, read through rtnetlink (libnl-route-3) and
// sysfs. A snapshot is a value; nothing in it is kept up to date.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace HostCtl::Lib::Linux {

struct LinkInfo {
    int index = 0;
    std::string name;
    // The rtnetlink link kind: "bridge", "bond", "vlan", "veth", "tun",
    // "macvlan", ...; "" for a plain device (a physical NIC has none).
    std::string kind;
    std::string mac;          // "52:54:00:12:34:56", "" when the link has none
    bool adminUp = false;     // IFF_UP
    bool carrier = false;     // IFF_LOWER_UP
    int masterIndex = 0;      // the bridge or bond this link is a port or slave of; 0 for none
    int parentIndex = 0;      // a VLAN's lower link; 0 for none
    int vlanId = 0;           // a VLAN link's id
    bool hasDevice = false;   // sysfs "device" link: a NIC with hardware behind it
    std::string driver;       // sysfs device/driver's name, "" without a device
    int speedMbps = 0;        // sysfs "speed"; 0 when unknown or no link
    std::string duplex;       // sysfs "duplex": "full", "half" or ""
    std::string bondPrimary;  // a bond's primary slave's name ("" when none)
    std::string bondMode;     // a bond's mode ("active-backup", "802.3ad", ...)
    std::string description;  // udev ID_MODEL_FROM_DATABASE or similar, "" when unknown
    std::string label;        // SMBIOS/ACPI label (sysfs device/label), "" when none
};

struct AddressInfo {
    int linkIndex = 0;
    bool ipv6 = false;
    std::string address;  // canonical text, no prefix
    int prefixLength = 0;
    // IFA_F_* flags of the address.
    uint32_t flags = 0;
    bool Permanent() const;                    // IFA_F_PERMANENT: configured, not learned
    bool Tentative() const;                    // IFA_F_TENTATIVE: duplicate detection not done
    bool DadFailed() const;                    // IFA_F_DADFAILED
    uint32_t validLifetime = 0xffffffffu;      // seconds left; 0xffffffff: forever
    uint32_t preferredLifetime = 0xffffffffu;  // seconds left; 0 once deprecated
    // IFA_PROTO: who made the address (IFAPROT_KERNEL_RA for one made from a
    // router advertisement, IFAPROT_KERNEL_LL for the link-local one); 0
    // when the kernel does not say.
    uint8_t proto = 0;
};

struct RouteInfo {
    bool ipv6 = false;
    std::string gateway;  // "" for a route without a gateway
    int linkIndex = 0;
    int prefixLength = 0;  // 0 for a default route
    std::string destination;
    uint8_t protocol = 0;  // RTPROT_*: RTPROT_RA for a router-advertised route, RTPROT_DHCP ...
    uint32_t metric = 0;   // RTA_PRIORITY; among routes to one destination the lowest wins
};

struct NetworkSnapshot {
    std::vector<LinkInfo> links;
    std::vector<AddressInfo> addresses;
    // The main table's unicast routes, one entry per next hop of a
    // multipath route.
    std::vector<RouteInfo> routes;

    const LinkInfo* FindLink(const std::string& name) const;
    const LinkInfo* FindLink(int index) const;
    std::vector<const AddressInfo*> AddressesOf(int linkIndex) const;
    // The default route of the family with the lowest metric; nothing when
    // there is none.
    std::optional<RouteInfo> DefaultRoute(bool ipv6) const;
};

// Reads the network namespace the process runs in. Throws HostCtlException
// when rtnetlink cannot be asked; a sysfs or udev file that cannot be read
// leaves its field empty.
NetworkSnapshot ReadNetwork();

}  // namespace HostCtl::Lib::Linux
