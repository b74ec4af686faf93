#include "orvex/queue/queue_mgr.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <sstream>
#include <utility>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/policy/custom_event.h"
#include "platform/share_test_root.h"
#include "queue/line_reader.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

using testing::LogCapture;
using testing::ScopedOrvexRoot;
using testing::TempDir;

std::string Line(uint32_t mask, const std::string& path, const std::string& path_old = "") {
  Json::Value line;
  line["event"] = mask;
  line["is_dir"] = false;
  line["path"] = path;
  if (!path_old.empty()) line["path_old"] = path_old;
  return toString(line);
}

std::string ReadFile(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

bool Exists(const std::string& path) {
  struct stat st;
  return ::stat(path.c_str(), &st) == 0;
}

// A queue directory with its live queue and snapshot, under a private
// ORVEX_ROOT (IsFullPathProcessing loads the folder configuration from it).
struct ScanCase {
  std::vector<std::string> live;
  std::vector<std::string> tmp;
  std::string full_path;
  bool expected;
};

class QueueMgrTest : public ::testing::Test {
 protected:
  void WriteLive(const std::vector<std::string>& lines) { Write(live_, lines); }
  void WriteTmp(const std::vector<std::string>& lines) { Write(tmp_, lines); }

  // Writes each case's live queue and snapshot and checks query's answer.
  void ExpectScans(const std::vector<ScanCase>& cases,
                   bool (QueueMgr::*query)(const std::string&)) {
    for (size_t i = 0; i < cases.size(); ++i) {
      const ScanCase& c = cases[i];
      std::filesystem::remove(live_);
      std::filesystem::remove(tmp_);
      if (!c.live.empty()) WriteLive(c.live);
      if (!c.tmp.empty()) WriteTmp(c.tmp);
      QueueMgr queue(live_);
      EXPECT_EQ(c.expected, (queue.*query)(c.full_path)) << "case " << i << ": " << c.full_path;
    }
  }

  static void Write(const std::string& path, const std::vector<std::string>& lines) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    for (const auto& line : lines) out << line << '\n';
  }

  // Paths of the ops handed out, printed as the consumer sees them.
  std::vector<std::string> Drain(QueueMgr& queue, bool use_tmp) {
    std::vector<std::string> seen;
    count_ = queue.ProcessOP(
        [&seen](std::shared_ptr<OP> op) {
          std::ostringstream text;
          text << op;
          seen.push_back(text.str());
        },
        use_tmp);
    return seen;
  }

  TempDir dir_;
  ScopedOrvexRoot root_{dir_.path()};
  std::string live_ = dir_.Join("queue");
  std::string tmp_ = dir_.Join("queue.tmp");
  int count_ = -1;
};

TEST_F(QueueMgrTest, NoLiveQueueHandsOutNothingAndCreatesNothing) {
  QueueMgr queue(live_);
  int calls = 0;
  EXPECT_EQ(0, queue.ProcessOP([&calls](std::shared_ptr<OP>) { ++calls; }, false));
  EXPECT_EQ(0, queue.ProcessOP([&calls](std::shared_ptr<OP>) { ++calls; }, true));
  EXPECT_EQ(0, calls);
  EXPECT_FALSE(queue.PrepareTmpQueue());
  // The lock is taken on the queue file itself: it must not be created just
  // to find that there is nothing to rotate.
  EXPECT_FALSE(Exists(live_));
  EXPECT_FALSE(Exists(tmp_));
  EXPECT_FALSE(queue.IsFullPathProcessing("/v/s"));
  EXPECT_FALSE(queue.IsFullPathHasReindex("/v/s"));
}

TEST_F(QueueMgrTest, RotationMovesTheLiveQueueWholeAndDeleteTmpRemovesIt) {
  const std::vector<std::string> lines = {Line(EVENT_CREATE, "/v/s/a"),
                                          Line(EVENT_MODIFY, "/v/s/b")};
  WriteLive(lines);
  const std::string before = ReadFile(live_);
  QueueMgr queue(live_);
  EXPECT_EQ((std::vector<std::string>{"[02] /v/s/a", "[02] /v/s/b"}), Drain(queue, true));
  EXPECT_EQ(2, count_);
  EXPECT_FALSE(Exists(live_));
  EXPECT_EQ(before, ReadFile(tmp_));
  // Nothing live any more: the next events start a fresh queue.
  EXPECT_TRUE(Drain(queue, false).empty());
  EXPECT_EQ(0, count_);
  queue.DeleteTmp();
  EXPECT_FALSE(Exists(tmp_));
  queue.DeleteTmp();  // a missing snapshot is not an error
}

TEST_F(QueueMgrTest, ExistingSnapshotIsKeptAndProcessedBeforeTheLiveQueue) {
  WriteTmp({Line(EVENT_DELETE, "/v/s/old")});
  WriteLive({Line(EVENT_CREATE, "/v/s/new")});
  const std::string live_before = ReadFile(live_);
  {
    QueueMgr queue(live_);
    EXPECT_TRUE(queue.PrepareTmpQueue());
    EXPECT_EQ(live_before, ReadFile(live_));
    EXPECT_EQ((std::vector<std::string>{"[01] /v/s/old"}), Drain(queue, true));
    EXPECT_EQ(live_before, ReadFile(live_));
    queue.DeleteTmp();
  }
  QueueMgr next(live_);
  EXPECT_EQ((std::vector<std::string>{"[02] /v/s/new"}), Drain(next, true));
  EXPECT_FALSE(Exists(live_));
}

TEST_F(QueueMgrTest, TreesAreBuiltOnceAndNeverRefreshed) {
  WriteLive({Line(EVENT_CREATE, "/v/s/a")});
  QueueMgr queue(live_);
  std::shared_ptr<OPTree> tree = queue.GetOPTree();
  WriteLive({Line(EVENT_CREATE, "/v/s/a"), Line(EVENT_CREATE, "/v/s/b")});
  EXPECT_EQ(tree, queue.GetOPTree());
  EXPECT_EQ((std::vector<std::string>{"[02] /v/s/a"}), Drain(queue, false));
  // The snapshot's tree comes from its own file, which does not exist.
  EXPECT_THROW(queue.GetOPTreeTmp(), Error);
}

TEST_F(QueueMgrTest, RenameFailureThrows502AndLeavesTheQueue) {
  // A live queue name of 252 bytes leaves no room for ".tmp" in one
  // component: the rename fails even for root.
  const std::string live = dir_.Join(std::string(252, 'q'));
  Write(live, {Line(EVENT_CREATE, "/v/s/a")});
  QueueMgr queue(live);
  LogCapture log;
  try {
    queue.PrepareTmpQueue();
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorSystem, e.code());
    EXPECT_EQ("rename failed, reason=File name too long", e.reason());
  }
  ASSERT_EQ(1u, log.lines().size());
  EXPECT_EQ(0u, log.lines()[0].rfind("queue_mgr:", 0)) << log.lines()[0];
  EXPECT_NE(std::string::npos,
            log.lines()[0].find("Failed [0 > rename(queue_path_.c_str(), "
                                "queue_path_tmp_.c_str())], reason: rename failed, reason="))
      << log.lines()[0];
  EXPECT_TRUE(Exists(live));
}

TEST_F(QueueMgrTest, IsFullPathProcessingMatchesWholeComponentsInBothFiles) {
  const std::vector<ScanCase> cases = {
      {{Line(EVENT_MODIFY, "/v/s/a/b")}, {}, "/v/s/a", true},
      {{Line(EVENT_MODIFY, "/v/s/a")}, {}, "/v/s/a", true},
      {{Line(EVENT_MODIFY, "/v/s/ab")}, {}, "/v/s/a", false},
      {{Line(EVENT_MODIFY, "/v/s")}, {}, "/v/s/a", false},  // an ancestor is not below
      {{Line(EVENT_RENAME, "/v/s/z", "/v/s/a/x")}, {}, "/v/s/a", true},
      {{Line(EVENT_RENAME, "/v/s/z", "/v/s/ab")}, {}, "/v/s/a", false},
      {{Line(EVENT_MODIFY, "/v/t/a")}, {Line(EVENT_CREATE, "/v/s/a/deep/f")}, "/v/s/a", true},
      {{}, {Line(EVENT_MODIFY, "/v/s/ab/f")}, "/v/s/a", false},
  };
  ExpectScans(cases, &QueueMgr::IsFullPathProcessing);
}

TEST_F(QueueMgrTest, IsFullPathHasReindexNeedsAPureReindexOfThePathOrAnAncestor) {
  const std::vector<ScanCase> cases = {
      {{Line(EVENT_REINDEX, "/v/s/a")}, {}, "/v/s/a/b", true},
      {{Line(EVENT_REINDEX, "/v/s/a")}, {}, "/v/s/a", true},
      {{Line(EVENT_REINDEX, "/v/s/a")}, {}, "/v/s/ab", false},
      {{Line(EVENT_REINDEX, "/v/s/a/b/c")}, {}, "/v/s/a/b", false},  // deeper
      {{Line(EVENT_REINDEX | EVENT_MODIFY, "/v/s/a")}, {}, "/v/s/a/b", false},
      {{Line(EVENT_UPDATE_CFG, "/v/s/a")}, {}, "/v/s/a/b", false},
      {{Line(EVENT_CREATE, "/v/s")}, {Line(EVENT_REINDEX, "/v/s")}, "/v/s/a/b", true},
  };
  ExpectScans(cases, &QueueMgr::IsFullPathHasReindex);
}

// On every kind of line, both queries answer as a naive reading through
// Event with the "/"-appended prefix rule does, errors included.
TEST_F(QueueMgrTest, ScansReadEveryLineAsEventDoes) {
  const std::vector<std::string> lines = {
      R"({"event":65536,"path":"/v/s"})",
      R"({"event":65536,"path":"/v/s/a/b"})",
      R"({"event":65536.0,"path":"/v/s"})",
      R"({"event":65538,"path":"/v/s"})",
      R"({"event":null,"path":"/v/s/a"})",
      R"({"event":true,"path":"/v/s/ab"})",
      R"({"event":65536,"path":null})",
      R"({"event":65536,"path":12})",
      R"({"event":2,"path":"/x","path_old":"/v/s/a/b"})",
      R"({"event":2,"path":"/x","path_old":"/v/s/ab"})",
      R"({"event":2,"path":"/x","path_old":7})",
      R"({"event":2,"path":"/x","path_old":null})",
      R"({"event":2,"path":"/x","path_old":["/v/s/a"]})",
      R"({"event":2,"path":"/v/s/a","is_dir":"yes","data":5,"time":1})",
      R"({"event":-1,"path":"/v/s"})",
      R"({"event":4294967296,"path":"/v/s"})",
      R"({"event":"65536","path":"/v/s"})",
      R"({"event":65536,"path":"/v/s","path":"/v/t"})",
      R"({"path":"/v/s"})",
      R"([65536,"/v/s"])",
      R"("/v/s/a")",
      "",
  };
  const std::string asked = "/v/s/a";
  // 1 or 0 for the answer, the negated error code for a failure.
  auto naive = [&asked](const std::string& line, bool reindex_query) {
    try {
      const Event e(line);
      if (reindex_query) {
        return e.event == EVENT_REINDEX && (asked + "/").rfind(e.path + "/", 0) == 0 ? 1 : 0;
      }
      return (e.path + "/").rfind(asked + "/", 0) == 0 ||
                     (e.path_old + "/").rfind(asked + "/", 0) == 0
                 ? 1
                 : 0;
    } catch (const Error& error) {
      return -static_cast<int>(error.code());
    }
  };
  auto scanned = [&](bool reindex_query) {
    try {
      QueueMgr queue(live_);
      return (reindex_query ? queue.IsFullPathHasReindex(asked) : queue.IsFullPathProcessing(asked))
                 ? 1
                 : 0;
    } catch (const Error& error) {
      return -static_cast<int>(error.code());
    }
  };
  for (const auto& line : lines) {
    WriteLive({line});
    EXPECT_EQ(naive(line, false), scanned(false)) << line;
    EXPECT_EQ(naive(line, true), scanned(true)) << line;
  }
}

TEST_F(QueueMgrTest, MalformedLineFailsTheScan) {
  QueueMgr queue(live_);
  WriteLive({"not json", Line(EVENT_REINDEX, "/v/s")});
  try {
    queue.IsFullPathHasReindex("/v/s/a");
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorMalformedEvent, e.code());
    EXPECT_EQ("Malformed event_raw: not json", e.reason());
  }
  WriteLive({R"({"event": 2})"});
  try {
    queue.IsFullPathProcessing("/v/s/a");
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorBadArgument, e.code());
  }
}

TEST_F(QueueMgrTest, LastLineStillBeingAppendedIsNotLookedAt) {
  // A producer's append can be seen half done; only a line that ends in its
  // newline counts.
  const std::string reindex = Line(EVENT_REINDEX, "/v/s");
  dir_.Write("queue", Line(EVENT_MODIFY, "/v/t") + "\n" + reindex.substr(0, 20));
  QueueMgr queue(live_);
  EXPECT_FALSE(queue.IsFullPathHasReindex("/v/s/a"));
  dir_.Write("queue", Line(EVENT_MODIFY, "/v/t") + "\n" + reindex);
  EXPECT_FALSE(queue.IsFullPathHasReindex("/v/s/a"));
  dir_.Write("queue", Line(EVENT_MODIFY, "/v/t") + "\n" + reindex + "\n");
  EXPECT_TRUE(queue.IsFullPathHasReindex("/v/s/a"));
  // A finished line that is not an event still fails the scan, last or not.
  dir_.Write("queue", Line(EVENT_MODIFY, "/v/t") + "\n" + reindex.substr(0, 20) + "\n");
  EXPECT_THROW(queue.IsFullPathHasReindex("/v/s/a"), Error);
}

TEST_F(QueueMgrTest, QueueThatIsADirectoryFailsWith502) {
  std::filesystem::create_directory(tmp_);
  QueueMgr queue(live_);
  LogCapture log;
  try {
    queue.IsFullPathHasReindex("/v/s/a");
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorSystem, e.code());
    EXPECT_EQ("Failed to open queue, reason=Is a directory", e.reason());
  }
  EXPECT_EQ(1u, log.Matching("Failed [!input_stream], reason: Failed to open queue").size());
  ASSERT_FALSE(log.lines().empty());
  EXPECT_EQ(0u, log.lines()[0].rfind("queue_mgr:", 0));
}

TEST_F(QueueMgrTest, IsFullPathProcessingLoadsTheFolderConfiguration) {
  WriteLive({Line(EVENT_MODIFY, "/v/s/a")});
  std::filesystem::create_directories(dir_.Join("var/packages/Orvex/etc"));
  dir_.Write("var/packages/Orvex/etc/fileindex.folders", "{broken");
  try {
    QueueMgr(live_).IsFullPathProcessing("/v/s/a");
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorLoadJson, e.code());
  }
  // The re-index query does not need the folders.
  EXPECT_FALSE(QueueMgr(live_).IsFullPathHasReindex("/v/s"));
}

// ---------------------------------------------------------------------------
// Rotation under load: producers append custom events through the real
// AddCustomEvent while a consumer rotates and drains the queue as the
// indexing daemon does. Every line must come out exactly once and whole.

constexpr int kWriters = 4;
constexpr int kLinesPerWriter = 500;
constexpr int kPadEvery = 10;  // every tenth line is long, so a split write would show
constexpr size_t kPadBytes = 3000;

// Lock retries sleep a two-hundredth of their time: contention resolves in
// microseconds, and the test is about order, not waiting.
SystemHooks FastHooks() {
  SystemHooks hooks;
  hooks.sleep_for = [](unsigned long micros) { ::usleep(static_cast<useconds_t>(micros / 200)); };
  return hooks;
}

// Runs body in a child process; the child's exit status is 0 when body
// returned normally. Hooks are per process, so each child sets its own.
pid_t Spawn(const std::function<void()>& body) {
  const pid_t pid = ::fork();
  if (pid != 0) return pid;
  int status = 0;
  try {
    ScopedSystemHooks hooks(FastHooks());
    body();
  } catch (const Error& e) {
    std::fprintf(stderr, "child %d: Error %d: %s\n", static_cast<int>(::getpid()),
                 static_cast<int>(e.code()), e.reason().c_str());
    status = 1;
  } catch (const std::exception& e) {
    std::fprintf(stderr, "child %d: %s\n", static_cast<int>(::getpid()), e.what());
    status = 1;
  }
  std::fflush(stderr);
  ::_exit(status);
}

int Wait(pid_t pid) {
  int status = 0;
  if (::waitpid(pid, &status, 0) != pid || !WIFEXITED(status)) return -1;
  return WEXITSTATUS(status);
}

class QueueRotationStressTest : public testing::ShareTestRoot {
 protected:
  void SetUp() override {
    share_root_ = AddShare("s");
    queue_path_ = sdk::SDKShare("s").GetQueuePath();
    drained_ = dir_.Join("drained");
    stop_ = dir_.Join("stop");
    rounds_ = dir_.Join("rounds");
  }

  void Write(int writer) {
    for (int seq = 0; seq < kLinesPerWriter; ++seq) {
      Json::Value data(Json::nullValue);
      if (seq % kPadEvery == 0) data["pad"] = std::string(kPadBytes, 'a' + writer);
      AddCustomEvent(EVENT_UPDATE_CFG, PathOf(writer, seq), "", data);
    }
  }

  std::string PathOf(int writer, int seq) const {
    return share_root_ + "/w" + std::to_string(writer) + "/" + std::to_string(seq);
  }

  // Rotates and drains until told to stop, then once more; writes the number
  // of rotations to rounds_.
  void Drain() {
    std::ofstream drained(drained_, std::ios::binary | std::ios::app);
    int rounds = 0;
    for (bool last = false;;) {
      last = Exists(stop_);
      QueueMgr queue(queue_path_);
      if (queue.PrepareTmpQueue()) {
        LineReader reader(queue.queue_path_tmp());
        for (std::string line; reader.Next(line);) drained << line << '\n';
        drained.flush();
        queue.DeleteTmp();
        ++rounds;
      } else {
        ::usleep(200);
      }
      if (last) break;
    }
    std::ofstream(rounds_) << rounds;
  }

  // Every line in the files, in order.
  static void Collect(const std::string& path, std::vector<std::string>& lines) {
    if (!Exists(path)) return;
    LineReader reader(path);
    for (std::string line; reader.Next(line);) lines.push_back(line);
  }

  std::string share_root_;
  std::string queue_path_;
  std::string drained_;
  std::string stop_;
  std::string rounds_;
};

TEST_F(QueueRotationStressTest, EveryLineIsDrainedOnceAndWholeWhileWritersAppend) {
  const pid_t drainer = Spawn([this] { Drain(); });
  std::vector<pid_t> writers;
  for (int w = 0; w < kWriters; ++w) writers.push_back(Spawn([this, w] { Write(w); }));
  for (pid_t pid : writers) EXPECT_EQ(0, Wait(pid)) << "writer " << pid;
  std::ofstream(stop_).flush();
  ASSERT_EQ(0, Wait(drainer));

  std::vector<std::string> lines;
  Collect(drained_, lines);
  const size_t drained = lines.size();
  Collect(queue_path_ + ".tmp", lines);
  Collect(queue_path_, lines);

  std::map<std::string, int> seen;
  for (const auto& line : lines) {
    Json::Value value;
    ASSERT_TRUE(fromString(value, line)) << "torn line: " << line.substr(0, 120);
    const Event event(line);
    EXPECT_EQ(EVENT_UPDATE_CFG, event.event);
    ++seen[event.path];
  }
  for (int w = 0; w < kWriters; ++w) {
    for (int seq = 0; seq < kLinesPerWriter; ++seq) {
      EXPECT_EQ(1, seen[PathOf(w, seq)]) << PathOf(w, seq);
    }
  }
  EXPECT_EQ(static_cast<size_t>(kWriters * kLinesPerWriter), lines.size());
  EXPECT_GT(drained, 0u);
  int rounds = 0;
  std::ifstream(rounds_) >> rounds;
  EXPECT_GE(rounds, 2) << "the queue was never rotated while writers were appending";
  // No append failed: the share was never marked for a re-index.
  EXPECT_FALSE(Exists(dir_.Join("var/packages/Orvex/etc/fileindex.status")));
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
