#include "orvex/queue/queue_mgr.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <sstream>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "platform/share_test_root.h"
#include "support/log_capture.h"
#include "support/run_program.h"

namespace orvex {
namespace fileindex {
namespace {

using Lines = std::vector<std::string>;
using testing::ReadFileText;
using testing::SplitLines;

std::string Line(uint32_t mask, const std::string& path, const std::string& path_old = "") {
  Json::Value line;
  line["event"] = mask;
  line["path"] = path;
  if (!path_old.empty()) line["path_old"] = path_old;
  return toString(line);
}

void Write(const std::string& path, const Lines& lines) {
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  for (const auto& line : lines) out << line << '\n';
}

// The answer of a query: 1 or 0, or the negated code of the Error it threw.
int Answer(const std::function<bool()>& query) {
  try {
    return query() ? 1 : 0;
  } catch (const Error& e) {
    return -static_cast<int>(e.code());
  }
}

// A private ORVEX_ROOT (for the folder configuration), a live queue and its snapshot.
class QueueMgrTest : public testing::ShareTestRoot {
 protected:
  // The ops handed out, printed; the count goes to count_.
  Lines Drain(QueueMgr& queue, bool use_tmp) {
    Lines seen;
    auto print = [&seen](std::shared_ptr<OP> op) {
      std::ostringstream text;
      seen.push_back((text << op, text.str()));
    };
    count_ = queue.ProcessOP(print, use_tmp);
    return seen;
  }

  std::string live_ = dir_.Join("queue");
  std::string tmp_ = dir_.Join("queue.tmp");
  int count_ = -1;
};

TEST_F(QueueMgrTest, RotationMovesTheLiveQueueWholeAndTreesAreNeverRefreshed) {
  {
    QueueMgr empty(live_);
    EXPECT_TRUE(Drain(empty, true).empty());
    EXPECT_EQ(0, count_);
    EXPECT_FALSE(empty.PrepareTmpQueue());
    // The lock is taken on the queue file itself: it must not be created.
    EXPECT_FALSE(std::filesystem::exists(live_));
    EXPECT_FALSE(std::filesystem::exists(tmp_));
  }
  Write(live_, {Line(EVENT_CREATE, "/v/s/a"), Line(EVENT_MODIFY, "/v/s/b")});
  const std::string before = ReadFileText(live_);
  QueueMgr queue(live_);
  EXPECT_EQ((Lines{"[02] /v/s/a", "[02] /v/s/b"}), Drain(queue, true));
  EXPECT_EQ(2, count_);
  EXPECT_FALSE(std::filesystem::exists(live_));
  EXPECT_EQ(before, ReadFileText(tmp_));
  // A fresh live queue; the cached trees are not refreshed.
  Write(live_, {Line(EVENT_DELETE, "/v/s/c")});
  const std::shared_ptr<OPTree> live_tree = queue.GetOPTree();
  Write(live_, {Line(EVENT_DELETE, "/v/s/c"), Line(EVENT_DELETE, "/v/s/d")});
  EXPECT_EQ(live_tree, queue.GetOPTree());
  EXPECT_EQ(Lines{"[01] /v/s/c"}, Drain(queue, false));
  queue.DeleteTmp();
  EXPECT_FALSE(std::filesystem::exists(tmp_));
  queue.DeleteTmp();  // a missing snapshot is not an error
  // The live queue is rotated again, but the cached snapshot tree answers.
  EXPECT_EQ((Lines{"[02] /v/s/a", "[02] /v/s/b"}), Drain(queue, true));
  EXPECT_TRUE(std::filesystem::exists(tmp_));
}

TEST_F(QueueMgrTest, ExistingSnapshotIsKeptAndProcessedBeforeTheLiveQueue) {
  Write(tmp_, {Line(EVENT_DELETE, "/v/s/old")});
  Write(live_, {Line(EVENT_CREATE, "/v/s/new")});
  const std::string live_before = ReadFileText(live_);
  {
    QueueMgr queue(live_);
    EXPECT_TRUE(queue.PrepareTmpQueue());
    EXPECT_EQ(Lines{"[01] /v/s/old"}, Drain(queue, true));
    EXPECT_EQ(live_before, ReadFileText(live_));
    queue.DeleteTmp();
  }
  QueueMgr next(live_);
  EXPECT_EQ(Lines{"[02] /v/s/new"}, Drain(next, true));
  EXPECT_FALSE(std::filesystem::exists(live_));
}

// f must log one "queue_mgr" line holding logged and throw 502 with reason.
void ExpectLogged502(const std::function<void()>& f, const std::string& reason,
                     const std::string& logged) {
  testing::LogCapture log;
  try {
    f();
    ADD_FAILURE() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorSystem, e.code());
    EXPECT_EQ(reason, e.reason());
  }
  ASSERT_EQ(1u, log.lines().size());
  EXPECT_EQ(0u, log.lines()[0].rfind("queue_mgr:", 0)) << log.lines()[0];
  EXPECT_NE(std::string::npos, log.lines()[0].find(logged)) << log.lines()[0];
}

TEST_F(QueueMgrTest, RenameOrReadFailuresThrow502) {
  // No room for ".tmp" in a 252-byte name: rename fails even for root.
  const std::string live = dir_.Join(std::string(252, 'q'));
  Write(live, {Line(EVENT_CREATE, "/v/s/a")});
  ExpectLogged502([&] { QueueMgr(live).PrepareTmpQueue(); },
                  "rename failed, reason=File name too long",
                  "Failed [0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str())], reason: "
                  "rename failed, reason=File name too long");
  EXPECT_TRUE(std::filesystem::exists(live));
  std::filesystem::create_directory(tmp_);
  ExpectLogged502([&] { QueueMgr(live_).IsFullPathHasReindex("/v/s/a"); },
                  "Failed to open queue, reason=Is a directory",
                  "Failed [!input_stream], reason: Failed to open queue, reason=Is a directory");
}

TEST_F(QueueMgrTest, QueriesMatchWholeComponentsInBothFiles) {
  struct {
    bool reindex_query;  // IsFullPathHasReindex, else IsFullPathProcessing
    Lines live, tmp;
    std::string full_path;
    int expected;  // as Answer gives it
  } const cases[] = {
      {false, {Line(EVENT_MODIFY, "/v/s/a/b")}, {}, "/v/s/a", 1},
      {false, {Line(EVENT_RENAME, "/v/s/z", "/v/s/a/x")}, {}, "/v/s/a", 1},
      {false, {Line(EVENT_MODIFY, "/v/t/a")}, {Line(EVENT_CREATE, "/v/s/a/deep/f")}, "/v/s/a", 1},
      {true, {Line(EVENT_REINDEX, "/v/s/a")}, {}, "/v/s/a/b", 1},
      {true, {Line(EVENT_REINDEX, "/v/s/a/b/c")}, {}, "/v/s/a/b", 0},  // deeper
      {true, {Line(EVENT_REINDEX | EVENT_MODIFY, "/v/s/a")}, {}, "/v/s/a/b", 0},
      {true, {Line(EVENT_CREATE, "/v/s")}, {Line(EVENT_REINDEX, "/v/s")}, "/v/s/a/b", 1},
      // A mistyped optional member is ignored; a bad line ahead of a match fails.
      {false, {R"({"event":2,"path":"/x","path_old":["/v/s/a"]})"}, {}, "/v/s/a", 0},
      {true, {R"({"event":"65536","path":"/v/s"})"}, {}, "/v/s/a", -kErrorBadArgument},
      {true, {"not json", Line(EVENT_REINDEX, "/v/s")}, {}, "/v/s/a", -kErrorMalformedEvent},
  };
  for (const auto& c : cases) {
    std::filesystem::remove(live_);
    std::filesystem::remove(tmp_);
    if (!c.live.empty()) Write(live_, c.live);
    if (!c.tmp.empty()) Write(tmp_, c.tmp);
    QueueMgr queue(live_);
    EXPECT_EQ(c.expected, Answer([&] {
                return c.reindex_query ? queue.IsFullPathHasReindex(c.full_path)
                                       : queue.IsFullPathProcessing(c.full_path);
              }))
        << c.full_path << " " << (c.live.empty() ? c.tmp[0] : c.live[0]);
  }
}

TEST_F(QueueMgrTest, LastLineStillBeingAppendedIsNotLookedAt) {
  // An append can be seen half done; only a line ending in newline counts.
  const std::string first = Line(EVENT_MODIFY, "/v/t") + "\n";
  const std::string reindex = Line(EVENT_REINDEX, "/v/s");
  QueueMgr queue(live_);
  auto has_reindex = [&](const std::string& text) {
    dir_.Write("queue", text);
    return Answer([&] { return queue.IsFullPathHasReindex("/v/s/a"); });
  };
  EXPECT_EQ(0, has_reindex(first + reindex.substr(0, 20)));
  EXPECT_EQ(0, has_reindex(first + reindex));
  EXPECT_EQ(1, has_reindex(first + reindex + "\n"));
  // A finished line that is not an event still fails the scan, last or not.
  EXPECT_EQ(-kErrorMalformedEvent, has_reindex(first + reindex.substr(0, 20) + "\n"));
  // The queue knows nothing of the folder configuration: a broken folders
  // file is the business of the folder that asks.
  EXPECT_EQ(1, has_reindex(first + reindex + "\n"));
  std::filesystem::create_directories(dir_.Join("var/packages/Orvex/etc"));
  dir_.Write("var/packages/Orvex/etc/fileindex.folders", "{broken");
  EXPECT_EQ(1, Answer([&] { return queue.IsFullPathProcessing("/v/s"); }));
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
