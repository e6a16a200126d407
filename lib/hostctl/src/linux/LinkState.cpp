// Reads links through libnl-route-3's link cache, and routes and addresses
// through dumps whose messages libnl parses one by one (IFA_PROTO, which
// libnl 3.7's address object drops, by hand). sysfs and udev's database fill
// in what rtnetlink does not carry.
#include "LinkState.hpp"

#include <arpa/inet.h>
#include <linux/if.h>
#include <linux/if_addr.h>
#include <netlink/cache.h>
#include <netlink/msg.h>
#include <netlink/netlink.h>
#include <netlink/route/addr.h>
#include <netlink/route/link.h>
#include <netlink/route/link/vlan.h>
#include <netlink/route/nexthop.h>
#include <netlink/route/route.h>
#include <netlink/socket.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <functional>
#include <memory>

#include "hostctl/Host.hpp"
#include "hostctl/HostCtl.hpp"

namespace HostCtl::Lib::Linux {

bool AddressInfo::Permanent() const { return (flags & IFA_F_PERMANENT) != 0; }
bool AddressInfo::Tentative() const { return (flags & IFA_F_TENTATIVE) != 0; }
bool AddressInfo::DadFailed() const { return (flags & IFA_F_DADFAILED) != 0; }

const LinkInfo* NetworkSnapshot::FindLink(const std::string& name) const {
    for (const LinkInfo& link : links)
        if (link.name == name) return &link;
    return nullptr;
}

const LinkInfo* NetworkSnapshot::FindLink(int index) const {
    for (const LinkInfo& link : links)
        if (link.index == index) return &link;
    return nullptr;
}

std::vector<const AddressInfo*> NetworkSnapshot::AddressesOf(int linkIndex) const {
    std::vector<const AddressInfo*> found;
    for (const AddressInfo& address : addresses)
        if (address.linkIndex == linkIndex) found.push_back(&address);
    return found;
}

std::optional<RouteInfo> NetworkSnapshot::DefaultRoute(bool ipv6) const {
    std::optional<RouteInfo> best;
    for (const RouteInfo& route : routes) {
        if (route.ipv6 != ipv6 || route.prefixLength != 0) continue;
        if (!best || route.metric < best->metric) best = route;
    }
    return best;
}

namespace {

struct SocketDeleter {
    void operator()(nl_sock* sock) const { nl_socket_free(sock); }
};
struct CacheDeleter {
    void operator()(nl_cache* cache) const { nl_cache_free(cache); }
};
using Socket = std::unique_ptr<nl_sock, SocketDeleter>;
using Cache = std::unique_ptr<nl_cache, CacheDeleter>;

[[noreturn]] void Fail(const std::string& what, int error) {
    throw HostCtlException("reading the network through rtnetlink: " + what + ": " + nl_geterror(error));
}

// The first line of a sysfs file without its line end; "" when it cannot be read.
std::string ReadLine(const std::string& path) {
    std::string text;
    if (!ReadText(HostPath(path), text)) return "";
    std::string line = text.substr(0, text.find('\n'));
    while (!line.empty() && (line.back() == '\n' || line.back() == '\r' || line.back() == ' '))
        line.pop_back();
    return line;
}

// The last part of a symbolic link's target ("e1000e" for .../drivers/e1000e).
std::string LinkTargetName(const std::string& path) {
    char target[4096];
    const ssize_t n = readlink(HostPath(path).c_str(), target, sizeof target - 1);
    if (n <= 0) return "";
    std::string text(target, static_cast<size_t>(n));
    const size_t slash = text.rfind('/');
    return slash == std::string::npos ? text : text.substr(slash + 1);
}

bool Exists(const std::string& path) { return access(HostPath(path).c_str(), F_OK) == 0; }

// A property of udev's database entry for a network interface ("E:KEY=value"
// lines of /run/udev/data/n<ifindex>); "" when udev has none.
std::string UdevProperty(int index, const std::string& key) {
    std::string text;
    ReadText(HostPath("/run/udev/data/n" + std::to_string(index)), text);
    const std::string prefix = "E:" + key + "=";
    for (const std::string& line : Lines(text))
        if (line.compare(0, prefix.size(), prefix) == 0) return line.substr(prefix.size());
    return "";
}

std::string AddressText(nl_addr* addr) {
    if (addr == nullptr) return "";
    const int family = nl_addr_get_family(addr);
    const unsigned len = nl_addr_get_len(addr);
    const void* bytes = nl_addr_get_binary_addr(addr);
    char text[INET6_ADDRSTRLEN] = "";
    if ((family == AF_INET && len == 4) || (family == AF_INET6 && len == 16)) {
        if (inet_ntop(family, bytes, text, sizeof text) == nullptr) return "";
        return text;
    }
    if (family == AF_LLC || family == AF_UNSPEC) {
        // A link-layer address: lower-case hexadecimal pairs joined by colons.
        std::string mac;
        const auto* b = static_cast<const unsigned char*>(bytes);
        for (unsigned i = 0; i < len; ++i) {
            char pair[4];
            std::snprintf(pair, sizeof pair, "%s%02x", i == 0 ? "" : ":", b[i]);
            mac += pair;
        }
        return mac;
    }
    return "";
}

void FillFromSysfs(LinkInfo& link) {
    const std::string dir = "/sys/class/net/" + link.name;
    link.hasDevice = Exists(dir + "/device");
    if (link.hasDevice) {
        link.driver = LinkTargetName(dir + "/device/driver");
        link.label = ReadLine(dir + "/device/label");
    }
    // "speed" reads -1 or fails with EINVAL without a link.
    const std::string speed = ReadLine(dir + "/speed");
    try {
        const long mbps = speed.empty() ? 0 : std::stol(speed);
        link.speedMbps = mbps > 0 && mbps < 10000000 ? static_cast<int>(mbps) : 0;
    } catch (const std::exception&) {
        link.speedMbps = 0;
    }
    link.duplex = ReadLine(dir + "/duplex");
    if (link.duplex != "full" && link.duplex != "half") link.duplex.clear();
    if (link.kind == "bond") {
        link.bondPrimary = ReadLine(dir + "/bonding/primary");
        // "active-backup 1": the name, then the number.
        const std::string mode = ReadLine(dir + "/bonding/mode");
        link.bondMode = mode.substr(0, mode.find(' '));
    }
    link.description = UdevProperty(link.index, "ID_MODEL_FROM_DATABASE");
    if (link.label.empty()) link.label = UdevProperty(link.index, "ID_NET_LABEL_ONBOARD");
}

std::vector<LinkInfo> ReadLinks(nl_sock* sock) {
    nl_cache* raw = nullptr;
    if (const int err = rtnl_link_alloc_cache(sock, AF_UNSPEC, &raw); err < 0) Fail("listing the links", err);
    Cache cache(raw);
    std::vector<LinkInfo> links;
    for (nl_object* obj = nl_cache_get_first(raw); obj != nullptr; obj = nl_cache_get_next(obj)) {
        auto* l = reinterpret_cast<rtnl_link*>(obj);
        LinkInfo link;
        link.index = rtnl_link_get_ifindex(l);
        if (const char* name = rtnl_link_get_name(l)) link.name = name;
        if (const char* kind = rtnl_link_get_type(l)) link.kind = kind;
        link.mac = AddressText(rtnl_link_get_addr(l));
        const unsigned flags = rtnl_link_get_flags(l);
        link.adminUp = (flags & IFF_UP) != 0;
        link.carrier = (flags & IFF_LOWER_UP) != 0;
        link.masterIndex = rtnl_link_get_master(l);
        // IFLA_LINK of a veth names its peer, possibly in another namespace:
        // only links stacked on a lower device have a parent.
        if (link.kind == "vlan" || link.kind == "macvlan" || link.kind == "macvtap" || link.kind == "ipvlan")
            link.parentIndex = rtnl_link_get_link(l);
        if (link.kind == "vlan") link.vlanId = std::max(rtnl_link_vlan_get_id(l), 0);
        FillFromSysfs(link);
        links.push_back(std::move(link));
    }
    return links;
}

// One dump request whose answers libnl parses into objects one message at a
// time; unlike a cache, nothing is merged (a cache keeps one of the routes
// to fe80::/64 that every IPv6 link has) and the raw message stays at hand.
struct Dump {
    // Called with each parsed object and the message it came from.
    std::function<void(nl_object*, nl_msg*)> take;
    nl_msg* current = nullptr;
    bool failed = false;
};

// libnl calls back through C frames: no exception may leave the callback.
void TakeObject(nl_object* obj, void* arg) {
    auto* dump = static_cast<Dump*>(arg);
    if (dump->failed) return;
    try {
        dump->take(obj, dump->current);
    } catch (...) {
        dump->failed = true;
    }
}

int OnDumpMessage(nl_msg* msg, void* arg) {
    auto* dump = static_cast<Dump*>(arg);
    dump->current = msg;
    // A message libnl cannot parse (a family it does not know) is skipped.
    nl_msg_parse(msg, TakeObject, dump);
    return dump->failed ? NL_STOP : NL_OK;
}

template <typename Header>
void RunDump(nl_sock* sock, int type, Header header, const char* what, Dump& dump) {
    if (const int err = nl_socket_modify_cb(sock, NL_CB_VALID, NL_CB_CUSTOM, OnDumpMessage, &dump); err < 0)
        Fail(what, err);
    if (const int err = nl_send_simple(sock, type, NLM_F_DUMP, &header, sizeof header); err < 0)
        Fail(what, err);
    if (const int err = nl_recvmsgs_default(sock); err < 0) Fail(what, err);
    if (dump.failed)
        throw HostCtlException(std::string("reading the network through rtnetlink: ") + what +
                               ": out of memory");
}

std::vector<RouteInfo> ReadRoutes(nl_sock* sock) {
    std::vector<RouteInfo> routes;
    Dump dump;
    dump.take = [&routes](nl_object* obj, nl_msg*) {
        auto* r = reinterpret_cast<rtnl_route*>(obj);
        const uint8_t family = rtnl_route_get_family(r);
        if (rtnl_route_get_table(r) != RT_TABLE_MAIN || rtnl_route_get_type(r) != RTN_UNICAST) return;
        if (family != AF_INET && family != AF_INET6) return;
        RouteInfo route;
        route.ipv6 = family == AF_INET6;
        route.protocol = rtnl_route_get_protocol(r);
        route.metric = rtnl_route_get_priority(r);
        if (nl_addr* dst = rtnl_route_get_dst(r)) {
            route.prefixLength = static_cast<int>(nl_addr_get_prefixlen(dst));
            if (route.prefixLength != 0) route.destination = AddressText(dst);
        }
        if (route.destination.empty()) route.destination = route.ipv6 ? "::" : "0.0.0.0";
        const int hops = rtnl_route_get_nnexthops(r);
        for (int i = 0; i < hops; ++i) {
            rtnl_nexthop* hop = rtnl_route_nexthop_n(r, i);
            RouteInfo entry = route;
            entry.linkIndex = rtnl_route_nh_get_ifindex(hop);
            entry.gateway = AddressText(rtnl_route_nh_get_gateway(hop));
            routes.push_back(std::move(entry));
        }
        if (hops == 0) routes.push_back(std::move(route));
    };
    rtmsg request{};
    request.rtm_family = AF_UNSPEC;
    RunDump(sock, RTM_GETROUTE, request, "listing the routes", dump);
    return routes;
}

std::vector<AddressInfo> ReadAddresses(nl_sock* sock) {
    std::vector<AddressInfo> addresses;
    Dump dump;
    dump.take = [&addresses](nl_object* obj, nl_msg* msg) {
        auto* a = reinterpret_cast<rtnl_addr*>(obj);
        const int family = rtnl_addr_get_family(a);
        if (family != AF_INET && family != AF_INET6) return;
        AddressInfo address;
        address.linkIndex = rtnl_addr_get_ifindex(a);
        address.ipv6 = family == AF_INET6;
        // libnl's "local" is IFA_LOCAL, the address itself, or IFA_ADDRESS
        // when there is no IFA_LOCAL (IFA_ADDRESS is a point-to-point peer
        // otherwise).
        address.address = AddressText(rtnl_addr_get_local(a));
        address.prefixLength = static_cast<int>(rtnl_addr_get_prefixlen(a));
        address.flags = rtnl_addr_get_flags(a);
        address.validLifetime = rtnl_addr_get_valid_lifetime(a);
        address.preferredLifetime = rtnl_addr_get_preferred_lifetime(a);
        // libnl 3.7 drops IFA_PROTO: read it from the message.
        nlattr* attrs[IFA_MAX + 1] = {};
        if (nlmsg_parse(nlmsg_hdr(msg), sizeof(ifaddrmsg), attrs, IFA_MAX, nullptr) == 0 &&
            attrs[IFA_PROTO] != nullptr && nla_len(attrs[IFA_PROTO]) >= 1)
            address.proto = nla_get_u8(attrs[IFA_PROTO]);
        addresses.push_back(std::move(address));
    };
    ifaddrmsg request{};
    request.ifa_family = AF_UNSPEC;
    RunDump(sock, RTM_GETADDR, request, "listing the addresses", dump);
    return addresses;
}

}  // namespace

NetworkSnapshot ReadNetwork() {
    Socket sock(nl_socket_alloc());
    if (!sock) throw HostCtlException("reading the network through rtnetlink: out of memory");
    if (const int err = nl_connect(sock.get(), NETLINK_ROUTE); err < 0) Fail("opening a netlink socket", err);
    NetworkSnapshot snapshot;
    snapshot.links = ReadLinks(sock.get());
    snapshot.routes = ReadRoutes(sock.get());
    snapshot.addresses = ReadAddresses(sock.get());
    return snapshot;
}

}  // namespace HostCtl::Lib::Linux
