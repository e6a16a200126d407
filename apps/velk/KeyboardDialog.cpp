#include "KeyboardDialog.hpp"

#include <syslog.h>

#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

KeyboardDialog::KeyboardDialog(Frame* parent) : Dialog(parent, 76, 18, 6) {
    // Host errors leave the constructor: the base classes free the windows.
    const std::string current = _systemInfo.GetKeyboardLayout();
    _layouts = _systemInfo.GetKeyboardLayouts();
    // When the current layout is not offered, nothing is marked and Enter
    // applies the first layout unless Space marks another.
    for (size_t i = 0; i < _layouts.size(); ++i) {
        const bool marked = _layouts[i] == current;
        _items.push_back(new RadioItem(_layouts[i], marked));
        if (marked) _checkedIndex = i;
    }
    _list = NewContentList(std::vector<Item*>(_items.begin(), _items.end()));
}

KeyboardDialog::~KeyboardDialog() {
    delete _list;
    for (RadioItem* item : _items) delete item;
}

int KeyboardDialog::Run() {
    SetTitle(_factory->GetString(16));
    SetDescription(_factory->GetString(255));
    _list->Draw();
    SetFooter(TOGGLE_LIST_FOOTER);
    Refresh();
    const auto mark = [this] {
        const int current = _list->GetCurrentIndex();
        if (current < 0) return;
        _items[_checkedIndex]->SetSelected(false);
        _checkedIndex = static_cast<size_t>(current);
        _items[_checkedIndex]->SetSelected(true);
        _list->Draw();
    };
    const auto apply = [this]() -> std::optional<int> {
        if (_layouts.empty()) return std::nullopt;
        // The marked layout is applied, not the one under the cursor, and
        // the host is told again even when nothing changed.
        const std::string& layout = _layouts[_checkedIndex];
        _systemInfo.SetKeyboardLayout(layout);
        _systemInfo.LoadKeyboardMappings(layout);
        HostCtl::Lib::Syslog(LOG_INFO, "Keyboard Layout changed to %s", layout.c_str());
        return 1;
    };
    return RunList(_list, mark, apply);
}

}  // namespace Velk
