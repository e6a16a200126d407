// velk-hostcmd: the simulated host's command-line tools in one program.
//   velk-hostcmd --root ROOT TOOL [ARGS...]
// TOOL is hrm-cmd, grabCIMData, powerOffVms, reboot, poweroff,
// firmwareConfig.sh, openssl, or a service tool (TarnShell, SSH,
// tarncfg-advcfg, tarncli, localcli, services.sh, qelbacktrace) or qelping
// (the host's ping, answered by the simulated network). Every tool
// but openssl first waits for its delay and fails with its fault, when the
// host's state sets one (ToolFaults.hpp). A host root holds small
// scripts under the tools' host paths that run this program with the root
// filled in, so the tools work with an empty environment, as the console
// runs them.
#include <fcntl.h>

#include <cstdio>
#include <cstdlib>
#include <map>
#include <string>
#include <vector>

#include "HostCommands.hpp"
#include "ToolFaults.hpp"

namespace {

using Tool = int (*)(HostCtl::Lib::SimState&, const std::vector<std::string>&, std::string&, std::string&);

const std::map<std::string, Tool> TOOLS = {
    {"hrm-cmd", VelkTools::HrmCmd},
    {"grabCIMData", VelkTools::GrabCimData},
    {"powerOffVms", VelkTools::PowerOffVms},
    {"reboot", VelkTools::Reboot},
    {"poweroff", VelkTools::Poweroff},
    {"firmwareConfig.sh", VelkTools::FirmwareConfig},
    // Services.
    {"TarnShell", VelkTools::TarnShellScript},
    {"SSH", VelkTools::SshScript},
    {"tarncfg-advcfg", VelkTools::TarncfgAdvcfg},
    {"tarncli", VelkTools::Tarncli},
    {"localcli", VelkTools::Localcli},
    {"services.sh", VelkTools::ServicesScript},
    {"qelbacktrace", VelkTools::Qelbacktrace},
    // Network.
    {"qelping", VelkTools::Qelping},
};

int Usage() {
    std::fputs(
        "usage: velk-hostcmd --root ROOT TOOL [ARGS...]\n"
        "  TOOL: hrm-cmd, grabCIMData, powerOffVms, reboot, poweroff, firmwareConfig.sh, openssl,\n"
        "        TarnShell, SSH, tarncfg-advcfg, tarncli, localcli, services.sh, qelbacktrace or qelping\n"
        "  (VELK_HOST_ROOT stands for --root when it is left out)\n",
        stderr);
    return 1;
}

std::string OneLine(std::string text) {
    for (char& c : text)
        if (c == '\n' || c == '\r') c = ' ';
    return text;
}

}  // namespace

int main(int argc, char** argv) {
    // A tool may be started with its standard streams closed (the console's
    // ping check does so). Whatever file it opens must never become one of
    // them: its output would land in that file.
    for (int fd = 0; fd <= 2; ++fd) {
        if (fcntl(fd, F_GETFD) < 0 && open("/dev/null", fd == 0 ? O_RDONLY : O_WRONLY) != fd) return 1;
    }
    std::vector<std::string> args(argv + 1, argv + argc);
    std::string root;
    size_t next = 0;
    if (args.size() >= 2 && args[0] == "--root") {
        root = args[1];
        next = 2;
    } else if (const char* env = std::getenv("VELK_HOST_ROOT")) {
        root = env;
    }
    if (root.empty() || next >= args.size()) return Usage();
    const std::string& name = args[next];
    if (name == "openssl") return VelkTools::Openssl({args.begin() + std::ptrdiff_t(next) + 1, args.end()});
    auto tool = TOOLS.find(name);
    if (tool == TOOLS.end()) {
        std::fprintf(stderr, "velk-hostcmd: unknown tool %s\n", name.c_str());
        return Usage();
    }
    std::vector<std::string> toolArgs(args.begin() + std::ptrdiff_t(next) + 1, args.end());

    std::string out;
    std::string err;
    int status = 1;
    try {
        HostCtl::Lib::SimState sim(root);
        if (VelkTools::InjectToolFault(sim, name, toolArgs, err))
            status = 1;
        else
            status = tool->second(sim, toolArgs, out, err);
    } catch (const std::exception& e) {
        std::fprintf(stderr, "%s: %s\n", name.c_str(), OneLine(e.what()).c_str());
        return 1;
    }
    std::fwrite(out.data(), 1, out.size(), stdout);
    std::fwrite(err.data(), 1, err.size(), stderr);
    return status;
}
