#include "RestoreNetworkDialog.hpp"

#include <syslog.h>

#include "CommandRunner.hpp"
#include "DoRestoreNetworkDialog.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

RestoreNetworkDialog::RestoreNetworkDialog(Frame* parent) : Dialog(parent, 60, 12, 6) {
    _text = new TextArea(_content, 0, 0, _content->GetWidth() - 6, _content->GetHeight(), BLACK);
}

int RestoreNetworkDialog::Run() {
    SetTitle(_factory->GetString(189));
    SetDescription(_factory->GetString(190));
    _text->SetText(_factory->GetString(191));
    SetFooter(
        "{color:black}<F11>{/color} {color:dark-grey}Yes, "
        "Reset{/color}{align:right}{color:black}<Esc>{/color} "
        "{color:dark-grey}Cancel{/color}{/align}");
    Refresh();
    if (!WaitForF11()) return false;
    DoRestoreNetworkDialog(this).Execute();
    // Written after the work, whatever it came to (also when the warning
    // about running virtual machines was declined).
    HostCtl::Lib::Syslog(LOG_INFO, "Restoring factory network settings");
    ReportObzEvent("@&!*@*@(obz.user.velk.factory.network.restored)Restoring factory network settings");
    return true;
}

}  // namespace Velk
