// hrm-cmd of a Debian host. There is no host agent: each command the console
// sends is done directly, or answered as the host's truth (there is no
// lockdown mode, and nothing caches the host's state that would need a
// refresh).
#include <algorithm>
#include <functional>
#include <map>

#include "DebianTools.hpp"
#include "Guests.hpp"
#include "Services.hpp"

namespace VelkDebian {

namespace {

const char* const USAGE = "usage: hrm-cmd -U USER COMMAND [ARGS...]\n";

// The users the console runs commands as: root, and the console's own user,
// to which it falls back when a command is refused for the logged-in user.
const char* const USERS[] = {"root", "velk"};

using Command = std::function<int()>;

Command Print(const char* text) {
    return [text] {
        Say(text);
        return 0;
    };
}

Command Switch(Switchable service, ServiceAction action) {
    return [service, action] { return SwitchService(service, action, "hrm-cmd"); };
}

int NoLockdown() {
    Complain("Lockdown mode does not exist on a Debian host\n");
    return 1;
}

const std::map<std::string, Command>& Commands() {
    static const std::map<std::string, Command> commands = {
        {"hrmsvc/auth/lockdown_is_enabled", Print("false\n")},
        {"hrmsvc/auth/lockdown_is_possible", Print("false\n")},
        {"hrmsvc/auth/lockdown_mode_enter", NoLockdown},
        {"hrmsvc/auth/lockdown_mode_exit", NoLockdown},
        {"internalsvc/refresh", [] { return 0; }},
        {"hostsvc/autostartmanager/autostop", [] { return StopAutostartGuests(); }},
        {"hostsvc/start_tarn_shell", Switch(Switchable::TarnShell, ServiceAction::Start)},
        {"hostsvc/stop_tarn_shell", Switch(Switchable::TarnShell, ServiceAction::Stop)},
        {"hostsvc/enable_tarn_shell", Switch(Switchable::TarnShell, ServiceAction::Enable)},
        {"hostsvc/disable_tarn_shell", Switch(Switchable::TarnShell, ServiceAction::Disable)},
        {"hostsvc/start_ssh", Switch(Switchable::Ssh, ServiceAction::Start)},
        {"hostsvc/stop_ssh", Switch(Switchable::Ssh, ServiceAction::Stop)},
        {"hostsvc/enable_ssh", Switch(Switchable::Ssh, ServiceAction::Enable)},
        {"hostsvc/disable_ssh", Switch(Switchable::Ssh, ServiceAction::Disable)},
    };
    return commands;
}

}  // namespace

int HrmCmd(const Args& args) {
    std::string user;
    bool haveUser = false;
    size_t next = 0;
    while (next < args.size() && !args[next].empty() && args[next][0] == '-') {
        if (args[next] != "-U" || next + 1 >= args.size()) {
            Complain(std::string("hrm-cmd: ") +
                     (args[next] == "-U" ? "-U needs a user name" : "unknown option " + args[next]) + "\n" +
                     USAGE);
            return 1;
        }
        user = args[next + 1];
        haveUser = true;
        next += 2;
    }
    if (!haveUser || next >= args.size()) {
        Complain(std::string("hrm-cmd: ") + (haveUser ? "no command given" : "no user given (-U)") + "\n" +
                 USAGE);
        return 1;
    }
    // 255: the tool cannot act as that user (the console retries as its own).
    if (std::find(std::begin(USERS), std::end(USERS), user) == std::end(USERS)) {
        Complain("hrm-cmd: cannot run commands as user " + user + ": not a user of the host agent\n");
        return 255;
    }
    const auto command = Commands().find(args[next]);
    if (command == Commands().end()) {
        Complain("Unknown command '" + args[next] + "'\n");
        return 1;
    }
    return command->second();
}

}  // namespace VelkDebian
