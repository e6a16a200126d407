// "IPv6 Configuration": IPv6 off, dynamic (router advertisement, optionally
// DHCPv6) or static with up to three address/prefix entries and a default
// gateway. Edits copies only.
#pragma once

#include <array>
#include <optional>
#include <string>
#include <vector>

#include "CheckItem.hpp"
#include "Dialog.hpp"
#include "InputItem.hpp"
#include "ItemList.hpp"
#include "RadioItem.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class IPv6ConfigurationDialog : public Dialog {
public:
    IPv6ConfigurationDialog(Frame* parent, bool ipv6Enabled, const HostCtl::Network::IpConfig& ipConfig,
                            const HostCtl::Network::Ipv6Address& gateway);
    ~IPv6ConfigurationDialog() override;

    // true for OK (the copies then hold the result), false for Esc.
    int Run() override;

    bool IsIpv6Enabled() const { return _ipv6Enabled; }
    // The DHCPv6 and router-advertisement switches, and the IPv6 addresses:
    // the static entries as typed, the others kept where the chosen mode
    // still obtains them.
    const HostCtl::Network::IpConfig& GetIpConfig() const { return _ipConfig; }
    // :: when the field was left empty.
    const HostCtl::Network::Ipv6Address& GetGateway() const { return _gateway; }

    // The rows of the dialog, top to bottom.
    enum Row {
        DISABLE_ROW,
        DYNAMIC_ROW,
        DHCP_ROW,
        STATIC_ROW,
        FIRST_ADDRESS_ROW,
        GATEWAY_ROW = 7,
        ROW_COUNT
    };
    static constexpr int kAddressRows = GATEWAY_ROW - FIRST_ADDRESS_ROW;

    // What the radio and check rows show: IPv6 on or off, and the switches
    // of the dynamic choice. Both switches off is the static choice.
    struct Mode {
        bool enabled;
        bool dhcp;
        bool routerAdvertised;
        bool operator==(const Mode&) const = default;
    };
    // The mode after Space on `row`; Space on an input row changes nothing.
    static Mode Mark(Mode mode, int row);

    // A refused entry: the row to select and the error message to show.
    struct Rejection {
        int row;
        int titleId;
        int messageId;
    };
    // The first static entry (empty rows skipped) or gateway that is refused,
    // in row order; none when all are usable.
    static std::optional<Rejection> CheckStatic(const std::array<std::string, kAddressRows>& addresses,
                                                const std::string& gateway);
    // The address list once the dialog ends with OK: link-local addresses
    // are kept, autoconfigured ones while router advertisement is on, DHCPv6
    // ones while DHCPv6 is on; the static entries stay with a dynamic choice
    // (which is only the two switches) and give way to `typed` with the
    // static one.
    static std::vector<HostCtl::Network::Ipv6Network> MergeAddresses(
        const std::vector<HostCtl::Network::Ipv6Network>& present, bool dhcp, bool routerAdvertised,
        const std::vector<HostCtl::Network::Ipv6Network>& typed);
    // The keys the input rows take: letters, digits, ":", "%", "/" and the
    // editing keys.
    static bool IsFieldKey(int key);

private:
    Mode GetMode() const;
    // Marks the radio and check rows after the mode and enables the rows
    // that the mode uses.
    void ShowMode();
    void Draw();
    // The input field of an address or gateway row.
    InputItem* FieldAt(int row) const;
    // Stores the result; false when a static entry is refused.
    bool Accept();
    // Selects the refused row, its text selected for replacing, and tells
    // the user why.
    void Reject(const Rejection& rejection);

    bool _ipv6Enabled;
    HostCtl::Network::IpConfig _ipConfig;
    HostCtl::Network::Ipv6Address _gateway;
    RadioItem* _disable;
    RadioItem* _dynamic;
    CheckItem* _dhcp;
    RadioItem* _static;
    InputItem* _addresses[kAddressRows];
    InputItem* _gatewayField;
    ItemList* _list;
};

}  // namespace Velk
