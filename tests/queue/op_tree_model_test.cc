// Checks OPTree against a deliberately naive model of the merge rules on
// seeded random queues. The model keeps nodes in a map keyed by full path and
// ops in a vector addressed by index, recomputes nothing cleverly, copies every
// list before walking it and recurses freely: slow and obviously literal, so a
// disagreement points at the tree. On a mismatch the test shrinks the queue to
// a minimal failing one and prints it with its seed.

#include <gtest/gtest.h>
#include <json/json.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <exception>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "orvex/foundation/json.h"
#include "orvex/queue/event.h"
#include "orvex/queue/op.h"
#include "orvex/queue/op_tree.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

// One generated queue line and what it means. A line the event parser must
// reject (not JSON, missing or mistyped "event"/"path") has parses false.
struct GenEvent {
  std::string line;
  bool parses = true;
  uint32_t mask = 0;
  bool is_dir = false;
  std::string path;
  std::string path_old;
  Json::Value data;
};

// How often the interesting rules fired over a run, so that a generator that
// stopped producing some case shows up as a failure, not as silent green.
struct RuleHits {
  int unplaceable = 0;
  int self_dropped = 0;
  int cancelled_below_reindex = 0;
  int renames_kept_below_reindex = 0;
  int moved_from_source = 0;
  int moved_from_descendant = 0;
  int deletes_left_behind = 0;
  int extra_appended = 0;
  int renames_into_own_subtree = 0;
  int renames_onto_themselves = 0;
  int data_merged = 0;
  int crashed = 0;
  int long_op_lists = 0;  // a node's list reached 16 entries, cancelled ones included
};

struct Outcome {
  std::vector<std::string> handed_out;
  int count = 0;
  std::string threw;  // what() of an exception that escaped, if any

  bool operator==(const Outcome& other) const {
    return handed_out == other.handed_out && count == other.count && threw == other.threw;
  }
};

std::ostream& operator<<(std::ostream& out, const Outcome& outcome) {
  if (!outcome.threw.empty()) out << "  threw: " << outcome.threw << "\n";
  for (const auto& op : outcome.handed_out) out << "  " << op << "\n";
  return out << "  count=" << outcome.count << "\n";
}

// A path GetNodeByPath cannot place.
struct Unplaceable {};
// The model kept creating nodes. Cannot happen while renames into the
// source's own subtree are refused; kept so that a model regression fails
// loudly instead of exhausting memory.
struct Runaway {};

// Simple-handler outcomes for one (incoming, pending) pair.
enum Cell {
  kNothing,    // both stay, the new op is appended after the pending one
  kDrop,       // drop new
  kToUpsert,   // pending becomes UPSERT; drop new
  kToDelete,   // pending becomes DELETE; drop new
  kToConfig,   // pending becomes UPDATE_CFG with the new data; drop new
  kMergeData,  // pending merges the new data; drop new
};

// Columns: pending DELETE, UPSERT, ATTR, UPDATE_CFG, RENAME, REINDEX.
constexpr Cell kCreateRow[6] = {kToUpsert, kDrop, kToUpsert, kDrop, kNothing, kDrop};
constexpr Cell kModifyRow[6] = {kDrop, kDrop, kToUpsert, kDrop, kNothing, kDrop};
constexpr Cell kAttrRow[6] = {kDrop, kDrop, kDrop, kDrop, kNothing, kDrop};
constexpr Cell kDeleteRow[6] = {kDrop, kToDelete, kToDelete, kNothing, kNothing, kNothing};
constexpr Cell kUpdateCfgRow[6] = {kDrop, kToConfig, kToConfig, kMergeData, kNothing, kDrop};

bool IsBoolTrue(const Json::Value& object, const char* key) {
  if (!object.isObject() || !object.isMember(key)) return false;
  const Json::Value& member = object[key];
  return member.isBool() && member.asBool();
}

// The pieces of path as an istream read with '/' as delimiter yields them:
// an empty piece for a leading or doubled slash, none after a trailing one.
std::vector<std::string> SplitOnSlash(const std::string& path) {
  std::vector<std::string> pieces;
  size_t start = 0;
  while (start < path.size()) {
    size_t slash = path.find('/', start);
    if (slash == std::string::npos) {
      pieces.push_back(path.substr(start));
      break;
    }
    pieces.push_back(path.substr(start, slash - start));
    start = slash + 1;
  }
  return pieces;
}

class NaiveModel {
 public:
  explicit NaiveModel(RuleHits* hits) : hits_(hits) { nodes_[""]; }

  void Build(const std::vector<GenEvent>& events) {
    for (const GenEvent& ev : events) {
      if (!ev.parses) continue;
      try {
        InsertEvent(ev);
      } catch (const Unplaceable&) {
        ++hits_->unplaceable;
      }
      if (crashed_) break;
    }
  }

  Outcome Process() const {
    Outcome outcome;
    if (crashed_) {
      ++hits_->crashed;
      outcome.handed_out.push_back("[07] ");
      outcome.count = 1;
      return outcome;
    }
    for (size_t index : global_) {
      if (ops_[index].kind != OP_NONE) outcome.handed_out.push_back(Print(ops_[index]));
    }
    outcome.count = static_cast<int>(global_.size());
    return outcome;
  }

 private:
  struct Node {
    std::vector<std::string> children;  // full paths, in creation order
    std::vector<size_t> ops;            // indexes into ops_
  };
  struct Op {
    std::string node;  // full path of the op's node
    int kind;
    std::string path;
    Json::Value data;
  };

  static std::string Print(const Op& op) {
    std::string text = "[";
    text += static_cast<char>('0' + op.kind / 10);
    text += static_cast<char>('0' + op.kind % 10);
    text += "] ";
    if (op.kind == OP_RENAME) text += op.path + " -> ";
    text += op.node;
    if (op.kind == OP_UPDATE_CFG) text += ", data=" + toString(op.data);
    return text;
  }

  void InsertEvent(const GenEvent& ev) {
    std::string node = GetNodeByPath(ev.path);
    size_t op = NewOp(node);
    if (ev.mask & EVENT_CREATE) {
      if (ev.is_dir) {
        HandleReindex(node, op);
      } else {
        HandleSimple(node, op, OP_UPSERT, kCreateRow);
      }
    }
    if (ev.mask & EVENT_ATTR) HandleSimple(node, op, OP_ATTR, kAttrRow);
    if (ev.mask & EVENT_MODIFY) HandleSimple(node, op, OP_UPSERT, kModifyRow);
    if (ev.mask & EVENT_DELETE) {
      if (ev.is_dir) {
        HandleReindex(node, op);
      } else {
        HandleSimple(node, op, OP_DELETE, kDeleteRow);
      }
    }
    if (ev.mask & EVENT_RENAME) {
      ops_[op].path = ev.path_old;
      HandleRename(node, op);
    }
    if (ev.mask & EVENT_REINDEX) HandleReindex(node, op);
    if (ev.mask & EVENT_UPDATE_CFG) {
      ops_[op].data = ev.data;
      HandleSimple(node, op, OP_UPDATE_CFG, kUpdateCfgRow);
    }
    if (ev.mask & EVENT_QUEUE_CRASHED) crashed_ = true;
  }

  size_t NewOp(const std::string& node) {
    ops_.push_back(Op{node, OP_NONE, "", Json::Value()});
    return ops_.size() - 1;
  }

  std::string GetChild(const std::string& parent, const std::string& name) {
    std::string child = parent + "/" + name;
    std::vector<std::string>& children = nodes_[parent].children;
    if (std::find(children.begin(), children.end(), child) == children.end()) {
      children.push_back(child);
      nodes_[child];
      if (nodes_.size() > kMaxNodes || child.size() > kMaxPathSize) throw Runaway();
    }
    return child;
  }

  std::string GetNodeByPath(const std::string& path) {
    std::string current;
    for (const std::string& piece : SplitOnSlash(path)) {
      if (piece.empty()) continue;
      current = GetChild(current, piece);
      if (current == path) return current;
    }
    throw Unplaceable();
  }

  void TraverseOP(const std::string& node, const std::function<void(size_t)>& f) {
    std::vector<size_t> copy = nodes_[node].ops;
    for (size_t index : copy) {
      if (ops_[index].kind != OP_NONE) f(index);
    }
  }

  // Post-order, children in creation order, each node's children copied when
  // it is entered.
  void TraverseNodeDescendant(const std::string& node,
                              const std::function<void(const std::string&)>& f, bool skip_self) {
    std::vector<std::string> children = nodes_[node].children;
    for (const std::string& child : children) TraverseNodeDescendant(child, f, false);
    if (!skip_self) f(node);
  }

  void Append(const std::string& node, size_t op) {
    global_.push_back(op);
    PushOp(node, op);
  }

  void PushOp(const std::string& node, size_t op) {
    nodes_[node].ops.push_back(op);
    if (nodes_[node].ops.size() == kLongList) ++hits_->long_op_lists;
  }

  void Move(size_t op, const std::string& from, const std::string& to) {
    PushOp(to, op);
    std::vector<size_t>& list = nodes_[from].ops;
    list.erase(std::remove(list.begin(), list.end(), op), list.end());
    ops_[op].node = to;
  }

  void Drop(size_t op, size_t pending) {
    if (op == pending) ++hits_->self_dropped;
    ops_[op].kind = OP_NONE;
  }

  void MergeData(Json::Value& data, const Json::Value& other) {
    ++hits_->data_merged;
    for (const char* key : {"document", "audio", "video", "photo"}) {
      bool incoming = IsBoolTrue(other, key);
      data[key] = incoming || IsBoolTrue(data, key);
    }
  }

  void HandleSimple(const std::string& node, size_t op, int kind, const Cell* row) {
    ops_[op].kind = kind;
    TraverseOP(node, [&](size_t e) {
      switch (row[ops_[e].kind - 1]) {
        case kNothing:
          return;
        case kDrop:
          break;
        case kToUpsert:
          ops_[e].kind = OP_UPSERT;
          break;
        case kToDelete:
          ops_[e].kind = OP_DELETE;
          break;
        case kToConfig:
          ops_[e].kind = OP_UPDATE_CFG;
          ops_[e].data = ops_[op].data;
          break;
        case kMergeData: {
          Json::Value incoming = ops_[op].data;
          MergeData(ops_[e].data, incoming);
          break;
        }
      }
      Drop(op, e);
    });
    if (ops_[op].kind != OP_NONE) Append(node, op);
  }

  void HandleReindex(const std::string& node, size_t op) {
    ops_[op].kind = OP_REINDEX;
    TraverseOP(node, [&](size_t e) {
      int kind = ops_[e].kind;
      if (kind == OP_RENAME) return;
      if (kind == OP_UPSERT || kind == OP_ATTR || kind == OP_UPDATE_CFG) ops_[e].kind = OP_REINDEX;
      Drop(op, e);
    });
    TraverseNodeDescendant(
        node,
        [&](const std::string& d) {
          TraverseOP(d, [&](size_t e) {
            if (ops_[e].kind == OP_RENAME) {
              ++hits_->renames_kept_below_reindex;
              return;
            }
            ++hits_->cancelled_below_reindex;
            ops_[e].kind = OP_NONE;
          });
        },
        /*skip_self=*/true);
    if (ops_[op].kind != OP_NONE) Append(node, op);
  }

  void HandleRename(const std::string& node, size_t op) {
    const std::string old_path = ops_[op].path;
    const std::string new_path = node;
    // A directory cannot move into itself; followed literally, the walk
    // below the source would meet the copies it makes and never end. Such a
    // line is refused before anything changes, like an unplaceable path.
    if (new_path.compare(0, old_path.size() + 1, old_path + "/") == 0) {
      ++hits_->renames_into_own_subtree;
      throw Unplaceable();
    }
    const std::string old_node = GetNodeByPath(old_path);
    if (new_path == old_path) ++hits_->renames_onto_themselves;
    size_t extra = NewOp(node);
    ops_[op].kind = OP_RENAME;
    TraverseOP(node, [&](size_t e) {
      int kind = ops_[e].kind;
      if (kind == OP_DELETE || kind == OP_UPSERT || kind == OP_ATTR) ops_[e].kind = OP_NONE;
    });
    TraverseOP(old_node, [&](size_t e) {
      int kind = ops_[e].kind;
      if (kind == OP_UPSERT || kind == OP_ATTR || kind == OP_REINDEX) {
        ops_[extra].kind = kind;
        ops_[e].kind = OP_NONE;
      }
      ++hits_->moved_from_source;
      Move(e, old_node, node);
    });
    TraverseNodeDescendant(
        old_node,
        [&](const std::string& d) {
          std::string new_d = GetNodeByPath(new_path + d.substr(old_path.size()));
          TraverseOP(d, [&](size_t e) {
            if (ops_[e].kind == OP_DELETE) {
              ++hits_->deletes_left_behind;
              return;
            }
            ++hits_->moved_from_descendant;
            Move(e, d, new_d);
          });
        },
        /*skip_self=*/true);
    Append(node, op);
    if (ops_[extra].kind != OP_NONE) {
      ++hits_->extra_appended;
      Append(node, extra);
    }
  }

  // Far beyond what a terminating fold of the generated queues creates.
  static constexpr size_t kMaxNodes = 3000;
  static constexpr size_t kMaxPathSize = 300;
  static constexpr size_t kLongList = 16;

  RuleHits* hits_;
  bool crashed_ = false;
  std::map<std::string, Node> nodes_;  // "" is the root
  std::vector<Op> ops_;                // every op ever made, appended or not
  std::vector<size_t> global_;         // the tree's list: appended ops in order
};

// The shape of the random queues: 1..max_events lines on paths made of the
// first name_count letters at depth 1..max_depth under "/s" (now and then
// "/t"); about crash_per_mille lines in a thousand carry the crash mark.
struct QueueShape {
  int max_events;
  int name_count;
  int max_depth;
  int crash_per_mille;
};

class QueueGenerator {
 public:
  QueueGenerator(uint32_t seed, QueueShape shape) : rng_(seed), shape_(shape) {}

  std::vector<GenEvent> Sequence() {
    std::vector<GenEvent> events;
    int n = 1 + Pick(shape_.max_events);
    for (int i = 0; i < n; ++i) events.push_back(Next());
    return events;
  }

 private:
  static constexpr uint32_t kSimpleBits[] = {EVENT_CREATE,    EVENT_ATTR,   EVENT_MODIFY,
                                             EVENT_DELETE,    EVENT_RENAME, EVENT_REINDEX,
                                             EVENT_UPDATE_CFG};

  int Pick(int n) { return std::uniform_int_distribution<int>(0, n - 1)(rng_); }
  bool Chance(int percent) { return Pick(100) < percent; }

  std::string ValidPath() {
    std::string path = Chance(5) ? "/t" : "/s";
    int depth = Chance(4) ? 0 : 1 + Pick(shape_.max_depth);
    for (int i = 0; i < depth; ++i) path = ChildOf(path);
    return path;
  }

  // Paths GetNodeByPath must refuse; the last three create nodes on the way.
  std::string InvalidPath() {
    static const char* const kInvalid[] = {"", "/", "/s//a", "s/a", "/s/a/"};
    return kInvalid[Pick(5)];
  }

  std::string AnyPath() { return Chance(4) ? InvalidPath() : ValidPath(); }

  std::string ChildOf(const std::string& path) {
    return path + "/" + std::string(1, static_cast<char>('a' + Pick(shape_.name_count)));
  }

  Json::Value RandomFlags() {
    Json::Value data(Json::objectValue);
    for (const char* key : {"document", "audio", "video", "photo"}) {
      int roll = Pick(100);
      if (roll < 30) continue;
      if (roll < 60) {
        data[key] = true;
      } else if (roll < 85) {
        data[key] = false;
      } else if (roll < 93) {
        data[key] = 1;  // truthy, but not a bool
      } else {
        data[key] = "yes";
      }
    }
    if (Chance(15)) data["folder"] = "/s/a";
    return data;
  }

  // Fills path_old for a rename so that self-renames, renames into the own
  // subtree and onto an ancestor all happen.
  void FillRename(GenEvent& ev, Json::Value& line) {
    int roll = Pick(100);
    if (roll < 12) {
      ev.path_old = ev.path;
    } else if (roll < 18) {
      ev.path_old = ValidPath();
      ev.path = ChildOf(ev.path_old);  // refused: into its own subtree
      line["path"] = ev.path;
    } else if (roll < 30) {
      ev.path_old = ChildOf(ev.path);
    } else if (roll < 36) {
      ev.path_old = InvalidPath();
    } else if (roll < 39) {
      return;  // no "path_old": renamed from ""
    } else {
      ev.path_old = ValidPath();
    }
    line["path_old"] = ev.path_old;
  }

  uint32_t RandomMask() {
    if (Pick(1000) < shape_.crash_per_mille) return EVENT_QUEUE_CRASHED;
    int roll = Pick(1000);
    if (roll < 60) {
      uint32_t mask = 0;
      int bits = 2 + Pick(2);
      for (int i = 0; i < bits; ++i) mask |= kSimpleBits[Pick(7)];
      if (Chance(10)) mask |= 0x1;
      if (Pick(1000) < 6 * shape_.crash_per_mille) mask |= EVENT_QUEUE_CRASHED;
      return mask;
    }
    if (roll < 70) return 0x8;  // a bit nobody handles
    static const uint32_t kWeighted[] = {
        EVENT_CREATE,     EVENT_CREATE,     EVENT_CREATE,    EVENT_CREATE,  EVENT_MODIFY,
        EVENT_MODIFY,     EVENT_MODIFY,     EVENT_ATTR,      EVENT_ATTR,    EVENT_ATTR,
        EVENT_DELETE,     EVENT_DELETE,     EVENT_DELETE,    EVENT_DELETE,  EVENT_RENAME,
        EVENT_RENAME,     EVENT_RENAME,     EVENT_RENAME,    EVENT_REINDEX, EVENT_REINDEX,
        EVENT_UPDATE_CFG, EVENT_UPDATE_CFG, EVENT_UPDATE_CFG};
    return kWeighted[Pick(sizeof(kWeighted) / sizeof(kWeighted[0]))];
  }

  GenEvent BadLine() {
    static const char* const kBad[] = {"not json",
                                       "",
                                       R"({"path":"/s/a"})",
                                       R"({"event":"64","path":"/s/a"})",
                                       R"({"event":64})",
                                       R"([64,"/s/a"])",
                                       R"({"event":64,"path":7})"};
    GenEvent ev;
    ev.line = kBad[Pick(7)];
    ev.parses = false;
    return ev;
  }

  GenEvent Next() {
    if (Chance(2)) return BadLine();
    GenEvent ev;
    ev.mask = RandomMask();
    ev.path = AnyPath();
    Json::Value line;
    line["event"] = ev.mask;
    if (!Chance(10)) {
      ev.is_dir = Chance(30);
      line["is_dir"] = ev.is_dir;
    }
    line["path"] = ev.path;
    if (ev.mask & EVENT_RENAME) FillRename(ev, line);
    if ((ev.mask & EVENT_UPDATE_CFG) && !Chance(8)) {
      ev.data = RandomFlags();
      line["data"] = ev.data;
    }
    if (Chance(5)) line["ts"] = 1700000000;
    ev.line = toString(line);
    return ev;
  }

  std::mt19937 rng_;
  QueueShape shape_;
};

// The model's outcome, or nullopt when it never finishes folding the queue.
std::optional<Outcome> RunModel(const std::vector<GenEvent>& events, RuleHits* hits) {
  NaiveModel model(hits);
  try {
    model.Build(events);
  } catch (const Runaway&) {
    return std::nullopt;
  }
  return model.Process();
}

Outcome RunTree(const std::vector<GenEvent>& events, const testing::TempDir& dir) {
  std::string text;
  for (const GenEvent& ev : events) text += ev.line + "\n";
  // A fresh file each time: truncating one that ext4 just wrote makes it
  // flush on close, which would turn thousands of tiny queues into seconds.
  std::remove(dir.Join("queue").c_str());
  std::string queue = dir.Write("queue", text);
  testing::LogCapture quiet;
  Outcome outcome;
  try {
    OPTree tree(queue);
    outcome.count = tree.ProcessOP([&outcome](std::shared_ptr<OP> op) {
      std::ostringstream printed;
      printed << op;
      outcome.handed_out.push_back(printed.str());
    });
  } catch (const std::exception& e) {
    outcome.threw = e.what();
  }
  return outcome;
}

// True also when the model never finishes: such a queue is reported on its
// own and must not be run through the tree.
bool Agree(const std::vector<GenEvent>& events, const testing::TempDir& dir) {
  RuleHits ignored;
  std::optional<Outcome> expected = RunModel(events, &ignored);
  return !expected || *expected == RunTree(events, dir);
}

// Drops events one at a time while the disagreement persists.
std::vector<GenEvent> Shrink(std::vector<GenEvent> events, const testing::TempDir& dir) {
  bool shrunk = true;
  while (shrunk) {
    shrunk = false;
    for (size_t i = 0; i < events.size(); ++i) {
      std::vector<GenEvent> fewer = events;
      fewer.erase(fewer.begin() + static_cast<long>(i));
      if (Agree(fewer, dir)) continue;
      events = fewer;
      shrunk = true;
      break;
    }
  }
  return events;
}

std::string Describe(uint32_t seed, const std::vector<GenEvent>& events,
                     const testing::TempDir& dir) {
  RuleHits ignored;
  std::ostringstream text;
  text << "seed " << seed << ", " << events.size() << " lines:\n";
  for (const GenEvent& ev : events) text << "  " << ev.line << "\n";
  text << "model:\n" << *RunModel(events, &ignored) << "tree:\n" << RunTree(events, dir);
  return text.str();
}

// Runs `sequences` seeded queues through both; reports at most a few
// disagreements, each as the full queue and its shrunk form.
void CompareOnSeeds(uint32_t first_seed, int sequences, QueueShape shape, RuleHits* hits) {
  testing::TempDir dir;
  int reported = 0;
  for (uint32_t seed = first_seed; seed < first_seed + static_cast<uint32_t>(sequences); ++seed) {
    std::vector<GenEvent> events = QueueGenerator(seed, shape).Sequence();
    std::optional<Outcome> expected = RunModel(events, hits);
    if (!expected) {
      ADD_FAILURE() << "the model never finishes folding seed " << seed;
      continue;
    }
    Outcome actual = RunTree(events, dir);
    if (*expected == actual) continue;
    ADD_FAILURE() << "tree disagrees with the naive model\n"
                  << Describe(seed, events, dir) << "shrunk to "
                  << Describe(seed, Shrink(events, dir), dir);
    if (++reported == 3) return;
  }
}

void ExpectEveryRuleFired(const RuleHits& hits) {
  EXPECT_GT(hits.unplaceable, 0);
  EXPECT_GT(hits.self_dropped, 0);
  EXPECT_GT(hits.cancelled_below_reindex, 0);
  EXPECT_GT(hits.renames_kept_below_reindex, 0);
  EXPECT_GT(hits.moved_from_source, 0);
  EXPECT_GT(hits.moved_from_descendant, 0);
  EXPECT_GT(hits.deletes_left_behind, 0);
  EXPECT_GT(hits.extra_appended, 0);
  EXPECT_GT(hits.renames_into_own_subtree, 0);
  EXPECT_GT(hits.renames_onto_themselves, 0);
  EXPECT_GT(hits.data_merged, 0);
  EXPECT_GT(hits.crashed, 0);
}

TEST(OPTreeModelTest, AgreesWithNaiveModelOnRandomQueues) {
  RuleHits hits;
  CompareOnSeeds(/*first_seed=*/1, /*sequences=*/2000,
                 QueueShape{/*max_events=*/40, /*name_count=*/3, /*max_depth=*/3,
                            /*crash_per_mille=*/5},
                 &hits);
  ExpectEveryRuleFired(hits);
}

// Two names two deep: nearly every event lands on a path with pending ops.
TEST(OPTreeModelTest, AgreesWithNaiveModelOnCrowdedQueues) {
  RuleHits hits;
  CompareOnSeeds(/*first_seed=*/100001, /*sequences=*/1000,
                 QueueShape{/*max_events=*/60, /*name_count=*/2, /*max_depth=*/2,
                            /*crash_per_mille=*/5},
                 &hits);
  ExpectEveryRuleFired(hits);
}

// One name one deep and long queues: the same few paths churn through
// hundreds of events, so their op lists fill up with cancelled entries.
TEST(OPTreeModelTest, AgreesWithNaiveModelOnChurningPaths) {
  RuleHits hits;
  CompareOnSeeds(/*first_seed=*/200001, /*sequences=*/300,
                 QueueShape{/*max_events=*/200, /*name_count=*/1, /*max_depth=*/1,
                            /*crash_per_mille=*/1},
                 &hits);
  ExpectEveryRuleFired(hits);
  EXPECT_GT(hits.long_op_lists, 50);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
