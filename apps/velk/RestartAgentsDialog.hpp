// "Restart Management Agents": after F11, stops and starts the host's
// management agents, showing each step in a small progress log. With the
// check box set, a live core of the host agent is taken first, on a thread of
// its own that nobody waits for: the agents are stopped while the core may
// still be written.
#pragma once

#include <string>
#include <vector>

#include "CheckItem.hpp"
#include "Dialog.hpp"
#include "ItemList.hpp"
#include "TextArea.hpp"

namespace Velk {

class RestartAgentsDialog : public Dialog {
public:
    explicit RestartAgentsDialog(Frame* parent);
    ~RestartAgentsDialog() override;

    // false for Esc before F11; true once the restart has run and Enter was
    // pressed.
    int Run() override;

    // Body of the live-core thread (the argument is not used; the result is
    // null). Uses only the system log and the host control library.
    static void* GenerateCoradLiveCore(void*);

private:
    // Drawing.
    void DrawConfirmation();
    // The finished steps in dark grey, then `running` in black.
    void ShowLog(const std::string& running);

    // Keys: true for F11, false for Esc.
    bool Confirm();

    // Actions.
    void Restart();
    void StartLiveCore();
    // Shows the step as running, runs the command line, marks it done.
    void Step(int textId, const char* commandLine);
    void AddFinished(int textId);

    TextArea* _log;             // owned by the window tree
    std::vector<Item*> _items;  // owned: the check item
    CheckItem* _collect;
    ItemList* _list;
    std::string _finished;  // finished lines, each ended by a line break
};

}  // namespace Velk
