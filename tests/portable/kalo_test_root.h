// TempRootTest: a fixture with a fresh ORVEX_ROOT for the portable platform's
// tests; InChild: runs a check in a forked process of its own (for changes
// of identity that cannot be undone). One test at a time (both change the
// process environment).
#ifndef ORVEX_TESTS_PORTABLE_KALO_TEST_ROOT_H_
#define ORVEX_TESTS_PORTABLE_KALO_TEST_ROOT_H_

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <string>

#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace testing {

// Runs body in a forked child and returns its exit status: body's result,
// 99 when it threw, -1 when the child did not exit normally.
template <typename Body>
int InChild(Body body) {
  const pid_t pid = ::fork();
  if (pid == 0) {
    int status = 99;
    try {
      status = body();
    } catch (...) {
    }
    ::_exit(status);
  }
  int status = 0;
  ::waitpid(pid, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

class TempRootTest : public ::testing::Test {
 protected:
  // Writes the share registry under the root.
  void WriteRegistry(const std::string& json) const {
    std::filesystem::create_directories(dir_.Join("etc/orvex"));
    dir_.Write("etc/orvex/shares.json", json);
  }

  TempDir dir_;
  ScopedOrvexRoot orvex_root_{dir_.path()};
  const std::string root_ = dir_.path();
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_PORTABLE_KALO_TEST_ROOT_H_
