// velk-simhost: creating a host root, and reading and changing its state.
#include <filesystem>
#include <regex>
#include <sstream>

#include "ToolTestSupport.hpp"

namespace ToolTest {
namespace {

namespace fs = std::filesystem;
using nlohmann::json;

using SimHostCreate = HostTest;
using SimHostState = HostTest;

TEST_F(SimHostCreate, MakesEveryFile) {
    std::error_code ec;
    for (const char* data : {"/host.json", "/etc/zolva/ssl/rui.crt", "/etc/ssh/ssh_host_rsa_key",
                             "/etc/ssh/ssh_host_rsa_key.pub", "/etc/hosts", "/var/log/syslog.log",
                             "/var/log/qelkernel.log", "/var/log/sysboot.log", "/var/log/corad.log",
                             "/var/log/tirpa.log", "/var/log/halvo.log", "/var/log/obzd.log"})
        EXPECT_TRUE(fs::is_regular_file(_root + data) && fs::file_size(_root + data, ec) > 0) << data;
    const std::string flag = _root + "/var/run/zolva/show-velk-login";
    EXPECT_TRUE(fs::is_regular_file(flag) && fs::file_size(flag, ec) == 0);
    EXPECT_TRUE(fs::is_directory(_root + "/dev") && fs::is_empty(_root + "/dev", ec));
    // (The tool scripts and the links to the machine's sh, less and
    // ssh-keygen are run by the other tool tests and end to end.)
    // The console switches terminals through "/dev/console"; on a simulated
    // host that must find nothing.
    EXPECT_FALSE(fs::exists(_root + "/dev/console"));

    json state = State();
    EXPECT_EQ(state["network"]["dns"]["hostname"], "host1");
    EXPECT_EQ(state["network"]["dns"]["domain"], "example.test");
    EXPECT_NE(ReadFile(_root + "/etc/hosts").find("host1.example.test"), std::string::npos);

    // The certificate and the keys are read the way the console reads them.
    Result cert = Tool("/bin/openssl", {"x509", "-in", _root + "/etc/zolva/ssl/rui.crt", "-noout",
                                        "-fingerprint", "-sha1", "-subject"});
    ASSERT_EQ(cert.status, 0) << cert.err;
    EXPECT_TRUE(std::regex_search(cert.out, std::regex("^SHA1 Fingerprint=([0-9A-F]{2}:){19}[0-9A-F]{2}\n")))
        << cert.out;
    EXPECT_NE(cert.out.find("\nsubject=CN = host1.example.test\n"), std::string::npos) << cert.out;
    Result noCert = Tool("/bin/openssl", {"x509", "-in", _root + "/etc/zolva/ssl/none.crt", "-noout"});
    EXPECT_NE(noCert.status, 0);
    EXPECT_TRUE(noCert.out.empty());

    Result rsa =
        Tool("/usr/lib/zolva/openssh/bin/ssh-keygen", {"-l", "-f", _root + "/etc/ssh/ssh_host_rsa_key"});
    ASSERT_EQ(rsa.status, 0) << rsa.err;
    EXPECT_TRUE(std::regex_match(rsa.out, std::regex("2048 SHA256:\\S+ .*\\(RSA\\)\n"))) << rsa.out;

    // A DSA key only where ssh-keygen can still make one, and then whole.
    std::string dsaKey = _root + "/etc/ssh/ssh_host_dsa_key";
    EXPECT_EQ(fs::exists(dsaKey), fs::exists(dsaKey + ".pub"));
    if (fs::exists(dsaKey)) {
        Result dsa = Tool("/usr/lib/zolva/openssh/bin/ssh-keygen", {"-l", "-f", dsaKey});
        EXPECT_EQ(dsa.status, 0) << dsa.err;
        EXPECT_NE(dsa.out.find("(DSA)"), std::string::npos);
    }

    // The host's syslog is in the format the console's own lines use.
    std::istringstream syslog(ReadFile(_root + "/var/log/syslog.log"));
    std::regex line(R"(^\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{3}Z [\w-]+\[\d+\]: [a-z]+\.[a-z]+: .+$)");
    for (std::string l; std::getline(syslog, l);) EXPECT_TRUE(std::regex_match(l, line)) << l;
}

TEST_F(SimHostCreate, RefusesAnExistingRootUnlessForced) {
    Edit("/marker", 1);
    Result refused = SimHost({"create", _root});
    EXPECT_TRUE(Fails(refused, "--force"));
    EXPECT_EQ(Lines(refused.err), 1u);
    EXPECT_EQ(State()["marker"], 1);

    Result forced = SimHost({"create", _root, "--force", "--hostname", "esx9"});
    ASSERT_EQ(forced.status, 0) << forced.err;
    json state = State();
    EXPECT_FALSE(state.contains("marker"));
    EXPECT_EQ(state["network"]["dns"]["hostname"], "esx9");
    Result after = Hrm("root", "hrmsvc/auth/lockdown_is_possible");
    EXPECT_EQ(after.status, 0) << after.err;
    EXPECT_EQ(after.out, "true\n");

    // An existing empty folder is taken as it is, with one line naming it; a
    // file is not a folder.
    fs::create_directory(_dir + "/empty");
    Result empty = SimHost({"create", _dir + "/empty"});
    ASSERT_EQ(empty.status, 0) << empty.err;
    EXPECT_EQ(Lines(empty.out), 1u);
    EXPECT_NE(empty.out.find(_dir + "/empty"), std::string::npos) << empty.out;
    EXPECT_EQ(SimHost({"get", _dir + "/empty", "/network/dns/hostname"}).out, "\"host1\"\n");
    WriteFile(_dir + "/file", "x");
    Result onFile = SimHost({"create", _dir + "/file", "--force"});
    EXPECT_TRUE(Fails(onFile));
    EXPECT_EQ(Lines(onFile.err), 1u);
}

// Bad arguments of every command: one failure, nothing made or changed.
TEST_F(SimHostCreate, BadArgumentsFailCleanly) {
    const std::string fresh = _dir + "/fresh", missing = _dir + "/missing";
    const std::string state = ReadFile(_root + "/host.json");
    const std::string passdb = ReadFile(_root + "/etc/pam-wrapper/passdb");
    const std::vector<std::vector<std::string>> cases = {
        {},
        {"create"},
        {"create", fresh, "--hostname"},
        {"create", fresh, "--hostname", "bad name"},
        {"create", fresh, "--hostname", "semi;colon"},
        {"create", fresh, "--bogus"},
        {"create", fresh, "extra", "argument"},
        {"create", fresh, "--password", "a:b"},
        {"create", fresh, "--password", ""},
        {"create", fresh, "--password"},
        {"frobnicate", _root},
        {"get", _root},
        {"set", _root, "/x"},
        {"remove", _root, "/x", "y"},
        {"login", missing},
        {"login"},
        {"card", _root, "insert", "bob", "1:2"},
        {"card", _root, "insert", "bob", ""},
        {"card", _root, "insert", "bob", "12", "--slot", "7"},
        {"card", _root, "insert", "bob"},
        {"card", _root, "pull", "--slot", "x"},
        {"card", _root, "eject"},
        {"card", missing, "pull"}};
    for (const auto& args : cases) EXPECT_TRUE(Fails(SimHost(args))) << ::testing::PrintToString(args);
    EXPECT_FALSE(fs::exists(fresh));
    EXPECT_FALSE(fs::exists(missing));
    EXPECT_EQ(ReadFile(_root + "/host.json"), state);
    EXPECT_EQ(ReadFile(_root + "/etc/pam-wrapper/passdb"), passdb);
}

TEST_F(SimHostState, SetGetRemoveRoundTrip) {
    struct Case {
        const char* pointer;
        const char* value;
        const char* readAt;  // where the value is read back
        const char* printed;
    };
    const Case cases[] = {
        {"/network/vnics/0/ipv4/address", "\"10.0.0.7\"", "", "\"10.0.0.7\""},
        {"/network/vnics/0/ipv4/address", "10.0.0.8", "", "\"10.0.0.8\""},  // not JSON: a string
        {"/vms/running", "3", "", "3"},
        {"/new/deep/member", "{\"a\": [1]}", "/new/deep/member/a/0", "1"},
        {"/advancedOptions/~1UserVars~1VelkTimeOut", "30", "", "30"},
        {"/network/dns/servers/-", "\"10.0.0.1\"", "/network/dns/servers/1", "\"10.0.0.1\""},
        {"/network/dns/servers/2", "\"10.0.0.2\"", "/network/dns/servers/2", "\"10.0.0.2\""},
        {"/network/pnics", "[]", "", "[]"},
        {"/system/welcomeMessage", "1e400", "", "\"1e400\""},  // no double holds it: a string
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.pointer);
        Result set = SimHost({"set", _root, c.pointer, c.value});
        ASSERT_EQ(set.status, 0) << set.err;
        EXPECT_TRUE(set.err.empty());
        std::string readAt = *c.readAt ? c.readAt : c.pointer;
        Result get = SimHost({"get", _root, readAt});
        EXPECT_EQ(get.status, 0) << get.err;
        EXPECT_EQ(get.out, std::string(c.printed) + "\n");
        EXPECT_EQ(State()[json::json_pointer(readAt)], json::parse(c.printed));
    }

    Result removed = SimHost({"remove", _root, "/new/deep/member"});
    EXPECT_EQ(removed.status, 0) << removed.err;
    EXPECT_EQ(SimHost({"get", _root, "/new/deep/member"}).status, 1);
    EXPECT_EQ(SimHost({"get", _root, "/new/deep"}).out, "{}\n");
    EXPECT_EQ(SimHost({"remove", _root, "/network/dns/servers/0"}).status, 0);
    EXPECT_EQ(State()["network"]["dns"]["servers"], json({"10.0.0.1", "10.0.0.2"}));
}

TEST_F(SimHostState, BadInputIsOneLineAndLeavesTheStateAlone) {
    const std::string good = ReadFile(_root + "/host.json");
    struct Case {
        const char* state;  // host.json text, or null to keep the created one
        std::vector<std::string> args;
        const char* mentions;
    };
    const std::string missing = _dir + "/nohost";
    // Nesting that would overflow the stack of a recursive reader or writer.
    const std::string deepState = "{\"a\": " + std::string(100000, '[') + std::string(100000, ']') + "}";
    const std::string deepValue = std::string(60000, '[') + std::string(60000, ']');
    std::string deepPointer;
    for (int i = 0; i < 600; ++i) deepPointer += "/a";
    const Case cases[] = {
        {deepState.c_str(), {"set", _root, "/a", "1"}, "host.json: arrays and objects nested deeper than"},
        {nullptr, {"set", _root, "/a", deepValue}, "the value nests arrays and objects deeper than"},
        {nullptr, {"set", _root, deepPointer, "1"}, "would nest deeper than"},
        {nullptr, {"set", missing, "/vms", "1"}, "nohost/host.json"},
        {"{\"network\": ", {"set", _root, "/network", "1"}, "host.json: parse error"},
        {"[1, 2]", {"remove", _root, "/0"}, "not a JSON object"},
        {"", {"get", _root, "/vms"}, "host.json"},
        {nullptr, {"get", _root, "network"}, "bad pointer \"network\""},
        {nullptr, {"get", _root, "/a~2b"}, "bad pointer \"/a~2b\""},
        {nullptr, {"get", _root, "/nope/deeper"}, "/nope: no such field"},
        {nullptr, {"set", _root, "/vms/running/x", "1"}, "/vms/running is a number"},
        {nullptr, {"set", _root, "/network/vnics/3/name", "\"x\""}, "/network/vnics/3: no such element"},
        {nullptr, {"set", _root, "/network/vnics/first/name", "\"x\""}, "\"first\" is not an array index"},
        {nullptr, {"set", _root, "", "[]"}, "JSON object"},
        {nullptr, {"remove", _root, "/nope"}, "/nope: no such field"},
        {nullptr, {"remove", _root, ""}, "whole document"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.args[0] + " " + c.args[2]);
        std::string before = c.state ? c.state : good;
        WriteFile(_root + "/host.json", before);
        const Result r = SimHost(c.args);
        EXPECT_TRUE(Fails(r, c.mentions));
        EXPECT_EQ(Lines(r.err), 1u);
        EXPECT_EQ(ReadFile(_root + "/host.json"), before);
    }
    EXPECT_FALSE(fs::exists(missing));
}

using SimHostPam = HostTest;

// The host's PAM services: the console's service checks passwords against
// the host's own file (exercised by PamServices), every other service denies.
TEST_F(SimHostPam, ServicesAndDemoLogin) {
    Result login = SimHost({"login", _root});
    ASSERT_EQ(login.status, 0) << login.err;
    EXPECT_TRUE(std::regex_match(login.out, std::regex("Demo login: user root, password demo-[a-z0-9]{6}\n")))
        << login.out;

    EXPECT_EQ(
        ReadFile(_root + "/etc/pam-wrapper/other"),
        "auth\trequired\tpam_deny.so\naccount\trequired\tpam_deny.so\npassword\trequired\tpam_deny.so\n");

    const std::string other = _dir + "/other";
    ASSERT_EQ(SimHost({"create", other, "--password", "s3cret pass"}).status, 0);
    EXPECT_EQ(ReadFile(other + "/etc/pam-wrapper/passdb"), "root:s3cret pass:velk\nguest:guest-pass:other\n");
    EXPECT_EQ(SimHost({"login", other}).out, "Demo login: user root, password s3cret pass\n");
}

// A card puts its user into the password file with the PIN as secret; a
// second card for the same user replaces the secret, not the line's service.
TEST_F(SimHostPam, CardInsertAndPull) {
    const std::string passdb = _root + "/etc/pam-wrapper/passdb";
    const std::string before = ReadFile(passdb);
    ASSERT_EQ(SimHost({"card", _root, "insert", "alice", "1234"}).status, 0);
    EXPECT_EQ(State()["smartCards"]["slots"][0]["token"]["userIds"], json({"alice"}));
    EXPECT_EQ(ReadFile(passdb), before + "alice:1234:velk\n");
    ASSERT_EQ(SimHost({"card", _root, "insert", "guest", "9999"}).status, 0);
    EXPECT_NE(ReadFile(passdb).find("\nguest:9999:other\n"), std::string::npos) << ReadFile(passdb);
    ASSERT_EQ(SimHost({"card", _root, "pull", "--slot", "0"}).status, 0);
    EXPECT_TRUE(State()["smartCards"]["slots"][0]["token"].is_null());
}

}  // namespace
}  // namespace ToolTest
