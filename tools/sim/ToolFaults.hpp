// Faults and delays of the simulated host's tools, kept in the host's state:
//   "toolFaults": {NAME: stderr text}  the call fails: the text goes to its
//                                      standard error, the status is 1 and
//                                      nothing changes
//   "toolDelays": {NAME: seconds}      the call waits that long before it acts
// NAME is a tool ("qelbacktrace") for every call of it, or a tool and one word
// ("hrm-cmd hrmsvc/auth/lockdown_mode_enter", "services.sh stop") for the
// calls that have that word among their arguments; the longer name wins.
#pragma once

#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "hostctl/SimState.hpp"

namespace VelkTools {

// The tools that faults and delays apply to, by the name the host calls them.
const std::vector<std::string>& ToolNames();

// Whether the first word of `name` is one of ToolNames().
bool IsToolFaultName(const std::string& name);

// The entry of `table` ("toolFaults" or "toolDelays") that applies to a call
// of `tool` with `args`, or null. A table or entry of the wrong type throws
// the state's error.
const nlohmann::json* ToolEntry(const HostCtl::Lib::SimState& sim, const nlohmann::json& state,
                                const std::string& table, const std::string& tool,
                                const std::vector<std::string>& args);

// Before a tool runs: waits for its delay, then, when a fault applies,
// records the failed call in the history, puts the fault's text into `err`
// and answers true (the tool is not run).
bool InjectToolFault(HostCtl::Lib::SimState& sim, const std::string& tool,
                     const std::vector<std::string>& args, std::string& err);

}  // namespace VelkTools
