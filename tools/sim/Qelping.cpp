// qelping of the simulated host: the host's ping. It never sends a packet: the
// simulated network tells whether the target answers from the interface
// (HostCtl::Lib::ReachableHost) and how long the answer takes.
//
// Each run is recorded in the host's history when it starts, as
// {"tool": "qelping", "args": [...], "status": null}, and the exit status is
// filled into that entry when the run ends. A run killed while it waits
// leaves "status" null; every write replaces the state file as a whole, so a
// kill never leaves half a state.
#include <chrono>
#include <cstdio>
#include <thread>

#include "HostCommands.hpp"
#include "QelpingArgs.hpp"
#include "hostctl/HostCtl.hpp"
#include "hostctl/SimNetwork.hpp"

namespace VelkTools {

using HostCtl::Lib::SimState;
using nlohmann::json;

namespace {

const char* const USAGE = "usage: qelping TARGET [-I INTERFACE]\n";
// The longest wait a state may ask for, so that a typing error cannot hang
// the console's test for days.
const int64_t MOST_MS = 600000;

// A wait in milliseconds from `object`'s `field` (`what` names it in
// errors), or `fallback` when the field is missing.
int64_t Milliseconds(const SimState& sim, const json& object, const char* field, const std::string& what,
                     int64_t fallback) {
    const auto it = object.find(field);
    if (it == object.end()) return fallback;
    if (!it->is_number_integer() || it->get<int64_t>() < 0 || it->get<int64_t>() > MOST_MS)
        throw sim.Error(what + " must be 0 to " + std::to_string(MOST_MS) + " milliseconds");
    return it->get<int64_t>();
}

bool HasVnic(const SimState& sim, const json& state, const std::string& vnic) {
    const json& vnics = sim.Array(state, "/network/vnics");
    for (size_t i = 0; i < vnics.size(); ++i)
        if (sim.String(state, "/network/vnics/" + std::to_string(i) + "/name") == vnic) return true;
    return false;
}

}  // namespace

int Qelping(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    QelpingRequest request;
    int status = -1;  // -1 until known
    if (const std::string problem = ParseQelpingArgs(args, request); !problem.empty()) {
        err = "qelping: " + problem + "\n" + USAGE;
        status = 2;
    } else if (!HostCtl::Network::Ipv4Address::IsValidAddress(request.target) &&
               !HostCtl::Network::Ipv6Address::IsValidAddress(request.target)) {
        err = "qelping: unknown host " + request.target + "\n";
        status = 2;
    }

    json answer;  // the machine that answers, null when none does
    int64_t waitMs = 0;
    json seq;
    sim.Update([&](json& state) {
        if (status < 0) {
            const std::string vnic = request.interface.empty()
                                         ? sim.String(state, "/network/managementInterface")
                                         : request.interface;
            if (vnic.empty()) {
                err = "qelping: the host has no management interface to send from\n";
                status = 2;
            } else if (!HasVnic(sim, state, vnic)) {
                err = "qelping: unknown interface " + vnic + "\n";
                status = 2;
            } else {
                answer = HostCtl::Lib::ReachableHost(sim, state, vnic, request.target);
                const json network = sim.Object(state, "/network");
                waitMs =
                    answer.is_null()
                        ? Milliseconds(sim, network, "pingTimeoutMs", "field /network/pingTimeoutMs", 1000)
                        : Milliseconds(sim, answer, "delayMs", "the delayMs of machine " + request.target, 0);
            }
        }
        sim.AppendHistory(
            state, {{"tool", "qelping"}, {"args", args}, {"status", status < 0 ? json() : json(status)}});
        seq = state["history"].back()["seq"];
    });
    if (status >= 0) return status;

    std::this_thread::sleep_for(std::chrono::milliseconds(waitMs));
    status = answer.is_null() ? 1 : 0;
    const std::string& target = request.target;
    out = "PING " + target + " (" + target + "): 56 data bytes\n";
    if (!answer.is_null()) {
        char time[32];
        std::snprintf(time, sizeof time, "%.3f", double(waitMs));
        out += "64 bytes from " + target + ": icmp_seq=0 ttl=64 time=" + time + " ms\n";
    }
    out += "\n--- " + target + " ping statistics ---\n1 packets transmitted, " +
           (answer.is_null() ? "0" : "1") + " packets received, " + (answer.is_null() ? "100" : "0") +
           "% packet loss\n";

    sim.Update([&](json& state) {
        json& history = state["history"];
        if (history.is_array())
            for (json& entry : history)
                if (entry.is_object() && entry.value("seq", json()) == seq &&
                    entry.value("tool", "") == "qelping") {
                    entry["status"] = status;
                    return;
                }
        // The entry was edited away meanwhile: the end is recorded on its own.
        sim.AppendHistory(state, {{"tool", "qelping"}, {"args", args}, {"status", status}});
    });
    return status;
}

}  // namespace VelkTools
