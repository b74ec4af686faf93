#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "index_mgr/index_mgr_test_root.h"

namespace orvex {
namespace fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using testing::OutcomeOf;

class PauseResumeTest : public testing::IndexMgrTestRoot {
 protected:
  void SetUp() override {
    s1_ = AddShareWithDirs("s1");
    s2_ = AddShareWithDirs("s2");
    // A share on another volume whose mount point begins like volume1's.
    s10_ = AddShareWithDirs("s10", "volume10/s10");
    FolderAdd(Array({FolderJson("/s1/a"), FolderJson("/s1/b"), FolderJson("/s1/c"),
                     FolderJson("/s2/a"), FolderJson("/s10/a")}),
              true);
    timeline_.clear();
  }

  bool Paused(const std::string& path) const { return Folders().at(path); }

  std::string Volume1() const { return dir_.Join("volume1"); }

  std::string s1_, s2_, s10_;
};

TEST_F(PauseResumeTest, SharePauseSilencesTheDaemonFirstAndFlagsTheFoldersLast) {
  SharePause("s1");
  EXPECT_THAT(Requests(), ElementsAre(R"(fileindexd worker_delete {"share_name":"s1"})",
                                      "elastic index_pause fileindex_s1"));
  std::vector<testing::Step> steps = Timeline();
  ASSERT_EQ(steps.size(), 2u);
  EXPECT_TRUE(steps[0].at.monitor.count(QueuePath("s1")));
  EXPECT_FALSE(steps[1].at.monitor.count(QueuePath("s1")));
  EXPECT_FALSE(steps[1].at.folders.at("/s1/a")) << "flagged only after the index is paused";
  EXPECT_TRUE(Paused("/s1/a") && Paused("/s1/b") && Paused("/s1/c"));
  EXPECT_FALSE(Paused("/s2/a"));
  EXPECT_TRUE(IsRegistered("s2"));
}

TEST_F(PauseResumeTest, ShareResumeWakesTheIndexFirstAndRegistersBeforeTheDaemon) {
  SharePause("s1");
  timeline_.clear();
  ShareResume("s1");
  EXPECT_THAT(Requests(), ElementsAre("elastic index_resume fileindex_s1",
                                      R"(fileindexd worker_create {"share_name":"s1"})"));
  std::vector<testing::Step> steps = Timeline();
  ASSERT_EQ(steps.size(), 2u);
  EXPECT_FALSE(steps[0].at.monitor.count(QueuePath("s1")));
  EXPECT_THAT(steps[1].at.monitor[QueuePath("s1")],
              ElementsAre(s1_ + "/a", s1_ + "/b", s1_ + "/c"));
  EXPECT_TRUE(steps[1].at.folders.at("/s1/a")) << "unflagged only at the end";
  EXPECT_FALSE(Paused("/s1/a") || Paused("/s1/b") || Paused("/s1/c"));
}

TEST_F(PauseResumeTest, AShareWithoutFoldersIsLeftAlone) {
  AddShareWithDirs("idle");
  SharePause("idle");
  ShareResume("idle");
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(PauseResumeTest, VolumePauseSavesFirstThenEachShareOnceInNameOrder) {
  VolumePause(Volume1());
  // The plain prefix test takes volume10's share too.
  EXPECT_THAT(Requests(), ElementsAre(R"(fileindexd worker_delete {"share_name":"s1"})",
                                      "elastic index_pause fileindex_s1",
                                      R"(fileindexd worker_delete {"share_name":"s10"})",
                                      "elastic index_pause fileindex_s10",
                                      R"(fileindexd worker_delete {"share_name":"s2"})",
                                      "elastic index_pause fileindex_s2"));
  std::vector<testing::Step> steps = Timeline();
  ASSERT_EQ(steps.size(), 6u);
  for (const auto& [path, paused] : steps[0].at.folders) EXPECT_TRUE(paused) << path;
  EXPECT_TRUE(steps[0].at.monitor.count(QueuePath("s1")));
  EXPECT_FALSE(steps[1].at.monitor.count(QueuePath("s1")));
  EXPECT_TRUE(steps[2].at.monitor.count(QueuePath("s10")));
  EXPECT_FALSE(steps[3].at.monitor.count(QueuePath("s10")));
  EXPECT_FALSE(IsRegistered("s2"));

  timeline_.clear();
  VolumePause(Volume1());
  EXPECT_THAT(Requests(), IsEmpty()) << "nothing left unpaused";
}

TEST_F(PauseResumeTest, VolumeResumeTellsTheDaemonBeforeRegistering) {
  VolumePause(dir_.Join("volume10"));
  timeline_.clear();
  VolumeResume(dir_.Join("volume10"));
  EXPECT_THAT(Requests(), ElementsAre("elastic index_resume fileindex_s10",
                                      R"(fileindexd worker_create {"share_name":"s10"})"));
  std::vector<testing::Step> steps = Timeline();
  ASSERT_EQ(steps.size(), 2u);
  EXPECT_FALSE(steps[0].at.folders.at("/s10/a")) << "saved before the first request";
  EXPECT_FALSE(steps[1].at.monitor.count(QueuePath("s10"))) << "registered after the daemon";
  EXPECT_THAT(Registered("s10"), ElementsAre(s10_ + "/a"));
}

TEST_F(PauseResumeTest, ShareClearPausedDropsTheShareAndStopsServicesWhenNothingIsLeft) {
  std::filesystem::create_directories(DBPath("s2"));
  dir_.Write("volume1/s2/@eaDir/@fileindex/queue", "x\n");
  StatusMgr().SetShareStatus("s2", NeedReindex);
  ForgetServices();
  ShareClearPaused("s2", s2_);
  EXPECT_THAT(Requests(), ElementsAre("elastic index_delete fileindex_s2"));
  std::vector<testing::Step> steps = Timeline();
  EXPECT_THAT(steps[0].at.queues["s2"], IsEmpty()) << "data removed before the index";
  EXPECT_EQ(steps[0].at.folders.count("/s2/a"), 1u) << "folders dropped after the index";
  EXPECT_FALSE(std::filesystem::exists(DBPath("s2")));
  EXPECT_EQ(StatusMgr().GetAllShareStatus().count("s2"), 0u);
  EXPECT_EQ(Folders().count("/s2/a"), 0u);
  EXPECT_THAT(Services(), IsEmpty());

  ShareClearPaused("s1", s1_);
  ShareClearPaused("s10", s10_);
  EXPECT_TRUE(Folders().empty());
  EXPECT_EQ(Services(), testing::kServicesOff);
}

TEST_F(PauseResumeTest, AShareRootThatComposesNoPathStopsTheClearBeforeTheIndex) {
  const testing::Outcome outcome = OutcomeOf([] { ShareClearPaused("s2", "relative/s2"); });
  EXPECT_EQ(outcome.code, kErrorSystem);
  EXPECT_EQ(outcome.reason, "FILEIDXQueuePathCompose failed, share_path=relative/s2");
  EXPECT_EQ(Logged("Failed [0 > FILEIDXQueuePathCompose(share_path.c_str(), path, "
                   "sizeof(path))], reason: FILEIDXQueuePathCompose failed, "
                   "share_path=relative/s2"),
            1u);
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_EQ(Folders().count("/s2/a"), 1u);
}

TEST_F(PauseResumeTest, VolumeClearPausedForgetsFoldersAndStatusButKeepsIndexes) {
  StatusMgr().SetShareStatus("s10", NeedReindex);
  StatusMgr().SetShareStatus("s1", NeedReindex);
  ForgetServices();
  VolumeClearPaused(dir_.Join("volume10"));
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_EQ(Folders().count("/s10/a"), 0u);
  EXPECT_EQ(Folders().size(), 4u);
  EXPECT_EQ(StatusMgr().GetAllShareStatus().count("s10"), 0u);
  EXPECT_EQ(StatusMgr().GetShareStatus("s1"), 1);
  EXPECT_THAT(Services(), IsEmpty());
  VolumeClearPaused(Volume1());
  EXPECT_TRUE(Folders().empty());
  EXPECT_EQ(Services(), testing::kServicesOff);
}

TEST_F(PauseResumeTest, EmptyArgumentsAreRefusedBeforeAnythingHappens) {
  struct Case {
    const char* what;
    std::function<void()> call;
    std::string reason;
    std::string condition;
  };
  const Case cases[] = {
      {"pause", [] { SharePause(""); }, "Missing share name", "share_name.empty()"},
      {"resume", [] { ShareResume(""); }, "Missing share name", "share_name.empty()"},
      {"clear name", [] { ShareClearPaused("", "/x"); }, "Missing share name",
       "share_name.empty()"},
      {"clear path", [] { ShareClearPaused("s1", ""); }, "Missing share path",
       "share_path.empty()"},
      {"volume pause", [] { VolumePause(""); }, "Missing mount point", "mount_point.empty()"},
      {"volume resume", [] { VolumeResume(""); }, "Missing mount point", "mount_point.empty()"},
      {"volume clear", [] { VolumeClearPaused(""); }, "Missing mount point", "mount_point.empty()"},
  };
  for (const Case& c : cases) {
    testing::LogCapture log;
    const testing::Outcome outcome = OutcomeOf(c.call);
    EXPECT_EQ(outcome.code, kErrorBadArgument) << c.what;
    EXPECT_EQ(outcome.reason, c.reason) << c.what;
    EXPECT_EQ(log.Matching("index_mgr:").size(), 1u) << c.what;
    EXPECT_EQ(log.Matching("Failed [" + c.condition + "], reason: " + c.reason).size(), 1u)
        << c.what;
  }
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_EQ(Folders().size(), 5u);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
