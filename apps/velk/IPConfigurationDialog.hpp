// "IPv4 Configuration": off, DHCP, or a static address, netmask and default
// gateway. Edits copies only; the network window compares and keeps them.
#pragma once

#include <optional>
#include <string>

#include "Dialog.hpp"
#include "InputItem.hpp"
#include "ItemList.hpp"
#include "RadioItem.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class IPConfigurationDialog : public Dialog {
public:
    IPConfigurationDialog(Frame* parent, bool ipv4Off, bool ipv4Dhcp,
                          const HostCtl::Network::IpConfig& ipConfig,
                          const HostCtl::Network::Ipv4Address& gateway);
    ~IPConfigurationDialog() override;

    // true for OK (the copies then hold the result), false for Esc.
    int Run() override;

    const HostCtl::Network::IpConfig& GetIpConfig() const { return _ipConfig; }
    const HostCtl::Network::Ipv4Address& GetGateway() const { return _gateway; }

    // The rows of the dialog, top to bottom.
    enum Row { OFF_ROW, DHCP_ROW, STATIC_ROW, ADDRESS_ROW, NETMASK_ROW, GATEWAY_ROW, ROW_COUNT };

    // A refused entry: the row to select and the error message to show.
    struct Rejection {
        int row;
        int titleId;
        int messageId;
    };
    // The first of the static address, netmask and gateway that is refused,
    // checked in that order; none when all three are valid.
    static std::optional<Rejection> CheckStatic(const std::string& address, const std::string& netmask,
                                                const std::string& gateway);
    // The keys the input rows take: digits, the full stop and the editing keys.
    static bool IsFieldKey(int key);

private:
    static constexpr int kChoices = 3;
    static constexpr int kFields = ROW_COUNT - ADDRESS_ROW;

    void Draw();
    // Marks the choice of a radio row; the input rows are usable only with
    // the static choice.
    void Mark(int row);
    // Stores the choice; false when a static entry is refused.
    bool Accept();
    // Selects the refused row, its text selected for replacing, and tells
    // the user why.
    void Reject(const Rejection& rejection);

    HostCtl::Network::IpConfig _ipConfig;
    HostCtl::Network::Ipv4Address _gateway;
    bool _ipv4Off;
    bool _ipv4Dhcp;
    bool _ipv4Static;
    // The choice marked when the dialog opened: confirming it again keeps the
    // stored gateway.
    const bool _offAtStart;
    const bool _dhcpAtStart;
    RadioItem* _choices[kChoices];
    InputItem* _fields[kFields];
    ItemList* _list;
};

}  // namespace Velk
