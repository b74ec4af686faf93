#include "search/wal_checkpointer.h"

#include "search/sqlite_db.h"

namespace orvex {
namespace search {

WalCheckpointer::WalCheckpointer(const std::string& path)
    : db_(std::make_unique<SqliteDb>(path, /*create=*/false)) {
  // Its own commits are none: it only copies pages, and must not wait on
  // the writer for long (a passive checkpoint never does).
  db_->Exec("PRAGMA wal_autocheckpoint=0");
  // A connection opens the log only when it first reads the database: a
  // checkpoint before that finds no log and copies nothing.
  db_->Exec("SELECT count(*) FROM sqlite_master");
  thread_ = std::thread([this] { Run(); });
}

WalCheckpointer::~WalCheckpointer() {
  {
    std::lock_guard<std::mutex> lock(mutex_);
    stopping_ = true;
  }
  wake_.notify_one();
  thread_.join();
}

void WalCheckpointer::Install(sqlite3* writer) { sqlite3_wal_hook(writer, &OnCommit, this); }

void WalCheckpointer::Uninstall(sqlite3* writer) { sqlite3_wal_hook(writer, nullptr, nullptr); }

int WalCheckpointer::OnCommit(void* self, sqlite3* writer, const char* schema, int frames) {
  if (frames >= kLimitFrames) {
    // Waits (through the writer's busy timeout) for a checkpoint under way
    // on the thread, then copies the rest: the next transaction starts the
    // log afresh. A failure leaves the log as it is, to be tried again.
    sqlite3_wal_checkpoint_v2(writer, schema, SQLITE_CHECKPOINT_FULL, nullptr, nullptr);
  } else if (frames >= kStartFrames) {
    static_cast<WalCheckpointer*>(self)->Request();
  }
  return SQLITE_OK;
}

void WalCheckpointer::Request() {
  {
    std::lock_guard<std::mutex> lock(mutex_);
    requested_ = true;
  }
  wake_.notify_one();
}

void WalCheckpointer::Run() {
  std::unique_lock<std::mutex> lock(mutex_);
  while (true) {
    wake_.wait(lock, [this] { return requested_ || stopping_; });
    if (stopping_) return;
    requested_ = false;
    lock.unlock();
    // Busy (another checkpoint, or a reader on an old snapshot) only means
    // that fewer pages were copied this time: the next commit asks again.
    sqlite3_wal_checkpoint_v2(db_->handle(), nullptr, SQLITE_CHECKPOINT_PASSIVE, nullptr, nullptr);
    lock.lock();
  }
}

}  // namespace search
}  // namespace orvex
