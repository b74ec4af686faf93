// The lookups behind GetNodeByPath and GetChild: the full-path index must
// always answer as a walk from the root would, whoever created the nodes.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/queue/op_tree.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

class OPTreeIndexTest : public ::testing::Test {
 protected:
  std::unique_ptr<OPTree> EmptyTree() {
    return std::make_unique<OPTree>(dir_.Write("queue", ""));
  }

  testing::TempDir dir_;
};

// The node of path found by walking the children by name, or null.
std::shared_ptr<OPNode> Walk(const std::shared_ptr<OPNode>& root, const std::string& path) {
  std::shared_ptr<OPNode> node = root;
  size_t pos = 1;
  while (node && pos <= path.size()) {
    size_t next = path.find('/', pos);
    if (next == std::string::npos) next = path.size();
    const std::string name = path.substr(pos, next - pos);
    std::shared_ptr<OPNode> found;
    for (const auto& child : node->children()) {
      if (child->name() == name) found = child;
    }
    node = found;
    pos = next + 1;
  }
  return node;
}

TEST_F(OPTreeIndexTest, PathsThatShareTheirBytesButNotTheirComponentsStayApart) {
  auto tree = EmptyTree();
  auto bc = tree->GetNodeByPath("/a/bc");
  auto ab = tree->GetNodeByPath("/ab/c");
  auto abc = tree->GetNodeByPath("/abc");
  EXPECT_NE(bc, ab);
  EXPECT_NE(ab, abc);
  EXPECT_EQ(bc->GetPath(), "/a/bc");
  EXPECT_EQ(ab->GetPath(), "/ab/c");
  EXPECT_EQ(tree->GetNodeByPath("/a/bc"), bc);
  EXPECT_EQ(tree->GetNodeByPath("/ab/c"), ab);
  // A known path does not make its non-canonical spellings acceptable.
  for (const char* bad : {"/a/bc/", "/a//bc", "//a/bc"}) {
    EXPECT_THROW(tree->GetNodeByPath(bad), Error) << bad;
  }
}

TEST_F(OPTreeIndexTest, FindsNodesCreatedBehindItsBack) {
  auto tree = EmptyTree();
  auto dir = tree->GetNodeByPath("/s/dir");
  // Created directly, and by a walk that then failed: neither was indexed.
  auto direct = dir->GetChild("direct");
  EXPECT_THROW(tree->GetNodeByPath("/s/dir/walked/"), Error);
  EXPECT_EQ(tree->GetNodeByPath("/s/dir/direct"), direct);
  EXPECT_EQ(tree->GetNodeByPath("/s/dir/walked"), Walk(tree->root(), "/s/dir/walked"));
  EXPECT_EQ(dir->children().size(), 2u);
}

TEST_F(OPTreeIndexTest, RenamedBranchesAreFoundAtTheirNewPaths) {
  auto tree = EmptyTree();
  for (int i = 0; i < 50; ++i) {
    auto ev = std::make_shared<Event>(R"({"event":64,"path":"/s/old/d)" + std::to_string(i % 5) +
                                      "/f" + std::to_string(i) + "\"}");
    tree->InsertEvent(ev);
  }
  tree->InsertEvent(std::make_shared<Event>(
      R"({"event":256,"is_dir":true,"path":"/s/new","path_old":"/s/old"})"));
  for (int i = 0; i < 50; ++i) {
    const std::string path = "/s/new/d" + std::to_string(i % 5) + "/f" + std::to_string(i);
    auto node = tree->GetNodeByPath(path);
    EXPECT_EQ(node, Walk(tree->root(), path)) << path;
    ASSERT_EQ(node->ops().size(), 1u) << path;
    EXPECT_EQ(node->ops()[0]->kind, OP_UPSERT) << path;
  }
}

TEST_F(OPTreeIndexTest, ABigDirectoryKeepsItsOrderAndFindsEveryName) {
  auto tree = EmptyTree();
  std::vector<std::shared_ptr<OPNode>> made;
  for (int i = 0; i < 5000; ++i) {
    made.push_back(tree->GetNodeByPath("/s/big/n" + std::to_string(i)));
  }
  auto big = tree->GetNodeByPath("/s/big");
  ASSERT_EQ(big->children().size(), made.size());
  for (size_t i = 0; i < made.size(); ++i) {
    EXPECT_EQ(big->children()[i], made[i]);
    EXPECT_EQ(big->GetChild("n" + std::to_string(i)), made[i]);
  }
  EXPECT_EQ(big->children().size(), made.size());
  EXPECT_EQ(big->GetChild(std::string("n1\0", 3))->GetPath(), std::string("/s/big/n1\0", 10));
  EXPECT_EQ(big->children().size(), made.size() + 1);
}

TEST_F(OPTreeIndexTest, ALooseNodeNamedLikeATreeNodeKeepsItsChildrenApart) {
  auto tree = EmptyTree();
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
}

TEST_F(OPTreeIndexTest, NodesHeldAfterTheTreeIsGoneStillGrowAndFindChildren) {
  std::shared_ptr<OPNode> dir;
  {
    auto tree = EmptyTree();
    dir = tree->GetNodeByPath("/s/dir");
    for (int i = 0; i < 100; ++i) tree->GetNodeByPath("/s/dir/f" + std::to_string(i));
  }
  // The tree cut its links: the kept node starts over, and its new children
  // are found again by name.
  EXPECT_TRUE(dir->children().empty());
  auto made = dir->GetChild("later");
  EXPECT_EQ(dir->GetChild("later"), made);
  EXPECT_EQ(made->GetPath(), "/s/dir/later");
  EXPECT_EQ(dir->children().size(), 1u);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
