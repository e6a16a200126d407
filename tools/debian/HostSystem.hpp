// What the Debian host's tools need from the machine: running its programs
// with a clean environment, its init system, its files.
#pragma once

#include <string>
#include <vector>

namespace VelkDebian {

// The one environment entry of every program a tool runs.
inline constexpr const char* CHILD_PATH = "PATH=/usr/sbin:/usr/bin:/sbin:/bin";

struct Child {
    bool started = false;   // the program could be run
    bool timedOut = false;  // it was killed at the end of its time
    int status = -1;        // exit status 0 to 255; -1 when it did not exit
    std::string out;        // its standard output, when captured
};

// Runs argv[0] (an absolute host path, mapped through HostPath) with argv,
// the environment CHILD_PATH alone, /dev/null as standard input, no
// descriptor beyond 0 to 2 and default signal handling. Its standard output
// is captured when `capture`, else shared with the tool's; its standard error
// is always the tool's. After `timeoutSeconds` it is killed.
Child Run(const std::vector<std::string>& argv, bool capture, int timeoutSeconds);

// Messages of the tools, written at once (before any child writes its own).
void Say(const std::string& text);       // standard output
void Complain(const std::string& text);  // standard error

// The host file's text, "" when it cannot be read; at most 64 KiB.
std::string ReadHostFile(const std::string& hostPath);
bool HostPathExists(const std::string& hostPath);

// The init system's view of one service ("ssh", "libvirtd",
// "getty@tty1.service"): systemctl when systemd runs the host
// ("/run/systemd/system" is a folder), else service and update-rc.d.
enum class ServiceAction { Start, Stop, Restart, Enable, Disable };
bool SystemdRuns();
const char* ActionName(ServiceAction action);
// 0 when the init system did it; otherwise the init tool's status (its
// message is on standard error) or -1 when it could not be run.
int ControlService(const std::string& service, ServiceAction action);
bool ServiceRuns(const std::string& service);

// Whether a getty runs on the virtual terminal `tty` ("tty1"), from the
// processes' command lines (a host without systemd starts gettys from
// /etc/inittab).
bool GettyRunsOn(const std::string& tty);

}  // namespace VelkDebian
