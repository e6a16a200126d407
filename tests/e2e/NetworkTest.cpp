// "Configure Management Network" with the real console on a simulated host:
// the change set, the question on leaving, and the ordered apply with its
// failures, checked on screen, in the host's log and in the host's state.
#include "NetworkConsole.hpp"

namespace E2e {
namespace {

using nlohmann::json;

TEST_F(NetworkTest, StaticAddressThenTheWelcomeScreenShowsIt) {
    host.Set("/network/lan/0/hosts/192.0.2.254", json::object());  // the new gateway
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kIpv4, StaticIpv4("192.0.2.10", "255.255.255.0", "192.0.2.254")));
    ASSERT_TRUE(SelectEntry(*t, "IPv4 Configuration"));
    EXPECT_TRUE(t->Shows("IPv4 Address: 192.0.2.10"));
    EXPECT_TRUE(t->Shows("Default Gateway: 192.0.2.254"));
    EXPECT_TRUE(t->Shows("Manual"));
    // Nothing reached the host yet.
    EXPECT_EQ(host.Get("/network/vnics/0/ipv4/address"), "192.0.2.100");

    ASSERT_TRUE(LeaveAndApply());
    const std::vector<std::string> steps = {"Setting ipv4 configuration to 192.0.2.10/255.255.255.0 on qk0",
                                            "Setting ipv6 configuration",
                                            "Setting default gateway to 192.0.2.254",
                                            "Setting hostname to host1",
                                            "Setting nameservers to 192.0.2.53",
                                            "Setting suffixes to example.test",
                                            "Network settings changed."};
    EXPECT_EQ(Logged(steps), steps) << Joined(host.SyslogLines());
    // Only what changed, and without DHCP no renewal; a name without a dot
    // is a host name, not a fully qualified one.
    EXPECT_EQ(Operations(host), (std::vector<std::string>{
                                    "SetIpv6Enabled", "SetVnicIpConfig", "SetDefaultGateway", "SetHostname",
                                    "RemoveNameServers", "AddNameServer", "SetSearchDomains", "SaveConfig"}));
    EXPECT_EQ(host.Get("/network/vnics/0/ipv4/netmask"), "255.255.255.0");

    // The main menu reads the host at once, the welcome screen after log-out.
    ASSERT_TRUE(WaitForMenu(*t));
    ASSERT_TRUE(SelectEntry(*t, "Configure Management Network"));
    EXPECT_TRUE(t->Shows("192.0.2.10"));
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForWelcome(*t));
    EXPECT_TRUE(t->WaitForText("http://192.0.2.10/ (STATIC)"));
}

TEST_F(NetworkTest, EveryStepAppliesInItsOrder) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(EditEverything());
    ASSERT_TRUE(LeaveAndApply());

    const std::vector<std::string> steps = {
        "Setting adapters to zonic0 zonic1",
        "Adding uplink zonic1",
        "Setting VlanID to 20",
        "Setting ipv4 configuration to 198.51.100.10/255.255.255.0 on qk0",
        "Setting ipv6 configuration",
        "Setting default gateway to 198.51.100.1",
        "Setting default ipv6 gateway to 2001:db8:20::1",
        "Changed vlan, restarting management interface",
        "Setting hostname to esx7.lab.test",
        "Setting nameservers to 198.51.100.53 2001:db8:20::53",
        "Setting suffixes to lab.test, corp.test",
        "Network settings changed."};
    EXPECT_EQ(Logged(steps), steps) << Joined(host.SyslogLines());
    EXPECT_TRUE(NotLogged(host, "failed"));

    // What the host itself recorded, in order, with the agent's refresh last.
    EXPECT_EQ(Operations(host),
              (std::vector<std::string>{"AddUplinkToTeamingPolicy", "SetPortGroupVlanId", "SetIpv6Enabled",
                                        "SetVnicIpConfig", "SetDefaultGateway", "SetIpv6DefaultGateway",
                                        "SetVnicEnabled", "SetVnicEnabled", "SetFqdn", "RemoveNameServers",
                                        "AddNameServer", "AddNameServer", "SetSearchDomains", "SaveConfig"}));
    const std::vector<json> record = History(host, {"hostctl", "hrm-cmd"});
    ASSERT_FALSE(record.empty());
    EXPECT_EQ(record.back().value("command", ""), "internalsvc/refresh") << json(record).dump(1);
    EXPECT_EQ(History(host, {"hostctl"})[0]["args"], json({"kSwitch0", "zonic1", "active"}));

    const json network = host.Get("/network");
    EXPECT_EQ(network["vswitches"][0]["portgroups"][0]["vlan"], 20);
    const json& vnic = network["vnics"][0];
    EXPECT_EQ(vnic["ipv4"]["address"], "198.51.100.10");
    bool staticV6 = false;
    for (const json& a : vnic["ipv6"]["addresses"])
        staticV6 |= a["address"] == "2001:db8:20::10" && a["prefix"] == 64 && a["type"] == "static";
    EXPECT_TRUE(staticV6) << vnic.dump(1);
    EXPECT_EQ(network["routing"]["ipv4Gateway"], "198.51.100.1");
    EXPECT_EQ(network["routing"]["ipv6Gateway"], "2001:db8:20::1");
    EXPECT_EQ(network["dns"]["hostname"], "esx7");
    EXPECT_EQ(network["dns"]["domain"], "lab.test");
    EXPECT_EQ(network["dns"]["servers"], json{"198.51.100.53"});
    EXPECT_EQ(network["dns"]["ipv6Servers"], json{"2001:db8:20::53"});
    EXPECT_EQ(network["dns"]["searchDomains"], json({"lab.test", "corp.test"}));
}

// The gateway the window dropped with the static address is written before
// the renewal, which brings the lease's gateway.
TEST_F(StaticNetworkTest, DhcpOnAVlanWithAServerShowsTheLease) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kVlan, {"20"}));
    ASSERT_TRUE(Edit(kIpv4, {"Down", " "}));
    ASSERT_TRUE(LeaveAndApply());
    EXPECT_TRUE(WaitForLog(host, "Switching to DHCP on qk0"));
    EXPECT_TRUE(WaitForLog(host, "Renew DHCP lease on qk0"));
    EXPECT_EQ(host.Get("/network/routing/ipv4Gateway"), "198.51.100.1");
    ASSERT_TRUE(WaitForMenu(*t));
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForWelcome(*t));
    EXPECT_TRUE(t->WaitForText("http://198.51.100.100/ (DHCP)"));
    EXPECT_TRUE(t->Lacks("DHCP lookup failed"));
}

// The bottom line shows each step cut to the screen's width by columns: a
// wide character that no longer fits is left out whole.
TEST_F(NetworkTest, StepLineIsCutByColumns) {
    std::string wide;
    for (int i = 0; i < 30; ++i) wide += "\u540d";
    host.Set("/network/dns/hostname", "x" + wide);
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kSuffixes, {"lab.test"}));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    t->Send("y");
    // The host refuses such a name: its error box holds the apply at that step.
    ASSERT_TRUE(t->WaitForText(kErrorTitle));
    EXPECT_EQ(t->RowTextTrimmed(24), " Setting hostname to x" + wide.substr(0, 28 * 3)) << t->Dump();
    t->SendKey("Enter");
    ASSERT_TRUE(WaitForLog(host, "Network settings changed."));
}

// A read of the management switch that fails as the window opens ends the
// window with the main menu's error box.
class EntryReadTest : public NetworkTest, public ::testing::WithParamInterface<const char*> {};

TEST_P(EntryReadTest, EndsTheWindowWithTheMenusErrorBox) {
    host.Fail(GetParam(), "the switch is locked");
    ASSERT_TRUE(StartInMenu());
    ASSERT_TRUE(SelectEntry(*t, "Configure Management Network"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Operation on the management network interface failed."));
    EXPECT_TRUE(t->Lacks(kNetworkFooter)) << t->Dump();
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("Operation on the management network interface failed."));
    EXPECT_TRUE(WaitForMenu(*t));
    EXPECT_TRUE(WaitForLog(host, "the switch is locked"));
}

INSTANTIATE_TEST_SUITE_P(Reads, EntryReadTest, ::testing::Values("GetTeamingPolicy", "GetPortGroupVlanId"),
                         [](const auto& info) { return std::string(info.param); });

// One host operation made to fail: its line is logged and shown, and the
// steps after it still reach the host.
struct FaultCase {
    const char* name;
    const char* operation;  // "" when the step is made to fail by its input
    const char* line;       // the failure line, up to the exception's text
};
void PrintTo(const FaultCase& c, std::ostream* os) { *os << c.name; }

class NetworkFaultTest : public NetworkTest, public ::testing::WithParamInterface<FaultCase> {};

TEST_P(NetworkFaultTest, FailedStepIsShownAndTheRestGoesOn) {
    const FaultCase& c = GetParam();
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(EditEverything());
    // After the edits: a read that fails when the window opens keeps its
    // entry from being edited at all.
    if (*c.operation)
        host.Fail(c.operation);
    else  // The network address of its own subnet passes the dialog but not the host.
        ASSERT_TRUE(Edit(kIpv4, StaticIpv4("198.51.100.0", "255.255.255.0", "198.51.100.1")));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    t->Send("y");
    ASSERT_TRUE(t->WaitForText(kErrorTitle));
    EXPECT_TRUE(t->Shows(c.line)) << t->Dump();
    // Later failures of the same fault (a step may call it more than once)
    // are closed too.
    for (int i = 0; i < 5 && t->Contains(kErrorTitle); ++i) {
        t->SendKey("Enter");
        ASSERT_TRUE(t->WaitQuiet(Duration(200)));
    }
    // A change left incomplete may fail its checks: it is kept here, to see
    // what reached the host.
    if (t->Contains("Check Management Network")) t->SendKey("F11");
    ASSERT_TRUE(WaitForLog(host, "Network settings changed."));
    EXPECT_FALSE(host.ConsoleLog(std::string("user.err: ") + c.line, t->Pid()).empty())
        << Joined(host.SyslogLines());

    // The last steps reached the host all the same.
    EXPECT_EQ(host.Get("/network/dns/searchDomains"), json({"lab.test", "corp.test"}));
    ASSERT_TRUE(WaitForHistory(host, "hrm-cmd"));
}

const FaultCase kFaultCases[] = {
    {"AddUplink", "AddUplinkToTeamingPolicy", "VS: add uplink to teaming policy failed: "},
    {"MaxActiveUplinks", "GetMaxActiveUplinks", "Getting max number of active uplinks failed: "},
    {"ReadVlan", "GetPortGroupVlanId", "Getting VlanID failed: "},
    {"SetVlan", "SetPortGroupVlanId", "Setting VlanID failed: "},
    {"StaticAddress", "", "Setting ip configuration failed: "},
    {"Ipv6Enablement", "SetIpv6Enabled", "Setting ipv6 configuration failed: "},
    {"IpConfiguration", "SetVnicIpConfig", "Setting ip/ipv6 configuration failed: "},
    {"Gateway", "SetDefaultGateway", "Setting default gateway failed: "},
    {"Ipv6Gateway", "SetIpv6DefaultGateway", "Setting default ipv6 gateway failed: "},
    {"Restart", "SetVnicEnabled", "Restarting management interface failed: "},
    {"Hostname", "SetFqdn", "Setting DNS failed: "},
    {"NameServers", "RemoveNameServers", "Setting DNS failed: "},
    {"Save", "SaveConfig", "Setting DNS failed: "},
};
INSTANTIATE_TEST_SUITE_P(Steps, NetworkFaultTest, ::testing::ValuesIn(kFaultCases),
                         [](const auto& info) { return std::string(info.param.name); });

// A step that takes a value away before it adds the new one, refused the
// addition: the step puts back what it removed, so the setting stays as it
// was (the host keeps its uplink, its name server).
struct RefusedAddition {
    const char* name;
    NetworkTest::Entry entry;
    std::vector<std::string> keys;
    const char* fault;    // an operation, with the argument whose calls fail
    const char* kept;     // the state the step leaves as it was
    const char* putBack;  // the log line of the put-back, or null: nothing was removed
};
void PrintTo(const RefusedAddition& c, std::ostream* os) { *os << c.name; }

class RefusedAdditionTest : public StaticNetworkTest,
                            public ::testing::WithParamInterface<RefusedAddition> {};

TEST_P(RefusedAdditionTest, PutsBackWhatTheStepRemoved) {
    const RefusedAddition& c = GetParam();
    const json before = host.Get(c.kept);
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(c.entry, c.keys));
    host.Fail(c.fault);
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    t->Send("y");
    ASSERT_TRUE(t->WaitForText(kErrorTitle));
    t->SendKey("Enter");
    ASSERT_TRUE(WaitForLog(host, "Network settings changed."));
    EXPECT_EQ(host.Get(c.kept), before);
    if (c.putBack) {
        EXPECT_TRUE(LoggedOnce(host, c.putBack, t->Pid()));
    }
}

const RefusedAddition kRefusedAdditions[] = {
    {"AdapterReplaced",
     NetworkTest::kAdapters,
     {" ", "Down", " "},
     "AddUplinkToTeamingPolicy zonic1",
     "/network/vswitches/0",
     "Putting back uplinks of kSwitch0: zonic0"},
    {"NameServerReplaced",
     NetworkTest::kDns,
     {"Down", "198.51.100.53"},
     "AddNameServer 198.51.100.53",
     "/network/dns",
     "Putting back nameservers 192.0.2.53"},
    {"SuffixesReplaced",
     NetworkTest::kSuffixes,
     {"lab.test"},
     "SetSearchDomains",
     "/network/dns/searchDomains",
     nullptr},
};
INSTANTIATE_TEST_SUITE_P(Steps, RefusedAdditionTest, ::testing::ValuesIn(kRefusedAdditions),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace E2e
