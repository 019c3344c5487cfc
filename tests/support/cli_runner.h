// Drives the lumo tool's command table in-process for end-to-end tests: a
// runner that captures the tool's output streams, and a fixture that gives
// each test its own scratch directory.
#pragma once

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "cli.h"

namespace lumo {
namespace support {

// Exit code and captured output of one tool run.
struct RunResult {
    int nCode;
    std::string osOut;
    std::string osErr;
};

// Runs `lumo <args...>` through the command table, with stdout and stderr
// captured instead of written to the process streams.
inline RunResult RunTool(std::vector<std::string> args) {
    args.insert(args.begin(), "lumo");
    std::vector<char*> argv;
    argv.reserve(args.size());
    for (auto& a : args) argv.push_back(a.data());
    std::ostringstream out, err;
    const int code = lumo::cli::RunLumo(static_cast<int>(argv.size()), argv.data(), out, err);
    return {code, out.str(), err.str()};
}

// Runs `lumo <args...>` and expects success; the run's messages tell why not.
inline RunResult RunOk(std::vector<std::string> args) {
    const std::string command = args.empty() ? std::string() : args[0];
    RunResult r = RunTool(std::move(args));
    EXPECT_EQ(r.nCode, 0) << command << ": " << r.osErr;
    return r;
}

// The whole content of a text file ("" when it cannot be read).
inline std::string ReadText(const std::string& path) {
    std::ifstream in(path);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

// A scratch directory per test, named after the prefix, the test and the
// process (tests of one binary may run in parallel processes), removed with
// everything in it after the test.
class ScratchDirTest : public ::testing::Test {
  protected:
    explicit ScratchDirTest(std::string osPrefix) : mosPrefix(std::move(osPrefix)) {}
    ScratchDirTest() : ScratchDirTest("lumo_") {}

    void SetUp() override {
        const auto* info = ::testing::UnitTest::GetInstance()->current_test_info();
        mDir = std::filesystem::temp_directory_path() /
               (mosPrefix + std::string(info->name()) + "_" + std::to_string(::getpid()));
        std::filesystem::create_directories(mDir);
    }
    void TearDown() override { std::filesystem::remove_all(mDir); }

    std::string Path(const std::string& name) const { return (mDir / name).string(); }
    // Writes `text` verbatim to a file of the scratch directory; returns its path.
    std::string Write(const std::string& name, const std::string& text) const {
        std::ofstream(Path(name), std::ios::binary) << text;
        return Path(name);
    }

    std::filesystem::path mDir;

  private:
    std::string mosPrefix;
};

}  // namespace support
}  // namespace lumo
