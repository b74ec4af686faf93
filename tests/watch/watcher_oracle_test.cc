// The watcher against the truth: after a storm of changes (thousands of files
// in nested directories, modifications, a directory renamed, a subtree
// removed, files moved out and in), the queue folded by the library's own
// operation tree and applied to a naive model of the index must give exactly
// the files that are on disk. A lost or misordered line shows as a difference.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "kalo/kalo_notify.h"
#include "orvex/portable/root.h"
#include "orvex/queue/op_tree.h"
#include "support/temp_dir.h"
#include "watch/watcher.h"

namespace orvex {
namespace watch {
namespace {

namespace fs = std::filesystem;
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

class WatcherOracleTest : public ::testing::Test {
 protected:
  void SetUp() override {
    fs::create_directories(share_);
    fs::create_directories(outside_);
    WatcherOptions options;
    options.registry_dir = portable::RootPath(KALO::KALONOTIFYD::kMonitorRegistryDir);
    watcher_ = std::make_unique<Watcher>(options);
    std::string why;
    ASSERT_TRUE(watcher_->Start(why)) << why;
    Json::Value desc(Json::objectValue);
    desc["queue"] = queue_;
    Json::Value entry(Json::objectValue);
    entry["path"] = share_;
    entry["mask"] = 65478;
    entry["ignore"].append("@eaDir");
    desc["config"].append(entry);
    ASSERT_TRUE(
        KALO::KALONOTIFYD::MonitorQueue::Upsert(KALO::KALONOTIFYD::MonitorQueue(desc), "fileindex",
                                                KALO::KALONOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION));
    Drain();
  }

  void Drain() {
    for (int i = 0; i < 10000 && watcher_->RunOnce(0) > 0; ++i) {
    }
  }

  static void WriteFile(const std::string& path, const std::string& content) {
    std::ofstream(path, std::ios::binary) << content;
  }

  // Folds the queue as the indexing daemon does and applies it to model.
  void Fold(IndexModel& model) {
    fileindex::OPTree tree(queue_);
    tree.BuildTree();
    EXPECT_EQ(0u, tree.lines_skipped());
    EXPECT_FALSE(tree.crashed());
    tree.ProcessOP([&](std::shared_ptr<OP> op) { model.Apply(op); });
  }

  testing::TempDir dir_;
  testing::ScopedOrvexRoot orvex_root_{dir_.path()};
  const std::string share_ = dir_.Join("volume1/share");
  const std::string outside_ = dir_.Join("elsewhere");
  const std::string queue_ = share_ + "/@eaDir/@fileindex/queue";
  std::unique_ptr<Watcher> watcher_;
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
