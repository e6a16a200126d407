// powerOffVms of the simulated host: stops every running virtual machine
// ("--terminate" asks for the forceful way) and records the request.
#include "HostCommands.hpp"
#include "ToolSupport.hpp"

namespace VelkTools {

using HostCtl::Lib::SimState;
using nlohmann::json;

int PowerOffVms(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    for (const std::string& arg : args) {
        if (arg != "--terminate") {
            err = "powerOffVms: unknown argument " + arg + "\nusage: powerOffVms [--terminate]\n";
            return 1;
        }
    }
    sim.Read();  // a missing or malformed state fails here, before anything is written
    sim.Update([&](json& state) {
        ObjectMember(sim, state, "", "vms")["running"] = 0;
        sim.AppendHistory(state, {{"tool", "powerOffVms"}, {"args", args}});
    });
    out.clear();
    return 0;
}

}  // namespace VelkTools
