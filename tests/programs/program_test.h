// ProgramTest: a fixture that runs one of the built programs as a real
// process with its own ORVEX_ROOT, in UTC. One test at a time.
#ifndef ORVEX_TESTS_PROGRAMS_PROGRAM_TEST_H_
#define ORVEX_TESTS_PROGRAMS_PROGRAM_TEST_H_

#include <gtest/gtest.h>
#include <json/json.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <vector>

#include "orvex/foundation/json.h"
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
  explicit ProgramTest(const std::string& name)
      : program_(std::string(ORVEX_BUILD_DIR) + "/" + name) {}
  void SetUp() override { ASSERT_EQ(0, ::access(program_.c_str(), X_OK)) << program_; }

  // input_path, when given, is the program's standard input.
  ProgramOutcome Run(const std::vector<std::string>& args,
                     const std::string& input_path = std::string()) {
    return RunProgram(program_, args, {"ORVEX_ROOT=" + root_.path(), "TZ=UTC"}, io_.path(),
                      input_path);
  }
  // Runs args expecting exit status 0 and returns stdout as JSON.
  Json::Value RunJson(const std::vector<std::string>& args) {
    const ProgramOutcome outcome = Run(args);
    EXPECT_EQ(0, outcome.status) << outcome.err;
    return Parse(outcome.out);
  }
  // Writes text to rel under the root, creating its directories.
  std::string Write(const std::string& rel, const std::string& text) {
    std::filesystem::create_directories(std::filesystem::path(root_.Join(rel)).parent_path());
    return root_.Write(rel, text);
  }

  const std::string program_;
  TempDir root_;
  TempDir io_;
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_PROGRAMS_PROGRAM_TEST_H_
