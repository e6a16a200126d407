// "Shut Down/Restart": F2 shuts the host down, F11 restarts it; the check
// item makes running virtual machines be terminated forcefully.
#pragma once

#include "CheckItem.hpp"
#include "Dialog.hpp"
#include "ItemList.hpp"

namespace Velk {

class ShutdownDialog : public Dialog {
public:
    explicit ShutdownDialog(Frame* parent);
    ~ShutdownDialog() override;

    int Run() override;

private:
    CheckItem* _force;
    ItemList* _list;
};

}  // namespace Velk
