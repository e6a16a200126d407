// Key decoding as the console sees it: curses in keypad mode with the
// console's own escape-sequence table (DefineKeys), on the terminal types a
// console runs on (the local console, and serial lines as vt100 or xterm).
//
// Input: the first byte picks the terminal type, the rest is what arrives on
// the line. Rules: every key read is a byte or a key code curses names, there are
// never more keys than bytes, all bytes are taken, and the same bytes give the
// same keys again (nothing is left over from one read to the next).
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <string>
#include <vector>

#include "Console.hpp"
#include "FuzzSupport.hpp"

namespace {

using fuzz_support::Require;

struct Line {
    SCREEN* screen = nullptr;
    int readFd = -1;
    int writeFd = -1;
};

const char* const kTerminals[] = {"linux", "vt100", "xterm"};
constexpr size_t kTerminalCount = sizeof kTerminals / sizeof kTerminals[0];

std::vector<Line>& Lines() {
    static std::vector<Line> lines = [] {
        std::setlocale(LC_ALL, "C.UTF-8");
        unsetenv("LINES");
        unsetenv("COLUMNS");
        std::vector<Line> made;
        for (const char* type : kTerminals) {
            int fds[2];
            if (pipe2(fds, O_CLOEXEC | O_NONBLOCK) != 0) fuzz_support::Fail("a pipe can be made", type);
            FILE* in = fdopen(fds[0], "r");
            FILE* out = std::fopen("/dev/null", "w");
            SCREEN* screen = newterm(type, out, in);
            if (!screen) fuzz_support::Fail("a curses screen can be made", type);
            set_term(screen);
            cbreak();
            noecho();
            keypad(stdscr, TRUE);
            nodelay(stdscr, TRUE);
            set_escdelay(0);
            Velk::DefineKeys();
            made.push_back({screen, fds[0], fds[1]});
        }
        return made;
    }();
    return lines;
}

std::vector<int> Decode(const Line& line, const std::string& bytes) {
    set_term(line.screen);
    size_t written = 0;
    while (written < bytes.size()) {
        const ssize_t n = write(line.writeFd, bytes.data() + written, bytes.size() - written);
        if (n <= 0) fuzz_support::Fail("the line takes the bytes", bytes);
        written += size_t(n);
    }
    std::vector<int> keys;
    for (;;) {
        const int key = wgetch(stdscr);
        if (key == ERR) break;
        keys.push_back(key);
        if (keys.size() > bytes.size()) fuzz_support::Fail("never more keys than bytes", bytes);
    }
    return keys;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1 || size > 512) return 0;
    const Line& line = Lines()[data[0] % kTerminalCount];
    const std::string bytes(reinterpret_cast<const char*>(data) + 1, size - 1);
    const std::vector<int> keys = Decode(line, bytes);
    for (int key : keys) {
        // Codes above KEY_MAX are the terminal description's extended keys
        // (kUP5, Ctrl-Up): curses names them.
        const bool known = key >= KEY_MIN && key <= KEY_MAX + 512 && keyname(key) != nullptr;
        if (!((key >= 0 && key <= 0xff) || known)) {
            std::fprintf(stderr, "key %d (%s)\n", key, keyname(key) ? keyname(key) : "?");
            fuzz_support::Fail("a key is a byte or a curses key code", bytes);
        }
    }
    char left;
    Require(read(line.readFd, &left, 1) < 0 && errno == EAGAIN, "all bytes are taken", bytes);
    const std::vector<int> again = Decode(line, bytes);
    Require(again == keys, "the same bytes give the same keys", bytes);
    return 0;
}
