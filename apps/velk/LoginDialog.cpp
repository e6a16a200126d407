#include "LoginDialog.hpp"

#include <security/pam_appl.h>
#include <syslog.h>

#include "CommandRunner.hpp"
#include "Console.hpp"
#include "KeyboardDialog.hpp"
#include "MessageDialog.hpp"
#include "Pam.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

using HostCtl::Lib::Syslog;

namespace {
const char kPasswordFooter[] =
    "{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
    "{color:dark-grey}Cancel{/color}{/align}";
const char kPinFooter[] =
    "{align:left}{color:black>}<F3>{/color} {color:dark-grey}Switch PIN/Password Login{/color}{/align}"
    "{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
    "{color:dark-grey}Cancel{/color}{/align}";
}  // namespace

LoginDialog::LoginDialog(Frame* parent) : Dialog(parent, 60, 14, 7) {
    if (!runningOverSerial) {
        _keyboard = new LabelItem(KeyboardLabel());
        _items.push_back(_keyboard);
    }
    _name = new InputItem("", "");
    _secret = new InputItem("", "");
    _secret->SetMasked(true);
    _items.push_back(_name);
    _items.push_back(_secret);
    _list = NewContentList(_items);
    // A card already in its reader offers PIN login at once, even when no
    // refresh signal has told the console about it yet.
    CheckSmartCard();
    SetMode(!_smartCardLoginId.empty());
}

LoginDialog::~LoginDialog() {
    for (Item* item : _items) delete item;
    delete _list;
}

std::string LoginDialog::KeyboardLabel() {
    std::string layout;
    try {
        layout = QelCtl::System::SystemInfoImpl().GetKeyboardLayout();
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_ERR, "Unable to read the keyboard layout: %s", e.what());
    }
    return "Configured Keyboard (" + layout + ")";
}

void LoginDialog::SetMode(bool pinMode) {
    _pinMode = pinMode;
    std::string hostname;
    try {
        hostname = QelCtl::Network::DnsConfigImpl("defaultTcpipStack").GetHostname();
    } catch (const HostCtl::Lib::HostCtlException&) {
        // The description goes without the host name.
    }
    SetTitle(_factory->GetString(144));
    SetDescription(std::string(_factory->GetString(pinMode ? 146 : 145)) + hostname);
    // The label and the field share the row: "Login Name: [root      ]".
    delete _name;
    delete _secret;
    _name = new InputItem(_factory->GetString(pinMode ? 150 : 149), pinMode ? _smartCardLoginId : "root");
    _secret = new InputItem(_factory->GetString(pinMode ? 152 : 151), "");
    _secret->SetMasked(true);
    _items[_keyboard ? 1 : 0] = _name;
    _items[_keyboard ? 2 : 1] = _secret;
    _list->SetItems(_items);
    _list->SetCurrent(_keyboard ? 1 : 0);
    SetFooter(pinMode ? kPinFooter : kPasswordFooter);
}

int LoginDialog::Run() {
    Window::SetCursor(true);
    for (;;) {
        _list->Draw();
        const int key = GetKey(true);
        Item* current = _list->GetCurrent();
        const bool onLast = current == _secret;
        if (key == 27) {
            Window::SetCursor(false);
            Show(false);
            return 0;
        } else if (key == KEY_UP) {
            _list->Up();
        } else if (key == KEY_DOWN) {
            _list->Down();
        } else if (key == KEY_F(3)) {
            SetMode(!_pinMode);
        } else if (key == '\n' && current == _keyboard) {
            try {
                KeyboardDialog keyboard(this);
                keyboard.Execute();
            } catch (const HostCtl::Lib::HostCtlException& e) {
                // The login goes on with the layout the host has now.
                Syslog(LOG_ERR, "%s %s", _factory->GetString(21), e.what());
                MessageDialog(this, 17, 21).Execute();
            }
            _keyboard->SetText(KeyboardLabel());
        } else if ((key == '\t' || key == '\n') && !onLast) {
            _list->Down();
        } else if (key == '\t') {
            _list->SetCurrent(0);
        } else if (key == '\n') {
            Submit();
            if (_loggedIn) {
                Window::SetCursor(false);
                Show(false);
                return 1;
            }
        } else if (auto* field = dynamic_cast<InputItem*>(current)) {
            field->HandleKey(key);
        }
    }
}

void LoginDialog::Submit() {
    loginName = _name->GetText();
    std::string secret = _secret->GetText();
    // The field's copy is gone as soon as PAM has the secret.
    _secret->WipeText();
    Window::Flush();
    const int rc = PamLogin(loginName, secret);
    WipeSecret(secret);
    const char* user = loginName.c_str();
    if (rc == PAM_SUCCESS) {
        SetLoginName(loginName);
        SetLoggedIn(true);
        Syslog(LOG_AUTH | LOG_EMERG, "Authentication of user %s succeeded", user);
        Syslog(LOG_INFO, "User %s logged in", user);
        return;
    }
    if (rc == PAM_PERM_DENIED) {
        Syslog(LOG_AUTH | LOG_ERR, "Authorization of user %s failed with permission denied error.", user);
    } else {
        Syslog(LOG_AUTH | LOG_ERR, "Authentication of user %s failed with authentication failure.", user);
    }
    ReportObzEvent("@&!*@*@(obz.user.velk.login.failed)Authentication for user %s failed", user);
    MessageDialog message(this, 153, rc == PAM_PERM_DENIED ? 155 : 154);
    message.Execute();
    _secret->WipeText();
    _list->SetCurrent(_keyboard ? 2 : 1);
}

}  // namespace Velk
