#include "DNSConfigurationDialog.hpp"

#include <cctype>

#include "MessageDialog.hpp"
#include "StringFactory.hpp"

namespace Velk {

using HostCtl::Network::IpAddress;
using HostCtl::Network::Ipv4Address;
using HostCtl::Network::Ipv6Address;

namespace {

bool IsServer(const std::string& text) {
    return Ipv6Address::IsValidAddress(text) || Ipv4Address::IsValidAddress(text);
}

bool IsByte(int key) { return key >= 0 && key <= 255; }

}  // namespace

DNSConfigurationDialog::DNSConfigurationDialog(Frame* parent, bool dnsAutomatic, bool dhcpAvailable,
                                               const std::vector<IpAddress>& servers,
                                               const std::string& hostname)
    : Dialog(parent, 78, 16, 6),
      dnsAutomatic(dnsAutomatic && dhcpAvailable),
      _servers(servers),
      _hostname(hostname) {
    _automatic = new RadioItem(_factory->GetString(126), this->dnsAutomatic);
    _automatic->SetEnabled(dhcpAvailable);
    _manual = new RadioItem(_factory->GetString(127), !this->dnsAutomatic);

    const int labels[kFields] = {43, 44, 42};
    const std::string values[kFields] = {servers.size() > 0 ? servers[0].GetStringAddress() : "",
                                         servers.size() > 1 ? servers[1].GetStringAddress() : "", hostname};
    for (int i = 0; i < kFields; ++i) {
        _fields[i] = new InputItem(_factory->GetString(labels[i]), values[i]);
        _fields[i]->SetEnabled(!this->dnsAutomatic);
    }
    _list = NewContentList({_automatic, _manual, _fields[0], _fields[1], _fields[2]});
}

DNSConfigurationDialog::~DNSConfigurationDialog() {
    SetCursor(false);
    delete _list;
    delete _automatic;
    delete _manual;
    for (InputItem* field : _fields) delete field;
}

void DNSConfigurationDialog::Draw() {
    SetTitle(_factory->GetString(124));
    SetDescription(_factory->GetString(125));
    SetFooter(MARK_LIST_FOOTER);
    Refresh();
    _list->Draw();
}

void DNSConfigurationDialog::FollowSelection() { SetCursor(_list->GetCurrentIndex() >= PRIMARY_ROW); }

int DNSConfigurationDialog::Run() {
    FollowSelection();
    return RunForm([this] { Draw(); }, [this] { return Accept(); },
                   [this](int key) {
                       const int row = _list->GetCurrentIndex();
                       switch (key) {
                           case ' ':
                               if (row == AUTOMATIC_ROW || row == MANUAL_ROW) Mark(row);
                               _list->Draw();
                               break;
                           case KEY_DOWN:
                               _list->Down();
                               FollowSelection();
                               break;
                           case KEY_UP:
                               _list->Up();
                               FollowSelection();
                               break;
                           default: {
                               if (row < PRIMARY_ROW) break;
                               const bool taken = row == HOSTNAME_ROW ? IsHostnameKey(key) : IsServerKey(key);
                               if (taken && _fields[row - PRIMARY_ROW]->HandleKey(key)) _list->Draw();
                               break;
                           }
                       }
                   });
}

void DNSConfigurationDialog::Mark(int row) {
    dnsAutomatic = row == AUTOMATIC_ROW;
    _automatic->SetSelected(dnsAutomatic);
    _manual->SetSelected(!dnsAutomatic);
    for (InputItem* field : _fields) field->SetEnabled(!dnsAutomatic);
}

bool DNSConfigurationDialog::Accept() {
    // From DHCP: the rows are greyed and neither read nor checked.
    if (dnsAutomatic) return true;
    const std::string& primary = _fields[PRIMARY_ROW - PRIMARY_ROW]->GetText();
    const std::string& alternate = _fields[ALTERNATE_ROW - PRIMARY_ROW]->GetText();
    if (const auto row = CheckServers(primary, alternate)) {
        Reject(*row);
        return false;
    }
    _servers = ServersFromText(primary, alternate);
    // The host name is taken as typed: its key filter is its only check.
    _hostname = _fields[HOSTNAME_ROW - PRIMARY_ROW]->GetText();
    return true;
}

void DNSConfigurationDialog::Reject(int row) {
    InputItem* field = _fields[row - PRIMARY_ROW];
    field->SetText(std::string(field->GetText()));
    _list->SetCurrent(row);
    _list->Draw();
    FollowSelection();
    MessageDialog error(this, 94, 95);
    error.Execute();
}

std::optional<int> DNSConfigurationDialog::CheckServers(const std::string& primary,
                                                        const std::string& alternate) {
    if (!primary.empty() && !IsServer(primary)) return PRIMARY_ROW;
    if (!alternate.empty() && !IsServer(alternate)) return ALTERNATE_ROW;
    return std::nullopt;
}

std::vector<IpAddress> DNSConfigurationDialog::ServersFromText(const std::string& primary,
                                                               const std::string& alternate) {
    std::vector<IpAddress> servers;
    for (const std::string* text : {&primary, &alternate}) {
        // IpAddress tries IPv6 first, then IPv4.
        if (IsServer(*text)) servers.emplace_back(*text);
    }
    return servers;
}

bool DNSConfigurationDialog::IsServerKey(int key) {
    return (IsByte(key) && std::isxdigit(key)) || key == ':' || key == '.' || InputItem::IsEditingKey(key);
}

bool DNSConfigurationDialog::IsHostnameKey(int key) {
    return (IsByte(key) && std::isalnum(key)) || key == '.' || key == '-' || InputItem::IsEditingKey(key);
}

}  // namespace Velk
