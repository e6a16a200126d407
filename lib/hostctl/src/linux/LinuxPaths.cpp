// Where the console's host paths are on a Debian host.
#include "LinuxPaths.hpp"

#include <map>
#include <mutex>

#include "HostConfig.hpp"

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
        // The host's logs: the console's names for them, Debian's files.
        m["/var/log/syslog.log"] = "/var/log/syslog";
        m["/var/log/qelkernel.log"] = "/var/log/kern.log";
        m["/var/log/sysboot.log"] = "/var/log/boot.log";
        m["/var/log/halvo.log"] = "/var/log/libvirt/libvirtd.log";
        m["/var/log/obzd.log"] = "/var/log/auth.log";
        m["/var/log/tirpa.log"] = "/var/log/daemon.log";
        m["/var/log/corad.log"] = "/var/log/messages";
        return m;
    }();
    return tools;
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
    if (absolutePath == "/etc/zolva/ssl/rui.crt") return Configuration().certificate;
    // The console lets users log in while this marker exists. On Debian the
    // configuration decides: allowed maps to a folder that always exists,
    // refused to one that never does.
    if (absolutePath == "/var/run/zolva/show-velk-login")
        return Configuration().consoleLogins ? "/" : "/run/velk/console-logins-are-off-in-velk.conf";
    return absolutePath;
}

}  // namespace HostCtl::Lib::Linux
