#include "RestartNetworkDialog.hpp"

#include "DoRestartNetworkDialog.hpp"
#include "StringFactory.hpp"

namespace Velk {

RestartNetworkDialog::RestartNetworkDialog(Frame* parent, std::unique_ptr<HostCtl::Network::QelNic> mgmt)
    : Dialog(parent, 60, 13, 8), _mgmtIntf(std::move(mgmt)) {
    _question = new TextArea(_content, 0, 0, _content->GetWidth(), _content->GetHeight(), BLACK);
}

int RestartNetworkDialog::Run() {
    SetTitle(_factory->GetString(130));
    SetDescription(_factory->GetString(131));
    _question->SetText(_factory->GetString(132));
    SetFooter(
        "{align:right}{color:black}<F11>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
        "{color:dark-grey}Cancel{/color}{/align}");
    Refresh();
    if (!WaitForF11()) return false;
    DoRestartNetworkDialog(this, *_mgmtIntf).Execute();
    return true;
}

}  // namespace Velk
