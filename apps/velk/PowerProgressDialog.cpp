#include "PowerProgressDialog.hpp"

#include "CommandRunner.hpp"
#include "StringFactory.hpp"

namespace Velk {

PowerProgressDialog::PowerProgressDialog(Frame* parent, bool keepRunningVms, int titleId, int headerId,
                                         const char* command)
    : Dialog(parent, 70, 10, 7),
      keepRunningVms(keepRunningVms),
      _titleId(titleId),
      _headerId(headerId),
      _command(command) {}

int PowerProgressDialog::Run() {
    SetTitle(_factory->GetString(_titleId));
    SetDescription(_factory->GetString(_headerId));
    Refresh();
    PowerOffVms(keepRunningVms);
    if (RunShellCommand(_command) == -1) return false;
    // The host is going down; nothing is left to do but wait for it.
    for (;;) GetKey(false);
}

}  // namespace Velk
