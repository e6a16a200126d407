// Command lines run through the host's own shell.
#include "HostShell.hpp"

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <ctime>

#include "hostctl/Host.hpp"
#include "hostctl/HostCtl.hpp"

namespace HostCtl::Lib {

namespace {

bool IsPathChar(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
           std::strchr("/._-+@%:,=", c) != nullptr;
}

std::string ShellQuote(const std::string& text) {
    std::string out = "'";
    for (char c : text) out += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return out + "'";
}

}  // namespace

std::string HostCommandLine(const std::string& line) {
    std::string out;
    char quote = 0;
    bool wordStart = true;
    for (size_t i = 0; i < line.size(); ++i) {
        const char c = line[i];
        if (quote == 0 && wordStart && c == '/' && line.compare(i, 5, "/dev/") != 0) {
            size_t end = i;
            while (end < line.size() && IsPathChar(line[end])) ++end;
            out += ShellQuote(HostPath(line.substr(i, end - i)));
            i = end - 1;
            wordStart = false;
            continue;
        }
        out += c;
        if (quote != 0) {
            if (c == quote) quote = 0;
            wordStart = false;
        } else if (c == '\'' || c == '"') {
            quote = c;
            wordStart = false;
        } else {
            wordStart = std::strchr(" \t\n;|&()<>", c) != nullptr;
        }
    }
    return out;
}

namespace {

// Spawn attributes every host child gets: no signal blocked, the signals the
// console handles back at their defaults, and (for bounded children) a
// process group of its own, so that a time-out ends everything it started.
struct ChildAttributes {
    posix_spawnattr_t attr;
    explicit ChildAttributes(bool ownGroup) {
        posix_spawnattr_init(&attr);
        sigset_t none, defaults;
        sigemptyset(&none);
        sigemptyset(&defaults);
        for (int sig : {SIGPIPE, SIGINT, SIGQUIT, SIGTERM, SIGUSR1, SIGUSR2, SIGCHLD, SIGHUP})
            sigaddset(&defaults, sig);
        posix_spawnattr_setsigmask(&attr, &none);
        posix_spawnattr_setsigdefault(&attr, &defaults);
        short flags = POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF;
        if (ownGroup) {
            posix_spawnattr_setpgroup(&attr, 0);
            flags |= POSIX_SPAWN_SETPGROUP;
        }
        posix_spawnattr_setflags(&attr, flags);
    }
    ~ChildAttributes() { posix_spawnattr_destroy(&attr); }
};

int ExitStatus(int status) {
    if (WIFEXITED(status)) return WEXITSTATUS(status);
    return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : -1;
}

}  // namespace

int RunBounded(const std::vector<std::string>& args, int timeoutMs, std::string* output, size_t maxOutput) {
    if (args.empty()) throw HostCtlException("no program to run");
    int fds[2] = {-1, -1};
    if (pipe2(fds, O_CLOEXEC) != 0)
        throw HostCtlException(std::string("cannot create a pipe: ") + std::strerror(errno));
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&actions, fds[1], 1);
    posix_spawn_file_actions_adddup2(&actions, fds[1], 2);
    posix_spawn_file_actions_addclosefrom_np(&actions, 3);
    ChildAttributes attributes(true);
    const std::string program = HostPath(args[0]);
    std::vector<char*> argv;
    for (const std::string& a : args) argv.push_back(const_cast<char*>(a.c_str()));
    argv.push_back(nullptr);
    const char* const env[] = {"PATH=/usr/sbin:/usr/bin:/sbin:/bin", "LANG=C", nullptr};
    pid_t pid = -1;
    const int rc = posix_spawn(&pid, program.c_str(), &actions, &attributes.attr, argv.data(),
                               const_cast<char* const*>(env));
    posix_spawn_file_actions_destroy(&actions);
    close(fds[1]);
    if (rc != 0) {
        close(fds[0]);
        throw HostCtlException("cannot run " + program + ": " + std::strerror(rc));
    }
    // Collect the output until the program ends or the time is up. A daemon
    // the program started may keep the output open: the program's own end
    // is what counts.
    timespec start{};
    clock_gettime(CLOCK_MONOTONIC, &start);
    std::string text;
    fcntl(fds[0], F_SETFL, O_NONBLOCK);
    bool open = true;
    auto drain = [&] {
        char buf[4096];
        for (ssize_t n; open && (n = read(fds[0], buf, sizeof buf)) > 0;)
            if (text.size() < maxOutput) text.append(buf, size_t(n));
    };
    for (;;) {
        int status = 0;
        if (waitpid(pid, &status, WNOHANG) == pid) {
            drain();
            close(fds[0]);
            if (output) *output = text;
            return ExitStatus(status);
        }
        timespec now{};
        clock_gettime(CLOCK_MONOTONIC, &now);
        const long elapsed = (now.tv_sec - start.tv_sec) * 1000 + (now.tv_nsec - start.tv_nsec) / 1000000;
        if (elapsed >= timeoutMs) {
            kill(-pid, SIGKILL);
            while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
            }
            close(fds[0]);
            if (output) *output = text;
            return -1;
        }
        pollfd p{fds[0], POLLIN, 0};
        poll(&p, open ? 1 : 0, int(std::min<long>(timeoutMs - elapsed, 50)));
        if (open && (p.revents & (POLLIN | POLLHUP))) {
            char buf[4096];
            const ssize_t n = read(fds[0], buf, sizeof buf);
            if (n == 0) open = false;
            if (n > 0 && text.size() < maxOutput) text.append(buf, size_t(n));
        }
    }
}

int RunHostShell(const std::string& commandLine, bool logOutput, bool wait) {
    std::string line = HostCommandLine(commandLine);
    // A command that is not waited for runs in a background job of a
    // shell that ends at once, so nothing is left to reap.
    if (!wait) line = "(" + line + ") &";
    const bool capture = logOutput && wait;
    int fds[2] = {-1, -1};
    if (capture && pipe2(fds, O_CLOEXEC) != 0)
        throw HostCtlException(std::string("cannot create a pipe: ") + std::strerror(errno));

    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    if (capture)
        posix_spawn_file_actions_adddup2(&actions, fds[1], 1);
    else
        posix_spawn_file_actions_addopen(&actions, 1, "/dev/null", O_WRONLY, 0);
    posix_spawn_file_actions_adddup2(&actions, 1, 2);
    posix_spawn_file_actions_addclosefrom_np(&actions, 3);
    // The caller may block signals (the console does, in every thread);
    // the command starts with none blocked and default dispositions.
    ChildAttributes attributes(false);

    const std::string shell = HostPath("/bin/sh");
    std::string path = "PATH=" + HostPath("/sbin") + ":" + HostPath("/bin");
    // A real host's own programs live in the usual folders besides the
    // host tools' one.
    if (!IsSimulatedHost()) path += ":/usr/sbin:/usr/bin:/sbin:/bin";
    const char* const argv[] = {"sh", "-c", line.c_str(), nullptr};
    const char* const env[] = {"PYTHONHOME=/", path.c_str(), nullptr};
    pid_t pid = -1;
    const int rc = posix_spawn(&pid, shell.c_str(), &actions, &attributes.attr,
                               const_cast<char* const*>(argv), const_cast<char* const*>(env));
    posix_spawn_file_actions_destroy(&actions);
    if (capture) close(fds[1]);
    if (rc != 0) {
        if (capture) close(fds[0]);
        throw HostCtlException("cannot run the host's shell " + shell + ": " + std::strerror(rc));
    }
    if (capture) {
        std::string pending;
        char buf[4096];
        for (;;) {
            const ssize_t n = read(fds[0], buf, sizeof buf);
            if (n < 0 && errno == EINTR) continue;
            if (n <= 0) break;
            pending.append(buf, size_t(n));
            for (size_t end; (end = pending.find('\n')) != std::string::npos; pending.erase(0, end + 1))
                Syslog(LOG_INFO, "%s", pending.substr(0, end).c_str());
        }
        if (!pending.empty()) Syslog(LOG_INFO, "%s", pending.c_str());
        close(fds[0]);
    }
    int status = 0;
    while (waitpid(pid, &status, 0) < 0) {
        if (errno != EINTR)
            throw HostCtlException(std::string("waiting for the shell: ") + std::strerror(errno));
    }
    return ExitStatus(status);
}

}  // namespace HostCtl::Lib
