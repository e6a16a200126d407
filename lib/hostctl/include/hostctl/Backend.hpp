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
    std::vector<Network::Ipv4Address> servers;
    std::vector<Network::Ipv6Address> ipv6Servers;
    std::vector<std::string> searchDomains;
};

// Default gateways of one network stack ("0.0.0.0" / "::" for none).
struct RouteSettings {
    Network::Ipv4Address ipv4Gateway;
    Network::Ipv6Address ipv6Gateway;
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

    // Network: physical NICs and virtual NICs. A virtual NIC is named by
    // its name ("qk0").
    virtual std::vector<Network::Pnic> GetPnics() = 0;
    // Name of the virtual NIC that carries management, or "" when none does.
    virtual std::string GetManagementInterfaceName() = 0;
    virtual Network::IpConfig GetVnicIpConfig(const std::string& vnic) = 0;
    // Configures the interface: static addresses as given, DHCP leases and
    // autoconfigured IPv6 addresses obtained as the configuration asks.
    virtual void SetVnicIpConfig(const std::string& vnic, const Network::IpConfig& config) = 0;
    virtual Network::ConnectionPoint GetVnicConnectionPoint(const std::string& vnic) = 0;
    virtual void SetVnicConnectionPoint(const std::string& vnic, const Network::ConnectionPoint& point) = 0;
    virtual std::vector<std::string> GetVnicNames() = 0;
    virtual std::string GetVnicMacAddress(const std::string& vnic) = 0;
    virtual void SetVnicMacAddress(const std::string& vnic, const std::string& mac) = 0;
    virtual void RenewVnicDhcpLease(const std::string& vnic) = 0;
    // Down (dynamic addresses given up) or up (obtained anew).
    virtual void SetVnicEnabled(const std::string& vnic, bool enabled) = 0;
    // A set of network changes made as one: between Begin and Commit a host
    // may stage the network setters and apply them together at Commit (a
    // failure to apply throws there). A host that applies each setter at
    // once does nothing here.
    virtual void BeginNetworkChange() {}
    virtual void CommitNetworkChange() {}
    // Before a static IPv4 address is set on `vnic`: whether another machine
    // on its link already uses `address`. Returns who answered (a MAC address
    // or a machine's name), or nothing when the address is free. Bounded
    // (a few seconds); sends nothing beyond the interface's own link.
    virtual std::optional<std::string> ProbeIpv4Address(const std::string& vnic,
                                                        const Network::Ipv4Address& address) = 0;
    // The checks of the management interface `vnic` after a change, each
    // bounded: link on a physical uplink, every configured address present
    // and not a duplicate, the IPv4 and IPv6 default gateways answer on the
    // link, and each name server answers a query for the host's own name (a
    // warning when it does not, never a failure). Every check is listed, in
    // that order, passed or not.
    virtual std::vector<QelCtl::Network::NetworkCheck> CheckNetwork(const std::string& vnic) = 0;
    // IPv6 in the running kernel; the setter decides the next boot.
    virtual bool GetIpv6Enabled() = 0;
    virtual void SetIpv6Enabled(bool enabled) = 0;

    // Switches.
    virtual std::string GetConnectionPointSwitch(const Network::ConnectionPoint& point) = 0;
    virtual std::vector<std::string> GetVirtualSwitchNames() = 0;
    virtual void AddVirtualSwitch(const std::string& vswitch) = 0;
    virtual void RemoveVirtualSwitch(const std::string& vswitch) = 0;
    virtual std::vector<std::string> GetVirtualSwitchUplinks(const std::string& vswitch) = 0;
    virtual Network::TeamingPolicy GetTeamingPolicy(const std::string& vswitch) = 0;
    virtual unsigned GetMaxActiveUplinks(const std::string& vswitch) = 0;
    virtual void AddUplinkToTeamingPolicy(const std::string& vswitch, const std::string& pnic,
                                          bool standby) = 0;
    virtual void RemoveUplinkFromTeamingPolicy(const std::string& vswitch, const std::string& pnic) = 0;
    virtual std::vector<std::string> GetPortGroupNames(const std::string& vswitch) = 0;
    virtual void AddPortGroup(const std::string& vswitch, const std::string& portGroup, uint16_t vlanId) = 0;
    virtual uint16_t GetPortGroupVlanId(const std::string& vswitch, const std::string& portGroup) = 0;
    virtual void SetPortGroupVlanId(const std::string& vswitch, const std::string& portGroup,
                                    uint16_t vlanId) = 0;
    virtual std::vector<std::string> GetDistributedSwitchNames() = 0;
    virtual std::vector<Network::DistributedSwitch::UplinkPort> GetDvsUplinkPorts(const std::string& dvs) = 0;
    virtual void RemoveDvsUplink(const std::string& dvs, const std::string& pnic) = 0;
    virtual void AddDvsUplink(const std::string& dvs, const std::string& uplinkPort,
                              const std::string& pnic) = 0;
    virtual Network::DistributedSwitch::PortSettings GetDvsPortSettings(const std::string& dvs,
                                                                        const std::string& port) = 0;
    // Returns the new port's key.
    virtual std::string AddDvsHostLocalPort(const std::string& dvs,
                                            const Network::DistributedSwitch::PortSettings& settings) = 0;
    virtual void RemoveDvsHostLocalPort(const std::string& dvs, const std::string& port) = 0;

    // The factory restore of the network (see QelCtl::Network::NetworkInfoImpl).
    virtual void DisableNetDumper() = 0;
    virtual void ClearNetworkConfig() = 0;
    virtual void AutoConfigNetwork() = 0;
    // What ClearNetworkConfig removes, as an opaque text, and its return.
    virtual std::string GetNetworkConfig() = 0;
    virtual void SetNetworkConfig(const std::string& config) = 0;
    // The host resolver's answer for `name`: hosts file, then name servers.
    virtual std::vector<Network::IpAddress> ResolveHostName(const std::string& name) = 0;

    // Name service and routing of a network stack ("defaultTcpipStack").
    // `persist` also writes the saved configuration the host boots with.
    virtual DnsSettings GetDns(const std::string& netstack) = 0;
    virtual void SetHostname(const std::string& netstack, const std::string& hostname, bool persist) = 0;
    // Host name and domain together (the domain may be empty).
    virtual void SetFqdn(const std::string& netstack, const std::string& hostname, const std::string& domain,
                         bool persist) = 0;
    virtual void RemoveNameServers(const std::string& netstack) = 0;
    virtual void AddNameServer(const std::string& netstack, const Network::IpAddress& server) = 0;
    virtual void SetSearchDomains(const std::string& netstack, const std::vector<std::string>& domains) = 0;
    virtual void SaveConfig(const std::string& netstack) = 0;
    virtual RouteSettings GetRouting(const std::string& netstack) = 0;
    virtual void SetDefaultGateway(const std::string& netstack, const Network::Ipv4Address& gateway,
                                   bool persist) = 0;
    virtual void SetIpv6DefaultGateway(const std::string& netstack, const Network::Ipv6Address& gateway) = 0;

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

    // Services and firewall.
    // Whether the firewall ruleset `id` ("sshServer") lets its traffic in; an
    // unknown id throws.
    virtual bool GetFirewallRulesetEnabled(const std::string& id) = 0;
    virtual void SetFirewallRulesetEnabled(const std::string& id, bool enabled) = 0;
    // Runs `commandLine` through the host's shell ("/bin/sh -c"); absolute
    // paths in it are host paths. With `logOutput` every line the command
    // prints goes to the system log, otherwise its output is dropped. With
    // `wait` the result is the command's exit status (128 + the signal number
    // when a signal ended it); without, the command is left running on its
    // own (its output dropped) and the result is 0 once it has started.
    // Throws when the shell cannot be started.
    virtual int RunCommandLine(const std::string& commandLine, bool logOutput, bool wait) = 0;
};

// The process's backend, chosen by InitHost() (called on first use).
Backend& GetBackend();

// Puts another backend in place of the process's one (tests use it to talk
// to a fake host); null puts back the backend of the host chosen by InitHost
// or UseSimulatedHost. Not safe while other threads use the backend.
void SetBackend(std::unique_ptr<Backend> backend);

}  // namespace HostCtl::Lib
