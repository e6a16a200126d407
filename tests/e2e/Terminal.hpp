// A program running in a pseudo-terminal whose screen is kept by libvterm. A
// reader thread drains the pty all the time, so the program never blocks on
// output while the test is busy elsewhere.
#pragma once

#include <gtest/gtest.h>
#include <sys/types.h>
#include <termios.h>

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

struct VTerm;
struct VTermScreen;

namespace E2e {

using Duration = std::chrono::milliseconds;

// Long enough for a sanitizer build on a busy two-core machine.
inline constexpr Duration kDefaultTimeout{10000};
// Output pause after which a screen counts as drawn.
inline constexpr Duration kQuiet{50};

struct Rgb {
    uint8_t r = 0, g = 0, b = 0;
    bool operator==(const Rgb&) const = default;
};
std::string ToString(const Rgb& rgb);  // "#rrggbb"

// A cell colour as the program set it.
struct CellColor {
    enum class Kind { Default, Indexed, Direct };
    Kind kind = Kind::Default;
    int index = -1;
    Rgb rgb;

    bool IsIndex(int i) const { return kind == Kind::Indexed && index == i; }
    bool operator==(const CellColor&) const = default;
};
std::string ToString(const CellColor& color);

struct Cell {
    std::string text;  // UTF-8; " " for an empty cell
    CellColor fg, bg;
    bool bold = false;
    bool underline = false;
    bool blink = false;
    bool reverse = false;  // reverse video; curses' standout on these terminals
};

struct Pos {
    int col = -1, row = -1;
    bool operator==(const Pos&) const = default;
};

// One palette change seen in the output; index -1 is a palette reset (ESC ] R).
struct PaletteChange {
    int index = -1;
    Rgb rgb;
    bool operator==(const PaletteChange&) const = default;
};

// Cuts the linux console's palette sequences ("ESC ] P n rrggbb", "ESC ] R")
// out of an output stream, appending them to `changes`: libvterm would take
// either for the start of an OSC string and swallow the text after it. A
// sequence split across reads is held back until complete.
class LinuxPaletteFilter {
public:
    std::string Feed(std::string_view bytes, std::vector<PaletteChange>& changes);

private:
    std::string _held;
};

// Parses the body of an xterm palette OSC, "4;n;rgb:rr/gg/bb[;n;rgb:...]";
// false when it is not one.
bool ParsePaletteOsc(std::string_view body, std::vector<PaletteChange>& changes);

struct TerminalOptions {
    std::string program;
    std::vector<std::string> args;  // argv[1...]
    std::string term = "linux";
    // The child's whole environment besides TERM, as "NAME=value".
    std::vector<std::string> env;
    int cols = 80;
    int rows = 25;
};

class Terminal {
public:
    explicit Terminal(TerminalOptions options);
    ~Terminal();
    Terminal(const Terminal&) = delete;
    Terminal& operator=(const Terminal&) = delete;

    pid_t Pid() const { return _pid; }
    const std::string& Term() const { return _options.term; }
    int Cols() const;
    int Rows() const;

    // --- input ---
    void Send(std::string_view bytes);
    // A named key (F1..F12, Up, Home, PageUp, Insert, Backspace, Enter, Esc,
    // ...) with the bytes the terminal type sends for it (terminfo). Fails
    // the test when the terminal type has no such key.
    void SendKey(std::string_view name);
    // The terminfo string `capname` ("kf2") of `term`; "" when it has none.
    static std::string TerminfoString(const std::string& term, const std::string& capname);
    void Signal(int sig);
    // Sets the pty's size; the kernel signals SIGWINCH to the program.
    void Resize(int cols, int rows);
    // Closes the master side, as a terminal emulator that goes away does: the
    // kernel hangs up the program's terminal (SIGHUP). Output is no longer read.
    void HangUp();
    // The pty's termios settings as the program left them.
    struct termios Modes() const;

    // --- waiting ---
    // Waits until `text` is on the screen, then for the output to go quiet.
    ::testing::AssertionResult WaitForText(std::string_view text, Duration timeout = kDefaultTimeout) {
        return WaitFor(text, true, timeout);
    }
    // Waits until `text` is no longer on the screen, then for quiet.
    ::testing::AssertionResult WaitForTextGone(std::string_view text, Duration timeout = kDefaultTimeout) {
        return WaitFor(text, false, timeout);
    }
    // Waits until the program has written nothing for `quiet` since the call.
    ::testing::AssertionResult WaitQuiet(Duration quiet = kQuiet, Duration timeout = kDefaultTimeout);
    // Waits for the program to end; the raw wait status, nothing on timeout.
    std::optional<int> WaitForExit(Duration timeout = kDefaultTimeout);
    // Waits for the program to end with exit status `code`.
    ::testing::AssertionResult ExitsWith(int code, Duration timeout = kDefaultTimeout);
    // Whether the program has ended, without waiting.
    bool HasExited() { return Reap(WNOHANG); }
    // "exit N", "signal N" or "running".
    static std::string DescribeStatus(std::optional<int> status);

    // --- screen ---
    Cell CellAt(int col, int row) const;
    std::string RowText(int row) const;         // every cell of the row
    std::string RowTextTrimmed(int row) const;  // without trailing blanks
    // The cells of a rectangle, each row trimmed at both ends, non-empty rows
    // joined with single blanks: a word-wrapped paragraph reads as one line.
    std::string RegionText(int col, int row, int width, int height) const;
    std::string ScreenText() const;  // all rows joined with "\n"
    std::optional<Pos> Find(std::string_view text) const;
    std::vector<Pos> FindAll(std::string_view text) const;
    bool Contains(std::string_view text) const { return Find(text).has_value(); }
    // Whether the row reads `text` from column `col` on.
    ::testing::AssertionResult HasTextAt(int col, int row, std::string_view text) const;
    // Whether `text` is on the screen (Shows) or nowhere on it (Lacks).
    ::testing::AssertionResult Shows(std::string_view text) const { return OnScreen(text, true); }
    ::testing::AssertionResult Lacks(std::string_view text) const { return OnScreen(text, false); }
    // The screen with row numbers; with `colors`, lines with the foreground,
    // background and attributes of every cell below each row.
    std::string Dump(bool colors = false) const;

    // --- palette and output ---
    std::vector<PaletteChange> PaletteLog() const;
    // The colour last set for `index` since the last palette reset.
    std::optional<Rgb> PaletteColor(int index) const;
    size_t BytesReceived() const;
    // Every byte the program wrote to the terminal so far.
    std::string Output() const;

    // --- the program as a process ---
    // Entries of /proc/PID/fd of the program (-1 once it has gone).
    int OpenDescriptors() const;
    // The program's resident set in KiB (VmRSS), -1 once it has gone.
    long ResidentKiB() const;
    // The direct children of the program with their state letter ('Z', ...).
    std::vector<std::pair<pid_t, char>> Children() const;

private:
    void ReaderLoop();
    ::testing::AssertionResult WaitFor(std::string_view text, bool shown, Duration timeout);
    ::testing::AssertionResult OnScreen(std::string_view text, bool shown) const;
    // The first `most` places of `text`, row by row.
    std::vector<Pos> FindLocked(std::string_view text, size_t most) const;
    Cell CellLocked(int col, int row) const;
    std::string RowLocked(int row) const;
    std::string DumpLocked(bool colors) const;
    bool Reap(int options);
    static void OnOutput(const char* bytes, size_t len, void* user);
    static int OnOsc(const char* command, size_t len, void* user);

    TerminalOptions _options;
    pid_t _pid = -1;
    int _master = -1;
    std::optional<int> _status;  // wait status once reaped
    std::thread _reader;
    bool _stop = false;

    mutable std::mutex _mutex;
    std::condition_variable _changed;
    VTerm* _vt = nullptr;
    VTermScreen* _screen = nullptr;
    int _cols, _rows;
    bool _eof = false;    // the pty's slave side is closed
    std::string _output;  // every byte received
    std::chrono::steady_clock::time_point _lastOutput;
    LinuxPaletteFilter _filter;
    std::vector<PaletteChange> _palette;
};

}  // namespace E2e
