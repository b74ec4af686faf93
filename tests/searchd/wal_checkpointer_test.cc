// The checkpoint thread: a commit that leaves a long log gets it copied
// into the database file without the writer checkpointing itself.
#include "search/wal_checkpointer.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <chrono>
#include <string>
#include <thread>

#include "search/sqlite_db.h"
#include "support/temp_dir.h"

namespace orvex {
namespace testing {
namespace {

off_t FileSize(const std::string& path) {
  struct stat st {};
  return ::stat(path.c_str(), &st) == 0 ? st.st_size : -1;
}

TEST(WalCheckpointerTest, ALongLogIsCopiedIntoTheDatabaseOnTheThread) {
  TempDir dir;
  const std::string path = dir.path() + "/index.db";
  search::SqliteDb writer(path, /*create=*/true);
  writer.Exec("PRAGMA journal_mode=WAL; CREATE TABLE t(b BLOB)");
  const off_t empty = FileSize(path);
  search::WalCheckpointer checkpointer(path);
  checkpointer.Install(writer.handle());
  // Twice the thread's threshold in one commit: below the writer's own.
  const int pages = 2 * search::WalCheckpointer::kStartFrames;
  writer.Exec("BEGIN; WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < " +
              std::to_string(pages) + ") INSERT INTO t SELECT zeroblob(3000) FROM n; COMMIT");
  const off_t copied = static_cast<off_t>(pages) * 3000;
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
  while (FileSize(path) < copied && std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  EXPECT_GE(FileSize(path), copied) << "the database file stayed at " << empty << " bytes";
  search::WalCheckpointer::Uninstall(writer.handle());
}

}  // namespace
}  // namespace testing
}  // namespace orvex
