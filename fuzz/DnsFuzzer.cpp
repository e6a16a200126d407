// The parsers the network screens added: the DNS suffix line, domain names,
// and the editing of the host's hosts file by host name.
//
// Input: the first line is a host name, the second a suffix line as typed,
// the rest the hosts file. Rules: the suffix line splits into non-empty
// pieces without separators that join and split back to the same list;
// domain names are checked label by label; removing a name from the hosts
// file leaves no line naming it, keeps every other line as it was and in
// order, and removing it again changes nothing.
#include <sys/stat.h>

#include <cstdint>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "FuzzSupport.hpp"
#include "NetworkWindow.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"
#include "hostctl/SimState.hpp"

namespace {

using fuzz_support::FileText;
using fuzz_support::Require;

std::string g_root;

std::vector<std::string> Lines(const std::string& text) {
    std::vector<std::string> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
}

char Lower(char c) { return c >= 'A' && c <= 'Z' ? char(c - 'A' + 'a') : c; }

bool SameName(const std::string& a, const std::string& b) {
    if (a.size() != b.size()) return false;
    for (size_t i = 0; i < a.size(); ++i)
        if (Lower(a[i]) != Lower(b[i])) return false;
    return true;
}

// True when the line lists `name` among its host names (the fields after the
// address, before a comment).
bool Names(const std::string& line, const std::string& name) {
    std::istringstream fields(line.substr(0, line.find('#')));
    std::string field;
    fields >> field;
    while (fields >> field)
        if (SameName(field, name)) return true;
    return false;
}

bool IsLabel(const std::string& label) {
    if (label.empty() || label.size() > 63 || label.front() == '-' || label.back() == '-') return false;
    for (char c : label) {
        const bool alnum = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
        if (!alnum && c != '-') return false;
    }
    return true;
}

void CheckSuffixes(const std::string& line) {
    const std::vector<std::string> pieces = Velk::NetworkWindow::SplitSuffixes(line);
    for (const std::string& piece : pieces) {
        Require(!piece.empty() && piece.find_first_of(" ,\t") == std::string::npos,
                "a suffix is a non-empty piece without separators", line);
        bool valid = piece.size() <= 253;
        for (const std::string& label : fuzz_support::Split(piece, '.')) valid = valid && IsLabel(label);
        Require(QelCtl::Network::DnsConfigImpl::IsValidDomainName(piece) == valid,
                "a domain name is valid exactly when each label is", piece);
    }
    const std::string joined = Velk::NetworkWindow::JoinSuffixes(pieces);
    Require(Velk::NetworkWindow::SplitSuffixes(joined) == pieces, "suffixes join and split back", line);
}

void CheckHostsFile(const std::string& name, const std::string& text) {
    const std::string path = g_root + "/etc/hosts";
    {
        std::ofstream out(path, std::ios::binary | std::ios::trunc);
        out << text;
    }
    chmod(path.c_str(), 0640);
    try {
        QelCtl::Network::HostsFile::RemoveEntryByHostName(name);
    } catch (const HostCtl::Lib::HostCtlException& e) {
        fuzz_support::Fail("a readable hosts file is edited without error", e.what());
    }
    const std::string edited = FileText(path);
    const std::vector<std::string> before = Lines(text);
    const std::vector<std::string> after = Lines(edited);
    size_t next = 0;
    for (const std::string& line : after) Require(!Names(line, name), "no line names the removed name", text);
    for (const std::string& line : before) {
        if (Names(line, name)) continue;
        while (next < after.size() && after[next] != line) ++next;
        Require(next < after.size(), "lines without the name stay, in order", text);
        ++next;
    }
    Require(after.size() <= before.size(), "no line is added", text);
    struct stat st;
    Require(stat(path.c_str(), &st) == 0 && (st.st_mode & 07777) == 0640, "the file keeps its mode", text);
    QelCtl::Network::HostsFile::RemoveEntryByHostName(name);
    Require(FileText(path) == edited, "removing a name again changes nothing", text);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    char path[] = "/dev/shm/velk-fuzz-dns-XXXXXX";
    if (!mkdtemp(path)) fuzz_support::Fail("a host root can be made", path);
    g_root = path;
    mkdir((g_root + "/etc").c_str(), 0755);
    HostCtl::Lib::SimState(g_root).Replace(nlohmann::json{{"history", nlohmann::json::array()}});
    setenv("VELK_HOST_ROOT", g_root.c_str(), 1);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size > 4096) return 0;
    const std::string input(reinterpret_cast<const char*>(data), size);
    const size_t first = input.find('\n');
    const std::string name = input.substr(0, first);
    const size_t second = first == std::string::npos ? std::string::npos : input.find('\n', first + 1);
    const std::string suffixes =
        first == std::string::npos
            ? ""
            : input.substr(first + 1, second == std::string::npos ? second : second - first - 1);
    const std::string hosts = second == std::string::npos ? "" : input.substr(second + 1);
    CheckSuffixes(suffixes);
    CheckHostsFile(name, hosts);
    return 0;
}
