// The indexing daemon in front of the real search daemon kaloelasticd: files
// queued, renamed, deleted and re-indexed end up in searches as they are on
// disk.
#include <gtest/gtest.h>
#include <signal.h>

#include <filesystem>
#include <set>
#include <string>

#include "elastic/channel.h"
#include "indexd/indexd_test_root.h"
#include "orvex/elastic.h"
#include "support/daemon_process.h"
#include "support/log_capture.h"
#include "support/run_program.h"

namespace orvex {
namespace indexd {
namespace {

namespace fs = std::filesystem;

class WithSearchDaemonTest : public IndexdTestRoot {
 protected:
  void SetUp() override {
    const testing::ProgramOutcome started = testing::RunProgram(
        testing::BuiltProgram("kaloelasticd"), {}, {"ORVEX_ROOT=" + dir_.path()}, io_.path());
    ASSERT_EQ(0, started.status) << started.err;
    ASSERT_TRUE(search_.Adopt(dir_.Join("var/run/kaloelasticd.pid")));
    fileindex::elastic::ShareIndexCreate("s");
    WorkerOptions worker = Quick();
    worker.page_size = 2;  // every walk reads the index over several pages
    Start(worker);
  }

  void TearDown() override {
    daemon_.reset();
    EXPECT_TRUE(search_.pid() < 0 || search_.Stop() == 0);
  }

  void Reindex() { Queue(R"({"event": 65536, "path": ")" + docs_ + "\"}"); }

  // The paths of every committed document of the share's index.
  std::set<std::string> Indexed() {
    Json::Value request;
    request["command"] = "search";
    request["data"]["id"] = "fileindex_s";
    request["data"]["limit"] = 1000;
    Json::Value answer;
    fileindex::elastic::SendOnce(answer, request);
    std::set<std::string> paths;
    for (const Json::Value& hit : answer["data"]["hits"]) paths.insert(hit["path"].asString());
    return paths;
  }

  testing::TempDir io_;
  testing::LogCapture log_;
  testing::DaemonProcess search_;
};

TEST_F(WithSearchDaemonTest, QueuedChangesAndReindexLeaveTheIndexAsTheDiskIs) {
  const std::string a = Touch("a.bin"), b = Touch("sub/b.bin");
  Touch("@eaDir/thumb.bin");
  Reindex();
  Drain();
  EXPECT_EQ(Indexed(), (std::set<std::string>{docs_, docs_ + "/sub", a, b}));

  const std::string c = docs_ + "/c.bin";
  fs::rename(a, c);
  Queue(RenameLine(a, c));
  fs::remove(b);
  Queue(Line(128, b));
  Drain();
  EXPECT_EQ(Indexed(), (std::set<std::string>{docs_, docs_ + "/sub", c}));

  // Changed behind the daemon's back: only a re-index can tell.
  fs::remove_all(docs_ + "/sub");
  const std::string d = Touch("d.bin");
  Reindex();
  Drain();
  EXPECT_EQ(Indexed(), (std::set<std::string>{docs_, c, d}));
}

// The index lists paths in byte order, where "/" sorts between "." and "0":
// a walk that met these in another order would take documents it holds for
// gone, delete them and read the files again.
TEST_F(WithSearchDaemonTest, AReindexOfAnUnchangedTreeReadsAndDeletesNothing) {
  std::set<std::string> all = {docs_, docs_ + "/a", docs_ + "/a/y"};
  for (const char* rel : {"a/x", "a/y/z", "a.b", "a0", "b"}) all.insert(Touch(rel));
  const auto read = [&] { return daemon_->Status()["shares"]["s"]["total_read"].asInt64(); };
  Reindex();
  Drain();
  ASSERT_EQ(Indexed(), all);
  const int64_t first = read();
  Reindex();
  Drain();
  EXPECT_EQ(read(), first);
  EXPECT_EQ(Indexed(), all);
}

}  // namespace
}  // namespace indexd
}  // namespace orvex
