// The watcher driven step by step (RunOnce) on a temporary tree: the lines it
// appends for each kind of change, registrations followed while it runs, new
// directories, ignored names, masks, a kernel queue overflow, and folders that
// go away and come back. Every test reads the queue file as the indexing
// daemon would. Then the watcher against the truth: after storms of changes,
// the queue folded by the library's own operation tree and applied to a
// naive model of the index must give exactly the files that are on disk; a
// lost or misordered line shows as a difference.
#include "watch/watcher.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "kalo/kalo_notify.h"
#include "orvex/portable/root.h"
#include "orvex/queue/event.h"
#include "orvex/queue/op_tree.h"
#include "support/log_capture.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace watch {
namespace {

namespace fs = std::filesystem;
using KALO::KALONOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION;
using KALO::KALONOTIFYD::MonitorQueue;

constexpr unsigned kAllKinds = 65478;  // what the library registers

// The line the watcher must write, spelt out independently of its writer.
std::string Line(unsigned event, bool is_dir, const std::string& path,
                 const std::string& path_old = "") {
  std::string line = "{\"event\":" + std::to_string(event) +
                     ",\"is_dir\":" + (is_dir ? "true" : "false") + ",\"path\":\"" + path + "\"";
  if (!path_old.empty()) line += ",\"path_old\":\"" + path_old + "\"";
  return line + "}";
}

// The two lines of a file made and written: its create, then its modify.
std::vector<std::string> Written(const std::string& path) {
  return {Line(64, false, path), Line(2, false, path)};
}

class WatcherTest : public ::testing::Test {
 protected:
  void SetUp() override {
    fs::create_directories(share_);
    fs::create_directories(outside_);
    WatcherOptions options;
    options.registry_dir = portable::RootPath(KALO::KALONOTIFYD::kMonitorRegistryDir);
    options.missing_retry = std::chrono::milliseconds(0);
    options.watch_fault = [this](const std::string& dir) {
      return dir.size() >= 5 && dir.compare(dir.size() - 5, 5, "/full") == 0 ? watch_fault_ : 0;
    };
    watcher_ = std::make_unique<Watcher>(options);
    std::string why;
    ASSERT_TRUE(watcher_->Start(why)) << why;
  }

  void Register(const std::vector<std::string>& folders, unsigned mask = kAllKinds,
                const std::vector<std::string>& ignore = {"@eaDir"}) {
    Json::Value desc(Json::objectValue);
    desc["queue"] = queue_;
    desc["config"] = Json::Value(Json::arrayValue);
    for (const std::string& folder : folders) {
      Json::Value entry(Json::objectValue);
      entry["path"] = folder;
      entry["mask"] = mask;
      entry["ignore"] = Json::Value(Json::arrayValue);
      for (const std::string& name : ignore) entry["ignore"].append(name);
      desc["config"].append(entry);
    }
    ASSERT_TRUE(
        MonitorQueue::Upsert(MonitorQueue(desc), "fileindex", MONITOR_QUEUE_TYPE_APPLICATION));
  }

  // Steps until a step finds nothing more to do.
  void Drain() {
    for (int i = 0; i < 10000 && watcher_->RunOnce(0) > 0; ++i) {
    }
  }

  // Lines written since the last call.
  std::vector<std::string> NewLines() {
    Drain();
    const std::vector<std::string> all = testing::SplitLines(testing::ReadFileText(queue_));
    std::vector<std::string> fresh(all.begin() + static_cast<long>(seen_), all.end());
    seen_ = all.size();
    return fresh;
  }

  static void WriteFile(const std::string& path, const std::string& content = "x") {
    std::ofstream(path, std::ios::binary) << content;
  }

  testing::TempDir dir_;
  testing::ScopedOrvexRoot orvex_root_{dir_.path()};
  const std::string share_ = dir_.Join("volume1/photo");
  const std::string outside_ = dir_.Join("outside");
  std::string queue_ = share_ + "/@eaDir/@fileindex/queue";
  std::unique_ptr<Watcher> watcher_;
  size_t seen_ = 0;
  int watch_fault_ = 0;  // errno for watches of directories named "full"
};

// Registrations are followed while the watcher runs: added, changed to
// another folder list, removed.
TEST_F(WatcherTest, RegistrationsAreFollowedWhileRunning) {
  fs::create_directories(share_ + "/a");
  fs::create_directories(share_ + "/b");
  WriteFile(share_ + "/before");
  Drain();
  EXPECT_FALSE(fs::exists(queue_));
  Register({share_ + "/a"});
  Drain();
  WriteFile(share_ + "/a/x");
  EXPECT_EQ(Written(share_ + "/a/x"), NewLines());
  Register({share_ + "/b"});
  Drain();
  WriteFile(share_ + "/a/y");
  WriteFile(share_ + "/b/y");
  EXPECT_EQ(Written(share_ + "/b/y"), NewLines());
  ASSERT_TRUE(MonitorQueue::Delete(queue_, "fileindex", MONITOR_QUEUE_TYPE_APPLICATION));
  Drain();
  WriteFile(share_ + "/b/z");
  EXPECT_TRUE(NewLines().empty());
  EXPECT_EQ(0u, watcher_->watch_count());
}

TEST_F(WatcherTest, EachKindOfChangeHasItsLine) {
  Register({share_});
  Drain();
  const std::string f = share_ + "/f.txt";
  const std::string d = share_ + "/d";
  WriteFile(f);
  ASSERT_EQ(0, ::chmod(f.c_str(), 0600));
  ASSERT_EQ(0, ::unlink(f.c_str()));
  ASSERT_EQ(0, ::mkdir(d.c_str(), 0755));
  ASSERT_EQ(0, ::chmod(d.c_str(), 0700));
  ASSERT_EQ(0, ::rmdir(d.c_str()));
  EXPECT_EQ((std::vector<std::string>{Line(64, false, f), Line(2, false, f), Line(4, false, f),
                                      Line(128, false, f), Line(64, true, d), Line(4, true, d),
                                      Line(128, true, d)}),
            NewLines());
}

TEST_F(WatcherTest, RenamesArePairedAndLoneHalvesBecomeDeleteOrCreate) {
  fs::create_directories(share_ + "/d/sub");
  WriteFile(share_ + "/a");
  WriteFile(outside_ + "/in");
  Register({share_});
  Drain();
  fs::rename(share_ + "/a", share_ + "/b");
  fs::rename(share_ + "/d", share_ + "/e");
  fs::rename(share_ + "/b", outside_ + "/b");
  fs::rename(outside_ + "/in", share_ + "/in");
  EXPECT_EQ(
      (std::vector<std::string>{Line(256, false, share_ + "/b", share_ + "/a"),
                                Line(256, true, share_ + "/e", share_ + "/d"),
                                Line(128, false, share_ + "/b"), Line(64, false, share_ + "/in")}),
      NewLines());
  // The renamed directory's watches follow it.
  WriteFile(share_ + "/e/sub/z");
  EXPECT_EQ(Written(share_ + "/e/sub/z"), NewLines());
}

TEST_F(WatcherTest, DirectoryMovedOutIsNoLongerWatchedAndMovedInIs) {
  fs::create_directories(outside_ + "/in/deep");
  fs::create_directories(share_ + "/out");
  Register({share_});
  Drain();
  fs::rename(share_ + "/out", outside_ + "/out");
  fs::rename(outside_ + "/in", share_ + "/in");
  EXPECT_EQ(
      (std::vector<std::string>{Line(128, true, share_ + "/out"), Line(64, true, share_ + "/in")}),
      NewLines());
  WriteFile(outside_ + "/out/gone");
  WriteFile(share_ + "/in/deep/here");
  EXPECT_EQ(Written(share_ + "/in/deep/here"), NewLines());
}

TEST_F(WatcherTest, EveryFileOfANewDirectoryReachesTheQueue) {
  Register({share_});
  Drain();
  std::set<std::string> made;
  // Files and directories made right after mkdir, before the watcher has
  // had a chance to watch the new directory.
  for (int i = 0; i < 5; ++i) {
    const std::string d = share_ + "/new" + std::to_string(i);
    ASSERT_EQ(0, ::mkdir(d.c_str(), 0755));
    ASSERT_EQ(0, ::mkdir((d + "/inner").c_str(), 0755));
    made.insert(d);
    made.insert(d + "/inner");
    for (int j = 0; j < 40; ++j) {
      const std::string f = d + (j % 2 ? "/inner" : "") + "/f" + std::to_string(j);
      WriteFile(f);
      made.insert(f);
    }
  }
  std::set<std::string> created;
  for (const std::string& line : NewLines()) {
    fileindex::Event ev(line);
    if (ev.event == fileindex::EVENT_CREATE) created.insert(ev.path);
  }
  EXPECT_EQ(made, created);
  // And the new directories are watched from now on.
  WriteFile(share_ + "/new3/inner/late");
  EXPECT_EQ(Line(64, false, share_ + "/new3/inner/late"), NewLines().at(0));
}

TEST_F(WatcherTest, IgnoredNamesMetadataAndQueueFilesAreSkipped) {
  queue_ = share_ + "/q/queue";  // a queue inside its own folder
  fs::create_directories(share_ + "/skip/deeper");
  fs::create_directories(share_ + "/q");
  Register({share_}, kAllKinds, {"skip", "@eaDir"});
  Drain();
  WriteFile(share_ + "/skip/a");
  WriteFile(share_ + "/skip/deeper/b");
  fs::create_directories(share_ + "/@eaDir/x");
  WriteFile(share_ + "/@eaDir/x/c");
  fs::create_directories(share_ + "/sub/skip");
  WriteFile(share_ + "/sub/skip/d");
  WriteFile(share_ + "/kept");
  // The watcher's own appends to the queue must not feed back into it.
  for (int round = 0; round < 3; ++round) Drain();
  EXPECT_EQ(
      (std::vector<std::string>{Line(64, true, share_ + "/sub"), Line(64, false, share_ + "/kept"),
                                Line(2, false, share_ + "/kept")}),
      NewLines());
}

TEST_F(WatcherTest, OnlyKindsInTheMaskAreWritten) {
  Register({share_}, fileindex::EVENT_CREATE | fileindex::EVENT_DELETE);
  Drain();
  const std::string f = share_ + "/f";
  WriteFile(f);
  ASSERT_EQ(0, ::chmod(f.c_str(), 0600));
  fs::rename(f, share_ + "/g");
  ASSERT_EQ(0, ::unlink((share_ + "/g").c_str()));
  // No rename bit: the rename is told as the two changes it makes.
  EXPECT_EQ(
      (std::vector<std::string>{Line(64, false, f), Line(128, false, f),
                                Line(64, false, share_ + "/g"), Line(128, false, share_ + "/g")}),
      NewLines());
}

TEST_F(WatcherTest, NestedFoldersOfOneQueueTellEachChangeOnce) {
  fs::create_directories(share_ + "/a/b");
  Register({share_ + "/a", share_ + "/a/b"});
  Drain();
  WriteFile(share_ + "/a/b/f");
  EXPECT_EQ(Written(share_ + "/a/b/f"), NewLines());
}

TEST_F(WatcherTest, NamesWithAnyBytesStayOneValidLine) {
  Register({share_});
  Drain();
  const std::string name = "new\nline \"quoted\" \\ tab\t \xff\xfe end";
  WriteFile(share_ + "/" + name);
  const std::vector<std::string> lines = NewLines();
  ASSERT_EQ(2u, lines.size());
  for (const std::string& line : lines) {
    fileindex::Event ev(line);
    EXPECT_EQ(share_ + "/" + name, ev.path);
  }
}

TEST_F(WatcherTest, KernelQueueOverflowWritesTheCrashMark) {
  Register({share_});
  Drain();
  long limit = 16384;
  std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> limit;
  const std::string a = share_ + "/a";
  const std::string b = share_ + "/b";
  WriteFile(a);
  WriteFile(b);
  testing::LogCapture log;
  // Alternating files: the kernel merges a repeat of the last event only.
  for (long i = 0; i < limit + 100; ++i) {
    ASSERT_EQ(0, ::chmod(i % 2 ? a.c_str() : b.c_str(), i % 4 < 2 ? 0600 : 0644));
  }
  const std::vector<std::string> lines = NewLines();
  EXPECT_EQ(1, std::count(lines.begin(), lines.end(), Line(512, false, share_)));
  EXPECT_EQ(1u, log.Matching("fs.inotify.max_queued_events").size());
  // Still watching afterwards.
  WriteFile(share_ + "/after");
  EXPECT_EQ(Line(64, false, share_ + "/after"), NewLines().at(0));
}

TEST_F(WatcherTest, WatchLimitWritesTheCrashMarkAndSaysWhichSysctl) {
  Register({share_});
  Drain();
  watch_fault_ = ENOSPC;
  testing::LogCapture log;
  fs::create_directories(share_ + "/a/full");
  fs::create_directories(share_ + "/b/full");
  const std::vector<std::string> lines = NewLines();
  EXPECT_EQ(1, std::count(lines.begin(), lines.end(), Line(512, false, share_)));
  EXPECT_LE(1, std::count(lines.begin(), lines.end(), Line(64, true, share_ + "/a/full")));
  EXPECT_EQ(1u, log.Matching("fs.inotify.max_user_watches").size());
  EXPECT_LE(2u, watcher_->Status()["watch_limit_hits"].asUInt());
  // Changes elsewhere go on being told.
  WriteFile(share_ + "/a/ok");
  EXPECT_EQ(Line(64, false, share_ + "/a/ok"), NewLines().at(0));
}

TEST_F(WatcherTest, FolderThatGoesAwayIsWatchedAgainWhenItReturns) {
  const std::string folder = share_ + "/docs";
  fs::create_directories(folder + "/sub");
  Register({folder});
  Drain();
  testing::LogCapture log;
  fs::remove_all(folder);
  EXPECT_EQ((std::vector<std::string>{Line(128, true, folder + "/sub"), Line(128, true, folder)}),
            NewLines());
  EXPECT_EQ(1u, log.Matching(folder + " of queue").size());
  fs::create_directories(folder);
  EXPECT_EQ(std::vector<std::string>{Line(64, true, folder)}, NewLines());
  WriteFile(folder + "/back");
  EXPECT_EQ(Written(folder + "/back"), NewLines());
}

TEST_F(WatcherTest, FolderMissingAtRegistrationIsWatchedOnceItExists) {
  const std::string folder = share_ + "/later";
  Register({folder});
  Drain();
  EXPECT_EQ(0u, watcher_->watch_count());
  fs::create_directories(folder);
  EXPECT_EQ(std::vector<std::string>{Line(64, true, folder)}, NewLines());
  WriteFile(folder + "/f");
  EXPECT_EQ(Line(64, false, folder + "/f"), NewLines().at(0));
}

TEST_F(WatcherTest, StatusTellsFoldersWatchesAndLines) {
  fs::create_directories(share_ + "/a/b");
  Register({share_});
  Drain();
  WriteFile(share_ + "/f");
  Drain();
  const Json::Value status = watcher_->Status();
  EXPECT_EQ(3u, status["watches"].asUInt());  // share, a, a/b
  ASSERT_EQ(1u, status["folders"].size());
  EXPECT_EQ(share_, status["folders"][0]["path"].asString());
  EXPECT_TRUE(status["folders"][0]["watched"].asBool());
  ASSERT_EQ(1u, status["queues"].size());
  EXPECT_EQ(queue_, status["queues"][0]["queue"].asString());
  EXPECT_EQ(2u, status["queues"][0]["lines_written"].asUInt());
}

using fileindex::OP;

bool IsUnder(const std::string& path, const std::string& top) {
  return path == top || path.rfind(top + "/", 0) == 0;
}

// Regular files on disk at or below top, skipping the metadata folders.
std::set<std::string> FilesOnDisk(const std::string& top) {
  std::set<std::string> files;
  if (!fs::is_directory(top)) return files;
  for (auto it = fs::recursive_directory_iterator(top); it != fs::end(it); ++it) {
    if (it->path().filename() == "@eaDir") {
      it.disable_recursion_pending();
      continue;
    }
    if (it->is_regular_file()) files.insert(it->path().string());
  }
  return files;
}

// The index as the indexing daemon would leave it: files only. A re-index
// reads the disk as it is at the end, which is when the daemon would run.
class IndexModel {
 public:
  explicit IndexModel(std::string share) : share_(std::move(share)) {}

  void Apply(const std::shared_ptr<OP>& op) {
    const std::string path = op->node->GetPath();
    switch (op->kind) {
      case fileindex::OP_UPSERT:
        files_.insert(path);
        break;
      case fileindex::OP_DELETE:
        Drop(path);
        break;
      case fileindex::OP_RENAME: {
        std::set<std::string> moved;
        for (auto it = files_.begin(); it != files_.end();) {
          if (IsUnder(*it, op->path)) {
            moved.insert(path + it->substr(op->path.size()));
            it = files_.erase(it);
          } else {
            ++it;
          }
        }
        files_.insert(moved.begin(), moved.end());
        break;
      }
      case fileindex::OP_REINDEX:
        Reindex(path);
        break;
      case fileindex::OP_QUEUE_CRASHED:
        Reindex(share_);
        break;
      default:
        break;
    }
  }

  const std::set<std::string>& files() const { return files_; }

 private:
  void Drop(const std::string& top) {
    for (auto it = files_.begin(); it != files_.end();) {
      it = IsUnder(*it, top) ? files_.erase(it) : std::next(it);
    }
  }
  void Reindex(const std::string& top) {
    Drop(top);
    const std::set<std::string> now = FilesOnDisk(top);
    files_.insert(now.begin(), now.end());
  }

  std::string share_;
  std::set<std::string> files_;
};

class WatcherOracleTest : public WatcherTest {
 protected:
  void SetUp() override {
    WatcherTest::SetUp();
    Register({share_});
    Drain();
  }

  // Folds the queue as the indexing daemon does and applies it to model.
  void Fold(IndexModel& model) {
    fileindex::OPTree tree(queue_);
    tree.BuildTree();
    EXPECT_EQ(0u, tree.lines_skipped());
    EXPECT_FALSE(tree.crashed());
    tree.ProcessOP([&](std::shared_ptr<OP> op) { model.Apply(op); });
  }
};

TEST_F(WatcherOracleTest, StormFoldsToTheFilesOnDisk) {
  std::mt19937 random(20261124);
  // 2,000 files in nested directories, stepping only now and then so that
  // most directories are filled before the watcher has seen them.
  for (int a = 0; a < 10; ++a) {
    for (int b = 0; b < 10; ++b) {
      const std::string d = share_ + "/d" + std::to_string(a) + "/e" + std::to_string(b);
      fs::create_directories(d);
      for (int f = 0; f < 20; ++f) WriteFile(d + "/f" + std::to_string(f), "v1");
    }
    if (a % 3 == 0) watcher_->RunOnce(0);
  }
  Drain();
  for (int i = 0; i < 300; ++i) {
    const std::string f = share_ + "/d" + std::to_string(random() % 10) + "/e" +
                          std::to_string(random() % 10) + "/f" + std::to_string(random() % 20);
    WriteFile(f, "v2");
  }
  fs::rename(share_ + "/d3", share_ + "/d3-renamed");
  WriteFile(share_ + "/d3-renamed/e0/after-rename", "x");
  fs::remove_all(share_ + "/d5");
  fs::rename(share_ + "/d6/e6", outside_ + "/e6");
  fs::rename(share_ + "/d7/e7/f7", outside_ + "/f7");
  fs::create_directories(outside_ + "/incoming/deep");
  WriteFile(outside_ + "/incoming/deep/g", "x");
  fs::rename(outside_ + "/incoming", share_ + "/d8/incoming");
  fs::rename(share_ + "/d9/e9/f9", share_ + "/d9/e9/f9-renamed");
  fs::create_directories(share_ + "/d1/fresh/a/b");
  WriteFile(share_ + "/d1/fresh/a/b/h", "x");
  fs::remove_all(share_ + "/d2/e2");
  Drain();

  IndexModel model(share_);
  Fold(model);
  EXPECT_EQ(FilesOnDisk(share_), model.files());
  // 2,000 made, d5 (200) and d2/e2 (20) removed, d6/e6 (20) and one file
  // moved out, three files added.
  EXPECT_EQ(2000u - 200 - 20 - 20 - 1 + 3, model.files().size());
}

// Seeded random changes, with steps of the watcher at random points between
// them: whatever the interleaving, the folded queue must describe the disk.
class RandomStorm {
 public:
  RandomStorm(unsigned seed, std::string share, std::string outside)
      : random_(seed), share_(std::move(share)), outside_(std::move(outside)) {}

  void Step() {
    std::vector<std::string> dirs{share_};
    std::vector<std::string> files;
    for (auto it = fs::recursive_directory_iterator(share_); it != fs::end(it); ++it) {
      if (it->path().filename() == "@eaDir") {
        it.disable_recursion_pending();
      } else if (it->is_directory()) {
        dirs.push_back(it->path());
      } else {
        files.push_back(it->path());
      }
    }
    const std::string dir = Pick(dirs);
    const std::string fresh = dir + "/n" + std::to_string(counter_++);
    switch (random_() % 10) {
      case 0:
      case 1:
        Write(fresh);
        break;
      case 2:
        fs::create_directories(fresh + "/x");
        Write(fresh + "/x/f");
        Write(fresh + "/g");
        break;
      case 3:
        if (!files.empty()) Write(Pick(files));
        break;
      case 4:
        if (!files.empty())
          fs::permissions(Pick(files), fs::perms::owner_read | fs::perms::owner_write);
        break;
      case 5:
        if (!files.empty()) fs::remove(Pick(files));
        break;
      case 6: {  // rename a file or a directory, never into itself
        const std::string from = random_() % 2 || files.empty() ? Pick(dirs) : Pick(files);
        if (from != share_ && !IsUnder(dir, from)) fs::rename(from, fresh);
        break;
      }
      case 7: {  // out
        const std::string from = random_() % 2 || files.empty() ? Pick(dirs) : Pick(files);
        if (from != share_) fs::rename(from, outside_ + "/o" + std::to_string(counter_++));
        break;
      }
      case 8: {  // in
        const std::string made = outside_ + "/i" + std::to_string(counter_++);
        fs::create_directories(made + "/deep");
        Write(made + "/deep/h");
        fs::rename(made, fresh);
        break;
      }
      default:
        if (dir != share_) fs::remove_all(dir);
        break;
    }
  }

  bool Chance(unsigned in) { return random_() % in == 0; }

 private:
  const std::string& Pick(const std::vector<std::string>& from) {
    return from[random_() % from.size()];
  }
  static void Write(const std::string& path) { std::ofstream(path, std::ios::binary) << "x"; }

  std::mt19937 random_;
  std::string share_;
  std::string outside_;
  int counter_ = 0;
};

TEST_F(WatcherOracleTest, SeededRandomChangesFoldToTheFilesOnDisk) {
  for (unsigned seed = 1; seed <= 12; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    // Each seed starts from an empty folder and an empty queue.
    for (const auto& entry : fs::directory_iterator(share_)) {
      if (entry.path().filename() != "@eaDir") fs::remove_all(entry.path());
    }
    fs::remove_all(outside_);
    fs::create_directories(outside_);
    Drain();
    fs::remove(queue_);
    RandomStorm storm(seed, share_, outside_);
    for (int i = 0; i < 400; ++i) {
      storm.Step();
      if (storm.Chance(8)) watcher_->RunOnce(0);
    }
    Drain();
    IndexModel model(share_);
    Fold(model);
    ASSERT_EQ(FilesOnDisk(share_), model.files());
  }
}

}  // namespace
}  // namespace watch
}  // namespace orvex
