// A change of the management network on trial: the configuration before it,
// saved in one file whose existence marks the change as pending, the checks
// after it, and keeping or putting back. Works on any host through the
// backend.
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <functional>
#include <nlohmann/json.hpp>
#include <optional>

#include "hostctl/Backend.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace QelCtl::Network {

using HostCtl::Lib::GetBackend;
using HostCtl::Lib::HostCtlException;
using nlohmann::json;

namespace {

const char* const TRIAL_FILE = "/var/lib/velk/network/trial";
const char* const NETSTACK = "defaultTcpipStack";

// What the marker holds.
struct Saved {
    std::string config;
    std::string description;
    std::string user;
    std::string time;
    // The management interface when the change began: a change that takes
    // its address away also takes away what finds it again.
    std::string iface;
};

std::string MarkerPath() { return HostCtl::Lib::HostPath(TRIAL_FILE); }

std::string FolderOf(const std::string& path) { return path.substr(0, path.rfind('/')); }

// Runs `body` with the marker's folder (made when missing) locked against the
// other consoles of the host; `body` gets the folder's descriptor, to flush it.
void Locked(const std::function<void(int folderFd)>& body) {
    HostCtl::Lib::WithFolderLock(FolderOf(MarkerPath()), body);
}

// The console that has a change on trial holds a shared lock on the marker
// until it keeps or puts back the change; the kernel drops the lock with the
// console, so a marker nobody holds was left behind. Opened close-on-exec: a
// program the console runs (a DHCP client that stays) must not keep it.
int g_ownerFd = -1;

void Disown() {
    if (g_ownerFd >= 0) close(g_ownerFd);
    g_ownerFd = -1;
}

// Whether this console holds the marker as it is now.
bool Owned() {
    struct stat held, now;
    return g_ownerFd >= 0 && fstat(g_ownerFd, &held) == 0 && stat(MarkerPath().c_str(), &now) == 0 &&
           held.st_dev == now.st_dev && held.st_ino == now.st_ino;
}

void Own() {
    Disown();
    const std::string path = MarkerPath();
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0 || flock(fd, LOCK_SH | LOCK_NB) < 0) {
        const int err = errno;
        if (fd >= 0) close(fd);
        throw HostCtlException(path + ": cannot lock: " + std::strerror(err));
    }
    g_ownerFd = fd;
}

// Whether another running console holds the marker.
bool HeldElsewhere() {
    if (Owned()) return false;
    const int fd = open(MarkerPath().c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) return false;
    const bool held = flock(fd, LOCK_EX | LOCK_NB) < 0 && errno == EWOULDBLOCK;
    close(fd);
    return held;
}

// The saved configuration, or nothing when no change is pending. A marker
// that cannot be read or makes no sense is logged and moved aside: nothing
// of it is ever applied, and the console is not asked again at every start.
std::optional<Saved> Load() {
    const std::string path = MarkerPath();
    struct stat st;
    if (stat(path.c_str(), &st) < 0) {
        if (errno == ENOENT) return std::nullopt;
        throw HostCtlException(path + ": cannot read: " + std::strerror(errno));
    }
    std::string text;
    std::string problem;
    Saved saved;
    if (!HostCtl::Lib::ReadText(path, text)) {
        problem = "cannot be read";
    } else {
        const json marker = json::parse(text, nullptr, false);
        auto field = [&](const char* name, std::string& into) {
            if (!marker.is_object() || !marker.contains(name) || !marker[name].is_string()) return false;
            into = marker[name].get<std::string>();
            return true;
        };
        if (!field("config", saved.config) || !field("description", saved.description) ||
            !field("user", saved.user) || !field("time", saved.time) || saved.config.empty())
            problem = "is not a saved network configuration";
        else if (marker.contains("iface") && marker["iface"].is_string())
            saved.iface = marker["iface"].get<std::string>();
    }
    if (problem.empty()) return saved;
    const std::string aside = path + ".unreadable";
    if (rename(path.c_str(), aside.c_str()) == 0)
        HostCtl::Lib::Syslog(LOG_ERR, "%s %s; moved to %s, nothing put back", path.c_str(), problem.c_str(),
                             aside.c_str());
    else
        HostCtl::Lib::Syslog(LOG_ERR, "%s %s and cannot be moved aside (%s); nothing put back", path.c_str(),
                             problem.c_str(), std::strerror(errno));
    return std::nullopt;
}

// Whether the host has no marker: then nothing is locked (nor the marker's
// folder made) for the question.
bool NoMarker() {
    struct stat st;
    return stat(MarkerPath().c_str(), &st) < 0 && errno == ENOENT;
}

// The marker read under the lock.
std::optional<Saved> ReadSaved() {
    if (NoMarker()) return std::nullopt;
    std::optional<Saved> saved;
    Locked([&](int) { saved = Load(); });
    return saved;
}

std::string OnTrialElsewhere(const Saved& saved) {
    return "a network change by " + saved.user + " is on trial at another console";
}

// Removes the marker so that a crash right after cannot bring it back.
void RemoveMarker(int folderFd) {
    const std::string path = MarkerPath();
    if (unlink(path.c_str()) < 0 && errno != ENOENT)
        throw HostCtlException(path + ": cannot remove: " + std::strerror(errno));
    if (fsync(folderFd) < 0)
        throw HostCtlException(FolderOf(path) + ": cannot flush: " + std::strerror(errno));
}

std::string Joined(const std::vector<std::string>& items, const std::string& none = "none") {
    if (items.empty()) return none;
    std::string out;
    for (const std::string& item : items) out += (out.empty() ? "" : " ") + item;
    return out;
}

// "/24" for a netmask, the mask itself when it is none.
std::string MaskText(const HostCtl::Network::Ipv4Address& mask) {
    if (!mask.IsValidNetmask()) return "/" + mask.GetStringAddress();
    int bits = 0;
    for (uint32_t m = mask.GetHostOrder(); m != 0; m <<= 1) ++bits;
    return "/" + std::to_string(bits);
}

// One piece of the description; a piece the host cannot tell says so
// instead of losing the others.
std::string Piece(const std::string& label, const std::function<std::string()>& read) {
    try {
        return label + " " + read();
    } catch (const HostCtlException&) {
        return label + " unknown";
    }
}

}  // namespace

std::optional<std::string> NetworkTrialImpl::ProbeAddress(const HostCtl::Network::Ipv4Address& address) {
    const std::string vnic = GetBackend().GetManagementInterfaceName();
    if (vnic.empty()) return std::nullopt;  // no link to ask on
    const std::optional<std::string> who = GetBackend().ProbeIpv4Address(vnic, address);
    if (!who) return std::nullopt;
    return address.GetStringAddress() + " is already used on the management network by " + *who;
}

PendingChange NetworkTrialImpl::Save(const std::string& user) {
    PendingChange saved;
    Locked([&](int) {
        // The configuration of the first change on trial is the one to go
        // back to: a change still pending is taken over, not replaced.
        if (const std::optional<Saved> pending = Load()) {
            if (HeldElsewhere()) throw HostCtlException(OnTrialElsewhere(*pending));
            Own();
            saved = {pending->user, pending->description, false};
            return;
        }
        saved = {user, Describe(), false};
        json marker = {{"config", GetBackend().GetNetworkConfig()},
                       {"description", saved.description},
                       {"user", user},
                       {"time", HostCtl::Lib::UtcTimestamp()},
                       {"iface", GetBackend().GetManagementInterfaceName()}};
        HostCtl::Lib::ReplaceFile(MarkerPath(), marker.dump(2) + "\n", 0600);
        Own();
    });
    return saved;
}

std::optional<PendingChange> NetworkTrialImpl::Pending() {
    std::optional<PendingChange> pending;
    if (NoMarker()) return pending;
    Locked([&](int) {
        if (const std::optional<Saved> saved = Load())
            pending = PendingChange{saved->user, saved->description, HeldElsewhere()};
    });
    return pending;
}

std::vector<NetworkCheck> NetworkTrialImpl::Check() {
    std::string vnic = GetBackend().GetManagementInterfaceName();
    if (vnic.empty()) {
        if (const std::optional<Saved> saved = ReadSaved()) vnic = saved->iface;
    }
    if (vnic.empty()) return {{"management interface", NetworkCheck::Outcome::Failed, "none"}};
    return GetBackend().CheckNetwork(vnic);
}

bool NetworkTrialImpl::Passed(const std::vector<NetworkCheck>& checks) {
    return std::none_of(checks.begin(), checks.end(),
                        [](const NetworkCheck& c) { return c.outcome == NetworkCheck::Outcome::Failed; });
}

void NetworkTrialImpl::Keep() {
    Locked([](int folderFd) {
        RemoveMarker(folderFd);
        Disown();
    });
}

void NetworkTrialImpl::Revert() {
    Locked([](int folderFd) {
        const std::optional<Saved> saved = Load();
        if (!saved) throw HostCtlException("no saved network configuration to put back");
        if (HeldElsewhere()) throw HostCtlException(OnTrialElsewhere(*saved));
        GetBackend().SetNetworkConfig(saved->config);
        RemoveMarker(folderFd);
        Disown();
    });
}

std::string NetworkTrialImpl::Describe() {
    using namespace HostCtl::Network;
    HostCtl::Lib::Backend& host = GetBackend();
    const std::string vnic = host.GetManagementInterfaceName();
    if (vnic.empty()) return "no management interface";
    std::vector<std::string> parts = {"management interface " + vnic};

    parts.push_back(Piece("IPv4", [&] {
        const IpConfig c = host.GetVnicIpConfig(vnic);
        if (c.GetIpv4UseNone()) return std::string("off");
        std::string text = c.GetIpv4Address().IsZero()
                               ? std::string("no address")
                               : c.GetIpv4Address().GetStringAddress() + MaskText(c.GetIpv4Netmask());
        return c.GetUseDhcp() ? "DHCP " + text : text;
    }));
    parts.push_back(Piece("IPv6", [&] {
        const IpConfig c = host.GetVnicIpConfig(vnic);
        std::vector<std::string> addresses;
        for (const Ipv6Network& n : c.GetIpv6Network())
            if (!n.GetAddress().IsLinkLocal()) addresses.push_back(n.ToString());
        return Joined(addresses);
    }));
    parts.push_back(Piece("gateways", [&] {
        const HostCtl::Lib::RouteSettings r = host.GetRouting(NETSTACK);
        std::vector<std::string> gateways;
        if (!r.ipv4Gateway.IsZero()) gateways.push_back(r.ipv4Gateway.GetStringAddress());
        if (!r.ipv6Gateway.IsZero()) gateways.push_back(r.ipv6Gateway.GetStringAddress());
        return Joined(gateways);
    }));
    // Where the interface is connected: the VLAN and the adapters its
    // traffic leaves by.
    std::string vlan = "unknown", adapters = "unknown";
    try {
        const ConnectionPoint point = host.GetVnicConnectionPoint(vnic);
        if (point.GetType() == ConnectionPoint::PortGroup) {
            const std::string vswitch = host.GetConnectionPointSwitch(point);
            vlan = std::to_string(host.GetPortGroupVlanId(vswitch, point.GetName()));
            const TeamingPolicy policy = host.GetTeamingPolicy(vswitch);
            std::vector<std::string> names = policy.activeUplinks;
            for (const std::string& standby : policy.standbyUplinks) names.push_back(standby + "(standby)");
            adapters = Joined(names);
        } else if (point.GetType() == ConnectionPoint::DvsPort) {
            const std::string dvs = host.GetConnectionPointSwitch(point);
            const DistributedSwitch::PortSettings settings = host.GetDvsPortSettings(dvs, point.GetName());
            vlan = std::to_string(settings.vlanId);
            std::vector<std::string> names;
            for (const DistributedSwitch::UplinkPort& port : host.GetDvsUplinkPorts(dvs)) {
                const bool allowed = settings.uplinks.empty() ||
                                     std::find(settings.uplinks.begin(), settings.uplinks.end(), port.key) !=
                                         settings.uplinks.end();
                if (allowed && !port.pnic.empty()) names.push_back(port.pnic);
            }
            adapters = Joined(names);
        } else {
            vlan = adapters = "none";
        }
    } catch (const HostCtlException&) {
    }
    parts.push_back("VLAN " + vlan);
    parts.push_back("adapters " + adapters);
    std::string fqdn;
    parts.push_back(Piece("name servers", [&] {
        const HostCtl::Lib::DnsSettings dns = host.GetDns(NETSTACK);
        fqdn = dns.domain.empty() ? dns.hostname : dns.hostname + "." + dns.domain;
        std::vector<std::string> servers;
        for (const Ipv4Address& s : dns.servers) servers.push_back(s.GetStringAddress());
        for (const Ipv6Address& s : dns.ipv6Servers) servers.push_back(s.GetStringAddress());
        return Joined(servers);
    }));
    parts.push_back("host name " + (fqdn.empty() ? std::string("unknown") : fqdn));
    std::string line;
    for (const std::string& part : parts) line += (line.empty() ? "" : ", ") + part;
    return line;
}

}  // namespace QelCtl::Network
