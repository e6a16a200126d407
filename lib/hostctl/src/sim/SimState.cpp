// The simulated host's state file: cached reads, locked atomic writes.
#include "hostctl/SimState.hpp"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <system_error>

#include "UniqueFd.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/SimNetwork.hpp"

namespace HostCtl::Lib {

using nlohmann::json;

namespace {

std::string ErrnoText(int err) { return std::error_code(err, std::generic_category()).message(); }

using Fd = UniqueFd;

bool Later(const timespec& a, const timespec& b) {
    return a.tv_sec > b.tv_sec || (a.tv_sec == b.tv_sec && a.tv_nsec > b.tv_nsec);
}

bool WriteAll(int fd, const std::string& data) {
    size_t done = 0;
    while (done < data.size()) {
        ssize_t n = write(fd, data.data() + done, data.size() - done);
        if (n < 0) {
            if (errno == EINTR) continue;
            return false;
        }
        done += size_t(n);
    }
    return true;
}

// The default state, as a JSON text so that it reads like the state file.
// Fields whose meaning the names do not tell:
//
// "network" (the network stack "defaultTcpipStack"; SimNetwork.cpp holds its
// rules):
// - "pnics": the physical NICs; "label" is the PCI device's hardware label
//   ("" when it has none), "speedMbps" 0 while the link is down.
// - "vnics": the host's virtual NICs. "mac" (the first virtual NIC takes the
//   MAC of its switch's first uplink), "enabled" (up or down), "dhcpDns"
//   (name servers and domain from DHCP). "connectionType" is 0 (not
//   connected), 1 (a port group of a standard switch, named by "portgroup"),
//   2 (port "port" of distributed switch "dvs") or 3 (an opaque network whose
//   id is "portgroup"). "ipv4": "dhcp", "none" (IPv4 off; wins over "dhcp"),
//   and the address and netmask it holds now (static, leased, or 0.0.0.0
//   without an answer).
//   "ipv6": the "dhcp" (DHCPv6) and "routerAdvertisement" switches, the
//   configured "static" addresses ({"address", "prefix"}) and the
//   "addresses" the interface holds now, each with a "type" of "static",
//   "dhcp" or "autoconf" (link-local and router-advertised ones); none while
//   the kernel has no IPv6.
// - "vswitches": standard switches; "uplinks" are the attached NICs, the
//   teaming policy's "active" and "standby" lists hold only attached ones, at
//   most "maxActiveUplinks" active; port groups have a "vlan" (0 untagged,
//   4095 all VLANs).
// - "dvswitches": distributed switches the host is a member of: uplink ports
//   ({"key", "pnic"}, "pnic" "" when no NIC backs the port) and ports
//   ({"key", "vlan", "hostLocal", "connectee"}: the virtual NIC on the port,
//   or ""; optional "blocked": the port passes nothing, and "uplinks": the
//   keys of the only uplink ports its traffic may use).
// - "ipv6Enabled": IPv6 in the running kernel; "ipv6EnabledAtBoot": what the
//   next boot gives it.
// - "dns", "routing": the running name service and default gateways
//   ("0.0.0.0" and "::" for none); "saved": {"dns", "routing"}, the
//   configuration the host boots with.
// - "lan": the physical network every uplink is cabled to, by VLAN id as
//   text ("0" untagged). A VLAN may have a DHCP server "dhcp" (pool "first" to
//   "last", "netmask", "gateway", "dns", "domain", and its "leases" by MAC), an
//   IPv6 router "routerAdvertisement" ("prefix", "prefixLength", the "router"
//   address) and a DHCPv6 server "dhcpv6" ("first", "last", "dns", "leases").
//   "hosts" are the machines on the VLAN's segment, by address: {"dns": true
//   for a DNS server, "delayMs": how long its answer to a ping takes,
//   "name": how it answers a probe for its address (optional)}. The
//   segment's machines, its DHCP "gateway", its IPv6 "router" and the other
//   clients' leases hold their addresses: the host's checks find them as
//   duplicates.
// - "remote": the machines beyond the routers, in the same shape; reached
//   through the default gateway. "dnsZone": what the network's DNS servers
//   answer, {"name": ["address", ...]}. "pingTimeoutMs": how long qelping
//   waits for an answer that never comes.
// - "netDumper": the network core dump sender, "enabled" on "interface"; the
//   network configuration cannot be cleared while it holds one.
// - "factory": the names of a freshly installed host's network: its standard
//   switch "vswitch", management port group "portgroup" and interface "vnic".
//
// "faults": {operation: message}: the simulated backend's operation of that
// name (a Backend method name) fails with the message and changes nothing;
// "operation word" makes only the calls with that argument fail. "delays":
// {operation: seconds} (set by velk-simhost slow), named the same way: the
// operation waits that long before it acts.
//
// Services and firewall: "services" holds the local shell ("tarnShell") and
// SSH ("ssh"), each "running" now and "enabled" (started with the host);
// "hostAgent"/"running" is false while the management agents are stopped;
// "firewall"/"rulesets" holds each ruleset by id with its "enabled" flag.
// "toolFaults" and "toolDelays" (set by velk-simhost fail and slow) make the
// host's tools fail or take their time.
//
// Elsewhere: a smart-card slot's "token" is null when the slot is empty, else
// {"label": text, "userIds": [text, ...]}; advanced options hold an integer or
// a text; "userOptions" holds the names of the user options that are set.
const char* const DEFAULT_STATE = R"({
  "version": {"product": "Tarni", "version": "8.0.2", "kernelRelease": "8.0.2",
              "build": "releasebuild-22380479", "buildNumber": 22380479},
  "hardware": {
    "vendor": "Acme",
    "product": "Acme Server 9",
    "cpu": {"packages": 2, "model": "Acme Processor A9-2400 @ 2.40GHz"},
    "memory": {"pageSize": 4096, "totalPages": 4194304}
  },
  "network": {
    "ipv6Enabled": true,
    "ipv6EnabledAtBoot": true,
    "managementInterface": "qk0",
    "pnics": [
      {"name": "zonic0", "mac": "00:50:56:01:00:02", "driver": "e1000e", "linkUp": true, "speedMbps": 1000,
       "description": "Acme Gigabit Ethernet Controller", "label": "NIC 1"},
      {"name": "zonic1", "mac": "00:50:56:01:00:03", "driver": "e1000e", "linkUp": true, "speedMbps": 1000,
       "description": "Acme Gigabit Ethernet Controller", "label": "NIC 2"},
      {"name": "zonic2", "mac": "00:50:56:01:00:04", "driver": "ixgben", "linkUp": true, "speedMbps": 10000,
       "description": "Brightwave 10G Ethernet Adapter", "label": ""},
      {"name": "zonic3", "mac": "00:50:56:01:00:05", "driver": "e1000e", "linkUp": false, "speedMbps": 0,
       "description": "Acme Gigabit Ethernet Controller", "label": "Embedded LOM Port 4"}
    ],
    "vswitches": [
      {"name": "kSwitch0", "uplinks": ["zonic0"], "maxActiveUplinks": 2,
       "teaming": {"active": ["zonic0"], "standby": []},
       "portgroups": [{"name": "Management Network", "vlan": 0}]},
      {"name": "kSwitch1", "uplinks": ["zonic2"], "maxActiveUplinks": 2,
       "teaming": {"active": ["zonic2"], "standby": []},
       "portgroups": [{"name": "VM Network", "vlan": 0}]}
    ],
    "dvswitches": [],
    "vnics": [{
      "name": "qk0", "mac": "00:50:56:01:00:02", "enabled": true, "dhcpDns": true,
      "connectionType": 1, "portgroup": "Management Network",
      "ipv4": {"dhcp": true, "none": false, "address": "192.0.2.100", "netmask": "255.255.255.0"},
      "ipv6": {"dhcp": false, "routerAdvertisement": true, "static": [],
               "addresses": [{"address": "fe80::250:56ff:fe01:2", "prefix": 64, "type": "autoconf"}]}
    }],
    "dns": {"hostname": "host1", "domain": "example.test", "servers": ["192.0.2.53"], "ipv6Servers": [],
            "searchDomains": ["example.test"]},
    "routing": {"ipv4Gateway": "192.0.2.1", "ipv6Gateway": "::"},
    "saved": {
      "dns": {"hostname": "host1", "domain": "example.test", "servers": [], "ipv6Servers": [],
              "searchDomains": []},
      "routing": {"ipv4Gateway": "0.0.0.0", "ipv6Gateway": "::"}
    },
    "lan": {
      "0": {"dhcp": {"first": "192.0.2.100", "last": "192.0.2.199", "netmask": "255.255.255.0",
                     "gateway": "192.0.2.1", "dns": ["192.0.2.53"], "domain": "example.test",
                     "leases": {"00:50:56:01:00:02": "192.0.2.100"}},
            "hosts": {"192.0.2.1": {}, "192.0.2.53": {"dns": true}}},
      "20": {"dhcp": {"first": "198.51.100.100", "last": "198.51.100.199", "netmask": "255.255.255.0",
                      "gateway": "198.51.100.1", "dns": ["198.51.100.53"], "domain": "example.test",
                      "leases": {}},
             "routerAdvertisement": {"prefix": "2001:db8:20::", "prefixLength": 64, "router": "fe80::1"},
             "dhcpv6": {"first": "2001:db8:20::1000", "last": "2001:db8:20::10ff", "dns": ["2001:db8:20::53"],
                        "leases": {}},
             "hosts": {"198.51.100.1": {}, "198.51.100.53": {"dns": true}, "fe80::1": {},
                       "2001:db8:20::53": {"dns": true}}},
      "30": {}
    },
    "remote": {"203.0.113.10": {}, "203.0.113.53": {"dns": true}},
    "dnsZone": {"www.example.test": ["203.0.113.10"]},
    "pingTimeoutMs": 1000,
    "netDumper": {"enabled": true, "interface": "qk0"},
    "factory": {"vswitch": "kSwitch0", "portgroup": "Management Network", "vnic": "qk0"}
  },
  "faults": {},
  "system": {
    "welcomeMessage": "",
    "systemAlert": "",
    "bootOptions": {"auditMode": false},
    "keyboardLayout": "US Default",
    "keyboardLayouts": ["Belgian", "Brazilian", "Croatian", "Czechoslovakian", "Danish", "Default", "Estonian",
                        "Finnish", "French", "German", "Greek", "Icelandic", "Italian", "Japanese",
                        "Latin American", "Norwegian", "Polish", "Portuguese", "Russian", "Slovenian", "Spanish",
                        "Swedish", "Swiss French", "Swiss German", "Turkish", "US Default", "US Dvorak",
                        "Ukrainian", "United Kingdom"]
  },
  "advancedOptions": {"/UserVars/VelkTimeOut": 600, "/UserVars/TarniShellTimeOut": 0,
                      "/UserVars/TarniShellInteractiveTimeOut": 0},
  "userOptions": {},
  "smartCards": {"slots": [{"name": "slot0", "token": null}]},
  "cim": {
    "OMC_SMASHFirmwareIdentity": {"VersionString": "2.4.1"},
    "OMC_MCFirmwareIdentity": {"VersionString": "1.10"},
    "Zolva_HHRCWrapperSoftwareIdentity": {"VersionString": "3.0.0"},
    "CIM_Chassis": {"OtherIdentifyingInfo": "ASSET-0042"}
  },
  "hostAgent": {"lockdownEnabled": false, "lockdownPossible": true, "users": ["root", "velk"], "running": true},
  "services": {"ssh": {"enabled": false, "running": false}, "tarnShell": {"enabled": false, "running": false}},
  "firewall": {"rulesets": {"sshServer": {"enabled": false}}},
  "vms": {"running": 0},
  "driverVm": {"state": 0, "devices": [
    {"id": "0000:03:00.0", "name": "Acme SATA Controller", "owned": false, "group": "g1"},
    {"id": "0000:03:00.1", "name": "Acme SATA Controller, second port", "owned": false, "group": "g1"},
    {"id": "0000:05:00.0", "name": "Brightwave 10G Ethernet Adapter", "owned": true, "group": "g2"},
    {"id": "0000:06:00.0", "name": "Kestrel RAID Controller", "owned": false, "group": "g3"}
  ]},
  "history": []
})";

}  // namespace

SimState::SimState(std::string root) : _root(std::move(root)), _statePath(_root + "/host.json") {}

HostCtlException SimState::Error(const std::string& problem) const {
    return HostCtlException(_statePath + ": " + problem);
}

json SimState::Load(Identity& identity, bool mustExist) const {
    Fd fd(open(_statePath.c_str(), O_RDONLY | O_CLOEXEC));
    if (fd.Get() < 0) {
        int err = errno;
        if (err == ENOENT && !mustExist) {
            identity = {};
            return json::object();
        }
        throw Error("cannot open: " + ErrnoText(err));
    }
    struct stat st;
    if (fstat(fd.Get(), &st) < 0) throw Error("cannot read: " + ErrnoText(errno));
    identity = {st.st_dev, st.st_ino, st.st_size, st.st_mtim};

    // Read straight into the text: a big buffer on the stack would leave the
    // pages below it, which the parser's calls then use, resident for good.
    std::string text(static_cast<size_t>(std::max<off_t>(st.st_size, 0)) + 1, '\0');
    size_t used = 0;
    for (;;) {
        if (used == text.size()) text.resize(text.size() * 2);
        ssize_t n = read(fd.Get(), text.data() + used, text.size() - used);
        if (n < 0) {
            if (errno == EINTR) continue;
            throw Error("cannot read: " + ErrnoText(errno));
        }
        if (n == 0) break;
        used += size_t(n);
    }
    text.resize(used);

    if (JsonTextDepth(text, kMaxStateDepth) > kMaxStateDepth)
        throw Error("arrays and objects nested deeper than " + std::to_string(kMaxStateDepth) + " levels");
    json state;
    try {
        state = json::parse(text);
    } catch (const json::exception& e) {
        // Drop the library's "[json.exception.parse_error.N] " tag; keep "parse
        // error at line L, column C: ...". A number too large for a double
        // ("1e400") is the library's out_of_range, not a parse_error.
        std::string what = e.what();
        size_t tagEnd = what.find("] ");
        throw Error(tagEnd == std::string::npos ? what : what.substr(tagEnd + 2));
    }
    if (!state.is_object()) throw Error("the state is not a JSON object");
    return state;
}

std::shared_ptr<const json> SimState::Read() {
    std::lock_guard<std::mutex> lock(_mutex);
    // Compare the identity of the file as it is now with the cached one; only
    // a changed file is read and parsed again.
    struct stat st;
    if (stat(_statePath.c_str(), &st) == 0 && _cached) {
        Identity now{st.st_dev, st.st_ino, st.st_size, st.st_mtim};
        if (now == _cachedIdentity) return _cached;
    }
    Identity identity;
    auto state = std::make_shared<const json>(Load(identity, true));
    _cached = state;
    _cachedIdentity = identity;
    return state;
}

void SimState::Update(const std::function<void(json&)>& change,
                      const std::function<void(const json&)>& afterWrite) {
    Fd lockFd(open(LockPath().c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
    if (lockFd.Get() < 0) throw HostCtlException(LockPath() + ": cannot open: " + ErrnoText(errno));
    while (flock(lockFd.Get(), LOCK_EX) < 0) {
        if (errno != EINTR) throw HostCtlException(LockPath() + ": cannot lock: " + ErrnoText(errno));
    }
    // Always read the file itself here, never the cache: only what is on disk
    // under the lock is known to be the latest state.
    Identity identity;
    json state = Load(identity, true);
    change(state);
    WriteLocked(state);
    if (afterWrite) afterWrite(state);
}

void SimState::WithLock(const std::function<void()>& work) {
    Fd lockFd(open(LockPath().c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
    if (lockFd.Get() < 0) throw HostCtlException(LockPath() + ": cannot open: " + ErrnoText(errno));
    while (flock(lockFd.Get(), LOCK_EX) < 0) {
        if (errno != EINTR) throw HostCtlException(LockPath() + ": cannot lock: " + ErrnoText(errno));
    }
    work();
}

void SimState::Replace(const json& state) {
    Fd lockFd(open(LockPath().c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
    if (lockFd.Get() < 0) throw HostCtlException(LockPath() + ": cannot open: " + ErrnoText(errno));
    while (flock(lockFd.Get(), LOCK_EX) < 0) {
        if (errno != EINTR) throw HostCtlException(LockPath() + ": cannot lock: " + ErrnoText(errno));
    }
    WriteLocked(state);
}

void SimState::WriteLocked(const json& state) {
    if (!state.is_object()) throw Error("cannot write: the state must be a JSON object");
    if (JsonDepth(state, kMaxStateDepth) > kMaxStateDepth)
        throw Error("cannot write: arrays and objects would nest deeper than " +
                    std::to_string(kMaxStateDepth) + " levels");
    std::string text = state.dump(2, ' ', false, json::error_handler_t::replace) + "\n";

    std::string tmpPath = _statePath + ".XXXXXX";
    Fd fd(mkostemp(tmpPath.data(), O_CLOEXEC));
    if (fd.Get() < 0) throw Error("cannot create a temporary file: " + ErrnoText(errno));
    auto fail = [&](const std::string& what) {
        int err = errno;
        unlink(tmpPath.c_str());
        return Error(what + ": " + ErrnoText(err));
    };
    if (!WriteAll(fd.Get(), text)) throw fail("cannot write");
    if (fchmod(fd.Get(), 0644) < 0) throw fail("cannot set mode");

    // The new file's modification time must be later than the old file's, even
    // when both writes fall in the same clock tick: readers tell states apart
    // by it (inode numbers are reused once the old file is gone).
    timespec times[2];
    times[0].tv_sec = 0;
    times[0].tv_nsec = UTIME_OMIT;
    clock_gettime(CLOCK_REALTIME, &times[1]);
    struct stat old;
    if (stat(_statePath.c_str(), &old) == 0 && !Later(times[1], old.st_mtim)) {
        times[1] = old.st_mtim;
        if (++times[1].tv_nsec >= 1000000000L) {
            times[1].tv_nsec = 0;
            ++times[1].tv_sec;
        }
    }
    if (futimens(fd.Get(), times) < 0) throw fail("cannot set the modification time");
    if (fsync(fd.Get()) < 0) throw fail("cannot flush");
    struct stat st;
    if (fstat(fd.Get(), &st) < 0) throw fail("cannot read back");
    if (close(fd.Release()) < 0) throw fail("cannot close");
    if (rename(tmpPath.c_str(), _statePath.c_str()) < 0) throw fail("cannot replace");

    // Make the rename itself durable.
    Fd dir(open(_root.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (dir.Get() >= 0) fsync(dir.Get());

    std::lock_guard<std::mutex> lock(_mutex);
    _cached = std::make_shared<const json>(state);
    _cachedIdentity = {st.st_dev, st.st_ino, st.st_size, st.st_mtim};
}

void SimState::AppendHistory(json& state, json entry) const {
    if (!state.contains("history")) state["history"] = json::array();
    json& history = state["history"];
    if (!history.is_array()) throw Error("field /history must be an array");
    uint64_t last = 0;
    for (const json& old : history) {
        if (!old.is_object() || !old.contains("seq")) continue;
        const json& seq = old["seq"];
        if (seq.is_number_unsigned() && seq.get<uint64_t>() > last) last = seq.get<uint64_t>();
    }
    entry["seq"] = last + 1;
    entry["time"] = UtcTimestamp();
    history.push_back(std::move(entry));
    if (history.size() > kHistoryLimit)
        history.erase(history.begin(), history.begin() + std::ptrdiff_t(history.size() - kHistoryLimit));
}

int JsonTextDepth(const std::string& text, int limit) {
    int depth = 0;
    int deepest = 0;
    bool inString = false;
    for (size_t i = 0; i < text.size(); ++i) {
        const char c = text[i];
        if (inString) {
            if (c == '\\')
                ++i;
            else if (c == '"')
                inString = false;
        } else if (c == '"') {
            inString = true;
        } else if (c == '[' || c == '{') {
            if (++depth > deepest) deepest = depth;
            if (deepest > limit) break;
        } else if ((c == ']' || c == '}') && depth > 0) {
            --depth;
        }
    }
    return deepest;
}

int JsonDepth(const json& value, int limit) {
    if (!value.is_structured()) return 0;
    if (limit <= 0) return 1;
    int deepest = 0;
    for (const json& child : value) {
        const int depth = JsonDepth(child, limit - 1);
        if (depth > deepest) deepest = depth;
        if (deepest >= limit) break;
    }
    return deepest + 1;
}

const json& SimState::Field(const json& state, const std::string& pointer) const {
    try {
        return state.at(json::json_pointer(pointer));
    } catch (const json::exception&) {
        throw Error("missing field " + pointer);
    }
}

std::string SimState::String(const json& state, const std::string& pointer) const {
    const json& v = Field(state, pointer);
    if (!v.is_string()) throw Error("field " + pointer + " must be a string");
    return v.get<std::string>();
}

bool SimState::Bool(const json& state, const std::string& pointer) const {
    const json& v = Field(state, pointer);
    if (!v.is_boolean()) throw Error("field " + pointer + " must be true or false");
    return v.get<bool>();
}

int64_t SimState::Integer(const json& state, const std::string& pointer) const {
    const json& v = Field(state, pointer);
    if (v.is_number_unsigned() && v.get<uint64_t>() > uint64_t(INT64_MAX))
        throw Error("field " + pointer + " is too large");
    if (!v.is_number_integer()) throw Error("field " + pointer + " must be an integer");
    return v.get<int64_t>();
}

uint64_t SimState::Unsigned(const json& state, const std::string& pointer) const {
    const json& v = Field(state, pointer);
    if (!v.is_number_integer() || (!v.is_number_unsigned() && v.get<int64_t>() < 0))
        throw Error("field " + pointer + " must be a non-negative integer");
    return v.get<uint64_t>();
}

const json& SimState::Array(const json& state, const std::string& pointer) const {
    const json& v = Field(state, pointer);
    if (!v.is_array()) throw Error("field " + pointer + " must be an array");
    return v;
}

const json& SimState::Object(const json& state, const std::string& pointer) const {
    const json& v = Field(state, pointer);
    if (!v.is_object()) throw Error("field " + pointer + " must be an object");
    return v;
}

std::vector<std::string> SimState::StringList(const json& state, const std::string& pointer) const {
    std::vector<std::string> out;
    const json& list = Array(state, pointer);
    for (size_t i = 0; i < list.size(); ++i) out.push_back(String(state, pointer + "/" + std::to_string(i)));
    return out;
}

json DefaultHostState(const std::string& hostname) {
    json state = json::parse(DEFAULT_STATE);
    size_t dot = hostname.find('.');
    for (json* dns : {&state["network"]["dns"], &state["network"]["saved"]["dns"]})
        (*dns)["hostname"] = hostname.substr(0, dot);
    if (dot != std::string::npos) {
        // The host's domain is the one its network's DHCP servers hand out.
        std::string domain = hostname.substr(dot + 1);
        state["network"]["saved"]["dns"]["domain"] = domain;
        for (auto& [vlan, servers] : state["network"]["lan"].items())
            if (servers.contains("dhcp")) servers["dhcp"]["domain"] = domain;
    }
    // What the host obtains from its network is derived as a boot derives it.
    BootNetwork(SimState("."), state);
    RegisterHostInDnsZone(state);
    return state;
}

}  // namespace HostCtl::Lib
