// The console's configuration on a Debian host, "/etc/velk/velk.conf", and
// its own option file "/etc/velk/options". Both are optional: a missing file
// gives every key its default.
//
// velk.conf holds "key = value" lines; "#" starts a comment line, blank
// lines are ignored, an unknown key, a malformed line or a bad value is logged
// once and skipped, the key keeping its default (a typo must never stop the
// console of a host). A key given twice takes its last value. Lists are
// separated by blanks or commas.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace HostCtl::Lib::Linux {

// The host paths of the two files (mapped through HostPath when used).
inline constexpr const char* VELK_CONF_PATH = "/etc/velk/velk.conf";
inline constexpr const char* OPTION_FILE_PATH = "/etc/velk/options";

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
    // "shell-tty": the virtual terminal whose getty is the local shell,
    // "tty1" to "tty63". Default: "tty1" (the console itself is usually on
    // tty2, and a getty started there would take the console's place).
    std::string shellTty = "tty1";
    // "console-logins": whether logins at the console are allowed ("yes" or
    // "no"). Default: yes.
    bool consoleLogins = true;
    // "welcome-message": a file whose text the welcome screen shows. Default:
    // "/etc/velk/welcome", shown only when present.
    std::string welcomeMessageFile = "/etc/velk/welcome";
    // "vm-shutdown-timeout": seconds to wait for virtual machines asked to
    // shut down before a shut-down or restart of the host, 0 to 3600.
    // Default: 300.
    int vmShutdownTimeout = 300;

    // Parses the text of velk.conf; problems are appended to `problems`, one
    // line each ("velk.conf line 3: unknown key \"foo\""). The default of
    // "agent-services" looks for "/usr/sbin/libvirtd" on the host.
    static HostConfig Parse(const std::string& text, std::vector<std::string>& problems);
    // Reads "/etc/velk/velk.conf" (through the host path mapping), logging
    // each problem; a missing file gives the defaults.
    static HostConfig Load();
};

// The option file "/etc/velk/options": the advanced options the console and
// the host tools keep ("/UserVars/VelkTimeOut" and the shell timeouts), one
// "NAME = VALUE" line each. Values are integers or text; a missing file or
// option gives the option's default. Lines the file holds besides the
// options (comments, names this host does not know) are kept on writes.
class OptionFile {
public:
    struct Value {
        bool isInteger = true;
        int64_t integer = 0;
        std::string text;
    };
    // The options this host knows, with their defaults.
    static const std::map<std::string, Value>& Defaults();
    // The option's value: the file's, else the default (a value of the wrong
    // kind in the file is logged and the default used); nothing for an option
    // this host does not know. A file that cannot be read throws
    // HostCtlException.
    static std::optional<Value> Get(const std::string& name);
    // Writes one option (atomically, under a lock on "/etc/velk" so that two
    // writers never lose an update; the folder is made when missing); an
    // unknown option, a value of the wrong kind, a text that would not read
    // back the same (line breaks, control characters, surrounding blanks) or
    // a failed write throws HostCtlException and changes nothing.
    static void Set(const std::string& name, const Value& value);
};

}  // namespace HostCtl::Lib::Linux
