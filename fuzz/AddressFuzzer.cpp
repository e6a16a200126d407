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

void CheckIpv4(const std::string& text) {
    if (!Ipv4Address::IsValidAddress(text)) {
        Require(Throws<Ipv4Address>(text), "an invalid IPv4 address throws", text);
        return;
    }
    const Ipv4Address address(text);
    const std::string printed = address.GetStringAddress();
    Require(Ipv4Address::IsValidAddress(printed), "a printed IPv4 address parses", text);
    Require(Ipv4Address(printed) == address, "a printed IPv4 address keeps its value", text);
    Require(Ipv4Address(printed).GetStringAddress() == printed, "IPv4 printing is stable", text);
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
    if (!Ipv6Address::IsValidAddress(text)) {
        Require(Throws<Ipv6Address>(text), "an invalid IPv6 address throws", text);
    } else {
        const Ipv6Address address(text);
        const std::string printed = address.GetStringAddress();
        Require(Ipv6Address::IsValidAddress(printed), "a printed IPv6 address parses", text);
        Require(Ipv6Address(printed) == address, "a printed IPv6 address keeps its value", text);
        Require(Ipv6Address(printed).GetStringAddress() == printed, "IPv6 printing is stable", text);
    }
    if (!Ipv6Network::IsValidAddressAndNetmask(text)) {
        Require(Throws<Ipv6Network>(text), "an invalid IPv6 network throws", text);
    } else {
        const Ipv6Network network(text);
        Require(network.GetPrefixLength() >= 0 && network.GetPrefixLength() <= 128, "a prefix is 0 to 128",
                text);
        const std::string printed = network.ToString();
        Require(Ipv6Network::IsValidAddressAndNetmask(printed), "a printed IPv6 network parses", text);
        const Ipv6Network again(printed);
        Require(again.GetAddress() == network.GetAddress() &&
                    again.GetPrefixLength() == network.GetPrefixLength(),
                "a printed IPv6 network keeps its value", text);
    }
}

void CheckIp(const std::string& text) {
    const bool valid = Ipv6Address::IsValidAddress(text) || Ipv4Address::IsValidAddress(text);
    if (!valid) {
        Require(Throws<IpAddress>(text), "an invalid IP address throws", text);
        return;
    }
    const IpAddress address(text);
    const std::string printed = address.GetStringAddress();
    Require(IpAddress(printed) == address, "a printed IP address keeps its value", text);
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
    std::vector<std::string> fields;
    size_t start = 0;
    for (;;) {
        const size_t end = input.find('\n', start);
        fields.push_back(input.substr(start, end - start));
        if (end == std::string::npos) break;
        start = end + 1;
    }
    for (const std::string& field : fields) {
        CheckIpv4(field);
        CheckIpv6(field);
        CheckIp(field);
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
