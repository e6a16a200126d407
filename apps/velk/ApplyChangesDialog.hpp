// "Configure Management Network: Confirm": asked when the network window is
// left with changes. Y applies them, N drops them, Esc goes back to the menu
// with every edit kept. When IPv6 was turned on or off the question names a
// reboot of the host instead of a restart of the management network.
#pragma once

#include "Dialog.hpp"
#include "TextArea.hpp"

namespace Velk {

class ApplyChangesDialog : public Dialog {
public:
    ApplyChangesDialog(Frame* parent, bool reboot);

    // true for Y or N (with `apply` set for Y), false for Esc.
    int Run() override;

    bool reboot;
    bool apply = false;

private:
    TextArea* _question;  // owned by the window tree
};

}  // namespace Velk
