// Runs the Debian host backend's network checks, changes and put-backs in
// the namespace it runs in, for the namespace tests. Each command prints
// one JSON object with what it found and how long it took ("ms"):
//   probe IFACE ADDRESS           {"answer": MAC or null}
//   check IFACE                   {"checks": [{"subject", "outcome", "detail"}]}
//   apply IFACE ADDRESS/PREFIX GATEWAY   a static IPv4 change through the backend
//   save FILE                     the saved configuration written to FILE
//   restore FILE                  the configuration of FILE put back
// Exit status 1 with the error on standard error when the command fails.
#include <chrono>
#include <cstdio>
#include <exception>
#include <fstream>
#include <nlohmann/json.hpp>
#include <sstream>
#include <string>

#include "hostctl/Backend.hpp"
#include "linux/LinuxBackend.hpp"

using namespace HostCtl;
using nlohmann::json;

namespace {

const char* OutcomeName(QelCtl::Network::NetworkCheck::Outcome outcome) {
    switch (outcome) {
        case QelCtl::Network::NetworkCheck::Outcome::Passed:
            return "passed";
        case QelCtl::Network::NetworkCheck::Outcome::Failed:
            return "failed";
        case QelCtl::Network::NetworkCheck::Outcome::Warning:
            return "warning";
    }
    return "";
}

json Run(Lib::Backend& backend, int argc, char** argv) {
    const std::string command = argv[1];
    auto arg = [&](int i) -> std::string {
        if (i >= argc) throw std::runtime_error(command + ": too few arguments");
        return argv[i];
    };
    json out = json::object();
    if (command == "probe") {
        const auto answer = backend.ProbeIpv4Address(arg(2), Network::Ipv4Address(arg(3)));
        out["answer"] = answer ? json(*answer) : json();
    } else if (command == "check") {
        out["checks"] = json::array();
        for (const auto& c : backend.CheckNetwork(arg(2)))
            out["checks"].push_back(
                {{"subject", c.subject}, {"outcome", OutcomeName(c.outcome)}, {"detail", c.detail}});
    } else if (command == "apply") {
        const std::string iface = arg(2), address = arg(3);
        const int prefix = std::stoi(address.substr(address.find('/') + 1));
        Network::IpConfig ip = backend.GetVnicIpConfig(iface);
        ip.SetUseDhcp(false, false, Network::Ipv4Address(address.substr(0, address.find('/'))),
                      Network::Ipv4Address::FromHostOrder(prefix == 0 ? 0 : ~0u << (32 - prefix)));
        backend.BeginNetworkChange();
        backend.SetVnicIpConfig(iface, ip);
        backend.SetDefaultGateway("defaultTcpipStack", Network::Ipv4Address(arg(4)), false);
        backend.CommitNetworkChange();
    } else if (command == "save") {
        std::ofstream(arg(2)) << backend.GetNetworkConfig();
    } else if (command == "restore") {
        std::ifstream in(arg(2));
        std::stringstream text;
        text << in.rdbuf();
        backend.SetNetworkConfig(text.str());
    } else {
        throw std::runtime_error("unknown command " + command);
    }
    return out;
}

}  // namespace

int main(int argc, char** argv) {
    if (argc < 2) {
        std::fprintf(stderr, "usage: %s probe|check|apply|save|restore ...\n", argv[0]);
        return 2;
    }
    try {
        const std::unique_ptr<Lib::Backend> backend = Lib::Linux::MakeLinuxBackend();
        const auto start = std::chrono::steady_clock::now();
        json out = Run(*backend, argc, argv);
        out["ms"] =
            std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - start)
                .count();
        std::puts(out.dump().c_str());
        return 0;
    } catch (const std::exception& e) {
        std::fprintf(stderr, "%s\n", e.what());
        return 1;
    }
}
