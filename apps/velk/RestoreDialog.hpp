// "Reset System Configuration": confirmed with F11, runs the host's reset
// script, then only Enter is left, which restarts the host.
#pragma once

#include "Dialog.hpp"
#include "TextArea.hpp"

namespace Velk {

class RestoreDialog : public Dialog {
public:
    explicit RestoreDialog(Frame* parent);

    int Run() override;

private:
    TextArea* _text;  // owned by the window tree
};

}  // namespace Velk
