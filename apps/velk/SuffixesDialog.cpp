#include "SuffixesDialog.hpp"

#include <cctype>

#include "StringFactory.hpp"

namespace Velk {

namespace {

constexpr const char* kFooter =
    "{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
    "{color:dark-grey}Cancel{/color}{/align}";

}  // namespace

SuffixesDialog::SuffixesDialog(Frame* parent, const std::string& suffixLine)
    : Dialog(parent, 70, 14, 8), _line(suffixLine) {
    _field = new InputItem(_factory->GetString(129), suffixLine);
    _list = NewContentList({_field});
}

SuffixesDialog::~SuffixesDialog() {
    SetCursor(false);
    delete _list;
    delete _field;
}

void SuffixesDialog::Draw() {
    SetTitle(_factory->GetString(55));
    SetDescription(_factory->GetString(128));
    SetFooter(kFooter);
    Refresh();
    SetCursor(true);
    _list->Draw();
}

int SuffixesDialog::Run() {
    return RunForm([this] { Draw(); },
                   [this] {
                       _line = _field->GetText();
                       return true;
                   },
                   [this](int key) {
                       if (IsFieldKey(key) && _field->HandleKey(key)) _list->Draw();
                   });
}

bool SuffixesDialog::IsFieldKey(int key) {
    return (key >= 0 && key <= 255 && std::isalnum(key)) || key == ' ' || key == ',' || key == '.' ||
           key == '-' || InputItem::IsEditingKey(key);
}

}  // namespace Velk
