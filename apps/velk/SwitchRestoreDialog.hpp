// The shape of the switch restores: a question confirmed with F11 (Esc
// leaves), then one line per step ending in "Done." or "Failed.", then Enter
// to close. A failed step ends the list, since every step builds on the ones
// before it.
#pragma once

#include <functional>
#include <memory>
#include <string>

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
    // Logs `logLine` and reports `event`, then waits for Enter.
    void Finish(const std::string& logLine, const char* event);
    // Finds the management interface and its distributed port (into
    // `_mgmtIntf` and `_dvsName`); throws when it is on no distributed switch.
    HostCtl::Network::ConnectionPoint ReadDvsPort();

    std::unique_ptr<HostCtl::Network::QelNic> _mgmtIntf;
    std::string _dvsName;

private:
    TextArea* _log;  // owned by the window tree
};

}  // namespace Velk
