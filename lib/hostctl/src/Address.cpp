// Parsing and printing of IP addresses and IPv6 networks.
#include <arpa/inet.h>

#include <cstring>

#include "hostctl/HostCtl.hpp"

namespace HostCtl::Network {

using Lib::HostCtlException;

namespace {

// Strict dotted quad: exactly four decimal parts of one to three digits, each
// 0..255, nothing before, between or after them.
bool ParseDottedQuad(const std::string& text, uint32_t& out) {
    uint32_t value = 0;
    size_t pos = 0;
    for (int part = 0; part < 4; ++part) {
        if (part > 0) {
            if (pos >= text.size() || text[pos] != '.') return false;
            ++pos;
        }
        size_t start = pos;
        unsigned octet = 0;
        while (pos < text.size() && text[pos] >= '0' && text[pos] <= '9' && pos - start < 3) {
            octet = octet * 10 + unsigned(text[pos] - '0');
            ++pos;
        }
        if (pos == start || octet > 255) return false;
        value = (value << 8) | octet;
    }
    if (pos != text.size()) return false;
    out = value;
    return true;
}

bool ParseIpv6(const std::string& text, uint8_t (&bytes)[16]) {
    // inet_pton stops at a NUL, so text with an embedded one must be refused here.
    if (text.find('\0') != std::string::npos) return false;
    return inet_pton(AF_INET6, text.c_str(), bytes) == 1;
}

bool ParsePrefix(const std::string& text, int& prefix) {
    if (text.empty() || text.size() > 3) return false;
    int value = 0;
    for (char c : text) {
        if (c < '0' || c > '9') return false;
        value = value * 10 + (c - '0');
    }
    if (value > 128) return false;
    prefix = value;
    return true;
}

bool ParseNetwork(const std::string& text, uint8_t (&bytes)[16], int& prefix) {
    size_t slash = text.find('/');
    if (slash == std::string::npos) return false;
    return ParseIpv6(text.substr(0, slash), bytes) && ParsePrefix(text.substr(slash + 1), prefix);
}

}  // namespace

Ipv4Address::Ipv4Address() = default;

Ipv4Address::Ipv4Address(const std::string& text) {
    if (!ParseDottedQuad(text, _addr)) throw HostCtlException("invalid IPv4 address \"" + text + "\"");
}

bool Ipv4Address::IsValidAddress(const std::string& text) {
    uint32_t ignored;
    return ParseDottedQuad(text, ignored);
}

std::string Ipv4Address::GetStringAddress() const {
    return std::to_string(_addr >> 24) + "." + std::to_string((_addr >> 16) & 0xff) + "." +
           std::to_string((_addr >> 8) & 0xff) + "." + std::to_string(_addr & 0xff);
}

bool Ipv4Address::IsValidNetmask() const {
    // The inverted mask must be of the form 0...01...1, i.e. one less than a
    // power of two.
    uint32_t inverted = ~_addr;
    return (inverted & (inverted + 1)) == 0;
}

Ipv6Address::Ipv6Address() = default;

Ipv6Address::Ipv6Address(const std::string& text) {
    if (!ParseIpv6(text, _bytes)) throw HostCtlException("invalid IPv6 address \"" + text + "\"");
}

bool Ipv6Address::IsValidAddress(const std::string& text) {
    uint8_t ignored[16];
    return ParseIpv6(text, ignored);
}

std::string Ipv6Address::GetStringAddress() const {
    char buf[INET6_ADDRSTRLEN];
    inet_ntop(AF_INET6, _bytes, buf, sizeof buf);
    return buf;
}

bool Ipv6Address::IsLinkLocal() const { return _bytes[0] == 0xfe && (_bytes[1] & 0xc0) == 0x80; }

bool Ipv6Address::IsZero() const {
    for (uint8_t b : _bytes)
        if (b != 0) return false;
    return true;
}

IpAddress::IpAddress(const std::string& text) {
    if (Ipv6Address::IsValidAddress(text)) {
        _isV6 = true;
        _v6 = Ipv6Address(text);
    } else if (Ipv4Address::IsValidAddress(text)) {
        _v4 = Ipv4Address(text);
    } else {
        throw HostCtlException("invalid IP address \"" + text + "\"");
    }
}

std::string IpAddress::GetStringAddress() const {
    return _isV6 ? _v6.GetStringAddress() : _v4.GetStringAddress();
}

Ipv6Network::Ipv6Network(const Ipv6Address& addr, int prefix, Ipv6AddressType type)
    : _addr(addr), _prefix(prefix), _type(type) {
    if (prefix < 0 || prefix > 128)
        throw HostCtlException("invalid IPv6 prefix length " + std::to_string(prefix));
}

Ipv6Network::Ipv6Network(const std::string& text) {
    if (!IsValidAddressAndNetmask(text)) throw HostCtlException("invalid IPv6 network \"" + text + "\"");
    size_t slash = text.find('/');
    _addr = Ipv6Address(text.substr(0, slash));
    ParsePrefix(text.substr(slash + 1), _prefix);
}

bool Ipv6Network::IsValidAddressAndNetmask(const std::string& text) {
    uint8_t bytes[16];
    int prefix;
    return ParseNetwork(text, bytes, prefix);
}

std::string Ipv6Network::ToString() const { return _addr.GetStringAddress() + "/" + std::to_string(_prefix); }

}  // namespace HostCtl::Network
