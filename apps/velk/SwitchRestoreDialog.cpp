#include "SwitchRestoreDialog.hpp"

#include <syslog.h>

#include "CommandRunner.hpp"
#include "ManagementInterface.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

using HostCtl::Lib::Syslog;

SwitchRestoreDialog::SwitchRestoreDialog(Frame* parent, int height, int headerHeight)
    : Dialog(parent, 70, height, headerHeight) {
    _log = new TextArea(_content, 0, 0, _content->GetWidth(), _content->GetHeight(), BLACK);
}

bool SwitchRestoreDialog::Confirm(const std::string& title, const std::string& header,
                                  const std::string& question) {
    SetTitle(title);
    SetDescription(header);
    _log->SetText(TextArea::Escape(question) + "\n\n");
    SetFooter(
        "{align:right}{color:black}<F11>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
        "{color:dark-grey}Cancel{/color}{/align}");
    Refresh();
    if (!WaitForF11()) return false;
    // The steps take the whole area.
    _log->SetText("");
    SetFooter("");
    return true;
}

bool SwitchRestoreDialog::Step(const std::string& text, const std::function<void()>& work) {
    Syslog(LOG_INFO, "%s", text.c_str());
    _log->AppendText(TextArea::Escape(text) + " ");
    Refresh();
    Window::Flush();
    try {
        work();
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_ERR, "%s failed: %s", text.c_str(), e.what());
        _log->AppendText(std::string(_factory->GetString(223)) + "\n");
        Refresh();
        return false;
    }
    _log->AppendText(std::string(_factory->GetString(123)) + "\n");
    Refresh();
    return true;
}

void SwitchRestoreDialog::ShowLine(const std::string& text) {
    _log->AppendText(TextArea::Escape(text) + "\n");
    Refresh();
}

void SwitchRestoreDialog::AddUndo(const std::string& text, std::function<void()> undo, bool last) {
    if (last)
        _undo.insert(_undo.begin(), {text, std::move(undo)});
    else
        _undo.emplace_back(text, std::move(undo));
}

bool SwitchRestoreDialog::Undo() {
    if (_undo.empty()) return true;
    bool complete = true;
    const std::vector<std::pair<std::string, std::function<void()>>> actions = std::move(_undo);
    _undo.clear();
    Step(_factory->GetString(280), [&] {
        // Every action is tried, whatever the ones before it did.
        for (auto action = actions.rbegin(); action != actions.rend(); ++action) {
            Syslog(LOG_INFO, "%s", action->first.c_str());
            try {
                action->second();
            } catch (const HostCtl::Lib::HostCtlException& e) {
                Syslog(LOG_ERR, "%s failed: %s", action->first.c_str(), e.what());
                complete = false;
            }
        }
        if (!complete) throw HostCtl::Lib::HostCtlException("the host is not as it was before the restore");
    });
    return complete;
}

void SwitchRestoreDialog::Finish(const std::string& logLine, const char* event) {
    Syslog(LOG_INFO, "%s", logLine.c_str());
    ReportObzEvent("%s", event);
    SetFooter("{align:right}{color:black}<Enter>{/color}{color:dark-grey} OK{/color}{/align}");
    Refresh();
    while (GetKey(true) != '\n') {
    }
}

HostCtl::Network::ConnectionPoint SwitchRestoreDialog::ReadDvsPort() {
    using HostCtl::Network::ConnectionPoint;
    _mgmtIntf = GetManagementInterface();
    if (!_mgmtIntf) throw HostCtl::Lib::HostCtlException("there is no management interface");
    const ConnectionPoint point = _mgmtIntf->GetConnectionPoint();
    if (point.GetType() != ConnectionPoint::DvsPort)
        throw HostCtl::Lib::HostCtlException("the management interface is not on a distributed switch");
    _dvsName = point.GetSwitchName();
    return point;
}

std::vector<HostCtl::Network::DistributedSwitch::UplinkPort> SwitchRestoreDialog::ReadHostUplinks() const {
    std::vector<HostCtl::Network::DistributedSwitch::UplinkPort> backed;
    for (const auto& port : HostCtl::Network::DistributedSwitch(_dvsName).GetUplinkPorts())
        if (!port.pnic.empty()) backed.push_back(port);
    return backed;
}

}  // namespace Velk
