// Folds an index's write-ahead log back into its database file on a thread
// of its own, so that the thread answering requests never waits for the
// copy and its flush to disk.
//
// Install() replaces SQLite's automatic checkpoint on the writing
// connection: after each commit, a log of kStartFrames pages or more wakes
// the thread, which runs a passive checkpoint on its own connection (it
// never blocks the writer or the readers). Should the writer outrun it and
// the log reach kLimitFrames, the writer checkpoints in full itself before
// it goes on, which bounds the log on disk.
#ifndef ORVEX_SEARCH_WAL_CHECKPOINTER_H_
#define ORVEX_SEARCH_WAL_CHECKPOINTER_H_

#include <sqlite3.h>

#include <condition_variable>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

namespace orvex {
namespace search {

class SqliteDb;

class WalCheckpointer {
 public:
  static constexpr int kStartFrames = 4096;   // 16 MiB of 4 KiB pages
  static constexpr int kLimitFrames = 65536;  // 256 MiB

  // Opens a connection of its own to the database at path (which must
  // exist, in WAL mode) and starts the thread. Throws SearchError kStorage.
  explicit WalCheckpointer(const std::string& path);
  // Lets a checkpoint in progress finish, then stops the thread.
  ~WalCheckpointer();
  WalCheckpointer(const WalCheckpointer&) = delete;
  WalCheckpointer& operator=(const WalCheckpointer&) = delete;

  // Hooks writer's commits to this object, which must outlive the hook:
  // uninstall with Uninstall(writer) before destroying it.
  void Install(sqlite3* writer);
  static void Uninstall(sqlite3* writer);

 private:
  static int OnCommit(void* self, sqlite3* writer, const char* schema, int frames);
  void Request();
  void Run();

  std::unique_ptr<SqliteDb> db_;
  std::mutex mutex_;
  std::condition_variable wake_;
  bool requested_ = false;
  bool stopping_ = false;
  std::thread thread_;
};

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_WAL_CHECKPOINTER_H_
