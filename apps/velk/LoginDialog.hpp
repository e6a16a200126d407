// The gate to every logged-in screen: a login name and password (or a smart
// card's login id and PIN) checked through PAM. On the local console a first
// row leads to the keyboard layout.
#pragma once

#include <string>
#include <vector>

#include "Dialog.hpp"
#include "InputItem.hpp"
#include "ItemList.hpp"
#include "LabelItem.hpp"

namespace Velk {

class LoginDialog : public Dialog {
public:
    explicit LoginDialog(Frame* parent);
    ~LoginDialog() override;

    // 1 when a user logged in, 0 when the user left with Esc.
    int Run() override;

    // The name entered; valid after Run returned 1.
    std::string loginName;

private:
    void SetMode(bool pinMode);
    std::string KeyboardLabel();
    void Submit();

    LabelItem* _keyboard = nullptr;  // local console only
    InputItem* _name;
    InputItem* _secret;
    ItemList* _list;
    std::vector<Item*> _items;
    bool _pinMode = false;
};

}  // namespace Velk
