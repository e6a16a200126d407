// The command-line tools of a Debian host, one multi-call program: the same
// command lines, exit statuses and output as the simulated host's tools, but
// acting on the machine itself (the init system, libvirt, ping, DMI and the
// console's own option file).
//
// Every tool takes its arguments (without the tool's name), writes straight
// to the standard streams and returns its exit status. Every absolute path a
// tool uses, the programs it runs included, goes through the host path
// mapping, so a test can point the tools at a scratch folder with
// VELK_HOST_ROOT.
#pragma once

#include <map>
#include <string>
#include <vector>

namespace VelkDebian {

using Args = std::vector<std::string>;
using Tool = int (*)(const Args&);

// hrm-cmd -U USER COMMAND [ARGS...]: what the host agent would do, for root
// and the console's own user; 255 for any other user.
int HrmCmd(const Args& args);

// The init scripts "/etc/init.d/TarnShell" and "/etc/init.d/SSH":
// status|start|stop|restart, status 0 while running and 3 while not.
int TarnShellScript(const Args& args);
int SshScript(const Args& args);

// services.sh start|stop|restart: the management agents (velk.conf's
// "agent-services").
int ServicesScript(const Args& args);

// tarncfg-advcfg [-q] -g OPTION; tarncli and localcli "system settings
// advanced set -o OPTION -i VALUE": the option file "/etc/velk/options".
int TarncfgAdvcfg(const Args& args);
int Tarncli(const Args& args);
int Localcli(const Args& args);

// powerOffVms [--terminate]: every running libvirt guest shut down (or
// powered off with --terminate).
int PowerOffVms(const Args& args);

// grabCIMData CLASS PROPERTY: the firmware version from DMI.
int GrabCimData(const Args& args);

// qelping TARGET [-I INTERFACE]: one ping; 0 answered, 1 no answer, 2 bad
// usage.
int Qelping(const Args& args);

// firmwareConfig.sh and qelbacktrace: refused, status 1.
int FirmwareConfig(const Args& args);
int Qelbacktrace(const Args& args);

// The tools by name.
const std::map<std::string, Tool>& Tools();

}  // namespace VelkDebian
