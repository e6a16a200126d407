// The harness itself: the palette parsers on split and malformed input, and a
// small curses program driven through the pty on each terminal type the
// console tests use.
#include <signal.h>
#include <sys/wait.h>

#include "Terminal.hpp"

namespace E2e {
namespace {

TEST(LinuxPaletteFilterTest, CutsSequencesSplitAtEveryByte) {
    const std::string stream = "ab\x1b]P6545454cd\x1b[0m\x1b]Rz\x1b]P3FECC00";
    const std::vector<PaletteChange> expected = {{6, {0x54, 0x54, 0x54}}, {-1, {}}, {3, {0xfe, 0xcc, 0x00}}};
    for (size_t split = 0; split <= stream.size(); ++split) {
        LinuxPaletteFilter filter;
        std::vector<PaletteChange> changes;
        std::string out = filter.Feed(std::string_view(stream).substr(0, split), changes);
        out += filter.Feed(std::string_view(stream).substr(split), changes);
        EXPECT_EQ(out, "abcd\x1b[0mz") << "split at " << split;
        EXPECT_EQ(changes, expected) << "split at " << split;
    }
}

TEST(LinuxPaletteFilterTest, LeavesOtherSequencesAlone) {
    struct Case {
        std::string in;
        std::string out;
    };
    const Case cases[] = {
        {"\x1b]4;3;rgb:fe/cc/00\x1b\\", "\x1b]4;3;rgb:fe/cc/00\x1b\\"},  // xterm palette: libvterm's business
        {"\x1b]0;title\x07x", "\x1b]0;title\x07x"},
        {"\x1b]Pzz12345rest", "\x1b]Pzz12345rest"},  // not hex: passed on
        {"\x1b\x1b]P1ff0000.", "\x1b."},
    };
    for (const auto& c : cases) {
        LinuxPaletteFilter filter;
        std::vector<PaletteChange> changes;
        EXPECT_EQ(filter.Feed(c.in, changes), c.out);
    }
}

TEST(ParsePaletteOscTest, Forms) {
    struct Case {
        std::string body;
        bool ok;
        std::vector<PaletteChange> changes;
    };
    const Case cases[] = {
        {"4;3;rgb:FE/CC/00", true, {{3, {0xfe, 0xcc, 0x00}}}},
        {"4;6;rgb:5454/5454/5454;1;rgb:f/0/0", true, {{6, {0x54, 0x54, 0x54}}, {1, {0xff, 0, 0}}}},
        {"4;200;rgb:0/8/f", true, {{200, {0, 0x88, 0xff}}}},
        {"4;3", false, {}},
        {"4;3;rgb:fe/cc", false, {}},
        {"4;3;rgb:fe/cc/00/11", false, {}},
        {"4;x;rgb:fe/cc/00", false, {}},
        {"4;3;#fecc00", false, {}},
        {"10;rgb:ff/ff/ff", false, {}},
        {"4;3;rgb:fe/cc/00;6", false, {}},
    };
    for (const auto& c : cases) {
        std::vector<PaletteChange> changes;
        EXPECT_EQ(ParsePaletteOsc(c.body, changes), c.ok) << c.body;
        EXPECT_EQ(changes, c.changes) << c.body;
    }
}

TerminalOptions Probe(const std::string& term, int cols = 80, int rows = 24, std::string status = "0") {
    TerminalOptions options;
    options.program = CURSES_PROBE_BIN;
    options.args = {status};
    options.term = term;
    options.cols = cols;
    options.rows = rows;
    options.env = {"LANG=C.UTF-8", "ESCDELAY=25"};
    return options;
}

struct TermCase {
    const char* term;
    bool color;
};
void PrintTo(const TermCase& c, std::ostream* os) { *os << "TERM=" << c.term; }

class ProbeTest : public ::testing::TestWithParam<TermCase> {};

TEST_P(ProbeTest, ScreenKeysAndResize) {
    Terminal t(Probe(GetParam().term));
    ASSERT_TRUE(t.WaitForText("PROBE READY 80x24"));
    EXPECT_EQ(t.Find("PROBE READY"), (Pos{2, 1}));
    EXPECT_EQ(t.RowTextTrimmed(1), "│ PROBE READY 80x24" + std::string(60, ' ') + "│");
    EXPECT_EQ(t.CellAt(0, 0).text, "┌");
    EXPECT_EQ(t.CellAt(79, 23).text, "┘");
    std::string rule;
    for (int i = 0; i < 17; ++i) rule += "─";
    EXPECT_EQ(t.RegionText(2, 0, 17, 3), rule + " PROBE READY 80x24");
    const Cell upper = t.CellAt(10, 5), lower = t.CellAt(10, 18);
    if (GetParam().color) {
        EXPECT_TRUE(upper.bg.IsIndex(6)) << ToString(upper.bg) << "\n" << t.Dump(true);
        EXPECT_TRUE(upper.fg.IsIndex(7)) << ToString(upper.fg);
        EXPECT_TRUE(lower.bg.IsIndex(3)) << ToString(lower.bg);
        EXPECT_FALSE(upper.reverse);
        // 333 on curses' 0..1000 scale, truncated to 8 bits by terminfo.
        EXPECT_EQ(t.PaletteColor(6), (Rgb{84, 84, 84}));
        EXPECT_EQ(t.PaletteColor(3), (Rgb{254, 204, 0}));
        EXPECT_EQ(t.PaletteColor(2), std::nullopt);
    } else {
        EXPECT_EQ(upper.bg, CellColor{}) << t.Dump(true);
        EXPECT_TRUE(upper.reverse) << t.Dump(true);
        EXPECT_FALSE(lower.reverse);
        EXPECT_TRUE(t.PaletteLog().empty());
    }
    EXPECT_GT(t.BytesReceived(), 200u);

    t.Resize(100, 31);
    ASSERT_TRUE(t.WaitForText("PROBE READY 100x31"));
    EXPECT_EQ(t.Cols(), 100);
    EXPECT_EQ(t.Rows(), 31);
    EXPECT_EQ(t.CellAt(99, 30).text, "┘") << t.Dump();

    // Keys with the bytes terminfo gives; a lone Esc after ESCDELAY.
    for (const auto& [key, shown] :
         {std::pair{"F2", "KEY KEY_F(2)"}, std::pair{"Up", "KEY KEY_UP"}, std::pair{"Down", "KEY KEY_DOWN"},
          std::pair{"Enter", "KEY ^J"}, std::pair{"Tab", "KEY ^I"}}) {
        t.SendKey(key);
        EXPECT_TRUE(t.WaitForText(shown)) << key;
    }
    t.Send("\x1b");
    EXPECT_TRUE(t.WaitForText("KEY ^["));
    t.Send("q");
    EXPECT_TRUE(t.ExitsWith(0));
}

INSTANTIATE_TEST_SUITE_P(Terms, ProbeTest,
                         ::testing::Values(TermCase{"linux", true}, TermCase{"xterm-256color", true},
                                           TermCase{"xterm", false}, TermCase{"vt100", false}),
                         [](const auto& info) {
                             std::string name = info.param.term;
                             for (char& c : name)
                                 if (c == '-') c = '_';
                             return name;
                         });

TEST(TerminalTest, ExitStatusAndSignals) {
    {
        Terminal t(Probe("linux", 80, 24, "7"));
        ASSERT_TRUE(t.WaitForText("PROBE READY"));
        EXPECT_FALSE(t.HasExited());
        t.Send("q");
        EXPECT_EQ(Terminal::DescribeStatus(t.WaitForExit()), "exit 7");
    }
    {
        Terminal t(Probe("linux"));
        ASSERT_TRUE(t.WaitForText("PROBE READY"));
        t.Signal(SIGKILL);
        EXPECT_EQ(Terminal::DescribeStatus(t.WaitForExit()), "signal 9");
        EXPECT_FALSE(t.ExitsWith(0, Duration(10)));
    }
    {
        Terminal t(Probe("linux"));
        ASSERT_TRUE(t.WaitForText("PROBE READY"));
        EXPECT_EQ(t.WaitForExit(Duration(100)), std::nullopt);
        EXPECT_EQ(Terminal::DescribeStatus(std::nullopt), "running");
    }
}

TEST(TerminalTest, FailuresCarryTheScreen) {
    Terminal t(Probe("linux"));
    ASSERT_TRUE(t.WaitForText("PROBE READY"));
    ::testing::AssertionResult missing = t.WaitForText("NOT THERE", Duration(100));
    EXPECT_FALSE(missing);
    EXPECT_NE(std::string(missing.message()).find(" 1|│ PROBE READY 80x24"), std::string::npos)
        << missing.message();
    const std::string colors = t.Dump(true);
    // The box is drawn with the screen's own (default) colours over both halves.
    EXPECT_NE(colors.find(" bg|." + std::string(78, '6') + ".|"), std::string::npos) << colors;
    EXPECT_NE(colors.find(" bg|." + std::string(78, '3') + ".|"), std::string::npos) << colors;
}

TEST(TerminalTest, MissingProgramExits127) {
    TerminalOptions options = Probe("linux");
    options.program = "/nonexistent/program";
    Terminal t(options);
    EXPECT_TRUE(t.ExitsWith(127));
}

TEST(TerminalTest, TerminfoStrings) {
    EXPECT_EQ(Terminal::TerminfoString("linux", "kf2"), "\x1b[[B");
    EXPECT_EQ(Terminal::TerminfoString("xterm", "kf2"), "\x1bOQ");
    EXPECT_EQ(Terminal::TerminfoString("vt100", "kf11"), "");
    EXPECT_EQ(Terminal::TerminfoString("no-such-terminal", "kf2"), "");
}

}  // namespace
}  // namespace E2e
