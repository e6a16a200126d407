// A change of the management network on trial, as the screens run it. The
// present configuration is saved before the first step and the change is
// checked after the last: a change that passes is kept at once; one that
// fails goes to the check screen, which keeps it only when the operator says
// so and otherwise puts the saved configuration back (checked again, with
// the factory network restore offered when that fails too). A change still
// on trial when the console ends (a signal, the end of its input), when an
// idle log-out unwinds the screens, or when the console was killed (found at
// the next start) is put back. Every kept or put-back change is one log line
// and one observation event: who, what, before and after.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "Frame.hpp"
#include "hostctl/HostCtl.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

class NetworkTrial {
public:
    // `screen` is the screen the trial's dialogs open over (none before the
    // first screen).
    explicit NetworkTrial(Frame* screen);
    // A change still on trial is put back.
    ~NetworkTrial();
    NetworkTrial(const NetworkTrial&) = delete;
    NetworkTrial& operator=(const NetworkTrial&) = delete;

    // Whether `address` is free on the management interface's link; when
    // another machine answers for it, the operator is told and false comes
    // back. When the probe itself fails the operator is warned and the
    // address counts as free: the checks after the change still catch a
    // duplicate.
    static bool AddressFree(Frame* screen, const HostCtl::Network::Ipv4Address& address);

    // Saves the present configuration for the logged-in user. False, after
    // telling the operator, when it cannot be saved: nothing may be changed.
    bool Begin();
    // The checks of the change, each logged.
    std::vector<QelCtl::Network::NetworkCheck> Check();
    // Keeps a change whose checks passed; otherwise the check screen decides.
    // The line for the status row of the menu.
    std::string Decide(const std::vector<QelCtl::Network::NetworkCheck>& checks);
    // Puts a change still on trial back at once, without a screen (a step
    // failed, or the console is ending).
    void Undo();

    // Before the welcome screen: puts back a change a console left on trial.
    // The line for the welcome screen, "" when there was none.
    static std::string RecoverAtStart();

private:
    void Keep(const char* what);
    // Puts the saved configuration back and checks it; the line for the
    // status row.
    std::string PutBack();
    // Puts it back and audits that as `what`; why it failed, if it did.
    std::optional<std::string> Revert(const char* what);
    void Close();

    static std::vector<QelCtl::Network::NetworkCheck> LoggedChecks(QelCtl::Network::NetworkTrialImpl& trial);
    static void Audit(const std::string& who, const char* what, const std::string& before,
                      const std::string& after);

    Frame* _screen;
    StringFactory* _factory;
    QelCtl::Network::NetworkTrialImpl _trial;
    bool _open = false;
    // Read when the configuration was saved (the marker is gone by the time
    // the change is kept or put back).
    std::string _who;
    std::string _before;
};

}  // namespace Velk
