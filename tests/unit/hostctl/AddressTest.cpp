// Parsing and printing of IPv4 and IPv6 addresses, netmasks and networks.
#include <gtest/gtest.h>

#include <string>

#include "hostctl/HostCtl.hpp"

namespace {

using HostCtl::Lib::HostCtlException;
using HostCtl::Network::IpAddress;
using HostCtl::Network::Ipv4Address;
using HostCtl::Network::Ipv6Address;
using HostCtl::Network::Ipv6Network;

TEST(Ipv4Address, ParsesAndPrintsDottedQuads) {
    struct Case {
        std::string text;
        const char* printed;  // null: refused
    };
    const Case cases[] = {
        {"0.0.0.0", "0.0.0.0"},
        {"255.255.255.255", "255.255.255.255"},
        {"192.168.10.21", "192.168.10.21"},
        {"010.001.000.009", "10.1.0.9"},  // decimal, leading zeros dropped
        {"", nullptr},
        {"1.2.3", nullptr},
        {"1.2.3.4.5", nullptr},
        {"1.2.3.", nullptr},
        {".1.2.3", nullptr},
        {"1..2.3", nullptr},
        {"256.0.0.1", nullptr},
        {"1.2.3.256", nullptr},
        {"1234.1.1.1", nullptr},
        {"0001.1.1.1", nullptr},
        {" 1.2.3.4", nullptr},
        {"1.2.3.4 ", nullptr},
        {"1.2.3.4/24", nullptr},
        {"1.2.3.-4", nullptr},
        {"+1.2.3.4", nullptr},
        {"0x1.2.3.4", nullptr},
        {"a.b.c.d", nullptr},
        {std::string("1.2.3.4\0", 8), nullptr},
        {"::1", nullptr},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE("\"" + c.text + "\"");
        EXPECT_EQ(Ipv4Address::IsValidAddress(c.text), c.printed != nullptr);
        if (c.printed) {
            EXPECT_EQ(Ipv4Address(c.text).GetStringAddress(), c.printed);
        } else {
            EXPECT_THROW(Ipv4Address{c.text}, HostCtlException);
        }
    }
    EXPECT_EQ(Ipv4Address("192.168.10.21").GetHostOrder(), 0xc0a80a15u);
    EXPECT_EQ(Ipv4Address().GetStringAddress(), "0.0.0.0");
    EXPECT_TRUE(Ipv4Address("0.0.0.0").IsZero());
}

TEST(Ipv4Address, Netmasks) {
    struct Case {
        const char* mask;
        bool valid;
    };
    const Case cases[] = {
        {"255.255.255.0", true},    {"255.255.255.255", true}, {"0.0.0.0", true},
        {"128.0.0.0", true},        {"255.255.255.254", true}, {"255.255.252.0", true},
        {"255.255.0.255", false},   {"0.255.255.255", false},  {"255.0.255.0", false},
        {"255.255.255.253", false}, {"254.255.255.0", false},  {"0.0.0.1", false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.mask);
        EXPECT_EQ(Ipv4Address(c.mask).IsValidNetmask(), c.valid);
    }
}

TEST(Ipv6Address, ParsesToCanonicalForm) {
    struct Case {
        const char* text;
        const char* canonical;  // null: refused
    };
    const Case cases[] = {
        {"::", "::"},
        {"0:0:0:0:0:0:0:0", "::"},
        {"0:0:0:0:0:0:0:1", "::1"},
        {"2001:DB8:0:0:0:0:0:1", "2001:db8::1"},
        {"2001:0db8:0000:0000:0000:0000:0000:0001", "2001:db8::1"},
        {"2001:db8:0:0:1:0:0:1", "2001:db8::1:0:0:1"},     // first of two equal runs
        {"2001:db8:0:1:0:0:0:1", "2001:db8:0:1::1"},       // the longest run
        {"2001:db8:0:1:1:1:1:1", "2001:db8:0:1:1:1:1:1"},  // a single zero group stays
        {"fe80::250:56ff:fe01:2", "fe80::250:56ff:fe01:2"},
        {"1::", "1::"},
        {"", nullptr},
        {":::", nullptr},
        {"1::2::3", nullptr},
        {"2001:db8::g", nullptr},
        {"12345::", nullptr},
        {"1:2:3:4:5:6:7:8:9", nullptr},
        {"1:2:3:4:5:6:7", nullptr},
        {"2001:db8::1%zk0", nullptr},
        {"2001:db8::1/64", nullptr},
        {" ::1", nullptr},
        {"192.168.0.1", nullptr},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.text);
        EXPECT_EQ(Ipv6Address::IsValidAddress(c.text), c.canonical != nullptr);
        if (c.canonical) {
            EXPECT_EQ(Ipv6Address(c.text).GetStringAddress(), c.canonical);
        } else {
            EXPECT_THROW(Ipv6Address{c.text}, HostCtlException);
        }
    }
    EXPECT_FALSE(Ipv6Address::IsValidAddress(std::string("::1\0", 4)));
    EXPECT_TRUE(Ipv6Address().IsZero());
    EXPECT_FALSE(Ipv6Address("::1").IsZero());
}

TEST(Ipv6Address, LinkLocalIsFe80Slash10) {
    EXPECT_TRUE(Ipv6Address("fe80::1").IsLinkLocal());
    EXPECT_TRUE(Ipv6Address("febf:ffff::1").IsLinkLocal());
    EXPECT_FALSE(Ipv6Address("fec0::1").IsLinkLocal());
    EXPECT_FALSE(Ipv6Address("fe7f::1").IsLinkLocal());
    EXPECT_FALSE(Ipv6Address("2001:db8::1").IsLinkLocal());
}

TEST(Ipv6Network, ParsesAddressSlashPrefix) {
    struct Case {
        const char* text;
        const char* printed;  // null: refused
    };
    const Case cases[] = {
        {"2001:db8::10/64", "2001:db8::10/64"},
        {"2001:DB8:0::10/064", "2001:db8::10/64"},
        {"::/0", "::/0"},
        {"2001:db8::1/128", "2001:db8::1/128"},
        {"2001:db8::10", nullptr},
        {"2001:db8::10/", nullptr},
        {"2001:db8::10/129", nullptr},
        {"2001:db8::10/-1", nullptr},
        {"2001:db8::10/0064", nullptr},
        {"2001:db8::10/ 64", nullptr},
        {"2001:db8::10/64 ", nullptr},
        {"2001:db8::10/64/1", nullptr},
        {"2001:db8::10/6x", nullptr},
        {"/64", nullptr},
        {"10.0.0.1/24", nullptr},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.text);
        EXPECT_EQ(Ipv6Network::IsValidAddressAndNetmask(c.text), c.printed != nullptr);
        if (c.printed) {
            EXPECT_EQ(Ipv6Network(std::string(c.text)).ToString(), c.printed);
        } else {
            EXPECT_THROW(Ipv6Network{std::string(c.text)}, HostCtlException);
        }
    }
    Ipv6Network network("2001:db8::10/48");
    EXPECT_EQ(network.GetPrefixLength(), 48);
    EXPECT_EQ(network.GetStringAddress(), "2001:db8::10");
    EXPECT_THROW(Ipv6Network(Ipv6Address("::1"), 129), HostCtlException);
    EXPECT_THROW(Ipv6Network(Ipv6Address("::1"), -1), HostCtlException);
}

TEST(IpAddress, TellsTheKindApart) {
    EXPECT_FALSE(IpAddress("10.0.0.1").IsIpv6());
    EXPECT_EQ(IpAddress("10.0.0.1").V4().GetStringAddress(), "10.0.0.1");
    EXPECT_TRUE(IpAddress("2001:DB8::1").IsIpv6());
    EXPECT_EQ(IpAddress("2001:DB8::1").GetStringAddress(), "2001:db8::1");
    EXPECT_TRUE(IpAddress("::ffff:10.0.0.1").IsIpv6());
    EXPECT_THROW(IpAddress("10.0.0"), HostCtlException);
    EXPECT_THROW(IpAddress(""), HostCtlException);
}

}  // namespace
