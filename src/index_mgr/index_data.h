// Removing what indexing keeps of a share besides its search index: the
// live event queue, its snapshot, the index database and the share's status
// flags. Works from the share's root alone, so it serves shares whose record
// is gone. Safe for concurrent use as far as the status file allows.
#ifndef ORVEX_SRC_INDEX_MGR_INDEX_DATA_H_
#define ORVEX_SRC_INDEX_MGR_INDEX_DATA_H_

#include <string>

namespace orvex {
namespace fileindex {

// Removes (rm -rf) the queue, the queue's ".tmp" snapshot and the database
// composed from share_path, then clears the share's status. A removal that
// fails is not reported. Throws Error 502 "FILEIDXQueuePathCompose failed,
// share_path=<share_path>" or "FILEIDXDBPathCompose failed,
// share_path=<share_path>" (nothing removed after it) when a path cannot be
// composed, and the status file's errors.
void RemoveShareIndexData(const std::string& share, const std::string& share_path);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_INDEX_MGR_INDEX_DATA_H_
