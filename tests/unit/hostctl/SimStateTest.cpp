// The simulated host's state file: changes seen across objects and
// processes, no lost updates, and clear errors for a broken file.
#include <sys/wait.h>

#include "TestSupport.hpp"

namespace {

using namespace HostCtlTest;
using HostCtl::Lib::SimState;

class SimStateTest : public ::testing::Test {
protected:
    void SetUp() override { SimState(Root()).Replace(json{{"alert", "a"}, {"counter", 0}}); }
    const std::string& Root() const { return _dir.Path(); }
    std::string StatePath() const { return Root() + "/host.json"; }

private:
    TempDir _dir;
};

TEST_F(SimStateTest, WriteByAnotherObjectIsSeenAtOnce) {
    SimState reader(Root());
    const auto setAlert = [&](const std::string& alert) {
        SimState(Root()).Update([&](json& s) { s["alert"] = alert; });
    };
    // Same-size values written in quick succession, two between reads: the
    // second file may get the inode of the one the reader saw, so only the
    // strictly later modification time tells the states apart.
    for (int i = 0; i < 50; ++i) {
        setAlert("x");
        const std::string alert(1, char('a' + i % 26));
        setAlert(alert);
        ASSERT_EQ(reader.Read()->at("alert"), alert) << "round " << i;
    }
}

TEST_F(SimStateTest, ConcurrentProcessesLoseNoUpdate) {
    constexpr int kChildren = 4;
    constexpr int kIncrements = 50;
    std::vector<pid_t> children;
    for (int c = 0; c < kChildren; ++c) {
        children.push_back(Spawn([&] {
            SimState state(Root());
            for (int i = 0; i < kIncrements; ++i)
                state.Update([](json& s) { s["counter"] = s["counter"].get<int>() + 1; });
        }));
        ASSERT_GT(children.back(), 0);
    }
    // Meanwhile every read finds a whole file and a counter that never goes
    // back. Failures are only noted here: the children are always waited for.
    SimState reader(Root());
    int last = 0;
    int reads = 0;
    bool monotonic = true;
    std::string readError;
    for (size_t done = 0; done < children.size();) {
        try {
            int now = reader.Read()->at("counter").get<int>();
            monotonic = monotonic && now >= last;
            last = now;
            ++reads;
        } catch (const std::exception& e) {
            readError = e.what();
        }
        int status = 0;
        pid_t pid = waitpid(-1, &status, WNOHANG);
        if (pid > 0) {
            EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
            ++done;
        }
    }
    EXPECT_TRUE(monotonic);
    EXPECT_EQ(readError, "");
    EXPECT_GT(reads, 0);
    EXPECT_EQ(reader.Read()->at("counter").get<int>(), kChildren * kIncrements);
}

TEST_F(SimStateTest, FailedChangeWritesNothing) {
    const std::string before = ReadFile(StatePath());
    SimState state(Root());
    const auto refuse = [](json& s) {
        s["alert"] = "changed";
        throw HostCtlException("refused");
    };
    EXPECT_THROW(state.Update(refuse), HostCtlException);
    EXPECT_EQ(ReadFile(StatePath()), before);
    EXPECT_EQ(state.Read()->at("alert"), "a");
}

// A one-line text that starts with the state file's path and contains `what`.
void ExpectStateError(const std::function<void()>& call, const std::string& path, const std::string& what) {
    try {
        call();
        ADD_FAILURE() << "no exception; expected " << what;
    } catch (const HostCtlException& e) {
        const std::string text = e.what();
        EXPECT_EQ(text.rfind(path + ": ", 0), 0u) << text;
        EXPECT_NE(text.find(what), std::string::npos) << text;
        EXPECT_EQ(text.find('\n'), std::string::npos) << text;
    }
}

TEST_F(SimStateTest, BrokenFilesGiveErrorsNamingTheFile) {
    struct Case {
        const char* content;  // null: no file
        const char* what;
    };
    const Case cases[] = {
        {nullptr, "cannot open: No such file or directory"}, {"", "parse error"},
        {"{\"alert\": }", "parse error at line 1"},          {"[1, 2]", "not a JSON object"},
        {"{\"alert\": 1e400}", "number overflow"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.content ? c.content : "(missing)");
        unlink(StatePath().c_str());
        if (c.content) WriteFile(StatePath(), c.content);
        SimState state(Root());
        ExpectStateError([&] { state.Read(); }, StatePath(), c.what);
        ExpectStateError([&] { state.Update([](json&) {}); }, StatePath(), c.what);
        if (c.content) {
            EXPECT_EQ(ReadFile(StatePath()), c.content);  // left as it was
        }
    }
}

// Nesting the parser would take but copying or writing the state would not
// survive: refused as one clear error, the file left alone.
TEST_F(SimStateTest, DeeplyNestedStateIsRefused) {
    auto nested = [](size_t depth) { return std::string(depth, '[') + std::string(depth, ']'); };
    const std::string cases[] = {
        "{\"a\": " + nested(100000) + "}",
        nested(100000),
        "{\"a\": " + nested(size_t(HostCtl::Lib::kMaxStateDepth)) + "}",
    };
    for (const std::string& content : cases) {
        SCOPED_TRACE(content.size());
        WriteFile(StatePath(), content);
        SimState state(Root());
        ExpectStateError([&] { state.Read(); }, StatePath(), "nested deeper than");
        ExpectStateError([&] { state.Update([](json&) {}); }, StatePath(), "nested deeper than");
        EXPECT_EQ(ReadFile(StatePath()), content);
    }
    // Brackets inside strings are text, and the deepest allowed state is read.
    const std::string inString = "{\"a\": \"" + std::string(100000, '[') +
                                 "\\\"\", \"b\": " + nested(size_t(HostCtl::Lib::kMaxStateDepth) - 1) + "}";
    WriteFile(StatePath(), inString);
    EXPECT_EQ(SimState(Root()).Read()->at("a").get<std::string>().size(), 100001u);
}

TEST_F(SimStateTest, WriteThatWouldNestTooDeepIsRefused) {
    const std::string before = ReadFile(StatePath());
    SimState state(Root());
    ExpectStateError(
        [&] {
            state.Update([](json& s) {
                json* at = &s["deep"];
                for (int i = 0; i < HostCtl::Lib::kMaxStateDepth + 10; ++i) at = &(*at)["x"];
            });
        },
        StatePath(), "nest deeper than");
    EXPECT_EQ(ReadFile(StatePath()), before);
}

TEST_F(SimStateTest, HistoryKeepsTheLatestEntries) {
    SimState state(Root());
    const size_t total = SimState::kHistoryLimit + 50;
    for (size_t i = 0; i < total; ++i) state.Update([&](json& s) { state.AppendHistory(s, {{"call", i}}); });
    const json& history = state.Read()->at("history");
    ASSERT_EQ(history.size(), SimState::kHistoryLimit);
    for (size_t i = 0; i < history.size(); ++i) {
        const size_t call = total - SimState::kHistoryLimit + i;
        EXPECT_EQ(history[i]["call"], call);
        EXPECT_EQ(history[i]["seq"], call + 1);
    }
}

TEST_F(SimStateTest, CachedStateIsDroppedWhenTheFileBreaks) {
    SimState state(Root());
    state.Read();
    WriteFile(StatePath(), "{broken");
    ExpectStateError([&] { state.Read(); }, StatePath(), "parse error");
}

// Fields of the wrong type, seen through the operations that read them.
class WrongFieldTest : public SimHostTest {};

TEST_F(WrongFieldTest, OperationsNameTheFileAndTheField) {
    struct Case {
        const char* pointer;
        json value;
        std::function<void()> call;
        const char* problem;  // after "field POINTER "
    };
    const auto setDhcp = [] {
        IpConfig dhcp;
        dhcp.SetUseDhcp(true);
        Mgmt().SetIpConfig(dhcp);
    };
    const auto getToken = [] {
        QelCtl::Hardware::SmartCardToken token;
        QelCtl::Hardware::SmartCardInfoImpl().GetToken({"slot0"}, token);
    };
    const Case cases[] = {
        {"/system/systemAlert", 5, [] { QelCtl::System::SystemInfoImpl().GetSystemAlert(); },
         "must be a string"},
        {"/vms/running", "no", [] { QelCtl::Resource::ResourceInfoImpl().HasRunningVirtualMachines(); },
         "must be a non-negative integer"},
        {"/network/dns/servers/0", "300.1.1.1",
         [] { QelCtl::Network::DnsConfigImpl(STACK).GetNameServers(); },
         "is not an IPv4 address: \"300.1.1.1\""},
        {"/network/routing/ipv6Gateway", "fe80::zz", [] { Ipv6Gateway(); }, "is not an IPv6 address"},
        {"/network/dns/searchDomains", "example.test",
         [] { QelCtl::Network::DnsConfigImpl(STACK).GetSearchDomains(); }, "must be an array"},
        {"/network/vnics/0/ipv4/dhcp", "yes", [] { Mgmt().GetIpConfig(); }, "must be true or false"},
        {"/network/vnics/0/ipv6/addresses/0/type", "slaac", [] { Mgmt().GetIpConfig(); }, "must be"},
        {"/network/vnics/0/ipv6/addresses/0/prefix", 129, [] { Mgmt().GetIpConfig(); }, "must be 0 to 128"},
        {"/network/vnics/0/ipv4", json::array(), setDhcp, "must be an object"},
        {"/network/pnics/0/speedMbps", 1.5, [] { QelCtl::Network::NetworkInfoImpl().GetPnics(); },
         "must be an integer"},
        {"/version/buildNumber", 4294967296, [] { GetBackend().GetVersionRecord(); }, "is too large"},
        {"/advancedOptions/~1UserVars~1VelkTimeOut", true,
         [] { QelCtl::Adv::AdvancedOptionImpl().FindOption("/UserVars/VelkTimeOut"); },
         "must be an integer or a string"},
        {"/smartCards/slots/0/token", "card", getToken, "must be an object"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.pointer);
        Reset();
        Edit([&](json& s) { s[json::json_pointer(c.pointer)] = c.value; });
        const std::string before = ReadFile(StatePath());
        ExpectStateError(c.call, StatePath(), std::string("field ") + c.pointer + " " + c.problem);
        EXPECT_EQ(ReadFile(StatePath()), before);
    }

    Reset();
    Edit([](json& s) { s["network"]["managementInterface"] = "qk9"; });
    ExpectStateError(
        [] { QelCtl::Network::NetworkInfoImpl().GetManagementInterface()->GetConnectionPoint(); },
        StatePath(), "no virtual NIC named \"qk9\"");
    Edit([](json& s) { s.erase("hardware"); });
    ExpectStateError([] { QelCtl::Hardware::CpuInfoImpl().GetNumCpuPackages(); }, StatePath(),
                     "missing field /hardware/cpu/packages");
}

}  // namespace
