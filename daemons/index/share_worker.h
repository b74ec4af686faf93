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
// end of the batch. Document changes go out a few hundred to a compound
// request, sent before anything that must follow them (a rename, a subtree
// delete, a listing, a commit) and at the end of each step. One thread at a
// time.
#ifndef ORVEX_DAEMONS_INDEX_SHARE_WORKER_H_
#define ORVEX_DAEMONS_INDEX_SHARE_WORKER_H_

#include <json/json.h>

#include <cstdint>
#include <ctime>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <unordered_set>
#include <vector>

#include "orvex/config/folder_mgr.h"
#include "orvex/elastic.h"
#include "orvex/queue/op.h"

namespace orvex {
namespace indexd {

struct WorkerOptions {
  // Milliseconds the live queue must stay unchanged before it is taken:
  // long enough that a burst (an untar, a checkout) becomes one batch,
  // short enough that a single save is searchable within a second.
  int64_t quiet_ms = 150;
  // A queue that never stops growing is taken this long after its first
  // line was seen, so a steady stream is still indexed.
  int64_t max_wait_ms = 30000;
  // Documents sent between two commits of the share's index.
  size_t commit_every = 2000;
  // Document commands (or entries a walk compares) per Step, so that the
  // loop returns regularly, also during a walk that finds nothing changed.
  size_t step_budget = 200;
  // Documents per answer when a walk lists what the index holds: a walk's
  // memory is a page and the entries of the directories it is in, however
  // large the subtree.
  size_t page_size = 1000;
  // Document changes (upserts, attribute changes, deletes) sent together as
  // one compound request: at most this many, and a new one is not added
  // past about this many bytes of request text.
  size_t batch_docs = 500;
  size_t batch_bytes = 4 << 20;
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
  enum class Kind { kDelete, kDeleteTree, kUpsert, kAttr, kRename, kReindex, kWalk, kRefresh };
  // The disk and the index below a path, side by side in path order.
  struct SubtreeWalk;
  struct Action {
    Kind kind;
    std::string path;
    std::string from;      // kRename: the old path
    bool refresh = false;  // kReindex, kWalk: read every file again, changed or not
    std::shared_ptr<SubtreeWalk> walk = nullptr;  // kWalk: where it stands, kept across steps
  };

  int64_t NowMs() const;
  bool SnapshotDue();
  void TakeSnapshot();
  void AddOp(const std::shared_ptr<fileindex::OP>& op);
  // Carries out the front action; may replace it by the actions it expands
  // into. Returns the number of document commands sent; adds the work done
  // (a walk: the entries it compared) to work.
  size_t Perform(const Action& action, size_t& work);
  size_t Reindex(const std::string& path, bool refresh);
  // A walk of the subtree below dir, its first page of documents asked.
  std::shared_ptr<SubtreeWalk> StartWalk(const std::string& dir, bool refresh);
  // Compares entries until the step's work is done or the walk is over
  // (else it goes back to the front): upserts what is new or changed,
  // deletes what the index holds and the disk no longer does.
  size_t WalkSome(const Action& action, size_t& work);
  // Upsert for a file met by a walk; an unreadable one is skipped.
  size_t UpsertFound(const std::string& path);
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
  // Adds the document change (kUpsert, kAttr or kDelete) of path to the
  // compound request being gathered, sending that first when it is full or
  // already holds path (a path's changes keep their order).
  void Batch(Kind kind, const std::string& path);
  // Sends the gathered changes; a refused one is carried out again alone, as
  // a single command, which throws as it always did (an attribute change of a
  // document the index does not hold becomes an upsert).
  void FlushBatch();
  void SendAlone(const Action& action, int refused_code);
  // The attribute change of path alone; false when the index does not hold
  // its document.
  bool AttrAlone(const std::string& path);
  void Commit();
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
  // Targets of the batch's renames not carried out yet: a walk leaves them
  // to their rename, which moves their documents instead of reading them.
  std::multiset<std::string> rename_targets_;
  std::set<std::string> refresh_;  // directories (and moved items) to refresh
  std::vector<Action> uncommitted_;
  // The changes gathered in batch_, in its order: noted as uncommitted once
  // sent, put back in front of the actions when the batch stops first.
  fileindex::elastic::DocumentBatch batch_;
  std::vector<Action> batched_;
  std::unordered_set<std::string> batched_paths_;
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
