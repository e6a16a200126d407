// "Restore Network Factory Settings": F11 resets the host's network
// configuration to its defaults (in DoRestoreNetworkDialog); Esc leaves.
#pragma once

#include "Dialog.hpp"
#include "TextArea.hpp"

namespace Velk {

class RestoreNetworkDialog : public Dialog {
public:
    explicit RestoreNetworkDialog(Frame* parent);

    // false on Esc, true once the restore was attempted.
    int Run() override;

private:
    TextArea* _text;  // owned by the window tree
};

}  // namespace Velk
