#include "DoRestoreNetworkDialog.hpp"

#include <syslog.h>

#include "CommandRunner.hpp"
#include "NetworkTrial.hpp"
#include "RootWindow.hpp"
#include "RunningVMsWarningDialog.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

using HostCtl::Lib::Syslog;

DoRestoreNetworkDialog::DoRestoreNetworkDialog(Frame* parent) : Dialog(parent, 60, 12, 6) {
    _log = new TextArea(_content, 0, 0, _content->GetWidth() - 6, _content->GetHeight(), BLACK);
}

void DoRestoreNetworkDialog::Log(const std::string& text) {
    _log->AppendText(text);
    Refresh();
    Window::Flush();
}

int DoRestoreNetworkDialog::Run() {
    SetTitle(_factory->GetString(207));
    SetDescription(_factory->GetString(208));
    Refresh();
    QelCtl::Network::NetworkInfoImpl networkInfo;
    QelCtl::Resource::ResourceInfoImpl resourceInfo;
    const std::string done = std::string(_factory->GetString(123)) + "\n";
    const std::string failed = std::string(_factory->GetString(223)) + "\n";

    bool powerOffFailed = false;
    bool running = false;
    try {
        running = resourceInfo.HasRunningVirtualMachines();
    } catch (const HostCtl::Lib::HostCtlException& e) {
        // Without knowing, the machines are taken to be running: the user
        // is warned and they are powered off before the network goes.
        Syslog(LOG_ERR, "Cannot tell whether virtual machines run: %s", e.what());
        running = true;
    }
    if (running) {
        if (!RunningVMsWarningDialog(this).Execute()) return false;
        _log->SetText(std::string(_factory->GetString(209)) + " ");
        Refresh();
        const char* argv[] = {"powerOffVms", nullptr};
        if (RunCommand("/sbin/powerOffVms", argv, nullptr, nullptr, nullptr, nullptr, nullptr, 0, 0) == 0)
            Log(done);
        else
            powerOffFailed = true;
    }

    bool restored = false;
    // The configuration as it is goes aside first, as for every change of
    // the management network: a restore that fails halfway, restored
    // settings that fail their checks, or a console that ends before they
    // are decided, get it back.
    NetworkTrial trial(this);
    try {
        networkInfo.DisableNetDumper();
        if (powerOffFailed) {
            Log(failed);
            Syslog(LOG_ERR, "Error powering off VMs");
        } else if (!trial.Begin()) {
            Log(failed);
        } else {
            Log(std::string(_factory->GetString(210)) + " ");
            Syslog(LOG_INFO, "Clearing Network Config");
            networkInfo.ClearNetworkConfig();
            Syslog(LOG_INFO, "Auto-Configuring Network");
            networkInfo.AutoConfigNetwork();
            Log(done);
            restored = true;
        }
    } catch (const HostCtl::Lib::HostCtlException&) {
        Log(failed);
        Syslog(LOG_ERR, "Error auto-configuring network");
        // A failed restore leaves the host as it was, not without network.
        trial.Undo();
    }

    if (restored) {
        Log(std::string(_factory->GetString(303)) + " ");
        const std::vector<QelCtl::Network::NetworkCheck> checks = trial.Check();
        Log(QelCtl::Network::NetworkTrialImpl::Passed(checks) ? done : failed);
        RootWindow::PostStatus(trial.Decide(checks));
    }

    SetFooter("{align:right}{color:black}<Enter>{/color}{color:dark-grey} OK{/color}{/align}");
    Refresh();
    while (GetKey(true) != '\n') {
    }
    return true;
}

}  // namespace Velk
