// The state of a simulated host: one JSON file, "<root>/host.json", shared by
// every process that works on the host (the console, the host's tools, tests).
//
// Reads always see the latest state: the file is parsed again whenever its
// identity (device, inode, size, modification time) changed since the last
// read, otherwise the cached parse is used. Writes are read-modify-write under
// an exclusive flock on "<root>/host.json.lock"; the new state goes to a
// temporary file in the same folder, is flushed to disk and renamed over the
// old one, so readers never see half a file and no writer loses another's
// update. Each write gives the file a modification time later than the one it
// replaces, so a reader's cached identity can never match a newer state.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <ctime>
#include <functional>
#include <memory>
#include <mutex>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "hostctl/HostCtl.hpp"

namespace HostCtl::Lib {

class Backend;

class SimState {
public:
    explicit SimState(std::string root);

    const std::string& Root() const { return _root; }
    const std::string& StatePath() const { return _statePath; }
    std::string LockPath() const { return _statePath + ".lock"; }

    // The latest state. Throws HostCtlException naming the file when it is
    // missing, unreadable, not JSON or not a JSON object.
    std::shared_ptr<const nlohmann::json> Read();

    // Applies `change` to the latest state and writes the result, all under
    // the lock. When `change` throws, nothing is written. `afterWrite`, when
    // given, runs with the state as written while the lock is still held (for
    // files that must follow the state in the same order as the state's
    // writes); an exception from it reaches the caller, the state stays
    // written.
    void Update(const std::function<void(nlohmann::json&)>& change,
                const std::function<void(const nlohmann::json&)>& afterWrite = nullptr);

    // Runs `work` under the lock without reading or writing the state: files
    // of the host that follow the state (the hosts file) take turns with the
    // state's writers this way.
    void WithLock(const std::function<void()>& work);

    // Writes `state` as the whole new state, under the lock; the file need not
    // exist yet.
    void Replace(const nlohmann::json& state);

    // Typed access to a field of a state read from this file. `pointer` is a
    // JSON pointer ("/network/dns/hostname"). A missing field or one of the
    // wrong type throws HostCtlException naming the file and the field.
    const nlohmann::json& Field(const nlohmann::json& state, const std::string& pointer) const;
    std::string String(const nlohmann::json& state, const std::string& pointer) const;
    bool Bool(const nlohmann::json& state, const std::string& pointer) const;
    int64_t Integer(const nlohmann::json& state, const std::string& pointer) const;
    uint64_t Unsigned(const nlohmann::json& state, const std::string& pointer) const;
    const nlohmann::json& Array(const nlohmann::json& state, const std::string& pointer) const;
    const nlohmann::json& Object(const nlohmann::json& state, const std::string& pointer) const;
    std::vector<std::string> StringList(const nlohmann::json& state, const std::string& pointer) const;

    // Appends `entry` to the state's "/history" (created when missing), giving
    // it the time and a "seq" one above the highest seq already recorded, so
    // that the order of entries can be checked even after the list was
    // edited. Only the last kHistoryLimit entries are kept: every call of the
    // host's agents adds one, and the state is read again after each write.
    // Call it inside Update: only there is the state the latest.
    void AppendHistory(nlohmann::json& state, nlohmann::json entry) const;
    static constexpr size_t kHistoryLimit = 200;

    // An exception whose text is "<state file>: <problem>".
    HostCtlException Error(const std::string& problem) const;

private:
    struct Identity {
        dev_t dev = 0;
        ino_t ino = 0;
        off_t size = -1;
        timespec mtime = {};
        bool operator==(const Identity& o) const {
            return dev == o.dev && ino == o.ino && size == o.size && mtime.tv_sec == o.mtime.tv_sec &&
                   mtime.tv_nsec == o.mtime.tv_nsec;
        }
    };

    // Reads and parses the file; `identity` receives the identity of what was
    // read. `mustExist` false turns a missing file into an empty object.
    nlohmann::json Load(Identity& identity, bool mustExist) const;
    void WriteLocked(const nlohmann::json& state);

    std::string _root;
    std::string _statePath;
    std::mutex _mutex;  // guards the cache
    Identity _cachedIdentity;
    std::shared_ptr<const nlohmann::json> _cached;
};

// The deepest nesting of arrays and objects a state may have. JSON values are
// copied, compared and written out recursively, so a state nested much deeper
// would overflow the stack; Read refuses such a file and writes refuse to
// produce one.
constexpr int kMaxStateDepth = 512;

// How deeply arrays and objects nest in JSON text, counted without parsing it
// (brackets inside strings do not count). Counting stops above `limit`.
int JsonTextDepth(const std::string& text, int limit);

// How deeply arrays and objects nest in a value (a scalar is 0). Counting
// stops above `limit`, so the recursion stays bounded.
int JsonDepth(const nlohmann::json& value, int limit);

// The state a freshly created simulated host starts with. A host name that
// holds a dot ("esx1.lab.test") also sets the domain.
nlohmann::json DefaultHostState(const std::string& hostname = "host1");

// A backend working on the simulated host in `root`. Before anything else,
// each of its operations looks for its own name (the Backend method name,
// "SetVnicIpConfig") in the state's "faults" object; when it is there, the
// operation throws HostCtlException with the text stored under the name and
// changes nothing.
std::unique_ptr<Backend> MakeSimulatedBackend(const std::string& root);

// The names of the simulated backend's operations, the names "faults" knows,
// in the order of the Backend interface.
const std::vector<std::string>& SimulatedOperations();

}  // namespace HostCtl::Lib
