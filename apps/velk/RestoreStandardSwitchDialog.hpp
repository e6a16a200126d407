// "Restore Standard Switch": moves the management network off its
// distributed switch onto a new standard switch: a management port group with
// the distributed port's VLAN, the distributed switch's uplinks on this host,
// and the management interface with its IP settings. The host's other
// interfaces are disabled, as they may depend on the distributed switch.
// Each NIC leaves the distributed switch only for the new switch: when the
// new switch does not take it, it goes back; a failed step undoes the ones
// before it. Without an uplink on this host there is nothing to move.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "SwitchRestoreDialog.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class RestoreStandardSwitchDialog : public SwitchRestoreDialog {
public:
    explicit RestoreStandardSwitchDialog(Frame* parent);

    // true when the management network was moved.
    int Run() override;

    // The first of `base` followed by first, first + 1, ... ("kSwitch0") that
    // `taken` does not hold.
    static std::string FreeName(const std::vector<std::string>& taken, const std::string& base, int first);

private:
    void ReadManagementNetwork();
    void CreateSwitch();
    void AddPortGroup();
    bool MoveUplinks();
    void MoveUplink(const HostCtl::Network::DistributedSwitch::UplinkPort& port, bool standby);
    void MoveInterface();
    void DisableOtherInterfaces();

    uint16_t _vlanId = 0;
    std::string _portKey;
    std::vector<HostCtl::Network::DistributedSwitch::UplinkPort> _uplinks;
    bool _noUplinks = false;
    unsigned _maxActive = 0;
    std::string _switchName;
    std::string _portGroup;
};

}  // namespace Velk
