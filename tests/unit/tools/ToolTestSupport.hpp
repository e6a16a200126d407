// Running the simulated host's programs from tests, in a scratch folder that
// holds one freshly created host.
#pragma once

#include <gtest/gtest.h>
#include <sys/types.h>

#include <map>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

namespace ToolTest {

struct Result {
    int status = -1;  // exit status, -1 when the program was killed or could not run
    std::string out;
    std::string err;
};

// The environment the console gives the host's tools.
inline const std::vector<std::string> CONSOLE_ENV = {"PYTHONHOME=/"};

std::string ReadFile(const std::string& path);
void WriteFile(const std::string& path, const std::string& text);
size_t Lines(const std::string& text);
// Exit status 1, a message on standard error that contains `mentions`, and
// nothing on standard output.
::testing::AssertionResult Fails(const Result& r, const std::string& mentions = "");

class HostTest : public ::testing::Test {
protected:
    void SetUp() override;
    void TearDown() override;

    // Starts argv[0] (an absolute path) with `env`; its output goes to files.
    pid_t Start(const std::vector<std::string>& argv, const std::vector<std::string>& env);
    Result Finish(pid_t pid);
    Result Run(const std::vector<std::string>& argv, const std::vector<std::string>& env);

    // velk-simhost with the test's own environment.
    Result SimHost(const std::vector<std::string>& args);
    // A tool of the host, by its host path, exactly as the console runs it.
    Result Tool(const std::string& hostPath, const std::vector<std::string>& args);
    Result Hrm(const std::string& user, const std::string& command);

    nlohmann::json State() const;
    void Edit(const std::string& pointer, const nlohmann::json& value);

    std::string _dir;   // scratch folder, removed afterwards
    std::string _root;  // the host, in a path with a space and a quote

private:
    std::map<pid_t, std::string> _pending;  // where each started program's output goes
    int _outputs = 0;
};

}  // namespace ToolTest
