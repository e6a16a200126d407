// Helpers for cases that log in to the console: the console runs with the PAM
// wrapper pointed at the host root's own services and password file, so that
// logging in needs no change to the machine's PAM set-up.
#pragma once

#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "SimHost.hpp"
#include "Terminal.hpp"

namespace E2e {

// The password root has on every host of these tests.
inline constexpr char kRootPassword[] = "Velk-e2e-7";
// A user who authenticates but whose account may not use the console.
inline constexpr char kGuest[] = "guest";
inline constexpr char kGuestPassword[] = "guest-pass";

// Gives root kRootPassword in the host's password file.
void SetRootPassword(const SimHost& host, const std::string& password = kRootPassword);

// How to run the console on `host` with the PAM wrapper; sanitizer settings
// are completed so that the preloaded wrapper is accepted and its known leak
// ignored.
TerminalOptions PamConsole(const SimHost& host, const std::string& term = "linux", int cols = 80,
                           int rows = 25);

// The welcome screen, recognised by its footer (the shut-down dialog's title
// also reads "Shut Down/Restart").
::testing::AssertionResult WaitForWelcome(Terminal& t, Duration timeout = kDefaultTimeout);
// The system customization menu.
::testing::AssertionResult WaitForMenu(Terminal& t);

// Presses `key` on the welcome screen, waits for the login dialog and
// submits `password` for `user` ("" keeps the prefilled name).
::testing::AssertionResult SubmitLogin(Terminal& t, const std::string& password, const std::string& user = "",
                                       const std::string& key = "F2");
// SubmitLogin with root's password, then waits for the main menu.
::testing::AssertionResult LogInToMenu(Terminal& t, const std::string& password = kRootPassword);

// Moves the menu selection with Down (Up when `up`) until `entry` is the
// selected entry, that is until its name also heads the right pane.
::testing::AssertionResult SelectEntry(Terminal& t, const std::string& entry, bool up = false);

// Entries of /history, in order, whose "tool" is one of `tools`.
std::vector<nlohmann::json> History(const SimHost& host, const std::vector<std::string>& tools);
// Waits until some history entry has tool `tool`.
::testing::AssertionResult WaitForHistory(const SimHost& host, const std::string& tool,
                                          Duration timeout = kDefaultTimeout);
// Waits until the host's log has a line containing `text`.
::testing::AssertionResult WaitForLog(const SimHost& host, const std::string& text,
                                      Duration timeout = kDefaultTimeout);

// Exactly one line of the console with `pid` contains `text`; the failure
// shows the log.
::testing::AssertionResult LoggedOnce(const SimHost& host, const std::string& text, pid_t pid);
// No line of the host's log, whoever wrote it, contains `text`.
::testing::AssertionResult NotLogged(const SimHost& host, const std::string& text);

std::string Joined(const std::vector<std::string>& lines);

// The "operation" of every hostctl entry of /history, in order.
std::vector<std::string> Operations(const SimHost& host);

// Polls `check` every 20 ms until it holds or `timeout` has passed; whether it held.
template <typename Check>
bool Eventually(Check check, Duration timeout = kDefaultTimeout) {
    const auto end = std::chrono::steady_clock::now() + timeout;
    while (!check()) {
        if (std::chrono::steady_clock::now() > end) return false;
        std::this_thread::sleep_for(Duration(20));
    }
    return true;
}

// Any process, read from /proc: the children of all its threads; its utime +
// stime in clock ticks (-1 once gone); whether it has ended (gone, or a
// zombie nobody has reaped yet).
std::vector<pid_t> ChildrenOf(pid_t pid);
long CpuTicks(pid_t pid);
bool Ended(pid_t pid);

// A case on a fresh host where root has kRootPassword. `t` is the console
// once one of the Start functions ran; a case that needs another host changes
// it before that.
class ConsoleTest : public ::testing::Test {
protected:
    // `network`: the host's shape (velk-simhost create --network).
    explicit ConsoleTest(const std::string& network = "") : host("host1", network) { SetRootPassword(host); }

    // Starts the console and waits for the welcome screen.
    ::testing::AssertionResult Start(const std::string& term = "linux");
    // Start, then logs root in and waits for the main menu.
    ::testing::AssertionResult StartInMenu(const std::string& term = "linux");
    // StartInMenu, then selects `entry`, presses Enter and waits for `shown`.
    ::testing::AssertionResult OpenEntry(const std::string& entry, const std::string& shown);
    // Sends each of `keys`: by name when it is longer than one character and
    // begins with a capital letter ("Down", "Enter"), else as typed.
    void Keys(const std::vector<std::string>& keys);
    // The console's log lines holding one of `texts`, as the texts they hold,
    // in the order they were logged.
    std::vector<std::string> Logged(const std::vector<std::string>& texts) const;

    SimHost host;
    std::optional<Terminal> t;
};

template <typename Param>
class ConsoleTestWithParam : public ConsoleTest, public ::testing::WithParamInterface<Param> {};

}  // namespace E2e
