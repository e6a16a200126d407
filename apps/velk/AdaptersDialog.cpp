#include "AdaptersDialog.hpp"

#include <algorithm>

#include "AdapterInfoDialog.hpp"
#include "DisplayWidth.hpp"
#include "MessageDialog.hpp"
#include "QuestionDialog.hpp"
#include "StringFactory.hpp"

namespace Velk {

namespace {

const char* const COLUMNS =
    "    {align:padding:13}Device Name{/align}{align:padding:30}Hardware Label (MAC Address){/align}Status";

const char* const FOOTER =
    "{color:black}<D>{/color} {color:dark-grey}View Details{/color}  {color:black}<Space>{/color} "
    "{color:dark-grey}Toggle Selected{/color}{align:right}{color:black}<Enter>{/color} "
    "{color:dark-grey}OK{/color}"
    "  {color:black}<Esc>{/color} {color:dark-grey}Cancel{/color}{/align}";

bool Contains(const std::vector<std::string>& list, const std::string& name) {
    return std::find(list.begin(), list.end(), name) != list.end();
}

}  // namespace

AdaptersDialog::AdaptersDialog(Frame* parent, const std::vector<std::string>& adapterList,
                               const std::string& switchName)
    : Dialog(parent, 78, 20, 7),
      _adapterList(adapterList),
      _switchName(switchName),
      _adapters(ReadAdapters()) {
    for (const Adapter& adapter : _adapters)
        _items.push_back(new CheckItem(RowText(adapter, _switchName), Contains(_adapterList, adapter.name)));
    // The column heads sit over the rows' text, which starts one column into
    // the list.
    _columns = new TextArea(_content, 1, 0, _content->GetWidth() - 2, 1, BLACK, COLUMNS);
    _list = new ItemList(_content, 0, 1, _content->GetWidth(), _content->GetHeight() - 1);
    _list->SetItems(std::vector<Item*>(_items.begin(), _items.end()));
}

AdaptersDialog::~AdaptersDialog() {
    delete _list;
    for (CheckItem* item : _items) delete item;
}

std::string AdaptersDialog::RowText(const Adapter& adapter, const std::string& switchName) {
    // Lengths are screen columns: a label may hold wide characters, and a
    // cut never splits a character.
    const std::string name =
        DisplayColumns(adapter.name) < 12 ? adapter.name : CutToColumns(adapter.name, 8) + "...";
    const std::string label =
        DisplayColumns(adapter.label) <= 14 ? adapter.label : CutToColumns(adapter.label, 11) + "...";
    std::string mac = adapter.mac;
    const int labelColumns = DisplayColumns(label);
    if (labelColumns + DisplayColumns(mac) >= 26) {
        const size_t keep = std::min(mac.size(), size_t(22 - labelColumns));
        mac = "..." + mac.substr(mac.size() - keep);
    }
    return "{align:padding:13}" + TextArea::Escape(name) + "{/align}{align:padding:30}" +
           TextArea::Escape(label) + " (" + TextArea::Escape(mac) + "){/align}" +
           (adapter.connected ? "Connected" : "Disconnected") + " " +
           (adapter.IsUsedElsewhere(switchName) ? "(...)" : "");
}

void AdaptersDialog::Draw() {
    SetTitle(_factory->GetString(77));
    SetDescription(_factory->GetString(78));
    SetFooter(FOOTER);
    _columns->SetText(COLUMNS);
    Refresh();
    _list->Draw();
}

int AdaptersDialog::Run() {
    Draw();
    for (;;) {
        const int key = GetKey(true);
        const int current = _list->GetCurrentIndex();
        switch (key) {
            case KEY_UP:
                _list->Up();
                break;
            case KEY_DOWN:
                _list->Down();
                break;
            case ' ':
                if (current < 0) break;
                _items[size_t(current)]->SetChecked(!_items[size_t(current)]->IsChecked());
                _list->Draw();
                break;
            case 'd':
            case 'D':
                if (current < 0) break;
                AdapterInfoDialog(this, _adapters[size_t(current)]).Execute();
                Draw();
                break;
            case '\n':
                if (Confirm()) return true;
                Draw();
                break;
            case 27:
                return false;
            default:
                break;
        }
    }
}

std::vector<std::string> AdaptersDialog::MarkedList() const {
    auto marked = [&](const std::string& name) {
        for (size_t i = 0; i < _adapters.size(); ++i)
            if (_adapters[i].name == name) return _items[i]->IsChecked();
        return false;
    };
    std::vector<std::string> list;
    for (const std::string& name : _adapterList)
        if (marked(name)) list.push_back(name);
    for (size_t i = 0; i < _adapters.size(); ++i)
        if (_items[i]->IsChecked() && !Contains(list, _adapters[i].name)) list.push_back(_adapters[i].name);
    return list;
}

// Accepts the marks, asking first when a marked NIC serves another
// connection. Without any mark the management network would lose every
// uplink: that is refused.
bool AdaptersDialog::Confirm() {
    const std::vector<std::string> list = MarkedList();
    if (list.empty()) {
        MessageDialog(this, 79, 283).Execute();
        return false;
    }
    const bool takesUsed = std::any_of(_adapters.begin(), _adapters.end(), [&](const Adapter& adapter) {
        return Contains(list, adapter.name) && adapter.IsUsedElsewhere(_switchName);
    });
    if (takesUsed && !QuestionDialog(this, 79, 80, 81).Execute()) return false;
    _adapterList = list;
    return true;
}

}  // namespace Velk
