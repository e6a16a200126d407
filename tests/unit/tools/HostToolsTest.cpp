// The host's tools (hrm-cmd, the service tools, grabCIMData, the power
// tools), run through the scripts in the host root with the console's
// one-entry environment.
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
    // Reading and switching lockdown mode is covered end to end (LockdownTest).
    const Step steps[] = {
        {"nobody", "hrmsvc/auth/lockdown_is_enabled", 255, "", "nobody"},
        {"root", "hrmsvc/auth/lockdown_is_possible", 0, "true\n", ""},
        {"velk", "hrmsvc/auth/lockdown_mode_enter", 0, "", ""},
        {"velk", "hrmsvc/auth/lockdown_mode_enter", 0, "", ""},  // already in: no error
        {"root", "hrmsvc/auth/lockdown_is_enabled", 0, "true\n", ""},
        {"velk", "hrmsvc/auth/lockdown_mode_exit", 0, "", ""},
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

// (The console's auto-stop and powerOffVms calls are checked end to end by PowerTest.)
TEST_F(HostTools, HistoryKeepsTheOrder) {
    Edit("/vms/running", 3);
    ASSERT_EQ(Tool("/bin/hrm-cmd", {"-U", "root", "internalsvc/refresh", "extra"}).status, 0);
    ASSERT_EQ(Tool("/sbin/powerOffVms", {}).status, 0);

    const json state = State();
    EXPECT_EQ(state["vms"]["running"], 0);
    const json expected[] = {
        {{"tool", "hrm-cmd"}, {"user", "root"}, {"command", "internalsvc/refresh"}, {"args", {"extra"}}},
        {{"tool", "powerOffVms"}, {"args", json::array()}}};
    ASSERT_EQ(state["history"].size(), 2u) << state["history"].dump(1);
    for (size_t i = 0; i < 2; ++i) {
        const json& entry = state["history"][i];
        for (const auto& [key, value] : expected[i].items()) EXPECT_EQ(entry[key], value) << key;
        EXPECT_EQ(entry["seq"], i + 1);  // numbered from 1, at UTC times
        EXPECT_EQ(entry["time"].get<std::string>().back(), 'Z');
    }

    // Numbering goes on from the highest entry left after the list was edited.
    Edit("/history", json::array({{{"tool", "x"}, {"seq", 41}}}));
    ASSERT_EQ(Hrm("root", "internalsvc/refresh").status, 0);
    EXPECT_EQ(State()["history"][1]["seq"], 42);
}

// Setting options and switching services through the console is covered end
// to end (TroubleshootingTest); here the service tools' answers and refusals.
TEST_F(HostTools, ServiceToolsAnswerAndRefuse) {
    const auto set = [](const char* option, const char* value) {
        return std::vector<std::string>{"system", "settings", "advanced", "set", "-o", option, "-i", value};
    };
    struct Case {
        const char* hostPath;
        std::vector<std::string> args;
        int status;
        const char *out, *err;  // contained in the output and the error output
    };
    const Case cases[] = {
        {"/sbin/tarncfg-advcfg", {"-q", "-g", "/UserVars/VelkTimeOut"}, 0, "600\n", ""},
        {"/sbin/tarncfg-advcfg", {"-g", "/UserVars/VelkTimeOut"}, 0, "Value of VelkTimeOut is 600", ""},
        {"/sbin/tarncfg-advcfg", {"-q", "-g", "/UserVars/Nope"}, 1, "", "no such option"},
        {"/sbin/tarncfg-advcfg", {"-q"}, 1, "", "Usage"},
        {"/sbin/tarncli", set("/UserVars/VelkTimeOut", "6x"), 1, "", "Invalid integer"},
        {"/sbin/localcli", set("/UserVars/Nope", "1"), 1, "", "Unable to find option"},
        {"/sbin/localcli", {"system", "settings", "advanced", "get"}, 1, "", "Usage"},
        {"/etc/init.d/SSH", {"status"}, 3, "SSH is not running", ""},
        {"/etc/init.d/SSH", {"reload"}, 1, "", "Usage: /etc/init.d/SSH"},
        // Without the host agent only localcli sets options.
        {"/sbin/services.sh", {"stop"}, 0, "Stopping", ""},
        {"/sbin/tarncli", set("/UserVars/VelkTimeOut", "120"), 1, "", "host agent"},
        {"/sbin/localcli", set("/UserVars/VelkTimeOut", "120"), 0, "", ""},
        {"/sbin/qelbacktrace",
         {"-w", "-n", "sshd", "-o", "x%", "-d", "/var/log/"},
         1,
         "",
         "no process named sshd"},
        {"/sbin/qelbacktrace", {"-w"}, 1, "", "Usage"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string(c.hostPath) + " " + c.args[0]);
        const Result r = Tool(c.hostPath, c.args);
        EXPECT_EQ(r.status, c.status) << r.err;
        EXPECT_NE(r.out.find(c.out), std::string::npos) << r.out;
        EXPECT_NE(r.err.find(c.err), std::string::npos) << r.err;
    }
    const json state = State();
    EXPECT_EQ(state["advancedOptions"]["/UserVars/VelkTimeOut"], 120);
    EXPECT_EQ(state["hostAgent"]["running"], false);
}

// (How long a slowed tool takes is seen end to end by
// TroubleshootingTest.LiveCoreRunsBesideTheRestartWithoutBeingAwaited.)
TEST_F(HostTools, ToolFaultsAndDelaysByToolOrWord) {
    ASSERT_EQ(SimHost({"fail", _root, "SSH start", "ssh: port 22 in use"}).status, 0);
    ASSERT_EQ(SimHost({"fail", _root, "tarncfg-advcfg"}).status, 0);
    ASSERT_EQ(SimHost({"slow", _root, "SSH status", "0.4"}).status, 0);
    // A host control operation is slowed in a table of its own.
    ASSERT_EQ(SimHost({"slow", _root, "GetPnics", "1"}).status, 0);
    // Refused: unknown names, delays that are no number of seconds.
    EXPECT_TRUE(Fails(SimHost({"fail", _root, "sshd start", "x"})));
    EXPECT_TRUE(Fails(SimHost({"slow", _root, "GetPnicz", "1"})));
    EXPECT_TRUE(Fails(SimHost({"slow", _root, "qelbacktrace", "-1"})));
    EXPECT_TRUE(Fails(SimHost({"slow", _root, "qelbacktrace", "soon"})));

    const Result start = Tool("/etc/init.d/SSH", {"start"});
    EXPECT_EQ(start.status, 1);
    EXPECT_EQ(start.err, "ssh: port 22 in use\n");
    EXPECT_EQ(Tool("/etc/init.d/SSH", {"status"}).status, 3)
        << "the fault of \"SSH start\" applies to start only";
    EXPECT_TRUE(Fails(Tool("/sbin/tarncfg-advcfg", {"-q", "-g", "/UserVars/VelkTimeOut"}),
                      "simulated failure of tarncfg-advcfg"));

    json state = State();
    EXPECT_EQ(state["services"]["ssh"]["running"], false);
    const json& failed = state["history"][state["history"].size() - 3];
    EXPECT_EQ(failed["tool"], "SSH");
    EXPECT_EQ(failed["status"], 1);
    EXPECT_EQ(failed["fault"], "ssh: port 22 in use");

    ASSERT_EQ(SimHost({"fail", _root, "SSH start", "--clear"}).status, 0);
    ASSERT_EQ(SimHost({"slow", _root, "SSH status", "0"}).status, 0);
    EXPECT_EQ(Tool("/etc/init.d/SSH", {"start"}).status, 0);
    state = State();
    EXPECT_EQ(state["services"]["ssh"]["running"], true);
    EXPECT_EQ(state["toolDelays"], json::object());
    EXPECT_EQ(state["delays"], json({{"GetPnics", 1.0}}));
    EXPECT_EQ(state["toolFaults"], json({{"tarncfg-advcfg", "simulated failure of tarncfg-advcfg"}}));
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

    const json state = State();
    EXPECT_EQ(state["power"]["state"], "off");
    EXPECT_EQ(state["power"]["resetDone"], true);
    EXPECT_EQ(state["history"].size(), 3u);  // the entries: PowerTest, ResetTest (end to end)
}

}  // namespace
}  // namespace ToolTest
