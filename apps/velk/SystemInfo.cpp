// The host values that texts reach through value keys. None is cached: each
// call asks the host again, so a redraw shows the current value.
#include "SystemInfo.hpp"

#include <syslog.h>

#include <cstdio>
#include <cstring>

#include "CommandRunner.hpp"
#include "ManagementInterface.hpp"
#include "TextArea.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

using HostCtl::Lib::Syslog;

namespace {

const std::string kSshKeygen = "/usr/lib/zolva/openssh/bin/ssh-keygen";
constexpr size_t kCapacity = 256;

struct Captured {
    int status;
    std::string out;
    std::string err;
};

Captured Capture(const char* path, const char* const argv[]) {
    char out[kCapacity + 1];
    char err[kCapacity + 1];
    size_t outLen = kCapacity;
    size_t errLen = kCapacity;
    int status = RunCommand(path, argv, out, &outLen, err, &errLen, nullptr, 0, 0);
    return {status, std::string(out, outLen), std::string(err, errLen)};
}

// Reads the kernel's system-version record; false when it can't be read.
bool ReadVersionRecord(char (&record)[QelCtl::Util::SYSINFO_VERSION_SIZE]) {
    try {
        QelCtl::Util::SysinfoUtil::SysinfoGet(QelCtl::Util::SysinfoNode::SystemVersion, nullptr, record,
                                              sizeof record);
        return true;
    } catch (const HostCtl::Lib::HostCtlException&) {
        return false;
    }
}

std::string FieldText(const char* record, size_t offset, size_t width) {
    return std::string(record + offset, strnlen(record + offset, width));
}

}  // namespace

std::string FormatMemorySize(uint64_t bytes) {
    static const char kUnits[] = {'M', 'G', 'T', 'P', 'E'};
    constexpr uint64_t kStep = 268435455ULL;  // rounding up to 256 MiB
    // Sizes too large to round up stay at the largest step below them.
    const uint64_t value = bytes > UINT64_MAX - kStep ? UINT64_MAX & ~kStep : (bytes + kStep) & ~kStep;
    uint64_t unit = 1048576;
    int index = 0;
    while (index < 4 && value / 1024 >= unit) {
        unit *= 1024;
        ++index;
    }
    const uint64_t whole = value / unit;
    const uint64_t rest = value % unit;
    std::string text = std::to_string(whole);
    if (rest != 0) {
        text += '.';
        text += std::to_string(static_cast<unsigned>((static_cast<unsigned __int128>(rest) * 10) / unit));
    }
    return text + " " + kUnits[index];
}

std::string FormatVersion(const std::string& version, uint32_t build) {
    char number[16];
    snprintf(number, sizeof number, "%05u", build);
    return version + " build-" + number;
}

uint64_t GetTotalMemoryBytes() {
    QelCtl::Hardware::MemoryInfoImpl memory;
    uint64_t bytes = 0;
    // A product past 64 bits is shown as the largest size, never wrapped.
    if (__builtin_mul_overflow(memory.GetTotalPages(), memory.GetPageSize(), &bytes)) return UINT64_MAX;
    return bytes;
}

std::string GetSshKeyFingerprint(const std::string& keyFile) {
    const std::string mapped = HostCtl::Lib::HostPath(keyFile);
    const char* argv[] = {"ssh-keygen", "-l", "-f", mapped.c_str(), nullptr};
    Captured result = Capture(kSshKeygen.c_str(), argv);
    if (result.status != 0) {
        Syslog(LOG_INFO, "Error generating SSH Key Fingerprint: %s", result.err.c_str());
        return "";
    }
    // "<size> <fingerprint> <file> (<type>)"
    const std::vector<std::string> words = HostCtl::Lib::Words(result.out);
    return words.size() > 1 ? words[1] : "";
}

std::string GetCimProperty(const std::string& className, const std::string& propertyName) {
    const char* argv[] = {"grabCIMData", className.c_str(), propertyName.c_str(), nullptr};
    Captured result = Capture("/sbin/grabCIMData", argv);
    // A tool that reports no instances with a failing status still means "N/A".
    if (result.out.find("no instances") != std::string::npos) {
        Syslog(LOG_WARNING, "No instance of class %s", className.c_str());
        return "N/A";
    }
    if (result.status != 0) {
        Syslog(LOG_ERR, "Error: %s", result.err.c_str());
        return "";
    }
    return result.out;
}

std::string TextArea::GetIpValue() {
    HostCtl::Network::Ipv4Address address("0.0.0.0");
    try {
        if (auto mgmt = GetManagementInterface()) address = mgmt->GetIpConfig().GetIpv4Address();
    } catch (const HostCtl::Lib::HostCtlException&) {
        return "0.0.0.0";
    }
    return address.GetStringAddress();
}

std::string TextArea::GetHostnameValue() {
    try {
        QelCtl::Network::DnsConfigImpl dns("defaultTcpipStack");
        return dns.GetHostname() + "." + dns.GetDomain();
    } catch (const HostCtl::Lib::HostCtlException&) {
        return "";
    }
}

std::string TextArea::GetTarnProduct() {
    char record[QelCtl::Util::SYSINFO_VERSION_SIZE] = {};
    return ReadVersionRecord(record) ? FieldText(record, 0, 32) : "";
}

std::string TextArea::GetTarnVersion() {
    char record[QelCtl::Util::SYSINFO_VERSION_SIZE] = {};
    if (!ReadVersionRecord(record)) return "";
    uint32_t build;
    std::memcpy(&build, record + 292, sizeof build);
    return FormatVersion(FieldText(record, 32, 64), build);
}

std::string TextArea::GetSystemMemory() {
    try {
        return FormatMemorySize(GetTotalMemoryBytes()) + "B";
    } catch (const HostCtl::Lib::HostCtlException&) {
        return "";
    }
}

std::string TextArea::GetSSLThumbprintValue() {
    const std::string cert = HostCtl::Lib::HostPath("/etc/zolva/ssl/rui.crt");
    const char* argv[] = {"openssl", "x509", "-in", cert.c_str(), "-noout", "-fingerprint", "-sha1", nullptr};
    Captured result = Capture("/bin/openssl", argv);
    if (result.status != 0) return "";
    char fingerprint[256] = {};
    if (sscanf(result.out.c_str(), "SHA1 Fingerprint=%255s", fingerprint) != 1) return "";
    return fingerprint;
}

std::string TextArea::GetSSHRsaKeyFingerprintValue() {
    return GetSshKeyFingerprint("/etc/ssh/ssh_host_rsa_key");
}
std::string TextArea::GetSSHDsaKeyFingerprintValue() {
    return GetSshKeyFingerprint("/etc/ssh/ssh_host_dsa_key");
}
std::string TextArea::GetBIOSVersion() {
    return GetCimProperty("OMC_SMASHFirmwareIdentity", "VersionString");
}
std::string TextArea::GetBMCVersion() { return GetCimProperty("OMC_MCFirmwareIdentity", "VersionString"); }
std::string TextArea::GetPLSAVersion() {
    return GetCimProperty("Zolva_HHRCWrapperSoftwareIdentity", "VersionString");
}
std::string TextArea::GetAssetTag() { return GetCimProperty("CIM_Chassis", "OtherIdentifyingInfo"); }
std::string TextArea::GetCPLDVersion() { return "N/A"; }

}  // namespace Velk
