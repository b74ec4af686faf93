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
using testing::ReadFileText;

class FolderOpsTest : public testing::IndexMgrTestRoot {
 protected:
  void SetUp() override {
    s1_ = AddShareWithDirs("s1");
    s2_ = AddShareWithDirs("s2");
  }

  std::string s1_, s2_;
};

TEST_F(FolderOpsTest, AddSavesStartsServicesThenCreatesEachNewShareInNameOrder) {
  FolderAdd(Array({FolderJson("/s2/a"), FolderJson("/s1/a"), FolderJson("/s1/b")}), false);

  EXPECT_THAT(
      Requests(),
      ElementsAre("elastic index_create fileindex_s1",
                  R"(fileindexd notify_setting_changed {"is_upsert":true,"share_name":"s1"})",
                  "elastic index_create fileindex_s2",
                  R"(fileindexd notify_setting_changed {"is_upsert":true,"share_name":"s2"})"));
  std::vector<testing::Step> steps = Timeline();
  ASSERT_EQ(steps.size(), 4u);
  // Saved and services started before the first request.
  EXPECT_EQ(steps[0].at.folders.size(), 3u);
  EXPECT_EQ(steps[0].at.services, testing::kServicesOn);
  // Each share's queue is registered after the daemon was told, before the
  // next share's index is created.
  EXPECT_TRUE(steps[1].at.monitor.empty());
  EXPECT_THAT(steps[2].at.monitor[QueuePath("s1")], ElementsAre(s1_ + "/a", s1_ + "/b"));
  EXPECT_EQ(steps[3].at.monitor.count(QueuePath("s2")), 0u);
  EXPECT_THAT(Registered("s2"), ElementsAre(s2_ + "/a"));
  // The events come last, in request order, each flagging everything.
  for (testing::Step& step : steps) {
    EXPECT_THAT(step.at.queues["s1"], IsEmpty()) << step.text;
    EXPECT_THAT(step.at.queues["s2"], IsEmpty()) << step.text;
  }
  EXPECT_THAT(CfgEvents("s1"),
              ElementsAre("131072 " + s1_ + "/a DAVP", "131072 " + s1_ + "/b DAVP"));
  EXPECT_THAT(CfgEvents("s2"), ElementsAre("131072 " + s2_ + "/a DAVP"));
  EXPECT_EQ(QueueEvents("s1")[0]["path_old"].asString(), "");
  Json::Value spotlight;
  ASSERT_TRUE(fromFile(spotlight, dir_.Join("etc/orvex/smb.json")));
  EXPECT_TRUE(spotlight["spotlight"].asBool());
}

TEST_F(FolderOpsTest, AddToAShareWithFoldersCreatesNoIndex) {
  FolderAdd(Array({FolderJson("/s1/a")}), false);
  timeline_.clear();
  FolderAdd(Array({FolderJson("/s1/b")}), false);
  EXPECT_THAT(
      Requests(),
      ElementsAre(R"(fileindexd notify_setting_changed {"is_upsert":true,"share_name":"s1"})"));
  EXPECT_THAT(Registered("s1"), ElementsAre(s1_ + "/a", s1_ + "/b"));
}

TEST_F(FolderOpsTest, AddOfAnEmptyArraySavesRefreshesServicesAndSendsNothing) {
  FolderAdd(Json::Value(Json::arrayValue), false);
  EXPECT_EQ(ReadFileText(FoldersPath()).find('['), 0u) << ReadFileText(FoldersPath());
  EXPECT_TRUE(Folders().empty());
  EXPECT_EQ(Services(), testing::kServicesOn);
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_FALSE(std::filesystem::exists(QueuePath("s1")));
}

TEST_F(FolderOpsTest, AddOfAnExistingPathFailsUnchangedWhileSetSucceeds) {
  FolderAdd(Array({FolderJson("/s1/a")}), false);
  const std::string before = ReadFileText(FoldersPath());
  timeline_.clear();
  const Json::Value again = Array({FolderJson("/s1/a", "renamed")});
  const testing::Outcome add = OutcomeOf([&] { FolderAdd(again, false); });
  EXPECT_EQ(add.code, kErrorFolderExists);
  EXPECT_EQ(add.reason, "Duplicated ID: /s1/a");
  EXPECT_EQ(ReadFileText(FoldersPath()), before);
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_EQ(Logged("Failed [create && folder_mgr.HasFolder(folder_new->GetPath())], "
                   "reason: Duplicated ID: /s1/a"),
            1u);
  EXPECT_EQ(OutcomeOf([&] { FolderSet(again, false); }).code, 0);
  Json::Value got;
  FolderGet(got, "/s1/a");
  EXPECT_EQ(got["name"].asString(), "renamed");
}

TEST_F(FolderOpsTest, SetOfTheNameAloneSendsAllFalseAndANewSubfolderAllTrue) {
  FolderAdd(Array({FolderJson("/s1/a")}), false);
  std::filesystem::remove(QueuePath("s1"));
  FolderSet(Array({FolderJson("/s1/a", "other name")}), false);
  FolderAdd(Array({FolderJson("/s1/a/sub")}), false);
  FolderSet(Array({FolderJson("/s1/a", "other name", true, true, true, false)}), false);
  EXPECT_THAT(CfgEvents("s1"),
              ElementsAre("131072 " + s1_ + "/a ----", "131072 " + s1_ + "/a/sub DAVP",
                          "131072 " + s1_ + "/a ---P"));
}

TEST_F(FolderOpsTest, UpdaterModeAcceptsAnUnindexablePathAndQueuesNothing) {
  const Json::Value request = Array({FolderJson("/s1/missing")});
  EXPECT_EQ(OutcomeOf([&] { FolderAdd(request, false); }).reason, "Path cannot index: /s1/missing");
  EXPECT_TRUE(Folders().empty());
  FolderAdd(request, true);
  EXPECT_EQ(Folders().count("/s1/missing"), 1u);
  EXPECT_FALSE(std::filesystem::exists(QueuePath("s1")));
  EXPECT_THAT(
      Requests(),
      ElementsAre("elastic index_create fileindex_s1",
                  R"(fileindexd notify_setting_changed {"is_upsert":true,"share_name":"s1"})"));
}

TEST_F(FolderOpsTest, AFailingElementLeavesTheEarlierOnesUnsaved) {
  struct Case {
    const char* what;
    Json::Value second;
    int code;
    std::string reason;
  };
  Json::Value no_name = FolderJson("/s1/b");
  no_name.removeMember("name");
  const Case cases[] = {
      {"unindexable", FolderJson("/s1/@eaDir"), kErrorPathCannotIndex,
       "Path cannot index: /s1/@eaDir"},
      {"duplicate in request", FolderJson("/s1/a"), kErrorFolderExists, "Duplicated ID: /s1/a"},
      {"malformed", no_name, kErrorBadArgument, ""},
      {"not an object", Json::Value("x"), kErrorBadArgument, ""},
  };
  for (const Case& c : cases) {
    const testing::Outcome outcome = OutcomeOf([&] {
      FolderAdd(Array({FolderJson("/s1/a"), c.second}), false);
    });
    EXPECT_EQ(outcome.code, c.code) << c.what;
    if (!c.reason.empty()) {
      EXPECT_EQ(outcome.reason, c.reason) << c.what;
    }
    EXPECT_TRUE(Folders().empty()) << c.what;
  }
  const testing::Outcome not_array = OutcomeOf([] { FolderAdd(Json::Value("x"), false); });
  EXPECT_EQ(not_array.code, kErrorBadArgument);
  EXPECT_EQ(not_array.reason, "\"x\"");
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_THAT(Services(), IsEmpty());
}

TEST_F(FolderOpsTest, TheThousandAndFirstFolderIsRefusedAndNothingSaved) {
  Json::Value stored(Json::arrayValue);
  for (int i = 0; i < 1000; ++i) {
    Json::Value record = FolderJson("/s2/f" + std::to_string(i));
    record["paused"] = false;
    record["volume_to_be_clean"] = "";
    stored.append(record);
  }
  std::filesystem::create_directories(std::filesystem::path(FoldersPath()).parent_path());
  ASSERT_TRUE(toFile(stored, FoldersPath()));
  const std::string before = ReadFileText(FoldersPath());
  const testing::Outcome outcome =
      OutcomeOf([] { FolderAdd(Array({FolderJson("/s1/a")}), false); });
  EXPECT_EQ(outcome.code, kErrorTooManyFolders);
  EXPECT_EQ(ReadFileText(FoldersPath()), before);
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_THAT(Services(), IsEmpty());
}

TEST_F(FolderOpsTest, ReindexQueuesForIndexedSharesOnlyAndClearsTheirFlag) {
  FolderAdd(Array({FolderJson("/s1/a")}), false);
  std::filesystem::remove(QueuePath("s1"));
  StatusMgr().SetShareStatus("s1", NeedReindex);
  StatusMgr().SetShareStatus("s2", NeedReindex);
  timeline_.clear();
  FolderReindex(Array({Json::Value("/s1/a/sub"), Json::Value("/s2/b")}));
  const std::vector<Json::Value> events = QueueEvents("s1");
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ(events[0]["event"].asInt(), 0x10000);
  EXPECT_EQ(events[0]["path"].asString(), s1_ + "/a/sub");
  EXPECT_TRUE(events[0]["data"].isNull());
  EXPECT_FALSE(std::filesystem::exists(QueuePath("s2")));
  EXPECT_EQ(StatusMgr().GetShareStatus("s1"), 0);
  EXPECT_EQ(StatusMgr().GetAllShareStatus().count("s1"), 1u) << "the member stays at 0";
  EXPECT_EQ(StatusMgr().GetShareStatus("s2"), 1) << "a share without folders keeps its flag";
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(FolderOpsTest, ReindexAndDeleteRefuseBadLists) {
  struct Case {
    const char* what;
    Json::Value list;
    std::string reason;
  };
  const Case cases[] = {
      {"object", Json::Value(Json::objectValue), "{}"},
      {"number element", Array({Json::Value(5)}), "5"},
      {"null element", Array({Json::Value()}), "null"},
  };
  for (const Case& c : cases) {
    const testing::Outcome reindex = OutcomeOf([&] { FolderReindex(c.list); });
    EXPECT_EQ(reindex.code, kErrorBadArgument) << c.what;
    EXPECT_EQ(reindex.reason, c.reason) << c.what;
    const testing::Outcome del = OutcomeOf([&] { FolderDelete(c.list); });
    EXPECT_EQ(del.code, kErrorBadArgument) << c.what;
    EXPECT_EQ(del.reason, c.reason) << c.what;
  }
  EXPECT_EQ(Logged("index_mgr:"), 6u);
  EXPECT_EQ(Logged("Failed [!it.isString()]"), 4u);
}

TEST_F(FolderOpsTest, DeleteOfTheLastFolderOfAShareDropsEverythingOfIt) {
  FolderAdd(Array({FolderJson("/s1/a"), FolderJson("/s2/a")}), false);
  std::filesystem::create_directories(DBPath("s1"));
  dir_.Write(QueuePath("s1").substr(dir_.path().size() + 1) + ".tmp", "");
  StatusMgr().SetShareStatus("s1", NeedReindex);
  ForgetServices();
  timeline_.clear();

  FolderDelete(Array({Json::Value("/s1/a")}));

  EXPECT_THAT(
      Requests(),
      ElementsAre(R"(fileindexd notify_setting_changed {"is_upsert":false,"share_name":"s1"})",
                  "elastic index_delete fileindex_s1"));
  std::vector<testing::Step> steps = Timeline();
  ASSERT_EQ(steps.size(), 2u);
  // Saved, and the change event queued, before the daemon hears of it.
  EXPECT_EQ(steps[0].at.folders.count("/s1/a"), 0u);
  ASSERT_EQ(steps[0].at.queues["s1"].size(), 2u);
  EXPECT_TRUE(steps[0].at.monitor.count(QueuePath("s1")));
  EXPECT_FALSE(steps[1].at.monitor.count(QueuePath("s1"))) << "unregistered before the index goes";
  EXPECT_EQ(steps[1].at.queues["s1"].size(), 2u) << "the data goes after the index";
  // Then the share's data is gone; the other share is untouched.
  EXPECT_FALSE(std::filesystem::exists(QueuePath("s1")));
  EXPECT_FALSE(std::filesystem::exists(QueuePath("s1") + ".tmp"));
  EXPECT_FALSE(std::filesystem::exists(DBPath("s1")));
  EXPECT_EQ(StatusMgr().GetAllShareStatus().count("s1"), 0u);
  EXPECT_THAT(Registered("s2"), ElementsAre(s2_ + "/a"));
  EXPECT_THAT(Services(), IsEmpty()) << "a folder is left: services stay";
}

TEST_F(FolderOpsTest, DeleteOfOneOfTwoFoldersReregistersTheRest) {
  FolderAdd(Array({FolderJson("/s1/a"), FolderJson("/s1/b")}), false);
  std::filesystem::remove(QueuePath("s1"));
  timeline_.clear();
  FolderDelete(Array({Json::Value("/s1/b")}));
  EXPECT_THAT(
      Requests(),
      ElementsAre(R"(fileindexd notify_setting_changed {"is_upsert":false,"share_name":"s1"})"));
  EXPECT_THAT(Registered("s1"), ElementsAre(s1_ + "/a"));
  EXPECT_THAT(CfgEvents("s1"), ElementsAre("131072 " + s1_ + "/b DAVP"));
}

TEST_F(FolderOpsTest, DeleteOfTheLastFolderStopsTheServices) {
  FolderAdd(Array({FolderJson("/s1/a")}), false);
  FolderDelete(Array({Json::Value("/s1/a")}));
  std::vector<std::string> expected = testing::kServicesOn;
  expected.insert(expected.end(), testing::kServicesOff.begin(), testing::kServicesOff.end());
  EXPECT_EQ(Services(), expected);
  Json::Value spotlight;
  ASSERT_TRUE(fromFile(spotlight, dir_.Join("etc/orvex/smb.json")));
  EXPECT_FALSE(spotlight["spotlight"].asBool());
}

TEST_F(FolderOpsTest, DeleteOfAPathNoFolderGovernsSavesNothing) {
  FolderAdd(Array({FolderJson("/s1/a")}), false);
  const std::string before = ReadFileText(FoldersPath());
  timeline_.clear();
  const testing::Outcome outcome = OutcomeOf([] {
    FolderDelete(Array({Json::Value("/s1/a"), Json::Value("/s1/b")}));
  });
  EXPECT_EQ(outcome.code, kErrorNoFolder);
  EXPECT_EQ(ReadFileText(FoldersPath()), before);
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(FolderOpsTest, ListPagesAndGetReturnsTheStoredRecord) {
  FolderAdd(Array({FolderJson("/s1/b", "beta"), FolderJson("/s1/a", "alpha")}), true);
  Json::Value out(Json::arrayValue);
  FolderList(out, 0, 0, "name", "asc", Json::Value(Json::arrayValue));
  EXPECT_EQ(toString(out), R"({"folder":[],"offset":0,"total":2})");
  FolderList(out, 1, 5, "name", "desc", Json::Value(Json::arrayValue));
  EXPECT_EQ(
      toString(out),
      R"({"folder":[{"audio":true,"document":true,"name":"alpha","path":"/s1/a","paused":false,"photo":true,"video":true,"volume_to_be_clean":""}],"offset":1,"total":2})");
  Json::Value got;
  FolderGet(got, "/s1/b");
  EXPECT_EQ(got["name"].asString(), "beta");
  const testing::Outcome absent = OutcomeOf([&] { FolderGet(got, "/s1/zz"); });
  EXPECT_EQ(absent.code, kErrorNoFolder);
  EXPECT_EQ(absent.reason, "/s1/zz");
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
