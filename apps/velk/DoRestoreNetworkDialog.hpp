// "Restore Network Settings": powers the running virtual machines off (after a
// warning), then clears the network configuration and configures the network
// as on a freshly installed host, with a line per step ending in "Done." or
// "Failed.". A failed power-off leaves the network alone. Enter closes it.
#pragma once

#include <string>

#include "Dialog.hpp"
#include "TextArea.hpp"

namespace Velk {

class DoRestoreNetworkDialog : public Dialog {
public:
    explicit DoRestoreNetworkDialog(Frame* parent);

    // false when the warning about running virtual machines was declined.
    int Run() override;

private:
    void Log(const std::string& text);

    TextArea* _log;  // owned by the window tree
};

}  // namespace Velk
