// The simulated host's service tools: the init scripts of the local shell and
// SSH, the advanced-option tools, the management agents' start script and the
// live-core tool. Each records what it was asked, with its exit status, in the
// host's history; none touches the machine it runs on.
#include <map>

#include "HostCommands.hpp"
#include "ToolSupport.hpp"

namespace VelkTools {

using HostCtl::Lib::SimState;
using nlohmann::json;

namespace {

void Record(SimState& sim, const std::string& tool, const std::vector<std::string>& args, int status) {
    sim.Update([&](json& state) {
        sim.AppendHistory(state, {{"tool", tool}, {"args", args}, {"status", status}});
    });
}

// An init script: status answers 0 while the service runs and 3 while it
// does not; start, stop and restart change whether it runs.
int InitScript(SimState& sim, const std::string& script, const std::string& service,
               const std::vector<std::string>& args, std::string& out, std::string& err) {
    static const std::map<std::string, int> actions = {
        {"status", 0}, {"start", 1}, {"stop", 2}, {"restart", 3}};
    const auto action = args.size() == 1 ? actions.find(args[0]) : actions.end();
    if (action == actions.end()) {
        err = "Usage: /etc/init.d/" + script + " {start|stop|restart|status}\n";
        return 1;
    }
    int status = 0;
    sim.Update([&](json& state) {
        json& entry = ObjectMember(sim, ObjectMember(sim, state, "", "services"), "/services", service);
        const bool running = entry.value("running", false) == true;
        switch (action->second) {
            case 0:
                out = script + (running ? " is running\n" : " is not running\n");
                status = running ? 0 : 3;
                break;
            case 1:
                out = "Starting " + script + "\n";
                entry["running"] = true;
                break;
            case 2:
                out = "Stopping " + script + "\n";
                entry["running"] = false;
                break;
            default:
                out = (running ? "Restarting " : "Starting ") + script + "\n";
                entry["running"] = true;
                break;
        }
        sim.AppendHistory(state, {{"tool", script}, {"args", args}, {"status", status}});
    });
    return status;
}

// The value of `option` from the arguments after `flag` ("-o OPTION"), or ""
// when the flag is missing.
std::string FlagValue(const std::vector<std::string>& args, size_t from, const std::string& flag) {
    for (size_t i = from; i + 1 < args.size(); ++i)
        if (args[i] == flag) return args[i + 1];
    return "";
}

// "system settings advanced set -o OPTION -i VALUE": sets an integer
// advanced option. `needsAgent`: the tool talks to the host agent and fails
// while the agents are stopped.
int AdvancedSet(SimState& sim, const std::string& tool, bool needsAgent, const std::vector<std::string>& args,
                std::string& out, std::string& err) {
    out.clear();
    const std::vector<std::string> prefix = {"system", "settings", "advanced", "set"};
    const bool shaped = args.size() == 8 && std::equal(prefix.begin(), prefix.end(), args.begin());
    const std::string option = shaped ? FlagValue(args, 4, "-o") : "";
    const std::string text = shaped ? FlagValue(args, 4, "-i") : "";
    if (option.empty() || text.empty()) {
        err = "Error: Unknown command or namespace. Usage: " + tool +
              " system settings advanced set -o OPTION -i VALUE\n";
        return 1;
    }
    int64_t value = 0;
    try {
        size_t used = 0;
        value = std::stoll(text, &used);
        if (used != text.size()) throw std::invalid_argument(text);
    } catch (const std::logic_error&) {
        err = "Error: Invalid integer value " + text + "\n";
        return 1;
    }
    int status = 0;
    sim.Update([&](json& state) {
        const bool agentUp =
            !state.contains("hostAgent") || state["hostAgent"].value("running", true) == true;
        json& options = ObjectMember(sim, state, "", "advancedOptions");
        if (needsAgent && !agentUp) {
            err = "Error: Connection to the host agent failed\n";
            status = 1;
        } else if (!options.contains(option)) {
            err = "Error: Unable to find option " + option + "\n";
            status = 1;
        } else if (!options[option].is_number_integer()) {
            err = "Error: Option " + option + " does not hold an integer\n";
            status = 1;
        } else {
            options[option] = value;
        }
        sim.AppendHistory(state, {{"tool", tool}, {"args", args}, {"status", status}});
    });
    return status;
}

}  // namespace

int TarnShellScript(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    return InitScript(sim, "TarnShell", "tarnShell", args, out, err);
}

int SshScript(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    return InitScript(sim, "SSH", "ssh", args, out, err);
}

int TarncfgAdvcfg(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    bool quiet = false;
    std::string option;
    for (size_t i = 0; i < args.size(); ++i) {
        if (args[i] == "-q") {
            quiet = true;
        } else if (args[i] == "-g" && i + 1 < args.size() && option.empty()) {
            option = args[++i];
        } else {
            option.clear();
            break;
        }
    }
    if (option.empty()) {
        err = "Usage: tarncfg-advcfg [-q] -g OPTION\n";
        return 1;
    }
    std::shared_ptr<const json> state = sim.Read();
    const json& options = sim.Object(*state, "/advancedOptions");
    int status = 0;
    if (!options.contains(option)) {
        err = "tarncfg-advcfg: no such option " + option + "\n";
        status = 1;
    } else {
        const json& value = options[option];
        const std::string text = value.is_string() ? value.get<std::string>() : value.dump();
        out = quiet ? text + "\n" : "Value of " + option.substr(option.rfind('/') + 1) + " is " + text + "\n";
    }
    Record(sim, "tarncfg-advcfg", args, status);
    return status;
}

int Tarncli(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    return AdvancedSet(sim, "tarncli", true, args, out, err);
}

int Localcli(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    return AdvancedSet(sim, "localcli", false, args, out, err);
}

int ServicesScript(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    if (args.size() != 1 || (args[0] != "start" && args[0] != "stop" && args[0] != "restart")) {
        err = "Usage: services.sh {start|stop|restart}\n";
        return 1;
    }
    const bool stop = args[0] == "stop";
    sim.Update([&](json& state) {
        ObjectMember(sim, state, "", "hostAgent")["running"] = !stop;
        sim.AppendHistory(state, {{"tool", "services.sh"}, {"args", args}, {"status", 0}});
    });
    out = stop ? "Stopping the management agents\n" : "Starting the management agents\n";
    return 0;
}

int Qelbacktrace(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    std::string process, pattern, folder;
    bool usage = false;
    for (size_t i = 0; i < args.size() && !usage; ++i) {
        if (args[i] == "-w") continue;
        std::string* value = args[i] == "-n"   ? &process
                             : args[i] == "-o" ? &pattern
                             : args[i] == "-d" ? &folder
                                               : nullptr;
        if (value == nullptr || i + 1 >= args.size())
            usage = true;
        else
            *value = args[++i];
    }
    if (usage || process.empty() || pattern.empty() || folder.empty()) {
        err = "Usage: qelbacktrace [-w] -n PROCESS -o PATTERN -d FOLDER\n";
        return 1;
    }
    // The host agent is the one process whose live core the host can take.
    const int status = process == "corad" ? 0 : 1;
    if (status != 0)
        err = "qelbacktrace: no process named " + process + "\n";
    else
        out = "Live core of " + process + " written to " + folder + "\n";
    Record(sim, "qelbacktrace", args, status);
    return status;
}

}  // namespace VelkTools
