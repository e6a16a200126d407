// Creates the folder of a simulated host: its state file, a real TLS
// certificate and real SSH host keys, logs, markers, and the host's tools as
// scripts that run our simulated tools on this host's state.
#pragma once

#include <string>
#include <vector>

namespace VelkTools {

struct HostRootOptions {
    std::string root;
    std::string hostname = "host1";
    bool force = false;                      // create over an existing, non-empty folder
    std::string hostCommandBinary;           // absolute path of velk-hostcmd
    std::string supportInfo;                 // the support information pages to copy into the host
    std::string password;                    // root's console password; empty: a generated "demo-xxxxxx"
    std::vector<std::string> networkShapes;  // see NetworkShapes.hpp
};

// Creates the host and returns its root as an absolute path. Throws
// std::runtime_error (or HostCtlException) with a one-line text on any
// failure; the network shapes are checked before anything is made.
std::string CreateHostRoot(const HostRootOptions& options);

// The PAM service folder of a host root (ROOT/etc/pam-wrapper) and its
// password file.
std::string PamServiceDir(const std::string& root);
std::string PamPassdbPath(const std::string& root);

// root's password as the host's password file holds it now. Throws
// std::runtime_error when the file cannot be read or has no root line.
std::string ReadRootPassword(const std::string& root);

// Gives `user` the console secret `secret` (password or card PIN) in the
// host's password file: the user's line is replaced, or added when missing.
// The file is replaced as a whole (written beside it, then renamed), so a
// console logging in at the same time reads either the old or the new file.
void SetLoginSecret(const std::string& root, const std::string& user, const std::string& secret);

// True for a password that the host's password file can hold: not empty, no
// ':' and no line breaks.
bool IsValidPassword(const std::string& password);

// True for a host name made of letters, digits, '-' and '.' only, not
// starting or ending with '.'.
bool IsValidHostname(const std::string& hostname);

}  // namespace VelkTools
