// The simulated host's command-line tools. Each works on the host's state
// file, fills `out` and `err` with what the real tool would print on its
// standard output and standard error, and returns the exit status. Failures
// of the state file itself (missing, malformed, a field of the wrong type)
// throw; the caller turns them into a one-line message and status 1.
#pragma once

#include <string>
#include <vector>

#include "hostctl/SimState.hpp"

namespace VelkTools {

// hrm-cmd -U USER COMMAND [ARGS...]: a host-agent command run as USER.
int HrmCmd(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
           std::string& err);

// grabCIMData CLASS PROPERTY: one property of the host's CIM instance.
int GrabCimData(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
                std::string& err);

// powerOffVms [--terminate]: stops every running virtual machine.
int PowerOffVms(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
                std::string& err);

// reboot [-f] and poweroff [-f]: record the request and set /power/state to
// "rebooting" or "off".
int Reboot(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
           std::string& err);
int Poweroff(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
             std::string& err);

// firmwareConfig.sh --reset-only: records the request and sets
// /power/resetDone.
int FirmwareConfig(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
                   std::string& err);

// Services: the init scripts "/etc/init.d/TarnShell" and "/etc/init.d/SSH"
// (status|start|stop|restart, on /services/tarnShell and /services/ssh),
// tarncfg-advcfg [-q] -g OPTION (prints an advanced option), tarncli and
// localcli "system settings advanced set -o OPTION -i VALUE" (tarncli needs
// the running host agent, localcli does not), services.sh start|stop|restart
// (the management agents: /hostAgent/running) and
// qelbacktrace [-w] -n corad -o PATTERN -d FOLDER (a live core of the agent).
int TarnShellScript(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
                    std::string& err);
int SshScript(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
              std::string& err);
int TarncfgAdvcfg(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
                  std::string& err);
int Tarncli(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
            std::string& err);
int Localcli(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
             std::string& err);
int ServicesScript(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
                   std::string& err);
int Qelbacktrace(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
                 std::string& err);

// qelping TARGET [-I INTERFACE]: the host's ping, answered by the simulated
// network from the interface (the management interface by default) without
// sending anything. Waits the answering machine's "delayMs" and exits 0, or
// waits "/network/pingTimeoutMs" and exits 1 when nothing answers; 2 for bad
// usage, an unknown interface or a target that is no address. The run is
// recorded in the host's history at its start, its status filled in at the
// end (null while it waits, and after a kill).
int Qelping(HostCtl::Lib::SimState& sim, const std::vector<std::string>& args, std::string& out,
            std::string& err);

// openssl [ARGS...]: the machine's openssl, printing fingerprint lines the
// way the host's openssl does. Writes straight to the standard streams and
// needs no state.
int Openssl(const std::vector<std::string>& args);

}  // namespace VelkTools
