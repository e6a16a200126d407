// Asks whether to keep a new password that is the same as the old one.
#pragma once

#include "Dialog.hpp"

namespace Velk {

class PasswordWarningDialog : public Dialog {
public:
    explicit PasswordWarningDialog(Frame* parent) : Dialog(parent, 60, 10, 7) {}
    // true: go on with the change (Enter); false: back to editing (Esc).
    int Run() override;
};

}  // namespace Velk
