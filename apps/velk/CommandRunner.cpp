#include "CommandRunner.hpp"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "Console.hpp"
#include "Frame.hpp"
#include "hostctl/Host.hpp"
#include "obzuser/obzuser.h"

namespace Velk {

using HostCtl::Lib::Syslog;

namespace {

constexpr useconds_t kPollMicros = 20000;
constexpr int kPollMillis = 20;

void ClosePair(int fds[2]) {
    close(fds[0]);
    close(fds[1]);
}

// What the console keeps of one output stream of a child: the first bytes,
// up to the caller's buffer; the rest is read and dropped, so a child that
// writes more than a pipe holds never blocks.
struct Capture {
    int fd;
    char* buf;
    size_t capacity;
    size_t kept = 0;
    bool open = true;

    void Drain() {
        char scratch[4096];
        for (;;) {
            char* into = scratch;
            size_t room = sizeof scratch;
            if (buf && kept < capacity) {
                into = buf + kept;
                room = capacity - kept;
            }
            const ssize_t n = read(fd, into, room);
            if (n > 0) {
                if (into != scratch) kept += static_cast<size_t>(n);
                continue;
            }
            if (n < 0 && errno == EINTR) continue;
            if (n == 0) open = false;
            return;  // EAGAIN: nothing more for now
        }
    }
};

// Waits for the child while reading its output. With a time limit the child
// is killed when it runs out. A termination signal ends the console from
// here (the signal thread has already asked the child to end). False when
// the child could not be waited for.
bool WaitForChild(pid_t pid, int timeoutSeconds, int outFd, char* outBuf, size_t* outLen, int errFd,
                  char* errBuf, size_t* errLen, int* status, bool* killed) {
    Capture out{outFd, outBuf, outBuf && outLen ? *outLen : 0};
    Capture err{errFd, errBuf, errBuf && errLen ? *errLen : 0};
    fcntl(outFd, F_SETFL, O_NONBLOCK);
    fcntl(errFd, F_SETFL, O_NONBLOCK);
    Frame::SetForegroundChild(pid);
    long long budget = static_cast<long long>(timeoutSeconds) * 1000;
    bool ok = true;
    for (;;) {
        const pid_t r = waitpid(pid, status, WNOHANG);
        if (r == pid) break;
        if (r < 0 && errno != EINTR) {
            ok = false;
            break;
        }
        if (Frame::EndRequested()) {
            // Give the child a moment to end on the signal thread's SIGTERM.
            for (int i = 0; i < 50 && waitpid(pid, status, WNOHANG) == 0; ++i) usleep(kPollMicros);
            kill(pid, SIGKILL);
            waitpid(pid, status, 0);
            Frame::SetForegroundChild(0);
            Frame::EndIfRequested();
        }
        struct pollfd fds[2] = {{out.open ? outFd : -1, POLLIN, 0}, {err.open ? errFd : -1, POLLIN, 0}};
        const int n = poll(fds, 2, kPollMillis);
        if (n > 0) {
            if (fds[0].revents) out.Drain();
            if (fds[1].revents) err.Drain();
        }
        if (timeoutSeconds > 0 && (budget -= kPollMillis) < 1) {
            Syslog(LOG_WARNING, "Killing process because %d seconds timeout expired", timeoutSeconds);
            kill(pid, SIGKILL);
            // Reap it so no zombie stays behind; the result is -1.
            while (waitpid(pid, status, 0) < 0 && errno == EINTR) {
            }
            *killed = true;
            break;
        }
    }
    Frame::SetForegroundChild(0);
    // What the child wrote just before it ended is still in the pipes.
    if (out.open) out.Drain();
    if (err.open) err.Drain();
    if (outLen) *outLen = outBuf ? out.kept : 0;
    if (errLen) *errLen = errBuf ? err.kept : 0;
    return ok;
}

}  // namespace

namespace {

const char* const kChildEnv[] = {"PYTHONHOME=/", nullptr};

int Spawn(const char* path, const char* const argv[], const char* const env[], char* outBuf, size_t* outLen,
          char* errBuf, size_t* errLen, const char* inBuf, size_t inLen, int timeoutSeconds);

}  // namespace

int RunCommand(const char* path, const char* const argv[], char* outBuf, size_t* outLen, char* errBuf,
               size_t* errLen, const char* inBuf, size_t inLen, int timeoutSeconds) {
    return Spawn(path, argv, kChildEnv, outBuf, outLen, errBuf, errLen, inBuf, inLen, timeoutSeconds);
}

int RunShellCommand(const std::string& commandLine) {
    // An absolute program path at the start of the line is a host path; the
    // shell finds other programs only in the host's own folders, so on a
    // simulated host nothing reaches the real machine's tools.
    std::string line = commandLine;
    if (!line.empty() && line[0] == '/') {
        const size_t end = line.find_first_of(" \t");
        line =
            HostCtl::Lib::HostPath(line.substr(0, end)) + (end == std::string::npos ? "" : line.substr(end));
    }
    const std::string path = "PATH=" + HostCtl::Lib::HostPath("/sbin") + ":" +
                             HostCtl::Lib::HostPath("/bin") +
                             (HostCtl::Lib::IsSimulatedHost() ? "" : ":/usr/sbin:/usr/bin");
    const char* const env[] = {"PYTHONHOME=/", path.c_str(), nullptr};
    const char* const argv[] = {"sh", "-c", line.c_str(), nullptr};
    return Spawn("/bin/sh", argv, env, nullptr, nullptr, nullptr, nullptr, nullptr, 0, 0);
}

namespace {

int Spawn(const char* path, const char* const argv[], const char* const env[], char* outBuf, size_t* outLen,
          char* errBuf, size_t* errLen, const char* inBuf, size_t inLen, int timeoutSeconds) {
    int errPipe[2], outPipe[2], inPipe[2];
    if (pipe2(errPipe, O_CLOEXEC) != 0) return -1;
    if (pipe2(outPipe, O_CLOEXEC) != 0) {
        ClosePair(errPipe);
        return -1;
    }
    if (pipe2(inPipe, O_CLOEXEC) != 0) {
        ClosePair(errPipe);
        ClosePair(outPipe);
        return -1;
    }
    const std::string program = HostCtl::Lib::HostPath(path);
    // No new child once the console is ending.
    if (Frame::EndRequested()) {
        ClosePair(errPipe);
        ClosePair(outPipe);
        ClosePair(inPipe);
        Frame::EndIfRequested();
    }

    // The screen shows what the console waits for while the child runs.
    Window::Flush();
    pid_t pid = fork();
    if (pid < 0) {
        ClosePair(errPipe);
        ClosePair(outPipe);
        ClosePair(inPipe);
        return -1;
    }
    if (pid == 0) {
        close(inPipe[1]);
        close(outPipe[0]);
        close(errPipe[0]);
        close(0);
        close(1);
        close(2);
        if (dup2(inPipe[0], 0) < 0 || dup2(outPipe[1], 1) < 0 || dup2(errPipe[1], 2) < 0) _exit(-1);
        close(inPipe[0]);
        close(outPipe[1]);
        close(errPipe[1]);
        // Nothing of the console's own descriptors reaches the child.
        closefrom(3);
        // The signals the console receives through its signal thread are
        // blocked in every thread; the child starts with a clean mask.
        sigset_t none;
        sigemptyset(&none);
        sigprocmask(SIG_SETMASK, &none, nullptr);
        signal(SIGPIPE, SIG_DFL);
        execve(program.c_str(), const_cast<char* const*>(argv), const_cast<char* const*>(env));
        _exit(1);
    }

    close(inPipe[0]);
    close(outPipe[1]);
    close(errPipe[1]);
    if (inBuf && inLen > 0) {
        ssize_t ignored = write(inPipe[1], inBuf, inLen);
        (void)ignored;
    }
    close(inPipe[1]);

    int status = 0;
    bool killed = false;
    const bool waited = WaitForChild(pid, timeoutSeconds, outPipe[0], outBuf, outLen, errPipe[0], errBuf,
                                     errLen, &status, &killed);
    close(outPipe[0]);
    close(errPipe[0]);
    if (!waited) status = -1;

    if (!killed && status != -1 && WIFEXITED(status)) return WEXITSTATUS(status);
    Syslog(LOG_ERR, "Run Command did not terminate normally");
    return -1;
}

}  // namespace

int InvokeHrmCmd(const char* path, const char* argv[], char* outBuf, size_t* outLen, char* errBuf,
                 size_t* errLen, const char* inBuf, size_t inLen) {
    int result = RunCommand(path, argv, outBuf, outLen, errBuf, errLen, inBuf, inLen, 0);
    if (result != 255) return result;
    Syslog(LOG_INFO, "Unable to execute command hrm-cmd %s using user %s. Using user %s", argv[3], argv[2],
           VELK_USER);
    argv[2] = VELK_USER;
    if (outLen) *outLen = 256;
    if (errLen) *errLen = 256;
    return RunCommand(path, argv, outBuf, outLen, errBuf, errLen, inBuf, inLen, 0);
}

void RefreshHostAgent() {
    const char* argv[] = {"hrm-cmd", "-U", Frame::_loginName.c_str(), "internalsvc/refresh", nullptr};
    InvokeHrmCmd("/bin/hrm-cmd", argv, nullptr, nullptr, nullptr, nullptr, nullptr, 0);
}

bool HrmGetFlag(const std::string& command) {
    Syslog(LOG_INFO, "hrm-cmd invocation: get %s", command.c_str());
    char out[257] = {};
    size_t outLen = 256;
    const char* argv[] = {"hrm-cmd", "-U", VELK_USER, command.c_str(), nullptr};
    int status = RunCommand("/bin/hrm-cmd", argv, out, &outLen, nullptr, nullptr, nullptr, 0, 120);
    if (status != 0) Syslog(LOG_ERR, "hrm-cmd invocation failure: %m");
    return std::strncmp(out, "true", 4) == 0;
}

void PowerOffVms(bool keepRunning) {
    const char* agentArgv[] = {"hrm-cmd", "-U", Frame::_loginName.c_str(),
                               "hostsvc/autostartmanager/autostop", nullptr};
    InvokeHrmCmd("/bin/hrm-cmd", agentArgv, nullptr, nullptr, nullptr, nullptr, nullptr, 0);
    const char* gentle[] = {"powerOffVms", nullptr};
    const char* forceful[] = {"powerOffVms", "--terminate", nullptr};
    RunCommand("/bin/powerOffVms", keepRunning ? gentle : forceful, nullptr, nullptr, nullptr, nullptr,
               nullptr, 0, 0);
}

int InitObzUser() {
    Syslog(LOG_INFO, "%s", "Initializing obzuser library");
    int rc = ObzUserLib_Init();
    if (rc != 0) Syslog(LOG_ERR, "Unable to initialize obzuser library from VELK. Error code: %d", rc);
    return rc;
}

void ReportObzEvent(const char* format, ...) {
    if (InitObzUser() != 0) return;
    va_list args;
    va_start(args, format);
    ObzUserLib_VAddObz(format, args);
    va_end(args);
    ObzUserLib_Close();
}

}  // namespace Velk
