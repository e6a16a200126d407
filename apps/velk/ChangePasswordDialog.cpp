#include "ChangePasswordDialog.hpp"

#include <security/pam_appl.h>
#include <syslog.h>

#include "CommandRunner.hpp"
#include "MessageDialog.hpp"
#include "Pam.hpp"
#include "PasswordWarningDialog.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

namespace {

enum Field { OLD_FIELD = 0, NEW_FIELD = 1, CONFIRM_FIELD = 2 };

// Copies of the field texts for one attempt, wiped when the attempt ends
// however it ends.
struct Secrets {
    std::string oldSecret;
    std::string newSecret;
    std::string confirmSecret;
    ~Secrets() {
        WipeSecret(oldSecret);
        WipeSecret(newSecret);
        WipeSecret(confirmSecret);
    }
};

}  // namespace

ChangePasswordDialog::ChangePasswordDialog(Frame* parent) : Dialog(parent, 60, 14, 6) {
    const int labels[3] = {158, 159, 160};
    for (int i = 0; i < 3; ++i) {
        _fields[i] = new InputItem(_factory->GetString(labels[i]), "");
        _fields[i]->SetMasked(true);
    }
    _list = NewContentList({_fields[OLD_FIELD], _fields[NEW_FIELD], _fields[CONFIRM_FIELD]});
}

ChangePasswordDialog::~ChangePasswordDialog() {
    SetCursor(false);
    delete _list;
    for (InputItem* field : _fields) {
        field->WipeText();
        delete field;
    }
}

void ChangePasswordDialog::Draw() {
    SetTitle(_factory->GetString(156));
    SetDescription(_factory->GetString(157));
    SetFooter(
        "{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
        "{color:dark-grey}Cancel{/color}{/align}");
    Refresh();
    SetCursor(true);
    _list->Draw();
}

int ChangePasswordDialog::Run() {
    Draw();
    for (;;) {
        const int key = GetKey(true);
        const int current = _list->GetCurrentNumber();
        switch (key) {
            case 27:
                WipeFields(OLD_FIELD);
                SetCursor(false);
                return 0;
            case KEY_UP:
                _list->Up();
                break;
            case KEY_DOWN:
                _list->Down();
                break;
            case '\t':
                if (current == CONFIRM_FIELD)
                    _list->SetCurrent(OLD_FIELD);
                else
                    _list->Down();
                _list->Draw();
                break;
            case '\n':
            case KEY_ENTER:
                if (current != CONFIRM_FIELD) {
                    _list->Down();
                    break;
                }
                if (Submit() == Outcome::Changed) {
                    SetCursor(false);
                    return 1;
                }
                Draw();
                break;
            default:
                if (_fields[current]->HandleKey(key)) _list->Draw();
                break;
        }
    }
}

ChangePasswordDialog::Outcome ChangePasswordDialog::Submit() {
    Secrets s{_fields[OLD_FIELD]->GetText(), _fields[NEW_FIELD]->GetText(),
              _fields[CONFIRM_FIELD]->GetText()};
    if (s.newSecret.empty()) {
        Reject(165, NEW_FIELD);
        return Outcome::Retry;
    }
    if (s.newSecret != s.confirmSecret) {
        Reject(164, NEW_FIELD);
        return Outcome::Retry;
    }
    if (s.newSecret == s.oldSecret) {
        SetCursor(false);
        PasswordWarningDialog warning(this);
        if (!warning.Execute()) {
            WipeFields(NEW_FIELD);
            return Outcome::Retry;
        }
    }
    WipeFields(OLD_FIELD);
    const std::string& user = Frame::_loginName;
    Window::Flush();
    const int rc = PamChangePassword(user, s.oldSecret, s.newSecret);
    if (rc != PAM_SUCCESS) {
        // PAM modules refuse a wrong old password either way.
        const bool oldRefused = rc == PAM_AUTH_ERR || rc == PAM_AUTHTOK_RECOVERY_ERR;
        Reject(oldRefused ? 163 : 167, OLD_FIELD);
        return Outcome::Retry;
    }
    HostCtl::Lib::Syslog(LOG_INFO, "Password for user %s changed", user.c_str());
    ReportObzEvent("@&!*@*@(obz.user.velk.login.passwd.changed)Login password for user %s changed",
                   user.c_str());
    RefreshHostAgent();
    return Outcome::Changed;
}

void ChangePasswordDialog::Reject(int textId, int first) {
    WipeFields(first);
    SetCursor(false);
    MessageDialog error(this, 161, textId);
    error.Execute();
}

void ChangePasswordDialog::WipeFields(int first) {
    for (int i = first; i < 3; ++i) _fields[i]->WipeText();
    _list->SetCurrent(first);
}

}  // namespace Velk
