// The progress screen of a power action: powers the virtual machines off,
// starts the host's power command and stays on screen until the host goes
// down. Returns false only when the command could not be started.
#pragma once

#include "Dialog.hpp"

namespace Velk {

class PowerProgressDialog : public Dialog {
public:
    PowerProgressDialog(Frame* parent, bool keepRunningVms, int titleId, int headerId, const char* command);

    int Run() override;

    bool keepRunningVms;

private:
    int _titleId;
    int _headerId;
    const char* _command;
};

}  // namespace Velk
