// powerOffVms of a Debian host, and the guests' part of hrm-cmd's auto-stop:
// libvirt guests asked to shut down (and waited for), or powered off.
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <optional>

#include "DebianTools.hpp"
#include "Guests.hpp"
#include "HostConfig.hpp"
#include "HostSystem.hpp"
#include "hostctl/Host.hpp"

namespace VelkDebian {

using HostCtl::Lib::Syslog;

namespace {

const char* const VIRSH = "/usr/bin/virsh";
const char* const SYSTEM_URI = "qemu:///system";
// Bounds of single virsh calls; a guest's own shut-down is bounded by the
// configured wait.
const int LIST_SECONDS = 30;
const int CALL_SECONDS = 60;

std::vector<std::string> VirshCall(const std::vector<std::string>& args) {
    std::vector<std::string> argv = {VIRSH, "-c", SYSTEM_URI, "-q"};
    argv.insert(argv.end(), args.begin(), args.end());
    return argv;
}

// The UUIDs of the running guests (with autostart set, when asked); nothing
// when virsh fails.
std::optional<std::vector<std::string>> RunningGuests(bool autostartOnly) {
    std::vector<std::string> args = {"list", "--uuid", "--state-running"};
    if (autostartOnly) args.push_back("--autostart");
    const Child child = Run(VirshCall(args), true, LIST_SECONDS);
    if (child.status != 0) return std::nullopt;
    std::vector<std::string> uuids;
    size_t start = 0;
    while (start < child.out.size()) {
        size_t end = child.out.find('\n', start);
        if (end == std::string::npos) end = child.out.size();
        std::string line = child.out.substr(start, end - start);
        line.erase(0, line.find_first_not_of(" \t\r"));
        line.erase(line.find_last_not_of(" \t\r") + 1);
        if (!line.empty() && line[0] != '-') uuids.push_back(line);
        start = end + 1;
    }
    return uuids;
}

bool Virsh(const std::string& verb, const std::string& uuid) {
    return Run(VirshCall({verb, uuid}), true, CALL_SECONDS).status == 0;
}

// Asks each guest to shut down and waits, up to the configured time, for
// them to stop running; answers those still running (or every one, when the
// guests cannot be listed any more).
std::vector<std::string> ShutDown(const std::vector<std::string>& guests, const std::string& tool) {
    Syslog(LOG_INFO, "Shutting down %zu virtual machines", guests.size());
    for (const std::string& uuid : guests)
        if (!Virsh("shutdown", uuid))
            Complain(tool + ": cannot ask virtual machine " + uuid + " to shut down\n");
    const int wait = HostCtl::Lib::Linux::HostConfig::Load().vmShutdownTimeout;
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(wait);
    std::vector<std::string> left = guests;
    for (;;) {
        const auto running = RunningGuests(false);
        if (!running) return left;
        std::erase_if(left, [&](const std::string& uuid) {
            return std::find(running->begin(), running->end(), uuid) == running->end();
        });
        if (left.empty() || std::chrono::steady_clock::now() >= deadline) return left;
        sleep(1);
    }
}

bool Libvirt() { return HostPathExists(VIRSH); }

}  // namespace

int StopAutostartGuests() {
    if (!Libvirt()) return 0;
    const auto guests = RunningGuests(true);
    if (!guests) {
        Complain("hrm-cmd: cannot list the virtual machines (is libvirtd running?)\n");
        return 1;
    }
    if (!guests->empty()) ShutDown(*guests, "hrm-cmd");
    return 0;
}

int PowerOffVms(const Args& args) {
    bool terminate = false;
    for (const std::string& arg : args) {
        if (arg != "--terminate") {
            Complain("powerOffVms: unknown argument " + arg + "\nusage: powerOffVms [--terminate]\n");
            return 1;
        }
        terminate = true;
    }
    if (!Libvirt()) return 0;  // no libvirt: no virtual machines
    const auto guests = RunningGuests(false);
    if (!guests) {
        Complain("powerOffVms: cannot list the virtual machines (is libvirtd running?)\n");
        return 1;
    }
    std::vector<std::string> left = *guests;
    if (!terminate && !left.empty()) {
        left = ShutDown(left, "powerOffVms");
        if (!left.empty())
            Complain("powerOffVms: " + std::to_string(left.size()) +
                     " virtual machines did not shut down in time; powering them off\n");
    }
    int status = 0;
    for (const std::string& uuid : left) {
        Syslog(LOG_WARNING, "Powering off virtual machine %s", uuid.c_str());
        if (!Virsh("destroy", uuid)) {
            Complain("powerOffVms: cannot power off virtual machine " + uuid + "\n");
            status = 1;
        }
    }
    return status;
}

}  // namespace VelkDebian
