// Indexability rules: whether a folder may be configured for indexing. Reads
// the share registry and the file system on every call. Safe for concurrent
// use.
#ifndef ORVEX_POLICY_INDEXABILITY_H_
#define ORVEX_POLICY_INDEXABILITY_H_

#include <string>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {

// Whether the share-relative path ("/<share>" or "/<share>/rest") may be
// indexed. False when the path is empty or relative or has an empty, "." or
// ".." component; when its share is not registered or may not be indexed
// (SDKShare::CanBeIndexed); when a component is a system folder ("@eaDir",
// "#snapshot", "#recycle") or a system-reserved name beginning with "@"
// directly under the share root; or when the full path is not an existing
// directory (symbolic links followed). Never throws.
ORVEX_EXPORT bool CanPathBeIndexed(const std::string& share_relative_path);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_POLICY_INDEXABILITY_H_
