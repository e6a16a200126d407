// Observation events on a simulated host.
#include <syslog.h>
#include <unistd.h>

#include <cerrno>

#include "TestSupport.hpp"
#include "obzuser/obzuser.h"

namespace {

using namespace HostCtlTest;

class ObzUserTest : public SimHostTest {
protected:
    std::string ObzLog() const { return Root() + "/var/log/obzd.log"; }
};

TEST_F(ObzUserTest, EventGoesToSyslogAndTheObservationLog) {
    WriteFile(ObzLog(), "");
    HostCtl::Lib::OpenLog("VELK", 0, LOG_USER);
    ASSERT_EQ(ObzUserLib_Init(), 0);
    EXPECT_EQ(ObzUserLib_Init(), EALREADY);
    EXPECT_EQ(
        ObzUserLib_AddObz("@&!*@*@(obz.user.velk.login.failed)Authentication for user %s failed", "bob"), 0);
    ObzUserLib_Close();
    EXPECT_EQ(ObzUserLib_AddObz("after close"), EBADF);

    const std::string event = "@&!*@*@(obz.user.velk.login.failed)Authentication for user bob failed\n";
    EXPECT_NE(ReadFile(Root() + "/var/log/syslog.log").find("]: user.info: " + event), std::string::npos);
    EXPECT_NE(ReadFile(ObzLog()).find(" obzd: " + event), std::string::npos);
    EXPECT_EQ(ReadFile(Root() + "/var/log/syslog.log").find("after close"), std::string::npos);
}

TEST_F(ObzUserTest, MissingObservationServiceFailsInit) {
    unlink(ObzLog().c_str());
    EXPECT_EQ(ObzUserLib_Init(), ENOENT);
    EXPECT_EQ(ObzUserLib_AddObz("dropped"), EBADF);
    ObzUserLib_Close();
    WriteFile(ObzLog(), "");
    EXPECT_EQ(ObzUserLib_Init(), 0);
    ObzUserLib_Close();
}

}  // namespace
