// "Restore kDS": gives the management interface a new port on its
// distributed switch, a port that lives on this host only, with the
// properties entered in its dialog (VLAN, blocking, uplinks; the rest as
// defaults), and moves the interface onto it. A failed step puts the
// interface back on its old port and takes the new port away again.
#pragma once

#include <memory>
#include <string>

#include "SwitchRestoreDialog.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class RestoreDvsDialog : public SwitchRestoreDialog {
public:
    explicit RestoreDvsDialog(Frame* parent);

    // true when the management interface was moved to a new port.
    int Run() override;

private:
    void CreatePort(const HostCtl::Network::DistributedSwitch::PortSettings& settings);
    void MoveInterface();
    void ShowAddress();

    std::string _portKey;
    std::string _newPortKey;
};

}  // namespace Velk
