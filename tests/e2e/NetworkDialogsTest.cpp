// The dialogs of "Configure Management Network" with the real console: what
// each field refuses, what each dialog accepts, and when leaving the window
// asks a question. Each case walks one dialog through its edge cases in one
// console, the way an administrator would try them one after the other.
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

TEST_F(NetworkTest, LeavingUntouchedClosesWithoutQuestion) {
    ASSERT_TRUE(OpenNetwork());
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForMenu(*t));
    EXPECT_TRUE(NotLogged(host, "Setting"));
    EXPECT_TRUE(History(host, {"hostctl"}).empty()) << host.Get("/history").dump(1);
    for (const json& e : History(host, {"hrm-cmd"})) EXPECT_NE(e.value("command", ""), "internalsvc/refresh");
}

class StaticHostTest : public NetworkTest {
protected:
    StaticHostTest() : NetworkTest("static") {}
};

TEST_F(StaticHostTest, ConfirmingEveryDialogUnchangedAsksNothing) {
    ASSERT_TRUE(OpenNetwork());
    const std::pair<const char*, const char*> dialogs[] = {
        {"Network Adapters", "Hardware Label (MAC Address)"},
        {"VLAN (optional)", "VLAN ID (1-4094"},
        {"IPv4 Configuration", "Set static IPv4 address"},
        {"IPv6 Configuration", "Set static IPv6 address"},
        {"DNS Configuration", "Use the following DNS server"},
        {"Custom DNS Suffixes", "Suffixes:"},
    };
    for (const auto& [entry, shown] : dialogs) {
        ASSERT_TRUE(OpenDialog(entry, shown));
        ASSERT_TRUE(Confirm(shown)) << entry;
    }
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForMenu(*t));
    EXPECT_TRUE(t->Lacks(kRestartQuestion));
    EXPECT_TRUE(NotLogged(host, "Setting"));
}

TEST_F(NetworkTest, EscAtTheQuestionKeepsTheEditsAndNoDropsThem) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit("VLAN (optional)", "VLAN ID (1-4094", {"20"}));

    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    EXPECT_TRUE(t->Shows("Configure Management Network: Confirm"));
    t->Send("x");  // not an answer
    ASSERT_TRUE(t->WaitQuiet());
    EXPECT_TRUE(t->Shows(kRestartQuestion));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kNetworkFooter));
    ASSERT_TRUE(SelectEntry(*t, "VLAN (optional)"));
    EXPECT_TRUE(t->Shows("20")) << t->Dump();

    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    t->Send("N");
    ASSERT_TRUE(WaitForMenu(*t));
    EXPECT_EQ(host.Get("/network/vswitches/0/portgroups/0/vlan"), 0);
    EXPECT_TRUE(NotLogged(host, "Setting"));
    // Nothing reached the host.
    EXPECT_TRUE(History(host, {"hostctl"}).empty()) << host.Get("/history").dump(1);
}

TEST_F(NetworkTest, Ipv6OffAndOnAgainAsksNothing) {
    ASSERT_TRUE(OpenNetwork());
    // Row 0: disable.
    ASSERT_TRUE(Edit("IPv6 Configuration", "Disable IPv6 (restart required)", {" "}));
    ASSERT_TRUE(SelectEntry(*t, "IPv6 Configuration"));
    EXPECT_TRUE(t->Shows("IPv6 is disabled."));

    // Row 1: dynamic.
    ASSERT_TRUE(Edit("IPv6 Configuration", "Disable IPv6 (restart required)", {"Down", " "}));
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForMenu(*t));
    EXPECT_TRUE(NotLogged(host, "Setting"));
}

TEST_F(NetworkTest, Ipv6ChangeAsksForARebootAndTakesEffectAtBoot) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit("IPv6 Configuration", "Disable IPv6 (restart required)", {" "}));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRebootQuestion));
    t->Send("Y");
    ASSERT_TRUE(t->WaitForText("Restart in progress..."));
    ASSERT_TRUE(WaitForHistory(host, "reboot"));
    EXPECT_TRUE(WaitForLog(host, "Switching to DHCP on qk0") && WaitForLog(host, "Setting suffixes to"));

    // The running kernel keeps IPv6 until the host has booted.
    EXPECT_EQ(host.Get("/network/ipv6EnabledAtBoot"), false);
    EXPECT_EQ(host.Get("/network/ipv6Enabled"), true);
    EXPECT_FALSE(host.Get("/network/vnics/0/ipv6/addresses").empty());
    host.Boot();
    EXPECT_EQ(host.Get("/network/ipv6Enabled"), false);
    EXPECT_TRUE(host.Get("/network/vnics/0/ipv6/addresses").empty());
}

class DvsNetworkTest : public NetworkTest {
protected:
    DvsNetworkTest() : NetworkTest("dvs") {}
};

TEST_F(DvsNetworkTest, AdaptersAndVlanAreGreyAndNeverApplied) {
    const json before = host.Get("/network/dvswitches");
    ASSERT_TRUE(OpenNetwork());
    for (const char* entry : {"Network Adapters", "VLAN (optional)"}) {
        const auto at = t->Find(entry);
        ASSERT_TRUE(at) << t->Dump();
        EXPECT_TRUE(t->CellAt(at->col, at->row).fg.IsIndex(6)) << entry << "\n" << t->Dump(true);
    }
    // The selection starts below them and cannot reach them.
    EXPECT_EQ(t->FindAll("IPv4 Configuration").size(), 2u) << t->Dump();
    Keys({"Up", "Up", "Enter"});
    ASSERT_TRUE(t->WaitForText("Set static IPv4 address"));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone("Set static IPv4 address"));

    ASSERT_TRUE(SetStaticIpv4("192.0.2.10", "255.255.255.0", "192.0.2.1"));
    ASSERT_TRUE(LeaveAndApply());
    EXPECT_TRUE(NotLogged(host, "Setting adapters"));
    EXPECT_TRUE(NotLogged(host, "VlanID"));
    EXPECT_EQ(host.Get("/network/dvswitches"), before);
    EXPECT_EQ(host.Get("/network/vnics/0/ipv4/address"), "192.0.2.10");
}

TEST_F(NetworkTest, VlanFieldAndItsLimits) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog("VLAN (optional)", "VLAN ID (1-4094"));
    EXPECT_TRUE(t->Shows("If you are unsure how to configure or use a VLAN"));
    // Letters and signs cannot be typed; five digits at most.
    t->Send("a-_/ 123456");
    ASSERT_TRUE(t->WaitQuiet());
    EXPECT_TRUE(t->Shows("12345")) << t->Dump();
    EXPECT_TRUE(t->Lacks("123456"));
    t->SendKey("Enter");
    ASSERT_TRUE(Refused(*t, "Invalid VLAN ID", "Please reenter a valid VLAN ID (1-4095)."));

    for (const char* refused : {"0", "4096"}) {
        Keys({"End", "Backspace", "Backspace", "Backspace", "Backspace", "Backspace", refused, "Enter"});
        ASSERT_TRUE(Refused(*t, "Invalid VLAN ID", "Please reenter a valid VLAN ID (1-4095).")) << refused;
        // The typed text stays for correcting.
        EXPECT_TRUE(t->Shows(std::string(" ") + refused + " ")) << t->Dump();
    }
    Keys({"End", "Backspace", "Backspace", "Backspace", "Backspace", "4095", "Enter"});
    ASSERT_TRUE(t->WaitForText("You entered a VLAN ID of 4095."));
    EXPECT_TRUE(t->Shows("Warning"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("VLAN ID (1-4094"));
    EXPECT_TRUE(t->Shows("4095"));

    // The pre-filled value is replaced; no warning.
    ASSERT_TRUE(Edit("VLAN (optional)", "VLAN ID (1-4094", {"4094"}));
    EXPECT_TRUE(t->Shows("4094"));

    // Empty: no VLAN.
    ASSERT_TRUE(Edit("VLAN (optional)", "VLAN ID (1-4094", {"Backspace"}));
    EXPECT_TRUE(t->Shows("Not set"));
    // Back at the value read, but a dialog was confirmed with another value
    // on the way: the question comes.
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
}

TEST_F(NetworkTest, Ipv4FieldsAreCheckedInRowOrder) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog("IPv4 Configuration", "Set static IPv4 address"));
    // Static with an address that is no address.
    Keys({"Down", "Down", " ", "Down", "1.2.3", "abc", "Enter"});
    ASSERT_TRUE(Refused(*t, "Invalid IP address", "Please reenter a valid IPv4 address (x.x.x.x)."));
    EXPECT_TRUE(t->Shows("1.2.3 ")) << t->Dump();

    Keys({"End", ".4", "Down", "255.255.0.255", "Enter"});
    ASSERT_TRUE(Refused(*t, "Invalid subnet", "Please reenter a valid subnet (x.x.x.x)."));
    Keys({"End", "Backspace", "Backspace", "Backspace", "0", "Down", "1.2.3.4.5", "Enter"});
    ASSERT_TRUE(Refused(*t, "Invalid gateway address", "Please reenter a valid gateway address (x.x.x.x)."));

    // Esc leaves the change set as it was.
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone("Set static IPv4 address"));
    ASSERT_TRUE(SelectEntry(*t, "IPv4 Configuration"));
    EXPECT_TRUE(t->Shows("Automatic"));
    EXPECT_TRUE(t->Shows("IPv4 Address: 192.0.2.100"));

    // With DHCP marked, what is left in the greyed fields is not checked.
    ASSERT_TRUE(Edit("IPv4 Configuration", "Set static IPv4 address",
                     {"Down", "Down", " ", "Down", "999.1", "Up", "Up", " "}));
    EXPECT_TRUE(t->Lacks("Invalid IP address"));
}

TEST_F(NetworkTest, Ipv6StaticEntriesAreChecked) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog("IPv6 Configuration", "Set static IPv6 address"));
    EXPECT_TRUE(t->Shows("(o) Use dynamic IPv6 address and network configuration")) << t->Dump();
    Keys({"Down", "Down", "Down", " ", "Down", "fe80::10/64", "Enter"});
    ASSERT_TRUE(Refused(*t, "Invalid scope", "Cannot add a link-local address as static address."));
    Keys({"Backspace", "2001:db8::10", "_", "Enter"});
    ASSERT_TRUE(Refused(*t, "Invalid IP address", "Please reenter a valid IPv6 network address (x:x:x/x)."));
    Keys({"End", "/64", "Down", "Down", "Down", "2001:db8::g", "Enter"});
    ASSERT_TRUE(
        Refused(*t, "Invalid gateway address", "Please reenter a valid IPv6 gateway address (x:x:x)."));
    Keys({"End", "Backspace", "1", "Enter"});
    ASSERT_TRUE(t->WaitForTextGone("Set static IPv6 address"));
    ASSERT_TRUE(SelectEntry(*t, "IPv6 Configuration"));
    EXPECT_TRUE(t->Shows("2001:db8::10/64")) << t->Dump();
    EXPECT_TRUE(t->Shows("Manual"));

    // Empty static rows and gateway are accepted.
    ASSERT_TRUE(Edit("IPv6 Configuration", "Set static IPv6 address",
                     {"Down", "Down", "Down", "Down", "Backspace", "Down", "Down", "Down", "Backspace"}));

    // The dynamic choice skips every check.
    ASSERT_TRUE(Edit("IPv6 Configuration", "Set static IPv6 address",
                     {"Down", "Down", "Down", "Down", "nonsense", "Up", "Up", "Up", " "}));
    EXPECT_TRUE(t->Lacks("Invalid"));
    EXPECT_TRUE(t->Shows("Automatic"));
}

TEST_F(NetworkTest, DnsServersAreCheckedAndEmptyOnesGiveNone) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog("DNS Configuration", "Use the following DNS server"));
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
    ASSERT_TRUE(Edit("DNS Configuration", "Use the following DNS server",
                     {"Down", "Down", "Backspace", "Down", "Backspace"}));
    ASSERT_TRUE(LeaveAndApply());
    EXPECT_EQ(host.Get("/network/dns/servers"), json::array());
    EXPECT_EQ(host.Get("/network/dns/ipv6Servers"), json::array());
    EXPECT_EQ(host.Get("/network/dns/hostname"), "new-host");
}

TEST_F(NetworkTest, SuffixesAreTakenAsTyped) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog("Custom DNS Suffixes", "Suffixes:"));
    EXPECT_TRUE(t->Shows("Use spaces or commas to separate multiple entries."));
    Keys({"a.test b_.test,/c.test"});
    ASSERT_TRUE(Confirm("Suffixes:"));
    EXPECT_TRUE(t->Shows("a.test, b.test, c.test")) << t->Dump();
    ASSERT_TRUE(LeaveAndApply());
    EXPECT_EQ(host.Get("/network/dns/searchDomains"), json({"a.test", "b.test", "c.test"}));
}

TEST_F(NetworkTest, AdapterRowsAreCutToTheirColumns) {
    host.Set("/network/pnics/3/name", "zonic-uplink-3");
    host.Set("/network/pnics/3/label", "ABCDEFGHIJKLMNO");
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog("Network Adapters", "Hardware Label (MAC Address)"));
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
}

TEST_F(NetworkTest, TakingANicFromAnotherSwitchAsksFirst) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(OpenDialog("Network Adapters", "Hardware Label (MAC Address)"));
    Keys({"Down", "Down", " ", "Enter"});
    ASSERT_TRUE(t->WaitForText("Remove these adapters from their current connections?"));
    EXPECT_TRUE(t->Shows("Network Adapters: Warning"));
    t->SendKey("Esc");  // back to the list, the mark kept
    ASSERT_TRUE(t->WaitForTextGone("Remove these adapters"));
    EXPECT_TRUE(t->Shows("Hardware Label (MAC Address)"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Remove these adapters from their current connections?"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("Hardware Label (MAC Address)"));
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
