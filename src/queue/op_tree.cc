#include "orvex/queue/op_tree.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <functional>
#include <string_view>

#include "foundation/check.h"
#include "orvex/foundation/log.h"
#include "queue/event_parser.h"
#include "queue/line_reader.h"
#include "queue/node_index.h"
#include "queue/read_ahead.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "optree";

}  // namespace

OPTree::OPTree(const std::string& queue_path)
    : queue_path_(queue_path), root_(std::make_shared<OPNode>(nullptr, "")) {
  BuildTree();
}

OPTree::~OPTree() {
  // Nodes link to their parents and ops to their nodes with owning pointers,
  // and nodes own their children and ops: nothing would be freed without
  // cutting the downward links.
  ops_.clear();
  OPNode::ReleaseTree(root_);
}
void OPTree::BuildTree() {
  LineReader reader(queue_path_);
  ORVEX_CHECK_AS(!reader.ok(), "!input_stream", kErrorSystem,
                 "Failed to open queue, reason=" + std::string(strerror(errno)));
  ReadAhead lines(reader, root_->index());
  while (!crashed_) {
    AheadLine* line = lines.Next();
    if (line == nullptr) break;
    FoldLine(*line);
  }
}

void OPTree::FoldLine(const AheadLine& line) {
  ++lines_read_;
  if (log_level == 7) LogPlain("%s:%d Got event: %s", kLogSource, __LINE__, line.text.c_str());
  try {
    // BuildTree's reader has the default cap.
    ORVEX_CHECK(line.too_long, kErrorMalformedEvent,
                LongLineReason(line.text, line.length, LineReader::kDefaultMaxLine));
    // What Event's constructor does, without a heap object per line: the
    // common shape was scanned into the line's fields, anything else is
    // parsed afresh by the JSON parser.
    if (line.scanned) {
      Insert(line.fields, line.keys);
    } else {
      EventFields parsed;
      ParseEventJson(line.text, parsed);
      Insert(parsed, NodeIndex::KeysOf(parsed.path));
    }
  } catch (const Error& e) {
    ++lines_skipped_;
    const std::string raw = line.too_long ? LongLineHead(line.text) : line.text;
    LogErrno("%s:%d (%d, %u) InsertEvent failed, event_raw=%s, code=%d, reason=%s", kLogSource,
             __LINE__, static_cast<int>(::getpid()), static_cast<unsigned>(::geteuid()),
             raw.c_str(), static_cast<int>(e.code()), e.reason().c_str());
  }
}

std::shared_ptr<OPNode> OPTree::GetNodeByPath(const std::string& path) {
  return NodeOf(path)->shared_from_this();
}

OPNode* OPTree::NodeOf(const std::string& path) { return NodeOf(path, NodeIndex::KeysOf(path)); }

OPNode* OPTree::NodeOf(const std::string& path, const PathKeys& keys) {
  if (!keys.canonical) return WalkPath(path, false);
  NodeIndex& index = root_->index();
  if (OPNode* known = index.FindPath(keys.key, path)) return known;
  // Every node of the tree is in the index, so a directory found there with
  // the path missing is a directory without that entry yet.
  const std::string_view dir(path.data(), keys.name_start - 1);
  OPNode* parent = dir.empty() ? root_.get() : index.FindPath(keys.dir_key, dir);
  if (parent == nullptr) return WalkPath(path, true);
  return parent->AddChild(std::string_view(path).substr(keys.name_start), keys.key);
}

OPNode* OPTree::WalkPath(const std::string& path, bool canonical) {
  // Walks the non-empty components from the root, creating nodes. The node
  // reached matches the path byte for byte only when the path is canonical:
  // absolute, with no empty component and no trailing slash.
  std::shared_ptr<OPNode> node = root_;
  std::string component;
  size_t pos = 0;
  while (pos < path.size()) {
    size_t next = path.find('/', pos);
    if (next == std::string::npos) next = path.size();
    if (next > pos) {
      component.assign(path, pos, next - pos);
      node = node->GetChild(component);
    }
    pos = next + 1;
  }
  if (!canonical) throw Error(kErrorInternal, "GetNodeByPath failed, path=" + path);
  return node.get();
}

void OPTree::TraverseNodeDescendant(std::shared_ptr<OPNode> node,
                                    const std::function<void(std::shared_ptr<OPNode>)>& f,
                                    bool skip_self) {
  // The recursive walk, with an explicit stack: each node's children are
  // copied as it is entered, so nodes that f creates below a node already
  // entered are not visited.
  struct Frame {
    std::shared_ptr<OPNode> node;
    std::vector<std::shared_ptr<OPNode>> children;
    size_t next;
    bool visit;
  };
  std::vector<Frame> stack;
  stack.push_back(Frame{node, node->children(), 0, !skip_self});
  while (!stack.empty()) {
    Frame& top = stack.back();
    if (top.next < top.children.size()) {
      std::shared_ptr<OPNode> child = top.children[top.next++];
      std::vector<std::shared_ptr<OPNode>> grandchildren = child->children();
      stack.push_back(Frame{std::move(child), std::move(grandchildren), 0, true});
      continue;
    }
    std::shared_ptr<OPNode> done = std::move(top.node);
    bool visit = top.visit;
    stack.pop_back();
    if (visit) f(std::move(done));
  }
}

int OPTree::ProcessOP(const std::function<void(std::shared_ptr<OP>)>& f) {
  if (crashed_) {
    LogPlain("%s:%d Queue crashed: %s", kLogSource, __LINE__, queue_path_.c_str());
    f(std::make_shared<OP>(root_, OP_QUEUE_CRASHED, "", Json::Value()));
    return 1;
  }
  for (size_t i = 0; i < ops_.size(); ++i) {
    std::shared_ptr<OP> op = ops_[i];
    if (op->kind != OP_NONE) f(std::move(op));
  }
  return static_cast<int>(ops_.size());
}

void OPTree::Append(OPNode& node, const std::shared_ptr<OP>& op) {
  ops_.push_back(op);
  node.AttachOP(op, in_flight_);
}

void OPTree::MoveOPs(OPNode& from, const std::shared_ptr<OPNode>& to,
                     const std::vector<std::shared_ptr<OP>>& moved) {
  for (const auto& op : moved) {
    to->AttachOP(op, in_flight_);
    op->node = to;
  }
  // Every occurrence leaves the source, also when source and target are the
  // same node.
  from.DetachOPs(moved);
}

}  // namespace fileindex
}  // namespace orvex
