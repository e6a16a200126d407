#pragma once

#include "PowerProgressDialog.hpp"

namespace Velk {

// Progress screen of the host's poweroff.
class ShutdownConfirmDialog : public PowerProgressDialog {
public:
    ShutdownConfirmDialog(Frame* parent, bool keepRunningVms)
        : PowerProgressDialog(parent, keepRunningVms, 171, 172, "poweroff") {}
};

}  // namespace Velk
