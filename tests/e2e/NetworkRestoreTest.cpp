// "Network Restore Options": the factory restore of the network with and
// without running virtual machines, and the two restores of a management
// network on a distributed switch.
#include <algorithm>

#include "LoggedIn.hpp"

namespace E2e {
namespace {

using nlohmann::json;

const char kFactoryQuestion[] = "Are you sure you want to reset the host network";
const char kSwitchQuestion[] = "Move the management network onto a standard switch?";
const char kKdsProperties[] = "Enter the properties for new kDS host local port";
const char kFactoryEvent[] = "(obz.user.velk.factory.network.restored)Restoring factory network settings";

class RestoreTest : public ConsoleTest {
protected:
    explicit RestoreTest(const std::string& network = "") : ConsoleTest(network) {}

    ::testing::AssertionResult OpenRestore() {
        return OpenEntry("Network Restore Options", "Restore Network Settings");
    }

    // From the restore window: the confirmation of the entry `downs` rows
    // below the first, F11.
    ::testing::AssertionResult Confirm(int downs, const std::string& question) {
        for (int i = 0; i < downs; ++i) t->SendKey("Down");
        t->SendKey("Enter");
        if (auto asked = t->WaitForText(question); !asked) return asked;
        t->SendKey("F11");
        return ::testing::AssertionSuccess();
    }

    bool EventReported(const std::string& event) const {
        return host.ReadFile("/var/log/obzd.log").find(event) != std::string::npos;
    }
};

TEST_F(RestoreTest, FactoryRestoreOnAStandardSwitch) {
    ASSERT_TRUE(OpenRestore());
    // Only the factory restore on a standard switch; its footers as they are.
    EXPECT_TRUE(t->Lacks("Restore Standard Switch"));
    EXPECT_TRUE(t->Lacks("Restore kDS"));
    EXPECT_TRUE(t->Shows("<Enter> Restart")) << t->Dump();
    EXPECT_TRUE(t->Shows("<Esc> Log Out"));

    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(kFactoryQuestion));
    t->SendKey("Enter");  // F11 confirms, not Enter
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    EXPECT_TRUE(t->Shows(kFactoryQuestion));
    EXPECT_TRUE(NotLogged(host, "Clearing Network Config"));

    t->SendKey("F11");
    ASSERT_TRUE(t->WaitForText("<Enter> OK"));
    // No virtual machine runs: no warning, the log starts with the network.
    EXPECT_TRUE(t->Lacks("Powering Off VMs"));
    EXPECT_TRUE(t->Shows("Auto-configuring network. Done.")) << t->Dump();
    EXPECT_TRUE(History(host, {"powerOffVms"}).empty());
    EXPECT_EQ(Operations(host),
              (std::vector<std::string>{"DisableNetDumper", "ClearNetworkConfig", "AutoConfigNetwork"}));

    // The log line and event come after the work.
    EXPECT_TRUE(NotLogged(host, "Restoring factory network settings"));
    t->SendKey("Enter");
    ASSERT_TRUE(WaitForLog(host, "user.info: Restoring factory network settings"));
    EXPECT_TRUE(EventReported(kFactoryEvent));
    const std::vector<std::string> order = {"user.info: Clearing Network Config",
                                            "user.info: Auto-Configuring Network",
                                            "user.info: Restoring factory network settings"};
    EXPECT_EQ(Logged(order), order);
}

struct VmCase {
    const char* name;
    const char* warningKey;  // Enter goes on, Esc declines
    const char* fault;       // a host operation made to fail, or ""
    const char* shown;       // on screen after the work ("" when declined)
    const char* logged;      // an error line, or ""
};
void PrintTo(const VmCase& c, std::ostream* os) { *os << c.name; }

class RunningVmsTest : public RestoreTest, public ::testing::WithParamInterface<VmCase> {};

TEST_P(RunningVmsTest, WarnedFirstAndLoggedWhatever) {
    const VmCase& c = GetParam();
    host.Set("/vms/running", 2);
    if (*c.fault) host.Fail(c.fault);
    const json before = host.Get("/network/vnics");
    ASSERT_TRUE(OpenRestore());
    ASSERT_TRUE(Confirm(0, kFactoryQuestion));
    ASSERT_TRUE(t->WaitForText("Warning: VMs running on the host"));
    t->SendKey(c.warningKey);
    if (*c.shown) {
        ASSERT_TRUE(t->WaitForText("<Enter> OK"));
        EXPECT_TRUE(t->Shows(c.shown)) << t->Dump();
        t->SendKey("Enter");
    }
    ASSERT_TRUE(WaitForLog(host, "user.info: Restoring factory network settings"));
    EXPECT_TRUE(EventReported(kFactoryEvent));
    if (*c.logged) {
        EXPECT_TRUE(WaitForLog(host, c.logged));
    }

    // A refused restore leaves the network as it was.
    if (*c.fault) {
        EXPECT_EQ(host.Get("/network/vnics"), before);
    }
    const std::vector<json> powerOff = History(host, {"powerOffVms"});
    if (std::string(c.warningKey) == "Esc") {
        EXPECT_TRUE(powerOff.empty());
        EXPECT_EQ(host.Get("/network/vnics"), before);
        EXPECT_TRUE(Operations(host).empty());
    } else {
        ASSERT_EQ(powerOff.size(), 1u);
        EXPECT_EQ(powerOff[0]["args"], json::array());  // never "--terminate"
    }
}

const VmCase kVmCases[] = {
    {"PoweredOffThenRestored", "Enter", "", "Powering Off VMs. Done.", ""},
    {"DeclinedRestoresNothing", "Esc", "", "", ""},
    {"HostRefusesTheRestore", "Enter", "ClearNetworkConfig", "Auto-configuring network. Failed.",
     "user.err: Error auto-configuring network"},
    {"HostRefusesTheNewNetwork", "Enter", "AutoConfigNetwork", "Auto-configuring network. Failed.",
     "user.info: Putting back the previous network configuration"},
};
INSTANTIATE_TEST_SUITE_P(Cases, RunningVmsTest, ::testing::ValuesIn(kVmCases),
                         [](const auto& info) { return std::string(info.param.name); });

class DvsRestoreTest : public RestoreTest {
protected:
    DvsRestoreTest() : RestoreTest("dvs") {}

    // From the restore window: opens "Restore kDS" and waits for its properties.
    ::testing::AssertionResult OpenKdsProperties() {
        Keys({"Down", "Down", "Enter"});
        return t->WaitForText(kKdsProperties);
    }
};

// A failed step stops the restore and keeps its entry; once the host lets it,
// the restore moves the management network, its entry goes and the selection
// moves on to the next one.
TEST_F(DvsRestoreTest, StandardSwitchRestoreStopsAtAFailedStepThenMovesTheManagementNetwork) {
    const json dvsPort = host.Get("/network/vnics/0");
    host.Fail("AddVirtualSwitch", "no room for another switch");
    ASSERT_TRUE(OpenRestore());
    EXPECT_TRUE(t->Shows("Restore kDS"));
    ASSERT_TRUE(Confirm(1, kSwitchQuestion));
    ASSERT_TRUE(t->WaitForText("<Enter> OK"));
    EXPECT_TRUE(t->Shows("Creating standard switch kSwitch2. Failed.")) << t->Dump();
    EXPECT_TRUE(t->Lacks("Moving"));
    EXPECT_TRUE(t->Lacks("Undoing"));  // nothing was done
    EXPECT_TRUE(WaitForLog(host, "no room for another switch"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("<Enter> OK"));
    EXPECT_TRUE(t->Shows("Restore Standard Switch"));
    EXPECT_EQ(host.Get("/network/vnics/0/connectionType"), 2);

    host.Clear("AddVirtualSwitch");
    ASSERT_TRUE(Confirm(0, kSwitchQuestion));
    ASSERT_TRUE(t->WaitForText("<Enter> OK"));
    EXPECT_EQ(t->FindAll("Done.").size(), 7u) << t->Dump();
    for (const char* step : {"Adding port group Management Network 2. Done.", "Moving uplink zonic0. Done.",
                             "Moving uplink zonic1. Done.", "Moving management interface qk0. Done."})
        EXPECT_TRUE(t->Shows(step)) << step;
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("<Enter> OK"));
    // Its entry is gone; the next one is selected (its name heads the pane).
    EXPECT_TRUE(t->Lacks("Restore Standard Switch")) << t->Dump();
    EXPECT_EQ(t->FindAll("Restore kDS").size(), 2u) << t->Dump();
    // Each attempt is logged, the failed one too.
    EXPECT_EQ(host.ConsoleLog("user.info: Restoring standard switch", t->Pid()).size(), 2u);
    EXPECT_TRUE(EventReported("(obz.user.velk.standard.switch.restored)"));

    const json network = host.Get("/network");
    const json& vnic = network["vnics"][0];
    EXPECT_EQ(vnic["connectionType"], 1) << vnic.dump(1);
    EXPECT_EQ(vnic["ipv4"]["address"], dvsPort["ipv4"]["address"]);
    const json& moved = network["vswitches"].back();
    EXPECT_EQ(moved["uplinks"], json({"zonic0", "zonic1"})) << moved.dump(1);
    EXPECT_EQ(moved["portgroups"][0]["name"], vnic["portgroup"]);
    EXPECT_EQ(network["dvswitches"][0]["uplinkPorts"][0]["pnic"], "");
}

// A step the host refuses after others were done: every NIC stays on the
// distributed switch, the new switch goes again, the interface stays on its
// port; the screen and the log say so.
struct UndoCase {
    const char* name;
    const char* fault;
    const char* failed;  // the step that failed
};
void PrintTo(const UndoCase& c, std::ostream* os) { *os << c.name; }

class StandardSwitchUndoTest : public DvsRestoreTest, public ::testing::WithParamInterface<UndoCase> {};

TEST_P(StandardSwitchUndoTest, AFailedRestoreLeavesTheHostAsItWas) {
    const UndoCase& c = GetParam();
    host.Fail(c.fault, "refused by the test");
    const json before = host.Get("/network");
    ASSERT_TRUE(OpenRestore());
    ASSERT_TRUE(Confirm(1, kSwitchQuestion));
    ASSERT_TRUE(t->WaitForText("<Enter> OK"));
    EXPECT_TRUE(t->Shows(std::string(c.failed) + " Failed.")) << t->Dump();
    EXPECT_TRUE(t->Shows("Undoing the steps already done. Done.")) << t->Dump();
    EXPECT_TRUE(WaitForLog(host, "user.info: Undoing the steps already done."));
    EXPECT_TRUE(WaitForLog(host, "user.info: Removing standard switch kSwitch2"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("<Enter> OK"));
    EXPECT_TRUE(t->Shows("Restore Standard Switch"));
    EXPECT_EQ(host.Get("/network"), before) << host.Get("/network").dump(1);
}

const UndoCase kUndoCases[] = {
    {"UplinkRefused", "AddUplinkToTeamingPolicy", "Moving uplink zonic0."},
    {"InterfaceRefused", "SetVnicConnectionPoint", "Moving management interface qk0."},
    {"RestartRefused", "SetVnicEnabled", "Moving management interface qk0."},
};
INSTANTIATE_TEST_SUITE_P(Steps, StandardSwitchUndoTest, ::testing::ValuesIn(kUndoCases),
                         [](const auto& info) { return std::string(info.param.name); });

// Without an uplink of the distributed switch on this host there is nothing
// to move and no port to give uplinks: both restores refuse and change nothing.
TEST_F(DvsRestoreTest, WithoutUplinksBothRestoresRefuse) {
    for (const char* port :
         {"/network/dvswitches/0/uplinkPorts/0/pnic", "/network/dvswitches/0/uplinkPorts/1/pnic"})
        host.Set(port, "");
    const json before = host.Get("/network");
    ASSERT_TRUE(OpenRestore());
    ASSERT_TRUE(Confirm(1, kSwitchQuestion));
    ASSERT_TRUE(t->WaitForText("No uplinks are configured on the host for this kDS."));
    EXPECT_TRUE(t->Shows("No kDS Uplinks: Error"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("<Enter> OK"));
    EXPECT_TRUE(t->Lacks("Done.")) << t->Dump();
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("<Enter> OK"));
    EXPECT_TRUE(t->Shows("Restore Standard Switch"));

    Keys({"Down", "Enter"});
    ASSERT_TRUE(t->WaitForText("No uplinks are configured on the host for this kDS."));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("No kDS Uplinks: Error"));
    EXPECT_TRUE(t->Lacks(kKdsProperties));
    EXPECT_EQ(host.Get("/network"), before);
}

// The management port's VLAN went wrong and the interface lost its address.
// The restore's dialog shows the port's properties; a refused move leaves the
// interface on its port (the new port goes again), then the new port with the corrected properties
// gives it its address again.
TEST_F(DvsRestoreTest, KdsRestoreMovesTheInterfaceToANewPortWithCorrectedProperties) {
    host.Set("/network/dvswitches/0/ports/0/vlan", 30);
    host.Boot();
    ASSERT_EQ(host.Get("/network/vnics/0/ipv4/address"), "0.0.0.0");
    host.Fail("SetVnicEnabled", "the interface is busy");
    ASSERT_TRUE(OpenRestore());
    ASSERT_TRUE(OpenKdsProperties());
    EXPECT_TRUE(t->Shows(" 30 ")) << t->Dump();
    EXPECT_TRUE(t->Shows("[X] Restore to default blocked setting (unblocked)"));
    EXPECT_TRUE(t->Shows("uplink1 (zonic0), uplink2 (zonic1)")) << t->Dump();
    // Checked as the VLAN dialog checks, without the VLAN of all VLANs.
    Keys({"4095", "Enter"});
    ASSERT_TRUE(t->WaitForText("Please enter a valid VLAN ID (1-4094)."));
    EXPECT_TRUE(t->Shows("Invalid VLAN ID"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("Please enter a valid VLAN ID"));
    Keys({"20", "Enter"});
    ASSERT_TRUE(t->WaitForTextGone(kKdsProperties));
    ASSERT_TRUE(t->WaitForText("<Enter> OK"));
    EXPECT_TRUE(t->Shows("Moving management interface qk0. Failed.")) << t->Dump();
    EXPECT_TRUE(t->Shows("Undoing the steps already done. Done."));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Unable to restore kDS. Check logs for details."));
    EXPECT_TRUE(t->Shows("Restore kDS: Error"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("Restore kDS: Error"));
    EXPECT_EQ(host.Get("/network/vnics/0/port"), "100");
    EXPECT_EQ(host.Get("/network/dvswitches/0/ports").size(), 1u);
    EXPECT_TRUE(WaitForLog(host, "the interface is busy"));

    // The uplinks: none marked is asked about, Esc goes back to the marks.
    host.Clear("SetVnicEnabled");
    ASSERT_TRUE(OpenKdsProperties());
    Keys({"Down", "Down", " "});
    ASSERT_TRUE(t->WaitForText("Select the kDS Uplinks (one or more)"));
    Keys({" ", "Down", " ", "Enter"});
    ASSERT_TRUE(t->WaitForText("No uplinks were selected."));
    EXPECT_TRUE(t->Shows("Do you want to continue?"));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone("No uplinks were selected."));
    Keys({" ", "Enter"});
    ASSERT_TRUE(t->WaitForTextGone("Select the kDS Uplinks"));
    EXPECT_TRUE(t->Shows("uplink2 (zonic1)")) << t->Dump();
    EXPECT_TRUE(t->Lacks("uplink1 (zonic0)"));
    // Empty: no VLAN.
    Keys({"Up", "Up", "Backspace", "Enter"});
    ASSERT_TRUE(t->WaitForTextGone(kKdsProperties));
    ASSERT_TRUE(t->WaitForText("<Enter> OK"));
    EXPECT_EQ(t->FindAll("Done.").size(), 2u) << t->Dump();
    EXPECT_TRUE(t->Shows("IP address is 192.0.2.100")) << t->Dump();
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("<Enter> OK"));
    EXPECT_TRUE(t->Shows("Restore kDS"));  // it may be needed again
    EXPECT_EQ(host.ConsoleLog("user.info: Restoring kDS port", t->Pid()).size(), 2u);
    EXPECT_TRUE(EventReported("(obz.user.velk.kds.port.restored)"));

    const json network = host.Get("/network");
    const json& vnic = network["vnics"][0];
    EXPECT_EQ(vnic["ipv4"]["address"], "192.0.2.100") << vnic.dump(1);
    const json& ports = network["dvswitches"][0]["ports"];
    ASSERT_EQ(ports.size(), 2u) << ports.dump(1);
    EXPECT_EQ(ports[0]["connectee"], "");
    EXPECT_EQ(ports[1], json({{"key", vnic["port"]},
                              {"vlan", 0},
                              {"blocked", false},
                              {"uplinks", {"uplink2"}},
                              {"hostLocal", true},
                              {"connectee", "qk0"}}));
}

}  // namespace
}  // namespace E2e
