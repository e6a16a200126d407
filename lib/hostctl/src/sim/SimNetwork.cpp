// The simulated host's network: links, VLANs, DHCP, router advertisements,
// DHCPv6, switches, reachability and name resolution, booting and the hosts
// file.
#include "hostctl/SimNetwork.hpp"

#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <optional>
#include <set>
#include <system_error>

#include "SimNetworkModel.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace HostCtl::Lib {

using Network::IpAddress;
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

// Host names compare without regard to letter case, as resolvers do.
bool SameName(const std::string& a, const std::string& b) { return Lower(a) == Lower(b); }

bool IsIpText(const std::string& text) {
    return Ipv4Address::IsValidAddress(text) || Ipv6Address::IsValidAddress(text);
}

void AddOnce(std::vector<IpAddress>& list, const IpAddress& address) {
    if (std::find(list.begin(), list.end(), address) == list.end()) list.push_back(address);
}

// The management interface's IPv4 address, or "" when it has none (or the
// state does not tell).
std::string ManagementIpv4(const json& state) {
    const std::string vnic = TextAt(state, "/network/managementInterface");
    if (vnic.empty() || !state.contains(json::json_pointer("/network/vnics"))) return "";
    const json& vnics = state.at(json::json_pointer("/network/vnics"));
    if (!vnics.is_array()) return "";
    for (const json& v : vnics) {
        if (!v.is_object() || v.value("name", json()) != vnic) continue;
        const std::string address = TextAt(v, "/ipv4/address");
        if (!Ipv4Address::IsValidAddress(address) || Ipv4Address(address).IsZero()) return "";
        return address;
    }
    return "";
}

// Whether the interface has an IPv6 address of the right kind: any for a
// link-local target, a global one otherwise.
bool HasIpv6For(const json& addresses, const Ipv6Address& target) {
    for (const json& a : addresses) {
        const std::string text = a.is_object() ? TextAt(a, "/address") : "";
        if (!Ipv6Address::IsValidAddress(text)) continue;
        if (target.IsLinkLocal() || !Ipv6Address(text).IsLinkLocal()) return true;
    }
    return false;
}

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

std::string NetworkView::DvsPortPointer(const std::string& dvsPointer, const std::string& port) const {
    std::string p = Find(dvsPointer + "/ports", port, "key");
    if (p.empty())
        throw _sim.Error("distributed switch \"" + _sim.String(_view, dvsPointer + "/name") +
                         "\" has no port \"" + port + "\"");
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
    if (!_sim.Bool(_view, v + "/enabled") || PortBlocked(v)) return false;
    for (const std::string& uplink : Uplinks(v))
        if (PnicHasLink(uplink)) return true;
    return false;
}

std::vector<std::string> NetworkView::Uplinks(const std::string& v) const {
    std::vector<std::string> uplinks;
    switch (_sim.Integer(_view, v + "/connectionType")) {
        case Network::ConnectionPoint::PortGroup: {
            const std::string portGroup = _sim.String(_view, v + "/portgroup");
            const std::string list = "/network/vswitches";
            for (size_t i = 0; i < _sim.Array(_view, list).size(); ++i) {
                const std::string sw = At(list, i);
                if (Find(sw + "/portgroups", portGroup).empty()) continue;
                for (const char* role : {"/teaming/active", "/teaming/standby"})
                    for (const std::string& uplink : _sim.StringList(_view, sw + role))
                        uplinks.push_back(uplink);
                break;
            }
            break;
        }
        case Network::ConnectionPoint::DvsPort: {
            const std::string dvs = Find("/network/dvswitches", _sim.String(_view, v + "/dvs"));
            if (dvs.empty()) break;
            const std::string port = Find(dvs + "/ports", _sim.String(_view, v + "/port"), "key");
            if (port.empty()) break;
            // A port limited to some uplinks reaches the network only through those.
            const bool limited = _view.at(json::json_pointer(port)).contains("uplinks");
            const std::vector<std::string> allowed =
                limited ? _sim.StringList(_view, port + "/uplinks") : std::vector<std::string>{};
            const std::string ports = dvs + "/uplinkPorts";
            for (size_t i = 0; i < _sim.Array(_view, ports).size(); ++i) {
                const std::string key = _sim.String(_view, At(ports, i) + "/key");
                if (limited && std::find(allowed.begin(), allowed.end(), key) == allowed.end()) continue;
                const std::string pnic = _sim.String(_view, At(ports, i) + "/pnic");
                if (!pnic.empty()) uplinks.push_back(pnic);
            }
            break;
        }
        default:
            break;
    }
    return uplinks;
}

bool NetworkView::PortBlocked(const std::string& v) const {
    if (_sim.Integer(_view, v + "/connectionType") != Network::ConnectionPoint::DvsPort) return false;
    const std::string dvs = Find("/network/dvswitches", _sim.String(_view, v + "/dvs"));
    if (dvs.empty()) return false;
    const std::string port = Find(dvs + "/ports", _sim.String(_view, v + "/port"), "key");
    if (port.empty()) return false;
    return _view.at(json::json_pointer(port)).contains("blocked") && _sim.Bool(_view, port + "/blocked");
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

// ---- Reachability and name resolution ----

const json* NetworkView::Machine(const std::string& pointer, const IpAddress& target) const {
    const json::json_pointer at(pointer);
    if (!_view.contains(at) || _view.at(at).is_null()) return nullptr;
    // Every entry is checked, so that a broken list fails whatever is asked.
    const json& machines = _sim.Object(_view, pointer);
    const json* found = nullptr;
    for (auto it = machines.begin(); it != machines.end(); ++it) {
        if (!IsIpText(it.key()))
            throw _sim.Error("field " + pointer + " holds \"" + it.key() + "\", which is not an IP address");
        if (!it->is_object()) throw _sim.Error("field " + pointer + "/" + it.key() + " must be an object");
        if (IpAddress(it.key()) == target) found = &*it;
    }
    return found;
}

bool NetworkView::IsOwnAddress(const std::string& v, const IpAddress& target) const {
    if (!target.IsIpv6()) {
        const std::string text = _sim.String(_view, v + "/ipv4/address");
        if (!Ipv4Address::IsValidAddress(text))
            throw _sim.Error("field " + v + "/ipv4/address is not an IPv4 address: \"" + text + "\"");
        return !Ipv4Address(text).IsZero() && Ipv4Address(text) == target.V4();
    }
    if (!_sim.Bool(_view, "/network/ipv6Enabled")) return false;
    for (const json& a : _sim.Array(_view, v + "/ipv6/addresses")) {
        const std::string text = a.is_object() ? TextAt(a, "/address") : "";
        if (Ipv6Address::IsValidAddress(text) && Ipv6Address(text) == target.V6()) return true;
    }
    return false;
}

const json* NetworkView::OnSegment(const std::string& v, const IpAddress& target) const {
    const int vlan = Vlan(v);
    if (vlan < 0) return nullptr;
    const json* machine = Machine("/network/lan/" + std::to_string(vlan) + "/hosts", target);
    if (machine == nullptr) return nullptr;
    if (target.IsIpv6()) {
        if (!_sim.Bool(_view, "/network/ipv6Enabled")) return nullptr;
        return HasIpv6For(_sim.Array(_view, v + "/ipv6/addresses"), target.V6()) ? machine : nullptr;
    }
    const std::string address = _sim.String(_view, v + "/ipv4/address");
    const std::string netmask = _sim.String(_view, v + "/ipv4/netmask");
    if (!Ipv4Address::IsValidAddress(address) || !Ipv4Address::IsValidAddress(netmask))
        throw _sim.Error("field " + v + "/ipv4 holds an address or netmask that is not IPv4");
    if (Ipv4Address(address).IsZero()) return nullptr;
    const uint32_t mask = Ipv4Address(netmask).GetHostOrder();
    const bool same = (Ipv4Address(address).GetHostOrder() & mask) == (target.V4().GetHostOrder() & mask);
    return same ? machine : nullptr;
}

const json* NetworkView::Reach(const std::string& v, const IpAddress& target) const {
    static const json OWN = json::object();
    if (!HasLink(v)) return nullptr;
    if (IsOwnAddress(v, target)) return &OWN;
    if (const json* machine = OnSegment(v, target)) return machine;
    // Beyond the segment only through the default gateway of the family.
    const json* remote = Machine("/network/remote", target);
    if (remote == nullptr) return nullptr;
    const std::string field =
        target.IsIpv6() ? "/network/routing/ipv6Gateway" : "/network/routing/ipv4Gateway";
    const std::string gateway = _sim.String(_view, field);
    if (!IsIpText(gateway)) throw _sim.Error("field " + field + " is not an IP address: \"" + gateway + "\"");
    const IpAddress router(gateway);
    if (router.IsIpv6() != target.IsIpv6() || (router.IsIpv6() ? router.V6().IsZero() : router.V4().IsZero()))
        return nullptr;
    return OnSegment(v, router) != nullptr ? remote : nullptr;
}

std::string NetworkView::Holder(const std::string& v, const IpAddress& address) const {
    const int vlan = Vlan(v);
    if (vlan < 0 || !HasLink(v)) return "";
    const std::string segment = "/network/lan/" + std::to_string(vlan);
    const std::string where = "VLAN " + std::to_string(vlan);
    if (const json* machine = Machine(segment + "/hosts", address)) {
        const auto name = machine->find("name");
        if (name == machine->end()) return "a machine on " + where;
        if (!name->is_string())
            throw _sim.Error("the \"name\" field of machine " + address.GetStringAddress() + " must be text");
        return name->get<std::string>();
    }
    // The servers of the segment: a router holds its own address, and a DHCP
    // server's leases are held by the other clients.
    const std::string ownMac = Lower(_sim.String(_view, v + "/mac"));
    for (const char* kind : {"dhcp", "routerAdvertisement", "dhcpv6"}) {
        const json::json_pointer at(segment + "/" + kind);
        if (!_view.contains(at) || _view.at(at).is_null()) continue;
        const std::string server = segment + "/" + kind;
        const json& object = _sim.Object(_view, server);
        for (const char* router : {"gateway", "router"}) {
            if (!object.contains(router)) continue;
            const std::string text = _sim.String(_view, server + "/" + router);
            if (IsIpText(text) && IpAddress(text) == address) return "the router of " + where;
        }
        if (!object.contains("leases") || object["leases"].is_null()) continue;
        const json& leases = _sim.Object(_view, server + "/leases");
        for (auto it = leases.begin(); it != leases.end(); ++it) {
            const std::string held = it->is_string() ? it->get<std::string>() : "";
            if (Lower(it.key()) != ownMac && IsIpText(held) && IpAddress(held) == address) return it.key();
        }
    }
    return "";
}

std::vector<QelCtl::Network::NetworkCheck> NetworkView::Checks(const std::string& v) const {
    using Check = QelCtl::Network::NetworkCheck;
    using Outcome = Check::Outcome;
    std::vector<Check> checks;
    auto add = [&](std::string subject, Outcome outcome, std::string detail = "") {
        checks.push_back({std::move(subject), outcome, std::move(detail)});
    };
    const std::string name = _sim.String(_view, v + "/name");

    // Link: one physical uplink with carrier is enough; the others that have
    // none are only warned about.
    const std::vector<std::string> uplinks = Uplinks(v);
    if (!_sim.Bool(_view, v + "/enabled")) {
        add("link of " + name, Outcome::Failed, "interface down");
    } else if (PortBlocked(v)) {
        add("link of " + name, Outcome::Failed, "port blocked");
    } else if (uplinks.empty()) {
        add("link of " + name, Outcome::Failed, "no uplink");
    } else {
        const bool any = HasLink(v);
        for (const std::string& uplink : uplinks) {
            if (PnicHasLink(uplink))
                add("link of " + uplink, Outcome::Passed);
            else
                add("link of " + uplink, any ? Outcome::Warning : Outcome::Failed, "no carrier");
        }
    }

    // Addresses: present, and held by no other machine of the segment.
    auto address = [&](const std::string& subject, const IpAddress& held) {
        const std::string holder = Holder(v, held);
        if (holder.empty())
            add(subject, Outcome::Passed);
        else
            add(subject, Outcome::Failed, "duplicate address, used by " + holder);
    };
    if (!_sim.Bool(_view, v + "/ipv4/none")) {
        const std::string text = _sim.String(_view, v + "/ipv4/address");
        if (!Ipv4Address::IsValidAddress(text))
            throw _sim.Error("field " + v + "/ipv4/address is not an IPv4 address: \"" + text + "\"");
        const bool dhcp = _sim.Bool(_view, v + "/ipv4/dhcp");
        if (Ipv4Address(text).IsZero())
            add(dhcp ? "IPv4 address (DHCP)" : "IPv4 address", Outcome::Failed, "no address");
        else
            address("address " + text, IpAddress(text));
    }
    if (_sim.Bool(_view, "/network/ipv6Enabled")) {
        const json& held = _sim.Array(_view, v + "/ipv6/addresses");
        auto holds = [&](const Ipv6Address& wanted, const char* type) {
            for (const json& a : held) {
                const std::string text = a.is_object() ? TextAt(a, "/address") : "";
                if (Ipv6Address::IsValidAddress(text) && Ipv6Address(text) == wanted &&
                    (type == nullptr || TextAt(a, "/type") == type))
                    return true;
            }
            return false;
        };
        const std::string statics = v + "/ipv6/static";
        for (size_t i = 0; i < _sim.Array(_view, statics).size(); ++i) {
            const std::string text = _sim.String(_view, At(statics, i) + "/address");
            if (!Ipv6Address::IsValidAddress(text))
                throw _sim.Error("field " + At(statics, i) + "/address is not an IPv6 address: \"" + text +
                                 "\"");
            const Ipv6Address wanted(text);
            const std::string subject = "address " + wanted.GetStringAddress();
            if (!holds(wanted, nullptr))
                add(subject, Outcome::Failed, "no address");
            else
                address(subject, IpAddress(wanted.GetStringAddress()));
        }
        // Obtained addresses are the network's to give; a DHCPv6 server that
        // does not answer is worth a warning.
        bool leased = false;
        for (const json& a : held) {
            const std::string text = a.is_object() ? TextAt(a, "/address") : "";
            const std::string type = a.is_object() ? TextAt(a, "/type") : "";
            if (type == "static" || !Ipv6Address::IsValidAddress(text) || Ipv6Address(text).IsLinkLocal())
                continue;
            leased = leased || type == "dhcp";
            add("address " + Ipv6Address(text).GetStringAddress(), Outcome::Passed);
        }
        if (_sim.Bool(_view, v + "/ipv6/dhcp") && !leased)
            add("IPv6 address (DHCPv6)", Outcome::Warning, "no address");
    }

    // Default gateways answer on the link.
    for (const char* family : {"ipv4Gateway", "ipv6Gateway"}) {
        const std::string field = std::string("/network/routing/") + family;
        const std::string text = _sim.String(_view, field);
        if (!IsIpText(text)) throw _sim.Error("field " + field + " is not an IP address: \"" + text + "\"");
        const IpAddress gateway(text);
        if (gateway.IsIpv6() ? gateway.V6().IsZero() : gateway.V4().IsZero()) continue;
        const std::string subject = (gateway.IsIpv6() ? "IPv6 gateway " : "gateway ") + text;
        if (IsOwnAddress(v, gateway))
            add(subject, Outcome::Failed, "the host's own address");
        else if (OnSegment(v, gateway) == nullptr || !HasLink(v))
            add(subject, Outcome::Failed, "no answer");
        else
            add(subject, Outcome::Passed);
    }

    // Name servers: a DNS server that answers from the interface answers
    // the query for the host's own name.
    std::vector<std::string> servers = _sim.StringList(_view, "/network/dns/servers");
    for (const std::string& server : _sim.StringList(_view, "/network/dns/ipv6Servers"))
        servers.push_back(server);
    for (const std::string& server : servers) {
        if (!IsIpText(server)) throw _sim.Error("the name server \"" + server + "\" is not an IP address");
        const json* machine = Reach(v, IpAddress(server));
        const bool answers = machine != nullptr && machine->value("dns", json(false)) == json(true);
        if (answers)
            add("name server " + server, Outcome::Passed);
        else
            add("name server " + server, Outcome::Warning, "no answer");
    }
    return checks;
}

std::vector<IpAddress> NetworkView::Resolve(const std::string& name) const {
    if (name.empty()) return {};
    const std::vector<IpAddress> found = FromHostsFile(name);
    return found.empty() ? FromDns(name) : found;
}

std::vector<IpAddress> NetworkView::FromHostsFile(const std::string& name) const {
    // A host without a hosts file (or an unreadable one) asks DNS, as
    // resolvers do.
    std::vector<IpAddress> found;
    std::string text;
    Lib::ReadText(_sim.Root() + "/etc/hosts", text);
    for (const std::string& line : Lib::Lines(text)) {
        const std::vector<std::string> fields = Lib::Words(std::string_view(line).substr(0, line.find('#')));
        bool named = false;
        for (size_t f = 1; f < fields.size(); ++f) named = named || SameName(fields[f], name);
        if (named && IsIpText(fields[0])) AddOnce(found, IpAddress(fields[0]));
    }
    return found;
}

std::vector<IpAddress> NetworkView::FromDns(const std::string& name) const {
    const std::string vnic = _sim.String(_view, "/network/managementInterface");
    const std::string v = vnic.empty() ? "" : Find("/network/vnics", vnic);
    if (v.empty() || !_view.contains(json::json_pointer("/network/dnsZone"))) return {};
    const json& zone = _sim.Object(_view, "/network/dnsZone");

    std::vector<std::string> servers = _sim.StringList(_view, "/network/dns/servers");
    for (const std::string& server : _sim.StringList(_view, "/network/dns/ipv6Servers"))
        servers.push_back(server);
    std::vector<std::string> candidates = {name};
    if (name.find('.') == std::string::npos)
        for (const std::string& domain : _sim.StringList(_view, "/network/dns/searchDomains"))
            candidates.push_back(name + "." + domain);

    for (const std::string& server : servers) {
        if (!IsIpText(server)) throw _sim.Error("the name server \"" + server + "\" is not an IP address");
        const json* machine = Reach(v, IpAddress(server));
        if (machine == nullptr) continue;
        const auto dns = machine->find("dns");
        if (dns != machine->end() && !dns->is_boolean())
            throw _sim.Error("the \"dns\" field of machine " + server + " must be true or false");
        if (dns == machine->end() || !dns->get<bool>()) continue;
        // The first name server that answers gives the answer.
        std::vector<IpAddress> found;
        for (const std::string& candidate : candidates) {
            for (auto it = zone.begin(); it != zone.end(); ++it) {
                std::string key = it.key();
                if (!key.empty() && key.back() == '.') key.pop_back();
                std::string wanted = candidate;
                if (!wanted.empty() && wanted.back() == '.') wanted.pop_back();
                if (!SameName(key, wanted)) continue;
                if (!it->is_array())
                    throw _sim.Error("field /network/dnsZone/" + it.key() + " must be an array");
                for (const json& address : *it) {
                    if (!address.is_string() || !IsIpText(address.get<std::string>()))
                        throw _sim.Error("field /network/dnsZone/" + it.key() + " holds " + address.dump() +
                                         ", which is not an IP address");
                    AddOnce(found, IpAddress(address.get<std::string>()));
                }
            }
            if (!found.empty()) break;
        }
        return found;
    }
    return {};
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

void NetworkModel::AddDvsUplink(const std::string& dvs, const std::string& uplinkPort,
                                const std::string& pnic) {
    const std::string d = DvsPointer(dvs);
    PnicPointer(pnic);
    const std::string port = Find(d + "/uplinkPorts", uplinkPort, "key");
    if (port.empty())
        throw HostCtlException("distributed switch \"" + dvs + "\" has no uplink port \"" + uplinkPort +
                               "\"");
    const std::string backing = _sim.String(_view, port + "/pnic");
    if (!backing.empty())
        throw HostCtlException("uplink port \"" + uplinkPort + "\" is already backed by \"" + backing + "\"");
    const std::string owner = SwitchOfPnic(pnic);
    if (!owner.empty())
        throw HostCtlException("physical NIC \"" + pnic + "\" is already used by switch \"" + owner + "\"");
    Object(port)["pnic"] = pnic;
}

void NetworkModel::SetConnectionPoint(const std::string& v, int type, const std::string& name) {
    const std::string vnic = _sim.String(_view, v + "/name");
    // The distributed port the interface leaves, when it is on one.
    std::string oldPort;
    if (_sim.Integer(_view, v + "/connectionType") == Network::ConnectionPoint::DvsPort) {
        const std::string dvs = Find("/network/dvswitches", _sim.String(_view, v + "/dvs"));
        if (!dvs.empty()) oldPort = Find(dvs + "/ports", _sim.String(_view, v + "/port"), "key");
    }
    std::string dvsName, port;
    if (type == Network::ConnectionPoint::DvsPort) {
        dvsName = ConnectionPointSwitch(type, name);
        port = DvsPortPointer(DvsPointer(dvsName), name);
        std::string user = _sim.String(_view, port + "/connectee");
        const std::string list = "/network/vnics";
        for (size_t i = 0; i < _sim.Array(_view, list).size() && user.empty(); ++i) {
            const std::string other = ::HostCtl::Lib::At(list, i);
            if (other != v &&
                _sim.Integer(_view, other + "/connectionType") == Network::ConnectionPoint::DvsPort &&
                _sim.String(_view, other + "/dvs") == dvsName && _sim.String(_view, other + "/port") == name)
                user = _sim.String(_view, other + "/name");
        }
        if (!user.empty() && user != vnic)
            throw HostCtlException("port \"" + name + "\" of distributed switch \"" + dvsName +
                                   "\" is already used by \"" + user + "\"");
    } else if (type == Network::ConnectionPoint::PortGroup) {
        ConnectionPointSwitch(type, name);  // the port group must exist
    } else {
        throw HostCtlException(
            "a virtual NIC connects to a port group (type 1) or a distributed port (type 2), "
            "not to type " +
            std::to_string(type));
    }

    if (!oldPort.empty() && _sim.String(_view, oldPort + "/connectee") == vnic)
        Object(oldPort)["connectee"] = "";
    json& nic = Object(v);
    nic["connectionType"] = type;
    if (type == Network::ConnectionPoint::PortGroup) {
        nic.erase("dvs");
        nic.erase("port");
        nic["portgroup"] = name;
    } else {
        nic.erase("portgroup");
        nic["dvs"] = dvsName;
        nic["port"] = name;
        Object(port)["connectee"] = vnic;
    }
}

void NetworkModel::AddVirtualSwitch(const std::string& vswitch) {
    if (vswitch.empty()) throw HostCtlException("a switch needs a name");
    if (!Find("/network/vswitches", vswitch).empty() || !Find("/network/dvswitches", vswitch).empty())
        throw HostCtlException("the host already has a switch named \"" + vswitch + "\"");
    At("/network/vswitches")
        .push_back({{"name", vswitch},
                    {"uplinks", json::array()},
                    {"maxActiveUplinks", 2},
                    {"teaming", {{"active", json::array()}, {"standby", json::array()}}},
                    {"portgroups", json::array()}});
}

void NetworkModel::RemoveVirtualSwitch(const std::string& vswitch) {
    const std::string sw = VswitchPointer(vswitch);
    const std::string vnics = "/network/vnics";
    for (size_t i = 0; i < _sim.Array(_view, vnics).size(); ++i) {
        const std::string v = ::HostCtl::Lib::At(vnics, i);
        if (_sim.Integer(_view, v + "/connectionType") != Network::ConnectionPoint::PortGroup) continue;
        if (!Find(sw + "/portgroups", _sim.String(_view, v + "/portgroup")).empty())
            throw HostCtlException("switch \"" + vswitch + "\" is used by \"" +
                                   _sim.String(_view, v + "/name") + "\"");
    }
    json kept = json::array();
    for (const json& other : _sim.Array(_view, "/network/vswitches"))
        if (!other.is_object() || other.value("name", "") != vswitch) kept.push_back(other);
    At("/network/vswitches") = std::move(kept);
}

void NetworkModel::AddPortGroup(const std::string& vswitch, const std::string& portGroup, unsigned vlan) {
    const std::string sw = VswitchPointer(vswitch);
    if (portGroup.empty()) throw HostCtlException("a port group needs a name");
    if (vlan > 4095) throw HostCtlException("VLAN ID " + std::to_string(vlan) + " is above 4095");
    const std::string list = "/network/vswitches";
    for (size_t i = 0; i < _sim.Array(_view, list).size(); ++i) {
        const std::string other = ::HostCtl::Lib::At(list, i);
        if (!Find(other + "/portgroups", portGroup).empty())
            throw HostCtlException("port group \"" + portGroup + "\" already exists on switch \"" +
                                   _sim.String(_view, other + "/name") + "\"");
    }
    At(sw + "/portgroups").push_back({{"name", portGroup}, {"vlan", vlan}});
}

std::string NetworkModel::AddDvsHostLocalPort(const std::string& dvs,
                                              const Network::DistributedSwitch::PortSettings& settings) {
    const std::string d = DvsPointer(dvs);
    if (settings.vlanId > 4095)
        throw HostCtlException("VLAN ID " + std::to_string(settings.vlanId) + " is above 4095");
    for (const std::string& uplink : settings.uplinks)
        if (Find(d + "/uplinkPorts", uplink, "key").empty())
            throw HostCtlException("distributed switch \"" + dvs + "\" has no uplink port \"" + uplink +
                                   "\"");
    // A number above every numeric key of the switch's ports.
    uint64_t highest = 99;
    for (const char* list : {"/ports", "/uplinkPorts"}) {
        for (size_t i = 0; i < _sim.Array(_view, d + list).size(); ++i) {
            const std::string key = _sim.String(_view, ::HostCtl::Lib::At(d + list, i) + "/key");
            if (!key.empty() && key.size() < 19 && key.find_first_not_of("0123456789") == std::string::npos)
                highest = std::max<uint64_t>(highest, std::stoull(key));
        }
    }
    const std::string key = std::to_string(highest + 1);
    json port = {{"key", key},
                 {"vlan", settings.vlanId},
                 {"blocked", settings.blocked},
                 {"hostLocal", true},
                 {"connectee", ""}};
    if (!settings.uplinks.empty()) port["uplinks"] = settings.uplinks;
    At(d + "/ports").push_back(std::move(port));
    return key;
}

void NetworkModel::RemoveDvsHostLocalPort(const std::string& dvs, const std::string& port) {
    const std::string d = DvsPointer(dvs);
    const std::string p = DvsPortPointer(d, port);
    if (!_sim.Bool(_view, p + "/hostLocal"))
        throw HostCtlException("port \"" + port + "\" of distributed switch \"" + dvs +
                               "\" is not host-local");
    std::string user = _sim.String(_view, p + "/connectee");
    const std::string vnics = "/network/vnics";
    for (size_t i = 0; i < _sim.Array(_view, vnics).size() && user.empty(); ++i) {
        const std::string v = ::HostCtl::Lib::At(vnics, i);
        if (_sim.Integer(_view, v + "/connectionType") == Network::ConnectionPoint::DvsPort &&
            _sim.String(_view, v + "/dvs") == dvs && _sim.String(_view, v + "/port") == port)
            user = _sim.String(_view, v + "/name");
    }
    if (!user.empty())
        throw HostCtlException("port \"" + port + "\" of distributed switch \"" + dvs + "\" is used by \"" +
                               user + "\"");
    json kept = json::array();
    for (const json& other : _sim.Array(_view, d + "/ports"))
        if (!other.is_object() || other.value("key", "") != port) kept.push_back(other);
    At(d + "/ports") = std::move(kept);
}

void NetworkModel::ClearConfig() {
    const std::string dumper = _sim.String(_view, "/network/netDumper/interface");
    if (_sim.Bool(_view, "/network/netDumper/enabled") && !dumper.empty())
        throw HostCtlException("the network core dump sender is enabled on \"" + dumper +
                               "\": disable it first");
    for (const char* list : {"/network/vnics", "/network/vswitches", "/network/dvswitches"}) {
        _sim.Array(_view, list);
        At(list) = json::array();
    }
    Object("/network")["managementInterface"] = "";
    for (const char* routing : {"/network/routing", "/network/saved/routing"}) {
        json& r = Object(routing);
        r["ipv4Gateway"] = "0.0.0.0";
        r["ipv6Gateway"] = "::";
    }
    for (const char* dns : {"/network/dns", "/network/saved/dns"}) {
        json& d = Object(dns);
        d["servers"] = json::array();
        d["ipv6Servers"] = json::array();
    }
}

void NetworkModel::AutoConfig() {
    const std::pair<const char*, const char*> parts[] = {{"/network/vnics", "virtual NICs"},
                                                         {"/network/vswitches", "standard switches"},
                                                         {"/network/dvswitches", "distributed switches"}};
    for (const auto& [list, what] : parts)
        if (!_sim.Array(_view, list).empty())
            throw HostCtlException(std::string("the network is not clear: the host still has ") + what);
    std::string names[3];
    const char* const fields[3] = {"/network/factory/vswitch", "/network/factory/portgroup",
                                   "/network/factory/vnic"};
    for (int i = 0; i < 3; ++i) {
        names[i] = _sim.String(_view, fields[i]);
        if (names[i].empty()) throw _sim.Error(std::string("field ") + fields[i] + " may not be empty");
    }
    const std::string pnics = "/network/pnics";
    if (_sim.Array(_view, pnics).empty())
        throw HostCtlException("the host has no physical NIC to configure the network on");
    // The first NIC with link; without any, the first NIC.
    std::string uplink = ::HostCtl::Lib::At(pnics, 0);
    for (size_t i = _sim.Array(_view, pnics).size(); i-- > 0;)
        if (_sim.Bool(_view, ::HostCtl::Lib::At(pnics, i) + "/linkUp")) uplink = ::HostCtl::Lib::At(pnics, i);
    const std::string pnic = _sim.String(_view, uplink + "/name");
    const std::string mac = _sim.String(_view, uplink + "/mac");
    if (!ParseMac(mac)) throw _sim.Error("field " + uplink + "/mac is not a MAC address: \"" + mac + "\"");

    At("/network/vswitches")
        .push_back({{"name", names[0]},
                    {"uplinks", json::array({pnic})},
                    {"maxActiveUplinks", 2},
                    {"teaming", {{"active", json::array({pnic})}, {"standby", json::array()}}},
                    {"portgroups", json::array({{{"name", names[1]}, {"vlan", 0}}})}});
    At("/network/vnics")
        .push_back(
            {{"name", names[2]},
             {"mac", Lower(mac)},
             {"enabled", true},
             {"dhcpDns", true},
             {"connectionType", Network::ConnectionPoint::PortGroup},
             {"portgroup", names[1]},
             {"ipv4", {{"dhcp", true}, {"none", false}, {"address", "0.0.0.0"}, {"netmask", "0.0.0.0"}}},
             {"ipv6",
              {{"dhcp", false},
               {"routerAdvertisement", true},
               {"static", json::array()},
               {"addresses", json::array()}}}});
    Object("/network")["managementInterface"] = names[2];
    Configure("/network/vnics/0");
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
    const std::string hostname = TextAt(state, "/network/dns/hostname");
    const std::string domain = TextAt(state, "/network/dns/domain");
    const std::string address = ManagementIpv4(state);
    if (hostname.empty() || address.empty()) return "";
    return address + "\t" + (domain.empty() ? hostname : hostname + "." + domain + " " + hostname);
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
        std::string old;
        struct stat st;
        if (!Lib::ReadText(path, old) && stat(path.c_str(), &st) == 0) throw fail("cannot read", EACCES);
        bool placed = false;
        for (const std::string& line : Lib::Lines(old)) {
            const std::vector<std::string> fields =
                Lib::Words(std::string_view(line).substr(0, line.find('#')));
            bool ours = false;
            for (size_t f = 1; f < fields.size(); ++f) ours = ours || names.count(fields[f]);
            if (ours && !IsLoopback(fields[0])) {
                if (!placed && !entry.empty()) text += entry + "\n";
                placed = true;
                continue;
            }
            text += line + "\n";
        }
        if (!placed && !entry.empty()) text += entry + "\n";
    }

    if (mkdir(dir.c_str(), 0755) < 0 && errno != EEXIST) throw fail("cannot create its folder", errno);
    ReplaceFile(path, text, 0644);
}

json ReachableHost(const SimState& sim, const json& state, const std::string& vnic,
                   const std::string& target) {
    if (!IsIpText(target)) throw HostCtlException("\"" + target + "\" is not an IP address");
    try {
        const NetworkView view(sim, state);
        const json* machine = view.Reach(view.VnicPointer(vnic), IpAddress(target));
        return machine != nullptr ? *machine : json();
    } catch (const json::exception& e) {
        const std::string what = e.what();
        const size_t tagEnd = what.find("] ");
        throw sim.Error(tagEnd == std::string::npos ? what : what.substr(tagEnd + 2));
    }
}

void RegisterHostInDnsZone(json& state) {
    const std::string hostname = TextAt(state, "/network/dns/hostname");
    const std::string domain = TextAt(state, "/network/dns/domain");
    if (hostname.empty() || !state.is_object() || !state["network"].is_object()) return;
    json& zone = state["network"]["dnsZone"];
    if (!zone.is_object()) zone = json::object();
    const std::string fqdn = domain.empty() ? hostname : hostname + "." + domain;
    const std::string address = ManagementIpv4(state);
    if (address.empty())
        zone.erase(fqdn);
    else
        zone[fqdn] = json::array({address});
}

}  // namespace HostCtl::Lib
