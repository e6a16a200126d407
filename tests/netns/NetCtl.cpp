// Changes the management network of the host it runs on through the host
// control API, in the order and with the calls the console's network screen
// makes on "Apply changes" (one change set, then the name service), or runs
// the console's network restore. The namespace tests run it inside the bed.
//
//   velk_netctl [ipv4=dhcp|none|ADDR/PREFIX] [gateway=ADDR] [ipv6=off|slaac|dhcp]
//               [hostname=NAME] [dns=ADDR,ADDR] [search=DOMAIN,DOMAIN]
//   velk_netctl restore
//
// Prints one JSON object: {"ms": time taken, "error": "" or the failure}.
// Exit status 0 when every call succeeded, 1 when one failed, 2 for bad
// arguments.
#include <chrono>
#include <cstdio>
#include <map>
#include <nlohmann/json.hpp>
#include <string>

#include "hostctl/HostCtl.hpp"
#include "hostctl/QelCtl.hpp"

namespace {

using HostCtl::Lib::HostCtlException;
namespace Net = HostCtl::Network;

Net::Ipv4Address Netmask(int prefix) {
    return Net::Ipv4Address::FromHostOrder(prefix <= 0 ? 0 : prefix >= 32 ? ~0u : ~0u << (32 - prefix));
}

void Change(const std::map<std::string, std::string>& args) {
    auto has = [&](const char* key) { return args.count(key) != 0; };
    QelCtl::Network::NetworkInfoImpl info;
    std::unique_ptr<Net::QelNic> mgmt = info.GetManagementInterface();
    if (!mgmt) throw HostCtlException("no management interface");
    Net::IpConfig config = mgmt->GetIpConfig();
    bool dhcp = config.GetUseDhcp();

    info.BeginChange();
    if (has("ipv4") || has("ipv6")) {
        if (has("ipv4")) {
            const std::string v4 = args.at("ipv4");
            if (v4 == "dhcp" || v4 == "none") {
                config.SetUseDhcp(v4 == "dhcp", v4 == "none");
            } else {
                const size_t slash = v4.find('/');
                config.SetUseDhcp(false, false, Net::Ipv4Address(v4.substr(0, slash)),
                                  Netmask(std::stoi(v4.substr(slash + 1))));
            }
            dhcp = config.GetUseDhcp();
        }
        if (has("ipv6")) {
            const std::string v6 = args.at("ipv6");
            config.SetUseIpv6RouterAdvertised(v6 == "slaac");
            config.SetUseIpv6Dhcp(v6 == "dhcp");
            config.SetIpv6Network({});
        }
        config.SetDhcpDns(dhcp || config.GetUseIpv6Dhcp());
        mgmt->SetIpConfig(config);
    }
    QelCtl::Network::RoutingInfoImpl routing("defaultTcpipStack");
    if (has("gateway")) routing.SetQelKernelDefaultGateway(Net::Ipv4Address(args.at("gateway")), false);
    if (dhcp && has("ipv4")) mgmt->RenewDhcpLease();
    info.CommitChange();

    QelCtl::Network::DnsConfigImpl dns("defaultTcpipStack");
    if (has("hostname")) {
        const std::string& name = args.at("hostname");
        if (name.find('.') != std::string::npos)
            dns.SetFqdn(name, false);
        else
            dns.SetHostname(name, false);
    }
    if (has("dns")) {
        dns.RemoveNameServers();
        std::string list = args.at("dns") + ",";
        for (size_t at = 0, comma; (comma = list.find(',', at)) != std::string::npos; at = comma + 1)
            if (comma > at) dns.AddNameServer(Net::IpAddress(list.substr(at, comma - at)));
    }
    if (has("search")) dns.SetSearchDomainsString(args.at("search"));
    dns.SaveConfig();
}

// The console's restore: what is removed is kept, and put back when the new
// layout cannot be made.
void Restore() {
    QelCtl::Network::NetworkInfoImpl info;
    info.DisableNetDumper();
    const std::string removed = info.GetNetworkConfig();
    info.ClearNetworkConfig();
    try {
        info.AutoConfigNetwork();
    } catch (const HostCtlException&) {
        info.SetNetworkConfig(removed);
        throw;
    }
}

}  // namespace

int main(int argc, char** argv) {
    std::map<std::string, std::string> args;
    bool restore = false;
    for (int i = 1; i < argc; ++i) {
        const std::string arg = argv[i];
        const size_t eq = arg.find('=');
        if (arg == "restore") {
            restore = true;
        } else if (eq == std::string::npos) {
            std::fprintf(stderr, "velk_netctl: not KEY=VALUE: %s\n", arg.c_str());
            return 2;
        } else {
            args[arg.substr(0, eq)] = arg.substr(eq + 1);
        }
    }
    const auto start = std::chrono::steady_clock::now();
    std::string error;
    try {
        restore ? Restore() : Change(args);
    } catch (const std::exception& e) {
        error = e.what();
    }
    const auto ms =
        std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - start)
            .count();
    std::puts(nlohmann::json{{"ms", ms}, {"error", error}}.dump().c_str());
    return error.empty() ? 0 : 1;
}
