// "Network Adapters: Warning": some of the marked NICs already serve other
// connections. Enter takes them over, Esc goes back to the adapter list.
#pragma once

#include "Dialog.hpp"
#include "TextArea.hpp"

namespace Velk {

class UsedAdaptersDialog : public Dialog {
public:
    explicit UsedAdaptersDialog(Frame* parent);

    // true for Enter, false for Esc.
    int Run() override;

private:
    TextArea* _question;  // owned by the window tree
};

}  // namespace Velk
