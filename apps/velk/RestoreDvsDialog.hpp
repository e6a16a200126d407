// "Restore kDS": gives the management interface a new port on its
// distributed switch: a port that lives on this host only, cloned from the
// management port (VLAN and the other properties), and moves the interface
// onto it.
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
    void ReadManagementPort();

    std::string _portKey;
    std::string _newPortKey;
};

}  // namespace Velk
