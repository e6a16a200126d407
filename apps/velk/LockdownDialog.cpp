#include "LockdownDialog.hpp"

#include <syslog.h>

#include <string>

#include "CommandRunner.hpp"
#include "Console.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

using HostCtl::Lib::Syslog;

LockdownDialog::LockdownDialog(Frame* parent)
    : Dialog(parent, 70, 11, 6), enabled(HrmGetFlag("hrmsvc/auth/lockdown_is_enabled")) {
    _item = new CheckItem(_factory->GetString(254), enabled);
    _list = NewContentList({_item});
}

LockdownDialog::~LockdownDialog() {
    delete _list;
    delete _item;
}

// Drawing.

void LockdownDialog::Draw() {
    SetTitle(_factory->GetString(252));
    SetDescription(_factory->GetString(253));
    _list->Draw();
    SetFooter(
        "{color:black}<Space>{/color} {color:dark-grey}Toggle "
        "Selected{/color}{align:right}{color:black}<Enter>"
        "{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} {color:dark-grey}Cancel{/color}"
        "{/align}");
    Refresh();
}

// Keys.

int LockdownDialog::Run() {
    Draw();
    const auto toggle = [this] {
        _item->SetChecked(!_item->IsChecked());
        _list->Draw();
    };
    const auto apply = [this]() -> std::optional<int> {
        // Only a box that differs from the agent's setting asks it for
        // anything.
        if (_item->IsChecked() != enabled) Change(_item->IsChecked());
        return 1;
    };
    return RunList(_list, toggle, apply);
}

// Actions.

void LockdownDialog::Change(bool enable) {
    // As the console's own account: the change is the console's, not the
    // logged-in user's, so there is no other user to fall back to.
    const char* argv[] = {"hrm-cmd", "-U", VELK_USER,
                          enable ? "hrmsvc/auth/lockdown_mode_enter" : "hrmsvc/auth/lockdown_mode_exit",
                          nullptr};
    char out[257] = {};
    size_t outLen = 256;
    char err[257] = {};
    size_t errLen = 256;
    const int status = RunCommand("/bin/hrm-cmd", argv, out, &outLen, err, &errLen, nullptr, 0, 0);
    if (status != 0) {
        std::string text(err, errLen <= 256 ? errLen : 0);
        while (!text.empty() && (text.back() == '\n' || text.back() == '\r')) text.pop_back();
        Syslog(LOG_ERR,
               enable ? "Enabling lockdown mode failed with error: %s"
                      : "Disabling lockdown mode failed with error: %s",
               text.c_str());
        return;
    }
    Syslog(LOG_INFO, enable ? "Lockdown mode enabled" : "Lockdown mode disabled");
    enabled = enable;
}

}  // namespace Velk
