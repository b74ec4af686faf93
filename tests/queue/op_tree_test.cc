#include "orvex/queue/op_tree.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <sstream>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/queue/op.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

using Ops = std::vector<std::string>;

std::string Line(uint32_t mask, const std::string& path, bool is_dir = false,
                 const std::string& path_old = "") {
  Json::Value line;
  line["event"] = mask;
  line["is_dir"] = is_dir;
  line["path"] = path;
  if (!path_old.empty()) line["path_old"] = path_old;
  return toString(line);
}

// One queue line from "<kind> <path> [<new path> | <data>]": c create, m
// modify, a attr, d delete, i reindex, C and D a directory's create and
// delete, r and R a file's and a directory's rename from path to new path,
// u a configuration update with JSON data.
std::string Ev(const std::string& shorthand) {
  static const std::map<char, std::pair<uint32_t, bool>> kKinds = {
      {'c', {EVENT_CREATE, false}}, {'m', {EVENT_MODIFY, false}},  {'a', {EVENT_ATTR, false}},
      {'d', {EVENT_DELETE, false}}, {'i', {EVENT_REINDEX, false}}, {'C', {EVENT_CREATE, true}},
      {'D', {EVENT_DELETE, true}},  {'r', {EVENT_RENAME, false}},  {'R', {EVENT_RENAME, true}}};
  std::istringstream in(shorthand);
  char kind = 0;
  std::string path, extra;
  in >> kind >> path >> extra;
  if (kind == 'u') return R"({"event":131072,"path":")" + path + R"(","data":)" + extra + "}";
  const auto [mask, is_dir] = kKinds.at(kind);
  return mask == EVENT_RENAME ? Line(mask, extra, is_dir, path) : Line(mask, path, is_dir);
}

// Splits "x; y; z" into its parts.
Ops Split(const std::string& text) {
  Ops parts;
  for (size_t start = 0; start < text.size();) {
    const size_t end = std::min(text.find("; ", start), text.size());
    parts.push_back(text.substr(start, end - start));
    start = end + 2;
  }
  return parts;
}

std::string Print(const std::shared_ptr<OP>& op) {
  std::ostringstream text;
  text << op;
  return text.str();
}

// The ops handed to the consumer, printed; the tree's count goes to count.
Ops Drain(OPTree& tree, int* count = nullptr) {
  Ops out;
  const int n = tree.ProcessOP([&out](std::shared_ptr<OP> op) { out.push_back(Print(op)); });
  if (count != nullptr) *count = n;
  return out;
}

class OPTreeTest : public ::testing::Test {
 protected:
  std::unique_ptr<OPTree> Build(const std::vector<std::string>& lines) {
    std::string text;
    for (const auto& line : lines) text += line + "\n";
    return std::make_unique<OPTree>(dir_.Write("queue", text));
  }

  std::unique_ptr<OPTree> BuildFrom(const std::string& shorthands) {
    Ops lines;
    for (const auto& line : Split(shorthands)) lines.push_back(Ev(line));
    return Build(lines);
  }

  testing::TempDir dir_;
  testing::LogCapture log_;
};

struct FoldCase {
  const char* name;
  const char* queue;             // Ev shorthands, "; " between lines
  const char* expected;          // printed ops, "; " between them
  int count;                     // ops ever appended, cancelled ones included
  const char* logged = nullptr;  // a text that must be logged once
};

TEST_F(OPTreeTest, MergeRules) {
  const FoldCase cases[] = {
      {"empty queue", "", "", 0},
      {"content changes of a new file", "c /s/f; m /s/f; a /s/f; m /s/f", "[02] /s/f", 1},
      {"modify upgrades attr", "a /s/f; m /s/f", "[02] /s/f", 1},
      {"delete after create", "c /s/f; d /s/f", "[01] /s/f", 1},
      {"create after delete revives", "d /s/f; c /s/f", "[02] /s/f", 1},
      {"modify after delete absorbed", "d /s/f; m /s/f; a /s/f", "[01] /s/f", 1},
      {"delete appended after config and reindex",
       R"(u /s/c {"photo":true}; d /s/c; i /s/r; d /s/r)",
       R"([04] /s/c, data={"photo":true}; [01] /s/c; [06] /s/r; [01] /s/r)", 4},
      {"config updates merge",
       R"(u /s/p {"document":true,"audio":false}; u /s/p {"document":false,"audio":true})",
       R"([04] /s/p, data={"audio":true,"document":true,"photo":false,"video":false})", 1},
      {"config replaces upsert in place", R"(m /s/p; c /s/q; u /s/p {"video":true})",
       R"([04] /s/p, data={"video":true}; [02] /s/q)", 2},
      {"directory create and delete reindex", "C /s/d; D /s/e", "[06] /s/d; [06] /s/e", 2},
      {"reindex cancels below except renames",
       "m /s/a/b; c /s/a/b/c; r /s/a/x /s/a/y; d /s/a/b/d; i /s/a",
       "[05] /s/a/x -> /s/a/y; [06] /s/a", 5},
      {"reindex upgrades in place", "a /s/a; c /s/b; i /s/a; m /s/a", "[06] /s/a; [02] /s/b", 2},
      {"reindex below a reindex", "i /s/a/b; i /s/a; i /s/a/b", "[06] /s/a; [06] /s/a/b", 3},
      {"create then rename", "c /s/a/x; r /s/a/x /s/a/y", "[05] /s/a/x -> /s/a/y; [02] /s/a/y", 3},
      {"directory rename moves work but not deletes",
       R"(m /s/d/f; d /s/d/g; u /s/d/sub {"audio":true}; R /s/d /s/e)",
       R"([02] /s/e/f; [01] /s/d/g; [04] /s/e/sub, data={"audio":true}; [05] /s/d -> /s/e)", 4},
      // The target's own children stay; the moved attr is upgraded at its new path.
      {"rename moves nested work",
       "a /s/d/a/b/f; m /s/d/x; d /s/d/a/gone; c /s/e/old; R /s/d /s/e; m /s/e/a/b/f",
       "[02] /s/e/a/b/f; [02] /s/e/x; [01] /s/d/a/gone; [02] /s/e/old; [05] /s/d -> /s/e", 5},
      // Impossible on a file system; followed literally it would copy the
      // subtree into itself and double it with each such line.
      {"rename into its own subtree refused", "m /s/a/f; R /s/a /s/a/b; R /s/a /s/ab",
       "[02] /s/ab/f; [05] /s/a -> /s/ab", 2,
       "code=120, reason=Rename into its own subtree: /s/a -> /s/a/b"},
      {"rename cancels the target's content changes",
       R"(u /s/y {"photo":true}; d /s/y; c /s/w; r /s/x /s/y; r /s/v /s/w)",
       R"([04] /s/y, data={"photo":true}; [05] /s/x -> /s/y; [05] /s/v -> /s/w)", 5},
      // The pending delete moves with the source and reports the new path.
      {"rename carries reindex", "i /s/d; d /s/d; R /s/d /s/e",
       "[01] /s/e; [05] /s/d -> /s/e; [06] /s/e", 4},
      {"chained renames", "c /s/a; r /s/a /s/b; r /s/b /s/c",
       "[05] /s/a -> /s/c; [05] /s/b -> /s/c; [02] /s/c", 5},
  };
  for (const FoldCase& c : cases) {
    SCOPED_TRACE(c.name);
    testing::LogCapture log;
    int count = -1;
    EXPECT_EQ(Drain(*BuildFrom(c.queue), &count), Split(c.expected));
    EXPECT_EQ(count, c.count);
    if (c.logged != nullptr) {
      EXPECT_EQ(log.Matching(c.logged).size(), 1u);
    }
  }
  // Create appends the op, then Attr finds that very object and drops it.
  int count = -1;
  EXPECT_EQ(Drain(*Build({Line(EVENT_CREATE | EVENT_ATTR, "/s/f")}), &count), Ops{});
  EXPECT_EQ(count, 1);
}

TEST_F(OPTreeTest, CrashMarkStopsReadingAndBecomesOneWholeShareOp) {
  std::vector<std::string> lines = {Ev("c /s/a"), Ev("m /s/b"), Line(EVENT_QUEUE_CRASHED, "/s")};
  // Lines after the mark are never looked at: neither counted nor logged.
  for (int i = 0; i < 40; ++i) {
    lines.push_back(Ev("c /s/c" + std::to_string(i)));
    lines.push_back("not json");
  }
  auto tree = Build(lines);
  EXPECT_TRUE(tree->crashed());
  EXPECT_EQ(tree->lines_read(), 3u);
  EXPECT_EQ(tree->lines_skipped(), 0u);
  EXPECT_TRUE(log_.Matching("event_raw=").empty());
  int count = 0;
  EXPECT_EQ(Drain(*tree, &count), Ops{"[07] "});
  EXPECT_EQ(count, 1);
  const auto logged = log_.Matching(" Queue crashed: " + tree->queue_path());
  ASSERT_EQ(logged.size(), 1u);
  EXPECT_EQ(logged[0].rfind("optree:", 0), 0u);
  tree->ProcessOP([&tree](std::shared_ptr<OP> op) { EXPECT_EQ(op->node, tree->root()); });
}

TEST_F(OPTreeTest, BadLinesAreLoggedAndSkippedAndEveryLineTracedAtDebugLevel) {
  auto tree = Build({Ev("c /s/a"), "not json", Line(EVENT_CREATE, "/"), Line(EVENT_CREATE, ""),
                     R"({"event":"64","path":"/s/b"})", Line(EVENT_RENAME, "/s/z"), Ev("c /s/c")});
  EXPECT_EQ(tree->lines_read(), 7u);
  EXPECT_EQ(tree->lines_skipped(), 5u);
  const auto failures = log_.Matching("InsertEvent failed, event_raw=");
  ASSERT_EQ(failures.size(), 5u);
  EXPECT_NE(failures[0].find("event_raw=not json, code=906, reason=Malformed event_raw: not json"),
            std::string::npos);
  EXPECT_NE(failures[1].find("code=9999, reason=GetNodeByPath failed, path=/"), std::string::npos);
  EXPECT_NE(failures[3].find("code=120, reason="), std::string::npos);
  EXPECT_NE(failures[4].find("code=9999, reason=GetNodeByPath failed, path="), std::string::npos);
  // The rename with no old path appended nothing before failing.
  EXPECT_EQ(Drain(*tree), (Ops{"[02] /s/a", "[02] /s/c"}));
  EXPECT_EQ(log_.Matching("Got event: ").size(), 7u);
  const int saved = log_level;
  log_level = 6;
  BuildFrom("c /s/a");
  log_level = saved;
  EXPECT_EQ(log_.Matching("Got event: ").size(), 7u);
}

TEST_F(OPTreeTest, HugeLinesNulBytesInvalidUtf8AndAnUnterminatedLastLine) {
  const std::string huge = "/s/" + std::string(3 << 20, 'x');
  const std::string text = Ev("c " + huge) + "\n" +
                           std::string("{\"event\":64,\"path\":\"/s/a\0b\"}\n", 29) +
                           std::string(1 << 20, '[') + "\n" + Ev("c /s/\xff\xfe/bad");
  OPTree tree(dir_.Write("q", text));
  EXPECT_EQ(tree.lines_read(), 4u);
  std::vector<std::string> paths;
  tree.ProcessOP([&paths](std::shared_ptr<OP> op) { paths.push_back(op->node->GetPath()); });
  ASSERT_GE(paths.size(), 2u);
  EXPECT_EQ(paths.front(), huge);
  EXPECT_EQ(paths.back(), "/s/\xff\xfe/bad");
}

TEST_F(OPTreeTest, MissingQueueOrADirectoryFailsWith502) {
  for (const std::string& path : {dir_.Join("absent"), dir_.path()}) {
    try {
      OPTree tree(path);
      ADD_FAILURE() << "built a tree from " << path;
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorSystem);
      EXPECT_EQ(e.reason().rfind("Failed to open queue, reason=", 0), 0u) << e.reason();
    }
  }
  EXPECT_EQ(log_.Matching("Failed [!input_stream], reason: Failed to open queue").size(), 2u);
}

TEST_F(OPTreeTest, GetNodeByPathPlacesOnlyCanonicalPathsAndKeepsLookalikesApart) {
  auto tree = Build({});
  auto bc = tree->GetNodeByPath("/a/bc");
  auto ab = tree->GetNodeByPath("/ab/c");
  EXPECT_NE(bc, ab);
  EXPECT_NE(ab, tree->GetNodeByPath("/abc"));
  EXPECT_EQ(tree->GetNodeByPath("/a/bc"), bc);
  EXPECT_EQ(tree->GetNodeByPath("/ab/c"), ab);
  EXPECT_EQ(ab->GetPath(), "/ab/c");
  // A known path does not make its other spellings acceptable.
  for (const char* bad : {"", "/", "a", "a/b", "/a//bc", "/a/bc/", "//a/bc"}) {
    try {
      tree->GetNodeByPath(bad);
      ADD_FAILURE() << "placed " << bad;
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorInternal);
      EXPECT_EQ(e.reason(), std::string("GetNodeByPath failed, path=") + bad);
    }
  }
  // A failed walk still created the nodes it passed; the index finds them,
  // and nodes made directly with GetChild.
  EXPECT_THROW(tree->GetNodeByPath("/x//y/"), Error);
  ASSERT_EQ(tree->root()->children().size(), 4u);
  EXPECT_EQ(tree->GetNodeByPath("/x/y"), tree->root()->children()[3]->children().at(0));
  auto direct = bc->GetChild("direct");
  EXPECT_EQ(tree->GetNodeByPath("/a/bc/direct"), direct);
  // Many siblings: the index grows and still finds each name, in creation
  // order, by its exact bytes.
  for (int i = 0; i < 5000; ++i) tree->GetNodeByPath("/big/n" + std::to_string(i));
  auto big = tree->GetNodeByPath("/big");
  for (int i = 0; i < 5000; i += 7) {
    EXPECT_EQ(big->GetChild("n" + std::to_string(i)), big->children()[i]);
  }
  EXPECT_EQ(big->GetChild(std::string("n1\0", 3))->GetPath(), std::string("/big/n1\0", 8));
  EXPECT_EQ(big->children().size(), 5001u);
}

TEST_F(OPTreeTest, ALooseNodeNamedLikeATreeNodeKeepsItsChildrenApart) {
  auto tree = Build({});
  auto real = tree->GetNodeByPath("/a");
  // Made by hand with a tree node as parent, never its child: what it
  // creates must not answer for the tree's paths, nor the other way round.
  auto loose = std::make_shared<OPNode>(tree->root(), "a");
  auto loose_child = loose->GetChild("x");
  auto real_child = tree->GetNodeByPath("/a/x");
  EXPECT_NE(real_child, loose_child);
  EXPECT_EQ(real_child->parent(), real);
  EXPECT_EQ(loose->GetChild("x"), loose_child);
  EXPECT_EQ(real->GetChild("x"), real_child);
  EXPECT_EQ(loose_child->GetPath(), "/a/x");
  // Its children hold it: only cutting the links frees them.
  std::weak_ptr<OPNode> gone = loose_child;
  loose_child.reset();
  OPNode::ReleaseTree(loose);
  EXPECT_TRUE(gone.expired());
}

TEST_F(OPTreeTest, OpsAndNodesHeldAfterTheTreeIsGone) {
  std::shared_ptr<OP> held;
  std::weak_ptr<OPNode> top;
  std::shared_ptr<OPNode> dir;
  {
    auto tree = BuildFrom("c /t/a/b");
    tree->ProcessOP([&held](std::shared_ptr<OP> op) { held = op; });
    top = tree->GetNodeByPath("/t");
    dir = tree->GetNodeByPath("/s/dir");
    for (int i = 0; i < 100; ++i) tree->GetNodeByPath("/s/dir/f" + std::to_string(i));
  }
  ASSERT_NE(held, nullptr);
  EXPECT_EQ(held->node->GetPath(), "/t/a/b");
  held.reset();
  EXPECT_TRUE(top.expired());
  // The tree cut its links: a kept node starts over and finds its new
  // children again by name.
  EXPECT_TRUE(dir->children().empty());
  auto later = dir->GetChild("later");
  EXPECT_EQ(dir->GetChild("later"), later);
  EXPECT_EQ(later->GetPath(), "/s/dir/later");
  EXPECT_EQ(dir->children().size(), 1u);
  std::weak_ptr<OPNode> kept = dir;
  later.reset();
  OPNode::ReleaseTree(dir);
  dir.reset();
  EXPECT_TRUE(kept.expired());
}

TEST_F(OPTreeTest, TraversalIsPostOrderInCreationOrder) {
  auto tree = Build({});
  for (const char* path : {"/a/c", "/a/b/d", "/a/b/e", "/f"}) tree->GetNodeByPath(path);
  Ops seen;
  auto record = [&seen](std::shared_ptr<OPNode> node) { seen.push_back(node->GetPath()); };
  OPTree::TraverseNodeDescendant(tree->GetNodeByPath("/a"), record, /*skip_self=*/true);
  EXPECT_EQ(seen, (Ops{"/a/c", "/a/b/d", "/a/b/e", "/a/b"}));
  seen.clear();
  OPTree::TraverseNodeDescendant(tree->root(), record, /*skip_self=*/false);
  EXPECT_EQ(seen, (Ops{"/a/c", "/a/b/d", "/a/b/e", "/a/b", "/a", "/f", ""}));
}

TEST_F(OPTreeTest, DeepPathsNeitherRecurseNorLeak) {
  std::string deep;
  for (int i = 0; i < 200000; ++i) deep += "/d";
  std::weak_ptr<OPNode> leaf;
  {
    auto tree = BuildFrom("m " + deep + "/f; i /d; R /d/d /e");
    leaf = tree->GetNodeByPath(deep);
    int count = 0;
    Drain(*tree, &count);
    EXPECT_EQ(count, 3);
  }
  EXPECT_TRUE(leaf.expired());
}

TEST_F(OPTreeTest, AChurningPathKeepsItsNodeListShort) {
  std::vector<std::string> lines;
  for (int i = 0; i < 5000; ++i) {
    lines.push_back(Ev("m /s/a/f"));
    lines.push_back(Ev("i /s/a"));
  }
  auto tree = Build(lines);
  EXPECT_LT(tree->GetNodeByPath("/s/a/f")->ops().size(), 64u);
  EXPECT_EQ(Drain(*tree), Ops{"[06] /s/a"});
}

TEST_F(OPTreeTest, TraverseOPSkipsCancelledAndIgnoresChangesDuringTheWalk) {
  auto tree = Build({});
  auto node = tree->GetNodeByPath("/f");
  auto live = std::make_shared<OP>(node, OP_UPSERT, "", Json::Value());
  auto cancelled = std::make_shared<OP>(node, OP_NONE, "", Json::Value());
  auto later = std::make_shared<OP>(node, OP_ATTR, "", Json::Value());
  for (const auto& op : {live, cancelled, later}) node->AttachOP(op, nullptr);
  std::vector<OP*> seen;
  node->TraverseOP([&](std::shared_ptr<OP> op) {
    seen.push_back(op.get());
    node->AttachOP(std::make_shared<OP>(node, OP_DELETE, "", Json::Value()), nullptr);
    later->kind = OP_NONE;  // cancelled before it is reached: skipped
  });
  EXPECT_EQ(seen, (std::vector<OP*>{live.get()}));
  EXPECT_EQ(node->ops().size(), 4u);
}

TEST_F(OPTreeTest, PrinterRestoresTheStreamFill) {
  auto tree = Build({});
  std::ostringstream out;
  out << std::make_shared<OP>(tree->GetNodeByPath("/x"), OP_DELETE, "", Json::Value());
  out.width(3);
  out << 7;
  EXPECT_EQ(out.str(), "[01] /x  7");
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
