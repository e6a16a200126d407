// "Restart Management Network": takes the management interface down and up
// again, showing each step, then the addresses it has afterwards. Enter
// closes it. Host-control errors pass to the caller.
#pragma once

#include <string>

#include "Dialog.hpp"
#include "TextArea.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class DoRestartNetworkDialog : public Dialog {
public:
    DoRestartNetworkDialog(Frame* parent, HostCtl::Network::QelNic& mgmt);

    int Run() override;

    // The address lines shown after the restart: the IPv4 address when the
    // interface has one, then the IPv6 addresses that are not link-local (at
    // most kShownIpv6, then "   ..."), each on its own line after three
    // blanks.
    static std::string AddressLines(const HostCtl::Network::IpConfig& config, const std::string& ipLabel);
    static constexpr size_t kShownIpv6 = 3;

private:
    // Appends a step's text and sends the screen, for the operator to see
    // while the host works.
    void Progress(const std::string& text);
    // Waits up to kDhcpWaitSeconds for a lease while the interface uses DHCP
    // and has no address yet; the configuration as it is at the end.
    HostCtl::Network::IpConfig WaitForLease(HostCtl::Network::IpConfig config);

    HostCtl::Network::QelNic& _mgmtIntf;
    TextArea* _log;  // owned by the window tree
};

}  // namespace Velk
