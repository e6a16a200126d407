#include "NetworkCheckWindow.hpp"

#include <algorithm>
#include <string>

#include "Console.hpp"
#include "StringFactory.hpp"

namespace Velk {

using QelCtl::Network::NetworkCheck;

namespace {

constexpr int kWidth = 72;
constexpr int kHeaderHeight = 7;
// Rows of the body around the list: a blank row and the count's two rows
// below it (the count wraps on an 80-column screen), and the body's own
// frame and footer.
constexpr int kBodyRows = 3 + 4;
constexpr long kTickMillis = 1000;

}  // namespace

NetworkCheckWindow::NetworkCheckWindow(Frame* parent, Stage stage, const std::vector<NetworkCheck>& checks)
    : Dialog(parent, kWidth, Height(checks.size()), kHeaderHeight), _stage(stage), _checks(checks) {
    const int width = _content->GetWidth();
    const int rows = _content->GetHeight();
    _list = new TextArea(_content, 0, 0, width, std::max(1, rows - 3), BLACK);
    _countdown = new TextArea(_content, 0, std::max(0, rows - 2), width, 2, BLACK);
}

// As many rows as the checks need, within the screen.
int NetworkCheckWindow::Height(size_t checks) {
    const int wanted = kHeaderHeight + kBodyRows + static_cast<int>(std::max<size_t>(checks, 1));
    return std::min(wanted, LINES - 2);
}

// Drawing.

void NetworkCheckWindow::DrawChecks() {
    SetTitle(_factory->GetString(285));
    SetDescription(_factory->GetString(_stage == CHANGED ? 286 : 295));
    // The results in a column as wide as the widest of them.
    int resultWidth = 0;
    for (int id : {287, 288, 289})
        resultWidth = std::max(resultWidth, TextArea::Columns(_factory->GetString(id)));
    std::string text;
    for (const NetworkCheck& check : _checks) {
        const bool failed = check.outcome == NetworkCheck::Outcome::Failed;
        const int result = failed ? 288 : check.outcome == NetworkCheck::Outcome::Warning ? 289 : 287;
        const std::string label = _factory->GetString(result);
        std::string row = TextArea::Escape(check.subject);
        if (!check.detail.empty()) row += ": " + TextArea::Escape(check.detail);
        text += std::string(failed ? "{color:red}" : "{color:black}") + TextArea::Escape(label) + "{/color}" +
                std::string(static_cast<size_t>(resultWidth - TextArea::Columns(label) + 2), ' ') +
                "{color:dark-grey}" + row + "{/color}\n";
    }
    _list->SetText(text);
    if (_stage == CHANGED) {
        SetFooter(std::string("{color:black}<F11>{/color} {color:dark-grey}") + _factory->GetString(292) +
                  "{/color}{align:right}{color:black}<Enter>{/color} {color:dark-grey}" +
                  _factory->GetString(293) + "{/color}{/align}");
    } else {
        SetFooter(std::string("{color:black}<Enter>{/color} {color:dark-grey}") + _factory->GetString(296) +
                  "{/color}{align:right}{color:black}<Esc>{/color} {color:dark-grey}" +
                  _factory->GetString(297) + "{/color}{/align}");
    }
}

void NetworkCheckWindow::DrawCountdown(int seconds) {
    _countdown->SetText(std::string(_factory->GetString(290)) + " {color:red}" + std::to_string(seconds) +
                        "{/color} " + _factory->GetString(291));
    Refresh();
}

// Keys.

int NetworkCheckWindow::Run() {
    DrawChecks();
    Refresh();
    return _stage == CHANGED ? RunCountdown() : RunReverted();
}

// The only screen of the console that wakes up without a key: once a second,
// while it is up.
int NetworkCheckWindow::RunCountdown() {
    int left = kCountdownSeconds;
    DrawCountdown(left);
    for (;;) {
        const int key = GetKey(false, kTickMillis);
        if (key == EV_TIMEOUT) {
            if (--left <= 0) return REVERT;
        } else if (key == KEY_F(11)) {
            return KEEP;
        } else if (key == '\n' || key == 27) {
            return REVERT;
        } else if (key >= 0) {
            left = kCountdownSeconds;
        }
        DrawCountdown(left);
    }
}

int NetworkCheckWindow::RunReverted() {
    for (;;) {
        const int key = GetKey(true);
        if (key == '\n') return RESTORE_FACTORY;
        if (key == 27) return LEAVE;
    }
}

}  // namespace Velk
