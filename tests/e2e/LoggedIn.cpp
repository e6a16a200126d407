#include "LoggedIn.hpp"

#include <algorithm>
#include <cstdlib>
#include <thread>

namespace E2e {

namespace {

// `options` with `extra` appended, in the sanitizers' "a=b:c=d" form.
std::string WithOption(const char* current, const std::string& extra) {
    std::string value = current ? current : "";
    if (!value.empty()) value += ":";
    return value + extra;
}

template <typename Check>
::testing::AssertionResult Poll(Check check, Duration timeout) {
    const auto end = std::chrono::steady_clock::now() + timeout;
    for (;;) {
        if (check()) return ::testing::AssertionSuccess();
        if (std::chrono::steady_clock::now() > end) return ::testing::AssertionFailure();
        std::this_thread::sleep_for(Duration(20));
    }
}

}  // namespace

void SetRootPassword(const SimHost& host, const std::string& password) {
    host.WriteFile("/etc/pam-wrapper/passdb",
                   "root:" + password + ":velk\n" + kGuest + ":" + kGuestPassword + ":other\n");
}

TerminalOptions PamConsole(const SimHost& host, const std::string& term, int cols, int rows) {
    TerminalOptions options = host.Console(term, cols, rows);
    std::vector<std::string> env;
    for (const auto& entry : options.env) {
        // Set again below, completed.
        if (entry.starts_with("ASAN_OPTIONS=") || entry.starts_with("LSAN_OPTIONS=")) continue;
        env.push_back(entry);
    }
    env.push_back("PAM_WRAPPER=1");
    // The wrapper loads libpam with RTLD_DEEPBIND, which the sanitizer runtime
    // refuses (the console would end at its first login); this turns it off.
    env.push_back("UID_WRAPPER_DISABLE_DEEPBIND=1");
    env.push_back("LD_PRELOAD=libpam_wrapper.so");
    env.push_back("PAM_WRAPPER_SERVICE_DIR=" + host.Path("/etc/pam-wrapper"));
    // Under AddressSanitizer the runtime must accept a library preloaded ahead
    // of it; without the sanitizer these settings are not read at all.
    env.push_back("ASAN_OPTIONS=" + WithOption(getenv("ASAN_OPTIONS"), "verify_asan_link_order=0"));
    env.push_back("LSAN_OPTIONS=" + WithOption(getenv("LSAN_OPTIONS"),
                                               std::string("suppressions=") + VELK_E2E_LSAN_SUPPRESSIONS));
    options.env = std::move(env);
    return options;
}

::testing::AssertionResult WaitForWelcome(Terminal& t, Duration timeout) {
    return t.WaitForText("Customize System/View Logs", timeout);
}

::testing::AssertionResult WaitForMenu(Terminal& t) { return t.WaitForText("System Customization"); }

::testing::AssertionResult SubmitLogin(Terminal& t, const std::string& password, const std::string& user,
                                       const std::string& key) {
    t.SendKey(key);
    if (auto shown = t.WaitForText("Login Name:"); !shown) return shown;
    // The prefilled name is replaced by the first key typed.
    if (!user.empty()) t.Send(user);
    t.SendKey("Enter");
    if (auto quiet = t.WaitQuiet(); !quiet) return quiet;
    t.Send(password);
    t.SendKey("Enter");
    return ::testing::AssertionSuccess();
}

::testing::AssertionResult LogInToMenu(Terminal& t, const std::string& password) {
    if (auto submitted = SubmitLogin(t, password); !submitted) return submitted;
    return WaitForMenu(t);
}

::testing::AssertionResult SelectEntry(Terminal& t, const std::string& entry, bool up) {
    for (int moves = 0; moves < 20; ++moves) {
        if (t.FindAll(entry).size() >= 2) return ::testing::AssertionSuccess();
        // The bar's move is on the screen before the next look: a console
        // slower than the quiet period (a loaded machine, the sanitizers)
        // would otherwise be sent keys for a screen it has not drawn yet.
        const size_t before = t.BytesReceived();
        t.SendKey(up ? "Up" : "Down");
        Poll([&] { return t.BytesReceived() > before; }, Duration(3000));
        if (auto quiet = t.WaitQuiet(); !quiet) return quiet;
    }
    return ::testing::AssertionFailure() << "\"" << entry << "\" never got selected\n" << t.Dump();
}

std::vector<nlohmann::json> History(const SimHost& host, const std::vector<std::string>& tools) {
    std::vector<nlohmann::json> found;
    for (const auto& entry : host.Get("/history"))
        if (std::ranges::find(tools, entry.value("tool", "")) != tools.end()) found.push_back(entry);
    return found;
}

::testing::AssertionResult WaitForHistory(const SimHost& host, const std::string& tool, Duration timeout) {
    if (Poll([&] { return !History(host, {tool}).empty(); }, timeout)) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure()
           << "no " << tool << " in the history: " << host.Get("/history").dump(1);
}

::testing::AssertionResult WaitForLog(const SimHost& host, const std::string& text, Duration timeout) {
    if (Poll([&] { return !host.ConsoleLog(text).empty(); }, timeout)) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "no log line with \"" << text << "\":\n"
                                         << Joined(host.SyslogLines());
}

::testing::AssertionResult LoggedOnce(const SimHost& host, const std::string& text, pid_t pid) {
    const size_t count = host.ConsoleLog(text, pid).size();
    if (count == 1) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure()
           << count << " log lines of [" << pid << "] with \"" << text << "\":\n"
           << Joined(host.SyslogLines());
}

::testing::AssertionResult NotLogged(const SimHost& host, const std::string& text) {
    if (host.ConsoleLog(text).empty()) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "a log line with \"" << text << "\":\n"
                                         << Joined(host.SyslogLines());
}

std::string Joined(const std::vector<std::string>& lines) {
    std::string all;
    for (const auto& l : lines) all += l + "\n";
    return all;
}

::testing::AssertionResult ConsoleTest::Start(const std::string& term) {
    t.emplace(PamConsole(host, term));
    return WaitForWelcome(*t);
}

::testing::AssertionResult ConsoleTest::StartInMenu(const std::string& term) {
    if (auto started = Start(term); !started) return started;
    return LogInToMenu(*t);
}

::testing::AssertionResult ConsoleTest::OpenEntry(const std::string& entry, const std::string& shown) {
    if (auto menu = StartInMenu(); !menu) return menu;
    if (auto selected = SelectEntry(*t, entry); !selected) return selected;
    t->SendKey("Enter");
    return t->WaitForText(shown);
}

}  // namespace E2e
