// The backend of a simulated host: every operation reads or changes the
// host's state file through SimState, so that all processes working on the
// host see one state.
#include <climits>
#include <cstdint>
#include <functional>
#include <utility>

#include "hostctl/Backend.hpp"
#include "hostctl/SimState.hpp"

namespace HostCtl::Lib {

using nlohmann::json;

namespace {

using Network::Ipv4Address;
using Network::Ipv6Address;
using Network::Ipv6AddressType;
using Network::Ipv6Network;

const char* const DEFAULT_NETSTACK = "defaultTcpipStack";

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

const char* Ipv6TypeName(Ipv6AddressType type) {
    switch (type) {
        case Ipv6AddressType::Dhcp:
            return "dhcp";
        case Ipv6AddressType::Autoconf:
            return "autoconf";
        case Ipv6AddressType::Static:
            break;
    }
    return "static";
}

class SimulatedBackend : public Backend {
public:
    explicit SimulatedBackend(const std::string& root) : _sim(root) {}

    // Version and hardware.

    VersionRecord GetVersionRecord() override {
        return Reading([&](const json& s) {
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
        return Reading([&](const json& s) { return _sim.String(s, "/hardware/vendor"); });
    }

    std::string GetHardwareProduct() override {
        return Reading([&](const json& s) { return _sim.String(s, "/hardware/product"); });
    }

    unsigned GetCpuPackages() override {
        return Reading([&](const json& s) {
            uint64_t packages = _sim.Unsigned(s, "/hardware/cpu/packages");
            if (packages > UINT_MAX) throw _sim.Error("field /hardware/cpu/packages is too large");
            return unsigned(packages);
        });
    }

    std::string GetCpuModel() override {
        return Reading([&](const json& s) { return _sim.String(s, "/hardware/cpu/model"); });
    }

    uint64_t GetMemoryPageSize() override {
        return Reading([&](const json& s) { return _sim.Unsigned(s, "/hardware/memory/pageSize"); });
    }

    uint64_t GetMemoryTotalPages() override {
        return Reading([&](const json& s) { return _sim.Unsigned(s, "/hardware/memory/totalPages"); });
    }

    // Network.

    std::vector<Network::Pnic> GetPnics() override {
        return Reading([&](const json& s) {
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
                pnics.push_back(std::move(pnic));
            }
            return pnics;
        });
    }

    std::string GetManagementInterfaceName() override {
        return Reading([&](const json& s) { return _sim.String(s, "/network/managementInterface"); });
    }

    Network::IpConfig GetVnicIpConfig(const std::string& vnic) override {
        return Reading([&](const json& s) {
            const std::string p = VnicPointer(s, vnic);
            Network::IpConfig config;
            config.SetUseDhcp(_sim.Bool(s, p + "/ipv4/dhcp"));
            config.SetIpv4UseNone(_sim.Bool(s, p + "/ipv4/none"));
            config.SetIpv4Address(V4(s, p + "/ipv4/address"));
            config.SetIpv4Netmask(V4(s, p + "/ipv4/netmask"));
            config.SetIpv6Dhcp(_sim.Bool(s, p + "/ipv6/dhcp"));
            config.SetIpv6RouterAdvertisement(_sim.Bool(s, p + "/ipv6/routerAdvertisement"));
            std::vector<Ipv6Network> networks;
            const std::string list = p + "/ipv6/addresses";
            for (size_t i = 0; i < _sim.Array(s, list).size(); ++i) {
                const std::string a = At(list, i);
                int64_t prefix = _sim.Integer(s, a + "/prefix");
                if (prefix < 0 || prefix > 128) throw _sim.Error("field " + a + "/prefix must be 0 to 128");
                networks.emplace_back(V6(s, a + "/address"), int(prefix), Ipv6Type(s, a + "/type"));
            }
            config.SetIpv6Network(networks);
            return config;
        });
    }

    void SetVnicIpConfig(const std::string& vnic, const Network::IpConfig& config) override {
        Writing([&](json& s) {
            const std::string p = VnicPointer(s, vnic);
            json& ipv4 = ObjectAt(s, p + "/ipv4");
            ipv4["dhcp"] = config.GetUseDhcp();
            ipv4["none"] = config.GetIpv4UseNone();
            ipv4["address"] = config.GetIpv4Address().GetStringAddress();
            ipv4["netmask"] = config.GetIpv4Netmask().GetStringAddress();
            json& ipv6 = ObjectAt(s, p + "/ipv6");
            ipv6["dhcp"] = config.GetIpv6Dhcp();
            ipv6["routerAdvertisement"] = config.GetIpv6RouterAdvertisement();
            json addresses = json::array();
            for (const Ipv6Network& network : config.GetIpv6Network()) {
                addresses.push_back({{"address", network.GetStringAddress()},
                                     {"prefix", network.GetPrefixLength()},
                                     {"type", Ipv6TypeName(network.GetIpv6AddressType())}});
            }
            ipv6["addresses"] = std::move(addresses);
        });
    }

    Network::ConnectionPoint GetVnicConnectionPoint(const std::string& vnic) override {
        return Reading([&](const json& s) {
            const std::string p = VnicPointer(s, vnic);
            int64_t type = _sim.Integer(s, p + "/connectionType");
            if (type < 0 || type > 2) throw _sim.Error("field " + p + "/connectionType must be 0, 1 or 2");
            return Network::ConnectionPoint(int(type), _sim.String(s, p + "/portgroup"));
        });
    }

    bool GetIpv6Enabled() override {
        return Reading([&](const json& s) { return _sim.Bool(s, "/network/ipv6Enabled"); });
    }

    void SetIpv6Enabled(bool enabled) override {
        Writing([&](json& s) { ObjectAt(s, "/network")["ipv6Enabled"] = enabled; });
    }

    DnsSettings GetDns(const std::string& netstack) override {
        return Reading([&](const json& s) {
            CheckNetstack(netstack);
            const std::string p = "/network/dns";
            DnsSettings dns;
            dns.hostname = _sim.String(s, p + "/hostname");
            dns.domain = _sim.String(s, p + "/domain");
            dns.dhcp = _sim.Bool(s, p + "/dhcp");
            for (size_t i = 0; i < _sim.Array(s, p + "/servers").size(); ++i)
                dns.servers.push_back(V4(s, At(p + "/servers", i)));
            for (size_t i = 0; i < _sim.Array(s, p + "/ipv6Servers").size(); ++i)
                dns.ipv6Servers.push_back(V6(s, At(p + "/ipv6Servers", i)));
            dns.searchDomains = _sim.StringList(s, p + "/searchDomains");
            return dns;
        });
    }

    void SetDns(const std::string& netstack, const DnsSettings& settings, unsigned fields) override {
        CheckNetstack(netstack);
        Writing([&](json& s) {
            json& dns = ObjectAt(s, "/network/dns");
            if (fields & DnsHostname) dns["hostname"] = settings.hostname;
            if (fields & DnsDomain) dns["domain"] = settings.domain;
            if (fields & DnsDhcp) dns["dhcp"] = settings.dhcp;
            if (fields & DnsServers) {
                json v4 = json::array();
                for (const Ipv4Address& a : settings.servers) v4.push_back(a.GetStringAddress());
                json v6 = json::array();
                for (const Ipv6Address& a : settings.ipv6Servers) v6.push_back(a.GetStringAddress());
                dns["servers"] = std::move(v4);
                dns["ipv6Servers"] = std::move(v6);
            }
            if (fields & DnsSearchDomains) dns["searchDomains"] = settings.searchDomains;
        });
    }

    RouteSettings GetRouting(const std::string& netstack) override {
        return Reading([&](const json& s) {
            CheckNetstack(netstack);
            RouteSettings routes;
            routes.ipv4Gateway = V4(s, "/network/routing/ipv4Gateway");
            routes.ipv6Gateway = V6(s, "/network/routing/ipv6Gateway");
            return routes;
        });
    }

    void SetRouting(const std::string& netstack, const RouteSettings& settings, unsigned fields) override {
        CheckNetstack(netstack);
        Writing([&](json& s) {
            json& routing = ObjectAt(s, "/network/routing");
            if (fields & RouteIpv4Gateway) routing["ipv4Gateway"] = settings.ipv4Gateway.GetStringAddress();
            if (fields & RouteIpv6Gateway) routing["ipv6Gateway"] = settings.ipv6Gateway.GetStringAddress();
        });
    }

    std::vector<std::string> GetVirtualSwitchNames() override {
        return Reading([&](const json& s) {
            std::vector<std::string> names;
            const std::string list = "/network/vswitches";
            for (size_t i = 0; i < _sim.Array(s, list).size(); ++i)
                names.push_back(_sim.String(s, At(list, i) + "/name"));
            return names;
        });
    }

    // System.

    std::string GetWelcomeMessage() override {
        return Reading([&](const json& s) { return _sim.String(s, "/system/welcomeMessage"); });
    }

    std::string GetSystemAlert() override {
        return Reading([&](const json& s) { return _sim.String(s, "/system/systemAlert"); });
    }

    void SetSystemAlert(const std::string& alert) override {
        Writing([&](json& s) { ObjectAt(s, "/system")["systemAlert"] = alert; });
    }

    QelCtl::System::BootOptions GetBootOptions() override {
        return Reading([&](const json& s) {
            QelCtl::System::BootOptions options;
            options.auditMode = _sim.Bool(s, "/system/bootOptions/auditMode");
            return options;
        });
    }

    std::string GetKeyboardLayout() override {
        return Reading([&](const json& s) { return _sim.String(s, "/system/keyboardLayout"); });
    }

    void SetKeyboardLayout(const std::string& layout) override {
        Writing([&](json& s) {
            bool known = false;
            for (const std::string& name : _sim.StringList(s, "/system/keyboardLayouts"))
                known |= name == layout;
            if (!known) throw _sim.Error("unknown keyboard layout \"" + layout + "\"");
            ObjectAt(s, "/system")["keyboardLayout"] = layout;
        });
    }

    std::vector<std::string> GetKeyboardLayouts() override {
        return Reading([&](const json& s) { return _sim.StringList(s, "/system/keyboardLayouts"); });
    }

    // The simulated console driver only remembers which mappings it holds.
    void LoadKeyboardMappings(const std::string& layout) override {
        Writing([&](json& s) {
            bool known = false;
            for (const std::string& name : _sim.StringList(s, "/system/keyboardLayouts"))
                known |= name == layout;
            if (!known) throw _sim.Error("no key mappings for keyboard layout \"" + layout + "\"");
            ObjectAt(s, "/system")["loadedKeymap"] = layout;
        });
    }

    // Options.

    std::optional<AdvancedOptionValue> FindAdvancedOption(const std::string& name) override {
        return Reading([&](const json& s) -> std::optional<AdvancedOptionValue> {
            if (!_sim.Object(s, "/advancedOptions").contains(name)) return std::nullopt;
            return OptionValue(s, name);
        });
    }

    void SetAdvancedOption(const std::string& name, const AdvancedOptionValue& value) override {
        Writing([&](json& s) {
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
        return Reading([&](const json& s) { return _sim.Object(s, "/userOptions").contains(name); });
    }

    // Smart cards.

    std::vector<QelCtl::Hardware::SmartCardSlot> GetSmartCardSlots() override {
        return Reading([&](const json& s) {
            std::vector<QelCtl::Hardware::SmartCardSlot> slots;
            const std::string list = "/smartCards/slots";
            for (size_t i = 0; i < _sim.Array(s, list).size(); ++i)
                slots.push_back({_sim.String(s, At(list, i) + "/name")});
            return slots;
        });
    }

    std::optional<QelCtl::Hardware::SmartCardToken> GetSmartCardToken(const std::string& slot) override {
        return Reading([&](const json& s) -> std::optional<QelCtl::Hardware::SmartCardToken> {
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
        return Reading([&](const json& s) { return _sim.Unsigned(s, "/vms/running") > 0; });
    }

    // Driver VM. A host without "/driverVm" has no driver VM and no devices.

    int GetDriverVmState() override {
        return Reading([&](const json& s) {
            if (!s.contains("driverVm")) return 0;
            int64_t state = _sim.Integer(s, "/driverVm/state");
            if (state < 0 || state > 2) throw _sim.Error("field /driverVm/state must be 0, 1 or 2");
            return int(state);
        });
    }

    std::vector<QelCtl::Hardware::DriverVmDevice> GetDriverVmDevices() override {
        return Reading([&](const json& s) { return DriverVmDevices(s); });
    }

    void SetDriverVmOwned(const std::vector<std::string>& ownedIds) override {
        Writing([&](json& s) {
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

private:
    // Runs `read` on the latest state. Library errors that a state of an
    // unexpected shape could still raise are turned into the state's errors.
    template <typename Read>
    auto Reading(Read read) -> decltype(read(std::declval<const json&>())) {
        std::shared_ptr<const json> state = _sim.Read();
        try {
            return read(*state);
        } catch (const json::exception& e) {
            throw _sim.Error(JsonProblem(e));
        }
    }

    // Applies `change` to the latest state under the lock; nothing is written
    // when it throws.
    void Writing(const std::function<void(json&)>& change) {
        try {
            _sim.Update(change);
        } catch (const json::exception& e) {
            throw _sim.Error(JsonProblem(e));
        }
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

    // The pointer of the virtual NIC with that name.
    std::string VnicPointer(const json& s, const std::string& vnic) const {
        const std::string list = "/network/vnics";
        for (size_t i = 0; i < _sim.Array(s, list).size(); ++i) {
            if (_sim.String(s, At(list, i) + "/name") == vnic) return At(list, i);
        }
        throw _sim.Error("no virtual NIC named \"" + vnic + "\"");
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

}  // namespace HostCtl::Lib
