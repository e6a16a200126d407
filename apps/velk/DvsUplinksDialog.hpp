// "kDS Uplinks": the uplink ports of the distributed switch that a NIC of
// this host backs, one check row each ("uplink1 (zonic0)"). The marked ones
// are to carry the new port's traffic; going on with none marked is asked
// first, and leaves the choice to the switch.
#pragma once

#include <string>
#include <vector>

#include "CheckItem.hpp"
#include "Dialog.hpp"
#include "ItemList.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class DvsUplinksDialog : public Dialog {
public:
    // `ports`: the uplink ports offered; `marked`: the keys marked at first.
    DvsUplinksDialog(Frame* parent, const std::vector<HostCtl::Network::DistributedSwitch::UplinkPort>& ports,
                     const std::vector<std::string>& marked);
    ~DvsUplinksDialog() override;

    // true for OK (GetMarked then holds the choice), false for Esc.
    int Run() override;
    // Keys of the marked ports, in the order shown.
    std::vector<std::string> GetMarked() const;

    // "uplink1 (zonic0)".
    static std::string PortText(const HostCtl::Network::DistributedSwitch::UplinkPort& port);

private:
    void Draw();

    std::vector<HostCtl::Network::DistributedSwitch::UplinkPort> _ports;
    std::vector<CheckItem*> _items;  // owned
    ItemList* _list;
};

}  // namespace Velk
