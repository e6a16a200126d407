#include "GeneralWindow.hpp"

#include <syslog.h>

#include <algorithm>

#include "ChangePasswordDialog.hpp"
#include "CommandRunner.hpp"
#include "Console.hpp"
#include "DriverVMDialog.hpp"
#include "KeyboardDialog.hpp"
#include "LockdownDialog.hpp"
#include "ManagementInterface.hpp"
#include "MessageDialog.hpp"
#include "NetworkRestoreWindow.hpp"
#include "NetworkWindow.hpp"
#include "RestartNetworkDialog.hpp"
#include "RestoreDialog.hpp"
#include "StringFactory.hpp"
#include "TestDialog.hpp"
#include "TroubleShootingWindow.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

namespace {

const char* const SUPPORT_INFO_PATH = "/usr/share/velk/support-info";

const char* const CHANGE_FOOTER =
    "{color:white}<Enter>{/color}{color:light-grey} Change{/color}{align:right}{color:white}<Esc>{/color}"
    "{color:light-grey} Log Out{/color}{/align}";
const char* const MORE_FOOTER =
    "{color:white}<Enter>{/color}{color:light-grey} More{/color}{align:right}{color:white}<Esc>{/color}"
    "{color:light-grey} Log Out{/color}{/align}";

// Driver-VM state that hides the driver-VM entry.
constexpr int DRIVER_VM_HIDDEN = 2;
// Driver-VM state that shows the entry but does not let it be chosen.
constexpr int DRIVER_VM_BUSY = 1;

}  // namespace

std::unique_ptr<HostCtl::Network::QelNic> GeneralWindow::_mgmtIntf;

GeneralWindow::GeneralWindow(Frame* parent) : RootWindow(parent) {
    const bool lockdownEnabled = HrmGetFlag("hrmsvc/auth/lockdown_is_enabled");
    const bool lockdownPossible = HrmGetFlag("hrmsvc/auth/lockdown_is_possible");
    HostCtl::Lib::Syslog(LOG_INFO, "Lockdown mode is %s and %s", lockdownEnabled ? "enabled" : "disabled",
                         lockdownPossible ? "can be changed" : "cannot be changed");

    _mgmtIntf.reset();
    try {
        _mgmtIntf = GetManagementInterface();
    } catch (const HostCtl::Lib::HostCtlException& e) {
        HostCtl::Lib::Syslog(LOG_WARNING, "Cannot find the management interface: %s", e.what());
    }
    const bool haveMgmt = _mgmtIntf != nullptr;

    bool pxeBoot = false;
    try {
        pxeBoot = QelCtl::Adv::AdvancedOptionImpl().HasUserOption("PXEBootEnabled");
    } catch (const HostCtl::Lib::HostCtlException& e) {
        HostCtl::Lib::Syslog(LOG_WARNING, "Cannot read user option PXEBootEnabled: %s", e.what());
    }

    int driverVmState = DRIVER_VM_HIDDEN;
    try {
        driverVmState = QelCtl::Hardware::DriverVmInfoImpl().GetState();
    } catch (const HostCtl::Lib::HostCtlException& e) {
        HostCtl::Lib::Syslog(LOG_WARNING, "Cannot read the DriverVM state: %s", e.what());
    }

    AddEntry(5, true);
    AddEntry(6, lockdownPossible);
    AddEntry(3, false);
    if (driverVmState != DRIVER_VM_HIDDEN) AddEntry(7, driverVmState != DRIVER_VM_BUSY);
    AddEntry(8, haveMgmt);
    AddEntry(9, haveMgmt);
    AddEntry(10, haveMgmt);
    AddEntry(11, true);
    AddEntry(3, false);
    if (!runningOverSerial) AddEntry(16, true);
    AddEntry(14, true);
    AddEntry(3, false);
    AddEntry(13, true);
    AddEntry(3, false);
    AddEntry(12, true);
    AddEntry(3, false);
    AddEntry(15, !pxeBoot);

    _menu->SetItems(std::vector<Item*>(_items.begin(), _items.end()));
    // Disabled entries read in dark grey; the list passes over them.
    if (driverVmState == DRIVER_VM_BUSY) DisableEntry(7);
    if (!lockdownPossible) DisableEntry(6);
    if (!haveMgmt) {
        DisableEntry(8);
        DisableEntry(9);
        DisableEntry(10);
    }
    if (pxeBoot) DisableEntry(15);

    LoadSupportPages();
}

GeneralWindow::~GeneralWindow() {
    for (LabelItem* item : _items) delete item;
}

void GeneralWindow::AddEntry(int textId, bool enabled) {
    _ids.push_back(textId);
    auto* item = new LabelItem(_factory->GetString(textId));
    item->SetActive(enabled);
    _items.push_back(item);
}

void GeneralWindow::DisableEntry(int textId) {
    for (size_t i = 0; i < _ids.size(); ++i) {
        if (_ids[i] != textId) continue;
        _items[i]->SetActive(false);
        _items[i]->SetText(std::string("{color:dark-grey}") + _factory->GetString(textId) + "{/color}");
    }
}

int GeneralWindow::SelectedId() const {
    const Item* current = _menu->GetCurrent();
    for (size_t i = 0; i < _items.size(); ++i)
        if (_items[i] == current) return _ids[i];
    return -1;
}

std::vector<std::string> GeneralWindow::SplitPages(const std::string& text) {
    std::vector<std::string> pages(1);
    for (const std::string& line : HostCtl::Lib::Lines(text)) {
        if (line == "%%") {
            pages.emplace_back();
            continue;
        }
        pages.back() += line + "\n";
    }
    for (std::string& page : pages)
        while (!page.empty() && page.back() == '\n') page.pop_back();
    return pages;
}

void GeneralWindow::LoadSupportPages() {
    const std::string path = HostCtl::Lib::HostPath(SUPPORT_INFO_PATH);
    std::string text;
    if (!HostCtl::Lib::ReadText(path, text)) {
        HostCtl::Lib::Syslog(LOG_WARNING, "Support information %s cannot be read", SUPPORT_INFO_PATH);
        _pages = {"Support information is not available on this host."};
        return;
    }
    _pages = SplitPages(text);
}

std::string GeneralWindow::SupportPageDescription() const {
    std::string text = _pages[_page];
    const bool previous = _page > 0;
    const bool next = _page + 1 < _pages.size();
    if (previous || next) {
        text += "\n\n";
        if (previous) text += "{color:white}<Page Up>{/color}";
        if (next) text += "{align:right}{color:white}<Page Down>{/color}{/align}";
    }
    return text;
}

std::string GeneralWindow::ManagementNetworkDescription() {
    std::string address = _factory->GetString(36);
    bool dhcp = false;
    std::vector<std::string> ipv6;
    if (_mgmtIntf) {
        try {
            const HostCtl::Network::IpConfig config = _mgmtIntf->GetIpConfig();
            address = config.GetIpv4Address().GetStringAddress();
            dhcp = config.GetUseDhcp();
            for (const auto& net : config.GetIpv6Network()) ipv6.push_back(net.ToString());
        } catch (const HostCtl::Lib::HostCtlException& e) {
            HostCtl::Lib::Syslog(LOG_WARNING, "Cannot read the management network configuration: %s",
                                 e.what());
        }
    }
    std::string text = std::string(_factory->GetString(37)) + ":\n  {color:white}" + address + "{/color}\n";
    if (dhcp) text += std::string("  ") + _factory->GetString(33) + "\n";
    if (!ipv6.empty()) {
        text += std::string("\n") + _factory->GetString(38) + ":\n";
        for (const std::string& a : ipv6) text += "  {color:white}" + a + "{/color}\n";
    }
    return text + "\n" + _factory->GetString(25);
}

void GeneralWindow::DrawContents() {
    SetLeftTitle(_factory->GetString(4));
    SetLeftFooter("{color:black}<Up/Down>{/color}{color:dark-grey} Select{/color}");
    _menu->Draw();
    Update();
}

void GeneralWindow::Update() {
    const int id = SelectedId();
    if (id < 0) return;
    SetRightTitle(_factory->GetString(id));
    std::string description;
    std::string footer;
    switch (id) {
        case 5:
            description = _factory->GetString(22);
            footer = CHANGE_FOOTER;
            break;
        case 6:
            description = _factory->GetString(23);
            footer =
                "{color:white}<Enter>{color:light-grey} Change{/color}{align:right}{color:white}<Esc>{/color}"
                "{color:light-grey} Log Out{/color}{/align}";
            break;
        case 7:
            description = _factory->GetString(24);
            footer = CHANGE_FOOTER;
            break;
        case 8:
            description = ManagementNetworkDescription();
            footer = MORE_FOOTER;
            break;
        case 9:
            description = _factory->GetString(26);
            footer =
                "{color:white}<Enter>{/color} "
                "{color:light-grey}Restart{align:right}{color:white}<Esc>{/color}"
                "{color:light-grey} Log Out{/color}{/align}";
            break;
        case 10:
            description = _factory->GetString(27);
            footer =
                "{color:white}<Enter>{/color}{color:light-grey} Run "
                "Test{/color}{align:right}{color:white}<Esc>"
                "{/color}{color:light-grey} Log Out{/color}{/align}";
            break;
        case 11:
            description = _factory->GetString(28);
            footer = MORE_FOOTER;
            break;
        case 12:
            description = SupportPageDescription();
            break;
        case 13:
            description = _logViewer.Listing();
            break;
        case 14:
            description = _factory->GetString(30);
            footer = MORE_FOOTER;
            break;
        case 15:
            description = _factory->GetString(31);
            footer =
                "{color:white}<Enter>{/color}{color:light-grey} Reset{/color}{align:right}{color:white}<Esc>"
                "{/color}{color:light-grey} Log Out{/color}{/align}";
            break;
        case 16:
            description = _factory->GetString(34);
            footer = MORE_FOOTER;
            break;
        default:
            break;
    }
    _description->SetText(description);
    SetRightFooter(footer);
    Refresh();
}

void GeneralWindow::OpenEntry(int textId) {
    std::unique_ptr<Frame> screen;
    switch (textId) {
        case 5:
            screen = std::make_unique<ChangePasswordDialog>(this);
            break;
        case 7:
            screen = std::make_unique<DriverVMDialog>(this);
            break;
        case 15:
            screen = std::make_unique<RestoreDialog>(this);
            break;
        case 16:
            screen = std::make_unique<KeyboardDialog>(this);
            break;
        case 8:
            screen = std::make_unique<NetworkWindow>(this);
            break;
        case 6:
            screen = std::make_unique<LockdownDialog>(this);
            break;
        case 14:
            screen = std::make_unique<TroubleShootingWindow>(this);
            break;
        case 9:
            if (auto mgmt = GetManagementInterface()) {
                screen = std::make_unique<RestartNetworkDialog>(this, std::move(mgmt));
            } else {
                HostCtl::Lib::Syslog(LOG_ERR, "Could not get a suitable management interface");
                screen = std::make_unique<MessageDialog>(this, 17, 20);
            }
            break;
        case 10:
            screen = std::make_unique<TestDialog>(this);
            break;
        case 11:
            screen = std::make_unique<NetworkRestoreWindow>(this);
            break;
        default:
            return;
    }
    screen->Execute();
}

int GeneralWindow::Run() {
    for (;;) {
        Draw();
        for (;;) {
            const int key = GetKey(true);
            const int id = SelectedId();
            if (key == 27) return 1;
            if (key == '\n') {
                if (id == 12 || id == 13) continue;
                try {
                    OpenEntry(id);
                } catch (const HostCtl::Lib::HostCtlException& e) {
                    HostCtl::Lib::Syslog(LOG_ERR, "%s %s", _factory->GetString(21), e.what());
                    MessageDialog(this, 17, 21).Execute();
                }
                break;  // redraw the menu
            }
            switch (key) {
                case KEY_DOWN:
                case KEY_UP:
                    if (id == 12) _page = 0;
                    if (key == KEY_DOWN)
                        _menu->Down();
                    else
                        _menu->Up();
                    Update();
                    break;
                case KEY_NPAGE:
                    if (id != 12) break;
                    if (_page + 1 < _pages.size()) ++_page;
                    Update();
                    break;
                case KEY_PPAGE:
                    if (id != 12) break;
                    if (_page > 0) --_page;
                    Update();
                    break;
                default:
                    if (id == 13 && key >= '0' && key <= '9') {
                        const int row = _logViewer.ChooseLog(key - '0');
                        if (row >= 0) {
                            _logViewer.ViewLog(row, this);
                            Update();
                        }
                    }
                    break;
            }
        }
    }
}

}  // namespace Velk
