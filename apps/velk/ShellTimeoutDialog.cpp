#include "ShellTimeoutDialog.hpp"

#include <syslog.h>

#include <cstdio>
#include <cstdlib>

#include "CommandRunner.hpp"
#include "Console.hpp"
#include "StringFactory.hpp"
#include "TimeoutField.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

using HostCtl::Lib::Syslog;

namespace {

const char* const AVAILABILITY_OPTION = "/UserVars/TarniShellTimeOut";
const char* const IDLE_OPTION = "/UserVars/TarniShellInteractiveTimeOut";

// A tool's standard error as one log text: the line breaks at its end go.
std::string ErrorText(const char* buf, size_t len) {
    std::string text(buf, len);
    while (!text.empty() && (text.back() == '\n' || text.back() == '\r')) text.pop_back();
    return text;
}

// Runs "<tool> system settings advanced set -o OPTION -i SECONDS"; the
// status, and the tool's standard error in `err`.
int RunAdvancedSet(const char* path, const char* name, const char* option, const char* seconds,
                   std::string& err) {
    const char* argv[] = {name, "system", "settings", "advanced", "set",
                          "-o", option,   "-i",       seconds,    nullptr};
    char errBuf[257] = {};
    size_t errLen = 256;
    const int status = RunCommand(path, argv, nullptr, nullptr, errBuf, &errLen, nullptr, 0, 0);
    err = ErrorText(errBuf, errLen);
    return status;
}

}  // namespace

ShellTimeoutDialog::ShellTimeoutDialog(Frame* parent)
    : Dialog(parent, 70, 21, 15),
      _availability(ReadMinutes(AVAILABILITY_OPTION)),
      _idle(ReadMinutes(IDLE_OPTION)) {
    auto field = [&](int label, long minutes) {
        auto* item = new InputItem(_factory->GetString(label), minutes < 0 ? "" : std::to_string(minutes),
                                   TIMEOUT_FIELD_LENGTH);
        item->SetMaxLength(TIMEOUT_FIELD_LENGTH);
        return item;
    };
    _availabilityField = field(267, _availability);
    _idleField = field(268, _idle);
    _list = NewContentList({_availabilityField, _idleField});
}

ShellTimeoutDialog::~ShellTimeoutDialog() {
    SetCursor(false);
    delete _list;
    delete _availabilityField;
    delete _idleField;
}

long ShellTimeoutDialog::ReadMinutes(const char* option) {
    const char* argv[] = {"tarncfg-advcfg", "-q", "-g", option, nullptr};
    char out[257] = {};
    size_t outLen = 256;
    char err[257] = {};
    size_t errLen = 256;
    const int status = RunCommand("/sbin/tarncfg-advcfg", argv, out, &outLen, err, &errLen, nullptr, 0, 0);
    out[outLen <= 256 ? outLen : 0] = '\0';
    char* end = nullptr;
    const long seconds = std::strtol(out, &end, 10);
    if (status != 0 || end == out || seconds < 0) {
        Syslog(LOG_WARNING, "Cannot read %s (status %d): %s", option, status, ErrorText(err, errLen).c_str());
        return -1;
    }
    return seconds / 60;
}

// Drawing.

void ShellTimeoutDialog::Draw() {
    SetTitle(_factory->GetString(265));
    SetDescription(_factory->GetString(266));
    SetFooter(TIMEOUT_FOOTER);
    Refresh();
    SetCursor(true);
    _list->Draw();
}

// Keys.

int ShellTimeoutDialog::Run() {
    return RunForm([this] { Draw(); }, [this] { return Accept(); }, [this](int key) { HandleKey(key); });
}

void ShellTimeoutDialog::HandleKey(int key) {
    if (key == KEY_DOWN) {
        _list->Down();
    } else if (key == KEY_UP) {
        _list->Up();
    } else if (IsTimeoutFieldKey(key)) {
        auto* field = dynamic_cast<InputItem*>(_list->GetCurrent());
        if (field != nullptr && field->HandleKey(key)) _list->Draw();
    }
}

// Actions.

bool ShellTimeoutDialog::Accept() {
    // The availability timeout: a value out of range is refused and the idle
    // field is still looked at.
    const TimeoutEntry availability = ReadTimeoutField(_availabilityField->GetText());
    if (availability.kind == TimeoutEntry::Invalid) {
        ShowInvalidTimeout(this);
    } else if (availability.kind == TimeoutEntry::Minutes && availability.minutes != _availability &&
               WriteMinutes(AVAILABILITY_OPTION, availability.minutes)) {
        _availability = availability.minutes;
        // Running services take the new availability timeout when they start.
        RestartRunningServices();
        if (availability.minutes == 0)
            Syslog(LOG_INFO, "Disabled Shell timeout");
        else
            Syslog(LOG_INFO, "Modified Shell timeout to %ld minutes", availability.minutes);
    }

    // The idle timeout of interactive sessions applies at the next login: no
    // service is restarted for it.
    const TimeoutEntry idle = ReadTimeoutField(_idleField->GetText());
    if (idle.kind == TimeoutEntry::Invalid) {
        ShowInvalidTimeout(this);
    } else if (idle.kind == TimeoutEntry::Minutes && idle.minutes != _idle &&
               WriteMinutes(IDLE_OPTION, idle.minutes)) {
        _idle = idle.minutes;
        if (idle.minutes == 0)
            Syslog(LOG_INFO, "Disabled shell interactive timeout");
        else
            Syslog(LOG_INFO, "Modified shell interactive timeout to %ld minutes", idle.minutes);
    }
    return true;
}

bool ShellTimeoutDialog::WriteMinutes(const char* option, long minutes) {
    char seconds[16];
    std::snprintf(seconds, sizeof seconds, "%ld", minutes * 60);
    std::string err;
    if (RunAdvancedSet("/sbin/tarncli", "tarncli", option, seconds, err) == 0) return true;
    // tarncli needs the host agent; localcli sets the option without it.
    Syslog(LOG_WARNING, "Unable to run tarncli to set %s: %s", option, err.c_str());
    if (RunAdvancedSet("/sbin/localcli", "localcli", option, seconds, err) == 0) return true;
    Syslog(LOG_ERR, "Setting %s to %s seconds failed with error: %s", option, seconds, err.c_str());
    return false;
}

void ShellTimeoutDialog::RestartRunningServices() {
    for (const char* script : {"/etc/init.d/TarnShell", "/etc/init.d/SSH"}) {
        const std::string path = HostCtl::Lib::HostPath(script);
        const char* status[] = {"sh", path.c_str(), "status", nullptr};
        if (RunCommand("/bin/sh", status, nullptr, nullptr, nullptr, nullptr, nullptr, 0, 0) != 0) continue;
        const char* restart[] = {"sh", path.c_str(), "restart", nullptr};
        RunCommand("/bin/sh", restart, nullptr, nullptr, nullptr, nullptr, nullptr, 0, 0);
    }
}

}  // namespace Velk
