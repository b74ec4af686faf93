// The library's log: one line per failure or trace, written to the system log
// at LOG_ERR by default. The sink is replaceable so that a host process (or a
// test) can collect the lines itself. SetLogSink is not thread-safe: set it
// before starting threads; writing lines is safe for concurrent use.
#ifndef ORVEX_FOUNDATION_LOG_H_
#define ORVEX_FOUNDATION_LOG_H_

#include <functional>
#include <string>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {

// A syslog priority; per-item trace lines are written only while it equals 7
// (LOG_DEBUG), its initial value. Error lines are never gated.
ORVEX_EXPORT extern int log_level;

}  // namespace fileindex

// Receives each finished line (no trailing newline) with its priority.
using LogSink = std::function<void(int priority, const std::string& line)>;

// Installs sink and returns the previous one; an empty sink restores the
// system log.
ORVEX_EXPORT LogSink SetLogSink(LogSink sink);

// Writes one printf-formatted line at LOG_ERR as it stands.
ORVEX_EXPORT void LogPlain(const char* format, ...) __attribute__((format(printf, 1, 2)));

// Writes one printf-formatted line at LOG_ERR; when errno is non-zero,
// " [err: <system error text>]" is appended and errno is reset to 0.
ORVEX_EXPORT void LogErrno(const char* format, ...) __attribute__((format(printf, 1, 2)));

}  // namespace orvex

#endif  // ORVEX_FOUNDATION_LOG_H_
