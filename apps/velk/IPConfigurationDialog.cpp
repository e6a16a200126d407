#include "IPConfigurationDialog.hpp"

#include "MessageDialog.hpp"
#include "StringFactory.hpp"

namespace Velk {

using HostCtl::Network::Ipv4Address;

namespace {

constexpr int kFieldLength = 16;

}  // namespace

IPConfigurationDialog::IPConfigurationDialog(Frame* parent, bool ipv4Off, bool ipv4Dhcp,
                                             const HostCtl::Network::IpConfig& ipConfig,
                                             const Ipv4Address& gateway)
    : Dialog(parent, 78, 19, 7),
      _ipConfig(ipConfig),
      _gateway(gateway),
      _ipv4Off(ipv4Off),
      _ipv4Dhcp(ipv4Dhcp && !ipv4Off),
      _ipv4Static(!ipv4Off && !ipv4Dhcp),
      _offAtStart(_ipv4Off),
      _dhcpAtStart(_ipv4Dhcp) {
    const int choiceLabels[kChoices] = {103, 104, 105};
    const bool marked[kChoices] = {_ipv4Off, _ipv4Dhcp, _ipv4Static};
    for (int i = 0; i < kChoices; ++i)
        _choices[i] = new RadioItem(_factory->GetString(choiceLabels[i]), marked[i]);

    const int fieldLabels[kFields] = {37, 41, 40};
    const std::string values[kFields] = {ipConfig.GetIpv4Address().GetStringAddress(),
                                         ipConfig.GetIpv4Netmask().GetStringAddress(),
                                         gateway.GetStringAddress()};
    for (int i = 0; i < kFields; ++i) {
        _fields[i] = new InputItem(_factory->GetString(fieldLabels[i]), values[i], kFieldLength);
        _fields[i]->SetMaxLength(kFieldLength);
        _fields[i]->SetEnabled(_ipv4Static);
    }
    _list = NewContentList({_choices[0], _choices[1], _choices[2], _fields[0], _fields[1], _fields[2]});
}

IPConfigurationDialog::~IPConfigurationDialog() {
    SetCursor(false);
    delete _list;
    for (RadioItem* choice : _choices) delete choice;
    for (InputItem* field : _fields) delete field;
}

void IPConfigurationDialog::Draw() {
    SetTitle(_factory->GetString(101));
    SetDescription(_factory->GetString(102));
    SetFooter(MARK_LIST_FOOTER);
    Refresh();
    _list->Draw();
}

int IPConfigurationDialog::Run() {
    return RunForm(
        [this] { Draw(); }, [this] { return Accept(); },
        [this](int key) {
            // The row before the key: the text cursor follows it,
            // not the row the selection lands on.
            const int row = _list->GetCurrentIndex();
            switch (key) {
                case ' ':
                    if (row >= OFF_ROW && row <= STATIC_ROW) Mark(row);
                    _list->Draw();
                    break;
                case KEY_DOWN:
                    _list->Down();
                    if (row >= ADDRESS_ROW) SetCursor(true);
                    break;
                case KEY_UP:
                    _list->Up();
                    if (row <= STATIC_ROW) SetCursor(false);
                    break;
                default:
                    if (row >= ADDRESS_ROW && IsFieldKey(key) && _fields[row - ADDRESS_ROW]->HandleKey(key))
                        _list->Draw();
                    break;
            }
        });
}

void IPConfigurationDialog::Mark(int row) {
    _ipv4Off = row == OFF_ROW;
    _ipv4Dhcp = row == DHCP_ROW;
    _ipv4Static = row == STATIC_ROW;
    _choices[OFF_ROW]->SetSelected(_ipv4Off);
    _choices[DHCP_ROW]->SetSelected(_ipv4Dhcp);
    _choices[STATIC_ROW]->SetSelected(_ipv4Static);
    for (InputItem* field : _fields) field->SetEnabled(_ipv4Static);
}

bool IPConfigurationDialog::Accept() {
    if (!_ipv4Static) {
        // Off or DHCP: whatever the greyed rows hold is dropped, and so is
        // the stored gateway when the choice changed (a lease brings its own).
        _ipConfig.SetUseDhcp(_ipv4Dhcp);
        if (_ipv4Off) _ipConfig.SetIpv4UseNone();
        if (_ipv4Off != _offAtStart || _ipv4Dhcp != _dhcpAtStart) _gateway = Ipv4Address();
        return true;
    }
    const std::string& address = _fields[ADDRESS_ROW - ADDRESS_ROW]->GetText();
    const std::string& netmask = _fields[NETMASK_ROW - ADDRESS_ROW]->GetText();
    const std::string& gateway = _fields[GATEWAY_ROW - ADDRESS_ROW]->GetText();
    if (const auto rejection = CheckStatic(address, netmask, gateway)) {
        Reject(*rejection);
        return false;
    }
    _ipConfig.SetUseDhcp(false);
    _ipConfig.SetIpv4Address(Ipv4Address(address));
    _ipConfig.SetIpv4Netmask(Ipv4Address(netmask));
    _gateway = Ipv4Address(gateway);
    return true;
}

void IPConfigurationDialog::Reject(const Rejection& rejection) {
    InputItem* field = _fields[rejection.row - ADDRESS_ROW];
    field->SetText(std::string(field->GetText()));
    _list->SetCurrent(rejection.row);
    SetCursor(true);
    _list->Draw();
    MessageDialog error(this, rejection.titleId, rejection.messageId);
    error.Execute();
}

std::optional<IPConfigurationDialog::Rejection> IPConfigurationDialog::CheckStatic(
    const std::string& address, const std::string& netmask, const std::string& gateway) {
    if (!Ipv4Address::IsValidAddress(address)) return Rejection{ADDRESS_ROW, 82, 83};
    if (!Ipv4Address::IsValidAddress(netmask) || !Ipv4Address(netmask).IsValidNetmask())
        return Rejection{NETMASK_ROW, 86, 87};
    // The gateway is not required to lie in the address's subnet.
    if (!Ipv4Address::IsValidAddress(gateway)) return Rejection{GATEWAY_ROW, 90, 91};
    return std::nullopt;
}

bool IPConfigurationDialog::IsFieldKey(int key) {
    return (key >= '0' && key <= '9') || key == '.' || InputItem::IsEditingKey(key);
}

}  // namespace Velk
