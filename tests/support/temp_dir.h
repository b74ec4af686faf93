// TempDir: a fresh directory for one test, removed with everything in it
// when the test ends. Tests that open the system's fixed paths point
// ORVEX_ROOT at one (ScopedOrvexRoot).
#ifndef ORVEX_TESTS_SUPPORT_TEMP_DIR_H_
#define ORVEX_TESTS_SUPPORT_TEMP_DIR_H_

#include <stdlib.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <stdexcept>
#include <string>

namespace orvex {
namespace testing {

class TempDir {
 public:
  TempDir() {
    const char* base = std::getenv("TMPDIR");
    std::string pattern = std::string(base && *base ? base : "/tmp") + "/orvex-test-XXXXXX";
    if (::mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("mkdtemp failed");
    path_ = pattern;
  }
  TempDir(const TempDir&) = delete;
  TempDir& operator=(const TempDir&) = delete;
  ~TempDir() {
    std::string command = "rm -rf '" + path_ + "'";
    if (std::system(command.c_str()) != 0) std::perror("rm -rf");
  }

  const std::string& path() const { return path_; }
  std::string Join(const std::string& name) const { return path_ + "/" + name; }

  // Writes content to name (relative to the directory) and returns its path.
  std::string Write(const std::string& name, const std::string& content) const {
    std::string full = Join(name);
    std::ofstream(full, std::ios::binary) << content;
    return full;
  }

 private:
  std::string path_;
};

// Sets ORVEX_ROOT for a scope and restores the previous value.
class ScopedOrvexRoot {
 public:
  explicit ScopedOrvexRoot(const std::string& root) {
    const char* old = std::getenv("ORVEX_ROOT");
    had_old_ = old != nullptr;
    if (had_old_) old_ = old;
    ::setenv("ORVEX_ROOT", root.c_str(), 1);
  }
  ScopedOrvexRoot(const ScopedOrvexRoot&) = delete;
  ScopedOrvexRoot& operator=(const ScopedOrvexRoot&) = delete;
  ~ScopedOrvexRoot() {
    if (had_old_) {
      ::setenv("ORVEX_ROOT", old_.c_str(), 1);
    } else {
      ::unsetenv("ORVEX_ROOT");
    }
  }

 private:
  bool had_old_ = false;
  std::string old_;
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_SUPPORT_TEMP_DIR_H_
