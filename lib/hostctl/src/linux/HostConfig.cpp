// The console's configuration file and option file on a Debian host.
#include "HostConfig.hpp"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <functional>
#include <map>
#include <system_error>

#include "hostctl/Host.hpp"
#include "hostctl/HostCtl.hpp"

namespace HostCtl::Lib::Linux {

namespace {

// Neither file is ever large; anything bigger is not one of them.
const size_t MOST_BYTES = 1 << 20;

// Blanks around a text go, and so does the "\r" of a "\r\n" line end.
std::string Trim(const std::string& text) {
    const size_t start = text.find_first_not_of(" \t\r");
    if (start == std::string::npos) return "";
    return text.substr(start, text.find_last_not_of(" \t\r") - start + 1);
}

// The lines of a text, without their "\n" (a "\r" before it stays, so that a
// rewritten file keeps the lines it does not change byte for byte).
std::vector<std::string> Lines(const std::string& text) {
    std::vector<std::string> lines;
    size_t start = 0;
    while (start < text.size()) {
        size_t end = text.find('\n', start);
        if (end == std::string::npos) end = text.size();
        lines.push_back(text.substr(start, end - start));
        start = end + 1;
    }
    return lines;
}

// "key = value" split at the first "=", both sides trimmed; false when the
// line has no "=" or no key.
bool SplitAssignment(const std::string& line, std::string& key, std::string& value) {
    const size_t equals = line.find('=');
    if (equals == std::string::npos) return false;
    key = Trim(line.substr(0, equals));
    value = Trim(line.substr(equals + 1));
    return !key.empty();
}

bool IsCommentOrBlank(const std::string& line) {
    const std::string trimmed = Trim(line);
    return trimmed.empty() || trimmed[0] == '#';
}

// Control characters other than the tab, which separates words.
bool HasControlCharacters(const std::string& text) {
    for (unsigned char c : text)
        if ((c < 0x20 && c != '\t') || c == 0x7f) return true;
    return false;
}

std::vector<std::string> Words(const std::string& text) {
    std::vector<std::string> words;
    std::string word;
    for (char c : text + " ") {
        if (c == ' ' || c == '\t' || c == ',') {
            if (!word.empty()) words.push_back(std::move(word));
            word.clear();
        } else {
            word += c;
        }
    }
    return words;
}

// A name the kernel accepts for a network interface.
bool IsInterfaceName(const std::string& name) {
    if (name.empty() || name.size() > 15 || name == "." || name == "..") return false;
    for (unsigned char c : name)
        if (c <= 0x20 || c == 0x7f || c == '/' || c == ':') return false;
    return true;
}

// A service name as init systems know them ("libvirtd", "ssh.service",
// "getty@tty1.service"): it never starts with "-", so it is never taken for an
// option of the tool it is passed to.
bool IsServiceName(const std::string& name) {
    if (name.empty() || name[0] == '-' || name.size() > 255) return false;
    for (unsigned char c : name)
        if (!std::isalnum(c) && std::strchr("@._:-", c) == nullptr) return false;
    return true;
}

bool IsAbsolutePath(const std::string& path) {
    return !path.empty() && path[0] == '/' && !HasControlCharacters(path);
}

// "ttyN" with N from 1 to 63, the virtual terminals of the kernel.
bool IsVirtualTerminal(const std::string& name) {
    if (name.size() < 4 || name.size() > 5 || name.compare(0, 3, "tty") != 0) return false;
    const std::string digits = name.substr(3);
    if (digits[0] == '0') return false;
    for (char c : digits)
        if (c < '0' || c > '9') return false;
    const int number = std::stoi(digits);
    return number >= 1 && number <= 63;
}

bool ParseInteger(const std::string& text, int64_t& value) {
    if (text.empty()) return false;
    errno = 0;
    char* end = nullptr;
    const long long parsed = std::strtoll(text.c_str(), &end, 10);
    if (errno != 0 || end != text.c_str() + text.size() || std::isspace(static_cast<unsigned char>(text[0])))
        return false;
    value = parsed;
    return true;
}

bool HostHasLibvirtd() {
    struct stat st;
    return stat(HostPath("/usr/sbin/libvirtd").c_str(), &st) == 0 && S_ISREG(st.st_mode);
}

// The file's text; false when it does not exist. Other failures throw.
bool ReadText(const std::string& path, std::string& text) {
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY);
    if (fd < 0) {
        if (errno == ENOENT) return false;
        throw HostCtlException(path + ": cannot open: " + std::strerror(errno));
    }
    text.clear();
    char buffer[8192];
    for (;;) {
        const ssize_t n = read(fd, buffer, sizeof buffer);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) {
            const int err = errno;
            close(fd);
            throw HostCtlException(path + ": cannot read: " + std::strerror(err));
        }
        if (n == 0) break;
        text.append(buffer, size_t(n));
        if (text.size() > MOST_BYTES) {
            close(fd);
            throw HostCtlException(path + ": larger than " + std::to_string(MOST_BYTES) + " bytes");
        }
    }
    close(fd);
    return true;
}

// One key of velk.conf: applies the value to the configuration, or answers
// why it cannot.
using Setter = std::function<std::string(HostConfig&, const std::string&)>;

const std::map<std::string, Setter>& Keys() {
    static const std::map<std::string, Setter> keys = {
        {"management-interface",
         [](HostConfig& c, const std::string& v) -> std::string {
             if (!v.empty() && !IsInterfaceName(v)) return "\"" + v + "\" is no interface name";
             c.managementInterface = v;
             return "";
         }},
        {"physical-nics",
         [](HostConfig& c, const std::string& v) -> std::string {
             if (HasControlCharacters(v)) return "control characters in the patterns";
             c.physicalNics = Words(v);
             return "";
         }},
        {"agent-services",
         [](HostConfig& c, const std::string& v) -> std::string {
             std::vector<std::string> services = Words(v);
             for (const std::string& service : services)
                 if (!IsServiceName(service)) return "\"" + service + "\" is no service name";
             c.agentServices = std::move(services);
             return "";
         }},
        {"certificate",
         [](HostConfig& c, const std::string& v) -> std::string {
             if (!IsAbsolutePath(v)) return "the certificate must be an absolute path";
             c.certificate = v;
             return "";
         }},
        {"shell-tty",
         [](HostConfig& c, const std::string& v) -> std::string {
             if (!IsVirtualTerminal(v)) return "\"" + v + "\" is no virtual terminal (tty1 to tty63)";
             c.shellTty = v;
             return "";
         }},
        {"console-logins",
         [](HostConfig& c, const std::string& v) -> std::string {
             if (v != "yes" && v != "no") return "expected \"yes\" or \"no\"";
             c.consoleLogins = v == "yes";
             return "";
         }},
        {"welcome-message",
         [](HostConfig& c, const std::string& v) -> std::string {
             if (!IsAbsolutePath(v)) return "the welcome message must be an absolute path";
             c.welcomeMessageFile = v;
             return "";
         }},
        {"vm-shutdown-timeout",
         [](HostConfig& c, const std::string& v) -> std::string {
             int64_t seconds = 0;
             if (!ParseInteger(v, seconds) || seconds < 0 || seconds > 3600)
                 return "expected 0 to 3600 seconds";
             c.vmShutdownTimeout = int(seconds);
             return "";
         }},
    };
    return keys;
}

// Runs `body` with the folder of the option file locked against other
// writers, making the folder first when it is missing.
template <typename Body>
void WithOptionLock(const std::string& file, Body body) {
    WithFolderLock(file.substr(0, file.rfind('/')), [&](int) { body(); });
}

std::string KindName(bool isInteger) { return isInteger ? "an integer" : "text"; }

}  // namespace

HostConfig HostConfig::Parse(const std::string& text, std::vector<std::string>& problems) {
    HostConfig config;
    bool agentServicesGiven = false;
    const std::vector<std::string> lines = Lines(text);
    for (size_t i = 0; i < lines.size(); ++i) {
        const std::string where = "velk.conf line " + std::to_string(i + 1) + ": ";
        if (IsCommentOrBlank(lines[i])) continue;
        std::string key, value;
        if (!SplitAssignment(lines[i], key, value)) {
            problems.push_back(where + "expected \"key = value\"");
            continue;
        }
        const auto setter = Keys().find(key);
        if (setter == Keys().end()) {
            problems.push_back(where + "unknown key \"" + (HasControlCharacters(key) ? "?" : key) + "\"");
            continue;
        }
        if (const std::string problem = setter->second(config, value); !problem.empty()) {
            problems.push_back(where + key + ": " + problem);
            continue;
        }
        agentServicesGiven |= key == "agent-services";
    }
    if (!agentServicesGiven && HostHasLibvirtd()) config.agentServices = {"libvirtd"};
    return config;
}

HostConfig HostConfig::Load() {
    const std::string path = HostPath(VELK_CONF_PATH);
    std::string text;
    try {
        ReadText(path, text);
    } catch (const HostCtlException& e) {
        Syslog(LOG_WARNING, "%s; using the default configuration", e.what());
        text.clear();
    }
    std::vector<std::string> problems;
    HostConfig config = Parse(text, problems);
    for (const std::string& problem : problems) Syslog(LOG_WARNING, "%s", problem.c_str());
    return config;
}

const std::map<std::string, OptionFile::Value>& OptionFile::Defaults() {
    static const std::map<std::string, Value> defaults = {
        {"/UserVars/VelkTimeOut", Value{true, 600, ""}},
        {"/UserVars/TarniShellTimeOut", Value{true, 0, ""}},
        {"/UserVars/TarniShellInteractiveTimeOut", Value{true, 0, ""}},
    };
    return defaults;
}

std::optional<OptionFile::Value> OptionFile::Get(const std::string& name) {
    const auto known = Defaults().find(name);
    if (known == Defaults().end()) return std::nullopt;
    const std::string path = HostPath(OPTION_FILE_PATH);
    std::string text;
    if (!ReadText(path, text)) return known->second;

    Value value = known->second;
    const std::vector<std::string> lines = Lines(text);
    for (size_t i = 0; i < lines.size(); ++i) {
        std::string key, found;
        if (IsCommentOrBlank(lines[i]) || !SplitAssignment(lines[i], key, found) || key != name) continue;
        if (!known->second.isInteger) {
            value.text = found;
        } else if (int64_t number = 0; ParseInteger(found, number)) {
            value.integer = number;
        } else {
            Syslog(LOG_WARNING, "%s line %zu: %s holds no integer; using %lld", path.c_str(), i + 1,
                   name.c_str(), static_cast<long long>(known->second.integer));
            value.integer = known->second.integer;
        }
    }
    return value;
}

void OptionFile::Set(const std::string& name, const Value& value) {
    const auto known = Defaults().find(name);
    if (known == Defaults().end()) throw HostCtlException("no advanced option \"" + name + "\"");
    if (known->second.isInteger != value.isInteger)
        throw HostCtlException("advanced option \"" + name + "\" holds " + KindName(known->second.isInteger) +
                               ", not " + KindName(value.isInteger));
    if (!value.isInteger && (HasControlCharacters(value.text) || Trim(value.text) != value.text))
        throw HostCtlException("advanced option \"" + name +
                               "\": the text may hold no line breaks, control characters or surrounding "
                               "blanks");
    const std::string line = name + " = " + (value.isInteger ? std::to_string(value.integer) : value.text);

    const std::string path = HostPath(OPTION_FILE_PATH);
    WithOptionLock(path, [&] {
        std::string text;
        ReadText(path, text);
        // Every line of the option is replaced by the new one (the first
        // keeps its place); every other line stays as it was.
        std::string updated;
        bool written = false;
        for (const std::string& current : Lines(text)) {
            std::string key, ignored;
            if (!IsCommentOrBlank(current) && SplitAssignment(current, key, ignored) && key == name) {
                if (!written) updated += line + "\n";
                written = true;
            } else {
                updated += current + "\n";
            }
        }
        if (!written) updated += line + "\n";
        ReplaceFile(path, updated, 0644);
    });
}

}  // namespace HostCtl::Lib::Linux
