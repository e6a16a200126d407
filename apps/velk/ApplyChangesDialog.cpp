#include "ApplyChangesDialog.hpp"

#include "StringFactory.hpp"

namespace Velk {

ApplyChangesDialog::ApplyChangesDialog(Frame* parent, bool reboot)
    : Dialog(parent, 70, 14, 9), reboot(reboot) {
    _question = new TextArea(_content, 0, 0, _content->GetWidth(), _content->GetHeight(), BLACK);
}

int ApplyChangesDialog::Run() {
    SetTitle(_factory->GetString(211));
    SetDescription(_factory->GetString(212));
    _question->SetText(_factory->GetString(reboot ? 214 : 213));
    SetFooter(
        "{color:black}<Y>{/color} {color:dark-grey}Yes{/color}  {color:black}<N>{/color} "
        "{color:dark-grey}No{/color}{align:right}{color:black}<Esc>{/color} "
        "{color:dark-grey}Cancel{/color}{/align}");
    Refresh();
    for (;;) {
        switch (GetKey(true)) {
            case 'y':
            case 'Y':
                apply = true;
                return true;
            case 'n':
            case 'N':
                apply = false;
                return true;
            case 27:
                return false;
            default:
                break;
        }
    }
}

}  // namespace Velk
