// "Network Restore Options": the ways back to a working management network.
// A factory restore of the network is always offered; when the management
// interface sits on a distributed switch, also moving the management network
// onto a new standard switch and giving it a new port on the distributed
// switch.
#pragma once

#include <vector>

#include "LabelItem.hpp"
#include "RootWindow.hpp"

namespace Velk {

class NetworkRestoreWindow : public RootWindow {
public:
    explicit NetworkRestoreWindow(Frame* parent);
    ~NetworkRestoreWindow() override;

    // true when left with Esc.
    int Run() override;
    // Redraws the description of the selected entry.
    void Update() override;

protected:
    void DrawContents() override;

private:
    void AddEntry(int textId, bool shown);
    void RemoveEntry(int textId);
    // Text number of the selected entry, -1 for none.
    int SelectedId() const;
    void OpenEntry(int textId);

    std::vector<LabelItem*> _items;  // owned
    std::vector<int> _ids;
};

}  // namespace Velk
