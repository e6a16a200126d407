// Helpers shared by the simulated host's commands: member access that
// creates what is missing, and shell quoting for the tool scripts installed
// in a host root. (The history of what the host was asked to do is kept by
// SimState::AppendHistory.)
#pragma once

#include <nlohmann/json.hpp>
#include <string>

#include "hostctl/SimState.hpp"

namespace VelkTools {

// The member `key` of the object at `pointer` (`object` itself), created as
// an empty object when missing. Throws the state's error when the member
// exists but is not an object.
nlohmann::json& ObjectMember(const HostCtl::Lib::SimState& sim, nlohmann::json& object,
                             const std::string& pointer, const std::string& key);

// `text` in single quotes for /bin/sh, embedded quotes included.
std::string ShellQuote(const std::string& text);

}  // namespace VelkTools
