// Address, netmask, prefix and VLAN parsing and printing: the parsers of
// hostctl and the checks the network dialogs make on Enter.
//
// Input: up to five fields separated by line breaks. Rules: what parses
// prints back to text that parses to the same value and prints the same;
// what does not parse throws HostCtlException only; the dialogs' checks agree
// with the parsers and with the decimal value of a VLAN ID.
#include <algorithm>
#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "DNSConfigurationDialog.hpp"
#include "FuzzSupport.hpp"
#include "IPConfigurationDialog.hpp"
#include "IPv6ConfigurationDialog.hpp"
#include "VlanDialog.hpp"
#include "hostctl/HostCtl.hpp"

namespace {

using fuzz_support::Require;
using HostCtl::Lib::HostCtlException;
using HostCtl::Network::IpAddress;
using HostCtl::Network::Ipv4Address;
using HostCtl::Network::Ipv6Address;
using HostCtl::Network::Ipv6Network;

template <typename T>
bool Throws(const std::string& text) {
    try {
        T value(text);
        (void)value;
    } catch (const HostCtlException&) {
        return true;
    }
    return false;
}

bool IsValidIp(const std::string& text) {
    return Ipv6Address::IsValidAddress(text) || Ipv4Address::IsValidAddress(text);
}

// An address of type T: what parses prints back to text that parses to the
// same value and prints the same; what does not parse throws HostCtlException
// only. True when `text` parsed.
template <typename T>
bool RoundTrips(const std::string& text, bool (*isValid)(const std::string&), const std::string& kind) {
    const auto require = [&](bool holds, const std::string& rule) {
        if (!holds) fuzz_support::Fail(rule.c_str(), text);
    };
    if (!isValid(text)) {
        require(Throws<T>(text), "an invalid " + kind + " throws");
        return false;
    }
    const T address(text);
    const std::string printed = address.GetStringAddress();
    require(isValid(printed), "a printed " + kind + " parses");
    require(T(printed) == address, "a printed " + kind + " keeps its value");
    require(T(printed).GetStringAddress() == printed, kind + " printing is stable");
    return true;
}

void CheckIpv4(const std::string& text) {
    if (!RoundTrips<Ipv4Address>(text, Ipv4Address::IsValidAddress, "IPv4 address")) return;
    const Ipv4Address address(text);
    Require(Ipv4Address::FromHostOrder(address.GetHostOrder()) == address, "IPv4 host order round trip",
            text);
    // A netmask is a run of ones from the top: one of the 33 prefix masks.
    bool isPrefixMask = false;
    for (int prefix = 0; prefix <= 32; ++prefix) {
        const uint32_t mask = prefix == 0 ? 0 : ~uint32_t(0) << (32 - prefix);
        if (address.GetHostOrder() == mask) isPrefixMask = true;
    }
    Require(address.IsValidNetmask() == isPrefixMask, "netmasks are exactly the prefix masks", text);
}

void CheckIpv6(const std::string& text) {
    RoundTrips<Ipv6Address>(text, Ipv6Address::IsValidAddress, "IPv6 address");
    if (!Ipv6Network::IsValidAddressAndNetmask(text)) {
        Require(Throws<Ipv6Network>(text), "an invalid IPv6 network throws", text);
        return;
    }
    const Ipv6Network network(text);
    Require(network.GetPrefixLength() >= 0 && network.GetPrefixLength() <= 128, "a prefix is 0 to 128", text);
    const std::string printed = network.ToString();
    Require(Ipv6Network::IsValidAddressAndNetmask(printed), "a printed IPv6 network parses", text);
    const Ipv6Network again(printed);
    Require(
        again.GetAddress() == network.GetAddress() && again.GetPrefixLength() == network.GetPrefixLength(),
        "a printed IPv6 network keeps its value", text);
}

// The VLAN ID rules by value: digits only, 1 to 4094, or 4095 for all VLANs.
void CheckVlan(const std::string& text) {
    using Entry = Velk::VlanDialog::Entry;
    Entry expected = Entry::Invalid;
    if (text.empty()) {
        expected = Entry::Unset;
    } else if (text.find_first_not_of("0123456789") == std::string::npos) {
        uint64_t value = 0;
        for (char c : text) value = value > 100000 ? value : value * 10 + uint64_t(c - '0');
        if (value >= 1 && value <= 4094) expected = Entry::Accepted;
        if (value == 4095) expected = Entry::AllVlans;
    }
    const Entry entry = Velk::VlanDialog::CheckText(text);
    Require(entry == expected, "a VLAN ID is taken by its decimal value", text);
    if (entry == Entry::Accepted || entry == Entry::AllVlans) {
        const std::string printed = std::to_string(std::stoul(text));
        Require(Velk::VlanDialog::CheckText(printed) == entry, "a printed VLAN ID is taken the same", text);
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size > 1024) return 0;
    const std::string input(reinterpret_cast<const char*>(data), size);
    std::vector<std::string> fields = fuzz_support::Split(input, '\n');
    for (const std::string& field : fields) {
        CheckIpv4(field);
        CheckIpv6(field);
        RoundTrips<IpAddress>(field, IsValidIp, "IP address");
        CheckVlan(field);
    }
    fields.resize(std::max<size_t>(fields.size(), 5));

    const auto v4 = Velk::IPConfigurationDialog::CheckStatic(fields[0], fields[1], fields[2]);
    if (!v4) {
        Require(Ipv4Address::IsValidAddress(fields[0]) && Ipv4Address::IsValidAddress(fields[2]) &&
                    Ipv4Address::IsValidAddress(fields[1]) && Ipv4Address(fields[1]).IsValidNetmask(),
                "an accepted IPv4 entry is an address, a netmask and a gateway", input);
    }
    const std::array<std::string, Velk::IPv6ConfigurationDialog::kAddressRows> rows = {fields[0], fields[1],
                                                                                       fields[2]};
    if (!Velk::IPv6ConfigurationDialog::CheckStatic(rows, fields[3])) {
        for (const std::string& row : rows) {
            if (row.empty()) continue;
            Require(!Ipv6Network(row).GetAddress().IsLinkLocal(), "an accepted IPv6 entry is not link-local",
                    input);
        }
    }
    if (!Velk::DNSConfigurationDialog::CheckServers(fields[0], fields[1])) {
        const auto servers = Velk::DNSConfigurationDialog::ServersFromText(fields[0], fields[1]);
        const size_t typed = size_t(!fields[0].empty()) + size_t(!fields[1].empty());
        Require(servers.size() == typed, "every accepted server entry gives a server", input);
        for (const IpAddress& server : servers)
            Require(IpAddress(server.GetStringAddress()) == server, "a server prints back to itself", input);
    }
    return 0;
}
