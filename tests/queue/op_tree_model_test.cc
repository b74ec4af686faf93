// OPTree against a naive model of the merge rules on seeded random queues: nodes
// in a map by full path, ops in a vector by index, every list copied before a
// walk. Slow and literal, so a disagreement points at the tree.

#include <gtest/gtest.h>
#include <json/json.h>

#include <algorithm>
#include <cstdio>
#include <functional>
#include <map>
#include <random>
#include <sstream>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/queue/event.h"
#include "orvex/queue/op.h"
#include "orvex/queue/op_tree.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

using Lines = std::vector<std::string>;

// How often each rule fired, so a generator that stops producing a case fails.
using RuleHits = std::map<std::string, int>;

// Ops handed out, then "count=N" and what() of an escaped exception.
using Outcome = Lines;

// A line the tree logs and skips.
struct Unplaceable {};

// A simple handler meeting a pending op: keep both, drop the new op, merge
// the new data into the pending op, or turn the pending op into the given
// kind (taking the new data for a config update) and drop the new op.
constexpr int kKeepBoth = -1;
constexpr int kDropNew = 0;
constexpr int kMergeData = 100;

// Columns: pending DELETE, UPSERT, ATTR, UPDATE_CFG, RENAME, REINDEX.
constexpr int kCreateRow[6] = {OP_UPSERT, kDropNew, OP_UPSERT, kDropNew, kKeepBoth, kDropNew};
constexpr int kModifyRow[6] = {kDropNew, kDropNew, OP_UPSERT, kDropNew, kKeepBoth, kDropNew};
constexpr int kAttrRow[6] = {kDropNew, kDropNew, kDropNew, kDropNew, kKeepBoth, kDropNew};
constexpr int kDeleteRow[6] = {kDropNew, OP_DELETE, OP_DELETE, kKeepBoth, kKeepBoth, kKeepBoth};
constexpr int kUpdateCfgRow[6] = {kDropNew,   OP_UPDATE_CFG, OP_UPDATE_CFG,
                                  kMergeData, kKeepBoth,     kDropNew};

bool IsBoolTrue(const Json::Value& object, const char* key) {
  return object.isObject() && object[key].isBool() && object[key].asBool();
}

class NaiveModel {
 public:
  explicit NaiveModel(RuleHits& hits) : hits_(hits) { nodes_[""]; }

  void Build(const Lines& lines) {
    testing::LogCapture quiet;
    for (const std::string& line : lines) {
      try {
        InsertEvent(Event(line));
      } catch (const Error&) {
        continue;
      } catch (const Unplaceable&) {
        ++hits_["unplaceable"];
      }
      if (crashed_) break;
    }
  }

  Outcome Process() const {
    if (crashed_) {
      ++hits_["crashed"];
      return {"[07] ", "count=1"};
    }
    Outcome outcome;
    for (size_t i : global_) {
      if (ops_[i].kind != OP_NONE) outcome.push_back(Print(ops_[i]));
    }
    outcome.push_back("count=" + std::to_string(global_.size()));
    return outcome;
  }

 private:
  struct Node {
    std::vector<std::string> children;  // full paths, in creation order
    std::vector<size_t> ops;            // indexes into ops_
  };
  struct Op {
    std::string node;  // full path
    int kind;
    std::string path;
    Json::Value data;
  };

  static std::string Print(const Op& op) {
    std::string text = "[0" + std::to_string(op.kind) + "] ";
    if (op.kind == OP_RENAME) text += op.path + " -> ";
    text += op.node;
    if (op.kind == OP_UPDATE_CFG) text += ", data=" + toString(op.data);
    return text;
  }

  void InsertEvent(const Event& ev) {
    std::string node = GetNodeByPath(ev.path);
    size_t op = NewOp(node);
    if (ev.event & EVENT_CREATE) {
      ev.is_dir ? HandleReindex(node, op) : HandleSimple(node, op, OP_UPSERT, kCreateRow);
    }
    if (ev.event & EVENT_ATTR) HandleSimple(node, op, OP_ATTR, kAttrRow);
    if (ev.event & EVENT_MODIFY) HandleSimple(node, op, OP_UPSERT, kModifyRow);
    if (ev.event & EVENT_DELETE) {
      ev.is_dir ? HandleReindex(node, op) : HandleSimple(node, op, OP_DELETE, kDeleteRow);
    }
    if (ev.event & EVENT_RENAME) {
      ops_[op].path = ev.path_old;
      HandleRename(node, op);
    }
    if (ev.event & EVENT_REINDEX) HandleReindex(node, op);
    if (ev.event & EVENT_UPDATE_CFG) {
      ops_[op].data = ev.data;
      HandleSimple(node, op, OP_UPDATE_CFG, kUpdateCfgRow);
    }
    if (ev.event & EVENT_QUEUE_CRASHED) crashed_ = true;
  }

  size_t NewOp(const std::string& node) {
    ops_.push_back(Op{node, OP_NONE, "", Json::Value()});
    return ops_.size() - 1;
  }

  // A node per non-empty "/" piece; succeeds at the first one matching path.
  std::string GetNodeByPath(const std::string& path) {
    std::string current;
    std::istringstream in(path);
    for (std::string piece; std::getline(in, piece, '/');) {
      if (piece.empty()) continue;
      const std::string child = current + "/" + piece;
      std::vector<std::string>& children = nodes_[current].children;
      if (std::find(children.begin(), children.end(), child) == children.end()) {
        children.push_back(child);
      }
      current = child;
      if (current == path) return current;
    }
    throw Unplaceable();
  }

  void TraverseOP(const std::string& node, const std::function<void(size_t)>& f) {
    for (size_t index : std::vector<size_t>(nodes_[node].ops)) {
      if (ops_[index].kind != OP_NONE) f(index);
    }
  }

  // Post-order, children in creation order, copied when a node is entered.
  void TraverseNodeDescendant(const std::string& node,
                              const std::function<void(const std::string&)>& f, bool skip_self) {
    for (const auto& child : Lines(nodes_[node].children)) TraverseNodeDescendant(child, f, false);
    if (!skip_self) f(node);
  }

  void Append(const std::string& node, size_t op) {
    global_.push_back(op);
    PushOp(node, op);
  }

  void PushOp(const std::string& node, size_t op) {
    nodes_[node].ops.push_back(op);
    if (nodes_[node].ops.size() == 16) ++hits_["long_op_lists"];
  }

  void Move(size_t op, const std::string& from, const std::string& to) {
    PushOp(to, op);
    std::vector<size_t>& list = nodes_[from].ops;
    list.erase(std::remove(list.begin(), list.end(), op), list.end());
    ops_[op].node = to;
  }

  void Drop(size_t op, size_t pending) {
    hits_["self_dropped"] += op == pending;
    ops_[op].kind = OP_NONE;
  }

  void HandleSimple(const std::string& node, size_t op, int kind, const int* row) {
    ops_[op].kind = kind;
    TraverseOP(node, [&](size_t e) {
      const int cell = row[ops_[e].kind - 1];
      if (cell == kKeepBoth) return;
      if (cell == kMergeData) {
        ++hits_["data_merged"];
        for (const char* key : {"document", "audio", "video", "photo"}) {
          ops_[e].data[key] = IsBoolTrue(ops_[op].data, key) || IsBoolTrue(ops_[e].data, key);
        }
      } else if (cell != kDropNew) {
        ops_[e].kind = cell;
        if (cell == OP_UPDATE_CFG) ops_[e].data = ops_[op].data;
      }
      Drop(op, e);
    });
    if (ops_[op].kind != OP_NONE) Append(node, op);
  }

  void HandleReindex(const std::string& node, size_t op) {
    ops_[op].kind = OP_REINDEX;
    TraverseOP(node, [&](size_t e) {
      const int kind = ops_[e].kind;
      if (kind == OP_RENAME) return;
      if (kind == OP_UPSERT || kind == OP_ATTR || kind == OP_UPDATE_CFG) ops_[e].kind = OP_REINDEX;
      Drop(op, e);
    });
    auto cancel = [&](const std::string& d) {
      TraverseOP(d, [&](size_t e) {
        ++hits_[ops_[e].kind == OP_RENAME ? "renames_kept_below_reindex" : "cancelled_below"];
        if (ops_[e].kind != OP_RENAME) ops_[e].kind = OP_NONE;
      });
    };
    TraverseNodeDescendant(node, cancel, /*skip_self=*/true);
    if (ops_[op].kind != OP_NONE) Append(node, op);
  }

  void HandleRename(const std::string& node, size_t op) {
    const std::string old_path = ops_[op].path;
    const std::string new_path = node;
    // A directory cannot move into itself (a literal walk would never end).
    if (new_path.compare(0, old_path.size() + 1, old_path + "/") == 0) {
      ++hits_["renames_into_own_subtree"];
      throw Unplaceable();
    }
    const std::string old_node = GetNodeByPath(old_path);
    if (new_path == old_path) ++hits_["renames_onto_themselves"];
    const size_t extra = NewOp(node);
    ops_[op].kind = OP_RENAME;
    TraverseOP(node, [&](size_t e) {
      const int kind = ops_[e].kind;
      if (kind == OP_DELETE || kind == OP_UPSERT || kind == OP_ATTR) ops_[e].kind = OP_NONE;
    });
    TraverseOP(old_node, [&](size_t e) {
      const int kind = ops_[e].kind;
      if (kind == OP_UPSERT || kind == OP_ATTR || kind == OP_REINDEX) {
        ops_[extra].kind = kind;
        ops_[e].kind = OP_NONE;
      }
      ++hits_["moved_from_source"];
      Move(e, old_node, node);
    });
    auto follow = [&](const std::string& d) {
      const std::string new_d = GetNodeByPath(new_path + d.substr(old_path.size()));
      TraverseOP(d, [&](size_t e) {
        const bool stays = ops_[e].kind == OP_DELETE;
        ++hits_[stays ? "deletes_left_behind" : "moved_from_descendant"];
        if (!stays) Move(e, d, new_d);
      });
    };
    TraverseNodeDescendant(old_node, follow, /*skip_self=*/true);
    Append(node, op);
    if (ops_[extra].kind != OP_NONE) {
      ++hits_["extra_appended"];
      Append(node, extra);
    }
  }

  RuleHits& hits_;
  bool crashed_ = false;
  std::map<std::string, Node> nodes_;  // "" is the root
  std::vector<Op> ops_;                // every op ever made, appended or not
  std::vector<size_t> global_;         // the tree's list: appended ops in order
};

// 1..max_events lines on paths of the first name_count letters at depth
// 0..max_depth under "/s" (now and then "/t").
struct QueueShape {
  const char* name;
  uint32_t first_seed;
  int sequences, max_events, name_count, max_depth, crash_per_mille;
  int min_long_lists;  // nodes whose list must reach 16 entries
};

class QueueGenerator {
 public:
  QueueGenerator(uint32_t seed, const QueueShape& shape) : rng_(seed), shape_(shape) {}

  Lines Sequence() {
    Lines lines(static_cast<size_t>(1 + Pick(shape_.max_events)));
    for (std::string& line : lines) line = Next();
    return lines;
  }

 private:
  int Pick(int n) { return std::uniform_int_distribution<int>(0, n - 1)(rng_); }
  bool Chance(int percent) { return Pick(100) < percent; }

  std::string ValidPath() {
    std::string path = Chance(5) ? "/t" : "/s";
    const int depth = Chance(4) ? 0 : 1 + Pick(shape_.max_depth);
    for (int i = 0; i < depth; ++i) path = ChildOf(path);
    return path;
  }

  // Refused paths; the last three create nodes on the way.
  std::string InvalidPath() {
    static const char* const kInvalid[] = {"", "/", "/s//a", "s/a", "/s/a/"};
    return kInvalid[Pick(5)];
  }

  std::string ChildOf(const std::string& path) {
    return path + "/" + char('a' + Pick(shape_.name_count));
  }

  // Bools either way, values that are not bools, absent and other keys.
  Json::Value RandomFlags() {
    static const char* const kFlags[] = {R"({"document":true,"audio":false})",
                                         R"({"audio":true,"photo":false,"folder":"/s/a"})",
                                         R"({"document":1,"video":"yes","photo":true})", "{}"};
    Json::Value data;
    fromString(data, kFlags[Pick(4)]);
    return data;
  }

  // Self-renames, renames into the own subtree and onto an ancestor all happen.
  void FillRename(Json::Value& line) {
    const std::string path = line["path"].asString();
    const int roll = Pick(100);
    std::string old = ValidPath();
    if (roll < 12) {
      old = path;
    } else if (roll < 18) {
      line["path"] = ChildOf(old);
    } else if (roll < 30) {
      old = ChildOf(path);
    } else if (roll < 36) {
      old = InvalidPath();
    } else if (roll < 39) {
      return;  // no "path_old": renamed from ""
    }
    line["path_old"] = old;
  }

  uint32_t RandomMask() {
    static const uint32_t kBits[] = {EVENT_CREATE, EVENT_ATTR,    EVENT_MODIFY,    EVENT_DELETE,
                                     EVENT_RENAME, EVENT_REINDEX, EVENT_UPDATE_CFG};
    if (Pick(1000) < shape_.crash_per_mille) return EVENT_QUEUE_CRASHED;
    const int roll = Pick(1000);
    if (roll < 60) {  // several bits in one line, now and then an unknown one
      uint32_t mask = Chance(10) ? 0x1 : 0;
      for (int i = 2 + Pick(2); i > 0; --i) mask |= kBits[Pick(7)];
      if (Pick(1000) < 6 * shape_.crash_per_mille) mask |= EVENT_QUEUE_CRASHED;
      return mask;
    }
    if (roll < 70) return 0x8;                                  // a bit nobody handles
    static const char kWeighted[] = "00001112223333444455666";  // indexes into kBits
    return kBits[kWeighted[Pick(23)] - '0'];
  }

  std::string Next() {
    if (Chance(2)) {
      static const char* const kBad[] = {"not json", "", R"({"event":"64","path":"/s/a"})",
                                         R"({"event":64})"};
      return kBad[Pick(4)];
    }
    const uint32_t mask = RandomMask();
    Json::Value line;
    line["event"] = mask;
    if (!Chance(10)) line["is_dir"] = Chance(30);
    line["path"] = Chance(4) ? InvalidPath() : ValidPath();
    if (mask & EVENT_RENAME) FillRename(line);
    if ((mask & EVENT_UPDATE_CFG) && !Chance(8)) line["data"] = RandomFlags();
    return toString(line);
  }

  std::mt19937 rng_;
  const QueueShape& shape_;
};

Outcome RunTree(const Lines& lines, const testing::TempDir& dir) {
  std::string text;
  for (const std::string& line : lines) text += line + "\n";
  // A fresh file each time: truncating one ext4 just wrote flushes on close.
  std::remove(dir.Join("queue").c_str());
  const std::string queue = dir.Write("queue", text);
  testing::LogCapture quiet;
  Outcome outcome;
  try {
    OPTree tree(queue);
    const int count = tree.ProcessOP([&outcome](std::shared_ptr<OP> op) {
      std::ostringstream printed;
      outcome.push_back((printed << op, printed.str()));
    });
    outcome.push_back("count=" + std::to_string(count));
  } catch (const std::exception& e) {
    outcome.push_back(std::string("threw ") + e.what());
  }
  return outcome;
}

TEST(OPTreeModelTest, AgreesWithTheNaiveModelOnSeededRandomQueues) {
  const QueueShape shapes[] = {
      {"random", 1, 2000, 40, 3, 3, 5, 0},
      {"crowded", 100001, 1000, 60, 2, 2, 5, 0},  // nearly every path has pending ops
      // Op lists fill up with cancelled entries and get pruned.
      {"churning", 200001, 300, 200, 1, 1, 1, 50},
  };
  testing::TempDir dir;
  for (const QueueShape& shape : shapes) {
    SCOPED_TRACE(shape.name);
    RuleHits hits;
    int reported = 0;
    for (uint32_t seed = shape.first_seed; seed < shape.first_seed + shape.sequences; ++seed) {
      const Lines lines = QueueGenerator(seed, shape).Sequence();
      NaiveModel model(hits);
      model.Build(lines);
      const Outcome expected = model.Process();
      const Outcome actual = RunTree(lines, dir);
      if (expected == actual) continue;
      ADD_FAILURE() << "seed " << seed << "\nqueue: " << ::testing::PrintToString(lines)
                    << "\nmodel: " << ::testing::PrintToString(expected)
                    << "\ntree:  " << ::testing::PrintToString(actual);
      if (++reported == 3) break;
    }
    for (const char* rule :
         {"unplaceable", "self_dropped", "cancelled_below", "renames_kept_below_reindex",
          "moved_from_source", "moved_from_descendant", "deletes_left_behind", "extra_appended",
          "renames_into_own_subtree", "renames_onto_themselves", "data_merged", "crashed"}) {
      EXPECT_GT(hits[rule], 0) << rule;
    }
    EXPECT_GE(hits["long_op_lists"], shape.min_long_lists);
  }
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
