#include "orvex/queue/op_tree.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <sstream>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/queue/op.h"
#include "queue/line_reader.h"
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

// A line from "<kind> <path> [<new path> | <data>]": c create, m modify, a attr,
// d delete, i reindex, r/R file/directory rename,
// u config update with JSON data.
std::string Ev(const std::string& shorthand) {
  static const std::map<char, std::pair<uint32_t, bool>> kKinds = {
      {'c', {EVENT_CREATE, false}}, {'m', {EVENT_MODIFY, false}},  {'a', {EVENT_ATTR, false}},
      {'d', {EVENT_DELETE, false}}, {'i', {EVENT_REINDEX, false}}, {'r', {EVENT_RENAME, false}},
      {'R', {EVENT_RENAME, true}}};
  std::istringstream in(shorthand);
  char kind = 0;
  std::string path, extra;
  in >> kind >> path >> extra;
  if (kind == 'u') return R"({"event":131072,"path":")" + path + R"(","data":)" + extra + "}";
  const auto [mask, is_dir] = kKinds.at(kind);
  return mask == EVENT_RENAME ? Line(mask, extra, is_dir, path) : Line(mask, path, is_dir);
}

Ops Split(const std::string& text) {
  Ops parts;
  for (size_t start = 0; start < text.size();) {
    const size_t end = std::min(text.find("; ", start), text.size());
    parts.push_back(text.substr(start, end - start));
    start = end + 2;
  }
  return parts;
}

// The ops handed out, printed; the tree's count goes to count.
Ops Drain(OPTree& tree, int* count = nullptr) {
  Ops out;
  const int n = tree.ProcessOP([&out](std::shared_ptr<OP> op) {
    std::ostringstream text;
    out.push_back((text << op, text.str()));
  });
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
    Ops lines = Split(shorthands);
    for (auto& line : lines) line = Ev(line);
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
      {"content changes of a new file", "c /s/f; m /s/f; a /s/f; m /s/f", "[02] /s/f", 1},
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
      {"reindex cancels below except renames",
       "m /s/a/b; c /s/a/b/c; r /s/a/x /s/a/y; d /s/a/b/d; i /s/a",
       "[05] /s/a/x -> /s/a/y; [06] /s/a", 5},
      {"reindex upgrades in place", "a /s/a; c /s/b; i /s/a; m /s/a", "[06] /s/a; [02] /s/b", 2},
      {"create then rename", "c /s/a/x; r /s/a/x /s/a/y", "[05] /s/a/x -> /s/a/y; [02] /s/a/y", 3},
      // The target's own children stay; the moved attr is upgraded at its new path.
      {"rename moves nested work",
       "a /s/d/a/b/f; m /s/d/x; d /s/d/a/gone; c /s/e/old; R /s/d /s/e; m /s/e/a/b/f",
       "[02] /s/e/a/b/f; [02] /s/e/x; [01] /s/d/a/gone; [02] /s/e/old; [05] /s/d -> /s/e", 5},
      // Followed literally it would copy the subtree into itself.
      {"rename into its own subtree refused", "m /s/a/f; R /s/a /s/a/b; R /s/a /s/ab",
       "[02] /s/ab/f; [05] /s/a -> /s/ab", 2,
       "code=120, reason=Rename into its own subtree: /s/a -> /s/a/b"},
      {"rename cancels the target's content changes",
       R"(u /s/y {"photo":true}; d /s/y; c /s/w; r /s/x /s/y; r /s/v /s/w)",
       R"([04] /s/y, data={"photo":true}; [05] /s/x -> /s/y; [05] /s/v -> /s/w)", 5},
      // The pending delete moves with the source and reports the new path.
      {"rename carries reindex", "i /s/d; d /s/d; R /s/d /s/e",
       "[01] /s/e; [05] /s/d -> /s/e; [06] /s/e", 4},
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
}

TEST_F(OPTreeTest, CrashMarkStopsReadingAndBecomesOneWholeShareOp) {
  std::vector<std::string> lines = {Ev("c /s/a"), Ev("m /s/b"), Line(EVENT_QUEUE_CRASHED, "/s")};
  // Lines after the mark are neither counted nor logged.
  for (int i = 0; i < 4; ++i) {
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
}

TEST_F(OPTreeTest, BadLinesAreLoggedAndSkippedAndEveryLineTraced) {
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
}

TEST_F(OPTreeTest, LongLinesNulBytesInvalidUtf8AndAnUnterminatedLastLine) {
  // The longest line kept: exactly the cap.
  const std::string long_path = "/s/long/" + std::string(1 << 19, 'x');
  std::string at_cap = Ev("c " + long_path);
  const std::string fill(LineReader::kDefaultMaxLine - at_cap.size(), ' ');
  at_cap += fill;
  const std::string text = at_cap + "\n" +
                           std::string("{\"event\":64,\"path\":\"/s/a\0b\"}\n", 29) +
                           R"({"event":64,"path":"/s/a\u0000b"})" + "\n" +
                           R"({"event":256,"path":"/s/b","path_old":"/s/\u0000"})" + "\n" +
                           std::string(1 << 20, '[') + "\n" + Ev("c /s/\xff\xfe/bad");
  OPTree tree(dir_.Write("q", text));
  EXPECT_EQ(tree.lines_read(), 6u);
  EXPECT_EQ(tree.lines_skipped(), 4u);
  EXPECT_EQ(Drain(tree), (Ops{"[02] " + long_path, "[02] /s/\xff\xfe/bad"}));
  const std::string nul_path = R"({"event":64,"path":"/s/a\u0000b"})";
  EXPECT_EQ(log_.Matching("code=906, reason=Malformed event_raw: " + nul_path).size(), 1u);
}

TEST_F(OPTreeTest, OverLongLinesAreSkippedAndLoggedShortenedWhileTheirNeighboursFold) {
  // Valid JSON, and its head alone would scan as a create of /s/evil: the
  // length decides, not the head.
  const std::string long_create = Ev("c /s/evil") + std::string(LineReader::kDefaultMaxLine, ' ');
  const std::string long_garbage(3 * LineReader::kDefaultMaxLine, 'z');
  const std::string text = Ev("c /s/a") + "\n" + long_create + "\n" + Ev("m /s/a") + "\n" +
                           long_garbage + "\n" + Ev("c /s/b") + "\n" + long_garbage;
  auto tree = std::make_unique<OPTree>(dir_.Write("q", text));
  EXPECT_EQ(tree->lines_read(), 6u);
  EXPECT_EQ(tree->lines_skipped(), 3u);
  EXPECT_EQ(Drain(*tree), (Ops{"[02] /s/a", "[02] /s/b"}));
  const auto failures = log_.Matching("InsertEvent failed, event_raw=");
  ASSERT_EQ(failures.size(), 3u);
  const struct {
    std::string head;
    size_t length;
  } expected[] = {{long_create.substr(0, LineReader::kLongLineHead), long_create.size()},
                  {std::string(LineReader::kLongLineHead, 'z'), long_garbage.size()},
                  {std::string(LineReader::kLongLineHead, 'z'), long_garbage.size()}};
  for (size_t i = 0; i < failures.size(); ++i) {
    const std::string& line = failures[i];
    SCOPED_TRACE(line.substr(0, 300));
    const std::string reason = "Malformed event_raw of " + std::to_string(expected[i].length) +
                               " bytes, longer than 1048576: " + expected[i].head + "...";
    EXPECT_NE(line.find("event_raw=" + expected[i].head + "..., code=906, reason=" + reason),
              std::string::npos);
    EXPECT_LT(line.size(), 800u);
  }
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
  EXPECT_NE(ab, tree->GetNodeByPath("/abc"));
  EXPECT_EQ(tree->GetNodeByPath("/a/bc"), bc);
  EXPECT_EQ(tree->GetNodeByPath("/ab/c"), ab);
  // A known path does not make its other spellings acceptable.
  for (const char* bad : {"", "/", "a/b", "/a//bc", "/a/bc/"}) {
    try {
      tree->GetNodeByPath(bad);
      ADD_FAILURE() << "placed " << bad;
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorInternal);
      EXPECT_EQ(e.reason(), std::string("GetNodeByPath failed, path=") + bad);
    }
  }
  // The index finds nodes a failed walk created and nodes made by GetChild.
  EXPECT_THROW(tree->GetNodeByPath("/x//y/"), Error);
  ASSERT_EQ(tree->root()->children().size(), 4u);
  EXPECT_EQ(tree->GetNodeByPath("/x/y"), tree->root()->children()[3]->children().at(0));
  EXPECT_EQ(tree->GetNodeByPath("/a/bc/direct"), bc->GetChild("direct"));
  // Many siblings: the index grows and finds each name by its exact bytes.
  for (int i = 0; i < 5000; ++i) tree->GetNodeByPath("/big/n" + std::to_string(i));
  auto big = tree->GetNodeByPath("/big");
  for (int i = 0; i < 5000; i += 7) {
    EXPECT_EQ(big->GetChild("n" + std::to_string(i)), big->children()[i]);
  }
  EXPECT_EQ(big->GetChild(std::string("n1\0", 3))->GetPath(), std::string("/big/n1\0", 8));
}

TEST_F(OPTreeTest, ALooseNodeNamedLikeATreeNodeKeepsItsChildrenApart) {
  auto tree = Build({});
  auto real = tree->GetNodeByPath("/a");
  // A tree node as parent but not its child: the two must not mix.
  auto loose = std::make_shared<OPNode>(tree->root(), "a");
  auto loose_child = loose->GetChild("x");
  auto real_child = tree->GetNodeByPath("/a/x");
  EXPECT_NE(real_child, loose_child);
  EXPECT_EQ(real_child->parent(), real);
  EXPECT_EQ(loose->GetChild("x"), loose_child);
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
  // The tree cut its links: a kept node starts over.
  EXPECT_TRUE(dir->children().empty());
  EXPECT_EQ(dir->GetChild("later"), dir->GetChild("later"));
  EXPECT_EQ(dir->children().size(), 1u);
  std::weak_ptr<OPNode> kept = dir;
  OPNode::ReleaseTree(dir);
  dir.reset();
  EXPECT_TRUE(kept.expired());
}

TEST_F(OPTreeTest, DeepPathsAndChurningPathsStayCheap) {
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
  std::vector<std::string> lines;
  for (int i = 0; i < 10000; ++i) lines.push_back(Ev(i % 2 ? "i /s/a" : "m /s/a/f"));
  auto tree = Build(lines);
  EXPECT_LT(tree->GetNodeByPath("/s/a/f")->ops().size(), 64u);
  EXPECT_EQ(Drain(*tree), Ops{"[06] /s/a"});
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
