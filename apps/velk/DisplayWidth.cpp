#include "DisplayWidth.hpp"

#include <locale.h>

#include <cwchar>

namespace Velk {

namespace {

bool IsContinuation(unsigned char c) { return (c & 0xC0) == 0x80; }

// Columns of a code point as the C library's UTF-8 tables give them,
// whatever locale the process runs in; -1 for what cannot be shown.
int CodePointColumns(char32_t cp) {
    static const locale_t utf8 = newlocale(LC_CTYPE_MASK, "C.UTF-8", static_cast<locale_t>(nullptr));
    if (utf8 == static_cast<locale_t>(nullptr)) return cp < 0x20 || (cp >= 0x7f && cp < 0xa0) ? -1 : 1;
    const locale_t previous = uselocale(utf8);
    const int columns = wcwidth(static_cast<wchar_t>(cp));
    uselocale(previous);
    return columns;
}

// Decodes one well-formed UTF-8 sequence (no overlong forms, no surrogates,
// nothing above U+10FFFF); 0 bytes when text[i] does not start one.
size_t Decode(std::string_view text, size_t i, char32_t& cp) {
    const unsigned char lead = static_cast<unsigned char>(text[i]);
    if (lead < 0x80) {
        cp = lead;
        return 1;
    }
    size_t length = 0;
    unsigned char low = 0x80;
    unsigned char high = 0xBF;
    if (lead >= 0xC2 && lead <= 0xDF) {
        length = 2;
        cp = lead & 0x1F;
    } else if (lead >= 0xE0 && lead <= 0xEF) {
        length = 3;
        cp = lead & 0x0F;
        if (lead == 0xE0) low = 0xA0;
        if (lead == 0xED) high = 0x9F;
    } else if (lead >= 0xF0 && lead <= 0xF4) {
        length = 4;
        cp = lead & 0x07;
        if (lead == 0xF0) low = 0x90;
        if (lead == 0xF4) high = 0x8F;
    } else {
        return 0;
    }
    if (i + length > text.size()) return 0;
    for (size_t k = 1; k < length; ++k) {
        const unsigned char c = static_cast<unsigned char>(text[i + k]);
        if (!IsContinuation(c) || (k == 1 && (c < low || c > high))) return 0;
        cp = (cp << 6) | (c & 0x3F);
    }
    return length;
}

}  // namespace

Glyph NextGlyph(std::string_view text, size_t i) {
    Glyph glyph;
    char32_t cp = 0;
    const size_t length = Decode(text, i, cp);
    if (length == 1 && (cp < 0x20 || cp == 0x7f)) {
        glyph.columns = 0;
        glyph.shown = text.substr(i, 1);
        glyph.codePoint = cp;
        return glyph;
    }
    const int columns = length == 0 ? -1 : CodePointColumns(cp);
    if (columns < 0) {
        glyph.length = length == 0 ? 1 : length;
        glyph.shown = kReplacementChar;
        glyph.replaced = true;
        glyph.codePoint = 0xFFFD;
        return glyph;
    }
    glyph.length = length;
    glyph.columns = columns > 2 ? 2 : columns;
    glyph.shown = text.substr(i, length);
    glyph.codePoint = cp;
    return glyph;
}

int DisplayColumns(std::string_view text) {
    int columns = 0;
    for (size_t i = 0; i < text.size();) {
        const Glyph glyph = NextGlyph(text, i);
        columns += glyph.columns;
        i += glyph.length;
    }
    return columns;
}

std::string ShowableText(std::string_view text) {
    std::string out;
    out.reserve(text.size());
    for (size_t i = 0; i < text.size();) {
        const Glyph glyph = NextGlyph(text, i);
        out += glyph.shown;
        i += glyph.length;
    }
    return out;
}

std::string CutToColumns(std::string_view text, int columns) {
    std::string out;
    int used = 0;
    for (size_t i = 0; i < text.size();) {
        const Glyph glyph = NextGlyph(text, i);
        if (used + glyph.columns > columns) break;
        used += glyph.columns;
        out += glyph.shown;
        i += glyph.length;
    }
    return out;
}

void AddShownText(WINDOW* win, std::string_view text) {
    wchar_t cell[CCHARW_MAX + 1] = {};
    int count = 0;
    auto flush = [&] {
        if (count == 0) return;
        cell[count] = L'\0';
        cchar_t c;
        // No attributes of its own: the cell takes the window's.
        if (setcchar(&c, cell, A_NORMAL, 0, nullptr) == OK) wadd_wch(win, &c);
        count = 0;
    };
    for (size_t i = 0; i < text.size();) {
        const Glyph glyph = NextGlyph(text, i);
        i += glyph.length;
        if (glyph.columns > 0) {
            flush();
            cell[count++] = static_cast<wchar_t>(glyph.codePoint);
        } else if (glyph.codePoint >= 0x20 && count > 0 && count < CCHARW_MAX) {
            cell[count++] = static_cast<wchar_t>(glyph.codePoint);
        }
    }
    flush();
}

}  // namespace Velk
