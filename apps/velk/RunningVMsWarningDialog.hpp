// Asks whether to go on although virtual machines are running.
#pragma once

#include "Dialog.hpp"

namespace Velk {

class RunningVMsWarningDialog : public Dialog {
public:
    explicit RunningVMsWarningDialog(Frame* parent) : Dialog(parent, 60, 10, 7) {}

    int Run() override;
};

}  // namespace Velk
