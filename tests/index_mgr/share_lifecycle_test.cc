#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "index_mgr/index_mgr_test_root.h"
#include "index_mgr/share_worker.h"

namespace orvex {
namespace fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using testing::OutcomeOf;

class ShareLifecycleTest : public testing::IndexMgrTestRoot {
 protected:
  void SetUp() override { s1_ = AddShareWithDirs("s1"); }
  std::string s1_;
};

TEST_F(ShareLifecycleTest, AShareWithTwoFoldersHasOneQueueWithBoth) {
  FolderAdd(Array({FolderJson("/s1/b"), FolderJson("/s1/a")}), true);
  UpsertShareWorker("s1");
  EXPECT_EQ(toString(RegistrationOf("s1")),
            R"({"config":[{"ignore":["@eaDir"],"mask":65478,"path":")" + s1_ +
                R"(/b"},{"ignore":["@eaDir"],"mask":65478,"path":")" + s1_ + R"(/a"}],"queue":")" +
                QueuePath("s1") + R"("})");
  DeleteShareWorker("s1");
  EXPECT_FALSE(IsRegistered("s1"));
  DeleteShareWorker("s1");  // already gone: not a failure
}

TEST_F(ShareLifecycleTest, ARegistrationThatCannotBeWrittenFailsWith502) {
  FolderAdd(Array({FolderJson("/s1/a")}), true);
  // Another queue's file where this queue's registration belongs.
  const std::string file = KALO::KALONOTIFYD::MonitorRegistrationPath(QueuePath("s1"), kAppName);
  std::filesystem::create_directories(std::filesystem::path(file).parent_path());
  dir_.Write(file.substr(dir_.path().size() + 1), R"({"queue": "/elsewhere/queue", "config": []})");
  const testing::Outcome upsert = OutcomeOf([] { UpsertShareWorker("s1"); });
  EXPECT_EQ(upsert.code, kErrorSystem);
  EXPECT_EQ(upsert.reason, "MonitorQueue::Upsert failed, share=s1");
  const testing::Outcome del = OutcomeOf([] { DeleteShareWorker("s1"); });
  EXPECT_EQ(del.code, kErrorSystem);
  EXPECT_EQ(del.reason, "MonitorQueue::Delete failed, share=s1");
  EXPECT_EQ(Logged("Failed [!MonitorQueue::Upsert(monitor_queue, kAppName, "
                   "MONITOR_QUEUE_TYPE_APPLICATION)]"),
            1u);
  EXPECT_EQ(Logged("Failed [!MonitorQueue::Delete(share.GetQueuePath(), kAppName, "
                   "MONITOR_QUEUE_TYPE_APPLICATION)]"),
            1u);
}

TEST_F(ShareLifecycleTest, RenameSavesTheFoldersBeforeTheIndexAndQueuesTheRootRename) {
  FolderAdd(Array({FolderJson("/s1/a"), FolderJson("/s1/b")}), true);
  timeline_.clear();
  // The platform renamed the share where it stands.
  const std::string new_root = dir_.Join("volume1/s9");
  std::filesystem::rename(s1_, new_root);
  shares_ = Json::Value(Json::arrayValue);
  share_roots_.clear();
  AddShareAt("s9", new_root);
  share_roots_["s9"] = new_root;

  ShareRename("s1", "s9");

  EXPECT_THAT(Requests(), ElementsAre("elastic index_config_set fileindex_s1"));
  std::vector<testing::Step> steps = Timeline();
  ASSERT_EQ(steps.size(), 1u);
  EXPECT_EQ(toString(steps[0].request["data"]), R"({"data":{"id":"fileindex_s9","path":")" +
                                                    DBPath("s9") + R"("},"id":"fileindex_s1"})");
  EXPECT_EQ(steps[0].at.folders.count("/s9/a"), 1u) << "saved before the index is renamed";
  EXPECT_THAT(steps[0].at.queues["s9"], IsEmpty());
  const std::vector<Json::Value> events = QueueEvents("s9");
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ(events[0]["event"].asInt(), 256);
  EXPECT_EQ(events[0]["path"].asString(), new_root);
  EXPECT_EQ(events[0]["path_old"].asString(), s1_);
}

TEST_F(ShareLifecycleTest, MigrateOfAnIndexedShareRepointsTheIndexAndQueuesTheMove) {
  ShareMigrate("s1", "/volume2/s1", s1_);
  EXPECT_THAT(Requests(), IsEmpty()) << "not indexed: nothing";
  FolderAdd(Array({FolderJson("/s1/a")}), true);
  timeline_.clear();
  ShareMigrate("s1", "/volume2/s1", s1_);
  EXPECT_THAT(Requests(), ElementsAre("elastic index_config_set fileindex_s1"));
  EXPECT_EQ(toString(Timeline()[0].request["data"]),
            R"({"data":{"path":")" + DBPath("s1") + R"("},"id":"fileindex_s1"})");
  const std::vector<Json::Value> events = QueueEvents("s1");
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ(toString(events[0]),
            R"({"data":null,"event":256,"path":")" + s1_ + R"(","path_old":"/volume2/s1"})");
}

TEST_F(ShareLifecycleTest, CheckRecycleQueuesAReindexOfTheRecycleBin) {
  ShareCheckRecycle("s1");
  const std::vector<Json::Value> events = QueueEvents("s1");
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ(toString(events[0]),
            R"({"data":null,"event":65536,"path":")" + s1_ + R"(/#recycle","path_old":""})");
  EXPECT_EQ(OutcomeOf([] { ShareCheckRecycle("nope"); }).code, kErrorNoShare);
}

TEST_F(ShareLifecycleTest, MissingArgumentsAreRefusedInOrder) {
  struct Case {
    const char* what;
    std::function<void()> call;
    std::string reason;
  };
  const Case cases[] = {
      {"rename from", [] { ShareRename("", ""); }, "Missing share_from"},
      {"rename to", [] { ShareRename("s1", ""); }, "Missing share_to"},
      {"migrate all", [] { ShareMigrate("", "", ""); }, "Missing share_name"},
      {"migrate from", [] { ShareMigrate("s1", "", ""); }, "Missing path_from"},
      {"migrate to", [] { ShareMigrate("s1", "/a", ""); }, "Missing path_to"},
  };
  for (const Case& c : cases) {
    const testing::Outcome outcome = OutcomeOf(c.call);
    EXPECT_EQ(outcome.code, kErrorBadArgument) << c.what;
    EXPECT_EQ(outcome.reason, c.reason) << c.what;
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
