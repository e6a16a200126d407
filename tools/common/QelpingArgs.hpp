// The command line of qelping, the same on every host:
//   qelping TARGET [-I INTERFACE]
// where TARGET may carry a scope ("fe80::1%vmbr0") that names the interface.
#pragma once

#include <string>
#include <vector>

namespace VelkTools {

struct QelpingRequest {
    std::string target;     // the address, without a scope
    std::string scope;      // "fe80::1%eth0": "eth0"
    std::string interface;  // from -I or the scope; "" when neither names one
};

// "" when the arguments are fine, else the problem.
inline std::string ParseQelpingArgs(const std::vector<std::string>& args, QelpingRequest& request) {
    bool haveTarget = false;
    for (size_t i = 0; i < args.size(); ++i) {
        if (args[i] == "-I") {
            if (i + 1 >= args.size() || args[i + 1].empty()) return "-I needs an interface name";
            request.interface = args[++i];
        } else if (!args[i].empty() && args[i][0] == '-') {
            return "unknown option " + args[i];
        } else if (haveTarget) {
            return "more than one target (" + request.target + ", " + args[i] + ")";
        } else {
            request.target = args[i];
            haveTarget = true;
        }
    }
    if (!haveTarget || request.target.empty()) return "no target given";
    const size_t percent = request.target.find('%');
    if (percent != std::string::npos) {
        request.scope = request.target.substr(percent + 1);
        request.target.erase(percent);
        if (request.scope.empty()) return "the target's scope after '%' is empty";
        if (!request.interface.empty() && request.interface != request.scope)
            return "the target's scope " + request.scope + " is not the interface " + request.interface;
        request.interface = request.scope;
    }
    return "";
}

}  // namespace VelkTools
