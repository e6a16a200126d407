// hrm-cmd of the simulated host: the host agent's command tool. Every command
// run by a known user is recorded in the host's history with its result, so
// that tests can see what the console asked for and in which order.
#include <algorithm>
#include <functional>
#include <map>

#include "HostCommands.hpp"
#include "ToolSupport.hpp"

namespace VelkTools {

using HostCtl::Lib::SimState;
using nlohmann::json;

namespace {

const char* const USAGE = "usage: hrm-cmd -U USER COMMAND [ARGS...]\n";

struct Outcome {
    int status = 0;
    std::string out;
    std::string err;
};

using Handler = std::function<Outcome(const SimState&, json&)>;

Handler PrintFlag(const std::string& pointer) {
    return [pointer](const SimState& sim, json& state) {
        return Outcome{0, sim.Bool(state, pointer) ? "true\n" : "false\n", ""};
    };
}

Handler SetLockdown(bool enable) {
    return [enable](const SimState& sim, json& state) {
        if (!sim.Bool(state, "/hostAgent/lockdownPossible"))
            return Outcome{1, "", "Lockdown mode cannot be changed on this host\n"};
        ObjectMember(sim, state, "", "hostAgent")["lockdownEnabled"] = enable;
        return Outcome{};
    };
}

Handler RecordOnly() {
    return [](const SimState&, json&) { return Outcome{}; };
}

// Starting and stopping change whether the service runs now; enabling and
// disabling whether it starts with the host.
Handler SetService(const std::string& service, const std::string& field, bool value) {
    return [service, field, value](const SimState& sim, json& state) {
        json& services = ObjectMember(sim, state, "", "services");
        ObjectMember(sim, services, "/services", service)[field] = value;
        return Outcome{};
    };
}

// The agent opens or closes the firewall for SSH along with the service (a
// host without the ruleset has no firewall to change).
Handler SwitchSsh(bool running) {
    return [running](const SimState& sim, json& state) {
        Outcome outcome = SetService("ssh", "running", running)(sim, state);
        const json::json_pointer ruleset("/firewall/rulesets/sshServer");
        if (state.contains(ruleset))
            ObjectMember(sim, state["firewall"]["rulesets"], "/firewall/rulesets", "sshServer")["enabled"] =
                running;
        return outcome;
    };
}

const std::map<std::string, Handler>& Commands() {
    static const std::map<std::string, Handler> commands = {
        {"hrmsvc/auth/lockdown_is_enabled", PrintFlag("/hostAgent/lockdownEnabled")},
        {"hrmsvc/auth/lockdown_is_possible", PrintFlag("/hostAgent/lockdownPossible")},
        {"hrmsvc/auth/lockdown_mode_enter", SetLockdown(true)},
        {"hrmsvc/auth/lockdown_mode_exit", SetLockdown(false)},
        {"internalsvc/refresh", RecordOnly()},
        {"hostsvc/autostartmanager/autostop", RecordOnly()},
        {"hostsvc/start_tarn_shell", SetService("tarnShell", "running", true)},
        {"hostsvc/stop_tarn_shell", SetService("tarnShell", "running", false)},
        {"hostsvc/enable_tarn_shell", SetService("tarnShell", "enabled", true)},
        {"hostsvc/disable_tarn_shell", SetService("tarnShell", "enabled", false)},
        {"hostsvc/start_ssh", SwitchSsh(true)},
        {"hostsvc/stop_ssh", SwitchSsh(false)},
        {"hostsvc/enable_ssh", SetService("ssh", "enabled", true)},
        {"hostsvc/disable_ssh", SetService("ssh", "enabled", false)},
    };
    return commands;
}

// Commands the host agent is set to fail ("/hostAgent/failCommands", absent
// on a host where everything works).
bool MustFail(const SimState& sim, const json& state, const std::string& command) {
    if (!state.contains("hostAgent") || !state["hostAgent"].is_object() ||
        !state["hostAgent"].contains("failCommands"))
        return false;
    std::vector<std::string> failing = sim.StringList(state, "/hostAgent/failCommands");
    return std::find(failing.begin(), failing.end(), command) != failing.end();
}

}  // namespace

int HrmCmd(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    std::string user;
    bool haveUser = false;
    size_t next = 0;
    while (next < args.size() && !args[next].empty() && args[next][0] == '-') {
        if (args[next] != "-U" || next + 1 >= args.size()) {
            err = std::string("hrm-cmd: ") +
                  (args[next] == "-U" ? "-U needs a user name" : "unknown option " + args[next]) + "\n" +
                  USAGE;
            return 1;
        }
        user = args[next + 1];
        haveUser = true;
        next += 2;
    }
    if (!haveUser || next >= args.size()) {
        err =
            std::string("hrm-cmd: ") + (haveUser ? "no command given" : "no user given (-U)") + "\n" + USAGE;
        return 1;
    }
    std::string command = args[next];
    std::vector<std::string> commandArgs(args.begin() + std::ptrdiff_t(next) + 1, args.end());

    // A user the agent does not know: status 255, the agent's way to say it
    // cannot act as that user. Nothing is recorded.
    std::shared_ptr<const json> current = sim.Read();
    std::vector<std::string> users = sim.StringList(*current, "/hostAgent/users");
    if (std::find(users.begin(), users.end(), user) == users.end()) {
        err = "hrm-cmd: cannot run commands as user " + user + ": not a user of the host agent\n";
        return 255;
    }

    Outcome outcome;
    sim.Update([&](json& state) {
        auto handler = Commands().find(command);
        if (MustFail(sim, state, command))
            outcome = Outcome{1, "", "The host agent failed to run " + command + "\n"};
        else if (handler == Commands().end())
            outcome = Outcome{1, "", "Unknown command '" + command + "'\n"};
        else
            outcome = handler->second(sim, state);
        sim.AppendHistory(state, {{"tool", "hrm-cmd"},
                                  {"user", user},
                                  {"command", command},
                                  {"args", commandArgs},
                                  {"status", outcome.status}});
    });
    out = outcome.out;
    err = outcome.err;
    return outcome.status;
}

}  // namespace VelkTools
