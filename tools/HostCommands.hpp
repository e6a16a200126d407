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

// openssl [ARGS...]: the machine's openssl, printing fingerprint lines the
// way the host's openssl does. Writes straight to the standard streams and
// needs no state.
int Openssl(const std::vector<std::string>& args);

}  // namespace VelkTools
