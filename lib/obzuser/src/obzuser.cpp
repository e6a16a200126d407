// Observation events. Each event line goes to the system log (informational
// priority). On a simulated host the library also stands in for the host's
// observation service and appends the line to the host's observation log;
// there a missing log means the service is absent, and init fails.
#include "obzuser/obzuser.h"

#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <ctime>
#include <string>

#include "hostctl/Host.hpp"

namespace {

bool g_open = false;
int g_obzLog = -1;  // the simulated host's observation log while open

}  // namespace

int ObzUserLib_Init(void) {
    if (g_open) return EALREADY;
    if (HostCtl::Lib::IsSimulatedHost()) {
        g_obzLog = open(HostCtl::Lib::HostPath("/var/log/obzd.log").c_str(), O_WRONLY | O_APPEND | O_CLOEXEC);
        if (g_obzLog < 0) return errno;
    }
    g_open = true;
    return 0;
}

int ObzUserLib_VAddObz(const char* format, va_list args) {
    if (!g_open) return EBADF;
    // As long as it is: an audit event names a whole configuration before
    // and after.
    const std::string text = HostCtl::Lib::VFormat(format, args);
    const char* event = text.c_str();
    HostCtl::Lib::Syslog(LOG_INFO, "%s", event);
    if (g_obzLog < 0) return 0;

    const std::string line = HostCtl::Lib::UtcTimestamp() + " obzd: " + event + "\n";
    ssize_t n = write(g_obzLog, line.data(), line.size());
    if (n < 0) return errno;
    return size_t(n) == line.size() ? 0 : EIO;
}

int ObzUserLib_AddObz(const char* format, ...) {
    va_list args;
    va_start(args, format);
    int rc = ObzUserLib_VAddObz(format, args);
    va_end(args);
    return rc;
}

void ObzUserLib_Close(void) {
    if (g_obzLog >= 0) close(g_obzLog);
    g_obzLog = -1;
    g_open = false;
}
