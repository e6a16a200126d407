// The simulated host's network: links, VLANs, DHCP, router advertisements,
// DHCPv6, switches, booting and the hosts file.
#include "hostctl/SimNetwork.hpp"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <fstream>
#include <optional>
#include <set>
#include <sstream>
#include <system_error>

#include "SimNetworkModel.hpp"
#include "hostctl/QelCtl.hpp"

namespace HostCtl::Lib {

using Network::Ipv4Address;
using Network::Ipv6Address;
using nlohmann::json;

namespace {

using Uint128 = unsigned __int128;

std::string At(const std::string& list, size_t index) { return list + "/" + std::to_string(index); }

// Six bytes from "xx:xx:xx:xx:xx:xx" (either case), or nothing.
std::optional<std::array<uint8_t, 6>> ParseMac(const std::string& text) {
    if (text.size() != 17) return std::nullopt;
    std::array<uint8_t, 6> mac{};
    for (size_t i = 0; i < 6; ++i) {
        if (i > 0 && text[i * 3 - 1] != ':') return std::nullopt;
        unsigned value = 0;
        for (size_t j = 0; j < 2; ++j) {
            const char c = text[i * 3 + j];
            unsigned digit;
            if (c >= '0' && c <= '9')
                digit = unsigned(c - '0');
            else if (c >= 'a' && c <= 'f')
                digit = unsigned(c - 'a' + 10);
            else if (c >= 'A' && c <= 'F')
                digit = unsigned(c - 'A' + 10);
            else
                return std::nullopt;
            value = value * 16 + digit;
        }
        mac[i] = uint8_t(value);
    }
    return mac;
}

std::string Lower(std::string text) {
    for (char& c : text)
        if (c >= 'A' && c <= 'Z') c = char(c - 'A' + 'a');
    return text;
}

Uint128 ToNumber(const Ipv6Address& address) {
    Uint128 n = 0;
    for (int i = 0; i < 16; ++i) n = (n << 8) | address.Bytes()[i];
    return n;
}

Ipv6Address FromNumber(Uint128 n) {
    std::string text;
    for (int group = 7; group >= 0; --group) {
        char part[8];
        snprintf(part, sizeof part, "%x", unsigned((n >> (group * 16)) & 0xffff));
        text += part;
        if (group > 0) text += ':';
    }
    return Ipv6Address(text);
}

// The address of `prefix`'s upper 64 bits with the modified EUI-64 interface
// identifier of `mac` (the universal/local bit inverted, ff:fe in the middle).
Ipv6Address Eui64Address(const Ipv6Address& prefix, const std::array<uint8_t, 6>& mac) {
    const uint8_t id[8] = {uint8_t(mac[0] ^ 0x02), mac[1], mac[2], 0xff, 0xfe, mac[3], mac[4], mac[5]};
    Uint128 n = ToNumber(prefix) >> 64 << 64;
    for (int i = 0; i < 8; ++i) n |= Uint128(id[i]) << (8 * (7 - i));
    return FromNumber(n);
}

json AddressEntry(const std::string& address, int prefix, const char* type) {
    return {{"address", address}, {"prefix", prefix}, {"type", type}};
}

// Tolerant reads for the hosts file, which must follow the state even when
// unrelated parts of it are broken.
std::string TextAt(const json& state, const std::string& pointer) {
    const json::json_pointer at(pointer);
    if (!state.contains(at)) return "";
    const json& v = state.at(at);
    return v.is_string() ? v.get<std::string>() : "";
}

// Removes the leases of `mac` (lower case), however the server spelt it.
void EraseLeaseOf(json& leases, const std::string& mac) {
    for (auto it = leases.begin(); it != leases.end();) {
        if (Lower(it.key()) == mac)
            it = leases.erase(it);
        else
            ++it;
    }
}

bool IsLoopback(const std::string& address) { return address.rfind("127.", 0) == 0 || address == "::1"; }

std::string ErrnoText(int err) { return std::error_code(err, std::generic_category()).message(); }

}  // namespace

// ---- NetworkView ----

std::string NetworkView::Find(const std::string& list, const std::string& name, const char* key) const {
    const json& items = _sim.Array(_view, list);
    for (size_t i = 0; i < items.size(); ++i)
        if (_sim.String(_view, At(list, i) + "/" + key) == name) return At(list, i);
    return "";
}

std::string NetworkView::VnicPointer(const std::string& vnic) const {
    std::string p = Find("/network/vnics", vnic);
    if (p.empty()) throw _sim.Error("no virtual NIC named \"" + vnic + "\"");
    return p;
}

std::string NetworkView::PnicPointer(const std::string& pnic) const {
    std::string p = Find("/network/pnics", pnic);
    if (p.empty()) throw _sim.Error("no physical NIC named \"" + pnic + "\"");
    return p;
}

std::string NetworkView::VswitchPointer(const std::string& vswitch) const {
    std::string p = Find("/network/vswitches", vswitch);
    if (p.empty()) throw _sim.Error("no standard switch named \"" + vswitch + "\"");
    return p;
}

std::string NetworkView::PortGroupPointer(const std::string& vswitchPointer,
                                          const std::string& portGroup) const {
    std::string p = Find(vswitchPointer + "/portgroups", portGroup);
    if (p.empty())
        throw _sim.Error("standard switch \"" + _sim.String(_view, vswitchPointer + "/name") +
                         "\" has no port group named \"" + portGroup + "\"");
    return p;
}

std::string NetworkView::DvsPointer(const std::string& dvs) const {
    std::string p = Find("/network/dvswitches", dvs);
    if (p.empty()) throw _sim.Error("no distributed switch named \"" + dvs + "\"");
    return p;
}

std::string NetworkView::ConnectionPointSwitch(int type, const std::string& name) const {
    switch (type) {
        case Network::ConnectionPoint::PortGroup: {
            const std::string list = "/network/vswitches";
            for (size_t i = 0; i < _sim.Array(_view, list).size(); ++i)
                if (!Find(At(list, i) + "/portgroups", name).empty())
                    return _sim.String(_view, At(list, i) + "/name");
            throw HostCtlException("no standard switch holds a port group named \"" + name + "\"");
        }
        case Network::ConnectionPoint::DvsPort: {
            const std::string list = "/network/dvswitches";
            for (size_t i = 0; i < _sim.Array(_view, list).size(); ++i)
                if (!Find(At(list, i) + "/ports", name, "key").empty())
                    return _sim.String(_view, At(list, i) + "/name");
            throw HostCtlException("no distributed switch has a port \"" + name + "\"");
        }
        case Network::ConnectionPoint::OpaqueNetwork:
            throw HostCtlException("opaque network \"" + name +
                                   "\" is managed outside the host: it has no switch on this host");
        case Network::ConnectionPoint::None:
            throw HostCtlException("the connection point is not connected to any switch");
        default:
            throw HostCtlException("unknown connection point type " + std::to_string(type));
    }
}

std::string NetworkView::SwitchOfPnic(const std::string& pnic) const {
    const std::string vswitches = "/network/vswitches";
    for (size_t i = 0; i < _sim.Array(_view, vswitches).size(); ++i) {
        for (const std::string& uplink : _sim.StringList(_view, At(vswitches, i) + "/uplinks"))
            if (uplink == pnic) return _sim.String(_view, At(vswitches, i) + "/name");
    }
    const std::string dvswitches = "/network/dvswitches";
    for (size_t i = 0; i < _sim.Array(_view, dvswitches).size(); ++i) {
        if (!Find(At(dvswitches, i) + "/uplinkPorts", pnic, "pnic").empty())
            return _sim.String(_view, At(dvswitches, i) + "/name");
    }
    return "";
}

bool NetworkView::PnicHasLink(const std::string& pnic) const {
    const std::string p = Find("/network/pnics", pnic);
    return !p.empty() && _sim.Bool(_view, p + "/linkUp");
}

bool NetworkView::HasLink(const std::string& v) const {
    if (!_sim.Bool(_view, v + "/enabled")) return false;
    switch (_sim.Integer(_view, v + "/connectionType")) {
        case Network::ConnectionPoint::PortGroup: {
            const std::string portGroup = _sim.String(_view, v + "/portgroup");
            const std::string list = "/network/vswitches";
            for (size_t i = 0; i < _sim.Array(_view, list).size(); ++i) {
                const std::string sw = At(list, i);
                if (Find(sw + "/portgroups", portGroup).empty()) continue;
                for (const char* role : {"/teaming/active", "/teaming/standby"})
                    for (const std::string& uplink : _sim.StringList(_view, sw + role))
                        if (PnicHasLink(uplink)) return true;
                return false;
            }
            return false;
        }
        case Network::ConnectionPoint::DvsPort: {
            const std::string dvs = Find("/network/dvswitches", _sim.String(_view, v + "/dvs"));
            if (dvs.empty() || Find(dvs + "/ports", _sim.String(_view, v + "/port"), "key").empty())
                return false;
            const std::string ports = dvs + "/uplinkPorts";
            for (size_t i = 0; i < _sim.Array(_view, ports).size(); ++i) {
                const std::string pnic = _sim.String(_view, At(ports, i) + "/pnic");
                if (!pnic.empty() && PnicHasLink(pnic)) return true;
            }
            return false;
        }
        default:
            return false;
    }
}

int NetworkView::Vlan(const std::string& v) const {
    std::string at;
    switch (_sim.Integer(_view, v + "/connectionType")) {
        case Network::ConnectionPoint::PortGroup: {
            const std::string portGroup = _sim.String(_view, v + "/portgroup");
            const std::string list = "/network/vswitches";
            for (size_t i = 0; i < _sim.Array(_view, list).size() && at.empty(); ++i)
                at = Find(At(list, i) + "/portgroups", portGroup);
            break;
        }
        case Network::ConnectionPoint::DvsPort: {
            const std::string dvs = Find("/network/dvswitches", _sim.String(_view, v + "/dvs"));
            if (!dvs.empty()) at = Find(dvs + "/ports", _sim.String(_view, v + "/port"), "key");
            break;
        }
        default:
            break;
    }
    if (at.empty()) return -1;
    const uint64_t vlan = _sim.Unsigned(_view, at + "/vlan");
    if (vlan > 4095) throw _sim.Error("field " + at + "/vlan is above 4095");
    return int(vlan);
}

// ---- NetworkModel ----

json& NetworkModel::At(const std::string& pointer) {
    _sim.Field(_state, pointer);  // a missing field is named in the error
    return _state.at(json::json_pointer(pointer));
}

json& NetworkModel::Object(const std::string& pointer) {
    _sim.Object(_state, pointer);  // a missing field or another type is named in the error
    return _state.at(json::json_pointer(pointer));
}

std::string NetworkModel::Mac(const std::string& v) const {
    const std::string text = _sim.String(_view, v + "/mac");
    if (!ParseMac(text)) throw _sim.Error("field " + v + "/mac is not a MAC address: \"" + text + "\"");
    return Lower(text);
}

std::string NetworkModel::Server(int vlan, const char* kind) const {
    if (vlan < 0 || !_view.contains(json::json_pointer("/network/lan"))) return "";
    _sim.Object(_view, "/network/lan");
    const std::string p = "/network/lan/" + std::to_string(vlan) + "/" + kind;
    const json::json_pointer at(p);
    if (!_view.contains(at) || _view.at(at).is_null()) return "";
    _sim.Object(_view, p);
    return p;
}

void NetworkModel::LeaseIpv4(const std::string& v) {
    json& ipv4 = Object(v + "/ipv4");
    // Without an answer the client leaves the interface unconfigured.
    ipv4["address"] = "0.0.0.0";
    ipv4["netmask"] = "0.0.0.0";
    if (!HasLink(v)) return;
    const std::string server = Server(Vlan(v), "dhcp");
    if (server.empty()) return;

    auto v4 = [&](const std::string& pointer) {
        const std::string text = _sim.String(_view, pointer);
        if (!Ipv4Address::IsValidAddress(text))
            throw _sim.Error("field " + pointer + " is not an IPv4 address: \"" + text + "\"");
        return Ipv4Address(text);
    };
    const uint32_t first = v4(server + "/first").GetHostOrder();
    const uint32_t last = v4(server + "/last").GetHostOrder();
    const Ipv4Address netmask = v4(server + "/netmask");
    if (first > last) throw _sim.Error("field " + server + "/first is above " + server + "/last");
    if (!netmask.IsValidNetmask()) throw _sim.Error("field " + server + "/netmask is not a netmask");

    const std::string mac = Mac(v);
    json& serverObject = Object(server);
    if (!serverObject.contains("leases") || serverObject["leases"].is_null())
        serverObject["leases"] = json::object();
    json& leases = At(server + "/leases");
    if (!leases.is_object()) throw _sim.Error("field " + server + "/leases must be an object");

    std::optional<uint32_t> chosen;
    std::set<uint32_t> taken;
    for (auto it = leases.begin(); it != leases.end(); ++it) {
        const uint32_t held = v4(server + "/leases/" + it.key()).GetHostOrder();
        if (Lower(it.key()) != mac)
            taken.insert(held);
        else if (held >= first && held <= last)
            chosen = held;
    }
    EraseLeaseOf(leases, mac);
    if (!chosen) {
        // The lowest free address of the pool; an old lease outside it ends.
        for (uint64_t a = first; a <= last && !chosen; ++a)
            if (!taken.count(uint32_t(a))) chosen = uint32_t(a);
        if (!chosen) return;  // the pool is full: no offer
    }
    leases[mac] = Ipv4Address::FromHostOrder(*chosen).GetStringAddress();
    ipv4["address"] = leases[mac];
    ipv4["netmask"] = netmask.GetStringAddress();

    const json& answer = _view.at(json::json_pointer(server));
    if (answer.contains("gateway"))
        Object("/network/routing")["ipv4Gateway"] = v4(server + "/gateway").GetStringAddress();
    if (_sim.Bool(_view, v + "/dhcpDns")) {
        json& dns = Object("/network/dns");
        if (answer.contains("dns")) {
            json servers = json::array();
            for (size_t i = 0; i < _sim.Array(_view, server + "/dns").size(); ++i)
                servers.push_back(v4(::HostCtl::Lib::At(server + "/dns", i)).GetStringAddress());
            dns["servers"] = std::move(servers);
        }
        if (answer.contains("domain")) {
            const std::string domain = _sim.String(_view, server + "/domain");
            dns["domain"] = domain;
            dns["searchDomains"] = domain.empty() ? json::array() : json::array({domain});
        }
    }
}

void NetworkModel::LeaseIpv6(const std::string& v, json& addresses) {
    if (!HasLink(v) || !_sim.Bool(_view, v + "/ipv6/dhcp")) return;
    const std::string server = Server(Vlan(v), "dhcpv6");
    if (server.empty()) return;
    auto v6 = [&](const std::string& pointer) {
        const std::string text = _sim.String(_view, pointer);
        if (!Ipv6Address::IsValidAddress(text))
            throw _sim.Error("field " + pointer + " is not an IPv6 address: \"" + text + "\"");
        return Ipv6Address(text);
    };
    const Uint128 first = ToNumber(v6(server + "/first"));
    const Uint128 last = ToNumber(v6(server + "/last"));
    if (first > last) throw _sim.Error("field " + server + "/first is above " + server + "/last");

    const std::string mac = Mac(v);
    json& serverObject = Object(server);
    if (!serverObject.contains("leases") || serverObject["leases"].is_null())
        serverObject["leases"] = json::object();
    json& leases = At(server + "/leases");
    if (!leases.is_object()) throw _sim.Error("field " + server + "/leases must be an object");

    std::optional<Uint128> chosen;
    std::set<Uint128> taken;
    for (auto it = leases.begin(); it != leases.end(); ++it) {
        const Uint128 held = ToNumber(v6(server + "/leases/" + it.key()));
        if (Lower(it.key()) != mac)
            taken.insert(held);
        else if (held >= first && held <= last)
            chosen = held;
    }
    EraseLeaseOf(leases, mac);
    if (!chosen) {
        for (Uint128 a = first;; ++a) {
            if (!taken.count(a)) {
                chosen = a;
                break;
            }
            if (a == last) break;
        }
        if (!chosen) return;
    }
    const std::string address = FromNumber(*chosen).GetStringAddress();
    leases[mac] = address;
    addresses.push_back(AddressEntry(address, 128, "dhcp"));

    if (_sim.Bool(_view, v + "/dhcpDns") && _view.at(json::json_pointer(server)).contains("dns")) {
        json servers = json::array();
        for (size_t i = 0; i < _sim.Array(_view, server + "/dns").size(); ++i)
            servers.push_back(v6(::HostCtl::Lib::At(server + "/dns", i)).GetStringAddress());
        Object("/network/dns")["ipv6Servers"] = std::move(servers);
    }
}

json NetworkModel::Ipv6Addresses(const std::string& v) {
    json addresses = json::array();
    if (!_sim.Bool(_view, "/network/ipv6Enabled")) return addresses;
    const bool up = _sim.Bool(_view, v + "/enabled");
    const std::array<uint8_t, 6> mac = *ParseMac(Mac(v));
    if (up)
        addresses.push_back(
            AddressEntry(Eui64Address(Ipv6Address("fe80::"), mac).GetStringAddress(), 64, "autoconf"));
    const std::string statics = v + "/ipv6/static";
    for (size_t i = 0; i < _sim.Array(_view, statics).size(); ++i) {
        const std::string a = ::HostCtl::Lib::At(statics, i);
        const std::string text = _sim.String(_view, a + "/address");
        const int64_t prefix = _sim.Integer(_view, a + "/prefix");
        if (!Ipv6Address::IsValidAddress(text))
            throw _sim.Error("field " + a + "/address is not an IPv6 address: \"" + text + "\"");
        if (prefix < 1 || prefix > 128) throw _sim.Error("field " + a + "/prefix must be 1 to 128");
        addresses.push_back(AddressEntry(Ipv6Address(text).GetStringAddress(), int(prefix), "static"));
    }
    if (!HasLink(v)) return addresses;

    const std::string router = Server(Vlan(v), "routerAdvertisement");
    if (!router.empty() && _sim.Bool(_view, v + "/ipv6/routerAdvertisement")) {
        const std::string prefixText = _sim.String(_view, router + "/prefix");
        const std::string routerText = _sim.String(_view, router + "/router");
        const int64_t length = _sim.Integer(_view, router + "/prefixLength");
        if (!Ipv6Address::IsValidAddress(prefixText))
            throw _sim.Error("field " + router + "/prefix is not an IPv6 address: \"" + prefixText + "\"");
        if (!Ipv6Address::IsValidAddress(routerText))
            throw _sim.Error("field " + router + "/router is not an IPv6 address: \"" + routerText + "\"");
        if (length < 1 || length > 128)
            throw _sim.Error("field " + router + "/prefixLength must be 1 to 128");
        // Stateless autoconfiguration forms addresses only from /64 prefixes;
        // the router is the default gateway either way.
        if (length == 64)
            addresses.push_back(
                AddressEntry(Eui64Address(Ipv6Address(prefixText), mac).GetStringAddress(), 64, "autoconf"));
        json& routing = Object("/network/routing");
        const std::string current = _sim.String(_view, "/network/routing/ipv6Gateway");
        if (!Ipv6Address::IsValidAddress(current) || Ipv6Address(current).IsZero())
            routing["ipv6Gateway"] = Ipv6Address(routerText).GetStringAddress();
    }
    LeaseIpv6(v, addresses);
    return addresses;
}

void NetworkModel::Configure(const std::string& v) {
    const bool dhcp = _sim.Bool(_view, v + "/ipv4/dhcp");
    const bool none = _sim.Bool(_view, v + "/ipv4/none");
    _sim.Object(_view, v + "/ipv6");
    if (none) {
        Object(v + "/ipv4")["address"] = "0.0.0.0";
        Object(v + "/ipv4")["netmask"] = "0.0.0.0";
    } else if (dhcp) {
        LeaseIpv4(v);
    }
    json addresses = Ipv6Addresses(v);
    Object(v + "/ipv6")["addresses"] = std::move(addresses);
}

void NetworkModel::RenewLeases(const std::string& v) {
    const bool dhcp = _sim.Bool(_view, v + "/ipv4/dhcp") && !_sim.Bool(_view, v + "/ipv4/none");
    const bool dhcpv6 = _sim.Bool(_view, v + "/ipv6/dhcp") && _sim.Bool(_view, "/network/ipv6Enabled");
    if (!dhcp && !dhcpv6)
        throw HostCtlException("\"" + _sim.String(_view, v + "/name") +
                               "\" does not use DHCP: nothing to renew");
    if (dhcp) LeaseIpv4(v);
    if (dhcpv6) {
        // Only the DHCPv6 address is asked for again.
        json addresses = json::array();
        for (const json& a : _sim.Array(_view, v + "/ipv6/addresses"))
            if (!a.is_object() || a.value("type", "") != "dhcp") addresses.push_back(a);
        LeaseIpv6(v, addresses);
        Object(v + "/ipv6")["addresses"] = std::move(addresses);
    }
}

void NetworkModel::SetIpConfig(const std::string& v, const Network::IpConfig& config) {
    const bool dhcp = config.GetUseDhcp();
    const bool none = !dhcp && config.GetIpv4UseNone();
    if (!dhcp && !none) {
        // The same check as a static configuration made through IpConfig.
        Network::IpConfig check;
        check.SetUseDhcp(false, false, config.GetIpv4Address(), config.GetIpv4Netmask());
    }
    json statics = json::array();
    for (const Network::Ipv6Network& network : config.GetIpv6Network()) {
        if (network.GetIpv6AddressType() != Network::Ipv6AddressType::Static) continue;
        const Ipv6Address& a = network.GetAddress();
        const std::string text = network.ToString();
        if (a.IsZero() || a.Bytes()[0] == 0xff || a.IsLinkLocal() || ToNumber(a) == 1)
            throw HostCtlException("invalid static IPv6 address " + text +
                                   ": not a unicast address outside fe80::/10");
        if (network.GetPrefixLength() < 1 || network.GetPrefixLength() > 128)
            throw HostCtlException("invalid static IPv6 address " + text + ": the prefix must be 1 to 128");
        json entry = {{"address", a.GetStringAddress()}, {"prefix", network.GetPrefixLength()}};
        bool seen = false;
        for (const json& s : statics) seen = seen || s["address"] == entry["address"];
        if (!seen) statics.push_back(std::move(entry));
    }

    json& ipv4 = Object(v + "/ipv4");
    ipv4["dhcp"] = dhcp;
    ipv4["none"] = none;
    if (!dhcp && !none) {
        ipv4["address"] = config.GetIpv4Address().GetStringAddress();
        ipv4["netmask"] = config.GetIpv4Netmask().GetStringAddress();
    }
    json& ipv6 = Object(v + "/ipv6");
    ipv6["dhcp"] = config.GetUseIpv6Dhcp();
    ipv6["routerAdvertisement"] = config.GetUseIpv6RouterAdvertised();
    ipv6["static"] = std::move(statics);
    Object(v)["dhcpDns"] = config.GetDhcpDns();
    Configure(v);
}

void NetworkModel::SetMac(const std::string& v, const std::string& mac) {
    const std::optional<std::array<uint8_t, 6>> bytes = ParseMac(mac);
    if (!bytes) throw HostCtlException("\"" + mac + "\" is not a MAC address (xx:xx:xx:xx:xx:xx)");
    if ((*bytes)[0] & 0x01) throw HostCtlException(mac + " is a multicast MAC address");
    if (*bytes == std::array<uint8_t, 6>{}) throw HostCtlException(mac + " is not a usable MAC address");
    Object(v)["mac"] = Lower(mac);
    // The link-local and autoconfigured addresses are derived from the MAC,
    // and DHCP servers lease by it.
    Configure(v);
}

void NetworkModel::SetEnabled(const std::string& v, bool enabled) {
    Object(v)["enabled"] = enabled;
    Configure(v);
}

void NetworkModel::Boot() {
    const json saved = _sim.Object(_view, "/network/saved");
    _sim.Object(_view, "/network/saved/dns");
    _sim.Object(_view, "/network/saved/routing");
    json& network = Object("/network");
    network["dns"] = saved["dns"];
    network["routing"] = saved["routing"];
    network["ipv6Enabled"] = _sim.Bool(_view, "/network/ipv6EnabledAtBoot");
    const std::string list = "/network/vnics";
    for (size_t i = 0; i < _sim.Array(_view, list).size(); ++i) Configure(::HostCtl::Lib::At(list, i));
}

void NetworkModel::AddUplink(const std::string& vswitch, const std::string& pnic, bool standby) {
    const std::string sw = VswitchPointer(vswitch);
    PnicPointer(pnic);
    const std::string owner = SwitchOfPnic(pnic);
    if (!owner.empty() && owner != vswitch)
        throw HostCtlException("physical NIC \"" + pnic + "\" is already used by switch \"" + owner + "\"");
    auto without = [&](const std::string& pointer) {
        json list = json::array();
        for (const std::string& name : _sim.StringList(_view, pointer))
            if (name != pnic) list.push_back(name);
        return list;
    };
    json active = without(sw + "/teaming/active");
    json standbys = without(sw + "/teaming/standby");
    json uplinks = without(sw + "/uplinks");
    if (!standby) {
        const uint64_t most = _sim.Unsigned(_view, sw + "/maxActiveUplinks");
        if (active.size() >= most)
            throw HostCtlException("switch \"" + vswitch + "\" already has " + std::to_string(active.size()) +
                                   " active uplinks, the most it may have");
        active.push_back(pnic);
    } else {
        standbys.push_back(pnic);
    }
    uplinks.push_back(pnic);
    json& s = Object(sw);
    s["uplinks"] = std::move(uplinks);
    s["teaming"]["active"] = std::move(active);
    s["teaming"]["standby"] = std::move(standbys);
}

void NetworkModel::RemoveUplink(const std::string& vswitch, const std::string& pnic) {
    const std::string sw = VswitchPointer(vswitch);
    PnicPointer(pnic);
    if (SwitchOfPnic(pnic) != vswitch)
        throw HostCtlException("physical NIC \"" + pnic + "\" is not an uplink of switch \"" + vswitch +
                               "\"");
    for (const char* field : {"/uplinks", "/teaming/active", "/teaming/standby"}) {
        json list = json::array();
        for (const std::string& name : _sim.StringList(_view, sw + field))
            if (name != pnic) list.push_back(name);
        At(sw + field) = std::move(list);
    }
}

void NetworkModel::SetPortGroupVlan(const std::string& vswitch, const std::string& portGroup, unsigned vlan) {
    if (vlan > 4095) throw HostCtlException("VLAN ID " + std::to_string(vlan) + " is above 4095");
    Object(PortGroupPointer(VswitchPointer(vswitch), portGroup))["vlan"] = vlan;
}

void NetworkModel::RemoveDvsUplink(const std::string& dvs, const std::string& pnic) {
    const std::string d = DvsPointer(dvs);
    PnicPointer(pnic);
    const std::string port = Find(d + "/uplinkPorts", pnic, "pnic");
    if (port.empty())
        throw HostCtlException("physical NIC \"" + pnic + "\" backs no uplink port of distributed switch \"" +
                               dvs + "\"");
    Object(port)["pnic"] = "";
}

// ---- Booting and the hosts file ----

void BootNetwork(const SimState& sim, json& state) {
    try {
        NetworkModel(sim, state).Boot();
    } catch (const json::exception& e) {
        // Without the library's "[json.exception.x.N] " tag.
        const std::string what = e.what();
        const size_t tagEnd = what.find("] ");
        throw sim.Error(tagEnd == std::string::npos ? what : what.substr(tagEnd + 2));
    }
}

void BootSimulatedHost(const std::string& root) {
    SimState sim(root);
    sim.Read();  // a missing or malformed state fails here, before anything is made
    std::vector<std::string> formerNames;
    sim.Update(
        [&](json& state) {
            // The names the host had before: their line in the hosts file goes.
            const std::string hostname = TextAt(state, "/network/dns/hostname");
            const std::string domain = TextAt(state, "/network/dns/domain");
            formerNames = {hostname, domain.empty() ? "" : hostname + "." + domain};
            BootNetwork(sim, state);
            if (!state.contains("power") || !state["power"].is_object()) state["power"] = json::object();
            state["power"]["state"] = "on";
        },
        [&](const json& state) { SyncHostsFile(root, state, formerNames); });
}

std::string HostsFileEntry(const json& state) {
    const std::string vnic = TextAt(state, "/network/managementInterface");
    const std::string hostname = TextAt(state, "/network/dns/hostname");
    const std::string domain = TextAt(state, "/network/dns/domain");
    if (vnic.empty() || hostname.empty() || !state.contains(json::json_pointer("/network/vnics"))) return "";
    const json& vnics = state.at(json::json_pointer("/network/vnics"));
    if (!vnics.is_array()) return "";
    for (const json& v : vnics) {
        if (!v.is_object() || v.value("name", json()) != vnic) continue;
        const std::string address = TextAt(v, "/ipv4/address");
        if (!Ipv4Address::IsValidAddress(address) || Ipv4Address(address).IsZero()) return "";
        return address + "\t" + (domain.empty() ? hostname : hostname + "." + domain + " " + hostname);
    }
    return "";
}

void SyncHostsFile(const std::string& root, const json& state, const std::vector<std::string>& formerNames) {
    const std::string dir = root + "/etc";
    const std::string path = dir + "/hosts";
    auto fail = [&](const std::string& what, int err) {
        return HostCtlException(path + ": " + what + ": " + ErrnoText(err));
    };

    std::set<std::string> names(formerNames.begin(), formerNames.end());
    const std::string hostname = TextAt(state, "/network/dns/hostname");
    const std::string domain = TextAt(state, "/network/dns/domain");
    names.insert(hostname);
    if (!domain.empty()) names.insert(hostname + "." + domain);
    names.erase("");
    const std::string entry = HostsFileEntry(state);

    std::string text;
    {
        std::ifstream in(path);
        struct stat st;
        if (!in && stat(path.c_str(), &st) == 0) throw fail("cannot read", EACCES);
        bool placed = false;
        for (std::string line; std::getline(in, line);) {
            std::istringstream fields(line.substr(0, line.find('#')));
            std::string address, name;
            fields >> address;
            bool ours = false;
            while (fields >> name) ours = ours || names.count(name);
            if (ours && !IsLoopback(address)) {
                if (!placed && !entry.empty()) text += entry + "\n";
                placed = true;
                continue;
            }
            text += line + "\n";
        }
        if (!placed && !entry.empty()) text += entry + "\n";
    }

    if (mkdir(dir.c_str(), 0755) < 0 && errno != EEXIST) throw fail("cannot create its folder", errno);
    std::string tmp = path + ".XXXXXX";
    const int fd = mkostemp(tmp.data(), O_CLOEXEC);
    if (fd < 0) throw fail("cannot create a temporary file", errno);
    size_t done = 0;
    while (done < text.size()) {
        const ssize_t n = write(fd, text.data() + done, text.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) {
            const int err = errno;
            close(fd);
            unlink(tmp.c_str());
            throw fail("cannot write", err);
        }
        done += size_t(n);
    }
    if (fchmod(fd, 0644) < 0 || fsync(fd) < 0) {
        const int err = errno;
        close(fd);
        unlink(tmp.c_str());
        throw fail("cannot write", err);
    }
    close(fd);
    if (rename(tmp.c_str(), path.c_str()) < 0) {
        const int err = errno;
        unlink(tmp.c_str());
        throw fail("cannot replace", err);
    }
    const int dirFd = open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (dirFd >= 0) {
        fsync(dirFd);
        close(dirFd);
    }
}

}  // namespace HostCtl::Lib
