#include "orvex/queue/op.h"

#include <algorithm>
#include <cstring>
#include <iomanip>
#include <unordered_set>
#include <utility>

#include "orvex/foundation/json.h"
#include "queue/node_index.h"

namespace orvex {
namespace fileindex {

OP::OP(std::shared_ptr<OPNode> node_in, FileIndexOP kind_in, const std::string& path_in,
       const Json::Value& data_in)
    : node(std::move(node_in)), kind(kind_in), path(path_in), data(data_in) {}

void OP::MergeData(const Json::Value& other) {
  // A change that is not an object carries no file-type flags; start from an
  // empty object so that the flags can be set.
  if (!data.isObject()) data = Json::Value(Json::objectValue);
  for (const char* key : {"document", "audio", "video", "photo"}) {
    const Json::Value* incoming = other.isObject() ? other.find(key, key + strlen(key)) : nullptr;
    const bool enable = incoming != nullptr && incoming->isBool() && incoming->asBool();
    const Json::Value& current = data[key];
    data[key] = enable || (current.isBool() && current.asBool());
  }
}

OPNode::OPNode(std::shared_ptr<OPNode> parent, const std::string& name)
    : name_(name),
      parent_(std::move(parent)),
      key_(NodeIndex::kRootKey),
      owned_index_(std::make_unique<NodeIndex>()) {
  index_ = owned_index_.get();
}

OPNode::OPNode(Passkey, std::shared_ptr<OPNode> parent, const std::string& name, uint64_t key)
    : name_(name), parent_(std::move(parent)), key_(key), index_(parent_->index_) {}

OPNode::~OPNode() {
  // Release the chain of parents iteratively: a node held only by its child
  // (after the tree is gone) would otherwise free its ancestors recursively,
  // one stack frame per path component.
  std::shared_ptr<OPNode> up = std::move(parent_);
  while (up && up.use_count() == 1) {
    std::shared_ptr<OPNode> next = std::move(up->parent_);
    up = std::move(next);
  }
}

std::shared_ptr<OPNode> OPNode::GetChild(const std::string& name) {
  if (index_->retired()) {
    // The tree is gone and its index with it: what is left is a detached
    // fragment, searched the plain way.
    for (const auto& child : children_) {
      if (child->name_ == name) return child;
    }
    children_.push_back(std::make_shared<OPNode>(Passkey(), shared_from_this(), name, 0));
    return children_.back();
  }
  const uint64_t key = NodeIndex::ChildKey(key_, name);
  OPNode* child = index_->FindChild(key, this, name);
  if (child == nullptr) child = AddChild(name, key);
  return child->shared_from_this();
}

OPNode* OPNode::AddChild(std::string_view name, uint64_t key) {
  children_.push_back(
      std::make_shared<OPNode>(Passkey(), shared_from_this(), std::string(name), key));
  OPNode* child = children_.back().get();
  index_->Add(key, child);
  return child;
}

std::string OPNode::GetPath() const {
  std::vector<const OPNode*> chain;
  size_t length = 0;
  for (const OPNode* node = this; node->parent_ != nullptr; node = node->parent_.get()) {
    chain.push_back(node);
    length += node->name_.size() + 1;
  }
  std::string path;
  path.reserve(length);
  for (auto it = chain.rbegin(); it != chain.rend(); ++it) {
    path.push_back('/');
    path += (*it)->name_;
  }
  // A parentless node that is not the tree's root still reports its name.
  if (chain.empty()) return name_;
  return path;
}

void OPNode::TraverseOP(const std::function<void(std::shared_ptr<OP>)>& f) {
  // Walk a copy: f may append to or remove from this list. Entries cancelled
  // by the time they are reached are skipped; a cancelled op never revives
  // during a walk, so cancelled entries need not be copied at all.
  // Most nodes hold a handful of ops: their copy lives on the stack.
  constexpr size_t kInline = 8;
  std::shared_ptr<OP> inline_copy[kInline];
  std::vector<std::shared_ptr<OP>> heap_copy;
  std::shared_ptr<OP>* pending = inline_copy;
  if (ops_.size() > kInline) {
    heap_copy.resize(ops_.size());
    pending = heap_copy.data();
  }
  size_t count = 0;
  for (const auto& op : ops_) {
    if (op->kind != OP_NONE) pending[count++] = op;
  }
  for (size_t i = 0; i < count; ++i) {
    if (pending[i]->kind != OP_NONE) f(pending[i]);
  }
}

void OPNode::AttachOP(std::shared_ptr<OP> op, const OP* keep) {
  ops_.push_back(std::move(op));
  if (ops_.size() < kPruneMinimum || ops_.size() < 2 * live_after_prune_) return;
  // Cancelled ops are skipped by every walk and never revive once their event
  // is folded in, so the node may forget them (the tree's list keeps them).
  // Pruning when the list has doubled keeps appends amortised constant and a
  // churning path from growing its list without bound.
  ops_.erase(std::remove_if(ops_.begin(), ops_.end(),
                            [keep](const std::shared_ptr<OP>& e) {
                              return e->kind == OP_NONE && e.get() != keep;
                            }),
             ops_.end());
  live_after_prune_ = ops_.size();
}

void OPNode::DetachOPs(const std::vector<std::shared_ptr<OP>>& moved) {
  if (moved.empty()) return;
  // A node moves a handful of ops at a time: compare them directly.
  constexpr size_t kDirectMaximum = 8;
  if (moved.size() <= kDirectMaximum) {
    ops_.erase(std::remove_if(ops_.begin(), ops_.end(),
                              [&moved](const std::shared_ptr<OP>& e) {
                                for (const auto& gone : moved) {
                                  if (gone == e) return true;
                                }
                                return false;
                              }),
               ops_.end());
    return;
  }
  std::unordered_set<const OP*> gone;
  for (const auto& op : moved) gone.insert(op.get());
  ops_.erase(std::remove_if(ops_.begin(), ops_.end(),
                            [&gone](const std::shared_ptr<OP>& e) { return gone.count(e.get()); }),
             ops_.end());
}

void OPNode::ReleaseTree(const std::shared_ptr<OPNode>& head) {
  // The index goes first: it must not outlive the nodes it points to.
  head->index_->Retire();
  std::vector<std::shared_ptr<OPNode>> nodes{head};
  for (size_t i = 0; i < nodes.size(); ++i) {
    for (const auto& child : nodes[i]->children_) nodes.push_back(child);
  }
  for (const auto& node : nodes) node->ReleaseLinks();
  while (!nodes.empty()) nodes.pop_back();
}

void OPNode::ReleaseLinks() {
  children_.clear();
  ops_.clear();
}

std::ostream& operator<<(std::ostream& out, std::shared_ptr<OP> op) {
  const char fill = out.fill('0');
  out << '[' << std::setw(2) << static_cast<int>(op->kind);
  out.fill(fill);
  out << "] ";
  if (op->kind == OP_RENAME) out << op->path << " -> ";
  if (op->node) out << op->node->GetPath();
  if (op->kind == OP_UPDATE_CFG) out << ", data=" << toString(op->data);
  return out;
}

std::ostream& operator<<(std::ostream& out, std::shared_ptr<OPNode> node) {
  out << "Node[" << node->GetPath() << "]: ";
  for (const auto& op : node->ops()) out << "\n  " << op;
  return out;
}

}  // namespace fileindex
}  // namespace orvex
