// The ORVEX_ROOT rule: every fixed absolute path of the system (state files,
// lock files, sockets, the notification tool, the platform's own files) is
// opened under the directory named by the environment variable ORVEX_ROOT when
// it is set and not empty, and as it stands otherwise. Share paths and full
// paths inside shares are never rewritten. Safe for concurrent use.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef ORVEX_PORTABLE_ROOT_H_
#define ORVEX_PORTABLE_ROOT_H_

#include <string>

namespace orvex {
namespace portable {

// fixed_path is one of the system's absolute constants, e.g.
// "/var/packages/Orvex/etc/fileindex.status". The environment is read on every
// call, so tests and tools may point each process at its own root.
std::string RootPath(const std::string& fixed_path);

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_ROOT_H_
