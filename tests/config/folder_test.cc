// Folder: the record's JSON forms, share moves, its status and the extra
// sections of the web API's reply, against a real share registry, status
// file and share queue.
#include "orvex/config/folder.h"

#include <gtest/gtest.h>

#include "config/folder_test_root.h"
#include "orvex/foundation/system_hooks.h"
#include "support/log_capture.h"

namespace orvex {
namespace testing {
namespace {

constexpr time_t kNow = 1700000000;

TEST(FolderRecordTest, MalformedRecordsFailWith120) {
  EXPECT_EQ(kErrorBadArgument, CodeOf([] { Folder folder(Json::Value(Json::arrayValue)); }));
  for (const char* required : {"path", "name", "document", "audio", "video", "photo"}) {
    Json::Value data = FolderJson("/s/a", "d");
    data.removeMember(required);
    EXPECT_EQ(kErrorBadArgument, CodeOf([&] { Folder folder(data); })) << required;
  }
  const std::vector<std::pair<std::string, std::string>> mistyped = {
      {"path", "{}"}, {"name", "[]"}, {"audio", "\"yes\""}, {"paused", "\"no\""}};
  for (const auto& [key, value] : mistyped) {
    Json::Value data = FolderJson("/s/a", "d");
    data[key] = Options(value);
    EXPECT_EQ(kErrorBadArgument, CodeOf([&] { Folder folder(data); })) << key << " " << value;
  }
}

using FolderTest = FolderTestRoot;

TEST_F(FolderTest, GetDataHoldsTheRecordOnlyAndSetShareKeepsTheCachedFullPath) {
  const std::string root_a = AddShare("a");
  AddShare("b");
  Json::Value data = FolderJson("/a/x", "dp", "X");
  data.removeMember("paused");
  data.removeMember("volume_to_be_clean");
  Folder folder(data);
  EXPECT_EQ(root_a + "/x", folder.GetFullPath());
  EXPECT_EQ("a", folder.GetShare());
  EXPECT_EQ(FolderJson("/a/x", "dp", "X"), folder.GetData());  // defaults, no cached values
  Json::Value cfg = FolderJson("", "dp");
  for (const char* key : {"path", "name", "paused", "volume_to_be_clean"}) cfg.removeMember(key);
  EXPECT_EQ(cfg, folder.GetIndexCfg());

  folder.SetShare("b");
  EXPECT_EQ("/b/x", folder.GetPath());
  EXPECT_EQ("b", folder.GetShare());
  EXPECT_EQ(root_a + "/x", folder.GetFullPath());  // deliberately stale
  EXPECT_EQ("/b/x", folder.GetData()["path"].asString());
}

// A real share with folder /photo/a and a fixed clock.
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

  std::string root_;
  ScopedSystemHooks clock_{SystemHooks{[] { return kNow; }, nullptr, nullptr}};
};

TEST_F(FolderStatusTest, InvalidPathOutranksNeedReindexWhichOutranksPendingEvents) {
  WriteStatus(0);
  EXPECT_EQ("finished", Status());  // no queue at all
  QueueCreate(root_, root_ + "/ab/x.jpg");
  QueueCreate(root_, root_ + "/b.jpg");
  EXPECT_EQ("finished", Status());  // /photo/ab is not inside /photo/a

  QueueCreate(root_, root_ + "/a/sub/x.jpg");
  const struct {
    long long resume_time;
    const char* text;
  } pauses[] = {
      {-1, "processing"},        {0, "paused"}, {kNow + 60, "paused"}, {kNow, "processing"},
      {kNow - 60, "processing"},  // an expired pause has no state of its own
  };
  for (const auto& p : pauses) {
    WriteStatus(p.resume_time);
    EXPECT_EQ(p.text, Status()) << "resume_time " << p.resume_time;
  }

  WriteStatus(-1, "photo", 4);  // flags other than need-reindex do not count
  EXPECT_EQ("processing", Status());
  WriteStatus(0, "photo", 1 | 4);
  EXPECT_EQ("need_reindex", Status());
  for (const char* invalid : {"/photo/missing", "/photo/@eaDir", "/nosuchshare/a"}) {
    EXPECT_EQ("error/invalid_path", Status(invalid)) << invalid;
  }
}

TEST_F(FolderStatusTest, AdditionalStatusSectionAndItsFailures) {
  WriteStatus(0);
  QueueCreate(root_, root_ + "/a/sub/x.jpg");
  const Folder folder("/photo/a", "A", true, false, false, false, false);
  EXPECT_EQ(folder.GetData(), folder.GetDataWithAdditional(Json::arrayValue));
  Json::Value expected = folder.GetData();
  expected["additional"]["status"]["text"] = "paused";
  EXPECT_EQ(expected, folder.GetDataWithAdditional(Options(R"(["status", "status"])")));

  const struct {
    const char* text;
    const char* reason;
    const char* logged;  // "" when no log line is due
  } failures[] = {{R"({})", "{}", "Failed [!addiitionals.isArray()], reason: {}"},
                  {"null", "null", "Failed [!addiitionals.isArray()], reason: null"},
                  {R"(["status", 5])", "5", "Failed [!it.isString()], reason: 5"},
                  {R"(["size"])", "Unknown additioal: size", ""}};
  for (const auto& f : failures) {
    SCOPED_TRACE(f.text);
    LogCapture log;
    std::string reason;
    EXPECT_EQ(kErrorBadArgument,
              CodeOf([&] { folder.GetDataWithAdditional(Options(f.text)); }, &reason));
    EXPECT_EQ(f.reason, reason);
    if (*f.logged == '\0') {
      EXPECT_TRUE(log.lines().empty());
      continue;
    }
    ASSERT_EQ(1u, log.lines().size());
    EXPECT_EQ(0u, log.lines()[0].rfind("folder:", 0)) << log.lines()[0];
    EXPECT_NE(std::string::npos, log.lines()[0].find(f.logged)) << log.lines()[0];
  }
}

}  // namespace
}  // namespace testing
}  // namespace orvex
