// Folder: the record's JSON forms, share moves, its status and the extra
// sections of the web API's reply, against a real share registry, status
// file and share queue.
#include "orvex/config/folder.h"

#include <gtest/gtest.h>

#include <ctime>

#include "config/folder_test_root.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/system_hooks.h"
#include "support/log_capture.h"

namespace orvex {
namespace testing {
namespace {

constexpr time_t kNow = 1700000000;

std::vector<std::string> Keys(const Json::Value& object) { return object.getMemberNames(); }

TEST(FolderRecordTest, MissingOptionalKeysWriteBackAsDefaults) {
  Json::Value data = FolderJson("/photo/a", "dp", "A");
  data.removeMember("paused");
  data.removeMember("volume_to_be_clean");
  const Folder folder(data);
  const Json::Value out = folder.GetData();
  EXPECT_EQ(false, out["paused"].asBool());
  EXPECT_EQ("", out["volume_to_be_clean"].asString());
  EXPECT_EQ("/photo/a", out["path"].asString());
  EXPECT_EQ("A", out["name"].asString());
  EXPECT_TRUE(out["document"].asBool());
  EXPECT_FALSE(out["audio"].asBool());
  EXPECT_FALSE(out["video"].asBool());
  EXPECT_TRUE(out["photo"].asBool());
  EXPECT_EQ((std::vector<std::string>{"audio", "document", "photo", "video"}),
            Keys(folder.GetIndexCfg()));
  EXPECT_TRUE(folder.GetIndexCfg()["photo"].asBool());
}

TEST(FolderRecordTest, MalformedRecordsFailWith120) {
  const struct {
    const char* what;
    Json::Value data;
  } cases[] = {
      {"not an object", Json::Value(Json::arrayValue)},
      {"no path",
       [] {
         auto d = FolderJson("/s/a", "d");
         d.removeMember("path");
         return d;
       }()},
      {"no photo",
       [] {
         auto d = FolderJson("/s/a", "d");
         d.removeMember("photo");
         return d;
       }()},
      {"path object",
       [] {
         auto d = FolderJson("/s/a", "d");
         d["path"] = Json::objectValue;
         return d;
       }()},
      {"name array",
       [] {
         auto d = FolderJson("/s/a", "d");
         d["name"] = Json::arrayValue;
         return d;
       }()},
      {"audio string",
       [] {
         auto d = FolderJson("/s/a", "d");
         d["audio"] = "yes";
         return d;
       }()},
      {"paused string",
       [] {
         auto d = FolderJson("/s/a", "d");
         d["paused"] = "no";
         return d;
       }()},
  };
  for (const auto& c : cases) {
    try {
      Folder folder(c.data);
      ADD_FAILURE() << c.what << " was accepted: " << toString(c.data);
    } catch (const Error& e) {
      EXPECT_EQ(kErrorBadArgument, e.code()) << c.what;
    }
  }
}

class FolderTest : public FolderTestRoot {};

TEST_F(FolderTest, GetDataNeverHoldsTheCachedShareOrFullPath) {
  const std::string root = AddShare("photo");
  const Folder folder("/photo/a", "A", true, false, false, true, true);
  EXPECT_EQ("photo", folder.GetShare());
  EXPECT_EQ(root + "/a", folder.GetFullPath());
  EXPECT_EQ((std::vector<std::string>{"audio", "document", "name", "path", "paused", "photo",
                                      "video", "volume_to_be_clean"}),
            Keys(folder.GetData()));
  EXPECT_TRUE(folder.GetData()["paused"].asBool());
}

TEST_F(FolderTest, SetShareMovesThePathButKeepsTheCachedFullPath) {
  const std::string root_a = AddShare("a");
  AddShare("b");
  Folder folder("/a/x", "X", true, true, true, true, false);
  EXPECT_EQ(root_a + "/x", folder.GetFullPath());
  folder.SetShare("b");
  EXPECT_EQ("/b/x", folder.GetPath());
  EXPECT_EQ("b", folder.GetShare());
  EXPECT_EQ(root_a + "/x", folder.GetFullPath());  // deliberately stale
  EXPECT_EQ("/b/x", folder.GetData()["path"].asString());
}

// A real share with folder /photo/a, a status file and (per test) events.
class FolderStatusTest : public FolderTestRoot {
 protected:
  void SetUp() override {
    root_ = AddShare("photo");
    MakeDirs(root_, {"a/sub", "ab"});
  }
  std::string Status(const std::string& path = "/photo/a") {
    Json::Value out(Json::objectValue);
    out["keep"] = 1;
    Folder(path, "A", true, true, true, true, false).GetStatus(out);
    EXPECT_EQ(1, out["keep"].asInt()) << "GetStatus touched another key";
    return out.isMember("desc") ? out["text"].asString() + "/" + out["desc"].asString()
                                : out["text"].asString();
  }
  void QueueEventUnderFolder() { WriteQueue(root_, {CreateEvent(root_ + "/a/sub/x.jpg")}); }

  std::string root_;
  ScopedSystemHooks clock_{SystemHooks{[] { return kNow; }, nullptr, nullptr}};
};

TEST_F(FolderStatusTest, InvalidPathOutranksNeedReindex) {
  WriteStatus(-1, "photo", 1);
  QueueEventUnderFolder();
  EXPECT_EQ("error/invalid_path", Status("/photo/missing"));
  EXPECT_EQ("error/invalid_path", Status("/photo/@eaDir"));
  EXPECT_EQ("error/invalid_path", Status("/nosuchshare/a"));
}

TEST_F(FolderStatusTest, NeedReindexOutranksPendingEvents) {
  WriteStatus(-1, "photo", 1 | 4);
  QueueEventUnderFolder();
  EXPECT_EQ("need_reindex", Status());
  WriteStatus(-1, "photo", 4);  // other flags do not count
  EXPECT_EQ("processing", Status());
}

TEST_F(FolderStatusTest, FinishedWithoutEventsUnderTheFolder) {
  WriteStatus(0);
  EXPECT_EQ("finished", Status());  // no queue at all
  WriteQueue(root_, {CreateEvent(root_ + "/ab/x.jpg"), CreateEvent(root_ + "/b.jpg")});
  EXPECT_EQ("finished", Status());  // /photo/ab is not inside /photo/a
}

TEST_F(FolderStatusTest, PendingEventsReportPausedOrProcessingByDeadline) {
  QueueEventUnderFolder();
  const struct {
    long long resume_time;
    const char* text;
  } cases[] = {
      {-1, "processing"},        {0, "paused"}, {kNow + 60, "paused"}, {kNow, "processing"},
      {kNow - 60, "processing"},  // an expired pause has no state of its own
  };
  for (const auto& c : cases) {
    WriteStatus(c.resume_time);
    EXPECT_EQ(c.text, Status()) << "resume_time " << c.resume_time;
  }
}

TEST_F(FolderStatusTest, EventsInTheSnapshotAndOldPathsOfRenamesCount) {
  WriteStatus(-1);
  WriteQueue(root_, {CreateEvent(root_ + "/a/sub/y.jpg")}, /*snapshot=*/true);
  EXPECT_EQ("processing", Status());
  std::filesystem::remove(root_ + "/@eaDir/@fileindex/queue.tmp");
  WriteQueue(root_, {CreateEvent(root_ + "/ab/moved.jpg", root_ + "/a/was.jpg")});
  EXPECT_EQ("processing", Status());
}

TEST_F(FolderStatusTest, AdditionalStatusSectionAndItsFailures) {
  WriteStatus(0);
  QueueEventUnderFolder();
  const Folder folder("/photo/a", "A", true, false, false, false, false);

  EXPECT_EQ(folder.GetData(), folder.GetDataWithAdditional(Json::arrayValue));
  Json::Value twice(Json::arrayValue);
  twice.append("status");
  twice.append("status");
  Json::Value expected = folder.GetData();
  expected["additional"]["status"]["text"] = "paused";
  EXPECT_EQ(expected, folder.GetDataWithAdditional(twice));

  const struct {
    const char* text;
    const char* reason;
    const char* logged;  // "" when no log line is due
  } failures[] = {
      {R"({})", "{}", "Failed [!addiitionals.isArray()], reason: {}"},
      {"null", "null", "Failed [!addiitionals.isArray()], reason: null"},
      {R"(["status", 5])", "5", "Failed [!it.isString()], reason: 5"},
      {R"(["size"])", "Unknown additioal: size", ""},
  };
  for (const auto& f : failures) {
    LogCapture log;
    try {
      folder.GetDataWithAdditional(Options(f.text));
      ADD_FAILURE() << f.text << " was accepted";
    } catch (const Error& e) {
      EXPECT_EQ(kErrorBadArgument, e.code()) << f.text;
      EXPECT_EQ(f.reason, e.reason()) << f.text;
    }
    if (*f.logged == '\0') {
      EXPECT_TRUE(log.lines().empty()) << f.text;
    } else {
      ASSERT_EQ(1u, log.lines().size()) << f.text;
      EXPECT_EQ(0u, log.lines()[0].rfind("folder:", 0)) << log.lines()[0];
      EXPECT_NE(std::string::npos, log.lines()[0].find(f.logged)) << log.lines()[0];
    }
  }
}

}  // namespace
}  // namespace testing
}  // namespace orvex
