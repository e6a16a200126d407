// The rules of the management network's dialogs that need no terminal: the
// key filters of their fields, the checks Enter makes, the IPv6 choices and
// the address list the IPv6 dialog hands back.
#include <curses.h>
#include <gtest/gtest.h>

#include <array>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "DNSConfigurationDialog.hpp"
#include "IPConfigurationDialog.hpp"
#include "IPv6ConfigurationDialog.hpp"
#include "SuffixesDialog.hpp"
#include "VlanDialog.hpp"
#include "hostctl/HostCtl.hpp"

namespace {

using HostCtl::Network::IpAddress;
using HostCtl::Network::Ipv6Address;
using HostCtl::Network::Ipv6AddressType;
using HostCtl::Network::Ipv6Network;
using Velk::DNSConfigurationDialog;
using Velk::IPConfigurationDialog;
using Velk::IPv6ConfigurationDialog;
using Velk::VlanDialog;

// ---- Key filters ----

struct FilterCase {
    const char* name;
    bool (*filter)(int);
    std::string accepted;
    std::string refused;
};

void PrintTo(const FilterCase& c, std::ostream* os) { *os << c.name; }

class KeyFilterTest : public ::testing::TestWithParam<FilterCase> {};

TEST_P(KeyFilterTest, TakesItsCharactersAndTheEditingKeysOnly) {
    const FilterCase& c = GetParam();
    for (char key : c.accepted) EXPECT_TRUE(c.filter(key)) << "'" << key << "'";
    for (char key : c.refused) EXPECT_FALSE(c.filter(key)) << "'" << key << "'";
    for (int key : {8, KEY_BACKSPACE, KEY_DC, KEY_LEFT, KEY_RIGHT, KEY_HOME, KEY_END})
        EXPECT_TRUE(c.filter(key)) << "editing key " << key;
    // Selection, confirmation and other keys are the dialog's, never typed.
    for (int key : {KEY_UP, KEY_DOWN, 9, 10, 27, KEY_F(2), KEY_NPAGE, 0, 200, 0x141, -1})
        EXPECT_FALSE(c.filter(key)) << "key " << key;
}

const FilterCase kFilterCases[] = {
    {"Vlan", VlanDialog::IsFieldKey, "0123456789", "-+ .aAfx:_/"},
    {"Ipv4", IPConfigurationDialog::IsFieldKey, "0123456789.", " -,:aAfx_/%"},
    {"Ipv6", IPv6ConfigurationDialog::IsFieldKey, "0123456789abcdefABCDEFxyzXYZ:%/", " .-,_[]"},
    {"DnsServer", DNSConfigurationDialog::IsServerKey, "0123456789abcdefABCDEF:.", "gGxzZ_/% -,"},
    {"Hostname", DNSConfigurationDialog::IsHostnameKey, "0123456789azAZ.-", "_/ ,:%*"},
    {"Suffixes", Velk::SuffixesDialog::IsFieldKey, "0123456789azAZ .,-", "_/;:%*"},
};

INSTANTIATE_TEST_SUITE_P(Dialogs, KeyFilterTest, ::testing::ValuesIn(kFilterCases),
                         [](const auto& info) { return std::string(info.param.name); });

// ---- VLAN ID ----

struct VlanCase {
    const char* text;
    VlanDialog::Entry entry;
};

void PrintTo(const VlanCase& c, std::ostream* os) { *os << '"' << c.text << '"'; }

class VlanTextTest : public ::testing::TestWithParam<VlanCase> {};

TEST_P(VlanTextTest, Classifies) { EXPECT_EQ(VlanDialog::CheckText(GetParam().text), GetParam().entry); }

const VlanCase kVlanCases[] = {
    {"", VlanDialog::Entry::Unset},         {"0", VlanDialog::Entry::Invalid},
    {"00000", VlanDialog::Entry::Invalid},  {"1", VlanDialog::Entry::Accepted},
    {"00007", VlanDialog::Entry::Accepted}, {"4094", VlanDialog::Entry::Accepted},
    {"4095", VlanDialog::Entry::AllVlans},  {"04095", VlanDialog::Entry::AllVlans},
    {"4096", VlanDialog::Entry::Invalid},   {"65536", VlanDialog::Entry::Invalid},
    {"99999", VlanDialog::Entry::Invalid},  {"18446744073709551617", VlanDialog::Entry::Invalid},
    {"-1", VlanDialog::Entry::Invalid},     {"+5", VlanDialog::Entry::Invalid},
    {" 5", VlanDialog::Entry::Invalid},     {"5 ", VlanDialog::Entry::Invalid},
    {"12a", VlanDialog::Entry::Invalid},
};

INSTANTIATE_TEST_SUITE_P(Texts, VlanTextTest, ::testing::ValuesIn(kVlanCases));

// ---- Static IPv4 entries ----

struct Ipv4Case {
    const char* name;
    std::string address;
    std::string netmask;
    std::string gateway;
    int row;  // -1: accepted
    int titleId;
    int messageId;
};

void PrintTo(const Ipv4Case& c, std::ostream* os) { *os << c.name; }

class Ipv4CheckTest : public ::testing::TestWithParam<Ipv4Case> {};

TEST_P(Ipv4CheckTest, RefusesTheFirstBadRow) {
    const Ipv4Case& c = GetParam();
    const auto rejection = IPConfigurationDialog::CheckStatic(c.address, c.netmask, c.gateway);
    if (c.row < 0) {
        EXPECT_FALSE(rejection.has_value()) << "row " << rejection->row;
        return;
    }
    ASSERT_TRUE(rejection.has_value());
    EXPECT_EQ(rejection->row, c.row);
    EXPECT_EQ(rejection->titleId, c.titleId);
    EXPECT_EQ(rejection->messageId, c.messageId);
}

const Ipv4Case kIpv4Cases[] = {
    {"Valid", "192.168.1.20", "255.255.255.0", "192.168.1.1", -1, 0, 0},
    {"GatewayOutsideTheSubnet", "192.168.1.20", "255.255.255.0", "10.0.0.1", -1, 0, 0},
    {"ZeroGateway", "192.168.1.20", "255.255.0.0", "0.0.0.0", -1, 0, 0},
    {"ShortAddress", "192.168.1", "255.255.255.0", "192.168.1.1", 3, 82, 83},
    {"OctetAbove255", "192.168.1.256", "255.255.255.0", "192.168.1.1", 3, 82, 83},
    {"EmptyAddress", "", "255.255.255.0", "192.168.1.1", 3, 82, 83},
    {"NonContiguousMask", "192.168.1.20", "255.255.0.255", "192.168.1.1", 4, 86, 87},
    {"MaskNotAnAddress", "192.168.1.20", "255.255.255", "192.168.1.1", 4, 86, 87},
    {"EmptyMask", "192.168.1.20", "", "192.168.1.1", 4, 86, 87},
    {"BadGateway", "192.168.1.20", "255.255.255.0", "192.168..1", 5, 90, 91},
    {"EmptyGateway", "192.168.1.20", "255.255.255.0", "", 5, 90, 91},
    {"AddressBeforeMask", "1.2.3", "255.0.255.0", "x", 3, 82, 83},
    {"MaskBeforeGateway", "10.1.2.3", "255.0.255.0", "", 4, 86, 87},
};

INSTANTIATE_TEST_SUITE_P(Entries, Ipv4CheckTest, ::testing::ValuesIn(kIpv4Cases),
                         [](const auto& info) { return std::string(info.param.name); });

// ---- IPv6 choices ----

using Mode = IPv6ConfigurationDialog::Mode;

struct MarkCase {
    const char* name;
    Mode before;
    int row;
    Mode after;
};

void PrintTo(const MarkCase& c, std::ostream* os) { *os << c.name; }

class Ipv6MarkTest : public ::testing::TestWithParam<MarkCase> {};

TEST_P(Ipv6MarkTest, Space) {
    const MarkCase& c = GetParam();
    const Mode after = IPv6ConfigurationDialog::Mark(c.before, c.row);
    EXPECT_EQ(after.enabled, c.after.enabled);
    EXPECT_EQ(after.dhcp, c.after.dhcp);
    EXPECT_EQ(after.routerAdvertised, c.after.routerAdvertised);
}

constexpr Mode kOff{false, false, false};
constexpr Mode kOffWithDhcp{false, true, false};
constexpr Mode kStatic{true, false, false};
constexpr Mode kDhcp{true, true, false};
constexpr Mode kAdvertised{true, false, true};
constexpr Mode kBoth{true, true, true};

const MarkCase kMarkCases[] = {
    {"DisableKeepsTheSwitches", kDhcp, 0, kOffWithDhcp},
    {"DisableFromStatic", kStatic, 0, kOff},
    {"DynamicFromStaticIsRouterAdvertisement", kStatic, 1, kAdvertised},
    {"DynamicFromOffWithoutDhcp", kOff, 1, kAdvertised},
    {"DynamicFromOffRemembersDhcp", kOffWithDhcp, 1, kDhcp},
    {"DynamicAgainKeepsDhcp", kDhcp, 1, kDhcp},
    {"DynamicWithBothSwitchesTakesDhcp", kBoth, 1, kDhcp},
    {"DhcpRowTurnsDhcpOn", kAdvertised, 2, kDhcp},
    {"DhcpRowTurnsDhcpOff", kDhcp, 2, kAdvertised},
    {"DhcpRowWithBothSwitches", kBoth, 2, kAdvertised},
    {"StaticFromDhcp", kDhcp, 3, kStatic},
    {"StaticFromOff", kOffWithDhcp, 3, kStatic},
    {"AddressRowChangesNothing", kDhcp, 4, kDhcp},
    {"GatewayRowChangesNothing", kOff, 7, kOff},
};

INSTANTIATE_TEST_SUITE_P(Rows, Ipv6MarkTest, ::testing::ValuesIn(kMarkCases),
                         [](const auto& info) { return std::string(info.param.name); });

// ---- Static IPv6 entries ----

struct Ipv6Case {
    const char* name;
    std::array<std::string, 3> addresses;
    std::string gateway;
    int row;  // -1: accepted
    int titleId;
    int messageId;
};

void PrintTo(const Ipv6Case& c, std::ostream* os) { *os << c.name; }

class Ipv6CheckTest : public ::testing::TestWithParam<Ipv6Case> {};

TEST_P(Ipv6CheckTest, RefusesTheFirstBadRow) {
    const Ipv6Case& c = GetParam();
    const auto rejection = IPv6ConfigurationDialog::CheckStatic(c.addresses, c.gateway);
    if (c.row < 0) {
        EXPECT_FALSE(rejection.has_value()) << "row " << rejection->row;
        return;
    }
    ASSERT_TRUE(rejection.has_value());
    EXPECT_EQ(rejection->row, c.row);
    EXPECT_EQ(rejection->titleId, c.titleId);
    EXPECT_EQ(rejection->messageId, c.messageId);
}

const Ipv6Case kIpv6Cases[] = {
    {"AllEmpty", {"", "", ""}, "", -1, 0, 0},
    {"OneAddress", {"2001:db8::10/64", "", ""}, "", -1, 0, 0},
    {"ThreeAddressesAndGateway",
     {"2001:db8::10/64", "2001:db8:1::1/48", "fd00::5/128"},
     "2001:db8::1",
     -1,
     0,
     0},
    {"SiteLocalIsNotLinkLocal", {"fec0::1/64", "", ""}, "", -1, 0, 0},
    {"LinkLocalGatewayPasses", {"", "", ""}, "fe80::1", -1, 0, 0},
    {"NoPrefix", {"2001:db8::10", "", ""}, "", 4, 82, 84},
    {"PrefixAbove128", {"2001:db8::10/129", "", ""}, "", 4, 82, 84},
    {"NotAnAddress", {"2001:db8:::10/64", "", ""}, "", 4, 82, 84},
    {"LinkLocal", {"fe80::10/64", "", ""}, "", 4, 88, 89},
    {"UpperEndOfLinkLocal", {"febf::1/64", "", ""}, "", 4, 88, 89},
    {"SecondRow", {"2001:db8::10/64", "2001:db8::11", ""}, "", 5, 82, 84},
    {"EmptyRowsSkipped", {"", "", "fe80::1/64"}, "", 6, 88, 89},
    {"BadGateway", {"2001:db8::10/64", "", ""}, "2001:db8::1/64", 7, 90, 92},
    {"IPv4Gateway", {"", "", ""}, "192.168.1.1", 7, 90, 92},
    {"AddressesBeforeGateway", {"", "x/64", ""}, "zz", 5, 82, 84},
};

INSTANTIATE_TEST_SUITE_P(Entries, Ipv6CheckTest, ::testing::ValuesIn(kIpv6Cases),
                         [](const auto& info) { return std::string(info.param.name); });

// ---- The IPv6 address list after OK ----

Ipv6Network Net(const std::string& text, Ipv6AddressType type) {
    const Ipv6Network parsed(text);
    return Ipv6Network(parsed.GetAddress(), parsed.GetPrefixLength(), type);
}

std::string Describe(const std::vector<Ipv6Network>& list) {
    static const char* const kTypes[] = {"static", "dhcp", "autoconf"};
    std::string text;
    for (const Ipv6Network& network : list)
        text += network.ToString() + " " + kTypes[static_cast<int>(network.GetIpv6AddressType())] + "; ";
    return text;
}

struct MergeCase {
    const char* name;
    bool dhcp;
    bool routerAdvertised;
    std::vector<std::string> typed;
    std::string expected;
};

void PrintTo(const MergeCase& c, std::ostream* os) { *os << c.name; }

class Ipv6MergeTest : public ::testing::TestWithParam<MergeCase> {};

// One address of each kind the interface may hold.
const std::vector<Ipv6Network> kPresent = {
    Net("fe80::1/64", Ipv6AddressType::Autoconf),  Net("2001:db8::a/64", Ipv6AddressType::Autoconf),
    Net("2001:db8::d/128", Ipv6AddressType::Dhcp), Net("2001:db8::5/64", Ipv6AddressType::Static),
    Net("fe80::5/64", Ipv6AddressType::Static),
};

TEST_P(Ipv6MergeTest, KeepsWhatTheModeStillObtains) {
    const MergeCase& c = GetParam();
    std::vector<Ipv6Network> typed;
    // Whatever type a typed entry carries, it is stored as static.
    for (const std::string& text : c.typed) typed.push_back(Net(text, Ipv6AddressType::Dhcp));
    EXPECT_EQ(Describe(IPv6ConfigurationDialog::MergeAddresses(kPresent, c.dhcp, c.routerAdvertised, typed)),
              c.expected);
}

const MergeCase kMergeCases[] = {
    {"StaticReplacesStatic",
     false,
     false,
     {"2001:db8::6/64", "2001:db8:1::1/48"},
     "fe80::1/64 autoconf; fe80::5/64 static; 2001:db8::6/64 static; 2001:db8:1::1/48 static; "},
    {"StaticWithNothingTyped", false, false, {}, "fe80::1/64 autoconf; fe80::5/64 static; "},
    {"RouterAdvertisement",
     false,
     true,
     {},
     "fe80::1/64 autoconf; 2001:db8::a/64 autoconf; fe80::5/64 static; "},
    {"Dhcp", true, false, {}, "fe80::1/64 autoconf; 2001:db8::d/128 dhcp; fe80::5/64 static; "},
    {"Both",
     true,
     true,
     {},
     "fe80::1/64 autoconf; 2001:db8::a/64 autoconf; 2001:db8::d/128 dhcp; fe80::5/64 static; "},
};

INSTANTIATE_TEST_SUITE_P(Modes, Ipv6MergeTest, ::testing::ValuesIn(kMergeCases),
                         [](const auto& info) { return std::string(info.param.name); });

// ---- DNS servers ----

struct DnsCase {
    const char* name;
    std::string primary;
    std::string alternate;
    int row;                           // -1: accepted
    std::vector<std::string> servers;  // accepted: the servers, "6:" marking IPv6 ones
};

void PrintTo(const DnsCase& c, std::ostream* os) { *os << c.name; }

class DnsServersTest : public ::testing::TestWithParam<DnsCase> {};

TEST_P(DnsServersTest, ChecksAndConverts) {
    const DnsCase& c = GetParam();
    const std::optional<int> row = DNSConfigurationDialog::CheckServers(c.primary, c.alternate);
    if (c.row >= 0) {
        EXPECT_EQ(row, std::optional<int>(c.row));
        return;
    }
    EXPECT_FALSE(row.has_value());
    std::vector<std::string> servers;
    for (const IpAddress& server : DNSConfigurationDialog::ServersFromText(c.primary, c.alternate))
        servers.push_back((server.IsIpv6() ? "6:" : "") + server.GetStringAddress());
    EXPECT_EQ(servers, c.servers);
}

const DnsCase kDnsCases[] = {
    {"BothEmpty", "", "", -1, {}},
    {"Ipv4Pair", "10.0.0.53", "10.0.0.54", -1, {"10.0.0.53", "10.0.0.54"}},
    {"LinkLocalIpv6", "fe80::1", "", -1, {"6:fe80::1"}},
    {"Mixed", "192.168.1.1", "2001:DB8::53", -1, {"192.168.1.1", "6:2001:db8::53"}},
    {"OnlyAlternate", "", "8.8.4.4", -1, {"8.8.4.4"}},
    {"ShortPrimary", "1.2.3", "", 2, {}},
    {"BadAlternate", "10.0.0.53", "10.0.0.", 3, {}},
    {"PrimaryFirst", "1.2.3", "::g", 2, {}},
    {"DotsOnly", "", "...", 3, {}},
};

INSTANTIATE_TEST_SUITE_P(Entries, DnsServersTest, ::testing::ValuesIn(kDnsCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
