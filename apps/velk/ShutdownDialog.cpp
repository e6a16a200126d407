#include "ShutdownDialog.hpp"

#include <syslog.h>

#include "CommandRunner.hpp"
#include "RebootConfirmDialog.hpp"
#include "ShutdownConfirmDialog.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

ShutdownDialog::ShutdownDialog(Frame* parent) : Dialog(parent, 60, 19, 13) {
    _force = new CheckItem(_factory->GetString(170), false, 0);
    _list = NewContentList({_force});
}

ShutdownDialog::~ShutdownDialog() {
    delete _force;
    delete _list;
}

int ShutdownDialog::Run() {
    for (;;) {
        SetTitle(_factory->GetString(168));
        SetDescription(_factory->GetString(169));
        _list->Draw();
        SetFooter(
            "{color:black}<F2>{/color} {color:dark-grey}Shut Down{/color}  {color:black}<F11>{/color} "
            "{color:dark-grey}Restart{/color}{align:right}{color:black}<Esc>{/color} "
            "{color:dark-grey}Cancel{/color}{/align}");
        const int key = GetKey(true);
        if (key == ' ') {
            _force->SetChecked(!_force->IsChecked());
        } else if (key == KEY_F(11)) {
            HostCtl::Lib::Syslog(LOG_INFO, "Rebooting host");
            ReportObzEvent("@&!*@*@(obz.user.velk.reboot.host)Rebooting host");
            RebootConfirmDialog progress(this, !_force->IsChecked());
            progress.Execute();
        } else if (key == KEY_F(2)) {
            HostCtl::Lib::Syslog(LOG_INFO, "Shutting down host");
            ReportObzEvent("@&!*@*@(obz.user.velk.shutdown.host)Shutting down host");
            ShutdownConfirmDialog progress(this, !_force->IsChecked());
            progress.Execute();
        } else if (key == 27) {
            return false;
        }
    }
}

}  // namespace Velk
