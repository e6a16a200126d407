// Process-wide host access: which host the process talks to, the mapping of
// absolute host paths, and the one function through which syslog lines go.
#pragma once

#include <sys/types.h>

#include <cstdarg>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace HostCtl::Lib {

// Chooses the backend once, at start-up. When the environment variable
// VELK_HOST_ROOT is set and not empty, the process works on the simulated host
// in that folder (a missing folder gives errors naming its state file, never
// actions on the machine itself); otherwise on the machine it runs on.
// Calling it again does nothing. Every other function here calls it on first
// use.
void InitHost();

// Makes the process work on the simulated host in `root`, replacing the
// choice of InitHost (tests and the simulated host's own tools use it). Not
// safe while other threads use the host.
void UseSimulatedHost(const std::string& root);

// True when the process works on a simulated host.
bool IsSimulatedHost();

// The simulated host's root folder, or "" on a real host.
const std::string& HostRoot();

// Maps an absolute host path ("/bin/hrm-cmd", "/var/run/velk.pid") to the
// path to use: on a Debian host where Debian keeps it (the host tools in
// /usr/libexec/velk, see linux/LinuxPaths.hpp); inside the host root on a simulated
// one. Relative paths and empty text come back unchanged.
std::string HostPath(const std::string& absolutePath);

// Sets the identity and facility of later syslog lines (as openlog does).
void OpenLog(const char* ident, int option, int facility);

// The one way a syslog line is written. priority may carry a facility
// (LOG_AUTH | LOG_ERR); without one the facility of OpenLog is used. On a
// simulated host the line is also appended to the host's
// "/var/log/syslog.log" as
//   "<ISO-8601 UTC time> <ident>[<pid>]: <facility>.<level>: <message>"
// in one write, a line per call (control characters in the message written
// as "#" and three octal digits). Before OpenLog the identity is the
// program's short name. errno is the same after the call as before it.
void Syslog(int priority, const char* format, ...) __attribute__((format(printf, 2, 3)));
void VSyslog(int priority, const char* format, va_list args);

// The text printf makes of `format` and `args`, however long.
std::string VFormat(const char* format, va_list args);

// Replaces the file at `path` as a whole with `text` and permissions `mode`:
// the text goes to a temporary file in the same folder, which is flushed to
// disk and renamed over `path`, and the folder is flushed too. Readers see
// the old file or the new one, never a part; after a failure (or a kill) the
// old file is still there. A file that is a mount point of its own is
// rewritten in place instead. Throws HostCtlException naming the file.
void ReplaceFile(const std::string& path, const std::string& text, mode_t mode);

// Runs `body` with `folder` (made when missing) locked against the other
// processes that change files in it; `body` gets the folder's descriptor, to
// flush the folder after a removal. Throws HostCtlException when the folder
// cannot be made, opened or locked; what `body` throws goes through, the
// lock released.
void WithFolderLock(const std::string& folder, const std::function<void(int folderFd)>& body);

// The time now as "2026-11-23T08:15:02.345Z" (UTC, milliseconds), the stamp
// of the simulated host's log lines.
std::string UtcTimestamp();

// Text helpers that need no streams: the console links the C++ runtime
// statically, and any stream would bring its whole locale machinery along.
// The words of `text` separated by blanks, tabs and line ends (as >> reads
// them in the C locale).
std::vector<std::string> Words(std::string_view text);
// The lines of `text` without their '\n', as std::getline gives them: none
// after a final line end.
std::vector<std::string> Lines(std::string_view text);
// The whole file at `path` into `text`; false (and `text` empty) when it
// cannot be opened or read.
bool ReadText(const std::string& path, std::string& text);

}  // namespace HostCtl::Lib
