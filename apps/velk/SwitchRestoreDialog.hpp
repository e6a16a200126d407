// The shape of the switch restores: one line per step ending in "Done." or
// "Failed.", then Enter to close. A failed step ends the list, since every
// step builds on the ones before it, and the steps already done are undone
// in reverse order, so that a failed restore leaves the host as it was.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "Dialog.hpp"
#include "TextArea.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class SwitchRestoreDialog : public Dialog {
protected:
    SwitchRestoreDialog(Frame* parent, int height, int headerHeight);

    // Shows the question and waits for F11 (true) or Esc (false).
    bool Confirm(const std::string& title, const std::string& header, const std::string& question);
    // Shows `text`, logs it, runs `work`; "Done." when it returns, "Failed."
    // (and the exception's text in the log) when the host refuses.
    bool Step(const std::string& text, const std::function<void()>& work);
    // A line of its own in the log area.
    void ShowLine(const std::string& text);
    // What puts back a change a step made, logged as `text` when it runs.
    // Undo runs them newest first; `last` ones run after all the others.
    void AddUndo(const std::string& text, std::function<void()> undo, bool last = false);
    // Runs the undo actions as one step of its own and forgets them; false
    // when one of them failed too (each failure is logged). Nothing to undo
    // shows nothing.
    bool Undo();
    // Logs `logLine` and reports `event`, then waits for Enter.
    void Finish(const std::string& logLine, const char* event);
    // Finds the management interface and its distributed port (into
    // `_mgmtIntf` and `_dvsName`); throws when it is on no distributed switch.
    HostCtl::Network::ConnectionPoint ReadDvsPort();
    // The uplink ports of `_dvsName` that a NIC of this host backs.
    std::vector<HostCtl::Network::DistributedSwitch::UplinkPort> ReadHostUplinks() const;

    std::unique_ptr<HostCtl::Network::QelNic> _mgmtIntf;
    std::string _dvsName;

private:
    TextArea* _log;  // owned by the window tree
    std::vector<std::pair<std::string, std::function<void()>>> _undo;
};

}  // namespace Velk
