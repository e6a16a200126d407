// The operations behind the management network's restore and test on a
// simulated host: connecting interfaces, new switches, port groups and
// distributed ports, the factory restore, what answers in the simulated
// network, the host resolver and the hosts file edit.
#include <cstring>

#include "TestSupport.hpp"

namespace {

using namespace HostCtlTest;

class RestoreTest : public SimHostTest {
protected:
    json Network() const { return State()["network"]; }
    std::string Hosts() const { return Root() + "/etc/hosts"; }
};

TEST_F(RestoreTest, SwitchAndPortOperations) {
    struct Case {
        const char* operation;  // as recorded in the history
        std::function<void()> call;
        std::function<void(const json& network)> check;
    };
    QelNic qk0("qk0");
    HostCtl::Lib::Backend& backend = GetBackend();
    const Case cases[] = {
        {"SetVnicConnectionPoint", [&] { qk0.SetConnectionPoint(ConnectionPoint(1, "VM Network")); },
         [](const json& n) { EXPECT_EQ(n["vnics"][0]["portgroup"], "VM Network"); }},
        {"SetVnicConnectionPoint", [&] { qk0.SetConnectionPoint(ConnectionPoint(2, "101")); },
         [](const json& n) {
             const json& v = n["vnics"][0];
             EXPECT_EQ(v["connectionType"], 2);
             EXPECT_EQ(v["dvs"], "kDS-1");
             EXPECT_EQ(v["port"], "101");
             EXPECT_FALSE(v.contains("portgroup"));
             EXPECT_EQ(n["dvswitches"][0]["ports"][1]["connectee"], "qk0");
         }},
        {"SetVnicConnectionPoint",
         [&] { QelNic("qk1").SetConnectionPoint(ConnectionPoint(1, "VM Network")); },
         [](const json& n) {
             EXPECT_EQ(n["dvswitches"][0]["ports"][0]["connectee"], "");  // the port it left is free
             EXPECT_FALSE(n["vnics"][1].contains("port"));
         }},
        {"AddVirtualSwitch", [] { QelCtl::Network::VirtualSwitchInfoImpl().AddVirtualSwitch("kSwitch2"); },
         [](const json& n) {
             EXPECT_EQ(n["vswitches"][2],
                       json({{"name", "kSwitch2"},
                             {"uplinks", json::array()},
                             {"maxActiveUplinks", 2},
                             {"teaming", {{"active", json::array()}, {"standby", json::array()}}},
                             {"portgroups", json::array()}}));
         }},
        {"AddPortGroup", [] { VirtualSwitch("kSwitch1").AddPortGroup("Lab", 20); },
         [](const json& n) {
             EXPECT_EQ(n["vswitches"][1]["portgroups"][1], json({{"name", "Lab"}, {"vlan", 20}}));
         }},
        {"AddDvsHostLocalPort",
         [] {
             EXPECT_EQ(DistributedSwitch("kDS-1").AddHostLocalPort({30, true, {"uplink1"}}), "102");
         },
         [](const json& n) {
             EXPECT_EQ(n["dvswitches"][0]["ports"][2], json({{"key", "102"},
                                                             {"vlan", 30},
                                                             {"blocked", true},
                                                             {"uplinks", {"uplink1"}},
                                                             {"hostLocal", true},
                                                             {"connectee", ""}}));
         }},
        {"RemoveDvsHostLocalPort", [] { DistributedSwitch("kDS-1").RemoveHostLocalPort("101"); },
         [](const json& n) { EXPECT_EQ(n["dvswitches"][0]["ports"].size(), 1u); }},
        {"AddDvsUplink", [] { DistributedSwitch("kDS-1").AddUplink("uplink2", "zonic3"); },
         [](const json& n) { EXPECT_EQ(n["dvswitches"][0]["uplinkPorts"][1]["pnic"], "zonic3"); }},
        {"RemoveVirtualSwitch",
         [] { QelCtl::Network::VirtualSwitchInfoImpl().RemoveVirtualSwitch("kSwitch1"); },
         [](const json& n) {
             ASSERT_EQ(n["vswitches"].size(), 1u);
             EXPECT_EQ(n["vswitches"][0]["name"], "kSwitch0");
         }},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.operation);
        Reset(HostWithDvs());
        c.call();
        const json state = State();
        EXPECT_EQ(state["history"].back()["operation"], c.operation);
        c.check(state["network"]);
    }
    const std::pair<const char*, std::function<void()>> refused[] = {
        {"a taken port", [&] { qk0.SetConnectionPoint(ConnectionPoint(2, "100")); }},
        {"an unknown port", [&] { qk0.SetConnectionPoint(ConnectionPoint(2, "999")); }},
        {"an unknown port group", [&] { qk0.SetConnectionPoint(ConnectionPoint(1, "Lab")); }},
        {"an opaque network", [&] { qk0.SetConnectionPoint(ConnectionPoint(3, "opaque-1")); }},
        {"no connection", [&] { qk0.SetConnectionPoint(ConnectionPoint(0, "")); }},
        {"a switch that exists", [&] { backend.AddVirtualSwitch("kSwitch1"); }},
        {"the name of a distributed switch", [&] { backend.AddVirtualSwitch("kDS-1"); }},
        {"a switch without name", [&] { backend.AddVirtualSwitch(""); }},
        {"a port group that exists", [] { VirtualSwitch("kSwitch1").AddPortGroup("Management Network", 0); }},
        {"a port group on VLAN 4096", [&] { backend.AddPortGroup("kSwitch1", "Lab", 4096); }},
        {"a port group without name", [&] { backend.AddPortGroup("kSwitch1", "", 0); }},
        {"a host-local port on an unknown uplink",
         [] {
             DistributedSwitch("kDS-1").AddHostLocalPort({0, false, {"uplink9"}});
         }},
        {"removing a port that is not host-local",
         [] { DistributedSwitch("kDS-1").RemoveHostLocalPort("100"); }},
        {"an uplink port that a NIC backs",
         [] { DistributedSwitch("kDS-1").AddUplink("uplink1", "zonic3"); }},
        {"an uplink of another switch", [] { DistributedSwitch("kDS-1").AddUplink("uplink2", "zonic0"); }},
        {"removing a switch in use",
         [] { QelCtl::Network::VirtualSwitchInfoImpl().RemoveVirtualSwitch("kSwitch0"); }},
    };
    for (const auto& [name, call] : refused) {
        SCOPED_TRACE(name);
        Reset(HostWithDvs());
        ExpectRefused(call);
    }
    Reset(HostWithDvs());
    qk0.SetConnectionPoint(ConnectionPoint(2, "101"));
    ExpectRefused([] { DistributedSwitch("kDS-1").RemoveHostLocalPort("101"); });

    // The reads, and a new connection seen at the next renew.
    Reset(HostWithDvs());
    EXPECT_EQ(QelCtl::Network::NetworkInfoImpl().GetVirtualNicNames(),
              (std::vector<std::string>{"qk0", "qk1"}));
    EXPECT_EQ(backend.GetDvsPortSettings("kDS-1", "100").vlanId, 20);
    EXPECT_EQ(backend.GetDvsPortSettings("kDS-1", "101").vlanId, 0);
    EXPECT_THROW(backend.GetDvsPortSettings("kDS-1", "999"), HostCtlException);
    QelNic("qk1").SetConnectionPoint(ConnectionPoint(1, "VM Network"));
    qk0.SetConnectionPoint(ConnectionPoint(2, "100"));
    EXPECT_EQ(qk0.GetConnectionPoint().GetName(), "100");
    EXPECT_EQ(Address(), "192.0.2.100");
    qk0.RenewDhcpLease();  // VLAN 20, where qk1 holds .100
    EXPECT_EQ(Address(), "198.51.100.101");

    // A blocked port, or one whose only uplink has no link, reaches nothing.
    DistributedSwitch dvs("kDS-1");
    const std::string blocked = dvs.AddHostLocalPort({0, true, {}});
    const auto settings = dvs.GetPortSettings(blocked);
    EXPECT_TRUE(settings.blocked);
    EXPECT_TRUE(settings.uplinks.empty());
    qk0.SetConnectionPoint(ConnectionPoint(2, blocked));
    qk0.Restart();
    EXPECT_EQ(Address(), "0.0.0.0");
    Edit([](json& s) { s["network"]["pnics"][1]["linkUp"] = false; });
    const std::string limited = dvs.AddHostLocalPort({0, false, {"uplink1"}});
    EXPECT_EQ(dvs.GetPortSettings(limited).uplinks, std::vector<std::string>{"uplink1"});
    qk0.SetConnectionPoint(ConnectionPoint(2, limited));
    qk0.Restart();
    EXPECT_EQ(Address(), "0.0.0.0");
    Edit([](json& s) { s["network"]["pnics"][1]["linkUp"] = true; });
    qk0.Restart();
    EXPECT_EQ(Address(), "192.0.2.100");
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
    QelCtl::Network::DnsConfigImpl dns(STACK);

    // The dump sender holds qk0; nothing to configure on a configured host.
    ExpectRefused([&] { network.ClearNetworkConfig(); });
    ExpectRefused([&] { network.AutoConfigNetwork(); });

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
    const IpConfig config = qk0.GetIpConfig();
    EXPECT_TRUE(config.GetUseDhcp());
    EXPECT_TRUE(config.GetDhcpDns());
    EXPECT_TRUE(config.GetUseIpv6RouterAdvertised());
    EXPECT_FALSE(config.GetUseIpv6Dhcp());
    EXPECT_EQ(Address(), "192.0.2.101");  // .100 is zonic0's lease
    EXPECT_EQ(Ipv6(), std::vector<std::string>{"fe80::250:56ff:fe01:3/64 autoconf"});
    EXPECT_EQ(Gateway(), "192.0.2.1");
    EXPECT_EQ(Texts(dns.GetNameServers()), std::vector<std::string>{"192.0.2.53"});
    EXPECT_EQ(ReadFile(Hosts()), "127.0.0.1\tlocalhost\n192.0.2.101\thost1.example.test host1\n");

    ExpectRefused([&] { network.AutoConfigNetwork(); });

    // Without any NIC with link the first NIC is taken; nothing answers it.
    Edit([](json& s) {
        for (json& p : s["network"]["pnics"]) p["linkUp"] = false;
    });
    network.ClearNetworkConfig();
    network.AutoConfigNetwork();
    EXPECT_EQ(Network()["vswitches"][0]["uplinks"], json({"zonic0"}));
    EXPECT_EQ(Address(), "0.0.0.0");
}

TEST(Reachability, FromTheManagementInterface) {
    const HostCtl::Lib::SimState sim(".");
    // On VLAN 20 (with an IPv6 router) after `edit`, booted.
    const auto on20 = [&](std::function<void(json&)> edit = nullptr) {
        return [=, &sim](json& s) {
            if (edit) edit(s);
            Vlan20(s);
            HostCtl::Lib::BootNetwork(sim, s);
        };
    };
    struct Case {
        const char* name;
        std::function<void(json&)> edit;
        const char* target;
        json answer;  // null: no answer
    };
    const json none, yes = json::object(), dnsServer = {{"dns", true}};
    const auto remote6 = Set("/network/remote/2001:db8:99::1", json::object());
    const Case cases[] = {
        {"own address", nullptr, "192.0.2.100", yes},
        {"own link-local address", nullptr, "fe80::250:56ff:fe01:2", yes},
        {"the router on the segment", nullptr, "192.0.2.1", yes},
        {"a DNS server on the segment", nullptr, "192.0.2.53", dnsServer},
        {"no such machine on the segment", nullptr, "192.0.2.77", none},
        {"a machine of another VLAN", nullptr, "198.51.100.1", none},
        {"another subnet", Set("/network/vnics/0/ipv4/address", "198.51.100.100"), "192.0.2.1", none},
        {"no IPv4 address", Set("/network/vnics/0/ipv4/address", "0.0.0.0"), "192.0.2.1", none},
        {"the answer takes its time",
         Set("/network/lan/0/hosts/192.0.2.1/delayMs", 40),
         "192.0.2.1",
         {{"delayMs", 40}}},
        {"link-local router", on20(), "fe80::1", yes},
        {"global DNS server with a global address", on20(), "2001:db8:20::53", dnsServer},
        {"global DNS server with only a link-local address",
         on20(Set("/network/vnics/0/ipv6/routerAdvertisement", false)), "2001:db8:20::53", none},
        {"link-local router without IPv6 in the kernel", on20(Set("/network/ipv6EnabledAtBoot", false)),
         "fe80::1", none},
        {"remote, through the gateway", nullptr, "203.0.113.10", yes},
        {"remote without a gateway", Set("/network/routing/ipv4Gateway", "0.0.0.0"), "203.0.113.10", none},
        {"remote through a gateway that is not there", Set("/network/routing/ipv4Gateway", "192.0.2.254"),
         "203.0.113.10", none},
        {"remote IPv6 without an IPv6 gateway", remote6, "2001:db8:99::1", none},
        {"remote IPv6 through the advertised router", on20(remote6), "2001:db8:99::1", yes},
        {"no link", Set("/network/pnics/0/linkUp", false), "192.0.2.100", none},
        {"disabled interface", Set("/network/vnics/0/enabled", false), "192.0.2.1", none},
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
        Reset();
        if (c.edit) Edit(c.edit);
        EXPECT_EQ(Texts(resolver.Resolve(c.query)), c.addresses);
    }

    // Without a hosts file every name is DNS's.
    Reset();
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
        const char* line;  // the line of `base` that changes
        const char* now;   // what it becomes
    };
    const Case cases[] = {
        {"the fully qualified name", "host1.example.test", "host1.example.test host1\n", "host1\n"},
        {"the short name; comments and longer names stay", "host1", "host1.example.test host1\n",
         "host1.example.test\n"},
        {"a line's comment stays with its other names", "Printer", "203.0.113.9  printer  host1-old",
         "203.0.113.9\thost1-old"},
        {"a line left without names goes", "lonely", "198.51.100.9\tlonely\n", ""},
    };
    std::filesystem::create_directories(Root() + "/etc");
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        WriteFile(Hosts(), base);
        QelCtl::Network::HostsFile::RemoveEntryByHostName(c.remove);
        std::string expected = base;
        expected.replace(expected.find(c.line), strlen(c.line), c.now);
        EXPECT_EQ(ReadFile(Hosts()), expected);
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
