// The console's configuration on a Debian host, "/etc/velk/velk.conf", and
// its own option file "/etc/velk/options". Both are optional: a missing file
// gives every key its default.
//
// velk.conf holds "key = value" lines; "#" starts a comment line, blank
// lines are ignored, an unknown key or a malformed line is logged once and
// skipped (a typo must never stop the console of a host).
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace HostCtl::Lib::Linux {

struct HostConfig {
    // "management-interface": the interface to manage when neither the host
    // name's address nor the default route names one. Default: none.
    std::string managementInterface;
    // "physical-nics": shell patterns of the links that count as physical
    // NICs besides those with hardware behind them (a test bed's veth pairs,
    // say). Default: none.
    std::vector<std::string> physicalNics;
    // "agent-services": the services restarted as the management agents.
    // Default: "libvirtd" when the host has it, else none.
    std::vector<std::string> agentServices;
    // "certificate": the TLS certificate whose fingerprint the welcome
    // screen shows. Default: "/etc/ssl/certs/ssl-cert-snakeoil.pem".
    std::string certificate = "/etc/ssl/certs/ssl-cert-snakeoil.pem";
    // "shell-tty": the virtual terminal whose getty is the local shell.
    // Default: "tty2".
    std::string shellTty = "tty2";
    // "console-logins": whether logins at the console are allowed ("yes" or
    // "no"). Default: yes.
    bool consoleLogins = true;
    // "welcome-message": a file whose text the welcome screen shows. Default:
    // "/etc/velk/welcome", shown only when present.
    std::string welcomeMessageFile = "/etc/velk/welcome";

    // Parses the text of velk.conf; problems are appended to `problems`, one
    // line each ("velk.conf line 3: unknown key \"foo\"").
    static HostConfig Parse(const std::string& text, std::vector<std::string>& problems);
    // Reads "/etc/velk/velk.conf" (through the host path mapping), logging
    // each problem; a missing file gives the defaults.
    static HostConfig Load();
};

// The option file "/etc/velk/options": the advanced options the console and
// the host tools keep ("/UserVars/VelkTimeOut" and the shell timeouts), one
// "NAME = VALUE" line each. Values are integers or text; a missing file or
// option gives the option's default.
class OptionFile {
public:
    struct Value {
        bool isInteger = true;
        int64_t integer = 0;
        std::string text;
    };
    // The options this host knows, with their defaults.
    static const std::map<std::string, Value>& Defaults();
    // The option's value: the file's, else the default; nothing for an
    // option this host does not know.
    static std::optional<Value> Get(const std::string& name);
    // Writes one option (atomically, under a lock); an unknown option or a
    // value of the wrong kind throws HostCtlException and changes nothing.
    static void Set(const std::string& name, const Value& value);
};

}  // namespace HostCtl::Lib::Linux
