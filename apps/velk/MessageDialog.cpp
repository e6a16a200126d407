#include "MessageDialog.hpp"

#include <algorithm>

#include "StringFactory.hpp"
#include "TextArea.hpp"

namespace Velk {

MessageDialog::MessageDialog(Frame* parent, int titleId, int messageId)
    : MessageDialog(parent, titleId, std::string(StringFactory::Get("en_US")->GetString(messageId))) {}

namespace {

constexpr int kWidth = 70;
// The title band holds the title and, three rows below it, the message.
constexpr int kBandRows = 4;
constexpr int kMessageRows = 3;

// Rows the message needs beyond the usual three (a long warning grows the
// dialog instead of being cut), as many as the screen allows.
int ExtraRows(const std::string& message) {
    const std::string laid =
        TextArea::Layout(message, kWidth - 6, [](const std::string&, std::string&) { return false; });
    const int lines = 1 + static_cast<int>(std::count(laid.begin(), laid.end(), '\n'));
    return std::clamp(lines - kMessageRows, 0, std::max(0, LINES - 10));
}

}  // namespace

MessageDialog::MessageDialog(Frame* parent, int titleId, const std::string& message)
    : Dialog(parent, kWidth, 10 + ExtraRows(message), kBandRows + kMessageRows + ExtraRows(message)),
      _titleId(titleId),
      _message(message) {}

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
