// A logged-in console in "Configure Management Network": opening its
// dialogs, typing into them, leaving with the changes applied, and reading
// what the apply logged.
#pragma once

#include <cctype>
#include <string>
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

    void Keys(const std::vector<std::string>& keys) {
        for (const std::string& key : keys) {
            if (key.size() > 1 && std::isupper(static_cast<unsigned char>(key[0])))
                t->SendKey(key);
            else
                t->Send(key);
        }
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

    // The console's informational and error lines holding one of `texts`,
    // as the texts they hold, in the order they were logged.
    std::vector<std::string> Logged(const std::vector<std::string>& texts) const {
        std::vector<std::string> found;
        for (const std::string& line : host.ConsoleLog("", t->Pid())) {
            for (const std::string& text : texts)
                if (line.find(text) != std::string::npos) found.push_back(text);
        }
        return found;
    }

    // Static IPv4 in the IPv4 dialog, from the menu of the network window.
    ::testing::AssertionResult SetStaticIpv4(const std::string& address, const std::string& mask,
                                             const std::string& gateway) {
        if (auto open = OpenDialog("IPv4 Configuration", "Set static IPv4 address"); !open) return open;
        // From the first row down to the static choice, mark it, then the fields.
        Keys({"Down", "Down", " ", "Down", address, "Down", mask, "Down", gateway});
        return Confirm("Set static IPv4 address");
    }

    // Every dialog of the window confirmed with a change: adapters (zonic1
    // added), VLAN 20, static IPv4 and IPv6, DNS servers, a dotted host name
    // and two suffixes.
    ::testing::AssertionResult EditEverything() {
        if (auto open = OpenDialog("Network Adapters", "Hardware Label (MAC Address)"); !open) return open;
        Keys({"Down", " "});
        if (auto ok = Confirm("Hardware Label (MAC Address)"); !ok) return ok;

        if (auto open = OpenDialog("VLAN (optional)", "VLAN ID (1-4094"); !open) return open;
        Keys({"20"});
        if (auto ok = Confirm("VLAN ID (1-4094"); !ok) return ok;

        if (auto ok = SetStaticIpv4("198.51.100.10", "255.255.255.0", "198.51.100.1"); !ok) return ok;

        if (auto open = OpenDialog("IPv6 Configuration", "Set static IPv6 address"); !open) return open;
        Keys({"Down", "Down", "Down", " ", "Down", "2001:db8:20::10/64", "Down", "Down", "Down",
              "2001:db8:20::1"});
        if (auto ok = Confirm("Set static IPv6 address"); !ok) return ok;

        // Without DHCP the automatic row cannot be chosen: the manual one is
        // current and marked.
        if (auto open = OpenDialog("DNS Configuration", "Use the following DNS server"); !open) return open;
        Keys({"Down", "198.51.100.53", "Down", "2001:db8:20::53", "Down", "esx7.lab.test"});
        if (auto ok = Confirm("Use the following DNS server"); !ok) return ok;

        if (auto open = OpenDialog("Custom DNS Suffixes", "Suffixes:"); !open) return open;
        Keys({"lab.test corp.test"});
        return Confirm("Suffixes:");
    }
};

}  // namespace E2e
