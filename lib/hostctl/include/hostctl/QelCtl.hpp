// The host control operations the console calls. Each object reads the host
// through the backend chosen at start-up (see Backend.hpp); nothing is cached,
// so every call sees the host's current state.
#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "hostctl/HostCtl.hpp"

namespace QelCtl {

namespace Util {

// Kernel system-information nodes.
enum class SysinfoNode { SystemVersion };

// The system-version record: 312 bytes.
//   0   product name, NUL-terminated (32 bytes)
//   32  version text, NUL-terminated (64 bytes)
//   96  kernel release text, NUL-terminated (32 bytes)
//   128 build text, NUL-terminated (164 bytes)
//   292 build number, 32-bit unsigned, host byte order
//   296 reserved (16 bytes)
constexpr size_t SYSINFO_VERSION_SIZE = 312;

class SysinfoUtil {
public:
    // Fills buf (len must be at least SYSINFO_VERSION_SIZE); params is unused
    // for the version node and may be null.
    static void SysinfoGet(SysinfoNode node, const char* params, void* buf, size_t len);
};

}  // namespace Util

namespace Adv {

class AdvancedOptionImpl {
public:
    // The option with that name ("/UserVars/VelkTimeOut"), or null when the host
    // has none. The result is an AdvancedIntegerOption or AdvancedStringOption.
    std::unique_ptr<HostCtl::Adv::AdvancedOption> FindOption(const std::string& name);
    // Whether a user option (such as "PXEBootEnabled") is present.
    bool HasUserOption(const std::string& name);
};

}  // namespace Adv

namespace Hardware {

class HardwareInfoImpl {
public:
    std::string GetVendorName();
    std::string GetProductName();
};

class CpuInfoImpl {
public:
    unsigned GetNumCpuPackages();
    std::string GetModelName();
};

class MemoryInfoImpl {
public:
    uint64_t GetTotalPages();
    uint64_t GetPageSize();
};

struct SmartCardSlot {
    std::string name;
};

struct SmartCardToken {
    std::string label;
    std::vector<std::string> userIds;
};

class SmartCardInfoImpl {
public:
    std::vector<SmartCardSlot> GetAllSlots();
    // Fills token and answers true when a token is present in the slot.
    bool GetToken(const SmartCardSlot& slot, SmartCardToken& token);
};

// A PCI device that can be handed to the driver virtual machine. Devices of
// one group change owner together.
struct DriverVmDevice {
    std::string id;  // PCI address, "0000:03:00.0"
    std::string name;
    std::string group;
    bool owned = false;
};

class DriverVmInfoImpl {
public:
    // 0: no driver VM on this host, 1 and 2: the driver VM's states.
    int GetState();
    std::vector<DriverVmDevice> GetDevices();
    // Gives exactly the devices in ownedIds to the driver VM; an unknown id
    // throws and changes nothing.
    void SetOwned(const std::vector<std::string>& ownedIds);
};

}  // namespace Hardware

namespace Network {

class NetworkInfoImpl {
public:
    // Looks up which virtual NIC carries the management network.
    void UpdateManagementInterface();
    // The management interface found by the last update, or null.
    std::unique_ptr<HostCtl::Network::QelNic> GetManagementInterface();
    std::vector<HostCtl::Network::Pnic> GetPnics();
    // Whether the running kernel has IPv6.
    bool IsQelIpv6Enabled();
    // Turns IPv6 on or off for the next boot of the host.
    void SetQelIpv6Enabled(bool enabled);
    // Names of the host kernel's virtual NICs.
    std::vector<std::string> GetVirtualNicNames();
    // The network changes made between these two calls reach the host as
    // one change; CommitChange throws when the host could not apply them.
    void BeginChange();
    void CommitChange();

    // The factory restore of the network, in this order: the network core
    // dump sender lets go of the management interface, the whole network
    // configuration (virtual NICs, switches, port groups, routes, name
    // servers) is removed, and the network is configured as on a freshly
    // installed host (a standard switch on the first connected NIC, its
    // management port group and interface, DHCP).
    void DisableNetDumper();
    void ClearNetworkConfig();
    void AutoConfigNetwork();
    // What ClearNetworkConfig removes (virtual NICs, switches, port groups,
    // routes, name servers) as an opaque text, and its return: a restore
    // whose new configuration cannot be made puts the old one back.
    std::string GetNetworkConfig();
    void SetNetworkConfig(const std::string& config);

private:
    bool _updated = false;
    std::string _mgmtName;
};

// One check of the management network after a change.
struct NetworkCheck {
    enum class Outcome { Passed, Failed, Warning };
    // What was checked, in a few words ("link of eno1", "address
    // 192.0.2.10", "gateway 192.0.2.1", "name server 192.0.2.53").
    std::string subject;
    Outcome outcome = Outcome::Passed;
    // Why it did not pass ("no carrier", "no answer", "duplicate address");
    // empty when it passed.
    std::string detail;
};

// A change of the management network neither kept nor reverted.
struct PendingChange {
    std::string user;         // who began it
    std::string description;  // the network before it (see Describe)
    // Whether another running console has it on trial (and keeps or puts
    // it back itself).
    bool elsewhere = false;
};

// A change of the management network on trial. Before the change the
// present configuration is saved with a marker (one file under
// "/var/lib/velk/", written atomically); after it, the checks tell whether
// the host is still reachable; the change is then kept (the marker goes) or
// the saved configuration is put back. The console that saved it holds a
// lock on the marker until then, so a marker nobody holds when a console
// starts belongs to a console that ended in between: the saved
// configuration is put back before anything else.
class NetworkTrialImpl {
public:
    // When another machine on the management interface's link already uses
    // `address`: a line naming who answered; nothing when it is free (or
    // there is no link to ask on). Throws HostCtlException when the probe
    // itself fails, which tells nothing about the address.
    std::optional<std::string> ProbeAddress(const HostCtl::Network::Ipv4Address& address);
    // Saves the present network configuration (files and running state)
    // with the marker, `user` recorded as who changes it, and returns what
    // was saved. A change still pending that no running console has on trial
    // (its put-back failed, or its console is gone) stays the way back: it
    // is taken over and returned instead. Throws HostCtlException when
    // another console has a change on trial, or when the configuration
    // cannot be saved; nothing is then changed.
    PendingChange Save(const std::string& user);
    // The change neither kept nor reverted, nothing when there is none.
    std::optional<PendingChange> Pending();
    // The checks of the management interface, in order (see
    // Backend::CheckNetwork); bounded.
    std::vector<NetworkCheck> Check();
    // True when no check failed (warnings pass).
    static bool Passed(const std::vector<NetworkCheck>& checks);
    // The change stays: the marker goes.
    void Keep();
    // Puts the saved configuration back and applies it, then drops the
    // marker. Throws HostCtlException when it cannot be put back (the marker
    // then stays), or when another console has the change on trial.
    void Revert();
    // The management network in one line for the audit: addresses, VLAN,
    // adapters, name servers, host name.
    std::string Describe();
};

// Host name, domain, name servers and search domains of one network stack.
// Setters with a `persist` flag change the running configuration and, when
// the flag is set, the saved one too; SaveConfig saves all of it. What is not
// saved is lost when the host boots.
class DnsConfigImpl {
public:
    explicit DnsConfigImpl(std::string netstack);
    std::string GetHostname();
    std::string GetDomain();
    // A host name without a domain; the domain stays. Throws HostCtlException
    // for a name that is not a valid host name.
    void SetHostname(const std::string& name, bool persist);
    // A fully qualified name: the first label becomes the host name, the rest
    // the domain.
    void SetFqdn(const std::string& fqdn, bool persist);
    std::vector<HostCtl::Network::Ipv4Address> GetNameServers();
    std::vector<HostCtl::Network::Ipv6Address> GetIpv6NameServers();
    void RemoveNameServers();
    // Appends a server to the list (IPv4 or IPv6).
    void AddNameServer(const HostCtl::Network::IpAddress& server);
    std::vector<std::string> GetSearchDomains();
    // The search domains as one text, separated by blanks or commas; empty
    // pieces are dropped. Throws HostCtlException for a piece that is not a
    // valid domain name.
    void SetSearchDomainsString(const std::string& domains);
    // Makes the running configuration the one the host boots with.
    void SaveConfig();

    // The pieces of a search-domain text (blanks and commas separate them).
    static std::vector<std::string> SplitSearchDomains(const std::string& domains);
    // Letters, digits and '-' in labels of 1 to 63 characters, no label
    // beginning or ending with '-'; dots between labels; 253 characters at most.
    static bool IsValidDomainName(const std::string& name);

private:
    std::string _netstack;
};

class RoutingInfoImpl {
public:
    explicit RoutingInfoImpl(std::string netstack);
    HostCtl::Network::Ipv4Address GetQelKernelDefaultGateway();
    // 0.0.0.0 removes the default route.
    void SetQelKernelDefaultGateway(const HostCtl::Network::Ipv4Address& gw, bool persist);
    HostCtl::Network::Ipv6Address GetIpv6QelKernelDefaultGateway();
    // :: removes the default route.
    void SetIpv6QelKernelDefaultGateway(const HostCtl::Network::Ipv6Address& gw);

private:
    std::string _netstack;
};

class VirtualSwitchInfoImpl {
public:
    // Names of the host's standard virtual switches.
    std::vector<std::string> GetVirtualSwitchNames();
    // Creates a standard switch without uplinks or port groups.
    void AddVirtualSwitch(const std::string& name);
    // Removes a standard switch with its port groups, which no virtual NIC
    // may use; its uplinks are set free.
    void RemoveVirtualSwitch(const std::string& name);
};

// The host's hosts file ("/etc/hosts").
class HostsFile {
public:
    // Removes `hostName` from every line that names it; a line left without
    // names goes away. Other lines stay as they are. The file is replaced as
    // a whole. Throws HostCtlException when it cannot be read or written.
    static void RemoveEntryByHostName(const std::string& hostName);
};

// Name resolution as the host's own resolver does it: the hosts file first,
// then the configured name servers.
class NameResolverImpl {
public:
    // The addresses of `name`; empty when it does not resolve. Throws
    // HostCtlException only when the resolver cannot be asked at all.
    std::vector<HostCtl::Network::IpAddress> Resolve(const std::string& name);
};

class DistributedSwitchInfoImpl {
public:
    // Names of the distributed switches the host is a member of.
    std::vector<std::string> GetDistributedSwitchNames();
};

}  // namespace Network

namespace System {

struct BootOptions {
    bool auditMode = false;
};

class SystemInfoImpl {
public:
    std::string GetWelcomeMessage();
    void SetSystemAlert(const std::string& alert);
    std::string GetSystemAlert();
    BootOptions GetBootOptions();
    std::string GetKeyboardLayout();
    void SetKeyboardLayout(const std::string& layout);
    std::vector<std::string> GetKeyboardLayouts();
    // Makes the console use the key mappings of that layout now.
    void LoadKeyboardMappings(const std::string& layout);
    // The firewall ruleset `id` ("sshServer"); throws when the host has none.
    HostCtl::Firewall::Ruleset GetFirewallRulesetById(const std::string& id);
};

}  // namespace System

namespace Resource {

class ResourceInfoImpl {
public:
    bool HasRunningVirtualMachines();
};

}  // namespace Resource

// Services and firewall: command lines run on the host.
namespace Util {

// Runs `commandLine` through the host's shell; absolute paths in it are host
// paths. `logOutput`: each line the command prints is written to the system
// log (informational), otherwise its output is dropped. `wait`: the result is
// the command's exit status; without it the command is left running in the
// background and the result is 0 once it has started. `throwOnFailure`: a
// result other than 0 throws HostCtlException instead of being returned.
// A shell that cannot be started always throws.
int QelCtl_Exec(const std::string& commandLine, bool logOutput, bool wait, bool throwOnFailure);

}  // namespace Util

}  // namespace QelCtl
