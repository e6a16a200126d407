// Where the console's host paths are on a Debian host.
#include "LinuxPaths.hpp"

#include <sys/stat.h>
#include <syslog.h>

#include <map>
#include <mutex>
#include <vector>

#include "HostConfig.hpp"
#include "HostShell.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/HostCtl.hpp"

namespace HostCtl::Lib::Linux {

namespace {

// The host tools the console runs by absolute path, each ours on Debian.
const std::map<std::string, std::string>& ToolPaths() {
    static const std::map<std::string, std::string> tools = [] {
        std::map<std::string, std::string> m;
        for (const char* path :
             {"/bin/hrm-cmd", "/sbin/qelping", "/sbin/services.sh", "/etc/init.d/TarnShell",
              "/etc/init.d/SSH", "/bin/powerOffVms", "/sbin/powerOffVms", "/sbin/grabCIMData",
              "/sbin/tarncfg-advcfg", "/sbin/tarncli", "/sbin/localcli", "/sbin/firmwareConfig.sh",
              "/sbin/qelbacktrace"}) {
            const std::string p = path;
            m[p] = std::string(TOOLS_DIR) + p.substr(p.rfind('/'));
        }
        // The host's own programs, where Debian keeps them.
        m["/usr/lib/zolva/openssh/bin/ssh-keygen"] = "/usr/bin/ssh-keygen";
        m["/bin/openssl"] = "/usr/bin/openssl";
        m["/bin/less"] = "/usr/bin/less";
        return m;
    }();
    return tools;
}

// The host's logs: the console's names for them, Debian's files, and what
// to ask the journal for when a file is not there (a host without a syslog
// daemon).
struct LogSource {
    const char* file;
    std::vector<std::string> journal;  // journalctl's selection
};
const std::map<std::string, LogSource>& Logs() {
    static const std::map<std::string, LogSource> logs = {
        {"/var/log/syslog.log", {"/var/log/syslog", {"-b"}}},
        {"/var/log/qelkernel.log", {"/var/log/kern.log", {"-k"}}},
        {"/var/log/sysboot.log", {"/var/log/boot.log", {"-b", "_PID=1"}}},
        {"/var/log/halvo.log", {"/var/log/libvirt/libvirtd.log", {"-u", "libvirtd"}}},
        {"/var/log/obzd.log", {"/var/log/auth.log", {"SYSLOG_FACILITY=4", "SYSLOG_FACILITY=10"}}},
        {"/var/log/tirpa.log", {"/var/log/daemon.log", {"SYSLOG_FACILITY=3"}}},
        {"/var/log/corad.log", {"/var/log/messages", {"-p", "info"}}},
    };
    return logs;
}

// A log the host keeps only in its journal, exported into a file of the
// console's own for the pager (only root reads it). The file Debian would
// have when the journal has nothing or cannot be asked.
std::string JournalExport(const std::string& name, const LogSource& source) {
    struct stat st {};
    if (stat(source.file, &st) == 0 || stat("/usr/bin/journalctl", &st) != 0) return source.file;
    mkdir("/run/velk", 0755);
    mkdir("/run/velk/logs", 0700);
    std::vector<std::string> argv = {"/usr/bin/journalctl", "--no-pager", "-q",   "-o",
                                     "short-iso",           "-n",         "20000"};
    argv.insert(argv.end(), source.journal.begin(), source.journal.end());
    std::string text;
    if (RunBounded(argv, 10000, &text, 8 << 20) != 0 || text.empty()) return source.file;
    const std::string path = "/run/velk/logs" + name.substr(name.rfind('/'));
    try {
        ReplaceFile(path, text, 0600);
    } catch (const HostCtlException& e) {
        Syslog(LOG_WARNING, "Exporting the journal for %s: %s", name.c_str(), e.what());
        return source.file;
    }
    return path;
}

// True on the thread that is reading the configuration: the paths it reads
// are the machine's own.
thread_local bool loadingConfig = false;

}  // namespace

const HostConfig& Configuration() {
    // Read once: the mapping is asked for on every host path, and the
    // configuration only changes with a restart of the console.
    static std::once_flag once;
    static HostConfig* config = nullptr;
    std::call_once(once, [] {
        loadingConfig = true;
        config = new HostConfig(HostConfig::Load());
        loadingConfig = false;
    });
    return *config;
}

std::string MapHostPath(const std::string& absolutePath) {
    if (loadingConfig) return absolutePath;
    const auto& tools = ToolPaths();
    if (auto it = tools.find(absolutePath); it != tools.end()) return it->second;
    if (auto log = Logs().find(absolutePath); log != Logs().end())
        return JournalExport(log->first, log->second);
    if (absolutePath == "/etc/zolva/ssl/rui.crt") return Configuration().certificate;
    // The console lets users log in while this marker exists. On Debian the
    // configuration decides: allowed maps to a folder that always exists,
    // refused to one that never does.
    if (absolutePath == "/var/run/zolva/show-velk-login")
        return Configuration().consoleLogins ? "/" : "/run/velk/console-logins-are-off-in-velk.conf";
    return absolutePath;
}

}  // namespace HostCtl::Lib::Linux
