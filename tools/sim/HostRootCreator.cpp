#include "HostRootCreator.hpp"

#include <fcntl.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>
#include <random>
#include <stdexcept>
#include <system_error>
#include <vector>

#include "NetworkShapes.hpp"
#include "ToolSupport.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/SimNetwork.hpp"
#include "hostctl/SimState.hpp"

extern char** environ;

namespace VelkTools {

namespace fs = std::filesystem;
using nlohmann::json;

namespace {

// The machine's own key and certificate tools, run to make the host's keys.
const char* const OPENSSL = "/usr/bin/openssl";
const char* const SSH_KEYGEN = "/usr/bin/ssh-keygen";

[[noreturn]] void Fail(const std::string& what) { throw std::runtime_error(what); }

std::string ErrnoText(int err) { return std::error_code(err, std::generic_category()).message(); }

// The last non-empty line of a tool's error output, for a one-line message.
std::string LastLine(const std::string& text) {
    size_t end = text.find_last_not_of("\r\n \t");
    if (end == std::string::npos) return "";
    size_t start = text.rfind('\n', end);
    return text.substr(start == std::string::npos ? 0 : start + 1,
                       end - (start == std::string::npos ? 0 : start + 1) + 1);
}

// Runs `argv` (argv[0] an absolute path) with input and output on /dev/null
// and its error output collected. Returns the exit status, or -1 when it
// could not be run or was killed.
int RunProgram(const std::vector<std::string>& argv, std::string& errText) {
    int pipeFds[2];
    if (pipe2(pipeFds, O_CLOEXEC) < 0) {
        errText = "cannot create a pipe: " + ErrnoText(errno);
        return -1;
    }
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_addopen(&actions, 1, "/dev/null", O_WRONLY, 0);
    posix_spawn_file_actions_adddup2(&actions, pipeFds[1], 2);

    std::vector<char*> args;
    for (const std::string& a : argv) args.push_back(const_cast<char*>(a.c_str()));
    args.push_back(nullptr);
    pid_t pid = -1;
    int rc = posix_spawn(&pid, args[0], &actions, nullptr, args.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    close(pipeFds[1]);
    if (rc != 0) {
        close(pipeFds[0]);
        errText = "cannot run " + argv[0] + ": " + ErrnoText(rc);
        return -1;
    }
    char buf[4096];
    for (;;) {
        ssize_t n = read(pipeFds[0], buf, sizeof buf);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;
        errText.append(buf, size_t(n));
    }
    close(pipeFds[0]);
    int status = 0;
    while (waitpid(pid, &status, 0) < 0) {
        if (errno != EINTR) return -1;
    }
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

void Run(const std::vector<std::string>& argv, const std::string& what) {
    std::string errText;
    int status = RunProgram(argv, errText);
    if (status != 0) {
        std::string detail = LastLine(errText);
        Fail(what + " failed" + (status > 0 ? " with status " + std::to_string(status) : std::string()) +
             (detail.empty() ? "" : ": " + detail));
    }
}

// Removes a file or symbolic link so that a new one can take its place; a
// folder in the way is an error.
void RemoveIfPresent(const fs::path& path) {
    std::error_code ec;
    fs::file_status st = fs::symlink_status(path, ec);
    if (ec || !fs::exists(st)) return;
    if (fs::is_directory(st)) Fail(path.string() + ": is a folder, expected a file");
    if (!fs::remove(path, ec) || ec) Fail(path.string() + ": cannot remove: " + ec.message());
}

void MakeDirectories(const fs::path& path) {
    std::error_code ec;
    fs::create_directories(path, ec);
    if (ec) Fail(path.string() + ": cannot create: " + ec.message());
    if (!fs::is_directory(path)) Fail(path.string() + ": exists and is not a folder");
}

// Writes a new file (never through a link left at that place).
void WriteFile(const fs::path& path, const std::string& content, mode_t mode) {
    RemoveIfPresent(path);
    int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
    if (fd < 0) Fail(path.string() + ": cannot create: " + ErrnoText(errno));
    size_t done = 0;
    while (done < content.size()) {
        ssize_t n = write(fd, content.data() + done, content.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) {
            int err = errno;
            close(fd);
            Fail(path.string() + ": cannot write: " + ErrnoText(err));
        }
        done += size_t(n);
    }
    if (fchmod(fd, mode) < 0 || fsync(fd) < 0 || close(fd) < 0)
        Fail(path.string() + ": cannot write: " + ErrnoText(errno));
}

void MakeSymlink(const std::string& target, const fs::path& link) {
    RemoveIfPresent(link);
    std::error_code ec;
    fs::create_symlink(target, link, ec);
    if (ec) Fail(link.string() + ": cannot link to " + target + ": " + ec.message());
}

// Makes the root folder: a new one, an empty one, or (with force) any folder.
fs::path PrepareRoot(const HostRootOptions& options) {
    if (options.root.empty()) Fail("no host root given");
    fs::path root = options.root;
    std::error_code ec;
    fs::file_status st = fs::status(root, ec);
    if (fs::exists(st)) {
        if (!fs::is_directory(st)) Fail(options.root + ": exists and is not a folder");
        bool empty = fs::is_empty(root, ec);
        if (ec) Fail(options.root + ": cannot read: " + ec.message());
        if (!empty && !options.force)
            Fail(options.root + ": already exists and is not empty (use --force to create the host over it)");
    } else {
        MakeDirectories(root);
    }
    fs::path absolute = fs::canonical(root, ec);
    if (ec) Fail(options.root + ": " + ec.message());
    return absolute;
}

void MakeCertificate(const fs::path& root, const std::string& fqdn) {
    fs::path crt = root / "etc/zolva/ssl/rui.crt";
    fs::path key = root / "etc/zolva/ssl/rui.key";
    RemoveIfPresent(crt);
    RemoveIfPresent(key);
    Run({OPENSSL, "req", "-x509", "-newkey", "rsa:2048", "-nodes", "-sha256", "-days", "3650", "-subj",
         "/CN=" + fqdn, "-keyout", key.string(), "-out", crt.string()},
        "making the certificate " + crt.string());
}

// Makes a key pair with ssh-keygen; false when this ssh-keygen cannot make
// keys of that type (then nothing is left behind).
bool MakeSshKey(const fs::path& key, const std::string& type, const std::string& comment, bool required) {
    fs::path pub = key.string() + ".pub";
    RemoveIfPresent(key);
    RemoveIfPresent(pub);
    std::vector<std::string> argv = {SSH_KEYGEN, "-q", "-t",    type, "-N",
                                     "",         "-C", comment, "-f", key.string()};
    if (type == "rsa") argv.insert(argv.begin() + 4, {"-b", "2048"});
    if (required) {
        Run(argv, "making the SSH host key " + key.string());
        return true;
    }
    std::string errText;
    if (RunProgram(argv, errText) == 0) return true;
    std::error_code ec;
    fs::remove(key, ec);
    fs::remove(pub, ec);
    return false;
}

std::string Text(const json& state, const std::string& pointer) {
    const json* at = &state;
    try {
        at = &state.at(json::json_pointer(pointer));
    } catch (const json::exception&) {
        return "";
    }
    return at->is_string() ? at->get<std::string>() : at->dump();
}

// A few lines of each of the host's logs, so that the log viewer has
// something to show.
std::vector<std::pair<std::string, std::string>> Logs(const json& state, const std::string& fqdn) {
    std::string t = HostCtl::Lib::UtcTimestamp();
    std::string version = Text(state, "/version/version");
    std::string build = Text(state, "/version/build");
    std::string address = "no IPv4 address";
    for (const json& vnic : state.at("network").at("vnics"))
        if (vnic.at("name") == state.at("network").at("managementInterface") &&
            vnic.at("ipv4").at("address") != "0.0.0.0")
            address = vnic.at("ipv4").at("address");
    std::string nic = Text(state, "/network/pnics/0/name");
    return {
        {"syslog.log", t + " sysboot[412]: daemon.info: Starting the host's services\n" + t +
                           " qelkernel[0]: kern.info: Host kernel " + version + " " + build + " started\n" +
                           t + " corad[2099]: daemon.info: Host agent started on " + fqdn + "\n" + t +
                           " sshd[2210]: auth.info: Server listening on 0.0.0.0 port 22.\n"},
        {"qelkernel.log", t + " cpu0:1)Boot: Loading the host kernel " + version + " " + build + "\n" + t +
                              " cpu0:1)Init: Memory and processors initialised\n" + t +
                              " cpu1:2097)Net: " + nic + ": link up, 1000 Mbps, full duplex\n"},
        {"sysboot.log", t + " sysboot: Loading the host configuration\n" + t +
                            " sysboot: Bringing up the management network (" + address + ")\n" + t +
                            " sysboot: Boot complete\n"},
        {"corad.log", t + " info corad[2099] Host agent " + version + " started\n" + t +
                          " info corad[2099] Listening for management connections on port 443\n" + t +
                          " verbose corad[2114] Host state refreshed\n"},
        {"tirpa.log", t + " info tirpa[2230] Korvanet agent started\n" + t +
                          " info tirpa[2230] Connected to the host agent\n"},
        {"halvo.log", t + " halvo[2301]: High availability agent installed\n" + t +
                          " halvo[2301]: Not part of a cluster; waiting for configuration\n"},
        {"obzd.log", t + " obzd[1990]: Observation service started\n" + t +
                         " obzd[1990]: Recorded event obz.host.boot\n"},
    };
}

// The console authenticates through PAM service "velk". A simulated host
// must not need /etc/pam.d, so its services live in ROOT/etc/pam-wrapper and
// check passwords against ROOT/etc/pam-wrapper/passdb (user:password:service
// lines) with pam_matrix. The console is run on such a host as
//   PAM_WRAPPER=1 LD_PRELOAD=libpam_wrapper.so PAM_WRAPPER_SERVICE_DIR=ROOT/etc/pam-wrapper velk ...
// Without PAM_WRAPPER=1 and the service folder, the preloaded wrapper makes
// authentication spin forever, so always set all three together. A password
// change rewrites passdb. "other" denies everything: without it libpam
// prints complaints over the screen.
void MakePam(const fs::path& root, const std::string& password) {
    const fs::path dir = PamServiceDir(root.string());
    MakeDirectories(dir);
    // libpam splits a service line at blanks; an argument in square brackets
    // may hold blanks, with "]" written as "\]".
    std::string passdb = "passdb=" + PamPassdbPath(root.string());
    if (passdb.find_first_of(" \t]") != std::string::npos) {
        std::string quoted = "[";
        for (char c : passdb) quoted += c == ']' ? std::string("\\]") : std::string(1, c);
        passdb = quoted + "]";
    }
    const std::string matrix = std::string(VELK_PAM_WRAPPER_MODULES) + "/pam_matrix.so " + passdb;
    std::string velk;
    for (const char* type : {"auth", "account", "password"})
        velk += std::string(type) + "\trequired\t" + matrix + "\n";
    WriteFile(dir / "velk", velk, 0644);
    WriteFile(
        dir / "other",
        "auth\trequired\tpam_deny.so\naccount\trequired\tpam_deny.so\npassword\trequired\tpam_deny.so\n",
        0644);
    // guest authenticates but may not use the console.
    WriteFile(PamPassdbPath(root.string()), "root:" + password + ":velk\nguest:guest-pass:other\n", 0600);
}

// "demo-" and six random lowercase letters and digits.
std::string DemoPassword() {
    static const char ALPHABET[] = "abcdefghijklmnopqrstuvwxyz0123456789";
    std::random_device random;
    std::uniform_int_distribution<size_t> pick(0, sizeof ALPHABET - 2);
    std::string password = "demo-";
    for (int i = 0; i < 6; ++i) password += ALPHABET[pick(random)];
    return password;
}

std::string ToolScript(const std::string& binary, const fs::path& root, const std::string& tool) {
    return "#!/bin/sh\n"
           "# A tool of a simulated host: runs the simulated " +
           tool + " on this host's state.\n" + "exec " + ShellQuote(binary) + " --root " +
           ShellQuote(root.string()) + " " + tool + " \"$@\"\n";
}

}  // namespace

std::string PamServiceDir(const std::string& root) { return root + "/etc/pam-wrapper"; }

std::string PamPassdbPath(const std::string& root) { return PamServiceDir(root) + "/passdb"; }

std::string ReadRootPassword(const std::string& root) {
    const std::string path = PamPassdbPath(root);
    std::ifstream in(path);
    if (!in) Fail(path + ": cannot read: " + ErrnoText(errno));
    std::string line;
    while (std::getline(in, line)) {
        if (line.rfind("root:", 0) != 0) continue;
        size_t end = line.find(':', 5);
        return line.substr(5, end == std::string::npos ? std::string::npos : end - 5);
    }
    Fail(path + ": has no line for root");
}

void SetLoginSecret(const std::string& root, const std::string& user, const std::string& secret) {
    if (!IsValidPassword(user)) Fail("bad user name \"" + user + "\"");
    if (!IsValidPassword(secret)) Fail("bad secret: it may not be empty or hold ':' or line breaks");
    const std::string path = PamPassdbPath(root);
    std::ifstream in(path);
    if (!in) Fail(path + ": cannot read: " + ErrnoText(errno));
    std::string content, line;
    bool replaced = false;
    while (std::getline(in, line)) {
        if (line.rfind(user + ":", 0) == 0) {
            // Keep the service the line names; only the secret changes.
            size_t end = line.find(':', user.size() + 1);
            line = user + ":" + secret + (end == std::string::npos ? ":velk" : line.substr(end));
            replaced = true;
        }
        content += line + "\n";
    }
    if (!replaced) content += user + ":" + secret + ":velk\n";
    const fs::path temporary = path + ".new";
    WriteFile(temporary, content, 0600);
    std::error_code ec;
    fs::rename(temporary, path, ec);
    if (ec) Fail(path + ": cannot replace: " + ec.message());
}

bool IsValidPassword(const std::string& password) {
    return !password.empty() && password.find_first_of(":\r\n") == std::string::npos;
}

bool IsValidHostname(const std::string& hostname) {
    if (hostname.empty() || hostname.size() > 253 || hostname.front() == '.' || hostname.back() == '.')
        return false;
    for (char c : hostname) {
        bool ok = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' ||
                  c == '.';
        if (!ok) return false;
    }
    return hostname.find("..") == std::string::npos;
}

std::string CreateHostRoot(const HostRootOptions& options) {
    if (!IsValidHostname(options.hostname))
        Fail("bad host name \"" + options.hostname + "\": use letters, digits, '-' and '.'");
    if (options.hostCommandBinary.empty() || access(options.hostCommandBinary.c_str(), X_OK) != 0)
        Fail("cannot find the simulated host tools: " +
             (options.hostCommandBinary.empty() ? std::string("no path") : options.hostCommandBinary) +
             " is not an executable");

    if (!options.password.empty() && !IsValidPassword(options.password))
        Fail("bad password: it may not hold ':' or line breaks");

    json state = HostCtl::Lib::DefaultHostState(options.hostname);
    ApplyNetworkShapes(state, options.networkShapes);

    fs::path root = PrepareRoot(options);
    for (const char* dir : {"bin", "sbin", "dev", "etc/ssh", "etc/zolva/ssl", "var/log", "var/run/zolva",
                            "usr/lib/zolva/openssh/bin"})
        MakeDirectories(root / dir);

    HostCtl::Lib::SimState(root.string()).Replace(state);

    std::string fqdn = options.hostname;
    std::string shortName = Text(state, "/network/dns/hostname");
    // The loopback lines, then the host's own line as the host control
    // library keeps it.
    WriteFile(root / "etc/hosts",
              "127.0.0.1\tlocalhost.localdomain localhost\n::1\tlocalhost.localdomain localhost\n", 0644);
    HostCtl::Lib::SyncHostsFile(root.string(), state);

    MakeCertificate(root, fqdn);
    MakeSshKey(root / "etc/ssh/ssh_host_rsa_key", "rsa", "root@" + shortName, true);
    // Newer ssh-keygen builds cannot make DSA keys; a host without one is
    // still a valid host.
    MakeSshKey(root / "etc/ssh/ssh_host_dsa_key", "dsa", "root@" + shortName, false);

    for (const auto& [name, text] : Logs(state, fqdn)) WriteFile(root / "var/log" / name, text, 0644);
    WriteFile(root / "var/run/zolva/show-velk-login", "", 0644);
    // The support information pages a host installs with the console.
    fs::create_directories(root / "usr/share/velk");
    fs::copy_file(options.supportInfo, root / "usr/share/velk/support-info",
                  fs::copy_options::overwrite_existing);

    WriteFile(root / "bin/hrm-cmd", ToolScript(options.hostCommandBinary, root, "hrm-cmd"), 0755);
    WriteFile(root / "sbin/grabCIMData", ToolScript(options.hostCommandBinary, root, "grabCIMData"), 0755);
    WriteFile(root / "bin/powerOffVms", ToolScript(options.hostCommandBinary, root, "powerOffVms"), 0755);
    WriteFile(root / "sbin/powerOffVms", ToolScript(options.hostCommandBinary, root, "powerOffVms"), 0755);

    WriteFile(root / "sbin/reboot", ToolScript(options.hostCommandBinary, root, "reboot"), 0755);
    WriteFile(root / "sbin/poweroff", ToolScript(options.hostCommandBinary, root, "poweroff"), 0755);
    WriteFile(root / "sbin/firmwareConfig.sh",
              ToolScript(options.hostCommandBinary, root, "firmwareConfig.sh"), 0755);
    WriteFile(root / "sbin/qelping", ToolScript(options.hostCommandBinary, root, "qelping"), 0755);
    MakePam(root, options.password.empty() ? DemoPassword() : options.password);

    WriteFile(root / "bin/openssl", ToolScript(options.hostCommandBinary, root, "openssl"), 0755);
    MakeSymlink(SSH_KEYGEN, root / "usr/lib/zolva/openssh/bin/ssh-keygen");
    MakeSymlink("/usr/bin/less", root / "bin/less");
    MakeSymlink("/bin/sh", root / "bin/sh");

    // Services: the init scripts, advanced-option tools, the management
    // agents' start script and the live-core tool.
    MakeDirectories(root / "etc/init.d");
    for (const char* script : {"TarnShell", "SSH"})
        WriteFile(root / "etc/init.d" / script, ToolScript(options.hostCommandBinary, root, script), 0755);
    for (const char* tool : {"tarncfg-advcfg", "tarncli", "localcli", "services.sh", "qelbacktrace"})
        WriteFile(root / "sbin" / tool, ToolScript(options.hostCommandBinary, root, tool), 0755);
    return root.string();
}

}  // namespace VelkTools
