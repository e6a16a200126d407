#include "HostSystem.hpp"

#include <dirent.h>
#include <fcntl.h>
#include <linux/close_range.h>
#include <poll.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>

#include "hostctl/Host.hpp"

namespace VelkDebian {

using HostCtl::Lib::HostPath;

namespace {

const char* const SYSTEMCTL = "/bin/systemctl";
const char* const SERVICE = "/usr/sbin/service";
const char* const UPDATE_RC_D = "/usr/sbin/update-rc.d";
// A service that takes longer than this to start or stop has hung.
const int SERVICE_SECONDS = 120;
// The most output a tool keeps of a program it runs.
const size_t MOST_OUTPUT = 1 << 20;

void WriteAll(int fd, const std::string& text) {
    size_t done = 0;
    while (done < text.size()) {
        const ssize_t n = write(fd, text.data() + done, text.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return;
        done += size_t(n);
    }
}

[[noreturn]] void StartChild(const std::vector<std::string>& argv, int outFd, int reportFd) {
    // Default handling and no blocked signals, whatever the tool inherited.
    for (int sig = 1; sig < NSIG; ++sig) signal(sig, SIG_DFL);
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
    const int devNull = open("/dev/null", O_RDWR | O_CLOEXEC);
    if (devNull < 0 || dup2(devNull, 0) < 0 || (outFd >= 0 && dup2(outFd, 1) < 0)) {
        const int err = errno;
        ssize_t ignored = write(reportFd, &err, sizeof err);
        (void)ignored;
        _exit(127);
    }
    // Nothing beyond 0 to 2 reaches the program; the report pipe stays open
    // until the exec succeeds.
    if (close_range(3, ~0U, CLOSE_RANGE_CLOEXEC) < 0)
        for (int fd = 3; fd < 4096; ++fd) fcntl(fd, F_SETFD, FD_CLOEXEC);
    std::vector<char*> args;
    for (const std::string& a : argv) args.push_back(const_cast<char*>(a.c_str()));
    args.push_back(nullptr);
    char* env[] = {const_cast<char*>(CHILD_PATH), nullptr};
    const std::string program = HostPath(argv[0]);
    execve(program.c_str(), args.data(), env);
    const int err = errno;
    ssize_t ignored = write(reportFd, &err, sizeof err);
    (void)ignored;
    _exit(127);
}

}  // namespace

Child Run(const std::vector<std::string>& argv, bool capture, int timeoutSeconds) {
    Child child;
    int report[2];
    int out[2] = {-1, -1};
    if (pipe2(report, O_CLOEXEC) < 0) return child;
    if (capture && pipe2(out, O_CLOEXEC) < 0) {
        close(report[0]);
        close(report[1]);
        return child;
    }
    const pid_t pid = fork();
    if (pid == 0) StartChild(argv, capture ? out[1] : -1, report[1]);
    close(report[1]);
    if (capture) close(out[1]);
    if (pid < 0) {
        close(report[0]);
        if (capture) close(out[0]);
        return child;
    }

    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(timeoutSeconds);
    int waitStatus = 0;
    bool ended = false;
    bool outOpen = capture;
    while (!ended) {
        const pid_t done = waitpid(pid, &waitStatus, WNOHANG);
        if (done == pid || (done < 0 && errno != EINTR)) {
            ended = true;
            break;
        }
        if (std::chrono::steady_clock::now() >= deadline) {
            kill(pid, SIGKILL);
            while (waitpid(pid, &waitStatus, 0) < 0 && errno == EINTR) {
            }
            child.timedOut = true;
            ended = true;
            break;
        }
        if (outOpen) {
            pollfd p = {out[0], POLLIN, 0};
            if (poll(&p, 1, 20) > 0) {
                char buffer[4096];
                const ssize_t n = read(out[0], buffer, sizeof buffer);
                if (n > 0 && child.out.size() < MOST_OUTPUT) child.out.append(buffer, size_t(n));
                if (n == 0) outOpen = false;
            }
        } else {
            usleep(20000);
        }
    }
    // What the program wrote before it ended (a program it left running may
    // hold the pipe open: only what is there now is read).
    if (outOpen) {
        fcntl(out[0], F_SETFL, O_NONBLOCK);
        char buffer[4096];
        ssize_t n;
        while ((n = read(out[0], buffer, sizeof buffer)) > 0 && child.out.size() < MOST_OUTPUT)
            child.out.append(buffer, size_t(n));
    }
    if (capture) close(out[0]);
    int execError = 0;
    const bool failedToStart = read(report[0], &execError, sizeof execError) == sizeof execError;
    close(report[0]);
    child.started = !failedToStart;
    if (child.started && !child.timedOut && WIFEXITED(waitStatus)) child.status = WEXITSTATUS(waitStatus);
    if (failedToStart)
        HostCtl::Lib::Syslog(LOG_ERR, "cannot run %s: %s", argv[0].c_str(), std::strerror(execError));
    else if (child.timedOut)
        HostCtl::Lib::Syslog(LOG_WARNING, "%s did not end within %d seconds and was killed", argv[0].c_str(),
                             timeoutSeconds);
    return child;
}

void Say(const std::string& text) { WriteAll(1, text); }
void Complain(const std::string& text) { WriteAll(2, text); }

std::string ReadHostFile(const std::string& hostPath) {
    const int fd = open(HostPath(hostPath).c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK);
    if (fd < 0) return "";
    std::string text;
    char buffer[4096];
    ssize_t n;
    while (text.size() < 65536 && (n = read(fd, buffer, sizeof buffer)) > 0) text.append(buffer, size_t(n));
    close(fd);
    return text;
}

bool HostPathExists(const std::string& hostPath) {
    struct stat st;
    return stat(HostPath(hostPath).c_str(), &st) == 0;
}

bool SystemdRuns() {
    struct stat st;
    return stat(HostPath("/run/systemd/system").c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

const char* ActionName(ServiceAction action) {
    switch (action) {
        case ServiceAction::Start:
            return "start";
        case ServiceAction::Stop:
            return "stop";
        case ServiceAction::Restart:
            return "restart";
        case ServiceAction::Enable:
            return "enable";
        case ServiceAction::Disable:
            return "disable";
    }
    return "";
}

int ControlService(const std::string& service, ServiceAction action) {
    std::vector<std::string> argv;
    if (SystemdRuns()) {
        argv = {SYSTEMCTL, ActionName(action), service};
    } else {
        // The init scripts of a host without systemd are named without the
        // unit's suffix.
        std::string script = service;
        if (script.size() > 8 && script.compare(script.size() - 8, 8, ".service") == 0)
            script.resize(script.size() - 8);
        if (action == ServiceAction::Enable || action == ServiceAction::Disable)
            argv = {UPDATE_RC_D, script, ActionName(action)};
        else
            argv = {SERVICE, script, ActionName(action)};
    }
    HostCtl::Lib::Syslog(LOG_INFO, "%s %s %s", argv[0].c_str(), argv[1].c_str(), argv[2].c_str());
    const Child child = Run(argv, false, SERVICE_SECONDS);
    if (child.status != 0)
        HostCtl::Lib::Syslog(LOG_ERR, "%s %s %s failed with status %d", argv[0].c_str(), argv[1].c_str(),
                             argv[2].c_str(), child.status);
    return child.status;
}

bool ServiceRuns(const std::string& service) {
    if (SystemdRuns()) return Run({SYSTEMCTL, "is-active", "--quiet", service}, false, 30).status == 0;
    // "service NAME status" answers as the init script does: 0 while it runs.
    return Run({SERVICE, service, "status"}, true, 30).status == 0;
}

bool GettyRunsOn(const std::string& tty) {
    DIR* proc = opendir(HostPath("/proc").c_str());
    if (proc == nullptr) return false;
    bool found = false;
    while (dirent* entry = readdir(proc)) {
        if (entry->d_name[0] < '1' || entry->d_name[0] > '9') continue;
        const std::string cmdline = ReadHostFile("/proc/" + std::string(entry->d_name) + "/cmdline");
        // NUL-separated arguments: a getty (agetty, mingetty, getty) with the
        // terminal as one of them.
        std::vector<std::string> args;
        for (size_t start = 0; start < cmdline.size();) {
            const size_t end = std::min(cmdline.find('\0', start), cmdline.size());
            args.push_back(cmdline.substr(start, end - start));
            start = end + 1;
        }
        if (args.empty()) continue;
        const std::string program = args[0].substr(args[0].rfind('/') + 1);
        if (program.size() < 5 || program.compare(program.size() - 5, 5, "getty") != 0) continue;
        for (size_t i = 1; i < args.size() && !found; ++i) found = args[i] == tty || args[i] == "/dev/" + tty;
        if (found) break;
    }
    closedir(proc);
    return found;
}

}  // namespace VelkDebian
