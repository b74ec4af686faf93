// QueueMgr: the consumer's handle on one share's event queue. The live queue
// is renamed to a ".tmp" snapshot under the queue's lock, processed from
// there and deleted afterwards, while producers start a fresh live queue. It
// also answers whether a path has pending events in either file. A QueueMgr
// and its trees are used by one thread at a time; between processes, the
// rotation and every producer serialise on the lock of the live queue file.
#ifndef ORVEX_QUEUE_QUEUE_MGR_H_
#define ORVEX_QUEUE_QUEUE_MGR_H_

#include <functional>
#include <memory>
#include <string>

#include "orvex/export.h"
#include "orvex/queue/op.h"
#include "orvex/queue/op_tree.h"

namespace orvex {
namespace fileindex {

class ORVEX_EXPORT QueueMgr {
 public:
  // queue_path is the share's live queue file; its snapshot is the same path
  // with ".tmp" appended. Touches no file.
  explicit QueueMgr(const std::string& queue_path);
  QueueMgr(const QueueMgr&) = delete;
  QueueMgr& operator=(const QueueMgr&) = delete;
  ~QueueMgr();

  // Takes a snapshot of the live queue. Returns false when there is no live
  // queue. Otherwise, holding LockFile(queue path, exclusive) so that no
  // producer appends meanwhile, renames the live queue to the snapshot path
  // unless a snapshot already exists (an earlier one not yet deleted, which
  // is then kept and must be processed first; the live queue stays), and
  // returns true. Throws Error 506 when the lock cannot be taken and 502
  // "rename failed, reason=..." (logged) when the rename fails.
  bool PrepareTmpQueue();

  // The tree of the live queue / of the snapshot, built from the file on the
  // first call and cached for the manager's life (never refreshed). Throws
  // Error 502 "Failed to open queue, reason=..." when the file cannot be
  // read. The tree is shared with the caller.
  std::shared_ptr<OPTree> GetOPTree() const;
  std::shared_ptr<OPTree> GetOPTreeTmp() const;

  // Hands f the pending operations in arrival order and returns the tree's
  // count (OPTree::ProcessOP). With use_tmp, first takes a snapshot
  // (PrepareTmpQueue) and processes the snapshot; else processes the live
  // queue as it stands. Returns 0 without calling f when the file does not
  // exist. The caller deletes the snapshot with DeleteTmp() once every
  // operation is handled. Throws what PrepareTmpQueue and the tree build
  // throw; exceptions from f propagate.
  int ProcessOP(const std::function<void(std::shared_ptr<OP>)>& f, bool use_tmp);

  // Removes the snapshot file; a missing file or a failure is ignored.
  void DeleteTmp();

  // True when full_path itself or anything below it (a whole-component
  // prefix: "/v/s/a" covers "/v/s/a/b", not "/v/s/ab") has an event in the
  // live queue or the snapshot, as the changed path or as the old path of a
  // rename. A last line without its newline is one a producer is still
  // appending and is not looked at. Throws Error 502 when a queue file exists
  // but cannot be read, and the Event errors (906, 120) for a malformed
  // line.
  bool IsFullPathProcessing(const std::string& full_path);

  // True when a pure re-index (mask exactly EVENT_REINDEX) of full_path or
  // of one of its ancestors waits in the live queue or the snapshot. Throws
  // as IsFullPathProcessing.
  bool IsFullPathHasReindex(const std::string& full_path);

  const std::string& queue_path() const { return queue_path_; }
  const std::string& queue_path_tmp() const { return queue_path_tmp_; }

 private:
  std::string queue_path_;
  std::string queue_path_tmp_;
  mutable std::shared_ptr<OPTree> tree_;
  mutable std::shared_ptr<OPTree> tree_tmp_;
};

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_QUEUE_QUEUE_MGR_H_
