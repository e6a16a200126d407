// The backend of a real Debian host: identity from the kernel, /etc and
// DMI; the network from rtnetlink and sysfs (a standard switch is a Linux
// bridge, a port group the host's interface on it); services, virtual
// machines and options through the Debian host's own tools and files. What a
// Debian host does not have is refused with one clear message.
#pragma once

#include <memory>

#include "hostctl/Backend.hpp"

namespace HostCtl::Lib::Linux {

std::unique_ptr<Backend> MakeLinuxBackend();

}  // namespace HostCtl::Lib::Linux
