// OP and OPNode: the pending operations of a share and the part of its
// directory hierarchy they live in. A node is one path component; an op hangs
// on the node of its path and is also listed, in arrival order, in its
// OPTree. Both are owned through std::shared_ptr and link to each other both
// ways; the OPTree that made them cuts those links when it is dropped, and
// nodes made outside a tree need OPNode::ReleaseTree. One thread at a time.
#ifndef ORVEX_QUEUE_OP_H_
#define ORVEX_QUEUE_OP_H_

#include <json/json.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {

// What the consumer must do for an op; stored and printed as an int.
enum FileIndexOP : int {
  OP_NONE = 0,           // cancelled; never handed to the consumer
  OP_DELETE = 1,         // remove the document of the node's path
  OP_UPSERT = 2,         // (re)index the file at the node's path
  OP_ATTR = 3,           // refresh the attributes of the node's path
  OP_UPDATE_CFG = 4,     // the folder configuration at the path changed; data holds it
  OP_RENAME = 5,         // renamed from the op's path to the node's path
  OP_REINDEX = 6,        // reindex the node's path and everything below it
  OP_QUEUE_CRASHED = 7,  // the queue is incomplete: reindex the whole share
};

class NodeIndex;
class OPNode;
class OPTree;

struct ORVEX_EXPORT OP {
  OP(std::shared_ptr<OPNode> node, FileIndexOP kind, const std::string& path,
     const Json::Value& data);

  // Merges another configuration change of the same folder into data: each
  // of "document", "audio", "video", "photo" ends true when either side has
  // it true (a missing or non-bool member counts as false). Other keys stay.
  void MergeData(const Json::Value& other);

  std::shared_ptr<OPNode> node;  // the node whose path the op concerns
  FileIndexOP kind;
  std::string path;  // for OP_RENAME the old path, else empty
  Json::Value data;  // for OP_UPDATE_CFG the change, else null
};

class ORVEX_EXPORT OPNode : public std::enable_shared_from_this<OPNode> {
  // Lets only GetChild construct the nodes that join an existing tree.
  class Passkey {
    friend class OPNode;
    explicit Passkey() = default;
  };

 public:
  // A node that heads a tree of its own: it and the descendants it creates
  // share one index, whatever `parent` is.
  OPNode(std::shared_ptr<OPNode> parent, const std::string& name);
  // Used by GetChild through std::make_shared; not callable elsewhere.
  OPNode(Passkey, std::shared_ptr<OPNode> parent, const std::string& name, uint64_t key);
  OPNode(const OPNode&) = delete;
  OPNode& operator=(const OPNode&) = delete;
  ~OPNode();

  // The child named `name` (exact bytes), created and appended when absent.
  // The node must already be owned by a shared_ptr. Constant time: every
  // node of a tree is indexed by its parent and name as well as kept in its
  // parent's creation order.
  std::shared_ptr<OPNode> GetChild(const std::string& name);

  // "/a/b" for node b under a under the root; the root's path is empty.
  std::string GetPath() const;

  // Calls f for each pending op of this node (kind not OP_NONE) in list
  // order, over a copy of the list: changes f makes do not affect the walk.
  void TraverseOP(const std::function<void(std::shared_ptr<OP>)>& f);

  const std::string& name() const { return name_; }
  const std::shared_ptr<OPNode>& parent() const { return parent_; }
  const std::vector<std::shared_ptr<OPNode>>& children() const { return children_; }
  std::vector<std::shared_ptr<OP>>& ops() { return ops_; }
  const std::vector<std::shared_ptr<OP>>& ops() const { return ops_; }

  // Attaches op at the end of this node's list. Cancelled ops other than
  // `keep` (the op of the event being folded in) may be pruned from the list
  // on the way: they are skipped by every walk and the tree still lists them.
  void AttachOP(std::shared_ptr<OP> op, const OP* keep);
  // Removes every occurrence of the given ops from this node's list.
  void DetachOPs(const std::vector<std::shared_ptr<OP>>& moved);

  // Parents and children own each other, so nodes are freed only once these
  // links are cut. Cuts the downward links (children and ops) of head and of
  // every node below it, which frees, deepest first and without recursion,
  // every node that no one else holds. OPTree's destructor does this for its
  // tree; nodes made outside a tree, or grown from a node kept after its tree
  // was dropped, need it from their owner. Lookups in head's tree work
  // afterwards, but no longer through its index.
  static void ReleaseTree(const std::shared_ptr<OPNode>& head);

 private:
  friend class OPTree;
  static constexpr size_t kPruneMinimum = 16;

  // Creates, records and appends the child named name, whose key is key;
  // the caller knows there is none yet.
  OPNode* AddChild(std::string_view name, uint64_t key);
  NodeIndex& index() const { return *index_; }
  // Drops this node's own downward links.
  void ReleaseLinks();
  uint64_t key() const { return key_; }

  std::string name_;
  std::shared_ptr<OPNode> parent_;
  std::vector<std::shared_ptr<OPNode>> children_;
  std::vector<std::shared_ptr<OP>> ops_;
  size_t live_after_prune_ = 0;
  uint64_t key_;                            // this node's key in index_
  NodeIndex* index_;                        // shared with the tree this node heads or belongs to
  std::unique_ptr<NodeIndex> owned_index_;  // set when this node heads a tree
};

// "[kk] " + (rename: old path + " -> ") + node path + (config: ", data=" + JSON),
// e.g. "[02] /s/a.txt", "[05] /s/old -> /s/new".
ORVEX_EXPORT std::ostream& operator<<(std::ostream& out, std::shared_ptr<OP> op);
// "Node[<path>]: " then each pending op after two blanks; debugging output.
ORVEX_EXPORT std::ostream& operator<<(std::ostream& out, std::shared_ptr<OPNode> node);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_QUEUE_OP_H_
