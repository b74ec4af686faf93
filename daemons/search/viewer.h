// Who a search is for, and what of an index that user may see: the share's
// privileges ("na" shows nothing) and, for shares that hide unreadable
// entries, the entries' own permission bits. Safe for concurrent use (reads
// the share registry and the file system, keeps nothing).
#ifndef ORVEX_SEARCH_VIEWER_H_
#define ORVEX_SEARCH_VIEWER_H_

#include <json/json.h>
#include <sys/types.h>

#include <string>
#include <vector>

#include "search/search_engine.h"

namespace orvex {
namespace search {

struct Viewer {
  bool everything = true;  // root asking for itself: no trimming
  std::string user;
  uid_t uid = 0;
  std::vector<gid_t> groups;
};

// Root may name any user in data "user" (or none: everything); anyone else
// gets their own results, and naming someone else is kNotPermitted. An
// unknown user name is kBadArgument.
Viewer ResolveViewer(const Json::Value& data, const Caller& caller);

enum class Visibility { kAll, kNone, kReadable };

// What viewer may see of index id ("fileindex_" + share name). Indexes of
// no known share are seen whole.
Visibility IndexVisibility(const std::string& index_id, const Viewer& viewer);

// Whether viewer may read the entry at path, by its permission bits.
bool CanRead(const std::string& path, const Viewer& viewer);

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_VIEWER_H_
