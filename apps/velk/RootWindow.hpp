// A full-screen menu window: a heading on top, a menu in the yellow left pane,
// the description of the selected entry in the dark-grey right pane, and a
// status line at the bottom.
#pragma once

#include <functional>
#include <string>

#include "Frame.hpp"
#include "ItemList.hpp"
#include "TextArea.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

class RootWindow : public Frame {
public:
    explicit RootWindow(Frame* parent);
    ~RootWindow() override;

    void SetLeftTitle(const std::string& text);
    void SetLeftFooter(const std::string& text);
    void SetRightTitle(const std::string& text);
    void SetRightFooter(const std::string& text);

    // Shows the window, the heading and the subclass's contents.
    void Draw();

    // A line for the status row of the next menu window drawn (what became
    // of a change once its window closed); that window's next drawing
    // clears it again.
    static void PostStatus(const std::string& line);

    // The key loop of a sub-menu: Up and Down move the selection and call
    // `describe`, Enter calls `open` with the selected entry's index, Esc
    // ends the loop with true once `leave` agrees. Other keys are ignored.
    int RunMenu(const std::function<void()>& describe, const std::function<void(int)>& open,
                const std::function<bool()>& leave);

protected:
    virtual void DrawContents() = 0;

    QelCtl::Network::DnsConfigImpl _dnsConfig;
    QelCtl::Network::RoutingInfoImpl _routingInfo;
    QelCtl::Network::VirtualSwitchInfoImpl _vswitchInfo;

    Window* _main;
    Window* _statusLine;
    Window* _leftPane;
    Window* _rightPane;
    TextArea* _leftTitle;
    TextArea* _leftFooter;
    TextArea* _rightTitle;
    TextArea* _rightFooter;
    ItemList* _menu;
    TextArea* _description;

private:
    static std::string _postedStatus;
    bool _showsPostedStatus = false;
};

}  // namespace Velk
