#include "ToolFaults.hpp"

#include <algorithm>
#include <chrono>
#include <thread>

namespace VelkTools {

using nlohmann::json;

const std::vector<std::string>& ToolNames() {
    static const std::vector<std::string> names = {
        "hrm-cmd",           "grabCIMData", "powerOffVms",  "reboot",         "poweroff",
        "firmwareConfig.sh", "TarnShell",   "SSH",          "tarncfg-advcfg", "tarncli",
        "localcli",          "services.sh", "qelbacktrace",
    };
    return names;
}

bool IsToolFaultName(const std::string& name) {
    const std::string tool = name.substr(0, name.find(' '));
    return std::ranges::find(ToolNames(), tool) != ToolNames().end();
}

const json* ToolEntry(const HostCtl::Lib::SimState& sim, const json& state, const std::string& table,
                      const std::string& tool, const std::vector<std::string>& args) {
    const auto found = state.find(table);
    if (found == state.end() || found->is_null()) return nullptr;
    if (!found->is_object()) throw sim.Error("field /" + table + " must be an object");
    for (const std::string& arg : args) {
        const auto entry = found->find(tool + " " + arg);
        if (entry != found->end()) return &*entry;
    }
    const auto entry = found->find(tool);
    return entry == found->end() ? nullptr : &*entry;
}

bool InjectToolFault(HostCtl::Lib::SimState& sim, const std::string& tool,
                     const std::vector<std::string>& args, std::string& err) {
    std::shared_ptr<const json> state = sim.Read();
    if (const json* delay = ToolEntry(sim, *state, "toolDelays", tool, args)) {
        if (!delay->is_number() || delay->get<double>() < 0)
            throw sim.Error("the delays of /toolDelays must be numbers of seconds");
        std::this_thread::sleep_for(std::chrono::duration<double>(delay->get<double>()));
        state = sim.Read();
    }
    const json* fault = ToolEntry(sim, *state, "toolFaults", tool, args);
    if (!fault) return false;
    if (!fault->is_string()) throw sim.Error("the faults of /toolFaults must be texts");
    const std::string text = fault->get<std::string>();
    sim.Update([&](json& latest) {
        sim.AppendHistory(latest, {{"tool", tool}, {"args", args}, {"status", 1}, {"fault", text}});
    });
    err = text + "\n";
    return true;
}

}  // namespace VelkTools
