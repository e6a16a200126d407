// qelping, the host's ping, run through its script in the host root as the
// console runs it: exit statuses, waits, the history entry and a kill while
// it waits.
#include <signal.h>

#include <chrono>
#include <thread>

#include "ToolTestSupport.hpp"

namespace ToolTest {
namespace {

using nlohmann::json;
using Clock = std::chrono::steady_clock;

class Qelping : public HostTest {
protected:
    void SetUp() override {
        HostTest::SetUp();
        Edit("/network/pingTimeoutMs", 100);
    }
    Result Ping(const std::vector<std::string>& args) { return Tool("/sbin/qelping", args); }
    std::vector<json> Runs() const {
        std::vector<json> runs;
        const json history = State()["history"];
        for (const json& e : history)
            if (e["tool"] == "qelping") runs.push_back(e);
        return runs;
    }
};

// (The console's own pings, answered or not, are checked end to end by TestDialogTest.)
TEST_F(Qelping, ExitStatuses) {
    struct Case {
        std::vector<std::string> args;
        int status;
        const char* errMentions;  // "" when nothing may be printed on stderr
    };
    const Case cases[] = {
        {{"-I", "qk0", "203.0.113.10"}, 0, ""},
        {{"192.0.2.100"}, 0, ""},
        {{"198.51.100.1"}, 1, ""},
        {{"192.0.2.1", "-I", "qk9"}, 2, "unknown interface qk9"},
        {{"fe80::1%qk1", "-I", "qk0"}, 2, "scope"},
        {{}, 2, "usage: qelping"},
        {{"192.0.2.1", "-I"}, 2, "-I needs"},
        {{"-c1", "192.0.2.1"}, 2, "unknown option -c1"},
        {{"192.0.2.1", "192.0.2.53"}, 2, "more than one target"},
        {{"gateway.example.test"}, 2, "unknown host"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.args.empty() ? "(no arguments)" : c.args[0]);
        const Result r = Ping(c.args);
        EXPECT_EQ(r.status, c.status) << r.err;
        if (*c.errMentions)
            EXPECT_NE(r.err.find(c.errMentions), std::string::npos) << r.err;
        else
            EXPECT_TRUE(r.err.empty()) << r.err;
        if (c.status < 2) {
            EXPECT_NE(r.out.find(c.status == 0 ? " 0% packet loss" : "100% packet loss"), std::string::npos)
                << r.out;
        }
        const std::vector<json> runs = Runs();
        ASSERT_FALSE(runs.empty());
        EXPECT_EQ(runs.back()["args"], json(c.args));
        EXPECT_EQ(runs.back()["status"], c.status);
    }
    EXPECT_EQ(Runs().size(), std::size(cases));

    // Without a management interface there is nothing to send from.
    Edit("/network/managementInterface", "");
    EXPECT_EQ(Ping({"192.0.2.1"}).status, 2);
}

TEST_F(Qelping, WaitsForTheAnswerOrTheTimeout) {
    Edit("/network/lan/0/hosts/192.0.2.1/delayMs", 300);
    Edit("/network/pingTimeoutMs", 400);
    struct Case {
        const char* target;
        int status;
        int atLeastMs;
    };
    const Case cases[] = {{"192.0.2.1", 0, 300}, {"198.51.100.1", 1, 400}};
    for (const Case& c : cases) {
        SCOPED_TRACE(c.target);
        const Clock::time_point start = Clock::now();
        const Result r = Ping({c.target});
        const auto took = std::chrono::duration_cast<std::chrono::milliseconds>(Clock::now() - start);
        EXPECT_EQ(r.status, c.status) << r.err;
        EXPECT_GE(took.count(), c.atLeastMs);
    }
    EXPECT_NE(Ping({"192.0.2.1"}).out.find("time=300.000 ms"), std::string::npos);

    Edit("/network/lan/0/hosts/192.0.2.1/delayMs", "soon");
    const Result bad = Ping({"192.0.2.1"});
    EXPECT_EQ(bad.status, 1);
    EXPECT_NE(bad.err.find("delayMs"), std::string::npos) << bad.err;
    EXPECT_EQ(Lines(bad.err), 1u);
}

TEST_F(Qelping, KilledWhileWaitingLeavesAWholeState) {
    Edit("/network/pingTimeoutMs", 60000);
    const pid_t pid = Start({_root + "/sbin/qelping", "198.51.100.1"}, CONSOLE_ENV);
    ASSERT_GT(pid, 0);
    // The run is recorded, without a status, before the wait.
    const Clock::time_point deadline = Clock::now() + std::chrono::seconds(10);
    while (Runs().empty() && Clock::now() < deadline)
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    ASSERT_EQ(Runs().size(), 1u);
    EXPECT_TRUE(Runs()[0]["status"].is_null());
    ASSERT_EQ(kill(pid, SIGKILL), 0);
    EXPECT_EQ(Finish(pid).status, -1);

    EXPECT_TRUE(Runs()[0]["status"].is_null());
    Edit("/network/pingTimeoutMs", 100);
    EXPECT_EQ(Ping({"192.0.2.1"}).status, 0);  // the state's lock went with the killed run
    EXPECT_EQ(Runs().size(), 2u);
}

}  // namespace
}  // namespace ToolTest
