// The real console on a Debian host: `velk` without a simulated host, started
// inside the bed's host namespace with the test's own /etc, logs in through
// the real PAM stack (pam_unix and the test's shadow file), shows the host's
// real name and address, and the typical path (IPv4 Configuration, a static
// address, Esc, Y) changes the namespace's address through ifupdown, with a
// VM port left on the bridge and only the management stanza's lines of the
// interfaces file changed. Both ifupdown flavours.
#include <gtest/gtest.h>

#include <cstdlib>
#include <nlohmann/json.hpp>

#include "LoggedIn.hpp"
#include "NetnsBed.hpp"
#include "Terminal.hpp"

using E2e::Terminal;
using E2e::TerminalOptions;
using Netns::BedOptions;
using Netns::NetnsBed;
using nlohmann::json;

namespace {

constexpr char kPassword[] = "Deb-host-42";

struct Flavour {
    const char* name;
    bool ifupdown2;
};

std::string Interfaces(bool ifupdown2, const std::string& address) {
    return "# Written by the test.\n"
           "auto lo\niface lo inet loopback\n\n"
           "iface eno1 inet manual\n\niface eno2 inet manual\n\n"
           "auto vmbr0\niface vmbr0 inet static\n"
           "\taddress " +
           address + "\n\tgateway 192.0.2.1\n\tbridge-ports eno1\n\tbridge-stp off\n\tbridge-fd 0\n" +
           (ifupdown2 ? "\tbridge-ports-condone-regex ^(tap|veth|fwpr)\n" : "") +
           "\t# VM ports come and go\n\n"
           "auto vmbr1\niface vmbr1 inet manual\n\tbridge-ports none\n" +
           (ifupdown2 ? "\tbridge-ports-condone-regex ^(tap|veth|fwpr)\n" : "");
}

// The IPv4 addresses of a link, as `ip -json addr` shows them.
std::vector<std::string> Ipv4Of(const NetnsBed& bed, const std::string& link) {
    std::vector<std::string> found;
    const Netns::RunResult r = bed.Run("ip -json addr show dev " + link);
    if (!r.Ok()) return found;
    for (const json& l : json::parse(r.out))
        for (const json& a : l.value("addr_info", json::array()))
            if (a.value("family", "") == "inet")
                found.push_back(a.value("local", "") + "/" + std::to_string(a.value("prefixlen", 0)));
    return found;
}

std::string MasterOf(const NetnsBed& bed, const std::string& link) {
    const Netns::RunResult r = bed.Run("ip -json link show dev " + link);
    if (!r.Ok()) return "";
    return json::parse(r.out).at(0).value("master", "");
}

class ConsoleTest : public ::testing::TestWithParam<Flavour> {};

TEST_P(ConsoleTest, TypicalPathChangesTheRealAddress) {
    BedOptions options;
    options.ifupdown2 = GetParam().ifupdown2;
    NetnsBed bed(options);
    if (bed.Skipped()) GTEST_SKIP() << bed.SkipReason();
    const std::string before = Interfaces(GetParam().ifupdown2, "192.0.2.10/24");
    bed.WriteFile("/etc/network/interfaces", before);
    ASSERT_TRUE(bed.Run("ifup vmbr0", Netns::Duration(30000)).Ok());
    ASSERT_EQ(Ipv4Of(bed, "vmbr0"), std::vector<std::string>{"192.0.2.10/24"});
    bed.WriteFile("/etc/pam.d/velk",
                  "auth required pam_unix.so\naccount required pam_unix.so\n"
                  "password required pam_unix.so yescrypt\nsession required pam_unix.so\n");
    bed.SetPassword("root", kPassword);
    // The bed's NICs are veth pairs, without hardware behind them.
    bed.WriteFile("/etc/velk/velk.conf", "physical-nics = eno*\n");

    const std::vector<std::string> argv = bed.Wrap({VELK_BIN});
    TerminalOptions console;
    console.program = argv[0];
    console.args.assign(argv.begin() + 1, argv.end());
    console.env = {"LANG=C.UTF-8", "ESCDELAY=25", "PATH=/usr/sbin:/usr/bin:/sbin:/bin"};
    for (const char* name : {"ASAN_OPTIONS", "UBSAN_OPTIONS", "LSAN_OPTIONS"})
        if (const char* value = getenv(name)) console.env.push_back(std::string(name) + "=" + value);
    Terminal t(console);

    // The namespace's own name and address, no simulated value.
    ASSERT_TRUE(E2e::WaitForWelcome(t, Netns::Duration(20000)));
    EXPECT_TRUE(t.Shows("http://velk-host/"));
    EXPECT_TRUE(t.Shows("http://192.0.2.10/ (STATIC)"));

    ASSERT_TRUE(E2e::SubmitLogin(t, kPassword));
    ASSERT_TRUE(E2e::WaitForMenu(t));
    ASSERT_TRUE(E2e::SelectEntry(t, "Configure Management Network"));
    t.SendKey("Enter");
    ASSERT_TRUE(t.WaitForText("<Esc> Exit"));
    ASSERT_TRUE(E2e::SelectEntry(t, "IPv4 Configuration"));
    EXPECT_TRUE(t.Shows("IPv4 Address: 192.0.2.10"));
    t.SendKey("Enter");
    ASSERT_TRUE(t.WaitForText("Set static IPv4 address"));
    // The static choice (already marked), then its address field.
    for (const char* key : {"Down", "Down", " ", "Down"}) key[0] == ' ' ? t.Send(key) : t.SendKey(key);
    for (int i = 0; i < 15; ++i) t.SendKey("Backspace");
    t.Send("192.0.2.20");
    t.SendKey("Enter");
    ASSERT_TRUE(t.WaitForTextGone("Set static IPv4 address"));
    EXPECT_TRUE(t.Shows("IPv4 Address: 192.0.2.20"));
    t.SendKey("Esc");
    ASSERT_TRUE(t.WaitForText("Apply changes and restart management network?"));
    t.Send("y");
    ASSERT_TRUE(t.WaitForText("System Customization", Netns::Duration(40000)));
    EXPECT_TRUE(t.Lacks("Error")) << t.Dump();

    EXPECT_EQ(Ipv4Of(bed, "vmbr0"), std::vector<std::string>{"192.0.2.20/24"});
    // The VM ports stayed, the second bridge and the NIC with them.
    EXPECT_EQ(MasterOf(bed, "tap100i0"), "vmbr0");
    EXPECT_EQ(MasterOf(bed, "tap101i0"), "vmbr1");
    EXPECT_EQ(MasterOf(bed, "eno1"), "vmbr0");
    // Only the management stanza's address line changed (and, on ifupdown2,
    // nothing more: both bridges already keep their VM ports).
    EXPECT_EQ(bed.ReadFile("/etc/network/interfaces").value_or(""),
              Interfaces(GetParam().ifupdown2, "192.0.2.20/24"));
    // The file as it was is kept for the way back.
    EXPECT_EQ(bed.ReadFile("/var/lib/velk/network/original/etc/network/interfaces").value_or(""), before);

    t.SendKey("Esc");
    ASSERT_TRUE(E2e::WaitForWelcome(t));
    EXPECT_TRUE(t.Shows("http://192.0.2.20/ (STATIC)"));
    t.Signal(SIGTERM);
    EXPECT_TRUE(t.ExitsWith(0));
}

INSTANTIATE_TEST_SUITE_P(Debian, ConsoleTest,
                         ::testing::Values(Flavour{"ifupdown", false}, Flavour{"ifupdown2", true}),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
