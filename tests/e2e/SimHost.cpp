#include "SimHost.hpp"

#include <fcntl.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>

extern char** environ;

namespace E2e {

namespace {

namespace fs = std::filesystem;

bool Keep() {
    const char* keep = getenv("VELK_E2E_KEEP");
    return keep && *keep && std::strcmp(keep, "0") != 0;
}

}  // namespace

ProgramOutput RunProgram(const std::vector<std::string>& args) {
    // Output into memory files, read once the program has ended.
    const int out = memfd_create("out", MFD_CLOEXEC), err = memfd_create("err", MFD_CLOEXEC);
    if (out < 0 || err < 0) throw std::runtime_error(std::string("memfd_create: ") + strerror(errno));
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&actions, out, 1);
    posix_spawn_file_actions_adddup2(&actions, err, 2);
    std::vector<char*> argv;
    for (const auto& a : args) argv.push_back(const_cast<char*>(a.c_str()));
    argv.push_back(nullptr);
    pid_t pid = -1;
    const int rc = posix_spawn(&pid, argv[0], &actions, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    ProgramOutput result;
    while (rc == 0 && waitpid(pid, &result.status, 0) < 0 && errno == EINTR) {
    }
    for (auto [fd, sink] : {std::pair{out, &result.out}, {err, &result.err}}) {
        char buf[4096];
        lseek(fd, 0, SEEK_SET);
        for (ssize_t n; (n = read(fd, buf, sizeof buf)) > 0;) sink->append(buf, size_t(n));
        close(fd);
    }
    if (rc != 0) throw std::runtime_error("cannot run " + args[0] + ": " + strerror(rc));
    return result;
}

SimHost::SimHost(const std::string& hostname, const std::string& network) {
    const char* tmp = getenv("TMPDIR");
    std::string pattern = std::string(tmp && *tmp ? tmp : "/tmp") + "/velk-e2e-XXXXXX";
    if (!mkdtemp(pattern.data())) throw std::runtime_error("mkdtemp " + pattern + ": " + strerror(errno));
    _dir = pattern;
    _root = _dir + "/host";
    try {
        std::vector<std::string> args{"create", _root, "--hostname", hostname};
        if (!network.empty()) args.insert(args.end(), {"--network", network});
        Tool(args);
    } catch (...) {
        if (!Keep()) fs::remove_all(_dir);
        throw;
    }
}

SimHost::~SimHost() {
    if (Keep()) {
        fprintf(stderr, "keeping the host root %s\n", _root.c_str());
        return;
    }
    std::error_code ec;
    fs::remove_all(_dir, ec);
}

void SimHost::InsertCard(const std::string& user, const std::string& pin, int slot) {
    Tool({"card", _root, "insert", user, pin, "--slot", std::to_string(slot)});
}

void SimHost::Fail(const std::string& operation, const std::string& message) {
    std::vector<std::string> args{"fail", _root, operation};
    if (!message.empty()) args.push_back(message);
    Tool(args);
}

void SimHost::Clear(const std::string& operation) { Tool({"fail", _root, operation, "--clear"}); }

void SimHost::Slow(const std::string& tool, double seconds) {
    Tool({"slow", _root, tool, std::to_string(seconds)});
}

void SimHost::Boot() { Tool({"boot", _root}); }

void SimHost::PullCard(int slot) { Tool({"card", _root, "pull", "--slot", std::to_string(slot)}); }

std::string SimHost::Tool(const std::vector<std::string>& args) const {
    std::vector<std::string> argv{VELK_SIMHOST_BIN};
    argv.insert(argv.end(), args.begin(), args.end());
    ProgramOutput out = RunProgram(argv);
    if (!WIFEXITED(out.status) || WEXITSTATUS(out.status) != 0) {
        std::string command;
        for (const auto& a : argv) command += (command.empty() ? "" : " ") + a;
        throw std::runtime_error(command + " failed (status " + std::to_string(out.status) + "): " + out.err);
    }
    return out.out;
}

nlohmann::json SimHost::Get(const std::string& pointer) const {
    return nlohmann::json::parse(Tool({"get", _root, pointer}));
}

void SimHost::Set(const std::string& pointer, const nlohmann::json& value) {
    Tool({"set", _root, pointer, value.dump()});
}

void SimHost::Remove(const std::string& pointer) { Tool({"remove", _root, pointer}); }

bool SimHost::Exists(std::string_view hostPath) const { return fs::exists(Path(hostPath)); }

std::string SimHost::ReadFile(std::string_view hostPath) const {
    std::ifstream in(Path(hostPath), std::ios::binary);
    if (!in) throw std::runtime_error("cannot read " + Path(hostPath));
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

void SimHost::WriteFile(std::string_view hostPath, const std::string& content) const {
    std::ofstream out(Path(hostPath), std::ios::binary | std::ios::trunc);
    out << content;
    if (!out) throw std::runtime_error("cannot write " + Path(hostPath));
}

void SimHost::RemoveFile(std::string_view hostPath) const { fs::remove(Path(hostPath)); }

std::vector<std::string> SimHost::SyslogLines() const {
    std::vector<std::string> lines;
    std::ifstream in(Path("/var/log/syslog.log"));
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
}

std::vector<std::string> SimHost::ConsoleLog(std::string_view text, pid_t pid) const {
    const std::string tag = "[" + std::to_string(pid) + "]: ";
    std::vector<std::string> found;
    for (const auto& line : SyslogLines()) {
        if (pid != 0 && line.find(tag) == std::string::npos) continue;
        if (line.find(text) != std::string::npos) found.push_back(line);
    }
    return found;
}

TerminalOptions SimHost::Console(const std::string& term, int cols, int rows,
                                 std::vector<std::string> args) const {
    TerminalOptions options;
    options.program = VELK_BIN;
    options.args = std::move(args);
    options.term = term;
    options.cols = cols;
    options.rows = rows;
    options.env = {"VELK_HOST_ROOT=" + _root, "LANG=C.UTF-8", "ESCDELAY=25",
                   "PATH=/usr/sbin:/usr/bin:/sbin:/bin"};
    // Sanitizer settings of the test run reach the console too.
    for (const char* name : {"ASAN_OPTIONS", "UBSAN_OPTIONS", "LSAN_OPTIONS"}) {
        if (const char* value = getenv(name)) options.env.push_back(std::string(name) + "=" + value);
    }
    return options;
}

}  // namespace E2e
