// The mark-up layout and drawing of a text area, for any text at any width
// from 1 to 300 columns.
//
// Input: two bytes choose the width, one the height (1 to 8 rows); the rest is
// the mark-up, and what follows its first NUL byte is the value of the key
// "{in}". Rules: no shown line is wider than the area, the shown text is valid
// UTF-8; drawn, every row holds exactly its laid-out line and nothing outside
// the area changes. Layout and drawing throw nothing.
#include <algorithm>
#include <cstdint>
#include <map>
#include <string>

#include "Console.hpp"
#include "FakeTerminal.hpp"
#include "FuzzSupport.hpp"
#include "TextArea.hpp"
#include "Window.hpp"

namespace {

using fuzz_support::Require;

// Keys the text area answers from the host; drawing must not run the host's
// tools, so the fuzzer renames these before drawing.
const char* const kHostKeys[] = {"ip",         "ssl-thumbprint", "ssh-dsa-fingerprint", "ssh-rsa-fingerprint",
                                 "hostname",   "tarnproduct",    "tarnversion",         "memory",
                                 "assettag",   "BIOSversion",    "BMCversion",          "CPLDversion",
                                 "PLSAversion"};

std::string TrimRight(std::string text) {
    while (!text.empty() && text.back() == ' ') text.pop_back();
    return text;
}

std::string WithoutHostKeys(const std::string& text) {
    std::string out;
    size_t i = 0;
    while (i < text.size()) {
        const size_t open = text.find('{', i);
        if (open == std::string::npos) break;
        const size_t close = text.find('}', open + 1);
        if (close == std::string::npos) break;
        const std::string tag = text.substr(open + 1, close - open - 1);
        out += text.substr(i, close - i);
        for (const char* key : kHostKeys)
            if (tag == key) out += "-x";
        out += '}';
        i = close + 1;
    }
    return out + text.substr(i);
}

// The text of a row as drawn: each character once, however many cells it
// covers; trailing blanks dropped.
std::string DrawnRow(WINDOW* win, int y) {
    std::string row;
    for (int x = 0; x < getmaxx(win);) {
        const std::string text = testing_support::CellText(win, y, x);
        row += text;
        x += std::max(1, Velk::DisplayColumns(text));
    }
    return TrimRight(row);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 3 || size > 4096) return 0;
    const int width = 1 + ((data[0] << 8) | data[1]) % 300;
    const int height = 1 + data[2] % 8;
    const std::string input(reinterpret_cast<const char*>(data) + 3, size - 3);
    const size_t nul = input.find('\0');
    const std::string text = input.substr(0, nul);
    const std::string inValue = nul == std::string::npos ? "" : input.substr(nul + 1);

    const std::map<std::string, std::string> values = {
        {"in", inValue},
        {"wide", "\u6f22\u5b57\u30db\u30b9\u30c8"},
        {"comb", "e\u0301e\u0301 a\u0308"},
        {"bad", "\xff\xc3 \xe2\x82"},
        {"brace", "{color:red}"},
        {"nl", "a\nb"},
    };
    auto lookup = [&](const std::string& key, std::string& value) {
        auto it = values.find(key);
        if (it == values.end()) return false;
        value = it->second;
        return true;
    };
    const std::string laidOut = Velk::TextArea::Layout(text, width, lookup);
    fuzz_support::CheckLaidOut(laidOut, width, input);

    // Drawn into an area with a one-cell margin of marked cells around it, on
    // a screen wide enough for the widest area.
    testing_support::EnsureFakeTerminal();
    static const bool sized = resize_term(40, 310) == OK;
    Require(sized, "a 40x310 curses screen can be made", text);
    const std::string drawn = WithoutHostKeys(text);
    auto* parent = new Velk::Window(0, 0, width + 2, height + 2, Velk::YELLOW, Velk::WHITE);
    WINDOW* outer = parent->GetWindow();
    Require(outer != nullptr, "the test window exists", text);
    for (int y = 0; y < height + 2; ++y)
        for (int x = 0; x < width + 2; ++x) mvwaddch(outer, y, x, '#');
    auto* area = new Velk::TextArea(parent, 1, 1, width, height, Velk::BLACK);
    area->SetText(drawn);

    const std::vector<std::string> lines = fuzz_support::ShownLines(
        Velk::TextArea::Layout(drawn, width, [](const std::string&, std::string&) { return false; }));
    for (int y = 0; y < height; ++y) {
        const std::string expected = y < static_cast<int>(lines.size()) ? TrimRight(lines[size_t(y)]) : "";
        const std::string row = DrawnRow(area->GetWindow(), y);
        if (row != expected) {
            std::fprintf(stderr, "row %d: drawn \"%s\", laid out \"%s\"\n", y, row.c_str(), expected.c_str());
            fuzz_support::Fail("each row holds its laid-out line", input);
        }
    }
    for (int y = 0; y < height + 2; ++y) {
        for (int x = 0; x < width + 2; ++x) {
            if (y >= 1 && y <= height && x >= 1 && x <= width) continue;
            Require((mvwinch(outer, y, x) & A_CHARTEXT) == '#', "nothing outside the area is drawn", input);
        }
    }
    delete parent;
    return 0;
}
