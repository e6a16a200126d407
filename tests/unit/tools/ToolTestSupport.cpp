#include "ToolTestSupport.hpp"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "hostctl/SimState.hpp"

extern char** environ;

namespace ToolTest {

std::string ReadFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

void WriteFile(const std::string& path, const std::string& text) {
    std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
}

size_t Lines(const std::string& text) { return size_t(std::count(text.begin(), text.end(), '\n')); }

::testing::AssertionResult Fails(const Result& r, const std::string& mentions) {
    if (r.status == 1 && !r.err.empty() && r.err.find(mentions) != std::string::npos && r.out.empty())
        return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "status " << r.status << ", wanted 1 and \"" << mentions
                                         << "\"\nerr: " << r.err << "\nout: " << r.out;
}

void HostTest::SetUp() {
    std::filesystem::create_directories(VELK_TEST_TMPDIR);
    std::string tmpl = std::string(VELK_TEST_TMPDIR) + "/host-XXXXXX";
    ASSERT_NE(mkdtemp(tmpl.data()), nullptr);
    _dir = tmpl;
    _root = _dir + "/it's a host";
    Result r = SimHost({"create", _root, "--hostname", "host1.example.test"});
    ASSERT_EQ(r.status, 0) << r.err;
}

void HostTest::TearDown() {
    for (const auto& [pid, output] : _pending) waitpid(pid, nullptr, 0);
    std::error_code ec;
    std::filesystem::remove_all(_dir, ec);
}

pid_t HostTest::Start(const std::vector<std::string>& argv, const std::vector<std::string>& env) {
    const std::string output = _dir + "/output." + std::to_string(_outputs++);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    for (int fd : {1, 2})
        posix_spawn_file_actions_addopen(&actions, fd, (output + ".fd" + std::to_string(fd)).c_str(),
                                         O_WRONLY | O_CREAT | O_TRUNC, 0644);
    std::vector<char*> args;
    for (const std::string& a : argv) args.push_back(const_cast<char*>(a.c_str()));
    args.push_back(nullptr);
    std::vector<char*> envp;
    for (const std::string& e : env) envp.push_back(const_cast<char*>(e.c_str()));
    envp.push_back(nullptr);
    pid_t pid = -1;
    int rc = posix_spawn(&pid, args[0], &actions, nullptr, args.data(), env.empty() ? environ : envp.data());
    posix_spawn_file_actions_destroy(&actions);
    EXPECT_EQ(rc, 0) << "cannot run " << argv[0];
    if (rc != 0) return -1;
    _pending[pid] = output;
    return pid;
}

Result HostTest::Finish(pid_t pid) {
    auto it = _pending.find(pid);
    if (it == _pending.end()) return {};
    const std::string output = it->second;
    _pending.erase(it);
    int status = 0;
    if (waitpid(pid, &status, 0) != pid) return {};
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, ReadFile(output + ".fd1"),
            ReadFile(output + ".fd2")};
}

Result HostTest::Run(const std::vector<std::string>& argv, const std::vector<std::string>& env) {
    pid_t pid = Start(argv, env);
    return pid < 0 ? Result{} : Finish(pid);
}

Result HostTest::SimHost(const std::vector<std::string>& args) {
    std::vector<std::string> argv = {VELK_SIMHOST_BIN};
    argv.insert(argv.end(), args.begin(), args.end());
    return Run(argv, {});
}

Result HostTest::Tool(const std::string& hostPath, const std::vector<std::string>& args) {
    std::vector<std::string> argv = {_root + hostPath};
    argv.insert(argv.end(), args.begin(), args.end());
    return Run(argv, CONSOLE_ENV);
}

Result HostTest::Hrm(const std::string& user, const std::string& command) {
    return Tool("/bin/hrm-cmd", {"-U", user, command});
}

nlohmann::json HostTest::State() const { return nlohmann::json::parse(ReadFile(_root + "/host.json")); }

void HostTest::Edit(const std::string& pointer, const nlohmann::json& value) {
    HostCtl::Lib::SimState(_root).Update(
        [&](nlohmann::json& state) { state[nlohmann::json::json_pointer(pointer)] = value; });
}

}  // namespace ToolTest
