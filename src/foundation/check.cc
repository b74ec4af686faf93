#include "foundation/check.h"

#include <unistd.h>

#include "orvex/foundation/log.h"

namespace orvex {
namespace internal {

void LogFailedCheck(const char* source, int line, const char* condition,
                    const std::string& reason) {
  LogErrno("%s:%d (%d, %u) Failed [%s], reason: %s", source, line, static_cast<int>(::getpid()),
           static_cast<unsigned>(::geteuid()), condition, reason.c_str());
}

void FailCheck(const char* source, int line, const char* condition, ErrorCode code,
               const std::string& reason) {
  LogFailedCheck(source, line, condition, reason);
  throw Error(code, reason);
}

}  // namespace internal
}  // namespace orvex
