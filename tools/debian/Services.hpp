// The two services the console switches on and off, the local shell (the
// getty of velk.conf's "shell-tty") and SSH (the ssh service), shared by
// hrm-cmd and their init scripts.
#pragma once

#include <string>

#include "HostSystem.hpp"

namespace VelkDebian {

enum class Switchable { TarnShell, Ssh };

// Does `action` to the service; 0 when done. Otherwise 1, with one line on
// standard error beginning with `tool` (besides what the init tool printed).
int SwitchService(Switchable service, ServiceAction action, const std::string& tool);
bool SwitchableRuns(Switchable service);

}  // namespace VelkDebian
