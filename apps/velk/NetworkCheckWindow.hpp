// "Check Management Network": the checks of the management network after a
// change, each with its result. After a change that failed a check it counts
// down a minute (any key starts the count again) and offers to keep the
// change anyway (F11) or to put the previous configuration back (Enter); Esc
// and the end of the count put it back too. After a put-back configuration
// that failed a check too, it offers the factory network restore instead.
#pragma once

#include <vector>

#include "Dialog.hpp"
#include "TextArea.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

class NetworkCheckWindow : public Dialog {
public:
    enum Stage { CHANGED, REVERTED };
    enum Choice { REVERT = 0, KEEP = 1, RESTORE_FACTORY = 2, LEAVE = 3 };

    NetworkCheckWindow(Frame* parent, Stage stage, const std::vector<QelCtl::Network::NetworkCheck>& checks);

    // CHANGED: KEEP or REVERT. REVERTED: RESTORE_FACTORY or LEAVE.
    int Run() override;

    static constexpr int kCountdownSeconds = 60;

private:
    static int Height(size_t checks);
    void DrawChecks();
    void DrawCountdown(int seconds);

    int RunCountdown();
    int RunReverted();

    Stage _stage;
    std::vector<QelCtl::Network::NetworkCheck> _checks;
    TextArea* _list;       // owned by the window tree
    TextArea* _countdown;  // owned by the window tree
};

}  // namespace Velk
