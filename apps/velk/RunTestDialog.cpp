#include "RunTestDialog.hpp"

#include <fcntl.h>
#include <signal.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <system_error>
#include <vector>

#include "StringFactory.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

using HostCtl::Lib::HostPath;
using HostCtl::Lib::Syslog;

namespace {

const char* const HOSTS = "/etc/hosts";
const char* const HOSTS_BACKUP = "/etc/hosts.backup";

std::string ErrnoText(int err) { return std::error_code(err, std::generic_category()).message(); }

// In a child right after fork: the signals the console blocks are open again,
// and no descriptor of the console is left but those of `keep`.
void PrepareChild() {
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
    signal(SIGPIPE, SIG_DFL);
    closefrom(3);
}

// Copies `from` to `to`, which must not exist yet. 0 or an errno value.
int CopyNew(const std::string& from, const std::string& to) {
    const int in = open(from.c_str(), O_RDONLY | O_CLOEXEC);
    if (in < 0) return errno;
    const int out = open(to.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0644);
    if (out < 0) {
        const int err = errno;
        close(in);
        return err;
    }
    int err = 0;
    char buf[8192];
    for (;;) {
        ssize_t n = read(in, buf, sizeof buf);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) {
            if (n < 0) err = errno;
            break;
        }
        for (ssize_t done = 0; done < n && err == 0;) {
            ssize_t w = write(out, buf + done, size_t(n - done));
            if (w < 0 && errno != EINTR) err = errno;
            if (w > 0) done += w;
        }
        if (err != 0) break;
    }
    if (err == 0 && fsync(out) < 0) err = errno;
    close(in);
    close(out);
    if (err != 0) unlink(to.c_str());
    return err;
}

}  // namespace

RunTestDialog::RunTestDialog(Frame* parent, const std::optional<HostCtl::Network::IpAddress>& target1,
                             const std::optional<HostCtl::Network::IpAddress>& target2,
                             const std::optional<HostCtl::Network::IpAddress>& target3,
                             const std::string& hostName)
    : Dialog(parent, 70, 14, 6), _targets{target1, target2, target3}, _hostName(hostName) {
    _results = new TextArea(_content, 0, 0, _content->GetWidth(), _content->GetHeight(), BLACK);
    try {
        if (auto mgmt = QelCtl::Network::NetworkInfoImpl().GetManagementInterface())
            _interfaceName = mgmt->GetName();
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_WARNING, "Cannot find the management interface: %s", e.what());
    }
}

RunTestDialog::~RunTestDialog() { Uninstall(); }

std::string RunTestDialog::PingLine(const std::string& label, int number,
                                    const HostCtl::Network::IpAddress& target,
                                    const std::string& interfaceName) {
    std::string address = target.GetStringAddress();
    if (target.IsIpv6() && target.V6().IsLinkLocal()) address += "%" + interfaceName;
    return label + " #" + std::to_string(number) + " (" + address + ").";
}

void RunTestDialog::Uninstall() {
    _childExitHandler = nullptr;
    _pid = -1;
}

int RunTestDialog::Run() {
    SetTitle(_factory->GetString(219));
    SetDescription(_factory->GetString(220));
    SetFooter("{align:right}{color:black}<Esc>{/color} {color:dark-grey}Cancel{/color}{/align}");
    Refresh();
    _childExitHandler = [this](pid_t pid, int status) { ChildExited(pid, status); };

    for (int n = 0; n < 3; ++n) {
        if (!_targets[n]) continue;
        _results->AppendText(
            TextArea::Escape(PingLine(_factory->GetString(221), n + 1, *_targets[n], _interfaceName)));
        Refresh();
        if (!WaitForCheck(PingCheck(*_targets[n]))) return false;
    }
    if (!_hostName.empty()) {
        _results->AppendText(
            TextArea::Escape(std::string(_factory->GetString(222)) + " (" + _hostName + ")."));
        Refresh();
        if (!WaitForCheck(ResolveCheck(_hostName))) return false;
    }

    Uninstall();
    SetFooter("{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}{/align}");
    Refresh();
    while (GetKey(true) != '\n') {
    }
    return true;
}

bool RunTestDialog::WaitForCheck(pid_t pid) {
    if (pid < 0) {
        WriteResult(1);
        return true;
    }
    _pid = pid;
    _done = false;
    while (!_done) {
        if (GetKey(true) == 27) {
            Uninstall();
            return false;
        }
    }
    _pid = -1;
    return true;
}

void RunTestDialog::ChildExited(pid_t pid, int status) {
    if (_pid < 0 || pid != _pid) return;
    WriteResult(status);
}

void RunTestDialog::WriteResult(int status) {
    _results->AppendText(std::string("{align:right}") + _factory->GetString(status == 0 ? 224 : 223) +
                         "{/align}\n");
    Refresh();
    _done = true;
}

// The ping tool's arguments: the target takes the place of "-c1", so the
// tool runs with the target, "-I" and the interface; without an interface,
// with the target alone.
pid_t RunTestDialog::PingCheck(const HostCtl::Network::IpAddress& target) {
    const std::string path = HostPath("/sbin/qelping");
    const std::string address = target.GetStringAddress();
    std::vector<const char*> argv = {"qelping", "-c1"};
    if (!_interfaceName.empty()) argv.insert(argv.end(), {"-I", _interfaceName.c_str()});
    argv[1] = address.c_str();
    argv.push_back(nullptr);
    const char* const env[] = {nullptr};

    Window::Flush();
    const pid_t pid = fork();
    if (pid == 0) {
        PrepareChild();
        close(0);
        close(1);
        close(2);
        execve(path.c_str(), const_cast<char* const*>(argv.data()), const_cast<char* const*>(env));
        _exit(1);
    }
    // A ping left running by Esc must not outlive the console.
    if (pid > 0) WatchChild(pid, true);
    return pid;
}

pid_t RunTestDialog::ResolveCheck(const std::string& hostName) {
    Window::Flush();
    const pid_t pid = fork();
    if (pid == 0) {
        PrepareChild();
        _exit(ResolveInChild(hostName));
    }
    // A resolver check runs to its end even after the console: it puts the
    // hosts file back.
    if (pid > 0) WatchChild(pid, false);
    return pid;
}

int RunTestDialog::ResolveInChild(const std::string& hostName) {
    const std::string hosts = HostPath(HOSTS);
    const std::string backup = HostPath(HOSTS_BACKUP);
    if (const int err = CopyNew(hosts, backup); err != 0) {
        Syslog(LOG_INFO, "failed to backup /etc/hosts: %s", ErrnoText(err).c_str());
        return 2;
    }
    bool resolved = false;
    try {
        QelCtl::Network::HostsFile::RemoveEntryByHostName(hostName);
        resolved = !QelCtl::Network::NameResolverImpl().Resolve(hostName).empty();
    } catch (const HostCtl::Lib::HostCtlException& e) {
        Syslog(LOG_INFO, "Resolving %s failed: %s", hostName.c_str(), e.what());
    }
    // The saved file takes the edited one's place in one step, so that the
    // host never goes without a hosts file.
    if (rename(backup.c_str(), hosts.c_str()) < 0)
        Syslog(LOG_INFO, "failed to restore /etc/hosts: %s", ErrnoText(errno).c_str());
    return resolved ? 0 : 1;
}

}  // namespace Velk
