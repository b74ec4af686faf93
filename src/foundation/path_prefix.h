// "This path or below it": the one test of whether a path lies in a
// directory's subtree, by whole components. Pure function: safe for
// concurrent use.
#ifndef ORVEX_SRC_FOUNDATION_PATH_PREFIX_H_
#define ORVEX_SRC_FOUNDATION_PATH_PREFIX_H_

#include <string_view>

namespace orvex {

// True when path is dir itself or lies below it: (path + "/") starts with
// (dir + "/"). Whole components only, so "/v/a" holds "/v/a/b" but not
// "/v/ab". dir carries no trailing slash; the empty dir holds every
// absolute path.
inline bool IsSameOrBelow(std::string_view path, std::string_view dir) {
  const size_t n = dir.size();
  if (path.size() < n) return false;
  // The boundary byte first: the paths tested against one directory share
  // long prefixes (volume, share, parent folders), and most of them end
  // where the other has no "/". The governing folder of every indexed file
  // is found this way among up to a thousand folders.
  if (path.size() != n && path[n] != '/') return false;
  return path.compare(0, n, dir) == 0;
}

}  // namespace orvex

#endif  // ORVEX_SRC_FOUNDATION_PATH_PREFIX_H_
