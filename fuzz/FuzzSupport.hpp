// What the fuzz targets share: the reading of laid-out mark-up as the text
// area draws it, small file and text helpers, and a failure that names the
// broken rule.
#pragma once

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>
#include <string_view>
#include <vector>

#include "DisplayWidth.hpp"

namespace fuzz_support {

// Prints the rule that broke and the text it broke on, then aborts so that
// libFuzzer keeps the input.
[[noreturn]] inline void Fail(const char* rule, std::string_view detail) {
    std::fprintf(stderr, "RULE BROKEN: %s\n  [%zu bytes] \"", rule, detail.size());
    for (unsigned char c : detail) {
        if (c >= 0x20 && c < 0x7f && c != '"' && c != '\\')
            std::fputc(c, stderr);
        else
            std::fprintf(stderr, "\\x%02x", c);
    }
    std::fputs("\"\n", stderr);
    std::abort();
}

inline void Require(bool holds, const char* rule, std::string_view detail) {
    if (!holds) Fail(rule, detail);
}

// Every byte of a file; "" when it cannot be read.
inline std::string FileText(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::ostringstream text;
    text << in.rdbuf();
    return text.str();
}

// `text` cut at every `separator`; empty pieces are kept.
inline std::vector<std::string> Split(std::string_view text, char separator) {
    std::vector<std::string> pieces;
    for (size_t start = 0;;) {
        const size_t end = text.find(separator, start);
        pieces.emplace_back(text.substr(start, end == std::string_view::npos ? end : end - start));
        if (end == std::string_view::npos) return pieces;
        start = end + 1;
    }
}

// The lines of laid-out mark-up as they appear on screen: tags dropped,
// "{lbrace}" shown as "{". Reads the text the way TextArea's drawing does.
inline std::vector<std::string> ShownLines(std::string_view laidOut) {
    std::vector<std::string> lines(1);
    for (size_t i = 0; i < laidOut.size();) {
        const char c = laidOut[i];
        if (c == '\n') {
            lines.emplace_back();
            ++i;
        } else if (c == '{') {
            const size_t close = laidOut.find('}', i);
            if (close == std::string_view::npos) break;
            if (laidOut.substr(i + 1, close - i - 1) == "lbrace") lines.back() += '{';
            i = close + 1;
        } else {
            lines.back() += c;
            ++i;
        }
    }
    return lines;
}

// The rules every laid-out text keeps: each shown line is valid UTF-8 without
// control characters and no wider than `width` columns.
inline void CheckLaidOut(std::string_view laidOut, int width, std::string_view input) {
    for (const std::string& line : ShownLines(laidOut)) {
        Require(Velk::ShowableText(line) == line, "a shown line is valid, printable UTF-8", line);
        for (unsigned char c : line) Require(c >= 0x20 && c != 0x7f, "no control character is shown", line);
        if (Velk::DisplayColumns(line) > width) {
            std::fprintf(stderr, "width %d, line of %d columns; input follows\n", width,
                         Velk::DisplayColumns(line));
            Fail("no line is wider than its area", input);
        }
    }
}

}  // namespace fuzz_support
