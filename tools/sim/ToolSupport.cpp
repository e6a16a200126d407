#include "ToolSupport.hpp"

namespace VelkTools {

using nlohmann::json;

json& ObjectMember(const HostCtl::Lib::SimState& sim, json& object, const std::string& pointer,
                   const std::string& key) {
    std::string memberPointer = pointer + "/" + key;
    if (!object.contains(key)) object[key] = json::object();
    json& member = object[key];
    if (!member.is_object()) throw sim.Error("field " + memberPointer + " must be an object");
    return member;
}

std::string ShellQuote(const std::string& text) {
    std::string quoted = "'";
    for (char c : text) {
        if (c == '\'')
            quoted += "'\\''";
        else
            quoted += c;
    }
    return quoted + "'";
}

}  // namespace VelkTools
