// The welcome screen of the real console: layout and colours on the local
// console and on serial terminals, the host's values, and how it follows
// changes of the host after the refresh signal.
#include <signal.h>

#include <cstring>
#include <functional>
#include <thread>

#include "SimHost.hpp"
#include "Terminal.hpp"

namespace E2e {
namespace {

using nlohmann::json;

const char kTitle[] = "Tarni 8.0.2 (QELKernel 8.0.2 Build releasebuild-22380479)";
const char kFooterLeft[] = "<F2> Customize System/View Logs";
const char kFooterRight[] = "<F12> Shut Down/Restart";
const char kNoAdapter[] =
    "No compatible network adapter found. Please consult the product's Hardware Compatibility Guide (HCG) "
    "for a list of supported adapters.";
const char kNoAdapterAlert[] = "No compatible network adapter found.";

// The welcome screen is complete once its footer is drawn and output pauses.
::testing::AssertionResult WaitForWelcome(Terminal& t) { return t.WaitForText("Shut Down/Restart"); }

// Where the console puts things: the upper half has LINES/2 rows, the lower
// half the rest, the network text starts on the lower half's second row.
struct Layout {
    int cols, rows;
    int Upper() const { return rows / 2; }
    int NetworkRow() const { return Upper() + 1; }
    int FooterRow() const { return rows - 2; }
};

std::string NetworkText(const Terminal& t) { return t.RegionText(8, t.Rows() / 2 + 1, t.Cols() - 16, 7); }

// The warning area has six rows, of which a short screen shows only those
// above the footer.
std::string WarningText(const Terminal& t) {
    const int row = t.Rows() / 2 + 9;
    return t.RegionText(16, row, t.Cols() - 32, std::min(6, t.Rows() - 2 - row));
}

struct ScreenCase {
    const char* term;
    int cols, rows;
    bool color;  // false: black/white mode (the terminal cannot redefine colours)
};
void PrintTo(const ScreenCase& c, std::ostream* os) {
    *os << "TERM=" << c.term << " " << c.cols << "x" << c.rows;
}

// The console on the case's terminal, showing the welcome screen.
class WelcomeLayoutTest : public ::testing::TestWithParam<ScreenCase> {
protected:
    void SetUp() override { ASSERT_TRUE(WaitForWelcome(t)); }

    const ScreenCase& p = GetParam();
    const Layout l{p.cols, p.rows};
    SimHost host;
    Terminal t{host.Console(p.term, p.cols, p.rows)};
};

TEST_P(WelcomeLayoutTest, TextsAndColoursInTheirPlaces) {
    EXPECT_TRUE(t.HasTextAt(8, 5, std::string(kTitle) + "   "));
    EXPECT_TRUE(t.HasTextAt(8, 7, "Acme Server 9   "));
    EXPECT_TRUE(t.HasTextAt(8, 9, "2 x Acme Processor A9-2400 @ 2.40GHz   "));
    EXPECT_TRUE(t.HasTextAt(8, 10, "16 GiB Memory   "));
    EXPECT_TRUE(t.HasTextAt(8, l.NetworkRow(), "Download tools to manage this host from:   "));
    EXPECT_TRUE(t.HasTextAt(8, l.NetworkRow() + 1, "http://host1/   "));
    EXPECT_TRUE(t.HasTextAt(8, l.NetworkRow() + 2, "http://192.0.2.100/ (DHCP)   "));
    EXPECT_TRUE(t.HasTextAt(8, l.NetworkRow() + 3, "http://[fe80::250:56ff:fe01:2]/ (AUTOCONF)   "));
    EXPECT_EQ(NetworkText(t),
              "Download tools to manage this host from: http://host1/ http://192.0.2.100/ (DHCP) "
              "http://[fe80::250:56ff:fe01:2]/ (AUTOCONF)");
    EXPECT_EQ(WarningText(t), "");

    // Footer: left part at column 2, right part ending at column COLS-3.
    EXPECT_TRUE(t.HasTextAt(2, l.FooterRow(), kFooterLeft));
    EXPECT_TRUE(
        t.HasTextAt(l.cols - 2 - int(strlen(kFooterRight)), l.FooterRow(), std::string(kFooterRight) + " "));
    EXPECT_EQ(t.FindAll("<F2>").size(), 1u);

    // A box around the whole screen.
    EXPECT_EQ(t.CellAt(0, 0).text, "┌") << t.Dump();
    EXPECT_EQ(t.CellAt(l.cols - 1, 0).text, "┐");
    EXPECT_EQ(t.CellAt(0, l.rows - 1).text, "└");
    EXPECT_EQ(t.CellAt(l.cols - 1, l.rows - 1).text, "┘");
    EXPECT_EQ(t.CellAt(0, l.rows / 2).text, "│");

    // Every cell inside the box belongs to one of the halves, upper dark grey
    // and lower yellow; with an odd number of rows the lower half has the
    // extra row.
    int wrong = 0;
    for (int row = 1; row < l.rows - 1 && wrong < 5; ++row) {
        const bool upper = row < l.Upper();
        for (int col = 1; col < l.cols - 1 && wrong < 5; ++col) {
            const Cell cell = t.CellAt(col, row);
            const bool ok = p.color
                                ? cell.bg.IsIndex(upper ? 6 : 3) && !cell.reverse
                                : cell.bg == CellColor{} && cell.fg == CellColor{} && cell.reverse == upper;
            if (!ok) {
                ++wrong;
                ADD_FAILURE() << "cell " << col << "," << row << " (" << (upper ? "upper" : "lower")
                              << " half): fg " << ToString(cell.fg) << ", bg " << ToString(cell.bg)
                              << (cell.reverse ? ", reverse" : "");
            }
        }
    }
    if (wrong) ADD_FAILURE() << t.Dump(true);
    if (!p.color) {
        EXPECT_TRUE(t.PaletteLog().empty())
            << t.PaletteLog().size() << " palette changes in black/white mode";
        return;
    }
    struct Expect {
        const char* what;
        Pos pos;
        int fg, bg;
    };
    const Expect texts[] = {
        {"title", {8, 5}, 7, 6},
        {"memory", {8, 10}, 7, 6},
        {"network", {8, l.NetworkRow()}, 0, 3},
        {"<F2>", {2, l.FooterRow()}, 0, 3},
        {"Customize", {7, l.FooterRow()}, 6, 3},
        {"<F12>", {l.cols - 25, l.FooterRow()}, 0, 3},
        {"Shut Down", {l.cols - 19, l.FooterRow()}, 6, 3},
    };
    for (const auto& e : texts) {
        const Cell cell = t.CellAt(e.pos.col, e.pos.row);
        EXPECT_TRUE(cell.fg.IsIndex(e.fg) && cell.bg.IsIndex(e.bg))
            << e.what << " at " << e.pos.col << "," << e.pos.row << " \"" << cell.text << "\": fg "
            << ToString(cell.fg) << ", bg " << ToString(cell.bg) << ", expected " << e.fg << " on " << e.bg;
    }
    // The redefined colours, 0..1000 scaled to 8 bits as terminfo does.
    const std::pair<int, Rgb> palette[] = {
        {3, {254, 204, 0}}, {6, {84, 84, 84}}, {2, {169, 169, 169}}, {7, {254, 254, 254}}, {1, {254, 0, 0}}};
    for (const auto& [index, rgb] : palette) {
        std::optional<Rgb> got = t.PaletteColor(index);
        EXPECT_TRUE(got && *got == rgb)
            << "colour " << index << " is " << (got ? ToString(*got) : std::string("not redefined"))
            << ", expected " << ToString(rgb);
    }
    EXPECT_EQ(t.PaletteColor(0), std::nullopt) << "colour 0 keeps its definition";
}

// 78x23 is the smallest size the console draws on.
INSTANTIATE_TEST_SUITE_P(
    Terms, WelcomeLayoutTest,
    ::testing::Values(ScreenCase{"linux", 80, 25, true}, ScreenCase{"linux", 80, 24, true},
                      ScreenCase{"linux", 78, 23, true}, ScreenCase{"linux", 300, 100, true},
                      ScreenCase{"xterm-256color", 80, 25, true}, ScreenCase{"xterm", 80, 25, false},
                      ScreenCase{"vt100", 100, 31, false}),
    [](const auto& info) {
        return std::string(info.param.term == std::string("xterm-256color") ? "xterm256" : info.param.term) +
               "_" + std::to_string(info.param.cols) + "x" + std::to_string(info.param.rows);
    });

json Ipv6(const std::string& address, const std::string& type) {
    return {{"address", address}, {"prefix", 64}, {"type", type}};
}
json Ipv6List(int count) {
    json list = json::array();
    for (int i = 1; i <= count; ++i) list.push_back(Ipv6("2001:db8::" + std::to_string(i), "static"));
    return list;
}

// A change of the host while the console shows the welcome screen, followed
// by the refresh signal.
struct ValueCase {
    const char* name;
    std::vector<std::pair<std::string, json>> changes;  // JSON pointer, new value
    std::optional<std::string> network;                 // the network text, rows joined
    std::vector<std::string> shown;                     // each on one row
    std::vector<std::string> hidden;
    std::optional<std::string> warning;
    int rows = 25;  // the warning area needs a tall screen to be seen whole
};
void PrintTo(const ValueCase& c, std::ostream* os) { *os << c.name; }

const std::string kDownload = "Download tools to manage this host from:";
const std::string kLinkLocal = "http://[fe80::250:56ff:fe01:2]/ (AUTOCONF)";

const ValueCase kValueCases[] = {
    {"StaticAddressEmptyHostNameNotLinked",
     {{"/network/vnics/0/ipv4/address", "10.0.0.7"},
      {"/network/vnics/0/ipv4/dhcp", false},
      {"/network/dns/hostname", ""}},
     kDownload + " http://10.0.0.7/ (STATIC) " + kLinkLocal,
     {"http://10.0.0.7/ (STATIC)"},
     {"192.0.2.100", "(DHCP)", "http:///"}},
    {"Ipv4OffIpv6Disabled",
     {{"/network/vnics/0/ipv4/none", true}, {"/network/ipv6Enabled", false}},
     kDownload + " http://host1/",
     {},
     {"http://192.0.2.100/", "http://["}},
    {"WaitingForDhcp",
     {{"/network/vnics/0/ipv4/address", "0.0.0.0"}},
     std::nullopt,
     {"Waiting for DHCP..."},
     {"http://192.0.2.100/"},
     "Warning: DHCP lookup failed. You may be unable to access this system until you customize its network "
     "configuration.",
     40},
    {"AuditMode",
     {{"/system/bootOptions/auditMode", true}},
     std::nullopt,
     {},
     {},
     "Warning: Host is running in audit mode. Your configuration will not be persistent across reboots. "
     "Please contact support.",
     40},
    {"Ipv6Origins",
     {{"/network/vnics/0/ipv6/addresses",
       json::array(
           {Ipv6("2001:db8::5", "static"), Ipv6("2001:db8::6", "dhcp"), Ipv6("fe80::1", "autoconf")})}},
     kDownload + " http://host1/ http://192.0.2.100/ (DHCP) http://[2001:db8::5]/ (STATIC) "
                 "http://[2001:db8::6]/ (DHCP) http://[fe80::1]/ (AUTOCONF)",
     {"http://[2001:db8::5]/ (STATIC)", "http://[2001:db8::6]/ (DHCP)", "http://[fe80::1]/ (AUTOCONF)"}},
    // "localhost" is not linked, which leaves five rows for the IPv6 list.
    {"FiveIpv6AllListed",
     {{"/network/dns/hostname", "localhost"}, {"/network/vnics/0/ipv6/addresses", Ipv6List(5)}},
     kDownload +
         " http://192.0.2.100/ (DHCP) http://[2001:db8::1]/ (STATIC) http://[2001:db8::2]/ (STATIC) "
         "http://[2001:db8::3]/ (STATIC) http://[2001:db8::4]/ (STATIC) http://[2001:db8::5]/ (STATIC)",
     {},
     {"..."}},
    {"SixIpv6FourListed",
     {{"/network/dns/hostname", "localhost"}, {"/network/vnics/0/ipv6/addresses", Ipv6List(6)}},
     kDownload + " http://192.0.2.100/ (DHCP) http://[2001:db8::1]/ (STATIC) http://[2001:db8::2]/ (STATIC) "
                 "http://[2001:db8::3]/ (STATIC) http://[2001:db8::4]/ (STATIC) ...",
     {},
     {"2001:db8::5", "2001:db8::6"}},
    // With the host-name and IPv4 lines, the list is cut early so that its
    // "..." stays inside the seven rows of the area.
    {"SixIpv6WithHostNameEndInsideTheArea",
     {{"/network/vnics/0/ipv6/addresses", Ipv6List(6)}},
     kDownload + " http://host1/ http://192.0.2.100/ (DHCP) http://[2001:db8::1]/ (STATIC) "
                 "http://[2001:db8::2]/ (STATIC) http://[2001:db8::3]/ (STATIC) ...",
     {"..."},
     {"2001:db8::4"}},
    // The host's own texts are not the screen's mark-up; a vendor the product
    // does not start with is put in front.
    {"BracesInHostTextsShownAsTheyStand",
     {{"/network/dns/hostname", "{color:red}x{/color}"},
      {"/hardware/vendor", "{"},
      {"/hardware/product", "Box {color:red}y{/color}"},
      {"/hardware/cpu/model", "CPU {color:red}z{/color} {"}},
     std::nullopt,
     {"http://{color:red}x{/color}/", "{ Box {color:red}y{/color}", "2 x CPU {color:red}z{/color} {"}},
    {"HostNameWithLineEndsStaysOnItsLine",
     {{"/network/dns/hostname", "lab\r\nrow"}},
     kDownload + " http://lab??row/ http://192.0.2.100/ (DHCP) " + kLinkLocal},
    // An unreadable configuration has no address to show; the reason is the
    // warning.
    {"UnreadableConfigurationShowsNoAddress",
     {{"/faults", {{"GetVnicIpConfig", "the interface table is locked"}}}},
     kDownload,
     {"the interface table is locked"},
     {"0.0.0.0", "(STATIC)"},
     std::nullopt,
     40},
    {"MemoryRoundedUpWithOneDecimal",  // 6300 MiB, rounded up to 6400 MiB
     {{"/hardware/memory/totalPages", 6300 * 256}},
     std::nullopt,
     {"6.2 GiB Memory"},
     {"16 GiB Memory"}},
    {"OnePackageMemoryTebibytes",
     {{"/hardware/cpu/packages", 1}, {"/hardware/memory/totalPages", 1536LL * 1024 * 256}},
     std::nullopt,
     {"Acme Processor A9-2400 @ 2.40GHz", "1.5 TiB Memory"},
     {"x Acme Processor", "GiB Memory"}},
    // Pages times page size past 64 bits: the largest size, not a wrapped one.
    {"MemoryBeyondSixtyFourBits",
     {{"/hardware/memory/totalPages", 1ULL << 62}},
     std::nullopt,
     {"15.9 EiB Memory"},
     {" MiB Memory"}},
};

// What the screen shows unlike the case expects; "" when nothing.
std::string Mismatch(const Terminal& t, const ValueCase& c) {
    if (c.network && NetworkText(t) != *c.network)
        return "network text \"" + NetworkText(t) + "\", expected \"" + *c.network + "\"";
    if (c.warning && WarningText(t) != *c.warning)
        return "warning \"" + WarningText(t) + "\", expected \"" + *c.warning + "\"";
    for (const auto& text : c.shown)
        if (!t.Contains(text)) return "\"" + text + "\" not shown";
    for (const auto& text : c.hidden)
        if (t.Contains(text)) return "\"" + text + "\" shown";
    return "";
}

class WelcomeValuesTest : public ::testing::TestWithParam<ValueCase> {};

TEST_P(WelcomeValuesTest, ShownAfterRefreshSignal) {
    const ValueCase& c = GetParam();
    SimHost host;
    Terminal t(host.Console("linux", 80, c.rows));
    ASSERT_TRUE(WaitForWelcome(t));
    ASSERT_TRUE(t.Shows("http://192.0.2.100/ (DHCP)"));
    for (const auto& [pointer, value] : c.changes) host.Set(pointer, value);
    t.Signal(SIGUSR1);
    for (auto end = std::chrono::steady_clock::now() + kDefaultTimeout;
         !Mismatch(t, c).empty() && std::chrono::steady_clock::now() < end;)
        std::this_thread::sleep_for(Duration(10));
    ASSERT_TRUE(t.WaitQuiet());
    EXPECT_EQ(Mismatch(t, c), "") << t.Dump();
    EXPECT_TRUE(t.Shows(kTitle));
    EXPECT_FALSE(t.HasExited()) << "the refresh signal ended the console";
    EXPECT_EQ(host.Get("/system/systemAlert"), "") << "only a host without adapters raises the alert";
}

INSTANTIATE_TEST_SUITE_P(Changes, WelcomeValuesTest, ::testing::ValuesIn(kValueCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(WelcomeScreenTest, MissingAdapterAlertRaisedOncePerRun) {
    SimHost host;
    const json pnics = host.Get("/network/pnics");
    host.Set("/network/pnics", json::array());
    Terminal t(host.Console());
    ASSERT_TRUE(t.WaitForText(kNoAdapterAlert));
    EXPECT_EQ(NetworkText(t), kNoAdapter) << t.Dump();
    EXPECT_EQ(host.Get("/system/systemAlert"), kNoAdapterAlert);

    // Cleared by someone else: the next draws of this run leave it alone.
    host.Set("/system/systemAlert", "");
    t.Signal(SIGUSR1);
    ASSERT_TRUE(t.WaitQuiet(Duration(300)));
    t.Signal(SIGUSR1);
    ASSERT_TRUE(t.WaitQuiet(Duration(300)));
    EXPECT_TRUE(t.Shows(kNoAdapterAlert));
    EXPECT_EQ(host.Get("/system/systemAlert"), "");

    // The adapters come back: so does the normal network text.
    host.Set("/network/pnics", pnics);
    t.Signal(SIGUSR1);
    EXPECT_TRUE(t.WaitForText("http://192.0.2.100/ (DHCP)"));
    EXPECT_TRUE(t.Lacks("No compatible network adapter"));
}

TEST(WelcomeScreenTest, CustomWelcomeMessageReplacesEverything) {
    SimHost host;
    Terminal t(host.Console("linux", 80, 25));
    ASSERT_TRUE(WaitForWelcome(t));
    host.Set("/system/welcomeMessage", "Property of the lab.\nAsk Dana before rebooting.");
    t.Signal(SIGUSR1);
    ASSERT_TRUE(t.WaitForText("Property of the lab."));
    EXPECT_EQ(t.Find("Property of the lab."), (Pos{2, 2}));
    EXPECT_TRUE(t.HasTextAt(2, 3, "Ask Dana before rebooting."));
    for (const char* gone : {"<F2>", "<F12>", "Download tools", "Tarni 8.0.2", "Acme Server 9", "GiB Memory"})
        EXPECT_TRUE(t.Lacks(gone));
    EXPECT_EQ(t.CellAt(0, 0).text, "┌") << t.Dump();
    EXPECT_EQ(t.CellAt(79, 24).text, "┘");

    // Message removed: the standard layout comes back.
    host.Set("/system/welcomeMessage", "");
    t.Signal(SIGUSR1);
    ASSERT_TRUE(t.WaitForText(kFooterRight));
    EXPECT_TRUE(t.Lacks("Property of the lab."));
    EXPECT_TRUE(t.HasTextAt(8, 5, kTitle));
    EXPECT_TRUE(t.CellAt(10, 3).bg.IsIndex(6)) << t.Dump(true);
    EXPECT_TRUE(t.CellAt(10, 20).bg.IsIndex(3)) << t.Dump(true);
}

// A refresh redraws the same screen: a key typed while it runs is kept,
// however long the redraw takes.
TEST(WelcomeScreenTest, KeyTypedDuringARefreshIsKept) {
    SimHost host;
    std::string message;
    while (message.size() < 10000) message += "Property of the lab, ask Dana before rebooting. ";
    host.Set("/system/welcomeMessage", message.substr(0, 10000));
    Terminal t(host.Console());
    ASSERT_TRUE(t.WaitForText("Property of the lab"));
    for (int round = 0; round < 6; ++round) {
        t.Signal(SIGUSR1);
        t.SendKey("F2");
        ASSERT_TRUE(t.WaitForText("Login Name:", Duration(3000))) << "round " << round;
        t.SendKey("Esc");
        ASSERT_TRUE(t.WaitForTextGone("Login Name:"));
    }
}

TEST(WelcomeScreenTest, OtherKeysAreIgnored) {
    SimHost host;
    Terminal t(host.Console());
    ASSERT_TRUE(WaitForWelcome(t));
    const std::string before = t.ScreenText();
    for (const char* key : {"Enter", "Up", "Down", "Tab", "F1", "F3", "F5", "F10"}) t.SendKey(key);
    t.Send("xq 1");
    ASSERT_TRUE(t.WaitQuiet(Duration(300)));
    EXPECT_FALSE(t.HasExited());
    EXPECT_EQ(t.ScreenText(), before) << t.Dump();
}

}  // namespace
}  // namespace E2e
