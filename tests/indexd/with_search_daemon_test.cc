// The indexing daemon in front of the real search daemon kaloelasticd: files
// queued, renamed, deleted and re-indexed end up in searches as they are on
// disk.
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <set>
#include <string>

#include "elastic/channel.h"
#include "index/index_daemon.h"
#include "orvex/elastic.h"
#include "platform/share_test_root.h"
#include "support/log_capture.h"
#include "support/run_program.h"

namespace orvex {
namespace indexd {
namespace {

namespace fs = std::filesystem;

class WithSearchDaemonTest : public testing::ShareTestRoot {
 protected:
  void SetUp() override {
    root_ = AddShare("s");
    docs_ = root_ + "/docs";
    fs::create_directories(docs_);
    fs::create_directories(root_ + "/@eaDir/@fileindex");
    queue_ = root_ + "/@eaDir/@fileindex/queue";
    fs::create_directories(dir_.Join("var/packages/Orvex/etc"));
    dir_.Write("var/packages/Orvex/etc/fileindex.folders",
               R"([{"path": "/s/docs", "name": "docs", "document": false, "audio": false, )"
               R"("video": false, "photo": false}])");
    const testing::ProgramOutcome started =
        testing::RunProgram(std::string(ORVEX_BUILD_DIR) + "/kaloelasticd", {},
                            {"ORVEX_ROOT=" + dir_.path()}, io_.path());
    ASSERT_EQ(0, started.status) << started.err;
    search_pid_ = std::stoi(testing::ReadFileText(dir_.Join("var/run/kaloelasticd.pid")));
    fileindex::elastic::ShareIndexCreate("s");

    IndexDaemonOptions options;
    options.server.socket_path = dir_.Join("var/run/fileindexd.sock");
    options.worker.quiet_ms = 0;
    options.worker.page_size = 2;  // every walk reads the index over several pages
    daemon_ = std::make_unique<IndexDaemon>(options);
    std::string why;
    ASSERT_TRUE(daemon_->Start(why)) << why;
  }

  void TearDown() override {
    daemon_.reset();
    if (search_pid_ <= 0) return;
    const int pidfd = static_cast<int>(::syscall(SYS_pidfd_open, search_pid_, 0));
    ::kill(search_pid_, SIGTERM);
    if (pidfd >= 0) {
      pollfd p = {pidfd, POLLIN, 0};
      EXPECT_EQ(::poll(&p, 1, 10000), 1);
      ::close(pidfd);
    }
  }

  void Queue(const std::string& line) { std::ofstream(queue_, std::ios::app) << line << "\n"; }

  void Drain() {
    for (int i = 0; i < 2000 && (fs::exists(queue_) || fs::exists(queue_ + ".tmp")); ++i) {
      daemon_->RunOnce(0);
    }
    ASSERT_FALSE(fs::exists(queue_ + ".tmp"));
    ASSERT_FALSE(fs::exists(queue_));
  }

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

  std::string Touch(const std::string& rel) {
    const std::string path = docs_ + "/" + rel;
    fs::create_directories(fs::path(path).parent_path());
    std::ofstream(path) << rel;
    return path;
  }

  testing::TempDir io_;
  testing::LogCapture log_;
  pid_t search_pid_ = -1;
  std::string root_, docs_, queue_;
  std::unique_ptr<IndexDaemon> daemon_;
};

TEST_F(WithSearchDaemonTest, QueuedChangesAndReindexLeaveTheIndexAsTheDiskIs) {
  const std::string a = Touch("a.bin"), b = Touch("sub/b.bin");
  Touch("@eaDir/thumb.bin");
  Queue(R"({"event": 65536, "path": ")" + docs_ + "\"}");
  Drain();
  EXPECT_EQ(Indexed(), (std::set<std::string>{docs_, docs_ + "/sub", a, b}));

  const std::string c = docs_ + "/c.bin";
  fs::rename(a, c);
  Queue(R"({"event": 256, "is_dir": false, "path": ")" + c + R"(", "path_old": ")" + a + "\"}");
  fs::remove(b);
  Queue(R"({"event": 128, "is_dir": false, "path": ")" + b + "\"}");
  Drain();
  EXPECT_EQ(Indexed(), (std::set<std::string>{docs_, docs_ + "/sub", c}));

  // Changed behind the daemon's back: only a re-index can tell.
  fs::remove_all(docs_ + "/sub");
  const std::string d = Touch("d.bin");
  Queue(R"({"event": 65536, "path": ")" + docs_ + "\"}");
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
  Queue(R"({"event": 65536, "path": ")" + docs_ + "\"}");
  Drain();
  ASSERT_EQ(Indexed(), all);
  const int64_t first = read();
  Queue(R"({"event": 65536, "path": ")" + docs_ + "\"}");
  Drain();
  EXPECT_EQ(read(), first);
  EXPECT_EQ(Indexed(), all);
}

}  // namespace
}  // namespace indexd
}  // namespace orvex
