#include "NetworkWindow.hpp"

#include <syslog.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>

#include "AdaptersDialog.hpp"
#include "ApplyChangesDialog.hpp"
#include "CommandRunner.hpp"
#include "Console.hpp"
#include "DNSConfigurationDialog.hpp"
#include "DisplayWidth.hpp"
#include "IPConfigurationDialog.hpp"
#include "IPv6ConfigurationDialog.hpp"
#include "ManagementInterface.hpp"
#include "MessageDialog.hpp"
#include "NetworkTrial.hpp"
#include "RebootConfirmDialog.hpp"
#include "StringFactory.hpp"
#include "SuffixesDialog.hpp"
#include "VlanDialog.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

using HostCtl::Lib::HostCtlException;
using HostCtl::Lib::Syslog;
using HostCtl::Network::IpAddress;
using HostCtl::Network::Ipv4Address;
using HostCtl::Network::Ipv6AddressType;
using HostCtl::Network::Ipv6Network;

namespace {

const char* const LEFT_FOOTER = "{color:black}<Up/Down>{/color} {color:dark-grey}Select{/color}";
const char* const RIGHT_FOOTER =
    "{color:white}<Enter>{/color}{color:light-grey} Change{/color}{align:right}{color:white}<Esc> "
    "{/color}{color:light-grey}Exit{/color}{/align}";

// Text ids of the entries, in menu order.
const int ENTRY_TEXT[] = {48, 49, 50, 51, 54, 55};

std::vector<Ipv6Network> StaticAddresses(const HostCtl::Network::IpConfig& config) {
    std::vector<Ipv6Network> statics;
    for (const Ipv6Network& network : config.GetIpv6Network())
        if (network.GetIpv6AddressType() == Ipv6AddressType::Static) statics.push_back(network);
    return statics;
}

}  // namespace

NetworkWindow::NetworkWindow(Frame* parent) : RootWindow(parent) {}

NetworkWindow::~NetworkWindow() {
    for (LabelItem* item : _items) delete item;
}

std::vector<std::string> NetworkWindow::SplitSuffixes(const std::string& line) {
    return QelCtl::Network::DnsConfigImpl::SplitSearchDomains(line);
}

std::string NetworkWindow::JoinSuffixes(const std::vector<std::string>& suffixes) {
    std::string line;
    for (const std::string& suffix : suffixes) line += (line.empty() ? "" : ", ") + suffix;
    return line;
}

// Reads everything the window shows. Host-control errors other than those of
// the switch leave the window (the main menu reports them).
bool NetworkWindow::ReadConfiguration() {
    QelCtl::Network::NetworkInfoImpl networkInfo;
    ipv6Enabled = ipv6EnabledAtStart = networkInfo.IsQelIpv6Enabled();

    _mgmtIntf = GetManagementInterface();
    if (!_mgmtIntf) {
        Syslog(LOG_ERR, "Could not get a suitable management interface");
        MessageDialog(this, 18, 20).Execute();
        return false;
    }
    _ipConfig = _ipConfigAtStart = _mgmtIntf->GetIpConfig();

    if (!IsManagementInterfaceOnDvs()) ReadSwitch();

    _gateway = _gatewayAtStart = _routingInfo.GetQelKernelDefaultGateway();
    _hostname = _dnsConfig.GetHostname();
    _ipv6Gateway = _ipv6GatewayAtStart = _routingInfo.GetIpv6QelKernelDefaultGateway();
    _dnsServers.clear();
    for (const auto& server : _dnsConfig.GetNameServers())
        _dnsServers.emplace_back(server.GetStringAddress());
    for (const auto& server : _dnsConfig.GetIpv6NameServers())
        _dnsServers.emplace_back(server.GetStringAddress());
    _suffixes = _dnsConfig.GetSearchDomains();
    _suffixLine = JoinSuffixes(_suffixes);
    return true;
}

// The team and VLAN of the management port group. A port that is not on a
// standard switch is not offered for editing; a team or VLAN that cannot be
// read ends the window like every other read at entry.
void NetworkWindow::ReadSwitch() {
    if (!FindManagementPort(*_mgmtIntf, _port)) return;
    try {
        _adapters = _adaptersAtStart = ReadTeam(_port.switchName);
    } catch (const HostCtlException& e) {
        Syslog(LOG_ERR, "Getting uplinks failed: %s", e.what());
        throw;
    }
    try {
        _vlanId = _vlanIdAtStart =
            HostCtl::Network::VirtualSwitch(_port.switchName).GetPortGroupVlanId(_port.portGroup);
    } catch (const HostCtlException& e) {
        Syslog(LOG_ERR, "Getting VlanID failed: %s", e.what());
        throw;
    }
    _nics = ReadAdapters();
    _switchEditable = true;
}

// Drawing.

void NetworkWindow::DrawContents() {
    SetLeftTitle(_factory->GetString(46));
    SetLeftFooter(LEFT_FOOTER);
    Update();
}

void NetworkWindow::Update() {
    if (_items.empty()) {
        for (int id : ENTRY_TEXT) _items.push_back(new LabelItem(_factory->GetString(id)));
        _adaptersItem = _items[ADAPTERS];
        _vlanItem = _items[VLAN];
        _adaptersItem->SetEnabled(_switchEditable);
        _vlanItem->SetEnabled(_switchEditable);
        _menu->SetItems(std::vector<Item*>(_items.begin(), _items.end()));
    }
    _menu->Draw();
    DrawDescription();
}

void NetworkWindow::DrawDescription() {
    const int entry = _menu->GetCurrentIndex();
    if (entry < 0) return;
    SetRightTitle(_factory->GetString(ENTRY_TEXT[entry]));
    _description->SetText(Description(entry));
    SetRightFooter(RIGHT_FOOTER);
    Refresh();
}

std::string NetworkWindow::Value(const std::string& text) const {
    return "{color:white}" + TextArea::Escape(text) + "{/color}";
}

std::string NetworkWindow::Labelled(int labelId, const std::string& value) const {
    return std::string(_factory->GetString(labelId)) + ": " + Value(value) + "\n";
}

std::string NetworkWindow::Description(int entry) const {
    const std::string notSet = _factory->GetString(120);
    switch (entry) {
        case ADAPTERS:
            return AdaptersDescription() + "\n" + _factory->GetString(56);
        case VLAN:
            return Value(_vlanId == 0 ? notSet : std::to_string(_vlanId)) + "\n\n" + _factory->GetString(58);
        case IPV4:
            return Ipv4Description() + "\n" + _factory->GetString(59);
        case IPV6:
            return Ipv6Description() + "\n" + _factory->GetString(60);
        case DNS:
            return DnsDescription() + "\n" + _factory->GetString(63);
        case SUFFIXES:
            return Value(_suffixLine) + "\n\n" + _factory->GetString(64);
        default:
            return "";
    }
}

std::string NetworkWindow::AdaptersDescription() const {
    if (_adapters.empty()) return Value(_factory->GetString(115)) + "\n";
    std::string text;
    for (const std::string& name : _adapters) {
        std::string detail;
        for (const Adapter& nic : _nics)
            if (nic.name == name) detail = nic.label.empty() ? nic.mac : nic.label;
        text += Value(name + " (" + detail + ")") + "\n";
    }
    return text;
}

std::string NetworkWindow::Ipv4Description() const {
    const int mode = _ipConfig.GetUseDhcp() ? 116 : _ipConfig.GetIpv4UseNone() ? 117 : 118;
    auto shown = [&](const Ipv4Address& address) {
        return address.IsZero() ? std::string(_factory->GetString(120)) : address.GetStringAddress();
    };
    return Value(_factory->GetString(mode)) + "\n\n" + Labelled(37, shown(_ipConfig.GetIpv4Address())) +
           Labelled(41, shown(_ipConfig.GetIpv4Netmask())) + Labelled(40, shown(_gateway));
}

std::string NetworkWindow::Ipv6Description() const {
    std::string text = Value(_factory->GetString(ipv6Enabled ? 52 : 53)) + "\n";
    if (ipv6Enabled && !ipv6EnabledAtStart) text += std::string("\n") + _factory->GetString(62) + "\n";
    if (!ipv6EnabledAtStart) return text + "\n" + _factory->GetString(61) + "\n";

    const bool dynamic = _ipConfig.GetUseIpv6Dhcp() || _ipConfig.GetUseIpv6RouterAdvertised();
    text += "\n" + Value(_factory->GetString(dynamic ? 116 : 118)) + "\n\n";
    text += std::string(_factory->GetString(38)) + ":\n";
    if (_ipConfig.GetIpv6Network().empty()) text += "  " + Value(_factory->GetString(120)) + "\n";
    for (const Ipv6Network& network : _ipConfig.GetIpv6Network())
        text += "  " + Value(network.ToString()) + "\n";
    return text + Labelled(40, _ipv6Gateway.IsZero() ? _factory->GetString(120) : ScopedIpv6Gateway());
}

std::string NetworkWindow::DnsDescription() const {
    std::string text = Value(_factory->GetString(_ipConfig.GetDhcpDns() ? 116 : 118)) + "\n\n";
    for (size_t i = 0; i < 2; ++i) {
        const bool present = i < _dnsServers.size();
        const int label = present && _dnsServers[i].IsIpv6() ? 45 : i == 0 ? 43 : 44;
        text += Labelled(label, present ? _dnsServers[i].GetStringAddress() : _factory->GetString(120));
    }
    return text + Labelled(42, _hostname);
}

// Keys.

int NetworkWindow::Run() {
    if (!ReadConfiguration()) return false;
    Draw();
    return RunMenu([this] { DrawDescription(); },
                   [this](int entry) {
                       OpenEntry(entry);
                       Draw();
                   },
                   [this] {
                       if (Leave()) return true;
                       Draw();
                       return false;
                   });
}

void NetworkWindow::OpenEntry(int entry) {
    switch (entry) {
        case ADAPTERS:
            if (_switchEditable) EditAdapters();
            break;
        case VLAN:
            if (_switchEditable) EditVlan();
            break;
        case IPV4:
            EditIpv4();
            break;
        case IPV6:
            EditIpv6();
            break;
        case DNS:
            EditDns();
            break;
        case SUFFIXES:
            EditSuffixes();
            break;
        default:
            break;
    }
}

void NetworkWindow::EditAdapters() {
    AdaptersDialog dialog(this, _adapters, _port.switchName);
    if (!dialog.Execute()) return;
    _nics = dialog.GetAdapters();
    if (dialog.GetAdapterList() == _adapters) return;
    _adapters = dialog.GetAdapterList();
    changed = true;
}

void NetworkWindow::EditVlan() {
    VlanDialog dialog(this, _vlanId);
    if (!dialog.Execute() || dialog.GetVlanId() == _vlanId) return;
    _vlanId = dialog.GetVlanId();
    changed = true;
}

void NetworkWindow::EditIpv4() {
    IPConfigurationDialog dialog(this, _ipConfig.GetIpv4UseNone(), _ipConfig.GetUseDhcp(), _ipConfig,
                                 _gateway);
    if (!dialog.Execute()) return;
    const HostCtl::Network::IpConfig& result = dialog.GetIpConfig();
    if (result.GetUseDhcp() != _ipConfig.GetUseDhcp() ||
        result.GetIpv4UseNone() != _ipConfig.GetIpv4UseNone()) {
        _ipConfig.SetUseDhcp(result.GetUseDhcp(), result.GetIpv4UseNone());
        changed = true;
    }
    if (!(result.GetIpv4Address() == _ipConfig.GetIpv4Address())) {
        _ipConfig.SetIpv4Address(result.GetIpv4Address());
        changed = true;
    }
    if (!(result.GetIpv4Netmask() == _ipConfig.GetIpv4Netmask())) {
        _ipConfig.SetIpv4Netmask(result.GetIpv4Netmask());
        changed = true;
    }
    if (!(dialog.GetGateway() == _gateway)) {
        _gateway = dialog.GetGateway();
        changed = true;
    }
}

void NetworkWindow::EditIpv6() {
    IPv6ConfigurationDialog dialog(this, ipv6Enabled, _ipConfig, _ipv6Gateway);
    if (!dialog.Execute()) return;
    // A change of IPv6 itself is told apart from the others: on its own,
    // turned back to how it was, it asks nothing.
    ipv6Enabled = dialog.IsIpv6Enabled();
    const HostCtl::Network::IpConfig& result = dialog.GetIpConfig();
    if (result.GetUseIpv6Dhcp() != _ipConfig.GetUseIpv6Dhcp()) {
        _ipConfig.SetUseIpv6Dhcp(result.GetUseIpv6Dhcp());
        changed = true;
    }
    if (result.GetUseIpv6RouterAdvertised() != _ipConfig.GetUseIpv6RouterAdvertised()) {
        _ipConfig.SetUseIpv6RouterAdvertised(result.GetUseIpv6RouterAdvertised());
        changed = true;
    }
    if (result.GetIpv6Network() != _ipConfig.GetIpv6Network()) {
        // Only typed addresses count as a change; the dynamic ones the dialog
        // dropped from the list the interface obtains by itself.
        if (StaticAddresses(result) != StaticAddresses(_ipConfig)) changed = true;
        _ipConfig.SetIpv6Network(result.GetIpv6Network());
    }
    if (!(dialog.GetGateway() == _ipv6Gateway)) {
        _ipv6Gateway = dialog.GetGateway();
        changed = true;
    }
}

void NetworkWindow::EditDns() {
    DNSConfigurationDialog dialog(this, _ipConfig.GetDhcpDns(), DhcpInUse(), _dnsServers, _hostname);
    if (!dialog.Execute()) return;
    if (dialog.IsDnsAutomatic() != _ipConfig.GetDhcpDns()) {
        _ipConfig.SetDhcpDns(dialog.IsDnsAutomatic());
        changed = true;
    }
    if (dialog.GetServers() != _dnsServers) {
        _dnsServers = dialog.GetServers();
        changed = true;
    }
    if (dialog.GetHostname() != _hostname) {
        _hostname = dialog.GetHostname();
        changed = true;
    }
}

void NetworkWindow::EditSuffixes() {
    SuffixesDialog dialog(this, _suffixLine);
    if (!dialog.Execute()) return;
    const std::vector<std::string> suffixes = SplitSuffixes(dialog.GetSuffixLine());
    if (suffixes == _suffixes) return;
    _suffixes = suffixes;
    _suffixLine = JoinSuffixes(_suffixes);
    changed = true;
}

bool NetworkWindow::Leave() {
    const bool reboot = ipv6Enabled != ipv6EnabledAtStart;
    if (!changed && !reboot) return true;
    ApplyChangesDialog question(this, reboot);
    if (!question.Execute()) return false;  // Esc: back to the menu, every edit kept
    if (!question.apply) return true;
    // Refused before anything was written: back to the menu, every edit kept.
    if (!Apply()) {
        _statusLine->Erase();
        return false;
    }
    Syslog(LOG_INFO, "Network settings changed.");
    _statusLine->Erase();
    _statusLine->Refresh();
    return true;
}

// Actions: the apply sequence. Each step catches its own failure, so that
// one refused value does not keep the others from the host.

void NetworkWindow::Step(const char* format, ...) {
    char line[512];
    va_list args;
    va_start(args, format);
    vsnprintf(line, sizeof line, format, args);
    va_end(args);
    Syslog(LOG_INFO, "%s", line);
    // The same line on the status row, sent at once: the host may take a
    // while with the step.
    _statusLine->Erase();
    _statusLine->Print(1, 0, CutToColumns(line, std::max(0, COLS - 2)));
    _statusLine->Refresh();
    Window::Flush();
}

void NetworkWindow::Fail(const std::string& line) {
    Syslog(LOG_ERR, "%s", line.c_str());
    MessageDialog(this, 18, line).Execute();
}

bool NetworkWindow::DhcpInUse() const {
    return _ipConfig.GetUseDhcp() || (ipv6Enabled && _ipConfig.GetUseIpv6Dhcp());
}

std::string NetworkWindow::ScopedIpv6Gateway() const {
    const std::string text = _ipv6Gateway.GetStringAddress();
    return _ipv6Gateway.IsLinkLocal() ? text + "%" + _mgmtIntf->GetName() : text;
}

// A new static IPv4 address is one the interface did not have as a static
// address when the window was entered.
bool NetworkWindow::NewStaticIpv4Address() const {
    if (_ipConfig.GetUseDhcp() || _ipConfig.GetIpv4UseNone()) return false;
    const bool staticAtStart = !_ipConfigAtStart.GetUseDhcp() && !_ipConfigAtStart.GetIpv4UseNone();
    return !staticAtStart || !(_ipConfig.GetIpv4Address() == _ipConfigAtStart.GetIpv4Address());
}

bool NetworkWindow::Apply() {
    if (NewStaticIpv4Address()) {
        Step("Probing for %s on %s", _ipConfig.GetIpv4Address().GetStringAddress().c_str(),
             _mgmtIntf->GetName().c_str());
        if (!NetworkTrial::AddressFree(this, _ipConfig.GetIpv4Address())) return false;
    }
    // The configuration as it is goes aside first: a change that fails its
    // checks, or a console that ends before it is decided, gets it back.
    NetworkTrial trial(this);
    if (!trial.Begin()) return false;

    // The steps reach the host as one change: a host may apply them together.
    QelCtl::Network::NetworkInfoImpl networkInfo;
    try {
        networkInfo.BeginChange();
    } catch (const HostCtlException& e) {
        Fail(std::string("Applying network configuration failed: ") + e.what());
    }
    ApplyAdapters();
    const bool vlanChanged = ApplyVlan();
    ApplyIpConfiguration();
    ApplyGateways();
    ApplyRenewal(vlanChanged);
    ApplyDns();
    try {
        networkInfo.CommitChange();
    } catch (const HostCtlException& e) {
        Fail(std::string("Applying network configuration failed: ") + e.what());
    }
    Step("Checking the management network");
    PostStatus(trial.Decide(trial.Check()));
    if (ipv6Enabled != ipv6EnabledAtStart) {
        RebootConfirmDialog reboot(this, true);
        reboot.Execute();
    }
    RefreshHostAgent();
    return true;
}

void NetworkWindow::ApplyAdapters() {
    if (!_switchEditable || _adapters == _adaptersAtStart) return;
    std::string names;
    for (const std::string& name : _adapters) names += " " + name;
    Step("Setting adapters to%s", names.c_str());
    WriteTeam(_port, *_mgmtIntf, _adapters, [this](const std::string& line) { Fail(line); });
}

// True when the port group's VLAN was changed.
bool NetworkWindow::ApplyVlan() {
    if (!_switchEditable) return false;
    HostCtl::Network::VirtualSwitch vswitch(_port.switchName);
    uint16_t present = _vlanIdAtStart;
    try {
        present = vswitch.GetPortGroupVlanId(_port.portGroup);
    } catch (const HostCtlException& e) {
        Fail(std::string("Getting VlanID failed: ") + e.what());
    }
    if (present == _vlanId) return false;
    try {
        Step("Setting VlanID to %u", unsigned(_vlanId));
        vswitch.SetPortGroupVlanId(_port.portGroup, _vlanId);
        return true;
    } catch (const HostCtlException& e) {
        Fail(std::string("Setting VlanID failed: ") + e.what());
        return false;
    }
}

void NetworkWindow::ApplyIpConfiguration() {
    const std::string& name = _mgmtIntf->GetName();
    HostCtl::Network::IpConfig config = _ipConfig;
    try {
        if (_ipConfig.GetIpv4UseNone()) {
            Step("Setting ipv4 configuration to none on %s", name.c_str());
            config.SetUseDhcp(false, true);
        } else if (!_ipConfig.GetUseDhcp()) {
            Step("Setting ipv4 configuration to %s/%s on %s",
                 _ipConfig.GetIpv4Address().GetStringAddress().c_str(),
                 _ipConfig.GetIpv4Netmask().GetStringAddress().c_str(), name.c_str());
            config.SetUseDhcp(false, false, _ipConfig.GetIpv4Address(), _ipConfig.GetIpv4Netmask());
        } else {
            Step("Switching to DHCP on %s", name.c_str());
            config.SetUseDhcp(true);
        }
    } catch (const HostCtlException& e) {
        Fail(std::string("Setting ip configuration failed: ") + e.what());
        config = _ipConfigAtStart;
    }

    try {
        QelCtl::Network::NetworkInfoImpl().SetQelIpv6Enabled(ipv6Enabled);
        if (ipv6Enabled) {
            Step("Setting ipv6 configuration");
            config.SetUseIpv6Dhcp(_ipConfig.GetUseIpv6Dhcp());
            config.SetUseIpv6RouterAdvertised(_ipConfig.GetUseIpv6RouterAdvertised());
            config.SetIpv6Network(StaticAddresses(_ipConfig));
        }
    } catch (const HostCtlException& e) {
        Fail(std::string("Setting ipv6 configuration failed: ") + e.what());
    }

    try {
        config.SetDhcpDns(_ipConfig.GetDhcpDns() && DhcpInUse());
        _mgmtIntf->SetIpConfig(config);
        Draw();
    } catch (const HostCtlException& e) {
        Fail(std::string("Setting ip/ipv6 configuration failed: ") + e.what());
    }
}

void NetworkWindow::ApplyGateways() {
    if (!(_gateway == _gatewayAtStart)) {
        try {
            Step("Setting default gateway to %s", _gateway.GetStringAddress().c_str());
            _routingInfo.SetQelKernelDefaultGateway(_gateway, false);
        } catch (const HostCtlException& e) {
            Fail(std::string("Setting default gateway failed: ") + e.what());
        }
    }
    if (ipv6Enabled && !(_ipv6Gateway == _ipv6GatewayAtStart)) {
        try {
            Step("Setting default ipv6 gateway to %s", ScopedIpv6Gateway().c_str());
            _routingInfo.SetIpv6QelKernelDefaultGateway(_ipv6Gateway);
        } catch (const HostCtlException& e) {
            Fail(std::string("Setting default ipv6 gateway failed: ") + e.what());
        }
    }
}

void NetworkWindow::ApplyRenewal(bool vlanChanged) {
    const std::string& name = _mgmtIntf->GetName();
    if (DhcpInUse()) {
        Step("Renew DHCP lease on %s", name.c_str());
        try {
            _mgmtIntf->RenewDhcpLease();
        } catch (const HostCtlException& e) {
            Fail(std::string("Renewing DHCP lease failed: ") + e.what());
        }
    }
    if (vlanChanged) {
        Step("Changed vlan, restarting management interface");
        try {
            _mgmtIntf->Restart();
        } catch (const HostCtlException& e) {
            Fail(std::string("Restarting management interface failed: ") + e.what());
        }
    }
}

std::string NetworkWindow::JoinServers(const std::vector<IpAddress>& servers) {
    std::string list;
    for (const IpAddress& server : servers) list += (list.empty() ? "" : " ") + server.GetStringAddress();
    return list;
}

// The host's servers are read before they are removed, and put back when a
// new one is refused: the host is never left without its name servers.
void NetworkWindow::ApplyNameServers() {
    Step("Setting nameservers to %s", JoinServers(_dnsServers).c_str());
    std::vector<IpAddress> present;
    try {
        for (const auto& server : _dnsConfig.GetNameServers())
            present.emplace_back(server.GetStringAddress());
        for (const auto& server : _dnsConfig.GetIpv6NameServers())
            present.emplace_back(server.GetStringAddress());
        _dnsConfig.RemoveNameServers();
    } catch (const HostCtlException& e) {
        Fail(std::string("Setting DNS failed: ") + e.what());
        return;
    }
    try {
        for (size_t i = 0; i < _dnsServers.size() && i < 2; ++i) _dnsConfig.AddNameServer(_dnsServers[i]);
    } catch (const HostCtlException& e) {
        Fail(std::string("Setting DNS failed: ") + e.what());
        Step("Putting back nameservers %s", JoinServers(present).c_str());
        try {
            _dnsConfig.RemoveNameServers();
            for (const IpAddress& server : present) _dnsConfig.AddNameServer(server);
        } catch (const HostCtlException& again) {
            Fail(std::string("Putting back nameservers failed: ") + again.what());
        }
    }
}

void NetworkWindow::ApplyDns() {
    try {
        Step("Setting hostname to %s", _hostname.c_str());
        if (_hostname.find('.') != std::string::npos)
            _dnsConfig.SetFqdn(_hostname, false);
        else
            _dnsConfig.SetHostname(_hostname, false);
    } catch (const HostCtlException& e) {
        Fail(std::string("Setting DNS failed: ") + e.what());
    }

    // Servers from DHCP arrived with the lease; those read at the start must
    // not replace them.
    if (!(_ipConfig.GetDhcpDns() && DhcpInUse())) ApplyNameServers();

    try {
        Step("Setting suffixes to %s", _suffixLine.c_str());
        // Without suffixes the host searches its own domain.
        const std::string domain = _dnsConfig.GetDomain();
        _dnsConfig.SetSearchDomainsString(_suffixes.empty() ? domain : _suffixLine);
    } catch (const HostCtlException& e) {
        Fail(std::string("Setting DNS failed: ") + e.what());
    }
    try {
        _dnsConfig.SaveConfig();
    } catch (const HostCtlException& e) {
        Fail(std::string("Setting DNS failed: ") + e.what());
    }
}

}  // namespace Velk
