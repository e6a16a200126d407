// The Debian host's service tools: the init scripts of the local shell and
// SSH, the management agents' script, the advanced-option tools, and the two
// tools whose work does not exist on a Debian host.
#include <syslog.h>

#include <algorithm>
#include <map>

#include "DebianTools.hpp"
#include "HostConfig.hpp"
#include "Services.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/HostCtl.hpp"

namespace VelkDebian {

using HostCtl::Lib::Syslog;
using HostCtl::Lib::Linux::HostConfig;
using HostCtl::Lib::Linux::OptionFile;

namespace {

// Read once per run: a tool that asks twice logs the file's problems once.
const HostConfig& Config() {
    static const HostConfig config = HostConfig::Load();
    return config;
}

std::string ShellTty() { return Config().shellTty; }

std::string GettyUnit(const std::string& tty) { return "getty@" + tty + ".service"; }

// The console's own unit on the terminal, when systemd runs it there: a getty
// started on that terminal would stop the console (the units conflict).
bool ConsoleRunsOn(const std::string& tty) {
    return Run({"/bin/systemctl", "is-active", "--quiet", "velk@" + tty.substr(3) + ".service"}, false, 30)
               .status == 0;
}

int Refuse(const std::string& tool, const std::string& why) {
    Syslog(LOG_WARNING, "%s refused: %s", tool.c_str(), why.c_str());
    Complain(tool + ": " + why + "\n");
    return 1;
}

// An init script: status answers 0 while the service runs and 3 while it
// does not; start, stop and restart go to the init system.
int InitScript(const std::string& script, Switchable service, const Args& args) {
    static const std::map<std::string, int> actions = {
        {"status", 0}, {"start", 1}, {"stop", 2}, {"restart", 3}};
    const auto action = args.size() == 1 ? actions.find(args[0]) : actions.end();
    if (action == actions.end()) {
        Complain("Usage: /etc/init.d/" + script + " {start|stop|restart|status}\n");
        return 1;
    }
    switch (action->second) {
        case 0: {
            const bool running = SwitchableRuns(service);
            Say(script + (running ? " is running\n" : " is not running\n"));
            return running ? 0 : 3;
        }
        case 1:
            Say("Starting " + script + "\n");
            return SwitchService(service, ServiceAction::Start, script);
        case 2:
            Say("Stopping " + script + "\n");
            return SwitchService(service, ServiceAction::Stop, script);
        default:
            Say((SwitchableRuns(service) ? "Restarting " : "Starting ") + script + "\n");
            return SwitchService(service, ServiceAction::Restart, script);
    }
}

// The value after `flag` in the arguments from `from` on, or "".
std::string FlagValue(const Args& args, size_t from, const std::string& flag) {
    for (size_t i = from; i + 1 < args.size(); ++i)
        if (args[i] == flag) return args[i + 1];
    return "";
}

// "system settings advanced set -o OPTION -i VALUE": an integer option of
// the option file. On a Debian host no agent stands between the tool and the
// file, so tarncli and localcli do the same.
int AdvancedSet(const std::string& tool, const Args& args) {
    const Args prefix = {"system", "settings", "advanced", "set"};
    const bool shaped = args.size() == 8 && std::equal(prefix.begin(), prefix.end(), args.begin());
    const std::string option = shaped ? FlagValue(args, 4, "-o") : "";
    const std::string text = shaped ? FlagValue(args, 4, "-i") : "";
    if (option.empty() || text.empty()) {
        Complain("Error: Unknown command or namespace. Usage: " + tool +
                 " system settings advanced set -o OPTION -i VALUE\n");
        return 1;
    }
    int64_t value = 0;
    try {
        size_t used = 0;
        value = std::stoll(text, &used);
        if (used != text.size()) throw std::invalid_argument(text);
    } catch (const std::logic_error&) {
        Complain("Error: Invalid integer value " + text + "\n");
        return 1;
    }
    const auto current = OptionFile::Get(option);
    if (!current) {
        Complain("Error: Unable to find option " + option + "\n");
        return 1;
    }
    if (!current->isInteger) {
        Complain("Error: Option " + option + " does not hold an integer\n");
        return 1;
    }
    OptionFile::Set(option, OptionFile::Value{true, value, ""});
    Syslog(LOG_INFO, "%s set to %lld", option.c_str(), static_cast<long long>(value));
    return 0;
}

}  // namespace

int SwitchService(Switchable service, ServiceAction action, const std::string& tool) {
    std::string unit = "ssh";
    if (service == Switchable::TarnShell) {
        const std::string tty = ShellTty();
        if (!SystemdRuns())
            return Refuse(
                tool, "the getty of " + tty + " is started from /etc/inittab on this host; change it there");
        if ((action == ServiceAction::Start || action == ServiceAction::Restart ||
             action == ServiceAction::Enable) &&
            ConsoleRunsOn(tty))
            return Refuse(tool, "the console itself runs on " + tty +
                                    "; name another terminal as shell-tty in /etc/velk/velk.conf");
        unit = GettyUnit(tty);
    }
    const int status = ControlService(unit, action);
    if (status == 0) return 0;
    Complain(tool + ": cannot " + ActionName(action) + " " + unit + "\n");
    return 1;
}

bool SwitchableRuns(Switchable service) {
    if (service == Switchable::Ssh) return ServiceRuns("ssh");
    const std::string tty = ShellTty();
    return SystemdRuns() ? ServiceRuns(GettyUnit(tty)) : GettyRunsOn(tty);
}

int TarnShellScript(const Args& args) { return InitScript("TarnShell", Switchable::TarnShell, args); }

int SshScript(const Args& args) { return InitScript("SSH", Switchable::Ssh, args); }

int ServicesScript(const Args& args) {
    if (args.size() != 1 || (args[0] != "start" && args[0] != "stop" && args[0] != "restart")) {
        Complain("Usage: services.sh {start|stop|restart}\n");
        return 1;
    }
    std::vector<std::string> services = Config().agentServices;
    ServiceAction action = ServiceAction::Start;
    if (args[0] == "stop") {
        action = ServiceAction::Stop;
        std::reverse(services.begin(), services.end());  // the last started stops first
    } else if (args[0] == "restart") {
        action = ServiceAction::Restart;
    }
    Say(action == ServiceAction::Stop ? "Stopping the management agents\n"
                                      : "Starting the management agents\n");
    int status = 0;
    for (const std::string& service : services) {
        if (ControlService(service, action) != 0) {
            Complain(std::string("services.sh: cannot ") + ActionName(action) + " " + service + "\n");
            status = 1;
        }
    }
    return status;
}

int TarncfgAdvcfg(const Args& args) {
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
        Complain("Usage: tarncfg-advcfg [-q] -g OPTION\n");
        return 1;
    }
    const auto value = OptionFile::Get(option);
    if (!value) {
        Complain("tarncfg-advcfg: no such option " + option + "\n");
        return 1;
    }
    const std::string text = value->isInteger ? std::to_string(value->integer) : value->text;
    Say(quiet ? text + "\n" : "Value of " + option.substr(option.rfind('/') + 1) + " is " + text + "\n");
    return 0;
}

int Tarncli(const Args& args) { return AdvancedSet("tarncli", args); }

int Localcli(const Args& args) { return AdvancedSet("localcli", args); }

int FirmwareConfig(const Args&) {
    return Refuse("firmwareConfig.sh",
                  "resetting the system configuration does not exist on a Debian host; only the "
                  "management network can be restored");
}

int Qelbacktrace(const Args&) {
    return Refuse("qelbacktrace", "live cores of the management agent do not exist on a Debian host");
}

}  // namespace VelkDebian
