// The merge rules: how a new event folds into the operations already pending
// on its path, its ancestors and its descendants. The rules are deliberately
// asymmetric (a modify after a pending delete is absorbed, a create after one
// revives the file) and must be kept exactly as they are.

#include "foundation/path_prefix.h"
#include "orvex/foundation/error.h"
#include "orvex/queue/op_tree.h"
#include "queue/event_parser.h"
#include "queue/node_index.h"
#include "queue/prefetch.h"

namespace orvex {
namespace fileindex {
namespace {

// What a simple handler does to the new op and to one pending op e.
enum class Action {
  kNothing,  // both stay: the new op is appended after e
  kDrop,     // the new op is absorbed by e
  kUpgrade,  // e takes the rule's kind; the new op is absorbed
  kReplace,  // e becomes a configuration update with the new data; absorbed
  kMerge,    // e's configuration merges the new data; absorbed
};

struct Rule {
  Action action;
  FileIndexOP upgrade_to;
};

constexpr Rule Nothing() { return {Action::kNothing, OP_NONE}; }
constexpr Rule Drop() { return {Action::kDrop, OP_NONE}; }
constexpr Rule Upgrade(FileIndexOP kind) { return {Action::kUpgrade, kind}; }
constexpr Rule Replace() { return {Action::kReplace, OP_UPDATE_CFG}; }
constexpr Rule Merge() { return {Action::kMerge, OP_UPDATE_CFG}; }

// One row per incoming kind; columns are the pending op's kind:
//                        DELETE               UPSERT             ATTR
//                        UPDATE_CFG           RENAME             REINDEX
using RuleRow = Rule[6];
constexpr RuleRow kCreateRules = {Upgrade(OP_UPSERT), Drop(), Upgrade(OP_UPSERT), Drop(),
                                  Nothing(),          Drop()};
constexpr RuleRow kModifyRules = {Drop(), Drop(), Upgrade(OP_UPSERT), Drop(), Nothing(), Drop()};
constexpr RuleRow kAttrRules = {Drop(), Drop(), Drop(), Drop(), Nothing(), Drop()};
constexpr RuleRow kDeleteRules = {Drop(),    Upgrade(OP_DELETE), Upgrade(OP_DELETE),
                                  Nothing(), Nothing(),          Nothing()};
constexpr RuleRow kUpdateCfgRules = {Drop(), Replace(), Replace(), Merge(), Nothing(), Drop()};

void ApplyRule(const Rule& rule, OP& incoming, OP& pending) {
  switch (rule.action) {
    case Action::kNothing:
      return;
    case Action::kDrop:
      break;
    case Action::kUpgrade:
      pending.kind = rule.upgrade_to;
      break;
    case Action::kReplace:
      pending.kind = OP_UPDATE_CFG;
      pending.data = incoming.data;
      break;
    case Action::kMerge:
      pending.MergeData(incoming.data);
      break;
  }
  incoming.kind = OP_NONE;
}

bool IsMergeable(FileIndexOP kind) { return kind >= OP_DELETE && kind <= OP_REINDEX; }

// Calls f(e) for each pending op e of node, in list order. Only for folds
// that change kinds and data: the list itself must not change meanwhile,
// which is what lets the walk skip TraverseOP's copy of it.
template <typename Fn>
void ForEachPending(OPNode& node, Fn f) {
  for (const auto& e : node.ops()) {
    if (e->kind != OP_NONE) f(*e);
  }
}

// Calls f on every node below node, in no particular order; f must not
// create nodes. A large subtree is scattered over the heap, and waiting for
// each node, then its op list, then its ops would dominate the walk: the
// nodes are visited breadth first from a list, with the memory of the nodes
// a few places further on loading meanwhile.
template <typename Fn>
void ForEachDescendant(OPNode& node, Fn f) {
  constexpr size_t kAhead = 8;  // places between two loading stages
  std::vector<OPNode*> nodes;
  for (const auto& child : node.children()) nodes.push_back(child.get());
  for (size_t i = 0; i < nodes.size(); ++i) {
    if (i + 3 * kAhead < nodes.size()) PrefetchNodeLists(nodes[i + 3 * kAhead]);
    if (i + 2 * kAhead < nodes.size()) PrefetchOpList(nodes[i + 2 * kAhead]);
    if (i + kAhead < nodes.size()) PrefetchOps(nodes[i + kAhead]);
    for (const auto& child : nodes[i]->children()) nodes.push_back(child.get());
    f(*nodes[i]);
  }
}

// Sets the new op's kind and folds it against every pending op of the node
// by the row's rules; true when it was not absorbed and is to be appended.
bool FoldSimple(OPNode& node, OP& op, FileIndexOP kind, const RuleRow& rules) {
  op.kind = kind;
  ForEachPending(node, [&](OP& e) {
    if (IsMergeable(e.kind)) ApplyRule(rules[e.kind - OP_DELETE], op, e);
  });
  return op.kind != OP_NONE;
}

// Clears in_flight on every way out of InsertEvent.
class InFlight {
 public:
  InFlight(const OP*& slot, const OP* op) : slot_(slot) { slot_ = op; }
  InFlight(const InFlight&) = delete;
  InFlight& operator=(const InFlight&) = delete;
  ~InFlight() { slot_ = nullptr; }

 private:
  const OP*& slot_;
};

}  // namespace

void OPTree::InsertEvent(std::shared_ptr<Event> ev) { Insert(*ev, NodeIndex::KeysOf(ev->path)); }

template <typename Fields>
void OPTree::Insert(const Fields& ev, const PathKeys& keys) {
  OPNode& node = *NodeOf(ev.path, keys);
  // One op object for every bit of the event: a mask with several bits runs
  // several handlers on it, which can revive or absorb it in turn.
  auto op = std::make_shared<OP>(node.shared_from_this(), OP_NONE, std::string(), Json::Value());
  InFlight in_flight(in_flight_, op.get());
  auto fold_simple = [&](FileIndexOP kind, const RuleRow& rules) {
    if (FoldSimple(node, *op, kind, rules)) Append(node, op);
  };
  const uint32_t mask = ev.event;
  if (mask & EVENT_CREATE) {
    ev.is_dir ? FoldReindex(node, op) : fold_simple(OP_UPSERT, kCreateRules);
  }
  if (mask & EVENT_ATTR) fold_simple(OP_ATTR, kAttrRules);
  if (mask & EVENT_MODIFY) fold_simple(OP_UPSERT, kModifyRules);
  if (mask & EVENT_DELETE) {
    // A deleted directory is rescanned: the consumer drops what is gone.
    ev.is_dir ? FoldReindex(node, op) : fold_simple(OP_DELETE, kDeleteRules);
  }
  if (mask & EVENT_RENAME) {
    op->path = ev.path_old;
    FoldRename(node, op);
  }
  if (mask & EVENT_REINDEX) FoldReindex(node, op);
  if (mask & EVENT_UPDATE_CFG) {
    op->data = ev.data;
    fold_simple(OP_UPDATE_CFG, kUpdateCfgRules);
  }
  if (mask & EVENT_QUEUE_CRASHED) crashed_ = true;
}

template void OPTree::Insert<EventFields>(const EventFields& ev, const PathKeys& keys);

void OPTree::HandleCreate(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  if (FoldSimple(*node, *op, OP_UPSERT, kCreateRules)) Append(*node, op);
}

void OPTree::HandleModify(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  if (FoldSimple(*node, *op, OP_UPSERT, kModifyRules)) Append(*node, op);
}

void OPTree::HandleAttr(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  if (FoldSimple(*node, *op, OP_ATTR, kAttrRules)) Append(*node, op);
}

void OPTree::HandleDelete(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  if (FoldSimple(*node, *op, OP_DELETE, kDeleteRules)) Append(*node, op);
}

void OPTree::HandleUpdateCfg(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  if (FoldSimple(*node, *op, OP_UPDATE_CFG, kUpdateCfgRules)) Append(*node, op);
}

void OPTree::HandleReindex(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  FoldReindex(*node, op);
}

void OPTree::HandleRename(std::shared_ptr<OPNode> node, std::shared_ptr<OP> op) {
  FoldRename(*node, op);
}

void OPTree::FoldReindex(OPNode& node, const std::shared_ptr<OP>& op) {
  op->kind = OP_REINDEX;
  ForEachPending(node, [&op](OP& e) {
    switch (e.kind) {
      case OP_DELETE:
      case OP_REINDEX:
        op->kind = OP_NONE;
        break;
      case OP_UPSERT:
      case OP_ATTR:
      case OP_UPDATE_CFG:
        e.kind = OP_REINDEX;  // its data stays as it was
        op->kind = OP_NONE;
        break;
      default:
        break;
    }
  });
  // Everything pending below is covered by the reindex, except renames,
  // which the index still has to carry out. Runs even when the new op was
  // absorbed above.
  ForEachDescendant(node, [](OPNode& descendant) {
    ForEachPending(descendant, [](OP& e) {
      if (e.kind != OP_RENAME) e.kind = OP_NONE;
    });
  });
  if (op->kind != OP_NONE) Append(node, op);
}

void OPTree::FoldRename(OPNode& node_ref, const std::shared_ptr<OP>& op) {
  const std::shared_ptr<OPNode> node = node_ref.shared_from_this();
  const std::string old_path = op->path;
  const std::string new_path = node->GetPath();
  // No file system can move a directory into itself. Following such a line
  // would copy the source's subtree into itself, doubling it with every
  // repetition, so the line is refused before anything changes.
  // (An empty old path is no directory at all: the lookup below refuses it.)
  if (!old_path.empty() && new_path != old_path && IsSameOrBelow(new_path, old_path)) {
    throw Error(kErrorBadArgument, "Rename into its own subtree: " + old_path + " -> " + new_path);
  }
  OPNode& old_node = *NodeOf(old_path);
  // Carries what the source still needed (an upsert, attribute refresh or
  // reindex) to the new path, after the rename itself.
  auto extra = std::make_shared<OP>(node, OP_NONE, "", Json::Value());
  op->kind = OP_RENAME;

  // The target's own pending content changes are superseded by what moves in.
  node->TraverseOP([](std::shared_ptr<OP> e) {
    if (e->kind == OP_DELETE || e->kind == OP_UPSERT || e->kind == OP_ATTR) e->kind = OP_NONE;
  });

  std::vector<std::shared_ptr<OP>> moved;
  old_node.TraverseOP([&](std::shared_ptr<OP> e) {
    if (e->kind == OP_UPSERT || e->kind == OP_ATTR || e->kind == OP_REINDEX) {
      extra->kind = e->kind;  // the last such op wins
      e->kind = OP_NONE;
    }
    moved.push_back(std::move(e));
  });
  MoveOPs(old_node, node, moved);

  FollowRename(old_node, node);

  Append(*node, op);
  if (extra->kind != OP_NONE) Append(*node, extra);
}

// Pending work below the source follows it to the new path, keeping its
// place in the processing order; deletes stay where the files were.
// Visits every descendant d of source in the order of TraverseNodeDescendant
// (post-order, children as they were on entry) and moves d's ops to d', the
// node of d's path with the source's path replaced by the target's. d' is
// found, and created if missing, at the moment d is visited, top-down from
// the target, exactly as a lookup of the rewritten path from the root would;
// but each counterpart is found once and remembered, so a deep subtree costs
// time linear in its size rather than one walk from the root per node.
void OPTree::FollowRename(OPNode& source, const std::shared_ptr<OPNode>& target) {
  // Children are only ever appended, so a frame remembers how many its node
  // had on entry instead of copying them.
  struct Frame {
    OPNode* node;
    size_t next;
    size_t end;
    std::shared_ptr<OPNode> counterpart;  // empty until first needed
  };
  // How many siblings ahead a counterpart's index slot starts loading: the
  // slots are scattered over the whole index, and a large subtree would
  // otherwise wait for memory at every node.
  constexpr size_t kPrefetchAhead = 6;
  std::vector<Frame> stack;
  stack.push_back(Frame{&source, 0, source.children().size(), target});
  auto counterpart_of = [&stack](size_t index) -> const std::shared_ptr<OPNode>& {
    size_t known = index;
    while (!stack[known].counterpart) --known;  // the bottom frame always has one
    for (size_t i = known + 1; i <= index; ++i) {
      stack[i].counterpart = stack[i - 1].counterpart->GetChild(stack[i].node->name());
    }
    return stack[index].counterpart;
  };
  std::vector<std::shared_ptr<OP>> following;
  while (stack.size() > 1 || stack.back().next < stack.back().end) {
    Frame& top = stack.back();
    if (top.next < top.end) {
      const auto& children = top.node->children();
      if (top.counterpart && top.next + kPrefetchAhead < top.end) {
        const OPNode& parent = *top.counterpart;
        parent.index().Prefetch(
            NodeIndex::ChildKey(parent.key(), children[top.next + kPrefetchAhead]->name()));
      }
      OPNode* child = children[top.next++].get();
      stack.push_back(Frame{child, 0, child->children().size(), nullptr});
      continue;
    }
    const std::shared_ptr<OPNode> to = counterpart_of(stack.size() - 1);
    OPNode& from = *top.node;
    stack.pop_back();
    following.clear();
    for (const auto& e : from.ops()) {
      if (e->kind != OP_NONE && e->kind != OP_DELETE) following.push_back(e);
    }
    MoveOPs(from, to, following);
  }
}

}  // namespace fileindex
}  // namespace orvex
