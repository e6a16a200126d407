// The console's PAM calls against the PAM services a simulated host gets, run
// the way the console runs on such a host: under libpam-wrapper with the
// host's service folder.
#include <security/_pam_types.h>

#include <regex>

#include "ToolTestSupport.hpp"

namespace ToolTest {
namespace {

using PamServices = HostTest;

std::string RootPassword(const Result& login) {
    std::smatch m;
    static const std::regex LINE("Demo login: user root, password (\\S+)\n");
    return std::regex_match(login.out, m, LINE) ? m[1].str() : std::string();
}

TEST_F(PamServices, LoginAndPasswordChange) {
    const std::string password = RootPassword(SimHost({"login", _root}));
    ASSERT_FALSE(password.empty());
    const std::vector<std::string> env = {"PAM_WRAPPER=1", "LD_PRELOAD=libpam_wrapper.so",
                                          "UID_WRAPPER_DISABLE_DEEPBIND=1",
                                          "PAM_WRAPPER_SERVICE_DIR=" + _root + "/etc/pam-wrapper",
                                          // In a sanitizer build the preloaded wrapper comes before the
                                          // sanitizer runtime, and the wrapper itself leaks a few bytes
                                          // in every process; neither is the probe's fault.
                                          "ASAN_OPTIONS=verify_asan_link_order=0:detect_leaks=0"};
    auto probe = [&](std::vector<std::string> args) {
        args.insert(args.begin(), VELK_PAM_PROBE_BIN);
        Result r = Run(args, env);
        EXPECT_EQ(r.status, 0) << r.err;
        return r.out.empty() ? -1 : std::stoi(r.out);
    };
    struct Case {
        std::vector<std::string> args;
        int rc;
    };
    const Case cases[] = {
        {{"login", "root", password}, PAM_SUCCESS},
        {{"login", "root", password + "x"}, PAM_AUTH_ERR},
        {{"login", "nobody", password}, PAM_AUTH_ERR},
        // guest's password is right, but guest may not use the console.
        {{"login", "guest", "guest-pass"}, PAM_PERM_DENIED},
        {{"passwd", "root", "wrong-old", "new-pass"}, PAM_AUTH_ERR},
        {{"login", "root", password}, PAM_SUCCESS},
        {{"passwd", "root", password, "new-pass"}, PAM_SUCCESS},
        {{"login", "root", "new-pass"}, PAM_SUCCESS},
        {{"login", "root", password}, PAM_AUTH_ERR},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.args[0] + " " + c.args[1] + " " + c.args[2]);
        EXPECT_EQ(probe(c.args), c.rc);
    }
    // The demo login shows the password as it is now.
    EXPECT_EQ(RootPassword(SimHost({"login", _root})), "new-pass");
}

}  // namespace
}  // namespace ToolTest
