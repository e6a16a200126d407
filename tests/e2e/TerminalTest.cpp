// The harness itself: the palette parsers on split and malformed input, exit
// statuses and terminfo keys. Reading cells, colours and keys on every
// terminal type is checked against the console's own screens
// (WelcomeScreenTest).
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

// A program in the terminal: `script` run by the shell.
TerminalOptions Shell(const std::string& script) { return {"/bin/sh", {"-c", script}}; }

TEST(TerminalTest, ExitStatusAndSignals) {
    Terminal exits(Shell("echo READY; read line; exit 7")), killed(Shell("echo READY; exec /bin/sleep 60")),
        runs(Shell("echo READY; exec /bin/sleep 60"));
    for (Terminal* t : {&exits, &killed, &runs}) ASSERT_TRUE(t->WaitForText("READY"));
    EXPECT_FALSE(exits.HasExited());
    exits.SendKey("Enter");
    EXPECT_EQ(Terminal::DescribeStatus(exits.WaitForExit()), "exit 7");
    killed.Signal(SIGKILL);
    EXPECT_EQ(Terminal::DescribeStatus(killed.WaitForExit()), "signal 9");
    EXPECT_FALSE(killed.ExitsWith(0, Duration(10)));
    EXPECT_EQ(runs.WaitForExit(Duration(100)), std::nullopt);
    EXPECT_EQ(Terminal::DescribeStatus(std::nullopt), "running");
}

TEST(TerminalTest, TerminfoStrings) {
    EXPECT_EQ(Terminal::TerminfoString("linux", "kf2"), "\x1b[[B");
    EXPECT_EQ(Terminal::TerminfoString("xterm", "kf2"), "\x1bOQ");
    EXPECT_EQ(Terminal::TerminfoString("vt100", "kf11"), "");
    EXPECT_EQ(Terminal::TerminfoString("no-such-terminal", "kf2"), "");
}

}  // namespace
}  // namespace E2e
