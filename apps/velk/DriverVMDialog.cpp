#include "DriverVMDialog.hpp"

#include <syslog.h>

#include <string>

#include "MessageDialog.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

DriverVMDialog::DriverVMDialog(Frame* parent) : Dialog(parent, 76, 20, 7) {
    // Host errors leave the constructor: the base classes free the windows.
    _devices = QelCtl::Hardware::DriverVmInfoImpl().GetDevices();
    for (const auto& device : _devices)
        _items.push_back(new CheckItem(device.name + " (" + device.id + ")", device.owned));
    _list = NewContentList(std::vector<Item*>(_items.begin(), _items.end()));
}

DriverVMDialog::~DriverVMDialog() {
    delete _list;
    for (CheckItem* item : _items) delete item;
}

void DriverVMDialog::Draw() {
    SetTitle(_factory->GetString(73));
    SetDescription(_factory->GetString(74));
    SetFooter(TOGGLE_LIST_FOOTER);
    Refresh();
    _list->Draw();
}

void DriverVMDialog::ToggleCurrent() {
    if (_list->GetCurrentIndex() < 0) return;
    const size_t current = static_cast<size_t>(_list->GetCurrentIndex());
    const bool owned = !_items[current]->IsChecked();
    const std::string& group = _devices[current].group;

    std::vector<size_t> affected;
    for (size_t i = 0; i < _items.size(); ++i) {
        if (i != current && !group.empty() && _devices[i].group == group && _items[i]->IsChecked() != owned)
            affected.push_back(i);
    }
    if (!affected.empty()) {
        MessageDialog warning(this, 75, 76);
        warning.Execute();
    }
    _items[current]->SetChecked(owned);
    for (size_t i : affected) _items[i]->SetChecked(owned);
}

int DriverVMDialog::Run() {
    Draw();
    const auto toggle = [this] {
        ToggleCurrent();
        Draw();
    };
    const auto apply = [this]() -> std::optional<int> {
        std::vector<std::string> owned;
        std::string shown;
        for (size_t i = 0; i < _items.size(); ++i) {
            if (!_items[i]->IsChecked()) continue;
            owned.push_back(_devices[i].id);
            shown += (shown.empty() ? "" : ", ") + _devices[i].id;
        }
        QelCtl::Hardware::DriverVmInfoImpl().SetOwned(owned);
        HostCtl::Lib::Syslog(LOG_INFO, "DriverVM devices set to %s", shown.c_str());
        return 1;
    };
    return RunList(_list, toggle, apply);
}

}  // namespace Velk
