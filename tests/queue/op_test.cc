#include "orvex/queue/op.h"

#include <gtest/gtest.h>

#include <sstream>

#include "orvex/queue/op_tree.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

// Nodes link both ways; a tree (built from an empty queue) owns them and
// releases the links when the test ends.
class NodeTest : public ::testing::Test {
 protected:
  NodeTest() : tree_(dir_.Write("queue", "")) {}
  std::shared_ptr<OPNode> root() { return tree_.root(); }

  testing::TempDir dir_;
  OPTree tree_;
};
using OPNodeTest = NodeTest;
using OPTest = NodeTest;

std::string Print(const std::shared_ptr<OP>& op) {
  std::ostringstream out;
  out << op;
  return out.str();
}

TEST_F(OPNodeTest, PathsAndChildren) {
  auto root = this->root();
  EXPECT_EQ(root->GetPath(), "");
  auto v = root->GetChild("v");
  EXPECT_EQ(v->GetPath(), "/v");
  auto b = v->GetChild("a")->GetChild("b");
  EXPECT_EQ(b->GetPath(), "/v/a/b");
  EXPECT_EQ(v->GetChild("a"), v->GetChild("a"));
  EXPECT_EQ(v->children().size(), 1u);
}

TEST_F(OPNodeTest, ChildrenKeepCreationOrderAndExactNames) {
  auto root = this->root();
  for (const char* name : {"b", "a", "B", "é", "a "}) root->GetChild(name);
  std::vector<std::string> names;
  for (const auto& child : root->children()) names.push_back(child->name());
  EXPECT_EQ(names, (std::vector<std::string>{"b", "a", "B", "é", "a "}));
}

TEST_F(OPNodeTest, TraverseOPSkipsCancelledAndIgnoresChangesDuringTheWalk) {
  auto root = this->root();
  auto node = root->GetChild("f");
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

TEST_F(OPTest, MergeDataKeepsEveryEnabledClass) {
  auto op = std::make_shared<OP>(nullptr, OP_UPDATE_CFG, "", Json::Value());
  Json::Value mine;
  mine["document"] = false;
  mine["audio"] = true;
  mine["extra"] = "kept";
  op->data = mine;
  Json::Value other;
  other["document"] = true;
  other["video"] = 1;  // not a bool: counts as false
  op->MergeData(other);
  EXPECT_TRUE(op->data["document"].asBool());
  EXPECT_TRUE(op->data["audio"].asBool());
  EXPECT_FALSE(op->data["video"].asBool());
  EXPECT_FALSE(op->data["photo"].asBool());
  EXPECT_TRUE(op->data["photo"].isBool());
  EXPECT_EQ(op->data["extra"].asString(), "kept");
}

TEST_F(OPTest, MergeDataOnANonObjectChangeDoesNotThrow) {
  auto op = std::make_shared<OP>(nullptr, OP_UPDATE_CFG, "", Json::Value("text"));
  Json::Value other;
  other["photo"] = true;
  op->MergeData(other);
  EXPECT_TRUE(op->data["photo"].asBool());
  op->MergeData(Json::Value(Json::arrayValue));
  EXPECT_TRUE(op->data["photo"].asBool());
}

TEST_F(OPTest, PrinterFormats) {
  auto root = this->root();
  auto file = root->GetChild("s")->GetChild("a.txt");
  EXPECT_EQ(Print(std::make_shared<OP>(file, OP_UPSERT, "", Json::Value())), "[02] /s/a.txt");
  EXPECT_EQ(Print(std::make_shared<OP>(file, OP_RENAME, "/s/old", Json::Value())),
            "[05] /s/old -> /s/a.txt");
  Json::Value cfg;
  cfg["document"] = true;
  EXPECT_EQ(Print(std::make_shared<OP>(file, OP_UPDATE_CFG, "", cfg)),
            "[04] /s/a.txt, data={\"document\":true}");
  EXPECT_EQ(Print(std::make_shared<OP>(root, OP_QUEUE_CRASHED, "", Json::Value())), "[07] ");
}

TEST_F(OPTest, PrinterLeavesTheStreamFillAsItWas) {
  auto root = this->root();
  std::ostringstream out;
  out << std::make_shared<OP>(root->GetChild("x"), OP_DELETE, "", Json::Value());
  out.width(3);
  out << 7;
  EXPECT_EQ(out.str(), "[01] /x  7");
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
