#include "LoginDisabledDialog.hpp"

#include "StringFactory.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

LoginDisabledDialog::LoginDisabledDialog(Frame* parent) : Dialog(parent, 60, 9, 7) {}

int LoginDisabledDialog::Run() {
    std::string hostname;
    try {
        hostname = QelCtl::Network::DnsConfigImpl("defaultTcpipStack").GetHostname();
    } catch (const HostCtl::Lib::HostCtlException&) {
        // The message is shown without the host name.
    }
    SetTitle(_factory->GetString(147));
    SetDescription(std::string(_factory->GetString(148)) + hostname);
    SetFooter("{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}{/align}");
    Refresh();
    while (GetKey(false) != '\n') {
    }
    return 0;
}

}  // namespace Velk
