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

// Texts `T` takes, each with how it prints, and texts it refuses, both by
// its check and by its constructor.
template <typename T>
void ExpectParsing(bool (*isValid)(const std::string&), std::string (T::*print)() const,
                   const std::vector<std::pair<std::string, std::string>>& accepted,
                   const std::vector<std::string>& refused) {
    for (const auto& [text, printed] : accepted) {
        SCOPED_TRACE("\"" + text + "\"");
        EXPECT_TRUE(isValid(text));
        EXPECT_EQ((T(text).*print)(), printed);
    }
    for (const std::string& text : refused) {
        SCOPED_TRACE("\"" + text + "\"");
        EXPECT_FALSE(isValid(text));
        EXPECT_THROW(T{text}, HostCtlException);
    }
}

TEST(Ipv4Address, ParsesAndPrintsDottedQuads) {
    ExpectParsing<Ipv4Address>(
        Ipv4Address::IsValidAddress, &Ipv4Address::GetStringAddress,
        {{"0.0.0.0", "0.0.0.0"},
         {"255.255.255.255", "255.255.255.255"},
         {"192.168.10.21", "192.168.10.21"},
         {"010.001.000.009", "10.1.0.9"}},  // decimal, leading zeros dropped
        {"", "1.2.3", "1.2.3.4.5", "1.2.3.", ".1.2.3", "1..2.3", "256.0.0.1", "1.2.3.256", "1234.1.1.1",
         "0001.1.1.1", " 1.2.3.4", "1.2.3.4 ", "1.2.3.4/24", "1.2.3.-4", "+1.2.3.4", "0x1.2.3.4", "a.b.c.d",
         std::string("1.2.3.4\0", 8), "::1"});
    EXPECT_EQ(Ipv4Address("192.168.10.21").GetHostOrder(), 0xc0a80a15u);
    EXPECT_TRUE(Ipv4Address("0.0.0.0").IsZero());
}

TEST(Ipv6Address, ParsesToCanonicalForm) {
    ExpectParsing<Ipv6Address>(
        Ipv6Address::IsValidAddress, &Ipv6Address::GetStringAddress,
        {{"::", "::"},
         {"0:0:0:0:0:0:0:0", "::"},
         {"0:0:0:0:0:0:0:1", "::1"},
         {"2001:DB8:0:0:0:0:0:1", "2001:db8::1"},
         {"2001:0db8:0000:0000:0000:0000:0000:0001", "2001:db8::1"},
         {"2001:db8:0:0:1:0:0:1", "2001:db8::1:0:0:1"},     // first of two equal runs
         {"2001:db8:0:1:0:0:0:1", "2001:db8:0:1::1"},       // the longest run
         {"2001:db8:0:1:1:1:1:1", "2001:db8:0:1:1:1:1:1"},  // a single zero group stays
         {"fe80::250:56ff:fe01:2", "fe80::250:56ff:fe01:2"},
         {"1::", "1::"}},
        {"", ":::", "1::2::3", "2001:db8::g", "12345::", "1:2:3:4:5:6:7:8:9", "1:2:3:4:5:6:7",
         "2001:db8::1%zk0", "2001:db8::1/64", " ::1", "192.168.0.1", std::string("::1\0", 4)});
    EXPECT_TRUE(Ipv6Address().IsZero());
    EXPECT_FALSE(Ipv6Address("::1").IsZero());
}

TEST(Ipv6Address, LinkLocalIsFe80Slash10) {
    for (const char* address : {"fe80::1", "febf:ffff::1"}) EXPECT_TRUE(Ipv6Address(address).IsLinkLocal());
    for (const char* address : {"fec0::1", "fe7f::1", "2001:db8::1"})
        EXPECT_FALSE(Ipv6Address(address).IsLinkLocal()) << address;
}

TEST(Ipv6Network, ParsesAddressSlashPrefix) {
    ExpectParsing<Ipv6Network>(Ipv6Network::IsValidAddressAndNetmask, &Ipv6Network::ToString,
                               {{"2001:db8::10/64", "2001:db8::10/64"},
                                {"2001:DB8:0::10/064", "2001:db8::10/64"},
                                {"::/0", "::/0"},
                                {"2001:db8::1/128", "2001:db8::1/128"}},
                               {"2001:db8::10", "2001:db8::10/", "2001:db8::10/129", "2001:db8::10/-1",
                                "2001:db8::10/0064", "2001:db8::10/ 64", "2001:db8::10/64 ",
                                "2001:db8::10/64/1", "2001:db8::10/6x", "/64", "10.0.0.1/24"});
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
