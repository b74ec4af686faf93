#include "orvex/foundation/log.h"

#include <syslog.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <utility>
#include <vector>

namespace orvex {
namespace fileindex {

int log_level = LOG_DEBUG;

}  // namespace fileindex

namespace {

LogSink& Sink() {
  static LogSink sink;
  return sink;
}

void Emit(const std::string& line) {
  const LogSink& sink = Sink();
  if (sink) {
    sink(LOG_ERR, line);
    return;
  }
  ::syslog(LOG_ERR, "%s", line.c_str());
}

std::string Format(const char* format, va_list args) {
  va_list copy;
  va_copy(copy, args);
  char small[512];
  int n = std::vsnprintf(small, sizeof(small), format, copy);
  va_end(copy);
  if (n < 0) return std::string();
  if (static_cast<size_t>(n) < sizeof(small)) return std::string(small, static_cast<size_t>(n));
  std::vector<char> big(static_cast<size_t>(n) + 1);
  std::vsnprintf(big.data(), big.size(), format, args);
  return std::string(big.data(), static_cast<size_t>(n));
}

}  // namespace

LogSink SetLogSink(LogSink sink) {
  LogSink previous = std::move(Sink());
  Sink() = std::move(sink);
  return previous;
}

void LogPlain(const char* format, ...) {
  int saved = errno;
  va_list args;
  va_start(args, format);
  std::string line = Format(format, args);
  va_end(args);
  Emit(line);
  errno = saved;
}

void LogErrno(const char* format, ...) {
  // Capture errno before formatting can disturb it.
  int saved = errno;
  va_list args;
  va_start(args, format);
  std::string line = Format(format, args);
  va_end(args);
  if (saved != 0) {
    char buf[256];
    line += " [err: ";
    line += ::strerror_r(saved, buf, sizeof(buf));
    line += "]";
  }
  Emit(line);
  errno = 0;
}

}  // namespace orvex
