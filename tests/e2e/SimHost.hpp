// A simulated host for one test: a host root in a fresh temporary folder,
// created and edited through velk-simhost, removed again at the end (kept
// when VELK_E2E_KEEP is set, for a look after a failure).
#pragma once

#include <nlohmann/json.hpp>
#include <string>
#include <string_view>
#include <vector>

#include "Terminal.hpp"

namespace E2e {

// What a program run to its end wrote, and its wait status.
struct ProgramOutput {
    int status = -1;
    std::string out, err;
};
// Runs `args` (argv[0] a path) with standard input from /dev/null and the
// test's environment until it ends.
ProgramOutput RunProgram(const std::vector<std::string>& args);

class SimHost {
public:
    // `network`: shapes for velk-simhost create --network ("dvs,ipv6-off"),
    // "" for the default host.
    explicit SimHost(const std::string& hostname = "host1", const std::string& network = "");
    ~SimHost();
    SimHost(const SimHost&) = delete;
    SimHost& operator=(const SimHost&) = delete;

    const std::string& Root() const { return _root; }
    // The file system path of a host path ("/var/run/velk.pid").
    std::string Path(std::string_view hostPath) const { return _root + std::string(hostPath); }

    // State access by JSON pointer ("/network/vnics/0/ipv4/address"). Failures
    // throw std::runtime_error with the tool's message.
    nlohmann::json Get(const std::string& pointer) const;
    void Set(const std::string& pointer, const nlohmann::json& value);
    void Remove(const std::string& pointer);

    // Makes the host control operation (or host tool) fail with `message`
    // (the tool's default text when empty) until Clear is called for it.
    void Fail(const std::string& operation, const std::string& message = "");
    void Clear(const std::string& operation);
    // Makes the calls of a host control operation ("SetDefaultGateway") or a
    // host tool ("qelbacktrace", or "services.sh stop" for the calls with
    // that argument) wait `seconds` before they act; 0 clears it.
    void Slow(const std::string& tool, double seconds);
    // Completes a reboot: the host comes up with its saved configuration.
    void Boot();

    // Smart cards: a card for `user` with `pin` as the console secret goes
    // into reader slot `slot`; Pull takes it out again.
    void InsertCard(const std::string& user, const std::string& pin, int slot = 0);
    void PullCard(int slot = 0);

    // Files of the host.
    bool Exists(std::string_view hostPath) const;
    std::string ReadFile(std::string_view hostPath) const;
    void WriteFile(std::string_view hostPath, const std::string& content) const;
    void RemoveFile(std::string_view hostPath) const;

    // Lines of "/var/log/syslog.log".
    std::vector<std::string> SyslogLines() const;
    // Lines written by the console: "<time> <ident>[<pid>]: ..." with `pid`
    // (any pid when 0) whose text contains `text`.
    std::vector<std::string> ConsoleLog(std::string_view text, pid_t pid = 0) const;

    // How to run the console on this host in a terminal.
    TerminalOptions Console(const std::string& term = "linux", int cols = 80, int rows = 25,
                            std::vector<std::string> args = {}) const;

private:
    std::string Tool(const std::vector<std::string>& args) const;

    std::string _dir;   // the temporary folder
    std::string _root;  // the host root inside it
};

}  // namespace E2e
