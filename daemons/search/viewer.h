// Who a search is for, and what of an index that user may see: the share's
// privileges ("na" shows nothing) and, for shares that hide unreadable
// entries, what the user could open: the entry's own read bit and the search
// bit of every directory from the share root down to it. The free functions
// are safe for concurrent use (they read the share registry and the file
// system, and keep nothing); a ReadCheck belongs to one search.
#ifndef ORVEX_SEARCH_VIEWER_H_
#define ORVEX_SEARCH_VIEWER_H_

#include <json/json.h>
#include <sys/stat.h>
#include <sys/types.h>

#include <functional>
#include <string>
#include <unordered_map>
#include <vector>

#include "search/search_engine.h"

namespace orvex {
namespace search {

struct Viewer {
  bool everything = true;  // root asking for itself: no trimming
  std::string user;
  uid_t uid = 0;
  std::vector<gid_t> groups;  // primary and supplementary
};

// Root may name any user in data "user" (or none: everything); anyone else
// gets their own results, and naming someone else is kNotPermitted. An
// unknown user name is kBadArgument.
Viewer ResolveViewer(const Json::Value& data, const Caller& caller);

enum class Visibility { kAll, kNone, kReadable };

struct IndexAccess {
  Visibility visibility = Visibility::kAll;
  std::string share_root;  // the share's root directory when kReadable
};

// What viewer may see of index id ("fileindex_" + share name). Indexes of
// no known share are seen whole.
IndexAccess IndexVisibility(const std::string& index_id, const Viewer& viewer);

// Whether viewer may read the entries of one share, as the kernel would let
// that user open them: the entry's read bit, and the search (x) bit of the
// share root and of every directory between it and the entry. An entry
// outside the share root, or one that cannot be looked at, is not readable.
// Each directory is looked at once, however many entries lie below it: the
// answers are kept for the checker's life, which is one search (a directory
// whose mode changes meanwhile is seen as it was). Not thread-safe.
class ReadCheck {
 public:
  // stat(2) by default; tests count the calls.
  using StatFn = std::function<int(const std::string& path, struct stat& st)>;

  ReadCheck(const Viewer& viewer, std::string share_root, StatFn stat_fn = nullptr);

  bool CanRead(const std::string& path);

 private:
  bool Traversable(const std::string& dir);
  // Whether mode grants the bit of viewer's class (owner, group or other):
  // like the kernel, the first class that matches decides.
  bool Grants(const struct stat& st, mode_t owner_bit) const;

  const Viewer& viewer_;
  std::string root_;
  StatFn stat_;
  std::unordered_map<std::string, bool> traversable_;
};

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_VIEWER_H_
