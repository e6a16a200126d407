#include "LogViewer.hpp"

#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <vector>

#include "Console.hpp"
#include "Frame.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

extern char** environ;

namespace Velk {

LogViewer::LogViewer()
    : _logs{{{"Syslog", "/var/log/syslog.log", false},
             {"Qelkernel", "/var/log/qelkernel.log", false},
             {"Config", "/var/log/sysboot.log", false},
             {"Management Agent (corad)", "/var/log/corad.log", false},
             {"Korvanet Agent (tirpa)", "/var/log/tirpa.log", false},
             {"High Availibility Agent (halvo)", "/var/log/halvo.log", false},
             {"Zolva Tarni Observation log (obzd)", "/var/log/obzd.log", false}}} {}

std::string LogViewer::Listing() {
    std::string text;
    int n = 1;
    for (Log& log : _logs) {
        struct stat st;
        log.available = stat(HostCtl::Lib::HostPath(log.path).c_str(), &st) == 0;
        if (!log.available) continue;
        text += "{color:white}<" + std::to_string(n) + "> {color:light-grey}" + log.label + "{/color}\n";
        ++n;
    }
    return text + StringFactory::Get("en_US")->GetString(29);
}

int LogViewer::ChooseLog(const std::array<bool, LOG_COUNT>& available, int digit) {
    int count = 0;
    for (int i = 0; i < LOG_COUNT; ++i) {
        if (available[static_cast<size_t>(i)]) ++count;
        if (count == digit) return i;
    }
    return count > 6 ? -1 : count;
}

int LogViewer::ChooseLog(int digit) const {
    std::array<bool, LOG_COUNT> available{};
    for (int i = 0; i < LOG_COUNT; ++i)
        available[static_cast<size_t>(i)] = _logs[static_cast<size_t>(i)].available;
    return ChooseLog(available, digit);
}

void LogViewer::ViewLog(int row, Frame* owner) {
    struct termios saved;
    const bool haveSaved = tcgetattr(1, &saved) == 0;
    tcsetattr(1, TCSANOW, &orig_termios);
    clear();
    refresh();
    // No refresh signal may repaint a screen under the pager.
    Frame::fgFrame = nullptr;

    // Everything the child needs is built before the fork: between fork and
    // exec only async-signal-safe calls are made (the signal thread may hold
    // the allocator's lock at the moment of the fork).
    const std::string pager = HostCtl::Lib::HostPath("/bin/less");
    const std::string path = HostCtl::Lib::HostPath(_logs[static_cast<size_t>(row)].path);
    const char* argv[] = {"less", "-cfP", "<Q> Quit </> RegExp Search <H> Help", path.c_str(), nullptr};
    // The pager runs restricted: no shell commands, editors or other files.
    std::vector<const char*> env;
    for (char** e = environ; *e; ++e)
        if (std::strncmp(*e, "LESSSECURE=", 11) != 0) env.push_back(*e);
    env.push_back("LESSSECURE=1");
    env.push_back(nullptr);

    const pid_t pid = fork();
    if (pid == 0) {
        // The pager starts with the signals the console blocks open again
        // (it must end on SIGTERM and follow SIGWINCH), the default SIGPIPE,
        // and none of the console's descriptors but the terminal.
        sigset_t none;
        sigemptyset(&none);
        sigprocmask(SIG_SETMASK, &none, nullptr);
        signal(SIGPIPE, SIG_DFL);
        closefrom(3);
        execve(pager.c_str(), const_cast<char* const*>(argv), const_cast<char* const*>(env.data()));
        _exit(0);
    }
    if (pid > 0) {
        // A termination signal ends the pager (through the signal thread),
        // then the console below. Only the pager's own end counts.
        Frame::SetForegroundChild(pid);
        for (;;) {
            const pid_t done = waitpid(pid, nullptr, 0);
            if (done == pid) break;
            if (done == -1 && errno != EINTR) break;
        }
        Frame::SetForegroundChild(0);
    }

    if (haveSaved) tcsetattr(1, TCSANOW, &saved);
    tcsetpgrp(1, getpgid(0));
    keypad(stdscr, FALSE);
    keypad(stdscr, TRUE);
    owner->Show(false);
    owner->Show(true);
    Frame::fgFrame = owner;
    clearok(curscr, TRUE);
    owner->Refresh();
    Frame::EndIfRequested();
}

}  // namespace Velk
