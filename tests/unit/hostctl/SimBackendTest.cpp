// The host control operations on a simulated host: what one write leaves for
// the next read, and the packing of the version record.
#include <cstring>
#include <filesystem>

#include "TestSupport.hpp"
#include "UnsupportedHostBackend.hpp"
#include "hostctl/Backend.hpp"
#include "hostctl/QelCtl.hpp"

namespace {

using namespace HostCtlTest;
using HostCtl::Lib::HostCtlException;
using HostCtl::Network::IpAddress;
using HostCtl::Network::Ipv4Address;
using HostCtl::Network::Ipv6Address;
using HostCtl::Network::Ipv6AddressType;
using HostCtl::Network::Ipv6Network;
using nlohmann::json;

class SimBackendTest : public SimHostTest {
protected:
    json State() const { return json::parse(ReadFile(StatePath())); }
};

TEST_F(SimBackendTest, VersionRecordIsPackedAtItsOffsets) {
    Edit([](json& s) {
        s["version"] = {{"product", "Tarni"},
                        {"version", "8.0.2"},
                        {"kernelRelease", "8.0.2-k"},
                        {"build", "releasebuild-22380479"},
                        {"buildNumber", 0xa1b2c3d4u}};
    });
    unsigned char record[QelCtl::Util::SYSINFO_VERSION_SIZE];
    memset(record, 0xee, sizeof record);
    QelCtl::Util::SysinfoUtil::SysinfoGet(QelCtl::Util::SysinfoNode::SystemVersion, nullptr, record,
                                          sizeof record);

    unsigned char expected[QelCtl::Util::SYSINFO_VERSION_SIZE] = {};
    memcpy(expected + 0, "Tarni", 5);
    memcpy(expected + 32, "8.0.2", 5);
    memcpy(expected + 96, "8.0.2-k", 7);
    memcpy(expected + 128, "releasebuild-22380479", 21);
    const uint32_t build = 0xa1b2c3d4u;
    memcpy(expected + 292, &build, 4);
    for (size_t i = 0; i < sizeof record; ++i) ASSERT_EQ(record[i], expected[i]) << "byte " << i;
}

TEST_F(SimBackendTest, OverlongVersionTextsAreCutInsideTheirFields) {
    Edit([](json& s) {
        s["version"]["product"] = std::string(40, 'P');
        s["version"]["version"] = std::string(70, 'V');
        s["version"]["kernelRelease"] = std::string(32, 'K');
        s["version"]["build"] = std::string(200, 'B');
        s["version"]["buildNumber"] = 7;
    });
    char record[QelCtl::Util::SYSINFO_VERSION_SIZE];
    QelCtl::Util::SysinfoUtil::SysinfoGet(QelCtl::Util::SysinfoNode::SystemVersion, nullptr, record,
                                          sizeof record);
    EXPECT_EQ(std::string(record + 0), std::string(31, 'P'));
    EXPECT_EQ(std::string(record + 32), std::string(63, 'V'));
    EXPECT_EQ(std::string(record + 96), std::string(31, 'K'));
    EXPECT_EQ(std::string(record + 128), std::string(163, 'B'));
    uint32_t build;
    memcpy(&build, record + 292, 4);
    EXPECT_EQ(build, 7u);
}

TEST_F(SimBackendTest, VersionRecordNeedsAWholeBuffer) {
    char record[QelCtl::Util::SYSINFO_VERSION_SIZE - 1] = {};
    EXPECT_THROW(QelCtl::Util::SysinfoUtil::SysinfoGet(QelCtl::Util::SysinfoNode::SystemVersion, nullptr,
                                                       record, sizeof record),
                 HostCtlException);
    for (char c : record) ASSERT_EQ(c, 0);
}

TEST_F(SimBackendTest, IpConfigRoundTrip) {
    HostCtl::Network::IpConfig config;
    config.SetUseDhcp(false, false, Ipv4Address("10.1.2.3"), Ipv4Address("255.255.252.0"));
    config.SetUseIpv6Dhcp(true);
    config.SetUseIpv6RouterAdvertised(false);
    config.SetDhcpDns(false);
    // Only the static entries are configuration; the others are obtained.
    config.SetIpv6Network({Ipv6Network(Ipv6Address("2001:db8::10"), 64, Ipv6AddressType::Static),
                           Ipv6Network(Ipv6Address("2001:db8:1::5"), 128, Ipv6AddressType::Dhcp),
                           Ipv6Network(Ipv6Address("fe80::1"), 10, Ipv6AddressType::Autoconf)});
    HostCtl::Network::QelNic("qk0").SetIpConfig(config);

    // A second backend on the same host, as another process would have.
    HostCtl::Lib::SetBackend(HostCtl::Lib::MakeSimulatedBackend(Root()));
    HostCtl::Network::IpConfig read = HostCtl::Network::QelNic("qk0").GetIpConfig();
    EXPECT_FALSE(read.GetUseDhcp());
    EXPECT_FALSE(read.GetIpv4UseNone());
    EXPECT_EQ(read.GetIpv4Address().GetStringAddress(), "10.1.2.3");
    EXPECT_EQ(read.GetIpv4Netmask().GetStringAddress(), "255.255.252.0");
    EXPECT_TRUE(read.GetUseIpv6Dhcp());
    EXPECT_FALSE(read.GetUseIpv6RouterAdvertised());
    EXPECT_FALSE(read.GetDhcpDns());
    ASSERT_EQ(read.GetIpv6Network().size(), 2u);
    EXPECT_EQ(read.GetIpv6Network()[0].ToString(), "fe80::250:56ff:fe01:2/64");
    EXPECT_EQ(read.GetIpv6Network()[0].GetIpv6AddressType(), Ipv6AddressType::Autoconf);
    EXPECT_EQ(read.GetIpv6Network()[1].ToString(), "2001:db8::10/64");
    EXPECT_EQ(read.GetIpv6Network()[1].GetIpv6AddressType(), Ipv6AddressType::Static);
    // What the write did not cover stays.
    EXPECT_EQ(State()["network"]["vnics"][0]["portgroup"], "Management Network");
    HostCtl::Network::ConnectionPoint point = HostCtl::Network::QelNic("qk0").GetConnectionPoint();
    EXPECT_EQ(point.GetType(), HostCtl::Network::ConnectionPoint::PortGroup);
    EXPECT_EQ(point.GetName(), "Management Network");
    EXPECT_THROW(HostCtl::Network::QelNic("qk7").SetIpConfig(config), HostCtlException);

    // IPv4 off leaves the interface without an IPv4 address.
    config.SetIpv4UseNone();
    HostCtl::Network::QelNic("qk0").SetIpConfig(config);
    read = HostCtl::Network::QelNic("qk0").GetIpConfig();
    EXPECT_TRUE(read.GetIpv4UseNone());
    EXPECT_FALSE(read.GetUseDhcp());
    EXPECT_TRUE(read.GetIpv4Address().IsZero());
    EXPECT_TRUE(read.GetIpv4Netmask().IsZero());
}

TEST_F(SimBackendTest, DnsWritesChangeOnlyTheirFields) {
    QelCtl::Network::DnsConfigImpl dns("defaultTcpipStack");
    dns.SetFqdn("esx1.lab.test", false);
    dns.RemoveNameServers();
    for (const char* server : {"10.0.0.53", "2001:DB8::53", "10.0.0.54"})
        dns.AddNameServer(IpAddress(server));
    dns.SetSearchDomainsString("lab.test, corp.test");
    EXPECT_EQ(dns.GetHostname(), "esx1");
    EXPECT_EQ(dns.GetDomain(), "lab.test");
    ASSERT_EQ(dns.GetNameServers().size(), 2u);
    EXPECT_EQ(dns.GetNameServers()[0].GetStringAddress(), "10.0.0.53");
    EXPECT_EQ(dns.GetNameServers()[1].GetStringAddress(), "10.0.0.54");
    ASSERT_EQ(dns.GetIpv6NameServers().size(), 1u);
    EXPECT_EQ(dns.GetIpv6NameServers()[0].GetStringAddress(), "2001:db8::53");
    EXPECT_EQ(dns.GetSearchDomains(), (std::vector<std::string>{"lab.test", "corp.test"}));

    dns.SetHostname("esx2", false);
    EXPECT_EQ(dns.GetHostname(), "esx2");
    EXPECT_EQ(dns.GetDomain(), "lab.test");
    EXPECT_EQ(dns.GetNameServers().size(), 2u);
    dns.SetFqdn("solo", false);
    EXPECT_EQ(dns.GetHostname(), "solo");
    EXPECT_EQ(dns.GetDomain(), "");
    dns.RemoveNameServers();
    EXPECT_TRUE(dns.GetNameServers().empty());
    EXPECT_TRUE(dns.GetIpv6NameServers().empty());
    EXPECT_EQ(dns.GetSearchDomains().size(), 2u);

    EXPECT_THROW(QelCtl::Network::DnsConfigImpl("otherStack").GetHostname(), HostCtlException);
    EXPECT_THROW(QelCtl::Network::DnsConfigImpl("otherStack").SetHostname("x", false), HostCtlException);
    EXPECT_EQ(dns.GetHostname(), "solo");
}

TEST_F(SimBackendTest, GatewaysAreSetOneAtATime) {
    QelCtl::Network::RoutingInfoImpl routing("defaultTcpipStack");
    routing.SetIpv6QelKernelDefaultGateway(Ipv6Address("2001:db8::1"));
    EXPECT_EQ(routing.GetQelKernelDefaultGateway().GetStringAddress(), "192.0.2.1");
    routing.SetQelKernelDefaultGateway(Ipv4Address("10.0.0.1"), false);
    EXPECT_EQ(routing.GetQelKernelDefaultGateway().GetStringAddress(), "10.0.0.1");
    EXPECT_EQ(routing.GetIpv6QelKernelDefaultGateway().GetStringAddress(), "2001:db8::1");
    EXPECT_EQ(State()["network"]["routing"]["ipv6Gateway"], "2001:db8::1");
}

TEST_F(SimBackendTest, AdvancedOptions) {
    QelCtl::Adv::AdvancedOptionImpl options;
    auto timeout = options.FindOption("/UserVars/VelkTimeOut");
    auto* integer = dynamic_cast<HostCtl::Adv::AdvancedIntegerOption*>(timeout.get());
    ASSERT_NE(integer, nullptr);
    EXPECT_EQ(integer->GetCurrent(), 600);
    integer->SetCurrent(900);
    EXPECT_EQ(integer->GetCurrent(), 900);
    EXPECT_EQ(State()["advancedOptions"]["/UserVars/VelkTimeOut"], 900);

    EXPECT_EQ(options.FindOption("/UserVars/Missing"), nullptr);

    Edit([](json& s) { s["advancedOptions"]["/UserVars/Motd"] = "hello"; });
    auto motd = options.FindOption("/UserVars/Motd");
    auto* text = dynamic_cast<HostCtl::Adv::AdvancedStringOption*>(motd.get());
    ASSERT_NE(text, nullptr);
    EXPECT_EQ(text->GetCurrent(), "hello");
    text->SetCurrent("bye");
    EXPECT_EQ(State()["advancedOptions"]["/UserVars/Motd"], "bye");

    // An option that changed kind or vanished meanwhile is not overwritten.
    HostCtl::Adv::AdvancedIntegerOption stale("/UserVars/Motd", 1);
    EXPECT_THROW(stale.SetCurrent(2), HostCtlException);
    EXPECT_EQ(stale.GetCurrent(), 1);
    EXPECT_EQ(State()["advancedOptions"]["/UserVars/Motd"], "bye");
    EXPECT_THROW(HostCtl::Adv::AdvancedIntegerOption("/UserVars/Gone", 1).SetCurrent(2), HostCtlException);
    EXPECT_FALSE(State()["advancedOptions"].contains("/UserVars/Gone"));

    EXPECT_FALSE(options.HasUserOption("PXEBootEnabled"));
    Edit([](json& s) { s["userOptions"]["PXEBootEnabled"] = true; });
    EXPECT_TRUE(options.HasUserOption("PXEBootEnabled"));
}

TEST_F(SimBackendTest, SmartCardTokens) {
    Edit([](json& s) {
        s["smartCards"]["slots"] =
            json::array({{{"name", "slot0"}, {"token", nullptr}},
                         {{"name", "slot1"}, {"token", {{"label", "PIV"}, {"userIds", {"alice", "root"}}}}}});
    });
    QelCtl::Hardware::SmartCardInfoImpl cards;
    auto slots = cards.GetAllSlots();
    ASSERT_EQ(slots.size(), 2u);
    EXPECT_EQ(slots[1].name, "slot1");
    QelCtl::Hardware::SmartCardToken token;
    EXPECT_FALSE(cards.GetToken(slots[0], token));
    ASSERT_TRUE(cards.GetToken(slots[1], token));
    EXPECT_EQ(token.label, "PIV");
    EXPECT_EQ(token.userIds, (std::vector<std::string>{"alice", "root"}));
    EXPECT_FALSE(cards.GetToken({"slot9"}, token));
}

TEST_F(SimBackendTest, KeyboardLayoutMustBeKnown) {
    QelCtl::System::SystemInfoImpl system;
    system.SetKeyboardLayout("German");
    EXPECT_EQ(system.GetKeyboardLayout(), "German");
    EXPECT_THROW(system.SetKeyboardLayout("Klingon"), HostCtlException);
    EXPECT_EQ(system.GetKeyboardLayout(), "German");
    EXPECT_EQ(system.GetKeyboardLayouts().size(), 29u);
}

TEST_F(SimBackendTest, KeyboardMappingsLoadOnlyForKnownLayouts) {
    QelCtl::System::SystemInfoImpl system;
    system.LoadKeyboardMappings("German");
    EXPECT_EQ(State()["system"]["loadedKeymap"], "German");
    EXPECT_THROW(system.LoadKeyboardMappings("Klingon"), HostCtlException);
    EXPECT_EQ(State()["system"]["loadedKeymap"], "German");
    // Loading mappings does not change the configured layout.
    EXPECT_NE(system.GetKeyboardLayout(), "German");
}

TEST_F(SimBackendTest, EveryCallReadsTheHostAgain) {
    QelCtl::Network::NetworkInfoImpl network;
    QelCtl::System::SystemInfoImpl system;
    QelCtl::Resource::ResourceInfoImpl resources;
    EXPECT_EQ(network.GetPnics().size(), 4u);
    EXPECT_TRUE(network.IsQelIpv6Enabled());
    EXPECT_FALSE(resources.HasRunningVirtualMachines());
    EXPECT_EQ(system.GetWelcomeMessage(), "");
    Edit([](json& s) {
        s["network"]["pnics"] = json::array();
        s["network"]["ipv6Enabled"] = false;
        s["vms"]["running"] = 3;
        s["system"]["welcomeMessage"] = "Hands off.";
        s["network"]["managementInterface"] = "";
    });
    EXPECT_TRUE(network.GetPnics().empty());
    EXPECT_FALSE(network.IsQelIpv6Enabled());
    EXPECT_TRUE(resources.HasRunningVirtualMachines());
    EXPECT_EQ(system.GetWelcomeMessage(), "Hands off.");
    network.UpdateManagementInterface();
    EXPECT_EQ(network.GetManagementInterface(), nullptr);

    network.SetQelIpv6Enabled(true);
    system.SetSystemAlert("disk failing");
    EXPECT_EQ(State()["network"]["ipv6EnabledAtBoot"], true);
    EXPECT_EQ(State()["system"]["systemAlert"], "disk failing");
}

}  // namespace

namespace {

using HostCtl::Lib::HostCtlException;
using nlohmann::json;
using QelCtl::Hardware::DriverVmDevice;
using QelCtl::Hardware::DriverVmInfoImpl;

using DriverVmTest = HostCtlTest::SimHostTest;

std::vector<std::string> OwnedIds(const std::vector<DriverVmDevice>& devices) {
    std::vector<std::string> ids;
    for (const DriverVmDevice& d : devices)
        if (d.owned) ids.push_back(d.id);
    return ids;
}

TEST_F(DriverVmTest, OwnershipRoundTripKeepsGroupsTogether) {
    DriverVmInfoImpl info;
    EXPECT_EQ(info.GetState(), 0);
    std::vector<DriverVmDevice> devices = info.GetDevices();
    ASSERT_GE(devices.size(), 3u);
    EXPECT_EQ(devices[0].id, "0000:03:00.0");
    EXPECT_EQ(devices[0].name, "Acme SATA Controller");
    EXPECT_EQ(devices[0].group, devices[1].group);

    info.SetOwned({devices[0].id, devices[1].id});
    EXPECT_EQ(OwnedIds(info.GetDevices()), (std::vector<std::string>{devices[0].id, devices[1].id}));

    // Half a group or an unknown device is refused and changes nothing.
    const std::string before = HostCtlTest::ReadFile(StatePath());
    for (const std::vector<std::string>& bad :
         {std::vector<std::string>{devices[0].id}, std::vector<std::string>{"0000:99:00.0"}}) {
        EXPECT_THROW(info.SetOwned(bad), HostCtlException);
    }
    EXPECT_EQ(HostCtlTest::ReadFile(StatePath()), before);

    info.SetOwned({});
    EXPECT_TRUE(OwnedIds(info.GetDevices()).empty());

    // A host without a driver VM, and one whose state is out of range.
    Edit([](json& s) { s.erase("driverVm"); });
    EXPECT_EQ(info.GetState(), 0);
    EXPECT_TRUE(info.GetDevices().empty());
    Edit([](json& s) { s["driverVm"] = {{"state", 7}, {"devices", json::array()}}; });
    EXPECT_THROW(info.GetState(), HostCtlException);
    Edit([](json& s) { s["driverVm"]["state"] = 2; });
    EXPECT_EQ(info.GetState(), 2);
}

}  // namespace

namespace {

using HostCtl::Lib::Backend;
using HostCtl::Lib::HostCtlException;
using nlohmann::json;

class FaultTest : public HostCtlTest::SimHostTest {
protected:
    // The default host with a distributed switch, where every operation of
    // the table below succeeds (building the factory network needs a clear
    // one, clearing it a disabled core dump sender).
    void Reset(const std::string& operation) {
        json state = HostCtl::Lib::DefaultHostState();
        state["network"]["dvswitches"] = json::array(
            {{{"name", "kDS-1"},
              {"uplinkPorts", {{{"key", "uplink1"}, {"pnic", "zonic3"}}}},
              {"ports", {{{"key", "100"}, {"vlan", 0}, {"hostLocal", false}, {"connectee", ""}}}}}});
        state["network"]["netDumper"]["enabled"] = false;
        if (operation == "AutoConfigNetwork") {
            for (const char* list : {"vnics", "vswitches", "dvswitches"})
                state["network"][list] = json::array();
            state["network"]["managementInterface"] = "";
        }
        HostCtl::Lib::SimState(Root()).Replace(state);
        std::filesystem::create_directories(Root() + "/etc");
        HostCtlTest::WriteFile(Root() + "/etc/hosts", "192.0.2.100\thost1.example.test host1\n");
    }
};

TEST_F(FaultTest, EveryOperationFailsAsToldAndChangesNothing) {
    const std::string stack = "defaultTcpipStack";
    using Call = std::function<void(Backend&)>;
    HostCtl::Network::IpConfig dhcp;
    dhcp.SetUseDhcp(true);
    const std::vector<std::pair<std::string, Call>> calls = {
        {"GetVersionRecord", [](Backend& b) { b.GetVersionRecord(); }},
        {"GetHardwareVendor", [](Backend& b) { b.GetHardwareVendor(); }},
        {"GetHardwareProduct", [](Backend& b) { b.GetHardwareProduct(); }},
        {"GetCpuPackages", [](Backend& b) { b.GetCpuPackages(); }},
        {"GetCpuModel", [](Backend& b) { b.GetCpuModel(); }},
        {"GetMemoryPageSize", [](Backend& b) { b.GetMemoryPageSize(); }},
        {"GetMemoryTotalPages", [](Backend& b) { b.GetMemoryTotalPages(); }},
        {"GetPnics", [](Backend& b) { b.GetPnics(); }},
        {"GetManagementInterfaceName", [](Backend& b) { b.GetManagementInterfaceName(); }},
        {"GetVnicIpConfig", [](Backend& b) { b.GetVnicIpConfig("qk0"); }},
        {"SetVnicIpConfig", [&](Backend& b) { b.SetVnicIpConfig("qk0", dhcp); }},
        {"GetVnicConnectionPoint", [](Backend& b) { b.GetVnicConnectionPoint("qk0"); }},
        {"SetVnicConnectionPoint",
         [](Backend& b) { b.SetVnicConnectionPoint("qk0", HostCtl::Network::ConnectionPoint(2, "100")); }},
        {"GetVnicNames", [](Backend& b) { b.GetVnicNames(); }},
        {"GetVnicMacAddress", [](Backend& b) { b.GetVnicMacAddress("qk0"); }},
        {"SetVnicMacAddress", [](Backend& b) { b.SetVnicMacAddress("qk0", "00:50:56:01:00:09"); }},
        {"RenewVnicDhcpLease", [](Backend& b) { b.RenewVnicDhcpLease("qk0"); }},
        {"SetVnicEnabled", [](Backend& b) { b.SetVnicEnabled("qk0", false); }},
        {"GetIpv6Enabled", [](Backend& b) { b.GetIpv6Enabled(); }},
        {"SetIpv6Enabled", [](Backend& b) { b.SetIpv6Enabled(false); }},
        {"GetConnectionPointSwitch",
         [](Backend& b) {
             b.GetConnectionPointSwitch(HostCtl::Network::ConnectionPoint(1, "Management Network"));
         }},
        {"GetVirtualSwitchNames", [](Backend& b) { b.GetVirtualSwitchNames(); }},
        {"AddVirtualSwitch", [](Backend& b) { b.AddVirtualSwitch("kSwitch2"); }},
        {"GetVirtualSwitchUplinks", [](Backend& b) { b.GetVirtualSwitchUplinks("kSwitch0"); }},
        {"GetTeamingPolicy", [](Backend& b) { b.GetTeamingPolicy("kSwitch0"); }},
        {"GetMaxActiveUplinks", [](Backend& b) { b.GetMaxActiveUplinks("kSwitch0"); }},
        {"AddUplinkToTeamingPolicy",
         [](Backend& b) { b.AddUplinkToTeamingPolicy("kSwitch0", "zonic1", true); }},
        {"RemoveUplinkFromTeamingPolicy",
         [](Backend& b) { b.RemoveUplinkFromTeamingPolicy("kSwitch1", "zonic2"); }},
        {"GetPortGroupNames", [](Backend& b) { b.GetPortGroupNames("kSwitch0"); }},
        {"AddPortGroup", [](Backend& b) { b.AddPortGroup("kSwitch1", "Lab", 5); }},
        {"GetPortGroupVlanId", [](Backend& b) { b.GetPortGroupVlanId("kSwitch0", "Management Network"); }},
        {"SetPortGroupVlanId",
         [](Backend& b) { b.SetPortGroupVlanId("kSwitch0", "Management Network", 20); }},
        {"GetDistributedSwitchNames", [](Backend& b) { b.GetDistributedSwitchNames(); }},
        {"GetDvsUplinkPorts", [](Backend& b) { b.GetDvsUplinkPorts("kDS-1"); }},
        {"RemoveDvsUplink", [](Backend& b) { b.RemoveDvsUplink("kDS-1", "zonic3"); }},
        {"GetDvsPortVlanId", [](Backend& b) { b.GetDvsPortVlanId("kDS-1", "100"); }},
        {"AddDvsHostLocalPort", [](Backend& b) { b.AddDvsHostLocalPort("kDS-1", "100"); }},
        {"DisableNetDumper", [](Backend& b) { b.DisableNetDumper(); }},
        {"ClearNetworkConfig", [](Backend& b) { b.ClearNetworkConfig(); }},
        {"AutoConfigNetwork", [](Backend& b) { b.AutoConfigNetwork(); }},
        {"ResolveHostName", [](Backend& b) { b.ResolveHostName("www.example.test"); }},
        {"GetDns", [&](Backend& b) { b.GetDns(stack); }},
        {"SetHostname", [&](Backend& b) { b.SetHostname(stack, "esx7", true); }},
        {"SetFqdn", [&](Backend& b) { b.SetFqdn(stack, "esx7", "lab.test", true); }},
        {"RemoveNameServers", [&](Backend& b) { b.RemoveNameServers(stack); }},
        {"AddNameServer",
         [&](Backend& b) { b.AddNameServer(stack, HostCtl::Network::IpAddress("192.0.2.54")); }},
        {"SetSearchDomains", [&](Backend& b) { b.SetSearchDomains(stack, {"lab.test"}); }},
        {"SaveConfig", [&](Backend& b) { b.SaveConfig(stack); }},
        {"GetRouting", [&](Backend& b) { b.GetRouting(stack); }},
        {"SetDefaultGateway",
         [&](Backend& b) { b.SetDefaultGateway(stack, HostCtl::Network::Ipv4Address("192.0.2.254"), true); }},
        {"SetIpv6DefaultGateway",
         [&](Backend& b) { b.SetIpv6DefaultGateway(stack, HostCtl::Network::Ipv6Address("2001:db8::1")); }},
        {"GetWelcomeMessage", [](Backend& b) { b.GetWelcomeMessage(); }},
        {"GetSystemAlert", [](Backend& b) { b.GetSystemAlert(); }},
        {"SetSystemAlert", [](Backend& b) { b.SetSystemAlert("disk failing"); }},
        {"GetBootOptions", [](Backend& b) { b.GetBootOptions(); }},
        {"GetKeyboardLayout", [](Backend& b) { b.GetKeyboardLayout(); }},
        {"SetKeyboardLayout", [](Backend& b) { b.SetKeyboardLayout("German"); }},
        {"GetKeyboardLayouts", [](Backend& b) { b.GetKeyboardLayouts(); }},
        {"LoadKeyboardMappings", [](Backend& b) { b.LoadKeyboardMappings("German"); }},
        {"FindAdvancedOption", [](Backend& b) { b.FindAdvancedOption("/UserVars/VelkTimeOut"); }},
        {"SetAdvancedOption",
         [](Backend& b) {
             b.SetAdvancedOption("/UserVars/VelkTimeOut", {true, 30, ""});
         }},
        {"HasUserOption", [](Backend& b) { b.HasUserOption("PXEBootEnabled"); }},
        {"GetSmartCardSlots", [](Backend& b) { b.GetSmartCardSlots(); }},
        {"GetSmartCardToken", [](Backend& b) { b.GetSmartCardToken("slot0"); }},
        {"HasRunningVirtualMachines", [](Backend& b) { b.HasRunningVirtualMachines(); }},
        {"GetDriverVmState", [](Backend& b) { b.GetDriverVmState(); }},
        {"GetDriverVmDevices", [](Backend& b) { b.GetDriverVmDevices(); }},
        {"SetDriverVmOwned", [](Backend& b) { b.SetDriverVmOwned({}); }},
        // Services and firewall.
        {"GetFirewallRulesetEnabled", [](Backend& b) { b.GetFirewallRulesetEnabled("sshServer"); }},
        {"SetFirewallRulesetEnabled", [](Backend& b) { b.SetFirewallRulesetEnabled("sshServer", true); }},
        {"RunCommandLine",
         [&](Backend& b) {
             // The host's shell is the machine's.
             std::filesystem::create_directories(Root() + "/bin");
             std::error_code ec;
             std::filesystem::create_symlink("/bin/sh", Root() + "/bin/sh", ec);
             b.RunCommandLine("true", false, true);
         }},
    };
    // The table covers every operation the backend lists, in its order.
    std::vector<std::string> names;
    for (const auto& [name, call] : calls) names.push_back(name);
    EXPECT_EQ(names, HostCtl::Lib::SimulatedOperations());

    Backend& backend = HostCtl::Lib::GetBackend();
    for (const auto& [name, call] : calls) {
        SCOPED_TRACE(name);
        Reset(name);
        const std::string message = "injected failure of " + name;
        Edit([&](json& s) { s["faults"][name] = message; });
        const std::string state = HostCtlTest::ReadFile(StatePath());
        const std::string hosts = HostCtlTest::ReadFile(Root() + "/etc/hosts");
        try {
            call(backend);
            ADD_FAILURE() << "no failure";
        } catch (const HostCtlException& e) {
            EXPECT_EQ(std::string(e.what()), message);
        }
        EXPECT_EQ(HostCtlTest::ReadFile(StatePath()), state);
        EXPECT_EQ(HostCtlTest::ReadFile(Root() + "/etc/hosts"), hosts);

        // Another operation's fault does not touch this one.
        Edit([&](json& s) { s["faults"] = {{name == "GetPnics" ? "GetDns" : "GetPnics", "elsewhere"}}; });
        EXPECT_NO_THROW(call(backend));
    }

    Reset("");
    Edit([](json& s) { s["faults"] = "GetPnics"; });
    EXPECT_THROW(backend.GetPnics(), HostCtlException);
}

// The real machine's backend refuses every operation with a text that names it.
TEST(UnsupportedHostBackendTest, RefusesTheNetworkOperationsByName) {
    std::unique_ptr<Backend> backend = HostCtl::Lib::MakeUnsupportedHostBackend();
    const std::string stack = "defaultTcpipStack";
    const std::vector<std::pair<const char*, std::function<void(Backend&)>>> calls = {
        {"renewing a DHCP lease", [](Backend& b) { b.RenewVnicDhcpLease("qk0"); }},
        {"setting a virtual NIC's MAC address",
         [](Backend& b) { b.SetVnicMacAddress("qk0", "00:50:56:01:00:09"); }},
        {"reading a virtual NIC's MAC address", [](Backend& b) { b.GetVnicMacAddress("qk0"); }},
        {"disabling a virtual NIC", [](Backend& b) { b.SetVnicEnabled("qk0", false); }},
        {"enabling a virtual NIC", [](Backend& b) { b.SetVnicEnabled("qk0", true); }},
        {"finding the switch of a connection point",
         [](Backend& b) { b.GetConnectionPointSwitch(HostCtl::Network::ConnectionPoint(1, "x")); }},
        {"listing a virtual switch's uplinks", [](Backend& b) { b.GetVirtualSwitchUplinks("kSwitch0"); }},
        {"reading a teaming policy", [](Backend& b) { b.GetTeamingPolicy("kSwitch0"); }},
        {"reading the number of active uplinks allowed",
         [](Backend& b) { b.GetMaxActiveUplinks("kSwitch0"); }},
        {"adding an uplink to a teaming policy",
         [](Backend& b) { b.AddUplinkToTeamingPolicy("kSwitch0", "zonic1", false); }},
        {"removing an uplink from a teaming policy",
         [](Backend& b) { b.RemoveUplinkFromTeamingPolicy("kSwitch0", "zonic1"); }},
        {"listing the port groups", [](Backend& b) { b.GetPortGroupNames("kSwitch0"); }},
        {"reading a port group's VLAN ID", [](Backend& b) { b.GetPortGroupVlanId("kSwitch0", "x"); }},
        {"setting a port group's VLAN ID", [](Backend& b) { b.SetPortGroupVlanId("kSwitch0", "x", 5); }},
        {"listing the distributed switches", [](Backend& b) { b.GetDistributedSwitchNames(); }},
        {"listing a distributed switch's uplink ports", [](Backend& b) { b.GetDvsUplinkPorts("kDS-1"); }},
        {"removing an uplink from a distributed switch",
         [](Backend& b) { b.RemoveDvsUplink("kDS-1", "zonic0"); }},
        {"setting the host name", [&](Backend& b) { b.SetHostname(stack, "esx1", true); }},
        {"setting the fully qualified host name",
         [&](Backend& b) { b.SetFqdn(stack, "esx1", "lab.test", true); }},
        {"removing the DNS servers", [&](Backend& b) { b.RemoveNameServers(stack); }},
        {"adding a DNS server",
         [&](Backend& b) { b.AddNameServer(stack, HostCtl::Network::IpAddress("::1")); }},
        {"setting the DNS search domains", [&](Backend& b) { b.SetSearchDomains(stack, {}); }},
        {"saving the network configuration", [&](Backend& b) { b.SaveConfig(stack); }},
        {"setting the IPv4 default gateway",
         [&](Backend& b) { b.SetDefaultGateway(stack, HostCtl::Network::Ipv4Address(), true); }},
        {"setting the IPv6 default gateway",
         [&](Backend& b) { b.SetIpv6DefaultGateway(stack, HostCtl::Network::Ipv6Address()); }},
    };
    for (const auto& [operation, call] : calls) {
        SCOPED_TRACE(operation);
        try {
            call(*backend);
            ADD_FAILURE() << "no failure";
        } catch (const HostCtlException& e) {
            EXPECT_EQ(std::string(e.what()).rfind(std::string(operation) + ": not available on this host", 0),
                      0u)
                << e.what();
        }
    }
}

}  // namespace
