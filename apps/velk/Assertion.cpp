#include "Assertion.hpp"

#include <syslog.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <string_view>

#include "hostctl/Host.hpp"

namespace Velk {

void AssertionFailed(const char* text, const char* file, int line, const char* function) {
    // The build passes absolute source paths; the project's own part is what
    // tells a reader where to look.
    const std::string_view path(file);
    const size_t at = path.rfind("/apps/");
    const char* source = at == std::string_view::npos ? file : file + at + 1;
    HostCtl::Lib::Syslog(LOG_ERR, "%s:%d: %s: Assertion `%s' failed.", source, line, function, text);
    std::fprintf(stderr, "%s: %s:%d: %s: Assertion `%s' failed.\n", program_invocation_short_name, source,
                 line, function, text);
    std::abort();
}

}  // namespace Velk
