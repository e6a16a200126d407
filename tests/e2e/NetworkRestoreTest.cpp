// "Network Restore Options": the factory restore of the network with and
// without running virtual machines, and the two restores of a management
// network on a distributed switch.
#include <algorithm>

#include "LoggedIn.hpp"

namespace E2e {
namespace {

using nlohmann::json;

const char kFactoryQuestion[] = "Are you sure you want to reset the host network";
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
     "user.info: Putting back the network configuration"},
};
INSTANTIATE_TEST_SUITE_P(Cases, RunningVmsTest, ::testing::ValuesIn(kVmCases),
                         [](const auto& info) { return std::string(info.param.name); });

class DvsRestoreTest : public RestoreTest {
protected:
    DvsRestoreTest() : RestoreTest("dvs") {}
};

// A failed step stops the restore and keeps its entry; once the host lets it,
// the restore moves the management network and its entry goes.
TEST_F(DvsRestoreTest, StandardSwitchRestoreStopsAtAFailedStepThenMovesTheManagementNetwork) {
    const json dvsPort = host.Get("/network/vnics/0");
    host.Fail("AddVirtualSwitch", "no room for another switch");
    ASSERT_TRUE(OpenRestore());
    EXPECT_TRUE(t->Shows("Restore kDS"));
    ASSERT_TRUE(Confirm(1, "Move the management network onto a standard switch?"));
    ASSERT_TRUE(t->WaitForText("<Enter> OK"));
    EXPECT_TRUE(t->Shows("Failed.")) << t->Dump();
    EXPECT_TRUE(t->Lacks("Moving"));
    EXPECT_TRUE(WaitForLog(host, "no room for another switch"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("<Enter> OK"));
    EXPECT_TRUE(t->Shows("Restore Standard Switch"));
    EXPECT_EQ(host.Get("/network/vnics/0/connectionType"), 2);

    host.Clear("AddVirtualSwitch");
    ASSERT_TRUE(Confirm(0, "Move the management network onto a standard switch?"));
    ASSERT_TRUE(t->WaitForText("<Enter> OK"));
    EXPECT_EQ(t->FindAll("Done.").size(), 5u) << t->Dump();
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("<Enter> OK"));
    // Its entry is gone; the selection is on what is left.
    EXPECT_TRUE(t->Lacks("Restore Standard Switch")) << t->Dump();
    EXPECT_TRUE(t->Shows("Restore kDS"));
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

TEST_F(DvsRestoreTest, KdsRestoreMovesTheInterfaceToANewHostLocalPort) {
    ASSERT_TRUE(OpenRestore());
    ASSERT_TRUE(Confirm(2, "Create a new host local port"));
    ASSERT_TRUE(t->WaitForText("<Enter> OK"));
    EXPECT_EQ(t->FindAll("Done.").size(), 3u) << t->Dump();
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("<Enter> OK"));
    EXPECT_TRUE(t->Shows("Restore kDS"));  // it may be needed again
    EXPECT_TRUE(EventReported("(obz.user.velk.kds.port.restored)"));

    const json network = host.Get("/network");
    const std::string port = network["vnics"][0]["port"];
    EXPECT_NE(port, "100");
    const json& ports = network["dvswitches"][0]["ports"];
    const auto created =
        std::find_if(ports.begin(), ports.end(), [&](const json& p) { return p["key"] == port; });
    ASSERT_NE(created, ports.end()) << ports.dump(1);
    EXPECT_EQ((*created)["hostLocal"], true);
    EXPECT_EQ((*created)["connectee"], "qk0");
}

}  // namespace
}  // namespace E2e
