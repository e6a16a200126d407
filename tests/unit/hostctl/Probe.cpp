// Reports which host a fresh process chose from its environment; the host
// tests run it.
#include <syslog.h>

#include <cstdio>

#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

int main() {
    HostCtl::Lib::Syslog(LOG_NOTICE, "probing");
    printf("simulated=%d\n", HostCtl::Lib::IsSimulatedHost() ? 1 : 0);
    printf("root=%s\n", HostCtl::Lib::HostRoot().c_str());
    printf("path=%s\n", HostCtl::Lib::HostPath("/bin/ls").c_str());
    printf("tool=%s\n", HostCtl::Lib::HostPath("/bin/hrm-cmd").c_str());
    try {
        printf("hostname=%s\n", QelCtl::Network::DnsConfigImpl("defaultTcpipStack").GetHostname().c_str());
    } catch (const HostCtl::Lib::HostCtlException& e) {
        printf("hostname=error: %s\n", e.what());
    }
    return 0;
}
