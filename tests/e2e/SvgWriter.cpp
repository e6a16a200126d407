#include "SvgWriter.hpp"

#include <sstream>
#include <utility>

namespace E2e {
namespace {

// The console's colours after a reset (the kernel's default palette).
constexpr Rgb kVga[16] = {
    {0x00, 0x00, 0x00}, {0xaa, 0x00, 0x00}, {0x00, 0xaa, 0x00}, {0xaa, 0x55, 0x00},
    {0x00, 0x00, 0xaa}, {0xaa, 0x00, 0xaa}, {0x00, 0xaa, 0xaa}, {0xaa, 0xaa, 0xaa},
    {0x55, 0x55, 0x55}, {0xff, 0x55, 0x55}, {0x55, 0xff, 0x55}, {0xff, 0xff, 0x55},
    {0x55, 0x55, 0xff}, {0xff, 0x55, 0xff}, {0x55, 0xff, 0xff}, {0xff, 0xff, 0xff},
};

// The palette entry of a cell colour, with `fallback` for the default colour;
// -1 for a direct colour.
int IndexOf(const CellColor& color, int fallback) {
    if (color.kind == CellColor::Kind::Direct) return -1;
    return color.kind == CellColor::Kind::Indexed ? color.index : fallback;
}

// The colours a cell is drawn in on the linux console: the default colours
// are palette entries 7 and 0, reverse video swaps foreground and background,
// bold brightens a foreground of 0 to 7 (to 8 to 15) and blink a background.
struct Resolved {
    Rgb fg, bg;
};

Resolved Resolve(const Screenshot& shot, const Cell& cell) {
    int fg = IndexOf(cell.fg, 7);
    int bg = IndexOf(cell.bg, 0);
    Rgb fgRgb = cell.fg.rgb, bgRgb = cell.bg.rgb;
    if (cell.reverse) {
        std::swap(fg, bg);
        std::swap(fgRgb, bgRgb);
    }
    if (cell.bold && fg >= 0 && fg < 8) fg += 8;
    if (cell.blink && bg >= 0 && bg < 8) bg += 8;
    return {fg >= 0 ? shot.palette[size_t(fg) & 0xff] : fgRgb,
            bg >= 0 ? shot.palette[size_t(bg) & 0xff] : bgRgb};
}

Rgb ForegroundOf(const Screenshot& shot, const Cell& cell) { return Resolve(shot, cell).fg; }
Rgb BackgroundOf(const Screenshot& shot, const Cell& cell) { return Resolve(shot, cell).bg; }

std::string XmlEscape(std::string_view text) {
    static const char* const kEntities[] = {"&amp;", "&lt;", "&gt;", "&quot;", "&apos;"};
    std::string out;
    for (char c : text) {
        const size_t special = std::string_view("&<>\"'").find(c);
        out += special == std::string_view::npos ? std::string(1, c) : kEntities[special];
    }
    return out;
}

bool IsBlank(const Cell& cell) { return cell.text.empty() || cell.text == " "; }

// Code points of a UTF-8 text; a malformed byte counts as one.
size_t CodePoints(std::string_view text) {
    size_t n = 0;
    for (unsigned char c : text)
        if ((c & 0xc0) != 0x80) ++n;
    return n;
}

}  // namespace

Palette ResetPalette() {
    Palette palette{};
    for (size_t i = 0; i < 16; ++i) palette[i] = kVga[i];
    static const uint8_t levels[6] = {0, 95, 135, 175, 215, 255};
    for (size_t i = 0; i < 216; ++i) palette[16 + i] = {levels[i / 36], levels[i / 6 % 6], levels[i % 6]};
    for (size_t i = 0; i < 24; ++i) {
        const auto grey = uint8_t(8 + 10 * i);
        palette[232 + i] = {grey, grey, grey};
    }
    return palette;
}

Screenshot Capture(const Terminal& t) {
    Screenshot shot;
    shot.cols = t.Cols();
    shot.rows = t.Rows();
    shot.cells.reserve(size_t(shot.cols) * size_t(shot.rows));
    for (int row = 0; row < shot.rows; ++row)
        for (int col = 0; col < shot.cols; ++col) shot.cells.push_back(t.CellAt(col, row));
    for (const PaletteChange& change : t.PaletteLog()) {
        if (change.index < 0)
            shot.palette = ResetPalette();
        else if (change.index < 256)
            shot.palette[size_t(change.index)] = change.rgb;
    }
    return shot;
}

std::string ToSvg(const Screenshot& shot, const SvgOptions& options) {
    const int cw = options.cellWidth, ch = options.cellHeight;
    const int width = shot.cols * cw, height = shot.rows * ch;
    // The baseline sits a fifth of the cell above its bottom, leaving room
    // for descenders.
    const int baseline = ch - ch / 5;
    std::ostringstream svg;
    svg << "<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"" << width << "\" height=\"" << height
        << "\" viewBox=\"0 0 " << width << " " << height << "\" xml:space=\"preserve\""
        << " font-family=\"DejaVu Sans Mono, Liberation Mono, Menlo, Consolas, monospace\" font-size=\""
        << options.fontSize << "\">\n";
    if (!options.title.empty()) svg << "<title>" << XmlEscape(options.title) << "</title>\n";

    for (int row = 0; row < shot.rows; ++row) {
        // Backgrounds: one rectangle per run of equal colour.
        for (int col = 0; col < shot.cols;) {
            const Rgb bg = BackgroundOf(shot, shot.At(col, row));
            int end = col + 1;
            while (end < shot.cols && BackgroundOf(shot, shot.At(end, row)) == bg) ++end;
            svg << "<rect x=\"" << col * cw << "\" y=\"" << row * ch << "\" width=\"" << (end - col) * cw
                << "\" height=\"" << ch << "\" fill=\"" << ToString(bg) << "\"/>\n";
            col = end;
        }
        // Text: one element per run of equal foreground and underline, blanks
        // at either end left out. The right half of a wide character (an
        // empty cell) belongs to the run of its left half.
        for (int col = 0; col < shot.cols;) {
            const Cell& first = shot.At(col, row);
            const Rgb fg = ForegroundOf(shot, first);
            const bool underline = first.underline;
            int end = col + 1;
            while (end < shot.cols) {
                const Cell& next = shot.At(end, row);
                if (!next.text.empty() && (next.underline != underline || ForegroundOf(shot, next) != fg))
                    break;
                ++end;
            }
            int from = col, to = end;
            if (!underline) {
                while (from < to && IsBlank(shot.At(from, row))) ++from;
                while (to > from && IsBlank(shot.At(to - 1, row))) --to;
            }
            col = end;
            if (from == to) continue;
            std::string xs, text;
            for (int c = from; c < to; ++c) {
                const Cell& cell = shot.At(c, row);
                if (cell.text.empty()) continue;
                // Every code point of the cell (a base character and its
                // combining marks) at the cell's x.
                for (size_t n = CodePoints(cell.text); n > 0; --n) {
                    if (!xs.empty()) xs += ' ';
                    xs += std::to_string(c * cw);
                }
                text += cell.text;
            }
            svg << "<text x=\"" << xs << "\" y=\"" << row * ch + baseline << "\" fill=\"" << ToString(fg)
                << "\"";
            if (underline) svg << " text-decoration=\"underline\"";
            svg << ">" << XmlEscape(text) << "</text>\n";
        }
    }
    svg << "</svg>\n";
    return svg.str();
}

}  // namespace E2e
