// The simulated host's state file and the JSON-pointer edits of velk-simhost.
//
// Input: the text of host.json, then after the first NUL byte one edit per
// line: "g<pointer>" reads, "s<pointer><TAB><value>" sets, "r<pointer>"
// removes, "h" appends a history entry. Rules: reading throws nothing but
// HostCtlException; the edits throw nothing but that and PointerError; an
// edit that fails leaves the file byte for byte as it was; one that succeeds
// can be read back; history stays bounded and in order.
#include <fcntl.h>
#include <stdlib.h>
#include <unistd.h>

#include <cstdint>
#include <fstream>
#include <sstream>
#include <string>

#include "FuzzSupport.hpp"
#include "StateEdit.hpp"
#include "hostctl/SimState.hpp"

namespace {

using fuzz_support::FileText;
using fuzz_support::Require;
using HostCtl::Lib::HostCtlException;
using HostCtl::Lib::SimState;
using nlohmann::json;

// A folder in memory: the state's writes flush to disk, which tmpfs skips.
const std::string& Root() {
    static const std::string root = [] {
        char path[] = "/dev/shm/velk-fuzz-state-XXXXXX";
        if (!mkdtemp(path)) fuzz_support::Fail("a folder for the state can be made", path);
        return std::string(path);
    }();
    return root;
}

void WriteFile(const std::string& path, const std::string& text) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out << text;
    Require(static_cast<bool>(out), "the state file can be written", path);
}

// Runs one write through SimState::Update; a failure must leave the file as
// it was. True when the write happened.
template <typename Change>
bool Write(SimState& sim, const std::string& line, Change change) {
    const std::string before = FileText(sim.StatePath());
    try {
        sim.Update(change);
        return true;
    } catch (const HostCtlException&) {
    } catch (const VelkTools::PointerError&) {
    }
    Require(FileText(sim.StatePath()) == before, "a failed write leaves the file as it was", line);
    return false;
}

void Edit(SimState& sim, const std::string& line) {
    if (line.empty()) return;
    const char command = line[0];
    std::string pointer = line.substr(1);
    std::string valueText;
    if (command == 's') {
        const size_t tab = pointer.find('\t');
        if (tab == std::string::npos) return;
        valueText = pointer.substr(tab + 1);
        pointer.resize(tab);
    }
    std::shared_ptr<const json> state;
    try {
        state = sim.Read();
    } catch (const HostCtlException&) {
        return;
    }
    if (command == 'g') {
        try {
            const json& value = VelkTools::GetAt(*state, pointer);
            (void)value.dump(-1, ' ', false, json::error_handler_t::replace);
        } catch (const VelkTools::PointerError&) {
        }
    } else if (command == 's') {
        json value;
        try {
            value = VelkTools::ParseValue(valueText);
        } catch (const HostCtlException&) {
            return;
        }
        const bool written =
            Write(sim, line, [&](json& latest) { VelkTools::SetAt(latest, pointer, value); });
        const bool appended = pointer.size() >= 2 && pointer.compare(pointer.size() - 2, 2, "/-") == 0;
        // Names that are not UTF-8 are written with U+FFFD in their place.
        bool utf8 = true;
        try {
            (void)json(pointer).dump();
        } catch (const json::type_error&) {
            utf8 = false;
        }
        if (written && !appended && utf8) {
            SimState again(sim.Root());
            Require(VelkTools::GetAt(*again.Read(), pointer) ==
                        json::parse(value.dump(-1, ' ', false, json::error_handler_t::replace)),
                    "a value set is read back", line);
        }
    } else if (command == 'r') {
        Write(sim, line, [&](json& latest) { VelkTools::RemoveAt(latest, pointer); });
    } else if (command == 'h') {
        if (Write(sim, line, [&](json& latest) { sim.AppendHistory(latest, {{"tool", "fuzz"}}); })) {
            SimState again(sim.Root());
            const json& history = again.Array(*again.Read(), "/history");
            Require(history.size() <= SimState::kHistoryLimit, "history stays bounded", line);
            const json& last = history.back();
            for (const json& entry : history) {
                if (&entry == &last || !entry.is_object() || !entry.contains("seq")) continue;
                const json& seq = entry["seq"];
                if (seq.is_number_unsigned())
                    Require(seq.get<uint64_t>() < last["seq"].get<uint64_t>(),
                            "the newest entry has the highest seq", line);
            }
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const std::string input(reinterpret_cast<const char*>(data), size);
    const size_t nul = input.find('\0');
    SimState sim(Root());
    WriteFile(sim.StatePath(), input.substr(0, nul));
    try {
        const std::shared_ptr<const json> state = sim.Read();
        Require(state->is_object(), "a state read is an object", input);
    } catch (const HostCtlException&) {
        return 0;
    }
    if (nul == std::string::npos) return 0;
    std::istringstream edits(input.substr(nul + 1));
    int count = 0;
    for (std::string line; std::getline(edits, line) && count < 8; ++count) Edit(sim, line);
    return 0;
}
