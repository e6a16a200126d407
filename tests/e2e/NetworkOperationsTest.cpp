// Restarting and testing the management network with the real console: the
// interface taken down and up with its new lease on screen, and the ping and
// resolver checks answered by the simulated network.
#include <dirent.h>

#include <fstream>
#include <iterator>

#include "LoggedIn.hpp"

namespace E2e {
namespace {

using nlohmann::json;

const char kRestartQuestion[] = "Restart management network now?";
const char kTestTitle[] = "Test Management Network";

// Processes whose command line holds every one of `parts`.
std::vector<pid_t> ProcessesWith(const std::vector<std::string>& parts) {
    std::vector<pid_t> found;
    DIR* proc = opendir("/proc");
    if (!proc) return found;
    while (dirent* e = readdir(proc)) {
        const pid_t pid = static_cast<pid_t>(atoi(e->d_name));
        if (pid <= 0) continue;
        std::ifstream in(std::string("/proc/") + e->d_name + "/cmdline", std::ios::binary);
        const std::string cmdline((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
        bool all = !cmdline.empty();
        for (const std::string& part : parts) all = all && cmdline.find(part) != std::string::npos;
        if (all) found.push_back(pid);
    }
    closedir(proc);
    return found;
}

class RestartTest : public ConsoleTest {
protected:
    ::testing::AssertionResult Restart() {
        if (auto selected = SelectEntry(*t, "Restart Management Network"); !selected) return selected;
        t->SendKey("Enter");
        if (auto asked = t->WaitForText(kRestartQuestion); !asked) return asked;
        t->SendKey("F11");
        return t->WaitForText("<Enter> OK");
    }

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

    // The DHCP server's pool moves: the restart gives up the old lease and
    // obtains one from the new pool. VLAN 0 has no IPv6 router: only the
    // link-local address, which is not listed.
    host.Set("/network/lan/0/dhcp/first", "192.0.2.150");
    host.Set("/network/lan/0/dhcp/last", "192.0.2.160");
    ASSERT_TRUE(Restart());
    EXPECT_TRUE(t->Shows("Stopping management network.")) << t->Dump();
    EXPECT_TRUE(t->Shows("Starting management network."));
    EXPECT_TRUE(t->Shows("IP address is 192.0.2.150")) << t->Dump();
    EXPECT_TRUE(t->Lacks("fe80"));
    EXPECT_EQ(EnableCalls(), (std::vector<json>{json{"qk0", false}, json{"qk0", true}}));
    EXPECT_TRUE(LoggedOnce(host, "user.info: Restarting qk0", t->Pid()));
    EXPECT_TRUE(host.ReadFile("/var/log/obzd.log").find("(obz.user.velk.network.restart)Restarting qk0") !=
                std::string::npos);

    // On VLAN 20 a router advertises a prefix: that address is listed.
    t->SendKey("Enter");
    ASSERT_TRUE(WaitForMenu(*t));
    host.Set("/network/vswitches/0/portgroups/0/vlan", 20);
    ASSERT_TRUE(Restart());
    EXPECT_TRUE(t->Shows("IP address is 198.51.100.100")) << t->Dump();
    EXPECT_TRUE(t->Shows("   2001:db8:20:0:250:56ff:fe01:2")) << t->Dump();
    EXPECT_TRUE(t->Lacks("fe80"));
    t->SendKey("Enter");
    ASSERT_TRUE(WaitForMenu(*t));
    t->SendKey("Esc");
    ASSERT_TRUE(WaitForWelcome(*t));
    EXPECT_TRUE(t->WaitForText("http://198.51.100.100/ (DHCP)"));
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

    std::vector<json> Pings() const {
        std::vector<json> args;
        for (const json& e : History(host, {"qelping"})) args.push_back(e["args"]);
        return args;
    }
};

TEST_F(TestDialogTest, DefaultTargetsAnswerAndTheNameResolves) {
    const std::string hosts = host.ReadFile("/etc/hosts");
    ASSERT_TRUE(OpenTest());
    // The gateway and the name server; no IPv6 gateway or server is set.
    EXPECT_TRUE(t->Shows("Ping Address #1")) << t->Dump();
    EXPECT_TRUE(t->Shows("192.0.2.1 ")) << t->Dump();
    EXPECT_TRUE(t->Shows("192.0.2.53")) << t->Dump();
    EXPECT_TRUE(t->Shows("host1.example.test")) << t->Dump();

    ASSERT_TRUE(RunAndWait());
    EXPECT_TRUE(t->Shows("Pinging address #1 (192.0.2.1).")) << t->Dump();
    EXPECT_TRUE(t->Shows("Pinging address #2 (192.0.2.53)."));
    EXPECT_TRUE(t->Lacks("Pinging address #3"));
    EXPECT_TRUE(t->Shows("Resolving hostname (host1.example.test)."));
    EXPECT_EQ(t->FindAll("OK.").size(), 3u) << t->Dump();
    EXPECT_TRUE(t->Lacks("Failed."));
    // The tool got the target where its count option was, then the interface.
    EXPECT_EQ(Pings(), (std::vector<json>{json{"192.0.2.1", "-I", "qk0"}, json{"192.0.2.53", "-I", "qk0"}}));
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
    EXPECT_FALSE(ProcessesWith({host.Root(), "qelping"}).empty());
    t->Signal(SIGTERM);
    ASSERT_TRUE(t->ExitsWith(0));
    EXPECT_TRUE(Eventually([&] { return ProcessesWith({host.Root(), "qelping"}).empty(); }, Duration(5000)));
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
