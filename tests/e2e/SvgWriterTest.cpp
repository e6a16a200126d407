// The SVG pictures of the screen: each kind of cell in the colours the linux
// console shows it in, runs of cells sharing elements with every character at
// its cell's x, and a real screen (the console's welcome screen) with the
// palette the console sets.
#include <algorithm>

#include "SimHost.hpp"
#include "SvgWriter.hpp"

namespace E2e {
namespace {

CellColor Index(int i) { return {CellColor::Kind::Indexed, i, {}}; }
CellColor Direct(uint8_t r, uint8_t g, uint8_t b) { return {CellColor::Kind::Direct, -1, {r, g, b}}; }

// Made-up cells and the colours the linux console shows them in.
struct CellCase {
    const char* name;
    Cell cell;
    const char* fg;
    const char* bg;
};

const CellCase kCellCases[] = {
    {"default colours", {"a", {}, {}}, "#aaaaaa", "#000000"},
    {"indexed", {"b", Index(1), Index(4)}, "#aa0000", "#0000aa"},
    {"bold brightens the foreground", {"c", Index(1), Index(4), true}, "#ff5555", "#0000aa"},
    {"bold default foreground", {"d", {}, {}, true}, "#ffffff", "#000000"},
    {"reverse swaps", {"e", Index(3), Index(6), false, false, false, true}, "#00aaaa", "#aa5500"},
    {"reverse of the defaults", {"f", {}, {}, false, false, false, true}, "#000000", "#aaaaaa"},
    {"blink brightens the background", {"g", Index(0), Index(2), false, false, true}, "#000000", "#55ff55"},
    {"direct colours", {"h", Direct(1, 2, 3), Direct(250, 128, 0)}, "#010203", "#fa8000"},
    {"changed palette entry", {"i", Index(5), Index(7)}, "#123456", "#aaaaaa"},
    {"colour cube", {"j", Index(16 + 36 * 5 + 6 * 2 + 1), Index(232)}, "#ff875f", "#080808"},
    {"underline", {"u", Index(2), {}, false, true}, "#00aa00", "#000000"},
};

TEST(SvgWriterTest, ResolvesEveryKindOfCell) {
    for (const CellCase& c : kCellCases) {
        SCOPED_TRACE(c.name);
        Screenshot shot;
        shot.cols = shot.rows = 1;
        shot.palette[5] = {0x12, 0x34, 0x56};
        shot.cells = {c.cell};
        const std::string svg = ToSvg(shot);
        EXPECT_NE(svg.find(std::string(R"(<rect x="0" y="0" width="9" height="18" fill=")") + c.bg + "\"/>"),
                  std::string::npos)
            << svg;
        EXPECT_NE(svg.find(std::string(R"(<text x="0" y="15" fill=")") + c.fg + "\"" +
                           (c.cell.underline ? R"( text-decoration="underline")" : "") + ">" + c.cell.text +
                           "</text>"),
                  std::string::npos)
            << svg;
    }
}

TEST(SvgWriterTest, RunsShareElements) {
    // Two words in one colour with blanks around and between them, over two
    // backgrounds: one text element, two rectangles.
    Screenshot shot;
    shot.cols = 8;
    shot.rows = 2;
    for (const char* text : {" ", "a", "b", " ", "c", " ", " ", " "})
        shot.cells.push_back({text, Index(7), shot.cells.size() < 4 ? Index(3) : Index(6)});
    // A combining mark at its base character's x, a wide character whose right
    // half is an empty cell, and the XML special characters.
    for (const char* text : {"e\u0301", "\u5b57", "", "<", "&", "\"", "'", " "})
        shot.cells.push_back({text, Index(2), {}});
    const std::string svg = ToSvg(shot, {10, 20, 16, "a <title> & \"'"});
    for (const char* element :
         {"<title>a &lt;title&gt; &amp; &quot;&apos;</title>",
          R"(<text x="10 20 30 40" y="16" fill="#aaaaaa">ab c</text>)",
          R"(<rect x="0" y="0" width="40" height="20" fill="#aa5500"/>)",
          R"(<rect x="40" y="0" width="40" height="20" fill="#00aaaa"/>)",
          R"(<rect x="0" y="20" width="80" height="20" fill="#000000"/>)",
          "<text x=\"0 0 10 30 40 50 60\" y=\"36\" fill=\"#00aa00\">e\u0301\u5b57&lt;&amp;&quot;&apos;"
          "</text>"})
        EXPECT_NE(svg.find(element), std::string::npos) << element << "\n" << svg;
    EXPECT_EQ(std::count(svg.begin(), svg.end(), '\n'), 8) << svg;  // svg, title, 3 rects, 2 texts, end
}

// The console's welcome screen on a simulated host, in the colours the
// console sets.
TEST(SvgWriterTest, WelcomeScreenInTheConsolesColours) {
    SimHost host("host1.example.test");
    Terminal t(host.Console());
    ASSERT_TRUE(t.WaitForText("Shut Down/Restart"));
    const std::string svg = ToSvg(Capture(t));
    EXPECT_NE(svg.find("Shut Down/Restart"), std::string::npos) << svg;
    // The console's yellow and dark grey are in the picture.
    EXPECT_NE(svg.find("fill=\"#fecc00\""), std::string::npos);
    EXPECT_NE(svg.find("fill=\"#545454\""), std::string::npos);
}

}  // namespace
}  // namespace E2e
