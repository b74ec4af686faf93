// Helpers for failure-path tests: the exact log line of a failed check or of
// any logged text, and a
// lowered resource limit that makes system calls fail even for root. One
// thread at a time (ScopedRlimit changes the whole process).
#ifndef ORVEX_TESTS_FOUNDATION_FAULT_HELPERS_H_
#define ORVEX_TESTS_FOUNDATION_FAULT_HELPERS_H_

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <unistd.h>

#include <csignal>
#include <string>

namespace orvex {
namespace testing {

// line with the number after its leading "<source>:" replaced by "N".
inline std::string WithoutLineNumber(const std::string& line) {
  const size_t colon = line.find(':');
  if (colon == std::string::npos) return line;
  const size_t end = line.find_first_not_of("0123456789", colon + 1);
  if (end == colon + 1 || end == std::string::npos || line[end] != ' ') return line;
  return line.substr(0, colon + 1) + "N" + line.substr(end);
}

// The line a failed check in source writes, as WithoutLineNumber shows it.
inline std::string CheckLine(const std::string& source, const std::string& condition,
                             const std::string& reason) {
  return source + ":N (" + std::to_string(::getpid()) + ", " + std::to_string(::geteuid()) +
         ") Failed [" + condition + "], reason: " + reason;
}

// Whether line is what source logs for text: "<source>:<n> (<pid>, <euid>)
// <text>", followed at most by the errno suffix " [err: ...]".
inline ::testing::AssertionResult IsLogLine(const std::string& line, const std::string& source,
                                            const std::string& text) {
  const std::string want = source + ":N (" + std::to_string(::getpid()) + ", " +
                           std::to_string(::geteuid()) + ") " + text;
  const std::string seen = WithoutLineNumber(line);
  if (seen.rfind(want, 0) != 0) return ::testing::AssertionFailure() << line;
  const std::string tail = seen.substr(want.size());
  if (!tail.empty() && tail.rfind(" [err: ", 0) != 0) {
    return ::testing::AssertionFailure() << "more than an errno after the text: " << line;
  }
  return ::testing::AssertionSuccess();
}

// Lowers one resource limit for a scope. Writes past an RLIMIT_FSIZE limit
// fail with EFBIG instead of raising SIGXFSZ: a full disk in miniature.
class ScopedRlimit {
 public:
  ScopedRlimit(decltype(RLIMIT_FSIZE) resource, rlim_t value) : resource_(resource) {
    handler_ = std::signal(SIGXFSZ, SIG_IGN);
    ::getrlimit(resource_, &saved_);
    struct rlimit lowered = saved_;
    lowered.rlim_cur = value;
    ok_ = ::setrlimit(resource_, &lowered) == 0;
  }
  ~ScopedRlimit() {
    ::setrlimit(resource_, &saved_);
    std::signal(SIGXFSZ, handler_);
  }
  bool ok() const { return ok_; }

 private:
  decltype(RLIMIT_FSIZE) resource_;
  struct rlimit saved_;
  void (*handler_)(int);
  bool ok_ = false;
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_FOUNDATION_FAULT_HELPERS_H_
