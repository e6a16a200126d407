// Value types and the exception of the host control library.
#pragma once

#include <cstdint>
#include <stdexcept>
#include <string>
#include <vector>

namespace HostCtl {

namespace Lib {

// Every failure of the library reaches the caller as this exception.
class HostCtlException : public std::runtime_error {
public:
    explicit HostCtlException(const std::string& what) : std::runtime_error(what) {}
};

}  // namespace Lib

namespace Network {

// An IPv4 address. Construction from text throws HostCtlException when the
// text is not a dotted quad.
class Ipv4Address {
public:
    Ipv4Address();  // 0.0.0.0
    explicit Ipv4Address(const std::string& text);
    static bool IsValidAddress(const std::string& text);
    std::string GetStringAddress() const;
    uint32_t GetHostOrder() const { return _addr; }
    bool IsZero() const { return _addr == 0; }
    // True for a netmask: ones from the top, then only zeros (0.0.0.0 and
    // 255.255.255.255 included).
    bool IsValidNetmask() const;
    bool operator==(const Ipv4Address&) const = default;

private:
    uint32_t _addr = 0;  // host byte order
};

// An IPv6 address, kept as 16 bytes; printed in its canonical short form.
class Ipv6Address {
public:
    Ipv6Address();  // ::
    explicit Ipv6Address(const std::string& text);
    static bool IsValidAddress(const std::string& text);
    std::string GetStringAddress() const;
    bool IsLinkLocal() const;  // fe80::/10
    bool IsZero() const;
    const uint8_t* Bytes() const { return _bytes; }
    bool operator==(const Ipv6Address&) const = default;

private:
    uint8_t _bytes[16] = {};
};

// Either kind of address (DNS servers mix both).
class IpAddress {
public:
    explicit IpAddress(const std::string& text);  // throws when neither kind
    bool IsIpv6() const { return _isV6; }
    std::string GetStringAddress() const;
    const Ipv4Address& V4() const { return _v4; }
    const Ipv6Address& V6() const { return _v6; }

private:
    bool _isV6 = false;
    Ipv4Address _v4;
    Ipv6Address _v6;
};

enum class Ipv6AddressType { Static = 0, Dhcp = 1, Autoconf = 2 };

// An IPv6 address with its prefix length and the way it was obtained.
class Ipv6Network {
public:
    Ipv6Network() = default;
    Ipv6Network(const Ipv6Address& addr, int prefix, Ipv6AddressType type = Ipv6AddressType::Static);
    // Parses "addr/prefix"; throws HostCtlException when invalid.
    explicit Ipv6Network(const std::string& text);
    static bool IsValidAddressAndNetmask(const std::string& text);
    const Ipv6Address& GetAddress() const { return _addr; }
    std::string GetStringAddress() const { return _addr.GetStringAddress(); }
    int GetPrefixLength() const { return _prefix; }
    Ipv6AddressType GetIpv6AddressType() const { return _type; }
    std::string ToString() const;  // "addr/prefix"

private:
    Ipv6Address _addr;
    int _prefix = 64;
    Ipv6AddressType _type = Ipv6AddressType::Static;
};

// The IP configuration of a virtual NIC.
class IpConfig {
public:
    bool GetUseDhcp() const { return _useDhcp; }
    void SetUseDhcp(bool v) { _useDhcp = v; }
    bool GetIpv4UseNone() const { return _ipv4None; }
    void SetIpv4UseNone(bool v) { _ipv4None = v; }
    const Ipv4Address& GetIpv4Address() const { return _ipv4; }
    void SetIpv4Address(const Ipv4Address& a) { _ipv4 = a; }
    const Ipv4Address& GetIpv4Netmask() const { return _netmask; }
    void SetIpv4Netmask(const Ipv4Address& m) { _netmask = m; }
    const std::vector<Ipv6Network>& GetIpv6Network() const { return _ipv6; }
    void SetIpv6Network(const std::vector<Ipv6Network>& v) { _ipv6 = v; }
    bool GetIpv6Dhcp() const { return _ipv6Dhcp; }
    void SetIpv6Dhcp(bool v) { _ipv6Dhcp = v; }
    bool GetIpv6RouterAdvertisement() const { return _ipv6Ra; }
    void SetIpv6RouterAdvertisement(bool v) { _ipv6Ra = v; }

private:
    bool _useDhcp = false;
    bool _ipv4None = false;
    Ipv4Address _ipv4;
    Ipv4Address _netmask;
    std::vector<Ipv6Network> _ipv6;
    bool _ipv6Dhcp = false;
    bool _ipv6Ra = false;
};

// Where a virtual NIC is connected. Type 1 is a standard switch port
// group, type 2 a distributed-switch port.
class ConnectionPoint {
public:
    enum Type { None = 0, PortGroup = 1, DvsPort = 2 };
    ConnectionPoint(int type, std::string name) : _type(type), _name(std::move(name)) {}
    int GetType() const { return _type; }
    const std::string& GetName() const { return _name; }

private:
    int _type;
    std::string _name;
};

// A physical network adapter.
struct Pnic {
    std::string name;    // e.g. "zonic0"
    std::string mac;     // "00:50:56:aa:bb:cc"
    std::string driver;  // e.g. "e1000e"
    bool linkUp = true;
    int speedMbps = 1000;
    std::string description;
};

// A virtual NIC of the host kernel (the management interface is one).
// Reads and writes go to the host each time they are called.
class QelNic {
public:
    explicit QelNic(std::string name) : _name(std::move(name)) {}
    const std::string& GetName() const { return _name; }
    IpConfig GetIpConfig() const;
    void SetIpConfig(const IpConfig& cfg);
    ConnectionPoint GetConnectionPoint() const;

private:
    std::string _name;
};

}  // namespace Network

namespace Adv {

// An advanced option of the host, as found by name.
class AdvancedOption {
public:
    explicit AdvancedOption(std::string name) : _name(std::move(name)) {}
    virtual ~AdvancedOption() = default;
    const std::string& GetName() const { return _name; }

private:
    std::string _name;
};

class AdvancedIntegerOption : public AdvancedOption {
public:
    AdvancedIntegerOption(std::string name, int64_t current)
        : AdvancedOption(std::move(name)), _current(current) {}
    int64_t GetCurrent() const { return _current; }
    void SetCurrent(int64_t value);  // writes to the host

private:
    int64_t _current;
};

class AdvancedStringOption : public AdvancedOption {
public:
    AdvancedStringOption(std::string name, std::string current)
        : AdvancedOption(std::move(name)), _current(std::move(current)) {}
    const std::string& GetCurrent() const { return _current; }
    void SetCurrent(const std::string& value);  // writes to the host

private:
    std::string _current;
};

}  // namespace Adv

}  // namespace HostCtl
