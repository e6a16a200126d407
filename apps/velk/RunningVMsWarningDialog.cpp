#include "RunningVMsWarningDialog.hpp"

#include "StringFactory.hpp"

namespace Velk {

int RunningVMsWarningDialog::Run() {
    SetTitle(_factory->GetString(173));
    SetDescription(_factory->GetString(174));
    SetFooter(
        "{color:black}<Enter>{/color} "
        "{color:dark-grey}Confirm{/color}{align:right}{color:black}<Esc>{/color} "
        "{color:dark-grey}Cancel{/color}{/align}");
    for (;;) {
        const int key = GetKey(true);
        if (key == '\n') return true;
        if (key == 27) return false;
    }
}

}  // namespace Velk
