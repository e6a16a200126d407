#include "NetworkRestoreWindow.hpp"

#include <algorithm>
#include <cstdint>

#include "ManagementInterface.hpp"
#include "RestoreDvsDialog.hpp"
#include "RestoreNetworkDialog.hpp"
#include "RestoreStandardSwitchDialog.hpp"
#include "StringFactory.hpp"

namespace Velk {

namespace {

constexpr int RESTORE_NETWORK = 67;
constexpr int RESTORE_STANDARD_SWITCH = 68;
constexpr int RESTORE_DVS = 69;

}  // namespace

NetworkRestoreWindow::NetworkRestoreWindow(Frame* parent) : RootWindow(parent) {
    AddEntry(RESTORE_NETWORK, true);
    const bool onDvs = IsManagementInterfaceOnDvs();
    AddEntry(RESTORE_STANDARD_SWITCH, onDvs);
    AddEntry(RESTORE_DVS, onDvs);
    _menu->SetItems(std::vector<Item*>(_items.begin(), _items.end()));
    if (!onDvs) {
        RemoveEntry(RESTORE_STANDARD_SWITCH);
        RemoveEntry(RESTORE_DVS);
    }
}

NetworkRestoreWindow::~NetworkRestoreWindow() {
    for (LabelItem* item : _items) delete item;
}

void NetworkRestoreWindow::AddEntry(int textId, bool shown) {
    auto* item = new LabelItem(_factory->GetString(textId));
    item->SetActive(shown);
    _items.push_back(item);
    _ids.push_back(textId);
}

void NetworkRestoreWindow::RemoveEntry(int textId) {
    const int selected = _menu->GetCurrentIndex();
    size_t removed = SIZE_MAX;
    for (size_t i = 0; i < _ids.size(); ++i) {
        if (_ids[i] != textId) continue;
        delete _items[i];
        _items.erase(_items.begin() + static_cast<std::ptrdiff_t>(i));
        _ids.erase(_ids.begin() + static_cast<std::ptrdiff_t>(i));
        removed = i;
        break;
    }
    // The first entry is always there, so the list keeps a selection. A
    // selected entry that goes hands the selection on to the one after it
    // (the one before it when it was the last).
    _menu->SetItems(std::vector<Item*>(_items.begin(), _items.end()));
    if (selected < 0) return;
    int keep = selected;
    if (static_cast<size_t>(selected) > removed) --keep;
    _menu->SetCurrent(std::min(keep, static_cast<int>(_items.size()) - 1));
}

int NetworkRestoreWindow::SelectedId() const {
    const int index = _menu->GetCurrentIndex();
    return index < 0 ? -1 : _ids[static_cast<size_t>(index)];
}

// Drawing.

void NetworkRestoreWindow::DrawContents() {
    SetLeftTitle(_factory->GetString(66));
    SetLeftFooter("{color:black}<Up/Down>{/color} {color:dark-grey}Select{/color}");
    _menu->Draw();
    Update();
}

void NetworkRestoreWindow::Update() {
    const int id = SelectedId();
    if (id < 0) return;
    SetRightTitle(_factory->GetString(id));
    switch (id) {
        case RESTORE_NETWORK:
            _description->SetText(_factory->GetString(70));
            SetRightFooter(
                "{color:white}<Enter>{/color} "
                "{color:light-grey}Restart{align:right}{color:white}<Esc>{/color}"
                "{color:light-grey} Log Out{/color}{/align}");
            break;
        default:
            _description->SetText(_factory->GetString(id == RESTORE_DVS ? 72 : 71));
            SetRightFooter(
                "{color:white}<Enter>{/color}{color:light-grey} "
                "Restore{/color}{align:right}{color:white}<Esc>"
                "{/color}{color:light-grey} Log Out{/color}{/align}");
            break;
    }
    Refresh();
}

// Keys.

int NetworkRestoreWindow::Run() {
    Draw();
    return RunMenu([this] { Update(); },
                   [this](int) {
                       OpenEntry(SelectedId());
                       Draw();
                   },
                   [] { return true; });
}

// Actions.

void NetworkRestoreWindow::OpenEntry(int textId) {
    switch (textId) {
        case RESTORE_NETWORK:
            RestoreNetworkDialog(this).Execute();
            break;
        case RESTORE_STANDARD_SWITCH:
            // Once the management network is on a standard switch, there is
            // nothing left to move.
            if (RestoreStandardSwitchDialog(this).Execute()) RemoveEntry(RESTORE_STANDARD_SWITCH);
            break;
        case RESTORE_DVS:
            RestoreDvsDialog(this).Execute();
            break;
        default:
            break;
    }
}

}  // namespace Velk
