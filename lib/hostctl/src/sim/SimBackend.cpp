// The backend of a simulated host: every operation reads or changes the
// host's state file through SimState, so that all processes working on the
// host see one state.
#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <climits>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <functional>
#include <stdexcept>
#include <thread>
#include <utility>

#include "HostShell.hpp"
#include "SimNetworkModel.hpp"
#include "hostctl/Backend.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"
#include "hostctl/SimNetwork.hpp"
#include "hostctl/SimState.hpp"

namespace HostCtl::Lib {

using nlohmann::json;

namespace {

using Network::Ipv4Address;
using Network::Ipv6Address;
using Network::Ipv6AddressType;
using Network::Ipv6Network;

const char* const DEFAULT_NETSTACK = "defaultTcpipStack";

// The operations of the backend, in the order of the Backend interface: the
// names "faults" in the state knows. Every operation below names itself in
// its Reading or Writing call, which refuses a name missing here.
const std::vector<std::string> OPERATIONS = {
    "GetVersionRecord",
    "GetHardwareVendor",
    "GetHardwareProduct",
    "GetCpuPackages",
    "GetCpuModel",
    "GetMemoryPageSize",
    "GetMemoryTotalPages",
    "GetPnics",
    "GetManagementInterfaceName",
    "GetVnicIpConfig",
    "SetVnicIpConfig",
    "GetVnicConnectionPoint",
    "SetVnicConnectionPoint",
    "GetVnicNames",
    "GetVnicMacAddress",
    "SetVnicMacAddress",
    "RenewVnicDhcpLease",
    "SetVnicEnabled",
    "ProbeIpv4Address",
    "CheckNetwork",
    "GetIpv6Enabled",
    "SetIpv6Enabled",
    "GetConnectionPointSwitch",
    "GetVirtualSwitchNames",
    "AddVirtualSwitch",
    "RemoveVirtualSwitch",
    "GetVirtualSwitchUplinks",
    "GetTeamingPolicy",
    "GetMaxActiveUplinks",
    "AddUplinkToTeamingPolicy",
    "RemoveUplinkFromTeamingPolicy",
    "GetPortGroupNames",
    "AddPortGroup",
    "GetPortGroupVlanId",
    "SetPortGroupVlanId",
    "GetDistributedSwitchNames",
    "GetDvsUplinkPorts",
    "RemoveDvsUplink",
    "AddDvsUplink",
    "GetDvsPortSettings",
    "AddDvsHostLocalPort",
    "RemoveDvsHostLocalPort",
    "DisableNetDumper",
    "ClearNetworkConfig",
    "AutoConfigNetwork",
    "GetNetworkConfig",
    "SetNetworkConfig",
    "ResolveHostName",
    "GetDns",
    "SetHostname",
    "SetFqdn",
    "RemoveNameServers",
    "AddNameServer",
    "SetSearchDomains",
    "SaveConfig",
    "GetRouting",
    "SetDefaultGateway",
    "SetIpv6DefaultGateway",
    "GetWelcomeMessage",
    "GetSystemAlert",
    "SetSystemAlert",
    "GetBootOptions",
    "GetKeyboardLayout",
    "SetKeyboardLayout",
    "GetKeyboardLayouts",
    "LoadKeyboardMappings",
    "FindAdvancedOption",
    "SetAdvancedOption",
    "HasUserOption",
    "GetSmartCardSlots",
    "GetSmartCardToken",
    "HasRunningVirtualMachines",
    "GetDriverVmState",
    "GetDriverVmDevices",
    "SetDriverVmOwned",
    // Services and firewall.
    "GetFirewallRulesetEnabled",
    "SetFirewallRulesetEnabled",
    "RunCommandLine",
};

bool IsSimulatedOperation(const char* name) {
    return std::find(OPERATIONS.begin(), OPERATIONS.end(), name) != OPERATIONS.end();
}

// A name as one step of a JSON pointer ("/UserVars/X" -> "~1UserVars~1X").
std::string PointerStep(const std::string& name) {
    std::string out;
    for (char ch : name) {
        if (ch == '~')
            out += "~0";
        else if (ch == '/')
            out += "~1";
        else
            out += ch;
    }
    return out;
}

// The text of a JSON library error without its "[json.exception.x.N] " tag.
std::string JsonProblem(const nlohmann::json::exception& e) {
    std::string what = e.what();
    size_t tagEnd = what.find("] ");
    return tagEnd == std::string::npos ? what : what.substr(tagEnd + 2);
}

std::string At(const std::string& pointer, size_t index) { return pointer + "/" + std::to_string(index); }

class SimulatedBackend : public Backend {
public:
    explicit SimulatedBackend(const std::string& root) : _sim(root) {}

    // Version and hardware.

    VersionRecord GetVersionRecord() override {
        return Reading("GetVersionRecord", [&](const json& s) {
            VersionRecord record;
            record.product = _sim.String(s, "/version/product");
            record.version = _sim.String(s, "/version/version");
            record.kernelRelease = _sim.String(s, "/version/kernelRelease");
            record.build = _sim.String(s, "/version/build");
            uint64_t number = _sim.Unsigned(s, "/version/buildNumber");
            if (number > UINT32_MAX) throw _sim.Error("field /version/buildNumber is too large");
            record.buildNumber = uint32_t(number);
            return record;
        });
    }

    std::string GetHardwareVendor() override {
        return Reading("GetHardwareVendor",
                       [&](const json& s) { return _sim.String(s, "/hardware/vendor"); });
    }

    std::string GetHardwareProduct() override {
        return Reading("GetHardwareProduct",
                       [&](const json& s) { return _sim.String(s, "/hardware/product"); });
    }

    unsigned GetCpuPackages() override {
        return Reading("GetCpuPackages", [&](const json& s) {
            uint64_t packages = _sim.Unsigned(s, "/hardware/cpu/packages");
            if (packages > UINT_MAX) throw _sim.Error("field /hardware/cpu/packages is too large");
            return unsigned(packages);
        });
    }

    std::string GetCpuModel() override {
        return Reading("GetCpuModel", [&](const json& s) { return _sim.String(s, "/hardware/cpu/model"); });
    }

    uint64_t GetMemoryPageSize() override {
        return Reading("GetMemoryPageSize",
                       [&](const json& s) { return _sim.Unsigned(s, "/hardware/memory/pageSize"); });
    }

    uint64_t GetMemoryTotalPages() override {
        return Reading("GetMemoryTotalPages",
                       [&](const json& s) { return _sim.Unsigned(s, "/hardware/memory/totalPages"); });
    }

    // Network: virtual NICs. The rules of the network are in SimNetwork.cpp.

    std::vector<Network::Pnic> GetPnics() override {
        return Reading("GetPnics", [&](const json& s) {
            std::vector<Network::Pnic> pnics;
            const std::string list = "/network/pnics";
            for (size_t i = 0; i < _sim.Array(s, list).size(); ++i) {
                const std::string p = At(list, i);
                Network::Pnic pnic;
                pnic.name = _sim.String(s, p + "/name");
                pnic.mac = _sim.String(s, p + "/mac");
                pnic.driver = _sim.String(s, p + "/driver");
                pnic.linkUp = _sim.Bool(s, p + "/linkUp");
                int64_t speed = _sim.Integer(s, p + "/speedMbps");
                if (speed < 0 || speed > INT_MAX)
                    throw _sim.Error("field " + p + "/speedMbps is out of range");
                pnic.speedMbps = int(speed);
                pnic.description = _sim.String(s, p + "/description");
                // NICs without a hardware label may leave the field out.
                if (s.at(json::json_pointer(p)).contains("label")) pnic.label = _sim.String(s, p + "/label");
                pnics.push_back(std::move(pnic));
            }
            return pnics;
        });
    }

    std::string GetManagementInterfaceName() override {
        return Reading("GetManagementInterfaceName",
                       [&](const json& s) { return _sim.String(s, "/network/managementInterface"); });
    }

    Network::IpConfig GetVnicIpConfig(const std::string& vnic) override {
        return Reading("GetVnicIpConfig", [&](const json& s) {
            const std::string p = NetworkView(_sim, s).VnicPointer(vnic);
            Network::IpConfig config;
            // IPv4 off wins over DHCP in a state that has both.
            const bool none = _sim.Bool(s, p + "/ipv4/none");
            config.SetUseDhcp(_sim.Bool(s, p + "/ipv4/dhcp") && !none, none);
            config.SetIpv4Address(V4(s, p + "/ipv4/address"));
            config.SetIpv4Netmask(V4(s, p + "/ipv4/netmask"));
            config.SetUseIpv6Dhcp(_sim.Bool(s, p + "/ipv6/dhcp"));
            config.SetUseIpv6RouterAdvertised(_sim.Bool(s, p + "/ipv6/routerAdvertisement"));
            config.SetDhcpDns(_sim.Bool(s, p + "/dhcpDns"));
            std::vector<Ipv6Network> networks;
            const std::string list = p + "/ipv6/addresses";
            for (size_t i = 0; i < _sim.Array(s, list).size(); ++i) {
                const std::string a = At(list, i);
                int64_t prefix = _sim.Integer(s, a + "/prefix");
                if (prefix < 0 || prefix > 128) throw _sim.Error("field " + a + "/prefix must be 0 to 128");
                networks.emplace_back(V6(s, a + "/address"), int(prefix), Ipv6Type(s, a + "/type"));
            }
            // A kernel without IPv6 has no IPv6 address on any interface.
            if (!_sim.Bool(s, "/network/ipv6Enabled")) networks.clear();
            config.SetIpv6Network(networks);
            return config;
        });
    }

    void SetVnicIpConfig(const std::string& vnic, const Network::IpConfig& config) override {
        Writing("SetVnicIpConfig",
                [&](json& s) {
                    NetworkModel network(_sim, s);
                    network.SetIpConfig(network.VnicPointer(vnic), config);
                },
                {vnic});
    }

    Network::ConnectionPoint GetVnicConnectionPoint(const std::string& vnic) override {
        return Reading("GetVnicConnectionPoint", [&](const json& s) {
            const std::string p = NetworkView(_sim, s).VnicPointer(vnic);
            const int64_t type = _sim.Integer(s, p + "/connectionType");
            switch (type) {
                case Network::ConnectionPoint::None:
                    return Network::ConnectionPoint(int(type), "");
                case Network::ConnectionPoint::PortGroup:
                case Network::ConnectionPoint::OpaqueNetwork:
                    return Network::ConnectionPoint(int(type), _sim.String(s, p + "/portgroup"));
                case Network::ConnectionPoint::DvsPort:
                    return Network::ConnectionPoint(int(type), _sim.String(s, p + "/port"));
                default:
                    throw _sim.Error("field " + p + "/connectionType must be 0, 1, 2 or 3");
            }
        });
    }

    void SetVnicConnectionPoint(const std::string& vnic, const Network::ConnectionPoint& point) override {
        Writing("SetVnicConnectionPoint",
                [&](json& s) {
                    NetworkModel network(_sim, s);
                    network.SetConnectionPoint(network.VnicPointer(vnic), point.GetType(), point.GetName());
                },
                {vnic, point.GetType(), point.GetName()});
    }

    std::vector<std::string> GetVnicNames() override {
        return Reading("GetVnicNames", [&](const json& s) { return Names(s, "/network/vnics"); });
    }

    std::string GetVnicMacAddress(const std::string& vnic) override {
        return Reading("GetVnicMacAddress", [&](const json& s) {
            return _sim.String(s, NetworkView(_sim, s).VnicPointer(vnic) + "/mac");
        });
    }

    void SetVnicMacAddress(const std::string& vnic, const std::string& mac) override {
        Writing("SetVnicMacAddress",
                [&](json& s) {
                    NetworkModel network(_sim, s);
                    network.SetMac(network.VnicPointer(vnic), mac);
                },
                {vnic, mac});
    }

    void RenewVnicDhcpLease(const std::string& vnic) override {
        Writing("RenewVnicDhcpLease",
                [&](json& s) {
                    NetworkModel network(_sim, s);
                    network.RenewLeases(network.VnicPointer(vnic));
                },
                {vnic});
    }

    void SetVnicEnabled(const std::string& vnic, bool enabled) override {
        Writing("SetVnicEnabled",
                [&](json& s) {
                    NetworkModel network(_sim, s);
                    network.SetEnabled(network.VnicPointer(vnic), enabled);
                },
                {vnic, enabled});
    }

    // The machines of the interface's VLAN segment answer for the addresses
    // they hold (SimNetwork.cpp).
    std::optional<std::string> ProbeIpv4Address(const std::string& vnic,
                                                const Network::Ipv4Address& address) override {
        return Reading("ProbeIpv4Address", [&](const json& s) -> std::optional<std::string> {
            const NetworkView network(_sim, s);
            std::string holder =
                network.Holder(network.VnicPointer(vnic), Network::IpAddress(address.GetStringAddress()));
            if (holder.empty()) return std::nullopt;
            return holder;
        });
    }

    std::vector<QelCtl::Network::NetworkCheck> CheckNetwork(const std::string& vnic) override {
        return Reading("CheckNetwork", [&](const json& s) {
            const NetworkView network(_sim, s);
            return network.Checks(network.VnicPointer(vnic));
        });
    }

    bool GetIpv6Enabled() override {
        return Reading("GetIpv6Enabled", [&](const json& s) { return _sim.Bool(s, "/network/ipv6Enabled"); });
    }

    // The running kernel keeps its IPv6 setting until the host boots again.
    void SetIpv6Enabled(bool enabled) override {
        Writing("SetIpv6Enabled",
                [&](json& s) {
                    _sim.Bool(s, "/network/ipv6EnabledAtBoot");
                    ObjectAt(s, "/network")["ipv6EnabledAtBoot"] = enabled;
                },
                {enabled});
    }

    // Switches.

    std::string GetConnectionPointSwitch(const Network::ConnectionPoint& point) override {
        return Reading("GetConnectionPointSwitch", [&](const json& s) {
            return NetworkView(_sim, s).ConnectionPointSwitch(point.GetType(), point.GetName());
        });
    }

    std::vector<std::string> GetVirtualSwitchNames() override {
        return Reading("GetVirtualSwitchNames",
                       [&](const json& s) { return Names(s, "/network/vswitches"); });
    }

    void AddVirtualSwitch(const std::string& vswitch) override {
        Writing("AddVirtualSwitch", [&](json& s) { NetworkModel(_sim, s).AddVirtualSwitch(vswitch); },
                {vswitch});
    }

    void RemoveVirtualSwitch(const std::string& vswitch) override {
        Writing("RemoveVirtualSwitch", [&](json& s) { NetworkModel(_sim, s).RemoveVirtualSwitch(vswitch); },
                {vswitch});
    }

    std::vector<std::string> GetVirtualSwitchUplinks(const std::string& vswitch) override {
        return Reading("GetVirtualSwitchUplinks", [&](const json& s) {
            return _sim.StringList(s, NetworkView(_sim, s).VswitchPointer(vswitch) + "/uplinks");
        });
    }

    Network::TeamingPolicy GetTeamingPolicy(const std::string& vswitch) override {
        return Reading("GetTeamingPolicy", [&](const json& s) {
            const std::string p = NetworkView(_sim, s).VswitchPointer(vswitch);
            Network::TeamingPolicy policy;
            policy.activeUplinks = _sim.StringList(s, p + "/teaming/active");
            policy.standbyUplinks = _sim.StringList(s, p + "/teaming/standby");
            return policy;
        });
    }

    unsigned GetMaxActiveUplinks(const std::string& vswitch) override {
        return Reading("GetMaxActiveUplinks", [&](const json& s) {
            const std::string p = NetworkView(_sim, s).VswitchPointer(vswitch) + "/maxActiveUplinks";
            const uint64_t most = _sim.Unsigned(s, p);
            if (most > UINT_MAX) throw _sim.Error("field " + p + " is too large");
            return unsigned(most);
        });
    }

    void AddUplinkToTeamingPolicy(const std::string& vswitch, const std::string& pnic,
                                  bool standby) override {
        Writing("AddUplinkToTeamingPolicy",
                [&](json& s) { NetworkModel(_sim, s).AddUplink(vswitch, pnic, standby); },
                {vswitch, pnic, standby ? "standby" : "active"});
    }

    void RemoveUplinkFromTeamingPolicy(const std::string& vswitch, const std::string& pnic) override {
        Writing("RemoveUplinkFromTeamingPolicy",
                [&](json& s) { NetworkModel(_sim, s).RemoveUplink(vswitch, pnic); }, {vswitch, pnic});
    }

    std::vector<std::string> GetPortGroupNames(const std::string& vswitch) override {
        return Reading("GetPortGroupNames", [&](const json& s) {
            return Names(s, NetworkView(_sim, s).VswitchPointer(vswitch) + "/portgroups");
        });
    }

    void AddPortGroup(const std::string& vswitch, const std::string& portGroup, uint16_t vlanId) override {
        Writing("AddPortGroup",
                [&](json& s) { NetworkModel(_sim, s).AddPortGroup(vswitch, portGroup, vlanId); },
                {vswitch, portGroup, vlanId});
    }

    uint16_t GetPortGroupVlanId(const std::string& vswitch, const std::string& portGroup) override {
        return Reading("GetPortGroupVlanId", [&](const json& s) {
            NetworkView network(_sim, s);
            const std::string p =
                network.PortGroupPointer(network.VswitchPointer(vswitch), portGroup) + "/vlan";
            const uint64_t vlan = _sim.Unsigned(s, p);
            if (vlan > 4095) throw _sim.Error("field " + p + " is above 4095");
            return uint16_t(vlan);
        });
    }

    void SetPortGroupVlanId(const std::string& vswitch, const std::string& portGroup,
                            uint16_t vlanId) override {
        Writing("SetPortGroupVlanId",
                [&](json& s) { NetworkModel(_sim, s).SetPortGroupVlan(vswitch, portGroup, vlanId); },
                {vswitch, portGroup, vlanId});
    }

    std::vector<std::string> GetDistributedSwitchNames() override {
        return Reading("GetDistributedSwitchNames",
                       [&](const json& s) { return Names(s, "/network/dvswitches"); });
    }

    std::vector<Network::DistributedSwitch::UplinkPort> GetDvsUplinkPorts(const std::string& dvs) override {
        return Reading("GetDvsUplinkPorts", [&](const json& s) {
            const std::string list = NetworkView(_sim, s).DvsPointer(dvs) + "/uplinkPorts";
            std::vector<Network::DistributedSwitch::UplinkPort> ports;
            for (size_t i = 0; i < _sim.Array(s, list).size(); ++i)
                ports.push_back(
                    {_sim.String(s, At(list, i) + "/key"), _sim.String(s, At(list, i) + "/pnic")});
            return ports;
        });
    }

    void RemoveDvsUplink(const std::string& dvs, const std::string& pnic) override {
        Writing("RemoveDvsUplink", [&](json& s) { NetworkModel(_sim, s).RemoveDvsUplink(dvs, pnic); },
                {dvs, pnic});
    }

    void AddDvsUplink(const std::string& dvs, const std::string& uplinkPort,
                      const std::string& pnic) override {
        Writing("AddDvsUplink", [&](json& s) { NetworkModel(_sim, s).AddDvsUplink(dvs, uplinkPort, pnic); },
                {dvs, uplinkPort, pnic});
    }

    Network::DistributedSwitch::PortSettings GetDvsPortSettings(const std::string& dvs,
                                                                const std::string& port) override {
        return Reading("GetDvsPortSettings", [&](const json& s) {
            NetworkView network(_sim, s);
            const std::string p = network.DvsPortPointer(network.DvsPointer(dvs), port);
            Network::DistributedSwitch::PortSettings settings;
            const uint64_t vlan = _sim.Unsigned(s, p + "/vlan");
            if (vlan > 4095) throw _sim.Error("field " + p + "/vlan is above 4095");
            settings.vlanId = uint16_t(vlan);
            // Ports made before these properties existed leave them out.
            const json& object = s.at(json::json_pointer(p));
            if (object.contains("blocked")) settings.blocked = _sim.Bool(s, p + "/blocked");
            if (object.contains("uplinks")) settings.uplinks = _sim.StringList(s, p + "/uplinks");
            return settings;
        });
    }

    std::string AddDvsHostLocalPort(const std::string& dvs,
                                    const Network::DistributedSwitch::PortSettings& settings) override {
        std::string key;
        Writing("AddDvsHostLocalPort",
                [&](json& s) { key = NetworkModel(_sim, s).AddDvsHostLocalPort(dvs, settings); },
                {dvs, settings.vlanId, settings.blocked, settings.uplinks});
        return key;
    }

    void RemoveDvsHostLocalPort(const std::string& dvs, const std::string& port) override {
        Writing("RemoveDvsHostLocalPort",
                [&](json& s) { NetworkModel(_sim, s).RemoveDvsHostLocalPort(dvs, port); }, {dvs, port});
    }

    // The factory restore of the network: the core dump sender lets go of
    // its interface, the configuration is cleared, the factory network built.

    void DisableNetDumper() override {
        Writing("DisableNetDumper", [&](json& s) {
            _sim.Bool(s, "/network/netDumper/enabled");
            ObjectAt(s, "/network/netDumper")["enabled"] = false;
        });
    }

    void ClearNetworkConfig() override {
        Writing("ClearNetworkConfig", [&](json& s) { NetworkModel(_sim, s).ClearConfig(); });
    }

    void AutoConfigNetwork() override {
        Writing("AutoConfigNetwork", [&](json& s) { NetworkModel(_sim, s).AutoConfig(); });
    }

    // The fields ClearNetworkConfig changes and those the network settings
    // change besides (host name, domain, search domains, IPv6 at the next
    // boot), by JSON pointer.
    static const std::vector<std::string>& NetworkConfigFields() {
        static const std::vector<std::string> fields = {"/network/vnics",
                                                        "/network/vswitches",
                                                        "/network/dvswitches",
                                                        "/network/managementInterface",
                                                        "/network/routing",
                                                        "/network/saved/routing",
                                                        "/network/dns/servers",
                                                        "/network/dns/ipv6Servers",
                                                        "/network/saved/dns/servers",
                                                        "/network/saved/dns/ipv6Servers",
                                                        "/network/dns/hostname",
                                                        "/network/dns/domain",
                                                        "/network/dns/searchDomains",
                                                        "/network/saved/dns/hostname",
                                                        "/network/saved/dns/domain",
                                                        "/network/saved/dns/searchDomains",
                                                        "/network/ipv6EnabledAtBoot"};
        return fields;
    }

    std::string GetNetworkConfig() override {
        return Reading("GetNetworkConfig", [&](const json& s) {
            json config = json::object();
            for (const std::string& field : NetworkConfigFields())
                if (s.contains(json::json_pointer(field))) config[field] = s.at(json::json_pointer(field));
            return config.dump();
        });
    }

    void SetNetworkConfig(const std::string& text) override {
        Writing("SetNetworkConfig", [&](json& s) {
            const json config = json::parse(text, nullptr, false);
            if (!config.is_object()) throw HostCtlException("not a network configuration of this host");
            for (const auto& [field, value] : config.items()) {
                if (std::ranges::find(NetworkConfigFields(), field) == NetworkConfigFields().end())
                    throw HostCtlException("not a network configuration of this host: " + field);
                // A value of another kind than the host's own is no
                // configuration it ever gave out.
                const json::json_pointer at(field);
                if (s.contains(at) && s.at(at).type() != value.type())
                    throw HostCtlException("not a network configuration of this host: " + field + " holds " +
                                           value.type_name());
                s[at] = value;
            }
        });
    }

    // The simulated network answers; the machine's own resolver is never asked.
    std::vector<Network::IpAddress> ResolveHostName(const std::string& name) override {
        return Reading("ResolveHostName", [&](const json& s) { return NetworkView(_sim, s).Resolve(name); });
    }

    // Name service and routing. The running configuration is "network/dns"
    // and "network/routing"; "network/saved" is what the host boots with.

    DnsSettings GetDns(const std::string& netstack) override {
        return Reading("GetDns", [&](const json& s) {
            CheckNetstack(netstack);
            const std::string p = "/network/dns";
            DnsSettings dns;
            dns.hostname = _sim.String(s, p + "/hostname");
            dns.domain = _sim.String(s, p + "/domain");
            for (size_t i = 0; i < _sim.Array(s, p + "/servers").size(); ++i)
                dns.servers.push_back(V4(s, At(p + "/servers", i)));
            for (size_t i = 0; i < _sim.Array(s, p + "/ipv6Servers").size(); ++i)
                dns.ipv6Servers.push_back(V6(s, At(p + "/ipv6Servers", i)));
            dns.searchDomains = _sim.StringList(s, p + "/searchDomains");
            return dns;
        });
    }

    void SetHostname(const std::string& netstack, const std::string& hostname, bool persist) override {
        Writing("SetHostname",
                [&](json& s) {
                    CheckNetstack(netstack);
                    CheckHostname(hostname);
                    for (json* dns : DnsObjects(s, persist)) (*dns)["hostname"] = hostname;
                },
                {hostname, persist});
    }

    void SetFqdn(const std::string& netstack, const std::string& hostname, const std::string& domain,
                 bool persist) override {
        Writing("SetFqdn",
                [&](json& s) {
                    CheckNetstack(netstack);
                    CheckHostname(hostname);
                    if (!domain.empty() && !QelCtl::Network::DnsConfigImpl::IsValidDomainName(domain))
                        throw HostCtlException("\"" + domain + "\" is not a valid domain name");
                    for (json* dns : DnsObjects(s, persist)) {
                        (*dns)["hostname"] = hostname;
                        (*dns)["domain"] = domain;
                    }
                },
                {hostname, domain, persist});
    }

    void RemoveNameServers(const std::string& netstack) override {
        Writing("RemoveNameServers", [&](json& s) {
            CheckNetstack(netstack);
            json& dns = ObjectAt(s, "/network/dns");
            dns["servers"] = json::array();
            dns["ipv6Servers"] = json::array();
        });
    }

    void AddNameServer(const std::string& netstack, const Network::IpAddress& server) override {
        Writing("AddNameServer",
                [&](json& s) {
                    CheckNetstack(netstack);
                    const std::string list =
                        server.IsIpv6() ? "/network/dns/ipv6Servers" : "/network/dns/servers";
                    const std::string text = server.GetStringAddress();
                    for (const std::string& known : _sim.StringList(s, list))
                        if (known == text) return;  // a server is listed once
                    s.at(json::json_pointer(list)).push_back(text);
                },
                {server.GetStringAddress()});
    }

    void SetSearchDomains(const std::string& netstack, const std::vector<std::string>& domains) override {
        Writing(
            "SetSearchDomains",
            [&](json& s) {
                CheckNetstack(netstack);
                for (const std::string& domain : domains)
                    if (!QelCtl::Network::DnsConfigImpl::IsValidDomainName(domain))
                        throw HostCtlException("\"" + domain + "\" is not a valid search domain");
                ObjectAt(s, "/network/dns")["searchDomains"] = domains;
            },
            json(domains));
    }

    void SaveConfig(const std::string& netstack) override {
        Writing("SaveConfig", [&](json& s) {
            CheckNetstack(netstack);
            json& saved = ObjectAt(s, "/network/saved");
            saved["dns"] = _sim.Object(s, "/network/dns");
            saved["routing"] = _sim.Object(s, "/network/routing");
        });
    }

    RouteSettings GetRouting(const std::string& netstack) override {
        return Reading("GetRouting", [&](const json& s) {
            CheckNetstack(netstack);
            RouteSettings routes;
            routes.ipv4Gateway = V4(s, "/network/routing/ipv4Gateway");
            routes.ipv6Gateway = V6(s, "/network/routing/ipv6Gateway");
            return routes;
        });
    }

    void SetDefaultGateway(const std::string& netstack, const Ipv4Address& gateway, bool persist) override {
        Writing("SetDefaultGateway",
                [&](json& s) {
                    CheckNetstack(netstack);
                    ObjectAt(s, "/network/routing")["ipv4Gateway"] = gateway.GetStringAddress();
                    if (persist)
                        ObjectAt(s, "/network/saved/routing")["ipv4Gateway"] = gateway.GetStringAddress();
                },
                {gateway.GetStringAddress(), persist});
    }

    void SetIpv6DefaultGateway(const std::string& netstack, const Ipv6Address& gateway) override {
        Writing("SetIpv6DefaultGateway",
                [&](json& s) {
                    CheckNetstack(netstack);
                    ObjectAt(s, "/network/routing")["ipv6Gateway"] = gateway.GetStringAddress();
                },
                {gateway.GetStringAddress()});
    }

    // System.

    std::string GetWelcomeMessage() override {
        return Reading("GetWelcomeMessage",
                       [&](const json& s) { return _sim.String(s, "/system/welcomeMessage"); });
    }

    std::string GetSystemAlert() override {
        return Reading("GetSystemAlert",
                       [&](const json& s) { return _sim.String(s, "/system/systemAlert"); });
    }

    void SetSystemAlert(const std::string& alert) override {
        Writing("SetSystemAlert", [&](json& s) { ObjectAt(s, "/system")["systemAlert"] = alert; });
    }

    QelCtl::System::BootOptions GetBootOptions() override {
        return Reading("GetBootOptions", [&](const json& s) {
            QelCtl::System::BootOptions options;
            options.auditMode = _sim.Bool(s, "/system/bootOptions/auditMode");
            return options;
        });
    }

    std::string GetKeyboardLayout() override {
        return Reading("GetKeyboardLayout",
                       [&](const json& s) { return _sim.String(s, "/system/keyboardLayout"); });
    }

    void SetKeyboardLayout(const std::string& layout) override {
        Writing("SetKeyboardLayout", [&](json& s) {
            bool known = false;
            for (const std::string& name : _sim.StringList(s, "/system/keyboardLayouts"))
                known |= name == layout;
            if (!known) throw _sim.Error("unknown keyboard layout \"" + layout + "\"");
            ObjectAt(s, "/system")["keyboardLayout"] = layout;
        });
    }

    std::vector<std::string> GetKeyboardLayouts() override {
        return Reading("GetKeyboardLayouts",
                       [&](const json& s) { return _sim.StringList(s, "/system/keyboardLayouts"); });
    }

    // The simulated console driver only remembers which mappings it holds.
    void LoadKeyboardMappings(const std::string& layout) override {
        Writing("LoadKeyboardMappings", [&](json& s) {
            bool known = false;
            for (const std::string& name : _sim.StringList(s, "/system/keyboardLayouts"))
                known |= name == layout;
            if (!known) throw _sim.Error("no key mappings for keyboard layout \"" + layout + "\"");
            ObjectAt(s, "/system")["loadedKeymap"] = layout;
        });
    }

    // Options.

    std::optional<AdvancedOptionValue> FindAdvancedOption(const std::string& name) override {
        return Reading("FindAdvancedOption", [&](const json& s) -> std::optional<AdvancedOptionValue> {
            if (!_sim.Object(s, "/advancedOptions").contains(name)) return std::nullopt;
            return OptionValue(s, name);
        });
    }

    void SetAdvancedOption(const std::string& name, const AdvancedOptionValue& value) override {
        Writing("SetAdvancedOption", [&](json& s) {
            json& options = ObjectAt(s, "/advancedOptions");
            if (!options.contains(name)) throw _sim.Error("no advanced option \"" + name + "\"");
            if (OptionValue(s, name).isInteger != value.isInteger)
                throw _sim.Error("advanced option \"" + name + "\" holds " +
                                 (value.isInteger ? "text, not an integer" : "an integer, not text"));
            if (value.isInteger)
                options[name] = value.integer;
            else
                options[name] = value.text;
        });
    }

    bool HasUserOption(const std::string& name) override {
        return Reading("HasUserOption",
                       [&](const json& s) { return _sim.Object(s, "/userOptions").contains(name); });
    }

    // Smart cards.

    std::vector<QelCtl::Hardware::SmartCardSlot> GetSmartCardSlots() override {
        return Reading("GetSmartCardSlots", [&](const json& s) {
            std::vector<QelCtl::Hardware::SmartCardSlot> slots;
            const std::string list = "/smartCards/slots";
            for (size_t i = 0; i < _sim.Array(s, list).size(); ++i)
                slots.push_back({_sim.String(s, At(list, i) + "/name")});
            return slots;
        });
    }

    std::optional<QelCtl::Hardware::SmartCardToken> GetSmartCardToken(const std::string& slot) override {
        return Reading("GetSmartCardToken",
                       [&](const json& s) -> std::optional<QelCtl::Hardware::SmartCardToken> {
                           const std::string list = "/smartCards/slots";
                           for (size_t i = 0; i < _sim.Array(s, list).size(); ++i) {
                               const std::string p = At(list, i);
                               if (_sim.String(s, p + "/name") != slot) continue;
                               if (_sim.Field(s, p + "/token").is_null()) return std::nullopt;
                               _sim.Object(s, p + "/token");
                               QelCtl::Hardware::SmartCardToken token;
                               token.label = _sim.String(s, p + "/token/label");
                               token.userIds = _sim.StringList(s, p + "/token/userIds");
                               return token;
                           }
                           return std::nullopt;
                       });
    }

    // Virtual machines.

    bool HasRunningVirtualMachines() override {
        return Reading("HasRunningVirtualMachines",
                       [&](const json& s) { return _sim.Unsigned(s, "/vms/running") > 0; });
    }

    // Driver VM. A host without "/driverVm" has no driver VM and no devices.

    int GetDriverVmState() override {
        return Reading("GetDriverVmState", [&](const json& s) {
            if (!s.contains("driverVm")) return 0;
            int64_t state = _sim.Integer(s, "/driverVm/state");
            if (state < 0 || state > 2) throw _sim.Error("field /driverVm/state must be 0, 1 or 2");
            return int(state);
        });
    }

    std::vector<QelCtl::Hardware::DriverVmDevice> GetDriverVmDevices() override {
        return Reading("GetDriverVmDevices", [&](const json& s) { return DriverVmDevices(s); });
    }

    void SetDriverVmOwned(const std::vector<std::string>& ownedIds) override {
        Writing("SetDriverVmOwned", [&](json& s) {
            std::vector<QelCtl::Hardware::DriverVmDevice> devices = DriverVmDevices(s);
            for (const std::string& id : ownedIds) {
                bool known = false;
                for (const auto& d : devices) known = known || d.id == id;
                if (!known) throw _sim.Error("no driver VM device \"" + id + "\"");
            }
            auto wanted = [&](const std::string& id) {
                for (const std::string& o : ownedIds)
                    if (o == id) return true;
                return false;
            };
            for (const auto& d : devices) {
                for (const auto& other : devices) {
                    if (!d.group.empty() && d.group == other.group && wanted(d.id) != wanted(other.id))
                        throw _sim.Error("devices of group \"" + d.group + "\" change owner together");
                }
            }
            json& list = s["driverVm"]["devices"];
            for (size_t i = 0; i < devices.size(); ++i) list[i]["owned"] = wanted(devices[i].id);
        });
    }

    // Services and firewall. A firewall ruleset is
    // "/firewall/rulesets/<id>": {"enabled": bool}. Command lines run with
    // the host's own shell and tools (see HostCommandLine).

    bool GetFirewallRulesetEnabled(const std::string& id) override {
        return Reading("GetFirewallRulesetEnabled",
                       [&](const json& s) { return _sim.Bool(s, RulesetEnabledPointer(s, id)); });
    }

    void SetFirewallRulesetEnabled(const std::string& id, bool enabled) override {
        Writing("SetFirewallRulesetEnabled",
                [&](json& s) {
                    const std::string pointer = RulesetEnabledPointer(s, id);
                    _sim.Bool(s, pointer);  // a ruleset of another shape is refused
                    s.at(json::json_pointer(pointer)) = enabled;
                },
                {id, enabled});
    }

    // The request is recorded first; the command then runs outside the
    // state's lock, since the host's tools change the state themselves.
    int RunCommandLine(const std::string& commandLine, bool logOutput, bool wait) override {
        Writing("RunCommandLine", [](json&) {}, {commandLine, logOutput, wait});
        return RunHostShell(commandLine, logOutput, wait);
    }

private:
    std::string RulesetEnabledPointer(const json& s, const std::string& id) const {
        if (!_sim.Object(s, "/firewall/rulesets").contains(id))
            throw _sim.Error("no firewall ruleset \"" + id + "\"");
        return "/firewall/rulesets/" + PointerStep(id) + "/enabled";
    }

    // Runs `read` on the latest state, unless a fault is set for `operation`.
    // Library errors that a state of an unexpected shape could still raise
    // are turned into the state's errors.
    template <typename Read>
    auto Reading(const char* operation, Read read) -> decltype(read(std::declval<const json&>())) {
        std::shared_ptr<const json> state = _sim.Read();
        try {
            if (Delay(*state, operation)) state = _sim.Read();
            CheckFault(*state, operation);
            return read(*state);
        } catch (const json::exception& e) {
            throw _sim.Error(JsonProblem(e));
        }
    }

    // Applies `change` to the latest state under the lock, unless a fault is
    // set for `operation`; nothing is written when it throws. When the host
    // name, the domain or the management address changed, the hosts file
    // follows, still under the lock.
    void Writing(const char* operation, const std::function<void(json&)>& change, json args = json::array()) {
        std::string hostname, domain, entry;
        try {
            Delay(*_sim.Read(), operation, args);
            _sim.Update(
                [&](json& s) {
                    CheckFault(s, operation, args);
                    hostname = DnsText(s, "hostname");
                    domain = DnsText(s, "domain");
                    entry = HostsFileEntry(s);
                    change(s);
                    // The host's own record of what it was asked to change.
                    _sim.AppendHistory(
                        s, {{"tool", "hostctl"}, {"operation", operation}, {"args", std::move(args)}});
                },
                [&](const json& s) {
                    if (DnsText(s, "hostname") == hostname && DnsText(s, "domain") == domain &&
                        HostsFileEntry(s) == entry)
                        return;
                    SyncHostsFile(_sim.Root(), s, {hostname, domain.empty() ? "" : hostname + "." + domain});
                });
        } catch (const json::exception& e) {
            throw _sim.Error(JsonProblem(e));
        }
    }

    // The entry of `table` ("faults" or "delays") for a call of `operation`:
    // one named by the operation and one of the call's arguments
    // ("AddNameServer 198.51.100.53") applies to the calls with that argument
    // only, and wins over one named by the operation alone.
    const json* Entry(const json& s, const char* table, const char* operation, const json& args) const {
        if (!IsSimulatedOperation(operation))
            throw std::logic_error(std::string("unlisted operation ") + operation);
        const auto found = s.find(table);
        if (found == s.end() || found->is_null()) return nullptr;
        if (!found->is_object()) throw _sim.Error(std::string("field /") + table + " must be an object");
        for (const json& arg : args) {
            if (!arg.is_string()) continue;
            const auto entry = found->find(std::string(operation) + " " + arg.get<std::string>());
            if (entry != found->end()) return &*entry;
        }
        const auto entry = found->find(operation);
        return entry == found->end() ? nullptr : &*entry;
    }

    void CheckFault(const json& s, const char* operation, const json& args = json::array()) const {
        const json* fault = Entry(s, "faults", operation, args);
        if (!fault) return;
        if (!fault->is_string())
            throw _sim.Error(std::string("field /faults/") + operation + " must be a string");
        throw HostCtlException(fault->get<std::string>());
    }

    // An operation with a delay takes that long before it acts, like a
    // host whose network stack is slow to answer. It waits outside the
    // state's lock: the host's tools and other consoles go on meanwhile.
    // True when it waited (the state may have changed).
    bool Delay(const json& s, const char* operation, const json& args = json::array()) const {
        const json* delay = Entry(s, "delays", operation, args);
        if (!delay) return false;
        if (!delay->is_number() || delay->get<double>() < 0)
            throw _sim.Error(std::string("field /delays/") + operation + " must be a number of seconds");
        std::this_thread::sleep_for(std::chrono::duration<double>(delay->get<double>()));
        return true;
    }

    static std::string DnsText(const json& s, const char* field) {
        const json::json_pointer at("/network/dns/" + std::string(field));
        return s.contains(at) && s.at(at).is_string() ? s.at(at).get<std::string>() : "";
    }

    static void CheckHostname(const std::string& hostname) {
        if (hostname.find('.') != std::string::npos ||
            !QelCtl::Network::DnsConfigImpl::IsValidDomainName(hostname))
            throw HostCtlException("\"" + hostname + "\" is not a valid host name");
    }

    // The running DNS configuration, and the saved one too when `persist`.
    std::vector<json*> DnsObjects(json& s, bool persist) {
        std::vector<json*> objects = {&ObjectAt(s, "/network/dns")};
        if (persist) objects.push_back(&ObjectAt(s, "/network/saved/dns"));
        return objects;
    }

    // The "name" of every member of the list at `pointer`.
    std::vector<std::string> Names(const json& s, const std::string& list) const {
        std::vector<std::string> names;
        for (size_t i = 0; i < _sim.Array(s, list).size(); ++i)
            names.push_back(_sim.String(s, At(list, i) + "/name"));
        return names;
    }

    void CheckNetstack(const std::string& netstack) const {
        if (netstack != DEFAULT_NETSTACK)
            throw HostCtlException("unknown network stack \"" + netstack + "\" (the host has only \"" +
                                   DEFAULT_NETSTACK + "\")");
    }

    // The object at `pointer`, created (with missing objects on the way) when
    // it is missing or null.
    json& ObjectAt(json& s, const std::string& pointer) {
        if (pointer.empty()) return s;
        const json::json_pointer at(pointer);
        if (!s.contains(at) || s.at(at).is_null())
            ObjectAt(s, at.parent_pointer().to_string())[at.back()] = json::object();
        json& v = s.at(at);
        if (!v.is_object()) throw _sim.Error("field " + pointer + " must be an object");
        return v;
    }

    Ipv4Address V4(const json& s, const std::string& pointer) const {
        std::string text = _sim.String(s, pointer);
        if (!Ipv4Address::IsValidAddress(text))
            throw _sim.Error("field " + pointer + " is not an IPv4 address: \"" + text + "\"");
        return Ipv4Address(text);
    }

    Ipv6Address V6(const json& s, const std::string& pointer) const {
        std::string text = _sim.String(s, pointer);
        if (!Ipv6Address::IsValidAddress(text))
            throw _sim.Error("field " + pointer + " is not an IPv6 address: \"" + text + "\"");
        return Ipv6Address(text);
    }

    Ipv6AddressType Ipv6Type(const json& s, const std::string& pointer) const {
        std::string text = _sim.String(s, pointer);
        if (text == "static") return Ipv6AddressType::Static;
        if (text == "dhcp") return Ipv6AddressType::Dhcp;
        if (text == "autoconf") return Ipv6AddressType::Autoconf;
        throw _sim.Error("field " + pointer + " must be \"static\", \"dhcp\" or \"autoconf\"");
    }

    std::vector<QelCtl::Hardware::DriverVmDevice> DriverVmDevices(const json& s) const {
        std::vector<QelCtl::Hardware::DriverVmDevice> devices;
        if (!s.contains("driverVm")) return devices;
        const std::string list = "/driverVm/devices";
        for (size_t i = 0; i < _sim.Array(s, list).size(); ++i) {
            const std::string p = At(list, i);
            QelCtl::Hardware::DriverVmDevice device;
            device.id = _sim.String(s, p + "/id");
            device.name = _sim.String(s, p + "/name");
            device.group = _sim.String(s, p + "/group");
            device.owned = _sim.Bool(s, p + "/owned");
            devices.push_back(std::move(device));
        }
        return devices;
    }

    AdvancedOptionValue OptionValue(const json& s, const std::string& name) const {
        const std::string p = "/advancedOptions/" + PointerStep(name);
        const json& v = _sim.Field(s, p);
        AdvancedOptionValue value;
        if (v.is_string()) {
            value.isInteger = false;
            value.text = v.get<std::string>();
        } else if (v.is_number_integer()) {
            value.integer = _sim.Integer(s, p);
        } else {
            throw _sim.Error("field " + p + " must be an integer or a string");
        }
        return value;
    }

    SimState _sim;
};

}  // namespace

std::unique_ptr<Backend> MakeSimulatedBackend(const std::string& root) {
    return std::make_unique<SimulatedBackend>(root);
}

const std::vector<std::string>& SimulatedOperations() { return OPERATIONS; }

}  // namespace HostCtl::Lib
