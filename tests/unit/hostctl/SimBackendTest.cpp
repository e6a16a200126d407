// The host control operations on a simulated host: what one write leaves for
// the next read, and the packing of the version record.
#include <cstring>

#include "TestSupport.hpp"
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
    config.SetUseDhcp(false);
    config.SetIpv4UseNone(false);
    config.SetIpv4Address(Ipv4Address("10.1.2.3"));
    config.SetIpv4Netmask(Ipv4Address("255.255.252.0"));
    config.SetIpv6Dhcp(true);
    config.SetIpv6RouterAdvertisement(false);
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
    EXPECT_TRUE(read.GetIpv6Dhcp());
    EXPECT_FALSE(read.GetIpv6RouterAdvertisement());
    ASSERT_EQ(read.GetIpv6Network().size(), 3u);
    for (size_t i = 0; i < 3; ++i) {
        EXPECT_EQ(read.GetIpv6Network()[i].ToString(), config.GetIpv6Network()[i].ToString());
        EXPECT_EQ(read.GetIpv6Network()[i].GetIpv6AddressType(),
                  config.GetIpv6Network()[i].GetIpv6AddressType());
    }
    // What the write did not cover stays.
    EXPECT_EQ(State()["network"]["vnics"][0]["portgroup"], "Management Network");
    HostCtl::Network::ConnectionPoint point = HostCtl::Network::QelNic("qk0").GetConnectionPoint();
    EXPECT_EQ(point.GetType(), HostCtl::Network::ConnectionPoint::PortGroup);
    EXPECT_EQ(point.GetName(), "Management Network");
    EXPECT_THROW(HostCtl::Network::QelNic("qk7").SetIpConfig(config), HostCtlException);
}

TEST_F(SimBackendTest, DnsWritesChangeOnlyTheirFields) {
    QelCtl::Network::DnsConfigImpl dns("defaultTcpipStack");
    dns.SetFqdn("esx1.lab.test");
    dns.SetNameServers({IpAddress("10.0.0.53"), IpAddress("2001:DB8::53"), IpAddress("10.0.0.54")});
    dns.SetSearchDomains({"lab.test", "corp.test"});
    dns.SetUseDhcp(false);
    EXPECT_EQ(dns.GetHostname(), "esx1");
    EXPECT_EQ(dns.GetDomain(), "lab.test");
    EXPECT_FALSE(dns.GetUseDhcp());
    ASSERT_EQ(dns.GetNameServers().size(), 2u);
    EXPECT_EQ(dns.GetNameServers()[0].GetStringAddress(), "10.0.0.53");
    EXPECT_EQ(dns.GetNameServers()[1].GetStringAddress(), "10.0.0.54");
    ASSERT_EQ(dns.GetIpv6NameServers().size(), 1u);
    EXPECT_EQ(dns.GetIpv6NameServers()[0].GetStringAddress(), "2001:db8::53");
    EXPECT_EQ(dns.GetSearchDomains(), (std::vector<std::string>{"lab.test", "corp.test"}));

    dns.SetHostname("esx2");
    EXPECT_EQ(dns.GetHostname(), "esx2");
    EXPECT_EQ(dns.GetDomain(), "lab.test");
    EXPECT_EQ(dns.GetNameServers().size(), 2u);
    dns.SetFqdn("solo");
    EXPECT_EQ(dns.GetHostname(), "solo");
    EXPECT_EQ(dns.GetDomain(), "");
    dns.SetNameServers({});
    EXPECT_TRUE(dns.GetNameServers().empty());
    EXPECT_TRUE(dns.GetIpv6NameServers().empty());
    EXPECT_EQ(dns.GetSearchDomains().size(), 2u);

    EXPECT_THROW(QelCtl::Network::DnsConfigImpl("otherStack").GetHostname(), HostCtlException);
    EXPECT_THROW(QelCtl::Network::DnsConfigImpl("otherStack").SetHostname("x"), HostCtlException);
    EXPECT_EQ(dns.GetHostname(), "solo");
}

TEST_F(SimBackendTest, GatewaysAreSetOneAtATime) {
    QelCtl::Network::RoutingInfoImpl routing("defaultTcpipStack");
    routing.SetIpv6QelKernelDefaultGateway(Ipv6Address("2001:db8::1"));
    EXPECT_EQ(routing.GetQelKernelDefaultGateway().GetStringAddress(), "192.168.10.1");
    routing.SetQelKernelDefaultGateway(Ipv4Address("10.0.0.1"));
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
    EXPECT_EQ(network.GetPnics().size(), 1u);
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
    EXPECT_EQ(State()["network"]["ipv6Enabled"], true);
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
