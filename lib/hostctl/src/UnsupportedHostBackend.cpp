// A backend for a real host that has no host control backend: every operation
// fails with a text naming the operation.
#include "UnsupportedHostBackend.hpp"

namespace HostCtl::Lib {

namespace {

[[noreturn]] void Unavailable(const char* operation) {
    throw HostCtlException(std::string(operation) +
                           ": not available on this host (the host control library can only work on a "
                           "simulated host; set VELK_HOST_ROOT)");
}

class UnsupportedHostBackend : public Backend {
public:
    VersionRecord GetVersionRecord() override { Unavailable("reading the system version"); }
    std::string GetHardwareVendor() override { Unavailable("reading the hardware vendor"); }
    std::string GetHardwareProduct() override { Unavailable("reading the hardware product"); }
    unsigned GetCpuPackages() override { Unavailable("reading the CPU packages"); }
    std::string GetCpuModel() override { Unavailable("reading the CPU model"); }
    uint64_t GetMemoryPageSize() override { Unavailable("reading the memory page size"); }
    uint64_t GetMemoryTotalPages() override { Unavailable("reading the memory size"); }

    std::vector<Network::Pnic> GetPnics() override { Unavailable("listing the physical NICs"); }
    std::string GetManagementInterfaceName() override { Unavailable("finding the management interface"); }
    Network::IpConfig GetVnicIpConfig(const std::string&) override {
        Unavailable("reading an IP configuration");
    }
    void SetVnicIpConfig(const std::string&, const Network::IpConfig&) override {
        Unavailable("setting an IP configuration");
    }
    Network::ConnectionPoint GetVnicConnectionPoint(const std::string&) override {
        Unavailable("reading a connection point");
    }
    std::string GetVnicMacAddress(const std::string&) override {
        Unavailable("reading a virtual NIC's MAC address");
    }
    void SetVnicMacAddress(const std::string&, const std::string&) override {
        Unavailable("setting a virtual NIC's MAC address");
    }
    void RenewVnicDhcpLease(const std::string&) override { Unavailable("renewing a DHCP lease"); }
    void SetVnicEnabled(const std::string&, bool enabled) override {
        Unavailable(enabled ? "enabling a virtual NIC" : "disabling a virtual NIC");
    }
    bool GetIpv6Enabled() override { Unavailable("reading the IPv6 setting"); }
    void SetIpv6Enabled(bool) override { Unavailable("setting IPv6"); }

    std::string GetConnectionPointSwitch(const Network::ConnectionPoint&) override {
        Unavailable("finding the switch of a connection point");
    }
    std::vector<std::string> GetVirtualSwitchNames() override { Unavailable("listing the virtual switches"); }
    std::vector<std::string> GetVirtualSwitchUplinks(const std::string&) override {
        Unavailable("listing a virtual switch's uplinks");
    }
    Network::TeamingPolicy GetTeamingPolicy(const std::string&) override {
        Unavailable("reading a teaming policy");
    }
    unsigned GetMaxActiveUplinks(const std::string&) override {
        Unavailable("reading the number of active uplinks allowed");
    }
    void AddUplinkToTeamingPolicy(const std::string&, const std::string&, bool) override {
        Unavailable("adding an uplink to a teaming policy");
    }
    void RemoveUplinkFromTeamingPolicy(const std::string&, const std::string&) override {
        Unavailable("removing an uplink from a teaming policy");
    }
    std::vector<std::string> GetPortGroupNames(const std::string&) override {
        Unavailable("listing the port groups");
    }
    uint16_t GetPortGroupVlanId(const std::string&, const std::string&) override {
        Unavailable("reading a port group's VLAN ID");
    }
    void SetPortGroupVlanId(const std::string&, const std::string&, uint16_t) override {
        Unavailable("setting a port group's VLAN ID");
    }
    std::vector<std::string> GetDistributedSwitchNames() override {
        Unavailable("listing the distributed switches");
    }
    std::vector<Network::DistributedSwitch::UplinkPort> GetDvsUplinkPorts(const std::string&) override {
        Unavailable("listing a distributed switch's uplink ports");
    }
    void SetVnicConnectionPoint(const std::string&, const Network::ConnectionPoint&) override {
        Unavailable("connecting a virtual NIC");
    }
    std::vector<std::string> GetVnicNames() override { Unavailable("listing the virtual NICs"); }
    void AddVirtualSwitch(const std::string&) override { Unavailable("creating a virtual switch"); }
    void RemoveVirtualSwitch(const std::string&) override { Unavailable("removing a virtual switch"); }
    void AddPortGroup(const std::string&, const std::string&, uint16_t) override {
        Unavailable("creating a port group");
    }
    Network::DistributedSwitch::PortSettings GetDvsPortSettings(const std::string&,
                                                                const std::string&) override {
        Unavailable("reading a distributed port's properties");
    }
    std::string AddDvsHostLocalPort(const std::string&,
                                    const Network::DistributedSwitch::PortSettings&) override {
        Unavailable("creating a host-local distributed port");
    }
    void RemoveDvsHostLocalPort(const std::string&, const std::string&) override {
        Unavailable("removing a host-local distributed port");
    }
    void AddDvsUplink(const std::string&, const std::string&, const std::string&) override {
        Unavailable("adding an uplink to a distributed switch");
    }
    void DisableNetDumper() override { Unavailable("disabling the network core dump sender"); }
    void ClearNetworkConfig() override { Unavailable("clearing the network configuration"); }
    void AutoConfigNetwork() override { Unavailable("configuring the network automatically"); }
    std::vector<Network::IpAddress> ResolveHostName(const std::string&) override {
        Unavailable("resolving a host name");
    }
    void RemoveDvsUplink(const std::string&, const std::string&) override {
        Unavailable("removing an uplink from a distributed switch");
    }

    DnsSettings GetDns(const std::string&) override { Unavailable("reading the DNS configuration"); }
    void SetHostname(const std::string&, const std::string&, bool) override {
        Unavailable("setting the host name");
    }
    void SetFqdn(const std::string&, const std::string&, const std::string&, bool) override {
        Unavailable("setting the fully qualified host name");
    }
    void RemoveNameServers(const std::string&) override { Unavailable("removing the DNS servers"); }
    void AddNameServer(const std::string&, const Network::IpAddress&) override {
        Unavailable("adding a DNS server");
    }
    void SetSearchDomains(const std::string&, const std::vector<std::string>&) override {
        Unavailable("setting the DNS search domains");
    }
    void SaveConfig(const std::string&) override { Unavailable("saving the network configuration"); }
    RouteSettings GetRouting(const std::string&) override { Unavailable("reading the default gateways"); }
    void SetDefaultGateway(const std::string&, const Network::Ipv4Address&, bool) override {
        Unavailable("setting the IPv4 default gateway");
    }
    void SetIpv6DefaultGateway(const std::string&, const Network::Ipv6Address&) override {
        Unavailable("setting the IPv6 default gateway");
    }

    std::string GetWelcomeMessage() override { Unavailable("reading the welcome message"); }
    std::string GetSystemAlert() override { Unavailable("reading the system alert"); }
    void SetSystemAlert(const std::string&) override { Unavailable("setting the system alert"); }
    QelCtl::System::BootOptions GetBootOptions() override { Unavailable("reading the boot options"); }
    std::string GetKeyboardLayout() override { Unavailable("reading the keyboard layout"); }
    void SetKeyboardLayout(const std::string&) override { Unavailable("setting the keyboard layout"); }
    std::vector<std::string> GetKeyboardLayouts() override { Unavailable("listing the keyboard layouts"); }
    void LoadKeyboardMappings(const std::string&) override { Unavailable("loading the keyboard mappings"); }

    std::optional<AdvancedOptionValue> FindAdvancedOption(const std::string&) override {
        Unavailable("reading an advanced option");
    }
    void SetAdvancedOption(const std::string&, const AdvancedOptionValue&) override {
        Unavailable("setting an advanced option");
    }
    bool HasUserOption(const std::string&) override { Unavailable("reading a user option"); }

    std::vector<QelCtl::Hardware::SmartCardSlot> GetSmartCardSlots() override {
        Unavailable("listing the smart-card slots");
    }
    std::optional<QelCtl::Hardware::SmartCardToken> GetSmartCardToken(const std::string&) override {
        Unavailable("reading a smart-card token");
    }

    bool HasRunningVirtualMachines() override { Unavailable("looking for running virtual machines"); }

    int GetDriverVmState() override { Unavailable("reading the driver VM state"); }
    std::vector<QelCtl::Hardware::DriverVmDevice> GetDriverVmDevices() override {
        Unavailable("listing the driver VM devices");
    }
    void SetDriverVmOwned(const std::vector<std::string>&) override {
        Unavailable("setting the driver VM devices");
    }

    // Services and firewall.
    bool GetFirewallRulesetEnabled(const std::string&) override { Unavailable("reading a firewall ruleset"); }
    void SetFirewallRulesetEnabled(const std::string&, bool) override {
        Unavailable("setting a firewall ruleset");
    }
    int RunCommandLine(const std::string&, bool, bool) override { Unavailable("running a command line"); }
};

}  // namespace

std::unique_ptr<Backend> MakeUnsupportedHostBackend() { return std::make_unique<UnsupportedHostBackend>(); }

}  // namespace HostCtl::Lib
