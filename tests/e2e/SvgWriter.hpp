// Pictures of the emulated screen: the cells of a Terminal (characters,
// colours, attributes) with the palette the program left in the terminal,
// written as SVG in the colours the linux console shows them in.
#pragma once

#include <array>
#include <string>
#include <string_view>
#include <vector>

#include "Terminal.hpp"

namespace E2e {

using Palette = std::array<Rgb, 256>;

// The palette of a linux console after a reset: the sixteen VGA colours,
// extended by xterm's colour cube and grey ramp for indexes 16 to 255.
Palette ResetPalette();

// A still of a terminal: its cells row by row and its palette.
struct Screenshot {
    int cols = 0;
    int rows = 0;
    std::vector<Cell> cells;
    Palette palette = ResetPalette();

    const Cell& At(int col, int row) const { return cells[size_t(row) * size_t(cols) + size_t(col)]; }
};

// Takes the cells of `t` and its palette: the reset palette with every change
// the program sent since the last reset (linux "ESC ] P" and xterm OSC 4).
// Take it once the screen is quiet.
Screenshot Capture(const Terminal& t);

struct SvgOptions {
    int cellWidth = 9;    // pixels per column
    int cellHeight = 18;  // pixels per row
    int fontSize = 15;
    std::string title;  // the picture's <title>; none when empty
};

// The screen as an SVG picture of fixed cell size: per row, one <rect> for
// each run of cells with the same background and one <text> for each run of
// non-blank text with the same foreground and underline, every character
// placed at its own cell's x.
std::string ToSvg(const Screenshot& shot, const SvgOptions& options = {});

}  // namespace E2e
