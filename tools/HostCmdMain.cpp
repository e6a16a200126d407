// velk-hostcmd: the simulated host's command-line tools in one program.
//   velk-hostcmd --root ROOT TOOL [ARGS...]
// TOOL is hrm-cmd, grabCIMData, powerOffVms, reboot, poweroff,
// firmwareConfig.sh or openssl. A host root holds small
// scripts under the tools' host paths that run this program with the root
// filled in, so the tools work with an empty environment, as the console
// runs them.
#include <cstdio>
#include <cstdlib>
#include <map>
#include <string>
#include <vector>

#include "HostCommands.hpp"

namespace {

using Tool = int (*)(HostCtl::Lib::SimState&, const std::vector<std::string>&, std::string&, std::string&);

const std::map<std::string, Tool> TOOLS = {
    {"hrm-cmd", VelkTools::HrmCmd},          {"grabCIMData", VelkTools::GrabCimData},
    {"powerOffVms", VelkTools::PowerOffVms}, {"reboot", VelkTools::Reboot},
    {"poweroff", VelkTools::Poweroff},       {"firmwareConfig.sh", VelkTools::FirmwareConfig},
};

int Usage() {
    std::fputs(
        "usage: velk-hostcmd --root ROOT TOOL [ARGS...]\n"
        "  TOOL: hrm-cmd, grabCIMData, powerOffVms, reboot, poweroff, firmwareConfig.sh or openssl\n"
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
        status = tool->second(sim, toolArgs, out, err);
    } catch (const std::exception& e) {
        std::fprintf(stderr, "%s: %s\n", name.c_str(), OneLine(e.what()).c_str());
        return 1;
    }
    std::fwrite(out.data(), 1, out.size(), stdout);
    std::fwrite(err.data(), 1, err.size(), stderr);
    return status;
}
