// "Troubleshooting Mode Options": switches the host's local shell and SSH
// services on and off, opens the shell and console timeout dialogs and the
// restart of the management agents. The services' states are read once, when
// the window is built; afterwards only the window's own switches change them.
#pragma once

#include <string>
#include <vector>

#include "Item.hpp"
#include "LabelItem.hpp"
#include "RootWindow.hpp"

namespace Velk {

class TroubleShootingWindow : public RootWindow {
public:
    explicit TroubleShootingWindow(Frame* parent);
    ~TroubleShootingWindow() override;

    // Runs Foreground.
    int Run() override;
    // The key loop; true when the user leaves with Esc.
    virtual bool Foreground();

    bool shellEnabled;  // the local shell service runs
    bool sshEnabled;    // the SSH service runs

protected:
    void DrawContents() override;

private:
    enum Entry { SHELL = 0, SSH, TIMEOUTS, VELK_TIMEOUT, RESTART_AGENTS, ENTRY_COUNT };
    // What a switch asks of the host for one service.
    struct Service;

    // Construction.
    static bool IsRunning(const char* initScript);

    // Drawing.
    std::string EntryLabel(int entry) const;
    void DrawDescription();
    std::string Description(int entry) const;
    // The menu's item for `entry` as a label item, or null.
    LabelItem* EntryItem(int entry) const;

    // Actions.
    void Switch(const Service& service, bool& enabled);
    // Runs a host-agent command for the logged-in user; its status.
    static int AgentCommand(const char* command);
    static void UpdateSshFirewall(bool enabled);
    void OpenEntry(int entry);

    std::vector<Item*> _items;  // owned; label items, one per entry
};

}  // namespace Velk
