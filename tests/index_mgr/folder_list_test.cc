// FolderList gives, folder for folder, what each record's own
// GetDataWithAdditional gives (the way the listing was built before it read
// each queue once per call): the same sections, and the same Error at the
// same folder.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>
#include <map>
#include <regex>
#include <set>

#include "index_mgr/index_mgr_test_root.h"

namespace orvex {
namespace fileindex {
namespace {

using testing::OutcomeOf;

// One folder at a time, each record asked on its own.
Json::Value NaiveList(unsigned offset, unsigned limit, const std::string& sort_by,
                      const std::string& direction, const Json::Value& additional) {
  const FolderMgr folder_mgr;
  std::vector<FolderMgr::FolderPtr> folders;
  unsigned total = 0;
  folder_mgr.List(folders, total, offset, limit, sort_by, direction);
  Json::Value out(Json::objectValue);
  out["folder"] = Json::Value(Json::arrayValue);
  out["total"] = total;
  out["offset"] = offset;
  for (const auto& folder : folders)
    out["folder"].append(folder->GetDataWithAdditional(additional));
  return out;
}

// What list threw, with its log lines (source line numbers taken out: the
// same check written in two places logs the same text from different lines).
testing::Outcome ListAndLog(const std::function<void()>& list, std::vector<std::string>* logged) {
  testing::LogCapture log;
  errno = 0;
  const testing::Outcome outcome = OutcomeOf(list);
  for (const std::string& line : log.lines()) {
    logged->push_back(std::regex_replace(line, std::regex("^([a-z_]+):[0-9]+ "), "$1:N "));
  }
  return outcome;
}

std::string Line(int event, const std::string& path, const std::string& path_old = "") {
  Json::Value v(Json::objectValue);
  v["event"] = event;
  v["path"] = path;
  if (!path_old.empty()) v["path_old"] = path_old;
  return toString(v) + "\n";
}

class FolderListTest : public testing::IndexMgrTestRoot {
 protected:
  void SetUp() override {
    s1_ = AddShareWithDirs("s1");
    s2_ = AddShareWithDirs("s2");
    s3_ = AddShareWithDirs("s3");
    FolderAdd(
        Array({FolderJson("/s1/a", "n1"), FolderJson("/s1/a/sub", "n2"), FolderJson("/s1/b", "n3"),
               FolderJson("/s2/a", "n4"), FolderJson("/s2/b", "n5"), FolderJson("/s1/gone", "n6"),
               FolderJson("/s3/a", "n7"), FolderJson("/s1/c", "n8")}),
        /*updater_mode=*/true);
    timeline_.clear();
  }

  void WriteQueue(const std::string& share, const std::string& suffix, const std::string& text) {
    std::filesystem::create_directories(std::filesystem::path(QueuePath(share)).parent_path());
    std::ofstream(QueuePath(share) + suffix, std::ios::binary | std::ios::trunc) << text;
  }

  void ClearQueues() {
    for (const char* share : {"s1", "s2", "s3"}) {
      std::filesystem::remove_all(QueuePath(share));
      std::filesystem::remove_all(QueuePath(share) + ".tmp");
    }
  }

  std::string s1_, s2_, s3_;
};

TEST_F(FolderListTest, StatusesMatchEachFolderAskedOnItsOwn) {
  struct Write {
    const char* share;
    const char* suffix;  // "" for the live queue, ".tmp" for the snapshot
    std::string text;
  };
  struct Case {
    const char* what;
    std::vector<Write> writes;
    std::function<void()> before = [] {};  // run before the writes
  };
  const Case cases[] = {
      {"no queues", {}},
      {"events under some folders, a rename out of another",
       {{"s1", "", Line(2, s1_ + "/a/sub/x") + Line(256, "/elsewhere", s1_ + "/c/y")},
        {"s2", "", Line(2, s2_ + "/bb") + Line(2, s2_ + "/b")}}},
      {"snapshot only", {{"s1", ".tmp", Line(2, s1_ + "/b/f")}}},
      {"live and snapshot",
       {{"s1", "", Line(2, s1_ + "/a/f")}, {"s1", ".tmp", Line(2, s1_ + "/b/f")}}},
      {"a last line still being written",
       {{"s1", "", Line(2, s1_ + "/b/x") + R"({"event":2,"path":")" + s1_ + "/a/y\"}"}}},
      {"malformed line after a's match, before b's",
       {{"s1", "", Line(2, s1_ + "/a/x") + "garbage\n" + Line(2, s1_ + "/b/x")}}},
      {"malformed first line", {{"s1", "", "{\n"}}},
      {"malformed line after every match",
       {{"s1", "",
         Line(2, s1_ + "/a/sub/x") + Line(2, s1_ + "/b") + Line(2, s1_ + "/c") + "{x\n"}}},
      {"malformed live, match in the snapshot",
       {{"s2", "", "nope\n"}, {"s2", ".tmp", Line(2, s2_ + "/a/1")}}},
      {"queue path is a directory",
       {},
       [&] { std::filesystem::create_directories(QueuePath("s2")); }},
      {"need-reindex share with a malformed queue",
       {{"s2", "", "nope\n"}},
       [] { StatusMgr().SetShareStatus("s2", NeedReindex); }},
      {"pause without end", {{"s3", "", Line(2, s3_ + "/a/1")}}, [] { StatusMgr().Pause(0); }},
      {"pause in the future", {{"s3", "", Line(2, s3_ + "/a/1")}}, [] { StatusMgr().Pause(5); }},
  };
  struct Request {
    unsigned offset, limit;
    const char* sort_by;
    const char* direction;
    const char* additional;
  };
  const Request requests[] = {
      {0, 100, "name", "asc", R"(["status"])"},
      {0, 100, "path", "desc", R"(["status", "status"])"},
      {2, 3, "photo", "asc", R"(["status"])"},
      {0, 100, "name", "asc", "[]"},
      {0, 100, "name", "asc", "[5]"},
      {0, 100, "name", "asc", "{}"},
      {0, 100, "name", "asc", R"(["status", "size"])"},
      {8, 10, "name", "asc", "{}"},
  };
  std::map<int, int> codes_seen;
  std::set<std::string> texts_seen;
  for (const Case& c : cases) {
    ClearQueues();
    std::filesystem::remove(portable::RootPath(kFileIndexStatusCfgPath));
    c.before();
    for (const Write& w : c.writes) WriteQueue(w.share, w.suffix, w.text);
    for (const Request& r : requests) {
      Json::Value additional;
      ASSERT_TRUE(fromString(additional, r.additional));
      Json::Value naive, fast;
      std::vector<std::string> naive_log, fast_log;
      const testing::Outcome naive_outcome = ListAndLog(
          [&] { naive = NaiveList(r.offset, r.limit, r.sort_by, r.direction, additional); },
          &naive_log);
      const testing::Outcome fast_outcome = ListAndLog(
          [&] { FolderList(fast, r.offset, r.limit, r.sort_by, r.direction, additional); },
          &fast_log);
      const std::string where = std::string(c.what) + " / " + r.sort_by + " " + r.direction + " " +
                                std::to_string(r.offset) + "+" + std::to_string(r.limit) + " " +
                                r.additional;
      ++codes_seen[naive_outcome.code];
      for (const Json::Value& f : naive["folder"]) {
        texts_seen.insert(f["additional"]["status"]["text"].asString());
      }
      EXPECT_EQ(fast_outcome.code, naive_outcome.code) << where;
      EXPECT_EQ(fast_outcome.reason, naive_outcome.reason) << where;
      EXPECT_EQ(fast_log, naive_log) << where;
      if (naive_outcome.code == 0) {
        EXPECT_EQ(toString(fast), toString(naive)) << where;
      }
    }
  }
  // The table reaches every outcome, so agreeing means something.
  EXPECT_GT(codes_seen[0], 0);
  EXPECT_GT(codes_seen[kErrorBadArgument], 0);
  EXPECT_GT(codes_seen[kErrorMalformedEvent], 0);
  EXPECT_GT(codes_seen[kErrorSystem], 0);
  EXPECT_EQ(texts_seen, (std::set<std::string>{"", "error", "finished", "need_reindex", "paused",
                                               "processing"}));
}

TEST_F(FolderListTest, TheStatusesThemselves) {
  WriteQueue("s1", "", Line(2, s1_ + "/a/sub/x"));
  StatusMgr().SetShareStatus("s2", NeedReindex);
  Json::Value out;
  Json::Value additional(Json::arrayValue);
  additional.append("status");
  FolderList(out, 0, 100, "path", "asc", additional);
  std::map<std::string, std::string> text;
  for (const Json::Value& f : out["folder"]) {
    text[f["path"].asString()] = f["additional"]["status"]["text"].asString();
  }
  EXPECT_EQ(text["/s1/a"], "processing");
  EXPECT_EQ(text["/s1/a/sub"], "processing");
  EXPECT_EQ(text["/s1/b"], "finished");
  EXPECT_EQ(text["/s1/gone"], "error");
  EXPECT_EQ(text["/s2/a"], "need_reindex");
  EXPECT_EQ(out["total"].asUInt(), 8u);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
