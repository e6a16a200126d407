// The one seam between the host control operations and the host they act on.
// QelCtl and HostCtl objects are thin wrappers that call the process's
// backend; a backend exists for the simulated host (a folder holding the
// host's state) and, later, for the real machine.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "hostctl/HostCtl.hpp"
#include "hostctl/QelCtl.hpp"

namespace HostCtl::Lib {

// The kernel's version record, before it is packed into bytes.
struct VersionRecord {
    std::string product;
    std::string version;
    std::string kernelRelease;
    std::string build;
    uint32_t buildNumber = 0;
};

// DNS settings of one network stack.
struct DnsSettings {
    std::string hostname;
    std::string domain;
    bool dhcp = false;
    std::vector<Network::Ipv4Address> servers;
    std::vector<Network::Ipv6Address> ipv6Servers;
    std::vector<std::string> searchDomains;
};

// Which fields of DnsSettings a write changes; the others keep the host's
// value, so that writers of different fields never undo each other.
enum DnsField : unsigned {
    DnsHostname = 1u << 0,
    DnsDomain = 1u << 1,
    DnsDhcp = 1u << 2,
    DnsServers = 1u << 3,  // both the IPv4 and the IPv6 list
    DnsSearchDomains = 1u << 4,
};

// Default gateways of one network stack ("0.0.0.0" / "::" for none).
struct RouteSettings {
    Network::Ipv4Address ipv4Gateway;
    Network::Ipv6Address ipv6Gateway;
};

enum RouteField : unsigned {
    RouteIpv4Gateway = 1u << 0,
    RouteIpv6Gateway = 1u << 1,
};

// The value of an advanced option: an integer or a string.
struct AdvancedOptionValue {
    bool isInteger = true;
    int64_t integer = 0;
    std::string text;
};

class Backend {
public:
    virtual ~Backend() = default;

    // Version and hardware.
    virtual VersionRecord GetVersionRecord() = 0;
    virtual std::string GetHardwareVendor() = 0;
    virtual std::string GetHardwareProduct() = 0;
    virtual unsigned GetCpuPackages() = 0;
    virtual std::string GetCpuModel() = 0;
    virtual uint64_t GetMemoryPageSize() = 0;
    virtual uint64_t GetMemoryTotalPages() = 0;

    // Network.
    virtual std::vector<Network::Pnic> GetPnics() = 0;
    // Name of the virtual NIC that carries management, or "" when none does.
    virtual std::string GetManagementInterfaceName() = 0;
    virtual Network::IpConfig GetVnicIpConfig(const std::string& vnic) = 0;
    virtual void SetVnicIpConfig(const std::string& vnic, const Network::IpConfig& config) = 0;
    virtual Network::ConnectionPoint GetVnicConnectionPoint(const std::string& vnic) = 0;
    virtual bool GetIpv6Enabled() = 0;
    virtual void SetIpv6Enabled(bool enabled) = 0;
    virtual DnsSettings GetDns(const std::string& netstack) = 0;
    // Writes the fields named in `fields` (a DnsField mask).
    virtual void SetDns(const std::string& netstack, const DnsSettings& settings, unsigned fields) = 0;
    virtual RouteSettings GetRouting(const std::string& netstack) = 0;
    // Writes the fields named in `fields` (a RouteField mask).
    virtual void SetRouting(const std::string& netstack, const RouteSettings& settings, unsigned fields) = 0;
    virtual std::vector<std::string> GetVirtualSwitchNames() = 0;

    // System.
    virtual std::string GetWelcomeMessage() = 0;
    virtual std::string GetSystemAlert() = 0;
    virtual void SetSystemAlert(const std::string& alert) = 0;
    virtual QelCtl::System::BootOptions GetBootOptions() = 0;
    virtual std::string GetKeyboardLayout() = 0;
    virtual void SetKeyboardLayout(const std::string& layout) = 0;
    virtual std::vector<std::string> GetKeyboardLayouts() = 0;
    // Loads the key mappings of a layout into the console driver.
    virtual void LoadKeyboardMappings(const std::string& layout) = 0;

    // Options.
    virtual std::optional<AdvancedOptionValue> FindAdvancedOption(const std::string& name) = 0;
    virtual void SetAdvancedOption(const std::string& name, const AdvancedOptionValue& value) = 0;
    virtual bool HasUserOption(const std::string& name) = 0;

    // Smart cards.
    virtual std::vector<QelCtl::Hardware::SmartCardSlot> GetSmartCardSlots() = 0;
    // The token in the slot, or nothing when the slot is empty or unknown.
    virtual std::optional<QelCtl::Hardware::SmartCardToken> GetSmartCardToken(const std::string& slot) = 0;

    // Virtual machines.
    virtual bool HasRunningVirtualMachines() = 0;

    // Driver VM: its state (0 when the host has none) and the devices it can own.
    virtual int GetDriverVmState() = 0;
    virtual std::vector<QelCtl::Hardware::DriverVmDevice> GetDriverVmDevices() = 0;
    virtual void SetDriverVmOwned(const std::vector<std::string>& ownedIds) = 0;
};

// The process's backend, chosen by InitHost() (called on first use).
Backend& GetBackend();

// Puts another backend in place of the process's one (tests use it to talk
// to a fake host); null puts back the backend of the host chosen by InitHost
// or UseSimulatedHost. Not safe while other threads use the backend.
void SetBackend(std::unique_ptr<Backend> backend);

}  // namespace HostCtl::Lib
