// Restarting and testing the management network: the interface taken down
// and up with its new lease on screen, and the ping and resolver checks.
#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "LoggedIn.hpp"

namespace E2e {
namespace {

using nlohmann::json;

const char kRestartQuestion[] = "Restart management network now?";
const char kTestTitle[] = "Test Management Network";

// Whether a process runs whose command line holds every one of `parts`.
bool Running(const std::vector<std::string>& parts) {
    for (const auto& process : std::filesystem::directory_iterator("/proc")) {
        std::ifstream in(process.path() / "cmdline", std::ios::binary);
        const std::string cmdline((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
        if (!cmdline.empty() && std::ranges::all_of(parts, [&](const std::string& part) {
                return cmdline.find(part) != std::string::npos;
            }))
            return true;
    }
    return false;
}

class RestartTest : public ConsoleTest {
protected:
    std::vector<json> EnableCalls() const {
        std::vector<json> calls;
        for (const json& e : History(host, {"hostctl"}))
            if (e["operation"] == "SetVnicEnabled") calls.push_back(e["args"]);
        return calls;
    }
};

TEST_F(RestartTest, OnlyF11RestartsAndTheNewLeaseIsShown) {
    ASSERT_TRUE(StartInMenu());
    ASSERT_TRUE(SelectEntry(*t, "Restart Management Network"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    EXPECT_TRUE(t->Shows("Restart Management Network: Confirm"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    EXPECT_TRUE(t->Shows(kRestartQuestion));
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForMenu(*t));
    EXPECT_TRUE(EnableCalls().empty());

    // Moved to VLAN 20, the interface takes a lease from that VLAN's server
    // when it comes up, and a router there advertises a prefix: that address
    // is listed, the link-local one is not.
    host.Set("/network/vswitches/0/portgroups/0/vlan", 20);
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText(kRestartQuestion));
    t->SendKey("F11");
    ASSERT_TRUE(t->WaitForText("<Enter> OK"));
    EXPECT_TRUE(t->Shows("Stopping management network.")) << t->Dump();
    EXPECT_TRUE(t->Shows("Starting management network."));
    EXPECT_TRUE(t->Shows("IP address is 198.51.100.100")) << t->Dump();
    EXPECT_TRUE(t->Shows("   2001:db8:20:0:250:56ff:fe01:2")) << t->Dump();
    EXPECT_TRUE(t->Lacks("fe80"));
    EXPECT_EQ(EnableCalls(), (std::vector<json>{json{"qk0", false}, json{"qk0", true}}));
    EXPECT_TRUE(LoggedOnce(host, "user.info: Restarting qk0", t->Pid()));
    EXPECT_TRUE(host.ReadFile("/var/log/obzd.log").find("(obz.user.velk.network.restart)Restarting qk0") !=
                std::string::npos);
}

class TestDialogTest : public ConsoleTest {
protected:
    ::testing::AssertionResult OpenTest() { return OpenEntry("Test Management Network", "Resolve Hostname"); }

    // Empties the selected field and types `text` into it.
    void Retype(const std::string& text) {
        t->SendKey("End");
        for (int i = 0; i < 30; ++i) t->SendKey("Backspace");
        t->Send(text);
    }

    ::testing::AssertionResult RunAndWait() {
        t->SendKey("Enter");
        if (auto shown = t->WaitForText("Testing Management Network"); !shown) return shown;
        return t->WaitForText("<Enter> OK");
    }
};

TEST_F(TestDialogTest, DefaultTargetsAnswerAndTheNameResolves) {
    const std::string hosts = host.ReadFile("/etc/hosts");
    ASSERT_TRUE(OpenTest());
    // The gateway and the name server; no IPv6 gateway or server is set.
    ASSERT_TRUE(RunAndWait());
    EXPECT_TRUE(t->Shows("Pinging address #1 (192.0.2.1).")) << t->Dump();
    EXPECT_TRUE(t->Shows("Pinging address #2 (192.0.2.53)."));
    EXPECT_TRUE(t->Shows("Resolving hostname (host1.example.test)."));
    EXPECT_EQ(t->FindAll("OK.").size(), 3u) << t->Dump();
    // The tool got the target where its count option was, then the interface.
    std::vector<json> pings;
    for (const json& e : History(host, {"qelping"})) pings.push_back(e["args"]);
    EXPECT_EQ(pings, (std::vector<json>{json{"192.0.2.1", "-I", "qk0"}, json{"192.0.2.53", "-I", "qk0"}}));
    // The hosts file is back as it was, and no copy is left.
    EXPECT_EQ(host.ReadFile("/etc/hosts"), hosts);
    EXPECT_FALSE(host.Exists("/etc/hosts.backup"));

    t->SendKey("Esc");  // only Enter closes the results
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    EXPECT_TRUE(t->Shows("Testing Management Network"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("Testing Management Network"));
    EXPECT_TRUE(t->Shows(kTestTitle));
}

TEST_F(TestDialogTest, WrongAddressesAndNamesOnlyInTheHostsFileFail) {
    host.Set("/network/pingTimeoutMs", 100);
    host.WriteFile("/etc/hosts", host.ReadFile("/etc/hosts") + "192.0.2.77\tonly-in-hosts.test\n");
    ASSERT_TRUE(OpenTest());
    Retype("1.2.3");
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Invalid IP or IPv6 address."));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForTextGone("Invalid IP or IPv6 address."));
    Retype("203.0.113.99");  // nobody there
    t->SendKey("Down");
    Retype("fe80::1");  // no router on this VLAN
    t->SendKey("Down");
    t->SendKey("Down");
    Retype("only-in-hosts.test");
    ASSERT_TRUE(RunAndWait());
    EXPECT_TRUE(t->Shows("Pinging address #2 (fe80::1%qk0).")) << t->Dump();
    EXPECT_EQ(t->FindAll("Failed.").size(), 3u) << t->Dump();
    EXPECT_TRUE(t->Shows("Resolving hostname (only-in-hosts.test)."));
    EXPECT_TRUE(host.ReadFile("/etc/hosts").find("only-in-hosts.test") != std::string::npos);
}

TEST_F(TestDialogTest, NothingToCheckShowsNoLines) {
    ASSERT_TRUE(OpenTest());
    for (int row = 0; row < 4; ++row) {
        Retype("");
        t->SendKey("Down");
    }
    ASSERT_TRUE(RunAndWait());
    EXPECT_TRUE(t->Lacks("Pinging")) << t->Dump();
    EXPECT_TRUE(t->Lacks("Resolving"));
    EXPECT_TRUE(History(host, {"qelping"}).empty());
}

TEST_F(TestDialogTest, EscDuringAPingEndsTheRunAndNoPingOutlivesTheConsole) {
    host.Set("/network/lan/0/hosts/192.0.2.1/delayMs", 60000);
    ASSERT_TRUE(OpenTest());
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitForText("Pinging address #1 (192.0.2.1)."));
    ASSERT_TRUE(WaitForHistory(host, "qelping"));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitForTextGone("Testing Management Network"));
    EXPECT_TRUE(t->Shows(kTestTitle));
    EXPECT_EQ(History(host, {"qelping"}).size(), 1u) << host.Get("/history").dump(1);
    // The ping goes on in the background until the console ends.
    EXPECT_TRUE(Running({host.Root(), "qelping"}));
    t->Signal(SIGTERM);
    ASSERT_TRUE(t->ExitsWith(0));
    EXPECT_TRUE(Eventually([&] { return !Running({host.Root(), "qelping"}); }, Duration(5000)));
}

TEST_F(TestDialogTest, AnExistingBackupFailsTheResolveAndStaysAsItWas) {
    const std::string hosts = host.ReadFile("/etc/hosts");
    host.WriteFile("/etc/hosts.backup", "a backup somebody keeps\n");
    ASSERT_TRUE(OpenTest());
    ASSERT_TRUE(RunAndWait());
    EXPECT_EQ(t->FindAll("OK.").size(), 2u) << t->Dump();
    EXPECT_EQ(t->FindAll("Failed.").size(), 1u);
    EXPECT_EQ(host.ReadFile("/etc/hosts"), hosts);
    EXPECT_EQ(host.ReadFile("/etc/hosts.backup"), "a backup somebody keeps\n");
    EXPECT_FALSE(host.ConsoleLog("failed to backup /etc/hosts: File exists").empty())
        << Joined(host.SyslogLines());
}

}  // namespace
}  // namespace E2e
