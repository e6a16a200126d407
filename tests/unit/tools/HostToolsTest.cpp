// The host's tools (hrm-cmd, grabCIMData, powerOffVms), run through the
// scripts in the host root with the console's one-entry environment.
#include <set>

#include "ToolTestSupport.hpp"

namespace ToolTest {
namespace {

using nlohmann::json;

using HostTools = HostTest;

struct Step {
    const char* user;
    const char* command;
    int status;
    const char* out;
    const char* errMentions;  // "" when nothing may be printed on stderr
};

// Each entry has the fields of its expected one, and the entries are numbered from 1.
void ExpectHistory(const json& history, const std::vector<json>& expected) {
    ASSERT_EQ(history.size(), expected.size()) << history.dump(1);
    for (size_t i = 0; i < history.size(); ++i) {
        SCOPED_TRACE(i);
        for (const auto& [key, value] : expected[i].items()) EXPECT_EQ(history[i][key], value) << key;
        EXPECT_EQ(history[i]["seq"], i + 1);
        EXPECT_EQ(history[i]["time"].get<std::string>().back(), 'Z');
    }
}

void Check(const Step& s, const Result& r) {
    SCOPED_TRACE(std::string(s.user) + " " + s.command);
    EXPECT_EQ(r.status, s.status) << r.err;
    EXPECT_EQ(r.out, s.out);
    if (*s.errMentions)
        EXPECT_NE(r.err.find(s.errMentions), std::string::npos) << r.err;
    else
        EXPECT_TRUE(r.err.empty()) << r.err;
}

TEST_F(HostTools, HrmCmdUsersAndLockdown) {
    const Step steps[] = {
        {"nobody", "hrmsvc/auth/lockdown_is_enabled", 255, "", "nobody"},
        {"root", "hrmsvc/auth/lockdown_is_enabled", 0, "false\n", ""},
        {"root", "hrmsvc/auth/lockdown_is_possible", 0, "true\n", ""},
        {"velk", "hrmsvc/auth/lockdown_mode_enter", 0, "", ""},
        {"root", "hrmsvc/auth/lockdown_is_enabled", 0, "true\n", ""},
        {"velk", "hrmsvc/auth/lockdown_mode_enter", 0, "", ""},
        {"root", "hrmsvc/auth/lockdown_is_enabled", 0, "true\n", ""},
        {"velk", "hrmsvc/auth/lockdown_mode_exit", 0, "", ""},
        {"root", "hrmsvc/auth/lockdown_is_enabled", 0, "false\n", ""},
        {"root", "hostsvc/no_such_thing", 1, "", "Unknown command"},
        {"nobody", "hostsvc/no_such_thing", 255, "", "nobody"},
    };
    size_t recorded = 0;
    for (const Step& s : steps) {
        Check(s, Hrm(s.user, s.command));
        if (s.status != 255) ++recorded;
    }
    // Unknown users are turned away before anything is recorded.
    json history = State()["history"];
    ASSERT_EQ(history.size(), recorded);
    EXPECT_EQ(history.back()["command"], "hostsvc/no_such_thing");
    EXPECT_EQ(history.back()["status"], 1);

    // A host where lockdown mode cannot be changed refuses both ways.
    Edit("/hostAgent/lockdownPossible", false);
    const Step locked[] = {
        {"root", "hrmsvc/auth/lockdown_is_possible", 0, "false\n", ""},
        {"velk", "hrmsvc/auth/lockdown_mode_enter", 1, "", "Lockdown"},
        {"root", "hrmsvc/auth/lockdown_is_enabled", 0, "false\n", ""},
    };
    for (const Step& s : locked) Check(s, Hrm(s.user, s.command));
    Edit("/hostAgent/lockdownEnabled", true);
    Check({"velk", "hrmsvc/auth/lockdown_mode_exit", 1, "", "Lockdown"},
          Hrm("velk", "hrmsvc/auth/lockdown_mode_exit"));
    EXPECT_EQ(State()["hostAgent"]["lockdownEnabled"], true);
}

TEST_F(HostTools, HrmCmdSwitchesServices) {
    struct Case {
        const char* command;
        const char* service;
        const char* field;
        bool value;
    };
    const Case cases[] = {
        {"hostsvc/start_ssh", "ssh", "running", true},
        {"hostsvc/enable_ssh", "ssh", "enabled", true},
        {"hostsvc/start_tarn_shell", "tarnShell", "running", true},
        {"hostsvc/stop_ssh", "ssh", "running", false},
        {"hostsvc/enable_tarn_shell", "tarnShell", "enabled", true},
        {"hostsvc/disable_ssh", "ssh", "enabled", false},
        {"hostsvc/stop_tarn_shell", "tarnShell", "running", false},
        {"hostsvc/disable_tarn_shell", "tarnShell", "enabled", false},
    };
    json expected = State()["services"];
    for (const Case& c : cases) {
        SCOPED_TRACE(c.command);
        Result r = Hrm("root", c.command);
        EXPECT_EQ(r.status, 0) << r.err;
        expected[c.service][c.field] = c.value;
        EXPECT_EQ(State()["services"], expected);
    }
    // A host whose state lacks the services altogether gets them.
    Edit("/services", json::object());
    EXPECT_EQ(Hrm("root", "hostsvc/enable_ssh").status, 0);
    EXPECT_EQ(State()["services"], json({{"ssh", {{"enabled", true}}}}));
}

TEST_F(HostTools, FailCommandsFail) {
    Edit("/hostAgent/failCommands", {"hostsvc/start_ssh", "hrmsvc/auth/lockdown_mode_enter"});
    const Step steps[] = {
        {"root", "hostsvc/start_ssh", 1, "", "hostsvc/start_ssh"},
        {"velk", "hrmsvc/auth/lockdown_mode_enter", 1, "", "lockdown_mode_enter"},
        {"root", "hostsvc/start_tarn_shell", 0, "", ""},
    };
    for (const Step& s : steps) Check(s, Hrm(s.user, s.command));
    json state = State();
    EXPECT_EQ(state["services"]["ssh"]["running"], false);
    EXPECT_EQ(state["services"]["tarnShell"]["running"], true);
    EXPECT_EQ(state["hostAgent"]["lockdownEnabled"], false);
    ASSERT_EQ(state["history"].size(), 3u);
    EXPECT_EQ(state["history"][0]["status"], 1);
    EXPECT_EQ(state["history"][2]["status"], 0);
}

TEST_F(HostTools, HistoryKeepsTheOrder) {
    Edit("/vms/running", 3);
    ASSERT_EQ(Tool("/bin/hrm-cmd", {"-U", "root", "internalsvc/refresh", "extra"}).status, 0);
    ASSERT_EQ(Hrm("velk", "hostsvc/autostartmanager/autostop").status, 0);
    ASSERT_EQ(Tool("/bin/powerOffVms", {"--terminate"}).status, 0);
    ASSERT_EQ(Tool("/sbin/powerOffVms", {}).status, 0);

    json state = State();
    EXPECT_EQ(state["vms"]["running"], 0);
    ExpectHistory(
        state["history"],
        {{{"tool", "hrm-cmd"}, {"user", "root"}, {"command", "internalsvc/refresh"}, {"args", {"extra"}}},
         {{"tool", "hrm-cmd"},
          {"user", "velk"},
          {"command", "hostsvc/autostartmanager/autostop"},
          {"args", json::array()}},
         {{"tool", "powerOffVms"}, {"args", {"--terminate"}}},
         {{"tool", "powerOffVms"}, {"args", json::array()}}});

    // Numbering goes on from the highest entry left after the list was edited.
    Edit("/history", json::array({{{"tool", "x"}, {"seq", 41}}}));
    ASSERT_EQ(Hrm("root", "internalsvc/refresh").status, 0);
    EXPECT_EQ(State()["history"][1]["seq"], 42);
}

TEST_F(HostTools, ConcurrentCallsLoseNothing) {
    const int count = 12;
    std::vector<pid_t> pids;
    for (int i = 0; i < count; ++i)
        pids.push_back(Start({_root + "/bin/hrm-cmd", "-U", "root", "internalsvc/refresh", std::to_string(i)},
                             CONSOLE_ENV));
    for (pid_t pid : pids) EXPECT_EQ(Finish(pid).status, 0);
    json history = State()["history"];
    ASSERT_EQ(history.size(), size_t(count));
    std::set<int> seqs;
    std::set<std::string> args;
    for (const json& h : history) {
        seqs.insert(h["seq"].get<int>());
        args.insert(h["args"][0].get<std::string>());
    }
    EXPECT_EQ(seqs.size(), size_t(count));
    EXPECT_EQ(*seqs.begin(), 1);
    EXPECT_EQ(*seqs.rbegin(), count);
    EXPECT_EQ(args.size(), size_t(count));
}

TEST_F(HostTools, GrabCimData) {
    Edit("/cim/Acme_Counter", {{"Count", 3}});
    struct Case {
        std::vector<std::string> args;
        int status;
        const char* out;
        bool err;
    };
    const Case cases[] = {
        {{"OMC_SMASHFirmwareIdentity", "VersionString"}, 0, "2.4.1\n", false},
        {{"CIM_Chassis", "OtherIdentifyingInfo"}, 0, "ASSET-0042\n", false},
        {{"Acme_Counter", "Count"}, 0, "3\n", false},
        {{"OMC_NoSuchClass", "VersionString"}, 1, "no instances of OMC_NoSuchClass\n", false},
        {{"CIM_Chassis", "NoSuchProperty"}, 1, "", true},
        {{"CIM_Chassis"}, 1, "", true},
        {{}, 1, "", true},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.args.empty() ? "(none)" : c.args[0]);
        Result r = Tool("/sbin/grabCIMData", c.args);
        EXPECT_EQ(r.status, c.status);
        EXPECT_EQ(r.out, c.out);
        EXPECT_EQ(!r.err.empty(), c.err) << r.err;
    }
    // A host without CIM data has no instances at all.
    ASSERT_EQ(SimHost({"remove", _root, "/cim"}).status, 0);
    Result none = Tool("/sbin/grabCIMData", {"OMC_MCFirmwareIdentity", "VersionString"});
    EXPECT_EQ(none.status, 1);
    EXPECT_NE(none.out.find("no instances"), std::string::npos);
}

TEST_F(HostTools, BadStateAndBadArgumentsFailWithoutTheUserStatus) {
    // 255 would make the console retry as another user: a broken state must
    // not look like a user problem.
    struct Case {
        const char* hostPath;
        std::vector<std::string> args;
        const char* state;  // host.json text, or null to keep the created one
        const char* mentions;
    };
    const std::vector<std::string> refresh = {"-U", "root", "internalsvc/refresh"};
    const Case cases[] = {
        {"/bin/hrm-cmd", refresh, "{oops", "host.json"},
        {"/sbin/grabCIMData", {"CIM_Chassis", "OtherIdentifyingInfo"}, "{oops", "host.json"},
        {"/bin/powerOffVms", {}, "{oops", "host.json"},
        {"/bin/hrm-cmd", refresh, R"({"hostAgent": {"users": 7}})", "/hostAgent/users"},
        {"/bin/hrm-cmd", refresh, R"({"hostAgent": {"users": ["root"]}, "history": 1})", "/history"},
        {"/bin/hrm-cmd", {"internalsvc/refresh"}, nullptr, "usage"},
        {"/bin/hrm-cmd", {"-U", "root"}, nullptr, "usage"},
        {"/bin/hrm-cmd", {"-X", "root", "internalsvc/refresh"}, nullptr, "usage"},
        {"/bin/powerOffVms", {"--now"}, nullptr, "usage"},
    };
    const std::string good = ReadFile(_root + "/host.json");
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string(c.hostPath) + " " + (c.state ? c.state : ""));
        std::string before = c.state ? c.state : good;
        WriteFile(_root + "/host.json", before);
        const Result r = Tool(c.hostPath, c.args);
        EXPECT_TRUE(Fails(r, c.mentions));
        EXPECT_TRUE(!c.state || Lines(r.err) == 1) << r.err;
        EXPECT_EQ(ReadFile(_root + "/host.json"), before);
    }
}

TEST_F(HostTools, HostCommandNeedsARootAndAKnownTool) {
    const std::vector<std::vector<std::string>> cases = {
        {VELK_HOSTCMD_BIN},
        {VELK_HOSTCMD_BIN, "--root", _root},
        {VELK_HOSTCMD_BIN, "--root", _root, "halt"},
        {VELK_HOSTCMD_BIN, "hrm-cmd", "-U", "root", "internalsvc/refresh"},  // no root, no VELK_HOST_ROOT
    };
    for (const auto& argv : cases) EXPECT_TRUE(Fails(Run(argv, CONSOLE_ENV))) << argv.size() << " arguments";
    Result fromEnv = Run({VELK_HOSTCMD_BIN, "grabCIMData", "CIM_Chassis", "OtherIdentifyingInfo"},
                         {"VELK_HOST_ROOT=" + _root});
    EXPECT_EQ(fromEnv.status, 0) << fromEnv.err;
    EXPECT_EQ(fromEnv.out, "ASSET-0042\n");
    EXPECT_TRUE(State()["history"].empty());
}

// The console runs "reboot -f" through sh with the host's folders as PATH,
// and the other power tools by their host paths; none of them may reach the
// machine itself.
TEST_F(HostTools, PowerToolsRecordAndNeverTouchTheMachine) {
    const std::vector<std::string> shellEnv = {"PATH=" + _root + "/sbin:" + _root + "/bin"};
    ASSERT_EQ(Tool("/sbin/firmwareConfig.sh", {"--reset-only"}).status, 0);
    Result r = Run({"/bin/sh", "-c", "reboot -f"}, shellEnv);
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(State()["power"]["state"], "rebooting");
    ASSERT_EQ(Tool("/sbin/poweroff", {}).status, 0);

    // Bad arguments fail and record nothing.
    for (const auto& [path, args] : std::vector<std::pair<std::string, std::vector<std::string>>>{
             {"/sbin/reboot", {"--now"}}, {"/sbin/poweroff", {"-x"}}, {"/sbin/firmwareConfig.sh", {}}}) {
        EXPECT_TRUE(Fails(Tool(path, args), "usage")) << path;
    }

    json state = State();
    EXPECT_EQ(state["power"]["state"], "off");
    EXPECT_EQ(state["power"]["resetDone"], true);
    ExpectHistory(state["history"], {{{"tool", "firmwareConfig.sh"}, {"args", {"--reset-only"}}},
                                     {{"tool", "reboot"}, {"args", {"-f"}}},
                                     {{"tool", "poweroff"}, {"args", json::array()}}});
}

}  // namespace
}  // namespace ToolTest
