// The backend of a real Debian host.
#include "LinuxBackend.hpp"

#include <fcntl.h>
#include <fnmatch.h>
#include <netdb.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/utsname.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <future>
#include <map>
#include <mutex>
#include <nlohmann/json.hpp>
#include <set>

#include "HostConfig.hpp"
#include "HostShell.hpp"
#include "LinkState.hpp"
#include "LinuxPaths.hpp"
#include "NetworkApply.hpp"
#include "NetworkChecks.hpp"
#include "hostctl/Host.hpp"

namespace HostCtl::Lib::Linux {

namespace {

using Network::Ipv4Address;
using Network::Ipv6Address;
using Network::Ipv6AddressType;
using Network::Ipv6Network;

// What a Debian host does not have: one clear message naming the operation
// and why.
[[noreturn]] void Refuse(const std::string& operation, const std::string& why) {
    throw HostCtlException(operation + ": " + why);
}

const char* const NO_DVS = "a Debian host has no distributed switches";

// A file's whole text, or nothing when it cannot be read.
std::optional<std::string> ReadHostText(const std::string& hostPath) {
    std::string text;
    if (!ReadText(HostPath(hostPath), text)) return std::nullopt;
    return text;
}

std::string Trim(const std::string& text) {
    const size_t begin = text.find_first_not_of(" \t\r\n");
    if (begin == std::string::npos) return "";
    return text.substr(begin, text.find_last_not_of(" \t\r\n") - begin + 1);
}

std::string FirstLine(const std::string& hostPath) {
    const std::string text = ReadHostText(hostPath).value_or("");
    return Trim(text.substr(0, text.find('\n')));
}

// "KEY=value" and "KEY="quoted value"" lines (os-release, /etc/default files).
std::map<std::string, std::string> ShellAssignments(const std::string& text) {
    std::map<std::string, std::string> values;
    for (std::string line : Lines(text)) {
        line = Trim(line);
        const size_t eq = line.find('=');
        if (line.empty() || line[0] == '#' || eq == std::string::npos) continue;
        std::string value = line.substr(eq + 1);
        if (value.size() >= 2 && (value[0] == '"' || value[0] == '\'') && value.back() == value[0])
            value = value.substr(1, value.size() - 2);
        values[line.substr(0, eq)] = value;
    }
    return values;
}

// The resolver file's servers, search domains and domain.
struct Resolver {
    std::vector<Ipv4Address> servers;
    std::vector<Ipv6Address> ipv6Servers;
    std::vector<std::string> search;
    std::string domain;
};

Resolver ReadResolver() {
    Resolver r;
    for (std::string line : Lines(ReadHostText("/etc/resolv.conf").value_or(""))) {
        std::vector<std::string> w = Words(line);
        if (w.size() < 2) continue;
        if (w[0] == "nameserver") {
            // A scoped link-local server ("fe80::1%eth0") is kept without its scope.
            const std::string address = w[1].substr(0, w[1].find('%'));
            if (Ipv4Address::IsValidAddress(address))
                r.servers.emplace_back(address);
            else if (Ipv6Address::IsValidAddress(address))
                r.ipv6Servers.emplace_back(address);
        } else if (w[0] == "search") {
            r.search.assign(w.begin() + 1, w.end());
        } else if (w[0] == "domain") {
            r.domain = w[1];
        }
    }
    return r;
}

// The hosts file's lines as address and names.
std::vector<std::vector<std::string>> HostsEntries() {
    std::vector<std::vector<std::string>> entries;
    for (std::string line : Lines(ReadHostText("/etc/hosts").value_or(""))) {
        std::vector<std::string> w = Words(line.substr(0, line.find('#')));
        if (w.size() >= 2) entries.push_back(std::move(w));
    }
    return entries;
}

// The kernel's host name as it is, domain and all.
std::string NodeName() {
    utsname u{};
    uname(&u);
    return u.nodename;
}

// The files besides the interfaces files that the network window changes.
const char* const HOST_FILES[] = {"/etc/hostname", "/etc/hosts", "/etc/resolv.conf"};

std::string ShortHostName() {
    utsname u{};
    uname(&u);
    const std::string name = u.nodename;
    return name.substr(0, name.find('.'));
}

// The domain: the kernel's name when it is fully qualified, else the fully
// qualified name the hosts file gives the short name, else the resolver's.
std::string HostDomain() {
    utsname u{};
    uname(&u);
    const std::string node = u.nodename;
    if (node.find('.') != std::string::npos) return node.substr(node.find('.') + 1);
    const std::string prefix = node + ".";
    for (const auto& entry : HostsEntries())
        for (size_t i = 1; i < entry.size(); ++i)
            if (entry[i].rfind(prefix, 0) == 0 && entry[i].size() > prefix.size())
                return entry[i].substr(prefix.size());
    return ReadResolver().domain;
}

// The addresses the hosts file gives `name` (the host's own line).
std::vector<std::string> HostsAddresses(const std::string& name) {
    std::vector<std::string> found;
    for (const auto& entry : HostsEntries())
        for (size_t i = 1; i < entry.size(); ++i)
            if (entry[i] == name || entry[i].substr(0, entry[i].find('.')) == name) {
                // Loopback lines (127.0.1.1 of an installer) name no interface.
                if (entry[0].rfind("127.", 0) != 0 && entry[0] != "::1") found.push_back(entry[0]);
                break;
            }
    return found;
}

Ipv4Address Netmask(int prefix) {
    return Ipv4Address::FromHostOrder(prefix <= 0 ? 0 : prefix >= 32 ? ~0u : ~0u << (32 - prefix));
}

std::string SysctlPath(const std::string& name, const std::string& key) {
    return "/proc/sys/net/ipv6/conf/" + name + "/" + key;
}

int ReadInt(const std::string& hostPath, int fallback) {
    const std::string text = FirstLine(hostPath);
    if (text.empty()) return fallback;
    try {
        return std::stoi(text);
    } catch (const std::exception&) {
        return fallback;
    }
}

// Keyboard layouts the console offers, as console-setup names them.
struct Layout {
    const char* name;
    const char* xkbLayout;
    const char* xkbVariant;
};
const Layout LAYOUTS[] = {
    {"Belgian", "be", ""},      {"Brazilian", "br", ""},
    {"Croatian", "hr", ""},     {"Czechoslovakian", "cz", ""},
    {"Danish", "dk", ""},       {"Estonian", "ee", ""},
    {"Finnish", "fi", ""},      {"French", "fr", ""},
    {"German", "de", ""},       {"Greek", "gr", ""},
    {"Icelandic", "is", ""},    {"Italian", "it", ""},
    {"Japanese", "jp", ""},     {"Latin American", "latam", ""},
    {"Norwegian", "no", ""},    {"Polish", "pl", ""},
    {"Portuguese", "pt", ""},   {"Russian", "ru", ""},
    {"Slovenian", "si", ""},    {"Spanish", "es", ""},
    {"Swedish", "se", ""},      {"Swiss French", "ch", "fr"},
    {"Swiss German", "ch", ""}, {"Turkish", "tr", ""},
    {"US Default", "us", ""},   {"US Dvorak", "us", "dvorak"},
    {"Ukrainian", "ua", ""},    {"United Kingdom", "gb", ""},
};

// Replaces (or appends) KEY="value" lines of a shell-assignment file,
// keeping every other line as it is.
std::string WithAssignments(const std::string& text, const std::map<std::string, std::string>& values) {
    std::set<std::string> done;
    std::string out;
    for (std::string line : Lines(text)) {
        const std::string t = Trim(line);
        const size_t eq = t.find('=');
        if (eq != std::string::npos && t[0] != '#' && values.count(t.substr(0, eq))) {
            const std::string key = t.substr(0, eq);
            if (done.insert(key).second) out += key + "=\"" + values.at(key) + "\"\n";
            continue;
        }
        out += line + "\n";
    }
    for (const auto& [key, value] : values)
        if (!done.count(key)) out += key + "=\"" + value + "\"\n";
    return out;
}

// Replaces a system file as a whole, keeping its permissions.
void ReplaceSystemFile(const std::string& hostPath, const std::string& text) {
    const std::string path = HostPath(hostPath);
    struct stat st {};
    ReplaceFile(path, text, stat(path.c_str(), &st) == 0 ? (st.st_mode & 07777) : 0644);
}

// The running network seen as the console's model: physical NICs, standard
// switches (bridges, or a NIC that holds the management address itself),
// port groups (the host's interface on a bridge) and virtual NICs.
class NetworkModel {
public:
    explicit NetworkModel(const HostConfig& config) : _config(config), _net(ReadNetwork()) {}

    const NetworkSnapshot& Snapshot() const { return _net; }

    bool IsNic(const LinkInfo& link) const {
        if (link.hasDevice && link.kind.empty()) return true;
        for (const std::string& pattern : _config.physicalNics)
            if (fnmatch(pattern.c_str(), link.name.c_str(), 0) == 0) return true;
        return false;
    }

    const LinkInfo& Link(const std::string& name) const {
        const LinkInfo* link = _net.FindLink(name);
        if (link == nullptr) throw HostCtlException("no network interface \"" + name + "\" on this host");
        return *link;
    }

    std::vector<const LinkInfo*> Nics() const {
        std::vector<const LinkInfo*> nics;
        for (const LinkInfo& link : _net.links)
            if (IsNic(link)) nics.push_back(&link);
        return nics;
    }

    // The interface carrying management: the one holding the address the
    // host name resolves to in the hosts file, else the one of the IPv4 (then
    // IPv6) default route, else the configured one.
    std::string ManagementInterface() const {
        for (const std::string& address : HostsAddresses(ShortHostName()))
            for (const AddressInfo& a : _net.addresses)
                if (a.address == address)
                    if (const LinkInfo* link = _net.FindLink(a.linkIndex)) return link->name;
        for (bool ipv6 : {false, true})
            if (auto route = _net.DefaultRoute(ipv6))
                if (const LinkInfo* link = _net.FindLink(route->linkIndex)) return link->name;
        if (!_config.managementInterface.empty() && _net.FindLink(_config.managementInterface))
            return _config.managementInterface;
        return "";
    }

    // The switch a host interface belongs to: a bridge for itself or its
    // VLAN interface, else the interface itself (an address directly on a
    // NIC or a bond).
    std::string SwitchOf(const std::string& vnic) const {
        const LinkInfo& link = Link(vnic);
        if (link.kind == "vlan" && link.parentIndex != 0)
            if (const LinkInfo* parent = _net.FindLink(link.parentIndex)) return parent->name;
        return link.name;
    }

    std::vector<std::string> Switches() const {
        std::vector<std::string> names;
        for (const LinkInfo& link : _net.links)
            if (link.kind == "bridge") names.push_back(link.name);
        const std::string mgmt = ManagementInterface();
        if (!mgmt.empty()) {
            const std::string own = SwitchOf(mgmt);
            if (std::find(names.begin(), names.end(), own) == names.end()) names.push_back(own);
        }
        return names;
    }

    std::vector<std::string> VnicNames() const {
        std::vector<std::string> names;
        for (const LinkInfo& link : _net.links) {
            const LinkInfo* parent = _net.FindLink(link.parentIndex);
            if (link.kind == "bridge" || (link.kind == "vlan" && parent && parent->kind == "bridge"))
                names.push_back(link.name);
        }
        const std::string mgmt = ManagementInterface();
        if (!mgmt.empty() && std::find(names.begin(), names.end(), mgmt) == names.end())
            names.push_back(mgmt);
        return names;
    }

    // The NICs behind a switch, in team order (a bond's primary first).
    Network::TeamingPolicy Team(const std::string& vswitch) const {
        const LinkInfo& sw = Link(vswitch);
        Network::TeamingPolicy team;
        auto addBond = [&](const LinkInfo& bond) {
            std::vector<std::string> slaves;
            for (const LinkInfo& l : _net.links)
                if (l.masterIndex == bond.index && IsNic(l)) slaves.push_back(l.name);
            const bool activeBackup = bond.bondMode == "active-backup";
            for (const std::string& s : slaves) {
                const bool primary = bond.bondPrimary.empty() ? s == slaves.front() : s == bond.bondPrimary;
                (activeBackup && !primary ? team.standbyUplinks : team.activeUplinks).push_back(s);
            }
        };
        if (sw.kind == "bond") {
            addBond(sw);
        } else if (sw.kind == "bridge") {
            for (const LinkInfo& port : _net.links) {
                if (port.masterIndex != sw.index) continue;
                if (port.kind == "bond")
                    addBond(port);
                else if (IsNic(port))
                    team.activeUplinks.push_back(port.name);
            }
        } else if (IsNic(sw)) {
            team.activeUplinks.push_back(sw.name);
        }
        return team;
    }

    unsigned MaxActive(const std::string& vswitch) const {
        // Two NICs directly on one bridge make a loop: one active uplink,
        // unless a bond that is not active-backup spreads the traffic.
        const LinkInfo& sw = Link(vswitch);
        for (const LinkInfo& port : _net.links)
            if ((port.index == sw.index || port.masterIndex == sw.index) && port.kind == "bond" &&
                port.bondMode != "active-backup")
                return unsigned(std::max<size_t>(1, Team(vswitch).activeUplinks.size()));
        return 1;
    }

    std::vector<std::string> PortGroups(const std::string& vswitch) const {
        const LinkInfo& sw = Link(vswitch);
        std::vector<std::string> names{sw.name};
        for (const LinkInfo& link : _net.links)
            if (link.kind == "vlan" && link.parentIndex == sw.index) names.push_back(link.name);
        return names;
    }

    uint16_t PortGroupVlan(const std::string& vswitch, const std::string& portGroup) const {
        const std::vector<std::string> groups = PortGroups(vswitch);
        if (std::find(groups.begin(), groups.end(), portGroup) == groups.end())
            throw HostCtlException("no port group \"" + portGroup + "\" on switch \"" + vswitch + "\"");
        return uint16_t(Link(portGroup).vlanId);
    }

    Network::IpConfig IpConfig(const std::string& vnic) {
        const LinkInfo& link = Link(vnic);
        const InterfacesFiles files;
        _methods = {ConfiguredMethod(files, vnic, "inet"), ConfiguredMethod(files, vnic, "inet6")};
        Network::IpConfig config;
        const AddressInfo* v4 = nullptr;
        std::vector<Ipv6Network> v6;
        bool dynamic6 = false;
        bool slaac = false;
        for (const AddressInfo* a : _net.AddressesOf(link.index)) {
            if (!a->ipv6) {
                if (v4 == nullptr) v4 = a;
                continue;
            }
            // The kernel's own link-local address is no address to manage
            // the host from, nor one to configure.
            if (Ipv6Address(a->address).IsLinkLocal()) continue;
            Ipv6AddressType type = Ipv6AddressType::Static;
            if (a->proto == 2 /* IFAPROT_KERNEL_RA */ ||
                (!a->Permanent() && a->prefixLength == 64 && a->proto == 0 && Autoconf(link.name))) {
                type = Ipv6AddressType::Autoconf;
                slaac = true;
            } else if (!a->Permanent()) {
                type = Ipv6AddressType::Dhcp;
                dynamic6 = true;
            }
            v6.emplace_back(Ipv6Address(a->address), a->prefixLength, type);
        }
        if (v4 == nullptr) {
            // DHCP without a lease yet is still DHCP.
            config.SetUseDhcp(_methods.inet == "dhcp", _methods.inet != "dhcp");
        } else {
            // An address with a lifetime came from a DHCP server.
            config.SetUseDhcp(!v4->Permanent() || _methods.inet == "dhcp", false);
            config.SetIpv4Address(Ipv4Address(v4->address));
            config.SetIpv4Netmask(Netmask(v4->prefixLength));
        }
        config.SetIpv6Network(v6);
        // Router advertisements count when the stanza asks for them, or
        // when the kernel made addresses from them.
        config.SetUseIpv6RouterAdvertised(
            _methods.inet6 == "auto" || slaac ||
            (_methods.inet6 != "" && _methods.inet6 != "manual" && Autoconf(link.name)));
        config.SetUseIpv6Dhcp(dynamic6 || _methods.inet6 == "dhcp");
        config.SetDhcpDns(config.GetUseDhcp() || dynamic6);
        return config;
    }

private:
    // Whether the kernel makes addresses from router advertisements here.
    static bool Autoconf(const std::string& name) {
        const int acceptRa = ReadInt(SysctlPath(name, "accept_ra"), 0);
        const int forwarding = ReadInt(SysctlPath(name, "forwarding"), 0);
        return ReadInt(SysctlPath(name, "autoconf"), 0) == 1 &&
               (acceptRa == 2 || (acceptRa == 1 && forwarding == 0));
    }

    const HostConfig& _config;
    NetworkSnapshot _net;
    // The methods of the interface's stanzas ("static", "dhcp", ...).
    struct {
        std::string inet, inet6;
    } _methods;
};

class LinuxBackend : public Backend {
public:
    // Version and hardware.

    VersionRecord GetVersionRecord() override {
        const std::map<std::string, std::string> os =
            ShellAssignments(ReadHostText("/etc/os-release").value_or(""));
        utsname u{};
        uname(&u);
        VersionRecord record;
        record.product = os.count("NAME") ? os.at("NAME") : "Linux";
        // Debian's point release ("12.8") where it has one.
        const std::string point = FirstLine("/etc/debian_version");
        record.version = !point.empty() && std::isdigit(static_cast<unsigned char>(point[0]))
                             ? point
                             : (os.count("VERSION_ID") ? os.at("VERSION_ID") : "");
        record.kernelRelease = u.release;
        // The kernel's build count: "#1 SMP PREEMPT_DYNAMIC Debian ...".
        record.build = u.version;
        if (u.version[0] == '#') {
            record.buildNumber = uint32_t(std::strtoul(u.version + 1, nullptr, 10));
            record.build = std::to_string(record.buildNumber);
        }
        return record;
    }

    std::string GetHardwareVendor() override { return FirstLine("/sys/class/dmi/id/sys_vendor"); }
    std::string GetHardwareProduct() override { return FirstLine("/sys/class/dmi/id/product_name"); }

    unsigned GetCpuPackages() override {
        std::set<std::string> packages;
        for (std::string line : Lines(ReadHostText("/proc/cpuinfo").value_or("")))
            if (line.rfind("physical id", 0) == 0) packages.insert(Trim(line.substr(line.find(':') + 1)));
        return unsigned(std::max<size_t>(1, packages.size()));
    }

    std::string GetCpuModel() override {
        for (std::string line : Lines(ReadHostText("/proc/cpuinfo").value_or("")))
            if (line.rfind("model name", 0) == 0) return Trim(line.substr(line.find(':') + 1));
        return "";
    }

    uint64_t GetMemoryPageSize() override { return uint64_t(sysconf(_SC_PAGESIZE)); }
    uint64_t GetMemoryTotalPages() override { return uint64_t(sysconf(_SC_PHYS_PAGES)); }

    // Network, read from the running kernel.

    std::vector<Network::Pnic> GetPnics() override {
        NetworkModel model(Configuration());
        std::vector<Network::Pnic> pnics;
        for (const LinkInfo* link : model.Nics()) {
            Network::Pnic pnic;
            pnic.name = link->name;
            pnic.mac = link->mac;
            pnic.driver = link->driver;
            pnic.linkUp = link->carrier;
            pnic.speedMbps = link->speedMbps;
            pnic.description = link->description;
            pnic.label = link->label;
            pnics.push_back(std::move(pnic));
        }
        return pnics;
    }

    std::string GetManagementInterfaceName() override {
        return NetworkModel(Configuration()).ManagementInterface();
    }

    Network::IpConfig GetVnicIpConfig(const std::string& vnic) override {
        return NetworkModel(Configuration()).IpConfig(vnic);
    }

    Network::ConnectionPoint GetVnicConnectionPoint(const std::string& vnic) override {
        NetworkModel(Configuration()).Link(vnic);  // an unknown interface throws
        return Network::ConnectionPoint(Network::ConnectionPoint::PortGroup, vnic);
    }

    std::vector<std::string> GetVnicNames() override { return NetworkModel(Configuration()).VnicNames(); }

    std::string GetVnicMacAddress(const std::string& vnic) override {
        return NetworkModel(Configuration()).Link(vnic).mac;
    }

    bool GetIpv6Enabled() override {
        struct stat st {};
        return stat(HostPath("/proc/net/if_inet6").c_str(), &st) == 0 &&
               ReadInt("/proc/sys/net/ipv6/conf/all/disable_ipv6", 0) == 0;
    }

    std::string GetConnectionPointSwitch(const Network::ConnectionPoint& point) override {
        if (point.GetType() != Network::ConnectionPoint::PortGroup)
            Refuse("finding a distributed port", NO_DVS);
        return NetworkModel(Configuration()).SwitchOf(point.GetName());
    }

    std::vector<std::string> GetVirtualSwitchNames() override {
        return NetworkModel(Configuration()).Switches();
    }

    std::vector<std::string> GetVirtualSwitchUplinks(const std::string& vswitch) override {
        const Network::TeamingPolicy team = NetworkModel(Configuration()).Team(vswitch);
        std::vector<std::string> all = team.activeUplinks;
        all.insert(all.end(), team.standbyUplinks.begin(), team.standbyUplinks.end());
        return all;
    }

    Network::TeamingPolicy GetTeamingPolicy(const std::string& vswitch) override {
        return NetworkModel(Configuration()).Team(vswitch);
    }

    unsigned GetMaxActiveUplinks(const std::string& vswitch) override {
        return NetworkModel(Configuration()).MaxActive(vswitch);
    }

    std::vector<std::string> GetPortGroupNames(const std::string& vswitch) override {
        return NetworkModel(Configuration()).PortGroups(vswitch);
    }

    uint16_t GetPortGroupVlanId(const std::string& vswitch, const std::string& portGroup) override {
        return NetworkModel(Configuration()).PortGroupVlan(vswitch, portGroup);
    }

    std::vector<std::string> GetDistributedSwitchNames() override { return {}; }

    std::vector<Network::IpAddress> ResolveHostName(const std::string& name) override {
        addrinfo hints{};
        hints.ai_family = AF_UNSPEC;
        hints.ai_socktype = SOCK_DGRAM;
        addrinfo* found = nullptr;
        std::vector<Network::IpAddress> addresses;
        if (getaddrinfo(name.c_str(), nullptr, &hints, &found) != 0) return addresses;
        for (addrinfo* a = found; a != nullptr; a = a->ai_next) {
            char text[NI_MAXHOST];
            if (getnameinfo(a->ai_addr, a->ai_addrlen, text, sizeof text, nullptr, 0, NI_NUMERICHOST) != 0)
                continue;
            const std::string address = std::string(text).substr(0, std::string(text).find('%'));
            try {
                Network::IpAddress ip(address);
                if (std::find(addresses.begin(), addresses.end(), ip) == addresses.end())
                    addresses.push_back(ip);
            } catch (const HostCtlException&) {
            }
        }
        freeaddrinfo(found);
        return addresses;
    }

    DnsSettings GetDns(const std::string&) override {
        const Resolver resolver = ReadResolver();
        DnsSettings dns;
        dns.hostname = ShortHostName();
        dns.domain = HostDomain();
        dns.servers = resolver.servers;
        dns.ipv6Servers = resolver.ipv6Servers;
        dns.searchDomains = resolver.search;
        return dns;
    }

    RouteSettings GetRouting(const std::string&) override {
        NetworkModel model(Configuration());
        RouteSettings routes;
        if (auto r = model.Snapshot().DefaultRoute(false); r && Ipv4Address::IsValidAddress(r->gateway))
            routes.ipv4Gateway = Ipv4Address(r->gateway);
        if (auto r = model.Snapshot().DefaultRoute(true); r && Ipv6Address::IsValidAddress(r->gateway))
            routes.ipv6Gateway = Ipv6Address(r->gateway);
        return routes;
    }

    // Network, written: the management interface's stanza. Between Begin
    // and Commit the setters stage one change, applied once; outside, each
    // setter is a change of its own.

    void BeginNetworkChange() override { _pending.emplace(); }

    std::optional<std::string> ProbeIpv4Address(const std::string& vnic,
                                                const Ipv4Address& address) override {
        return ProbeIpv4(vnic, address.GetStringAddress());
    }

    std::vector<QelCtl::Network::NetworkCheck> CheckNetwork(const std::string& vnic) override {
        NetworkModel model(Configuration());
        const int index = model.Link(vnic).index;
        const std::string vswitch = model.SwitchOf(vnic);
        const Network::TeamingPolicy team = model.Team(vswitch);
        std::vector<std::string> uplinks = team.activeUplinks;
        uplinks.insert(uplinks.end(), team.standbyUplinks.begin(), team.standbyUplinks.end());
        std::vector<NetworkCheck> checks = CheckLinks(vswitch, uplinks);

        // What the files give the interface, then what the kernel learned
        // (a lease's or a router advertisement's gateway).
        std::vector<std::string> addresses, gateways;
        const InterfacesFiles files;
        for (const auto& place : files.FindIface(vnic)) {
            const InterfacesFile& file = files.Files()[place.file].file;
            const auto& stanza = file.Stanzas()[place.stanza];
            if (stanza.Method() != "static" && !stanza.Family().empty()) continue;
            for (const std::string& a : file.OptionValues(place.stanza, "address"))
                addresses.push_back(a.substr(0, a.find('/')));
            for (const std::string& g : file.OptionValues(place.stanza, "gateway"))
                gateways.push_back(CanonicalAddress(g));
        }
        const bool dhcp4 = ConfiguredMethod(files, vnic, "inet") == "dhcp";
        for (NetworkCheck& c : CheckAddresses(vnic, addresses, dhcp4)) checks.push_back(std::move(c));
        for (const RouteInfo& r : ReadNetwork().routes)
            if (r.prefixLength == 0 && r.linkIndex == index && !r.gateway.empty() &&
                std::find(gateways.begin(), gateways.end(), CanonicalAddress(r.gateway)) == gateways.end())
                gateways.push_back(CanonicalAddress(r.gateway));

        // The gateways, then the name servers (a query must not race the
        // gateway's dropped neighbour entry), each set at once: a silent one
        // costs its own wait, not the others'.
        std::vector<std::future<NetworkCheck>> pending;
        for (const std::string& g : gateways)
            pending.push_back(std::async(std::launch::async, [&vnic, g] { return CheckGateway(vnic, g); }));
        for (auto& p : pending) checks.push_back(p.get());
        pending.clear();
        const Resolver resolver = ReadResolver();
        const std::string domain = HostDomain();
        const std::string name = ShortHostName() + (domain.empty() ? "" : "." + domain);
        std::vector<std::string> servers;
        for (const Ipv4Address& s : resolver.servers) servers.push_back(s.GetStringAddress());
        for (const Ipv6Address& s : resolver.ipv6Servers) servers.push_back(s.GetStringAddress());
        for (const std::string& s : servers)
            pending.push_back(std::async(std::launch::async, [s, name] { return CheckNameServer(s, name); }));
        for (auto& p : pending) checks.push_back(p.get());
        return checks;
    }

    void CommitNetworkChange() override {
        if (!_pending) return;
        PendingChange change = std::move(*_pending);
        _pending.reset();
        if (change.uplinks && change.uplinks->empty())
            throw HostCtlException("the management switch of " + change.iface + " needs an uplink");
        ApplyChange(change);
    }

    void SetVnicIpConfig(const std::string& vnic, const Network::IpConfig& config) override {
        Stage(vnic, [&](PendingChange& c) {
            c.ip = config;
            // A lease's gateway stays the host's gateway when the address
            // becomes static in the same subnet (a gateway set in the same
            // change replaces it).
            if (c.gateway4 || config.GetUseDhcp() || config.GetIpv4UseNone()) return;
            NetworkModel model(Configuration());
            const auto route = model.Snapshot().DefaultRoute(false);
            const LinkInfo* link = route ? model.Snapshot().FindLink(route->linkIndex) : nullptr;
            if (link == nullptr || link->name != c.iface || !Ipv4Address::IsValidAddress(route->gateway))
                return;
            const uint32_t mask = config.GetIpv4Netmask().GetHostOrder();
            if ((Ipv4Address(route->gateway).GetHostOrder() & mask) ==
                (config.GetIpv4Address().GetHostOrder() & mask))
                c.gateway4 = route->gateway;
        });
    }

    void RenewVnicDhcpLease(const std::string& vnic) override {
        if (_pending) {
            Stage(vnic, [](PendingChange& c) { c.restart = true; });
            return;
        }
        SetInterfaceUp(vnic, false);
        SetInterfaceUp(vnic, true);
    }

    void SetVnicEnabled(const std::string& vnic, bool enabled) override {
        if (_pending)
            Stage(vnic, [](PendingChange& c) { c.restart = true; });
        else
            SetInterfaceUp(vnic, enabled);
    }

    void SetDefaultGateway(const std::string&, const Ipv4Address& gateway, bool) override {
        Stage("", [&](PendingChange& c) { c.gateway4 = gateway.IsZero() ? "" : gateway.GetStringAddress(); });
    }

    void SetIpv6DefaultGateway(const std::string&, const Ipv6Address& gateway) override {
        Stage("", [&](PendingChange& c) { c.gateway6 = gateway.IsZero() ? "" : gateway.GetStringAddress(); });
    }

    void AddUplinkToTeamingPolicy(const std::string& vswitch, const std::string& pnic,
                                  bool standby) override {
        EditTeam(vswitch, [&](Network::TeamingPolicy& team) {
            for (const auto* list : {&team.activeUplinks, &team.standbyUplinks})
                if (std::find(list->begin(), list->end(), pnic) != list->end())
                    throw HostCtlException(pnic + " is already an uplink of " + vswitch);
            NetworkModel model(Configuration());
            if (!model.IsNic(model.Link(pnic))) throw HostCtlException(pnic + " is not a physical NIC");
            (standby ? team.standbyUplinks : team.activeUplinks).push_back(pnic);
        });
    }

    void RemoveUplinkFromTeamingPolicy(const std::string& vswitch, const std::string& pnic) override {
        EditTeam(vswitch, [&](Network::TeamingPolicy& team) {
            for (auto* list : {&team.activeUplinks, &team.standbyUplinks})
                list->erase(std::remove(list->begin(), list->end(), pnic), list->end());
        });
    }

    void SetIpv6Enabled(bool enabled) override {
        // The next boot's setting in a drop-in of its own; the running
        // kernel's too, so that a host that is not restarted is consistent.
        mkdir(HostPath("/etc/sysctl.d").c_str(), 0755);
        ReplaceFile(HostPath(IPV6_DROP_IN),
                    "# Written by velk: IPv6 on this host " + std::string(enabled ? "on" : "off") +
                        ".\nnet.ipv6.conf.all.disable_ipv6 = " + (enabled ? "0" : "1") +
                        "\nnet.ipv6.conf.default.disable_ipv6 = " + (enabled ? "0" : "1") + "\n",
                    0644);
        for (const char* scope : {"all", "default"}) {
            const std::string path =
                HostPath(std::string("/proc/sys/net/ipv6/conf/") + scope + "/disable_ipv6");
            const int fd = open(path.c_str(), O_WRONLY | O_CLOEXEC);
            if (fd < 0 || write(fd, enabled ? "0\n" : "1\n", 2) != 2)
                Syslog(LOG_WARNING, "Setting %s: %s", path.c_str(), std::strerror(errno));
            if (fd >= 0) close(fd);
        }
    }

    // The factory network: a DHCP bridge on the first NIC with a cable, as
    // an installer makes it.
    void DisableNetDumper() override {}  // a Debian host has no network core dump sender to stop
    void ClearNetworkConfig() override { RefuseOnClusterNode("restoring the network"); }
    void AutoConfigNetwork() override {
        NetworkModel model(Configuration());
        std::vector<std::string> nics;
        std::string uplink;
        for (const LinkInfo* nic : model.Nics()) {
            nics.push_back(nic->name);
            if (uplink.empty() && nic->carrier) uplink = nic->name;
        }
        if (uplink.empty()) Refuse("restoring the network", "no NIC of this host has a link");
        const std::string mgmt = model.ManagementInterface();
        std::string bridge = "vmbr0";
        if (!mgmt.empty() && model.Link(model.SwitchOf(mgmt)).kind == "bridge") bridge = model.SwitchOf(mgmt);
        ApplyFactoryLayout(mgmt, bridge, uplink, nics);
    }

    // What the network window changes, saved as a whole and put back as a
    // whole: the interfaces files, the host name (running and saved), the
    // hosts file and the resolver file (each of the three only when it is a
    // file of its own, not a link another program manages).
    std::string GetNetworkConfig() override {
        nlohmann::json saved{{"iface", NetworkModel(Configuration()).ManagementInterface()},
                             {"files", SavedFiles()},
                             {"nodename", NodeName()},
                             {"hostFiles", nlohmann::json::array()}};
        for (const char* path : HOST_FILES) {
            struct stat st {};
            std::optional<std::string> text = ReadHostText(path);
            if (lstat(HostPath(path).c_str(), &st) == 0 && S_ISREG(st.st_mode) && text)
                saved["hostFiles"].push_back({{"path", path}, {"mode", st.st_mode & 07777}, {"text", *text}});
        }
        return saved.dump();
    }
    void SetNetworkConfig(const std::string& config) override {
        std::string iface, files, nodename;
        struct HostFile {
            std::string path, text;
            mode_t mode;
        };
        std::vector<HostFile> hostFiles;
        try {
            const nlohmann::json saved = nlohmann::json::parse(config);
            iface = saved.at("iface").get<std::string>();
            files = saved.at("files").get<std::string>();
            nodename = saved.value("nodename", "");
            for (const auto& f : saved.value("hostFiles", nlohmann::json::array())) {
                const std::string path = f.at("path").get<std::string>();
                if (std::find(std::begin(HOST_FILES), std::end(HOST_FILES), path) == std::end(HOST_FILES))
                    throw HostCtlException("putting back the network configuration: " + path +
                                           " is no file of the network's");
                hostFiles.push_back({path, f.at("text").get<std::string>(), f.at("mode").get<mode_t>()});
            }
        } catch (const nlohmann::json::exception& e) {
            throw HostCtlException(std::string("putting back the network configuration: ") + e.what());
        }
        auto writeHostFiles = [&] {
            for (const HostFile& f : hostFiles) ReplaceFile(HostPath(f.path), f.text, f.mode);
            if (!nodename.empty() && sethostname(nodename.c_str(), nodename.size()) != 0)
                throw HostCtlException("putting back the host name: " + std::string(std::strerror(errno)));
        };
        PutBackFiles(files, iface, writeHostFiles);
        // A DHCP client writes the resolver file when its lease comes.
        for (const HostFile& f : hostFiles)
            if (ReadHostText(f.path) != f.text) ReplaceFile(HostPath(f.path), f.text, f.mode);
    }

    void SetVnicConnectionPoint(const std::string&, const Network::ConnectionPoint&) override {
        Refuse("moving the management interface to another switch", NO_MOVE);
    }
    void SetVnicMacAddress(const std::string&, const std::string&) override {
        Refuse("setting the management interface's MAC address", "a bridge takes its MAC from its ports");
    }
    void AddVirtualSwitch(const std::string&) override { Refuse("creating a switch", NO_MOVE); }
    void RemoveVirtualSwitch(const std::string&) override { Refuse("removing a switch", NO_MOVE); }
    void AddPortGroup(const std::string&, const std::string&, uint16_t) override {
        Refuse("creating a port group", NO_MOVE);
    }
    void SetPortGroupVlanId(const std::string& vswitch, const std::string& portGroup,
                            uint16_t vlan) override {
        // A VLAN interface is named after its VLAN ("vmbr0.10"): another VLAN
        // is another interface, with a stanza of its own.
        if (NetworkModel(Configuration()).PortGroupVlan(vswitch, portGroup) == vlan) return;
        Refuse("setting the management VLAN to " + std::to_string(vlan),
               "on a Debian host the VLAN is part of the interface's name (" + vswitch + "." +
                   std::to_string(vlan) + "); define that interface in /etc/network/interfaces");
    }

    std::vector<Network::DistributedSwitch::UplinkPort> GetDvsUplinkPorts(const std::string&) override {
        Refuse("listing a distributed switch's uplinks", NO_DVS);
    }
    void RemoveDvsUplink(const std::string&, const std::string&) override {
        Refuse("removing a distributed switch's uplink", NO_DVS);
    }
    void AddDvsUplink(const std::string&, const std::string&, const std::string&) override {
        Refuse("adding a distributed switch's uplink", NO_DVS);
    }
    Network::DistributedSwitch::PortSettings GetDvsPortSettings(const std::string&,
                                                                const std::string&) override {
        Refuse("reading a distributed port's settings", NO_DVS);
    }
    std::string AddDvsHostLocalPort(const std::string&,
                                    const Network::DistributedSwitch::PortSettings&) override {
        Refuse("creating a host-local distributed port", NO_DVS);
    }
    void RemoveDvsHostLocalPort(const std::string&, const std::string&) override {
        Refuse("removing a host-local distributed port", NO_DVS);
    }

    // Host name and resolver.

    void SetHostname(const std::string& netstack, const std::string& hostname, bool persist) override {
        SetFqdn(netstack, hostname, HostDomain(), persist);
    }

    void SetFqdn(const std::string&, const std::string& hostname, const std::string& domain,
                 bool persist) override {
        RefuseOnClusterNode("changing the host name");
        const std::string oldShort = ShortHostName();
        const std::string fqdn = domain.empty() ? hostname : hostname + "." + domain;
        // The hosts file first: the name must keep resolving to the management
        // address the moment the kernel's name changes.
        std::string hosts = ReadHostText("/etc/hosts").value_or("");
        ReplaceSystemFile("/etc/hosts", HostsWithName(hosts, oldShort, hostname, fqdn));
        if (persist) ReplaceSystemFile("/etc/hostname", hostname + "\n");
        if (sethostname(hostname.c_str(), hostname.size()) != 0)
            throw HostCtlException("setting the host name: " + std::string(std::strerror(errno)));
    }

    void RemoveNameServers(const std::string&) override {
        EditResolver([](Resolver& r) {
            r.servers.clear();
            r.ipv6Servers.clear();
        });
    }

    void AddNameServer(const std::string&, const Network::IpAddress& server) override {
        EditResolver([&](Resolver& r) {
            if (server.IsIpv6()) {
                if (std::find(r.ipv6Servers.begin(), r.ipv6Servers.end(), server.V6()) == r.ipv6Servers.end())
                    r.ipv6Servers.push_back(server.V6());
            } else if (std::find(r.servers.begin(), r.servers.end(), server.V4()) == r.servers.end()) {
                r.servers.push_back(server.V4());
            }
        });
    }

    void SetSearchDomains(const std::string&, const std::vector<std::string>& domains) override {
        EditResolver([&](Resolver& r) { r.search = domains; });
    }

    // The resolver file is the saved configuration itself and the interfaces
    // file is written with each change; the kernel's host name is saved for
    // the next boot.
    void SaveConfig(const std::string&) override {
        const std::string name = ShortHostName();
        const std::string saved = FirstLine("/etc/hostname");
        if (saved.substr(0, saved.find('.')) != name) ReplaceSystemFile("/etc/hostname", name + "\n");
    }

    // System.

    std::string GetWelcomeMessage() override {
        return ReadHostText(Configuration().welcomeMessageFile).value_or("");
    }

    std::string GetSystemAlert() override { return ReadHostText(ALERT_FILE).value_or(""); }

    void SetSystemAlert(const std::string& alert) override {
        mkdir(HostPath("/run/velk").c_str(), 0755);
        ReplaceFile(HostPath(ALERT_FILE), alert, 0644);
    }

    QelCtl::System::BootOptions GetBootOptions() override { return {}; }

    std::string GetKeyboardLayout() override {
        const auto values = ShellAssignments(ReadHostText(KEYBOARD_FILE).value_or(""));
        const std::string layout = values.count("XKBLAYOUT") ? values.at("XKBLAYOUT") : "us";
        const std::string variant = values.count("XKBVARIANT") ? values.at("XKBVARIANT") : "";
        for (const Layout& l : LAYOUTS)
            if (layout == l.xkbLayout && variant == l.xkbVariant) return l.name;
        return layout + (variant.empty() ? "" : " " + variant);
    }

    void SetKeyboardLayout(const std::string& layout) override {
        const Layout& l = FindLayout(layout);
        const std::string text = ReadHostText(KEYBOARD_FILE).value_or("");
        ReplaceSystemFile(KEYBOARD_FILE,
                          WithAssignments(text, {{"XKBLAYOUT", l.xkbLayout}, {"XKBVARIANT", l.xkbVariant}}));
    }

    std::vector<std::string> GetKeyboardLayouts() override {
        std::vector<std::string> names;
        for (const Layout& l : LAYOUTS) names.emplace_back(l.name);
        return names;
    }

    void LoadKeyboardMappings(const std::string& layout) override {
        FindLayout(layout);
        struct stat st {};
        if (stat(HostPath("/bin/setupcon").c_str(), &st) != 0)
            Refuse("loading the key mappings", "console-setup (setupcon) is not installed");
        if (RunHostShell("/bin/setupcon -k --force", true, true) != 0)
            throw HostCtlException("loading the key mappings: setupcon failed");
    }

    // Options.

    std::optional<AdvancedOptionValue> FindAdvancedOption(const std::string& name) override {
        std::optional<OptionFile::Value> value = OptionFile::Get(name);
        if (!value) return std::nullopt;
        return AdvancedOptionValue{value->isInteger, value->integer, value->text};
    }

    void SetAdvancedOption(const std::string& name, const AdvancedOptionValue& value) override {
        OptionFile::Set(name, {value.isInteger, value.integer, value.text});
    }

    // A Debian host cannot reset its system configuration to defaults, as a
    // host booted from the network cannot: it answers as such a host does,
    // and the console offers no reset.
    bool HasUserOption(const std::string& name) override {
        if (name != "PXEBootEnabled") return false;
        static std::once_flag logged;
        std::call_once(logged, [] {
            Syslog(LOG_INFO, "Resetting the system configuration is not available on a Debian host");
        });
        return true;
    }

    // Smart cards: without the PC/SC daemon there is no reader to ask.

    std::vector<QelCtl::Hardware::SmartCardSlot> GetSmartCardSlots() override {
        static std::once_flag logged;
        std::call_once(logged, [] {
            Syslog(LOG_INFO, "Smart-card logins are not available: this host has no PC/SC daemon");
        });
        return {};
    }

    std::optional<QelCtl::Hardware::SmartCardToken> GetSmartCardToken(const std::string&) override {
        return std::nullopt;
    }

    // Virtual machines: libvirt's QEMU driver keeps a status file per
    // running guest.
    bool HasRunningVirtualMachines() override {
        std::error_code ec;
        const std::string dir = HostPath("/run/libvirt/qemu");
        for (const auto& entry : std::filesystem::directory_iterator(dir, ec))
            if (entry.path().extension() == ".xml") return true;
        return false;
    }

    int GetDriverVmState() override { return 0; }
    std::vector<QelCtl::Hardware::DriverVmDevice> GetDriverVmDevices() override { return {}; }
    void SetDriverVmOwned(const std::vector<std::string>&) override {
        Refuse("handing devices to the driver VM", "a Debian host has no driver VM");
    }

    // Firewall: a Debian host has no rulesets the console manages; SSH is
    // reachable as the ssh service runs.
    bool GetFirewallRulesetEnabled(const std::string& id) override {
        Refuse("reading firewall ruleset \"" + id + "\"", "a Debian host's firewall is not managed by Velk");
    }
    void SetFirewallRulesetEnabled(const std::string& id, bool) override {
        Refuse("setting firewall ruleset \"" + id + "\"", "a Debian host's firewall is not managed by Velk");
    }

    int RunCommandLine(const std::string& commandLine, bool logOutput, bool wait) override {
        return RunHostShell(commandLine, logOutput, wait);
    }

private:
    static constexpr const char* NO_MOVE =
        "a Debian host's management interface stays on its bridge (restore the network instead)";
    static constexpr const char* IPV6_DROP_IN = "/etc/sysctl.d/90-velk-ipv6.conf";

    // Stages a change of the management interface (or applies it at once
    // outside a change set). `vnic` "" means the management interface.
    template <typename Edit>
    void Stage(const std::string& vnic, Edit edit) {
        const bool own = !_pending;
        if (own) _pending.emplace();
        try {
            if (_pending->iface.empty())
                _pending->iface = vnic.empty() ? NetworkModel(Configuration()).ManagementInterface() : vnic;
            if (_pending->iface.empty()) throw HostCtlException("this host has no management interface");
            if (!vnic.empty() && vnic != _pending->iface)
                throw HostCtlException("one change set changes one interface (" + _pending->iface + ", not " +
                                       vnic + ")");
            edit(*_pending);
        } catch (...) {
            if (own) _pending.reset();
            throw;
        }
        if (own) CommitNetworkChange();
    }

    // Changes the switch's uplinks, starting from the staged ones.
    template <typename Edit>
    void EditTeam(const std::string& vswitch, Edit edit) {
        NetworkModel model(Configuration());
        Network::TeamingPolicy team = model.Team(vswitch);
        if (_pending && _pending->uplinks) {
            team.activeUplinks = *_pending->uplinks;
            team.standbyUplinks.clear();
        }
        edit(team);
        std::vector<std::string> all = team.activeUplinks;
        all.insert(all.end(), team.standbyUplinks.begin(), team.standbyUplinks.end());
        // Inside a change set the team may be empty for a moment (the only
        // uplink replaced: the old one goes before the new one comes); the
        // change as a whole still needs one.
        if (all.empty() && !_pending)
            throw HostCtlException("the management switch " + vswitch + " needs an uplink");
        Stage("", [&](PendingChange& c) {
            c.uplinks = all;
            if (!all.empty())
                c.primary = team.activeUplinks.empty() ? all.front() : team.activeUplinks.front();
        });
    }

    static constexpr const char* ALERT_FILE = "/run/velk/system-alert";
    static constexpr const char* KEYBOARD_FILE = "/etc/default/keyboard";

    static const Layout& FindLayout(const std::string& name) {
        for (const Layout& l : LAYOUTS)
            if (name == l.name) return l;
        throw HostCtlException("unknown keyboard layout \"" + name + "\"");
    }

    // A node of a cluster keeps its name and address: its peers know it by them.
    static void RefuseOnClusterNode(const std::string& operation) {
        struct stat st {};
        for (const char* path : {"/etc/corosync/corosync.conf", "/etc/pve/corosync.conf"})
            if (stat(HostPath(path).c_str(), &st) == 0)
                Refuse(operation, "this host is a node of a cluster (" + std::string(path) + " exists)");
    }

    // The hosts file with the host's own line naming the new name: every
    // line that named the old short name (or a name under it) names the new
    // ones instead; other lines stay as they are.
    static std::string HostsWithName(const std::string& text, const std::string& oldShort,
                                     const std::string& hostname, const std::string& fqdn) {
        std::string out;
        for (std::string line : Lines(text)) {
            const std::string body = line.substr(0, line.find('#'));
            std::vector<std::string> w = Words(body);
            bool names = false;
            for (size_t i = 1; i < w.size(); ++i) names |= w[i].substr(0, w[i].find('.')) == oldShort;
            if (!names) {
                out += line + "\n";
                continue;
            }
            std::string rebuilt = w[0] + "\t" + fqdn + (fqdn != hostname ? " " + hostname : "");
            for (size_t i = 1; i < w.size(); ++i)
                if (w[i].substr(0, w[i].find('.')) != oldShort) rebuilt += " " + w[i];
            if (line.find('#') != std::string::npos) rebuilt += " " + line.substr(line.find('#'));
            out += rebuilt + "\n";
        }
        return out;
    }

    // Rewrites the resolver file's server and search lines, keeping its
    // other lines. A file that another program owns is left alone.
    template <typename Edit>
    void EditResolver(Edit edit) {
        const std::string path = HostPath("/etc/resolv.conf");
        struct stat st {};
        if (lstat(path.c_str(), &st) == 0 && S_ISLNK(st.st_mode)) {
            std::error_code ec;
            const std::string target = std::filesystem::read_symlink(path, ec).string();
            Refuse("changing the name servers",
                   "/etc/resolv.conf is managed by " +
                       std::string(target.find("systemd") != std::string::npos ? "systemd-resolved"
                                                                               : "resolvconf") +
                       " (a link to " + target + "); change them there");
        }
        const std::string text = ReadHostText("/etc/resolv.conf").value_or("");
        Resolver r = ReadResolver();
        edit(r);
        std::string out;
        bool wrote = false;
        auto writeOwned = [&] {
            if (wrote) return;
            wrote = true;
            if (!r.search.empty()) {
                out += "search";
                for (const std::string& d : r.search) out += " " + d;
                out += "\n";
            }
            for (const Ipv4Address& s : r.servers) out += "nameserver " + s.GetStringAddress() + "\n";
            for (const Ipv6Address& s : r.ipv6Servers) out += "nameserver " + s.GetStringAddress() + "\n";
        };
        for (std::string line : Lines(text)) {
            const std::vector<std::string> w = Words(line);
            if (!w.empty() && (w[0] == "nameserver" || w[0] == "search")) {
                writeOwned();  // where the first owned line was
                continue;
            }
            out += line + "\n";
        }
        writeOwned();
        ReplaceSystemFile("/etc/resolv.conf", out);
    }

    std::optional<PendingChange> _pending;
};

}  // namespace

std::unique_ptr<Backend> MakeLinuxBackend() { return std::make_unique<LinuxBackend>(); }

}  // namespace HostCtl::Lib::Linux
