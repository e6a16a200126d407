// Measures the console against a minimal ncurses menu program in the same run
// and prints each figure of both beside their ratio: time to the first frame
// and the bytes it took at 80x25 on TERM=linux, bytes and latency per Up/Down
// key in the main menu and in the management network menu (both against the
// minimal program's one menu), peak resident memory, and wake-ups over 5 idle
// seconds.
// Ratios, not absolute times, are what to compare between runs and machines.
#include <dirent.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <functional>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "SimHost.hpp"
#include "Terminal.hpp"

namespace {

using Clock = std::chrono::steady_clock;
using E2e::Terminal;
using E2e::TerminalOptions;

constexpr int kRuns = 7;
constexpr int kKeys = 40;

double Median(std::vector<double> values) {
    std::sort(values.begin(), values.end());
    return values.empty() ? 0 : values[values.size() / 2];
}

// A field of /proc/PID/status ("VmHWM:", "voluntary_ctxt_switches:").
long StatusField(const std::string& path, const std::string& name) {
    std::ifstream in(path);
    std::string line;
    while (std::getline(in, line)) {
        if (line.rfind(name, 0) == 0) return std::stol(line.substr(name.size()));
    }
    return 0;
}

// Context switches of every thread of the process: each is one wake-up.
long WakeUps(pid_t pid) {
    long total = 0;
    const std::string dir = "/proc/" + std::to_string(pid) + "/task";
    if (DIR* d = opendir(dir.c_str())) {
        while (dirent* e = readdir(d)) {
            if (e->d_name[0] == '.') continue;
            const std::string status = dir + "/" + e->d_name + "/status";
            total += StatusField(status, "voluntary_ctxt_switches:") +
                     StatusField(status, "nonvoluntary_ctxt_switches:");
        }
        closedir(d);
    }
    return total;
}

struct KeyFigures {
    double bytesPerKey = 0;
    double latencyMs = 0;
};

struct Figures {
    double firstFrameMs = 0;
    double firstFrameBytes = 0;
    KeyFigures menuKeys;
    KeyFigures networkKeys;
    double peakRssKb = 0;
    double idleWakeUps = 0;
    bool menu = false;
    bool network = false;
};

// Waits until output stops for `quiet`; returns when the last byte came.
Clock::time_point SettleAfter(Terminal& t, size_t before, Clock::time_point sent) {
    Clock::time_point first{};
    size_t last = before;
    Clock::time_point lastChange = Clock::now();
    const auto deadline = sent + std::chrono::seconds(5);
    while (Clock::now() < deadline) {
        size_t now = t.BytesReceived();
        if (now != last) {
            if (first == Clock::time_point{}) first = Clock::now();
            last = now;
            lastChange = Clock::now();
        } else if (first != Clock::time_point{} &&
                   Clock::now() - lastChange > std::chrono::milliseconds(30)) {
            break;
        }
        std::this_thread::sleep_for(std::chrono::microseconds(200));
    }
    return first == Clock::time_point{} ? sent : first;
}

// Bytes and latency of kKeys Up/Down keys in the menu on screen; the
// selection ends where it started.
KeyFigures MeasureKeys(Terminal& t) {
    std::vector<double> latencies;
    const size_t start = t.BytesReceived();
    for (int i = 0; i < kKeys; ++i) {
        const size_t before = t.BytesReceived();
        auto sent = Clock::now();
        t.SendKey(i % 8 < 4 ? "Down" : "Up");
        auto first = SettleAfter(t, before, sent);
        latencies.push_back(std::chrono::duration<double, std::milli>(first - sent).count());
    }
    return {static_cast<double>(t.BytesReceived() - start) / kKeys, Median(latencies)};
}

// Runs one program kRuns times for the first frame, then once more for the
// menu keys, memory and idle figures. `toMenu` brings it into its menu,
// `toNetwork` (may be empty) from there into a second menu.
Figures Measure(const std::function<TerminalOptions()>& options, const std::string& frameText,
                const std::function<bool(Terminal&)>& toMenu,
                const std::function<bool(Terminal&)>& toNetwork) {
    Figures f;
    std::vector<double> times, bytes;
    for (int i = 0; i < kRuns; ++i) {
        auto start = Clock::now();
        Terminal t(options());
        if (!t.WaitForText(frameText)) continue;
        times.push_back(std::chrono::duration<double, std::milli>(Clock::now() - start).count() - 50.0);
        bytes.push_back(static_cast<double>(t.BytesReceived()));
        t.Signal(SIGTERM);
        t.WaitForExit();
    }
    f.firstFrameMs = Median(times);
    f.firstFrameBytes = Median(bytes);

    Terminal t(options());
    if (t.WaitForText(frameText) && toMenu(t)) {
        f.menu = true;
        f.menuKeys = MeasureKeys(t);
        if (toNetwork && toNetwork(t)) {
            f.network = true;
            f.networkKeys = MeasureKeys(t);
        }
    }
    t.WaitQuiet(std::chrono::milliseconds(300));
    const std::string status = "/proc/" + std::to_string(t.Pid()) + "/status";
    const long before = WakeUps(t.Pid());
    std::this_thread::sleep_for(std::chrono::seconds(5));
    f.idleWakeUps = static_cast<double>(WakeUps(t.Pid()) - before);
    f.peakRssKb = static_cast<double>(StatusField(status, "VmHWM:"));
    t.Signal(SIGTERM);
    t.WaitForExit();
    return f;
}

void Row(const char* name, double velk, double minimal, const char* unit) {
    if (minimal > 0) {
        std::printf("%-28s %12.2f %12.2f %10.2fx  %s\n", name, velk, minimal, velk / minimal, unit);
    } else {
        std::printf("%-28s %12.2f %12.2f %11s  %s\n", name, velk, minimal, "-", unit);
    }
}

}  // namespace

// Upper bounds for --check: byte ratios are exact for a given screen and
// curses version, so they make a stable guard against redraws that send more
// than they must; times are never checked.
constexpr double kMaxFirstFrameBytesRatio = 2.0;
constexpr double kMaxBytesPerKeyRatio = 6.0;

// With --check, the figures are also judged: the console must reach its
// menu, stay below the byte ratios above, and not wake up while idle.
int Check(const Figures& velk, const Figures& minimal) {
    int failures = 0;
    auto fail = [&](const char* what, double limit) {
        std::printf("CHECK FAILED: %s", what);
        if (limit > 0) std::printf(" above %.1fx", limit);
        std::printf("\n");
        ++failures;
    };
    if (velk.firstFrameBytes > kMaxFirstFrameBytesRatio * minimal.firstFrameBytes)
        fail("bytes to first frame", kMaxFirstFrameBytesRatio);
    if (!velk.menu)
        fail("could not log in to the main menu", 0);
    else if (velk.menuKeys.bytesPerKey > kMaxBytesPerKeyRatio * minimal.menuKeys.bytesPerKey)
        fail("bytes per Up/Down key", kMaxBytesPerKeyRatio);
    if (!velk.network)
        fail("could not open the management network menu", 0);
    else if (velk.networkKeys.bytesPerKey > kMaxBytesPerKeyRatio * minimal.menuKeys.bytesPerKey)
        fail("bytes per Up/Down key in the network menu", kMaxBytesPerKeyRatio);
    if (velk.idleWakeUps > 0) fail("the console woke up while idle", 0);
    return failures == 0 ? 0 : 1;
}

int main(int argc, char** argv) {
    const bool check = argc > 1 && std::string(argv[1]) == "--check";
    E2e::SimHost host("bench");
    // The root account's password, from the host's PAM user table.
    std::string password;
    if (host.Exists("/etc/pam-wrapper/passdb")) {
        std::istringstream passdb(host.ReadFile("/etc/pam-wrapper/passdb"));
        std::string line;
        while (std::getline(passdb, line)) {
            if (line.rfind("root:", 0) == 0) password = line.substr(5, line.find(':', 5) - 5);
        }
    }
    auto velkOptions = [&] {
        TerminalOptions o = host.Console("linux", 80, 25);
        const bool hasPam = std::any_of(o.env.begin(), o.env.end(),
                                        [](const std::string& e) { return e.rfind("PAM_WRAPPER=", 0) == 0; });
        if (!hasPam && !password.empty()) {
            o.env.push_back("PAM_WRAPPER=1");
            o.env.push_back("LD_PRELOAD=libpam_wrapper.so");
            o.env.push_back("PAM_WRAPPER_SERVICE_DIR=" + host.Path("/etc/pam-wrapper"));
        }
        return o;
    };
    auto minimalOptions = [] {
        TerminalOptions o;
        o.program = BENCH_MINIMAL_MENU_BIN;
        o.env = {"LANG=C.UTF-8", "ESCDELAY=25"};
        return o;
    };
    auto login = [&](Terminal& t) {
        if (password.empty()) return false;
        t.SendKey("F2");
        if (!t.WaitForText("Password:")) return false;
        t.SendKey("Tab");
        t.Send(password);
        t.SendKey("Enter");
        return static_cast<bool>(t.WaitForText("System Customization"));
    };
    // From "Configure Password" down to "Configure Management Network".
    auto toNetwork = [](Terminal& t) {
        for (int i = 0; i < 3; ++i) t.SendKey("Down");
        t.SendKey("Enter");
        return static_cast<bool>(t.WaitForText("<Esc> Exit"));
    };
    Figures velk = Measure(velkOptions, "<F12>", login, toNetwork);
    Figures minimal = Measure(
        minimalOptions, "Reset System Configuration", [](Terminal&) { return true; }, nullptr);

    std::printf("%-28s %12s %12s %11s\n", "80x25, TERM=linux", "velk", "minimal", "ratio");
    Row("time to first frame", velk.firstFrameMs, minimal.firstFrameMs, "ms (median)");
    Row("bytes to first frame", velk.firstFrameBytes, minimal.firstFrameBytes, "bytes");
    if (velk.menu) {
        Row("bytes per Up/Down key", velk.menuKeys.bytesPerKey, minimal.menuKeys.bytesPerKey, "bytes");
        Row("latency per Up/Down key", velk.menuKeys.latencyMs, minimal.menuKeys.latencyMs,
            "ms (median, to first byte)");
    } else {
        std::printf("%-28s could not log in to the main menu\n", "menu keys");
    }
    if (velk.network) {
        Row("bytes per key, network", velk.networkKeys.bytesPerKey, minimal.menuKeys.bytesPerKey, "bytes");
        Row("latency per key, network", velk.networkKeys.latencyMs, minimal.menuKeys.latencyMs,
            "ms (median, to first byte)");
    } else {
        std::printf("%-28s could not open the management network menu\n", "network keys");
    }
    Row("peak resident memory", velk.peakRssKb, minimal.peakRssKb, "KiB");
    Row("wake-ups in 5 idle seconds", velk.idleWakeUps, minimal.idleWakeUps, "context switches");
    return check ? Check(velk, minimal) : 0;
}
