// velk-simhost and the simulated network: hosts created with network shapes,
// booting a host, and injected failures of host control operations.
#include <algorithm>
#include <filesystem>

#include "ToolTestSupport.hpp"
#include "hostctl/SimNetwork.hpp"

namespace ToolTest {
namespace {

namespace fs = std::filesystem;
using nlohmann::json;

using SimHostNetwork = HostTest;

TEST_F(SimHostNetwork, ShapesGiveConsistentHosts) {
    struct Case {
        const char* shapes;  // "" for the default host
        size_t pnics;
        int connectionType;
        const char* address;  // the gateway is 192.0.2.1 with an address
        bool ipv6;
        std::vector<std::string> managementUplinks;  // of kSwitch0, or of kDS-1 with a dvs
    };
    const Case cases[] = {
        {"", 4, 1, "192.0.2.100", true, {"zonic0"}},
        {"single-nic", 1, 1, "192.0.2.100", true, {"zonic0"}},
        {"dvs", 4, 2, "192.0.2.100", true, {"zonic0", "zonic1"}},
        {"ipv4-off", 4, 1, "0.0.0.0", true, {"zonic0"}},
        {"ipv6-off", 4, 1, "192.0.2.100", false, {"zonic0"}},
        {"no-dhcp", 4, 1, "0.0.0.0", true, {"zonic0"}},
        {"static", 4, 1, "192.0.2.10", true, {"zonic0"}},
        {"dvs,single-nic", 1, 2, "192.0.2.100", true, {"zonic0"}},
        {"static,ipv6-off,dvs", 4, 2, "192.0.2.10", false, {"zonic0", "zonic1"}},
    };
    int n = 0;
    for (const Case& c : cases) {
        SCOPED_TRACE(c.shapes);
        const std::string root = _dir + "/shape" + std::to_string(n++);
        std::vector<std::string> args = {"create", root, "--hostname", "esx1.lab.test"};
        if (*c.shapes) args.insert(args.end(), {"--network", c.shapes});
        const Result created = SimHost(args);
        ASSERT_EQ(created.status, 0) << created.err;
        const json state = json::parse(ReadFile(root + "/host.json"));

        // Consistent: a boot finds nothing to change.
        json booted = state;
        HostCtl::Lib::BootNetwork(HostCtl::Lib::SimState(root), booted);
        EXPECT_EQ(booted, state);

        const json& network = state["network"];
        const json& qk0 = network["vnics"][0];
        const bool addressed = std::string(c.address) != "0.0.0.0";
        EXPECT_EQ(network["pnics"].size(), c.pnics);
        EXPECT_EQ(qk0["connectionType"], c.connectionType);
        EXPECT_EQ(qk0["ipv4"]["address"], c.address);
        EXPECT_EQ(network["routing"]["ipv4Gateway"], addressed ? "192.0.2.1" : "0.0.0.0");
        EXPECT_EQ(network["ipv6Enabled"], c.ipv6);
        EXPECT_EQ(network["ipv6EnabledAtBoot"], c.ipv6);
        EXPECT_EQ(qk0["ipv6"]["addresses"].size(), c.ipv6 ? 1u : 0u);
        EXPECT_EQ(network["dns"]["domain"], "lab.test");
        if (c.connectionType == 2) {
            ASSERT_EQ(network["dvswitches"].size(), 1u);
            std::vector<std::string> used;
            for (const json& port : network["dvswitches"][0]["uplinkPorts"]) used.push_back(port["pnic"]);
            EXPECT_EQ(used, c.managementUplinks);
            EXPECT_EQ(qk0["dvs"], "kDS-1");
            EXPECT_EQ(qk0["port"], "100");
            EXPECT_TRUE(network["vswitches"][0]["uplinks"].empty());
        } else {
            EXPECT_EQ(network["vswitches"][0]["teaming"]["active"], json(c.managementUplinks));
        }
        // Every NIC is attached to one switch at most.
        std::vector<std::string> attached;
        for (const json& sw : network["vswitches"])
            for (const json& pnic : sw["uplinks"]) attached.push_back(pnic);
        for (const json& dvs : network["dvswitches"])
            for (const json& port : dvs["uplinkPorts"])
                if (port["pnic"] != "") attached.push_back(port["pnic"]);
        std::sort(attached.begin(), attached.end());
        EXPECT_EQ(std::adjacent_find(attached.begin(), attached.end()), attached.end());

        // The network's DNS knows the host by the address it was created with.
        const json zone = network["dnsZone"];
        EXPECT_EQ(zone.value("esx1.lab.test", json()), addressed ? json({c.address}) : json()) << zone;

        // The hosts file has the host's line exactly while it has an address.
        const std::string hosts = ReadFile(root + "/etc/hosts");
        const std::string line = std::string(c.address) + "\tesx1.lab.test esx1\n";
        EXPECT_EQ(hosts.find(line) != std::string::npos, addressed) << hosts;
        EXPECT_EQ(hosts.find("esx1") != std::string::npos, addressed) << hosts;
        EXPECT_EQ(hosts.rfind("127.0.0.1\tlocalhost.localdomain localhost\n", 0), 0u) << hosts;
    }

    // Shapes that touch the name service: a static host has no DNS from DHCP.
    const json statically = json::parse(ReadFile(_dir + "/shape6/host.json"));
    EXPECT_EQ(statically["network"]["vnics"][0]["dhcpDns"], false);
    EXPECT_EQ(statically["network"]["dns"]["servers"], json({"192.0.2.53"}));
    EXPECT_EQ(statically["network"]["saved"]["dns"]["servers"], json({"192.0.2.53"}));
    const json noDhcp = json::parse(ReadFile(_dir + "/shape5/host.json"));
    EXPECT_FALSE(noDhcp["network"]["lan"]["0"].contains("dhcp"));
    EXPECT_TRUE(noDhcp["network"]["dns"]["servers"].empty());
}

TEST_F(SimHostNetwork, BadShapesCreateNothing) {
    const std::string fresh = _dir + "/fresh";
    for (const std::vector<std::string>& args : std::vector<std::vector<std::string>>{
             {"create", fresh, "--network"},
             {"create", fresh, "--network", "bogus"},
             {"create", fresh, "--network", "static,"},
             {"create", fresh, "--network", ""},
             {"create", fresh, "--network", "Static"},
             {"create", fresh, "--network", "ipv4-off,static"},
             {"create", fresh, "--network", "ipv4-off", "--network", "static"},
         }) {
        EXPECT_TRUE(Fails(SimHost(args), "velk-simhost: ")) << args.back();
        EXPECT_FALSE(fs::exists(fresh));
    }
}

// Faults are kept in the state; that the backend honours them is checked by
// SimBackendTest.EveryOperationFailsAsToldAndChangesNothing.
TEST_F(SimHostNetwork, InjectedFaults) {
    ASSERT_EQ(SimHost({"fail", _root, "GetPnics"}).status, 0);
    ASSERT_EQ(SimHost({"fail", _root, "SetHostname", "the host agent is not responding"}).status, 0);
    EXPECT_EQ(State()["faults"], json({{"GetPnics", "simulated failure of GetPnics"},
                                       {"SetHostname", "the host agent is not responding"}}));
    for (int i = 0; i < 2; ++i)  // clearing twice is fine
        ASSERT_EQ(SimHost({"fail", _root, "GetPnics", "--clear"}).status, 0);
    EXPECT_EQ(State()["faults"], json({{"SetHostname", "the host agent is not responding"}}));

    const std::string before = ReadFile(_root + "/host.json");
    struct Case {
        std::vector<std::string> args;
        const char* mentions;
    };
    const Case cases[] = {
        {{"fail", _root, "GetPnicz"}, "unknown operation \"GetPnicz\""},
        {{"fail", _root, "getpnics"}, "SetVnicIpConfig"},
        {{"fail", _root, "GetPnics", ""}, "may not be empty"},
        {{"fail", _root, "GetPnics", "a", "b"}, "fail takes ROOT OPERATION"},
        {{"fail", _root}, "fail takes ROOT OPERATION"},
        {{"fail"}, "fail takes ROOT OPERATION"},
        {{"fail", _dir + "/missing", "GetPnics"}, "missing/host.json"},
    };
    for (const Case& c : cases) EXPECT_TRUE(Fails(SimHost(c.args), c.mentions));
    // The list of known operations fits on the error's one line.
    EXPECT_EQ(Lines(SimHost({"fail", _root, "GetPnicz"}).err), 1u);
    EXPECT_EQ(ReadFile(_root + "/host.json"), before);
    EXPECT_FALSE(fs::exists(_dir + "/missing"));
}

TEST_F(SimHostNetwork, BootStartsFromTheSavedConfiguration) {
    Edit("/power/state", "rebooting");
    Edit("/network/ipv6EnabledAtBoot", false);
    Edit("/network/dns/hostname", "renamed");
    Edit("/network/vswitches/0/portgroups/0/vlan", 20);
    const Result booted = SimHost({"boot", _root});
    ASSERT_EQ(booted.status, 0) << booted.err;
    EXPECT_TRUE(booted.err.empty());
    const json state = State();
    EXPECT_EQ(state["power"]["state"], "on");
    EXPECT_EQ(state["network"]["ipv6Enabled"], false);
    EXPECT_EQ(state["network"]["dns"]["hostname"], "host1");
    EXPECT_EQ(state["network"]["vnics"][0]["ipv4"]["address"], "198.51.100.100");
    const std::string hosts = ReadFile(_root + "/etc/hosts");
    EXPECT_NE(hosts.find("198.51.100.100\thost1.example.test host1\n"), std::string::npos) << hosts;
    EXPECT_EQ(hosts.find("192.0.2.100"), std::string::npos) << hosts;

    WriteFile(_root + "/host.json", "{\"network\": {}}");
    struct Case {
        std::vector<std::string> args;
        const char* mentions;
    };
    const Case cases[] = {
        {{"boot", _root}, "host.json: missing field /network/saved"},
        {{"boot"}, "boot takes ROOT"},
        {{"boot", _dir + "/missing"}, "missing/host.json"},
    };
    for (const Case& c : cases) EXPECT_TRUE(Fails(SimHost(c.args), c.mentions));
    EXPECT_EQ(ReadFile(_root + "/host.json"), "{\"network\": {}}");
    EXPECT_EQ(Lines(SimHost({"boot", _root}).err), 1u);
    EXPECT_FALSE(fs::exists(_dir + "/missing"));
}

}  // namespace
}  // namespace ToolTest
