// The checks after a change of the management network, run by the Debian
// host's backend inside the bed (through a probe program): a good change
// passes every check, each kind of fault fails (or warns about) exactly its
// own check, and a bad change is put back byte for byte with the host
// reachable again. Each case prints how long its checks took.
#include <gtest/gtest.h>

#include <functional>
#include <iostream>
#include <map>
#include <nlohmann/json.hpp>

#include "NetnsBed.hpp"

using Netns::BedOptions;
using Netns::Duration;
using Netns::NetnsBed;
using nlohmann::json;

namespace {

const std::string kInterfaces =
    "# Written by the test.\n"
    "auto lo\niface lo inet loopback\n\n"
    "iface eno1 inet manual\n\n"
    "auto vmbr0\niface vmbr0 inet static\n"
    "\taddress 192.0.2.10/24\n\tgateway 192.0.2.1\n\tbridge-ports eno1\n\tbridge-stp off\n\tbridge-fd 0\n\n"
    "iface vmbr0 inet6 static\n\taddress 2001:db8:1::10/64\n\tgateway 2001:db8:1::1\n";

json Probe(const NetnsBed& bed, const std::string& args, Duration timeout = Duration(60000)) {
    const Netns::RunResult r = bed.Run(std::string(VELK_NETCHECK_PROBE) + " " + args, timeout);
    if (!r.Ok()) {
        ADD_FAILURE() << "probe " << args << ": " << r.Describe();
        return json::object();
    }
    return json::parse(r.out);
}

// subject -> "outcome detail"
std::map<std::string, std::string> Checks(const json& result) {
    std::map<std::string, std::string> found;
    for (const json& c : result.value("checks", json::array()))
        found[c["subject"]] =
            c["outcome"].get<std::string>() +
            (c["detail"].get<std::string>().empty() ? "" : " " + c["detail"].get<std::string>());
    return found;
}

struct Case {
    const char* name;
    bool ifupdown2;
    // Breaks something after the host is up (nothing for a good change).
    std::function<void(NetnsBed&)> fault;
    // The checks that must be there with their outcome; every other check
    // must pass.
    std::map<std::string, std::string> expect;
    int maxMs;  // the checks' time limit
};

const std::map<std::string, std::string> kGood = {
    {"link of eno1", "passed"},           {"address 192.0.2.20", "passed"},
    {"address 2001:db8:1::10", "passed"}, {"gateway 192.0.2.1", "passed"},
    {"gateway 2001:db8:1::1", "passed"},  {"name server 192.0.2.1", "passed"},
};

void Apply(NetnsBed& bed, const std::string& address, const std::string& gateway) {
    const json applied = Probe(bed, "apply vmbr0 " + address + " " + gateway);
    std::cout << "[ apply    ] " << address << " via " << gateway << ": " << applied.value("ms", -1)
              << " ms\n";
}

class NetworkCheckTest : public ::testing::TestWithParam<Case> {};

TEST_P(NetworkCheckTest, ChecksTellWhatBroke) {
    const Case& c = GetParam();
    BedOptions options;
    options.ifupdown2 = c.ifupdown2;
    NetnsBed bed(options);
    if (bed.Skipped()) GTEST_SKIP() << bed.SkipReason();
    bed.WriteFile("/etc/network/interfaces", kInterfaces);
    bed.WriteFile("/etc/velk/velk.conf", "physical-nics = eno*\n");
    ASSERT_TRUE(bed.Run("ifup vmbr0").Ok());
    c.fault(bed);
    const json result = Probe(bed, "check vmbr0");
    std::cout << "[ checks   ] " << c.name << ": " << result.value("ms", -1) << " ms\n";
    const auto checks = Checks(result);
    for (const auto& [subject, outcome] : c.expect)
        EXPECT_EQ(checks.count(subject) ? checks.at(subject) : "missing", outcome) << subject;
    for (const auto& [subject, outcome] : checks)
        EXPECT_TRUE(c.expect.count(subject) || outcome == "passed") << subject << ": " << outcome;
    EXPECT_LE(result.value("ms", 1 << 30), c.maxMs);
}

std::vector<Case> Cases() {
    std::vector<Case> cases;
    for (bool ifupdown2 : {false, true}) {
        cases.push_back({ifupdown2 ? "GoodChange_ifupdown2" : "GoodChange_ifupdown", ifupdown2,
                         [](NetnsBed& bed) { Apply(bed, "192.0.2.20/24", "192.0.2.1"); }, kGood, 2500});
        cases.push_back({ifupdown2 ? "WrongGateway_ifupdown2" : "WrongGateway_ifupdown",
                         ifupdown2,
                         [](NetnsBed& bed) { Apply(bed, "192.0.2.10/24", "192.0.2.254"); },
                         {{"gateway 192.0.2.254", "failed no answer"}},
                         4500});
    }
    cases.push_back({"CablePulled",
                     false,
                     [](NetnsBed& bed) { bed.SetCable("eno1", false); },
                     {{"link of eno1", "failed no carrier"},
                      {"gateway 192.0.2.1", "failed no answer"},
                      {"gateway 2001:db8:1::1", "failed no answer"},
                      {"name server 192.0.2.1", "warning no answer"}},
                     9000});
    cases.push_back({"DuplicateIpv6",
                     false,
                     [](NetnsBed& bed) {
                         // The LAN takes the host's address while the host is down.
                         ASSERT_TRUE(bed.Run("ifdown --no-scripts vmbr0").Ok());
                         ASSERT_TRUE(bed.Lan("ip addr add 2001:db8:1::10/64 dev lan0 nodad").Ok());
                         // ifup reports the failed detection itself.
                         bed.Run("ifup vmbr0");
                     },
                     {{"address 2001:db8:1::10", "failed duplicate address"}},
                     6000});
    cases.push_back({"DeadNameServers",
                     false,
                     [](NetnsBed& bed) {
                         bed.StopLanServer();
                         bed.WriteFile("/etc/resolv.conf", "nameserver 192.0.2.1\nnameserver 192.0.2.53\n");
                     },
                     {{"name server 192.0.2.1", "warning no name service"},
                      {"name server 192.0.2.53", "warning no answer"}},
                     3000});
    return cases;
}

// Before a static address is set: the router's own address is answered by
// its MAC, a free one by nobody.
TEST(NetworkProbeTest, ArpProbeFindsWhoHoldsTheAddress) {
    NetnsBed bed;
    if (bed.Skipped()) GTEST_SKIP() << bed.SkipReason();
    const Netns::RunResult lan = bed.Lan("cat /sys/class/net/lan0/address");
    ASSERT_TRUE(lan.Ok()) << lan.Describe();
    const json taken = Probe(bed, "probe vmbr0 192.0.2.1");
    const json free = Probe(bed, "probe vmbr0 192.0.2.99");
    std::cout << "[ probe    ] taken: " << taken.value("ms", -1) << " ms, free: " << free.value("ms", -1)
              << " ms\n";
    EXPECT_EQ(taken.value("answer", json()), lan.out.substr(0, lan.out.find('\n')));
    EXPECT_LT(taken.value("ms", 1 << 30), 500);
    EXPECT_TRUE(free.contains("answer") && free["answer"].is_null()) << free.dump();
}

class NetworkRevertTest : public ::testing::TestWithParam<bool> {};

// A bad change (address, host name and name server) put back: every file as
// it was byte for byte, the old address answering the LAN, the VM port still
// on its bridge, and the checks passing again.
TEST_P(NetworkRevertTest, PutBackRestoresFilesAndReachability) {
    BedOptions options;
    options.ifupdown2 = GetParam();
    NetnsBed bed(options);
    if (bed.Skipped()) GTEST_SKIP() << bed.SkipReason();
    bed.WriteFile("/etc/network/interfaces", kInterfaces);
    bed.WriteFile("/etc/velk/velk.conf", "physical-nics = eno*\n");
    // A VM starts after the network is up (ifupdown2 took its port off the
    // bridge, whose stanza does not condone VM ports).
    ASSERT_TRUE(bed.Run("ifup vmbr0 && ip link set tap100i0 master vmbr0").Ok());
    const std::vector<std::string> files = {"/etc/network/interfaces", "/etc/hosts", "/etc/hostname",
                                            "/etc/resolv.conf"};
    std::map<std::string, std::string> before;
    for (const std::string& f : files) before[f] = bed.ReadFile(f).value_or("(none)");
    Probe(bed, "save /run/saved.json");

    Apply(bed, "198.51.100.10/24", "198.51.100.1");
    ASSERT_TRUE(bed.Run("hostname other && echo other > /etc/hostname && echo nameserver 203.0.113.53 > "
                        "/etc/resolv.conf && echo '198.51.100.10 other' >> /etc/hosts")
                    .Ok());
    ASSERT_FALSE(bed.Lan("ping -c1 -W1 192.0.2.10").Ok());

    const json restored = Probe(bed, "restore /run/saved.json");
    std::cout << "[ revert   ] " << restored.value("ms", -1) << " ms\n";
    for (const std::string& f : files) EXPECT_EQ(bed.ReadFile(f).value_or("(none)"), before[f]) << f;
    EXPECT_EQ(bed.Run("hostname").out, "velk-host\n");
    EXPECT_TRUE(bed.Lan("ping -c1 -W2 192.0.2.10").Ok());
    EXPECT_FALSE(bed.Run("ip -4 addr show dev vmbr0 | grep -q 198.51.100.10").Ok());
    EXPECT_TRUE(bed.Run("ip link show dev tap100i0 | grep -q 'master vmbr0'").Ok());
    for (const auto& [subject, outcome] : Checks(Probe(bed, "check vmbr0")))
        EXPECT_EQ(outcome, "passed") << subject;
}

INSTANTIATE_TEST_SUITE_P(Debian, NetworkRevertTest, ::testing::Values(false, true),
                         [](const auto& info) { return std::string(info.param ? "ifupdown2" : "ifupdown"); });

INSTANTIATE_TEST_SUITE_P(Debian, NetworkCheckTest, ::testing::ValuesIn(Cases()),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
