// The simulated host's network, through the operations the console calls:
// leases, autoconfiguration, MAC changes, booting, the hosts file and the
// switches.
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
using HostCtl::Network::IpAddress;
using HostCtl::Network::IpConfig;
using HostCtl::Network::Ipv4Address;
using HostCtl::Network::Ipv6Address;
using HostCtl::Network::Ipv6AddressType;
using HostCtl::Network::Ipv6Network;
using HostCtl::Network::QelNic;
using HostCtl::Network::VirtualSwitch;
using nlohmann::json;

const char* const STACK = "defaultTcpipStack";

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
    json State() const { return json::parse(ReadFile(StatePath())); }
    json Lan(const std::string& vlan) const { return State()["network"]["lan"][vlan]; }
    static QelNic Mgmt() { return QelNic("qk0"); }
    static std::string Address() { return Mgmt().GetIpConfig().GetIpv4Address().GetStringAddress(); }
    // The IPv6 addresses of the management interface as "addr/prefix type".
    static std::vector<std::string> Ipv6() {
        static const char* const TYPES[] = {"static", "dhcp", "autoconf"};
        std::vector<std::string> out;
        const IpConfig config = Mgmt().GetIpConfig();
        for (const Ipv6Network& n : config.GetIpv6Network())
            out.push_back(n.ToString() + " " + TYPES[int(n.GetIpv6AddressType())]);
        return out;
    }
    static std::string Gateway() {
        return QelCtl::Network::RoutingInfoImpl(STACK).GetQelKernelDefaultGateway().GetStringAddress();
    }
    static std::string Ipv6Gateway() {
        return QelCtl::Network::RoutingInfoImpl(STACK).GetIpv6QelKernelDefaultGateway().GetStringAddress();
    }
};

TEST_F(SimNetworkTest, DefaultHostIsWhatItsNetworkGivesIt) {
    const json state = HostCtl::Lib::DefaultHostState();
    json booted = state;
    HostCtl::Lib::BootNetwork(HostCtl::Lib::SimState(Root()), booted);
    EXPECT_EQ(booted, state) << "a boot of the default host changes it";

    EXPECT_EQ(Address(), "192.0.2.100");
    EXPECT_EQ(Lan("0")["dhcp"]["leases"], json({{"00:50:56:01:00:02", "192.0.2.100"}}));
    EXPECT_EQ(Ipv6(), (std::vector<std::string>{"fe80::250:56ff:fe01:2/64 autoconf"}));
    EXPECT_EQ(Gateway(), "192.0.2.1");
    EXPECT_EQ(Mgmt().GetMacAddress(), "00:50:56:01:00:02");

    std::vector<HostCtl::Network::Pnic> pnics = QelCtl::Network::NetworkInfoImpl().GetPnics();
    ASSERT_EQ(pnics.size(), 4u);
    EXPECT_EQ(pnics[0].mac, Mgmt().GetMacAddress());
    EXPECT_EQ(pnics[0].label, "NIC 1");
    EXPECT_EQ(pnics[2].label, "");
    EXPECT_GT(pnics[3].label.size(), 14u);
    EXPECT_FALSE(pnics[3].linkUp);
    EXPECT_EQ(VirtualSwitch("kSwitch1").GetUplinks(), std::vector<std::string>{"zonic2"});
}

TEST_F(SimNetworkTest, DhcpLeases) {
    struct Case {
        const char* name;
        std::function<void(json&)> network;  // the host's network before the renew
        std::function<void()> action;        // null: renew the lease
        const char* address;
        const char* netmask;
        const char* gateway;
    };
    const Case cases[] = {
        {"lease kept",
         [](json& s) { s["network"]["lan"]["0"]["dhcp"]["leases"]["00:50:56:01:00:02"] = "192.0.2.150"; },
         nullptr, "192.0.2.150", "255.255.255.0", "192.0.2.1"},
        {"a lease recorded in capitals is the same MAC's",
         [](json& s) {
             s["network"]["pnics"][0]["mac"] = "00:50:56:0a:00:02";
             s["network"]["vnics"][0]["mac"] = "00:50:56:0a:00:02";
             s["network"]["lan"]["0"]["dhcp"]["leases"] = {{"00:50:56:0A:00:02", "192.0.2.170"}};
         },
         nullptr, "192.0.2.170", "255.255.255.0", "192.0.2.1"},
        {"pool moved: a new lease",
         [](json& s) {
             s["network"]["lan"]["0"]["dhcp"]["first"] = "192.0.2.120";
             s["network"]["lan"]["0"]["dhcp"]["last"] = "192.0.2.130";
             s["network"]["lan"]["0"]["dhcp"]["netmask"] = "255.255.255.128";
         },
         nullptr, "192.0.2.120", "255.255.255.128", "192.0.2.1"},
        {"lowest free address",
         [](json& s) {
             s["network"]["lan"]["0"]["dhcp"]["leases"] = {{"00:50:56:99:00:01", "192.0.2.100"},
                                                           {"00:50:56:99:00:02", "192.0.2.102"}};
         },
         nullptr, "192.0.2.101", "255.255.255.0", "192.0.2.1"},
        {"full pool",
         [](json& s) {
             s["network"]["lan"]["0"]["dhcp"]["last"] = "192.0.2.101";
             s["network"]["lan"]["0"]["dhcp"]["leases"] = {{"00:50:56:99:00:01", "192.0.2.100"},
                                                           {"00:50:56:99:00:02", "192.0.2.101"}};
         },
         nullptr, "0.0.0.0", "0.0.0.0", "192.0.2.1"},
        {"no server on the VLAN", [](json& s) { s["network"]["vswitches"][0]["portgroups"][0]["vlan"] = 30; },
         nullptr, "0.0.0.0", "0.0.0.0", "192.0.2.1"},
        {"another VLAN's server", [](json& s) { s["network"]["vswitches"][0]["portgroups"][0]["vlan"] = 20; },
         nullptr, "198.51.100.100", "255.255.255.0", "198.51.100.1"},
        {"no link", [](json& s) { s["network"]["pnics"][0]["linkUp"] = false; }, nullptr, "0.0.0.0",
         "0.0.0.0", "192.0.2.1"},
        {"link through a standby uplink",
         [](json& s) {
             s["network"]["pnics"][0]["linkUp"] = false;
             s["network"]["vswitches"][0]["uplinks"].push_back("zonic1");
             s["network"]["vswitches"][0]["teaming"]["standby"] = {"zonic1"};
         },
         nullptr, "192.0.2.100", "255.255.255.0", "192.0.2.1"},
        {"attached but not in the team",
         [](json& s) {
             s["network"]["pnics"][0]["linkUp"] = false;
             s["network"]["vswitches"][0]["uplinks"].push_back("zonic1");
         },
         nullptr, "0.0.0.0", "0.0.0.0", "192.0.2.1"},
        {"disabled interface", nullptr, [] { Mgmt().Disable(); }, "0.0.0.0", "0.0.0.0", "192.0.2.1"},
        {"disabled, then renewed", nullptr,
         [] {
             Mgmt().Disable();
             Mgmt().RenewDhcpLease();
         },
         "0.0.0.0", "0.0.0.0", "192.0.2.1"},
        {"enabled again", nullptr, [] { Mgmt().Restart(); }, "192.0.2.100", "255.255.255.0", "192.0.2.1"},
        {"on a distributed port", PutManagementOnDvs, nullptr, "198.51.100.100", "255.255.255.0",
         "198.51.100.1"},
        {"distributed uplinks without link",
         [](json& s) {
             PutManagementOnDvs(s);
             s["network"]["dvswitches"][0]["uplinkPorts"][0]["pnic"] = "";
             s["network"]["pnics"][1]["linkUp"] = false;
         },
         nullptr, "0.0.0.0", "0.0.0.0", "192.0.2.1"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        HostCtl::Lib::SimState(Root()).Replace(HostCtl::Lib::DefaultHostState());
        if (c.network) Edit(c.network);
        if (c.action)
            c.action();
        else
            Mgmt().RenewDhcpLease();
        const IpConfig config = Mgmt().GetIpConfig();
        EXPECT_TRUE(config.GetUseDhcp());
        EXPECT_EQ(config.GetIpv4Address().GetStringAddress(), c.address);
        EXPECT_EQ(config.GetIpv4Netmask().GetStringAddress(), c.netmask);
        EXPECT_EQ(Gateway(), c.gateway);
        // The server records the lease by the client's MAC.
        if (std::string(c.address) != "0.0.0.0") {
            const json leases =
                Lan(std::string(c.address).rfind("198.", 0) == 0 ? "20" : "0")["dhcp"]["leases"];
            const std::string mac = Mgmt().GetMacAddress();
            size_t held = 0;
            for (const auto& [key, address] : leases.items()) {
                if (key == mac) {
                    EXPECT_EQ(address, c.address);
                }
                held += address == c.address;
            }
            EXPECT_EQ(held, 1u) << leases;
            EXPECT_TRUE(leases.contains(mac)) << leases;
        }
    }
}

TEST_F(SimNetworkTest, DnsFromDhcpOnlyWhenAsked) {
    Edit([](json& s) { s["network"]["vswitches"][0]["portgroups"][0]["vlan"] = 20; });
    IpConfig config = Mgmt().GetIpConfig();
    config.SetDhcpDns(false);
    Mgmt().SetIpConfig(config);
    QelCtl::Network::DnsConfigImpl dns(STACK);
    EXPECT_EQ(Address(), "198.51.100.100");
    ASSERT_EQ(dns.GetNameServers().size(), 1u);
    EXPECT_EQ(dns.GetNameServers()[0].GetStringAddress(), "192.0.2.53");

    Edit([](json& s) { s["network"]["lan"]["20"]["dhcp"]["domain"] = "vlan20.example.test"; });
    config.SetDhcpDns(true);
    Mgmt().SetIpConfig(config);
    ASSERT_EQ(dns.GetNameServers().size(), 1u);
    EXPECT_EQ(dns.GetNameServers()[0].GetStringAddress(), "198.51.100.53");
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
    const std::string linkLocal = "fe80::250:56ff:fe01:2/64 autoconf";
    const std::string slaac = "2001:db8:20:0:250:56ff:fe01:2/64 autoconf";
    struct Case {
        const char* name;
        std::function<void(json&)> network;
        bool dhcpv6;
        bool routerAdvertisement;
        std::vector<Ipv6Network> given;
        std::vector<std::string> addresses;
        const char* gateway;
    };
    const Ipv6Network staticAddress(Ipv6Address("2001:db8::10"), 64);
    const auto vlan20 = [](json& s) { s["network"]["vswitches"][0]["portgroups"][0]["vlan"] = 20; };
    const Case cases[] = {
        {"no router on the VLAN", nullptr, false, true, {}, {linkLocal}, "::"},
        {"router advertisement", vlan20, false, true, {}, {linkLocal, slaac}, "fe80::1"},
        {"advertisement and DHCPv6",
         vlan20,
         true,
         true,
         {},
         {linkLocal, slaac, "2001:db8:20::1000/128 dhcp"},
         "fe80::1"},
        {"DHCPv6 only", vlan20, true, false, {}, {linkLocal, "2001:db8:20::1000/128 dhcp"}, "::"},
        {"DHCPv6 skips taken addresses",
         [&](json& s) {
             vlan20(s);
             s["network"]["lan"]["20"]["dhcpv6"]["leases"] = {{"00:50:56:99:00:01", "2001:db8:20::1000"}};
         },
         true,
         false,
         {},
         {linkLocal, "2001:db8:20::1001/128 dhcp"},
         "::"},
        {"static only, advertisements ignored",
         vlan20,
         false,
         false,
         {staticAddress},
         {linkLocal, "2001:db8::10/64 static"},
         "::"},
        {"only static entries of the configuration are taken",
         vlan20,
         false,
         false,
         {staticAddress, Ipv6Network(Ipv6Address("2001:db8::99"), 128, Ipv6AddressType::Dhcp),
          Ipv6Network(Ipv6Address("fe80::99"), 64, Ipv6AddressType::Autoconf)},
         {linkLocal, "2001:db8::10/64 static"},
         "::"},
        {"a prefix other than /64 gives no address, but the router",
         [&](json& s) {
             vlan20(s);
             s["network"]["lan"]["20"]["routerAdvertisement"]["prefixLength"] = 48;
         },
         false,
         true,
         {},
         {linkLocal},
         "fe80::1"},
        {"a configured gateway stays",
         [&](json& s) {
             vlan20(s);
             s["network"]["routing"]["ipv6Gateway"] = "2001:db8:20::1";
         },
         false,
         true,
         {},
         {linkLocal, slaac},
         "2001:db8:20::1"},
        {"no link: link-local and static only",
         [&](json& s) {
             vlan20(s);
             s["network"]["pnics"][0]["linkUp"] = false;
         },
         true,
         true,
         {staticAddress},
         {linkLocal, "2001:db8::10/64 static"},
         "::"},
        {"no IPv6 in the kernel",
         [&](json& s) {
             vlan20(s);
             s["network"]["ipv6Enabled"] = false;
         },
         true,
         true,
         {staticAddress},
         {},
         "::"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        HostCtl::Lib::SimState(Root()).Replace(HostCtl::Lib::DefaultHostState());
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
    Edit([](json& s) { s["network"]["vswitches"][0]["portgroups"][0]["vlan"] = 20; });
    IpConfig config = Mgmt().GetIpConfig();
    config.SetUseIpv6Dhcp(true);
    Mgmt().SetIpConfig(config);
    QelCtl::Network::DnsConfigImpl dns(STACK);
    ASSERT_EQ(dns.GetIpv6NameServers().size(), 1u);
    EXPECT_EQ(dns.GetIpv6NameServers()[0].GetStringAddress(), "2001:db8:20::53");

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
    const std::string before = ReadFile(StatePath());
    EXPECT_THROW(Mgmt().RenewDhcpLease(), HostCtlException);
    EXPECT_EQ(ReadFile(StatePath()), before);
}

TEST_F(SimNetworkTest, DisableGivesUpDynamicAddressesOnly) {
    Edit([](json& s) { s["network"]["vswitches"][0]["portgroups"][0]["vlan"] = 20; });
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
    Edit([](json& s) { s["network"]["vswitches"][0]["portgroups"][0]["vlan"] = 20; });
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

    const std::string before = ReadFile(StatePath());
    for (const char* bad : {"00:50:56:01:00", "00:50:56:01:00:02:03", "00-50-56-01-00-02",
                            "00:50:56:01:00:g2", "01:00:5e:00:00:01", "00:00:00:00:00:00", ""}) {
        SCOPED_TRACE(bad);
        EXPECT_THROW(Mgmt().SetMacAddress(bad), HostCtlException);
    }
    EXPECT_EQ(ReadFile(StatePath()), before);
}

TEST_F(SimNetworkTest, BadIpConfigurationsChangeNothing) {
    const std::string before = ReadFile(StatePath());
    IpConfig noMask;  // static, 0.0.0.0/0.0.0.0
    IpConfig badMask;
    badMask.SetIpv4Address(Ipv4Address("192.0.2.10"));
    badMask.SetIpv4Netmask(Ipv4Address("255.0.255.0"));
    IpConfig linkLocal;
    linkLocal.SetUseDhcp(true);
    linkLocal.SetIpv6Network({Ipv6Network(Ipv6Address("fe80::10"), 64)});
    IpConfig multicast;
    multicast.SetUseDhcp(true);
    multicast.SetIpv6Network({Ipv6Network(Ipv6Address("ff02::1"), 64)});
    for (const IpConfig& bad : {noMask, badMask, linkLocal, multicast}) {
        EXPECT_THROW(Mgmt().SetIpConfig(bad), HostCtlException);
        EXPECT_EQ(ReadFile(StatePath()), before);
    }
    EXPECT_THROW(QelNic("qk7").SetIpConfig(linkLocal), HostCtlException);
    EXPECT_THROW(QelNic("qk7").Enable(), HostCtlException);
    EXPECT_EQ(ReadFile(StatePath()), before);
}

TEST_F(SimNetworkTest, Ipv6EnablementTakesEffectAtBoot) {
    QelCtl::Network::NetworkInfoImpl info;
    info.SetQelIpv6Enabled(false);
    EXPECT_TRUE(info.IsQelIpv6Enabled());
    EXPECT_EQ(Ipv6().size(), 1u);
    HostCtl::Lib::BootSimulatedHost(Root());
    EXPECT_FALSE(info.IsQelIpv6Enabled());
    EXPECT_TRUE(Ipv6().empty());
    EXPECT_TRUE(State()["network"]["vnics"][0]["ipv6"]["addresses"].empty());
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
    QelCtl::Network::DnsConfigImpl(STACK).SaveConfig();
    struct Case {
        const char* name;
        std::function<void()> change;
        bool survives;
    };
    QelCtl::Network::DnsConfigImpl dns(STACK);
    QelCtl::Network::RoutingInfoImpl routing(STACK);
    const Case cases[] = {
        {"host name", [&] { dns.SetHostname("esx7", false); }, false},
        {"host name, persisted", [&] { dns.SetHostname("esx7", true); }, true},
        {"fully qualified name", [&] { dns.SetFqdn("esx7.lab.test", false); }, false},
        {"fully qualified name, persisted", [&] { dns.SetFqdn("esx7.lab.test", true); }, true},
        {"name servers", [&] { dns.AddNameServer(IpAddress("2001:db8::53")); }, false},
        {"name servers, saved",
         [&] {
             dns.AddNameServer(IpAddress("2001:db8::53"));
             dns.SaveConfig();
         },
         true},
        {"search domains", [&] { dns.SetSearchDomainsString("lab.test"); }, false},
        {"search domains, saved",
         [&] {
             dns.SetSearchDomainsString("lab.test");
             dns.SaveConfig();
         },
         true},
        {"gateway", [&] { routing.SetQelKernelDefaultGateway(Ipv4Address("192.0.2.254"), false); }, false},
        {"gateway, persisted", [&] { routing.SetQelKernelDefaultGateway(Ipv4Address("192.0.2.254"), true); },
         true},
        {"gateway, saved with the DNS configuration",
         [&] {
             routing.SetQelKernelDefaultGateway(Ipv4Address("192.0.2.254"), false);
             dns.SaveConfig();
         },
         true},
        {"IPv6 gateway", [&] { routing.SetIpv6QelKernelDefaultGateway(Ipv6Address("2001:db8::1")); }, false},
        {"IPv6 gateway, saved",
         [&] {
             routing.SetIpv6QelKernelDefaultGateway(Ipv6Address("2001:db8::1"));
             dns.SaveConfig();
         },
         true},
    };
    const json base = State();
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        HostCtl::Lib::SimState(Root()).Replace(base);
        const json before = State()["network"];
        c.change();
        const json changed = State()["network"];
        ASSERT_NE(changed["dns"].dump() + changed["routing"].dump(),
                  before["dns"].dump() + before["routing"].dump());
        HostCtl::Lib::BootSimulatedHost(Root());
        const json after = State()["network"];
        const json& expected = c.survives ? changed : before;
        EXPECT_EQ(after["dns"], expected["dns"]);
        EXPECT_EQ(after["routing"], expected["routing"]);
    }
}

TEST_F(SimNetworkTest, DnsSettingsAreCheckedByTheHostToo) {
    const std::string before = ReadFile(StatePath());
    HostCtl::Lib::Backend& backend = GetBackend();
    EXPECT_THROW(backend.SetHostname(STACK, "esx1.lab", false), HostCtlException);
    EXPECT_THROW(backend.SetHostname(STACK, "-esx", true), HostCtlException);
    EXPECT_THROW(backend.SetFqdn(STACK, "esx1", "lab..test", false), HostCtlException);
    EXPECT_THROW(backend.SetSearchDomains(STACK, {"lab.test", "bad_domain"}), HostCtlException);
    EXPECT_THROW(backend.SetHostname("otherStack", "esx1", false), HostCtlException);
    EXPECT_THROW(backend.SaveConfig("otherStack"), HostCtlException);
    EXPECT_EQ(ReadFile(StatePath()), before);

    // A server is listed once.
    backend.RemoveNameServers(STACK);
    for (const char* server : {"192.0.2.53", "2001:db8::53", "192.0.2.53", "192.0.2.54"})
        backend.AddNameServer(STACK, IpAddress(server));
    EXPECT_EQ(State()["network"]["dns"]["servers"], json({"192.0.2.53", "192.0.2.54"}));
    EXPECT_EQ(State()["network"]["dns"]["ipv6Servers"], json({"2001:db8::53"}));
}

class HostsFileTest : public SimNetworkTest {
protected:
    void SetUp() override {
        SimNetworkTest::SetUp();
        std::filesystem::create_directories(Root() + "/etc");
        WriteFile(Hosts(),
                  "127.0.0.1\tlocalhost.localdomain localhost\n::1\tlocalhost.localdomain localhost\n"
                  "192.0.2.100\thost1.example.test host1\n203.0.113.9\tprinter # by hand\n");
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
        {"domain again", [&] { dns.SetFqdn("esx8.example.test", false); },
         "192.0.2.100\tesx8.example.test esx8\n", false},
        {"interface down", [] { Mgmt().Disable(); }, "", false},
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

TEST_F(HostsFileTest, LeftAloneByOtherWritesAndFailures) {
    struct stat before;
    ASSERT_EQ(stat(Hosts().c_str(), &before), 0);
    QelCtl::System::SystemInfoImpl().SetSystemAlert("disk failing");
    QelCtl::Network::DnsConfigImpl(STACK).SetHostname("host1", true);  // the same name
    Mgmt().RenewDhcpLease();                                           // the same address
    EXPECT_THROW(QelCtl::Network::DnsConfigImpl(STACK).SetHostname("bad_name", false), HostCtlException);
    Edit([](json& s) { s["faults"]["SetHostname"] = "refused"; });
    EXPECT_THROW(QelCtl::Network::DnsConfigImpl(STACK).SetHostname("esx7", false), HostCtlException);
    struct stat after;
    ASSERT_EQ(stat(Hosts().c_str(), &after), 0);
    EXPECT_EQ(after.st_ino, before.st_ino) << "the hosts file was rewritten";

    // A missing file is made with the host's line.
    Edit([](json& s) { s["faults"].erase("SetHostname"); });
    std::filesystem::remove(Hosts());
    QelCtl::Network::DnsConfigImpl(STACK).SetHostname("esx9", false);
    EXPECT_EQ(ReadFile(Hosts()), "192.0.2.100\tesx9.example.test esx9\n");
}

TEST_F(SimNetworkTest, SwitchOperations) {
    struct Case {
        const char* name;
        std::function<void()> change;
        bool refused;
        std::vector<std::string> uplinks0;  // kSwitch0 afterwards
        std::vector<std::string> active0;
        std::vector<std::string> standby0;
    };
    VirtualSwitch sw0("kSwitch0");
    VirtualSwitch sw1("kSwitch1");
    const Case cases[] = {
        {"add a standby",
         [&] { sw0.AddUplinkToTeamingPolicy("zonic1", true); },
         false,
         {"zonic0", "zonic1"},
         {"zonic0"},
         {"zonic1"}},
        {"add an active one",
         [&] { sw0.AddUplinkToTeamingPolicy("zonic3", false); },
         false,
         {"zonic0", "zonic3"},
         {"zonic0", "zonic3"},
         {}},
        {"move an uplink to standby",
         [&] { sw0.AddUplinkToTeamingPolicy("zonic0", true); },
         false,
         {"zonic0"},
         {},
         {"zonic0"}},
        {"more active uplinks than allowed",
         [&] {
             Edit([](json& s) { s["network"]["vswitches"][0]["maxActiveUplinks"] = 1; });
             sw0.AddUplinkToTeamingPolicy("zonic1", false);
         },
         true,
         {"zonic0"},
         {"zonic0"},
         {}},
        {"a NIC of another switch",
         [&] { sw0.AddUplinkToTeamingPolicy("zonic2", false); },
         true,
         {"zonic0"},
         {"zonic0"},
         {}},
        {"an unknown NIC",
         [&] { sw0.AddUplinkToTeamingPolicy("zonic9", true); },
         true,
         {"zonic0"},
         {"zonic0"},
         {}},
        {"an unknown switch",
         [&] { VirtualSwitch("kSwitch9").AddUplinkToTeamingPolicy("zonic1", true); },
         true,
         {"zonic0"},
         {"zonic0"},
         {}},
        {"remove the uplink", [&] { sw0.RemoveUplinkFromTeamingPolicy("zonic0"); }, false, {}, {}, {}},
        {"remove a NIC that is no uplink",
         [&] { sw0.RemoveUplinkFromTeamingPolicy("zonic3"); },
         true,
         {"zonic0"},
         {"zonic0"},
         {}},
        {"remove another switch's uplink",
         [&] { sw0.RemoveUplinkFromTeamingPolicy("zonic2"); },
         true,
         {"zonic0"},
         {"zonic0"},
         {}},
        {"move a NIC between switches",
         [&] {
             sw1.RemoveUplinkFromTeamingPolicy("zonic2");
             sw0.AddUplinkToTeamingPolicy("zonic2", false);
         },
         false,
         {"zonic0", "zonic2"},
         {"zonic0", "zonic2"},
         {}},
        {"VLAN above 4095",
         [] { GetBackend().SetPortGroupVlanId("kSwitch0", "Management Network", 4096); },
         true,
         {"zonic0"},
         {"zonic0"},
         {}},
        {"VLAN of an unknown port group",
         [&] { sw0.SetPortGroupVlanId("VM Network", 5); },
         true,
         {"zonic0"},
         {"zonic0"},
         {}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        HostCtl::Lib::SimState(Root()).Replace(HostCtl::Lib::DefaultHostState());
        if (c.refused) {
            EXPECT_THROW(c.change(), HostCtlException);
        } else {
            c.change();
        }
        if (c.refused) {
            json expected = HostCtl::Lib::DefaultHostState();
            json now = State();
            now["network"]["vswitches"][0]["maxActiveUplinks"] = 2;
            EXPECT_EQ(now, expected) << "a refused change changed the state";
        }
        EXPECT_EQ(sw0.GetUplinks(), c.uplinks0);
        EXPECT_EQ(sw0.GetTeamingPolicy().activeUplinks, c.active0);
        EXPECT_EQ(sw0.GetTeamingPolicy().standbyUplinks, c.standby0);
    }
    HostCtl::Lib::SimState(Root()).Replace(HostCtl::Lib::DefaultHostState());
    EXPECT_EQ(sw0.GetMaxActiveUplinks(), 2u);
    EXPECT_EQ(sw0.GetPortGroupNames(), std::vector<std::string>{"Management Network"});
    sw0.SetPortGroupVlanId("Management Network", 4095);
    EXPECT_EQ(sw0.GetPortGroupVlanId("Management Network"), 4095);
    EXPECT_EQ(sw1.GetPortGroupVlanId("VM Network"), 0);
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
    const std::string before = ReadFile(StatePath());
    EXPECT_THROW(VirtualSwitch("kSwitch0").AddUplinkToTeamingPolicy("zonic1", true), HostCtlException);
    EXPECT_THROW(dvs.RemoveUplink("zonic3"), HostCtlException);
    EXPECT_THROW(HostCtl::Network::DistributedSwitch("kDS-9").RemoveUplink("zonic0"), HostCtlException);
    EXPECT_EQ(ReadFile(StatePath()), before);

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
        {ConnectionPoint::PortGroup, "Management Network", "kSwitch0"},
        {ConnectionPoint::PortGroup, "VM Network", "kSwitch1"},
        {ConnectionPoint::PortGroup, "Lab Network", nullptr},
        {ConnectionPoint::DvsPort, "100", "kDS-1"},
        {ConnectionPoint::DvsPort, "101", "kDS-1"},
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
