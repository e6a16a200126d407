// "DNS Configuration": DNS servers and host name from DHCP, or a primary and
// an alternate server (IPv4 or IPv6) and a host name typed in.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "Dialog.hpp"
#include "InputItem.hpp"
#include "ItemList.hpp"
#include "RadioItem.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class DNSConfigurationDialog : public Dialog {
public:
    // `dhcpAvailable`: the change set uses DHCP or DHCPv6; without it the
    // automatic choice cannot be made.
    DNSConfigurationDialog(Frame* parent, bool dnsAutomatic, bool dhcpAvailable,
                           const std::vector<HostCtl::Network::IpAddress>& servers,
                           const std::string& hostname);
    ~DNSConfigurationDialog() override;

    // true for OK, false for Esc.
    int Run() override;

    bool IsDnsAutomatic() const { return dnsAutomatic; }
    // Primary first, then alternate; an empty field gives no server.
    const std::vector<HostCtl::Network::IpAddress>& GetServers() const { return _servers; }
    const std::string& GetHostname() const { return _hostname; }

    bool dnsAutomatic;

    // The rows of the dialog, top to bottom.
    enum Row { AUTOMATIC_ROW, MANUAL_ROW, PRIMARY_ROW, ALTERNATE_ROW, HOSTNAME_ROW, ROW_COUNT };

    // The row of the first server (primary, then alternate) that is neither
    // empty nor an IPv6 or IPv4 address; none when both are usable.
    static std::optional<int> CheckServers(const std::string& primary, const std::string& alternate);
    // The servers typed: an IPv6 address or else an IPv4 one for each entry
    // that is one; empty entries give none.
    static std::vector<HostCtl::Network::IpAddress> ServersFromText(const std::string& primary,
                                                                    const std::string& alternate);
    // The keys the server rows take: hexadecimal digits, ":", "." and the
    // editing keys.
    static bool IsServerKey(int key);
    // The keys the host-name row takes: letters, digits, ".", "-" and the
    // editing keys.
    static bool IsHostnameKey(int key);

private:
    static constexpr int kFields = ROW_COUNT - PRIMARY_ROW;

    // Marks the radio row's choice; the input rows are usable only with the
    // manual choice.
    void Mark(int row);
    // Shows the text cursor while an input row is selected.
    void FollowSelection();
    void Draw();
    // Stores the result; false when a server is refused.
    bool Accept();
    // Selects the refused server's row, its text selected for replacing, and
    // tells the user why.
    void Reject(int row);

    std::vector<HostCtl::Network::IpAddress> _servers;
    std::string _hostname;
    RadioItem* _automatic;
    RadioItem* _manual;
    InputItem* _fields[kFields];
    ItemList* _list;
};

}  // namespace Velk
