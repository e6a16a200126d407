// A logged-in console in "Configure Management Network": opening its
// dialogs, typing into them, leaving with the changes applied, and reading
// what the apply logged.
#pragma once

#include <string>
#include <tuple>
#include <vector>

#include "LoggedIn.hpp"

namespace E2e {

inline constexpr char kNetworkFooter[] = "<Esc> Exit";
inline constexpr char kRestartQuestion[] = "Apply changes and restart management network?";
inline constexpr char kRebootQuestion[] = "Apply changes and reboot host?";
inline constexpr char kErrorTitle[] = "Enable Management Network: Error";

class NetworkTest : public ConsoleTest {
protected:
    explicit NetworkTest(const std::string& network = "") : ConsoleTest(network) {}

    // Logs in and opens the network window.
    ::testing::AssertionResult OpenNetwork() {
        if (auto menu = StartInMenu(); !menu) return menu;
        if (auto selected = SelectEntry(*t, "Configure Management Network"); !selected) return selected;
        t->SendKey("Enter");
        return t->WaitForText(kNetworkFooter);
    }

    // In the network window: selects `entry`, presses Enter, waits for `shown`.
    ::testing::AssertionResult OpenDialog(const std::string& entry, const std::string& shown) {
        for (int i = 0; i < 6; ++i) t->SendKey("Up");
        if (auto quiet = t->WaitQuiet(); !quiet) return quiet;
        if (auto selected = SelectEntry(*t, entry); !selected) return selected;
        t->SendKey("Enter");
        return t->WaitForText(shown);
    }

    // Presses Enter in a dialog and waits until `shown` (the dialog's own
    // text) is gone.
    ::testing::AssertionResult Confirm(const std::string& shown) {
        t->SendKey("Enter");
        return t->WaitForTextGone(shown);
    }

    // Esc in the network window, Y to the question, then waits for the end
    // of the apply.
    ::testing::AssertionResult LeaveAndApply(const std::string& question = kRestartQuestion) {
        t->SendKey("Esc");
        if (auto asked = t->WaitForText(question); !asked) return asked;
        t->Send("y");
        return WaitForLog(host, "Network settings changed.");
    }

    // OpenDialog(entry, shown), Keys(keys), then Confirm(shown).
    ::testing::AssertionResult Edit(const std::string& entry, const std::string& shown,
                                    const std::vector<std::string>& keys) {
        if (auto open = OpenDialog(entry, shown); !open) return open;
        Keys(keys);
        return Confirm(shown);
    }

    // Static IPv4 in the IPv4 dialog, from the menu of the network window:
    // from the first row down to the static choice, mark it, then the fields.
    ::testing::AssertionResult SetStaticIpv4(const std::string& address, const std::string& mask,
                                             const std::string& gateway) {
        return Edit("IPv4 Configuration", "Set static IPv4 address",
                    {"Down", "Down", " ", "Down", address, "Down", mask, "Down", gateway});
    }

    // Every dialog of the window confirmed with a change: adapters (zonic1
    // added), VLAN 20, static IPv4 and IPv6, DNS servers, a dotted host name
    // and two suffixes. Without DHCP the automatic DNS row cannot be chosen:
    // the manual one is current and marked.
    ::testing::AssertionResult EditEverything() {
        const std::tuple<const char*, const char*, std::vector<std::string>> edits[] = {
            {"Network Adapters", "Hardware Label (MAC Address)", {"Down", " "}},
            {"VLAN (optional)", "VLAN ID (1-4094", {"20"}},
            {"IPv4 Configuration",
             "Set static IPv4 address",
             {"Down", "Down", " ", "Down", "198.51.100.10", "Down", "255.255.255.0", "Down", "198.51.100.1"}},
            {"IPv6 Configuration",
             "Set static IPv6 address",
             {"Down", "Down", "Down", " ", "Down", "2001:db8:20::10/64", "Down", "Down", "Down",
              "2001:db8:20::1"}},
            {"DNS Configuration",
             "Use the following DNS server",
             {"Down", "198.51.100.53", "Down", "2001:db8:20::53", "Down", "esx7.lab.test"}},
            {"Custom DNS Suffixes", "Suffixes:", {"lab.test corp.test"}},
        };
        for (const auto& [entry, shown, keys] : edits)
            if (auto ok = Edit(entry, shown, keys); !ok) return ok << " (" << entry << ")";
        return ::testing::AssertionSuccess();
    }
};

}  // namespace E2e
