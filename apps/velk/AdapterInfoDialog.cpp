#include "AdapterInfoDialog.hpp"

namespace Velk {

AdapterInfoDialog::AdapterInfoDialog(Frame* parent, const Adapter& adapter)
    : Dialog(parent, 70, 15, 5), _adapter(adapter) {
    _details = new TextArea(_content, 0, 0, _content->GetWidth(), _content->GetHeight(), BLACK);
}

std::string AdapterInfoDialog::DetailText(const Adapter& adapter) {
    std::string users;
    for (const std::string& user : adapter.usedBy) users += (users.empty() ? "" : ", ") + user;
    return "Device Name: " + TextArea::Escape(adapter.name) +
           "\nHardware Label: " + TextArea::Escape(adapter.label) +
           "\nMAC Address: " + TextArea::Escape(adapter.mac) +
           "\nConnection Status: " + (adapter.connected ? "Connected" : "Disconnected") +
           "\nUsed By: " + (users.empty() ? "None" : TextArea::Escape(users));
}

int AdapterInfoDialog::Run() {
    SetTitle("Adapter Details");
    _details->SetText(DetailText(_adapter));
    SetFooter("{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}{/align}");
    Refresh();
    while (GetKey(true) != '\n') {
    }
    return true;
}

}  // namespace Velk
