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

// Log lines with their source line numbers taken out: the same check
// written in two places logs the same text from different lines.
std::vector<std::string> WithoutLineNumbers(const std::vector<std::string>& lines) {
  std::vector<std::string> out;
  for (const std::string& line : lines) {
    out.push_back(std::regex_replace(line, std::regex("^([a-z_]+):[0-9]+ "), "$1:N "));
  }
  return out;
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
  struct Case {
    const char* what;
    std::function<void()> prepare;
  };
  const Case cases[] = {
      {"no queues", [] {}},
      {"events under some folders, a rename out of another",
       [&] {
         WriteQueue("s1", "", Line(2, s1_ + "/a/sub/x") + Line(256, "/elsewhere", s1_ + "/c/y"));
         WriteQueue("s2", "", Line(2, s2_ + "/bb") + Line(2, s2_ + "/b"));
       }},
      {"snapshot only", [&] { WriteQueue("s1", ".tmp", Line(2, s1_ + "/b/f")); }},
      {"live and snapshot",
       [&] {
         WriteQueue("s1", "", Line(2, s1_ + "/a/f"));
         WriteQueue("s1", ".tmp", Line(2, s1_ + "/b/f"));
       }},
      {"a last line still being written",
       [&] {
         WriteQueue("s1", "", Line(2, s1_ + "/b/x") + R"({"event":2,"path":")" + s1_ + "/a/y\"}");
       }},
      {"malformed line after a's match, before b's",
       [&] { WriteQueue("s1", "", Line(2, s1_ + "/a/x") + "garbage\n" + Line(2, s1_ + "/b/x")); }},
      {"malformed first line", [&] { WriteQueue("s1", "", "{\n"); }},
      {"malformed line after every match",
       [&] {
         WriteQueue("s1", "",
                    Line(2, s1_ + "/a/sub/x") + Line(2, s1_ + "/b") + Line(2, s1_ + "/c") + "{x\n");
       }},
      {"malformed live, match in the snapshot",
       [&] {
         WriteQueue("s2", "", "nope\n");
         WriteQueue("s2", ".tmp", Line(2, s2_ + "/a/1"));
       }},
      {"queue path is a directory", [&] { std::filesystem::create_directories(QueuePath("s2")); }},
      {"need-reindex share with a malformed queue",
       [&] {
         StatusMgr().SetShareStatus("s2", NeedReindex);
         WriteQueue("s2", "", "nope\n");
       }},
      {"pause without end",
       [&] {
         StatusMgr().Pause(0);
         WriteQueue("s3", "", Line(2, s3_ + "/a/1"));
       }},
      {"pause in the future",
       [&] {
         StatusMgr().Pause(5);
         WriteQueue("s3", "", Line(2, s3_ + "/a/1"));
       }},
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
    c.prepare();
    for (const Request& r : requests) {
      Json::Value additional;
      ASSERT_TRUE(fromString(additional, r.additional));
      Json::Value naive, fast;
      std::vector<std::string> naive_log, fast_log;
      testing::Outcome naive_outcome, fast_outcome;
      {
        testing::LogCapture log;
        errno = 0;
        naive_outcome = OutcomeOf(
            [&] { naive = NaiveList(r.offset, r.limit, r.sort_by, r.direction, additional); });
        naive_log = WithoutLineNumbers(log.lines());
      }
      {
        testing::LogCapture log;
        errno = 0;
        fast_outcome = OutcomeOf(
            [&] { FolderList(fast, r.offset, r.limit, r.sort_by, r.direction, additional); });
        fast_log = WithoutLineNumbers(log.lines());
      }
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
