#include "PasswordWarningDialog.hpp"

#include "StringFactory.hpp"

namespace Velk {

int PasswordWarningDialog::Run() {
    SetTitle(_factory->GetString(162));
    SetDescription(_factory->GetString(166));
    SetFooter(
        "{align:right}{color:black}<Enter>{/color} {color:dark-grey}Yes{/color}  {color:black}<Esc>{/color} "
        "{color:dark-grey}No{/color}{/align}");
    Refresh();
    for (;;) {
        const int key = GetKey(true);
        if (key == '\n') return true;
        if (key == 27) return false;
    }
}

}  // namespace Velk
