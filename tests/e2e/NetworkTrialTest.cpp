// Changes of the management network on trial, on a simulated host: a change
// that fails its checks comes back unless the operator keeps it, a good one
// is kept without a key, an address in use is refused before anything is
// written, and a console that dies in the middle leaves the next start to
// put the previous configuration back.
#include <chrono>

#include "NetworkConsole.hpp"

namespace E2e {
namespace {

using nlohmann::json;

const char kCheckTitle[] = "Check Management Network";
const char kCountdown[] = "The previous configuration is put back in";
const char kKept[] = "Management network checked: the change is kept.";
const char kKeptAnyway[] = "Management network: the change is kept although a check failed.";
const char kReverted[] = "Management network checked: the previous configuration is back.";
const char kRevertedAtStart[] = "A network change left unfinished was reverted at start.";
const char kInUse[] = "The IPv4 address is already in use on the management network";

// What a change may touch, to compare before and after.
json NetworkShape(const SimHost& host) {
    const json network = host.Get("/network");
    return {{"vnic", network["vnics"][0]},
            {"vswitches", network["vswitches"]},
            {"routing", network["routing"]},
            {"dns", network["dns"]}};
}

class TrialTest : public NetworkTest {
protected:
    bool EventReported(const std::string& event) const {
        return host.ReadFile("/var/log/obzd.log").find(event) != std::string::npos;
    }

    // Esc, Y, then the check screen with its count.
    ::testing::AssertionResult ApplyToTheCheckScreen() {
        t->SendKey("Esc");
        if (auto asked = t->WaitForText(kRestartQuestion); !asked) return asked;
        t->Send("y");
        if (auto shown = t->WaitForText(kCheckTitle); !shown) return shown;
        return t->WaitForText(kCountdown);
    }
};

// A change that fails a check of the simulated network: the check screen
// lists it and counts down; Enter puts the previous configuration back.
struct FailureCase {
    const char* name;
    std::function<void(SimHost&)> prepare;  // the simulated network's part
    NetworkTest::Entry entry;
    std::vector<std::string> keys;
    const char* failed;  // what the failed check's row shows
};
void PrintTo(const FailureCase& c, std::ostream* os) { *os << c.name; }

class TrialFailureTest : public TrialTest, public ::testing::WithParamInterface<FailureCase> {};

TEST_P(TrialFailureTest, ComesBackAfterTheCheckScreen) {
    const FailureCase& c = GetParam();
    if (c.prepare) c.prepare(host);
    const json before = NetworkShape(host);
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(c.entry, c.keys));
    ASSERT_TRUE(ApplyToTheCheckScreen());
    EXPECT_TRUE(t->Shows(c.failed)) << t->Dump();
    EXPECT_TRUE(t->Shows("Failed"));

    // Any key starts the count again.
    ASSERT_TRUE(t->WaitForText(" 58 ", Duration(5000))) << t->Dump();
    t->Send("x");
    EXPECT_TRUE(t->WaitForText(" 60 ", Duration(2000))) << t->Dump();

    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(kReverted)) << t->Dump();
    ASSERT_TRUE(WaitForMenu(*t));
    EXPECT_EQ(NetworkShape(host), before);
    EXPECT_TRUE(WaitForLog(host, "Network change by root reverted; before: "));
    EXPECT_TRUE(EventReported("(obz.user.velk.network.change.reverted)Network change by root reverted"));
}

const FailureCase kFailureCases[] = {
    {"GatewayOffTheSegment", nullptr, NetworkTest::kIpv4,
     NetworkTest::StaticIpv4("192.0.2.10", "255.255.255.0", "192.0.2.254"), "192.0.2.254"},
    {"WrongMask", nullptr, NetworkTest::kIpv4,
     NetworkTest::StaticIpv4("192.0.2.10", "255.255.255.128", "192.0.2.200"), "192.0.2.200"},
    {"VlanWithoutDhcpServer", nullptr, NetworkTest::kVlan, {"30"}, "address"},
    {"UplinkDown", nullptr, NetworkTest::kAdapters, {" ", "Down", "Down", "Down", " "}, "link"},
};
INSTANTIATE_TEST_SUITE_P(Simulated, TrialFailureTest, ::testing::ValuesIn(kFailureCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(TrialTest, GoodChangeIsKeptWithoutAKeyInUnderFiveSeconds) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kIpv4, StaticIpv4("192.0.2.10", "255.255.255.0", "192.0.2.1")));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    const auto start = std::chrono::steady_clock::now();
    t->Send("y");
    ASSERT_TRUE(t->WaitForText(kKept)) << t->Dump();
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
    EXPECT_TRUE(t->Shows("System Customization"));
    EXPECT_EQ(t->Output().find(kCheckTitle), std::string::npos);
    EXPECT_EQ(host.Get("/network/vnics/0/ipv4/address"), "192.0.2.10");
    EXPECT_TRUE(WaitForLog(host, "Network change by root kept; before: "));
    EXPECT_TRUE(EventReported("(obz.user.velk.network.change.kept)Network change by root kept"));
    // The line goes with the next drawing of the menu.
    ASSERT_TRUE(SelectEntry(*t, "Configure Management Network"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(kNetworkFooter));
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForMenu(*t));
    EXPECT_TRUE(t->WaitForTextGone(kKept));
}

TEST_F(TrialTest, AddressInUseIsRefusedBeforeAnythingIsWritten) {
    host.Set("/network/lan/0/hosts/192.0.2.77", json::object());
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kIpv4, StaticIpv4("192.0.2.77", "255.255.255.0", "192.0.2.1")));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    t->Send("y");
    ASSERT_TRUE(t->WaitForText(kInUse)) << t->Dump();
    t->SendKey("Enter");
    // Back in the window with the edit, nothing written or saved.
    ASSERT_TRUE(t->WaitForText(kNetworkFooter));
    ASSERT_TRUE(SelectEntry(*t, "IPv4 Configuration"));
    EXPECT_TRUE(t->Shows("IPv4 Address: 192.0.2.77"));
    EXPECT_TRUE(Operations(host).empty()) << json(Operations(host)).dump();
    EXPECT_TRUE(NotLogged(host, "Saved the network configuration"));
}

TEST_F(TrialTest, KeptAnywayStaysAndIsAudited) {
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kIpv4, StaticIpv4("192.0.2.10", "255.255.255.0", "192.0.2.254")));
    ASSERT_TRUE(ApplyToTheCheckScreen());
    t->SendKey("F11");
    ASSERT_TRUE(t->WaitForText(kKeptAnyway)) << t->Dump();
    EXPECT_EQ(host.Get("/network/routing/ipv4Gateway"), "192.0.2.254");
    EXPECT_TRUE(WaitForLog(host, "Network change by root kept anyway; before: "));
    EXPECT_TRUE(NotLogged(host, "reverted"));
}

// The whole minute, once, with no key.
TEST_F(TrialTest, CountdownAtZeroPutsTheChangeBack) {
    const json before = NetworkShape(host);
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kIpv4, StaticIpv4("192.0.2.10", "255.255.255.0", "192.0.2.254")));
    ASSERT_TRUE(ApplyToTheCheckScreen());
    ASSERT_TRUE(t->WaitForText(kReverted, Duration(70000))) << t->Dump();
    EXPECT_EQ(NetworkShape(host), before);
}

// The console ends while a change is on trial: killed outright, the next
// start puts the previous configuration back before the welcome screen; on a
// termination signal it does so itself before it ends.
struct EndCase {
    const char* name;
    bool atCheckScreen;  // else at a failed step's error box, before the checks
    int signal;
};
void PrintTo(const EndCase& c, std::ostream* os) { *os << c.name; }

class TrialEndTest : public TrialTest, public ::testing::WithParamInterface<EndCase> {};

TEST_P(TrialEndTest, ThePreviousConfigurationComesBack) {
    const EndCase& c = GetParam();
    const json before = NetworkShape(host);
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kIpv4, StaticIpv4("192.0.2.10", "255.255.255.0", "192.0.2.254")));
    if (c.atCheckScreen) {
        ASSERT_TRUE(ApplyToTheCheckScreen());
    } else {
        host.Fail("SetSearchDomains");
        t->SendKey("Esc");
        ASSERT_TRUE(t->WaitForText(kRestartQuestion));
        t->Send("y");
        ASSERT_TRUE(t->WaitForText(kErrorTitle));
        ASSERT_TRUE(WaitForLog(host, "Saved the network configuration before the change"));
        EXPECT_EQ(host.Get("/network/vnics/0/ipv4/address"), "192.0.2.10");
    }
    t->Signal(c.signal);
    ASSERT_TRUE(t->WaitForExit());
    host.Clear("SetSearchDomains");
    const bool killed = c.signal == SIGKILL;
    EXPECT_EQ(host.ConsoleLog(": Network change by root reverted;", t->Pid()).size(), killed ? 0u : 1u)
        << Joined(host.SyslogLines());

    ASSERT_TRUE(Start());
    EXPECT_EQ(NetworkShape(host), before);
    if (!killed) {
        EXPECT_TRUE(t->Lacks(kRevertedAtStart));
        return;
    }
    EXPECT_TRUE(t->Shows(kRevertedAtStart)) << t->Dump();
    EXPECT_TRUE(WaitForLog(host, "Network change by root reverted at start; before: "));
    // Said until the next login.
    ASSERT_TRUE(LogInToMenu(*t));
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForWelcome(*t));
    EXPECT_TRUE(t->Lacks(kRevertedAtStart));
}

const EndCase kEndCases[] = {
    {"KilledDuringTheSteps", false, SIGKILL},
    {"KilledAtTheCheckScreen", true, SIGKILL},
    {"TerminatedAtTheCheckScreen", true, SIGTERM},
};
INSTANTIATE_TEST_SUITE_P(Stages, TrialEndTest, ::testing::ValuesIn(kEndCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace E2e
