// The operations behind the management network's restore and test on a
// simulated host: connecting interfaces, new switches, port groups and
// distributed ports, the factory restore, what answers in the simulated
// network, the host resolver and the hosts file edit.
#include <sys/stat.h>

#include "TestSupport.hpp"
#include "hostctl/Backend.hpp"
#include "hostctl/QelCtl.hpp"
#include "hostctl/SimNetwork.hpp"

namespace {

using namespace HostCtlTest;
using HostCtl::Lib::GetBackend;
using HostCtl::Lib::HostCtlException;
using HostCtl::Network::ConnectionPoint;
using HostCtl::Network::QelNic;
using HostCtl::Network::VirtualSwitch;
using nlohmann::json;

// Beside the default network: kDS-1 with an uplink of its own, qk1 on its
// port "100" (VLAN 20) and a free port "101" (VLAN 0).
json HostWithDvs() {
    json s = HostCtl::Lib::DefaultHostState();
    json& network = s["network"];
    network["dvswitches"] =
        json::array({{{"name", "kDS-1"},
                      {"uplinkPorts", {{{"key", "uplink1"}, {"pnic", "zonic1"}}}},
                      {"ports",
                       {{{"key", "100"}, {"vlan", 20}, {"hostLocal", false}, {"connectee", "qk1"}},
                        {{"key", "101"}, {"vlan", 0}, {"hostLocal", false}, {"connectee", ""}}}}}});
    json qk1 = network["vnics"][0];
    qk1.erase("portgroup");
    qk1["name"] = "qk1";
    qk1["mac"] = "00:50:56:01:00:09";
    qk1["connectionType"] = 2;
    qk1["dvs"] = "kDS-1";
    qk1["port"] = "100";
    network["vnics"].push_back(qk1);
    HostCtl::Lib::BootNetwork(HostCtl::Lib::SimState("."), s);
    return s;
}

template <typename Address>
std::vector<std::string> Texts(const std::vector<Address>& addresses) {
    std::vector<std::string> out;
    for (const auto& a : addresses) out.push_back(a.GetStringAddress());
    return out;
}

class RestoreTest : public SimHostTest {
protected:
    json State() const { return json::parse(ReadFile(StatePath())); }
    json Network() const { return State()["network"]; }
    std::string Hosts() const { return Root() + "/etc/hosts"; }
};

TEST_F(RestoreTest, SwitchAndPortOperations) {
    struct Case {
        const char* operation;  // as recorded in the history
        std::function<void()> call;
        bool refused;
        std::function<void(const json& network)> check;  // after a success
    };
    QelNic qk0("qk0");
    HostCtl::Lib::Backend& backend = GetBackend();
    const Case cases[] = {
        {"SetVnicConnectionPoint", [&] { qk0.SetConnectionPoint(ConnectionPoint(1, "VM Network")); }, false,
         [](const json& n) {
             EXPECT_EQ(n["vnics"][0]["portgroup"], "VM Network");
             EXPECT_EQ(n["vnics"][0]["ipv4"]["address"], "192.0.2.100");  // until the next renew
         }},
        {"SetVnicConnectionPoint", [&] { qk0.SetConnectionPoint(ConnectionPoint(2, "101")); }, false,
         [](const json& n) {
             const json& v = n["vnics"][0];
             EXPECT_EQ(v["connectionType"], 2);
             EXPECT_EQ(v["dvs"], "kDS-1");
             EXPECT_EQ(v["port"], "101");
             EXPECT_FALSE(v.contains("portgroup"));
             EXPECT_EQ(n["dvswitches"][0]["ports"][1]["connectee"], "qk0");
         }},
        {"SetVnicConnectionPoint",
         [&] { QelNic("qk1").SetConnectionPoint(ConnectionPoint(1, "VM Network")); }, false,
         [](const json& n) {
             EXPECT_EQ(n["dvswitches"][0]["ports"][0]["connectee"], "");  // the port it left is free
             EXPECT_FALSE(n["vnics"][1].contains("port"));
         }},
        {"SetVnicConnectionPoint", [&] { qk0.SetConnectionPoint(ConnectionPoint(2, "100")); }, true, nullptr},
        {"SetVnicConnectionPoint", [&] { qk0.SetConnectionPoint(ConnectionPoint(2, "999")); }, true, nullptr},
        {"SetVnicConnectionPoint", [&] { qk0.SetConnectionPoint(ConnectionPoint(1, "Lab")); }, true, nullptr},
        {"SetVnicConnectionPoint", [&] { qk0.SetConnectionPoint(ConnectionPoint(3, "opaque-1")); }, true,
         nullptr},
        {"SetVnicConnectionPoint", [&] { qk0.SetConnectionPoint(ConnectionPoint(0, "")); }, true, nullptr},
        {"SetVnicConnectionPoint",
         [&] { QelNic("qk9").SetConnectionPoint(ConnectionPoint(1, "VM Network")); }, true, nullptr},
        {"AddVirtualSwitch", [] { QelCtl::Network::VirtualSwitchInfoImpl().AddVirtualSwitch("kSwitch2"); },
         false,
         [](const json& n) {
             EXPECT_EQ(n["vswitches"][2],
                       json({{"name", "kSwitch2"},
                             {"uplinks", json::array()},
                             {"maxActiveUplinks", 2},
                             {"teaming", {{"active", json::array()}, {"standby", json::array()}}},
                             {"portgroups", json::array()}}));
         }},
        {"AddVirtualSwitch", [&] { backend.AddVirtualSwitch("kSwitch1"); }, true, nullptr},
        {"AddVirtualSwitch", [&] { backend.AddVirtualSwitch("kDS-1"); }, true, nullptr},
        {"AddVirtualSwitch", [&] { backend.AddVirtualSwitch(""); }, true, nullptr},
        {"AddPortGroup", [] { VirtualSwitch("kSwitch1").AddPortGroup("Lab", 20); }, false,
         [](const json& n) {
             EXPECT_EQ(n["vswitches"][1]["portgroups"][1], json({{"name", "Lab"}, {"vlan", 20}}));
         }},
        {"AddPortGroup", [] { VirtualSwitch("kSwitch1").AddPortGroup("Management Network", 0); }, true,
         nullptr},
        {"AddPortGroup", [] { VirtualSwitch("kSwitch9").AddPortGroup("Lab", 0); }, true, nullptr},
        {"AddPortGroup", [&] { backend.AddPortGroup("kSwitch1", "Lab", 4096); }, true, nullptr},
        {"AddPortGroup", [&] { backend.AddPortGroup("kSwitch1", "", 0); }, true, nullptr},
        {"AddDvsHostLocalPort", [&] { EXPECT_EQ(backend.AddDvsHostLocalPort("kDS-1", "100"), "102"); }, false,
         [](const json& n) {
             EXPECT_EQ(n["dvswitches"][0]["ports"][2],
                       json({{"key", "102"}, {"vlan", 20}, {"hostLocal", true}, {"connectee", ""}}));
         }},
        {"AddDvsHostLocalPort", [&] { backend.AddDvsHostLocalPort("kDS-1", "999"); }, true, nullptr},
        {"AddDvsHostLocalPort", [&] { backend.AddDvsHostLocalPort("kDS-9", "100"); }, true, nullptr},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string(c.operation) + (c.refused ? ", refused" : ""));
        HostCtl::Lib::SimState(Root()).Replace(HostWithDvs());
        const std::string before = ReadFile(StatePath());
        if (c.refused) {
            EXPECT_THROW(c.call(), HostCtlException);
            EXPECT_EQ(ReadFile(StatePath()), before);
            continue;
        }
        c.call();
        const json state = State();
        EXPECT_EQ(state["history"].back()["operation"], c.operation);
        c.check(state["network"]);
    }

    // The reads, and a new connection seen at the next renew.
    HostCtl::Lib::SimState(Root()).Replace(HostWithDvs());
    EXPECT_EQ(QelCtl::Network::NetworkInfoImpl().GetVirtualNicNames(),
              (std::vector<std::string>{"qk0", "qk1"}));
    EXPECT_EQ(backend.GetDvsPortVlanId("kDS-1", "100"), 20);
    EXPECT_EQ(backend.GetDvsPortVlanId("kDS-1", "101"), 0);
    EXPECT_THROW(backend.GetDvsPortVlanId("kDS-1", "999"), HostCtlException);
    EXPECT_THROW(backend.GetDvsPortVlanId("kDS-9", "100"), HostCtlException);
    QelNic("qk1").SetConnectionPoint(ConnectionPoint(1, "VM Network"));
    qk0.SetConnectionPoint(ConnectionPoint(2, "100"));
    EXPECT_EQ(qk0.GetConnectionPoint().GetName(), "100");
    EXPECT_EQ(qk0.GetIpConfig().GetIpv4Address().GetStringAddress(), "192.0.2.100");
    qk0.RenewDhcpLease();  // VLAN 20, where qk1 holds .100
    EXPECT_EQ(qk0.GetIpConfig().GetIpv4Address().GetStringAddress(), "198.51.100.101");
}

TEST_F(RestoreTest, FactoryRestore) {
    std::filesystem::create_directories(Root() + "/etc");
    WriteFile(Hosts(), "127.0.0.1\tlocalhost\n");
    HostCtl::Lib::SyncHostsFile(Root(), State());
    Edit([](json& s) {
        s["network"]["dvswitches"] = HostWithDvs()["network"]["dvswitches"];
        s["network"]["dvswitches"][0]["ports"][0]["connectee"] = "";
        s["network"]["saved"]["routing"]["ipv4Gateway"] = "192.0.2.1";
        s["network"]["saved"]["dns"]["servers"] = {"192.0.2.53"};
        s["network"]["pnics"][0]["linkUp"] = false;  // the first NIC with link is zonic1
    });
    QelCtl::Network::NetworkInfoImpl network;
    QelCtl::Network::DnsConfigImpl dns("defaultTcpipStack");

    // The dump sender holds qk0; nothing to configure on a configured host.
    const std::string before = ReadFile(StatePath());
    EXPECT_THROW(network.ClearNetworkConfig(), HostCtlException);
    EXPECT_THROW(network.AutoConfigNetwork(), HostCtlException);
    EXPECT_EQ(ReadFile(StatePath()), before);

    network.DisableNetDumper();
    network.ClearNetworkConfig();
    json n = Network();
    EXPECT_EQ(n["netDumper"]["enabled"], false);
    for (const char* list : {"vnics", "vswitches", "dvswitches"}) EXPECT_TRUE(n[list].empty()) << list;
    EXPECT_EQ(n["managementInterface"], "");
    for (const json& routing : {n["routing"], n["saved"]["routing"]})
        EXPECT_EQ(routing, json({{"ipv4Gateway", "0.0.0.0"}, {"ipv6Gateway", "::"}}));
    for (const json& d : {n["dns"], n["saved"]["dns"]}) {
        EXPECT_TRUE(d["servers"].empty());
        EXPECT_TRUE(d["ipv6Servers"].empty());
    }
    EXPECT_EQ(dns.GetHostname(), "host1");
    EXPECT_EQ(dns.GetDomain(), "example.test");
    EXPECT_EQ(ReadFile(Hosts()), "127.0.0.1\tlocalhost\n");
    network.ClearNetworkConfig();  // a clear network may be cleared again

    network.AutoConfigNetwork();
    n = Network();
    ASSERT_EQ(n["vswitches"].size(), 1u);
    const json& sw = n["vswitches"][0];
    EXPECT_EQ(sw["name"], "kSwitch0");
    EXPECT_EQ(sw["uplinks"], json({"zonic1"}));
    EXPECT_EQ(sw["teaming"]["active"], json({"zonic1"}));
    EXPECT_EQ(sw["portgroups"], json::array({{{"name", "Management Network"}, {"vlan", 0}}}));
    network.UpdateManagementInterface();
    ASSERT_NE(network.GetManagementInterface(), nullptr);
    QelNic qk0("qk0");
    EXPECT_EQ(qk0.GetMacAddress(), "00:50:56:01:00:03");
    const HostCtl::Network::IpConfig config = qk0.GetIpConfig();
    EXPECT_TRUE(config.GetUseDhcp());
    EXPECT_TRUE(config.GetDhcpDns());
    EXPECT_TRUE(config.GetUseIpv6RouterAdvertised());
    EXPECT_FALSE(config.GetUseIpv6Dhcp());
    EXPECT_EQ(config.GetIpv4Address().GetStringAddress(), "192.0.2.101");  // .100 is zonic0's lease
    ASSERT_EQ(config.GetIpv6Network().size(), 1u);
    EXPECT_EQ(config.GetIpv6Network()[0].ToString(), "fe80::250:56ff:fe01:3/64");
    EXPECT_EQ(
        QelCtl::Network::RoutingInfoImpl("defaultTcpipStack").GetQelKernelDefaultGateway().GetStringAddress(),
        "192.0.2.1");
    EXPECT_EQ(Texts(dns.GetNameServers()), std::vector<std::string>{"192.0.2.53"});
    EXPECT_EQ(ReadFile(Hosts()), "127.0.0.1\tlocalhost\n192.0.2.101\thost1.example.test host1\n");

    EXPECT_THROW(network.AutoConfigNetwork(), HostCtlException);
    std::vector<std::string> operations;
    const json history = State()["history"];
    for (const json& e : history) operations.push_back(e["operation"]);
    EXPECT_EQ(operations, (std::vector<std::string>{"DisableNetDumper", "ClearNetworkConfig",
                                                    "ClearNetworkConfig", "AutoConfigNetwork"}));

    // Without any NIC with link the first NIC is taken; nothing answers it.
    Edit([](json& s) {
        for (json& p : s["network"]["pnics"]) p["linkUp"] = false;
    });
    network.ClearNetworkConfig();
    network.AutoConfigNetwork();
    EXPECT_EQ(Network()["vswitches"][0]["uplinks"], json({"zonic0"}));
    EXPECT_TRUE(qk0.GetIpConfig().GetIpv4Address().IsZero());
}

TEST(Reachability, FromTheManagementInterface) {
    const HostCtl::Lib::SimState sim(".");
    const auto vlan20 = [&](json& s) {
        s["network"]["vswitches"][0]["portgroups"][0]["vlan"] = 20;
        HostCtl::Lib::BootNetwork(sim, s);
    };
    struct Case {
        const char* name;
        std::function<void(json&)> edit;
        const char* target;
        json answer;  // null: no answer
    };
    const json none;
    const json dnsServer = {{"dns", true}};
    const Case cases[] = {
        {"own address", nullptr, "192.0.2.100", json::object()},
        {"own link-local address", nullptr, "fe80::250:56ff:fe01:2", json::object()},
        {"the router on the segment", nullptr, "192.0.2.1", json::object()},
        {"a DNS server on the segment", nullptr, "192.0.2.53", dnsServer},
        {"no such machine on the segment", nullptr, "192.0.2.77", none},
        {"a machine of another VLAN", nullptr, "198.51.100.1", none},
        {"another subnet", [](json& s) { s["network"]["vnics"][0]["ipv4"]["address"] = "198.51.100.100"; },
         "192.0.2.1", none},
        {"no IPv4 address", [](json& s) { s["network"]["vnics"][0]["ipv4"]["address"] = "0.0.0.0"; },
         "192.0.2.1", none},
        {"the answer takes its time",
         [](json& s) { s["network"]["lan"]["0"]["hosts"]["192.0.2.1"]["delayMs"] = 40; },
         "192.0.2.1",
         {{"delayMs", 40}}},
        {"link-local router", vlan20, "fe80::1", json::object()},
        {"global DNS server with a global address", vlan20, "2001:db8:20::53", dnsServer},
        {"global DNS server with only a link-local address",
         [&](json& s) {
             s["network"]["vnics"][0]["ipv6"]["routerAdvertisement"] = false;
             vlan20(s);
         },
         "2001:db8:20::53", none},
        {"link-local router without IPv6 in the kernel",
         [&](json& s) {
             s["network"]["ipv6EnabledAtBoot"] = false;
             vlan20(s);
         },
         "fe80::1", none},
        {"remote, through the gateway", nullptr, "203.0.113.10", json::object()},
        {"remote DNS server", nullptr, "203.0.113.53", dnsServer},
        {"remote without a gateway", [](json& s) { s["network"]["routing"]["ipv4Gateway"] = "0.0.0.0"; },
         "203.0.113.10", none},
        {"remote through a gateway that is not there",
         [](json& s) { s["network"]["routing"]["ipv4Gateway"] = "192.0.2.254"; }, "203.0.113.10", none},
        {"remote IPv6 without an IPv6 gateway",
         [](json& s) { s["network"]["remote"]["2001:db8:99::1"] = json::object(); }, "2001:db8:99::1", none},
        {"remote IPv6 through the advertised router",
         [&](json& s) {
             s["network"]["remote"]["2001:db8:99::1"] = json::object();
             vlan20(s);
         },
         "2001:db8:99::1", json::object()},
        {"no link", [](json& s) { s["network"]["pnics"][0]["linkUp"] = false; }, "192.0.2.100", none},
        {"disabled interface", [](json& s) { s["network"]["vnics"][0]["enabled"] = false; }, "192.0.2.1",
         none},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        json state = HostCtl::Lib::DefaultHostState();
        if (c.edit) c.edit(state);
        EXPECT_EQ(HostCtl::Lib::ReachableHost(sim, state, "qk0", c.target), c.answer);
    }
    const json state = HostCtl::Lib::DefaultHostState();
    EXPECT_THROW(HostCtl::Lib::ReachableHost(sim, state, "qk9", "192.0.2.1"), HostCtlException);
    EXPECT_THROW(HostCtl::Lib::ReachableHost(sim, state, "qk0", "gateway"), HostCtlException);
    json broken = state;
    broken["network"]["remote"]["not-an-address"] = json::object();
    EXPECT_THROW(HostCtl::Lib::ReachableHost(sim, broken, "qk0", "203.0.113.10"), HostCtlException);
}

TEST_F(RestoreTest, ResolverAsksTheHostsFileThenReachableNameServers) {
    struct Case {
        const char* name;
        std::function<void(json&)> edit;
        const char* query;
        std::vector<std::string> addresses;
    };
    const auto servers = [](std::vector<std::string> v4, std::vector<std::string> v6 = {}) {
        return [=](json& s) {
            s["network"]["dns"]["servers"] = v4;
            s["network"]["dns"]["ipv6Servers"] = v6;
        };
    };
    const Case cases[] = {
        {"the hosts file comes first", nullptr, "host1.example.test", {"192.0.2.7"}},
        {"any name of a line, letter case aside", nullptr, "HOST1", {"192.0.2.7"}},
        {"a name only in the hosts file", nullptr, "printer", {"203.0.113.9", "2001:db8::9"}},
        {"part of a name is no name", nullptr, "print", {}},
        {"through DNS", nullptr, "www.example.test", {"203.0.113.10"}},
        {"a short name with the search domain", nullptr, "www", {"203.0.113.10"}},
        {"unknown name", nullptr, "nowhere.example.test", {}},
        {"an unreachable name server", servers({"198.51.100.53"}), "www.example.test", {}},
        {"a machine that is no name server", servers({"192.0.2.1"}), "www.example.test", {}},
        {"the next server answers",
         servers({"198.51.100.53", "192.0.2.53"}),
         "www.example.test",
         {"203.0.113.10"}},
        {"a remote name server", servers({"203.0.113.53"}), "www.example.test", {"203.0.113.10"}},
        {"no link to any server",
         [](json& s) { s["network"]["pnics"][0]["linkUp"] = false; },
         "www.example.test",
         {}},
        {"no management interface",
         [](json& s) { s["network"]["managementInterface"] = ""; },
         "www.example.test",
         {}},
        {"an IPv6 name server",
         [&](json& s) {
             s["network"]["vswitches"][0]["portgroups"][0]["vlan"] = 20;
             HostCtl::Lib::BootNetwork(HostCtl::Lib::SimState("."), s);
             servers({}, {"2001:db8:20::53"})(s);
             s["network"]["dnsZone"]["www.example.test"].push_back("2001:db8::80");
         },
         "www.example.test",
         {"203.0.113.10", "2001:db8::80"}},
    };
    std::filesystem::create_directories(Root() + "/etc");
    WriteFile(Hosts(),
              "127.0.0.1\tlocalhost\n192.0.2.7\thost1.example.test host1\n"
              "203.0.113.9\tprinter # by hand\n2001:db8::9 printer\n");
    QelCtl::Network::NameResolverImpl resolver;
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        HostCtl::Lib::SimState(Root()).Replace(HostCtl::Lib::DefaultHostState());
        if (c.edit) Edit(c.edit);
        EXPECT_EQ(Texts(resolver.Resolve(c.query)), c.addresses);
    }

    // Without the host's line the name is DNS's.
    HostCtl::Lib::SimState(Root()).Replace(HostCtl::Lib::DefaultHostState());
    QelCtl::Network::HostsFile::RemoveEntryByHostName("host1.example.test");
    EXPECT_EQ(Texts(resolver.Resolve("host1.example.test")), std::vector<std::string>{"192.0.2.100"});
    std::filesystem::remove(Hosts());
    EXPECT_EQ(Texts(resolver.Resolve("www.example.test")), std::vector<std::string>{"203.0.113.10"});
}

TEST_F(RestoreTest, RemoveEntryByHostName) {
    const std::string base =
        "127.0.0.1\tlocalhost.localdomain localhost\n"
        "192.0.2.100\thost1.example.test host1\n"
        "# host1 by hand\n"
        "203.0.113.9  printer  host1-old # by hand\n"
        "198.51.100.9\tlonely\n";
    struct Case {
        const char* name;
        const char* remove;
        std::string expected;
    };
    const Case cases[] = {
        {"the fully qualified name", "host1.example.test",
         "127.0.0.1\tlocalhost.localdomain localhost\n192.0.2.100\thost1\n# host1 by hand\n"
         "203.0.113.9  printer  host1-old # by hand\n198.51.100.9\tlonely\n"},
        {"the short name; comments and longer names stay", "host1",
         "127.0.0.1\tlocalhost.localdomain localhost\n192.0.2.100\thost1.example.test\n# host1 by hand\n"
         "203.0.113.9  printer  host1-old # by hand\n198.51.100.9\tlonely\n"},
        {"a line's comment stays with its other names", "Printer",
         "127.0.0.1\tlocalhost.localdomain localhost\n192.0.2.100\thost1.example.test host1\n# host1 by "
         "hand\n"
         "203.0.113.9\thost1-old # by hand\n198.51.100.9\tlonely\n"},
        {"a line left without names goes", "lonely",
         "127.0.0.1\tlocalhost.localdomain localhost\n192.0.2.100\thost1.example.test host1\n# host1 by "
         "hand\n"
         "203.0.113.9  printer  host1-old # by hand\n"},
        {"a name no line has", "host", base},
    };
    std::filesystem::create_directories(Root() + "/etc");
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        WriteFile(Hosts(), base);
        ASSERT_EQ(chmod(Hosts().c_str(), 0640), 0);
        QelCtl::Network::HostsFile::RemoveEntryByHostName(c.remove);
        EXPECT_EQ(ReadFile(Hosts()), c.expected);
        struct stat st;
        ASSERT_EQ(stat(Hosts().c_str(), &st), 0);
        EXPECT_EQ(st.st_mode & 07777, 0640u);
        EXPECT_EQ(std::distance(std::filesystem::directory_iterator(Root() + "/etc"),
                                std::filesystem::directory_iterator()),
                  1);
    }

    // A missing file is an error; something that is no file is left alone.
    std::filesystem::remove(Hosts());
    EXPECT_THROW(QelCtl::Network::HostsFile::RemoveEntryByHostName("host1"), HostCtlException);
    EXPECT_FALSE(std::filesystem::exists(Hosts()));
    std::filesystem::create_directories(Hosts() + "/kept");
    EXPECT_THROW(QelCtl::Network::HostsFile::RemoveEntryByHostName("host1"), HostCtlException);
    EXPECT_THROW(HostCtl::Lib::ReplaceFile(Hosts(), "192.0.2.1\tgateway\n", 0644), HostCtlException);
    EXPECT_TRUE(std::filesystem::is_directory(Hosts() + "/kept"));
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(Root() + "/etc"),
                            std::filesystem::directory_iterator()),
              1);
}

}  // namespace
