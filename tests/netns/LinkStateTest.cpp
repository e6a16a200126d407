// The netlink and sysfs reader run inside the bed's host namespace (through a
// probe printing its snapshot as JSON), compared with what `ip -json` shows
// there; addresses learned through DHCPv4, SLAAC and DHCPv6 from the LAN's
// dnsmasq; VLAN and bond links where the kernel has them; both ifupdown
// flavours bringing up the bridge; and the bed's own isolation.
#include <gtest/gtest.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <iostream>
#include <nlohmann/json.hpp>
#include <set>
#include <sstream>
#include <thread>

#include "NetnsBed.hpp"

using Netns::BedOptions;
using Netns::Duration;
using Netns::NetnsBed;
using Netns::WaitUntil;
using nlohmann::json;

namespace {

constexpr uint32_t kForever = 0xffffffffu;
constexpr int kProtoKernelRa = 2;  // IFAPROT_KERNEL_RA
constexpr int kProtoKernelLl = 3;  // IFAPROT_KERNEL_LL
constexpr int kRtprotRa = 9;       // RTPROT_RA

json Probe(const NetnsBed& bed) {
    const Netns::RunResult r = bed.RunArgv({VELK_LINKSTATE_PROBE});
    if (!r.Ok()) {
        ADD_FAILURE() << "the probe failed: " << r.Describe();
        return json::object();
    }
    return json::parse(r.out);
}

json IpJson(const NetnsBed& bed, const std::string& args) {
    const Netns::RunResult r = bed.Run("ip -json " + args);
    if (!r.Ok()) {
        ADD_FAILURE() << "ip -json " << args << ": " << r.Describe();
        return json::array();
    }
    return json::parse(r.out);
}

const json* FindBy(const json& list, const std::string& key, const json& value) {
    for (const json& item : list)
        if (item.value(key, json()) == value) return &item;
    return nullptr;
}

bool HasFlag(const json& ipLink, const std::string& flag) {
    for (const json& f : ipLink.value("flags", json::array()))
        if (f == flag) return true;
    return false;
}

bool NoTentativeAddress(const NetnsBed& bed, const std::string& which = "") {
    for (const json& link : IpJson(bed, "addr " + which))
        for (const json& a : link.value("addr_info", json::array()))
            if (a.value("tentative", false)) return false;
    return true;
}

// "dst via gateway dev" of a route in `ip -json route` form.
std::string RouteKey(const std::string& dst, const std::string& gateway, const std::string& dev) {
    return dst + " via " + gateway + " dev " + dev;
}

std::string Reading(const json& probe) { return "\nthe probe read:\n" + probe.dump(1); }

// --- what ip -json shows, field by field ---

TEST(LinkStateTest, SnapshotMatchesIpJson) {
    BedOptions options;
    options.lanServer = false;  // no router advertisements: the addresses stay as set here
    NetnsBed bed(options);
    if (bed.Skipped()) GTEST_SKIP() << bed.SkipReason();
    ASSERT_TRUE(bed.Run("ip addr add 192.0.2.10/24 dev vmbr0 && ip addr add 2001:db8:1::10/64 dev vmbr0 && "
                        "ip route add default via 192.0.2.1 && ip -6 route add default via 2001:db8:1::1 && "
                        "ip addr add 198.51.100.7/32 dev eno2")
                    .Ok());
    bed.SetCable("eno2", false);
    ASSERT_TRUE(WaitUntil([&] { return NoTentativeAddress(bed); }, Duration(5000)));

    const json links = IpJson(bed, "-details link");
    const json addrs = IpJson(bed, "addr");
    const json routes4 = IpJson(bed, "-4 route show table main");
    const json routes6 = IpJson(bed, "-6 route show table main");
    const json probe = Probe(bed);
    ASSERT_TRUE(probe.contains("links")) << probe.dump();

    // Every link as ip shows it.
    ASSERT_EQ(links.size(), probe["links"].size()) << Reading(probe);
    for (const json& ip : links) {
        const std::string name = ip["ifname"];
        SCOPED_TRACE(name);
        const json* mine = FindBy(probe["links"], "name", name);
        ASSERT_NE(mine, nullptr) << Reading(probe);
        EXPECT_EQ((*mine)["index"], ip["ifindex"]);
        EXPECT_EQ((*mine)["mac"], ip.value("address", ""));
        EXPECT_EQ((*mine)["adminUp"], HasFlag(ip, "UP"));
        EXPECT_EQ((*mine)["carrier"], HasFlag(ip, "LOWER_UP"));
        EXPECT_EQ((*mine)["master"], ip.value("master", ""));
        EXPECT_EQ((*mine)["kind"], ip.value("linkinfo", json::object()).value("info_kind", ""));
    }

    // What the bed built: veth NICs, taps as VM ports, a bridge without uplink.
    struct LinkRow {
        const char* name;
        const char* kind;
        const char* master;
        bool adminUp, carrier;
    };
    const LinkRow rows[] = {
        {"eno1", "veth", "vmbr0", true, true},
        {"eno2", "veth", "", true, false},  // its cable pulled
        {"vmbr0", "bridge", "", true, true},
        {"tap100i0", "tun", "vmbr0", true, false},  // no VM holds it open
        {"vmbr1", "bridge", "", true, false},       // its only port has no carrier
        {"tap101i0", "tun", "vmbr1", true, false},
    };
    for (const LinkRow& row : rows) {
        SCOPED_TRACE(row.name);
        const json* mine = FindBy(probe["links"], "name", row.name);
        ASSERT_NE(mine, nullptr);
        EXPECT_EQ((*mine)["kind"], row.kind);
        EXPECT_EQ((*mine)["master"], row.master);
        EXPECT_EQ((*mine)["adminUp"], row.adminUp);
        EXPECT_EQ((*mine)["carrier"], row.carrier);
        EXPECT_EQ((*mine)["hasDevice"], false);  // none has hardware behind it
        EXPECT_EQ((*mine)["driver"], "");
    }

    // Every address, with its prefix, flags and lifetime.
    size_t count = 0;
    for (const json& link : addrs)
        for (const json& a : link.value("addr_info", json::array())) {
            ++count;
            const std::string text = a["local"];
            SCOPED_TRACE(text);
            // A bridge shares its first port's MAC, so both have one link-local address.
            const json* mine = nullptr;
            for (const json& m : probe["addresses"])
                if (m["address"] == text && m["link"] == link["ifname"]) mine = &m;
            ASSERT_NE(mine, nullptr) << Reading(probe);
            EXPECT_EQ((*mine)["ipv6"], a["family"] == "inet6");
            EXPECT_EQ((*mine)["prefixLength"], a["prefixlen"]);
            EXPECT_EQ((*mine)["permanent"], !a.value("dynamic", false));
            EXPECT_EQ((*mine)["tentative"], a.value("tentative", false));
            EXPECT_EQ((*mine)["validLifetime"], a.value("valid_life_time", kForever));
        }
    EXPECT_EQ(count, probe["addresses"].size()) << Reading(probe);
    for (const char* address : {"192.0.2.10", "2001:db8:1::10", "198.51.100.7"}) {
        const json* mine = FindBy(probe["addresses"], "address", address);
        ASSERT_NE(mine, nullptr) << address;
        EXPECT_TRUE((*mine)["permanent"].get<bool>()) << address;
    }

    // The main table's routes, and the default route of each family.
    std::multiset<std::string> ipRoutes, myRoutes;
    for (const json* table : {&routes4, &routes6})
        for (const json& r : *table)
            if (r.value("type", "unicast") == "unicast")
                ipRoutes.insert(RouteKey(r["dst"], r.value("gateway", ""), r.value("dev", "")));
    for (const json& r : probe["routes"]) {
        // ip names a host route without its prefix length.
        const int length = r["prefixLength"];
        const bool host = length == (r["ipv6"].get<bool>() ? 128 : 32);
        const std::string dst = length == 0 ? std::string("default")
                                : host      ? r["destination"].get<std::string>()
                                       : r["destination"].get<std::string>() + "/" + std::to_string(length);
        myRoutes.insert(RouteKey(dst, r["gateway"], r["link"]));
    }
    EXPECT_EQ(ipRoutes, myRoutes);
    EXPECT_EQ(probe["default4"]["gateway"], "192.0.2.1");
    EXPECT_EQ(probe["default4"]["link"], "vmbr0");
    EXPECT_EQ(probe["default6"]["gateway"], "2001:db8:1::1");

    // sysfs: speed and duplex as the files say; a file that cannot be read
    // (the loopback's speed) or says "unknown" (a bridge's duplex) is empty.
    const Netns::RunResult sysfs = bed.Run(
        "cd /sys/class/net && for l in *; do echo \"$l $(cat $l/speed 2>/dev/null || echo 0) "
        "$(cat $l/duplex 2>/dev/null || echo none)\"; done");
    ASSERT_TRUE(sysfs.Ok()) << sysfs.Describe();
    std::istringstream lines(sysfs.out);
    int rowsSeen = 0;
    for (std::string name, speed, duplex; lines >> name >> speed >> duplex; ++rowsSeen) {
        SCOPED_TRACE(name);
        const json* mine = FindBy(probe["links"], "name", name);
        ASSERT_NE(mine, nullptr);
        EXPECT_EQ((*mine)["speedMbps"], std::max(std::stoi(speed), 0));
        EXPECT_EQ((*mine)["duplex"], duplex == "full" || duplex == "half" ? duplex : "");
    }
    EXPECT_EQ(rowsSeen, static_cast<int>(links.size()));
}

// --- addresses the host learns from the LAN ---

struct LearnedRow {
    const char* name;
    const char* command;  // "" to wait for router advertisements alone
    const char* prefix;   // the learned address starts with it...
    int prefixLength;     // ...and has this prefix length
    bool ipv6;
};
void PrintTo(const LearnedRow& row, std::ostream* os) { *os << row.name; }

class LearnedAddressTest : public ::testing::TestWithParam<LearnedRow> {};

TEST_P(LearnedAddressTest, IsDynamicAndMatchesIp) {
    const LearnedRow& row = GetParam();
    NetnsBed bed;
    if (bed.Skipped()) GTEST_SKIP() << bed.SkipReason();
    if (*row.command != '\0') {
        // DHCPv6 binds the link-local address: wait for its duplicate check.
        ASSERT_TRUE(
            WaitUntil([&] { return NoTentativeAddress(bed, "show dev vmbr0 scope link"); }, Duration(5000)));
        const Netns::RunResult r = bed.Run(row.command, Duration(30000));
        ASSERT_TRUE(r.Ok()) << r.Describe() << "\n" << bed.LanServerLog();
    }
    json probe;
    const json* learned = nullptr;
    auto findLearned = [&] {
        probe = Probe(bed);
        learned = nullptr;
        if (!probe.contains("addresses")) return false;
        for (const json& a : probe["addresses"])
            if (a["link"] == "vmbr0" && a["ipv6"] == row.ipv6 && a["prefixLength"] == row.prefixLength &&
                a["address"].get<std::string>().rfind(row.prefix, 0) == 0 && !a["tentative"].get<bool>())
                learned = &a;
        return learned != nullptr;
    };
    ASSERT_TRUE(WaitUntil(findLearned, Duration(15000))) << Reading(probe) << "\n" << bed.LanServerLog();
    const std::string address = (*learned)["address"];
    EXPECT_FALSE((*learned)["permanent"].get<bool>()) << address;
    EXPECT_GT((*learned)["validLifetime"], 0u) << address;
    EXPECT_LE((*learned)["validLifetime"], 3600u) << address;  // the LAN leases for an hour

    // ip shows the same address as dynamic, with the same lifetime.
    bool seen = false;
    for (const json& link : IpJson(bed, "addr show dev vmbr0"))
        for (const json& a : link.value("addr_info", json::array()))
            if (a["local"] == address) {
                seen = true;
                EXPECT_TRUE(a.value("dynamic", false));
                EXPECT_LE(
                    std::abs(a.value("valid_life_time", 0ll) - (*learned)["validLifetime"].get<long long>()),
                    3);
            }
    EXPECT_TRUE(seen) << address;

    if (std::string(row.name) == "Slaac") {
        // The kernel names who made an address (IFA_PROTO) since 6.3; the
        // link-local address tells whether this one does.
        const json* linkLocal = nullptr;
        for (const json& a : probe["addresses"])
            if (a["link"] == "vmbr0" && a["address"].get<std::string>().rfind("fe80:", 0) == 0)
                linkLocal = &a;
        ASSERT_NE(linkLocal, nullptr) << Reading(probe);
        if ((*linkLocal)["proto"] == 0) {
            std::cout << "[   NOTE   ] this kernel does not report IFA_PROTO; the origin check is left out\n";
        } else {
            EXPECT_EQ((*linkLocal)["proto"], kProtoKernelLl);
            EXPECT_EQ((*learned)["proto"], kProtoKernelRa) << Reading(probe);
        }
        // The router's advertisement also gave a default route through
        // vmbr0 (and one through eno2, which hears the LAN too).
        const json* route = nullptr;
        for (const json& r : probe["routes"])
            if (r["ipv6"] == true && r["prefixLength"] == 0 && r["link"] == "vmbr0") route = &r;
        ASSERT_NE(route, nullptr) << Reading(probe);
        EXPECT_EQ((*route)["protocol"], kRtprotRa);
        EXPECT_EQ((*route)["gateway"].get<std::string>().rfind("fe80:", 0), 0u) << Reading(probe);
        EXPECT_TRUE(probe.contains("default6"));
    }
    if (!row.ipv6) {
        ASSERT_TRUE(probe.contains("default4")) << Reading(probe);
        EXPECT_EQ(probe["default4"]["gateway"], "192.0.2.1");
        // dhclient's script wrote the test's resolver file, not the machine's.
        EXPECT_NE(bed.ReadFile("/etc/resolv.conf").value_or("").find("nameserver 192.0.2.1"),
                  std::string::npos);
    }
}

INSTANTIATE_TEST_SUITE_P(
    Lan, LearnedAddressTest,
    ::testing::Values(LearnedRow{"Dhcp4", "dhclient -4 -1 vmbr0", "192.0.2.1", 24, false},
                      LearnedRow{"Slaac", "", "2001:db8:1:", 64, true},
                      LearnedRow{"Dhcp6", "dhclient -6 -1 vmbr0", "2001:db8:1::1", 128, true}),
    [](const auto& info) { return std::string(info.param.name); });

// --- links this kernel may lack ---

struct StackedRow {
    const char* kind;
    const char* script;
    const char* link;
    const char* expectKind;
    const char* field;  // a field of the link and its expected value
    json value;
};
void PrintTo(const StackedRow& row, std::ostream* os) { *os << row.kind << " " << row.field; }

class StackedLinkTest : public ::testing::TestWithParam<StackedRow> {};

TEST_P(StackedLinkTest, IsRead) {
    const StackedRow& row = GetParam();
    if (const std::string why = NetnsBed::KernelLacks(row.kind); !why.empty()) GTEST_SKIP() << why;
    BedOptions options;
    options.lanServer = false;
    NetnsBed bed(options);
    if (bed.Skipped()) GTEST_SKIP() << bed.SkipReason();
    const Netns::RunResult r = bed.Run(row.script);
    ASSERT_TRUE(r.Ok()) << r.Describe();
    const json probe = Probe(bed);
    ASSERT_TRUE(probe.contains("links"));
    const json* link = FindBy(probe["links"], "name", row.link);
    ASSERT_NE(link, nullptr) << Reading(probe);
    EXPECT_EQ((*link)["kind"], row.expectKind);
    EXPECT_EQ((*link)[row.field], row.value) << Reading(probe);
}

INSTANTIATE_TEST_SUITE_P(
    Kernel, StackedLinkTest,
    ::testing::Values(
        StackedRow{"vlan", "ip link add link eno2 name eno2.5 type vlan id 5 && ip link set eno2.5 up",
                   "eno2.5", "vlan", "vlanId", 5},
        StackedRow{"vlan", "ip link add link eno2 name eno2.7 type vlan id 7", "eno2.7", "vlan", "parent",
                   "eno2"},
        StackedRow{"bond",
                   "ip link add bond0 type bond mode active-backup && ip link set eno2 down && "
                   "ip link set eno2 master bond0 && echo eno2 > /sys/class/net/bond0/bonding/primary",
                   "bond0", "bond", "bondPrimary", "eno2"},
        StackedRow{"bond", "ip link add bond0 type bond mode active-backup", "bond0", "bond", "bondMode",
                   "active-backup"}),
    [](const auto& info) { return std::string(info.param.kind) + std::to_string(info.index); });

// --- the bed's two ifupdown flavours ---

struct FlavourRow {
    const char* name;
    bool ifupdown2;
    const char* ifup;  // where the host's ifup leads
};
void PrintTo(const FlavourRow& row, std::ostream* os) { *os << row.name; }

class FlavourTest : public ::testing::TestWithParam<FlavourRow> {};

TEST_P(FlavourTest, BringsUpTheBridgeFromTheTestsFile) {
    BedOptions options;
    options.bridges = false;  // ifup makes vmbr0
    options.lanServer = false;
    options.ifupdown2 = GetParam().ifupdown2;
    NetnsBed bed(options);
    if (bed.Skipped()) GTEST_SKIP() << bed.SkipReason();
    bed.WriteFile("/etc/network/interfaces",
                  "auto lo\niface lo inet loopback\n\n"
                  "iface eno1 inet manual\n\niface eno2 inet manual\n\n"
                  "auto vmbr0\niface vmbr0 inet static\n"
                  "\taddress 192.0.2.10/24\n\tgateway 192.0.2.1\n\tbridge-ports eno1\n"
                  "\tbridge-stp off\n\tbridge-fd 0\n\tbridge-ports-condone-regex ^(tap|veth|fwpr)\n");
    EXPECT_EQ(bed.Run("readlink -f \"$(command -v ifup)\"").out, std::string(GetParam().ifup) + "\n");
    const Netns::RunResult up = bed.Run("ifup -a", Duration(30000));
    ASSERT_TRUE(up.Ok()) << up.Describe();
    const json probe = Probe(bed);
    ASSERT_TRUE(probe.contains("addresses"));
    const json* address = FindBy(probe["addresses"], "address", "192.0.2.10");
    ASSERT_NE(address, nullptr) << Reading(probe);
    EXPECT_EQ((*address)["link"], "vmbr0");
    EXPECT_EQ((*FindBy(probe["links"], "name", "eno1"))["master"], "vmbr0");
    EXPECT_EQ(probe["default4"]["gateway"], "192.0.2.1");
    // The flavour's state went to the test's folders.
    EXPECT_TRUE(
        bed.ReadFile(GetParam().ifupdown2 ? "/var/tmp/network/ifstatenew" : "/run/network/ifstate.vmbr0"))
        << bed.Run("ls -la /run/network /var/tmp/network").out;
}

INSTANTIATE_TEST_SUITE_P(Bed, FlavourTest,
                         ::testing::Values(FlavourRow{"ifupdown", false, "/usr/sbin/ifup"},
                                           FlavourRow{"ifupdown2", true, "/usr/share/ifupdown2/__main__.py"}),
                         [](const auto& info) { return std::string(info.param.name); });

// --- the bed keeps its changes to itself ---

std::string MachineFile(const std::string& path) {
    std::ifstream in(path);
    std::ostringstream text;
    text << in.rdbuf();
    return in ? text.str() : "<missing>";
}

TEST(BedTest, ChangesStayInsideAndOutliveAProgram) {
    NetnsBed bed;
    if (bed.Skipped()) GTEST_SKIP() << bed.SkipReason();
    // The LAN's DNS answers for the host's name through the test's resolver
    // file (the hosts file left without it).
    bed.WriteFile("/etc/hosts", "127.0.0.1 localhost\n");
    ASSERT_TRUE(bed.Run("ip addr add 192.0.2.10/24 dev vmbr0").Ok());
    const Netns::RunResult dns = bed.Run("getent ahostsv4 velk-host.example.test");
    EXPECT_EQ(dns.out.substr(0, dns.out.find_first_of(" \t")), "192.0.2.10") << dns.Describe();
    EXPECT_EQ(bed.Run("hostname").out, "velk-host\n");

    const std::vector<std::string> files = {"/etc/hosts", "/etc/hostname", "/etc/resolv.conf"};
    std::vector<std::string> before;
    for (const std::string& f : files) before.push_back(MachineFile(f));
    ASSERT_TRUE(bed.Run("echo '192.0.2.99 intruder' >> /etc/hosts && echo other > /etc/hostname && "
                        "echo 'nameserver 192.0.2.99' > /etc/resolv.conf && hostname other-name && "
                        "echo lib > /var/lib/velk-bed-probe && echo run > /run/velk-bed-probe")
                    .Ok());
    // A second program sees what the first left, as after a restart.
    EXPECT_EQ(bed.Run("hostname; cat /etc/hostname /var/lib/velk-bed-probe /run/velk-bed-probe").out,
              "other-name\nother\nlib\nrun\n");
    EXPECT_EQ(bed.ReadFile("/run/velk-bed-probe"), "run\n");
    for (size_t i = 0; i < files.size(); ++i) EXPECT_EQ(MachineFile(files[i]), before[i]) << files[i];
    EXPECT_EQ(MachineFile("/var/lib/velk-bed-probe"), "<missing>");
    EXPECT_EQ(MachineFile("/run/velk-bed-probe"), "<missing>");
    char name[256] = "";
    gethostname(name, sizeof name - 1);
    EXPECT_NE(std::string(name), "other-name");

    // Users for a console log-in: root's password replaced, a new user added.
    bed.SetPassword("root", "secret");
    bed.SetPassword("operator1", "secret2");
    const Netns::RunResult users =
        bed.Run("getent shadow root operator1 | cut -d: -f1,2 | cut -c1-13; id -u operator1");
    EXPECT_NE(users.out.find("root:$6$"), std::string::npos) << users.out;
    EXPECT_NE(users.out.find("operator1:$6$"), std::string::npos) << users.out;
    EXPECT_EQ(MachineFile("/etc/shadow").find("operator1"), std::string::npos);
}

}  // namespace
