// qelping of a Debian host: one ping of the target, from the interface when
// one is named. Exit status 0 when it answered, 1 when it did not (or the
// packet could not be sent), 2 for bad usage, an unknown interface, or a
// target that is no address.
#include <arpa/inet.h>

#include "DebianTools.hpp"
#include "HostSystem.hpp"
#include "QelpingArgs.hpp"

namespace VelkDebian {

namespace {

const char* const USAGE = "usage: qelping TARGET [-I INTERFACE]\n";
const char* const PING = "/bin/ping";
// ping waits 2 seconds for its answer; this bounds the whole run.
const int PING_SECONDS = 10;

bool IsInterfaceName(const std::string& name) {
    if (name.empty() || name.size() > 15 || name == "." || name == "..") return false;
    for (unsigned char c : name)
        if (c <= 0x20 || c == 0x7f || c == '/') return false;
    return true;
}

}  // namespace

int Qelping(const Args& args) {
    VelkTools::QelpingRequest request;
    if (const std::string problem = VelkTools::ParseQelpingArgs(args, request); !problem.empty()) {
        Complain("qelping: " + problem + "\n" + USAGE);
        return 2;
    }
    unsigned char address[16];
    const bool v4 = inet_pton(AF_INET, request.target.c_str(), address) == 1;
    const bool v6 = !v4 && inet_pton(AF_INET6, request.target.c_str(), address) == 1;
    if (!v4 && !v6) {
        Complain("qelping: unknown host " + request.target + "\n");
        return 2;
    }
    if (!request.interface.empty() &&
        (!IsInterfaceName(request.interface) || !HostPathExists("/sys/class/net/" + request.interface))) {
        Complain("qelping: unknown interface " + request.interface + "\n");
        return 2;
    }
    std::vector<std::string> argv = {PING, "-n", "-c", "1", "-W", "2", v6 ? "-6" : "-4"};
    if (!request.interface.empty()) argv.insert(argv.end(), {"-I", request.interface});
    argv.push_back(request.scope.empty() ? request.target : request.target + "%" + request.scope);
    const Child child = Run(argv, false, PING_SECONDS);
    if (!child.started) {
        Complain(std::string("qelping: cannot run ") + PING + "\n");
        return 2;
    }
    return child.status == 0 ? 0 : 1;
}

}  // namespace VelkDebian
