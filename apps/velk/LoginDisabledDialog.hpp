// Shown instead of the login when the host has switched console logins off.
#pragma once

#include "Dialog.hpp"

namespace Velk {

class LoginDisabledDialog : public Dialog {
public:
    explicit LoginDisabledDialog(Frame* parent);

    int Run() override;
};

}  // namespace Velk
