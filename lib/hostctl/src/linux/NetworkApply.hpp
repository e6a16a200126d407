// Changing the management interface of a Debian host: its stanza in the
// ifupdown (or ifupdown2) configuration edited in place, applied once, and
// the result read back from the kernel.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "InterfacesFile.hpp"
#include "hostctl/HostCtl.hpp"

namespace HostCtl::Lib::Linux {

enum class Engine { Ifupdown, Ifupdown2 };

// The ifupdown the host has: ifupdown2 when its ifreload is there, else the
// classic one; throws HostCtlException when neither is installed.
Engine DetectEngine();

// A change of the management interface. The backend's setters fill it; it
// is applied as one.
struct PendingChange {
    std::string iface;                                // the management interface ("vmbr0")
    std::optional<Network::IpConfig> ip;              // the new IP configuration
    std::optional<std::string> gateway4;              // the new IPv4 gateway; "" for none
    std::optional<std::string> gateway6;              // the new IPv6 gateway; "" for none
    std::optional<std::vector<std::string>> uplinks;  // the switch's NICs, active ones first
    std::optional<std::string> primary;               // a bond's primary NIC
    bool restart = false;                             // leases to renew: the interface goes down and up

    bool Empty() const { return !ip && !gateway4 && !gateway6 && !uplinks && !restart; }
};

// The method of the interface's stanza of that family ("static", "dhcp",
// "manual", "auto"), "" when no stanza with a family defines it.
std::string ConfiguredMethod(const InterfacesFiles& files, const std::string& iface,
                             const std::string& family);

// Edits the files for the change: only the options Velk owns in the stanzas
// of the interface (and of its bridge or bond for uplinks) change; on
// ifupdown2 every bridge also keeps its VM ports across a reload. Throws
// HostCtlException, editing nothing more, for a change the files cannot say.
void EditForChange(InterfacesFiles& files, const PendingChange& change, Engine engine);

// Applies the change: keeps the files as they were under
// "/var/lib/velk/network" (the first ones ever, and the last ones), writes
// the edited files, has ifupdown apply them to the interface (bounded), and
// waits (bounded) until the kernel shows the new configuration. Throws
// HostCtlException with a clear text when something did not take effect.
void ApplyChange(const PendingChange& change);

// The interfaces file of a freshly installed host: the loopback, every NIC
// manual, and `bridge` on `uplink` with DHCP. Nothing else is sourced.
std::string FactoryLayout(const std::string& bridge, const std::string& uplink,
                          const std::vector<std::string>& nics, Engine engine);

// Puts the factory layout in place of the host's interfaces files (kept as
// ApplyChange keeps them), takes `oldIface` down and brings the bridge up
// (bounded), and waits for its DHCP lease (bounded).
void ApplyFactoryLayout(const std::string& oldIface, const std::string& bridge, const std::string& uplink,
                        const std::vector<std::string>& nics);

// The interfaces files as they are now, as one text for PutBackFiles.
std::string SavedFiles();
// Puts the files of SavedFiles back as they were and applies them to
// `iface` the way ApplyChange applies a change (VM ports stay on their
// bridges): ifupdown takes the interface down with the files in force,
// then the saved ones are written (`alongside` writes its own files at that
// moment) and the interface brought up; ifupdown2 reloads after the write.
// Waits (bounded) until the kernel shows the saved files' addresses.
// Throws HostCtlException for a text that is no saved configuration
// (nothing is then written) or when the addresses did not come back.
void PutBackFiles(const std::string& saved, const std::string& iface, const std::function<void()>& alongside);

// Takes the interface down (its addresses and leases go; a bridge and its
// ports stay) or brings it up again from its stanza, bounded.
void SetInterfaceUp(const std::string& iface, bool up);

}  // namespace HostCtl::Lib::Linux
