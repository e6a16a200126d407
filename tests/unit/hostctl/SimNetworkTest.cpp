// The simulated host's network, through the operations the console calls:
// leases, autoconfiguration, MAC changes, booting, the hosts file and the
// switches.
#include <sys/stat.h>

#include "TestSupport.hpp"

namespace {

using namespace HostCtlTest;

// A distributed switch with the management interface on port "100".
void PutManagementOnDvs(json& s) {
    json& network = s["network"];
    network["vswitches"][0]["uplinks"] = json::array();
    network["vswitches"][0]["teaming"]["active"] = json::array();
    network["dvswitches"] =
        json::array({{{"name", "kDS-1"},
                      {"uplinkPorts",
                       {{{"key", "uplink1"}, {"pnic", "zonic0"}}, {{"key", "uplink2"}, {"pnic", "zonic1"}}}},
                      {"ports",
                       {{{"key", "100"}, {"vlan", 20}, {"hostLocal", false}, {"connectee", "qk0"}},
                        {{"key", "101"}, {"vlan", 0}, {"hostLocal", true}, {"connectee", ""}}}}}});
    json& qk0 = network["vnics"][0];
    qk0.erase("portgroup");
    qk0["connectionType"] = 2;
    qk0["dvs"] = "kDS-1";
    qk0["port"] = "100";
}

class SimNetworkTest : public SimHostTest {
protected:
    json Lan(const std::string& vlan) const { return State()["network"]["lan"][vlan]; }
};

TEST_F(SimNetworkTest, DefaultHostIsWhatItsNetworkGivesIt) {
    const json state = HostCtl::Lib::DefaultHostState();
    json booted = state;
    HostCtl::Lib::BootNetwork(HostCtl::Lib::SimState(Root()), booted);
    EXPECT_EQ(booted, state) << "a boot of the default host changes it";

    std::vector<HostCtl::Network::Pnic> pnics = QelCtl::Network::NetworkInfoImpl().GetPnics();
    ASSERT_EQ(pnics.size(), 4u);
    EXPECT_EQ(pnics[0].mac, Mgmt().GetMacAddress());
    EXPECT_EQ(pnics[0].label, "NIC 1");
    EXPECT_FALSE(pnics[3].linkUp);
}

TEST_F(SimNetworkTest, DhcpLeases) {
    struct Case {
        const char* name;
        std::function<void(json&)> network;  // the host's network before the renew
        const char* address;                 // null: none
        const char* netmask;
    };
    const auto pool = [](json& s) -> json& { return s["network"]["lan"]["0"]["dhcp"]; };
    // zonic0 without link, zonic1 attached to the management switch.
    const auto secondUplink = [](json& s) {
        s["network"]["pnics"][0]["linkUp"] = false;
        s["network"]["vswitches"][0]["uplinks"].push_back("zonic1");
    };
    const Case cases[] = {
        {"lease kept", [&](json& s) { pool(s)["leases"]["00:50:56:01:00:02"] = "192.0.2.150"; },
         "192.0.2.150", "255.255.255.0"},
        {"a lease recorded in capitals is the same MAC's",
         [&](json& s) {
             s["network"]["pnics"][0]["mac"] = s["network"]["vnics"][0]["mac"] = "00:50:56:0a:00:02";
             pool(s)["leases"] = {{"00:50:56:0A:00:02", "192.0.2.170"}};
         },
         "192.0.2.170", "255.255.255.0"},
        {"pool moved: a new lease",
         [&](json& s) {
             pool(s)["first"] = "192.0.2.120";
             pool(s)["last"] = "192.0.2.130";
             pool(s)["netmask"] = "255.255.255.128";
         },
         "192.0.2.120", "255.255.255.128"},
        {"full pool",
         [&](json& s) {
             pool(s)["last"] = "192.0.2.101";
             pool(s)["leases"] = {{"00:50:56:99:00:01", "192.0.2.100"}, {"00:50:56:99:00:02", "192.0.2.101"}};
         },
         nullptr, nullptr},
        {"no server on the VLAN", [](json& s) { SetMgmtVlan(s, 30); }, nullptr, nullptr},
        {"link through a standby uplink",
         [=](json& s) {
             secondUplink(s);
             s["network"]["vswitches"][0]["teaming"]["standby"] = {"zonic1"};
         },
         "192.0.2.100", "255.255.255.0"},
        {"attached but not in the team", secondUplink, nullptr, nullptr},
        {"disabled interface", Set("/network/vnics/0/enabled", false), nullptr, nullptr},
        {"on a distributed port", PutManagementOnDvs, "198.51.100.100", "255.255.255.0"},
        {"distributed uplinks without link",
         [](json& s) {
             PutManagementOnDvs(s);
             s["network"]["dvswitches"][0]["uplinkPorts"][0]["pnic"] = "";
             s["network"]["pnics"][1]["linkUp"] = false;
         },
         nullptr, nullptr},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        Reset();
        if (c.network) Edit(c.network);
        Mgmt().RenewDhcpLease();
        const IpConfig config = Mgmt().GetIpConfig();
        EXPECT_TRUE(config.GetUseDhcp());
        EXPECT_EQ(config.GetIpv4Address().GetStringAddress(), c.address ? c.address : "0.0.0.0");
        EXPECT_EQ(config.GetIpv4Netmask().GetStringAddress(), c.netmask ? c.netmask : "0.0.0.0");
        // The gateway comes with a lease on VLAN 20 only; the default's stays otherwise.
        const bool vlan20 = c.address && std::string(c.address).rfind("198.", 0) == 0;
        EXPECT_EQ(Gateway(), vlan20 ? "198.51.100.1" : "192.0.2.1");
        if (!c.address) continue;
        // The server records the lease by the client's MAC, and only there.
        const json leases = Lan(vlan20 ? "20" : "0")["dhcp"]["leases"];
        size_t held = 0;
        for (const auto& [key, address] : leases.items()) held += address == c.address;
        EXPECT_EQ(held, 1u) << leases;
        EXPECT_EQ(leases.value(Mgmt().GetMacAddress(), ""), c.address) << leases;
    }
}

TEST_F(SimNetworkTest, DnsFromDhcpOnlyWhenAsked) {
    Edit(Vlan20);
    IpConfig config = Mgmt().GetIpConfig();
    config.SetDhcpDns(false);
    Mgmt().SetIpConfig(config);
    QelCtl::Network::DnsConfigImpl dns(STACK);
    EXPECT_EQ(Address(), "198.51.100.100");
    EXPECT_EQ(Texts(dns.GetNameServers()), std::vector<std::string>{"192.0.2.53"});

    Edit([](json& s) { s["network"]["lan"]["20"]["dhcp"]["domain"] = "vlan20.example.test"; });
    config.SetDhcpDns(true);
    Mgmt().SetIpConfig(config);
    EXPECT_EQ(Texts(dns.GetNameServers()), std::vector<std::string>{"198.51.100.53"});
    EXPECT_EQ(dns.GetDomain(), "vlan20.example.test");
    EXPECT_EQ(dns.GetSearchDomains(), std::vector<std::string>{"vlan20.example.test"});
}

TEST_F(SimNetworkTest, NetworkChangesShowOnlyAtTheNextRenew) {
    // A new VLAN, team or link is seen when the interface asks again, as on
    // a host, where the change needs a restart or renew of the interface.
    VirtualSwitch("kSwitch0").SetPortGroupVlanId("Management Network", 20);
    EXPECT_EQ(Address(), "192.0.2.100");
    Mgmt().RenewDhcpLease();
    EXPECT_EQ(Address(), "198.51.100.100");
    Edit([](json& s) { s["network"]["pnics"][0]["linkUp"] = false; });
    EXPECT_EQ(Address(), "198.51.100.100");
    Mgmt().Restart();
    EXPECT_EQ(Address(), "0.0.0.0");
    EXPECT_TRUE(Mgmt().GetIpConfig().GetUseDhcp());
}

TEST_F(SimNetworkTest, Ipv6Addresses) {
    const std::string ll = "fe80::250:56ff:fe01:2/64 autoconf";
    const std::string slaac = "2001:db8:20:0:250:56ff:fe01:2/64 autoconf";
    const std::string dhcp = "2001:db8:20::1000/128 dhcp";
    const std::string fixed = "2001:db8::10/64 static";
    const std::vector<Ipv6Network> staticOnly{Ipv6Network(Ipv6Address("2001:db8::10"), 64)};
    std::vector<Ipv6Network> mixed = staticOnly;
    mixed.emplace_back(Ipv6Address("2001:db8::99"), 128, Ipv6AddressType::Dhcp);
    mixed.emplace_back(Ipv6Address("fe80::99"), 64, Ipv6AddressType::Autoconf);
    const auto on20 = [](std::function<void(json&)> more) {
        return [=](json& s) {
            Vlan20(s);
            more(s);
        };
    };
    const auto taken = on20([](json& s) {
        s["network"]["lan"]["20"]["dhcpv6"]["leases"] = {{"00:50:56:99:00:01", "2001:db8:20::1000"}};
    });
    const auto prefix48 =
        on20([](json& s) { s["network"]["lan"]["20"]["routerAdvertisement"]["prefixLength"] = 48; });
    const auto gateway = on20([](json& s) { s["network"]["routing"]["ipv6Gateway"] = "2001:db8:20::1"; });
    const auto noLink = on20([](json& s) { s["network"]["pnics"][0]["linkUp"] = false; });
    const auto noIpv6 = on20([](json& s) { s["network"]["ipv6Enabled"] = false; });
    struct Case {
        const char* name;
        std::function<void(json&)> network;
        bool dhcpv6;
        bool routerAdvertisement;
        std::vector<Ipv6Network> given;
        std::vector<std::string> addresses;
        const char* gateway;
    };
    const Case cases[] = {
        {"no router on the VLAN", nullptr, false, true, {}, {ll}, "::"},
        {"router advertisement", Vlan20, false, true, {}, {ll, slaac}, "fe80::1"},
        {"advertisement and DHCPv6", Vlan20, true, true, {}, {ll, slaac, dhcp}, "fe80::1"},
        {"DHCPv6 skips taken addresses", taken, true, false, {}, {ll, "2001:db8:20::1001/128 dhcp"}, "::"},
        {"static only, advertisements ignored", Vlan20, false, false, staticOnly, {ll, fixed}, "::"},
        {"dynamic entries of a configuration ignored", Vlan20, false, false, mixed, {ll, fixed}, "::"},
        {"a /48 prefix gives no address, but the router", prefix48, false, true, {}, {ll}, "fe80::1"},
        {"a configured gateway stays", gateway, false, true, {}, {ll, slaac}, "2001:db8:20::1"},
        {"no link: link-local and static only", noLink, true, true, staticOnly, {ll, fixed}, "::"},
        {"no IPv6 in the kernel", noIpv6, true, true, staticOnly, {}, "::"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        Reset();
        if (c.network) Edit(c.network);
        IpConfig config = Mgmt().GetIpConfig();
        config.SetUseIpv6Dhcp(c.dhcpv6);
        config.SetUseIpv6RouterAdvertised(c.routerAdvertisement);
        config.SetIpv6Network(c.given);
        Mgmt().SetIpConfig(config);
        EXPECT_EQ(Ipv6(), c.addresses);
        EXPECT_EQ(Ipv6Gateway(), c.gateway);
    }
}

TEST_F(SimNetworkTest, DhcpV6DnsAndRenew) {
    Edit(Vlan20);
    IpConfig config = Mgmt().GetIpConfig();
    config.SetUseIpv6Dhcp(true);
    Mgmt().SetIpConfig(config);
    QelCtl::Network::DnsConfigImpl dns(STACK);
    EXPECT_EQ(Texts(dns.GetIpv6NameServers()), std::vector<std::string>{"2001:db8:20::53"});

    // The server's pool moves; a renew asks both servers again and keeps
    // the other addresses.
    Edit([](json& s) {
        s["network"]["lan"]["20"]["dhcpv6"]["first"] = "2001:db8:20::2000";
        s["network"]["lan"]["20"]["dhcpv6"]["last"] = "2001:db8:20::20ff";
    });
    Mgmt().RenewDhcpLease();
    EXPECT_EQ(Ipv6(), (std::vector<std::string>{"fe80::250:56ff:fe01:2/64 autoconf",
                                                "2001:db8:20:0:250:56ff:fe01:2/64 autoconf",
                                                "2001:db8:20::2000/128 dhcp"}));
    EXPECT_EQ(Lan("20")["dhcpv6"]["leases"], json({{"00:50:56:01:00:02", "2001:db8:20::2000"}}));

    // Nothing to renew without DHCP.
    config.SetUseDhcp(false, false, Ipv4Address("192.0.2.10"), Ipv4Address("255.255.255.0"));
    config.SetUseIpv6Dhcp(false);
    Mgmt().SetIpConfig(config);
    ExpectRefused([] { Mgmt().RenewDhcpLease(); });
}

TEST_F(SimNetworkTest, DisableGivesUpDynamicAddressesOnly) {
    Edit(Vlan20);
    IpConfig config = Mgmt().GetIpConfig();
    config.SetUseIpv6Dhcp(true);
    config.SetIpv6Network({Ipv6Network(Ipv6Address("2001:db8::10"), 64)});
    Mgmt().SetIpConfig(config);
    ASSERT_EQ(Ipv6().size(), 4u);

    Mgmt().Disable();
    EXPECT_EQ(Address(), "0.0.0.0");
    EXPECT_EQ(Ipv6(), std::vector<std::string>{"2001:db8::10/64 static"});
    EXPECT_FALSE(State()["network"]["vnics"][0]["enabled"]);
    Mgmt().Enable();
    EXPECT_EQ(Address(), "198.51.100.100");
    EXPECT_EQ(Ipv6().size(), 4u);

    // A static IPv4 address stays configured while the interface is down.
    config = Mgmt().GetIpConfig();
    config.SetUseDhcp(false, false, Ipv4Address("198.51.100.7"), Ipv4Address("255.255.255.0"));
    Mgmt().SetIpConfig(config);
    Mgmt().Disable();
    EXPECT_EQ(Address(), "198.51.100.7");
    EXPECT_FALSE(Mgmt().GetIpConfig().GetUseDhcp());
}

TEST_F(SimNetworkTest, MacChangeMovesDerivedAddresses) {
    Edit(Vlan20);
    Mgmt().RenewDhcpLease();
    ASSERT_EQ(Address(), "198.51.100.100");

    Mgmt().SetMacAddress("00:50:56:0A:0B:0C");
    EXPECT_EQ(Mgmt().GetMacAddress(), "00:50:56:0a:0b:0c");
    // The old MAC's lease still holds its address at the server.
    EXPECT_EQ(Address(), "198.51.100.101");
    EXPECT_EQ(Ipv6(), (std::vector<std::string>{"fe80::250:56ff:fe0a:b0c/64 autoconf",
                                                "2001:db8:20:0:250:56ff:fe0a:b0c/64 autoconf"}));
    Mgmt().SetMacAddress("00:50:56:01:00:02");
    EXPECT_EQ(Address(), "198.51.100.100");

    for (const char* bad : {"00:50:56:01:00", "00:50:56:01:00:02:03", "00-50-56-01-00-02",
                            "00:50:56:01:00:g2", "01:00:5e:00:00:01", "00:00:00:00:00:00", ""}) {
        SCOPED_TRACE(bad);
        ExpectRefused([&] { Mgmt().SetMacAddress(bad); });
    }
}

TEST_F(SimNetworkTest, BadIpConfigurationsChangeNothing) {
    IpConfig noMask;  // static, 0.0.0.0/0.0.0.0
    IpConfig badMask;
    badMask.SetIpv4Address(Ipv4Address("192.0.2.10"));
    badMask.SetIpv4Netmask(Ipv4Address("255.0.255.0"));
    IpConfig linkLocal;
    linkLocal.SetUseDhcp(true);
    linkLocal.SetIpv6Network({Ipv6Network(Ipv6Address("fe80::10"), 64)});
    IpConfig multicast = linkLocal;
    multicast.SetIpv6Network({Ipv6Network(Ipv6Address("ff02::1"), 64)});
    for (const IpConfig& bad : {noMask, badMask, linkLocal, multicast})
        ExpectRefused([&] { Mgmt().SetIpConfig(bad); });
    ExpectRefused([&] { QelNic("qk7").SetIpConfig(linkLocal); });
    ExpectRefused([] { QelNic("qk7").Enable(); });
}

TEST_F(SimNetworkTest, Ipv6EnablementTakesEffectAtBoot) {
    QelCtl::Network::NetworkInfoImpl info;
    info.SetQelIpv6Enabled(false);
    EXPECT_TRUE(info.IsQelIpv6Enabled());
    EXPECT_EQ(Ipv6().size(), 1u);
    HostCtl::Lib::BootSimulatedHost(Root());
    EXPECT_FALSE(info.IsQelIpv6Enabled());
    EXPECT_TRUE(Ipv6().empty());
    EXPECT_EQ(State()["power"]["state"], "on");

    info.SetQelIpv6Enabled(true);
    EXPECT_FALSE(info.IsQelIpv6Enabled());
    HostCtl::Lib::BootSimulatedHost(Root());
    EXPECT_TRUE(info.IsQelIpv6Enabled());
    EXPECT_EQ(Ipv6(), std::vector<std::string>{"fe80::250:56ff:fe01:2/64 autoconf"});
}

TEST_F(SimNetworkTest, WhatSurvivesABoot) {
    // The management interface is static here, so that no DHCP answer
    // overwrites the gateway or the name servers at boot.
    IpConfig config = Mgmt().GetIpConfig();
    config.SetUseDhcp(false, false, Ipv4Address("192.0.2.10"), Ipv4Address("255.255.255.0"));
    config.SetDhcpDns(false);
    Mgmt().SetIpConfig(config);
    QelCtl::Network::DnsConfigImpl dns(STACK);
    dns.SaveConfig();
    QelCtl::Network::RoutingInfoImpl routing(STACK);
    struct Change {
        const char* name;
        std::function<void(bool persist)> call;
        bool persists;  // takes a flag to persist the change
    };
    const Change changes[] = {
        {"host name", [&](bool persist) { dns.SetHostname("esx7", persist); }, true},
        {"name servers", [&](bool) { dns.AddNameServer(IpAddress("2001:db8::53")); }, false},
        {"gateway",
         [&](bool persist) { routing.SetQelKernelDefaultGateway(Ipv4Address("192.0.2.254"), persist); },
         true},
        {"IPv6 gateway", [&](bool) { routing.SetIpv6QelKernelDefaultGateway(Ipv6Address("2001:db8::1")); },
         false},
    };
    // A change survives a boot when persisted or saved with the DNS
    // configuration; the saved DNS configuration takes the gateways along.
    const json base = State();
    for (const Change& c : changes) {
        for (const char* how : {"running only", "persisted", "saved"}) {
            const std::string mode = how;
            if (mode == "persisted" && !c.persists) continue;
            SCOPED_TRACE(std::string(c.name) + ", " + how);
            Reset(base);
            const json before = State()["network"];
            c.call(mode == "persisted");
            if (mode == "saved") dns.SaveConfig();
            const json changed = State()["network"];
            ASSERT_NE(changed["dns"].dump() + changed["routing"].dump(),
                      before["dns"].dump() + before["routing"].dump());
            HostCtl::Lib::BootSimulatedHost(Root());
            const json after = State()["network"];
            const json& expected = mode == "running only" ? before : changed;
            EXPECT_EQ(after["dns"], expected["dns"]);
            EXPECT_EQ(after["routing"], expected["routing"]);
        }
    }
}

TEST_F(SimNetworkTest, DnsSettingsAreCheckedByTheHostToo) {
    HostCtl::Lib::Backend& backend = GetBackend();
    ExpectRefused([&] { backend.SetHostname(STACK, "esx1.lab", false); });
    ExpectRefused([&] { backend.SetFqdn(STACK, "esx1", "lab..test", false); });
    ExpectRefused([&] { backend.SetSearchDomains(STACK, {"lab.test", "bad_domain"}); });
    ExpectRefused([&] { backend.SetHostname("otherStack", "esx1", false); });
    ExpectRefused([&] { backend.SaveConfig("otherStack"); });
}

class HostsFileTest : public SimNetworkTest {
protected:
    void SetUp() override {
        SimNetworkTest::SetUp();
        std::filesystem::create_directories(Root() + "/etc");
        WriteFile(Hosts(), std::string(OTHERS) + "192.0.2.100\thost1.example.test host1\n" + PRINTER);
    }
    std::string Hosts() const { return Root() + "/etc/hosts"; }
    static constexpr const char* OTHERS =
        "127.0.0.1\tlocalhost.localdomain localhost\n::1\tlocalhost.localdomain localhost\n";
    static constexpr const char* PRINTER = "203.0.113.9\tprinter # by hand\n";
};

TEST_F(HostsFileTest, FollowsNameDomainAndAddress) {
    QelCtl::Network::DnsConfigImpl dns(STACK);
    struct Case {
        const char* name;
        std::function<void()> change;
        const char* line;  // the host's line, "" for none
        bool last;         // after the printer's line
    };
    const Case cases[] = {
        {"host name", [&] { dns.SetHostname("esx7", false); }, "192.0.2.100\tesx7.example.test esx7\n",
         false},
        {"domain", [&] { dns.SetFqdn("esx7.lab.test", true); }, "192.0.2.100\tesx7.lab.test esx7\n", false},
        {"no domain", [&] { dns.SetFqdn("esx8", false); }, "192.0.2.100\tesx8\n", false},
        {"interface down", [] { Mgmt().Disable(); }, "", false},
        // The new lease brings the DHCP server's domain along.
        {"interface up", [] { Mgmt().Enable(); }, "192.0.2.100\tesx8.example.test esx8\n", true},
        {"static address",
         [] {
             IpConfig config = Mgmt().GetIpConfig();
             config.SetUseDhcp(false, false, Ipv4Address("192.0.2.10"), Ipv4Address("255.255.255.0"));
             Mgmt().SetIpConfig(config);
         },
         "192.0.2.10\tesx8.example.test esx8\n", true},
        {"boot: the saved name", [&] { HostCtl::Lib::BootSimulatedHost(Root()); },
         "192.0.2.10\tesx7.lab.test esx7\n", true},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        c.change();
        // The host's line takes the place of the old one, or comes last when
        // there was none; no line while the interface has no address.
        const std::string expected =
            c.last ? std::string(OTHERS) + PRINTER + c.line : std::string(OTHERS) + c.line + PRINTER;
        EXPECT_EQ(ReadFile(Hosts()), expected);
    }
}

TEST_F(HostsFileTest, AStaleLineForTheNewNameIsReplaced) {
    WriteFile(Hosts(), std::string(OTHERS) +
                           "192.0.2.100\thost1.example.test host1\n198.51.100.9\tesx7 # old\n" + PRINTER);
    QelCtl::Network::DnsConfigImpl(STACK).SetHostname("esx7", false);
    EXPECT_EQ(ReadFile(Hosts()), std::string(OTHERS) + "192.0.2.100\tesx7.example.test esx7\n" + PRINTER);
}

TEST_F(HostsFileTest, LeftAloneByOtherWrites) {
    struct stat before;
    ASSERT_EQ(stat(Hosts().c_str(), &before), 0);
    QelCtl::System::SystemInfoImpl().SetSystemAlert("disk failing");
    QelCtl::Network::DnsConfigImpl(STACK).SetHostname("host1", true);  // the same name
    Mgmt().RenewDhcpLease();                                           // the same address
    struct stat after;
    ASSERT_EQ(stat(Hosts().c_str(), &after), 0);
    EXPECT_EQ(after.st_ino, before.st_ino) << "the hosts file was rewritten";

    // A missing file is made with the host's line.
    std::filesystem::remove(Hosts());
    QelCtl::Network::DnsConfigImpl(STACK).SetHostname("esx9", false);
    EXPECT_EQ(ReadFile(Hosts()), "192.0.2.100\tesx9.example.test esx9\n");
}

// A switch's uplinks, active and standby uplinks as "uplinks/active/standby".
std::string Team(const VirtualSwitch& sw) {
    const auto join = [](const std::vector<std::string>& nics) {
        std::string out;
        for (const std::string& nic : nics) out += (out.empty() ? "" : " ") + nic;
        return out;
    };
    const HostCtl::Network::TeamingPolicy team = sw.GetTeamingPolicy();
    return join(sw.GetUplinks()) + "/" + join(team.activeUplinks) + "/" + join(team.standbyUplinks);
}

TEST_F(SimNetworkTest, SwitchOperations) {
    VirtualSwitch sw0("kSwitch0");
    VirtualSwitch sw1("kSwitch1");
    struct Case {
        const char* name;
        std::function<void()> change;
        const char* team;  // kSwitch0's afterwards; null: refused
    };
    const Case cases[] = {
        {"add a standby", [&] { sw0.AddUplinkToTeamingPolicy("zonic1", true); },
         "zonic0 zonic1/zonic0/zonic1"},
        {"add an active one", [&] { sw0.AddUplinkToTeamingPolicy("zonic3", false); },
         "zonic0 zonic3/zonic0 zonic3/"},
        {"move an uplink to standby", [&] { sw0.AddUplinkToTeamingPolicy("zonic0", true); },
         "zonic0//zonic0"},
        {"more active uplinks than allowed",
         [&] {
             Edit([](json& s) { s["network"]["vswitches"][0]["maxActiveUplinks"] = 1; });
             sw0.AddUplinkToTeamingPolicy("zonic1", false);
         },
         nullptr},
        {"a NIC of another switch", [&] { sw0.AddUplinkToTeamingPolicy("zonic2", false); }, nullptr},
        {"an unknown NIC", [&] { sw0.AddUplinkToTeamingPolicy("zonic9", true); }, nullptr},
        {"remove the uplink", [&] { sw0.RemoveUplinkFromTeamingPolicy("zonic0"); }, "//"},
        {"remove a NIC that is no uplink", [&] { sw0.RemoveUplinkFromTeamingPolicy("zonic3"); }, nullptr},
        {"move a NIC between switches",
         [&] {
             sw1.RemoveUplinkFromTeamingPolicy("zonic2");
             sw0.AddUplinkToTeamingPolicy("zonic2", false);
         },
         "zonic0 zonic2/zonic0 zonic2/"},
        {"VLAN above 4095", [] { GetBackend().SetPortGroupVlanId("kSwitch0", "Management Network", 4096); },
         nullptr},
        {"VLAN of an unknown port group", [&] { sw0.SetPortGroupVlanId("VM Network", 5); }, nullptr},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        Reset();
        if (c.team) {
            c.change();
            EXPECT_EQ(Team(sw0), c.team);
            continue;
        }
        EXPECT_THROW(c.change(), HostCtlException);
        json now = State();
        now["network"]["vswitches"][0]["maxActiveUplinks"] = 2;  // as the case may have set it
        EXPECT_EQ(now, HostCtl::Lib::DefaultHostState()) << "a refused change changed the state";
    }
    Reset();
    EXPECT_EQ(sw0.GetMaxActiveUplinks(), 2u);
    EXPECT_EQ(sw0.GetPortGroupNames(), std::vector<std::string>{"Management Network"});
    sw0.SetPortGroupVlanId("Management Network", 4095);
    EXPECT_EQ(sw0.GetPortGroupVlanId("Management Network"), 4095);
    EXPECT_EQ(QelCtl::Network::VirtualSwitchInfoImpl().GetVirtualSwitchNames(),
              (std::vector<std::string>{"kSwitch0", "kSwitch1"}));
    EXPECT_THROW(sw0.GetPortGroupVlanId("VM Network"), HostCtlException);
    EXPECT_THROW(VirtualSwitch("kSwitch9").GetUplinks(), HostCtlException);
}

TEST_F(SimNetworkTest, DistributedSwitchUplinks) {
    EXPECT_TRUE(QelCtl::Network::DistributedSwitchInfoImpl().GetDistributedSwitchNames().empty());
    Edit(PutManagementOnDvs);
    HostCtl::Network::DistributedSwitch dvs("kDS-1");
    EXPECT_EQ(QelCtl::Network::DistributedSwitchInfoImpl().GetDistributedSwitchNames(),
              std::vector<std::string>{"kDS-1"});
    EXPECT_EQ(dvs.GetUsedUplinks(), (std::vector<std::string>{"zonic0", "zonic1"}));

    // The NICs of the distributed switch are not free for a standard one.
    ExpectRefused([] { VirtualSwitch("kSwitch0").AddUplinkToTeamingPolicy("zonic1", true); });
    ExpectRefused([&] { dvs.RemoveUplink("zonic3"); });
    ExpectRefused([] { HostCtl::Network::DistributedSwitch("kDS-9").RemoveUplink("zonic0"); });

    dvs.RemoveUplink("zonic1");
    ASSERT_EQ(dvs.GetUplinkPorts().size(), 2u);
    EXPECT_EQ(dvs.GetUplinkPorts()[1].key, "uplink2");
    EXPECT_EQ(dvs.GetUplinkPorts()[1].pnic, "");
    EXPECT_EQ(dvs.GetUsedUplinks(), std::vector<std::string>{"zonic0"});
    VirtualSwitch("kSwitch0").AddUplinkToTeamingPolicy("zonic1", true);
    EXPECT_EQ(VirtualSwitch("kSwitch0").GetTeamingPolicy().standbyUplinks,
              std::vector<std::string>{"zonic1"});
}

TEST_F(SimNetworkTest, ConnectionPointSwitch) {
    Edit([](json& s) {
        PutManagementOnDvs(s);
        s["network"]["vnics"].push_back(s["network"]["vnics"][0]);
        s["network"]["vnics"][1]["name"] = "qk1";
        s["network"]["vnics"][1]["connectionType"] = 3;
        s["network"]["vnics"][1]["portgroup"] = "opaque-7f3a";
    });
    EXPECT_EQ(Mgmt().GetConnectionPoint().GetType(), ConnectionPoint::DvsPort);
    EXPECT_EQ(Mgmt().GetConnectionPoint().GetName(), "100");
    EXPECT_EQ(QelNic("qk1").GetConnectionPoint().GetType(), ConnectionPoint::OpaqueNetwork);
    EXPECT_EQ(QelNic("qk1").GetConnectionPoint().GetName(), "opaque-7f3a");
    struct Case {
        int type;
        const char* name;
        const char* switchName;  // null: no switch
    };
    const Case cases[] = {
        {ConnectionPoint::PortGroup, "VM Network", "kSwitch1"},  // not just the first switch
        {ConnectionPoint::PortGroup, "Lab Network", nullptr},
        {ConnectionPoint::DvsPort, "100", "kDS-1"},
        {ConnectionPoint::DvsPort, "999", nullptr},
        {ConnectionPoint::OpaqueNetwork, "opaque-7f3a", nullptr},
        {ConnectionPoint::None, "", nullptr},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::to_string(c.type) + " " + c.name);
        const ConnectionPoint point(c.type, c.name);
        if (c.switchName)
            EXPECT_EQ(point.GetSwitchName(), c.switchName);
        else
            EXPECT_THROW(point.GetSwitchName(), HostCtlException);
    }
}

}  // namespace
