#include "TestDialog.hpp"

#include <optional>

#include "MessageDialog.hpp"
#include "RunTestDialog.hpp"
#include "StringFactory.hpp"

namespace Velk {

using HostCtl::Network::IpAddress;
using HostCtl::Network::Ipv4Address;
using HostCtl::Network::Ipv6Address;

TestDialog::TestDialog(Frame* parent)
    : Dialog(parent, 70, 14, 6), _dnsConfig("defaultTcpipStack"), _routingInfo("defaultTcpipStack") {
    // Host errors leave the constructor: the base classes free the windows.
    std::vector<std::string> candidates = {_routingInfo.GetQelKernelDefaultGateway().GetStringAddress()};
    for (const Ipv4Address& server : _dnsConfig.GetNameServers())
        candidates.push_back(server.GetStringAddress());
    if (QelCtl::Network::NetworkInfoImpl().IsQelIpv6Enabled()) {
        candidates.push_back(_routingInfo.GetIpv6QelKernelDefaultGateway().GetStringAddress());
        for (const Ipv6Address& server : _dnsConfig.GetIpv6NameServers())
            candidates.push_back(server.GetStringAddress());
    }
    const std::vector<std::string> targets = DefaultTargets(candidates);
    for (int row = 0; row < kPingRows; ++row) {
        const size_t index = static_cast<size_t>(row);
        _fields.push_back(
            new InputItem(std::string(_factory->GetString(217)) + " #" + std::to_string(row + 1),
                          index < targets.size() ? targets[index] : "", kFieldLength));
    }
    const std::string domain = _dnsConfig.GetDomain();
    _fields.push_back(new InputItem(_factory->GetString(218),
                                    _dnsConfig.GetHostname() + (domain.empty() ? "" : "." + domain),
                                    kFieldLength));
    for (InputItem* field : _fields) field->SetMaxLength(kFieldLength);
    _list = NewContentList(std::vector<Item*>(_fields.begin(), _fields.end()));
}

TestDialog::~TestDialog() {
    SetCursor(false);
    delete _list;
    for (InputItem* field : _fields) delete field;
}

std::vector<std::string> TestDialog::DefaultTargets(const std::vector<std::string>& candidates) {
    std::vector<std::string> targets;
    for (const std::string& candidate : candidates) {
        if (candidate.empty() || candidate == "0.0.0.0" || candidate == "::") continue;
        if (targets.size() == static_cast<size_t>(kPingRows)) break;
        targets.push_back(candidate);
    }
    return targets;
}

int TestDialog::Run() {
    SetTitle(_factory->GetString(215));
    SetDescription(_factory->GetString(216));
    SetFooter(
        "{color:black}<Up/Down>{/color} "
        "{color:dark-grey}Select{/color}{align:right}{color:black}<Enter>{/color} "
        "{color:dark-grey}OK{/color}  {color:black}<Esc>{/color} {color:dark-grey}Cancel{/color}{/align}");
    Refresh();
    SetCursor(true);
    _list->Draw();
    for (;;) {
        const int key = GetKey(true);
        switch (key) {
            case 27:
                SetCursor(false);
                return false;
            case KEY_UP:
                _list->Up();
                break;
            case KEY_DOWN:
                _list->Down();
                break;
            case '\n':
                StartTest();
                SetCursor(true);
                _list->Draw();
                break;
            default:
                if (_fields[static_cast<size_t>(_list->GetCurrentIndex())]->HandleKey(key)) _list->Draw();
                break;
        }
    }
}

// Checks the ping rows; the first that holds no address is selected and
// refused. Otherwise the test runs.
bool TestDialog::StartTest() {
    std::optional<IpAddress> targets[kPingRows];
    for (int row = 0; row < kPingRows; ++row) {
        const std::string& text = _fields[static_cast<size_t>(row)]->GetText();
        if (text.empty()) continue;
        if (!Ipv4Address::IsValidAddress(text) && !Ipv6Address::IsValidAddress(text)) {
            _list->SetCurrent(row);
            _list->Draw();
            MessageDialog(this, 82, 85).Execute();
            return false;
        }
        targets[row].emplace(text);
    }
    SetCursor(false);
    RunTestDialog(this, targets[0], targets[1], targets[2], _fields.back()->GetText()).Execute();
    return true;
}

}  // namespace Velk
