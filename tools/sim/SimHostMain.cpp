// velk-simhost: creates a simulated host and reads or changes its state.
//   velk-simhost create ROOT [--hostname NAME] [--password P] [--network SHAPE[,SHAPE...]] [--force]
//   velk-simhost boot ROOT
//   velk-simhost fail ROOT 'OPERATION [WORD]' [MESSAGE | --clear]
//   velk-simhost fail ROOT 'TOOL [WORD]' [STDERR | --clear]
//   velk-simhost slow ROOT 'OPERATION [WORD]' SECONDS
//   velk-simhost slow ROOT 'TOOL [WORD]' SECONDS
//   velk-simhost login ROOT
//   velk-simhost get ROOT POINTER
//   velk-simhost set ROOT POINTER VALUE
//   velk-simhost remove ROOT POINTER
//   velk-simhost card ROOT insert USER PIN [--slot N]
//   velk-simhost card ROOT pull [--slot N]
// POINTER is a JSON pointer into ROOT/host.json; VALUE is JSON, or else taken
// as a string.
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <string>
#include <vector>

#include "HostRootCreator.hpp"
#include "NetworkShapes.hpp"
#include "StateEdit.hpp"
#include "ToolFaults.hpp"
#include "ToolSupport.hpp"
#include "hostctl/SimNetwork.hpp"
#include "hostctl/SimState.hpp"

namespace {

namespace fs = std::filesystem;
using nlohmann::json;

const char* const USAGE =
    "usage: velk-simhost create ROOT [--hostname NAME] [--password P] [--network SHAPE[,SHAPE...]] "
    "[--force]\n"
    "       velk-simhost boot ROOT\n"
    "       velk-simhost fail ROOT 'OPERATION [WORD]' [MESSAGE | --clear]\n"
    "       velk-simhost fail ROOT 'TOOL [WORD]' [STDERR | --clear]\n"
    "       velk-simhost slow ROOT 'OPERATION [WORD]' SECONDS\n"
    "       velk-simhost slow ROOT 'TOOL [WORD]' SECONDS\n"
    "       velk-simhost login ROOT\n"
    "       velk-simhost get ROOT POINTER\n"
    "       velk-simhost set ROOT POINTER VALUE\n"
    "       velk-simhost remove ROOT POINTER\n"
    "       velk-simhost card ROOT insert USER PIN [--slot N]\n"
    "       velk-simhost card ROOT pull [--slot N]\n"
    "\n"
    "create --network changes the default network (4 NICs, management interface qk0 on VLAN 0 by\n"
    "DHCP, IPv6 with router advertisement); shapes combine:\n"
    "  single-nic  only zonic0\n"
    "  dvs         qk0 on port 100 of distributed switch kDS-1 (uplinks zonic0, zonic1), VLAN 0\n"
    "  ipv4-off    qk0 without IPv4\n"
    "  ipv6-off    IPv6 off now and at the next boot\n"
    "  no-dhcp     no DHCP server on VLAN 0: qk0 gets no address\n"
    "  static      qk0 static 192.0.2.10/24, gateway 192.0.2.1, DNS 192.0.2.53\n"
    "boot: boots the host: saved DNS and routing, IPv6 as set for the boot, every enabled\n"
    "  interface configured anew from the simulated network; power state \"on\".\n"
    "fail: makes the host control operation OPERATION (a backend method name such as\n"
    "  SetVnicIpConfig or GetPnics) fail with MESSAGE (default \"simulated failure of\n"
    "  OPERATION\") until cleared with --clear; with WORD, only the calls that have WORD\n"
    "  among their arguments ('AddNameServer 198.51.100.53'). With a host tool instead\n"
    "  (hrm-cmd, TarnShell, SSH, tarncfg-advcfg, tarncli, localcli, services.sh, qelbacktrace, powerOffVms, "
    "reboot,\n"
    "  poweroff, firmwareConfig.sh, grabCIMData), every call of the tool, or with WORD every\n"
    "  call that has WORD among its arguments ('hrm-cmd hostsvc/start_ssh', 'services.sh stop'),\n"
    "  prints STDERR on its standard error and exits with status 1 without changing anything.\n"
    "slow: makes those calls of a host control operation or a host tool wait SECONDS before\n"
    "  they act (0 clears).\n";

int Usage(const std::string& problem) {
    if (!problem.empty()) std::fprintf(stderr, "velk-simhost: %s\n", problem.c_str());
    std::fputs(USAGE, stderr);
    return 1;
}

std::string OneLine(std::string text) {
    for (char& c : text)
        if (c == '\n' || c == '\r') c = ' ';
    return text;
}

int Error(const std::string& text) {
    std::fprintf(stderr, "velk-simhost: %s\n", OneLine(text).c_str());
    return 1;
}

// The directory of this program, to find what it needs where it is
// installed: velk-hostcmd in PREFIX/lib/velk-simhost, the support pages in
// PREFIX/share/velk-simhost (this program being PREFIX/bin/velk-simhost).
fs::path OwnDirectory() {
    std::error_code ec;
    fs::path self = fs::read_symlink("/proc/self/exe", ec);
    return ec ? fs::path() : self.parent_path();
}

// velk-hostcmd sits next to this program in the build tree, and in
// PREFIX/lib/velk-simhost where both are installed; the path it was built at
// is the fallback.
std::string HostCommandBinary() {
    const fs::path own = OwnDirectory();
    if (!own.empty()) {
        for (const fs::path& candidate :
             {own / "velk-hostcmd", own.parent_path() / VELK_SIMHOST_LIBDIR / "velk-hostcmd"}) {
            if (access(candidate.c_str(), X_OK) == 0) return candidate.string();
        }
    }
    return VELK_HOSTCMD_BIN;
}

// The support information pages: installed beside the program, else those of
// the source tree it was built from.
std::string SupportInfo() {
    const fs::path own = OwnDirectory();
    if (!own.empty()) {
        const fs::path installed = own.parent_path() / VELK_SIMHOST_DATADIR / "support-info";
        if (access(installed.c_str(), R_OK) == 0) return installed.string();
    }
    return VELK_SUPPORT_INFO;
}

int Create(const std::vector<std::string>& args) {
    VelkTools::HostRootOptions options;
    options.hostCommandBinary = HostCommandBinary();
    options.supportInfo = SupportInfo();
    bool haveRoot = false;
    for (size_t i = 0; i < args.size(); ++i) {
        if (args[i] == "--force") {
            options.force = true;
        } else if (args[i] == "--hostname") {
            if (i + 1 >= args.size()) return Usage("--hostname needs a name");
            options.hostname = args[++i];
        } else if (args[i] == "--network") {
            if (i + 1 >= args.size()) return Usage("--network needs one or more shapes");
            try {
                VelkTools::ParseNetworkShapes(args[++i], options.networkShapes);
            } catch (const std::runtime_error& e) {
                return Usage(e.what());
            }
        } else if (args[i] == "--password") {
            if (i + 1 >= args.size()) return Usage("--password needs a password");
            options.password = args[++i];
            if (!VelkTools::IsValidPassword(options.password))
                return Usage("bad password: it may not be empty or hold ':' or line breaks");
        } else if (!args[i].empty() && args[i][0] == '-') {
            return Usage("unknown option " + args[i]);
        } else if (!haveRoot) {
            options.root = args[i];
            haveRoot = true;
        } else {
            return Usage("unexpected argument " + args[i]);
        }
    }
    if (!haveRoot || options.root.empty()) return Usage("no host root given");
    std::string root = VelkTools::CreateHostRoot(options);
    std::printf("Created the simulated host %s in %s\n", options.hostname.c_str(), root.c_str());
    return 0;
}

// Boots the host: its network comes up from the saved configuration and the
// simulated physical network, and the host is on.
int Boot(const std::vector<std::string>& args) {
    if (args.size() != 1) return Usage("boot takes ROOT");
    HostCtl::Lib::BootSimulatedHost(args[0]);
    return 0;
}

// What `name` ('OPERATION [WORD]') names: a host control operation or a
// host tool; the problem goes to standard error when it names neither.
enum class Target { Operation, Tool, Unknown };

Target TargetOf(const std::string& name) {
    const std::vector<std::string>& operations = HostCtl::Lib::SimulatedOperations();
    const std::string named = name.substr(0, name.find(' '));
    if (std::find(operations.begin(), operations.end(), named) != operations.end()) return Target::Operation;
    if (VelkTools::IsToolFaultName(name)) return Target::Tool;
    std::string list, tools;
    for (const std::string& operation : operations) list += (list.empty() ? "" : " ") + operation;
    for (const std::string& tool : VelkTools::ToolNames()) tools += (tools.empty() ? "" : " ") + tool;
    Error("unknown operation \"" + name + "\"; the operations are: " + list + "; the tools are: " + tools);
    return Target::Unknown;
}

// Sets or clears a fault: the named host control operation, or the calls of
// a host tool, fail with the message until the fault is cleared.
int Fail(const std::vector<std::string>& args) {
    if (args.size() < 2 || args.size() > 3) return Usage("fail takes ROOT OPERATION [MESSAGE | --clear]");
    const std::string& operation = args[1];
    const Target target = TargetOf(operation);
    if (target == Target::Unknown) return 1;
    const bool tool = target == Target::Tool;
    const bool clear = args.size() == 3 && args[2] == "--clear";
    const std::string message = args.size() == 3 ? args[2] : "simulated failure of " + operation;
    if (!clear && message.empty()) return Usage("the message of a fault may not be empty");
    HostCtl::Lib::SimState sim(args[0]);
    sim.Read();  // a missing or malformed state is reported before anything is made
    sim.Update([&](json& state) {
        json& faults = VelkTools::ObjectMember(sim, state, "", tool ? "toolFaults" : "faults");
        if (clear)
            faults.erase(operation);
        else
            faults[operation] = message;
    });
    return 0;
}

// Makes the calls of a host control operation or a host tool wait before
// they act, or (0) no longer.
int Slow(const std::vector<std::string>& args) {
    if (args.size() != 3) return Usage("slow takes ROOT 'OPERATION [WORD]' SECONDS");
    const std::string& name = args[1];
    const Target target = TargetOf(name);
    if (target == Target::Unknown) return 1;
    const bool tool = target == Target::Tool;
    double seconds = -1;
    try {
        size_t used = 0;
        seconds = std::stod(args[2], &used);
        if (used != args[2].size()) seconds = -1;
    } catch (const std::logic_error&) {
    }
    if (!(seconds >= 0 && seconds <= 3600)) return Usage("SECONDS must be a number from 0 to 3600");
    HostCtl::Lib::SimState sim(args[0]);
    sim.Read();
    sim.Update([&](json& state) {
        json& delays = VelkTools::ObjectMember(sim, state, "", tool ? "toolDelays" : "delays");
        if (seconds == 0)
            delays.erase(name);
        else
            delays[name] = seconds;
    });
    return 0;
}

// Prints the console login of the host, as its password file holds it now.
int Login(const std::vector<std::string>& args) {
    if (args.size() != 1) return Usage("login takes ROOT");
    std::string password = VelkTools::ReadRootPassword(args[0]);
    std::printf("Demo login: user root, password %s\n", password.c_str());
    return 0;
}

// Runs one state command; errors about the pointer name the state file.
int Edit(const std::string& command, const std::vector<std::string>& args) {
    size_t expected = command == "set" ? 3 : 2;
    if (args.size() != expected)
        return Usage(command + " takes " + (expected == 3 ? "ROOT POINTER VALUE" : "ROOT POINTER"));
    HostCtl::Lib::SimState sim(args[0]);
    const std::string& pointer = args[1];
    try {
        // Read first: a missing or malformed state is reported as such, and
        // nothing (not even a lock file) is made in a folder that is no host.
        std::shared_ptr<const json> state = sim.Read();
        if (command == "get") {
            const json& value = VelkTools::GetAt(*state, pointer);
            bool structured = value.is_structured() && !value.empty();
            std::printf("%s\n",
                        value.dump(structured ? 2 : -1, ' ', false, json::error_handler_t::replace).c_str());
        } else if (command == "set") {
            json value = VelkTools::ParseValue(args[2]);
            sim.Update([&](json& latest) { VelkTools::SetAt(latest, pointer, value); });
        } else {
            sim.Update([&](json& latest) { VelkTools::RemoveAt(latest, pointer); });
        }
    } catch (const VelkTools::PointerError& e) {
        return Error(sim.Error(e.what()).what());
    }
    return 0;
}

// Puts a smart card for USER into a reader slot (the first by default), with
// PIN as the user's console secret, or pulls the card out of the slot. The
// console notices either on its next refresh signal (SIGUSR1).
int Card(const std::vector<std::string>& args) {
    std::vector<std::string> words;
    size_t slot = 0;
    for (size_t i = 0; i < args.size(); ++i) {
        if (args[i] == "--slot") {
            if (i + 1 >= args.size()) return Usage("--slot needs a number");
            const std::string& n = args[++i];
            if (n.empty() || n.size() > 3 || n.find_first_not_of("0123456789") != std::string::npos)
                return Usage("bad slot number " + n);
            slot = std::stoul(n);
        } else {
            words.push_back(args[i]);
        }
    }
    const bool insert = words.size() == 4 && words[1] == "insert";
    if (!insert && !(words.size() == 2 && words[1] == "pull"))
        return Usage("card takes ROOT insert USER PIN, or ROOT pull");
    const std::string& root = words[0];
    HostCtl::Lib::SimState sim(root);
    std::shared_ptr<const json> state = sim.Read();
    const std::string pointer = "/smartCards/slots/" + std::to_string(slot);
    try {
        (void)VelkTools::GetAt(*state, pointer);
    } catch (const VelkTools::PointerError&) {
        return Error("the host has no smart card slot " + std::to_string(slot));
    }
    if (!insert) {
        sim.Update([&](json& latest) { VelkTools::SetAt(latest, pointer + "/token", nullptr); });
        return 0;
    }
    const std::string& user = words[2];
    // The secret first: a card the console sees can always be used.
    VelkTools::SetLoginSecret(root, user, words[3]);
    json token = {{"label", "Card of " + user}, {"userIds", {user}}};
    sim.Update([&](json& latest) { VelkTools::SetAt(latest, pointer + "/token", token); });
    return 0;
}

}  // namespace

int main(int argc, char** argv) {
    std::vector<std::string> args(argv + 1, argv + argc);
    if (args.empty()) return Usage("");
    std::string command = args[0];
    args.erase(args.begin());
    if (command == "help" || command == "--help" || command == "-h") {
        std::fputs(USAGE, stdout);
        return 0;
    }
    try {
        if (command == "create") return Create(args);
        if (command == "boot") return Boot(args);
        if (command == "fail") return Fail(args);
        if (command == "slow") return Slow(args);
        if (command == "login") return Login(args);
        if (command == "get" || command == "set" || command == "remove") return Edit(command, args);
        if (command == "card") return Card(args);
    } catch (const std::exception& e) {
        return Error(e.what());
    }
    return Usage("unknown command " + command);
}
