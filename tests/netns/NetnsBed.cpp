#include "NetnsBed.hpp"

#include <crypt.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <condition_variable>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <mutex>
#include <sstream>
#include <stdexcept>
#include <thread>

extern char** environ;

namespace fs = std::filesystem;

namespace Netns {

namespace {

using Clock = std::chrono::steady_clock;

std::string Quote(const std::string& text) {
    std::string quoted = "'";
    for (char c : text) quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return quoted + "'";
}

std::string Join(const std::vector<std::string>& argv) {
    std::string text;
    for (const std::string& arg : argv) text += (text.empty() ? "" : " ") + arg;
    return text;
}

std::optional<std::string> ReadWhole(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) return std::nullopt;
    std::ostringstream text;
    text << in.rdbuf();
    return text.str();
}

// The environment of child processes: ours, with the sbin folders on PATH.
std::vector<std::string> ChildEnvironment() {
    std::vector<std::string> env;
    std::string path = "/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin";
    for (char** e = environ; *e != nullptr; ++e) {
        if (std::strncmp(*e, "PATH=", 5) == 0) {
            path = std::string(*e + 5) + ":/usr/sbin:/sbin";
            continue;
        }
        env.emplace_back(*e);
    }
    env.push_back("PATH=" + path + ":/usr/bin:/bin");
    return env;
}

struct Argv {
    explicit Argv(const std::vector<std::string>& args) : strings(args) {
        for (std::string& s : strings) pointers.push_back(s.data());
        pointers.push_back(nullptr);
    }
    std::vector<std::string> strings;
    std::vector<char*> pointers;
};

// Starts `argv` with standard input from /dev/null and both outputs into the
// file `log` (appended); the process id. It is killed when this program ends.
pid_t Spawn(const std::vector<std::string>& argv, const std::string& log) {
    Argv args(argv), env(ChildEnvironment());
    const int out = open(log.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
    if (out < 0) throw std::runtime_error("cannot open " + log + ": " + std::strerror(errno));
    const pid_t pid = fork();
    if (pid == 0) {
        // A test program killed before its teardown takes the anchor and
        // dnsmasq with it.
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        const int in = open("/dev/null", O_RDONLY);
        dup2(in, 0);
        dup2(out, 1);
        dup2(out, 2);
        execvpe(args.pointers[0], args.pointers.data(), env.pointers.data());
        _exit(127);
    }
    close(out);
    if (pid < 0) throw std::runtime_error(std::string("fork: ") + std::strerror(errno));
    return pid;
}

// Waits for our child `pid` to end within `timeout`; true when it did.
bool Reap(pid_t pid, Duration timeout) {
    const auto deadline = Clock::now() + timeout;
    while (true) {
        const pid_t r = waitpid(pid, nullptr, WNOHANG);
        if (r == pid || (r < 0 && errno == ECHILD)) return true;
        if (Clock::now() >= deadline) return false;
        std::this_thread::sleep_for(Duration(20));
    }
}

void Must(const std::vector<std::string>& argv) {
    const RunResult r = RunCommand(argv);
    if (!r.Ok()) throw std::runtime_error(Join(argv) + ": " + r.Describe());
}

std::atomic<int> g_counter{0};

std::string UniqueName(const char* prefix) {
    return std::string(prefix) + std::to_string(getpid()) + "-" + std::to_string(g_counter++);
}

// Deletes the namespaces and folders left by an earlier test program that
// died before its teardown ("velk-h<pid>-<n>", "/tmp/velk-netns-<pid>.X"
// whose pid has gone), once per program.
void DropStaleNamespaces() {
    static bool done = false;
    if (done) return;
    done = true;
    std::istringstream list(RunCommand({"ip", "netns", "list"}).out);
    for (std::string line; std::getline(list, line);) {
        const std::string name = line.substr(0, line.find(' '));
        if (name.size() < 8 || name.rfind("velk-", 0) != 0 || name.find_first_of("hlk", 5) != 5) continue;
        const size_t dash = name.find('-', 6);
        if (dash == std::string::npos) continue;
        const std::string digits = name.substr(6, dash - 6);
        if (digits.empty() || digits.find_first_not_of("0123456789") != std::string::npos) continue;
        const pid_t owner = static_cast<pid_t>(std::stol(digits));
        if (owner != getpid() && kill(owner, 0) != 0 && errno == ESRCH)
            RunCommand({"ip", "netns", "del", name});
    }
    std::error_code ec;
    for (const auto& entry : fs::directory_iterator("/tmp", ec)) {
        const std::string name = entry.path().filename();
        if (name.rfind("velk-netns-", 0) != 0) continue;
        const pid_t owner = static_cast<pid_t>(std::atol(name.c_str() + 11));
        if (owner > 0 && owner != getpid() && kill(owner, 0) != 0 && errno == ESRCH)
            fs::remove_all(entry.path(), ec);
    }
}

// The unpacked ifupdown2 package in the cache folder, fetched on first use;
// "" with `why` set when it cannot be had.
std::string Ifupdown2Root(std::string& why) {
    static std::string root, reason;
    static bool tried = false;
    if (tried) {
        why = reason;
        return root;
    }
    tried = true;
    const char* env = std::getenv("VELK_NETNS_CACHE");
    const std::string cache = env != nullptr && *env != '\0' ? env : VELK_NETNS_CACHE_DIR;
    const std::string target = cache + "/ifupdown2";
    if (!fs::exists(target + "/usr/share/ifupdown2/__main__.py")) {
        std::error_code ec;
        fs::create_directories(cache, ec);
        std::string pattern = cache + "/fetch.XXXXXX";
        if (ec || mkdtemp(pattern.data()) == nullptr) {
            reason = "ifupdown2 cannot be cached: no folder " + cache;
            why = reason;
            return "";
        }
        const std::string tmp = pattern;
        RunResult r = RunCommand({"apt-get", "download", "-q", "-o", "APT::Sandbox::User=root", "ifupdown2"},
                                 Duration(180000), tmp);
        std::string deb;
        for (const auto& entry : fs::directory_iterator(tmp, ec))
            if (entry.path().extension() == ".deb") deb = entry.path();
        if (!r.Ok() || deb.empty()) {
            reason = "ifupdown2 could not be fetched (apt-get download ifupdown2: " + r.Describe() + ")";
        } else if (r = RunCommand({"dpkg-deb", "-x", deb, tmp + "/root"}); !r.Ok()) {
            reason = "ifupdown2 could not be unpacked (dpkg-deb -x: " + r.Describe() + ")";
        } else {
            chmod((tmp + "/root/usr/share/ifupdown2/__main__.py").c_str(), 0755);
            // Another process may have been quicker: its copy is as good.
            if (rename((tmp + "/root").c_str(), target.c_str()) != 0 &&
                !fs::exists(target + "/usr/share/ifupdown2/__main__.py"))
                reason = "ifupdown2 could not be cached in " + target + ": " + std::strerror(errno);
        }
        fs::remove_all(tmp, ec);
        if (!reason.empty()) {
            why = reason;
            return "";
        }
    }
    root = target;
    return root;
}

}  // namespace

std::string RunResult::Describe() const {
    std::string text = timedOut ? "timed out" : status < 0 ? "killed" : "exit " + std::to_string(status);
    std::string detail = err.empty() ? out : err;
    while (!detail.empty() && detail.back() == '\n') detail.pop_back();
    return detail.empty() ? text : text + ": " + detail;
}

RunResult RunCommand(const std::vector<std::string>& argv, Duration timeout, const std::string& cwd) {
    RunResult result;
    Argv args(argv), env(ChildEnvironment());
    int outPipe[2], errPipe[2];
    if (pipe2(outPipe, O_CLOEXEC) != 0) throw std::runtime_error("pipe failed");
    if (pipe2(errPipe, O_CLOEXEC) != 0) {
        close(outPipe[0]);
        close(outPipe[1]);
        throw std::runtime_error("pipe failed");
    }
    const pid_t pid = fork();
    if (pid == 0) {
        const int in = open("/dev/null", O_RDONLY);
        dup2(in, 0);
        dup2(outPipe[1], 1);
        dup2(errPipe[1], 2);
        if (!cwd.empty() && chdir(cwd.c_str()) != 0) _exit(127);
        execvpe(args.pointers[0], args.pointers.data(), env.pointers.data());
        dprintf(2, "cannot run %s: %s\n", args.pointers[0], std::strerror(errno));
        _exit(127);
    }
    close(outPipe[1]);
    close(errPipe[1]);
    if (pid < 0) {
        close(outPipe[0]);
        close(errPipe[0]);
        throw std::runtime_error(std::string("fork: ") + std::strerror(errno));
    }
    fcntl(outPipe[0], F_SETFL, O_NONBLOCK);
    fcntl(errPipe[0], F_SETFL, O_NONBLOCK);
    auto drain = [](int fd, std::string& into) {
        char buffer[4096];
        ssize_t n;
        while ((n = read(fd, buffer, sizeof buffer)) > 0) into.append(buffer, static_cast<size_t>(n));
    };
    const auto deadline = Clock::now() + timeout;
    int status = 0;
    while (true) {
        pollfd fds[2] = {{outPipe[0], POLLIN, 0}, {errPipe[0], POLLIN, 0}};
        poll(fds, 2, 20);
        drain(outPipe[0], result.out);
        drain(errPipe[0], result.err);
        const pid_t r = waitpid(pid, &status, WNOHANG);
        if (r == pid) {
            drain(outPipe[0], result.out);
            drain(errPipe[0], result.err);
            result.status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
            break;
        }
        if (Clock::now() >= deadline) {
            kill(pid, SIGKILL);
            waitpid(pid, &status, 0);
            result.timedOut = true;
            break;
        }
    }
    close(outPipe[0]);
    close(errPipe[0]);
    return result;
}

// A datagram socket bound as the host's /dev/log and a thread that keeps
// every message: a reader that falls behind would block the sender.
struct NetnsBed::SyslogReader {
    explicit SyslogReader(const std::string& path) {
        fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        if (fd < 0 || path.size() >= sizeof address.sun_path)
            throw std::runtime_error("cannot make a socket for " + path);
        std::strcpy(address.sun_path, path.c_str());
        if (bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
            const int err = errno;
            close(fd);
            throw std::runtime_error("cannot bind " + path + ": " + std::strerror(err));
        }
        reader = std::thread([this] {
            char buffer[8192];
            while (!stop) {
                pollfd p{fd, POLLIN, 0};
                if (poll(&p, 1, 50) <= 0) continue;
                const ssize_t n = recv(fd, buffer, sizeof buffer, MSG_DONTWAIT);
                if (n <= 0) continue;
                std::lock_guard<std::mutex> lock(mutex);
                lines.emplace_back(buffer, static_cast<size_t>(n));
                arrived.notify_all();
            }
        });
    }
    ~SyslogReader() {
        stop = true;
        reader.join();
        close(fd);
    }
    int fd = -1;
    std::atomic<bool> stop{false};
    std::thread reader;
    mutable std::mutex mutex;
    mutable std::condition_variable arrived;
    std::vector<std::string> lines;
};

// --- building and tearing down ---

NetnsBed::NetnsBed(BedOptions options) : _options(std::move(options)) {
    if (geteuid() != 0) {
        _skipReason = "network namespaces need root (running as uid " + std::to_string(geteuid()) + ")";
        return;
    }
    if (_options.ifupdown2) {
        std::string why;
        _ifupdown2 = Ifupdown2Root(why);
        if (_ifupdown2.empty()) {
            _skipReason = why;
            return;
        }
    }
    DropStaleNamespaces();
    _before = TakeGuard();
    try {
        Build();
    } catch (...) {
        Teardown();
        throw;
    }
    if (Skipped()) Teardown();
}

NetnsBed::~NetnsBed() { Teardown(); }

void NetnsBed::Build() {
    _host = UniqueName("velk-h");
    _lan = UniqueName("velk-l");
    if (const RunResult r = RunCommand({"ip", "netns", "add", _host}); !r.Ok()) {
        _skipReason = "ip netns add failed: " + r.Describe();
        return;
    }
    _hostCreated = true;
    Must({"ip", "netns", "add", _lan});
    _lanCreated = true;

    std::string pattern = "/tmp/velk-netns-" + std::to_string(getpid()) + ".XXXXXX";
    if (mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("mkdtemp failed");
    _dir = pattern;
    for (const char* sub :
         {"etc", "var-lib", "run/network", "run/lock", "var-tmp", "work/etc", "work/var-lib", "lan"})
        fs::create_directories(_dir + "/" + sub);

    // The LAN: a bridge with the NICs' peers as ports.
    const std::vector<std::string> lan = {"ip", "-n", _lan};
    auto inLan = [&](std::vector<std::string> args) {
        args.insert(args.begin(), lan.begin(), lan.end());
        Must(args);
    };
    const std::vector<std::string> host = {"ip", "-n", _host};
    auto inHost = [&](std::vector<std::string> args) {
        args.insert(args.begin(), host.begin(), host.end());
        Must(args);
    };
    inLan({"link", "set", "lo", "up"});
    inLan({"link", "add", "lan0", "type", "bridge", "forward_delay", "0", "mcast_snooping", "0"});
    for (const std::string& nic : _options.nics) {
        inHost({"link", "add", nic, "type", "veth", "peer", "name", "p-" + nic, "netns", _lan});
        inLan({"link", "set", "p-" + nic, "master", "lan0", "up"});
    }
    inLan({"addr", "add", "192.0.2.1/24", "dev", "lan0"});
    inLan({"addr", "add", "2001:db8:1::1/64", "dev", "lan0", "nodad"});
    inLan({"link", "set", "lan0", "up"});
    if (_options.lanServer) StartLanServer();

    // The host: NICs, VM ports and bridges, all up.
    inHost({"link", "set", "lo", "up"});
    std::vector<std::string> taps = {"tap100i0"};
    if (_options.secondBridge) taps.push_back("tap101i0");
    for (const std::string& tap : taps) inHost({"tuntap", "add", tap, "mode", "tap"});
    if (_options.bridges && !_options.nics.empty()) {
        inHost({"link", "add", "vmbr0", "type", "bridge", "forward_delay", "0"});
        inHost({"link", "set", _options.nics[0], "master", "vmbr0"});
        inHost({"link", "set", "tap100i0", "master", "vmbr0"});
        if (_options.secondBridge) {
            inHost({"link", "add", "vmbr1", "type", "bridge", "forward_delay", "0"});
            inHost({"link", "set", "tap101i0", "master", "vmbr1"});
            inHost({"link", "set", "vmbr1", "up"});
        }
    }
    for (const std::string& tap : taps) inHost({"link", "set", tap, "up"});
    for (const std::string& nic : _options.nics) inHost({"link", "set", nic, "up"});
    if (_options.bridges && !_options.nics.empty()) inHost({"link", "set", "vmbr0", "up"});

    if (!_ifupdown2.empty()) {
        // The package's own configuration (ifupdown2.conf, addons.conf,
        // /etc/default/networking) goes into the test's /etc.
        fs::copy(_ifupdown2 + "/etc", _dir + "/etc",
                 fs::copy_options::recursive | fs::copy_options::overwrite_existing);
    }
    StartAnchor();
    if (_options.syslog) _syslog = std::make_unique<SyslogReader>(HostView("/dev/log"));
    if (_options.writeHostFiles) WriteHostFiles();
}

void NetnsBed::StartAnchor() {
    for (const std::string& path : {_dir, _ifupdown2})
        if (path.find_first_of(",: \t\n'\"\\") != std::string::npos)
            throw std::runtime_error("the folder " + path + " cannot be named in an overlay mount");
    const std::string& t = _dir;
    std::string script = "set -e\n";
    if (_options.syslog) {
        // An overlay on /dev takes the socket; the terminals and shared
        // memory mounted below /dev move onto it.
        fs::create_directories(t + "/dev");
        fs::create_directories(t + "/work/dev");
        fs::create_directories(t + "/keep/pts");
        fs::create_directories(t + "/keep/shm");
        script += "mount --bind /dev/pts " + t + "/keep/pts\nmount --bind /dev/shm " + t + "/keep/shm\n";
        script += "mount -t overlay velk-dev -o lowerdir=/dev,upperdir=" + t + "/dev,workdir=" + t +
                  "/work/dev /dev\n";
        script += "mount --move " + t + "/keep/pts /dev/pts\nmount --move " + t + "/keep/shm /dev/shm\n";
    }
    script +=
        "mount -t overlay velk-etc -o lowerdir=/etc,upperdir=" + t + "/etc,workdir=" + t + "/work/etc /etc\n";
    script += "mount -t overlay velk-var-lib -o lowerdir=" +
              (_ifupdown2.empty() ? std::string() : _ifupdown2 + "/var/lib:") + "/var/lib,upperdir=" + t +
              "/var-lib,workdir=" + t + "/work/var-lib /var/lib\n";
    script += "mount --bind " + t + "/run /run\n";
    script += "mount --bind " + t + "/var-tmp /var/tmp\n";
    if (!_ifupdown2.empty()) {
        // Read-only overlays (no upper folder): ifupdown2's commands shadow
        // ifupdown's, its modules appear under /usr/share.
        script += "mount -t overlay velk-ifupdown2 -o lowerdir=" + _ifupdown2 +
                  "/usr/share:/usr/share /usr/share\n";
        script += "mount -t overlay velk-ifupdown2 -o lowerdir=" + _ifupdown2 + "/sbin:/usr/sbin /usr/sbin\n";
    }
    script += "hostname " + Quote(_options.hostName) + "\n";
    script += "echo velk-netns-anchor-ready\n";
    script += "exec sleep infinity\n";
    const std::string log = _dir + "/anchor.log";
    _anchor = Spawn({"ip", "netns", "exec", _host, "unshare", "--mount", "--uts", "--propagation", "private",
                     "sh", "-c", script},
                    log);
    const auto deadline = Clock::now() + Duration(10000);
    while (true) {
        const std::string text = ReadWhole(log).value_or("");
        if (text.find("velk-netns-anchor-ready") != std::string::npos) return;
        if (waitpid(_anchor, nullptr, WNOHANG) == _anchor) {
            _anchor = -1;
            throw std::runtime_error("the host's mount namespace could not be set up: " + text);
        }
        if (Clock::now() >= deadline)
            throw std::runtime_error("the host's mount namespace took too long: " + text);
        std::this_thread::sleep_for(Duration(10));
    }
}

void NetnsBed::WriteHostFiles() const {
    const BedOptions& o = _options;
    const std::string fqdn = o.hostName + "." + o.domain;
    WriteFile("/etc/hostname", o.hostName + "\n");
    WriteFile("/etc/hosts", "127.0.0.1\tlocalhost\n" + o.hostAddress + "\t" + fqdn + " " + o.hostName +
                                "\n\n::1\tlocalhost ip6-localhost ip6-loopback\nff02::1\tip6-allnodes\n"
                                "ff02::2\tip6-allrouters\n");
    WriteFile("/etc/resolv.conf", "search " + o.domain + "\nnameserver 192.0.2.1\n");
}

void NetnsBed::StartLanServer() {
    if (_dnsmasq > 0) return;
    const BedOptions& o = _options;
    const std::string lanDir = _dir + "/lan";
    const std::string log = lanDir + "/dnsmasq.log";
    const std::string fqdn = o.hostName + "." + o.domain;
    _dnsmasq = Spawn({"ip",
                      "netns",
                      "exec",
                      _lan,
                      "dnsmasq",
                      "--keep-in-foreground",
                      "--conf-file=/dev/null",
                      "--no-resolv",
                      "--no-hosts",
                      "--bind-interfaces",
                      "--interface=lan0",
                      "--user=root",
                      "--group=root",
                      "--pid-file=" + lanDir + "/dnsmasq.pid",
                      "--dhcp-leasefile=" + lanDir + "/leases",
                      "--log-facility=" + log,
                      "--log-dhcp",
                      "--domain=" + o.domain,
                      "--local=/" + o.domain + "/",
                      "--host-record=" + fqdn + "," + o.hostName + "," + o.hostAddress + "," + o.hostAddress6,
                      "--dhcp-authoritative",
                      "--dhcp-range=192.0.2.100,192.0.2.150,255.255.255.0,1h",
                      "--dhcp-range=2001:db8:1::100,2001:db8:1::1ff,slaac,64,1h",
                      "--dhcp-option=option:router,192.0.2.1",
                      "--enable-ra",
                      "--ra-param=lan0,10,600"},
                     lanDir + "/dnsmasq.out");
    const auto deadline = Clock::now() + Duration(10000);
    while (ReadWhole(log).value_or("").find("started, version") == std::string::npos) {
        if (waitpid(_dnsmasq, nullptr, WNOHANG) == _dnsmasq) {
            _dnsmasq = -1;
            throw std::runtime_error(
                "dnsmasq did not start: " + ReadWhole(lanDir + "/dnsmasq.out").value_or("") +
                ReadWhole(log).value_or(""));
        }
        if (Clock::now() >= deadline) throw std::runtime_error("dnsmasq took too long to start");
        std::this_thread::sleep_for(Duration(10));
    }
}

void NetnsBed::StopLanServer() {
    if (_dnsmasq <= 0) return;
    kill(_dnsmasq, SIGTERM);
    if (!Reap(_dnsmasq, Duration(3000))) {
        kill(_dnsmasq, SIGKILL);
        Reap(_dnsmasq, Duration(3000));
    }
    _dnsmasq = -1;
}

std::string NetnsBed::LanServerLog() const { return ReadWhole(_dir + "/lan/dnsmasq.log").value_or(""); }

void NetnsBed::Teardown() {
    std::vector<std::string> problems;
    StopLanServer();
    _syslog.reset();
    // Every process in the two namespaces was started by this test (the
    // anchor, DHCP clients, programs under test): end them by their ids, or
    // the mount namespace and its overlays would outlive the test.
    for (const auto& [ns, created] : {std::pair{_host, _hostCreated}, std::pair{_lan, _lanCreated}}) {
        if (!created) continue;
        for (int round = 0; round < 100; ++round) {
            const RunResult r = RunCommand({"ip", "netns", "pids", ns});
            std::istringstream pids(r.out);
            bool any = false;
            for (pid_t pid; pids >> pid;) {
                if (pid == getpid()) continue;
                kill(pid, SIGKILL);
                any = true;
            }
            if (_anchor > 0 && waitpid(_anchor, nullptr, WNOHANG) == _anchor) _anchor = -1;
            if (!any) break;
            if (round == 99) problems.push_back("processes in namespace " + ns + " did not end: " + r.out);
            std::this_thread::sleep_for(Duration(20));
        }
    }
    if (_anchor > 0) {
        kill(_anchor, SIGKILL);
        Reap(_anchor, Duration(3000));
        _anchor = -1;
    }
    for (auto [ns, created] : {std::pair{_host, &_hostCreated}, std::pair{_lan, &_lanCreated}}) {
        if (!*created) continue;
        if (const RunResult r = RunCommand({"ip", "netns", "del", ns}); !r.Ok())
            problems.push_back("ip netns del " + ns + ": " + r.Describe());
        *created = false;
    }
    if (!_dir.empty()) {
        const char* keep = std::getenv("VELK_NETNS_KEEP");
        if (keep != nullptr && *keep != '\0' && ::testing::Test::HasFailure()) {
            std::fprintf(stderr, "kept the test's folder %s\n", _dir.c_str());
        } else {
            std::error_code ec;
            fs::remove_all(_dir, ec);
            if (ec) problems.push_back("removing " + _dir + ": " + ec.message());
        }
        _dir.clear();
    }
    if (!_before.items.empty()) {
        const Guard after = TakeGuard();
        for (size_t i = 0; i < _before.items.size() && i < after.items.size(); ++i)
            if (_before.items[i] != after.items[i])
                problems.push_back("THE MACHINE'S OWN " + _before.items[i].first +
                                   " CHANGED during the test:\n--- before\n" + _before.items[i].second +
                                   "\n--- after\n" + after.items[i].second);
        _before.items.clear();
    }
    for (const std::string& problem : problems) ADD_FAILURE() << "network namespace bed: " << problem;
}

NetnsBed::Guard NetnsBed::TakeGuard() {
    Guard guard;
    for (const char* path : {"/etc/hosts", "/etc/hostname", "/etc/resolv.conf", "/etc/network/interfaces"})
        guard.items.emplace_back(path, ReadWhole(path).value_or("<missing>"));
    for (const char* dir : {"/etc/network/interfaces.d", "/var/lib/dhcp"}) {
        std::vector<std::string> names;
        std::error_code ec;
        for (const auto& entry : fs::directory_iterator(dir, ec)) names.push_back(entry.path().filename());
        std::sort(names.begin(), names.end());
        guard.items.emplace_back(std::string("folder ") + dir, Join(names));
    }
    char name[256] = "";
    gethostname(name, sizeof name - 1);
    guard.items.emplace_back("host name", name);
    return guard;
}

// --- running inside ---

std::vector<std::string> NetnsBed::Wrap(const std::vector<std::string>& argv) const {
    std::vector<std::string> wrapped = {
        "/usr/bin/nsenter", "--target", std::to_string(_anchor), "--mount", "--uts", "--net", "--"};
    wrapped.insert(wrapped.end(), argv.begin(), argv.end());
    return wrapped;
}

RunResult NetnsBed::RunArgv(const std::vector<std::string>& argv, Duration timeout) const {
    return RunCommand(Wrap(argv), timeout);
}

RunResult NetnsBed::Run(const std::string& script, Duration timeout) const {
    return RunArgv({"/bin/sh", "-c", script}, timeout);
}

RunResult NetnsBed::Lan(const std::string& script, Duration timeout) const {
    return RunCommand({"ip", "netns", "exec", _lan, "/bin/sh", "-c", script}, timeout);
}

void NetnsBed::SetCable(const std::string& nic, bool plugged) const {
    Must({"ip", "-n", _lan, "link", "set", "p-" + nic, plugged ? "up" : "down"});
}

// --- files ---

std::string NetnsBed::HostView(const std::string& path) const {
    if (path.empty() || path[0] != '/') throw std::runtime_error("not an absolute path: " + path);
    return "/proc/" + std::to_string(_anchor) + "/root" + path;
}

void NetnsBed::WriteFile(const std::string& path, const std::string& text, mode_t mode) const {
    const std::string real = HostView(path);
    fs::create_directories(fs::path(real).parent_path());
    std::ofstream out(real, std::ios::binary | std::ios::trunc);
    out << text;
    out.close();
    if (!out || chmod(real.c_str(), mode) != 0) throw std::runtime_error("cannot write the host's " + path);
}

std::optional<std::string> NetnsBed::ReadFile(const std::string& path) const {
    return ReadWhole(HostView(path));
}

void NetnsBed::RemoveFile(const std::string& path) const {
    if (unlink(HostView(path).c_str()) != 0 && errno != ENOENT)
        throw std::runtime_error("cannot remove the host's " + path + ": " + std::strerror(errno));
}

void NetnsBed::SetPassword(const std::string& user, const std::string& password) const {
    auto lines = [](const std::string& text) {
        std::vector<std::string> result;
        std::istringstream in(text);
        for (std::string line; std::getline(in, line);) result.push_back(line);
        return result;
    };
    auto joined = [](const std::vector<std::string>& items) {
        std::string text;
        for (const std::string& line : items) text += line + "\n";
        return text;
    };
    const std::string prefix = user + ":";
    std::vector<std::string> passwd = lines(ReadFile("/etc/passwd").value_or(""));
    bool known = false;
    unsigned highest = 1999;
    for (const std::string& line : passwd) {
        known = known || line.rfind(prefix, 0) == 0;
        std::istringstream fields(line);
        std::string name, x, uid;
        if (std::getline(fields, name, ':') && std::getline(fields, x, ':') && std::getline(fields, uid, ':'))
            try {
                const unsigned id = static_cast<unsigned>(std::stoul(uid));
                if (id > highest && id < 60000) highest = id;
            } catch (const std::exception&) {
            }
    }
    if (!known) {
        const std::string id = std::to_string(highest + 1);
        passwd.push_back(user + ":x:" + id + ":" + id + ":" + user + ":/home/" + user + ":/bin/sh");
        WriteFile("/etc/passwd", joined(passwd));
        std::vector<std::string> group = lines(ReadFile("/etc/group").value_or(""));
        group.push_back(user + ":x:" + id + ":");
        WriteFile("/etc/group", joined(group));
    }
    char salt[CRYPT_GENSALT_OUTPUT_SIZE];
    if (crypt_gensalt_rn("$6$", 0, nullptr, 0, salt, sizeof salt) == nullptr)
        throw std::runtime_error("crypt_gensalt failed");
    crypt_data data{};
    const char* hash = crypt_r(password.c_str(), salt, &data);
    if (hash == nullptr || hash[0] == '*') throw std::runtime_error("crypt failed");
    std::vector<std::string> shadow = lines(ReadFile("/etc/shadow").value_or(""));
    const std::string entry = user + ":" + hash + ":19000:0:99999:7:::";
    bool replaced = false;
    for (std::string& line : shadow)
        if (line.rfind(prefix, 0) == 0) {
            line = entry;
            replaced = true;
        }
    if (!replaced) shadow.push_back(entry);
    WriteFile("/etc/shadow", joined(shadow), 0640);
}

// --- the host's syslog ---

std::vector<std::string> NetnsBed::SyslogLines() const {
    if (!_syslog) return {};
    std::lock_guard<std::mutex> lock(_syslog->mutex);
    return _syslog->lines;
}

bool NetnsBed::WaitForSyslog(const std::string& text, Duration timeout, size_t from) const {
    if (!_syslog) return false;
    std::unique_lock<std::mutex> lock(_syslog->mutex);
    size_t seen = from;
    return _syslog->arrived.wait_for(lock, timeout, [&] {
        for (; seen < _syslog->lines.size(); ++seen)
            if (_syslog->lines[seen].find(text) != std::string::npos) return true;
        return false;
    });
}

// --- the kernel ---

std::string NetnsBed::KernelLacks(const std::string& kind) {
    static std::map<std::string, std::string> known;
    if (auto found = known.find(kind); found != known.end()) return found->second;
    if (geteuid() != 0) return "network namespaces need root";
    const std::string ns = UniqueName("velk-k");
    if (const RunResult r = RunCommand({"ip", "netns", "add", ns}); !r.Ok())
        return "ip netns add failed: " + r.Describe();
    std::vector<std::string> tryIt = {"ip", "-n", ns, "link", "add"};
    if (kind == "vlan") {
        RunCommand({"ip", "-n", ns, "link", "add", "d0", "type", "veth", "peer", "name", "d1"});
        tryIt.insert(tryIt.end(), {"link", "d0", "name", "d0.5", "type", "vlan", "id", "5"});
    } else {
        tryIt.insert(tryIt.end(), {"x0", "type", kind});
    }
    const RunResult r = RunCommand(tryIt);
    RunCommand({"ip", "netns", "del", ns});
    std::string reason;
    if (!r.Ok()) {
        const std::string what = kind == "vlan" ? "802.1Q VLAN" : kind == "bond" ? "bonding" : kind;
        reason = "the kernel has no " + what + " support (" + Join(tryIt) + ": " + r.Describe() + ")";
    }
    known[kind] = reason;
    return reason;
}

bool WaitUntil(const std::function<bool()>& done, Duration timeout) {
    const auto deadline = std::chrono::steady_clock::now() + timeout;
    while (!done()) {
        if (std::chrono::steady_clock::now() >= deadline) return false;
        std::this_thread::sleep_for(Duration(200));
    }
    return true;
}

}  // namespace Netns
