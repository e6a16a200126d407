#include "RootWindow.hpp"

#include <syslog.h>

#include <algorithm>
#include <cstring>

#include "Console.hpp"
#include "DisplayWidth.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

std::string RootWindow::_postedStatus;

RootWindow::RootWindow(Frame* parent)
    : Frame(parent, 0, 0, COLS, LINES, BLACK, WHITE),
      _dnsConfig("defaultTcpipStack"),
      _routingInfo("defaultTcpipStack") {
    const int half = COLS / 2;
    _main = NewChild(this, 0, 0, COLS, LINES - 1, LIGHT_GREY, WHITE);
    _main->Box();
    mvwhline(_main->GetWindow(), 2, 1, ACS_HLINE, _main->GetWidth() - 2);
    _statusLine = NewChild(this, 0, LINES - 1, COLS, 1, BLACK, LIGHT_GREY);
    _leftPane = NewChild(_main, 0, 0, half, LINES - 1, YELLOW, WHITE);
    _rightPane = NewChild(_main, half, 0, half, LINES - 1, DARK_GREY, WHITE);
    HostCtl::Lib::Syslog(LOG_INFO, "COLS=%d, LINES=%d", COLS, LINES);
    // The menu ends one row above the left footer, so that a long menu
    // scrolls instead of running under the footer's key hints.
    _menu = new ItemList(_leftPane, 2, 4, half - 2, LINES - 7);
    _description = new TextArea(_rightPane, 2, 4, half - 4, LINES - 6, LIGHT_GREY);
    _leftTitle = new TextArea(_leftPane, 3, 1, half - 6, 1, BLACK);
    _rightTitle = new TextArea(_rightPane, 2, 1, half - 6, 1, WHITE);
    _leftFooter = new TextArea(_leftPane, 2, LINES - 3, half - 3, 1, BLACK);
    _rightFooter = new TextArea(_rightPane, 1, LINES - 3, half - 3, 1, WHITE);
}

RootWindow::~RootWindow() = default;

void RootWindow::SetLeftTitle(const std::string& text) { _leftTitle->SetText(text); }
void RootWindow::SetLeftFooter(const std::string& text) { _leftFooter->SetText(text); }
void RootWindow::SetRightTitle(const std::string& text) { _rightTitle->SetText(text); }
void RootWindow::SetRightFooter(const std::string& text) { _rightFooter->SetText(text); }

void RootWindow::Draw() {
    Show(true);
    const char* heading = _factory->GetString(2);
    const int length = static_cast<int>(std::strlen(heading));
    _main->Print(_main->GetWidth() / 2 - length / 2, 0, heading);
    DrawContents();
    if (!_postedStatus.empty()) {
        _statusLine->Erase();
        _statusLine->Print(1, 0, CutToColumns(_postedStatus, std::max(0, COLS - 2)));
        _postedStatus.clear();
        _showsPostedStatus = true;
    } else if (_showsPostedStatus) {
        _statusLine->Erase();
        _showsPostedStatus = false;
    }
    Refresh();
}

void RootWindow::PostStatus(const std::string& line) { _postedStatus = line; }

int RootWindow::RunMenu(const std::function<void()>& describe, const std::function<void(int)>& open,
                        const std::function<bool()>& leave) {
    for (;;) {
        switch (GetKey(true)) {
            case KEY_DOWN:
                _menu->Down();
                describe();
                break;
            case KEY_UP:
                _menu->Up();
                describe();
                break;
            case '\n':
                open(_menu->GetCurrentIndex());
                break;
            case 27:
                if (leave()) return true;
                break;
            default:
                break;
        }
    }
}

}  // namespace Velk
