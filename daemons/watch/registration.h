// Registration: one monitor queue as the watcher reads it from its file under
// the monitor registry (doc/monitor_registry.md), and the reading of the whole
// registry. Plain values; reading is safe for concurrent use.
#ifndef ORVEX_DAEMONS_WATCH_REGISTRATION_H_
#define ORVEX_DAEMONS_WATCH_REGISTRATION_H_

#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <vector>

namespace orvex {
namespace watch {

// One folder of a queue: changes at or below path whose kind is in mask,
// except below a component named in ignore.
struct WatchedFolder {
  std::string path;
  uint32_t mask = 0;
  std::set<std::string> ignore;

  bool operator==(const WatchedFolder& o) const {
    return path == o.path && mask == o.mask && ignore == o.ignore;
  }
};

struct Registration {
  std::string queue;  // absolute path of the queue file
  std::vector<WatchedFolder> folders;
};

// Parses a registration file's text. Returns false with why set when it is
// not a registration (the watcher then keeps what it had for that file).
bool ParseRegistration(const std::string& text, Registration& out, std::string& why);

// The registration files of every application under registry_dir, keyed by
// file path, with their parsed content; files that cannot be read or parsed
// are left out and reported through bad (file path to reason). A missing
// registry holds no registrations.
std::map<std::string, Registration> ReadRegistry(const std::string& registry_dir,
                                                 std::map<std::string, std::string>& bad);

// True for a registration file's name ("<escaped queue>.json"); the writers'
// temporary files ("*.json.tmp-<pid>-<n>") and anything else are not.
bool IsRegistrationFileName(const std::string& name);

}  // namespace watch
}  // namespace orvex

#endif  // ORVEX_DAEMONS_WATCH_REGISTRATION_H_
