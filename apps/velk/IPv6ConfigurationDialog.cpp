#include "IPv6ConfigurationDialog.hpp"

#include <cctype>

#include "MessageDialog.hpp"
#include "StringFactory.hpp"

namespace Velk {

using HostCtl::Network::Ipv6Address;
using HostCtl::Network::Ipv6AddressType;
using HostCtl::Network::Ipv6Network;

namespace {

// The check row sits under the text of the dynamic choice's radio row.
constexpr int kCheckIndent = 4;

bool IsStatic(const IPv6ConfigurationDialog::Mode& mode) {
    return mode.enabled && !mode.dhcp && !mode.routerAdvertised;
}

bool IsDynamic(const IPv6ConfigurationDialog::Mode& mode) {
    return mode.enabled && (mode.dhcp || mode.routerAdvertised);
}

}  // namespace

IPv6ConfigurationDialog::IPv6ConfigurationDialog(Frame* parent, bool ipv6Enabled,
                                                 const HostCtl::Network::IpConfig& ipConfig,
                                                 const Ipv6Address& gateway)
    : Dialog(parent, 78, 20, 8), _ipv6Enabled(ipv6Enabled), _ipConfig(ipConfig), _gateway(gateway) {
    _disable = new RadioItem(_factory->GetString(108), false);
    _dynamic = new RadioItem(_factory->GetString(109), false);
    _dhcp = new CheckItem(_factory->GetString(110), false, kCheckIndent);
    _static = new RadioItem(_factory->GetString(111), false);

    // The static rows show the present static entries. Link-local ones are
    // left out: they cannot be typed and are kept anyway.
    std::vector<std::string> present;
    for (const Ipv6Network& network : ipConfig.GetIpv6Network()) {
        if (network.GetIpv6AddressType() == Ipv6AddressType::Static && !network.GetAddress().IsLinkLocal())
            present.push_back(network.ToString());
    }
    for (int i = 0; i < kAddressRows; ++i) {
        const size_t index = static_cast<size_t>(i);
        _addresses[i] = new InputItem(_factory->GetString(112), index < present.size() ? present[index] : "");
    }
    _gatewayField =
        new InputItem(_factory->GetString(113), gateway.IsZero() ? "" : gateway.GetStringAddress());

    ShowMode();
    _list = NewContentList(
        {_disable, _dynamic, _dhcp, _static, _addresses[0], _addresses[1], _addresses[2], _gatewayField});
}

IPv6ConfigurationDialog::~IPv6ConfigurationDialog() {
    SetCursor(false);
    delete _list;
    delete _disable;
    delete _dynamic;
    delete _dhcp;
    delete _static;
    for (InputItem* address : _addresses) delete address;
    delete _gatewayField;
}

IPv6ConfigurationDialog::Mode IPv6ConfigurationDialog::GetMode() const {
    return {_ipv6Enabled, _ipConfig.GetUseIpv6Dhcp(), _ipConfig.GetUseIpv6RouterAdvertised()};
}

void IPv6ConfigurationDialog::ShowMode() {
    const Mode mode = GetMode();
    _disable->SetSelected(!mode.enabled);
    _dynamic->SetSelected(IsDynamic(mode));
    _static->SetSelected(IsStatic(mode));
    _dhcp->SetChecked(mode.dhcp);
    _dhcp->SetEnabled(IsDynamic(mode));
    for (InputItem* address : _addresses) address->SetEnabled(IsStatic(mode));
    _gatewayField->SetEnabled(IsStatic(mode));
}

InputItem* IPv6ConfigurationDialog::FieldAt(int row) const {
    return row == GATEWAY_ROW ? _gatewayField : _addresses[row - FIRST_ADDRESS_ROW];
}

void IPv6ConfigurationDialog::Draw() {
    SetTitle(_factory->GetString(106));
    SetDescription(_factory->GetString(107));
    SetFooter(MARK_LIST_FOOTER);
    Refresh();
    _list->Draw();
}

int IPv6ConfigurationDialog::Run() {
    return RunForm(
        [this] { Draw(); }, [this] { return Accept(); },
        [this](int key) {
            const int row = _list->GetCurrentIndex();
            switch (key) {
                case ' ': {
                    const Mode mode = Mark(GetMode(), row);
                    _ipv6Enabled = mode.enabled;
                    _ipConfig.SetUseIpv6Dhcp(mode.dhcp);
                    _ipConfig.SetUseIpv6RouterAdvertised(mode.routerAdvertised);
                    ShowMode();
                    _list->Draw();
                    break;
                }
                case KEY_DOWN:
                    _list->Down();
                    if (_list->GetCurrentIndex() >= FIRST_ADDRESS_ROW) SetCursor(true);
                    break;
                case KEY_UP:
                    _list->Up();
                    if (_list->GetCurrentIndex() < FIRST_ADDRESS_ROW) SetCursor(false);
                    break;
                default:
                    if (row >= FIRST_ADDRESS_ROW && IsFieldKey(key) && FieldAt(row)->HandleKey(key))
                        _list->Draw();
                    break;
            }
        });
}

bool IPv6ConfigurationDialog::Accept() {
    const Mode mode = GetMode();
    // IPv6 off changes nothing but the switch; the addresses stay for when
    // it is turned on again.
    if (!mode.enabled) return true;
    if (IsDynamic(mode)) {
        // The static rows are greyed and not read.
        _ipConfig.SetIpv6Network(
            MergeAddresses(_ipConfig.GetIpv6Network(), mode.dhcp, mode.routerAdvertised, {}));
        return true;
    }
    std::array<std::string, kAddressRows> texts;
    for (int i = 0; i < kAddressRows; ++i) texts[static_cast<size_t>(i)] = _addresses[i]->GetText();
    const std::string& gateway = _gatewayField->GetText();
    if (const auto rejection = CheckStatic(texts, gateway)) {
        Reject(*rejection);
        return false;
    }
    std::vector<Ipv6Network> typed;
    for (const std::string& text : texts)
        if (!text.empty()) typed.emplace_back(text);
    _ipConfig.SetIpv6Network(MergeAddresses(_ipConfig.GetIpv6Network(), false, false, typed));
    _gateway = gateway.empty() ? Ipv6Address() : Ipv6Address(gateway);
    return true;
}

void IPv6ConfigurationDialog::Reject(const Rejection& rejection) {
    InputItem* field = FieldAt(rejection.row);
    field->SetText(std::string(field->GetText()));
    _list->SetCurrent(rejection.row);
    SetCursor(true);
    _list->Draw();
    MessageDialog error(this, rejection.titleId, rejection.messageId);
    error.Execute();
}

IPv6ConfigurationDialog::Mode IPv6ConfigurationDialog::Mark(Mode mode, int row) {
    switch (row) {
        case DISABLE_ROW:
            mode.enabled = false;
            break;
        case DYNAMIC_ROW:
            // The DHCPv6 row keeps its mark across the other choices.
            mode = {true, mode.dhcp, !mode.dhcp};
            break;
        case DHCP_ROW:
            mode = {mode.enabled, !mode.dhcp, mode.dhcp};
            break;
        case STATIC_ROW:
            mode = {true, false, false};
            break;
        default:
            break;
    }
    return mode;
}

std::optional<IPv6ConfigurationDialog::Rejection> IPv6ConfigurationDialog::CheckStatic(
    const std::array<std::string, kAddressRows>& addresses, const std::string& gateway) {
    for (int i = 0; i < kAddressRows; ++i) {
        const std::string& text = addresses[static_cast<size_t>(i)];
        if (text.empty()) continue;
        if (!Ipv6Network::IsValidAddressAndNetmask(text)) return Rejection{FIRST_ADDRESS_ROW + i, 82, 84};
        if (Ipv6Network(text).GetAddress().IsLinkLocal()) return Rejection{FIRST_ADDRESS_ROW + i, 88, 89};
    }
    // Only the form of the gateway is checked; a link-local one passes.
    if (!gateway.empty() && !Ipv6Address::IsValidAddress(gateway)) return Rejection{GATEWAY_ROW, 90, 92};
    return std::nullopt;
}

std::vector<Ipv6Network> IPv6ConfigurationDialog::MergeAddresses(const std::vector<Ipv6Network>& present,
                                                                 bool dhcp, bool routerAdvertised,
                                                                 const std::vector<Ipv6Network>& typed) {
    std::vector<Ipv6Network> result;
    for (const Ipv6Network& network : present) {
        bool keep = false;
        if (network.GetAddress().IsLinkLocal()) {
            keep = true;
        } else {
            switch (network.GetIpv6AddressType()) {
                case Ipv6AddressType::Autoconf:
                    keep = routerAdvertised;
                    break;
                case Ipv6AddressType::Dhcp:
                    keep = dhcp;
                    break;
                case Ipv6AddressType::Static:
                    // The dynamic choice adds to the static addresses; the
                    // static choice replaces them by the typed ones.
                    keep = dhcp || routerAdvertised;
                    break;
            }
        }
        if (keep) result.push_back(network);
    }
    for (const Ipv6Network& network : typed)
        result.emplace_back(network.GetAddress(), network.GetPrefixLength(), Ipv6AddressType::Static);
    return result;
}

bool IPv6ConfigurationDialog::IsFieldKey(int key) {
    return (key >= 0 && key <= 255 && std::isalnum(key)) || key == ':' || key == '%' || key == '/' ||
           InputItem::IsEditingKey(key);
}

}  // namespace Velk
