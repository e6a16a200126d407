#include "DvsUplinksDialog.hpp"

#include <algorithm>

#include "QuestionDialog.hpp"
#include "StringFactory.hpp"
#include "TextArea.hpp"

namespace Velk {

DvsUplinksDialog::DvsUplinksDialog(Frame* parent,
                                   const std::vector<HostCtl::Network::DistributedSwitch::UplinkPort>& ports,
                                   const std::vector<std::string>& marked)
    : Dialog(parent, 70, 16, 6), _ports(ports) {
    for (const auto& port : _ports)
        _items.push_back(new CheckItem(TextArea::Escape(PortText(port)),
                                       std::find(marked.begin(), marked.end(), port.key) != marked.end()));
    _list = NewContentList(std::vector<Item*>(_items.begin(), _items.end()));
}

DvsUplinksDialog::~DvsUplinksDialog() {
    delete _list;
    for (CheckItem* item : _items) delete item;
}

std::string DvsUplinksDialog::PortText(const HostCtl::Network::DistributedSwitch::UplinkPort& port) {
    return port.key + " (" + port.pnic + ")";
}

std::vector<std::string> DvsUplinksDialog::GetMarked() const {
    std::vector<std::string> keys;
    for (size_t i = 0; i < _ports.size(); ++i)
        if (_items[i]->IsChecked()) keys.push_back(_ports[i].key);
    return keys;
}

void DvsUplinksDialog::Draw() {
    SetTitle(_factory->GetString(200));
    SetDescription(_factory->GetString(201));
    SetFooter(TOGGLE_LIST_FOOTER);
    Refresh();
    _list->Draw();
}

int DvsUplinksDialog::Run() {
    Draw();
    return RunList(
        _list,
        [this] {
            const int current = _list->GetCurrentIndex();
            if (current < 0) return;
            CheckItem* item = _items[static_cast<size_t>(current)];
            item->SetChecked(!item->IsChecked());
            _list->Draw();
        },
        [this]() -> std::optional<int> {
            if (!GetMarked().empty() || QuestionDialog(this, 202, 203, 204).Execute()) return 1;
            Draw();
            return std::nullopt;
        });
}

}  // namespace Velk
