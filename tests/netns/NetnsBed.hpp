// A test bed in network namespaces: a "host" namespace with veth NICs, a
// bridge vmbr0 on the first NIC with a VM's tap as a second port, and a "LAN"
// namespace holding a bridge with the NICs' peers, 192.0.2.1/24 and
// 2001:db8:1::1/64, where dnsmasq serves DHCPv4, DHCPv6, router
// advertisements and DNS. Commands run inside the host with the test's own
// files: a private mount and UTS namespace (kept alive by a sleeping anchor
// process for the whole test) with an overlay on /etc and /var/lib whose upper
// folders are the test's, the test's own /run and /var/tmp, and the host name
// of the bed. The machine's own files and host name are compared before and
// after; a change fails the test. Everything is torn down when the bed goes,
// also after a failed test.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace Netns {

using Duration = std::chrono::milliseconds;
inline constexpr Duration kCommandTimeout{30000};

struct RunResult {
    int status = -1;  // exit status; -1 after a signal or the timeout
    bool timedOut = false;
    std::string out, err;
    bool Ok() const { return status == 0; }
    // "exit 1: <err>" for failure messages.
    std::string Describe() const;
};

// Runs `argv` (argv[0] looked up in PATH, sbin folders included) with
// standard input from /dev/null until it ends or `timeout` passes (then it is
// killed). Output is read until the program itself ends; daemons it leaves
// behind do not hold the call up.
RunResult RunCommand(const std::vector<std::string>& argv, Duration timeout = kCommandTimeout,
                     const std::string& cwd = "");

struct BedOptions {
    // The host's name in its UTS namespace and files; the LAN's DNS answers
    // for "<hostName>.<domain>" and "<hostName>" with the two addresses.
    std::string hostName = "velk-host";
    std::string domain = "example.test";
    std::string hostAddress = "192.0.2.10";
    std::string hostAddress6 = "2001:db8:1::10";
    // The host's NICs (veth pairs whose peers are ports of the LAN's bridge).
    std::vector<std::string> nics = {"eno1", "eno2"};
    // vmbr0 with the first NIC and the VM port tap100i0 as ports. Without it
    // the NICs and taps are created but nothing is attached (a test brings
    // them up through ifupdown and attaches the taps itself).
    bool bridges = true;
    // vmbr1 holding only tap101i0: a VM network without an uplink that
    // changes of the management network must leave alone.
    bool secondBridge = true;
    // dnsmasq in the LAN. Without it nothing answers DHCP, RS or DNS.
    bool lanServer = true;
    // /etc/hostname, /etc/hosts and /etc/resolv.conf of the test agree with
    // the names and addresses above.
    bool writeHostFiles = true;
    // ifupdown2 (fetched once with apt-get download, unpacked into a cache
    // folder and laid over /usr/share, /usr/sbin and /var/lib read-only)
    // instead of the machine's ifupdown. When it cannot be fetched the bed is
    // skipped with the reason.
    bool ifupdown2 = false;
    // The host's own /dev/log (an overlay on /dev inside the host's mount
    // namespace), read by the bed: programs' syslog lines, for tests that
    // follow a program's steps.
    bool syslog = false;
};

class NetnsBed {
public:
    // Builds the bed. When the machine cannot hold it (not root, `ip netns
    // add` fails, ifupdown2 cannot be fetched) SkipReason() tells why and
    // nothing else may be called. Any other failure throws
    // std::runtime_error after tearing down what was built.
    explicit NetnsBed(BedOptions options = {});
    ~NetnsBed();
    NetnsBed(const NetnsBed&) = delete;
    NetnsBed& operator=(const NetnsBed&) = delete;

    bool Skipped() const { return !_skipReason.empty(); }
    const std::string& SkipReason() const { return _skipReason; }

    const BedOptions& Options() const { return _options; }
    const std::string& HostNamespace() const { return _host; }
    const std::string& LanNamespace() const { return _lan; }
    // The test's folder on the machine (upper folders, logs, leases).
    const std::string& Dir() const { return _dir; }

    // --- running inside the host ---
    // `script` through /bin/sh -c inside the host's network, mount and UTS
    // namespaces. Every call shares the one mount namespace, so /run and
    // /var/lib outlive a program, as they do on a machine.
    RunResult Run(const std::string& script, Duration timeout = kCommandTimeout) const;
    RunResult RunArgv(const std::vector<std::string>& argv, Duration timeout = kCommandTimeout) const;
    // The argv that starts `argv` inside the host (nsenter into the anchor's
    // namespaces): for a pseudo-terminal harness, program = result[0] and
    // args = the rest. The environment passes through unchanged.
    std::vector<std::string> Wrap(const std::vector<std::string>& argv) const;

    // --- the host's files, as the host sees them ---
    // Writes `text` to the absolute path `path` ("/etc/network/interfaces")
    // of the host's view, creating its folders; the machine's file stays.
    void WriteFile(const std::string& path, const std::string& text, mode_t mode = 0644) const;
    // The file's content; nothing when it does not exist.
    std::optional<std::string> ReadFile(const std::string& path) const;
    // Hides the file from the host (an overlay whiteout for /etc, /var/lib).
    void RemoveFile(const std::string& path) const;
    // A user with `password` in the host's /etc/passwd, /etc/group and
    // /etc/shadow (SHA-512 hash); an existing user such as root only gets
    // the new password.
    void SetPassword(const std::string& user, const std::string& password) const;

    // --- the LAN ---
    RunResult Lan(const std::string& script, Duration timeout = kCommandTimeout) const;
    // Pulls (or plugs back) the cable of a host NIC: its LAN peer goes down,
    // so the NIC loses its carrier.
    void SetCable(const std::string& nic, bool plugged) const;
    void StartLanServer();
    void StopLanServer();
    // dnsmasq's log (DHCP and RA exchanges).
    std::string LanServerLog() const;

    // --- the host's syslog (BedOptions::syslog) ---
    // Every message received so far, in order ("<14>Nov 24 ... VELK: text").
    std::vector<std::string> SyslogLines() const;
    // Waits until a message from the `from`th on contains `text`; false
    // after `timeout`.
    bool WaitForSyslog(const std::string& text, Duration timeout = kCommandTimeout, size_t from = 0) const;

    // Whether the kernel can make the link kind ("vlan", "bond"): tries one
    // in a scratch namespace. "" when it can, else the reason to skip.
    static std::string KernelLacks(const std::string& kind);

private:
    void Build();
    void StartAnchor();
    void WriteHostFiles() const;
    std::string HostView(const std::string& path) const;
    void Teardown();
    struct Guard {
        std::vector<std::pair<std::string, std::string>> items;  // what, content
    };
    static Guard TakeGuard();

    BedOptions _options;
    std::string _skipReason;
    std::string _host, _lan;  // namespace names
    std::string _dir;
    std::string _ifupdown2;  // the unpacked package, "" when not used
    bool _hostCreated = false, _lanCreated = false;
    pid_t _anchor = -1;
    pid_t _dnsmasq = -1;
    Guard _before;
    struct SyslogReader;
    std::unique_ptr<SyslogReader> _syslog;
};

// Polls `done` every 200 ms until it holds or `timeout` passes; whether it
// held.
bool WaitUntil(const std::function<bool()>& done, Duration timeout);

}  // namespace Netns
