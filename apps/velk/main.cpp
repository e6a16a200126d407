// Start-up of the console: prepares the process and the terminal, runs the
// welcome window, and tears curses down when it returns.
#include <fcntl.h>
#include <locale.h>
#include <signal.h>
#include <syslog.h>
#include <termios.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "Console.hpp"
#include "Frame.hpp"
#include "NetworkTrial.hpp"
#include "WelcomeWindow.hpp"
#include "hostctl/Host.hpp"

using HostCtl::Lib::Syslog;

namespace {

const char kPidFile[] = "/var/run/velk.pid";

// The VT argument: 1..63, or -1 (no switch) for anything else.
int ParseVt(int argc, char** argv) {
    if (argc < 2) return -1;
    errno = 0;
    char* end = nullptr;
    long value = strtol(argv[1], &end, 10);
    const bool numeric = end != argv[1];
    if (!numeric || static_cast<unsigned long>(value - 1) > 62 || value == LONG_MIN || value == LONG_MAX) {
        Syslog(LOG_ERR, "Invalid VT specified for VELK: %s", argv[1]);
        return -1;
    }
    return static_cast<int>(value);
}

void SilenceStderr() {
    int fd = open("/dev/null", O_WRONLY | O_CLOEXEC);
    if (fd < 0) return;
    dup2(fd, 2);
    close(fd);
}

// Records this process in the PID file unless another live instance owns it.
void WritePidFile() {
    const std::string path = HostCtl::Lib::HostPath(kPidFile);
    long pid = 0;
    bool haveNumber = false;
    if (FILE* in = fopen(path.c_str(), "re")) {
        haveNumber = fscanf(in, "%ld", &pid) == 1;
        fclose(in);
    }
    if (haveNumber && pid > 0 && kill(static_cast<pid_t>(pid), 0) == 0) {
        Syslog(LOG_ERR, "Attempt to run multiple VELK instances, not updating %s", kPidFile);
        return;
    }
    if (FILE* out = fopen(path.c_str(), "we")) {
        fprintf(out, "%d", static_cast<int>(getpid()));
        fclose(out);
    }
}

}  // namespace

int main(int argc, char** argv) {
    HostCtl::Lib::InitHost();
    const int vt = ParseVt(argc, argv);

    Velk::Frame::StartSignalHandling();
    // A child that exits before reading its input must not end the console.
    signal(SIGPIPE, SIG_IGN);
    Velk::Frame::LoadIdleTimeout();
    SilenceStderr();
    tcgetattr(1, &orig_termios);
    setenv("TERMINFO", "/usr/share/terminfo", 0);
    const char* term = getenv("TERM");
    if (term && std::strcmp(term, "linux") == 0) runningOverSerial = false;

    HostCtl::Lib::OpenLog("VELK", 0, LOG_USER);
    Syslog(LOG_INFO, "Starting VELK");
    // Curses would end the process silently (its message goes to the
    // silenced standard error): say why, on the terminal and in the log, and
    // fail so that the supervisor sees a failed start.
    const std::string problem = Velk::TerminalProblem();
    if (!problem.empty()) {
        Syslog(LOG_ERR, "Cannot start on this terminal: %s", problem.c_str());
        const std::string line = "velk: cannot start: " + problem + "\r\n";
        ssize_t ignored = write(1, line.data(), line.size());
        (void)ignored;
        return 1;
    }
    WritePidFile();

    if (vt > 0) {
        Velk::SwitchToVt(vt);
        orig_termios.c_cc[VSUSP] = 0;
        tcsetattr(1, TCSANOW, &orig_termios);
    }

    // Hosts without that locale still get UTF-8 output for the line drawing.
    if (!setlocale(LC_ALL, "en_US.UTF-8")) setlocale(LC_ALL, "C.UTF-8");
    initscr();
    start_color();
    atexit([] { endwin(); });
    curs_set(0);
    cbreak();
    Velk::DisableFlowControl();
    noecho();
    keypad(stdscr, TRUE);
    Velk::InitColors();
    Velk::DefineKeys();
    // The first screen clears the terminal and draws itself in one update;
    // the blank standard screen goes into that update now, so that reading a
    // key never refreshes it over what the screens drew.
    wnoutrefresh(stdscr);
    if (COLS < Velk::kMinColumns || LINES < Velk::kMinLines) Velk::Frame::RefuseSmallTerminal();

    // A network change that a console left unfinished (it was killed while
    // the change was on trial) is put back before anyone sees the network.
    try {
        Velk::WelcomeWindow::SetNotice(Velk::NetworkTrial::RecoverAtStart());
    } catch (const std::exception& e) {
        Syslog(LOG_ERR, "Putting back an unfinished network change failed: %s", e.what());
    }
    Velk::WelcomeWindow* welcome = new Velk::WelcomeWindow();
    try {
        welcome->Execute();
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_ERR, "VELK aborted by exception: %s", e.what());
    }
    delete welcome;
    erase();
    refresh();
    endwin();
    ssize_t ignored = write(1, "\x1b]R", 3);
    (void)ignored;
    return 0;
}
