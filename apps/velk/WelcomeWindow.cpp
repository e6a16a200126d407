#include "WelcomeWindow.hpp"

#include <sys/stat.h>
#include <syslog.h>

#include <algorithm>
#include <cstring>
#include <memory>

#include "Console.hpp"
#include "GeneralWindow.hpp"
#include "LoginDialog.hpp"
#include "LoginDisabledDialog.hpp"
#include "ManagementInterface.hpp"
#include "ShutdownDialog.hpp"
#include "StringFactory.hpp"
#include "SystemInfo.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

using HostCtl::Lib::Syslog;

bool WelcomeWindow::_noAdapterAlertRaised = false;
std::string WelcomeWindow::_notice;

namespace {

const char kLoginMarker[] = "/var/run/zolva/show-velk-login";
const char kNoAdapterText[] =
    "No compatible network adapter found. Please consult the product's Hardware Compatibility Guide (HCG) "
    "for a "
    "list of supported adapters.";
const char kNoAdapterAlert[] = "No compatible network adapter found.";

// Collapses runs of blanks into one and trims both ends.
std::string NormalizeBlanks(const std::string& text) {
    std::string out;
    bool pendingBlank = false;
    for (char c : text) {
        if (c == ' ' || c == '\t' || c == '\n' || c == '\r') {
            pendingBlank = !out.empty();
            continue;
        }
        if (pendingBlank) out += ' ';
        pendingBlank = false;
        out += c;
    }
    return out;
}

const char* OriginText(StringFactory& factory, HostCtl::Network::Ipv6AddressType type) {
    switch (type) {
        case HostCtl::Network::Ipv6AddressType::Dhcp:
            return factory.GetString(261);
        case HostCtl::Network::Ipv6AddressType::Autoconf:
            return factory.GetString(263);
        default:
            return factory.GetString(262);
    }
}

constexpr size_t kNetworkRows = 7;

// Control characters of a host value become "?": the value stays on its line.
std::string OneLine(std::string text) {
    for (char& c : text)
        if ((static_cast<unsigned char>(c) < 0x20) || c == 0x7f) c = '?';
    return text;
}

bool FileExists(const char* hostPath) {
    struct stat st;
    return stat(HostCtl::Lib::HostPath(hostPath).c_str(), &st) == 0;
}

}  // namespace

WelcomeWindow::WelcomeWindow()
    : Frame(nullptr, 0, 0, COLS, LINES, BLACK, WHITE), _dnsConfig("defaultTcpipStack") {}

// Sub-windows and text areas belong to the window tree.
WelcomeWindow::~WelcomeWindow() = default;

std::string WelcomeWindow::CombineVendorAndProduct(const std::string& vendor, const std::string& product) {
    const std::string v = NormalizeBlanks(vendor);
    const std::string p = NormalizeBlanks(product);
    if (p.find(v) == 0) return p;
    return v + " " + p;
}

std::string WelcomeWindow::Ipv6Lines(const std::vector<HostCtl::Network::Ipv6Network>& networks,
                                     StringFactory& factory) {
    const size_t shown = networks.size() == 5 ? 5 : std::min<size_t>(networks.size(), 4);
    std::string text;
    for (size_t i = 0; i < shown; ++i) {
        text += "http://[" + networks[i].GetStringAddress() + "]/ (" +
                OriginText(factory, networks[i].GetIpv6AddressType()) + ")\n";
    }
    if (networks.size() > 5) text += "...";
    return text;
}

void WelcomeWindow::MakeStandardLayout() {
    if (_message) {
        delete _message;
        _message = nullptr;
    }
    if (_upper) return;
    Erase();
    const int half = LINES / 2;
    _upper = NewChild(this, 0, 0, COLS, half, DARK_GREY, WHITE);
    _lower = NewChild(this, 0, half, COLS, LINES % 2 == 0 ? half : (LINES + 1) / 2, YELLOW, WHITE);
    Box();
    const int w = _lower->GetWidth();
    const int h = _lower->GetHeight();
    // The warning sits below the network lines and above the footer. On a
    // short screen (25 lines) its six rows would cover the footer and the
    // border, so it takes the rows that are left, at the network lines' width.
    const int warningRows = h - 2 - 9;
    if (warningRows >= 6) {
        _warning = new TextArea(_lower, 16, 9, COLS - 32, 6, DARK_GREY);
    } else {
        _warning = new TextArea(_lower, 8, 9, COLS - 16, std::max(1, warningRows), DARK_GREY);
    }
    _footer = new TextArea(_lower, 2, h - 2, w - 4, 1, BLACK);
    _footer->SetText(std::string("<F2> {color:dark-grey}") + _factory->GetString(0) + "{/color}" +
                     "{align:right}<F12> {color:dark-grey}" + _factory->GetString(1) + "{/color}{/align}");
}

void WelcomeWindow::TearDownStandardLayout() {
    // Deleting the halves deletes the text areas inside them.
    delete _upper;
    delete _lower;
    _upper = _lower = nullptr;
    _title = _hardware = _processors = _network = _warning = _footer = nullptr;
}

void WelcomeWindow::Draw() {
    std::string message;
    try {
        message = _systemInfo.GetWelcomeMessage();
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_ERR, "Unable to read the welcome message: %s", e.what());
    }
    if (message.empty()) {
        MakeStandardLayout();
        Fill();
    } else {
        if (_upper) TearDownStandardLayout();
        if (!_message) {
            Erase();
            Box();
            _message = new TextArea(this, 2, 2, COLS - 4, LINES - 4, WHITE);
        }
        _message->SetText(message);
    }
    Show(true);
}

void WelcomeWindow::Fill() {
    _warning->SetText("");
    std::string warning;

    bool dhcp = false;
    bool ipv4Off = false;
    HostCtl::Network::Ipv4Address address;
    std::vector<HostCtl::Network::Ipv6Network> ipv6;
    bool ipv6Enabled = false;
    std::string hostname;
    bool noAdapter = false;
    bool networkRead = false;
    QelCtl::Network::NetworkInfoImpl networkInfo;
    try {
        if (auto mgmt = GetManagementInterface()) {
            HostCtl::Network::IpConfig config = mgmt->GetIpConfig();
            dhcp = config.GetUseDhcp();
            ipv4Off = config.GetIpv4UseNone();
            address = config.GetIpv4Address();
            ipv6 = config.GetIpv6Network();
        }
        ipv6Enabled = networkInfo.IsQelIpv6Enabled();
        hostname = _dnsConfig.GetHostname();
        noAdapter = networkInfo.GetPnics().empty();
        networkRead = true;
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_ERR, "Unable to read the network configuration: %s", e.what());
        warning = e.what();
    }

    try {
        if (_systemInfo.GetBootOptions().auditMode) warning = _factory->GetString(143);
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_ERR, "Unable to read the boot options: %s", e.what());
    }

    std::string network = _factory->GetString(141);
    // A host name is one line: control characters would split or move it.
    if (!hostname.empty() && hostname != "localhost")
        network += "\nhttp://" + TextArea::Escape(OneLine(hostname)) + "/ ";
    // An unreadable configuration has no address to show (the warning area
    // says why); "0.0.0.0" would read like one.
    if (!networkRead) {
    } else if (!ipv4Off) {
        if (dhcp && address.IsZero()) {
            network += std::string("\n") + _factory->GetString(264);
            warning = _factory->GetString(142);
        } else {
            network += "\nhttp://" + address.GetStringAddress() + "/ (" +
                       _factory->GetString(dhcp ? 261 : 262) + ")";
        }
    }
    if (ipv6Enabled && !ipv6.empty()) {
        // The list ends inside the area: when the rows left cannot take it
        // whole, it is cut early to leave a row for the "..." line.
        const size_t used = static_cast<size_t>(std::count(network.begin(), network.end(), '\n')) + 1;
        const size_t rowsLeft = kNetworkRows > used ? kNetworkRows - used : 0;
        const size_t rowsNeeded = ipv6.size() == 5 ? 5 : std::min<size_t>(ipv6.size(), 4) + (ipv6.size() > 5);
        if (rowsNeeded <= rowsLeft) {
            network += "\n" + Ipv6Lines(ipv6, *_factory);
        } else if (rowsLeft > 0) {
            const std::vector<HostCtl::Network::Ipv6Network> first(ipv6.begin(),
                                                                   ipv6.begin() + (rowsLeft - 1));
            network += "\n" + Ipv6Lines(first, *_factory) + "...";
        }
    }
    if (noAdapter) {
        network = kNoAdapterText;
        if (!_noAdapterAlertRaised) {
            _noAdapterAlertRaised = true;
            try {
                _systemInfo.SetSystemAlert(kNoAdapterAlert);
            } catch (const HostCtl::Lib::HostCtlException& e) {
                Syslog(LOG_ERR, "Unable to set the system alert: %s", e.what());
            }
        }
    }

    std::string hardware;
    std::string processors;
    try {
        QelCtl::Hardware::HardwareInfoImpl hardwareInfo;
        // Vendor, product and CPU model are the firmware's text, shown as
        // they stand: a "{" in them is not mark-up.
        hardware = TextArea::Escape(
            OneLine(CombineVendorAndProduct(hardwareInfo.GetVendorName(), hardwareInfo.GetProductName())));
        QelCtl::Hardware::CpuInfoImpl cpu;
        const unsigned packages = cpu.GetNumCpuPackages();
        processors = TextArea::Escape(OneLine(
            packages >= 2 ? std::to_string(packages) + " x " + cpu.GetModelName() : cpu.GetModelName()));
        processors += "\n" + FormatMemorySize(GetTotalMemoryBytes()) + "iB Memory";
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_ERR, "Unable to read the hardware information: %s", e.what());
    }

    if (!_title) _title = new TextArea(_upper, 8, 5, COLS - 16, 1, -1);
    if (!_hardware) _hardware = new TextArea(_upper, 8, 7, COLS - 16, 1, -1);
    if (!_processors) _processors = new TextArea(_upper, 8, 9, COLS - 16, 2, -1);
    if (!_network) _network = new TextArea(_lower, 8, 1, COLS - 16, kNetworkRows, BLACK);
    _network->SetText(network);
    if (!_notice.empty()) warning += (warning.empty() ? "" : "\n") + TextArea::Escape(_notice);
    _warning->SetText(warning);
    _title->SetText(_factory->GetString(2));
    _hardware->SetText(hardware);
    _processors->SetText(processors);
}

void WelcomeWindow::Update() { Draw(); }

void WelcomeWindow::SetNotice(const std::string& line) { _notice = line; }

void WelcomeWindow::OnLoginKey(int key) {
    if (!FileExists(kLoginMarker)) {
        LoginDisabledDialog dialog(this);
        dialog.Execute();
        return;
    }
    try {
        LoginDialog login(this);
        if (login.Execute() != 1) return;
    } catch (const VelkTimeout&) {
        // Nobody finished logging in: the welcome screen is drawn again.
        return;
    }
    _notice.clear();
    try {
        if (key == KEY_F(2)) {
            GeneralWindow menu(this);
            menu.Execute();
        } else {
            ShutdownDialog shutdown(this);
            shutdown.Execute();
        }
    } catch (const VelkTimeout&) {
        // The idle timeout unwound every screen of the session; log out below.
    }
    Syslog(LOG_INFO, "User %s logged out.", _loginName.c_str());
    SetLoggedIn(false);
    _isLoggedWithSmartCard = false;
    _loginName.clear();
}

int WelcomeWindow::Run() {
    Draw();
    for (;;) {
        const int key = GetKey(false);
        if (key == KEY_F(2) || key == KEY_F(12)) {
            OnLoginKey(key);
        } else if (key == KEY_F(4) && !bwColor) {
            clearok(curscr, TRUE);
        } else {
            continue;
        }
        Draw();
        if (_markForRestart) return 0;
    }
}

}  // namespace Velk
