// The choice of host, host path mapping and the syslog lines of a simulated
// host.
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <regex>

#include "TestSupport.hpp"

namespace {

using namespace HostCtlTest;
using HostCtl::Lib::HostPath;
using HostCtl::Lib::HostRoot;
using HostCtl::Lib::Syslog;

class HostTest : public SimHostTest {
protected:
    std::string LogPath() const { return Root() + "/var/log/syslog.log"; }
    std::string Log() const { return ReadFile(LogPath()); }
};

TEST_F(HostTest, HostPathMapsAbsolutePathsIntoTheRoot) {
    EXPECT_TRUE(HostCtl::Lib::IsSimulatedHost());
    EXPECT_EQ(HostRoot(), Root());
    EXPECT_EQ(HostPath("/bin/hrm-cmd"), Root() + "/bin/hrm-cmd");
    EXPECT_EQ(HostPath("/"), Root() + "/");
    EXPECT_EQ(HostPath("relative/file"), "relative/file");
    EXPECT_EQ(HostPath(""), "");

    // A relative root is made absolute.
    const std::filesystem::path cwd = std::filesystem::current_path();
    ASSERT_EQ(chdir(Root().c_str()), 0);
    HostCtl::Lib::UseSimulatedHost("var/../var");
    EXPECT_EQ(HostRoot(), Root() + "/var");
    EXPECT_EQ(HostPath("/log/syslog.log"), Root() + "/var/log/syslog.log");
    std::filesystem::current_path(cwd);
}

// The stream-free text helpers split as >> and std::getline do.
TEST(TextHelpers, WordsLinesAndWholeFiles) {
    using Split = std::vector<std::string>;
    const struct {
        std::string text;
        Split words, lines;
    } cases[] = {
        {"", {}, {}},
        {"one", {"one"}, {"one"}},
        {" \t192.0.2.1\thost  alias \r\n\n# c\n",
         {"192.0.2.1", "host", "alias", "#", "c"},
         {" \t192.0.2.1\thost  alias \r", "", "# c"}},
        {"\n\nlast", {"last"}, {"", "", "last"}},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(HostCtl::Lib::Words(c.text), c.words) << c.text;
        EXPECT_EQ(HostCtl::Lib::Lines(c.text), c.lines) << c.text;
    }
    std::string text = "stale";
    EXPECT_FALSE(HostCtl::Lib::ReadText("/nonexistent/file", text));
    EXPECT_EQ(text, "");
    EXPECT_FALSE(HostCtl::Lib::ReadText("/", text));  // a folder cannot be read
    EXPECT_TRUE(HostCtl::Lib::ReadText("/proc/self/cmdline", text));
    EXPECT_FALSE(text.empty());
}

TEST_F(HostTest, SyslogAppendsFacilityAndLevel) {
    HostCtl::Lib::OpenLog("VELK", LOG_PID, LOG_USER);
    Syslog(LOG_INFO, "Setting hostname to %s", "esx1");
    Syslog(LOG_AUTH | LOG_ERR, "Authentication for user %s failed", "root");
    Syslog(LOG_AUTHPRIV | LOG_NOTICE, "%d%%", 42);
    Syslog(LOG_LOCAL7 | LOG_DEBUG, "d");
    HostCtl::Lib::OpenLog("other", 0, LOG_LOCAL3);
    Syslog(LOG_INFO, "from local3");
    Syslog(LOG_USER | LOG_INFO, "explicit user");
    Syslog(LOG_INFO, "two\nlines\n");

    // Each line is a UTC time stamp, then the identity, process id and text.
    const std::string log =
        std::regex_replace(Log(), std::regex(R"((^|\n)\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{3}Z )"), "$1");
    std::string expected =
        "VELK[#]: user.info: Setting hostname to esx1\n"
        "VELK[#]: auth.err: Authentication for user root failed\n"
        "VELK[#]: authpriv.notice: 42%\n"
        "VELK[#]: local7.debug: d\n"
        "other[#]: local3.info: from local3\n"
        "other[#]: user.info: explicit user\n"
        "other[#]: local3.info: two#012lines\n";
    for (size_t at; (at = expected.find("[#]")) != std::string::npos;)
        expected.replace(at, 3, "[" + std::to_string(getpid()) + "]");
    EXPECT_EQ(log, expected);
}

TEST_F(HostTest, SyslogKeepsErrnoFormatsPercentMAndLongMessages) {
    HostCtl::Lib::OpenLog("VELK", 0, LOG_USER);
    errno = EACCES;
    Syslog(LOG_ERR, "open failed: %m");
    EXPECT_EQ(errno, EACCES);
    errno = ENOENT;
    Syslog(LOG_ERR, "%s with errno(%d): %s", "open", errno, strerror(errno));
    EXPECT_EQ(errno, ENOENT);
    // A long message is written whole.
    const std::string big(5000, 'x');
    Syslog(LOG_INFO, "<%s>", big.c_str());
    const std::string log = Log();
    EXPECT_NE(log.find("user.err: open failed: Permission denied\n"), std::string::npos) << log;
    EXPECT_NE(log.find("user.err: open with errno(2): No such file or directory\n"), std::string::npos)
        << log;
    EXPECT_NE(log.find("user.info: <" + big + ">\n"), std::string::npos);
}

TEST_F(HostTest, SyslogWithoutLogFolderDoesNotFail) {
    std::filesystem::remove_all(Root() + "/var/log");
    errno = EINTR;
    Syslog(LOG_INFO, "nowhere");
    EXPECT_EQ(errno, EINTR);
    EXPECT_FALSE(std::filesystem::exists(LogPath()));
}

TEST_F(HostTest, ConcurrentProcessesNeverInterleaveLines) {
    HostCtl::Lib::OpenLog("VELK", 0, LOG_USER);
    constexpr int kChildren = 4;
    constexpr int kLines = 1000;
    const std::string padding(300, 'p');
    std::vector<pid_t> children;
    for (int c = 0; c < kChildren; ++c) {
        children.push_back(Spawn([&] {
            for (int i = 0; i < kLines; ++i) Syslog(LOG_INFO, "child %d line %d %s", c, i, padding.c_str());
        }));
    }
    for (pid_t pid : children) ExpectExitedCleanly(pid);
    const std::regex line(R"(\S+ VELK\[\d+\]: user\.info: child (\d) line (\d+) p{300})");
    std::istringstream log(Log());
    std::string text;
    std::vector<int> next(kChildren, 0);
    int count = 0;
    while (std::getline(log, text)) {
        std::smatch m;
        ASSERT_TRUE(std::regex_match(text, m, line)) << text.substr(0, 120);
        int child = std::stoi(m[1]);
        EXPECT_EQ(std::stoi(m[2]), next[size_t(child)]++);  // each child's lines in its order
        ++count;
    }
    EXPECT_EQ(count, kChildren * kLines);
}

// The choice made from VELK_HOST_ROOT at start-up, seen in a fresh process:
// the probe prints what it found, with the given VELK_HOST_ROOT (null: unset).
std::string Probe(const char* hostRoot) {
    int out[2];
    if (pipe(out) != 0) return "pipe failed";
    pid_t pid = fork();
    if (pid == 0) {
        dup2(out[1], 1);
        dup2(out[1], 2);
        close(out[0]);
        close(out[1]);
        if (hostRoot)
            setenv("VELK_HOST_ROOT", hostRoot, 1);
        else
            unsetenv("VELK_HOST_ROOT");
        execl(HOSTCTL_PROBE_BIN, "hostctl_probe", static_cast<char*>(nullptr));
        _exit(127);
    }
    close(out[1]);
    std::string text;
    char buf[4096];
    ssize_t n;
    while ((n = read(out[0], buf, sizeof buf)) > 0) text.append(buf, size_t(n));
    close(out[0]);
    int status = 0;
    waitpid(pid, &status, 0);
    if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) text += "exit status " + std::to_string(status);
    return text;
}

TEST(HostChoice, EnvironmentNamesTheSimulatedHost) {
    TempDir dir;
    std::filesystem::create_directories(dir.Path() + "/var/log");
    HostCtl::Lib::SimState(dir.Path()).Replace(HostCtl::Lib::DefaultHostState("esx7.lab.test"));
    EXPECT_EQ(Probe((dir.Path() + "/").c_str()), "simulated=1\nroot=" + dir.Path() + "\npath=" + dir.Path() +
                                                     "/bin/ls\ntool=" + dir.Path() +
                                                     "/bin/hrm-cmd\nhostname=esx7\n");
    // Before any OpenLog the identity is the program's short name.
    const std::string log = ReadFile(dir.Path() + "/var/log/syslog.log");
    EXPECT_TRUE(std::regex_match(log, std::regex(R"(\S+ hostctl_probe\[\d+\]: user\.notice: probing\n)")))
        << log;
}

TEST(HostChoice, MissingRootStaysSimulatedAndFailsClearly) {
    EXPECT_EQ(Probe("/nonexistent/host-root"),
              "simulated=1\nroot=/nonexistent/host-root\npath=/nonexistent/host-root/bin/ls\n"
              "tool=/nonexistent/host-root/bin/hrm-cmd\n"
              "hostname=error: /nonexistent/host-root/host.json: cannot open: No such file or directory\n");
}

TEST(HostChoice, WithoutRootTheMachineIsTheHost) {
    char name[256] = {};
    gethostname(name, sizeof name - 1);
    const std::string out = Probe(nullptr);
    // The host tools are ours, beside the machine's own programs.
    EXPECT_EQ(out, "simulated=0\nroot=\npath=/bin/ls\ntool=/usr/libexec/velk/hrm-cmd\nhostname=" +
                       std::string(name).substr(0, std::string(name).find('.')) + "\n");
    EXPECT_EQ(Probe(""), out);  // an empty root is no root
}

}  // namespace
