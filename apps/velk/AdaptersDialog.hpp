// "Network Adapters": every physical NIC of the host with its hardware label,
// MAC address, link status and whether another connection uses it. The marked
// NICs are to carry the management network; D shows one NIC's details.
// Taking NICs that other connections use is confirmed first.
#pragma once

#include <string>
#include <vector>

#include "CheckItem.hpp"
#include "Dialog.hpp"
#include "ItemList.hpp"
#include "ManagementSwitch.hpp"
#include "TextArea.hpp"

namespace Velk {

class AdaptersDialog : public Dialog {
public:
    // `adapterList`: the management switch's uplinks in team order;
    // `switchName`: that switch, whose own uplinks count as unused.
    AdaptersDialog(Frame* parent, const std::vector<std::string>& adapterList, const std::string& switchName);
    ~AdaptersDialog() override;

    // true when confirmed (GetAdapterList then holds the new list), false for
    // Esc.
    int Run() override;

    // The marked NICs: those of the list given at construction in their team
    // order, then the newly marked ones in the order shown. Unchanged marks
    // give back the list as it was given.
    const std::vector<std::string>& GetAdapterList() const { return _adapterList; }
    // The NICs as read when the dialog was built.
    const std::vector<Adapter>& GetAdapters() const { return _adapters; }

    // The row of one NIC in mark-up: name, hardware label and MAC address,
    // status, and "(...)" when another connection than `switchName` uses it.
    static std::string RowText(const Adapter& adapter, const std::string& switchName);

private:
    void Draw();
    std::vector<std::string> MarkedList() const;
    bool Confirm();

    std::vector<std::string> _adapterList;
    std::string _switchName;
    std::vector<Adapter> _adapters;
    std::vector<CheckItem*> _items;  // owned
    TextArea* _columns;              // owned by the window tree
    ItemList* _list;
};

}  // namespace Velk
