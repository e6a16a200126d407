// velk-debian-tools: the Debian host's command-line tools in one program. It
// runs the tool named by the name it was started under (a link named
// "hrm-cmd", say), or the tool named by its first argument:
//   velk-debian-tools TOOL [ARGS...]
#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <exception>

#include "DebianTools.hpp"
#include "HostSystem.hpp"
#include "hostctl/Host.hpp"

namespace VelkDebian {

const std::map<std::string, Tool>& Tools() {
    static const std::map<std::string, Tool> tools = {
        {"hrm-cmd", HrmCmd},
        {"TarnShell", TarnShellScript},
        {"SSH", SshScript},
        {"services.sh", ServicesScript},
        {"tarncfg-advcfg", TarncfgAdvcfg},
        {"tarncli", Tarncli},
        {"localcli", Localcli},
        {"powerOffVms", PowerOffVms},
        {"grabCIMData", GrabCimData},
        {"qelping", Qelping},
        {"firmwareConfig.sh", FirmwareConfig},
        {"qelbacktrace", Qelbacktrace},
    };
    return tools;
}

}  // namespace VelkDebian

namespace {

int Usage() {
    std::string names;
    for (const auto& [name, tool] : VelkDebian::Tools()) names += (names.empty() ? "" : ", ") + name;
    VelkDebian::Complain("usage: velk-debian-tools TOOL [ARGS...]\n  TOOL: " + names +
                         "\n  (or run the program under a tool's name)\n");
    return 1;
}

}  // namespace

int main(int argc, char** argv) {
    // A tool may be started with its standard streams closed (the console's
    // ping check does so): whatever it opens must never become one of them.
    for (int fd = 0; fd <= 2; ++fd) {
        if (fcntl(fd, F_GETFD) < 0 && open("/dev/null", fd == 0 ? O_RDONLY : O_WRONLY) != fd) return 1;
    }
    std::vector<std::string> args(argv + 1, argv + argc);
    std::string name = argc > 0 ? argv[0] : "";
    name = name.substr(name.rfind('/') + 1);
    auto tool = VelkDebian::Tools().find(name);
    if (tool == VelkDebian::Tools().end() && !args.empty()) {
        name = args[0];
        tool = VelkDebian::Tools().find(name);
        args.erase(args.begin());
    }
    if (tool == VelkDebian::Tools().end()) return Usage();

    HostCtl::Lib::OpenLog(name.c_str(), LOG_PID, LOG_USER);
    try {
        return tool->second(args);
    } catch (const std::exception& e) {
        // The option file and the configuration fail this way.
        std::string text = e.what();
        for (char& c : text)
            if (c == '\n' || c == '\r') c = ' ';
        HostCtl::Lib::Syslog(LOG_ERR, "%s", text.c_str());
        VelkDebian::Complain(name + ": " + text + "\n");
        return 1;
    }
}
