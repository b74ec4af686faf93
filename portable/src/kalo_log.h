// The portable platform's system-log lines. The platform sits below the
// library and has no log sink of its own: it writes to syslog directly, with
// the same "%s:%d (%d, %u) " prefix (file, line, pid, effective uid) as the
// library's lines. Safe for concurrent use.
#ifndef ORVEX_PORTABLE_SRC_KALO_LOG_H_
#define ORVEX_PORTABLE_SRC_KALO_LOG_H_

namespace orvex {
namespace portable {

// Writes one line at priority (LOG_ERR, LOG_WARNING, ...); file is reduced
// to its base name.
void KaloLog(int priority, const char* file, int line, const char* format, ...)
    __attribute__((format(printf, 4, 5)));

}  // namespace portable
}  // namespace orvex

#define KALO_LOG(priority, ...) \
  ::orvex::portable::KaloLog((priority), __FILE__, __LINE__, __VA_ARGS__)

#endif  // ORVEX_PORTABLE_SRC_KALO_LOG_H_
