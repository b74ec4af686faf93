// The check-and-throw convention. A guarded call is written as a condition
// that holds when the call failed; the condition's source text goes to the log
// with the reason, then Error(code, reason) is thrown:
//
//   ORVEX_CHECK(0 > (fd_ = open(path_.c_str(), O_RDWR | O_CREAT, 0644)),
//               kErrorLockFile, "open failed, reason=" + std::string(strerror(errno)));
//
// logs "lock_file:<line> (<pid>, <euid>) Failed [0 > (fd_ = ...)], reason: ..."
// (with " [err: <text>]" while errno is set, which is then reset to 0).
// Each .cc file that uses it defines `constexpr char kLogSource[]`, the
// source name that the log lines carry ("lock_file", "optree", ...).
#ifndef ORVEX_SRC_FOUNDATION_CHECK_H_
#define ORVEX_SRC_FOUNDATION_CHECK_H_

#include <string>

#include "orvex/foundation/error.h"

namespace orvex {
namespace internal {

// Logs the failed check and throws Error(code, reason). errno is 0 when the
// exception reaches the caller.
[[noreturn]] void FailCheck(const char* source, int line, const char* condition, ErrorCode code,
                            const std::string& reason);

// Logs a failed check without throwing (for optional steps that only log).
void LogFailedCheck(const char* source, int line, const char* condition, const std::string& reason);

}  // namespace internal
}  // namespace orvex

// The reason expression is evaluated only when the check fails, before
// anything is logged, so it may read errno.
#define ORVEX_CHECK_AS(cond, text, code, reason)                                      \
  do {                                                                                \
    if (cond) ::orvex::internal::FailCheck(kLogSource, __LINE__, text, code, reason); \
  } while (0)

#define ORVEX_CHECK(cond, code, reason) ORVEX_CHECK_AS(cond, #cond, code, reason)

#endif  // ORVEX_SRC_FOUNDATION_CHECK_H_
