// The SVG pictures of the screen: read back cell by cell, they must hold the
// characters and colours the terminal shows, for made-up cells with known
// colours and for a real screen (the console's welcome screen).
#include <regex>
#include <sstream>

#include "SimHost.hpp"
#include "SvgWriter.hpp"

namespace E2e {
namespace {

// What a picture shows in one cell, read back from the SVG.
struct SvgCell {
    std::string text;  // "" where no text element puts a character
    std::string fg;    // fill of that text
    std::string bg;    // fill of the rectangle under the cell
    int rects = 0;     // rectangles covering the cell
    bool underline = false;
};

// Entities back to characters; a bare "&" makes the document malformed.
std::string Unescape(std::string text) {
    EXPECT_FALSE(std::regex_search(text, std::regex("&(?!(lt|gt|quot|apos|amp);)")))
        << "unescaped & in " << text;
    static const std::pair<const char*, const char*> entities[] = {
        {"&lt;", "<"}, {"&gt;", ">"}, {"&quot;", "\""}, {"&apos;", "'"}, {"&amp;", "&"}};
    for (const auto& [entity, c] : entities) text = std::regex_replace(text, std::regex(entity), c);
    return text;
}

// UTF-8 text split into code points.
std::vector<std::string> CodePoints(const std::string& text) {
    std::vector<std::string> points;
    for (unsigned char c : text) {
        if ((c & 0xc0) != 0x80 || points.empty())
            points.emplace_back(1, char(c));
        else
            points.back() += char(c);
    }
    return points;
}

// Reads the picture back into cells. Fails the test on anything outside the
// grid or misplaced between cells.
std::vector<SvgCell> ReadBack(const std::string& svg, int cols, int rows, const SvgOptions& o = {}) {
    std::vector<SvgCell> cells(size_t(cols) * size_t(rows));
    auto at = [&](int col, int row) -> SvgCell* {
        if (col < 0 || row < 0 || col >= cols || row >= rows) {
            ADD_FAILURE() << "outside the screen: column " << col << ", row " << row;
            return nullptr;
        }
        return &cells[size_t(row) * size_t(cols) + size_t(col)];
    };
    static const std::regex rect(
        R"re(<rect x="(\d+)" y="(\d+)" width="(\d+)" height="(\d+)" fill="(#[0-9a-f]{6})"/>)re");
    for (std::sregex_iterator it(svg.begin(), svg.end(), rect), end; it != end; ++it) {
        const int x = std::stoi((*it)[1]), y = std::stoi((*it)[2]), w = std::stoi((*it)[3]);
        EXPECT_EQ(std::stoi((*it)[4]), o.cellHeight);
        EXPECT_EQ(x % o.cellWidth, 0);
        EXPECT_EQ(w % o.cellWidth, 0);
        EXPECT_EQ(y % o.cellHeight, 0);
        for (int col = x / o.cellWidth; col < (x + w) / o.cellWidth; ++col) {
            if (SvgCell* cell = at(col, y / o.cellHeight)) {
                cell->bg = (*it)[5];
                ++cell->rects;
            }
        }
    }
    static const std::regex text(
        R"re(<text x="([0-9 ]+)" y="(\d+)" fill="(#[0-9a-f]{6})"( text-decoration="underline")?>([^<]*)</text>)re");
    size_t texts = 0;
    for (std::sregex_iterator it(svg.begin(), svg.end(), text), end; it != end; ++it, ++texts) {
        const int row = std::stoi((*it)[2]) / o.cellHeight;
        std::istringstream xs((*it)[1]);
        const std::vector<std::string> points = CodePoints(Unescape((*it)[5]));
        for (const std::string& point : points) {
            int x = -1;
            if (!(xs >> x)) {
                ADD_FAILURE() << "fewer x positions than characters in " << (*it)[0];
                break;
            }
            EXPECT_EQ(x % o.cellWidth, 0) << (*it)[0];
            if (SvgCell* cell = at(x / o.cellWidth, row)) {
                cell->text += point;
                cell->fg = (*it)[3];
                cell->underline = (*it)[4].matched;
            }
        }
    }
    return cells;
}

// The picture shows every cell of the still: its character (blanks may be
// left out), the colours it resolves to, and exactly one background each.
::testing::AssertionResult ShowsEveryCell(const Screenshot& shot, const std::vector<SvgCell>& cells) {
    for (int row = 0; row < shot.rows; ++row) {
        for (int col = 0; col < shot.cols; ++col) {
            const Cell& cell = shot.At(col, row);
            const SvgCell& drawn = cells[size_t(row) * size_t(shot.cols) + size_t(col)];
            const std::string where = "column " + std::to_string(col) + ", row " + std::to_string(row);
            const bool blank = cell.text.empty() || cell.text == " ";
            if (drawn.rects != 1)
                return ::testing::AssertionFailure() << where << " has " << drawn.rects << " backgrounds";
            if (drawn.bg != ToString(BackgroundOf(shot, cell)))
                return ::testing::AssertionFailure() << where << " background " << drawn.bg << ", expected "
                                                     << ToString(BackgroundOf(shot, cell));
            if (blank ? !(drawn.text.empty() || drawn.text == " ") : drawn.text != cell.text)
                return ::testing::AssertionFailure()
                       << where << " reads \"" << drawn.text << "\", expected \"" << cell.text << "\"";
            if (!blank && drawn.fg != ToString(ForegroundOf(shot, cell)))
                return ::testing::AssertionFailure()
                       << where << " (\"" << cell.text << "\") foreground " << drawn.fg << ", expected "
                       << ToString(ForegroundOf(shot, cell));
            if (!blank && drawn.underline != cell.underline)
                return ::testing::AssertionFailure() << where << " underline differs";
        }
    }
    return ::testing::AssertionSuccess();
}

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
    {"markup characters", {"<", Index(2), {}}, "#00aa00", "#000000"},
    {"ampersand", {"&", Index(2), {}}, "#00aa00", "#000000"},
    {"quotes", {"\"", Index(2), {}}, "#00aa00", "#000000"},
    {"apostrophe", {"'", Index(2), {}}, "#00aa00", "#000000"},
    {"combining mark", {"e\u0301", Index(2), {}}, "#00aa00", "#000000"},
    {"underline", {"u", Index(2), {}, false, true}, "#00aa00", "#000000"},
};

TEST(SvgWriterTest, ResolvesAndEscapesEveryKindOfCell) {
    Screenshot shot;
    shot.cols = int(std::size(kCellCases)) + 2;
    shot.rows = 1;
    shot.palette[5] = {0x12, 0x34, 0x56};
    for (const CellCase& c : kCellCases) shot.cells.push_back(c.cell);
    // A wide character: its right half is an empty cell.
    shot.cells.push_back({"\u5b57", Index(2), {}});
    shot.cells.push_back({"", Index(2), {}});
    const std::string svg = ToSvg(shot);
    const std::vector<SvgCell> cells = ReadBack(svg, shot.cols, shot.rows);
    for (size_t i = 0; i < std::size(kCellCases); ++i) {
        const CellCase& c = kCellCases[i];
        SCOPED_TRACE(c.name);
        EXPECT_EQ(cells[i].text, c.cell.text);
        EXPECT_EQ(cells[i].fg, c.fg);
        EXPECT_EQ(cells[i].bg, c.bg);
        EXPECT_EQ(cells[i].underline, c.cell.underline);
    }
    EXPECT_EQ(cells[std::size(kCellCases)].text, "\u5b57");
    EXPECT_EQ(cells[std::size(kCellCases) + 1].text, "");
    EXPECT_EQ(cells[std::size(kCellCases) + 1].rects, 1);
    EXPECT_TRUE(ShowsEveryCell(shot, cells));
}

TEST(SvgWriterTest, RunsShareElements) {
    // Two words in one colour with blanks around and between them, over two
    // backgrounds: one text element, two rectangles.
    Screenshot shot;
    shot.cols = 8;
    shot.rows = 1;
    for (const char* text : {" ", "a", "b", " ", "c", " ", " ", " "})
        shot.cells.push_back({text, Index(7), shot.cells.size() < 4 ? Index(3) : Index(6)});
    const std::string svg = ToSvg(shot, {10, 20, 16, "a <title>"});
    EXPECT_NE(svg.find("<title>a &lt;title&gt;</title>"), std::string::npos) << svg;
    EXPECT_NE(svg.find(R"(<text x="10 20 30 40" y="16" fill="#aaaaaa">ab c</text>)"), std::string::npos)
        << svg;
    EXPECT_NE(svg.find(R"(<rect x="0" y="0" width="40" height="20" fill="#aa5500"/>)"), std::string::npos)
        << svg;
    EXPECT_NE(svg.find(R"(<rect x="40" y="0" width="40" height="20" fill="#00aaaa"/>)"), std::string::npos)
        << svg;
}

// The console's welcome screen on a simulated host, in the colours the
// console sets: every cell read back as the terminal holds it.
TEST(SvgWriterTest, WelcomeScreenAsTheTerminalHoldsIt) {
    SimHost host("host1.example.test");
    Terminal t(host.Console());
    ASSERT_TRUE(t.WaitForText("Shut Down/Restart"));
    const Screenshot shot = Capture(t);
    const std::string svg = ToSvg(shot);
    ASSERT_TRUE(ShowsEveryCell(shot, ReadBack(svg, shot.cols, shot.rows))) << t.Dump(true);
    // The console's yellow and dark grey are in the picture.
    EXPECT_NE(svg.find("fill=\"#fecc00\""), std::string::npos);
    EXPECT_NE(svg.find("fill=\"#545454\""), std::string::npos);
}

}  // namespace
}  // namespace E2e
