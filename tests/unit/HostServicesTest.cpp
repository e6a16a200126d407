// Services on a simulated host: command lines run through the host's shell
// (QelCtl_Exec), the firewall rulesets, the service tools with their injected
// faults and delays, and the console's assertions.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <fstream>
#include <nlohmann/json.hpp>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "Assertion.hpp"
#include "CommandRunner.hpp"
#include "hostctl/Host.hpp"
#include "hostctl/QelCtl.hpp"
#include "hostctl/SimState.hpp"

namespace {

using nlohmann::json;
using Clock = std::chrono::steady_clock;

std::string ReadFile(const std::string& path) {
    std::ifstream in(path);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

std::string Quoted(const std::string& text) { return "'" + text + "'"; }

struct Ran {
    int status;
    std::string out;
    std::string err;
};

class HostServicesTest : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/velk-services-XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        _dir = tmpl;
        _root = _dir + "/host";
        ASSERT_EQ(SimHost({"create", _root, "--password", "Secret-1"}), 0);
        HostCtl::Lib::UseSimulatedHost(_root);
        // Prints its arguments and a line on standard error; "fail" exits 3,
        // "later FILE" writes FILE after a second.
        const std::string probe = _root + "/sbin/probe";
        std::ofstream(probe) << "#!/bin/sh\n"
                                "echo \"args: $*\"\n"
                                "echo 'to stderr' >&2\n"
                                "[ \"$1\" = fail ] && exit 3\n"
                                "[ \"$1\" = later ] && { /bin/sleep 1; echo done > \"$2\"; }\n"
                                "exit 0\n";
        chmod(probe.c_str(), 0755);
    }
    void TearDown() override { std::system(("rm -rf " + Quoted(_dir)).c_str()); }

    int SimHost(const std::vector<std::string>& args) const {
        std::string command = VELK_SIMHOST_BIN;
        for (const std::string& a : args) command += " " + Quoted(a);
        const int status = std::system((command + " >/dev/null 2>&1").c_str());
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    json State() const { return json::parse(ReadFile(_root + "/host.json")); }
    std::string Log() const { return ReadFile(_root + "/var/log/syslog.log"); }

    // A host tool, run as the console runs it.
    static Ran Tool(const char* path, const std::vector<const char*>& args) {
        std::vector<const char*> argv = args;
        argv.push_back(nullptr);
        char out[257] = {}, err[257] = {};
        size_t outLen = 256, errLen = 256;
        const int status = Velk::RunCommand(path, argv.data(), out, &outLen, err, &errLen, nullptr, 0, 30);
        return {status, std::string(out, outLen), std::string(err, errLen)};
    }

    std::string _dir;
    std::string _root;
};

TEST_F(HostServicesTest, CommandLinesRunWithTheHostsShellAndTools) {
    using QelCtl::Util::QelCtl_Exec;
    // Absolute words are host paths (the null device excepted), the host's
    // own folders are the search path, and with logOutput both streams go
    // to the log line by line.
    EXPECT_EQ(QelCtl_Exec("/sbin/probe /var/log/x /dev/null", true, true, false), 0);
    EXPECT_NE(Log().find("args: " + _root + "/var/log/x /dev/null"), std::string::npos) << Log();
    EXPECT_NE(Log().find("user.info: to stderr"), std::string::npos) << Log();
    EXPECT_EQ(QelCtl_Exec("probe found-by-path", true, true, false), 0);
    EXPECT_NE(Log().find("args: found-by-path"), std::string::npos);

    // The status comes back, or throws when asked to; without logOutput
    // nothing reaches the log.
    EXPECT_EQ(QelCtl_Exec("/sbin/probe fail quietly", false, true, false), 3);
    EXPECT_EQ(Log().find("fail quietly"), std::string::npos);
    EXPECT_THROW(QelCtl_Exec("/sbin/probe fail", false, true, true), HostCtl::Lib::HostCtlException);
    EXPECT_EQ(QelCtl_Exec("no-such-tool", false, true, false), 127);

    // Not waited for: back at once, the command goes on alone.
    const auto start = Clock::now();
    EXPECT_EQ(QelCtl_Exec("/sbin/probe later /var/log/marker", true, false, true), 0);
    EXPECT_LT(Clock::now() - start, std::chrono::milliseconds(800));
    EXPECT_EQ(ReadFile(_root + "/var/log/marker"), "");
    for (int i = 0; i < 100 && ReadFile(_root + "/var/log/marker").empty(); ++i)
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    EXPECT_EQ(ReadFile(_root + "/var/log/marker"), "done\n");

    // Each request is in the host's history; a fault refuses it unrun.
    size_t recorded = 0;
    const json history = State()["history"];
    for (const json& e : history) recorded += e.value("operation", "") == "RunCommandLine";
    EXPECT_EQ(recorded, 6u) << history.dump(1);
    ASSERT_EQ(SimHost({"fail", _root, "RunCommandLine", "no shell today"}), 0);
    try {
        QelCtl_Exec("/sbin/probe refused", true, true, false);
        ADD_FAILURE() << "no exception";
    } catch (const HostCtl::Lib::HostCtlException& e) {
        EXPECT_STREQ(e.what(), "no shell today");
    }
    EXPECT_EQ(Log().find("args: refused"), std::string::npos);
}

TEST_F(HostServicesTest, FirewallRulesetsByIdOnly) {
    QelCtl::System::SystemInfoImpl system;
    HostCtl::Firewall::Ruleset ssh = system.GetFirewallRulesetById("sshServer");
    EXPECT_FALSE(ssh.IsEnabled());
    ssh.SetEnabled(true);
    EXPECT_TRUE(ssh.IsEnabled());
    EXPECT_EQ(State()["firewall"]["rulesets"]["sshServer"]["enabled"], true);
    EXPECT_TRUE(system.GetFirewallRulesetById("sshServer").IsEnabled());
    EXPECT_EQ(State()["history"].back()["args"], json({"sshServer", true}));
    try {
        system.GetFirewallRulesetById("ntpClient");
        ADD_FAILURE() << "no exception";
    } catch (const HostCtl::Lib::HostCtlException& e) {
        EXPECT_NE(std::string(e.what()).find("no firewall ruleset \"ntpClient\""), std::string::npos)
            << e.what();
    }
}

TEST_F(HostServicesTest, ServiceToolsAnswerAndRefuse) {
    const std::string ssh = _root + "/etc/init.d/SSH";
    const std::string services = _root + "/sbin/services.sh";
    const char* set = "set";
    struct Case {
        const char* path;
        std::vector<const char*> args;
        int status;
        const char* out;  // contained in the output
        const char* err;  // contained in the error output
    };
    const Case cases[] = {
        {"/sbin/tarncfg-advcfg", {"tarncfg-advcfg", "-q", "-g", "/UserVars/VelkTimeOut"}, 0, "600\n", ""},
        {"/sbin/tarncfg-advcfg",
         {"tarncfg-advcfg", "-g", "/UserVars/VelkTimeOut"},
         0,
         "Value of VelkTimeOut is 600",
         ""},
        {"/sbin/tarncfg-advcfg", {"tarncfg-advcfg", "-q", "-g", "/UserVars/Nope"}, 1, "", "no such option"},
        {"/sbin/tarncfg-advcfg", {"tarncfg-advcfg", "-q"}, 1, "", "Usage"},
        {"/sbin/tarncli",
         {"tarncli", "system", "settings", "advanced", set, "-o", "/UserVars/VelkTimeOut", "-i", "60"},
         0,
         "",
         ""},
        {"/sbin/tarncfg-advcfg", {"tarncfg-advcfg", "-q", "-g", "/UserVars/VelkTimeOut"}, 0, "60\n", ""},
        {"/sbin/tarncli",
         {"tarncli", "system", "settings", "advanced", set, "-o", "/UserVars/VelkTimeOut", "-i", "6x"},
         1,
         "",
         "Invalid integer"},
        {"/sbin/localcli",
         {"localcli", "system", "settings", "advanced", set, "-o", "/UserVars/Nope", "-i", "1"},
         1,
         "",
         "Unable to find option"},
        {"/sbin/localcli", {"localcli", "system", "settings", "advanced", "get"}, 1, "", "Usage"},
        {"/bin/sh", {"sh", ssh.c_str(), "status"}, 3, "SSH is not running", ""},
        {"/bin/sh", {"sh", ssh.c_str(), "restart"}, 0, "Starting SSH", ""},
        {"/bin/sh", {"sh", ssh.c_str(), "status"}, 0, "SSH is running", ""},
        {"/bin/sh", {"sh", ssh.c_str(), "reload"}, 1, "", "Usage: /etc/init.d/SSH"},
        // Without the host agent only localcli sets options.
        {"/bin/sh", {"sh", services.c_str(), "stop"}, 0, "Stopping", ""},
        {"/sbin/tarncli",
         {"tarncli", "system", "settings", "advanced", set, "-o", "/UserVars/VelkTimeOut", "-i", "120"},
         1,
         "",
         "host agent"},
        {"/sbin/localcli",
         {"localcli", "system", "settings", "advanced", set, "-o", "/UserVars/VelkTimeOut", "-i", "120"},
         0,
         "",
         ""},
        {"/sbin/qelbacktrace",
         {"qelbacktrace", "-w", "-n", "sshd", "-o", "x%", "-d", "/var/log/"},
         1,
         "",
         "no process named sshd"},
        {"/sbin/qelbacktrace", {"qelbacktrace", "-w"}, 1, "", "Usage"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string(c.path) + " " + c.args.back());
        const Ran r = Tool(c.path, c.args);
        EXPECT_EQ(r.status, c.status) << r.err;
        EXPECT_NE(r.out.find(c.out), std::string::npos) << r.out;
        EXPECT_NE(r.err.find(c.err), std::string::npos) << r.err;
    }
    const json state = State();
    EXPECT_EQ(state["advancedOptions"]["/UserVars/VelkTimeOut"], 120);
    EXPECT_EQ(state["services"]["ssh"]["running"], true);
    EXPECT_EQ(state["hostAgent"]["running"], false);
}

TEST_F(HostServicesTest, ToolFaultsAndDelaysByToolOrWord) {
    const std::string ssh = _root + "/etc/init.d/SSH";
    ASSERT_EQ(SimHost({"fail", _root, "SSH start", "ssh: port 22 in use"}), 0);
    ASSERT_EQ(SimHost({"fail", _root, "tarncfg-advcfg"}), 0);
    ASSERT_EQ(SimHost({"slow", _root, "SSH status", "0.4"}), 0);
    // Refused: unknown names, delays that are no number of seconds.
    EXPECT_NE(SimHost({"fail", _root, "sshd start", "x"}), 0);
    EXPECT_NE(SimHost({"slow", _root, "GetPnics", "1"}), 0);
    EXPECT_NE(SimHost({"slow", _root, "qelbacktrace", "-1"}), 0);
    EXPECT_NE(SimHost({"slow", _root, "qelbacktrace", "soon"}), 0);

    Ran r = Tool("/bin/sh", {"sh", ssh.c_str(), "start"});
    EXPECT_EQ(r.status, 1);
    EXPECT_EQ(r.err, "ssh: port 22 in use\n");
    const auto start = Clock::now();
    r = Tool("/bin/sh", {"sh", ssh.c_str(), "status"});
    EXPECT_GE(Clock::now() - start, std::chrono::milliseconds(400));
    EXPECT_EQ(r.status, 3) << "the fault of \"SSH start\" applies to start only";
    r = Tool("/sbin/tarncfg-advcfg", {"tarncfg-advcfg", "-q", "-g", "/UserVars/VelkTimeOut"});
    EXPECT_EQ(r.status, 1);
    EXPECT_EQ(r.err, "simulated failure of tarncfg-advcfg\n");

    json state = State();
    EXPECT_EQ(state["services"]["ssh"]["running"], false);
    const json& failed = state["history"][state["history"].size() - 3];
    EXPECT_EQ(failed["tool"], "SSH");
    EXPECT_EQ(failed["status"], 1);
    EXPECT_EQ(failed["fault"], "ssh: port 22 in use");

    ASSERT_EQ(SimHost({"fail", _root, "SSH start", "--clear"}), 0);
    ASSERT_EQ(SimHost({"slow", _root, "SSH status", "0"}), 0);
    EXPECT_EQ(Tool("/bin/sh", {"sh", ssh.c_str(), "start"}).status, 0);
    state = State();
    EXPECT_EQ(state["services"]["ssh"]["running"], true);
    EXPECT_EQ(state["toolDelays"], json::object());
    EXPECT_EQ(state["toolFaults"], json({{"tarncfg-advcfg", "simulated failure of tarncfg-advcfg"}}));
}

// A class member, so that the message shows how the compiler names it.
struct Guarded {
    virtual ~Guarded() = default;
    virtual bool Check(const int* p) {
        VELK_ASSERT(p != NULL);
        return true;
    }
};

TEST(AssertionDeathTest, NamesTheConditionTheSourceAndTheFunction) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    int value = 0;
    EXPECT_TRUE(Guarded().Check(&value));
    EXPECT_DEATH(
        Guarded().Check(nullptr),
        "HostServicesTest\\.cpp:[0-9]+: virtual bool \\{anonymous\\}::Guarded::Check\\(const int\\*\\): "
        "Assertion `\\(p != __null\\)' failed\\.");
}

}  // namespace
