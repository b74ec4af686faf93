#include "kalo_log.h"

#include <syslog.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstring>

namespace orvex {
namespace portable {

void KaloLog(int priority, const char* file, int line, const char* format, ...) {
  const char* slash = std::strrchr(file, '/');
  char message[1024];
  va_list args;
  va_start(args, format);
  std::vsnprintf(message, sizeof(message), format, args);
  va_end(args);
  syslog(priority, "%s:%d (%d, %u) %s", slash == nullptr ? file : slash + 1, line,
         static_cast<int>(::getpid()), static_cast<unsigned>(::geteuid()), message);
}

}  // namespace portable
}  // namespace orvex
