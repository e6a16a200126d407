// Helpers shared by the simulated host's commands: the history of what the
// host's tools were asked to do, member access that creates what is missing,
// and shell quoting for the tool scripts installed in a host root.
#pragma once

#include <nlohmann/json.hpp>
#include <string>

#include "hostctl/SimState.hpp"

namespace VelkTools {

// The current time as ISO-8601 UTC with milliseconds, "2024-05-01T12:00:00.123Z".
std::string NowIso8601();

// Appends `entry` to the state's "/history" (created when missing), giving it
// the time and a "seq" one above the highest seq already recorded, so that
// the order of entries can be checked even after the list was edited. Must
// run inside SimState::Update: only there is the state known to be the latest.
void AppendHistory(const HostCtl::Lib::SimState& sim, nlohmann::json& state, nlohmann::json entry);

// The member `key` of the object at `pointer` (`object` itself), created as
// an empty object when missing. Throws the state's error when the member
// exists but is not an object.
nlohmann::json& ObjectMember(const HostCtl::Lib::SimState& sim, nlohmann::json& object,
                             const std::string& pointer, const std::string& key);

// `text` in single quotes for /bin/sh, embedded quotes included.
std::string ShellQuote(const std::string& text);

}  // namespace VelkTools
