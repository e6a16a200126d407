// reboot, poweroff and firmwareConfig.sh of the simulated host. They never
// touch the machine they run on: each records the request in the host's
// history and moves the host's power state, so that a test or a demo can see
// what the console asked for.
#include "HostCommands.hpp"
#include "ToolSupport.hpp"

namespace VelkTools {

using HostCtl::Lib::SimState;
using nlohmann::json;

namespace {

// Records `tool` with its arguments and applies `change` to the state, in one
// locked update.
template <typename Change>
void Record(SimState& sim, const std::string& tool, const std::vector<std::string>& args, Change change) {
    sim.Read();  // a missing or malformed state fails here, before anything is written
    sim.Update([&](json& state) {
        change(ObjectMember(sim, state, "", "power"));
        sim.AppendHistory(state, {{"tool", tool}, {"args", args}});
    });
}

// reboot and poweroff take only the force flag.
int PowerTool(SimState& sim, const std::string& tool, const std::string& newState,
              const std::vector<std::string>& args, std::string& err) {
    for (const std::string& arg : args) {
        if (arg != "-f" && arg != "--force") {
            err = tool + ": unknown argument " + arg + "\nusage: " + tool + " [-f]\n";
            return 1;
        }
    }
    Record(sim, tool, args, [&](json& power) { power["state"] = newState; });
    return 0;
}

}  // namespace

int Reboot(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    out.clear();
    return PowerTool(sim, "reboot", "rebooting", args, err);
}

int Poweroff(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    out.clear();
    return PowerTool(sim, "poweroff", "off", args, err);
}

int FirmwareConfig(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    out.clear();
    if (args != std::vector<std::string>{"--reset-only"}) {
        err = "firmwareConfig.sh: usage: firmwareConfig.sh --reset-only\n";
        return 1;
    }
    Record(sim, "firmwareConfig.sh", args, [](json& power) { power["resetDone"] = true; });
    out = "Resetting the host configuration to its defaults\n";
    return 0;
}

}  // namespace VelkTools
