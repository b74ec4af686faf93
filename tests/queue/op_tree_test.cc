#include "orvex/queue/op_tree.h"

#include <gtest/gtest.h>

#include <sstream>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

// Writes queue lines, builds the tree from them and reads back what the
// consumer would be handed, in the printer's format.
class OPTreeTest : public ::testing::Test {
 protected:
  void Push(uint32_t mask, const std::string& path, bool is_dir = false) {
    Json::Value line;
    line["event"] = mask;
    line["is_dir"] = is_dir;
    line["path"] = path;
    lines_.push_back(toString(line));
  }
  void Create(const std::string& path) { Push(EVENT_CREATE, path); }
  void Modify(const std::string& path) { Push(EVENT_MODIFY, path); }
  void Attr(const std::string& path) { Push(EVENT_ATTR, path); }
  void Delete(const std::string& path) { Push(EVENT_DELETE, path); }
  void Reindex(const std::string& path) { Push(EVENT_REINDEX, path); }
  void Rename(const std::string& from, const std::string& to, bool is_dir = false) {
    Json::Value line;
    line["event"] = EVENT_RENAME;
    line["is_dir"] = is_dir;
    line["path"] = to;
    line["path_old"] = from;
    lines_.push_back(toString(line));
  }
  void UpdateCfg(const std::string& path, const std::string& data_json) {
    Json::Value line, data;
    ASSERT_TRUE(fromString(data, data_json));
    line["event"] = EVENT_UPDATE_CFG;
    line["path"] = path;
    line["path_old"] = "";
    line["data"] = data;
    lines_.push_back(toString(line));
  }
  void Raw(const std::string& line) { lines_.push_back(line); }

  std::string WriteQueue() {
    std::string text;
    for (const auto& line : lines_) text += line + "\n";
    return dir_.Write("queue", text);
  }

  std::unique_ptr<OPTree> Build() { return std::make_unique<OPTree>(WriteQueue()); }

  // The ops handed out, printed; the tree's count goes to count_.
  std::vector<std::string> Drain() {
    auto tree = Build();
    std::vector<std::string> out;
    count_ = tree->ProcessOP([&out](std::shared_ptr<OP> op) {
      std::ostringstream text;
      text << op;
      out.push_back(text.str());
    });
    return out;
  }

  using Ops = std::vector<std::string>;
  testing::TempDir dir_;
  testing::LogCapture log_;
  std::vector<std::string> lines_;
  int count_ = -1;
};

TEST_F(OPTreeTest, ContentChangesOfANewFileFoldIntoOneUpsert) {
  Create("/s/f");
  Modify("/s/f");
  Attr("/s/f");
  Modify("/s/f");
  EXPECT_EQ(Drain(), (Ops{"[02] /s/f"}));
  EXPECT_EQ(count_, 1);
}

TEST_F(OPTreeTest, ModifyUpgradesAPendingAttr) {
  Attr("/s/f");
  Modify("/s/f");
  EXPECT_EQ(Drain(), (Ops{"[02] /s/f"}));
  EXPECT_EQ(count_, 1);
}

TEST_F(OPTreeTest, DeleteAfterCreateBecomesDelete) {
  Create("/s/f");
  Delete("/s/f");
  EXPECT_EQ(Drain(), (Ops{"[01] /s/f"}));
}

TEST_F(OPTreeTest, CreateAfterPendingDeleteBecomesUpsert) {
  Delete("/s/f");
  Create("/s/f");
  EXPECT_EQ(Drain(), (Ops{"[02] /s/f"}));
}

TEST_F(OPTreeTest, ModifyAfterPendingDeleteIsAbsorbed) {
  Delete("/s/f");
  Modify("/s/f");
  Attr("/s/f");
  EXPECT_EQ(Drain(), (Ops{"[01] /s/f"}));
}

TEST_F(OPTreeTest, DeleteIsAppendedAfterConfigRenameAndReindex) {
  UpdateCfg("/s/c", R"({"photo":true})");
  Delete("/s/c");
  Reindex("/s/r");
  Delete("/s/r");
  EXPECT_EQ(Drain(), (Ops{R"([04] /s/c, data={"photo":true})", "[01] /s/c", "[06] /s/r",
                          "[01] /s/r"}));
}

TEST_F(OPTreeTest, ConfigUpdatesOfOneFolderMerge) {
  UpdateCfg("/s/p", R"({"document":true,"audio":false,"video":false,"photo":false})");
  UpdateCfg("/s/p", R"({"document":false,"audio":true,"video":false,"photo":false})");
  EXPECT_EQ(Drain(), (Ops{R"([04] /s/p, data={"audio":true,"document":true,"photo":false,)"
                          R"("video":false})"}));
}

TEST_F(OPTreeTest, ConfigUpdateReplacesAPendingUpsertInPlace) {
  Modify("/s/p");
  Create("/s/q");
  UpdateCfg("/s/p", R"({"video":true})");
  EXPECT_EQ(Drain(), (Ops{R"([04] /s/p, data={"video":true})", "[02] /s/q"}));
}

TEST_F(OPTreeTest, DirectoryCreateAndDeleteBecomeReindex) {
  Push(EVENT_CREATE, "/s/d", /*is_dir=*/true);
  Push(EVENT_DELETE, "/s/e", /*is_dir=*/true);
  EXPECT_EQ(Drain(), (Ops{"[06] /s/d", "[06] /s/e"}));
}

TEST_F(OPTreeTest, ReindexCancelsEverythingBelowExceptRenames) {
  Modify("/s/a/b");
  Create("/s/a/b/c");
  Rename("/s/a/x", "/s/a/y");
  Delete("/s/a/b/d");
  Reindex("/s/a");
  EXPECT_EQ(Drain(), (Ops{"[05] /s/a/x -> /s/a/y", "[06] /s/a"}));
  EXPECT_EQ(count_, 5);  // cancelled ops still count
}

TEST_F(OPTreeTest, ReindexUpgradesPendingWorkOnItsPathAndKeepsItsPlace) {
  Attr("/s/a");
  Create("/s/b");
  Reindex("/s/a");
  Modify("/s/a");
  EXPECT_EQ(Drain(), (Ops{"[06] /s/a", "[02] /s/b"}));
}

TEST_F(OPTreeTest, ReindexBelowAPendingReindexIsStillCancelledFromAbove) {
  Reindex("/s/a/b");
  Reindex("/s/a");
  Reindex("/s/a/b");  // appended again: nothing above absorbs it
  EXPECT_EQ(Drain(), (Ops{"[06] /s/a", "[06] /s/a/b"}));
}

TEST_F(OPTreeTest, CreateThenRenameYieldsRenameThenUpsertOfTheNewPath) {
  Create("/s/a/x");
  Rename("/s/a/x", "/s/a/y");
  EXPECT_EQ(Drain(), (Ops{"[05] /s/a/x -> /s/a/y", "[02] /s/a/y"}));
}

TEST_F(OPTreeTest, RenamingADirectoryMovesPendingWorkButNotDeletes) {
  Modify("/s/d/f");
  Delete("/s/d/g");
  UpdateCfg("/s/d/sub", R"({"audio":true})");
  Rename("/s/d", "/s/e", /*is_dir=*/true);
  EXPECT_EQ(Drain(), (Ops{"[02] /s/e/f", "[01] /s/d/g", R"([04] /s/e/sub, data={"audio":true})",
                          "[05] /s/d -> /s/e"}));
}

TEST_F(OPTreeTest, RenamingMovesNestedWorkIntoTheNewBranch) {
  Attr("/s/d/a/b/f");
  Modify("/s/d/x");
  Delete("/s/d/a/gone");
  Create("/s/e/old");  // the target directory's own children are left alone
  Rename("/s/d", "/s/e", /*is_dir=*/true);
  Modify("/s/e/a/b/f");  // upgrades the moved attribute change
  EXPECT_EQ(Drain(), (Ops{"[02] /s/e/a/b/f", "[02] /s/e/x", "[01] /s/d/a/gone",
                          "[02] /s/e/old", "[05] /s/d -> /s/e"}));
}

TEST_F(OPTreeTest, RenamingIntoItsOwnSubtreeIsRefused) {
  // Impossible on a real file system; followed literally, each such line
  // would copy the subtree into itself and double it.
  Modify("/s/a/f");
  Rename("/s/a", "/s/a/b", /*is_dir=*/true);
  Rename("/s/a", "/s/ab", /*is_dir=*/true);  // a sibling, not a subtree
  EXPECT_EQ(Drain(), (Ops{"[02] /s/ab/f", "[05] /s/a -> /s/ab"}));
  EXPECT_EQ(log_.Matching("reason=Rename into its own subtree: /s/a -> /s/a/b").size(), 1u);
}

TEST_F(OPTreeTest, RenameCancelsTheTargetsContentChanges) {
  UpdateCfg("/s/y", R"({"photo":true})");
  Delete("/s/y");  // appended after the configuration update
  Create("/s/w");
  Rename("/s/x", "/s/y");
  Rename("/s/v", "/s/w");
  EXPECT_EQ(Drain(), (Ops{R"([04] /s/y, data={"photo":true})", "[05] /s/x -> /s/y",
                          "[05] /s/v -> /s/w"}));
}

TEST_F(OPTreeTest, RenameCarriesAPendingReindexToTheNewPath) {
  Reindex("/s/d");
  Delete("/s/d");
  Rename("/s/d", "/s/e", /*is_dir=*/true);
  // The pending delete moves with the source: it now reports the new path.
  EXPECT_EQ(Drain(), (Ops{"[01] /s/e", "[05] /s/d -> /s/e", "[06] /s/e"}));
}

TEST_F(OPTreeTest, ChainedRenamesReportTheLatestPath) {
  Create("/s/a");
  Rename("/s/a", "/s/b");
  Rename("/s/b", "/s/c");
  EXPECT_EQ(Drain(), (Ops{"[05] /s/a -> /s/c", "[05] /s/b -> /s/c", "[02] /s/c"}));
}

TEST_F(OPTreeTest, CreateAndAttrInOneEventCancelThemselves) {
  // Both handlers act on one op object: Attr finds the upsert that Create
  // just appended, which is that very object, and drops it.
  Push(EVENT_CREATE | EVENT_ATTR, "/s/f");
  EXPECT_EQ(Drain(), Ops{});
  EXPECT_EQ(count_, 1);
}

TEST_F(OPTreeTest, CrashMarkStopsReadingAndBecomesOneWholeShareOp) {
  Create("/s/a");
  Modify("/s/b");
  Push(EVENT_QUEUE_CRASHED, "/s");
  // Lines after the mark are never looked at: neither counted nor logged,
  // however many of them there are.
  for (int i = 0; i < 40; ++i) {
    Create("/s/c" + std::to_string(i));
    Raw("not json");
  }
  auto tree = Build();
  EXPECT_TRUE(tree->crashed());
  EXPECT_EQ(tree->lines_read(), 3u);
  EXPECT_EQ(tree->lines_skipped(), 0u);
  EXPECT_TRUE(log_.Matching("event_raw=").empty());
  std::vector<std::string> out;
  int count = tree->ProcessOP([&out, &tree](std::shared_ptr<OP> op) {
    std::ostringstream text;
    text << op;
    out.push_back(text.str());
    EXPECT_EQ(op->node, tree->root());
  });
  EXPECT_EQ(out, (Ops{"[07] "}));
  EXPECT_EQ(count, 1);
  EXPECT_EQ(log_.Matching("Queue crashed: " + tree->queue_path()).size(), 1u);
}

TEST_F(OPTreeTest, BadLinesAreLoggedAndSkipped) {
  Create("/s/a");
  Raw("not json");
  Push(EVENT_CREATE, "/");
  Push(EVENT_CREATE, "");
  Raw(R"({"event":"64","path":"/s/b"})");
  Rename("", "/s/z");
  Create("/s/c");
  auto tree = Build();
  EXPECT_EQ(tree->lines_read(), 7u);
  EXPECT_EQ(tree->lines_skipped(), 5u);
  auto failures = log_.Matching("InsertEvent failed, event_raw=");
  ASSERT_EQ(failures.size(), 5u);
  EXPECT_NE(failures[1].find("code=9999, reason=GetNodeByPath failed, path=/"), std::string::npos);
  EXPECT_NE(failures[0].find("code=906, reason=Malformed event_raw: not json"), std::string::npos);
  EXPECT_NE(failures[4].find("code=9999, reason=GetNodeByPath failed, path="), std::string::npos);
  std::vector<std::string> out;
  tree->ProcessOP([&out](std::shared_ptr<OP> op) { out.push_back(op->node->GetPath()); });
  // The rename with no old path appended nothing before failing.
  EXPECT_EQ(out, (Ops{"/s/a", "/s/c"}));
}

TEST_F(OPTreeTest, TracesEveryEventOnlyAtDebugLevel) {
  Create("/s/a");
  Create("/s/b");
  Build();
  EXPECT_EQ(log_.Matching("Got event: ").size(), 2u);
  int saved = log_level;
  log_level = 6;
  Build();
  log_level = saved;
  EXPECT_EQ(log_.Matching("Got event: ").size(), 2u);
}

TEST_F(OPTreeTest, EmptyQueueHandsOutNothing) {
  EXPECT_EQ(Drain(), Ops{});
  EXPECT_EQ(count_, 0);
}

TEST_F(OPTreeTest, LastLineWithoutNewlineIsRead) {
  std::string path = dir_.Write("q", R"({"event":64,"path":"/s/a"})"
                                     "\n"
                                     R"({"event":64,"path":"/s/b"})");
  OPTree tree(path);
  EXPECT_EQ(tree.lines_read(), 2u);
  EXPECT_EQ(tree.ProcessOP([](std::shared_ptr<OP>) {}), 2);
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

TEST_F(OPTreeTest, HugeLinesNulBytesAndInvalidUtf8DoNotBreakTheBuild) {
  Create("/s/" + std::string(3 << 20, 'x'));
  Raw(std::string("{\"event\":64,\"path\":\"/s/a\0b\"}", 28));
  Create("/s/\xff\xfe/bad");
  Raw(std::string(1 << 20, '['));
  auto tree = Build();
  EXPECT_EQ(tree->lines_read(), 4u);
  std::vector<std::string> paths;
  tree->ProcessOP([&paths](std::shared_ptr<OP> op) { paths.push_back(op->node->GetPath()); });
  ASSERT_GE(paths.size(), 2u);
  EXPECT_EQ(paths.front().size(), 3u + (3u << 20));
  EXPECT_EQ(paths.back(), "/s/\xff\xfe/bad");
}

TEST_F(OPTreeTest, GetNodeByPathAcceptsOnlyCanonicalAbsolutePaths) {
  auto tree = Build();
  EXPECT_EQ(tree->GetNodeByPath("/a/b")->GetPath(), "/a/b");
  EXPECT_EQ(tree->GetNodeByPath("/a"), tree->GetNodeByPath("/a"));
  for (const char* bad : {"", "/", "a", "a/b", "/a//b", "/a/", "//a"}) {
    try {
      tree->GetNodeByPath(bad);
      ADD_FAILURE() << "placed " << bad;
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorInternal);
      EXPECT_EQ(e.reason(), std::string("GetNodeByPath failed, path=") + bad);
    }
  }
  // The walk created the nodes it passed through.
  EXPECT_THROW(tree->GetNodeByPath("/x//y/"), Error);
  ASSERT_EQ(tree->root()->children().size(), 2u);
  EXPECT_EQ(tree->root()->children()[1]->GetChild("y")->GetPath(), "/x/y");
}

TEST_F(OPTreeTest, TraversalIsPostOrderInCreationOrder) {
  auto tree = Build();
  for (const char* path : {"/a/c", "/a/b/d", "/a/b/e", "/f"}) tree->GetNodeByPath(path);
  std::vector<std::string> seen;
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
  Modify(deep + "/f");
  Reindex("/d");
  Rename("/d/d", "/e", /*is_dir=*/true);
  std::weak_ptr<OPNode> leaf;
  {
    auto tree = Build();
    leaf = tree->GetNodeByPath(deep);
    EXPECT_EQ(tree->ProcessOP([](std::shared_ptr<OP>) {}), 3);
  }
  EXPECT_TRUE(leaf.expired());
}

TEST_F(OPTreeTest, AnOpHeldAfterTheTreeIsGoneStillKnowsItsPath) {
  Create("/s/a/b");
  std::shared_ptr<OP> held;
  std::weak_ptr<OPNode> root;
  {
    auto tree = Build();
    root = tree->root();
    tree->ProcessOP([&held](std::shared_ptr<OP> op) { held = op; });
  }
  ASSERT_NE(held, nullptr);
  EXPECT_EQ(held->node->GetPath(), "/s/a/b");
  held.reset();
  EXPECT_TRUE(root.expired());
}

TEST_F(OPTreeTest, AChurningPathKeepsItsNodeListShort) {
  for (int i = 0; i < 5000; ++i) {
    Modify("/s/a/f");
    Reindex("/s/a");
  }
  auto tree = Build();
  EXPECT_LT(tree->GetNodeByPath("/s/a/f")->ops().size(), 64u);
  std::vector<std::string> out;
  tree->ProcessOP([&out](std::shared_ptr<OP> op) { out.push_back(op->node->GetPath()); });
  EXPECT_EQ(out, (Ops{"/s/a"}));
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
