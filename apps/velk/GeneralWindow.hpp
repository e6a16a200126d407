// "System Customization": the menu shown after a successful log-in. Each entry
// opens the screen that configures one part of the host; the right pane
// describes the selected entry, shows the support information pages and the
// list of system logs.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "LabelItem.hpp"
#include "LogViewer.hpp"
#include "RootWindow.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class GeneralWindow : public RootWindow {
public:
    explicit GeneralWindow(Frame* parent);
    ~GeneralWindow() override;

    // Returns 1 on Esc: the caller logs the user out.
    int Run() override;
    // Rebuilds the right pane for the selected entry.
    void Update() override;

    // Splits the support information text into pages at lines that hold only
    // "%%". Trailing line breaks of a page are dropped.
    static std::vector<std::string> SplitPages(const std::string& text);

    // The management interface found at construction, or null.
    static std::unique_ptr<HostCtl::Network::QelNic> _mgmtIntf;

protected:
    void DrawContents() override;

private:
    void AddEntry(int textId, bool enabled);
    void DisableEntry(int textId);
    // Text id of the selected entry, -1 when there is none.
    int SelectedId() const;
    void LoadSupportPages();
    std::string ManagementNetworkDescription();
    std::string SupportPageDescription() const;
    // Opens the screen of the entry and runs it to its end.
    void OpenEntry(int textId);

    std::vector<LabelItem*> _items;  // owned
    std::vector<int> _ids;
    std::vector<std::string> _pages;
    size_t _page = 0;
    LogViewer _logViewer;
};

}  // namespace Velk
