// Changing the management interface of a Debian host.
#include "NetworkApply.hpp"

#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <filesystem>
#include <nlohmann/json.hpp>
#include <sstream>
#include <thread>

#include "HostShell.hpp"
#include "LinkState.hpp"
#include "hostctl/Host.hpp"

namespace HostCtl::Lib::Linux {

namespace {

using Network::Ipv6AddressType;

// VM ports a reload of ifupdown2 must leave on their bridge: libvirt's
// vnetN, and tapN/fwprN/vethN of Proxmox-style hosts.
const char* const VM_PORTS = "^(tap|veth|fwpr|vnet)";

// How long the engine and the kernel get. ifup waits about a minute for a
// lease nobody gives: a change waiting for DHCP ends after DHCP_MS in all,
// the tool's run included. A put-back may run while the console ends, which
// waits PUT_BACK_MS for it: one bound for all of it, whatever the method.
constexpr int ENGINE_MS = 35000;
constexpr int STATIC_MS = 10000;
constexpr int DHCP_MS = 30000;
constexpr int PUT_BACK_MS = 30000;

using Clock = std::chrono::steady_clock;

// One bound for several steps: each gets what is left of it.
class Budget {
public:
    explicit Budget(int ms) : _ms(ms), _end(Clock::now() + std::chrono::milliseconds(ms)) {}
    int Left() const {
        return int(std::chrono::duration_cast<std::chrono::milliseconds>(_end - Clock::now()).count());
    }
    bool Over() const { return Clock::now() >= _end; }
    int Seconds() const { return _ms / 1000; }

private:
    int _ms;
    Clock::time_point _end;
};

bool Exists(const std::string& hostPath) {
    struct stat st {};
    return stat(HostPath(hostPath).c_str(), &st) == 0;
}

int PrefixLength(const Network::Ipv4Address& netmask) {
    int prefix = 0;
    for (uint32_t m = netmask.GetHostOrder(); m & 0x80000000u; m <<= 1) ++prefix;
    return prefix;
}

std::vector<Network::Ipv6Network> StaticIpv6(const Network::IpConfig& ip) {
    std::vector<Network::Ipv6Network> statics;
    for (const auto& n : ip.GetIpv6Network())
        if (n.GetIpv6AddressType() == Ipv6AddressType::Static && !n.GetAddress().IsLinkLocal())
            statics.push_back(n);
    return statics;
}

// The stanza of the interface and family that the edit works on, added
// (with `method`) when the files have none.
InterfacesFiles::Place StanzaFor(InterfacesFiles& files, const std::string& iface, const std::string& family,
                                 const std::string& method) {
    std::vector<InterfacesFiles::Place> found = files.FindIface(iface, family);
    if (!found.empty()) return found.front();
    // ifupdown2 allows a stanza without a family: its options serve both.
    found = files.FindIface(iface, std::string());
    if (!found.empty()) return found.front();
    // A new stanza goes beside the interface's other stanzas, in their file.
    std::vector<InterfacesFiles::Place> any = files.FindIface(iface);
    const size_t file = any.empty() ? 0 : any.front().file;
    if (files.Files().empty()) throw HostCtlException("/etc/network/interfaces: the file cannot be read");
    const size_t stanza = files.Files()[file].file.AddIface(iface, family, method);
    return {file, stanza};
}

InterfacesFile& FileOf(InterfacesFiles& files, const InterfacesFiles::Place& place) {
    return files.Files()[place.file].file;
}

void SetMethodIfFamily(InterfacesFile& file, size_t stanza, const std::string& method,
                       const std::string& what) {
    if (!file.Stanzas()[stanza].Family().empty()) {
        file.SetMethod(stanza, method);
        return;
    }
    if (method != "static")
        throw HostCtlException(what + ": the interface's stanza has no address family (\"iface " +
                               file.Stanzas()[stanza].Name() + "\"); give it one to use " + method);
}

void EditIpv4(InterfacesFiles& files, const PendingChange& change) {
    const Network::IpConfig& ip = *change.ip;
    const std::string method = ip.GetIpv4UseNone() ? "manual" : ip.GetUseDhcp() ? "dhcp" : "static";
    const InterfacesFiles::Place place = StanzaFor(files, change.iface, "inet", method);
    InterfacesFile& file = FileOf(files, place);
    SetMethodIfFamily(file, place.stanza, method, "setting IPv4 on " + change.iface);
    if (method == "static") {
        file.SetOption(
            place.stanza, "address",
            ip.GetIpv4Address().GetStringAddress() + "/" + std::to_string(PrefixLength(ip.GetIpv4Netmask())));
        file.RemoveOption(place.stanza, "netmask");
    } else {
        file.RemoveOption(place.stanza, "address");
        file.RemoveOption(place.stanza, "netmask");
        file.RemoveOption(place.stanza, "gateway");
    }
}

void EditGateway(InterfacesFiles& files, const std::string& iface, const std::string& family,
                 const std::string& gateway) {
    std::vector<InterfacesFiles::Place> found = files.FindIface(iface, family);
    for (const auto& p : files.FindIface(iface, std::string())) found.push_back(p);
    for (const auto& place : found) {
        InterfacesFile& file = FileOf(files, place);
        const std::string method = file.Stanzas()[place.stanza].Method();
        if (method != "static" && !file.Stanzas()[place.stanza].Family().empty()) continue;
        if (gateway.empty())
            file.RemoveOption(place.stanza, "gateway");
        else
            file.SetOption(place.stanza, "gateway", gateway);
        return;
    }
    if (!gateway.empty())
        throw HostCtlException("setting the " + std::string(family == "inet" ? "IPv4" : "IPv6") +
                               " gateway of " + iface +
                               ": the interface has no static address to route from");
}

void EditIpv6(InterfacesFiles& files, const PendingChange& change, Engine engine) {
    const Network::IpConfig& ip = *change.ip;
    const std::vector<Network::Ipv6Network> statics = StaticIpv6(ip);
    const bool ra = ip.GetUseIpv6RouterAdvertised();
    const bool dhcp = ip.GetUseIpv6Dhcp();
    const std::string what = "setting IPv6 on " + change.iface;
    if (statics.size() > 1)
        throw HostCtlException(what + ": one static IPv6 address per interface on a Debian host");
    if (!statics.empty() && dhcp)
        throw HostCtlException(what +
                               ": a static IPv6 address and DHCPv6 together need two stanzas; choose one");
    std::vector<InterfacesFiles::Place> found = files.FindIface(change.iface, "inet6");
    if (statics.empty() && !ra && !dhcp) {
        // No IPv6 of its own: the stanza goes manual, without addresses.
        for (const auto& place : found) {
            InterfacesFile& file = FileOf(files, place);
            file.SetMethod(place.stanza, "manual");
            for (const char* o : {"address", "netmask", "gateway", "autoconf", "accept_ra"})
                file.RemoveOption(place.stanza, o);
        }
        return;
    }
    // ifupdown makes SLAAC with "inet6 auto"; ifupdown2 refuses that method
    // and turns forwarding on for bridges, so it needs the kernel's switches
    // set outright.
    std::string method = !statics.empty()             ? "static"
                         : dhcp                       ? "dhcp"
                         : engine == Engine::Ifupdown ? "auto"
                                                      : "manual";
    const InterfacesFiles::Place place = StanzaFor(files, change.iface, "inet6", method);
    InterfacesFile& file = FileOf(files, place);
    SetMethodIfFamily(file, place.stanza, method, what);
    if (!statics.empty()) {
        file.SetOption(place.stanza, "address", statics.front().ToString());
        file.RemoveOption(place.stanza, "netmask");
    } else {
        file.RemoveOption(place.stanza, "address");
        file.RemoveOption(place.stanza, "netmask");
        file.RemoveOption(place.stanza, "gateway");
    }
    if (method == "auto") {
        file.RemoveOption(place.stanza, "accept_ra");
        file.RemoveOption(place.stanza, "autoconf");
    } else {
        file.SetOption(place.stanza, "accept_ra", ra ? "2" : "0");
        file.SetOption(place.stanza, "autoconf", ra ? "1" : "0");
    }
}

// The bridge (or bond) stanza that names the switch's NICs.
void EditUplinks(InterfacesFiles& files, const PendingChange& change) {
    const std::vector<std::string>& nics = *change.uplinks;
    std::string joined;
    for (const std::string& n : nics) joined += (joined.empty() ? "" : " ") + n;
    // The interface's bridge: the interface itself, or the lower one of a
    // VLAN interface "vmbr0.10".
    std::vector<std::string> candidates{change.iface};
    if (change.iface.find('.') != std::string::npos)
        candidates.push_back(change.iface.substr(0, change.iface.find('.')));
    for (const std::string& name : candidates) {
        for (const auto& place : files.FindIface(name)) {
            InterfacesFile& file = FileOf(files, place);
            std::optional<std::string> ports = file.Option(place.stanza, "bridge-ports");
            if (!ports) continue;
            // A bond as the bridge's only port: its slaves are the uplinks.
            const std::string port = ports->substr(0, ports->find(' '));
            for (const auto& bond : files.FindIface(port)) {
                InterfacesFile& bondFile = FileOf(files, bond);
                if (!bondFile.Option(bond.stanza, "bond-slaves")) continue;
                bondFile.SetOption(bond.stanza, "bond-slaves", joined);
                if (change.primary) bondFile.SetOption(bond.stanza, "bond-primary", *change.primary);
                return;
            }
            file.SetOption(place.stanza, "bridge-ports", joined);
            return;
        }
    }
    throw HostCtlException("setting the adapters of " + change.iface + ": no bridge-ports option names them");
}

// The file as kept: the host path below the folder.
void Keep(const std::string& folder, const std::string& path, const std::string& text, mode_t mode,
          bool once) {
    const std::string copy = HostPath(folder + path);
    std::error_code ec;
    if (once && std::filesystem::exists(copy, ec)) return;
    std::filesystem::create_directories(std::filesystem::path(copy).parent_path(), ec);
    if (ec) throw HostCtlException(folder + ": cannot create the folder: " + ec.message());
    ReplaceFile(copy, text, mode);
}

// True when the kernel shows what the change asked of the interface.
bool Shows(const PendingChange& change, std::string& missing) {
    const NetworkSnapshot net = ReadNetwork();
    const LinkInfo* link = net.FindLink(change.iface);
    if (link == nullptr) {
        missing = "the interface " + change.iface;
        return false;
    }
    const std::vector<const AddressInfo*> addresses = net.AddressesOf(link->index);
    auto has = [&](auto predicate) { return std::any_of(addresses.begin(), addresses.end(), predicate); };
    if (!change.ip) return true;
    const Network::IpConfig& ip = *change.ip;
    if (ip.GetUseDhcp()) {
        missing = "an address from a DHCP server";
        if (!has([](const AddressInfo* a) { return !a->ipv6 && !a->Permanent(); })) return false;
    } else if (!ip.GetIpv4UseNone()) {
        const std::string want = ip.GetIpv4Address().GetStringAddress();
        missing = want;
        if (!has([&](const AddressInfo* a) { return !a->ipv6 && a->address == want; })) return false;
    }
    for (const auto& n : StaticIpv6(ip)) {
        const std::string want = n.GetStringAddress();
        const AddressInfo* found = nullptr;
        for (const AddressInfo* a : addresses)
            if (a->ipv6 && a->address == want) found = a;
        missing = want;
        if (found != nullptr && found->DadFailed())
            throw HostCtlException(want + " is in use by another machine on the link");
        if (found == nullptr || found->Tentative()) return false;
    }
    return true;
}

void Run(const std::vector<std::string>& argv, const std::string& what, int boundMs = ENGINE_MS) {
    std::string output;
    const int bound = std::max(1000, boundMs);
    const int status = RunBounded(argv, bound, &output);
    std::string line = argv[0];
    for (size_t i = 1; i < argv.size(); ++i) line += " " + argv[i];
    if (status == -1)
        Syslog(LOG_WARNING, "%s: %s did not end within %.1f s", what.c_str(), line.c_str(), bound / 1000.0);
    // The tools' status is no proof either way: the kernel's state is.
    else if (status != 0)
        Syslog(LOG_WARNING, "%s: %s ended with status %d: %s", what.c_str(), line.c_str(), status,
               output.c_str());
}

// ifupdown2 reads accept_ra and autoconf only in a DHCPv6 stanza, and turns
// forwarding on for bridges (the kernel then ignores router advertisements
// unless accept_ra is 2): the running kernel's switches are set here.
void EnableRouterAdvertisements(const std::string& iface) {
    for (const auto& [key, value] : {std::pair{"accept_ra", "2\n"}, std::pair{"autoconf", "1\n"}}) {
        const std::string path = HostPath("/proc/sys/net/ipv6/conf/" + iface + "/" + key);
        const int fd = open(path.c_str(), O_WRONLY | O_CLOEXEC);
        if (fd < 0 || write(fd, value, 2) != 2)
            Syslog(LOG_WARNING, "Setting %s: %s", path.c_str(), std::strerror(errno));
        if (fd >= 0) close(fd);
    }
}

}  // namespace

Engine DetectEngine() {
    if (Exists("/sbin/ifreload")) return Engine::Ifupdown2;
    if (Exists("/sbin/ifup")) return Engine::Ifupdown;
    throw HostCtlException("changing the network: neither ifupdown nor ifupdown2 is installed");
}

std::string ConfiguredMethod(const InterfacesFiles& files, const std::string& iface,
                             const std::string& family) {
    for (const auto& place : files.FindIface(iface, family))
        return files.Files()[place.file].file.Stanzas()[place.stanza].Method();
    return "";
}

void EditForChange(InterfacesFiles& files, const PendingChange& change, Engine engine) {
    if (change.ip) {
        EditIpv4(files, change);
        EditIpv6(files, change, engine);
    }
    if (change.gateway4) EditGateway(files, change.iface, "inet", *change.gateway4);
    if (change.gateway6) EditGateway(files, change.iface, "inet6", *change.gateway6);
    if (change.uplinks) EditUplinks(files, change);
    if (engine == Engine::Ifupdown2) {
        // ifreload takes every port off a bridge that its file does not
        // name, VM ports included, unless the bridge condones them.
        for (auto& f : files.Files())
            for (size_t s = 0; s < f.file.Stanzas().size(); ++s)
                if (f.file.Stanzas()[s].keyword == "iface" && f.file.Option(s, "bridge-ports") &&
                    !f.file.Option(s, "bridge-ports-condone-regex"))
                    f.file.SetOption(s, "bridge-ports-condone-regex", VM_PORTS);
    }
}

namespace {

// The ports the files give the bridge `iface` (none when it is no bridge).
std::vector<std::string> BridgePorts(const InterfacesFiles& files, const std::string& iface) {
    std::vector<std::string> ports;
    for (const auto& place : files.FindIface(iface))
        if (auto option = files.Files()[place.file].file.Option(place.stanza, "bridge-ports")) {
            std::istringstream words(*option);
            for (std::string port; words >> port;)
                if (port != "none") ports.push_back(port);
        }
    return ports;
}

// ifdown without its hook scripts leaves a bridge's ports in place (VM ports
// must stay): a NIC the files no longer name is taken off by hand.
void ReleasePorts(const std::vector<std::string>& before, const std::vector<std::string>& after,
                  const std::string& what) {
    for (const std::string& nic : before)
        if (std::find(after.begin(), after.end(), nic) == after.end())
            Run({"/sbin/ip", "link", "set", "dev", nic, "nomaster"}, what);
}

// The files as they were: the very first ones once, the last ones each time
// (a revert puts these back).
void KeepFiles(const InterfacesFiles& files) {
    for (const auto& f : files.Files()) {
        Keep("/var/lib/velk/network/original", f.path, f.original, f.mode, true);
        Keep("/var/lib/velk/network/previous", f.path, f.original, f.mode, false);
    }
}

// Waits until the kernel shows the change, at most until `budget` is spent.
void WaitFor(const PendingChange& change, const Budget& budget, const std::string& what) {
    std::string missing;
    while (!Shows(change, missing)) {
        if (budget.Over())
            throw HostCtlException(what + ": " + missing + " did not appear within " +
                                   std::to_string(budget.Seconds()) + " s");
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
}

}  // namespace

void ApplyChange(const PendingChange& change) {
    if (change.Empty()) return;
    const Engine engine = DetectEngine();
    InterfacesFiles files;
    const std::vector<std::string> portsBefore = BridgePorts(files, change.iface);
    EditForChange(files, change, engine);
    const std::vector<InterfacesFiles::Change> changes = files.Changes();
    KeepFiles(files);
    const std::string what = "applying the network configuration of " + change.iface;
    const bool dhcp = change.ip && (change.ip->GetUseDhcp() || change.ip->GetUseIpv6Dhcp());
    const Budget budget(dhcp ? DHCP_MS : ENGINE_MS);
    if (engine == Engine::Ifupdown) {
        // Down with the old stanza and without the hook scripts: the bridge,
        // its ifindex and its VM ports stay; only the addresses go.
        Run({"/sbin/ifdown", "--no-scripts", "--force", change.iface}, what, budget.Left());
    }
    for (const auto& c : changes) ReplaceFile(HostPath(c.path), c.text, c.mode);
    if (engine == Engine::Ifupdown) {
        Run({"/sbin/ifup", change.iface}, what, budget.Left());
        ReleasePorts(portsBefore, BridgePorts(InterfacesFiles(), change.iface), what);
    } else {
        Run({"/sbin/ifreload", "-a"}, what, budget.Left());
    }
    if (engine == Engine::Ifupdown2 && change.ip && change.ip->GetUseIpv6RouterAdvertised())
        EnableRouterAdvertisements(change.iface);

    WaitFor(change, dhcp ? budget : Budget(STATIC_MS), what);
    Syslog(LOG_INFO, "Applied the network configuration of %s", change.iface.c_str());
}

std::string FactoryLayout(const std::string& bridge, const std::string& uplink,
                          const std::vector<std::string>& nics, Engine engine) {
    std::string text =
        "# The host's network as freshly installed, written by velk's network restore.\n"
        "# The files it replaced are kept in /var/lib/velk/network/previous.\n\n"
        "auto lo\niface lo inet loopback\n";
    for (const std::string& nic : nics) text += "\niface " + nic + " inet manual\n";
    text += "\nauto " + bridge + "\niface " + bridge + " inet dhcp\n\tbridge-ports " + uplink +
            "\n\tbridge-stp off\n\tbridge-fd 0\n";
    if (engine == Engine::Ifupdown2) text += std::string("\tbridge-ports-condone-regex ") + VM_PORTS + "\n";
    return text;
}

void ApplyFactoryLayout(const std::string& oldIface, const std::string& bridge, const std::string& uplink,
                        const std::vector<std::string>& nics) {
    const Engine engine = DetectEngine();
    InterfacesFiles files;
    if (files.Files().empty()) throw HostCtlException("/etc/network/interfaces: the file cannot be read");
    KeepFiles(files);
    const std::string what = "restoring the network";
    const Budget budget(DHCP_MS);
    if (engine == Engine::Ifupdown && !oldIface.empty())
        Run({"/sbin/ifdown", "--no-scripts", "--force", oldIface}, what, budget.Left());
    const auto& main = files.Files().front();
    ReplaceFile(HostPath(main.path), FactoryLayout(bridge, uplink, nics, engine), main.mode);
    if (engine == Engine::Ifupdown)
        Run({"/sbin/ifup", bridge}, what, budget.Left());
    else
        Run({"/sbin/ifreload", "-a"}, what, budget.Left());
    PendingChange lease;
    lease.iface = bridge;
    lease.ip.emplace();
    lease.ip->SetUseDhcp(true);
    WaitFor(lease, budget, what);
    Syslog(LOG_INFO, "Restored the network: %s on %s with DHCP", bridge.c_str(), uplink.c_str());
}

std::string SavedFiles() {
    nlohmann::json files = nlohmann::json::array();
    const InterfacesFiles read;
    for (const auto& f : read.Files())
        files.push_back({{"path", f.path}, {"mode", f.mode}, {"text", f.original}});
    return files.dump();
}

namespace {

struct SavedFile {
    std::string path;
    mode_t mode;
    std::string text;
};

// The text with every bridge keeping its VM ports across a reload of
// ifupdown2.
std::string CondoningVmPorts(const std::string& text) {
    InterfacesFile file(text);
    for (size_t s = 0; s < file.Stanzas().size(); ++s)
        if (file.Stanzas()[s].keyword == "iface" && file.Option(s, "bridge-ports") &&
            !file.Option(s, "bridge-ports-condone-regex"))
            file.SetOption(s, "bridge-ports-condone-regex", VM_PORTS);
    return file.Print();
}

// What the saved files give `iface`, as a change whose result to wait for.
PendingChange SavedChange(const std::vector<SavedFile>& files, const std::string& iface) {
    Network::IpConfig ip;
    ip.SetIpv4UseNone();
    std::vector<Network::Ipv6Network> ipv6;
    for (const SavedFile& f : files) {
        const InterfacesFile file(f.text);
        for (size_t s : file.FindIface(iface)) {
            const auto& stanza = file.Stanzas()[s];
            if (stanza.Family() == "inet" && stanza.Method() == "dhcp") ip.SetUseDhcp(true);
            if (stanza.Method() != "static" && !stanza.Family().empty()) continue;
            for (const std::string& value : file.OptionValues(s, "address")) {
                const std::string address = value.substr(0, value.find('/'));
                const int prefix = value.find('/') == std::string::npos
                                       ? 64
                                       : std::atoi(value.c_str() + value.find('/') + 1);
                if (Network::Ipv4Address::IsValidAddress(address)) {
                    ip.SetUseDhcp(false);
                    ip.SetIpv4Address(Network::Ipv4Address(address));
                } else if (Network::Ipv6Address::IsValidAddress(address)) {
                    ipv6.emplace_back(Network::Ipv6Address(address), prefix);
                }
            }
        }
    }
    ip.SetIpv6Network(ipv6);
    PendingChange change;
    change.iface = iface;
    change.ip = ip;
    return change;
}

}  // namespace

void PutBackFiles(const std::string& saved, const std::string& iface,
                  const std::function<void()>& alongside) {
    std::vector<SavedFile> files;
    try {
        for (const auto& f : nlohmann::json::parse(saved))
            files.push_back({f.at("path").get<std::string>(), f.at("mode").get<mode_t>(),
                             f.at("text").get<std::string>()});
    } catch (const nlohmann::json::exception& e) {
        throw HostCtlException(
            std::string("putting back the network configuration: not a saved configuration: ") + e.what());
    }
    if (files.empty())
        throw HostCtlException("putting back the network configuration: no interfaces file saved");
    const Engine engine = DetectEngine();
    const std::string what = "putting back the network configuration of " + iface;
    const PendingChange expected = SavedChange(files, iface);
    const Budget budget(PUT_BACK_MS);
    // A write that fails must not leave the interface down: the engine runs
    // anyway, and the failure is told afterwards.
    std::exception_ptr failed;
    auto write = [&](bool condone) {
        try {
            for (const SavedFile& f : files)
                ReplaceFile(HostPath(f.path), condone ? CondoningVmPorts(f.text) : f.text, f.mode);
        } catch (...) {
            failed = std::current_exception();
        }
    };
    auto besides = [&] {
        try {
            alongside();
        } catch (...) {
            if (!failed) failed = std::current_exception();
        }
    };
    if (engine == Engine::Ifupdown) {
        // Down with the files in force (they know what is up), without the
        // hook scripts: the bridge and its VM ports stay.
        const std::vector<std::string> portsBefore = BridgePorts(InterfacesFiles(), iface);
        Run({"/sbin/ifdown", "--no-scripts", "--force", iface}, what, budget.Left());
        write(false);
        besides();
        Run({"/sbin/ifup", iface}, what, budget.Left());
        ReleasePorts(portsBefore, BridgePorts(InterfacesFiles(), iface), what);
    } else {
        // ifreload takes VM ports off a bridge its file does not condone
        // them on: it reads the saved files with them condoned, and the
        // files then go back byte for byte.
        write(true);
        besides();
        Run({"/sbin/ifreload", "-a"}, what, budget.Left());
        write(false);
    }
    if (failed) std::rethrow_exception(failed);
    WaitFor(expected, budget, what);
    Syslog(LOG_INFO, "Put back the saved network configuration of %s", iface.c_str());
}

void SetInterfaceUp(const std::string& iface, bool up) {
    const Engine engine = DetectEngine();
    const std::string what = std::string(up ? "bringing up " : "taking down ") + iface;
    if (engine == Engine::Ifupdown)
        Run(up ? std::vector<std::string>{"/sbin/ifup", iface}
               : std::vector<std::string>{"/sbin/ifdown", "--no-scripts", "--force", iface},
            what);
    // ifupdown2 would delete a bridge, VM ports and all, on the way down: it
    // only reloads the configuration on the way up.
    else if (up)
        Run({"/sbin/ifreload", "-a"}, what);
}

}  // namespace HostCtl::Lib::Linux
