#include "VelkTimeoutDialog.hpp"

#include <syslog.h>

#include "Console.hpp"
#include "StringFactory.hpp"
#include "TimeoutField.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

using HostCtl::Lib::Syslog;

namespace {

constexpr long DEFAULT_TIMEOUT_SECONDS = 600;

}  // namespace

VelkTimeoutDialog::VelkTimeoutDialog(Frame* parent) : Dialog(parent, 70, 15, 9), _current(ReadIdleTimeout()) {
    _field = new InputItem(_factory->GetString(273), std::to_string(_current / 60), TIMEOUT_FIELD_LENGTH);
    _field->SetMaxLength(TIMEOUT_FIELD_LENGTH);
    _list = NewContentList({_field});
}

VelkTimeoutDialog::~VelkTimeoutDialog() {
    SetCursor(false);
    delete _list;
    delete _field;
}

long VelkTimeoutDialog::ReadIdleTimeout() {
    try {
        std::unique_ptr<HostCtl::Adv::AdvancedOption> option =
            QelCtl::Adv::AdvancedOptionImpl().FindOption(VELK_TIMEOUT_VAR);
        if (auto* integer = dynamic_cast<HostCtl::Adv::AdvancedIntegerOption*>(option.get()))
            return static_cast<long>(integer->GetCurrent());
        Syslog(LOG_WARNING, "%s is not set to a number of seconds; using %ld", VELK_TIMEOUT_VAR.c_str(),
               DEFAULT_TIMEOUT_SECONDS);
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_WARNING, "Cannot read %s: %s", VELK_TIMEOUT_VAR.c_str(), e.what());
    }
    return DEFAULT_TIMEOUT_SECONDS;
}

// Drawing.

void VelkTimeoutDialog::Draw() {
    SetTitle(_factory->GetString(271));
    SetDescription(_factory->GetString(272));
    SetFooter(TIMEOUT_FOOTER);
    Refresh();
    SetCursor(true);
    _list->Draw();
}

// Keys.

int VelkTimeoutDialog::Run() {
    return RunForm([this] { Draw(); }, [this] { return Accept(); },
                   [this](int key) {
                       if (IsTimeoutFieldKey(key) && _field->HandleKey(key)) _list->Draw();
                   });
}

// Actions.

bool VelkTimeoutDialog::Accept() {
    const TimeoutEntry entry = ReadTimeoutField(_field->GetText());
    if (entry.kind == TimeoutEntry::Empty) return true;
    if (entry.kind == TimeoutEntry::Invalid) {
        ShowInvalidTimeout(this);
        return true;
    }
    const long seconds = entry.minutes * 60;
    if (seconds == _current || !WriteIdleTimeout(seconds)) return true;
    _current = seconds;
    Frame::LoadIdleTimeout();
    if (entry.minutes == 0)
        Syslog(LOG_INFO, "Disabled Velk timeout");
    else
        Syslog(LOG_INFO, "Modified Velk timeout to %ld minutes", entry.minutes);
    return true;
}

bool VelkTimeoutDialog::WriteIdleTimeout(long seconds) {
    try {
        std::unique_ptr<HostCtl::Adv::AdvancedOption> option =
            QelCtl::Adv::AdvancedOptionImpl().FindOption(VELK_TIMEOUT_VAR);
        auto* integer = dynamic_cast<HostCtl::Adv::AdvancedIntegerOption*>(option.get());
        if (integer == nullptr) {
            Syslog(LOG_WARNING, "Cannot set %s: the host has no such integer option",
                   VELK_TIMEOUT_VAR.c_str());
            return false;
        }
        integer->SetCurrent(seconds);
        return true;
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_WARNING, "Cannot set %s: %s", VELK_TIMEOUT_VAR.c_str(), e.what());
        return false;
    }
}

}  // namespace Velk
