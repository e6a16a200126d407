// The dialogs of "Configure Management Network": what each field refuses,
// what each dialog accepts, and when leaving the window asks a question. The
// entry rules are checked case by case in NetworkDialogRulesTest; here one
// case of each shows that the screen is wired to them.
#include "NetworkConsole.hpp"

namespace E2e {
namespace {

using nlohmann::json;

// The message of an error dialog is shown; Enter closes it.
::testing::AssertionResult Refused(Terminal& t, const std::string& title, const std::string& message) {
    if (auto shown = t.WaitForText(title); !shown) return shown;
    if (!t.Contains(message))
        return ::testing::AssertionFailure() << "no \"" << message << "\"\n" << t.Dump();
    t.SendKey("Enter");
    return t.WaitForTextGone(message);
}

// On a static address and on a DHCP lease, whose gateway stays as it is.
class UnchangedDialogsTest : public ::testing::WithParamInterface<const char*>, public NetworkTest {
protected:
    UnchangedDialogsTest() : NetworkTest(GetParam()) {}
};

TEST_P(UnchangedDialogsTest, ConfirmingEveryDialogUnchangedAsksNothingAndWritesNothing) {
    ASSERT_TRUE(OpenNetwork());
    for (const Entry entry : {kAdapters, kVlan, kIpv4, kIpv6, kDns, kSuffixes}) {
        ASSERT_TRUE(OpenDialog(entry));
        ASSERT_TRUE(Confirm(entry));
    }
    ASSERT_TRUE(SelectEntry(*t, "IPv4 Configuration", true));
    EXPECT_TRUE(t->Shows("Default Gateway: 192.0.2.1")) << t->Dump();
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForMenu(*t));
    EXPECT_TRUE(NotLogged(host, "Setting"));
    EXPECT_TRUE(History(host, {"hostctl"}).empty()) << host.Get("/history").dump(1);
    for (const json& e : History(host, {"hrm-cmd"})) EXPECT_NE(e.value("command", ""), "internalsvc/refresh");
}
INSTANTIATE_TEST_SUITE_P(Hosts, UnchangedDialogsTest, ::testing::Values("static", ""),
                         [](const auto& info) { return std::string(*info.param ? "Static" : "Dhcp"); });

// The VLAN field's limits, then the question on leaving: Esc keeps every
// edit, N drops them all.
TEST_F(NetworkTest, VlanLimitsAndTheQuestionOnLeaving) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog(kVlan));
    EXPECT_TRUE(t->Shows("If you are unsure how to configure or use a VLAN"));
    // Letters and signs cannot be typed; five digits at most.
    t->Send("a-_/ 123456");
    ASSERT_TRUE(t->WaitQuiet());
    EXPECT_TRUE(t->Shows("12345")) << t->Dump();
    EXPECT_TRUE(t->Lacks("123456"));
    t->SendKey("Enter");
    ASSERT_TRUE(Refused(*t, "Invalid VLAN ID", "Please reenter a valid VLAN ID (1-4095)."));
    // The refused text stays, selected: the next digit replaces it.
    EXPECT_TRUE(t->Shows(" 12345 ")) << t->Dump();
    Keys({"4095", "Enter"});
    ASSERT_TRUE(t->WaitForText("You entered a VLAN ID of 4095."));
    EXPECT_TRUE(t->Shows("Warning"));
    ASSERT_TRUE(Confirm(kVlan));
    EXPECT_TRUE(t->Shows("4095"));
    // The pre-filled value is replaced; no warning.
    ASSERT_TRUE(Edit(kVlan, {"4094"}));

    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    EXPECT_TRUE(t->Shows("Configure Management Network: Confirm"));
    t->Send("x");  // not an answer
    ASSERT_TRUE(t->WaitQuiet());
    EXPECT_TRUE(t->Shows(kRestartQuestion));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kNetworkFooter));
    ASSERT_TRUE(SelectEntry(*t, "VLAN (optional)"));
    EXPECT_TRUE(t->Shows("4094")) << t->Dump();

    // Empty: no VLAN. Back at the value read, but a dialog was confirmed with
    // another value on the way: the question comes.
    ASSERT_TRUE(Edit(kVlan, {"Backspace"}));
    EXPECT_TRUE(t->Shows("Not set"));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    t->Send("N");
    ASSERT_TRUE(WaitForMenu(*t));
    EXPECT_TRUE(History(host, {"hostctl"}).empty()) << host.Get("/history").dump(1);
}

// IPv6 off (row 0) and dynamic again (row 1) asks nothing; off alone asks
// for a reboot and is set for the boot.
TEST_F(NetworkTest, Ipv6OffAsksForARebootAndIsSetForTheBoot) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kIpv6, {" "}));
    ASSERT_TRUE(SelectEntry(*t, "IPv6 Configuration"));
    EXPECT_TRUE(t->Shows("IPv6 is disabled."));
    ASSERT_TRUE(Edit(kIpv6, {"Down", " "}));
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForMenu(*t));
    EXPECT_TRUE(NotLogged(host, "Setting"));

    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(kNetworkFooter));
    ASSERT_TRUE(Edit(kIpv6, {" "}));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRebootQuestion));
    t->Send("Y");
    ASSERT_TRUE(t->WaitForText("Restart in progress..."));
    ASSERT_TRUE(WaitForHistory(host, "reboot"));
    EXPECT_TRUE(WaitForLog(host, "Switching to DHCP on qk0") && WaitForLog(host, "Setting suffixes to"));
    // Set for the boot; the running interface keeps its IPv6 addresses.
    EXPECT_EQ(host.Get("/network/ipv6EnabledAtBoot"), false);
    EXPECT_FALSE(host.Get("/network/vnics/0/ipv6/addresses").empty());
}

class DvsNetworkTest : public NetworkTest {
protected:
    DvsNetworkTest() : NetworkTest("dvs") {}
};

TEST_F(DvsNetworkTest, AdaptersAndVlanAreGreyAndNeverApplied) {
    const json before = host.Get("/network/dvswitches");
    ASSERT_TRUE(OpenNetwork());
    for (const Entry entry : {kAdapters, kVlan}) {
        const auto at = t->Find(kDialogs[entry].entry);
        ASSERT_TRUE(at) << t->Dump();
        EXPECT_TRUE(t->CellAt(at->col, at->row).fg.IsIndex(6)) << kDialogs[entry].entry << "\n"
                                                               << t->Dump(true);
    }
    // The selection starts below them and cannot reach them.
    EXPECT_EQ(t->FindAll("IPv4 Configuration").size(), 2u) << t->Dump();
    Keys({"Up", "Up", "Enter"});
    ASSERT_TRUE(t->WaitForText("Set static IPv4 address"));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone("Set static IPv4 address"));

    ASSERT_TRUE(Edit(kIpv4, StaticIpv4("192.0.2.10", "255.255.255.0", "192.0.2.1")));
    ASSERT_TRUE(LeaveAndApply());
    EXPECT_TRUE(NotLogged(host, "Setting adapters"));
    EXPECT_TRUE(NotLogged(host, "VlanID"));
    EXPECT_EQ(host.Get("/network/dvswitches"), before);
    EXPECT_EQ(host.Get("/network/vnics/0/ipv4/address"), "192.0.2.10");
}

TEST_F(NetworkTest, Ipv4AndIpv6FieldsAreChecked) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog(kIpv4));
    // Static with an address that is no address.
    Keys({"Down", "Down", " ", "Down", "1.2.3", "abc", "Enter"});
    ASSERT_TRUE(Refused(*t, "Invalid IP address", "Please reenter a valid IPv4 address (x.x.x.x)."));
    EXPECT_TRUE(t->Shows("1.2.3 ")) << t->Dump();

    // Esc leaves the change set as it was.
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone("Set static IPv4 address"));
    ASSERT_TRUE(SelectEntry(*t, "IPv4 Configuration"));
    EXPECT_TRUE(t->Shows("Automatic"));
    EXPECT_TRUE(t->Shows("IPv4 Address: 192.0.2.100"));

    // With DHCP marked, what is left in the greyed fields is not checked.
    ASSERT_TRUE(Edit(kIpv4, {"Down", "Down", " ", "Down", "999.1", "Up", "Up", " "}));
    EXPECT_TRUE(t->Lacks("Invalid IP address"));

    ASSERT_TRUE(OpenDialog(kIpv6));
    EXPECT_TRUE(t->Shows("(o) Use dynamic IPv6 address and network configuration")) << t->Dump();
    // Static; the underscore cannot be typed, the address has no prefix.
    Keys({"Down", "Down", "Down", " ", "Down", "2001:db8::10_", "Enter"});
    ASSERT_TRUE(Refused(*t, "Invalid IP address", "Please reenter a valid IPv6 network address (x:x:x/x)."));
    Keys({"End", "/64", "Enter"});
    ASSERT_TRUE(t->WaitForTextGone("Set static IPv6 address"));
    ASSERT_TRUE(SelectEntry(*t, "IPv6 Configuration"));
    EXPECT_TRUE(t->Shows("2001:db8::10/64")) << t->Dump();
    EXPECT_TRUE(t->Shows("Manual"));

    // The dynamic choice skips every check.
    ASSERT_TRUE(Edit(kIpv6, {"Down", "Down", "Down", "Down", "nonsense", "Up", "Up", "Up", " "}));
    EXPECT_TRUE(t->Lacks("Invalid"));
    EXPECT_TRUE(t->Shows("Automatic"));
}

// The dynamic choice is only the two switches: a static address stays and
// is written beside what router advertisements bring.
TEST_F(NetworkTest, RouterAdvertisementKeepsTheStaticIpv6Address) {
    host.Set("/network/vnics/0/ipv6/routerAdvertisement", false);
    host.Set("/network/vnics/0/ipv6/static", json::array({{{"address", "2001:db8::10"}, {"prefix", 64}}}));
    host.Boot();
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog(kIpv6));
    EXPECT_TRUE(t->Shows("(o) Set static IPv6 address")) << t->Dump();
    Keys({"Down", " "});
    ASSERT_TRUE(Confirm(kIpv6));
    ASSERT_TRUE(SelectEntry(*t, "IPv6 Configuration"));
    EXPECT_TRUE(t->Shows("Automatic"));
    EXPECT_TRUE(t->Shows("2001:db8::10/64")) << t->Dump();
    ASSERT_TRUE(LeaveAndApply());
    const json ipv6 = host.Get("/network/vnics/0/ipv6");
    EXPECT_EQ(ipv6["routerAdvertisement"], true);
    EXPECT_EQ(ipv6["static"], json::array({{{"address", "2001:db8::10"}, {"prefix", 64}}})) << ipv6.dump(1);
    EXPECT_NE(ipv6["addresses"].dump().find("2001:db8::10"), std::string::npos) << ipv6.dump(1);
}

TEST_F(NetworkTest, DnsServersAndSuffixesAreTakenAsTyped) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog(kDns));
    EXPECT_TRUE(t->Shows("(o) Obtain DNS server addresses and a hostname automatically")) << t->Dump();
    // Manual; the primary server refused, the row selected for correcting.
    Keys({"Down", " ", "Down", "1.2.3", "Down", "fe80::1", "Enter"});
    ASSERT_TRUE(
        Refused(*t, "Invalid DNS server address", "Please reenter a valid DNS server address (IP or IPv6)."));
    Keys({"End", ".4_/"});  // the underscore and the slash do nothing
    ASSERT_TRUE(t->WaitQuiet());
    EXPECT_TRUE(t->Shows("1.2.3.4 ")) << t->Dump();
    Keys({"Down", "Down", "_/new-host", "Enter"});
    ASSERT_TRUE(t->WaitForTextGone("Use the following DNS server"));
    ASSERT_TRUE(SelectEntry(*t, "DNS Configuration"));
    EXPECT_TRUE(t->Shows("Primary DNS Server: 1.2.3.4"));
    EXPECT_TRUE(t->Shows("IPv6 DNS Server: fe80::1")) << t->Dump();
    EXPECT_TRUE(t->Shows("Hostname: new-host"));

    // Both rows emptied: no name servers at all.
    ASSERT_TRUE(Edit(kDns, {"Down", "Down", "Backspace", "Down", "Backspace"}));
    // Suffixes split at blanks and commas; the underscore and the slash do nothing.
    ASSERT_TRUE(Edit(kSuffixes, {"a.test b_.test,/c.test"}));
    EXPECT_TRUE(t->Shows("a.test, b.test, c.test")) << t->Dump();
    ASSERT_TRUE(LeaveAndApply());
    EXPECT_EQ(host.Get("/network/dns/servers"), json::array());
    EXPECT_EQ(host.Get("/network/dns/ipv6Servers"), json::array());
    EXPECT_EQ(host.Get("/network/dns/hostname"), "new-host");
    EXPECT_EQ(host.Get("/network/dns/searchDomains"), json({"a.test", "b.test", "c.test"}));
}

TEST_F(NetworkTest, AdapterRowsAndNicsOfOtherSwitches) {
    host.Set("/network/pnics/3/name", "zonic-uplink-3");
    host.Set("/network/pnics/3/label", "ABCDEFGHIJKLMNO");
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog(kAdapters));
    EXPECT_TRUE(t->Shows("[X] zonic0       NIC 1 (00:50:56:01:00:02)")) << t->Dump();
    EXPECT_TRUE(t->Shows("zonic-up...  ABCDEFGHIJK... (...01:00:05)")) << t->Dump();
    EXPECT_TRUE(t->Shows("Disconnected"));
    // Only the NIC another switch uses is marked "(...)".
    EXPECT_EQ(t->FindAll("(...)").size(), 1u) << t->Dump();

    Keys({"Down", "Down", "D"});
    ASSERT_TRUE(t->WaitForText("Adapter Details"));
    EXPECT_TRUE(t->Shows("Used By: kSwitch1")) << t->Dump();
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("Adapter Details"));

    // No NIC at all is refused.
    Keys({"Up", "Up", " ", "Enter"});
    ASSERT_TRUE(t->WaitForText("No adapter"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("No adapter"));

    // zonic0 again and zonic2 from kSwitch1: asked first; Esc goes back to
    // the list with the marks kept.
    Keys({" ", "Down", "Down", " ", "Enter"});
    ASSERT_TRUE(t->WaitForText("Remove these adapters from their current connections?"));
    EXPECT_TRUE(t->Shows("Network Adapters: Warning"));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone("Remove these adapters"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Remove these adapters from their current connections?"));
    ASSERT_TRUE(Confirm(kAdapters));
    ASSERT_TRUE(SelectEntry(*t, "Network Adapters"));
    EXPECT_TRUE(t->Shows("zonic2 (00:50:56:01:00:04)")) << t->Dump();

    ASSERT_TRUE(LeaveAndApply());
    const json network = host.Get("/network");
    EXPECT_EQ(network["vswitches"][1]["uplinks"], json::array()) << network["vswitches"].dump(1);
    const json& team = network["vswitches"][0]["teaming"];
    EXPECT_EQ(team["active"].size() + team["standby"].size(), 2u) << team.dump();
}

}  // namespace
}  // namespace E2e
