// Changes of the management network on trial, on a simulated host: a change
// that fails its checks comes back unless the operator keeps it, a good one
// is kept without a key, an address in use is refused before anything is
// written, and a console that dies in the middle leaves the next start to
// put the previous configuration back.
#include <algorithm>
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
const char kProbeFailed[] = "The management network could not be probed for another machine";
const char kFactoryQuestion[] = "Are you sure you want to reset the host network";
const char kNotPutBack[] = "The previous network configuration could not be put back.";
const char kMarker[] = "/var/lib/velk/network/trial";

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
    explicit TrialTest(const std::string& network = "") : NetworkTest(network) {}

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
    EXPECT_TRUE(t->Shows("restarts the count).")) << t->Dump();  // the count's second row

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

// Before anything is written, the new static address is probed for on its
// link: an address another machine answers for is refused; a probe that
// cannot be made only warns, since the checks after the change would still
// find a duplicate.
struct ProbeCase {
    const char* name;
    const char* pointer;  // set in the state before the apply
    nlohmann::json value;
    const char* shown;
    bool applied;
};
void PrintTo(const ProbeCase& c, std::ostream* os) { *os << c.name; }

class TrialProbeTest : public TrialTest, public ::testing::WithParamInterface<ProbeCase> {};

TEST_P(TrialProbeTest, TheAnswerDecidesTheApply) {
    const ProbeCase& c = GetParam();
    host.Set(c.pointer, c.value);
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kIpv4, StaticIpv4("192.0.2.77", "255.255.255.0", "192.0.2.1")));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    t->Send("y");
    ASSERT_TRUE(t->WaitForText(c.shown)) << t->Dump();
    t->SendKey("Enter");
    if (c.applied) {
        ASSERT_TRUE(t->WaitForText(kKept)) << t->Dump();
        EXPECT_EQ(host.Get("/network/vnics/0/ipv4/address"), "192.0.2.77");
        EXPECT_TRUE(WaitForLog(host, "Probing for 192.0.2.77 failed: no raw socket"));
        return;
    }
    // Back in the window with the edit, nothing written or saved.
    ASSERT_TRUE(t->WaitForText(kNetworkFooter));
    ASSERT_TRUE(SelectEntry(*t, "IPv4 Configuration"));
    EXPECT_TRUE(t->Shows("IPv4 Address: 192.0.2.77"));
    EXPECT_TRUE(Operations(host).empty()) << json(Operations(host)).dump();
    EXPECT_TRUE(NotLogged(host, "Saved the network configuration"));
}

const ProbeCase kProbeCases[] = {
    {"AddressInUseIsRefused", "/network/lan/0/hosts/192.0.2.77", json::object(), kInUse, false},
    {"FailedProbeOnlyWarns", "/faults/ProbeIpv4Address", "no raw socket", kProbeFailed, true},
};
INSTANTIATE_TEST_SUITE_P(Probe, TrialProbeTest, ::testing::ValuesIn(kProbeCases),
                         [](const auto& info) { return std::string(info.param.name); });

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

// Putting back goes wrong as well: the previous configuration fails its
// checks too, or the host refuses it (the change stays on trial for the next
// start). Either way the factory network restore is offered.
struct RevertCase {
    const char* name;
    const char* fault;  // set once the check screen is up
    const char* shown;
};
void PrintTo(const RevertCase& c, std::ostream* os) { *os << c.name; }

class TrialRevertTest : public TrialTest, public ::testing::WithParamInterface<RevertCase> {};

TEST_P(TrialRevertTest, TheFactoryRestoreIsOffered) {
    const RevertCase& c = GetParam();
    const json before = NetworkShape(host);
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kIpv4, StaticIpv4("192.0.2.10", "255.255.255.0", "192.0.2.254")));
    ASSERT_TRUE(ApplyToTheCheckScreen());
    host.Fail(c.fault);
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(c.shown)) << t->Dump();
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(kFactoryQuestion)) << t->Dump();
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForMenu(*t)) << t->Dump();
    EXPECT_TRUE(t->Lacks(kReverted));
    host.Clear(c.fault);
    const bool refused = std::string(c.shown) == kNotPutBack;
    EXPECT_EQ(host.Exists(kMarker), refused);
    if (!refused) {
        EXPECT_EQ(NetworkShape(host), before);
        return;
    }
    EXPECT_EQ(host.Get("/network/routing/ipv4Gateway"), "192.0.2.254");
    // Left on trial, the change goes at the next start.
    t->Signal(SIGTERM);
    ASSERT_TRUE(t->WaitForExit());
    ASSERT_TRUE(Start());
    EXPECT_TRUE(t->Shows(kRevertedAtStart)) << t->Dump();
    EXPECT_EQ(NetworkShape(host), before);
}

const RevertCase kRevertCases[] = {
    {"ItFailsItsChecksToo", "CheckNetwork", "Restore Factory Settings"},
    {"TheHostRefusesIt", "SetNetworkConfig", kNotPutBack},
};
INSTANTIATE_TEST_SUITE_P(Revert, TrialRevertTest, ::testing::ValuesIn(kRevertCases),
                         [](const auto& info) { return std::string(info.param.name); });

// The factory network restore is on trial too: DHCP where no server answers
// fails its check and the static configuration before it comes back.
class StaticTrialTest : public TrialTest {
protected:
    StaticTrialTest() : TrialTest("static,no-dhcp") {}
};

TEST_F(StaticTrialTest, FactoryRestoreThatFailsItsChecksComesBack) {
    const json before = NetworkShape(host);
    ASSERT_TRUE(OpenEntry("Network Restore Options", "Restore Network Settings"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(kFactoryQuestion));
    t->SendKey("F11");
    ASSERT_TRUE(t->WaitForText(kCountdown)) << t->Dump();
    EXPECT_TRUE(t->Shows("no address")) << t->Dump();
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("<Enter> OK")) << t->Dump();
    EXPECT_TRUE(t->Shows("Checking the management network. Failed.")) << t->Dump();
    EXPECT_EQ(NetworkShape(host), before);
    EXPECT_TRUE(WaitForLog(host, "Network change by root reverted; before: "));
}

// The console ends while a change is on trial: killed outright, the next
// start puts the previous configuration back before the welcome screen; on a
// termination signal or an idle log-out it does so itself. Each stage is
// reached with the address already changed.
struct EndCase {
    const char* name;
    const char* fault;  // a step that fails: the console waits at its error box
    const char* slow;   // an operation that takes its time: the console is inside it
    const char* stage;  // the console's log line once there; null: the check screen
    int signal;         // 0: no key until the idle log-out
};
void PrintTo(const EndCase& c, std::ostream* os) { *os << c.name; }

class TrialEndTest : public TrialTest, public ::testing::WithParamInterface<EndCase> {};

TEST_P(TrialEndTest, ThePreviousConfigurationComesBack) {
    const EndCase& c = GetParam();
    const json before = NetworkShape(host);
    if (!c.signal) host.Set("/advancedOptions/~1UserVars~1VelkTimeOut", 60);
    ASSERT_TRUE(OpenNetwork());
    ASSERT_TRUE(Edit(kIpv4, StaticIpv4("192.0.2.10", "255.255.255.0", "192.0.2.254")));
    if (c.fault) host.Fail(c.fault);
    if (c.slow) host.Slow(c.slow, 60);
    if (c.stage) {
        t->SendKey("Esc");
        ASSERT_TRUE(t->WaitForText(kRestartQuestion));
        t->Send("y");
        ASSERT_TRUE(WaitForLog(host, c.stage));
    } else {
        ASSERT_TRUE(ApplyToTheCheckScreen());
    }
    ASSERT_TRUE(WaitForLog(host, "Saved the network configuration before the change"));
    EXPECT_EQ(host.Get("/network/vnics/0/ipv4/address"), "192.0.2.10");
    if (c.slow) {
        // Inside the slowed operation: it has not acted, no check has come back.
        const std::vector<std::string> done = Operations(host);
        EXPECT_EQ(std::count(done.begin(), done.end(), c.slow), 0) << json(done).dump();
        EXPECT_TRUE(NotLogged(host, "Network check:"));
    }

    if (c.signal) {
        t->Signal(c.signal);
        ASSERT_TRUE(t->WaitForExit());
    } else {
        ASSERT_TRUE(WaitForWelcome(*t, Duration(75000))) << t->Dump();
    }
    if (c.fault) host.Clear(c.fault);
    if (c.slow) host.Slow(c.slow, 0);
    const bool killed = c.signal == SIGKILL;
    EXPECT_EQ(host.ConsoleLog(": Network change by root reverted;", t->Pid()).size(), killed ? 0u : 1u)
        << Joined(host.SyslogLines());
    if (!c.signal) {
        EXPECT_EQ(NetworkShape(host), before);
        EXPECT_FALSE(host.Exists(kMarker));
        return;
    }

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
    {"KilledAtAFailedStep", "SetSearchDomains", nullptr, "Setting DNS failed: ", SIGKILL},
    {"KilledDuringAStep", nullptr, "SetDefaultGateway", "Setting default gateway to 192.0.2.254", SIGKILL},
    {"KilledDuringTheChecks", nullptr, "CheckNetwork", "Checking the management network", SIGKILL},
    {"KilledAtTheCheckScreen", nullptr, nullptr, nullptr, SIGKILL},
    {"TerminatedAtTheCheckScreen", nullptr, nullptr, nullptr, SIGTERM},
    {"IdleAtAFailedStep", "SetSearchDomains", nullptr, "Setting DNS failed: ", 0},
};
INSTANTIATE_TEST_SUITE_P(Stages, TrialEndTest, ::testing::ValuesIn(kEndCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace E2e
