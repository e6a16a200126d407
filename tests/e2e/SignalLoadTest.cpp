// Signals under load: a flood of refresh signals while keys arrive loses no
// key and no screen update; the signals that end the console end it cleanly
// whenever they come, with the terminal as it was before the start.
#include <pty.h>
#include <signal.h>
#include <unistd.h>
#include <vterm.h>

#include <algorithm>
#include <atomic>
#include <functional>

#include "LoggedIn.hpp"

namespace E2e {
namespace {

// Sends `keys` with a short pause between them while another thread sends
// SIGUSR1 in a tight loop, and keeps the flood going until it has sent at
// least `least` signals. The number of signals sent.
long TypeUnderFlood(Terminal& t, const std::vector<std::string>& keys, long least) {
    std::atomic<bool> stop{false};
    std::atomic<long> sent{0};
    std::thread flood([&, pid = t.Pid()] {
        while (!stop.load() && kill(pid, SIGUSR1) == 0) sent.fetch_add(1);
    });
    for (const std::string& key : keys) {
        t.Send(key);
        std::this_thread::sleep_for(Duration(3));
    }
    const auto end = std::chrono::steady_clock::now() + Duration(20000);
    while (sent.load() < least && std::chrono::steady_clock::now() < end)
        std::this_thread::sleep_for(Duration(5));
    stop = true;
    flood.join();
    return sent.load();
}

using SignalLoadTest = ConsoleTest;

TEST_F(SignalLoadTest, TypingIntoTheLoginNameLosesNoKey) {
    ASSERT_TRUE(Start());
    t->SendKey("F2");
    ASSERT_TRUE(t->WaitForText("Login Name:"));
    const std::string typed = "flood-Typed_0123456789";
    std::vector<std::string> keys;
    for (char c : typed) keys.emplace_back(1, c);
    EXPECT_GE(TypeUnderFlood(*t, keys, 2000), 2000);
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    const auto label = t->Find("Login Name:");
    ASSERT_TRUE(label);
    // The typed text replaced the prefilled name and stands in the field alone.
    const std::string row = t->RowText(label->row);
    ASSERT_NE(row.find(typed), std::string::npos) << t->Dump();
    EXPECT_EQ(row.find("root"), std::string::npos) << t->Dump();
    EXPECT_FALSE(t->HasExited());

    // Editing keys under the flood: five Backspaces take off five characters.
    EXPECT_GE(TypeUnderFlood(*t, std::vector<std::string>(5, "\x7f"), 1000), 1000);
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    const std::string shortened = t->RowText(label->row);
    EXPECT_NE(shortened.find(typed.substr(0, typed.size() - 5) + " "), std::string::npos) << t->Dump();
    EXPECT_EQ(shortened.find(typed), std::string::npos) << t->Dump();
}

TEST_F(SignalLoadTest, WalkingTheMenuLosesNoKey) {
    ASSERT_TRUE(StartInMenu());
    // The entries in order, from a walk without signals.
    std::vector<std::string> entries;
    const auto heading = [&] { return t->RowTextTrimmed(2); };
    for (int i = 0; i < 6; ++i) {
        ASSERT_TRUE(t->WaitQuiet());
        entries.push_back(heading());
        t->SendKey("Down");
    }
    ASSERT_TRUE(t->WaitQuiet());
    for (int i = 0; i < 6; ++i) t->SendKey("Up");
    ASSERT_TRUE(t->WaitQuiet(Duration(200)));
    ASSERT_EQ(heading(), entries[0]) << t->Dump();

    // The same walk under the flood, down and back, several times.
    for (int round = 0; round < 3; ++round) {
        // Key (terminfo), how many, the entry selected after them.
        for (const auto& [key, count, at] : {std::tuple{"kcud1", 5, 5}, {"kcuu1", 3, 2}, {"kcuu1", 2, 0}}) {
            TypeUnderFlood(*t, std::vector<std::string>(count, Terminal::TerminfoString(t->Term(), key)),
                           500);
            ASSERT_TRUE(t->WaitQuiet(Duration(300)));
            ASSERT_EQ(heading(), entries[at]) << "round " << round << ", " << count << " " << key << "\n"
                                              << t->Dump();
        }
    }
    EXPECT_FALSE(t->HasExited());
}

// The terminal state the output leaves behind, read by a terminal of its own:
// whether the cursor shows and the attributes still on.
struct EndState {
    bool cursorVisible = true;
    std::string attributes;
};

EndState ReadEndState(const std::string& output, int cols, int rows) {
    VTerm* vt = vterm_new(rows, cols);
    vterm_set_utf8(vt, 1);
    VTermState* state = vterm_obtain_state(vt);
    EndState end;
    static VTermStateCallbacks callbacks = {};
    callbacks.settermprop = [](VTermProp prop, VTermValue* value, void* user) {
        if (prop == VTERM_PROP_CURSORVISIBLE) static_cast<EndState*>(user)->cursorVisible = value->boolean;
        return 1;
    };
    vterm_state_set_callbacks(state, &callbacks, &end);
    vterm_state_reset(state, 1);
    LinuxPaletteFilter filter;
    std::vector<PaletteChange> ignored;
    const std::string pass = filter.Feed(output, ignored);
    vterm_input_write(vt, pass.data(), pass.size());
    for (const auto& [attr, name] : {std::pair{VTERM_ATTR_BOLD, "bold"},
                                     {VTERM_ATTR_UNDERLINE, "underline"},
                                     {VTERM_ATTR_BLINK, "blink"},
                                     {VTERM_ATTR_REVERSE, "reverse"},
                                     {VTERM_ATTR_FOREGROUND, "foreground"},
                                     {VTERM_ATTR_BACKGROUND, "background"}}) {
        VTermValue value = {};
        vterm_state_get_penattr(state, attr, &value);
        const bool on = attr == VTERM_ATTR_FOREGROUND   ? !VTERM_COLOR_IS_DEFAULT_FG(&value.color)
                        : attr == VTERM_ATTR_BACKGROUND ? !VTERM_COLOR_IS_DEFAULT_BG(&value.color)
                                                        : value.number != 0;
        if (on) end.attributes += std::string(name) + " ";
    }
    vterm_free(vt);
    return end;
}

// The modes of a fresh pseudo-terminal: what the console found at its start.
struct termios FreshModes() {
    int master = -1, slave = -1;
    struct termios modes = {};
    if (openpty(&master, &slave, nullptr, nullptr, nullptr) == 0) {
        tcgetattr(master, &modes);
        close(master);
        close(slave);
    }
    return modes;
}

::testing::AssertionResult SameModes(const struct termios& want, const struct termios& got) {
    if (want.c_iflag == got.c_iflag && want.c_oflag == got.c_oflag && want.c_cflag == got.c_cflag &&
        want.c_lflag == got.c_lflag && std::equal(want.c_cc, want.c_cc + NCCS, got.c_cc))
        return ::testing::AssertionSuccess();
    auto failure = ::testing::AssertionFailure()
                   << std::hex << "iflag, oflag, cflag, lflag " << got.c_iflag << " " << got.c_oflag << " "
                   << got.c_cflag << " " << got.c_lflag << " instead of " << want.c_iflag << " "
                   << want.c_oflag << " " << want.c_cflag << " " << want.c_lflag;
    for (size_t i = 0; i < NCCS; ++i)
        if (want.c_cc[i] != got.c_cc[i])
            failure << "; c_cc[" << i << "] " << int(got.c_cc[i]) << " instead of " << int(want.c_cc[i]);
    return failure;
}

// A moment at which an ending signal comes: `prepare` brings the console
// there (possibly logging in), `delay` later the signal is sent.
struct EndMoment {
    const char* name;
    int sig;
    const char* term;
    std::function<::testing::AssertionResult(Terminal&)> prepare;
    int delayMs;
    // Keys sent after the signal ("" for none): a session ends before the
    // console does.
    const char* then = "";
};
void PrintTo(const EndMoment& m, std::ostream* os) { *os << m.name; }

using EndingSignalTest = ConsoleTestWithParam<EndMoment>;

::testing::AssertionResult FirstOutput(Terminal& t) {
    const auto end = std::chrono::steady_clock::now() + kDefaultTimeout;
    while (t.BytesReceived() == 0 && std::chrono::steady_clock::now() < end)
        std::this_thread::sleep_for(Duration(1));
    return ::testing::AssertionSuccess();
}
::testing::AssertionResult Welcome(Terminal& t) { return WaitForWelcome(t); }
::testing::AssertionResult LoginDialog(Terminal& t) {
    if (auto welcome = WaitForWelcome(t); !welcome) return welcome;
    t.SendKey("F2");
    return t.WaitForText("Login Name:");
}
::testing::AssertionResult TypingName(Terminal& t) {
    if (auto dialog = LoginDialog(t); !dialog) return dialog;
    // Keys still being handled when the signal comes.
    t.Send("abcdefghijklmnopqrstuvwxyz");
    return ::testing::AssertionSuccess();
}
::testing::AssertionResult RefreshBurst(Terminal& t) {
    if (auto welcome = WaitForWelcome(t); !welcome) return welcome;
    for (int i = 0; i < 200; ++i) t.Signal(SIGUSR1);
    return ::testing::AssertionSuccess();
}
::testing::AssertionResult InMenu(Terminal& t) {
    if (auto welcome = WaitForWelcome(t); !welcome) return welcome;
    return LogInToMenu(t);
}
::testing::AssertionResult WalkingMenu(Terminal& t) {
    if (auto menu = InMenu(t); !menu) return menu;
    for (int i = 0; i < 8; ++i) t.SendKey("Down");
    return ::testing::AssertionSuccess();
}

TEST_P(EndingSignalTest, EndsWithStatusZeroAndTheTerminalRestored) {
    const EndMoment& m = GetParam();
    const struct termios before = FreshModes();
    t.emplace(PamConsole(host, m.term));
    ASSERT_TRUE(m.prepare(*t));
    if (m.delayMs > 0) std::this_thread::sleep_for(Duration(m.delayMs));
    t->Signal(m.sig);
    if (*m.then) {
        ASSERT_TRUE(t->WaitQuiet(Duration(300)));
        EXPECT_FALSE(t->HasExited()) << "ended during the session";
        t->SendKey(m.then);
    }
    ASSERT_TRUE(t->ExitsWith(0));
    EXPECT_TRUE(SameModes(before, t->Modes()));
    const EndState end = ReadEndState(t->Output(), t->Cols(), t->Rows());
    EXPECT_TRUE(end.cursorVisible) << "the cursor is left hidden";
    EXPECT_EQ(end.attributes, "") << "attributes left on";
}

const EndMoment kEndMoments[] = {
    {"WinchAtFirstOutput", SIGWINCH, "linux", FirstOutput, 0},
    {"WinchOnWelcome", SIGWINCH, "linux", Welcome, 0},
    {"WinchInLoginDialog", SIGWINCH, "xterm-256color", LoginDialog, 0},
    {"WinchWhileTyping", SIGWINCH, "linux", TypingName, 0},
    {"WinchAfterRefreshBurst", SIGWINCH, "linux", RefreshBurst, 0},
    {"WinchInMenu", SIGWINCH, "linux", InMenu, 0},
    {"WinchWhileWalkingMenu", SIGWINCH, "xterm-256color", WalkingMenu, 5},
    {"Usr2AtFirstOutput", SIGUSR2, "linux", FirstOutput, 0},
    {"Usr2OnWelcome", SIGUSR2, "xterm-256color", Welcome, 0},
    {"Usr2WhileTypingLater", SIGUSR2, "vt100", TypingName, 15},
    {"Usr2InMenuEndsAtLogOut", SIGUSR2, "linux", InMenu, 0, "Esc"},
};

INSTANTIATE_TEST_SUITE_P(Moments, EndingSignalTest, ::testing::ValuesIn(kEndMoments),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace E2e
