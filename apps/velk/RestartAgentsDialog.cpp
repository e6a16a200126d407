#include "RestartAgentsDialog.hpp"

#include <pthread.h>
#include <syslog.h>

#include <cstring>
#include <exception>

#include "CommandRunner.hpp"
#include "Console.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

using HostCtl::Lib::Syslog;

RestartAgentsDialog::RestartAgentsDialog(Frame* parent) : Dialog(parent, 71, 20, 9) {
    _log = new TextArea(_content, 1, 2, GetWidth() - 8, 3, BLACK);
    _collect = new CheckItem(_factory->GetString(249), false);
    _items.push_back(_collect);
    _list = new ItemList(_content, 0, 0, GetWidth() - 4, 1);
    _list->SetItems(_items);
}

RestartAgentsDialog::~RestartAgentsDialog() {
    delete _list;
    for (Item* item : _items) delete item;
}

// Drawing.

void RestartAgentsDialog::DrawConfirmation() {
    SetTitle(_factory->GetString(244));
    SetDescription(_factory->GetString(245));
    _log->SetText(_factory->GetString(246));
    _list->Draw();
    SetFooter(
        "{align:right}{color:black}<F11>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
        "{color:dark-grey}Cancel{/color}{/align}");
    Refresh();
}

void RestartAgentsDialog::ShowLog(const std::string& running) {
    std::string text = "{color:dark-grey}" + _finished;
    if (!running.empty()) text += "{color:black}" + running;
    _log->SetText(text);
    // The step's command blocks: the screen shows what is running meanwhile.
    Window::Flush();
}

// Keys.

int RestartAgentsDialog::Run() {
    DrawConfirmation();
    if (!Confirm()) return false;
    Restart();
    SetFooter("{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}{/align}");
    Refresh();
    while (GetKey(true) != '\n') {
    }
    return true;
}

bool RestartAgentsDialog::Confirm() {
    for (;;) {
        switch (GetKey(true)) {
            case ' ':
                _collect->SetChecked(!_collect->IsChecked());
                _list->Draw();
                break;
            case KEY_F(11):
                return true;
            case 27:
                return false;
            default:
                // Enter included: the restart is confirmed with F11 only.
                break;
        }
    }
}

// Actions.

void RestartAgentsDialog::Restart() {
    SetFooter("");
    Syslog(LOG_INFO, "Restarting host agents");
    ReportObzEvent("@&!*@*@(obz.user.velk.restarting.hostagents)Restarting host agents");
    if (_collect->IsChecked()) StartLiveCore();
    Step(247, "/bin/sh /sbin/services.sh stop");
    Step(248, "/bin/sh /sbin/services.sh start");
}

void RestartAgentsDialog::StartLiveCore() {
    pthread_attr_t attr;
    pthread_t thread;
    int rc = pthread_attr_init(&attr);
    if (rc == 0) {
        rc = pthread_create(&thread, &attr, GenerateCoradLiveCore, nullptr);
        pthread_attr_destroy(&attr);
    }
    if (rc != 0) {
        Syslog(LOG_ERR, "failed to create live core generation thread: %s", std::strerror(rc));
        return;
    }
    // Nobody waits for the thread; it ends on its own.
    pthread_detach(thread);
    AddFinished(250);
    ShowLog("");
}

void RestartAgentsDialog::Step(int textId, const char* commandLine) {
    ShowLog(_factory->GetString(textId));
    // Whether the agents really stopped or started is not known here; the
    // step is done when its command has ended.
    try {
        QelCtl::Util::QelCtl_Exec(commandLine, false, true, false);
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_ERR, "%s failed: %s", commandLine, e.what());
    }
    AddFinished(textId);
    ShowLog("");
}

void RestartAgentsDialog::AddFinished(int textId) {
    _finished += std::string(_factory->GetString(textId)) + " " + _factory->GetString(123) + "\n";
}

void* RestartAgentsDialog::GenerateCoradLiveCore(void*) {
    // The option named here is not the one the command uses; both texts are
    // the ones operators know from the host's logs.
    Syslog(LOG_INFO, "Executing qelbacktrace -c against corad");
    try {
        if (QelCtl::Util::QelCtl_Exec("/sbin/qelbacktrace -w -n corad -o corad-restart% -d /var/log/", false,
                                      true, false) != 0) {
            Syslog(LOG_ERR, "qelbacktrace failed, probably corad was down");
            return nullptr;
        }
        QelCtl::System::SystemInfoImpl systemInfo;
        systemInfo.SetSystemAlert("Corad core dump completed");
    } catch (const std::exception& e) {
        Syslog(LOG_ERR, "%s", e.what());
    }
    return nullptr;
}

}  // namespace Velk
