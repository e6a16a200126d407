#include "UsedAdaptersDialog.hpp"

#include "StringFactory.hpp"

namespace Velk {

UsedAdaptersDialog::UsedAdaptersDialog(Frame* parent) : Dialog(parent, 70, 12, 7) {
    _question = new TextArea(_content, 0, 0, _content->GetWidth(), _content->GetHeight(), BLACK);
}

int UsedAdaptersDialog::Run() {
    SetTitle(_factory->GetString(79));
    SetDescription(_factory->GetString(80));
    _question->SetText(_factory->GetString(81));
    SetFooter(
        "{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
        "{color:dark-grey}Cancel{/color}{/align}");
    Refresh();
    for (;;) {
        const int key = GetKey(true);
        if (key == '\n') return true;
        if (key == 27) return false;
    }
}

}  // namespace Velk
