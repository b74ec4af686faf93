// Where the system's fixed paths live on this machine: every absolute
// constant (state files, lock files, sockets, the notification tool) is
// opened under $ORVEX_ROOT when that is set and not empty, and as it stands
// otherwise. Share paths and paths inside shares never go through here.
// Safe for concurrent use.
#ifndef ORVEX_SRC_PLATFORM_FIXED_PATH_H_
#define ORVEX_SRC_PLATFORM_FIXED_PATH_H_

#include <string>

namespace orvex {
namespace sdk {

// The path to open for the fixed path fixed_path, e.g.
// "/var/packages/Orvex/etc/fileindex.status". The environment is read on
// every call, so each process (and each test) may have its own root.
std::string FixedPath(const std::string& fixed_path);

}  // namespace sdk
}  // namespace orvex

#endif  // ORVEX_SRC_PLATFORM_FIXED_PATH_H_
