// "Configure Management Network": reads the management interface's
// configuration once, lets the six dialogs edit a copy of it (the change set)
// and, when the window is left, asks whether to apply the changes. Applying
// is one ordered sequence of host calls; a step that fails is logged and
// shown, and the sequence goes on with the next step. Nothing is written to
// the host before the administrator says yes. The sequence runs on trial
// (NetworkTrial): the configuration is saved before it and checked after it,
// and a change that fails its checks is put back unless the administrator
// keeps it.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "LabelItem.hpp"
#include "ManagementSwitch.hpp"
#include "RootWindow.hpp"
#include "hostctl/HostCtl.hpp"

namespace Velk {

class NetworkWindow : public RootWindow {
public:
    explicit NetworkWindow(Frame* parent);
    ~NetworkWindow() override;

    // Reads the configuration, runs the menu and, on leaving, the
    // confirmation and the apply. True when the window closed normally,
    // false when there is no management interface.
    int Run() override;
    // Fills the menu with the six entries, draws it and the description of
    // the selected entry.
    void Update() override;

    // The suffix line as the network window keeps it: the pieces joined by
    // ", " (blanks and commas separate them; empty pieces are dropped).
    static std::vector<std::string> SplitSuffixes(const std::string& line);
    static std::string JoinSuffixes(const std::vector<std::string>& suffixes);

    bool changed = false;
    bool ipv6Enabled = false;
    bool ipv6EnabledAtStart = false;

protected:
    void DrawContents() override;

private:
    enum Entry { ADAPTERS = 0, VLAN, IPV4, IPV6, DNS, SUFFIXES, ENTRY_COUNT };

    // Entry.
    bool ReadConfiguration();
    void ReadSwitch();

    // Drawing.
    void DrawDescription();
    std::string Description(int entry) const;
    std::string AdaptersDescription() const;
    std::string Ipv4Description() const;
    std::string Ipv6Description() const;
    std::string DnsDescription() const;
    std::string Value(const std::string& text) const;
    std::string Labelled(int labelId, const std::string& value) const;

    // Keys.
    void OpenEntry(int entry);
    void EditAdapters();
    void EditVlan();
    void EditIpv4();
    void EditIpv6();
    void EditDns();
    void EditSuffixes();
    // Asks whether to apply; true when the window is to close.
    bool Leave();

    // Actions: the apply sequence, on trial. False when it was refused
    // before anything was written (an address in use, a configuration that
    // could not be saved).
    bool Apply();
    bool NewStaticIpv4Address() const;
    void ApplyAdapters();
    bool ApplyVlan();
    void ApplyIpConfiguration();
    void ApplyGateways();
    void ApplyRenewal(bool vlanChanged);
    void ApplyDns();
    void ApplyNameServers();
    static std::string JoinServers(const std::vector<HostCtl::Network::IpAddress>& servers);
    bool DhcpInUse() const;
    std::string ScopedIpv6Gateway() const;
    // Logs a progress line and shows it on the status row.
    void Step(const char* format, ...) __attribute__((format(printf, 2, 3)));
    // Logs a failed step at error priority and shows it.
    void Fail(const std::string& line);

    std::vector<LabelItem*> _items;  // owned
    LabelItem* _adaptersItem = nullptr;
    LabelItem* _vlanItem = nullptr;

    std::unique_ptr<HostCtl::Network::QelNic> _mgmtIntf;
    HostCtl::Network::IpConfig _ipConfig;         // the change set's addresses
    HostCtl::Network::IpConfig _ipConfigAtStart;  // as read at entry
    // Adapters and VLAN are edited only on a port group of a standard switch
    // whose team and VLAN could be read.
    bool _switchEditable = false;
    ManagementPort _port;
    std::vector<std::string> _adapters;
    std::vector<std::string> _adaptersAtStart;
    std::vector<Adapter> _nics;  // every NIC, for the labels and MAC addresses shown
    uint16_t _vlanId = 0;
    uint16_t _vlanIdAtStart = 0;
    HostCtl::Network::Ipv4Address _gateway;
    HostCtl::Network::Ipv4Address _gatewayAtStart;
    HostCtl::Network::Ipv6Address _ipv6Gateway;
    HostCtl::Network::Ipv6Address _ipv6GatewayAtStart;
    std::string _hostname;
    std::vector<HostCtl::Network::IpAddress> _dnsServers;
    std::vector<std::string> _suffixes;
    std::string _suffixLine;
};

}  // namespace Velk
