// The checks of a host's network, asked of the kernel and the link.
#include "NetworkChecks.hpp"

#include <arpa/inet.h>
#include <arpa/nameser.h>
#include <linux/if_ether.h>
#include <linux/neighbour.h>
#include <net/if.h>
#include <net/if_arp.h>
#include <netinet/in.h>
#include <netlink/cache.h>
#include <netlink/netlink.h>
#include <netlink/route/neighbour.h>
#include <netlink/socket.h>
#include <netpacket/packet.h>
#include <poll.h>
#include <resolv.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <memory>
#include <thread>

#include "LinkState.hpp"
#include "UniqueFd.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/HostCtl.hpp"

namespace HostCtl::Lib::Linux {

namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;
using Outcome = NetworkCheck::Outcome;

// How long each check may take.
constexpr milliseconds PROBE_INTERVAL{500};  // between two ARP probes (a LAN answers within ms)
constexpr int PROBES = 3;
constexpr milliseconds PROBE_WAIT{1500};      // the last probe's answer included
constexpr milliseconds CARRIER_WAIT{2000};    // a NIC just brought up negotiates its link
constexpr milliseconds DAD_WAIT{5000};        // IPv6 duplicate detection takes about 1 s
constexpr milliseconds NEIGHBOUR_WAIT{4000};  // the kernel gives up after 3 probes, 1 s apart
constexpr milliseconds DNS_TRY{1000};
constexpr int DNS_TRIES = 2;

using Fd = UniqueFd;

std::string Errno(int err) { return std::strerror(err); }

int Remaining(Clock::time_point deadline) {
    const auto left = std::chrono::duration_cast<milliseconds>(deadline - Clock::now()).count();
    return int(std::max<long long>(0, left));
}

std::string MacText(const unsigned char* mac) {
    char text[18];
    std::snprintf(text, sizeof text, "%02x:%02x:%02x:%02x:%02x:%02x", mac[0], mac[1], mac[2], mac[3], mac[4],
                  mac[5]);
    return text;
}

NetworkCheck Passed(const std::string& subject) { return {subject, Outcome::Passed, ""}; }
NetworkCheck Failed(const std::string& subject, const std::string& detail) {
    return {subject, Outcome::Failed, detail};
}

// An ARP packet for IPv4 over Ethernet.
struct __attribute__((packed)) ArpPacket {
    uint16_t hardware;
    uint16_t protocol;
    uint8_t hardwareLength;
    uint8_t protocolLength;
    uint16_t operation;
    uint8_t senderMac[ETH_ALEN];
    uint8_t senderIp[4];
    uint8_t targetMac[ETH_ALEN];
    uint8_t targetIp[4];
};

// The first character of a sysfs attribute of a link; 0 when it cannot be
// read (a link that is down has no carrier to read).
char SysfsFlag(const std::string& link, const std::string& attribute) {
    std::string text;
    if (!ReadText(HostPath("/sys/class/net/" + link + "/" + attribute), text) || text.empty()) return 0;
    return text[0];
}

bool Exists(const std::string& link) { return if_nametoindex(link.c_str()) != 0; }

struct SocketDeleter {
    void operator()(nl_sock* sock) const { nl_socket_free(sock); }
};
struct CacheDeleter {
    void operator()(nl_cache* cache) const { nl_cache_free(cache); }
};
struct AddrDeleter {
    void operator()(nl_addr* addr) const { nl_addr_put(addr); }
};
struct NeighDeleter {
    void operator()(rtnl_neigh* neigh) const { rtnl_neigh_put(neigh); }
};

// The state (NUD_*) of the neighbour entry of `address` on the link; 0
// when there is none.
int NeighbourState(nl_sock* sock, int ifindex, nl_addr* address) {
    nl_cache* raw = nullptr;
    if (rtnl_neigh_alloc_cache(sock, &raw) < 0) return 0;
    std::unique_ptr<nl_cache, CacheDeleter> cache(raw);
    for (nl_object* o = nl_cache_get_first(raw); o != nullptr; o = nl_cache_get_next(o)) {
        auto* neigh = reinterpret_cast<rtnl_neigh*>(o);
        nl_addr* dst = rtnl_neigh_get_dst(neigh);
        if (rtnl_neigh_get_ifindex(neigh) == ifindex && dst != nullptr &&
            nl_addr_get_family(dst) == nl_addr_get_family(address) &&
            nl_addr_get_len(dst) == nl_addr_get_len(address) &&
            std::memcmp(nl_addr_get_binary_addr(dst), nl_addr_get_binary_addr(address),
                        nl_addr_get_len(dst)) == 0)
            return rtnl_neigh_get_state(neigh);
    }
    return 0;
}

}  // namespace

std::string CanonicalAddress(const std::string& address) {
    unsigned char binary[sizeof(in6_addr)];
    char text[INET6_ADDRSTRLEN];
    for (int family : {AF_INET, AF_INET6})
        if (inet_pton(family, address.c_str(), binary) == 1 &&
            inet_ntop(family, binary, text, sizeof text) != nullptr)
            return text;
    return address;
}

std::optional<std::string> ProbeIpv4(const std::string& iface, const std::string& address) {
    const std::string what = "probing for " + address + " on " + iface;
    in_addr target{};
    if (inet_pton(AF_INET, address.c_str(), &target) != 1)
        throw HostCtlException(what + ": not an IPv4 address");
    const unsigned ifindex = if_nametoindex(iface.c_str());
    if (ifindex == 0) throw HostCtlException(what + ": no such interface");
    Fd fd(socket(AF_PACKET, SOCK_DGRAM | SOCK_CLOEXEC, htons(ETH_P_ARP)));
    if (fd.Get() < 0) throw HostCtlException(what + ": " + Errno(errno));
    sockaddr_ll own{};
    own.sll_family = AF_PACKET;
    own.sll_protocol = htons(ETH_P_ARP);
    own.sll_ifindex = int(ifindex);
    socklen_t ownLength = sizeof own;
    if (bind(fd.Get(), reinterpret_cast<sockaddr*>(&own), sizeof own) != 0 ||
        getsockname(fd.Get(), reinterpret_cast<sockaddr*>(&own), &ownLength) != 0)
        throw HostCtlException(what + ": " + Errno(errno));
    if (own.sll_halen != ETH_ALEN) throw HostCtlException(what + ": not an Ethernet link");

    // Sender address 0.0.0.0: the probe asks without claiming the address,
    // so no machine's ARP cache learns it.
    ArpPacket probe{};
    probe.hardware = htons(ARPHRD_ETHER);
    probe.protocol = htons(ETH_P_IP);
    probe.hardwareLength = ETH_ALEN;
    probe.protocolLength = 4;
    probe.operation = htons(ARPOP_REQUEST);
    std::memcpy(probe.senderMac, own.sll_addr, ETH_ALEN);
    std::memcpy(probe.targetIp, &target, 4);
    sockaddr_ll broadcast = own;
    std::memset(broadcast.sll_addr, 0xff, ETH_ALEN);

    const auto start = Clock::now();
    const auto deadline = start + PROBE_WAIT;
    int sent = 0;
    while (Clock::now() < deadline) {
        if (sent < PROBES && Clock::now() >= start + sent * PROBE_INTERVAL) {
            if (sendto(fd.Get(), &probe, sizeof probe, 0, reinterpret_cast<sockaddr*>(&broadcast),
                       sizeof broadcast) < 0)
                throw HostCtlException(what + ": " + Errno(errno));
            ++sent;
        }
        const auto wake = sent < PROBES ? std::min(deadline, start + sent * PROBE_INTERVAL) : deadline;
        pollfd p{fd.Get(), POLLIN, 0};
        if (poll(&p, 1, Remaining(wake)) <= 0) continue;
        ArpPacket answer{};
        sockaddr_ll from{};
        socklen_t fromLength = sizeof from;
        const ssize_t n = recvfrom(fd.Get(), &answer, sizeof answer, MSG_DONTWAIT,
                                   reinterpret_cast<sockaddr*>(&from), &fromLength);
        if (n < ssize_t(sizeof answer) || from.sll_pkttype == PACKET_OUTGOING) continue;
        // A reply from the address, or another machine announcing it.
        if (answer.hardware == htons(ARPHRD_ETHER) && answer.protocol == htons(ETH_P_IP) &&
            std::memcmp(answer.senderIp, &target, 4) == 0 &&
            std::memcmp(answer.senderMac, own.sll_addr, ETH_ALEN) != 0)
            return MacText(answer.senderMac);
    }
    return std::nullopt;
}

std::vector<NetworkCheck> CheckLinks(const std::string& iface, const std::vector<std::string>& uplinks) {
    if (uplinks.empty()) return {Failed("link of " + iface, "no physical adapter")};
    auto carrier = [](const std::string& nic) { return SysfsFlag(nic, "carrier") == '1'; };
    const auto deadline = Clock::now() + CARRIER_WAIT;
    while (!std::all_of(uplinks.begin(), uplinks.end(), carrier) && Clock::now() < deadline)
        std::this_thread::sleep_for(milliseconds(50));
    const bool any = std::any_of(uplinks.begin(), uplinks.end(), carrier);
    std::vector<NetworkCheck> checks;
    for (const std::string& nic : uplinks) {
        const std::string subject = "link of " + nic;
        if (carrier(nic))
            checks.push_back(Passed(subject));
        else
            checks.push_back({subject, any ? Outcome::Warning : Outcome::Failed,
                              Exists(nic) ? "no carrier" : "no such adapter"});
    }
    return checks;
}

std::vector<NetworkCheck> CheckAddresses(const std::string& iface, const std::vector<std::string>& wanted,
                                         bool dhcp4) {
    std::vector<std::string> want;
    for (const std::string& w : wanted) want.push_back(CanonicalAddress(w));
    // Waits while a configured address or the lease is missing or still in
    // duplicate detection (a failed detection leaves the address tentative
    // for good). The addresses the kernel makes itself (link-local, from
    // router advertisements) are not waited for: an apply that takes the
    // link down starts their detection again, and they are only judged when
    // it has already failed.
    NetworkSnapshot net;
    const LinkInfo* link = nullptr;
    const auto deadline = Clock::now() + DAD_WAIT;
    auto pending = [](const AddressInfo* a) { return a->Tentative() && !a->DadFailed(); };
    while (true) {
        net = ReadNetwork();
        link = net.FindLink(iface);
        if (link == nullptr) return {Failed("interface " + iface, "missing")};
        const std::vector<const AddressInfo*> have = net.AddressesOf(link->index);
        bool waiting = false;
        for (const std::string& w : want) {
            auto found =
                std::find_if(have.begin(), have.end(), [&](const AddressInfo* a) { return a->address == w; });
            waiting |= found == have.end() || pending(*found);
        }
        if (dhcp4)
            waiting |= std::none_of(have.begin(), have.end(), [&](const AddressInfo* a) {
                return !a->ipv6 && !a->Permanent() && !pending(a);
            });
        if (!waiting || Clock::now() >= deadline) break;
        std::this_thread::sleep_for(milliseconds(50));
    }

    const std::vector<const AddressInfo*> have = net.AddressesOf(link->index);
    auto judge = [](const AddressInfo& a) {
        const std::string subject = "address " + a.address;
        if (a.DadFailed()) return Failed(subject, "duplicate address");
        if (a.Tentative()) return Failed(subject, "duplicate detection did not end");
        return Passed(subject);
    };
    std::vector<NetworkCheck> checks;
    std::vector<const AddressInfo*> judged;
    for (const std::string& w : want) {
        auto found =
            std::find_if(have.begin(), have.end(), [&](const AddressInfo* a) { return a->address == w; });
        if (found == have.end()) {
            checks.push_back(Failed("address " + w, "missing"));
            continue;
        }
        checks.push_back(judge(**found));
        judged.push_back(*found);
    }
    if (dhcp4) {
        auto lease = std::find_if(have.begin(), have.end(),
                                  [](const AddressInfo* a) { return !a->ipv6 && !a->Permanent(); });
        if (lease == have.end()) {
            checks.push_back(Failed("IPv4 address from DHCP", "no lease"));
        } else if (std::find(judged.begin(), judged.end(), *lease) == judged.end()) {
            checks.push_back(judge(**lease));
            judged.push_back(*lease);
        }
    }
    // Addresses from router advertisements or DHCPv6 once their detection
    // ended, and the link-local one when its detection failed (the gateways'
    // answers need it).
    for (const AddressInfo* a : have) {
        if (std::find(judged.begin(), judged.end(), a) != judged.end()) continue;
        const bool linkLocal = a->ipv6 && a->address.rfind("fe80:", 0) == 0;
        if (!a->ipv6 || pending(a) || (linkLocal && !a->DadFailed())) continue;
        checks.push_back(judge(*a));
    }
    return checks;
}

NetworkCheck CheckGateway(const std::string& iface, const std::string& gateway) {
    const std::string subject = "gateway " + gateway;
    const int family = gateway.find(':') == std::string::npos ? AF_INET : AF_INET6;
    const unsigned ifindex = if_nametoindex(iface.c_str());
    if (ifindex == 0) return Failed(subject, "no interface " + iface);

    nl_addr* rawAddress = nullptr;
    if (nl_addr_parse(gateway.c_str(), family, &rawAddress) < 0) return Failed(subject, "not an address");
    std::unique_ptr<nl_addr, AddrDeleter> address(rawAddress);
    std::unique_ptr<nl_sock, SocketDeleter> sock(nl_socket_alloc());
    if (!sock || nl_connect(sock.get(), NETLINK_ROUTE) < 0)
        return Failed(subject, "rtnetlink cannot be asked");

    // The kernel asks for an IPv6 neighbour from its link-local address, so
    // that address's duplicate detection must end first (an apply that took
    // the link down started it again).
    if (family == AF_INET6) {
        const auto deadline = Clock::now() + DAD_WAIT;
        auto linkLocalReady = [&] {
            const NetworkSnapshot net = ReadNetwork();
            const std::vector<const AddressInfo*> have = net.AddressesOf(int(ifindex));
            return std::any_of(have.begin(), have.end(), [](const AddressInfo* a) {
                return a->ipv6 && a->address.rfind("fe80:", 0) == 0 && !a->Tentative();
            });
        };
        while (!linkLocalReady() && Clock::now() < deadline) std::this_thread::sleep_for(milliseconds(50));
    }

    // An entry the administrator set stays: the kernel never probes it.
    const int before = NeighbourState(sock.get(), int(ifindex), address.get());
    if (before & (NUD_PERMANENT | NUD_NOARP)) return Passed(subject);
    if (before != 0) {
        std::unique_ptr<rtnl_neigh, NeighDeleter> entry(rtnl_neigh_alloc());
        rtnl_neigh_set_ifindex(entry.get(), int(ifindex));
        rtnl_neigh_set_family(entry.get(), family);
        rtnl_neigh_set_dst(entry.get(), address.get());
        rtnl_neigh_delete(sock.get(), entry.get(), 0);
    }

    // One empty datagram to the discard port: the kernel resolves the
    // gateway before it can send it.
    Fd udp(socket(family, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    if (udp.Get() < 0 || setsockopt(udp.Get(), SOL_SOCKET, SO_BINDTODEVICE, iface.c_str(), iface.size()) != 0)
        return Failed(subject, Errno(errno));
    sockaddr_storage to{};
    socklen_t toLength = 0;
    if (family == AF_INET) {
        auto* in = reinterpret_cast<sockaddr_in*>(&to);
        in->sin_family = AF_INET;
        in->sin_port = htons(9);
        inet_pton(AF_INET, gateway.c_str(), &in->sin_addr);
        toLength = sizeof *in;
    } else {
        auto* in6 = reinterpret_cast<sockaddr_in6*>(&to);
        in6->sin6_family = AF_INET6;
        in6->sin6_port = htons(9);
        inet_pton(AF_INET6, gateway.c_str(), &in6->sin6_addr);
        if (IN6_IS_ADDR_LINKLOCAL(&in6->sin6_addr)) in6->sin6_scope_id = ifindex;
        toLength = sizeof *in6;
    }
    const auto sent = Clock::now();
    if (sendto(udp.Get(), "", 0, 0, reinterpret_cast<sockaddr*>(&to), toLength) < 0) {
        const int err = errno;
        return Failed(subject, err == ENETUNREACH || err == EHOSTUNREACH ? "not on the link" : Errno(err));
    }

    bool resolving = false;
    while (Clock::now() < sent + NEIGHBOUR_WAIT) {
        const int state = NeighbourState(sock.get(), int(ifindex), address.get());
        if (state & (NUD_REACHABLE | NUD_STALE | NUD_DELAY | NUD_PROBE | NUD_PERMANENT | NUD_NOARP))
            return Passed(subject);
        resolving |= (state & NUD_INCOMPLETE) != 0;
        // A failed entry counts once this probe made it (not a deleted one's
        // last word).
        if ((state & NUD_FAILED) && (resolving || Clock::now() > sent + milliseconds(1000))) break;
        std::this_thread::sleep_for(milliseconds(20));
    }
    return Failed(subject, "no answer");
}

NetworkCheck CheckNameServer(const std::string& server, const std::string& name) {
    const std::string subject = "name server " + server;
    auto warn = [&](const std::string& detail) { return NetworkCheck{subject, Outcome::Warning, detail}; };
    sockaddr_storage to{};
    socklen_t toLength = 0;
    if (auto* in = reinterpret_cast<sockaddr_in*>(&to);
        inet_pton(AF_INET, server.c_str(), &in->sin_addr) == 1) {
        in->sin_family = AF_INET;
        in->sin_port = htons(NAMESERVER_PORT);
        toLength = sizeof *in;
    } else if (auto* in6 = reinterpret_cast<sockaddr_in6*>(&to);
               inet_pton(AF_INET6, server.c_str(), &in6->sin6_addr) == 1) {
        in6->sin6_family = AF_INET6;
        in6->sin6_port = htons(NAMESERVER_PORT);
        toLength = sizeof *in6;
    } else {
        return warn("not an address");
    }
    unsigned char query[NS_PACKETSZ];
    const int length =
        res_mkquery(ns_o_query, name.c_str(), ns_c_in, ns_t_a, nullptr, 0, nullptr, query, sizeof query);
    if (length < NS_HFIXEDSZ) return warn("cannot ask for " + name);
    Fd udp(socket(to.ss_family, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    if (udp.Get() < 0 || connect(udp.Get(), reinterpret_cast<sockaddr*>(&to), toLength) != 0)
        return warn(Errno(errno));
    for (int attempt = 0; attempt < DNS_TRIES; ++attempt) {
        if (send(udp.Get(), query, size_t(length), 0) < 0) return warn(Errno(errno));
        const auto deadline = Clock::now() + DNS_TRY;
        while (Clock::now() < deadline) {
            pollfd p{udp.Get(), POLLIN, 0};
            if (poll(&p, 1, Remaining(deadline)) <= 0) continue;
            unsigned char answer[NS_PACKETSZ];
            const ssize_t n = recv(udp.Get(), answer, sizeof answer, MSG_DONTWAIT);
            // A port that is closed answers with an ICMP error: no server.
            if (n < 0 && errno == ECONNREFUSED) return warn("no name service");
            if (n < NS_HFIXEDSZ || answer[0] != query[0] || answer[1] != query[1] || !(answer[2] & 0x80))
                continue;
            // The server works when it knows the name or knows it is not
            // there; refusing or failing is no service.
            const int rcode = answer[3] & 0x0f;
            if (rcode == ns_r_noerror || rcode == ns_r_nxdomain) return Passed(subject);
            return warn(rcode == ns_r_refused ? "refused the query" : "failed to answer");
        }
    }
    return warn("no answer");
}

}  // namespace HostCtl::Lib::Linux
