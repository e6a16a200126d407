// Command lines run through the host's own shell, on either host.
#pragma once

#include <string>
#include <vector>

namespace HostCtl::Lib {

// The command line as the host's shell must see it: every word outside
// quotes that starts with "/" is a host path and goes through HostPath
// ("/bin/sh /sbin/services.sh stop" runs the host's script), except the
// null device and the other devices.
std::string HostCommandLine(const std::string& commandLine);

// Runs `commandLine` with the host's "/bin/sh -c" and the host's tools
// first on PATH, standard input from the null device and no other
// descriptor inherited. See Backend::RunCommandLine for `logOutput` and
// `wait`. Throws HostCtlException when the shell cannot be started.
int RunHostShell(const std::string& commandLine, bool logOutput, bool wait);

// Runs a host program (argv[0] an absolute host path) with a clean
// environment, standard input from the null device and no other descriptor
// inherited, for at most `timeoutMs`: then its whole process group is killed
// and the result is -1. Otherwise the result is its exit status (128 + the
// signal number when a signal ended it). Its output (standard output and
// error together, at most `maxOutput` bytes) goes to `output` when given.
// Throws HostCtlException when it cannot be started.
int RunBounded(const std::vector<std::string>& argv, int timeoutMs, std::string* output = nullptr,
               size_t maxOutput = 65536);

}  // namespace HostCtl::Lib
