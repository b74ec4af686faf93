// Monitor queue registrations: one file per queue under the application's
// directory, replaced whole, removed on Delete, and refused (with nothing
// written) when the type, the application name or the description is wrong.
#include "kalo/kalo_notify.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include "platform/share_test_root.h"
#include "support/run_program.h"

namespace KALO {
namespace KALONOTIFYD {
namespace {

namespace fs = std::filesystem;

constexpr unsigned kMask = 65478;

Json::Value Description(const std::string& queue, const std::vector<std::string>& folders) {
  Json::Value desc(Json::objectValue);
  desc["queue"] = queue;
  desc["config"] = Json::Value(Json::arrayValue);
  for (const std::string& folder : folders) {
    Json::Value entry(Json::objectValue);
    entry["path"] = folder;
    entry["mask"] = Json::Int{kMask};  // as a stored file reads back
    entry["ignore"] = Json::Value(Json::arrayValue);
    entry["ignore"].append("@eaDir");
    desc["config"].append(entry);
  }
  return desc;
}

Json::Value ReadJson(const std::string& path) {
  return orvex::testing::Options(orvex::testing::ReadFileText(path));
}

std::vector<std::string> FilesIn(const std::string& dir) {
  std::vector<std::string> names;
  if (!fs::exists(dir)) return names;
  for (const auto& e : fs::directory_iterator(dir)) names.push_back(e.path().filename());
  return names;
}

class MonitorQueueTest : public orvex::testing::ShareTestRoot {
 protected:
  std::string AppDir() const { return dir_.Join("var/lib/orvex/monitor/fileindex"); }
  static bool Upsert(const Json::Value& desc, const std::string& app = "fileindex") {
    return MonitorQueue::Upsert(MonitorQueue(desc), app, MONITOR_QUEUE_TYPE_APPLICATION);
  }
  static bool Delete(const std::string& queue, const std::string& app = "fileindex") {
    return MonitorQueue::Delete(queue, app, MONITOR_QUEUE_TYPE_APPLICATION);
  }
};

TEST_F(MonitorQueueTest, UpsertWritesOneFileReplacedWholeAndDeleteRemovesIt) {
  const std::string queue = "/volume1/photo/@eaDir/@fileindex/queue";
  const std::string file = MonitorRegistrationPath(queue, "fileindex");
  EXPECT_EQ(AppDir() + "/%2Fvolume1%2Fphoto%2F@eaDir%2F@fileindex%2Fqueue.json", file);
  ASSERT_TRUE(Upsert(Description(queue, {"/volume1/photo/a", "/volume1/photo/b"})));
  EXPECT_EQ(std::vector<std::string>{fs::path(file).filename()}, FilesIn(AppDir()));
  EXPECT_EQ(Description(queue, {"/volume1/photo/a", "/volume1/photo/b"}), ReadJson(file));
  struct stat st;
  ASSERT_EQ(0, ::stat(file.c_str(), &st));
  EXPECT_EQ(0644u, st.st_mode & 07777);
  ASSERT_TRUE(Upsert(Description(queue, {"/volume1/photo/c"})));
  EXPECT_EQ(1u, FilesIn(AppDir()).size());
  EXPECT_EQ(Description(queue, {"/volume1/photo/c"}), ReadJson(file));
  EXPECT_TRUE(Delete(queue));
  EXPECT_TRUE(FilesIn(AppDir()).empty());
  EXPECT_TRUE(Delete(queue)) << "an absent queue counts as removed";
  EXPECT_TRUE(Delete("/never/registered", "other"));
}

TEST_F(MonitorQueueTest, MissingIgnoreIsStoredEmpty) {
  Json::Value desc = Description("/v/s/q", {"/v/s"});
  desc["config"][0].removeMember("ignore");
  ASSERT_TRUE(Upsert(desc, "app"));
  desc["config"][0]["ignore"] = Json::Value(Json::arrayValue);
  EXPECT_EQ(desc, ReadJson(MonitorRegistrationPath("/v/s/q", "app")));
}

TEST_F(MonitorQueueTest, RefusesBadInputWithoutWriting) {
  const Json::Value good = Description("/v/s/q", {"/v/s"});
  struct Case {
    const char* what;
    Json::Value desc;
    std::string app;
    int type;
  };
  std::vector<Case> cases = {
      {"unknown type", good, "fileindex", 7},
      {"empty app", good, "", MONITOR_QUEUE_TYPE_APPLICATION},
      {"app with slash", good, "a/b", MONITOR_QUEUE_TYPE_APPLICATION},
      {"app ..", good, "..", MONITOR_QUEUE_TYPE_APPLICATION},
      {"app too long", good, std::string(65, 'a'), MONITOR_QUEUE_TYPE_APPLICATION},
  };
  auto bad = [&](const char* what, auto change) {
    Json::Value desc = good;
    change(desc);
    cases.push_back({what, desc, "fileindex", MONITOR_QUEUE_TYPE_APPLICATION});
  };
  bad("not an object", [](Json::Value& d) { d = Json::Value(Json::arrayValue); });
  bad("relative queue", [](Json::Value& d) { d["queue"] = "v/s/q"; });
  bad("no queue", [](Json::Value& d) { d.removeMember("queue"); });
  bad("config not array", [](Json::Value& d) { d["config"] = 1; });
  bad("entry not object", [](Json::Value& d) { d["config"][0] = "x"; });
  bad("relative folder", [](Json::Value& d) { d["config"][0]["path"] = "s"; });
  bad("mask string", [](Json::Value& d) { d["config"][0]["mask"] = "65478"; });
  bad("mask negative", [](Json::Value& d) { d["config"][0]["mask"] = -1; });
  bad("mask too big", [](Json::Value& d) { d["config"][0]["mask"] = Json::Int64(1) << 32; });
  bad("ignore not array", [](Json::Value& d) { d["config"][0]["ignore"] = "@eaDir"; });
  bad("ignore with slash", [](Json::Value& d) { d["config"][0]["ignore"][0] = "a/b"; });
  bad("ignore empty name", [](Json::Value& d) { d["config"][0]["ignore"][0] = ""; });
  for (const Case& c : cases) {
    errno = 0;
    EXPECT_FALSE(
        MonitorQueue::Upsert(MonitorQueue(c.desc), c.app, static_cast<MONITOR_QUEUE_TYPE>(c.type)))
        << c.what;
    EXPECT_EQ(EINVAL, errno) << c.what;
  }
  EXPECT_FALSE(fs::exists(dir_.Join("var/lib/orvex/monitor/fileindex")));
  errno = 0;
  EXPECT_FALSE(Delete("relative"));
  EXPECT_EQ(EINVAL, errno);
}

TEST_F(MonitorQueueTest, FileNamesAreDistinctAndShort) {
  const std::string long_a = "/v/" + std::string(300, 'x') + "/a/queue";
  const std::string long_b = "/v/" + std::string(300, 'x') + "/b/queue";
  const std::vector<std::string> queues = {"/v/s/queue",   "/v/s%2Fqueue", "/v/s/que ue",
                                           "/v/s/qu\neue", long_a,         long_b};
  std::set<std::string> names;
  for (const std::string& q : queues) {
    const std::string path = MonitorRegistrationPath(q, "fileindex");
    const std::string name = fs::path(path).filename();
    EXPECT_LE(name.size(), 255u) << q;
    EXPECT_EQ(std::string::npos, name.find('/')) << q;
    EXPECT_NE('.', name[0]) << q;
    names.insert(name);
  }
  EXPECT_EQ(queues.size(), names.size());
  for (const std::string& q : queues) {
    ASSERT_TRUE(Upsert(Description(q, {"/v/s"}))) << q;
    EXPECT_EQ(q, ReadJson(MonitorRegistrationPath(q, "fileindex"))["queue"].asString());
  }
  EXPECT_EQ(queues.size(), FilesIn(AppDir()).size());
  EXPECT_EQ("", MonitorRegistrationPath("/v/s/q", "../x"));
}

TEST_F(MonitorQueueTest, AFileOfAnotherQueueIsNotReplaced) {
  const std::string queue = "/v/s/q";
  const std::string file = MonitorRegistrationPath(queue, "fileindex");
  fs::create_directories(AppDir());
  // As if another queue's long path had hashed to the same name.
  dir_.Write(fs::relative(file, dir_.path()), "{\"queue\": \"/v/other\", \"config\": []}");
  errno = 0;
  EXPECT_FALSE(Upsert(Description(queue, {"/v/s"})));
  EXPECT_EQ(EEXIST, errno);
  EXPECT_FALSE(Delete(queue));
  EXPECT_EQ("/v/other", ReadJson(file)["queue"].asString());
}

}  // namespace
}  // namespace KALONOTIFYD
}  // namespace KALO
