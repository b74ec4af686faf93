// Where a share's indexing data lives, composed from the share's root
// directory alone: its live event queue (the snapshot is the same path with
// ".tmp" appended) and its index database. The library's door to the
// platform's path composition, for shares whose record may be gone already.
// Safe for concurrent use.
#ifndef ORVEX_SRC_PLATFORM_INDEX_PATHS_H_
#define ORVEX_SRC_PLATFORM_INDEX_PATHS_H_

#include <string>

namespace orvex {
namespace sdk {

// Each sets out and returns a non-negative value, or returns a negative one
// (out unchanged) when share_path is empty or relative or the result does
// not fit a path. Never throws.
int ComposeQueuePath(const std::string& share_path, std::string& out);
int ComposeDBPath(const std::string& share_path, std::string& out);

}  // namespace sdk
}  // namespace orvex

#endif  // ORVEX_SRC_PLATFORM_INDEX_PATHS_H_
