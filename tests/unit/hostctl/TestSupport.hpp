// Scratch host roots and file helpers for the host control tests.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <sstream>
#include <string>

#include "hostctl/Host.hpp"
#include "hostctl/SimState.hpp"

namespace HostCtlTest {

inline std::string ReadFile(const std::string& path) {
    std::ifstream in(path);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

inline void WriteFile(const std::string& path, const std::string& text) { std::ofstream(path) << text; }

// A folder in /tmp, removed with everything in it at the end of the test.
class TempDir {
public:
    TempDir() {
        char tmpl[] = "/tmp/hostctl-test-XXXXXX";
        if (mkdtemp(tmpl) == nullptr) throw std::runtime_error("mkdtemp failed");
        _path = tmpl;
    }
    ~TempDir() {
        std::error_code ec;
        std::filesystem::remove_all(_path, ec);
    }
    TempDir(const TempDir&) = delete;
    TempDir& operator=(const TempDir&) = delete;
    const std::string& Path() const { return _path; }

private:
    std::string _path;
};

// A simulated host with the default state and a log folder, made the
// process's host.
class SimHostTest : public ::testing::Test {
protected:
    void SetUp() override {
        std::filesystem::create_directories(_dir.Path() + "/var/log");
        HostCtl::Lib::SimState(Root()).Replace(HostCtl::Lib::DefaultHostState());
        HostCtl::Lib::UseSimulatedHost(Root());
    }
    const std::string& Root() const { return _dir.Path(); }
    std::string StatePath() const { return Root() + "/host.json"; }
    // Changes the state as another process would, through its own SimState.
    void Edit(const std::function<void(nlohmann::json&)>& change) {
        HostCtl::Lib::SimState(Root()).Update(change);
    }

private:
    TempDir _dir;
};

}  // namespace HostCtlTest
