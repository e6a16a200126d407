// Creates the folder of a simulated host: its state file, a real TLS
// certificate and real SSH host keys, logs, markers, and the host's tools as
// scripts that run our simulated tools on this host's state.
#pragma once

#include <string>

namespace VelkTools {

struct HostRootOptions {
    std::string root;
    std::string hostname = "host1";
    bool force = false;             // create over an existing, non-empty folder
    std::string hostCommandBinary;  // absolute path of velk-hostcmd
};

// Creates the host and returns its root as an absolute path. Throws
// std::runtime_error with a one-line text on any failure.
std::string CreateHostRoot(const HostRootOptions& options);

// True for a host name made of letters, digits, '-' and '.' only, not
// starting or ending with '.'.
bool IsValidHostname(const std::string& hostname);

}  // namespace VelkTools
