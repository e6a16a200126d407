#include "DoRestartNetworkDialog.hpp"

#include <syslog.h>
#include <unistd.h>

#include "CommandRunner.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

namespace {

constexpr int kDhcpWaitSeconds = 10;
constexpr useconds_t kDhcpPollMicros = 500000;

std::string Done(const char* text) { return std::string("{align:right}") + text + "{/align}\n"; }

}  // namespace

DoRestartNetworkDialog::DoRestartNetworkDialog(Frame* parent, HostCtl::Network::QelNic& mgmt)
    : Dialog(parent, 60, 20, 6), _mgmtIntf(mgmt) {
    _log = new TextArea(_content, 0, 0, _content->GetWidth(), _content->GetHeight(), BLACK);
}

std::string DoRestartNetworkDialog::AddressLines(const HostCtl::Network::IpConfig& config,
                                                 const std::string& ipLabel) {
    std::string text;
    if (!config.GetIpv4UseNone() && !config.GetIpv4Address().IsZero())
        text += "\n   " + ipLabel + config.GetIpv4Address().GetStringAddress();
    size_t shown = 0;
    for (const HostCtl::Network::Ipv6Network& network : config.GetIpv6Network()) {
        if (network.GetAddress().IsLinkLocal()) continue;
        if (shown++ == kShownIpv6) {
            text += "\n   ...\n";
            return text;
        }
        text += "\n   " + network.GetStringAddress();
    }
    return text;
}

void DoRestartNetworkDialog::Progress(const std::string& text) {
    _log->AppendText(text);
    Refresh();
    Window::Flush();
}

HostCtl::Network::IpConfig DoRestartNetworkDialog::WaitForLease(HostCtl::Network::IpConfig config) {
    if (!config.GetUseDhcp() || !config.GetIpv4Address().IsZero()) return config;
    Progress(_factory->GetString(264));
    for (int waited = 0; waited < kDhcpWaitSeconds * 2 && config.GetIpv4Address().IsZero(); ++waited) {
        usleep(kDhcpPollMicros);
        EndIfRequested();
        config = _mgmtIntf.GetIpConfig();
    }
    Progress(Done(_factory->GetString(config.GetIpv4Address().IsZero() ? 223 : 123)));
    return config;
}

int DoRestartNetworkDialog::Run() {
    const std::string& name = _mgmtIntf.GetName();
    HostCtl::Lib::Syslog(LOG_INFO, "Restarting %s", name.c_str());
    ReportObzEvent("@&!*@*@(obz.user.velk.network.restart)Restarting %s", name.c_str());

    SetTitle(_factory->GetString(133));
    SetDescription(_factory->GetString(134));
    Progress(_factory->GetString(135));
    _mgmtIntf.Disable();
    Progress(Done(_factory->GetString(123)));
    Progress(_factory->GetString(136));
    _mgmtIntf.Enable();
    Progress(Done(_factory->GetString(123)));

    const HostCtl::Network::IpConfig config = WaitForLease(_mgmtIntf.GetIpConfig());
    _log->AppendText(TextArea::Escape(AddressLines(config, _factory->GetString(137))) + "\n\n" +
                     _factory->GetString(123));
    SetFooter("{align:right}{color:black}<Enter>{/color}{color:dark-grey} OK{/color}{/align}");
    Refresh();
    while (GetKey(true) != '\n') {
    }
    return true;
}

}  // namespace Velk
