#include "MessageDialog.hpp"

#include "StringFactory.hpp"

namespace Velk {

MessageDialog::MessageDialog(Frame* parent, int titleId, int messageId)
    : MessageDialog(parent, titleId, std::string(StringFactory::Get("en_US")->GetString(messageId))) {}

MessageDialog::MessageDialog(Frame* parent, int titleId, const std::string& message)
    : Dialog(parent, 70, 10, 7), _titleId(titleId), _message(message) {}

int MessageDialog::Run() {
    SetTitle(_factory->GetString(_titleId));
    SetDescription(_message);
    SetFooter("{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}{/align}");
    Refresh();
    while (GetKey(true) != '\n') {
    }
    return true;
}

}  // namespace Velk
