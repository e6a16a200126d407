// The whole console under a seeded stream of random keys: printable and
// control bytes, the terminal's own keys and the console's escape forms, lone
// Esc, pastes, invalid UTF-8, with logins now and then so that the menus and
// their dialogs are reached. The console is started again whenever it ends.
// The run fails on a sanitizer report, a crash or a non-zero exit, a hang, a
// busy loop while idle, a growing number of descriptors, a child left a
// zombie, or a growing resident set.
//
// VELK_RANDOM_KEYS_SECONDS sets how long each seed runs, VELK_RANDOM_KEYS_SEED
// runs that one seed instead of the built-in ones.
#include <signal.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <deque>
#include <filesystem>
#include <fstream>
#include <map>
#include <random>

#include "LoggedIn.hpp"

namespace E2e {
namespace {

using Clock = std::chrono::steady_clock;

#if defined(__SANITIZE_ADDRESS__)
constexpr bool kSanitized = true;
#else
constexpr bool kSanitized = false;
#endif

// How long the console may take to answer before it counts as hung.
constexpr Duration kHangLimit{kSanitized ? 20000 : 10000};
// How long a child may stay a zombie.
constexpr Duration kZombieLimit{2000};
// Growth of the resident set after warm-up that counts as a leak.
constexpr long kRssGrowthKiB = 16 * 1024;
// Keys a console instance gets before its resident set is taken as warm.
constexpr int kWarmUpKeys = 150;

const char kWelcomeFooter[] = "Customize System/View Logs";

// Bytes in a readable form for the failure report.
std::string Printable(std::string_view bytes, size_t most = 80) {
    std::string out;
    for (const unsigned char c : bytes.substr(0, most)) {
        char hex[8];
        snprintf(hex, sizeof hex, "\\x%02x", c);
        out += c == 0x1b ? "\\e" : c == '\\' ? "\\\\" : c >= 0x20 && c < 0x7f ? std::string(1, char(c)) : hex;
    }
    if (bytes.size() > most) out += "...(" + std::to_string(bytes.size()) + " bytes)";
    return out;
}

// What the main thread of a process is doing: "running", or the number of
// the system call it waits in and its first argument.
struct Syscall {
    bool running = false;
    bool gone = false;
    long number = -1;
    long arg0 = -1;
};

Syscall MainThreadSyscall(pid_t pid) {
    Syscall s;
    std::ifstream in("/proc/" + std::to_string(pid) + "/syscall");
    std::string first, arg;
    if (!(in >> first)) {
        s.gone = true;
    } else if (first == "running") {
        s.running = true;
    } else {
        s.number = strtol(first.c_str(), nullptr, 10);
        if (in >> arg) s.arg0 = strtol(arg.c_str(), nullptr, 16);
    }
    return s;
}

// Whether the main thread of `pid` waits for something that is bound to come:
// terminal input, a timer, or a child that itself waits so. A thread that
// waits on a full pipe or on its own terminal's output, or for a child that
// does, is stuck. `why` names the call otherwise.
bool WaitsSanely(pid_t pid, std::string& why, int depth = 0) {
    const Syscall s = MainThreadSyscall(pid);
    if (s.gone || s.running) return true;
    switch (s.number) {
        case 0:  // read: of the terminal only
            if (s.arg0 == 0) return true;
            break;
        case 61:  // wait4: as sane as the children it waits for
            if (depth >= 4) return true;
            for (pid_t child : ChildrenOf(pid)) {
                std::string childWhy;
                if (!WaitsSanely(child, childWhy, depth + 1)) {
                    why = "waits for a child that " + childWhy;
                    return false;
                }
            }
            return true;
        case 7:    // poll
        case 23:   // select
        case 35:   // nanosleep
        case 230:  // clock_nanosleep
        case 232:  // epoll_wait
        case 270:  // pselect6
        case 271:  // ppoll
        case 281:  // epoll_pwait
            return true;
        default:
            break;
    }
    std::ifstream comm("/proc/" + std::to_string(pid) + "/comm");
    std::string name;
    std::getline(comm, name);
    if (s.number < 0) {
        // In no system call: the thread has ended (the process is on its way
        // out) or is stopped. Say what its threads do: "tid (name) state".
        why = name + "[" + std::to_string(pid) + "] is in no system call; its threads:";
        std::error_code ec;
        for (const auto& task :
             std::filesystem::directory_iterator("/proc/" + std::to_string(pid) + "/task", ec)) {
            std::ifstream stat(task.path() / "stat");
            std::string line;
            std::getline(stat, line);
            why += " " + line.substr(0, line.find(' ', line.rfind(')') + 2)) + ";";
        }
        return false;
    }
    why = name + "[" + std::to_string(pid) + "] waits in system call " + std::to_string(s.number) + " (" +
          std::to_string(s.arg0) + ", ...)";
    return false;
}

// The key streams: each key is the bytes sent at once and a name for the report.
struct Key {
    std::string bytes;
    std::string name;
};

class KeyStream {
public:
    explicit KeyStream(uint64_t seed) : _rng(seed) {}

    bool Chance(double p) { return std::uniform_real_distribution<double>(0, 1)(_rng) < p; }
    size_t Pick(size_t n) { return std::uniform_int_distribution<size_t>(0, n - 1)(_rng); }

    Key Next(const std::string& term) {
        switch (_kinds(_rng)) {
            case 0:  // a key of the terminal type (terminfo)
                return TerminfoKey(term);
            case 1:  // an escape form of the console's own key table
                return ConsoleForm();
            case 2:  // lone Esc
                return {"\x1b", "Esc"};
            case 3: {  // Enter, Space, y, n, q and digits
                static const char* const common[] = {"\r", " ", "y", "n", "Y", "N", "q", "1",
                                                     "2",  "3", "4", "5", "6", "7", "0", "\n"};
                return Named("", common[Pick(std::size(common))]);
            }
            case 4:  // printable ASCII
                return Named("", std::string(1, char(0x20 + Pick(0x5f))));
            case 5: {
                // Any control byte but Esc (sent on its own above), and DEL.
                std::string bytes(1, char(Pick(0x20)));
                if (bytes[0] == 0x1b) bytes[0] = 0x7f;
                return Named("ctrl ", bytes);
            }
            case 6:  // valid UTF-8 beyond ASCII
                return Named("utf-8 ", Utf8Char());
            case 7:
                return Named("invalid utf-8 ", InvalidUtf8());
            case 8:  // a paste of hundreds of bytes
                return Named("paste ", Paste(), 40);
            default:  // ESC R: the console restarts
                return {"\x1bR", "\\eR"};
        }
    }

private:
    // `bytes` named for the report: quoted when `prefix` is empty.
    static Key Named(const std::string& prefix, const std::string& bytes, size_t most = 80) {
        return {bytes, prefix.empty() ? "\"" + Printable(bytes) + "\"" : prefix + Printable(bytes, most)};
    }

    Key TerminfoKey(const std::string& term) {
        static const std::vector<std::pair<const char*, const char*>> keys = {
            {"Up", "kcuu1"},     {"Down", "kcud1"},   {"Left", "kcub1"},    {"Right", "kcuf1"},
            {"Home", "khome"},   {"End", "kend"},     {"PageUp", "kpp"},    {"PageDown", "knp"},
            {"Insert", "kich1"}, {"Delete", "kdch1"}, {"Backspace", "kbs"}, {"F1", "kf1"},
            {"F2", "kf2"},       {"F3", "kf3"},       {"F4", "kf4"},        {"F5", "kf5"},
            {"F6", "kf6"},       {"F7", "kf7"},       {"F8", "kf8"},        {"F9", "kf9"},
            {"F10", "kf10"},     {"F11", "kf11"},     {"F12", "kf12"},      {"Up", "kcuu1"},
            {"Down", "kcud1"},   {"Down", "kcud1"},   {"Tab", nullptr},     {"Enter", nullptr},
        };
        const auto& [name, cap] = keys[Pick(keys.size())];
        if (!cap) return {std::string(name) == "Tab" ? "\t" : "\r", name};
        std::string bytes = Terminal::TerminfoString(term, cap);
        // A terminal without the key (vt100 has no F11): its console form.
        if (bytes.empty()) return ConsoleForm();
        return {bytes, std::string(name) + " (" + term + ")"};
    }

    Key ConsoleForm() {
        static const std::vector<std::string> forms = {
            "[11~", "[12~", "[13~", "[14~", "[15~", "[17~", "[18~", "[19~", "[20~", "[21~", "[23~", "[24~",
            "1",    "2",    "3",    "4",    "5",    "6",    "7",    "8",    "9",    "0",    "!",    "@",
            "h",    "k",    "+",    "-",    "?",    "/",    "[M",   "[N",   "[O",   "[P",   "[Q",   "[R",
            "[S",   "[T",   "[U",   "[V",   "[W",   "[X",   "OA",   "OB",   "OC",   "OD",   "[A",   "[B",
            "[C",   "[D",   "[2~",  "[3~",  "[1~",  "[4~",  "[5~",  "[6~"};
        const std::string bytes = "\x1b" + forms[Pick(forms.size())];
        return {bytes, Printable(bytes)};
    }

    std::string Utf8Char() {
        static const char* const chars[] = {"é", "ß", "Ж", "中", "文", "😀", "e\u0301", "\u200b", "ｱ", "€"};
        return chars[Pick(std::size(chars))];
    }

    std::string InvalidUtf8() {
        switch (Pick(4)) {
            case 0:  // a continuation byte alone
                return std::string(1, char(0x80 + Pick(0x40)));
            case 1:  // a lead byte without its continuation
                return std::string(1, char(0xc2 + Pick(0x30)));
            case 2:  // an overlong form
                return "\xc0\xaf";
            default: {  // bytes that never occur in UTF-8
                std::string bytes;
                for (size_t n = 1 + Pick(4); n > 0; --n) bytes += char(0xf8 + Pick(8));
                return bytes;
            }
        }
    }

    std::string Paste() {
        std::string bytes;
        const size_t size = 100 + Pick(700);
        while (bytes.size() < size) {
            const size_t roll = Pick(20);
            if (roll < 15) {
                bytes += char(0x20 + Pick(0x5f));
            } else if (roll < 17) {
                bytes += Utf8Char();
            } else if (roll < 18) {
                bytes += InvalidUtf8();
            } else if (roll < 19) {
                bytes += '\t';
            } else {
                bytes += '\r';
            }
        }
        return bytes;
    }

    std::mt19937_64 _rng;
    // The kinds of key of Next(). Weights favour the keys that move through
    // screens, so that the stream gets deep into the menus; lone Esc,
    // control bytes, UTF-8 (valid and not) and pastes come less often.
    std::discrete_distribution<int> _kinds{40, 12, 6, 12, 10, 3, 3, 2, 1, 1};
};

// Screens on which the console rightly waits for nothing but the host to go
// down: the test ends the console there and boots the host.
const char* const kFinalScreens[] = {"Shutdown in progress...", "Restart in progress..."};

class RandomKeysRun {
public:
    RandomKeysRun(uint64_t seed, Duration length) : _seed(seed), _length(length), _keys(seed) {
        SetRootPassword(_host);
    }

    void Run() {
        const auto end = Clock::now() + _length;
        if (!Start()) return;
        while (Clock::now() < end)
            if (!Step()) return;
        // The last console must still be sane and end cleanly.
        if (_t->HasExited()) {
            CheckEnd(_t->WaitForExit(kHangLimit), "the console ended");
        } else if (CheckProcess()) {
            // Reaped only by the test, so the process is there to signal.
            _t->Signal(SIGTERM);
            CheckEnd(_t->WaitForExit(kHangLimit), "SIGTERM at the end of the run");
        }
        _t.reset();
        if (getenv("VELK_RANDOM_KEYS_VERBOSE"))
            for (const auto& k : _last) std::cout << "  " << k << "\n";
        std::cout << "seed " << _seed << ": " << _sent << " keys, " << _logins << " logins, " << _starts
                  << " console starts\n";
    }

private:
    bool Start() {
        static const char* const terms[] = {"linux", "linux", "xterm-256color", "vt100"};
        _term = terms[_keys.Pick(std::size(terms))];
        _t.reset();
        _t.emplace(PamConsole(_host, _term));
        ++_starts;
        _instanceKeys = 0;
        _welcomeFds = -1;
        _warmRss = -1;
        _zombies.clear();
        Note("<start TERM=" + _term + ">");
        if (auto welcome = WaitForWelcome(*_t, kHangLimit); !welcome) {
            std::string why;
            WaitsSanely(_t->Pid(), why);
            return Fail("the console did not show the welcome screen after its start" +
                        (why.empty() ? std::string() : ": " + why));
        }
        return true;
    }

    bool Step() {
        const auto started = Clock::now();
        const bool ok = StepOnce();
        // Slow steps show in the report: where the console keeps the test waiting.
        if (const auto took = std::chrono::duration_cast<Duration>(Clock::now() - started);
            took > Duration(3000))
            Note("  (that took " + std::to_string(took.count()) + " ms)");
        return ok;
    }

    bool StepOnce() {
        if (_t->HasExited()) return Restart();
        if (OnFinalScreen()) {
            // The host would go down now: end the console, boot the host.
            Note("<SIGTERM on the final screen>");
            _t->Signal(SIGTERM);
            if (!CheckEnd(_t->WaitForExit(kHangLimit), "SIGTERM on the power screen")) return false;
            _host.Boot();
            return Start();
        }
        if (OnPlainWelcome() && _keys.Chance(0.3)) return LogIn();
        const Key key = _keys.Next(_term);
        Note(key.name);
        _t->Send(key.bytes);
        ++_sent;
        ++_instanceKeys;
        if (auto quiet = _t->WaitQuiet(kQuiet, kHangLimit); !quiet) {
            return Fail("the console kept writing for " + std::to_string(kHangLimit.count()) + " ms");
        }
        if (_t->HasExited()) return Restart();
        return CheckProcess();
    }

    bool LogIn() {
        // The password may have been changed by an earlier key stream.
        SetRootPassword(_host);
        Note("<log in>");
        ++_logins;
        std::string f2 = Terminal::TerminfoString(_term, "kf2");
        _t->Send(f2.empty() ? "\x1b"
                              "2"
                            : f2);
        if (!_t->WaitForText("Login Name:", Duration(3000))) return true;  // e.g. lockdown refuses
        _t->Send("\r");
        if (!_t->WaitQuiet(kQuiet, kHangLimit)) return Fail("no quiet after the login name");
        _t->Send(kRootPassword);
        _t->Send("\r");
        if (!_t->WaitQuiet(Duration(200), kHangLimit)) return Fail("no quiet after the password");
        return true;
    }

    bool Restart() {
        const std::optional<int> status = _t->WaitForExit(kHangLimit);
        if (!CheckEnd(status, "the console ended")) return false;
        return Start();
    }

    // The console ended: with status 0 and no sanitizer report.
    bool CheckEnd(std::optional<int> status, const std::string& what) {
        const std::string output = _t->Output();
        for (const char* report : {"Sanitizer", "runtime error:"}) {
            if (output.find(report) != std::string::npos)
                return Fail(what + ": sanitizer report\n" +
                            output.substr(output.find(report) - std::min<size_t>(output.find(report), 200)));
        }
        if (!status || !WIFEXITED(*status) || WEXITSTATUS(*status) != 0)
            return Fail(what + " with " + Terminal::DescribeStatus(status));
        return true;
    }

    bool CheckProcess() {
        const pid_t pid = _t->Pid();
        // A hang: the console waits for something that does not come.
        std::string why;
        if (!WaitsSanely(pid, why)) {
            const auto until = Clock::now() + kHangLimit;
            const size_t bytes = _t->BytesReceived();
            while (!_t->HasExited() && !WaitsSanely(pid, why) && Clock::now() < until &&
                   _t->BytesReceived() == bytes)
                std::this_thread::sleep_for(Duration(50));
            if (!_t->HasExited() && !WaitsSanely(pid, why) && _t->BytesReceived() == bytes)
                return Fail("hang: " + why);
        }
        // A busy loop: the console burns the processor while nothing happens.
        if (_sent % 20 == 0 && !Spins(Duration(250)).empty() && !_t->HasExited()) {
            if (std::string spin = Spins(Duration(1500)); !spin.empty() && !_t->HasExited())
                return Fail("busy while idle: " + spin);
        }
        // Children left zombies.
        const auto now = Clock::now();
        std::map<pid_t, Clock::time_point> zombies;
        for (const auto& [child, state] : _t->Children()) {
            if (state != 'Z') continue;
            auto seen = _zombies.find(child);
            zombies[child] = seen == _zombies.end() ? now : seen->second;
            if (now - zombies[child] > kZombieLimit)
                return Fail("child " + std::to_string(child) + " has been a zombie for over " +
                            std::to_string(kZombieLimit.count()) + " ms");
        }
        _zombies = std::move(zombies);
        // Descriptors: the welcome screen holds as many each time it shows.
        if (OnPlainWelcome() && _t->Children().empty()) {
            const int fds = _t->OpenDescriptors();
            if (_welcomeFds < 0) {
                _welcomeFds = fds;
            } else if (fds > _welcomeFds && !FewerDescriptorsSoon(fds)) {
                return Fail("open descriptors grew from " + std::to_string(_welcomeFds) + " to " +
                            std::to_string(_t->OpenDescriptors()) + "\n" + Descriptors(pid));
            }
        }
        // Memory: the sanitizer's quarantine grows by design, so only the
        // plain build measures the resident set.
        if (!kSanitized && _instanceKeys >= kWarmUpKeys && _instanceKeys % 25 == 0) {
            const long rss = _t->ResidentKiB();
            if (_warmRss < 0) {
                _warmRss = rss;
            } else if (rss > _warmRss + kRssGrowthKiB) {
                return Fail("resident set grew from " + std::to_string(_warmRss) + " KiB to " +
                            std::to_string(rss) + " KiB");
            }
        }
        return true;
    }

    // A child being started holds pipes for a moment: a count above the
    // welcome screen's counts only when it stays so with no child running.
    bool FewerDescriptorsSoon(int fds) {
        for (int i = 0; i < 20; ++i) {
            std::this_thread::sleep_for(Duration(50));
            if (_t->OpenDescriptors() < fds || !_t->Children().empty() || !OnPlainWelcome()) return true;
        }
        return false;
    }

    // Non-empty when the console used most of a processor over `window`.
    std::string Spins(Duration window) {
        const long before = CpuTicks(_t->Pid());
        const size_t bytes = _t->BytesReceived();
        std::this_thread::sleep_for(window);
        const long used = CpuTicks(_t->Pid()) - before;
        const long ticks = sysconf(_SC_CLK_TCK) * window.count() / 1000;
        if (before < 0 || used < ticks * 8 / 10 || _t->BytesReceived() != bytes) return "";
        return std::to_string(used) + " of " + std::to_string(ticks) + " ticks in " +
               std::to_string(window.count()) + " ms without output";
    }

    static std::string Descriptors(pid_t pid) {
        std::string list;
        std::error_code ec;
        for (const auto& fd : std::filesystem::directory_iterator("/proc/" + std::to_string(pid) + "/fd", ec))
            list += "  " + fd.path().filename().string() + " -> " +
                    std::filesystem::read_symlink(fd, ec).string() + "\n";
        return list;
    }

    bool OnPlainWelcome() const {
        if (!_t->Contains(kWelcomeFooter)) return false;
        for (const char* dialog : {"Login Name:", "Login Id:", "PIN:", "<Esc> Cancel", "<F2> Shut Down"})
            if (_t->Contains(dialog)) return false;
        return true;
    }

    bool OnFinalScreen() const {
        for (const char* text : kFinalScreens)
            if (_t->Contains(text)) return true;
        return false;
    }

    void Note(const std::string& name) {
        _last.push_back(name);
        if (_last.size() > 40) _last.pop_front();
    }

    bool Fail(const std::string& problem) {
        std::string keys;
        for (const auto& k : _last) keys += "  " + k + "\n";
        ADD_FAILURE() << "seed " << _seed << " (replay: VELK_RANDOM_KEYS_SEED=" << _seed
                      << " VELK_RANDOM_KEYS_SECONDS=" << _length.count() / 1000 << "), TERM=" << _term
                      << ", key " << _sent << ": " << problem << "\nlast keys, oldest first:\n"
                      << keys << "screen:\n"
                      << _t->Dump();
        return false;
    }

    const uint64_t _seed;
    const Duration _length;
    KeyStream _keys;
    SimHost _host;
    std::optional<Terminal> _t;
    std::string _term;
    std::deque<std::string> _last;
    std::map<pid_t, Clock::time_point> _zombies;
    int _welcomeFds = -1;
    long _warmRss = -1;
    long _sent = 0;
    int _instanceKeys = 0;
    int _logins = 0;
    int _starts = 0;
};

// The seeds CI runs; any other seed is one environment variable away.
const uint64_t kSeeds[] = {1, 2, 3};

class RandomKeysTest : public ::testing::TestWithParam<uint64_t> {};

TEST_P(RandomKeysTest, ConsoleSurvives) {
    uint64_t seed = GetParam();
    if (const char* chosen = getenv("VELK_RANDOM_KEYS_SEED"); chosen && *chosen) {
        // One chosen seed: the built-in ones other than the first stand aside.
        if (seed != kSeeds[0]) GTEST_SKIP() << "VELK_RANDOM_KEYS_SEED runs one seed";
        seed = strtoull(chosen, nullptr, 10);
    }
    const char* seconds = getenv("VELK_RANDOM_KEYS_SECONDS");
    RandomKeysRun(seed, Duration(1000 * (seconds && *seconds ? strtol(seconds, nullptr, 10) : 25))).Run();
}

INSTANTIATE_TEST_SUITE_P(RandomKeys, RandomKeysTest, ::testing::ValuesIn(kSeeds),
                         [](const auto& info) { return "seed" + std::to_string(info.index); });

}  // namespace
}  // namespace E2e
