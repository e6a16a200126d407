// The host control operations on a simulated host: what one write leaves for
// the next read, and the packing of the version record.
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstring>
#include <filesystem>

#include "LinuxBackend.hpp"
#include "TestSupport.hpp"

namespace {

using namespace HostCtlTest;

using SimBackendTest = SimHostTest;

void GetVersionRecord(void* record, size_t size) {
    QelCtl::Util::SysinfoUtil::SysinfoGet(QelCtl::Util::SysinfoNode::SystemVersion, nullptr, record, size);
}

TEST_F(SimBackendTest, VersionRecordIsPackedAndCutAtItsOffsets) {
    Edit([](json& s) {
        s["version"] = {{"product", "Tarni"},
                        {"version", "8.0.2"},
                        {"kernelRelease", "8.0.2-k"},
                        {"build", "releasebuild-22380479"},
                        {"buildNumber", 0xa1b2c3d4u}};
    });
    char record[QelCtl::Util::SYSINFO_VERSION_SIZE];
    memset(record, 0xee, sizeof record);
    GetVersionRecord(record, sizeof record);
    char expected[QelCtl::Util::SYSINFO_VERSION_SIZE] = {};
    memcpy(expected + 0, "Tarni", 5);
    memcpy(expected + 32, "8.0.2", 5);
    memcpy(expected + 96, "8.0.2-k", 7);
    memcpy(expected + 128, "releasebuild-22380479", 21);
    const uint32_t build = 0xa1b2c3d4u;
    memcpy(expected + 292, &build, 4);
    for (size_t i = 0; i < sizeof record; ++i) ASSERT_EQ(record[i], expected[i]) << "byte " << i;

    // Overlong texts are cut inside their fields.
    Edit([](json& s) {
        s["version"]["product"] = std::string(40, 'P');
        s["version"]["version"] = std::string(70, 'V');
        s["version"]["kernelRelease"] = std::string(32, 'K');
        s["version"]["build"] = std::string(200, 'B');
        s["version"]["buildNumber"] = 7;
    });
    GetVersionRecord(record, sizeof record);
    EXPECT_EQ(std::string(record + 0), std::string(31, 'P'));
    EXPECT_EQ(std::string(record + 32), std::string(63, 'V'));
    EXPECT_EQ(std::string(record + 96), std::string(31, 'K'));
    EXPECT_EQ(std::string(record + 128), std::string(163, 'B'));
    uint32_t cutBuild;
    memcpy(&cutBuild, record + 292, 4);
    EXPECT_EQ(cutBuild, 7u);
}

TEST_F(SimBackendTest, VersionRecordNeedsAWholeBuffer) {
    char record[QelCtl::Util::SYSINFO_VERSION_SIZE - 1] = {};
    EXPECT_THROW(GetVersionRecord(record, sizeof record), HostCtlException);
    for (char c : record) ASSERT_EQ(c, 0);
}

TEST_F(SimBackendTest, IpConfigRoundTrip) {
    IpConfig config;
    config.SetUseDhcp(false, false, Ipv4Address("10.1.2.3"), Ipv4Address("255.255.252.0"));
    config.SetUseIpv6Dhcp(true);
    config.SetUseIpv6RouterAdvertised(false);
    config.SetDhcpDns(false);
    config.SetIpv6Network({Ipv6Network(Ipv6Address("2001:db8::10"), 64)});
    Mgmt().SetIpConfig(config);

    // A second backend on the same host, as another process would have.
    HostCtl::Lib::SetBackend(HostCtl::Lib::MakeSimulatedBackend(Root()));
    IpConfig read = Mgmt().GetIpConfig();
    EXPECT_FALSE(read.GetUseDhcp());
    EXPECT_FALSE(read.GetIpv4UseNone());
    EXPECT_EQ(read.GetIpv4Address().GetStringAddress(), "10.1.2.3");
    EXPECT_EQ(read.GetIpv4Netmask().GetStringAddress(), "255.255.252.0");
    EXPECT_TRUE(read.GetUseIpv6Dhcp());
    EXPECT_FALSE(read.GetUseIpv6RouterAdvertised());
    EXPECT_FALSE(read.GetDhcpDns());
    EXPECT_EQ(Ipv6(),
              (std::vector<std::string>{"fe80::250:56ff:fe01:2/64 autoconf", "2001:db8::10/64 static"}));
    // What the write did not cover stays.
    EXPECT_EQ(Mgmt().GetConnectionPoint().GetType(), ConnectionPoint::PortGroup);
    EXPECT_EQ(Mgmt().GetConnectionPoint().GetName(), "Management Network");

    // IPv4 off leaves the interface without an IPv4 address.
    config.SetIpv4UseNone();
    Mgmt().SetIpConfig(config);
    read = Mgmt().GetIpConfig();
    EXPECT_TRUE(read.GetIpv4UseNone());
    EXPECT_FALSE(read.GetUseDhcp());
    EXPECT_TRUE(read.GetIpv4Address().IsZero());
    EXPECT_TRUE(read.GetIpv4Netmask().IsZero());
}

TEST_F(SimBackendTest, DnsWritesChangeOnlyTheirFields) {
    QelCtl::Network::DnsConfigImpl dns("defaultTcpipStack");
    dns.SetFqdn("esx1.lab.test", false);
    dns.RemoveNameServers();
    for (const char* server : {"10.0.0.53", "2001:DB8::53", "10.0.0.54", "10.0.0.53"})
        dns.AddNameServer(IpAddress(server));
    dns.SetSearchDomainsString("lab.test, corp.test");
    const std::vector<std::string> v4{"10.0.0.53", "10.0.0.54"};  // each listed once
    EXPECT_EQ(Texts(dns.GetNameServers()), v4);
    EXPECT_EQ(Texts(dns.GetIpv6NameServers()), std::vector<std::string>{"2001:db8::53"});
    EXPECT_EQ(dns.GetSearchDomains(), (std::vector<std::string>{"lab.test", "corp.test"}));

    dns.SetHostname("esx2", false);
    EXPECT_EQ(dns.GetDomain(), "lab.test");
    EXPECT_EQ(Texts(dns.GetNameServers()), v4);
    dns.RemoveNameServers();
    EXPECT_TRUE(dns.GetNameServers().empty());
    EXPECT_TRUE(dns.GetIpv6NameServers().empty());
    EXPECT_EQ(dns.GetSearchDomains().size(), 2u);
    EXPECT_EQ(dns.GetHostname(), "esx2");
    EXPECT_THROW(QelCtl::Network::DnsConfigImpl("otherStack").GetHostname(), HostCtlException);
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

TEST_F(SimBackendTest, KeyboardLayoutsAndMappingsMustBeKnown) {
    QelCtl::System::SystemInfoImpl system;
    EXPECT_EQ(system.GetKeyboardLayouts().size(), 29u);
    system.LoadKeyboardMappings("German");
    EXPECT_EQ(State()["system"]["loadedKeymap"], "German");
    EXPECT_NE(system.GetKeyboardLayout(), "German") << "loading mappings changed the configured layout";
    system.SetKeyboardLayout("German");
    EXPECT_EQ(system.GetKeyboardLayout(), "German");
    ExpectRefused([&] { system.SetKeyboardLayout("Klingon"); });
    ExpectRefused([&] { system.LoadKeyboardMappings("Klingon"); });
}

TEST_F(SimBackendTest, EveryCallReadsTheHostAgain) {
    QelCtl::Network::NetworkInfoImpl network;
    QelCtl::System::SystemInfoImpl system;
    QelCtl::Resource::ResourceInfoImpl resources;
    EXPECT_EQ(network.GetPnics().size(), 4u);
    EXPECT_FALSE(resources.HasRunningVirtualMachines());
    EXPECT_EQ(system.GetWelcomeMessage(), "");
    Edit([](json& s) {
        s["network"]["pnics"] = json::array();
        s["vms"]["running"] = 3;
        s["system"]["welcomeMessage"] = "Hands off.";
        s["network"]["managementInterface"] = "";
    });
    EXPECT_TRUE(network.GetPnics().empty());
    EXPECT_TRUE(resources.HasRunningVirtualMachines());
    EXPECT_EQ(system.GetWelcomeMessage(), "Hands off.");
    network.UpdateManagementInterface();
    EXPECT_EQ(network.GetManagementInterface(), nullptr);
    system.SetSystemAlert("disk failing");
    EXPECT_EQ(State()["system"]["systemAlert"], "disk failing");
}

using QelCtl::Hardware::DriverVmDevice;

std::vector<std::string> OwnedIds(const std::vector<DriverVmDevice>& devices) {
    std::vector<std::string> ids;
    for (const DriverVmDevice& d : devices)
        if (d.owned) ids.push_back(d.id);
    return ids;
}

TEST_F(SimBackendTest, DriverVmOwnershipKeepsGroupsTogether) {
    QelCtl::Hardware::DriverVmInfoImpl info;
    EXPECT_EQ(info.GetState(), 0);
    std::vector<DriverVmDevice> devices = info.GetDevices();
    ASSERT_GE(devices.size(), 3u);
    EXPECT_EQ(devices[0].id, "0000:03:00.0");
    EXPECT_EQ(devices[0].group, devices[1].group);

    info.SetOwned({devices[0].id, devices[1].id});
    EXPECT_EQ(OwnedIds(info.GetDevices()), (std::vector<std::string>{devices[0].id, devices[1].id}));
    // Half a group or an unknown device is refused.
    ExpectRefused([&] { info.SetOwned({devices[0].id}); });
    ExpectRefused([&] { info.SetOwned({"0000:99:00.0"}); });
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

using HostCtl::Lib::Backend;

// A call of the backend operation `name` with the given arguments.
// The checks after a change of the management network, on the simulated
// network: each row's state fails (or warns about) the named check.
TEST_F(SimBackendTest, NetworkChecksFindWhatCutsTheHostOff) {
    QelCtl::Network::NetworkTrialImpl trial;
    auto text = [](const std::vector<QelCtl::Network::NetworkCheck>& checks) {
        static const char* const OUTCOMES[] = {"passed", "FAILED", "warning"};
        std::vector<std::string> out;
        for (const auto& c : checks)
            out.push_back(c.subject + ": " + OUTCOMES[int(c.outcome)] +
                          (c.detail.empty() ? "" : " " + c.detail));
        return out;
    };
    EXPECT_EQ(text(trial.Check()),
              (std::vector<std::string>{"link of zonic0: passed", "address 192.0.2.100: passed",
                                        "gateway 192.0.2.1: passed", "name server 192.0.2.53: passed"}));

    const auto booted = [](std::function<void(json&)> edit) {
        return [=](json& s) {
            edit(s);
            HostCtl::Lib::BootNetwork(HostCtl::Lib::SimState("."), s);
        };
    };
    const auto staticAddress = [](const char* address) {
        return [=](json& s) {
            s["network"]["vnics"][0]["ipv4"]["dhcp"] = false;
            s["network"]["vnics"][0]["ipv4"]["address"] = address;
        };
    };
    struct Case {
        const char* name;
        std::function<void(json&)> edit;
        const char* check;  // the row of text() that tells
        bool passed;
    };
    const Case cases[] = {
        {"gateway of another VLAN's segment", Set("/network/routing/ipv4Gateway", "198.51.100.1"),
         "gateway 198.51.100.1: FAILED no answer", false},
        {"gateway is the host itself", Set("/network/routing/ipv4Gateway", "192.0.2.100"),
         "gateway 192.0.2.100: FAILED the host's own address", false},
        {"address of a machine on the segment", staticAddress("192.0.2.53"),
         "address 192.0.2.53: FAILED duplicate address, used by a machine on VLAN 0", false},
        {"address of the router, named",
         [&](json& s) {
             staticAddress("192.0.2.1")(s);
             s["network"]["lan"]["0"]["hosts"]["192.0.2.1"]["name"] = "gw-lab";
         },
         "address 192.0.2.1: FAILED duplicate address, used by gw-lab", false},
        {"address leased to another client",
         [&](json& s) {
             staticAddress("192.0.2.150")(s);
             s["network"]["lan"]["0"]["dhcp"]["leases"]["00:50:56:AA:00:01"] = "192.0.2.150";
         },
         "address 192.0.2.150: FAILED duplicate address, used by 00:50:56:AA:00:01", false},
        {"static IPv6 address of a DNS server", booted([](json& s) {
             Vlan20(s);
             s["network"]["vnics"][0]["ipv6"]["static"] = {{{"address", "2001:db8:20::53"}, {"prefix", 64}}};
         }),
         "address 2001:db8:20::53: FAILED duplicate address, used by a machine on VLAN 20", false},
        {"VLAN without a DHCP server", booted([](json& s) { SetMgmtVlan(s, 30); }),
         "IPv4 address (DHCP): FAILED no address", false},
        {"link down", Set("/network/pnics/0/linkUp", false), "link of zonic0: FAILED no carrier", false},
        {"standby uplink down beside a working one",
         [](json& s) {
             s["network"]["vswitches"][0]["uplinks"] = {"zonic0", "zonic3"};
             s["network"]["vswitches"][0]["teaming"]["standby"] = {"zonic3"};
         },
         "link of zonic3: warning no carrier", true},
        {"interface disabled", Set("/network/vnics/0/enabled", false), "link of qk0: FAILED interface down",
         false},
        {"dead name server", Set("/network/dns/servers", {"192.0.2.53", "192.0.2.54"}),
         "name server 192.0.2.54: warning no answer", true},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        json state = HostCtl::Lib::DefaultHostState();
        c.edit(state);
        Reset(state);
        const auto checks = trial.Check();
        const std::vector<std::string> rows = text(checks);
        EXPECT_NE(std::find(rows.begin(), rows.end(), c.check), rows.end()) << testing::PrintToString(rows);
        EXPECT_EQ(QelCtl::Network::NetworkTrialImpl::Passed(checks), c.passed);
    }

    // Before the change: who answers for an address is named; a free one,
    // the host's own lease and an address asked without link pass.
    Reset();
    EXPECT_EQ(trial.ProbeAddress(Ipv4Address("192.0.2.53")),
              "192.0.2.53 is already used on the management network by a machine on VLAN 0");
    EXPECT_EQ(trial.ProbeAddress(Ipv4Address("192.0.2.9")), std::nullopt);
    EXPECT_EQ(trial.ProbeAddress(Ipv4Address("192.0.2.100")), std::nullopt);
    // A probe that cannot be made is an error, not an answer.
    Edit(Set("/faults/ProbeIpv4Address", "no raw socket"));
    EXPECT_THROW(trial.ProbeAddress(Ipv4Address("192.0.2.53")), HostCtlException);
    Reset();
    Edit(Set("/network/pnics/0/linkUp", false));
    EXPECT_EQ(trial.ProbeAddress(Ipv4Address("192.0.2.53")), std::nullopt);
}

// Saved, changed, put back: everything the network settings change returns,
// the hosts file with it; a marker that makes no sense is never applied.
TEST_F(SimBackendTest, NetworkTrialSavesKeepsAndReverts) {
    QelCtl::Network::NetworkTrialImpl trial;
    QelCtl::Network::NetworkInfoImpl network;
    QelCtl::Network::DnsConfigImpl dns(STACK);
    const std::string marker = Root() + "/var/lib/velk/network/trial";
    std::filesystem::create_directories(Root() + "/etc");
    WriteFile(Root() + "/etc/hosts", "127.0.0.1\tlocalhost\n192.0.2.100\thost1.example.test host1\n");
    const std::string before = network.GetNetworkConfig(), hostsBefore = ReadFile(Root() + "/etc/hosts");
    const std::string description = trial.Describe();
    EXPECT_EQ(description,
              "management interface qk0, IPv4 DHCP 192.0.2.100/24, IPv6 none, gateways 192.0.2.1, VLAN 0, "
              "adapters zonic0, name servers 192.0.2.53, host name host1.example.test");
    auto change = [&] {
        IpConfig config = Mgmt().GetIpConfig();
        config.SetUseDhcp(false, false, Ipv4Address("198.51.100.10"), Ipv4Address("255.255.254.0"));
        Mgmt().SetIpConfig(config);
        VirtualSwitch("kSwitch0").SetPortGroupVlanId("Management Network", 20);
        dns.SetFqdn("esx7.lab.test", true);
        dns.SetSearchDomainsString("lab.test");
        dns.RemoveNameServers();
        dns.AddNameServer(IpAddress("198.51.100.53"));
        QelCtl::Network::RoutingInfoImpl(STACK).SetQelKernelDefaultGateway(Ipv4Address("198.51.100.1"), true);
        network.SetQelIpv6Enabled(false);
    };

    EXPECT_FALSE(trial.Pending());
    EXPECT_THROW(trial.Revert(), HostCtlException);
    EXPECT_EQ(trial.Save("root").description, description);
    ASSERT_TRUE(trial.Pending());
    EXPECT_EQ(trial.Pending()->user, "root");
    EXPECT_EQ(trial.Pending()->description, description);
    EXPECT_FALSE(trial.Pending()->elsewhere);
    EXPECT_EQ(trial.Save("admin").user, "root");  // the first saved configuration stays
    change();
    EXPECT_NE(network.GetNetworkConfig(), before);
    EXPECT_NE(trial.Describe(), description);
    trial.Revert();
    EXPECT_EQ(network.GetNetworkConfig(), before);
    EXPECT_EQ(ReadFile(Root() + "/etc/hosts"), hostsBefore);
    EXPECT_FALSE(trial.Pending());
    EXPECT_FALSE(std::filesystem::exists(marker));

    trial.Save("root");
    change();
    const std::string changed = network.GetNetworkConfig();
    trial.Keep();
    EXPECT_FALSE(trial.Pending());
    EXPECT_EQ(network.GetNetworkConfig(), changed);

    // Another console's change is its own while that console runs: it is
    // neither taken over nor put back; once that console is gone, it is.
    int ready[2];
    ASSERT_EQ(pipe(ready), 0);
    const pid_t other = fork();
    if (other == 0) {
        QelCtl::Network::NetworkTrialImpl().Save("admin");
        (void)!write(ready[1], "s", 1);
        pause();
        _exit(0);
    }
    char byte = 0;
    ASSERT_EQ(read(ready[0], &byte, 1), 1);
    close(ready[0]);
    close(ready[1]);
    ASSERT_TRUE(trial.Pending());
    EXPECT_TRUE(trial.Pending()->elsewhere);
    EXPECT_THROW(trial.Save("root"), HostCtlException);
    EXPECT_THROW(trial.Revert(), HostCtlException);
    kill(other, SIGKILL);
    waitpid(other, nullptr, 0);
    EXPECT_FALSE(trial.Pending()->elsewhere);
    trial.Revert();
    EXPECT_FALSE(trial.Pending());

    // Garbage is logged and moved aside, and nothing is put back.
    WriteFile(marker, "{\"config\": \"{\\\"/network/vnics\\\"");
    EXPECT_FALSE(trial.Pending());
    EXPECT_TRUE(std::filesystem::exists(marker + ".unreadable"));
    EXPECT_NE(ReadFile(Root() + "/var/log/syslog.log").find(marker + " is not a saved network configuration"),
              std::string::npos);
    EXPECT_THROW(trial.Revert(), HostCtlException);
    // A configuration the host never gave out is refused; the marker stays.
    WriteFile(marker, json({{"config", "{\"/network/vnics\": 5}"},
                            {"description", "?"},
                            {"user", "root"},
                            {"time", "2026-11-24T08:00:00.000Z"}})
                          .dump());
    ExpectRefused([&] { trial.Revert(); });
    EXPECT_TRUE(trial.Pending());
    EXPECT_EQ(network.GetNetworkConfig(), changed);
}

#define CALL(name, ...) [&](Backend& b) { b.name(__VA_ARGS__); }
#define OP(name, ...) \
    { #name, CALL(name, __VA_ARGS__) }

TEST_F(SimBackendTest, EveryOperationFailsAsToldAndChangesNothing) {
    const std::string stack = "defaultTcpipStack";
    IpConfig dhcp;
    dhcp.SetUseDhcp(true);
    // On the host with a distributed switch every operation of this table
    // succeeds (building the factory network needs a clear one, clearing it
    // a disabled core dump sender).
    const ConnectionPoint dvsPort(2, "101"), mgmtGroup(1, "Management Network");
    const HostCtl::Network::IpAddress server("192.0.2.54");
    const Ipv4Address gateway("192.0.2.254");
    const Ipv6Address gateway6("2001:db8::1");
    const std::vector<std::string> domains{"lab.test"}, none;
    const HostCtl::Lib::AdvancedOptionValue timeout{true, 30, ""};
    const HostCtl::Network::DistributedSwitch::PortSettings portSettings{0, false, {"uplink1"}};
    std::vector<std::pair<std::string, std::function<void(Backend&)>>> calls = {
        OP(GetVersionRecord),
        OP(GetHardwareVendor),
        OP(GetHardwareProduct),
        OP(GetCpuPackages),
        OP(GetCpuModel),
        OP(GetMemoryPageSize),
        OP(GetMemoryTotalPages),
        OP(GetPnics),
        OP(GetManagementInterfaceName),
        OP(GetVnicIpConfig, "qk0"),
        OP(SetVnicIpConfig, "qk0", dhcp),
        OP(GetVnicConnectionPoint, "qk0"),
        OP(SetVnicConnectionPoint, "qk0", dvsPort),
        OP(GetVnicNames),
        OP(GetVnicMacAddress, "qk0"),
        OP(SetVnicMacAddress, "qk0", "00:50:56:01:00:0a"),
        OP(RenewVnicDhcpLease, "qk0"),
        OP(SetVnicEnabled, "qk0", false),
        OP(ProbeIpv4Address, "qk0", Ipv4Address("192.0.2.9")),
        OP(CheckNetwork, "qk0"),
        OP(GetIpv6Enabled),
        OP(SetIpv6Enabled, false),
        OP(GetConnectionPointSwitch, mgmtGroup),
        OP(GetVirtualSwitchNames),
        OP(AddVirtualSwitch, "kSwitch2"),
        OP(RemoveVirtualSwitch, "kSwitch1"),
        OP(GetVirtualSwitchUplinks, "kSwitch0"),
        OP(GetTeamingPolicy, "kSwitch0"),
        OP(GetMaxActiveUplinks, "kSwitch0"),
        OP(AddUplinkToTeamingPolicy, "kSwitch0", "zonic3", true),
        OP(RemoveUplinkFromTeamingPolicy, "kSwitch1", "zonic2"),
        OP(GetPortGroupNames, "kSwitch0"),
        OP(AddPortGroup, "kSwitch1", "Lab", 5),
        OP(GetPortGroupVlanId, "kSwitch0", "Management Network"),
        OP(SetPortGroupVlanId, "kSwitch0", "Management Network", 20),
        OP(GetDistributedSwitchNames),
        OP(GetDvsUplinkPorts, "kDS-1"),
        OP(RemoveDvsUplink, "kDS-1", "zonic1"),
        OP(AddDvsUplink, "kDS-1", "uplink2", "zonic3"),
        OP(GetDvsPortSettings, "kDS-1", "100"),
        OP(AddDvsHostLocalPort, "kDS-1", portSettings),
        OP(RemoveDvsHostLocalPort, "kDS-1", "101"),
        OP(DisableNetDumper),
        OP(ClearNetworkConfig),
        OP(AutoConfigNetwork),
        OP(GetNetworkConfig),
        OP(SetNetworkConfig, "{}"),
        OP(ResolveHostName, "www.example.test"),
        OP(GetDns, stack),
        OP(SetHostname, stack, "esx7", true),
        OP(SetFqdn, stack, "esx7", "lab.test", true),
        OP(RemoveNameServers, stack),
        OP(AddNameServer, stack, server),
        OP(SetSearchDomains, stack, domains),
        OP(SaveConfig, stack),
        OP(GetRouting, stack),
        OP(SetDefaultGateway, stack, gateway, true),
        OP(SetIpv6DefaultGateway, stack, gateway6),
        OP(GetWelcomeMessage),
        OP(GetSystemAlert),
        OP(SetSystemAlert, "disk failing"),
        OP(GetBootOptions),
        OP(GetKeyboardLayout),
        OP(SetKeyboardLayout, "German"),
        OP(GetKeyboardLayouts),
        OP(LoadKeyboardMappings, "German"),
        OP(FindAdvancedOption, "/UserVars/VelkTimeOut"),
        OP(SetAdvancedOption, "/UserVars/VelkTimeOut", timeout),
        OP(HasUserOption, "PXEBootEnabled"),
        OP(GetSmartCardSlots),
        OP(GetSmartCardToken, "slot0"),
        OP(HasRunningVirtualMachines),
        OP(GetDriverVmState),
        OP(GetDriverVmDevices),
        OP(SetDriverVmOwned, none),
        OP(GetFirewallRulesetEnabled, "sshServer"),
        OP(SetFirewallRulesetEnabled, "sshServer", true)};
    calls.emplace_back("RunCommandLine", [&](Backend& b) {
        // The host's shell is the machine's.
        std::filesystem::create_directories(Root() + "/bin");
        std::error_code ec;
        std::filesystem::create_symlink("/bin/sh", Root() + "/bin/sh", ec);
        b.RunCommandLine("true", false, true);
    });
    // The table covers every operation the backend lists, in its order.
    std::vector<std::string> names;
    for (const auto& [name, call] : calls) names.push_back(name);
    EXPECT_EQ(names, HostCtl::Lib::SimulatedOperations());

    Backend& backend = GetBackend();
    std::filesystem::create_directories(Root() + "/etc");
    for (const auto& [name, call] : calls) {
        SCOPED_TRACE(name);
        json state = HostWithDvs();
        state["network"]["netDumper"]["enabled"] = false;
        if (name == "AutoConfigNetwork") {
            for (const char* list : {"vnics", "vswitches", "dvswitches"})
                state["network"][list] = json::array();
            state["network"]["managementInterface"] = "";
        }
        state["faults"][name] = "injected failure of " + name;
        Reset(state);
        WriteFile(Root() + "/etc/hosts", "192.0.2.100\thost1.example.test host1\n");
        ExpectRefused([&] { call(backend); }, "injected failure of " + name);
        EXPECT_EQ(ReadFile(Root() + "/etc/hosts"), "192.0.2.100\thost1.example.test host1\n");

        // Another operation's fault does not touch this one.
        Edit([&](json& s) { s["faults"] = {{name == "GetPnics" ? "GetDns" : "GetPnics", "elsewhere"}}; });
        EXPECT_NO_THROW(call(backend));
    }

    // Named with an argument, a fault refuses only the calls with it.
    Reset();
    Edit([](json& s) { s["faults"] = {{"AddNameServer 192.0.2.9", "refused"}}; });
    ExpectRefused([&] { backend.AddNameServer("defaultTcpipStack", IpAddress("192.0.2.9")); }, "refused");
    EXPECT_NO_THROW(backend.AddNameServer("defaultTcpipStack", IpAddress("192.0.2.8")));

    Reset();
    Edit([](json& s) { s["faults"] = "GetPnics"; });
    EXPECT_THROW(backend.GetPnics(), HostCtlException);

    // A delay holds the call back, then it acts (or fails) as it would.
    Reset();
    Edit([](json& s) {
        s["delays"] = {{"AddNameServer 192.0.2.9", 0.3}};
        s["faults"] = {{"GetDns", "refused"}};
    });
    auto start = std::chrono::steady_clock::now();
    EXPECT_NO_THROW(backend.AddNameServer("defaultTcpipStack", IpAddress("192.0.2.8")));
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(300));
    Edit([](json& s) { s["delays"]["GetDns"] = 0.3; });
    start = std::chrono::steady_clock::now();
    EXPECT_NO_THROW(backend.AddNameServer("defaultTcpipStack", IpAddress("192.0.2.9")));
    ExpectRefused([&] { backend.GetDns("defaultTcpipStack"); }, "refused");
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(600));
}

// A Debian host's backend refuses what such a host does not have with a text
// naming the operation and the reason, without touching the machine.
TEST(LinuxBackendTest, RefusesWhatADebianHostLacks) {
    std::unique_ptr<Backend> backend = HostCtl::Lib::Linux::MakeLinuxBackend();
    const std::vector<std::pair<const char*, std::function<void(Backend&)>>> calls = {
        {"listing a distributed switch's uplinks: a Debian host has no distributed switches",
         CALL(GetDvsUplinkPorts, "dvs0")},
        {"creating a host-local distributed port: a Debian host has no distributed switches",
         CALL(AddDvsHostLocalPort, "dvs0", HostCtl::Network::DistributedSwitch::PortSettings{})},
        {"handing devices to the driver VM: a Debian host has no driver VM", CALL(SetDriverVmOwned, {"x"})},
        {"setting firewall ruleset \"sshServer\": a Debian host's firewall is not managed by Velk",
         CALL(SetFirewallRulesetEnabled, "sshServer", true)},
    };
    for (const auto& [text, call] : calls) {
        SCOPED_TRACE(text);
        try {
            call(*backend);
            ADD_FAILURE() << "no failure";
        } catch (const HostCtlException& e) {
            EXPECT_EQ(std::string(e.what()), text);
        }
    }
    EXPECT_TRUE(backend->GetDistributedSwitchNames().empty());
    EXPECT_EQ(backend->GetDriverVmState(), 0);
}

#undef OP
#undef CALL

}  // namespace
