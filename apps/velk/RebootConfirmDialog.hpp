#pragma once

#include "PowerProgressDialog.hpp"

namespace Velk {

// Progress screen of the host's reboot.
class RebootConfirmDialog : public PowerProgressDialog {
public:
    RebootConfirmDialog(Frame* parent, bool keepRunningVms)
        : PowerProgressDialog(parent, keepRunningVms, 175, 176, "reboot") {}
};

}  // namespace Velk
