// Screen columns of UTF-8 text as a terminal shows it: wide characters (CJK)
// take two columns, combining characters none. Bytes that are not valid UTF-8
// and characters that cannot be shown are drawn as U+FFFD, one column each,
// so that text cut to a width never ends in half a character.
#pragma once

#include <curses.h>

#include <cstddef>
#include <string>
#include <string_view>

namespace Velk {

// U+FFFD, what stands in for a byte that is not valid UTF-8.
inline constexpr std::string_view kReplacementChar = "\xEF\xBF\xBD";

struct Glyph {
    size_t length = 1;       // bytes of the text it takes
    int columns = 1;         // 0, 1 or 2
    std::string_view shown;  // what to write: the text's bytes or kReplacementChar
    bool replaced = false;   // invalid or unprintable: shown as kReplacementChar
    char32_t codePoint = 0;  // of what is shown
};

// The character that starts at text[i] (i < text.size()). A byte that does
// not start a complete, well-formed sequence is one replaced glyph by itself.
// ASCII control characters are reported as they are, with 0 columns; the
// caller decides what to do with them.
Glyph NextGlyph(std::string_view text, size_t i);

// Columns the text takes when written with ShowableText's replacements.
int DisplayColumns(std::string_view text);

// The text with every glyph in its shown form (valid UTF-8 only).
std::string ShowableText(std::string_view text);

// The longest start of the text that fits in `columns` columns, whole
// characters only (combining characters stay with their base), in shown form.
std::string CutToColumns(std::string_view text, int columns);

// Writes shown text (valid UTF-8 without control characters, as laid out) at
// the window's cursor: each character with its combining characters as one
// cell, so that a combining character after the last column of a row is not
// carried over to the next row. Combining characters with nothing before them
// are not written.
void AddShownText(WINDOW* win, std::string_view text);

}  // namespace Velk
