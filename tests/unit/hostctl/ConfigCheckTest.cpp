// The checks made before a configuration reaches the host: a static IPv4
// address and netmask, host names, domains and search domains.
#include "TestSupport.hpp"

namespace {

using namespace HostCtlTest;

TEST(StaticIpv4CheckTest, AcceptsOnlyUsableHostAddresses) {
    struct Case {
        const char* address;
        const char* netmask;
        const char* problem;  // null: accepted
    };
    const Case cases[] = {
        {"192.0.2.10", "255.255.255.0", nullptr},
        {"198.51.100.0", "255.255.255.254", nullptr},  // /31: both addresses are hosts
        {"198.51.100.1", "255.255.255.254", nullptr},
        {"203.0.113.255", "255.255.255.255", nullptr},
        {"192.0.2.10", "255.0.255.0", "netmask 255.0.255.0 is not a netmask"},
        {"192.0.2.10", "0.0.0.0", "netmask 0.0.0.0 leaves no network"},
        {"0.0.0.0", "255.255.255.0", "0.0.0.0 is not a host address"},
        {"0.1.2.3", "255.0.0.0", "0.1.2.3 is not a host address"},
        {"127.0.0.1", "255.0.0.0", "127.0.0.1 is a loopback address"},
        {"224.0.0.1", "255.255.255.0", "224.0.0.1 is a multicast address"},
        {"240.0.0.1", "255.255.255.0", "240.0.0.1 is a reserved address"},
        {"192.0.2.0", "255.255.255.0", "192.0.2.0 is the network address of 192.0.2.0/24"},
        {"192.0.2.255", "255.255.255.0", "192.0.2.255 is the broadcast address of 192.0.2.0/24"},
        {"198.51.100.64", "255.255.255.192", "198.51.100.64 is the network address of 198.51.100.64/26"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string(c.address) + "/" + c.netmask);
        IpConfig config;
        config.SetUseDhcp(true);
        const IpConfig before = config;
        if (c.problem == nullptr) {
            config.SetUseDhcp(false, false, Ipv4Address(c.address), Ipv4Address(c.netmask));
            EXPECT_FALSE(config.GetUseDhcp());
            EXPECT_FALSE(config.GetIpv4UseNone());
            EXPECT_EQ(config.GetIpv4Address().GetStringAddress(), c.address);
            EXPECT_EQ(config.GetIpv4Netmask().GetStringAddress(), c.netmask);
            continue;
        }
        try {
            config.SetUseDhcp(false, false, Ipv4Address(c.address), Ipv4Address(c.netmask));
            ADD_FAILURE() << "accepted";
        } catch (const HostCtlException& e) {
            EXPECT_EQ(std::string(e.what()), std::string("invalid static IPv4 configuration: ") + c.problem);
        }
        EXPECT_EQ(config, before) << "a refused configuration changed the value";
        // DHCP and "none" take no address, so nothing is checked.
        config.SetUseDhcp(true, false, Ipv4Address(c.address), Ipv4Address(c.netmask));
        EXPECT_TRUE(config.GetUseDhcp());
        config.SetUseDhcp(false, true, Ipv4Address(c.address), Ipv4Address(c.netmask));
        EXPECT_TRUE(config.GetIpv4UseNone());
    }
}

using DnsCheckTest = SimHostTest;

TEST_F(DnsCheckTest, NamesAreCheckedBeforeTheHostIsChanged) {
    QelCtl::Network::DnsConfigImpl dns("defaultTcpipStack");
    const std::string label(63, 'a');
    struct Case {
        bool fqdn;  // SetFqdn, else SetHostname
        std::string name;
        const char* hostname;  // afterwards; null: refused
        const char* domain;
    };
    const Case cases[] = {
        {false, "esx-01", "esx-01", "example.test"},
        {false, label, label.c_str(), "example.test"},
        {false, label + "a"},
        {false, "esx1.lab"},
        {false, "es_x"},
        {false, ""},
        {true, "esx1.lab.test", "esx1", "lab.test"},
        {true, "esx1", "esx1", ""},
        {true, "esx1.lab..test"},
        {true, ".lab.test"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE((c.fqdn ? "fqdn " : "hostname ") + c.name);
        Reset();
        const auto set = [&] { c.fqdn ? dns.SetFqdn(c.name, false) : dns.SetHostname(c.name, false); };
        if (!c.hostname) {
            ExpectRefused(set);
            continue;
        }
        set();
        EXPECT_EQ(dns.GetHostname(), c.hostname);
        EXPECT_EQ(dns.GetDomain(), c.domain);
    }
}

TEST_F(DnsCheckTest, SearchDomains) {
    QelCtl::Network::DnsConfigImpl dns("defaultTcpipStack");
    struct Case {
        const char* text;
        bool accepted;
        std::vector<std::string> domains;
    };
    const Case cases[] = {
        {"lab.test", true, {"lab.test"}},
        {"lab.test, corp.test", true, {"lab.test", "corp.test"}},
        {" lab.test\tcorp.test,,x1 ", true, {"lab.test", "corp.test", "x1"}},
        {"", true, {}},
        {"lab_test", false, {}},
        {"lab.test -corp.test", false, {}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.text);
        dns.SetSearchDomainsString("before.test");
        if (c.accepted) {
            dns.SetSearchDomainsString(c.text);
            EXPECT_EQ(dns.GetSearchDomains(), c.domains);
        } else {
            EXPECT_THROW(dns.SetSearchDomainsString(c.text), HostCtlException);
            EXPECT_EQ(dns.GetSearchDomains(), std::vector<std::string>{"before.test"});
        }
    }
}

}  // namespace
