// The one way the console runs host programs, and the host-agent and
// observation-event helpers built on it.
#pragma once

#include <cstddef>
#include <string>

namespace Velk {

// Runs the host program at path (a host path, mapped to the host in use) with
// argv (null-terminated, argv[0] the short name) and an environment of exactly
// "PYTHONHOME=/". Optional output buffers receive at most *outLen / *errLen
// bytes, read once after the child has ended; the lengths are updated. Input,
// when given, is written to the child's standard input. timeoutSeconds <= 0
// means no limit; past the limit the child is killed. Returns the exit status
// (0..255), or -1 when the child could not be started or did not exit.
int RunCommand(const char* path, const char* const argv[], char* outBuf, size_t* outLen, char* errBuf,
               size_t* errLen, const char* inBuf, size_t inLen, int timeoutSeconds);

// Runs a command line through the host's shell ("/bin/sh -c"), waiting for it.
// The shell finds programs only in the host's "/sbin" and "/bin"; a leading
// absolute path is a host path. Returns the shell's exit status, or -1 when
// the shell could not be started.
int RunShellCommand(const std::string& commandLine);

// Runs "/bin/hrm-cmd"-style argv ("hrm-cmd", "-U", user, command, ...); when
// the tool answers 255 (it could not act as that user) it is run once more as
// VELK_USER, with both capacities reset to 256.
int InvokeHrmCmd(const char* path, const char* argv[], char* outBuf, size_t* outLen, char* errBuf,
                 size_t* errLen, const char* inBuf, size_t inLen);

// Asks the host agent to re-read the host's state.
void RefreshHostAgent();

// Asks the host agent a yes/no question: true when its answer begins "true".
bool HrmGetFlag(const std::string& command);

// Stops the virtual machines before a power action; keepRunning false adds
// "--terminate" (forceful).
void PowerOffVms(bool keepRunning);

int InitObzUser();
// Reports one observation event; format is printf-style.
void ReportObzEvent(const char* format, ...) __attribute__((format(printf, 1, 2)));

}  // namespace Velk
