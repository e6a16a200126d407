#include "NetworkShapes.hpp"

#include <algorithm>
#include <stdexcept>

#include "hostctl/SimNetwork.hpp"

namespace VelkTools {

using nlohmann::json;

namespace {

const char* const MANAGEMENT_VNIC = "qk0";

bool Has(const std::vector<std::string>& list, const std::string& name) {
    return std::find(list.begin(), list.end(), name) != list.end();
}

json& ManagementVnic(json& state) {
    for (json& vnic : state["network"]["vnics"])
        if (vnic["name"] == MANAGEMENT_VNIC) return vnic;
    throw std::runtime_error(std::string("the host has no virtual NIC ") + MANAGEMENT_VNIC);
}

// Takes NICs off every standard and distributed switch.
void Detach(json& network, const std::vector<std::string>& pnics) {
    auto without = [&](const json& list) {
        json kept = json::array();
        for (const json& name : list)
            if (!Has(pnics, name.get<std::string>())) kept.push_back(name);
        return kept;
    };
    for (json& vswitch : network["vswitches"]) {
        vswitch["uplinks"] = without(vswitch["uplinks"]);
        vswitch["teaming"]["active"] = without(vswitch["teaming"]["active"]);
        vswitch["teaming"]["standby"] = without(vswitch["teaming"]["standby"]);
    }
    for (json& dvs : network["dvswitches"])
        for (json& port : dvs["uplinkPorts"])
            if (Has(pnics, port["pnic"].get<std::string>())) port["pnic"] = "";
}

void SingleNic(json& network) {
    json kept = json::array();
    std::vector<std::string> removed;
    for (const json& pnic : network["pnics"]) {
        if (pnic["name"] == "zonic0")
            kept.push_back(pnic);
        else
            removed.push_back(pnic["name"]);
    }
    Detach(network, removed);
    network["pnics"] = std::move(kept);
}

void Dvs(json& state) {
    json& network = state["network"];
    std::vector<std::string> uplinks;
    for (const json& pnic : network["pnics"])
        if (pnic["name"] == "zonic0" || pnic["name"] == "zonic1") uplinks.push_back(pnic["name"]);
    Detach(network, uplinks);
    json uplinkPorts = json::array();
    for (size_t i = 0; i < uplinks.size(); ++i)
        uplinkPorts.push_back({{"key", "uplink" + std::to_string(i + 1)}, {"pnic", uplinks[i]}});
    network["dvswitches"].push_back(
        {{"name", "kDS-1"},
         {"uplinkPorts", std::move(uplinkPorts)},
         {"ports",
          json::array(
              {{{"key", "100"}, {"vlan", 0}, {"hostLocal", false}, {"connectee", MANAGEMENT_VNIC}}})}});
    json& vnic = ManagementVnic(state);
    vnic.erase("portgroup");
    vnic["connectionType"] = 2;
    vnic["dvs"] = "kDS-1";
    vnic["port"] = "100";
}

void Ipv4Off(json& state) {
    json& vnic = ManagementVnic(state);
    vnic["ipv4"] = {{"dhcp", false}, {"none", true}, {"address", "0.0.0.0"}, {"netmask", "0.0.0.0"}};
    vnic["dhcpDns"] = false;
    state["network"]["saved"]["routing"]["ipv4Gateway"] = "0.0.0.0";
}

void Static(json& state) {
    json& vnic = ManagementVnic(state);
    vnic["ipv4"] = {
        {"dhcp", false}, {"none", false}, {"address", "192.0.2.10"}, {"netmask", "255.255.255.0"}};
    vnic["dhcpDns"] = false;
    json& saved = state["network"]["saved"];
    saved["routing"]["ipv4Gateway"] = "192.0.2.1";
    saved["dns"]["servers"] = json::array({"192.0.2.53"});
    const std::string domain = saved["dns"]["domain"];
    saved["dns"]["searchDomains"] = domain.empty() ? json::array() : json::array({domain});
}

}  // namespace

const std::vector<std::string>& NetworkShapeNames() {
    static const std::vector<std::string> names = {"single-nic", "dvs",     "ipv4-off",
                                                   "ipv6-off",   "no-dhcp", "static"};
    return names;
}

void ParseNetworkShapes(const std::string& text, std::vector<std::string>& shapes) {
    size_t start = 0;
    for (;;) {
        const size_t comma = text.find(',', start);
        const std::string name =
            text.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
        if (!Has(NetworkShapeNames(), name)) {
            std::string known;
            for (const std::string& n : NetworkShapeNames()) known += (known.empty() ? "" : ", ") + n;
            throw std::runtime_error("unknown network shape \"" + name + "\" (known: " + known + ")");
        }
        if (!Has(shapes, name)) shapes.push_back(name);
        if (comma == std::string::npos) return;
        start = comma + 1;
    }
}

void ApplyNetworkShapes(json& state, const std::vector<std::string>& shapes) {
    if (shapes.empty()) return;
    if (Has(shapes, "ipv4-off") && Has(shapes, "static"))
        throw std::runtime_error("the network shapes ipv4-off and static exclude each other");
    json& network = state["network"];
    if (Has(shapes, "single-nic")) SingleNic(network);
    if (Has(shapes, "dvs")) Dvs(state);
    if (Has(shapes, "ipv4-off")) Ipv4Off(state);
    if (Has(shapes, "ipv6-off")) {
        network["ipv6Enabled"] = false;
        network["ipv6EnabledAtBoot"] = false;
    }
    if (Has(shapes, "no-dhcp")) {
        network["lan"]["0"].erase("dhcp");
        network["saved"]["routing"]["ipv4Gateway"] = "0.0.0.0";
    }
    if (Has(shapes, "static")) Static(state);

    // A new host's network has handed out no leases yet: the boot obtains
    // what this host's configuration asks for.
    for (auto& [vlan, servers] : network["lan"].items())
        for (const char* kind : {"dhcp", "dhcpv6"})
            if (servers.contains(kind)) servers[kind]["leases"] = json::object();
    HostCtl::Lib::BootNetwork(HostCtl::Lib::SimState("."), state);
    // The network's DNS knows the host by the address it got.
    HostCtl::Lib::RegisterHostInDnsZone(state);
}

}  // namespace VelkTools
