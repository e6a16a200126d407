#include "Console.hpp"

#include <fcntl.h>
#include <linux/vt.h>
#include <string.h>
#include <sys/ioctl.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>

#include "hostctl/Host.hpp"
// Defines macros such as "lines" and "columns": last.
#include <term.h>

bool runningOverSerial = true;
bool bwColor = false;
struct termios orig_termios = {};

namespace Velk {

const char* const VELK_APP = "velk";
const char* const VELK_USER = "velk";
const std::string VELK_TIMEOUT_VAR = "/UserVars/VelkTimeOut";

namespace {
// Backgrounds and foregrounds for which colour pairs are defined.
constexpr int kPairColors[] = {WHITE, BLACK, YELLOW, LIGHT_GREY, DARK_GREY, RED};

// Pair numbers are laid out on an 8-colour grid. On the local console
// (COLORS is 8) this is fg + bg * COLORS + 1; on terminals with 256 colours
// it keeps every number below 65, so it fits in a curses attribute.
int PairNumber(int bg, int fg) { return fg + bg * 8 + 1; }
}  // namespace

void InitColors() {
    use_default_colors();
    if (!can_change_color()) {
        bwColor = true;
        return;
    }
    init_color(YELLOW, 999, 800, 0);
    init_color(DARK_GREY, 333, 333, 333);
    init_color(LIGHT_GREY, 666, 666, 666);
    init_color(WHITE, 999, 999, 999);
    init_color(RED, 999, 0, 0);
    for (int bg : kPairColors) {
        for (int fg : kPairColors) {
            init_pair(static_cast<short>(PairNumber(bg, fg)), static_cast<short>(fg), static_cast<short>(bg));
        }
    }
}

attr_t ColorAttr(int bg, int fg) {
    if (bwColor) return (bg == DARK_GREY || bg == BLACK) ? A_STANDOUT : A_NORMAL;
    return COLOR_PAIR(PairNumber(bg, fg));
}

void DefineKeys() {
    struct KeyDef {
        const char* seq;
        int code;
    };
    static const KeyDef table[] = {
        {"\x1bR", KEY_RESIZE},
        {"\x1b[11~", KEY_F(1)},
        {"\x1b[12~", KEY_F(2)},
        {"\x1b[13~", KEY_F(3)},
        {"\x1b[14~", KEY_F(4)},
        {"\x1b[15~", KEY_F(5)},
        {"\x1b[17~", KEY_F(6)},
        {"\x1b[18~", KEY_F(7)},
        {"\x1b[19~", KEY_F(8)},
        {"\x1b[20~", KEY_F(9)},
        {"\x1b[21~", KEY_F(10)},
        {"\x1b[23~", KEY_F(11)},
        {"\x1b[24~", KEY_F(12)},
        {"\x1b"
         "1",
         KEY_F(1)},
        {"\x1b"
         "2",
         KEY_F(2)},
        {"\x1b"
         "3",
         KEY_F(3)},
        {"\x1b"
         "4",
         KEY_F(4)},
        {"\x1b"
         "5",
         KEY_F(5)},
        {"\x1b"
         "6",
         KEY_F(6)},
        {"\x1b"
         "7",
         KEY_F(7)},
        {"\x1b"
         "8",
         KEY_F(8)},
        {"\x1b"
         "9",
         KEY_F(9)},
        {"\x1b"
         "0",
         KEY_F(10)},
        {"\x1b!", KEY_F(11)},
        {"\x1b@", KEY_F(12)},
        {"\x1bh", KEY_HOME},
        {"\x1bk", KEY_END},
        {"\x1b+", KEY_IC},
        {"\x1b-", KEY_DC},
        {"\x1b?", KEY_PPAGE},
        {"\x1b/", KEY_NPAGE},
        {"\x1b[M", KEY_F(1)},
        {"\x1b[N", KEY_F(2)},
        {"\x1b[O", KEY_F(3)},
        {"\x1b[P", KEY_F(4)},
        {"\x1b[Q", KEY_F(5)},
        {"\x1b[R", KEY_F(6)},
        {"\x1b[S", KEY_F(7)},
        {"\x1b[T", KEY_F(8)},
        {"\x1b[U", KEY_F(9)},
        {"\x1b[V", KEY_F(10)},
        {"\x1b[W", KEY_F(11)},
        {"\x1b[X", KEY_F(12)},
        {"\x1bOA", KEY_UP},
        {"\x1bOB", KEY_DOWN},
        {"\x1bOC", KEY_RIGHT},
        {"\x1bOD", KEY_LEFT},
        {"\x1b[A", KEY_UP},
        {"\x1b[B", KEY_DOWN},
        {"\x1b[C", KEY_RIGHT},
        {"\x1b[D", KEY_LEFT},
        {"\x1b[2~", KEY_IC},
        {"\x1b[3~", KEY_DC},
        {"\x1b[1~", KEY_HOME},
        {"\x1b[4~", KEY_END},
        {"\x1b[5~", KEY_PPAGE},
        {"\x1b[6~", KEY_NPAGE},
        {"\x7f", KEY_BACKSPACE},
    };
    for (const KeyDef& k : table) define_key(k.seq, k.code);
}

void SwitchToVt(int vt) {
    int fd = open(HostCtl::Lib::HostPath("/dev/console").c_str(), O_RDWR | O_CLOEXEC);
    if (fd < 0) return;
    if (ioctl(fd, VT_ACTIVATE, vt) == -1) ioctl(fd, VT_WAITACTIVE, vt);
    close(fd);
}

void LogError(const char* what) {
    int err = errno;
    char buf[256];
    const char* text = strerror_r(err, buf, sizeof buf);
    HostCtl::Lib::Syslog(LOG_ERR, "%s with errno(%d): %s", what, err, text);
}

std::string TerminalProblem() {
    if (!isatty(0) || !isatty(1)) return "standard input and output must be a terminal";
    const char* term = getenv("TERM");
    if (!term || !*term) return "TERM is not set";
    int error = 0;
    if (setupterm(term, 1, &error) != OK) return std::string("unknown terminal type \"") + term + "\"";
    const char* address = tigetstr("cup");
    const bool addressable = address != nullptr && address != reinterpret_cast<char*>(-1);
    del_curterm(cur_term);
    if (!addressable) return std::string("terminal type \"") + term + "\" cannot place the cursor";
    return "";
}

void DisableFlowControl() {
    struct termios modes;
    if (tcgetattr(0, &modes) != 0) return;
    modes.c_iflag &= ~static_cast<tcflag_t>(IXON | IXOFF);
    tcsetattr(0, TCSANOW, &modes);
    // Curses restores these modes after a child had the terminal.
    def_prog_mode();
}

}  // namespace Velk
