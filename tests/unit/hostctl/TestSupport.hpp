// Scratch host roots, file and process helpers for the host control tests.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <sstream>
#include <string>
#include <vector>

#include "hostctl/Backend.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/HostCtl.hpp"
#include "hostctl/QelCtl.hpp"
#include "hostctl/SimNetwork.hpp"
#include "hostctl/SimState.hpp"

namespace HostCtlTest {

using HostCtl::Lib::GetBackend;
using HostCtl::Lib::HostCtlException;
using HostCtl::Network::ConnectionPoint;
using HostCtl::Network::DistributedSwitch;
using HostCtl::Network::IpAddress;
using HostCtl::Network::IpConfig;
using HostCtl::Network::Ipv4Address;
using HostCtl::Network::Ipv6Address;
using HostCtl::Network::Ipv6AddressType;
using HostCtl::Network::Ipv6Network;
using HostCtl::Network::QelNic;
using HostCtl::Network::VirtualSwitch;
using nlohmann::json;

inline const char* const STACK = "defaultTcpipStack";

inline std::string ReadFile(const std::string& path) {
    std::ifstream in(path);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

inline void WriteFile(const std::string& path, const std::string& text) { std::ofstream(path) << text; }

template <typename Address>
std::vector<std::string> Texts(const std::vector<Address>& addresses) {
    std::vector<std::string> out;
    for (const auto& a : addresses) out.push_back(a.GetStringAddress());
    return out;
}

// Runs `child` in a forked process, which exits 1 if it throws.
inline pid_t Spawn(const std::function<void()>& child) {
    pid_t pid = fork();
    if (pid == 0) {
        try {
            child();
        } catch (...) {
            _exit(1);
        }
        _exit(0);
    }
    return pid;
}

inline void ExpectExitedCleanly(pid_t pid) {
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
}

// An edit of the state that sets the value at a JSON pointer.
inline std::function<void(json&)> Set(const std::string& pointer, const json& value) {
    return [=](json& s) { s[json::json_pointer(pointer)] = value; };
}

// The management port group on another VLAN (20 has a DHCP server, a router
// and DNS in the default state, 30 has nothing).
inline void SetMgmtVlan(json& s, int vlan) { s["network"]["vswitches"][0]["portgroups"][0]["vlan"] = vlan; }
inline void Vlan20(json& s) { SetMgmtVlan(s, 20); }

// Beside the default network: kDS-1 with an uplink of its own, qk1 on its
// port "100" (VLAN 20) and a free port "101" (VLAN 0).
inline json HostWithDvs() {
    json s = HostCtl::Lib::DefaultHostState();
    json& network = s["network"];
    network["dvswitches"] = json::array(
        {{{"name", "kDS-1"},
          {"uplinkPorts", {{{"key", "uplink1"}, {"pnic", "zonic1"}}, {{"key", "uplink2"}, {"pnic", ""}}}},
          {"ports",
           {{{"key", "100"}, {"vlan", 20}, {"hostLocal", false}, {"connectee", "qk1"}},
            {{"key", "101"}, {"vlan", 0}, {"hostLocal", true}, {"connectee", ""}}}}}});
    json qk1 = network["vnics"][0];
    qk1.erase("portgroup");
    qk1["name"] = "qk1";
    qk1["mac"] = "00:50:56:01:00:09";
    qk1["connectionType"] = 2;
    qk1["dvs"] = "kDS-1";
    qk1["port"] = "100";
    network["vnics"].push_back(qk1);
    HostCtl::Lib::BootNetwork(HostCtl::Lib::SimState("."), s);
    return s;
}

// A folder in /tmp, removed with everything in it at the end of the test.
class TempDir {
public:
    TempDir() {
        char tmpl[] = "/tmp/hostctl-test-XXXXXX";
        if (mkdtemp(tmpl) == nullptr) throw std::runtime_error("mkdtemp failed");
        _path = tmpl;
    }
    ~TempDir() {
        std::error_code ec;
        std::filesystem::remove_all(_path, ec);
    }
    TempDir(const TempDir&) = delete;
    TempDir& operator=(const TempDir&) = delete;
    const std::string& Path() const { return _path; }

private:
    std::string _path;
};

// A simulated host with the default state and a log folder, made the
// process's host.
class SimHostTest : public ::testing::Test {
protected:
    void SetUp() override {
        std::filesystem::create_directories(_dir.Path() + "/var/log");
        Reset();
        HostCtl::Lib::UseSimulatedHost(Root());
    }
    const std::string& Root() const { return _dir.Path(); }
    std::string StatePath() const { return Root() + "/host.json"; }
    json State() const { return json::parse(ReadFile(StatePath())); }
    void Reset(const json& state = HostCtl::Lib::DefaultHostState()) {
        HostCtl::Lib::SimState(Root()).Replace(state);
    }
    // Changes the state as another process would, through its own SimState.
    void Edit(const std::function<void(json&)>& change) { HostCtl::Lib::SimState(Root()).Update(change); }
    // The call is refused (with the text `what`, if given) and leaves the
    // state file as it was.
    void ExpectRefused(const std::function<void()>& call, const std::string& what = "") {
        const std::string before = ReadFile(StatePath());
        try {
            call();
            ADD_FAILURE() << "not refused";
        } catch (const HostCtlException& e) {
            if (!what.empty()) {
                EXPECT_EQ(std::string(e.what()), what);
            }
        }
        EXPECT_EQ(ReadFile(StatePath()), before) << "a refused call changed the state";
    }
    static QelNic Mgmt() { return QelNic("qk0"); }
    static std::string Address() { return Mgmt().GetIpConfig().GetIpv4Address().GetStringAddress(); }
    // The IPv6 addresses of the management interface as "addr/prefix type".
    static std::vector<std::string> Ipv6() {
        static const char* const TYPES[] = {"static", "dhcp", "autoconf"};
        std::vector<std::string> out;
        const IpConfig config = Mgmt().GetIpConfig();  // outlives the loop over its list
        for (const Ipv6Network& n : config.GetIpv6Network())
            out.push_back(n.ToString() + " " + TYPES[int(n.GetIpv6AddressType())]);
        return out;
    }
    static std::string Gateway() {
        return QelCtl::Network::RoutingInfoImpl(STACK).GetQelKernelDefaultGateway().GetStringAddress();
    }
    static std::string Ipv6Gateway() {
        return QelCtl::Network::RoutingInfoImpl(STACK).GetIpv6QelKernelDefaultGateway().GetStringAddress();
    }

private:
    TempDir _dir;
};

}  // namespace HostCtlTest
