// The host's hosts file, edited by host name.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>
#include <vector>

#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"
#include "hostctl/SimState.hpp"

namespace QelCtl::Network {

using HostCtl::Lib::HostCtlException;

namespace {

std::string ErrnoText(int err) { return std::error_code(err, std::generic_category()).message(); }

// Host names compare without regard to letter case, as resolvers do.
bool SameName(const std::string& a, const std::string& b) {
    if (a.size() != b.size()) return false;
    for (size_t i = 0; i < a.size(); ++i) {
        char x = a[i], y = b[i];
        if (x >= 'A' && x <= 'Z') x = char(x - 'A' + 'a');
        if (y >= 'A' && y <= 'Z') y = char(y - 'A' + 'a');
        if (x != y) return false;
    }
    return true;
}

// The text of the file and its permission bits.
std::string ReadWhole(const std::string& path, mode_t& mode) {
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) throw HostCtlException(path + ": cannot read: " + ErrnoText(errno));
    struct stat st;
    if (fstat(fd, &st) < 0) {
        const int err = errno;
        close(fd);
        throw HostCtlException(path + ": cannot read: " + ErrnoText(err));
    }
    if (!S_ISREG(st.st_mode)) {
        close(fd);
        throw HostCtlException(path + ": cannot read: not a file");
    }
    mode = st.st_mode & 07777;
    std::string text;
    char buf[8192];
    for (;;) {
        const ssize_t n = read(fd, buf, sizeof buf);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) {
            const int err = errno;
            close(fd);
            throw HostCtlException(path + ": cannot read: " + ErrnoText(err));
        }
        if (n == 0) break;
        text.append(buf, size_t(n));
    }
    close(fd);
    return text;
}

// The lines of `text` with `hostName` taken off each line that names it;
// `changed` tells whether any line did.
std::string WithoutName(const std::string& text, const std::string& hostName, bool& changed) {
    std::string out;
    for (const std::string& line : HostCtl::Lib::Lines(text)) {
        const size_t hash = line.find('#');
        std::vector<std::string> fields = HostCtl::Lib::Words(std::string_view(line).substr(0, hash));
        const std::string address = fields.empty() ? "" : fields[0];
        std::vector<std::string> kept;
        bool named = false;
        for (size_t f = 1; f < fields.size(); ++f) {
            const std::string& name = fields[f];
            if (SameName(name, hostName))
                named = true;
            else
                kept.push_back(name);
        }
        if (!named) {
            out += line + "\n";
            continue;
        }
        changed = true;
        if (kept.empty()) continue;  // a line without names has no meaning left
        std::string rebuilt = address + "\t";
        for (size_t i = 0; i < kept.size(); ++i) rebuilt += (i > 0 ? " " : "") + kept[i];
        if (hash != std::string::npos) rebuilt += " " + line.substr(hash);
        out += rebuilt + "\n";
    }
    return out;
}

}  // namespace

void HostsFile::RemoveEntryByHostName(const std::string& hostName) {
    // The machine's own /etc stays untouched: like every other operation on
    // a real host for now, this one is refused there.
    if (!HostCtl::Lib::IsSimulatedHost())
        throw HostCtlException("/etc/hosts: removing a host name: not available on this host");
    const std::string path = HostCtl::Lib::HostPath("/etc/hosts");
    // Under the state's lock, the hosts file's other writer (which follows
    // the host's name and address) cannot slip in between read and write.
    HostCtl::Lib::SimState(HostCtl::Lib::HostRoot()).WithLock([&] {
        mode_t mode = 0644;
        const std::string text = ReadWhole(path, mode);
        bool changed = false;
        const std::string edited = WithoutName(text, hostName, changed);
        if (changed) HostCtl::Lib::ReplaceFile(path, edited, mode);
    });
}

}  // namespace QelCtl::Network
