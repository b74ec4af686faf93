// What every file of the management operations shares: the source name its
// log lines carry and the "(pid, euid)" fields of the line prefix.
#ifndef ORVEX_SRC_INDEX_MGR_LOG_UTIL_H_
#define ORVEX_SRC_INDEX_MGR_LOG_UTIL_H_

#include <unistd.h>

namespace orvex {
namespace fileindex {

// The source name of every log line of the management operations.
inline constexpr char kLogSource[] = "index_mgr";

inline int Pid() { return static_cast<int>(::getpid()); }
inline unsigned Euid() { return static_cast<unsigned>(::geteuid()); }

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_INDEX_MGR_LOG_UTIL_H_
