#include "VlanDialog.hpp"

#include <charconv>

#include "MessageDialog.hpp"
#include "StringFactory.hpp"

namespace Velk {

namespace {

constexpr int kFieldLength = 5;
constexpr uint16_t kAllVlans = 4095;

constexpr const char* kFooter =
    "{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
    "{color:dark-grey}Cancel{/color}{/align}";

// The whole text as a decimal number; false for anything else (an empty text,
// a sign, other characters, a value too large to hold).
bool ParseDecimal(const std::string& text, unsigned long& value) {
    const char* end = text.data() + text.size();
    const auto [stop, error] = std::from_chars(text.data(), end, value);
    return error == std::errc() && stop == end;
}

}  // namespace

VlanDialog::VlanDialog(Frame* parent, uint16_t vlanId) : Dialog(parent, 70, 12, 6), _vlanId(vlanId) {
    _field = new InputItem(_factory->GetString(100), vlanId == 0 ? "" : std::to_string(vlanId), kFieldLength);
    _field->SetMaxLength(kFieldLength);
    _list = NewContentList({_field});
}

VlanDialog::~VlanDialog() {
    SetCursor(false);
    delete _list;
    delete _field;
}

uint16_t VlanDialog::GetVlanId() const { return _vlanId; }

void VlanDialog::Draw() {
    SetTitle(_factory->GetString(49));
    SetDescription(_factory->GetString(99));
    SetFooter(kFooter);
    Refresh();
    SetCursor(true);
    _list->Draw();
}

int VlanDialog::Run() {
    return RunForm([this] { Draw(); }, [this] { return Accept(); },
                   [this](int key) {
                       if (IsFieldKey(key) && _field->HandleKey(key)) _list->Draw();
                   });
}

bool VlanDialog::Accept() {
    const std::string& text = _field->GetText();
    switch (CheckText(text)) {
        case Entry::Unset:
            _vlanId = 0;
            return true;
        case Entry::Invalid: {
            // The text stays, selected: the next digit replaces it, the
            // editing keys correct it.
            _field->SetText(std::string(_field->GetText()));
            MessageDialog error(this, 96, 97);
            error.Execute();
            return false;
        }
        case Entry::AllVlans: {
            MessageDialog warning(this, 114, 98);
            warning.Execute();
            _vlanId = kAllVlans;
            return true;
        }
        case Entry::Accepted: {
            unsigned long value = 0;
            ParseDecimal(text, value);
            _vlanId = static_cast<uint16_t>(value);
            return true;
        }
    }
    return false;
}

VlanDialog::Entry VlanDialog::CheckText(const std::string& text) {
    if (text.empty()) return Entry::Unset;
    unsigned long value = 0;
    // Unsigned arithmetic: 0 wraps round to the largest value and fails too.
    if (!ParseDecimal(text, value) || value - 1 >= kAllVlans) return Entry::Invalid;
    return value == kAllVlans ? Entry::AllVlans : Entry::Accepted;
}

bool VlanDialog::IsFieldKey(int key) { return (key >= '0' && key <= '9') || InputItem::IsEditingKey(key); }

}  // namespace Velk
