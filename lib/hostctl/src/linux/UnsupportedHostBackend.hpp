// The backend of a machine the library cannot control yet.
#pragma once

#include <memory>

#include "hostctl/Backend.hpp"

namespace HostCtl::Lib {

// Every operation throws HostCtlException("<operation>: not available on this
// host ..."): until a backend for the machine itself exists, that is the only
// true answer a real host can get.
std::unique_ptr<Backend> MakeUnsupportedHostBackend();

}  // namespace HostCtl::Lib
