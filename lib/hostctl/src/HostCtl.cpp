// The host objects of HostCtl: each call goes to the process's backend.
#include "hostctl/HostCtl.hpp"

#include "hostctl/Backend.hpp"

namespace HostCtl {

namespace Network {

namespace {

bool InNetwork(uint32_t address, uint32_t network, int prefix) {
    const uint32_t mask = prefix == 0 ? 0 : ~uint32_t(0) << (32 - prefix);
    return (address & mask) == network;
}

int PrefixLength(uint32_t netmask) {
    int prefix = 0;
    while (prefix < 32 && (netmask & (uint32_t(1) << (31 - prefix)))) ++prefix;
    return prefix;
}

// Why `address`/`netmask` cannot be a host's static address, or "" when it can.
std::string StaticAddressProblem(const Ipv4Address& address, const Ipv4Address& netmask) {
    const uint32_t a = address.GetHostOrder();
    const uint32_t m = netmask.GetHostOrder();
    const std::string text = address.GetStringAddress();
    if (!netmask.IsValidNetmask()) return "netmask " + netmask.GetStringAddress() + " is not a netmask";
    if (m == 0) return "netmask 0.0.0.0 leaves no network";
    if (InNetwork(a, 0x00000000u, 8)) return text + " is not a host address";
    if (InNetwork(a, 0x7f000000u, 8)) return text + " is a loopback address";
    if (InNetwork(a, 0xe0000000u, 4)) return text + " is a multicast address";
    if (InNetwork(a, 0xf0000000u, 4)) return text + " is a reserved address";
    if (PrefixLength(m) < 31) {
        const std::string subnet =
            Ipv4Address::FromHostOrder(a & m).GetStringAddress() + "/" + std::to_string(PrefixLength(m));
        if ((a & ~m) == 0) return text + " is the network address of " + subnet;
        if ((a & ~m) == ~m) return text + " is the broadcast address of " + subnet;
    }
    return "";
}

}  // namespace

void IpConfig::SetUseDhcp(bool useDhcp, bool none, const Ipv4Address& address, const Ipv4Address& netmask) {
    if (!useDhcp && !none) {
        const std::string problem = StaticAddressProblem(address, netmask);
        if (!problem.empty()) throw Lib::HostCtlException("invalid static IPv4 configuration: " + problem);
        _ipv4 = address;
        _netmask = netmask;
    }
    SetUseDhcp(useDhcp, none);
}

std::string ConnectionPoint::GetSwitchName() const {
    return Lib::GetBackend().GetConnectionPointSwitch(*this);
}

IpConfig QelNic::GetIpConfig() const { return Lib::GetBackend().GetVnicIpConfig(_name); }

void QelNic::SetIpConfig(const IpConfig& cfg) { Lib::GetBackend().SetVnicIpConfig(_name, cfg); }

ConnectionPoint QelNic::GetConnectionPoint() const { return Lib::GetBackend().GetVnicConnectionPoint(_name); }

void QelNic::SetConnectionPoint(const ConnectionPoint& point) {
    Lib::GetBackend().SetVnicConnectionPoint(_name, point);
}

std::string QelNic::GetMacAddress() const { return Lib::GetBackend().GetVnicMacAddress(_name); }

void QelNic::SetMacAddress(const std::string& mac) { Lib::GetBackend().SetVnicMacAddress(_name, mac); }

void QelNic::RenewDhcpLease() { Lib::GetBackend().RenewVnicDhcpLease(_name); }

void QelNic::Disable() { Lib::GetBackend().SetVnicEnabled(_name, false); }

void QelNic::Enable() { Lib::GetBackend().SetVnicEnabled(_name, true); }

void QelNic::Restart() {
    Disable();
    Enable();
}

std::vector<std::string> VirtualSwitch::GetUplinks() const {
    return Lib::GetBackend().GetVirtualSwitchUplinks(_name);
}

TeamingPolicy VirtualSwitch::GetTeamingPolicy() const { return Lib::GetBackend().GetTeamingPolicy(_name); }

unsigned VirtualSwitch::GetMaxActiveUplinks() const { return Lib::GetBackend().GetMaxActiveUplinks(_name); }

void VirtualSwitch::AddUplinkToTeamingPolicy(const std::string& pnic, bool standby) {
    Lib::GetBackend().AddUplinkToTeamingPolicy(_name, pnic, standby);
}

void VirtualSwitch::RemoveUplinkFromTeamingPolicy(const std::string& pnic) {
    Lib::GetBackend().RemoveUplinkFromTeamingPolicy(_name, pnic);
}

std::vector<std::string> VirtualSwitch::GetPortGroupNames() const {
    return Lib::GetBackend().GetPortGroupNames(_name);
}

void VirtualSwitch::AddPortGroup(const std::string& portGroup, uint16_t vlanId) {
    if (vlanId > 4095) throw Lib::HostCtlException("VLAN ID " + std::to_string(vlanId) + " is above 4095");
    Lib::GetBackend().AddPortGroup(_name, portGroup, vlanId);
}

uint16_t VirtualSwitch::GetPortGroupVlanId(const std::string& portGroup) const {
    return Lib::GetBackend().GetPortGroupVlanId(_name, portGroup);
}

void VirtualSwitch::SetPortGroupVlanId(const std::string& portGroup, uint16_t vlanId) {
    if (vlanId > 4095) throw Lib::HostCtlException("VLAN ID " + std::to_string(vlanId) + " is above 4095");
    Lib::GetBackend().SetPortGroupVlanId(_name, portGroup, vlanId);
}

std::vector<DistributedSwitch::UplinkPort> DistributedSwitch::GetUplinkPorts() const {
    return Lib::GetBackend().GetDvsUplinkPorts(_name);
}

std::vector<std::string> DistributedSwitch::GetUsedUplinks() const {
    std::vector<std::string> used;
    for (const UplinkPort& port : GetUplinkPorts())
        if (!port.pnic.empty()) used.push_back(port.pnic);
    return used;
}

void DistributedSwitch::RemoveUplink(const std::string& pnic) {
    Lib::GetBackend().RemoveDvsUplink(_name, pnic);
}

void DistributedSwitch::AddUplink(const std::string& uplinkPortKey, const std::string& pnic) {
    Lib::GetBackend().AddDvsUplink(_name, uplinkPortKey, pnic);
}

DistributedSwitch::PortSettings DistributedSwitch::GetPortSettings(const std::string& portKey) const {
    return Lib::GetBackend().GetDvsPortSettings(_name, portKey);
}

uint16_t DistributedSwitch::GetPortVlanId(const std::string& portKey) const {
    return GetPortSettings(portKey).vlanId;
}

std::string DistributedSwitch::AddHostLocalPort(const PortSettings& settings) {
    if (settings.vlanId > 4095)
        throw Lib::HostCtlException("VLAN ID " + std::to_string(settings.vlanId) + " is above 4095");
    return Lib::GetBackend().AddDvsHostLocalPort(_name, settings);
}

void DistributedSwitch::RemoveHostLocalPort(const std::string& portKey) {
    Lib::GetBackend().RemoveDvsHostLocalPort(_name, portKey);
}

}  // namespace Network

namespace Adv {

void AdvancedIntegerOption::SetCurrent(int64_t value) {
    Lib::AdvancedOptionValue v;
    v.isInteger = true;
    v.integer = value;
    Lib::GetBackend().SetAdvancedOption(GetName(), v);
    _current = value;
}

void AdvancedStringOption::SetCurrent(const std::string& value) {
    Lib::AdvancedOptionValue v;
    v.isInteger = false;
    v.text = value;
    Lib::GetBackend().SetAdvancedOption(GetName(), v);
    _current = value;
}

}  // namespace Adv

// Services and firewall.
namespace Firewall {

void Ruleset::SetEnabled(bool enabled) {
    Lib::GetBackend().SetFirewallRulesetEnabled(_id, enabled);
    _enabled = enabled;
}

}  // namespace Firewall

}  // namespace HostCtl
