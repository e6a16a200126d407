#include "DvsPortDialog.hpp"

#include <algorithm>
#include <charconv>

#include "DvsUplinksDialog.hpp"
#include "MessageDialog.hpp"
#include "StringFactory.hpp"
#include "TextArea.hpp"
#include "VlanDialog.hpp"

namespace Velk {

namespace {

constexpr int kVlanLength = 5;

constexpr const char* kFooter =
    "{color:black}<Up/Down>{/color} {color:dark-grey}Select{/color}  {color:black}<Space>{/color} "
    "{color:dark-grey}Change Selected{/color}{align:right}{color:black}<Enter>{/color} "
    "{color:dark-grey}OK{/color}  {color:black}<Esc>{/color} {color:dark-grey}Cancel{/color}{/align}";

}  // namespace

DvsPortDialog::DvsPortDialog(Frame* parent, const PortSettings& present, const std::vector<UplinkPort>& ports)
    : Dialog(parent, 74, 14, 6), _present(present), _settings(present), _ports(ports) {
    // The uplinks the port uses now, as far as this host backs them; a port
    // that leaves them to the switch uses all of them.
    std::vector<std::string> used;
    for (const UplinkPort& port : _ports) {
        const auto& chosen = present.uplinks;
        if (chosen.empty() || std::find(chosen.begin(), chosen.end(), port.key) != chosen.end())
            used.push_back(port.key);
    }
    _settings.uplinks = used;
    _vlan = new InputItem(_factory->GetString(282), present.vlanId == 0 ? "" : std::to_string(present.vlanId),
                          kVlanLength);
    _vlan->SetMaxLength(kVlanLength);
    _unblock = new CheckItem(_factory->GetString(192), true);
    _uplinks = new LabelItem(UplinksText());
    _list = NewContentList({_vlan, _unblock, _uplinks});
}

DvsPortDialog::~DvsPortDialog() {
    SetCursor(false);
    delete _list;
    delete _vlan;
    delete _unblock;
    delete _uplinks;
}

std::string DvsPortDialog::UplinksText() const {
    std::string names;
    for (const UplinkPort& port : _ports) {
        const auto& chosen = _settings.uplinks;
        if (std::find(chosen.begin(), chosen.end(), port.key) == chosen.end()) continue;
        names += (names.empty() ? "" : ", ") + DvsUplinksDialog::PortText(port);
    }
    return std::string(_factory->GetString(193)) + ": " +
           TextArea::Escape(names.empty() ? _factory->GetString(120) : names);
}

void DvsPortDialog::Draw() {
    SetTitle(_factory->GetString(195));
    SetDescription(_factory->GetString(196));
    SetFooter(kFooter);
    Refresh();
    SetCursor(_list->GetCurrentIndex() == VLAN_ROW);
    _list->Draw();
}

int DvsPortDialog::Run() {
    return RunForm([this] { Draw(); }, [this] { return Accept(); },
                   [this](int key) {
                       const int row = _list->GetCurrentIndex();
                       switch (key) {
                           case KEY_UP:
                               _list->Up();
                               break;
                           case KEY_DOWN:
                               _list->Down();
                               break;
                           case ' ':
                               if (row == UNBLOCK_ROW) _unblock->SetChecked(!_unblock->IsChecked());
                               if (row == UPLINKS_ROW) ChooseUplinks();
                               break;
                           default:
                               if (row == VLAN_ROW && VlanDialog::IsFieldKey(key)) _vlan->HandleKey(key);
                               break;
                       }
                       SetCursor(_list->GetCurrentIndex() == VLAN_ROW);
                       _list->Draw();
                   });
}

void DvsPortDialog::ChooseUplinks() {
    DvsUplinksDialog dialog(this, _ports, _settings.uplinks);
    if (dialog.Execute()) {
        _settings.uplinks = dialog.GetMarked();
        _uplinks->SetText(UplinksText());
    }
    Draw();
}

bool DvsPortDialog::Accept() {
    const std::string& text = _vlan->GetText();
    const VlanDialog::Entry entry = VlanDialog::CheckText(text);
    if (entry == VlanDialog::Entry::Invalid || entry == VlanDialog::Entry::AllVlans) {
        // The text stays, selected: the next digit replaces it.
        _vlan->SetText(std::string(text));
        _list->SetCurrent(VLAN_ROW);
        MessageDialog(this, 96, 194).Execute();
        return false;
    }
    unsigned long value = 0;
    if (entry == VlanDialog::Entry::Accepted) std::from_chars(text.data(), text.data() + text.size(), value);
    _settings.vlanId = static_cast<uint16_t>(value);
    // Marked: the default, unblocked; unmarked: as the port is now.
    _settings.blocked = _unblock->IsChecked() ? false : _present.blocked;
    return true;
}

}  // namespace Velk
