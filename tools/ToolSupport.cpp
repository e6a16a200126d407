#include "ToolSupport.hpp"

#include <chrono>
#include <cstdio>
#include <ctime>

namespace VelkTools {

using nlohmann::json;

std::string NowIso8601() {
    auto now = std::chrono::system_clock::now();
    auto millis =
        std::chrono::duration_cast<std::chrono::milliseconds>(now.time_since_epoch()).count() % 1000;
    std::time_t seconds = std::chrono::system_clock::to_time_t(now);
    std::tm utc{};
    gmtime_r(&seconds, &utc);
    char date[32];
    std::strftime(date, sizeof date, "%Y-%m-%dT%H:%M:%S", &utc);
    char fraction[8];
    std::snprintf(fraction, sizeof fraction, ".%03d", int(millis));
    return std::string(date) + fraction + "Z";
}

void AppendHistory(const HostCtl::Lib::SimState& sim, json& state, json entry) {
    if (!state.contains("history")) state["history"] = json::array();
    json& history = state["history"];
    if (!history.is_array()) throw sim.Error("field /history must be an array");
    uint64_t last = 0;
    for (const json& old : history) {
        if (!old.is_object() || !old.contains("seq")) continue;
        const json& seq = old["seq"];
        if (seq.is_number_unsigned() && seq.get<uint64_t>() > last) last = seq.get<uint64_t>();
    }
    entry["seq"] = last + 1;
    entry["time"] = NowIso8601();
    history.push_back(std::move(entry));
}

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
