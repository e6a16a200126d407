#include "TroubleShootingWindow.hpp"

#include <syslog.h>

#include "Assertion.hpp"
#include "CommandRunner.hpp"
#include "Console.hpp"
#include "RestartAgentsDialog.hpp"
#include "ShellTimeoutDialog.hpp"
#include "StringFactory.hpp"
#include "VelkTimeoutDialog.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

using HostCtl::Lib::Syslog;

namespace {

const char* const LEFT_FOOTER = "{color:black}<Up/Down>{/color} {color:dark-grey}Select{/color}";
const char* const CHANGE_FOOTER =
    "{color:white}<Enter>{/color}{color:light-grey} Change{/color}{align:right}{color:white}<Esc>{/color}"
    "{color:light-grey} Exit{/color}{/align}";
const char* const RESTART_FOOTER =
    "{color:white}<Enter>{/color}{color:light-grey} Restart{/color}{align:right}{color:white}<Esc>{/color}"
    "{color:light-grey} Exit{/color}{/align}";

}  // namespace

struct TroubleShootingWindow::Service {
    const char* name;  // in the log line "User <name> enabled <name>"
    const char* initScript;
    const char* start;
    const char* stop;
    const char* enable;
    const char* disable;
    const char* startStopWarning;
    const char* enableDisableWarning;
    bool firewall;  // the SSH server's firewall ruleset follows the service
};

namespace {

const char* const SHELL_SCRIPT = "/etc/init.d/TarnShell";
const char* const SSH_SCRIPT = "/etc/init.d/SSH";

}  // namespace

TroubleShootingWindow::TroubleShootingWindow(Frame* parent)
    : RootWindow(parent), shellEnabled(IsRunning(SHELL_SCRIPT)), sshEnabled(IsRunning(SSH_SCRIPT)) {
    for (int entry = 0; entry < ENTRY_COUNT; ++entry) _items.push_back(new LabelItem(EntryLabel(entry)));
    _menu->SetItems(_items);
}

TroubleShootingWindow::~TroubleShootingWindow() {
    for (Item* item : _items) delete item;
}

// An init script's status answers 0 exactly while the service runs.
bool TroubleShootingWindow::IsRunning(const char* initScript) {
    // The script is an argument of the shell, so its host path is taken here.
    const std::string script = HostCtl::Lib::HostPath(initScript);
    const char* argv[] = {"sh", script.c_str(), "status", nullptr};
    return RunCommand("/bin/sh", argv, nullptr, nullptr, nullptr, nullptr, nullptr, 0, 0) == 0;
}

// Drawing.

// The switches name the action Enter takes. The timeouts matter only while a
// service runs: with neither running their entry reads in dark grey.
std::string TroubleShootingWindow::EntryLabel(int entry) const {
    switch (entry) {
        case SHELL:
            return _factory->GetString(shellEnabled ? 227 : 226);
        case SSH:
            return _factory->GetString(sshEnabled ? 229 : 228);
        case TIMEOUTS:
            if (shellEnabled || sshEnabled) return _factory->GetString(232);
            return std::string("{color:dark-grey}") + _factory->GetString(232) + "{/color}";
        case VELK_TIMEOUT:
            return _factory->GetString(233);
        default:
            return _factory->GetString(234);
    }
}

void TroubleShootingWindow::DrawContents() {
    SetLeftTitle(_factory->GetString(225));
    SetLeftFooter(LEFT_FOOTER);
    _menu->Draw();
    DrawDescription();
}

void TroubleShootingWindow::DrawDescription() {
    const int entry = _menu->GetCurrentIndex();
    if (entry < 0) return;
    static const int HEADINGS[ENTRY_COUNT] = {230, 231, 232, 233, 234};
    SetRightTitle(_factory->GetString(HEADINGS[entry]));
    _description->SetText(Description(entry));
    SetRightFooter(entry == RESTART_AGENTS ? RESTART_FOOTER : CHANGE_FOOTER);
    Refresh();
}

std::string TroubleShootingWindow::Description(int entry) const {
    auto state = [&](int id) {
        return std::string("{color:white}") + _factory->GetString(id) + "{/color}\n\n";
    };
    switch (entry) {
        case SHELL:
            return state(shellEnabled ? 237 : 238) + _factory->GetString(235);
        case SSH:
            return state(sshEnabled ? 239 : 240) + _factory->GetString(236);
        case TIMEOUTS:
            return _factory->GetString(242);
        case VELK_TIMEOUT:
            return _factory->GetString(243);
        default:
            return std::string("{color:light-grey}") + _factory->GetString(241) + "{/color}";
    }
}

LabelItem* TroubleShootingWindow::EntryItem(int entry) const {
    if (entry < 0 || static_cast<size_t>(entry) >= _items.size()) return nullptr;
    return dynamic_cast<LabelItem*>(_items[static_cast<size_t>(entry)]);
}

// Keys.

int TroubleShootingWindow::Run() { return Foreground(); }

bool TroubleShootingWindow::Foreground() {
    static const Service SHELL_SERVICE = {"Tarni Shell",
                                          SHELL_SCRIPT,
                                          "hostsvc/start_tarn_shell",
                                          "hostsvc/stop_tarn_shell",
                                          "hostsvc/enable_tarn_shell",
                                          "hostsvc/disable_tarn_shell",
                                          "Unable to run hrm-cmd to start/stop Tarni Shell",
                                          "Unable to run hrm-cmd to enable/disable Tarni Shell",
                                          false};
    static const Service SSH_SERVICE = {"SSH",
                                        SSH_SCRIPT,
                                        "hostsvc/start_ssh",
                                        "hostsvc/stop_ssh",
                                        "hostsvc/enable_ssh",
                                        "hostsvc/disable_ssh",
                                        "Unable to run hrm-cmd to start/stop ssh",
                                        "Unable to run hrm-cmd to enable/disable ssh",
                                        true};

    // Its own loop, not RunMenu: the relabelling's assertions belong to this
    // function and name it when they fail.
    Draw();
    for (;;) {
        switch (GetKey(true)) {
            case KEY_DOWN:
                _menu->Down();
                DrawDescription();
                break;
            case KEY_UP:
                _menu->Up();
                DrawDescription();
                break;
            case 27:
                return true;
            case '\n': {
                const int entry = _menu->GetCurrentIndex();
                if (entry != SHELL && entry != SSH) {
                    OpenEntry(entry);
                    Draw();
                    break;
                }
                if (entry == SHELL)
                    Switch(SHELL_SERVICE, shellEnabled);
                else
                    Switch(SSH_SERVICE, sshEnabled);
                // The timeouts entry's look follows both services.
                LabelItem* tmp = EntryItem(entry);
                VELK_ASSERT(tmp != NULL);
                LabelItem* timeouts = EntryItem(TIMEOUTS);
                VELK_ASSERT(timeouts != NULL);
                tmp->SetText(EntryLabel(entry));
                timeouts->SetText(EntryLabel(TIMEOUTS));
                _menu->Draw();
                DrawDescription();
                break;
            }
            default:
                break;
        }
    }
}

// Actions.

// The decision follows the state before the switch. The host agent starts or
// stops the service and makes that last across restarts; when it cannot
// start or stop it, the init script does, and for SSH the firewall is
// brought in line here (the agent does that itself). The state flips
// whatever the outcome.
void TroubleShootingWindow::Switch(const Service& service, bool& enabled) {
    const bool wasEnabled = enabled;
    if (AgentCommand(wasEnabled ? service.stop : service.start) != 0) {
        Syslog(LOG_WARNING, "%s", service.startStopWarning);
        const std::string script = HostCtl::Lib::HostPath(service.initScript);
        const char* argv[] = {"sh", script.c_str(), wasEnabled ? "stop" : "start", nullptr};
        RunCommand("/bin/sh", argv, nullptr, nullptr, nullptr, nullptr, nullptr, 0, 0);
        if (service.firewall) UpdateSshFirewall(!wasEnabled);
    }
    if (AgentCommand(wasEnabled ? service.disable : service.enable) != 0)
        Syslog(LOG_WARNING, "%s", service.enableDisableWarning);
    enabled = !wasEnabled;
    const std::string line = "User " + _loginName + (enabled ? " enabled " : " disabled ") + service.name;
    Syslog(LOG_INFO, "%s", line.c_str());
}

int TroubleShootingWindow::AgentCommand(const char* command) {
    const char* argv[] = {"hrm-cmd", "-U", _loginName.c_str(), command, nullptr};
    return InvokeHrmCmd("/bin/hrm-cmd", argv, nullptr, nullptr, nullptr, nullptr, nullptr, 0);
}

void TroubleShootingWindow::UpdateSshFirewall(bool enabled) {
    try {
        HostCtl::Firewall::Ruleset ruleset =
            QelCtl::System::SystemInfoImpl().GetFirewallRulesetById("sshServer");
        if (ruleset.IsEnabled() != enabled) ruleset.SetEnabled(enabled);
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_ERR, "Failed to update firewall sshServer ruleset status: %s", e.what());
    }
}

void TroubleShootingWindow::OpenEntry(int entry) {
    switch (entry) {
        case TIMEOUTS:
            ShellTimeoutDialog(this).Execute();
            break;
        case VELK_TIMEOUT:
            VelkTimeoutDialog(this).Execute();
            break;
        case RESTART_AGENTS:
            RestartAgentsDialog(this).Execute();
            break;
        default:
            break;
    }
}

}  // namespace Velk
