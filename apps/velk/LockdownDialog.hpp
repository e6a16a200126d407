// "Configure Lockdown Mode": one check box with the host agent's lockdown
// setting, asked afresh each time the dialog opens. Enter asks the agent to
// enter or leave lockdown mode when the box differs from what was read; a
// failure is only logged, with the agent tool's own error text.
#pragma once

#include "CheckItem.hpp"
#include "Dialog.hpp"
#include "ItemList.hpp"

namespace Velk {

class LockdownDialog : public Dialog {
public:
    explicit LockdownDialog(Frame* parent);
    ~LockdownDialog() override;

    // 1 after Enter (also when nothing changed or the change failed), 0 for Esc.
    int Run() override;

    // The setting as the agent reported it, updated after a change.
    bool enabled;

private:
    void Draw();
    // Asks the agent to enter (`enable`) or leave lockdown mode.
    void Change(bool enable);

    CheckItem* _item;
    ItemList* _list;
};

}  // namespace Velk
