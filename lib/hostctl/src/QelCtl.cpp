// The QelCtl information and configuration objects: thin wrappers that ask
// the process's backend on every call.
#include "hostctl/QelCtl.hpp"

#include <algorithm>
#include <cstring>
#include <optional>
#include <utility>

#include "hostctl/Backend.hpp"

namespace QelCtl {

using HostCtl::Lib::GetBackend;
using HostCtl::Lib::HostCtlException;

namespace Util {

namespace {

// Copies `text` into a field of `width` bytes, cut to leave room for the NUL.
void PutText(uint8_t* record, size_t offset, size_t width, const std::string& text) {
    memcpy(record + offset, text.data(), std::min(text.size(), width - 1));
}

}  // namespace

void SysinfoUtil::SysinfoGet(SysinfoNode node, const char* /*params*/, void* buf, size_t len) {
    if (node != SysinfoNode::SystemVersion) throw HostCtlException("unknown system information node");
    if (buf == nullptr || len < SYSINFO_VERSION_SIZE)
        throw HostCtlException("the system version record needs a buffer of " +
                               std::to_string(SYSINFO_VERSION_SIZE) + " bytes");
    const HostCtl::Lib::VersionRecord version = GetBackend().GetVersionRecord();

    uint8_t record[SYSINFO_VERSION_SIZE] = {};
    PutText(record, 0, 32, version.product);
    PutText(record, 32, 64, version.version);
    PutText(record, 96, 32, version.kernelRelease);
    PutText(record, 128, 164, version.build);
    memcpy(record + 292, &version.buildNumber, sizeof version.buildNumber);
    memcpy(buf, record, sizeof record);
}

}  // namespace Util

namespace Adv {

std::unique_ptr<HostCtl::Adv::AdvancedOption> AdvancedOptionImpl::FindOption(const std::string& name) {
    std::optional<HostCtl::Lib::AdvancedOptionValue> value = GetBackend().FindAdvancedOption(name);
    if (!value) return nullptr;
    if (value->isInteger) return std::make_unique<HostCtl::Adv::AdvancedIntegerOption>(name, value->integer);
    return std::make_unique<HostCtl::Adv::AdvancedStringOption>(name, value->text);
}

bool AdvancedOptionImpl::HasUserOption(const std::string& name) { return GetBackend().HasUserOption(name); }

}  // namespace Adv

namespace Hardware {

std::string HardwareInfoImpl::GetVendorName() { return GetBackend().GetHardwareVendor(); }

std::string HardwareInfoImpl::GetProductName() { return GetBackend().GetHardwareProduct(); }

unsigned CpuInfoImpl::GetNumCpuPackages() { return GetBackend().GetCpuPackages(); }

std::string CpuInfoImpl::GetModelName() { return GetBackend().GetCpuModel(); }

uint64_t MemoryInfoImpl::GetTotalPages() { return GetBackend().GetMemoryTotalPages(); }

uint64_t MemoryInfoImpl::GetPageSize() { return GetBackend().GetMemoryPageSize(); }

std::vector<SmartCardSlot> SmartCardInfoImpl::GetAllSlots() { return GetBackend().GetSmartCardSlots(); }

bool SmartCardInfoImpl::GetToken(const SmartCardSlot& slot, SmartCardToken& token) {
    std::optional<SmartCardToken> found = GetBackend().GetSmartCardToken(slot.name);
    if (!found) return false;
    token = std::move(*found);
    return true;
}

int DriverVmInfoImpl::GetState() { return GetBackend().GetDriverVmState(); }

std::vector<DriverVmDevice> DriverVmInfoImpl::GetDevices() { return GetBackend().GetDriverVmDevices(); }

void DriverVmInfoImpl::SetOwned(const std::vector<std::string>& ownedIds) {
    GetBackend().SetDriverVmOwned(ownedIds);
}

}  // namespace Hardware

namespace Network {

void NetworkInfoImpl::UpdateManagementInterface() {
    _mgmtName = GetBackend().GetManagementInterfaceName();
    _updated = true;
}

std::unique_ptr<HostCtl::Network::QelNic> NetworkInfoImpl::GetManagementInterface() {
    if (!_updated) UpdateManagementInterface();
    if (_mgmtName.empty()) return nullptr;
    return std::make_unique<HostCtl::Network::QelNic>(_mgmtName);
}

std::vector<HostCtl::Network::Pnic> NetworkInfoImpl::GetPnics() { return GetBackend().GetPnics(); }

bool NetworkInfoImpl::IsQelIpv6Enabled() { return GetBackend().GetIpv6Enabled(); }

void NetworkInfoImpl::SetQelIpv6Enabled(bool enabled) { GetBackend().SetIpv6Enabled(enabled); }

std::vector<std::string> NetworkInfoImpl::GetVirtualNicNames() { return GetBackend().GetVnicNames(); }

void NetworkInfoImpl::BeginChange() { GetBackend().BeginNetworkChange(); }

void NetworkInfoImpl::CommitChange() { GetBackend().CommitNetworkChange(); }

void NetworkInfoImpl::DisableNetDumper() { GetBackend().DisableNetDumper(); }

void NetworkInfoImpl::ClearNetworkConfig() { GetBackend().ClearNetworkConfig(); }

void NetworkInfoImpl::AutoConfigNetwork() { GetBackend().AutoConfigNetwork(); }

std::string NetworkInfoImpl::GetNetworkConfig() { return GetBackend().GetNetworkConfig(); }

void NetworkInfoImpl::SetNetworkConfig(const std::string& config) { GetBackend().SetNetworkConfig(config); }

namespace {

bool IsValidLabel(const std::string& label) {
    if (label.empty() || label.size() > 63 || label.front() == '-' || label.back() == '-') return false;
    for (char c : label) {
        const bool ok =
            (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-';
        if (!ok) return false;
    }
    return true;
}

void CheckHostname(const std::string& name) {
    if (!IsValidLabel(name))
        throw HostCtlException("\"" + name +
                               "\" is not a valid host name (letters, digits and '-', 1 to 63 characters, "
                               "not beginning or ending with '-')");
}

}  // namespace

bool DnsConfigImpl::IsValidDomainName(const std::string& name) {
    if (name.empty() || name.size() > 253) return false;
    size_t start = 0;
    for (;;) {
        const size_t dot = name.find('.', start);
        if (!IsValidLabel(name.substr(start, dot == std::string::npos ? std::string::npos : dot - start)))
            return false;
        if (dot == std::string::npos) return true;
        start = dot + 1;
    }
}

std::vector<std::string> DnsConfigImpl::SplitSearchDomains(const std::string& domains) {
    std::vector<std::string> pieces;
    std::string piece;
    for (char c : domains + " ") {
        if (c == ' ' || c == ',' || c == '\t') {
            if (!piece.empty()) pieces.push_back(piece);
            piece.clear();
        } else {
            piece += c;
        }
    }
    return pieces;
}

DnsConfigImpl::DnsConfigImpl(std::string netstack) : _netstack(std::move(netstack)) {}

std::string DnsConfigImpl::GetHostname() { return GetBackend().GetDns(_netstack).hostname; }

std::string DnsConfigImpl::GetDomain() { return GetBackend().GetDns(_netstack).domain; }

void DnsConfigImpl::SetHostname(const std::string& name, bool persist) {
    CheckHostname(name);
    GetBackend().SetHostname(_netstack, name, persist);
}

void DnsConfigImpl::SetFqdn(const std::string& fqdn, bool persist) {
    // The first label is the host name, the rest (possibly nothing) the domain.
    const size_t dot = fqdn.find('.');
    const std::string hostname = fqdn.substr(0, dot);
    const std::string domain = dot == std::string::npos ? "" : fqdn.substr(dot + 1);
    CheckHostname(hostname);
    if (!domain.empty() && !IsValidDomainName(domain))
        throw HostCtlException("\"" + fqdn + "\" is not a valid fully qualified name: \"" + domain +
                               "\" is no domain name");
    GetBackend().SetFqdn(_netstack, hostname, domain, persist);
}

std::vector<HostCtl::Network::Ipv4Address> DnsConfigImpl::GetNameServers() {
    return GetBackend().GetDns(_netstack).servers;
}

std::vector<HostCtl::Network::Ipv6Address> DnsConfigImpl::GetIpv6NameServers() {
    return GetBackend().GetDns(_netstack).ipv6Servers;
}

void DnsConfigImpl::RemoveNameServers() { GetBackend().RemoveNameServers(_netstack); }

void DnsConfigImpl::AddNameServer(const HostCtl::Network::IpAddress& server) {
    GetBackend().AddNameServer(_netstack, server);
}

std::vector<std::string> DnsConfigImpl::GetSearchDomains() {
    return GetBackend().GetDns(_netstack).searchDomains;
}

void DnsConfigImpl::SetSearchDomainsString(const std::string& domains) {
    const std::vector<std::string> pieces = SplitSearchDomains(domains);
    for (const std::string& piece : pieces) {
        if (!IsValidDomainName(piece))
            throw HostCtlException("\"" + piece + "\" is not a valid search domain");
    }
    GetBackend().SetSearchDomains(_netstack, pieces);
}

void DnsConfigImpl::SaveConfig() { GetBackend().SaveConfig(_netstack); }

RoutingInfoImpl::RoutingInfoImpl(std::string netstack) : _netstack(std::move(netstack)) {}

HostCtl::Network::Ipv4Address RoutingInfoImpl::GetQelKernelDefaultGateway() {
    return GetBackend().GetRouting(_netstack).ipv4Gateway;
}

void RoutingInfoImpl::SetQelKernelDefaultGateway(const HostCtl::Network::Ipv4Address& gw, bool persist) {
    GetBackend().SetDefaultGateway(_netstack, gw, persist);
}

HostCtl::Network::Ipv6Address RoutingInfoImpl::GetIpv6QelKernelDefaultGateway() {
    return GetBackend().GetRouting(_netstack).ipv6Gateway;
}

void RoutingInfoImpl::SetIpv6QelKernelDefaultGateway(const HostCtl::Network::Ipv6Address& gw) {
    GetBackend().SetIpv6DefaultGateway(_netstack, gw);
}

std::vector<std::string> VirtualSwitchInfoImpl::GetVirtualSwitchNames() {
    return GetBackend().GetVirtualSwitchNames();
}

void VirtualSwitchInfoImpl::AddVirtualSwitch(const std::string& name) {
    if (!IsValidLabel(name)) throw HostCtlException("\"" + name + "\" is not a valid switch name");
    GetBackend().AddVirtualSwitch(name);
}

void VirtualSwitchInfoImpl::RemoveVirtualSwitch(const std::string& name) {
    GetBackend().RemoveVirtualSwitch(name);
}

std::vector<HostCtl::Network::IpAddress> NameResolverImpl::Resolve(const std::string& name) {
    return GetBackend().ResolveHostName(name);
}

std::vector<std::string> DistributedSwitchInfoImpl::GetDistributedSwitchNames() {
    return GetBackend().GetDistributedSwitchNames();
}

}  // namespace Network

namespace System {

std::string SystemInfoImpl::GetWelcomeMessage() { return GetBackend().GetWelcomeMessage(); }

void SystemInfoImpl::SetSystemAlert(const std::string& alert) { GetBackend().SetSystemAlert(alert); }

std::string SystemInfoImpl::GetSystemAlert() { return GetBackend().GetSystemAlert(); }

BootOptions SystemInfoImpl::GetBootOptions() { return GetBackend().GetBootOptions(); }

std::string SystemInfoImpl::GetKeyboardLayout() { return GetBackend().GetKeyboardLayout(); }

void SystemInfoImpl::SetKeyboardLayout(const std::string& layout) { GetBackend().SetKeyboardLayout(layout); }

std::vector<std::string> SystemInfoImpl::GetKeyboardLayouts() { return GetBackend().GetKeyboardLayouts(); }

void SystemInfoImpl::LoadKeyboardMappings(const std::string& layout) {
    GetBackend().LoadKeyboardMappings(layout);
}

}  // namespace System

namespace Resource {

bool ResourceInfoImpl::HasRunningVirtualMachines() { return GetBackend().HasRunningVirtualMachines(); }

}  // namespace Resource

// Services and firewall.

namespace System {

HostCtl::Firewall::Ruleset SystemInfoImpl::GetFirewallRulesetById(const std::string& id) {
    return HostCtl::Firewall::Ruleset(id, GetBackend().GetFirewallRulesetEnabled(id));
}

}  // namespace System

namespace Util {

int QelCtl_Exec(const std::string& commandLine, bool logOutput, bool wait, bool throwOnFailure) {
    const int result = GetBackend().RunCommandLine(commandLine, logOutput, wait);
    if (result != 0 && throwOnFailure)
        throw HostCtlException("\"" + commandLine + "\" failed with status " + std::to_string(result));
    return result;
}

}  // namespace Util

}  // namespace QelCtl
