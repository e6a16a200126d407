// "Testing Management Network": pings each target and resolves the host name,
// one check after the other, each in a child process, with one line per check
// ending in "OK." or "Failed.". Esc interrupts the run at once; the running
// check is left to end by itself (and is reaped then).
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

#include "Dialog.hpp"
#include "TextArea.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class RunTestDialog : public Dialog {
public:
    RunTestDialog(Frame* parent, const std::optional<HostCtl::Network::IpAddress>& target1,
                  const std::optional<HostCtl::Network::IpAddress>& target2,
                  const std::optional<HostCtl::Network::IpAddress>& target3, const std::string& hostName);
    ~RunTestDialog() override;

    // false when interrupted with Esc.
    int Run() override;

    // The line announcing the ping of target `number`: a link-local IPv6
    // target carries the interface it is reached through.
    static std::string PingLine(const std::string& label, int number,
                                const HostCtl::Network::IpAddress& target, const std::string& interfaceName);
    // The host's resolver check, run in the resolver child: the hosts file
    // saved aside, the host's own entry taken out (so that the name must come
    // from DNS), the name resolved, the hosts file put back. 0 when the name
    // resolved, another status when not or when the hosts file could not be
    // saved aside.
    static int ResolveInChild(const std::string& hostName);

private:
    // Fork the check's child; its process id, or -1 when the fork failed.
    pid_t PingCheck(const HostCtl::Network::IpAddress& target);
    pid_t ResolveCheck(const std::string& hostName);
    // Reads keys until the check has ended (true) or Esc was pressed (false).
    bool WaitForCheck(pid_t pid);
    // The child-exit handler: records the result of the check's child.
    void ChildExited(pid_t pid, int status);
    void WriteResult(int status);
    // Stops listening for the checks' children.
    void Uninstall();

    std::optional<HostCtl::Network::IpAddress> _targets[3];
    std::string _hostName;
    std::string _interfaceName;
    pid_t _pid = -1;
    bool _done = false;
    TextArea* _results;  // owned by the window tree
};

}  // namespace Velk
