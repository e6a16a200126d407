// "Restart Management Network: Confirm": F11 takes the management interface
// down and up again (in DoRestartNetworkDialog); Esc leaves. Enter does
// nothing here: the restart interrupts the network.
#pragma once

#include <memory>

#include "Dialog.hpp"
#include "TextArea.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class RestartNetworkDialog : public Dialog {
public:
    RestartNetworkDialog(Frame* parent, std::unique_ptr<HostCtl::Network::QelNic> mgmt);

    // true when the restart was performed, false on Esc.
    int Run() override;

private:
    std::unique_ptr<HostCtl::Network::QelNic> _mgmtIntf;
    TextArea* _question;  // owned by the window tree
};

}  // namespace Velk
