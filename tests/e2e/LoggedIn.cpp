#include "LoggedIn.hpp"

#include <algorithm>
#include <cctype>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

namespace E2e {

namespace {

// `options` with `extra` appended, in the sanitizers' "a=b:c=d" form.
std::string WithOption(const char* current, const std::string& extra) {
    std::string value = current ? current : "";
    if (!value.empty()) value += ":";
    return value + extra;
}

// The fields of /proc/PID/stat from the state (field 3) on, "" once gone.
std::string StatFields(pid_t pid) {
    std::ifstream in("/proc/" + std::to_string(pid) + "/stat");
    std::string text;
    std::getline(in, text);
    const size_t close = text.rfind(')');
    return close == std::string::npos || close + 2 >= text.size() ? "" : text.substr(close + 2);
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
        Eventually([&] { return t.BytesReceived() > before; }, Duration(3000));
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
    if (Eventually([&] { return !History(host, {tool}).empty(); }, timeout))
        return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure()
           << "no " << tool << " in the history: " << host.Get("/history").dump(1);
}

::testing::AssertionResult WaitForLog(const SimHost& host, const std::string& text, Duration timeout) {
    if (Eventually([&] { return !host.ConsoleLog(text).empty(); }, timeout))
        return ::testing::AssertionSuccess();
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

std::vector<std::string> Operations(const SimHost& host) {
    std::vector<std::string> operations;
    for (const auto& e : History(host, {"hostctl"})) operations.push_back(e["operation"]);
    return operations;
}

std::vector<pid_t> ChildrenOf(pid_t pid) {
    std::vector<pid_t> children;
    std::error_code ec;
    for (const auto& task :
         std::filesystem::directory_iterator("/proc/" + std::to_string(pid) + "/task", ec)) {
        std::ifstream in(task.path() / "children");
        for (long child; in >> child;) children.push_back(pid_t(child));
    }
    return children;
}

long CpuTicks(pid_t pid) {
    std::istringstream fields(StatFields(pid));
    std::string field;
    long ticks = 0;
    int n = 3;
    // utime is field 14, stime 15.
    for (; n <= 15 && fields >> field; ++n)
        if (n >= 14) ticks += std::stol(field);
    return n > 15 ? ticks : -1;
}

bool Ended(pid_t pid) {
    const std::string fields = StatFields(pid);
    return fields.empty() || fields[0] == 'Z';
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

void ConsoleTest::Keys(const std::vector<std::string>& keys) {
    for (const std::string& key : keys) {
        if (key.size() > 1 && std::isupper(static_cast<unsigned char>(key[0])))
            t->SendKey(key);
        else
            t->Send(key);
    }
}

std::vector<std::string> ConsoleTest::Logged(const std::vector<std::string>& texts) const {
    std::vector<std::string> found;
    for (const std::string& line : host.ConsoleLog("", t->Pid()))
        for (const std::string& text : texts)
            if (line.find(text) != std::string::npos) found.push_back(text);
    return found;
}

}  // namespace E2e
