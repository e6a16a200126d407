// The simulated host's state file: cached reads, locked atomic writes.
#include "hostctl/SimState.hpp"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <system_error>

namespace HostCtl::Lib {

using nlohmann::json;

namespace {

std::string ErrnoText(int err) { return std::error_code(err, std::generic_category()).message(); }

// Closes a descriptor when the scope ends.
class Fd {
public:
    explicit Fd(int fd) : _fd(fd) {}
    ~Fd() {
        if (_fd >= 0) close(_fd);
    }
    Fd(const Fd&) = delete;
    Fd& operator=(const Fd&) = delete;
    int get() const { return _fd; }
    int release() {
        int fd = _fd;
        _fd = -1;
        return fd;
    }

private:
    int _fd;
};

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
// Fields whose meaning the names do not tell: a virtual NIC's
// "connectionType" is 0 (not connected), 1 (a standard-switch port group) or 2
// (a distributed-switch port) and "portgroup" names what it is connected to;
// an IPv6 address's "type" is "static", "dhcp" or "autoconf"; "network/dns" and
// "network/routing" are those of the network stack "defaultTcpipStack"; a
// smart-card slot's "token" is null when the slot is empty, else
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
    "managementInterface": "qk0",
    "vnics": [{
      "name": "qk0", "portgroup": "Management Network", "connectionType": 1,
      "ipv4": {"dhcp": true, "none": false, "address": "192.168.10.21", "netmask": "255.255.255.0"},
      "ipv6": {"dhcp": false, "routerAdvertisement": true,
               "addresses": [{"address": "fe80::250:56ff:fe01:2", "prefix": 64, "type": "autoconf"}]}
    }],
    "pnics": [{"name": "zonic0", "mac": "00:50:56:01:00:02", "driver": "e1000e", "linkUp": true,
               "speedMbps": 1000, "description": "Acme Gigabit Ethernet Controller"}],
    "dns": {"hostname": "host1", "domain": "example.test", "dhcp": true, "servers": ["192.168.10.1"],
            "ipv6Servers": [], "searchDomains": ["example.test"]},
    "routing": {"ipv4Gateway": "192.168.10.1", "ipv6Gateway": "::"},
    "vswitches": [{"name": "kSwitch0", "uplinks": ["zonic0"],
                   "portgroups": [{"name": "Management Network", "vlan": 0}]}]
  },
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
  "hostAgent": {"lockdownEnabled": false, "lockdownPossible": true, "users": ["root", "velk"]},
  "services": {"ssh": {"enabled": false, "running": false}, "tarnShell": {"enabled": false, "running": false}},
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
    if (fd.get() < 0) {
        int err = errno;
        if (err == ENOENT && !mustExist) {
            identity = {};
            return json::object();
        }
        throw Error("cannot open: " + ErrnoText(err));
    }
    struct stat st;
    if (fstat(fd.get(), &st) < 0) throw Error("cannot read: " + ErrnoText(errno));
    identity = {st.st_dev, st.st_ino, st.st_size, st.st_mtim};

    std::string text;
    char buf[65536];
    for (;;) {
        ssize_t n = read(fd.get(), buf, sizeof buf);
        if (n < 0) {
            if (errno == EINTR) continue;
            throw Error("cannot read: " + ErrnoText(errno));
        }
        if (n == 0) break;
        text.append(buf, size_t(n));
    }

    json state;
    try {
        state = json::parse(text);
    } catch (const json::parse_error& e) {
        // Drop the library's "[json.exception.parse_error.N] " tag; keep "parse
        // error at line L, column C: ...".
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

void SimState::Update(const std::function<void(json&)>& change) {
    Fd lockFd(open(LockPath().c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
    if (lockFd.get() < 0) throw HostCtlException(LockPath() + ": cannot open: " + ErrnoText(errno));
    while (flock(lockFd.get(), LOCK_EX) < 0) {
        if (errno != EINTR) throw HostCtlException(LockPath() + ": cannot lock: " + ErrnoText(errno));
    }
    // Always read the file itself here, never the cache: only what is on disk
    // under the lock is known to be the latest state.
    Identity identity;
    json state = Load(identity, true);
    change(state);
    WriteLocked(state);
}

void SimState::Replace(const json& state) {
    Fd lockFd(open(LockPath().c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
    if (lockFd.get() < 0) throw HostCtlException(LockPath() + ": cannot open: " + ErrnoText(errno));
    while (flock(lockFd.get(), LOCK_EX) < 0) {
        if (errno != EINTR) throw HostCtlException(LockPath() + ": cannot lock: " + ErrnoText(errno));
    }
    WriteLocked(state);
}

void SimState::WriteLocked(const json& state) {
    std::string text = state.dump(2, ' ', false, json::error_handler_t::replace) + "\n";

    std::string tmpPath = _statePath + ".XXXXXX";
    Fd fd(mkostemp(tmpPath.data(), O_CLOEXEC));
    if (fd.get() < 0) throw Error("cannot create a temporary file: " + ErrnoText(errno));
    auto fail = [&](const std::string& what) {
        int err = errno;
        unlink(tmpPath.c_str());
        return Error(what + ": " + ErrnoText(err));
    };
    if (!WriteAll(fd.get(), text)) throw fail("cannot write");
    if (fchmod(fd.get(), 0644) < 0) throw fail("cannot set mode");

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
    if (futimens(fd.get(), times) < 0) throw fail("cannot set the modification time");
    if (fsync(fd.get()) < 0) throw fail("cannot flush");
    struct stat st;
    if (fstat(fd.get(), &st) < 0) throw fail("cannot read back");
    if (close(fd.release()) < 0) throw fail("cannot close");
    if (rename(tmpPath.c_str(), _statePath.c_str()) < 0) throw fail("cannot replace");

    // Make the rename itself durable.
    Fd dir(open(_root.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (dir.get() >= 0) fsync(dir.get());

    std::lock_guard<std::mutex> lock(_mutex);
    _cached = std::make_shared<const json>(state);
    _cachedIdentity = {st.st_dev, st.st_ino, st.st_size, st.st_mtim};
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
    state["network"]["dns"]["hostname"] = hostname.substr(0, dot);
    if (dot != std::string::npos) {
        std::string domain = hostname.substr(dot + 1);
        state["network"]["dns"]["domain"] = domain;
        state["network"]["dns"]["searchDomains"] = json::array({domain});
    }
    return state;
}

}  // namespace HostCtl::Lib
