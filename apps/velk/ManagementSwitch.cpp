#include "ManagementSwitch.hpp"

#include <strings.h>
#include <syslog.h>

#include <algorithm>

#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

using HostCtl::Lib::HostCtlException;
using HostCtl::Lib::Syslog;
using HostCtl::Network::DistributedSwitch;
using HostCtl::Network::VirtualSwitch;

namespace {

bool Contains(const std::vector<std::string>& list, const std::string& name) {
    return std::find(list.begin(), list.end(), name) != list.end();
}

std::string Line(const char* text, const HostCtlException& e) { return std::string(text) + e.what(); }

void LogFailure(const char* text, const HostCtlException& e) { Syslog(LOG_ERR, "%s", Line(text, e).c_str()); }

// The team of a standard switch as it was before a step changed it.
struct TeamBefore {
    std::string switchName;
    HostCtl::Network::TeamingPolicy policy;
};

// Brings the team of `before.switchName` back to `before.policy`: the NICs
// that still stand in their place (same role, same position) stay, the others
// leave, and the missing ones are added back in their order and role.
void PutBackTeam(const TeamBefore& before, const FailureReport& fail) {
    VirtualSwitch vswitch(before.switchName);
    HostCtl::Network::TeamingPolicy now;
    try {
        now = vswitch.GetTeamingPolicy();
    } catch (const HostCtlException& e) {
        fail(Line("Getting uplinks failed: ", e));
        return;
    }
    const HostCtl::Network::TeamingPolicy& was = before.policy;
    if (now.activeUplinks == was.activeUplinks && now.standbyUplinks == was.standbyUplinks) return;
    std::string names;
    for (const auto* list : {&was.activeUplinks, &was.standbyUplinks})
        for (const std::string& nic : *list) names += " " + nic;
    Syslog(LOG_INFO, "Putting back uplinks of %s:%s", before.switchName.c_str(), names.c_str());

    auto inPlace = [](const std::vector<std::string>& now, const std::vector<std::string>& was) {
        size_t n = 0;
        while (n < now.size() && n < was.size() && now[n] == was[n]) ++n;
        return n;
    };
    const size_t activeKept = inPlace(now.activeUplinks, was.activeUplinks);
    const size_t standbyKept = inPlace(now.standbyUplinks, was.standbyUplinks);
    std::vector<std::string> leaving(now.activeUplinks.begin() + static_cast<std::ptrdiff_t>(activeKept),
                                     now.activeUplinks.end());
    leaving.insert(leaving.end(), now.standbyUplinks.begin() + static_cast<std::ptrdiff_t>(standbyKept),
                   now.standbyUplinks.end());
    for (const std::string& nic : leaving) {
        Syslog(LOG_INFO, "Removing uplink %s", nic.c_str());
        try {
            vswitch.RemoveUplinkFromTeamingPolicy(nic);
        } catch (const HostCtlException& e) {
            fail(Line("VS: remove uplink from teaming policy failed: ", e));
        }
    }
    const std::pair<const std::vector<std::string>*, size_t> roles[] = {{&was.activeUplinks, activeKept},
                                                                        {&was.standbyUplinks, standbyKept}};
    for (const auto& [list, kept] : roles) {
        for (size_t i = kept; i < list->size(); ++i) {
            Syslog(LOG_INFO, "Adding uplink %s", (*list)[i].c_str());
            try {
                vswitch.AddUplinkToTeamingPolicy((*list)[i], list == &was.standbyUplinks);
            } catch (const HostCtlException& e) {
                fail(Line("VS: add uplink to teaming policy failed: ", e));
            }
        }
    }
}

// Takes `nic` off every switch but `keep`: standard switches drop it from
// their team (each switch's team is first noted in `touched`, once, so that
// it can be put back), distributed switches free the uplink port it backs.
void ReleaseFromOtherSwitches(const std::string& nic, const std::string& keep, const FailureReport& fail,
                              std::vector<TeamBefore>& touched) {
    std::vector<std::string> vswitches;
    try {
        vswitches = QelCtl::Network::VirtualSwitchInfoImpl().GetVirtualSwitchNames();
    } catch (const HostCtlException& e) {
        fail(Line("Scanning virtual switches failed: ", e));
    }
    for (const std::string& name : vswitches) {
        if (name == keep) continue;
        VirtualSwitch other(name);
        try {
            if (!Contains(other.GetUplinks(), nic)) continue;
        } catch (const HostCtlException& e) {
            fail(Line("Getting uplinks failed: ", e));
            continue;
        }
        // A team that could not be put back is not changed.
        if (std::none_of(touched.begin(), touched.end(),
                         [&](const TeamBefore& t) { return t.switchName == name; })) {
            try {
                touched.push_back({name, other.GetTeamingPolicy()});
            } catch (const HostCtlException& e) {
                fail(Line("Getting uplinks failed: ", e));
                continue;
            }
        }
        Syslog(LOG_INFO, "Removing uplink %s from %s", nic.c_str(), name.c_str());
        try {
            other.RemoveUplinkFromTeamingPolicy(nic);
        } catch (const HostCtlException& e) {
            fail(Line("VS: remove uplink from teaming policy failed: ", e));
        }
    }

    std::vector<std::string> dvswitches;
    try {
        dvswitches = QelCtl::Network::DistributedSwitchInfoImpl().GetDistributedSwitchNames();
    } catch (const HostCtlException& e) {
        fail(Line("Scanning dkswitches failed: ", e));
    }
    for (const std::string& name : dvswitches) {
        DistributedSwitch dvs(name);
        std::vector<DistributedSwitch::UplinkPort> ports;
        try {
            ports = dvs.GetUplinkPorts();
        } catch (const HostCtlException& e) {
            fail(Line("Getting uplink ports or info failed: ", e));
            continue;
        }
        const bool backs =
            std::any_of(ports.begin(), ports.end(), [&](const auto& p) { return p.pnic == nic; });
        if (!backs) continue;
        Syslog(LOG_INFO, "Removing uplink %s from %s", nic.c_str(), name.c_str());
        try {
            dvs.RemoveUplink(nic);
        } catch (const HostCtlException& e) {
            fail(Line("DVS: remove uplink failed: ", e));
        }
    }
}

// A management interface that carries the MAC address of one of the host's
// NICs took it from its first uplink; it follows the team's new first uplink.
void FollowFirstUplink(HostCtl::Network::QelNic& mgmt, const std::string& first, const FailureReport& fail) {
    std::vector<HostCtl::Network::Pnic> pnics;
    try {
        pnics = QelCtl::Network::NetworkInfoImpl().GetPnics();
    } catch (const HostCtlException& e) {
        fail(Line("Getting physical nics failed: ", e));
        return;
    }
    auto sameMac = [](const std::string& a, const std::string& b) {
        return strcasecmp(a.c_str(), b.c_str()) == 0;
    };
    try {
        const std::string mac = mgmt.GetMacAddress();
        const auto firstNic =
            std::find_if(pnics.begin(), pnics.end(), [&](const auto& p) { return p.name == first; });
        const bool inherited =
            std::any_of(pnics.begin(), pnics.end(), [&](const auto& p) { return sameMac(p.mac, mac); });
        if (firstNic == pnics.end() || !inherited || sameMac(firstNic->mac, mac)) return;
        Syslog(LOG_INFO, "Setting mac address of %s to %s", mgmt.GetName().c_str(), firstNic->mac.c_str());
        mgmt.SetMacAddress(firstNic->mac);
    } catch (const HostCtlException& e) {
        fail(Line("Setting mac address of zonic failed: ", e));
    }
}

}  // namespace

bool Adapter::IsUsedElsewhere(const std::string& switchName) const {
    return std::any_of(usedBy.begin(), usedBy.end(),
                       [&](const std::string& user) { return user != switchName; });
}

bool FindManagementPort(const HostCtl::Network::QelNic& mgmt, ManagementPort& port) {
    try {
        const HostCtl::Network::ConnectionPoint point = mgmt.GetConnectionPoint();
        switch (point.GetType()) {
            case HostCtl::Network::ConnectionPoint::PortGroup:
                break;
            case HostCtl::Network::ConnectionPoint::DvsPort:
                Syslog(LOG_ERR, "Unsupported kSwitch type");
                return false;
            case HostCtl::Network::ConnectionPoint::OpaqueNetwork:
                Syslog(LOG_ERR, "Opaque network connectee type not supported");
                return false;
            default:
                Syslog(LOG_ERR, "Unsupported connectee type");
                return false;
        }
        port.portGroup = point.GetName();
        port.switchName = point.GetSwitchName();
        return true;
    } catch (const HostCtlException& e) {
        LogFailure("Getting switch name failed: ", e);
        return false;
    }
}

std::vector<std::string> ReadTeam(const std::string& switchName) {
    const HostCtl::Network::TeamingPolicy policy = VirtualSwitch(switchName).GetTeamingPolicy();
    std::vector<std::string> team = policy.activeUplinks;
    team.insert(team.end(), policy.standbyUplinks.begin(), policy.standbyUplinks.end());
    return team;
}

std::vector<Adapter> ReadAdapters() {
    std::vector<Adapter> adapters;
    try {
        for (const HostCtl::Network::Pnic& pnic : QelCtl::Network::NetworkInfoImpl().GetPnics())
            adapters.push_back({pnic.name, pnic.label, pnic.mac, pnic.linkUp, {}});
    } catch (const HostCtlException& e) {
        LogFailure("Getting physical nics failed: ", e);
        return adapters;
    }
    auto addUser = [&](const std::string& nic, const std::string& user) {
        for (Adapter& adapter : adapters)
            if (adapter.name == nic && !Contains(adapter.usedBy, user)) adapter.usedBy.push_back(user);
    };

    try {
        for (const std::string& name : QelCtl::Network::VirtualSwitchInfoImpl().GetVirtualSwitchNames()) {
            try {
                for (const std::string& nic : VirtualSwitch(name).GetUplinks()) addUser(nic, name);
            } catch (const HostCtlException& e) {
                LogFailure("Getting uplinks failed: ", e);
            }
        }
    } catch (const HostCtlException& e) {
        LogFailure("Scanning virtual switches failed: ", e);
    }
    try {
        for (const std::string& name :
             QelCtl::Network::DistributedSwitchInfoImpl().GetDistributedSwitchNames()) {
            try {
                for (const std::string& nic : DistributedSwitch(name).GetUsedUplinks()) addUser(nic, name);
            } catch (const HostCtlException& e) {
                LogFailure("DVS: getting used uplinks failed: ", e);
            }
        }
    } catch (const HostCtlException& e) {
        LogFailure("Scanning dkswitches failed: ", e);
    }
    return adapters;
}

void WriteTeam(const ManagementPort& port, HostCtl::Network::QelNic& mgmt,
               const std::vector<std::string>& adapters, const FailureReport& fail) {
    VirtualSwitch vswitch(port.switchName);
    HostCtl::Network::TeamingPolicy policy;
    try {
        policy = vswitch.GetTeamingPolicy();
    } catch (const HostCtlException& e) {
        fail(Line("Getting uplinks failed: ", e));
        return;
    }
    std::vector<std::string> team = policy.activeUplinks;
    team.insert(team.end(), policy.standbyUplinks.begin(), policy.standbyUplinks.end());
    size_t active = policy.activeUplinks.size();

    for (const std::string& nic : team) {
        if (Contains(adapters, nic)) continue;
        Syslog(LOG_INFO, "Removing uplink %s", nic.c_str());
        try {
            vswitch.RemoveUplinkFromTeamingPolicy(nic);
            if (Contains(policy.activeUplinks, nic)) --active;
        } catch (const HostCtlException& e) {
            fail(Line("VS: remove uplink from teaming policy failed: ", e));
        }
    }

    // The first NIC the host refuses ends the step, which then puts back
    // what it removed: the management switch keeps the uplinks it had.
    std::vector<TeamBefore> touched;
    bool refused = false;
    for (const std::string& nic : adapters) {
        if (Contains(team, nic)) continue;
        ReleaseFromOtherSwitches(nic, port.switchName, fail, touched);
        Syslog(LOG_INFO, "Adding uplink %s", nic.c_str());
        // Without the limit, a NIC joins as active only when it is the first.
        bool standby = active > 0;
        try {
            standby = active >= vswitch.GetMaxActiveUplinks();
        } catch (const HostCtlException& e) {
            fail(Line("Getting max number of active uplinks failed: ", e));
        }
        try {
            vswitch.AddUplinkToTeamingPolicy(nic, standby);
            if (!standby) ++active;
        } catch (const HostCtlException& e) {
            fail(Line("VS: add uplink to teaming policy failed: ", e));
            refused = true;
            break;
        }
    }
    if (refused) {
        // The management switch first: it lets go of NICs the others take back.
        PutBackTeam({port.switchName, policy}, fail);
        for (const TeamBefore& other : touched) PutBackTeam(other, fail);
        return;
    }

    if (!adapters.empty()) FollowFirstUplink(mgmt, adapters.front(), fail);
}

}  // namespace Velk
