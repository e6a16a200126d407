#include "NetworkTrial.hpp"

#include <syslog.h>

#include <cstring>
#include <optional>

#include "CommandRunner.hpp"
#include "MessageDialog.hpp"
#include "NetworkCheckWindow.hpp"
#include "RestoreNetworkDialog.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

using HostCtl::Lib::HostCtlException;
using HostCtl::Lib::Syslog;
using QelCtl::Network::NetworkCheck;
using QelCtl::Network::NetworkTrialImpl;

namespace {

const char* OutcomeWord(NetworkCheck::Outcome outcome) {
    switch (outcome) {
        case NetworkCheck::Outcome::Failed:
            return "failed";
        case NetworkCheck::Outcome::Warning:
            return "warning";
        default:
            return "passed";
    }
}

// The audit's "after": what the host has now, or why that cannot be told.
std::string DescribeNow(NetworkTrialImpl& trial) {
    try {
        return trial.Describe();
    } catch (const HostCtlException& e) {
        return std::string("unknown (") + e.what() + ")";
    }
}

}  // namespace

NetworkTrial::NetworkTrial(Frame* screen) : _screen(screen), _factory(StringFactory::Get("en_US")) {}

NetworkTrial::~NetworkTrial() { Undo(); }

bool NetworkTrial::AddressFree(Frame* screen, const HostCtl::Network::Ipv4Address& address) {
    StringFactory* factory = StringFactory::Get("en_US");
    std::optional<std::string> inUse;
    try {
        inUse = NetworkTrialImpl().ProbeAddress(address);
    } catch (const HostCtlException& e) {
        // A probe that cannot be made says nothing about the address: the
        // operator may still change it, and the checks after the change find
        // a duplicate address all the same.
        Syslog(LOG_WARNING, "Probing for %s failed: %s", address.GetStringAddress().c_str(), e.what());
        MessageDialog(screen, 18, std::string(factory->GetString(304)) + "\n\n" + e.what()).Execute();
        return true;
    }
    if (!inUse) return true;
    Syslog(LOG_ERR, "Address %s refused: %s", address.GetStringAddress().c_str(), inUse->c_str());
    MessageDialog(screen, 18, std::string(factory->GetString(301)) + "\n\n" + *inUse).Execute();
    return false;
}

bool NetworkTrial::Begin() {
    try {
        const QelCtl::Network::PendingChange saved = _trial.Save(Frame::_loginName);
        _who = saved.user;
        _before = saved.description;
    } catch (const HostCtlException& e) {
        Syslog(LOG_ERR, "Saving the network configuration failed: %s", e.what());
        MessageDialog(_screen, 18, std::string(_factory->GetString(299)) + "\n\n" + e.what()).Execute();
        return false;
    }
    _open = true;
    Syslog(LOG_INFO, "Saved the network configuration before the change");
    Frame::_atEnd = [this] { Undo(); };
    return true;
}

std::vector<NetworkCheck> NetworkTrial::Check() { return LoggedChecks(_trial); }

std::vector<NetworkCheck> NetworkTrial::LoggedChecks(NetworkTrialImpl& trial) {
    std::vector<NetworkCheck> checks;
    try {
        checks = trial.Check();
    } catch (const std::exception& e) {
        // Checks that cannot run prove nothing: they count as failed.
        checks.push_back({e.what(), NetworkCheck::Outcome::Failed, ""});
    }
    for (const NetworkCheck& check : checks) {
        Syslog(check.outcome == NetworkCheck::Outcome::Passed ? LOG_INFO : LOG_WARNING,
               "Network check: %s: %s%s%s", check.subject.c_str(), OutcomeWord(check.outcome),
               check.detail.empty() ? "" : ", ", check.detail.c_str());
    }
    return checks;
}

std::string NetworkTrial::Decide(const std::vector<NetworkCheck>& checks) {
    if (NetworkTrialImpl::Passed(checks)) {
        Keep("kept");
        return _factory->GetString(284);
    }
    Syslog(LOG_WARNING, "The management network failed its checks; counting down %d seconds",
           NetworkCheckWindow::kCountdownSeconds);
    NetworkCheckWindow window(_screen, NetworkCheckWindow::CHANGED, checks);
    if (window.Execute() == NetworkCheckWindow::KEEP) {
        Keep("kept anyway");
        return _factory->GetString(302);
    }
    return PutBack();
}

void NetworkTrial::Keep(const char* what) {
    Close();
    try {
        _trial.Keep();
    } catch (const HostCtlException& e) {
        // The marker stays: the next start puts the change back.
        Syslog(LOG_ERR, "Keeping the network change failed: %s", e.what());
    }
    Audit(_who, what, _before, DescribeNow(_trial));
}

std::string NetworkTrial::PutBack() {
    if (const std::optional<std::string> error = Revert("reverted")) {
        // The marker stays for the next start; meanwhile the factory settings
        // are the way back onto the network.
        MessageDialog(_screen, 18, std::string(_factory->GetString(300)) + "\n\n" + *error).Execute();
        RestoreNetworkDialog(_screen).Execute();
        return "";
    }
    const std::vector<NetworkCheck> checks = LoggedChecks(_trial);
    if (NetworkTrialImpl::Passed(checks)) return _factory->GetString(294);
    NetworkCheckWindow window(_screen, NetworkCheckWindow::REVERTED, checks);
    if (window.Execute() == NetworkCheckWindow::RESTORE_FACTORY) RestoreNetworkDialog(_screen).Execute();
    return "";
}

void NetworkTrial::Undo() {
    if (_open) Revert("reverted");
}

std::optional<std::string> NetworkTrial::Revert(const char* what) {
    Close();
    Syslog(LOG_INFO, "Putting back the previous network configuration");
    try {
        _trial.Revert();
    } catch (const std::exception& e) {
        Syslog(LOG_ERR, "Putting back the previous network configuration failed: %s", e.what());
        return std::string(e.what());
    }
    Audit(_who, what, _before, DescribeNow(_trial));
    return std::nullopt;
}

void NetworkTrial::Close() {
    _open = false;
    Frame::_atEnd = nullptr;
}

std::string NetworkTrial::RecoverAtStart() {
    NetworkTrial trial(nullptr);
    std::optional<QelCtl::Network::PendingChange> pending;
    try {
        pending = trial._trial.Pending();
    } catch (const HostCtlException& e) {
        Syslog(LOG_ERR, "Cannot tell whether a network change is unfinished: %s", e.what());
        return "";
    }
    if (!pending) return "";
    if (pending->elsewhere) {
        Syslog(LOG_INFO, "A network change by %s is on trial at another console", pending->user.c_str());
        return "";
    }
    Syslog(LOG_WARNING, "A network change by %s was left unfinished; putting back the previous configuration",
           pending->user.c_str());
    trial._who = pending->user;
    trial._before = pending->description;
    if (const std::optional<std::string> error = trial.Revert("reverted at start"))
        return std::string(trial._factory->GetString(300)) + " " + *error;
    return trial._factory->GetString(298);
}

void NetworkTrial::Audit(const std::string& who, const char* what, const std::string& before,
                         const std::string& after) {
    Syslog(LOG_INFO, "Network change by %s %s; before: %s; after: %s", who.c_str(), what, before.c_str(),
           after.c_str());
    const char* event = std::strncmp(what, "kept", 4) == 0 ? "kept" : "reverted";
    ReportObzEvent("@&!*@*@(obz.user.velk.network.change.%s)Network change by %s %s; before: %s; after: %s",
                   event, who.c_str(), what, before.c_str(), after.c_str());
}

}  // namespace Velk
