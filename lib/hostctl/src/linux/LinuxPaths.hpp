// Where the console's host paths are on a Debian host.
#pragma once

#include <string>

namespace HostCtl::Lib::Linux {

// The folder of the Debian host's tools (hrm-cmd, qelping, services.sh, ...).
inline constexpr const char* TOOLS_DIR = "/usr/libexec/velk";

// Maps an absolute host path as the console names it to the path on a
// Debian host: the host tools to our own under TOOLS_DIR (never /bin or
// /sbin), the management certificate to the configured one, the
// login-permission marker to a path that exists exactly when console logins
// are allowed, the hosts' log files to the Debian ones; other paths stay.
std::string MapHostPath(const std::string& absolutePath);

struct HostConfig;
// The configuration ("/etc/velk/velk.conf"), read once, on first use.
const HostConfig& Configuration();

}  // namespace HostCtl::Lib::Linux
