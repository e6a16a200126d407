// "Custom DNS Suffixes": the search domains as one line, separated by blanks
// or commas. Not validated here.
#pragma once

#include <string>

#include "Dialog.hpp"
#include "InputItem.hpp"
#include "ItemList.hpp"

namespace Velk {

class SuffixesDialog : public Dialog {
public:
    SuffixesDialog(Frame* parent, const std::string& suffixLine);
    ~SuffixesDialog() override;

    // true for OK (GetSuffixLine then holds the line as typed), false for Esc.
    int Run() override;
    const std::string& GetSuffixLine() const { return _line; }

    // The keys the line takes: letters, digits, blank, ",", ".", "-" and the
    // editing keys.
    static bool IsFieldKey(int key);

private:
    void Draw();

    std::string _line;
    InputItem* _field;
    ItemList* _list;
};

}  // namespace Velk
