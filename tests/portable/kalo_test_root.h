// A fresh ORVEX_ROOT per test for the portable platform's tests: a temporary
// directory set as ORVEX_ROOT for the test's lifetime and removed after it.
// One test at a time (it changes the process environment).
#ifndef ORVEX_TESTS_PORTABLE_KALO_TEST_ROOT_H_
#define ORVEX_TESTS_PORTABLE_KALO_TEST_ROOT_H_

#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>

namespace orvex {
namespace portable {

class TempRootTest : public ::testing::Test {
 protected:
  void SetUp() override {
    char templ[] = "/tmp/orvex_portable_test.XXXXXX";
    ASSERT_NE(::mkdtemp(templ), nullptr);
    root_ = templ;
    ::setenv("ORVEX_ROOT", root_.c_str(), 1);
  }

  void TearDown() override {
    ::unsetenv("ORVEX_ROOT");
    std::error_code ignored;
    std::filesystem::remove_all(root_, ignored);
  }

  // root_ + rel, with the directories above it created.
  std::string Path(const std::string& rel) const {
    std::string path = root_ + rel;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    return path;
  }

  void WriteText(const std::string& path, const std::string& text) const {
    std::ofstream out(path, std::ios::trunc);
    out << text;
    ASSERT_TRUE(out.good()) << path;
  }

  std::string ReadText(const std::string& path) const {
    std::ifstream in(path);
    return std::string(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
  }

  // Writes the share registry under the test's root.
  void WriteRegistry(const std::string& json) const {
    WriteText(Path("/etc/orvex/shares.json"), json);
  }

  // Runs body in a forked child and returns its exit status (the child
  // exits with body's result; it never returns into the test).
  template <typename Body>
  static int InChild(Body body) {
    pid_t pid = ::fork();
    if (pid == 0) {
      try {
        ::_exit(body());
      } catch (...) {
        ::_exit(99);
      }
    }
    int status = 0;
    ::waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  std::string root_;
};

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_TESTS_PORTABLE_KALO_TEST_ROOT_H_
