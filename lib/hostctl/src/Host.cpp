// Which host the process works on, the mapping of host paths, and syslog.
#include "hostctl/Host.hpp"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <deque>
#include <filesystem>
#include <memory>
#include <mutex>
#include <string>
#include <system_error>

#include "UniqueFd.hpp"
#include "hostctl/Backend.hpp"
#include "hostctl/SimState.hpp"
#include "linux/LinuxBackend.hpp"
#include "linux/LinuxPaths.hpp"

namespace HostCtl::Lib {

namespace {

struct HostChoice {
    std::mutex mutex;  // guards the choice of host and the syslog identity
    bool chosen = false;
    bool simulated = false;
    std::string root;
    std::unique_ptr<Backend> backend;

    // openlog keeps the pointer it is given, so every identity ever set stays
    // alive here (they are few: one per OpenLog call).
    std::deque<std::string> idents;
    const char* ident = nullptr;  // null until OpenLog: the program's short name
    int facility = LOG_USER;
};

HostChoice& Choice() {
    static HostChoice* choice = new HostChoice;  // never destroyed: used until the very end
    return *choice;
}

// An absolute, lexically normal root without a trailing slash ("/" stays "/").
std::string NormalRoot(const std::string& root) {
    std::filesystem::path path(root);
    std::error_code ec;
    if (path.is_relative()) {
        std::filesystem::path absolute = std::filesystem::absolute(path, ec);
        if (!ec) path = absolute;
    }
    std::string text = path.lexically_normal().string();
    while (text.size() > 1 && text.back() == '/') text.pop_back();
    return text;
}

void ChooseSimulated(HostChoice& c, const std::string& root) {
    c.chosen = true;
    c.simulated = true;
    c.root = NormalRoot(root);
    c.backend = MakeSimulatedBackend(c.root);
}

void InitLocked(HostChoice& c) {
    if (c.chosen) return;
    // A set VELK_HOST_ROOT always means the simulated host, even when the
    // folder is missing: a mistyped root must end in clear errors about the
    // missing state, never in actions on the machine itself.
    const char* root = getenv("VELK_HOST_ROOT");
    if (root != nullptr && *root != '\0') {
        ChooseSimulated(c, root);
        return;
    }
    c.chosen = true;
    c.simulated = false;
    c.root.clear();
    c.backend = Linux::MakeLinuxBackend();
}

const char* FacilityName(int facility) {
    // Indexed by facility code (LOG_KERN is 0, LOG_LOCAL7 is 23); codes 12 to
    // 15 have no common name.
    static const char* const names[] = {"kern",    "user",    "mail",    "daemon",  "auth",     "syslog",
                                        "lpr",     "news",    "uucp",    "cron",    "authpriv", "ftp",
                                        "unknown", "unknown", "unknown", "unknown", "local0",   "local1",
                                        "local2",  "local3",  "local4",  "local5",  "local6",   "local7"};
    return names[LOG_FAC(facility) % 24];
}

const char* LevelName(int level) {
    static const char* const names[] = {"emerg",   "alert",  "crit", "err",
                                        "warning", "notice", "info", "debug"};
    return names[level & LOG_PRIMASK];
}

// One entry per line: trailing line ends are dropped and other control
// characters are written as "#" and three octal digits, as syslog daemons do.
std::string OneLine(const std::string& message) {
    size_t end = message.size();
    while (end > 0 && (message[end - 1] == '\n' || message[end - 1] == '\r')) --end;
    std::string out;
    out.reserve(end);
    for (size_t i = 0; i < end; ++i) {
        unsigned char ch = static_cast<unsigned char>(message[i]);
        if (ch < 0x20 || ch == 0x7f) {
            char code[5];
            snprintf(code, sizeof code, "#%03o", ch);
            out += code;
        } else {
            out += static_cast<char>(ch);
        }
    }
    return out;
}

void AppendToHostLog(const std::string& path, const std::string& line) {
    int fd = open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
    if (fd < 0) return;  // nowhere to report it: the line still went to syslog
    // One write: appends of other processes land before or after it, never
    // inside it.
    ssize_t ignored = write(fd, line.data(), line.size());
    (void)ignored;
    close(fd);
}

}  // namespace

std::string VFormat(const char* format, va_list args) {
    va_list copy;
    va_copy(copy, args);
    char small[512];
    int n = vsnprintf(small, sizeof small, format, copy);
    va_end(copy);
    if (n < 0) return format;
    if (size_t(n) < sizeof small) return std::string(small, size_t(n));
    std::string text(size_t(n) + 1, '\0');
    vsnprintf(text.data(), text.size(), format, args);
    text.resize(size_t(n));
    return text;
}

void InitHost() {
    HostChoice& c = Choice();
    std::lock_guard<std::mutex> lock(c.mutex);
    InitLocked(c);
}

void UseSimulatedHost(const std::string& root) {
    HostChoice& c = Choice();
    std::lock_guard<std::mutex> lock(c.mutex);
    ChooseSimulated(c, root);
}

bool IsSimulatedHost() {
    HostChoice& c = Choice();
    std::lock_guard<std::mutex> lock(c.mutex);
    InitLocked(c);
    return c.simulated;
}

const std::string& HostRoot() {
    HostChoice& c = Choice();
    std::lock_guard<std::mutex> lock(c.mutex);
    InitLocked(c);
    return c.root;
}

std::string HostPath(const std::string& absolutePath) {
    HostChoice& c = Choice();
    if (absolutePath.empty() || absolutePath[0] != '/') return absolutePath;
    {
        std::lock_guard<std::mutex> lock(c.mutex);
        InitLocked(c);
        if (c.simulated) return c.root == "/" ? absolutePath : c.root + absolutePath;
    }
    // Outside the lock: the real host's mapping reads its configuration once.
    return Linux::MapHostPath(absolutePath);
}

Backend& GetBackend() {
    HostChoice& c = Choice();
    std::lock_guard<std::mutex> lock(c.mutex);
    InitLocked(c);
    return *c.backend;
}

void SetBackend(std::unique_ptr<Backend> backend) {
    HostChoice& c = Choice();
    std::lock_guard<std::mutex> lock(c.mutex);
    InitLocked(c);
    if (backend)
        c.backend = std::move(backend);
    else
        c.backend = c.simulated ? MakeSimulatedBackend(c.root) : Linux::MakeLinuxBackend();
}

void OpenLog(const char* ident, int option, int facility) {
    HostChoice& c = Choice();
    std::lock_guard<std::mutex> lock(c.mutex);
    if (ident != nullptr) {
        c.idents.emplace_back(ident);
        c.ident = c.idents.back().c_str();
    } else {
        c.ident = nullptr;
    }
    c.facility = facility & LOG_FACMASK;
    openlog(c.ident, option, c.facility);
}

void VSyslog(int priority, const char* format, va_list args) {
    const int savedErrno = errno;
    HostChoice& c = Choice();
    std::string ident;
    std::string logPath;
    int facility;
    {
        std::lock_guard<std::mutex> lock(c.mutex);
        InitLocked(c);
        ident = c.ident != nullptr ? c.ident : program_invocation_short_name;
        facility = (priority & LOG_FACMASK) != 0 ? (priority & LOG_FACMASK) : c.facility;
        if (c.simulated) logPath = c.root == "/" ? "/var/log/syslog.log" : c.root + "/var/log/syslog.log";
    }
    const int level = priority & LOG_PRIMASK;

    errno = savedErrno;  // for "%m"
    const std::string message = VFormat(format, args);
    syslog(facility | level, "%s", message.c_str());

    if (!logPath.empty()) {
        std::string line = UtcTimestamp() + " " + ident + "[" + std::to_string(getpid()) +
                           "]: " + FacilityName(facility) + "." + LevelName(level) + ": " + OneLine(message) +
                           "\n";
        AppendToHostLog(logPath, line);
    }
    errno = savedErrno;
}

void Syslog(int priority, const char* format, ...) {
    va_list args;
    va_start(args, format);
    VSyslog(priority, format, args);
    va_end(args);
}

void WithFolderLock(const std::string& folder, const std::function<void(int folderFd)>& body) {
    std::error_code ec;
    std::filesystem::create_directories(folder, ec);
    if (ec) throw HostCtlException(folder + ": cannot create: " + ec.message());
    const UniqueFd fd(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));  // closing unlocks
    if (fd.Get() < 0) throw HostCtlException(folder + ": cannot open: " + std::strerror(errno));
    while (flock(fd.Get(), LOCK_EX) < 0)
        if (errno != EINTR) throw HostCtlException(folder + ": cannot lock: " + std::strerror(errno));
    body(fd.Get());
}

void ReplaceFile(const std::string& path, const std::string& text, mode_t mode) {
    auto fail = [&](const std::string& what, int err) {
        return HostCtlException(path + ": " + what + ": " +
                                std::error_code(err, std::generic_category()).message());
    };
    std::string tmp = path + ".XXXXXX";
    const int fd = mkostemp(tmp.data(), O_CLOEXEC);
    if (fd < 0) throw fail("cannot create a temporary file", errno);
    // Nothing but the complete file may take the old one's place.
    auto abandon = [&](const char* what) {
        const int err = errno;
        close(fd);
        unlink(tmp.c_str());
        return fail(what, err);
    };
    for (size_t done = 0; done < text.size();) {
        const ssize_t n = write(fd, text.data() + done, text.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) throw abandon("cannot write");
        done += size_t(n);
    }
    if (fchmod(fd, mode) < 0) throw abandon("cannot set the mode");
    if (fsync(fd) < 0) throw abandon("cannot write");
    if (close(fd) < 0) {
        const int err = errno;
        unlink(tmp.c_str());
        throw fail("cannot write", err);
    }
    if (rename(tmp.c_str(), path.c_str()) < 0) {
        const int err = errno;
        unlink(tmp.c_str());
        // A file that is a mount point of its own (containers bind-mount
        // /etc/hosts, /etc/hostname and /etc/resolv.conf) cannot be renamed
        // over: it is rewritten in place instead.
        if (err != EBUSY) throw fail("cannot replace", err);
        const int in = open(path.c_str(), O_WRONLY | O_TRUNC | O_CLOEXEC);
        if (in < 0) throw fail("cannot write in place", errno);
        for (size_t done = 0; done < text.size();) {
            const ssize_t n = write(in, text.data() + done, text.size() - done);
            if (n < 0 && errno == EINTR) continue;
            if (n < 0) {
                const int werr = errno;
                close(in);
                throw fail("cannot write in place", werr);
            }
            done += size_t(n);
        }
        const int serr = fsync(in) < 0 ? errno : 0;
        close(in);
        if (serr != 0) throw fail("cannot write in place", serr);
        return;
    }
    // Make the rename itself durable.
    const size_t slash = path.rfind('/');
    const std::string dir = slash == std::string::npos ? "." : slash == 0 ? "/" : path.substr(0, slash);
    const int dirFd = open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (dirFd >= 0) {
        fsync(dirFd);
        close(dirFd);
    }
}

std::string UtcTimestamp() {
    timespec now;
    clock_gettime(CLOCK_REALTIME, &now);
    tm utc;
    gmtime_r(&now.tv_sec, &utc);
    char text[80];
    snprintf(text, sizeof text, "%04d-%02d-%02dT%02d:%02d:%02d.%03dZ", utc.tm_year + 1900, utc.tm_mon + 1,
             utc.tm_mday, utc.tm_hour, utc.tm_min, utc.tm_sec, int(now.tv_nsec / 1000000) % 1000);
    return text;
}

std::vector<std::string> Words(std::string_view text) {
    std::vector<std::string> words;
    constexpr std::string_view kBlanks = " \t\n\v\f\r";
    for (size_t at = text.find_first_not_of(kBlanks); at != std::string_view::npos;) {
        const size_t end = text.find_first_of(kBlanks, at);
        words.emplace_back(text.substr(at, end == std::string_view::npos ? end : end - at));
        at = end == std::string_view::npos ? end : text.find_first_not_of(kBlanks, end);
    }
    return words;
}

std::vector<std::string> Lines(std::string_view text) {
    std::vector<std::string> lines;
    for (size_t at = 0; at < text.size();) {
        const size_t end = text.find('\n', at);
        lines.emplace_back(text.substr(at, end == std::string_view::npos ? end : end - at));
        at = end == std::string_view::npos ? text.size() : end + 1;
    }
    return lines;
}

bool ReadText(const std::string& path, std::string& text) {
    text.clear();
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) return false;
    char buf[8192];
    for (;;) {
        const ssize_t n = read(fd, buf, sizeof buf);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) {
            close(fd);
            if (n == 0) return true;
            text.clear();
            return false;
        }
        text.append(buf, size_t(n));
    }
}

}  // namespace HostCtl::Lib
