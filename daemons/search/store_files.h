// The files of one index database on disk: the database and the write-ahead
// log and shared-memory files SQLite keeps beside it. Safe for concurrent use
// on different paths.
#ifndef ORVEX_SEARCH_STORE_FILES_H_
#define ORVEX_SEARCH_STORE_FILES_H_

#include <string>

namespace orvex {
namespace search {

// Removes path and its "-wal" and "-shm" files; missing ones are no error.
// Throws SearchError kStorage when one cannot be removed.
void RemoveStoreFiles(const std::string& path);

// Moves the closed database from to to (creating to's directory). On one
// volume it is a single rename; across volumes the copy is written to a
// temporary file beside to, flushed and renamed into place before from is
// removed, so to is never half written. Throws kStorage; from is then intact.
void MoveStoreFile(const std::string& from, const std::string& to);

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_STORE_FILES_H_
