#include "Frame.hpp"

#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <sys/ioctl.h>
#include <sys/select.h>
#include <sys/wait.h>
#include <syslog.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <memory>
#include <utility>
#include <vector>

#include "Console.hpp"
#include "StringFactory.hpp"
#include "hostctl/Host.hpp"

namespace Velk {

using HostCtl::Lib::Syslog;

Frame* Frame::fgFrame = nullptr;
sigset_t Frame::_signalSet;
int Frame::_signalPipe[2] = {-1, -1};
QelCtl::Hardware::SmartCardInfoImpl Frame::_cardInfo;
bool Frame::_isLoggedWithSmartCard = false;
std::string Frame::_smartCardLoginId;
std::string Frame::_loginName;
bool Frame::_loggedIn = false;
bool Frame::_markForRestart = false;
unsigned int Frame::_idleTimeout = 600;
std::function<void(pid_t, int)> Frame::_childExitHandler;
std::function<void()> Frame::_atEnd;

namespace {
constexpr long kDimSeconds = 60;
// Reads that find the terminal readable but yield no key, in a row, after
// which its input counts as ended (a tty gives at least one byte per wake-up).
constexpr int kEmptyReadsAtEnd = 3;
// How long the main thread has to end after a termination signal before the
// signal side ends the process itself (it is stuck somewhere).
constexpr unsigned kEmergencyExitSeconds = 5;
// How much longer it waits while the work before the end runs.
constexpr unsigned kAtEndSeconds = 30;

std::atomic<int> endRequest{0};  // 0 or the event that ends the console
std::atomic<pid_t> foregroundChild{0};
std::atomic<bool> loggedInShadow{false};  // _loggedIn, readable by the signal thread
std::atomic<bool> emergencyArmed{false};
std::atomic<bool> atEndRunning{false};
int emptyReads = 0;

// Last resort when the main thread does not end after a termination signal:
// the terminal gets its modes back, the foreground child is killed, and the
// process ends at once. Only async-signal-safe calls.
void* EmergencyExit(void*) {
    unsigned left = kEmergencyExitSeconds;
    while (left > 0) left = sleep(left);
    for (unsigned waited = 0; atEndRunning.load() && waited < kAtEndSeconds; ++waited) sleep(1);
    const pid_t child = foregroundChild.load();
    if (child > 0) kill(child, SIGKILL);
    tcsetattr(1, TCSANOW, &orig_termios);
    static const char kReset[] = "\x1b[0m\x1b[H\x1b[2J\x1b[?25h";
    ssize_t ignored = write(1, kReset, sizeof kReset - 1);
    (void)ignored;
    _exit(0);
}

struct WatchedChild {
    pid_t pid;
    bool killAtExit;
};
std::vector<WatchedChild>& Watched() {
    static std::vector<WatchedChild> children;
    return children;
}

// At exit: children that must not outlive the console are killed; every
// watched child that has ended is reaped.
void EndWatchedChildren() {
    for (const WatchedChild& child : Watched()) {
        if (child.killAtExit) kill(child.pid, SIGKILL);
        int status;
        waitpid(child.pid, &status, child.killAtExit ? 0 : WNOHANG);
    }
}

// Time left from now until deadline, never negative.
struct timeval Remaining(const struct timeval& now, const struct timeval& deadline) {
    struct timeval left = {0, 0};
    if (timercmp(&deadline, &now, >)) timersub(&deadline, &now, &left);
    return left;
}
}  // namespace

Frame::Frame(Frame* parent, int x, int y, int width, int height, int bg, int fg)
    : Window(x, y, width, height, bg, fg), _parent(parent), _factory(StringFactory::Get("en_US")) {}

Frame::~Frame() {
    if (fgFrame == this) fgFrame = nullptr;
}

int Frame::Execute() {
    fgFrame = nullptr;
    if (_parent) {
        _parent->Show(false);
        _parent->Refresh();
    }
    Show(true);
    fgFrame = this;
    int result;
    try {
        result = Run();
    } catch (const VelkTimeout&) {
        fgFrame = nullptr;
        throw;
    }
    if (_parent) {
        _parent->Show(true);
        _parent->Refresh();
        fgFrame = _parent;
        return result & 0xff;
    }
    fgFrame = nullptr;
    return result;
}

int Frame::GetKey(bool useIdleTimeout, long tickMillis) {
    struct timeval start;
    gettimeofday(&start, nullptr);
    const bool limited = useIdleTimeout && _idleTimeout != 0;
    const long limitSeconds = std::max<long>(_idleTimeout, kDimSeconds);
    const struct timeval dimAt = {start.tv_sec + kDimSeconds, start.tv_usec};
    const struct timeval timeoutAt = {start.tv_sec + limitSeconds, start.tv_usec};
    const struct timeval tick = {tickMillis / 1000, (tickMillis % 1000) * 1000};
    struct timeval tickAt;
    timeradd(&start, &tick, &tickAt);
    bool dimmed = false;

    for (;;) {
        struct timeval now;
        gettimeofday(&now, nullptr);
        if (limited && timercmp(&now, &timeoutAt, >)) {
            fgFrame = nullptr;
            throw VelkTimeout();
        }
        if (tickMillis > 0 && !timercmp(&now, &tickAt, <)) return EV_TIMEOUT;
        int result;
        if (!dimmed && timercmp(&now, &dimAt, >)) {
            Show(false);
            Refresh();
            dimmed = true;
        }
        // The nearest of the dimming, the idle timeout and the tick.
        struct timeval left;
        struct timeval* wait = &left;
        if (!dimmed) {
            left = Remaining(now, dimAt);
        } else if (limited) {
            left = Remaining(now, timeoutAt);
        } else {
            wait = nullptr;
        }
        if (tickMillis > 0) {
            const struct timeval untilTick = Remaining(now, tickAt);
            if (!wait || timercmp(&untilTick, &left, <)) left = untilTick;
            wait = &left;
        }
        result = WaitForInput(wait);

        switch (result) {
            case EV_TIMEOUT:
                continue;
            case EV_REFRESH:
                if (fgFrame) {
                    // The same screen drawn again: keys typed meanwhile stay.
                    Window::_keepTypeAhead = true;
                    fgFrame->Update();
                    Window::_keepTypeAhead = false;
                }
                CheckSmartCard();
                continue;
            case EV_RESTART:
                if (_loggedIn) {
                    _markForRestart = true;
                    continue;
                }
                exit(0);
            case EV_RESIZE:
            case EV_TERMINATE:
            case EV_HANGUP:
                End(result);
            case EV_CHILD:
                ReapWatchedChildren();
                if (_childExitHandler) return EV_CHILD;
                continue;
            default:
                break;
        }
        if (result == KEY_RESIZE) End(EV_RESIZE);
        if (result < 0) continue;
        if (dimmed) {
            clearok(curscr, TRUE);
            Show(true);
            Refresh();
        }
        return result;
    }
}

int Frame::WaitForInput(struct timeval* timeout) {
    // An ending signal goes before whatever waits ahead of it in the pipe or
    // on the keyboard (a flood of refresh requests). A restart requested while
    // logged out ends the console too; once logged in, its byte marks it.
    const int ending = endRequest.load();
    if (ending != 0 && (ending != EV_RESTART || !_loggedIn)) return ending;
    fd_set fds;
    FD_ZERO(&fds);
    FD_SET(0, &fds);
    FD_SET(_signalPipe[0], &fds);
    // Keys already waiting are all handled before the screen is written: a
    // burst of keys or a paste is drawn once, with only its end result (over
    // a serial line every byte costs time).
    if (!InputWaiting()) Window::Flush();
    int n = select(std::max(0, _signalPipe[0]) + 1, &fds, nullptr, nullptr, timeout);
    if (n < 0) {
        LogError("select() failed");
        return EV_ERROR;
    }
    if (n == 0) return EV_TIMEOUT;
    if (FD_ISSET(0, &fds)) {
        wtimeout(stdscr, 0);
        int key = wgetch(stdscr);
        wtimeout(stdscr, -1);
        if (key != ERR) {
            emptyReads = 0;
            return key;
        }
        // A closed or hung-up terminal stays readable for ever: end instead
        // of spinning on it.
        if (const int end = EndOfInput()) {
            if (end != EV_HANGUP) Syslog(LOG_WARNING, "End of input on the terminal, exiting");
            End(end);
        }
        return EV_ERROR;
    }
    if (FD_ISSET(_signalPipe[0], &fds)) {
        unsigned char byte = 0;
        ssize_t r;
        do {
            r = read(_signalPipe[0], &byte, 1);
        } while (r <= 0 && errno == EINTR);
        if (r == 1 && byte >= 1 && byte <= 6) return -2 - byte;
    }
    return EV_ERROR;
}

void Frame::StartSignalHandling() {
    if (pipe2(_signalPipe, O_CLOEXEC) != 0) {
        LogError("pipe() failed");
        exit(1);
    }
    sigemptyset(&_signalSet);
    // SIGCHLD too: a child's end reaches the key loop as a pipe byte, never as
    // an interruption somewhere else.
    // SIGHUP: a hang-up of the terminal (a serial line without carrier, a
    // closed pseudo-terminal) ends the console like the end of its input.
    for (int sig : {SIGINT, SIGQUIT, SIGTERM, SIGUSR1, SIGUSR2, SIGWINCH, SIGCHLD, SIGHUP})
        sigaddset(&_signalSet, sig);
    if (pthread_sigmask(SIG_BLOCK, &_signalSet, nullptr) != 0) LogError("pthread_sigmask() failed");
    pthread_t thread;
    if (pthread_create(&thread, nullptr, SignalHandler, nullptr) != 0) {
        LogError("pthread_create() failed");
        exit(1);
    }
    pthread_detach(thread);
}

void* Frame::SignalHandler(void*) {
    for (;;) {
        int sig = 0;
        if (sigwait(&_signalSet, &sig) != 0) {
            LogError("sigwait() failed");
            continue;
        }
        unsigned char byte;
        switch (sig) {
            case SIGUSR1:
                byte = 1;
                break;
            case SIGUSR2:
                byte = 2;
                // Logged in, the restart waits for the log-out; otherwise it
                // ends the console like a termination.
                if (!loggedInShadow.load()) RequestEnd(EV_RESTART);
                break;
            case SIGWINCH:
                byte = 3;
                RequestEnd(EV_RESIZE);
                break;
            case SIGCHLD:
                byte = 5;
                break;
            case SIGINT:
            case SIGQUIT:
            case SIGTERM:
                byte = 4;
                RequestEnd(EV_TERMINATE);
                break;
            case SIGHUP:
                byte = 6;
                RequestEnd(EV_HANGUP);
                break;
            default:
                continue;
        }
        ssize_t w;
        do {
            w = write(_signalPipe[1], &byte, 1);
        } while (w <= 0 && errno == EINTR);
    }
    return nullptr;
}

void Frame::RequestEnd(int event) {
    int none = 0;
    endRequest.compare_exchange_strong(none, event);
    // The child the main thread waits for is asked to end, so the wait ends.
    const pid_t child = foregroundChild.load();
    if (child > 0) kill(child, SIGTERM);
    // Output held back by a stop character (Ctrl-S) would keep the main
    // thread in a write for ever.
    tcflow(1, TCOON);
    if (!emergencyArmed.exchange(true)) {
        pthread_t thread;
        if (pthread_create(&thread, nullptr, EmergencyExit, nullptr) == 0) pthread_detach(thread);
    }
}

bool Frame::InputWaiting() {
    struct pollfd input = {0, POLLIN, 0};
    return poll(&input, 1, 0) > 0 && (input.revents & POLLIN);
}

int Frame::EndOfInput() {
    struct pollfd input = {0, POLLIN, 0};
    if (poll(&input, 1, 0) < 0) return 0;
    // The hang-up signal may come after the hung-up terminal is seen here.
    if (input.revents & POLLHUP) return EV_HANGUP;
    if (input.revents & (POLLERR | POLLNVAL)) return EV_TERMINATE;
    if (!(input.revents & POLLIN)) {
        emptyReads = 0;
        return 0;
    }
    return ++emptyReads >= kEmptyReadsAtEnd ? EV_TERMINATE : 0;
}

void Frame::SetForegroundChild(pid_t pid) {
    foregroundChild.store(pid);
    // A signal that came before the child was registered asks it here.
    if (pid > 0 && endRequest.load() != 0) kill(pid, SIGTERM);
}

bool Frame::EndRequested() { return endRequest.load() != 0; }

void Frame::EndIfRequested() {
    const int event = endRequest.load();
    if (event != 0) End(event);
}

void Frame::RunAtEnd() {
    // Taken first: work that ends the console again from inside does not
    // run it twice.
    const std::function<void()> work = std::exchange(_atEnd, nullptr);
    if (!work) return;
    atEndRunning.store(true);
    work();
    atEndRunning.store(false);
}

void Frame::End(int event) {
    if (event == EV_RESIZE) ResizeTerminal();
    if (event == EV_HANGUP) Syslog(LOG_WARNING, "Terminal hung up, exiting");
    RunAtEnd();
    exit(0);
}

void Frame::RefuseSmallTerminal() {
    Syslog(LOG_WARNING, "Terminal too small: %dx%d, the console needs at least %dx%d", COLS, LINES,
           kMinColumns, kMinLines);
    const std::string notice = "Terminal too small: " + std::to_string(COLS) + "x" + std::to_string(LINES) +
                               ". This console needs at least " + std::to_string(kMinColumns) +
                               " columns and " + std::to_string(kMinLines) + " lines.";
    // Word-wrapped to the width; a word longer than a row is cut.
    std::vector<std::string> rows;
    std::string row;
    size_t at = 0;
    while (at < notice.size()) {
        size_t end = notice.find(' ', at);
        if (end == std::string::npos) end = notice.size();
        const std::string word = notice.substr(at, end - at);
        at = end + 1;
        if (!row.empty() && static_cast<int>(row.size() + 1 + word.size()) > COLS) {
            rows.push_back(row);
            row.clear();
        }
        row += (row.empty() ? "" : " ") + word;
    }
    if (!row.empty()) rows.push_back(row);
    erase();
    const int top = std::max(0, (LINES - static_cast<int>(rows.size())) / 2);
    for (size_t i = 0; i < rows.size() && top + static_cast<int>(i) < LINES; ++i)
        mvaddnstr(top + static_cast<int>(i), 0, rows[i].c_str(), COLS);
    refresh();
    for (;;) {
        switch (const int event = WaitForInput(nullptr)) {
            case EV_TERMINATE:
            case EV_RESTART:
            case EV_HANGUP:
                End(event);
            case EV_RESIZE:
            case KEY_RESIZE:
                End(EV_RESIZE);
            default:
                break;  // keys and refreshes change nothing here
        }
    }
}

void Frame::WatchChild(pid_t pid, bool killAtExit) {
    static const bool registered = [] { return std::atexit(EndWatchedChildren) == 0; }();
    (void)registered;
    Watched().push_back({pid, killAtExit});
}

void Frame::ReapWatchedChildren() {
    std::vector<WatchedChild>& children = Watched();
    for (size_t i = 0; i < children.size();) {
        int status = 0;
        pid_t r;
        do {
            r = waitpid(children[i].pid, &status, WNOHANG);
        } while (r < 0 && errno == EINTR);
        if (r == 0) {
            ++i;
            continue;
        }
        const pid_t pid = children[i].pid;
        children.erase(children.begin() + static_cast<std::ptrdiff_t>(i));
        // A child that cannot be waited for is over as far as the console can
        // tell; it counts as failed.
        if (_childExitHandler) _childExitHandler(pid, r == pid ? status : 1 << 8);
    }
}

void Frame::ResizeTerminal() {
    struct winsize ws = {};
    if (ioctl(0, TIOCGWINSZ, &ws) != 0 || ws.ws_row == 0 || ws.ws_col == 0) return;
    resizeterm(ws.ws_row, ws.ws_col);
    Syslog(LOG_INFO, "Resized window to %dx%d", ws.ws_col, ws.ws_row);
    refresh();
}

void Frame::LoadIdleTimeout() {
    _idleTimeout = 600;
    try {
        QelCtl::Adv::AdvancedOptionImpl options;
        std::unique_ptr<HostCtl::Adv::AdvancedOption> option = options.FindOption(VELK_TIMEOUT_VAR);
        if (auto* integer = dynamic_cast<HostCtl::Adv::AdvancedIntegerOption*>(option.get())) {
            _idleTimeout = static_cast<unsigned int>(integer->GetCurrent());
        }
    } catch (const HostCtl::Lib::HostCtlException&) {
        // The default stays in force.
    }
}

void Frame::SetLoggedIn(bool loggedIn) {
    _loggedIn = loggedIn;
    loggedInShadow.store(loggedIn);
    if (loggedIn) LoadIdleTimeout();
}

void Frame::SetLoginName(const std::string& name) {
    _loginName = name;
    _isLoggedWithSmartCard = IsSmartCardPresent(name);
}

std::string Frame::GetSmartCardUserId() {
    try {
        for (const auto& slot : _cardInfo.GetAllSlots()) {
            QelCtl::Hardware::SmartCardToken token;
            if (!_cardInfo.GetToken(slot, token)) continue;
            for (const std::string& id : token.userIds) {
                if (!id.empty()) return id;
            }
        }
    } catch (const HostCtl::Lib::HostCtlException&) {
        Syslog(LOG_ERR, "Error trying to lookup smart card tokens.");
    }
    return "";
}

bool Frame::IsSmartCardPresent(const std::string& userId) {
    try {
        for (const auto& slot : _cardInfo.GetAllSlots()) {
            QelCtl::Hardware::SmartCardToken token;
            if (!_cardInfo.GetToken(slot, token)) continue;
            if (std::find(token.userIds.begin(), token.userIds.end(), userId) != token.userIds.end())
                return true;
        }
    } catch (const HostCtl::Lib::HostCtlException&) {
        Syslog(LOG_ERR, "Error trying to lookup smart card tokens.");
    }
    return false;
}

void Frame::CheckSmartCard() {
    if (!_loggedIn) {
        _smartCardLoginId = GetSmartCardUserId();
        if (!_smartCardLoginId.empty())
            Syslog(LOG_INFO, "Found smart card with user id '%s'", _smartCardLoginId.c_str());
    } else if (_isLoggedWithSmartCard && !IsSmartCardPresent(_loginName)) {
        Syslog(LOG_INFO, "Logging out user id '%s'", _loginName.c_str());
        RunAtEnd();
        exit(0);
    }
}

}  // namespace Velk
