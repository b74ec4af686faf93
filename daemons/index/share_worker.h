// ShareWorker: makes one share's file changes searchable. When the share's
// live queue holds lines and has been quiet briefly (or has kept growing for
// too long), it is rotated into its snapshot with QueueMgr (a snapshot left by
// a killed run is taken as it is, before the live queue); the snapshot's
// operations become actions carried out a few at a time by Step(), so the
// daemon's loop keeps answering its socket during a long walk. Every file and
// directory governed by an indexed folder is a document of its own; nothing
// inside the metadata folders (@eaDir, #recycle, #snapshot) ever is. The
// index is committed every few thousand documents and at the end of the
// batch, and only then is the snapshot deleted; a batch that stops sends what
// it had not committed again, since the search daemon may have lost it.
// Directories, whose times change with their entries, are refreshed at the
// end of the batch. One thread at a time.
#ifndef ORVEX_DAEMONS_INDEX_SHARE_WORKER_H_
#define ORVEX_DAEMONS_INDEX_SHARE_WORKER_H_

#include <json/json.h>

#include <cstdint>
#include <ctime>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "orvex/config/folder_mgr.h"
#include "orvex/queue/op.h"

namespace orvex {
namespace indexd {

struct WorkerOptions {
  // Milliseconds the live queue must stay unchanged before it is taken:
  // long enough that a burst (an untar, a checkout) becomes one batch,
  // short enough that a single save is searchable within a second.
  int64_t quiet_ms = 250;
  // A queue that never stops growing is taken this long after its first
  // line was seen, so a steady stream is still indexed.
  int64_t max_wait_ms = 30000;
  // Documents sent between two commits of the share's index.
  size_t commit_every = 2000;
  // Document commands per Step, so that the loop returns regularly.
  size_t step_budget = 200;
  // Seconds before a batch that failed (search daemon away) is tried again.
  time_t retry_s = 30;
  // The monotonic clock, in milliseconds, that times the quiet period;
  // empty: the system's steady clock.
  std::function<int64_t()> clock_ms;
};

class ShareWorker {
 public:
  // share_root is the share's root directory, queue_path its live queue.
  ShareWorker(std::string share, std::string share_root, std::string queue_path,
              WorkerOptions options);
  ShareWorker(const ShareWorker&) = delete;
  ShareWorker& operator=(const ShareWorker&) = delete;

  // Adds a walk of every indexed folder of the share to the current batch
  // (the share needs a re-index); its flag is cleared once that batch is
  // committed.
  void ScheduleFullWalk();

  // Takes a snapshot when one is due, then carries out up to the step
  // budget of actions. Returns the number of document commands sent.
  // Errors are logged, never thrown: a failed command other than an
  // unreadable file keeps its place and the batch is retried later.
  size_t Step();

  // Work waits in memory (a batch being carried out, not waiting to retry).
  bool HasWork() const;

  // A batch waiting to be retried (the search daemon was away) is tried at
  // the next step.
  void RetryNow() { retry_at_ = 0; }

  // {"state", "done", "todo", "rate", "eta", "total_done", "total_read",
  // "last_error"}.
  Json::Value Status() const;

  const std::string& share() const { return share_; }

 private:
  enum class Kind {
    kDelete,
    kDeleteTree,
    kUpsert,
    kAttr,
    kRename,
    kReindex,
    kWalk,
    kSweep,
    kRefresh
  };
  struct Action {
    Kind kind;
    std::string path;
    std::string from;      // kRename: the old path
    bool refresh = false;  // kReindex, kWalk: read every file again, changed or not
  };
  // A document already in the index, as the walk compares it with the file.
  struct Known {
    long long size = -1;
    long long ctime = -1;
    long long mtime = -1;
    bool seen = false;
  };

  int64_t NowMs() const;
  bool SnapshotDue();
  void TakeSnapshot();
  void AddOp(const std::shared_ptr<fileindex::OP>& op);
  // Carries out the front action; may replace it by the actions it expands
  // into. Returns the number of document commands sent.
  size_t Perform(const Action& action);
  size_t Reindex(const std::string& path, bool refresh);
  void Walk(const std::string& dir, bool refresh);
  // Learns the documents below dir from the index (kept where known).
  void LearnKnown(const std::string& dir);
  // True when the index holds the file as it is now; marks it seen.
  bool Unchanged(const std::string& path);
  // Deletes the documents below dir that the walk did not find.
  size_t Sweep(const std::string& dir);
  size_t Rename(const std::string& from, const std::string& to);
  // Queues a refresh of the document of path's directory (its times change
  // with its entries), once per batch.
  void TouchParent(const std::string& path);
  // Brings the attributes of path's document up to date without reading
  // the file's content.
  size_t Refresh(const std::string& path);
  size_t Upsert(const std::string& path, bool attr_only);
  size_t Remove(const std::string& path, bool with_descendants);
  void FinishBatch();
  void CountSent(size_t sent);
  // Notes a document command sent since the last commit, to be sent again
  // when the batch stops: the search daemon may lose what it had not
  // committed (killed, or out of space).
  void Uncommitted(Kind kind, const std::string& path, const std::string& from = "");

  // A document of the index: governed by an indexed folder and outside the
  // metadata folders.
  bool IsDocument(const std::string& path) const;
  static bool InMetadataFolder(const std::string& path);
  // Full paths of the share's indexed folders at or below path.
  std::vector<std::string> FoldersBelow(const std::string& path) const;

  std::string share_;
  std::string share_root_;
  std::string queue_path_;
  WorkerOptions options_;

  std::deque<Action> actions_;
  std::map<std::string, Known> known_;  // by path, while a walk is under way
  // Targets of the batch's renames not carried out yet: a walk leaves them
  // to their rename, which moves their documents instead of reading them.
  std::multiset<std::string> rename_targets_;
  std::set<std::string> refresh_;  // directories (and moved items) to refresh
  std::vector<Action> uncommitted_;
  std::unique_ptr<fileindex::FolderMgr> folders_;  // loaded per batch
  bool in_batch_ = false;
  bool from_snapshot_ = false;
  bool full_walk_ = false;
  size_t sent_in_batch_ = 0;
  size_t since_commit_ = 0;
  size_t done_ = 0;
  size_t total_done_ = 0;
  size_t total_read_ = 0;  // documents made from the file's content (upserts)
  time_t batch_start_ = 0;
  time_t retry_at_ = 0;
  std::string last_error_;

  // The live queue as last seen: its size, when that last changed, and
  // when it was first seen holding lines.
  long long seen_size_ = 0;
  int64_t seen_change_ = 0;
  std::optional<int64_t> first_seen_;
};

}  // namespace indexd
}  // namespace orvex

#endif  // ORVEX_DAEMONS_INDEX_SHARE_WORKER_H_
