// The rules of the management network's dialogs that need no terminal: the
// key filters of their fields, the checks Enter makes, the IPv6 choices and
// the address list the IPv6 dialog hands back.
#include <curses.h>
#include <gtest/gtest.h>

#include <array>
#include <optional>
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
using HostCtl::Network::Ipv6AddressType;
using HostCtl::Network::Ipv6Network;
using Velk::DNSConfigurationDialog;
using Velk::IPConfigurationDialog;
using Velk::IPv6ConfigurationDialog;
using Velk::VlanDialog;

// "row R: title/message" for a refused entry, "" when all are accepted.
template <class Rejection>
std::string Refusal(const std::optional<Rejection>& r) {
    if (!r) return "";
    return "row " + std::to_string(r->row) + ": " + std::to_string(r->titleId) + "/" +
           std::to_string(r->messageId);
}

TEST(NetworkDialogRules, KeyFiltersTakeTheirCharactersAndTheEditingKeysOnly) {
    struct Case {
        const char* name;
        bool (*filter)(int);
        std::string accepted, refused;
    };
    const Case cases[] = {
        {"Vlan", VlanDialog::IsFieldKey, "0123456789", "-+ .aAfx:_/"},
        {"Ipv4", IPConfigurationDialog::IsFieldKey, "0123456789.", " -,:aAfx_/%"},
        {"Ipv6", IPv6ConfigurationDialog::IsFieldKey, "0123456789abcdefABCDEFxyzXYZ:%/", " .-,_[]"},
        {"DnsServer", DNSConfigurationDialog::IsServerKey, "0123456789abcdefABCDEF:.", "gGxzZ_/% -,"},
        {"Hostname", DNSConfigurationDialog::IsHostnameKey, "0123456789azAZ.-", "_/ ,:%*"},
        {"Suffixes", Velk::SuffixesDialog::IsFieldKey, "0123456789azAZ .,-", "_/;:%*"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        for (char key : c.accepted) EXPECT_TRUE(c.filter(key)) << "'" << key << "'";
        for (char key : c.refused) EXPECT_FALSE(c.filter(key)) << "'" << key << "'";
        for (int key : {8, KEY_BACKSPACE, KEY_DC, KEY_LEFT, KEY_RIGHT, KEY_HOME, KEY_END})
            EXPECT_TRUE(c.filter(key)) << "editing key " << key;
        // Selection, confirmation and other keys are the dialog's, never typed.
        for (int key : {KEY_UP, KEY_DOWN, 9, 10, 27, KEY_F(2), KEY_NPAGE, 0, 200, 0x141, -1})
            EXPECT_FALSE(c.filter(key)) << "key " << key;
    }
}

TEST(NetworkDialogRules, VlanText) {
    using E = VlanDialog::Entry;
    const std::pair<const char*, E> cases[] = {
        {"", E::Unset},         {"0", E::Invalid},
        {"1", E::Accepted},     {"00007", E::Accepted},
        {"4094", E::Accepted},  {"4095", E::AllVlans},
        {"04095", E::AllVlans}, {"4096", E::Invalid},
        {"65536", E::Invalid},  {"18446744073709551617", E::Invalid},
        {"-1", E::Invalid},     {"+5", E::Invalid},
        {" 5", E::Invalid},     {"5 ", E::Invalid},
        {"12a", E::Invalid},
    };
    for (const auto& [text, entry] : cases)
        EXPECT_EQ(VlanDialog::CheckText(text), entry) << '"' << text << '"';
}

// (Which texts are addresses, netmasks or link-local is AddressTest's, in the
// host library's tests.)
TEST(NetworkDialogRules, StaticIpv4RefusesTheFirstBadRow) {
    struct Case {
        const char* name;
        std::string address, netmask, gateway;
        std::string refusal;
    };
    const Case cases[] = {
        {"Valid", "192.168.1.20", "255.255.255.0", "192.168.1.1", ""},
        {"GatewayOutsideTheSubnet", "192.168.1.20", "255.255.255.0", "10.0.0.1", ""},
        {"ZeroGateway", "192.168.1.20", "255.255.0.0", "0.0.0.0", ""},
        {"ShortAddress", "192.168.1", "255.255.255.0", "192.168.1.1", "row 3: 82/83"},
        {"NonContiguousMask", "192.168.1.20", "255.255.0.255", "192.168.1.1", "row 4: 86/87"},
        {"BadGateway", "192.168.1.20", "255.255.255.0", "192.168..1", "row 5: 90/91"},
        {"AddressBeforeMask", "1.2.3", "255.0.255.0", "x", "row 3: 82/83"},
        {"MaskBeforeGateway", "10.1.2.3", "255.0.255.0", "", "row 4: 86/87"},
    };
    for (const Case& c : cases)
        EXPECT_EQ(Refusal(IPConfigurationDialog::CheckStatic(c.address, c.netmask, c.gateway)), c.refusal)
            << c.name;
}

TEST(NetworkDialogRules, Ipv6SpaceOnARow) {
    using Mode = IPv6ConfigurationDialog::Mode;
    // E: enabled, D: DHCP, R: router advertisement.
    auto bits = [](const Mode& m) {
        return std::string(m.enabled ? "E" : "-") + (m.dhcp ? "D" : "-") + (m.routerAdvertised ? "R" : "-");
    };
    constexpr Mode kOff{false, false, false}, kOffWithDhcp{false, true, false}, kStatic{true, false, false};
    constexpr Mode kDhcp{true, true, false}, kAdvertised{true, false, true}, kBoth{true, true, true};
    struct Case {
        const char* name;
        Mode before;
        int row;
        Mode after;
    };
    const Case cases[] = {
        {"DisableKeepsTheSwitches", kDhcp, 0, kOffWithDhcp},
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
    };
    for (const Case& c : cases)
        EXPECT_EQ(bits(IPv6ConfigurationDialog::Mark(c.before, c.row)), bits(c.after)) << c.name;
}

TEST(NetworkDialogRules, StaticIpv6RefusesTheFirstBadRow) {
    struct Case {
        const char* name;
        std::array<std::string, 3> addresses;
        std::string gateway;
        std::string refusal;
    };
    const Case cases[] = {
        {"AllEmpty", {"", "", ""}, "", ""},
        {"OneAddress", {"2001:db8::10/64", "", ""}, "", ""},
        {"ThreeAddressesAndGateway",
         {"2001:db8::10/64", "2001:db8:1::1/48", "fd00::5/128"},
         "2001:db8::1",
         ""},
        {"LinkLocalGatewayPasses", {"", "", ""}, "fe80::1", ""},
        {"NoPrefix", {"2001:db8::10", "", ""}, "", "row 4: 82/84"},
        {"LinkLocal", {"fe80::10/64", "", ""}, "", "row 4: 88/89"},
        {"SecondRow", {"2001:db8::10/64", "2001:db8::11", ""}, "", "row 5: 82/84"},
        {"EmptyRowsSkipped", {"", "", "fe80::1/64"}, "", "row 6: 88/89"},
        {"BadGateway", {"2001:db8::10/64", "", ""}, "2001:db8::1/64", "row 7: 90/92"},
        {"AddressesBeforeGateway", {"", "x/64", ""}, "zz", "row 5: 82/84"},
    };
    for (const Case& c : cases)
        EXPECT_EQ(Refusal(IPv6ConfigurationDialog::CheckStatic(c.addresses, c.gateway)), c.refusal) << c.name;
}

Ipv6Network Net(const std::string& text, Ipv6AddressType type) {
    const Ipv6Network parsed(text);
    return Ipv6Network(parsed.GetAddress(), parsed.GetPrefixLength(), type);
}

TEST(NetworkDialogRules, Ipv6AddressListKeepsWhatTheModeStillObtains) {
    // One address of each kind the interface may hold.
    const std::vector<Ipv6Network> present = {
        Net("fe80::1/64", Ipv6AddressType::Autoconf),  Net("2001:db8::a/64", Ipv6AddressType::Autoconf),
        Net("2001:db8::d/128", Ipv6AddressType::Dhcp), Net("2001:db8::5/64", Ipv6AddressType::Static),
        Net("fe80::5/64", Ipv6AddressType::Static),
    };
    struct Case {
        bool dhcp, routerAdvertised;
        std::vector<std::string> typed;
        std::string expected;
    };
    const Case cases[] = {
        {false,
         false,
         {"2001:db8::6/64", "2001:db8:1::1/48"},
         "fe80::1/64 autoconf; fe80::5/64 static; 2001:db8::6/64 static; 2001:db8:1::1/48 static; "},
        {false, false, {}, "fe80::1/64 autoconf; fe80::5/64 static; "},
        {false,
         true,
         {},
         "fe80::1/64 autoconf; 2001:db8::a/64 autoconf; 2001:db8::5/64 static; fe80::5/64 static; "},
        {true,
         false,
         {},
         "fe80::1/64 autoconf; 2001:db8::d/128 dhcp; 2001:db8::5/64 static; fe80::5/64 static; "},
        {true,
         true,
         {},
         "fe80::1/64 autoconf; 2001:db8::a/64 autoconf; 2001:db8::d/128 dhcp; 2001:db8::5/64 static; "
         "fe80::5/64 "
         "static; "},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(testing::Message() << "dhcp " << c.dhcp << ", advertised " << c.routerAdvertised);
        std::vector<Ipv6Network> typed;
        // Whatever type a typed entry carries, it is stored as static.
        for (const std::string& text : c.typed) typed.push_back(Net(text, Ipv6AddressType::Dhcp));
        std::string list;
        for (const Ipv6Network& n :
             IPv6ConfigurationDialog::MergeAddresses(present, c.dhcp, c.routerAdvertised, typed))
            list += n.ToString() + " " +
                    std::array{"static", "dhcp", "autoconf"}[static_cast<int>(n.GetIpv6AddressType())] + "; ";
        EXPECT_EQ(list, c.expected);
    }
}

TEST(NetworkDialogRules, DnsServersAreCheckedAndConverted) {
    struct Case {
        std::string primary, alternate;
        int row;                           // -1: accepted
        std::vector<std::string> servers;  // accepted: the servers, "6:" marking IPv6 ones
    };
    const Case cases[] = {
        {"", "", -1, {}},
        {"10.0.0.53", "10.0.0.54", -1, {"10.0.0.53", "10.0.0.54"}},
        {"fe80::1", "", -1, {"6:fe80::1"}},
        {"192.168.1.1", "2001:DB8::53", -1, {"192.168.1.1", "6:2001:db8::53"}},
        {"", "8.8.4.4", -1, {"8.8.4.4"}},
        {"1.2.3", "", 2, {}},
        {"10.0.0.53", "10.0.0.", 3, {}},
        {"1.2.3", "::g", 2, {}},  // the primary first
        {"", "...", 3, {}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.primary + " | " + c.alternate);
        const std::optional<int> row = DNSConfigurationDialog::CheckServers(c.primary, c.alternate);
        if (c.row >= 0) {
            EXPECT_EQ(row, std::optional<int>(c.row));
            continue;
        }
        EXPECT_FALSE(row.has_value());
        std::vector<std::string> servers;
        for (const IpAddress& server : DNSConfigurationDialog::ServersFromText(c.primary, c.alternate))
            servers.push_back((server.IsIpv6() ? "6:" : "") + server.GetStringAddress());
        EXPECT_EQ(servers, c.servers);
    }
}

}  // namespace
