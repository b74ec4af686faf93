// Storms and faults on the whole road, with the real programs in a temporary
// root: after each one, once the system has settled, the index holds exactly
// what a walk of the tree finds (every file and directory with its size and
// change times) and nothing else. Settling is a barrier through the road
// itself: a mark file is rewritten, and once the index describes it and the
// indexing daemon is idle with no queue left, every earlier change has been
// carried (the watcher reports in order and batches are done in order).
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "orvex/foundation/json.h"
#include "orvex/policy/custom_event.h"
#include "orvex/queue/event.h"
#include "support/ask_daemon.h"
#include "support/program_test.h"

namespace orvex {
namespace testing {
namespace {

namespace fs = std::filesystem;

#if defined(__SANITIZE_ADDRESS__)
constexpr size_t kDefaultFiles = 500;  // the sanitized build is several times slower
#else
constexpr size_t kDefaultFiles = 2000;
#endif
constexpr auto kPatience = std::chrono::seconds(100);
constexpr auto kPoll = std::chrono::milliseconds(20);

// The size of the big storms; ORVEX_STORM_FILES scales them (20000 is a
// large unpacked archive).
size_t StormFiles() {
  const char* text = std::getenv("ORVEX_STORM_FILES");
  const long n = text != nullptr ? std::strtol(text, nullptr, 10) : 0;
  return n >= 100 ? static_cast<size_t>(n) : kDefaultFiles;
}

// A file or directory as its document must describe it.
struct Entry {
  bool dir = false;
  long long size = -1;
  long long ctime = -1;
  long long mtime = -1;
  bool operator==(const Entry& o) const {
    return dir == o.dir && size == o.size && ctime == o.ctime && mtime == o.mtime;
  }
};
using Listing = std::map<std::string, Entry>;

bool IsMetadataName(const std::string& name) {
  return name == "@eaDir" || name == "#recycle" || name == "#snapshot";
}

// Links are entries of their own and never followed.
void WalkInto(const std::string& path, Listing& out) {
  struct stat st;
  if (::lstat(path.c_str(), &st) != 0) return;
  out[path] = {S_ISDIR(st.st_mode), st.st_size, st.st_ctim.tv_sec, st.st_mtim.tv_sec};
  std::error_code unreadable;  // a directory the walker may not read is a document, alone
  if (!S_ISDIR(st.st_mode)) return;
  for (const auto& entry : fs::directory_iterator(path, unreadable)) {
    const std::string name = entry.path().filename().string();
    if (!IsMetadataName(name)) WalkInto(path + "/" + name, out);
  }
}

std::string Describe(const std::string& path, const Entry& e) {
  return path + (e.dir ? " dir" : "") + " size " + std::to_string(e.size) + " ctime " +
         std::to_string(e.ctime) + " mtime " + std::to_string(e.mtime);
}

// What differs between the disk and the index, a few lines at most.
std::string Differences(const Listing& disk, const Listing& index) {
  std::string out;
  int shown = 0;
  size_t count = 0;
  const auto note = [&](const std::string& line) {
    ++count;
    if (shown++ < 12) out += "  " + line + "\n";
  };
  for (const auto& [path, entry] : disk) {
    const auto it = index.find(path);
    if (it == index.end()) {
      note("missing " + Describe(path, entry));
    } else if (!(it->second == entry)) {
      note("stale " + Describe(path, it->second) + ", is " + Describe(path, entry));
    }
  }
  for (const auto& [path, entry] : index) {
    if (!disk.count(path)) note("extra " + Describe(path, entry));
  }
  return count == 0 ? out : std::to_string(count) + " differences:\n" + out;
}

void WriteFile(const std::string& path, const std::string& text) {
  fs::create_directories(fs::path(path).parent_path());
  std::ofstream(path, std::ios::binary) << text;
}

// files files in directories of 100, two levels deep, below dir; one in ten
// is a text document, whose content is read.
void MakeFiles(const std::string& dir, size_t files) {
  for (size_t i = 0; i < files; ++i) {
    const std::string sub = dir + "/d" + std::to_string(i / 500) + "/e" + std::to_string(i / 100);
    const std::string name = "f" + std::to_string(i) + (i % 10 == 0 ? ".txt" : ".bin");
    WriteFile(sub + "/" + name, "content of file " + std::to_string(i) + "\n");
  }
}

int Shell(const std::string& command) { return std::system(command.c_str()); }

class StormTest : public ProgramTest {
 protected:
  StormTest() : ProgramTest("orvex") {}

  void SetUp() override {
    ProgramTest::SetUp();
    share_ = io_.Join("tree");
    fs::create_directories(share_);
  }

  void TearDown() override {
    Run({"down"});  // never leave daemons behind, whatever the test did
  }

  void Up() {
    const ProgramOutcome up = Run({"up"});
    ASSERT_EQ(0, up.status) << up.out << up.err;
  }

  // Registers the tree as a share and makes it an indexed folder; waits
  // until it is searchable unless wait is false.
  void Index(bool wait = true) {
    const ProgramOutcome index =
        Run({"index", share_, "--timeout", wait ? std::to_string(kPatience.count()) : "1"});
    ASSERT_EQ(0, index.status) << index.out << index.err;
  }

  // The indexing daemon's status of the share; null when it does not answer.
  Json::Value ShareStatus() {
    return AskDaemon(root_.Join("var/run/fileindexd.sock"),
                     Parse(R"({"type": "status", "data": null})"))["data"]["shares"]["tree"];
  }

  // The documents whose path begins with prefix.
  Json::Value Documents(const std::string& prefix) {
    Json::Value request;
    request["command"] = "document_get_by_query";
    request["data"]["id"] = "fileindex_tree";
    request["data"]["query"]["qsl"]["prefix"]["KALOMDPath"] = prefix;
    return AskDaemon(root_.Join("var/run/kaloelasticd.sock"), request)["data"];
  }

  Listing Indexed() {
    Listing out;
    for (const Json::Value& doc : Documents(share_)) {
      const std::string path = doc["KALOMDPath"].asString();
      if (path != share_ && path.compare(0, share_.size() + 1, share_ + "/") != 0) continue;
      out[path] = {doc["KALOMDIsDir"].asBool(), doc["KALOMDFSSize"].asInt64(),
                   doc["KALOMDAttributeChangeDate"].asInt64(),
                   doc["KALOMDFSContentChangeDate"].asInt64()};
    }
    return out;
  }

  std::string QueuePath() const { return share_ + "/@eaDir/@fileindex/queue"; }

  static bool HasBytes(const std::string& path) {
    struct stat st;
    return ::stat(path.c_str(), &st) == 0 && st.st_size > 0;
  }

  // Waits until every change made so far has been carried into the index
  // (see the top of the file), then compares the index with the disk.
  void Settle(const std::string& what) {
    SCOPED_TRACE(what);
    const std::string mark = share_ + "/settled.mark";
    WriteFile(mark, std::string(++settles_, 'm'));
    const bool settled = WaitUntil([&] {
      const Json::Value docs = Documents(mark);
      return docs.size() == 1 && docs[0]["KALOMDFSSize"].asUInt64() == settles_ && Idle();
    });
    ASSERT_TRUE(settled) << "not settled: " << toString(ShareStatus());
    Listing disk;
    WalkInto(share_, disk);
    EXPECT_EQ("", Differences(disk, Indexed()));
  }

  // Whether the indexing daemon is idle with nothing queued.
  bool Idle() {
    const Json::Value status = ShareStatus();
    return status["state"] == "idle" && status["todo"] == 0 && !HasBytes(QueuePath()) &&
           !HasBytes(QueuePath() + ".tmp");
  }

  long long Reads() { return ShareStatus()["total_read"].asInt64(); }

  // Kills a daemon without warning and waits until it is gone (a zombie
  // counts as gone).
  void Kill(const std::string& name) {
    DaemonProcess daemon;
    ASSERT_TRUE(daemon.Adopt(PidFile(name))) << name;
    ASSERT_EQ(0, daemon.Stop(SIGKILL)) << name << " does not die";
  }

  // Starts one daemon again (orvex up would take a zombie for it).
  void Restart(const std::string& name) {
    const ProgramOutcome started = RunIn(BuiltProgram(name), {});
    ASSERT_EQ(0, started.status) << started.err;
  }

  // Waits until the indexing daemon has sent at least done documents in
  // its life, or has nothing left to do.
  void WaitDone(long long done) {
    ASSERT_TRUE(WaitUntil([&] { return ShareStatus()["total_done"].asInt64() >= done || Idle(); }))
        << toString(ShareStatus());
  }

  template <typename Pred>
  static bool WaitUntil(Pred pred) {
    return testing::WaitUntil(pred, kPatience, kPoll);
  }

  std::string share_;
  size_t settles_ = 0;
};

TEST_F(StormTest, AfterEveryStormTheIndexIsTheTreeAsItIs) {
  const size_t n = StormFiles();
  Up();
  Index();
  const std::string outside = io_.Join("outside");
  const std::vector<std::pair<const char*, std::function<void()>>> storms = {
      {"untar",
       [&] {
         MakeFiles(outside + "/archive", n);
         ASSERT_EQ(0, Shell("tar -C " + outside + "/archive -cf " + outside +
                            "/a.tar . && tar -C " + share_ + " -xf " + outside + "/a.tar"));
       }},
      {"modify",
       [&] {
         for (size_t i = 0; i < n; i += 20) {
           std::ofstream(share_ + "/d" + std::to_string(i / 500) + "/e" + std::to_string(i / 100) +
                             "/f" + std::to_string(i) + (i % 10 == 0 ? ".txt" : ".bin"),
                         std::ios::app)
               << "more\n";
         }
       }},
      {"rename a directory of half the files, reading none again",
       [&] {
         fs::create_directories(share_ + "/half");
         for (size_t d = 0; d < (n + 999) / 1000; ++d) {  // half the d* directories, at least one
           fs::rename(share_ + "/d" + std::to_string(d), share_ + "/half/d" + std::to_string(d));
         }
         Settle("moved into a new directory");
         const long long reads = Reads();
         fs::rename(share_ + "/half", share_ + "/renamed");
         Settle("rename");
         // The mark, read at the settle, and nothing else.
         EXPECT_EQ(reads + 1, Reads());
       }},
      {"a directory out of the share and another in",
       [&] {
         fs::rename(share_ + "/renamed/d0/e1", outside + "/e1");
         MakeFiles(outside + "/incoming", 150);
         fs::rename(outside + "/incoming", share_ + "/incoming");
       }},
      {"rm -rf half",
       [&] {
         for (const auto& entry : fs::directory_iterator(share_ + "/renamed")) {
           if (entry.path().filename().string().back() % 2 == 0) fs::remove_all(entry.path());
         }
         fs::remove_all(share_ + "/incoming/d0/e1");
       }},
      {"create and delete the same names a hundred times",
       [&] {
         for (int round = 0; round < 100; ++round) {
           for (int i = 0; i < 10; ++i) WriteFile(share_ + "/burst/b" + std::to_string(i), "b");
           for (int i = 0; i < 10; ++i) fs::remove(share_ + "/burst/b" + std::to_string(i));
         }
         for (int i = 0; i < 10; i += 2) WriteFile(share_ + "/burst/b" + std::to_string(i), "last");
       }},
      {"git checkout of another branch",
       [&] {
         if (Shell("git --version >/dev/null 2>&1") != 0) {
           std::cout << "git is not installed: no checkout storm\n";
           return;
         }
         const std::string repo = share_ + "/repo";
         MakeFiles(repo + "/main", 200);
         const std::string git = "git -C " + repo + " -c user.name=t -c user.email=t@t ";
         ASSERT_EQ(0, Shell(git + "init -q -b main && " + git + "add -A && " + git +
                            "commit -qm main && " + git + "checkout -qb other && rm -rf " + repo +
                            "/main/d0/e1 && mv " + repo + "/main/d0/e0 " + repo + "/moved && " +
                            git + "add -A && " + git + "commit -qm other"));
         Settle("branches made");
         MakeFiles(repo + "/main/d0/e1", 50);  // untracked, in the way of nothing
         ASSERT_EQ(0, Shell(git + "checkout -q main"));
       }},
  };
  for (const auto& [name, storm] : storms) {
    storm();
    Settle(name);
    if (HasFatalFailure()) return;
  }
}

TEST_F(StormTest, KilledIndexingDaemonConvergesAfterRestart) {
  MakeFiles(share_, StormFiles());
  Up();
  Index(/*wait=*/false);
  const long long step = static_cast<long long>(StormFiles() / 4);
  for (int kill = 0; kill < 3; ++kill) {
    WaitDone(step);
    Kill("fileindexd");
    Restart("fileindexd");
  }
  Settle("after the kills");
}

TEST_F(StormTest, SearchDaemonKilledMidBatchThenBackConverges) {
  MakeFiles(share_, 100);
  Up();
  Index();
  // Killed in the middle of a batch, it loses what was not committed.
  const long long before = ShareStatus()["total_done"].asInt64();
  // Moved in whole: one walk that nothing else repeats.
  MakeFiles(io_.Join("while-away"), StormFiles());
  fs::rename(io_.Join("while-away"), share_ + "/while-away");
  WaitDone(before + static_cast<long long>(StormFiles() / 4));
  Kill("kaloelasticd");
  fs::remove_all(share_ + "/d0/e0");
  ASSERT_TRUE(WaitUntil([&] { return ShareStatus()["state"] == "retrying"; }))
      << toString(ShareStatus());
  Restart("kaloelasticd");
  // Resuming tells the workers to try again at once instead of at their
  // next retry.
  ASSERT_EQ(0, Run({"resume"}).status);
  Settle("search daemon back");
}

TEST_F(StormTest, PauseMidIndexHoldsAndResumeConverges) {
  MakeFiles(share_, StormFiles());
  Up();
  Index(/*wait=*/false);
  WaitDone(static_cast<long long>(StormFiles() / 4));
  ASSERT_EQ(0, Run({"pause"}).status);
  EXPECT_EQ("paused", ShareStatus()["state"].asString());
  const long long done = ShareStatus()["total_done"].asInt64();
  MakeFiles(share_ + "/while-paused", 100);
  EXPECT_EQ(done, ShareStatus()["total_done"].asInt64());
  ASSERT_EQ(0, Run({"resume"}).status);
  Settle("resumed");
}

TEST_F(StormTest, LostEventsAndACrashMarkEndInAWalkThatConverges) {
  MakeFiles(share_, 300);
  Up();
  Index();
  // The watcher away stands for a kernel queue that overflowed: the changes
  // meanwhile are lost, and the watcher marks the queue crashed.
  Kill("kalonotifyd");
  MakeFiles(share_ + "/unseen", 200);
  fs::remove_all(share_ + "/d0/e2");
  std::ofstream(share_ + "/d0/e0/f0.txt", std::ios::app) << "changed unseen\n";
  fileindex::AddCustomEvent(fileindex::EVENT_QUEUE_CRASHED, share_, "", Json::Value());
  Restart("kalonotifyd");
  Settle("crash mark");
}

TEST_F(StormTest, FullVolumeDuringCommitFlagsTheShareAndSpaceBackReindexes) {
  // Just above the free space a share needs to be indexed at all (100 MiB).
  if (::mount("tmpfs", share_.c_str(), "tmpfs", 0, "size=112m") != 0) {
    GTEST_SKIP() << "cannot mount a small tmpfs for the share: " << std::strerror(errno);
  }
  struct Unmount {
    std::string path;
    ~Unmount() { ::umount2(path.c_str(), MNT_DETACH); }
  } unmount{share_};
  MakeFiles(share_, 100);
  Up();
  Index();
  // Changes queued while indexing is paused, then the volume filled: their
  // documents cannot be committed once indexing resumes.
  ASSERT_EQ(0, Run({"pause"}).status);
  MakeFiles(share_ + "/late", 20);
  WriteFile(share_ + "/late.mark", "");
  ASSERT_TRUE(
      WaitUntil([&] { return ReadFileText(QueuePath()).find("late.mark") != std::string::npos; }));
  const std::string filler = share_ + "/@eaDir/filler";
  {
    std::ofstream out(filler, std::ios::binary);
    const std::string block(64 * 1024, 'f');
    while (out.write(block.data(), block.size()).flush()) {
    }
  }
  ASSERT_EQ(0, Run({"resume"}).status);
  const std::string status_file = root_.Join("var/packages/Orvex/etc/fileindex.status");
  ASSERT_TRUE(WaitUntil([&] {
    Json::Value status;
    return fromFile(status, status_file) && status["share"]["tree"].asInt() & 1;
  })) << toString(ShareStatus());
  fs::remove(filler);
  ASSERT_EQ(0, Run({"resume"}).status);
  Settle("space back");
  Json::Value status;
  ASSERT_TRUE(fromFile(status, status_file));
  EXPECT_EQ(0, status["share"]["tree"].asInt() & 1) << toString(status);
}

TEST_F(StormTest, BadInputIsSkippedAndTheRestIndexed) {
  MakeFiles(share_, 300);
  Up();
  Index();
  const std::vector<std::pair<const char*, std::function<void()>>> inputs = {
      {"queue lines the watcher did not write",
       [&] {
         std::ofstream(QueuePath(), std::ios::app)
             << "not json\n{\"event\": \"64\", \"path\": 1}\n{}\n\n{\"event\": 64}\n";
         WriteFile(share_ + "/after-garbage.bin", "x");
       }},
      {"a folder replaced by a link to /, a link loop and a dangling link",
       [&] {
         fs::remove_all(share_ + "/d0/e1");
         fs::create_directory_symlink("/", share_ + "/d0/e1");
         fs::create_directory_symlink(share_, share_ + "/d0/loop");
         fs::create_symlink("b", share_ + "/d0/a");
         fs::create_symlink("a", share_ + "/d0/b");
         fs::create_symlink("nowhere", share_ + "/d0/dangling");
       }},
      {"names with a newline and with bytes that are not UTF-8",
       [&] {
         WriteFile(share_ + "/odd/two\nlines.txt", "newline");
         WriteFile(share_ + "/odd/latin1-\xe9t\xe9.bin", "latin-1");
         WriteFile(share_ + "/odd/\xff\xfe.txt", "not UTF-8");
       }},
      {"a directory nobody may read",
       [&] {
         MakeFiles(share_ + "/closed", 20);
         fs::permissions(share_ + "/closed", fs::perms::none);
       }},
      {"the share root gone and back with other content",
       [&] {
         fs::rename(share_, io_.Join("tree.gone"));
         fs::create_directory(share_);
         MakeFiles(share_ + "/back", 50);
       }},
  };
  for (const auto& [name, input] : inputs) {
    input();
    Settle(name);
    if (HasFatalFailure()) return;
  }
  fs::permissions(io_.Join("tree.gone/closed"), fs::perms::owner_all);
}

}  // namespace
}  // namespace testing
}  // namespace orvex
