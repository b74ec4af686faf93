// OPTree: the pending operations of one queue file, folded per path by the
// merge rules so that each path carries the fewest operations that still bring
// the index to the right state, and handed out in arrival order. Built in one
// pass; one thread at a time. Dropping the tree releases all of its nodes and
// ops, except those a caller still holds.
#ifndef ORVEX_QUEUE_OP_TREE_H_
#define ORVEX_QUEUE_OP_TREE_H_

#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "orvex/export.h"
#include "orvex/queue/event.h"
#include "orvex/queue/op.h"

namespace orvex {
namespace fileindex {

struct AheadLine;
struct EventFields;
struct PathKeys;

class ORVEX_EXPORT OPTree {
 public:
  // Builds the tree from queue_path. Throws Error 502 ("Failed to open queue,
  // reason=...") when the file cannot be opened or is a directory; bad lines
  // are logged and skipped.
  explicit OPTree(const std::string& queue_path);
  OPTree(const OPTree&) = delete;
  OPTree& operator=(const OPTree&) = delete;
  ~OPTree();

  // Reads the queue file line by line and folds each event into the tree,
  // stopping after a line that marks the queue crashed.
  void BuildTree();

  // The node of a canonical absolute path ("/a/b"), created as needed. Any
  // other path ("", "/", "a/b", "/a//b", "/a/") throws Error 9999 after the
  // nodes it walked through have been created.
  std::shared_ptr<OPNode> GetNodeByPath(const std::string& path);

  // Post-order walk below node: every node after all of its descendants,
  // children in creation order, node itself last unless skip_self. Each
  // node's children are copied when it is entered. Not recursive: safe on
  // arbitrarily deep trees.
  static void TraverseNodeDescendant(std::shared_ptr<OPNode> node,
                                     const std::function<void(std::shared_ptr<OPNode>)>& f,
                                     bool skip_self);

  // Hands f every pending op in arrival order and returns the number of ops
  // ever appended (cancelled ones included). A crashed queue instead gives f
  // one OP_QUEUE_CRASHED op on the root and returns 1. Exceptions from f
  // propagate.
  int ProcessOP(const std::function<void(std::shared_ptr<OP>)>& f);

  // Folds one event into the tree. Throws Error 9999 for a path it cannot
  // place; the tree then keeps what was done up to that point.
  void InsertEvent(std::shared_ptr<Event> ev);

  void HandleCreate(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleModify(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleAttr(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleDelete(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleUpdateCfg(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleReindex(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);
  void HandleRename(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op);

  bool crashed() const { return crashed_; }
  const std::string& queue_path() const { return queue_path_; }
  const std::shared_ptr<OPNode>& root() const { return root_; }
  // Every op ever appended, in append order, cancelled ones included.
  const std::vector<std::shared_ptr<OP>>& ops() const { return ops_; }
  // Lines read by BuildTree, and how many of them were logged and skipped.
  size_t lines_read() const { return lines_read_; }
  size_t lines_skipped() const { return lines_skipped_; }

 private:
  // Appends op to the tree's list and to node's list.
  void Append(OPNode& node, const std::shared_ptr<OP>& op);
  // Moves ops to node's list and points them at it; their places in the
  // tree's list (the processing order) do not change.
  void MoveOPs(OPNode& from, const std::shared_ptr<OPNode>& to,
               const std::vector<std::shared_ptr<OP>>& moved);
  // Folds in one line of the queue file (read ahead of its turn).
  void FoldLine(const AheadLine& line);
  // InsertEvent's work, on an Event or on the fields of a parsed line, with
  // the keys of its path.
  template <typename Fields>
  void Insert(const Fields& ev, const PathKeys& keys);
  // GetNodeByPath without the shared reference: a path seen before, or a new
  // name in a directory seen before, costs one probe of the node index.
  OPNode* NodeOf(const std::string& path, const PathKeys& keys);
  OPNode* NodeOf(const std::string& path);
  // GetNodeByPath's walk from the root, component by component, creating
  // nodes; throws Error 9999 at the end unless the path is canonical.
  OPNode* WalkPath(const std::string& path, bool canonical);
  // The handlers' work, without copying shared references on the way; the
  // public handlers wrap these.
  void FoldReindex(OPNode& node, const std::shared_ptr<OP>& op);
  void FoldRename(OPNode& node, const std::shared_ptr<OP>& op);
  void FollowRename(OPNode& source, const std::shared_ptr<OPNode>& target);

  bool crashed_ = false;
  std::string queue_path_;
  std::shared_ptr<OPNode> root_;
  std::vector<std::shared_ptr<OP>> ops_;
  size_t lines_read_ = 0;
  size_t lines_skipped_ = 0;
  // The op of the event being folded in: the one cancelled op that may still
  // be revived (by a later bit of the same event), so it is never pruned.
  const OP* in_flight_ = nullptr;
};

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_QUEUE_OP_TREE_H_
