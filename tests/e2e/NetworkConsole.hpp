// A logged-in console in "Configure Management Network": its dialogs, and
// leaving with the changes applied.
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "LoggedIn.hpp"

namespace E2e {

inline constexpr char kNetworkFooter[] = "<Esc> Exit";
inline constexpr char kRestartQuestion[] = "Apply changes and restart management network?";
inline constexpr char kRebootQuestion[] = "Apply changes and reboot host?";
inline constexpr char kErrorTitle[] = "Enable Management Network: Error";

class NetworkTest : public ConsoleTest {
public:
    // The entries of the window in menu order.
    enum Entry { kAdapters, kVlan, kIpv4, kIpv6, kDns, kSuffixes };

    // The IPv4 dialog's keys for a static address.
    static std::vector<std::string> StaticIpv4(const std::string& address, const std::string& mask,
                                               const std::string& gateway) {
        return {"Down", "Down", " ", "Down", address, "Down", mask, "Down", gateway};
    }

protected:
    explicit NetworkTest(const std::string& network = "") : ConsoleTest(network) {}

    // Each entry with a text its dialog shows.
    struct EntryDialog {
        const char* entry;
        const char* shown;
    };
    static constexpr EntryDialog kDialogs[] = {
        {"Network Adapters", "Hardware Label (MAC Address)"},
        {"VLAN (optional)", "VLAN ID (1-4094"},
        {"IPv4 Configuration", "Set static IPv4 address"},
        {"IPv6 Configuration", "Set static IPv6 address"},
        {"DNS Configuration", "Use the following DNS server"},
        {"Custom DNS Suffixes", "Suffixes:"},
    };

    // Logs in and opens the network window.
    ::testing::AssertionResult OpenNetwork() {
        if (auto menu = StartInMenu(); !menu) return menu;
        if (auto selected = SelectEntry(*t, "Configure Management Network"); !selected) return selected;
        t->SendKey("Enter");
        return t->WaitForText(kNetworkFooter);
    }

    // In the network window: selects `entry`, presses Enter, waits for its dialog.
    ::testing::AssertionResult OpenDialog(Entry entry) {
        for (int i = 0; i < 6; ++i) t->SendKey("Up");
        if (auto quiet = t->WaitQuiet(); !quiet) return quiet;
        if (auto selected = SelectEntry(*t, kDialogs[entry].entry); !selected) return selected;
        t->SendKey("Enter");
        return t->WaitForText(kDialogs[entry].shown);
    }

    ::testing::AssertionResult Confirm(Entry entry) {
        t->SendKey("Enter");
        return t->WaitForTextGone(kDialogs[entry].shown);
    }

    // OpenDialog(entry), Keys(keys), then Confirm(entry).
    ::testing::AssertionResult Edit(Entry entry, const std::vector<std::string>& keys) {
        if (auto open = OpenDialog(entry); !open) return open;
        Keys(keys);
        return Confirm(entry) << " (" << kDialogs[entry].entry << ")";
    }

    // Esc, Y to the question, then waits for the end of the apply.
    ::testing::AssertionResult LeaveAndApply(const std::string& question = kRestartQuestion) {
        t->SendKey("Esc");
        if (auto asked = t->WaitForText(question); !asked) return asked;
        t->Send("y");
        return WaitForLog(host, "Network settings changed.");
    }

    // Every dialog confirmed with a change: zonic1 added, VLAN 20, static IPv4
    // and IPv6, DNS servers (without DHCP the manual row is already marked), a
    // dotted host name and two suffixes.
    ::testing::AssertionResult EditEverything() {
        // The IPv6 gateway typed answers on VLAN 20, so that the change
        // passes its checks.
        host.Set("/network/lan/20/hosts/2001:db8:20::1", nlohmann::json::object());
        const std::pair<Entry, std::vector<std::string>> edits[] = {
            {kAdapters, {"Down", " "}},
            {kVlan, {"20"}},
            {kIpv4, StaticIpv4("198.51.100.10", "255.255.255.0", "198.51.100.1")},
            {kIpv6,
             {"Down", "Down", "Down", " ", "Down", "2001:db8:20::10/64", "Down", "Down", "Down",
              "2001:db8:20::1"}},
            {kDns, {"Down", "198.51.100.53", "Down", "2001:db8:20::53", "Down", "esx7.lab.test"}},
            {kSuffixes, {"lab.test corp.test"}},
        };
        for (const auto& [entry, keys] : edits)
            if (auto ok = Edit(entry, keys); !ok) return ok;
        return ::testing::AssertionSuccess();
    }
};

class StaticNetworkTest : public NetworkTest {
protected:
    StaticNetworkTest() : NetworkTest("static") {}
};

}  // namespace E2e
