#include "RestoreDialog.hpp"

#include <syslog.h>

#include "CommandRunner.hpp"
#include "Console.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

RestoreDialog::RestoreDialog(Frame* parent) : Dialog(parent, 60, 12, 7) {
    _text = new TextArea(_content, 0, 0, _content->GetWidth() - 6, _content->GetHeight(), BLACK);
}

int RestoreDialog::Run() {
    SetTitle(_factory->GetString(177));
    SetDescription(_factory->GetString(178));
    _text->SetText(_factory->GetString(179));
    SetFooter(
        "{align:right}{color:black}<F11>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
        "{color:dark-grey}Cancel{/color}{/align}");
    if (!WaitForF11()) return false;

    HostCtl::Lib::Syslog(LOG_INFO, "Restoring factory defaults");
    ReportObzEvent("@&!*@*@(obz.user.velk.restore.factory.defaults)Restoring factory defaults");
    SetTitle(_factory->GetString(180));
    SetDescription(_factory->GetString(181));
    Refresh();
    if (RunShellCommand("/sbin/firmwareConfig.sh --reset-only > /dev/null 2>&1") == -1) return false;

    _text->SetText("");
    SetFooter("{align:right}{color:black}<Enter>{/color} {color:dark-grey}Restart Host{/color}{/align}");
    SetDescription(_factory->GetString(182));
    // There is no way back: the configuration is gone, only a restart helps.
    while (GetKey(false) != '\n') {
    }
    if (RunShellCommand("reboot -f") == -1) return false;
    // The host is going down: nothing is left to do but answer signals until
    // it is gone; keys are read and dropped.
    for (;;) GetKey(false);
}

}  // namespace Velk
