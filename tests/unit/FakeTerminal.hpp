// A curses screen for tests that draw: a vt100 terminal writing to /dev/null,
// created once per test program, with a UTF-8 locale so that wide characters
// land in single cells.
#pragma once

#include <curses.h>

#include <climits>
#include <clocale>
#include <cstdio>
#include <cstdlib>
#include <string>

namespace testing_support {

inline void EnsureFakeTerminal() {
    static bool ready = [] {
        if (stdscr) return true;
        std::setlocale(LC_ALL, "C.UTF-8");
        unsetenv("LINES");
        unsetenv("COLUMNS");
        FILE* out = std::fopen("/dev/null", "w");
        FILE* in = std::fopen("/dev/null", "r");
        SCREEN* screen = newterm("vt100", out, in);
        if (!screen) return false;
        set_term(screen);
        return true;
    }();
    (void)ready;
}

// The character in a cell of a window, as UTF-8 ("" when it can't be read).
inline std::string CellText(WINDOW* win, int y, int x) {
    cchar_t cell;
    if (mvwin_wch(win, y, x, &cell) == ERR) return "";
    wchar_t wide[CCHARW_MAX + 1] = {};
    attr_t attrs;
    short pair;
    if (getcchar(&cell, wide, &attrs, &pair, nullptr) == ERR) return "";
    char bytes[MB_LEN_MAX * (CCHARW_MAX + 1)] = {};
    const size_t n = std::wcstombs(bytes, wide, sizeof bytes);
    return n == static_cast<size_t>(-1) ? "" : std::string(bytes, n);
}

// The text of a row of a window, one cell after the other.
inline std::string RowText(WINDOW* win, int y) {
    std::string text;
    for (int x = 0; x < getmaxx(win); ++x) text += CellText(win, y, x);
    return text;
}

// The colour pair drawn in a cell.
inline int CellPair(WINDOW* win, int y, int x) {
    cchar_t cell;
    if (mvwin_wch(win, y, x, &cell) == ERR) return -1;
    wchar_t wide[CCHARW_MAX + 1] = {};
    attr_t attrs;
    short pair;
    if (getcchar(&cell, wide, &attrs, &pair, nullptr) == ERR) return -1;
    return pair;
}

}  // namespace testing_support
