// ProgramTest: a fixture that runs the built programs as real processes in
// a temporary ORVEX_ROOT (also this process's, for the library's own calls),
// in UTC. One test at a time.
#ifndef ORVEX_TESTS_SUPPORT_PROGRAM_TEST_H_
#define ORVEX_TESTS_SUPPORT_PROGRAM_TEST_H_

#include <gtest/gtest.h>
#include <json/json.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <vector>

#include "orvex/foundation/json.h"
#include "support/daemon_process.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace testing {

inline Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

class ProgramTest : public ::testing::Test {
 protected:
  explicit ProgramTest(const std::string& name) : program_(BuiltProgram(name)) {}
  void SetUp() override { ASSERT_EQ(0, ::access(program_.c_str(), X_OK)) << program_; }

  // Runs the program (or another one, by its path) in the root; env adds
  // "NAME=value" entries; input_path, when given, is its standard input.
  ProgramOutcome Run(const std::vector<std::string>& args,
                     const std::string& input_path = std::string()) {
    return RunIn(program_, args, {}, input_path);
  }
  ProgramOutcome RunIn(const std::string& program, const std::vector<std::string>& args,
                       std::vector<std::string> env = {},
                       const std::string& input_path = std::string()) {
    env.push_back("ORVEX_ROOT=" + root_.path());
    env.push_back("TZ=UTC");
    return RunProgram(program, args, env, io_.path(), input_path);
  }
  // Runs args expecting exit status 0 and returns stdout as JSON.
  Json::Value RunJson(const std::vector<std::string>& args) {
    const ProgramOutcome outcome = Run(args);
    EXPECT_EQ(0, outcome.status) << outcome.err;
    return Parse(outcome.out);
  }
  // Starts the daemon name, which returns once its socket is ready, and
  // takes it on by its pid file.
  void StartDetached(DaemonProcess& daemon, const std::string& name,
                     const std::vector<std::string>& args = {},
                     const std::vector<std::string>& env = {}) {
    const ProgramOutcome started = RunIn(BuiltProgram(name), args, env);
    ASSERT_EQ(0, started.status) << name << ": " << started.err;
    ASSERT_TRUE(daemon.Adopt(PidFile(name))) << name;
  }
  std::string PidFile(const std::string& name) const {
    return root_.Join("var/run/" + name + ".pid");
  }
  // Writes text to rel under the root, creating its directories.
  std::string Write(const std::string& rel, const std::string& text) {
    std::filesystem::create_directories(std::filesystem::path(root_.Join(rel)).parent_path());
    return root_.Write(rel, text);
  }

  const std::string program_;
  TempDir root_;
  TempDir io_;
  ScopedOrvexRoot scoped_root_{root_.path()};
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_SUPPORT_PROGRAM_TEST_H_
