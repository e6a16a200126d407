// "Configure Password": the logged-in user's old password, the new one and
// its confirmation, in masked fields; a valid change goes through PAM.
#pragma once

#include <string>

#include "Dialog.hpp"
#include "InputItem.hpp"
#include "ItemList.hpp"

namespace Velk {

class ChangePasswordDialog : public Dialog {
public:
    explicit ChangePasswordDialog(Frame* parent);
    ~ChangePasswordDialog() override;

    // 1 when the password was changed, 0 when the dialog was cancelled.
    int Run() override;

private:
    enum class Outcome { Changed, Retry };

    // Checks the fields and changes the password. Every copy of the secrets
    // is wiped before it returns.
    Outcome Submit();
    // Shows an error of "Configure Password" and wipes the fields from
    // `first` on, which then becomes the current field.
    void Reject(int textId, int first);
    void WipeFields(int first);
    void Draw();

    InputItem* _fields[3];
    ItemList* _list;
};

}  // namespace Velk
