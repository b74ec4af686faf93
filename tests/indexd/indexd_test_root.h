// IndexdTestRoot: a temporary root with one share "s" whose folder docs is
// indexed, its event queue written as the watcher writes it, and the
// indexing daemon run step by step in this process (or as a real program).
#ifndef ORVEX_TESTS_INDEXD_INDEXD_TEST_ROOT_H_
#define ORVEX_TESTS_INDEXD_INDEXD_TEST_ROOT_H_

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

#include "index/index_daemon.h"
#include "platform/share_test_root.h"

namespace orvex {
namespace indexd {

class IndexdTestRoot : public testing::ShareTestRoot {
 protected:
  IndexdTestRoot() {
    std::filesystem::create_directories(docs_);
    std::filesystem::create_directories(share_ + "/@eaDir/@fileindex");
    WriteFolders(/*paused=*/false);
  }

  void WriteFolders(bool paused) {
    std::filesystem::create_directories(dir_.Join("var/packages/Orvex/etc"));
    dir_.Write("var/packages/Orvex/etc/fileindex.folders",
               std::string(R"([{"path": "/s/docs", "name": "docs", "document": false, )") +
                   R"("audio": false, "video": false, "photo": false, "paused": )" +
                   (paused ? "true" : "false") + "}]");
  }

  // A file below docs, made with its directories; its path.
  std::string Touch(const std::string& rel) {
    const std::string path = docs_ + "/" + rel;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path) << rel;
    return path;
  }

  // Appends line to the queue (or to the queue's name with suffix).
  void Queue(const std::string& line, const std::string& suffix = "") {
    std::ofstream(queue_ + suffix, std::ios::app) << line << "\n";
  }
  static std::string Line(unsigned event, const std::string& path, bool is_dir = false) {
    return R"({"event": )" + std::to_string(event) + R"(, "is_dir": )" +
           (is_dir ? "true" : "false") + R"(, "path": ")" + path + "\"}";
  }
  static std::string RenameLine(const std::string& from, const std::string& to) {
    return R"({"event": 256, "is_dir": false, "path": ")" + to + R"(", "path_old": ")" + from +
           "\"}";
  }

  static WorkerOptions Quick() {
    WorkerOptions worker;
    worker.quiet_ms = 0;
    return worker;
  }

  void Start(WorkerOptions worker = Quick()) {
    IndexDaemonOptions options;
    options.server.socket_path = socket_;
    options.worker = worker;
    daemon_ = std::make_unique<IndexDaemon>(options);
    std::string why;
    ASSERT_TRUE(daemon_->Start(why)) << why;
  }

  // Steps the daemon until no queue file is left: every batch is committed
  // and its snapshot deleted.
  void Drain() {
    for (int i = 0; i < 2000 && (Exists(queue_) || Exists(queue_ + ".tmp")); ++i) {
      daemon_->RunOnce(0);
    }
    ASSERT_FALSE(Exists(queue_ + ".tmp"));
    ASSERT_FALSE(Exists(queue_));
  }

  static bool Exists(const std::string& path) { return std::filesystem::exists(path); }

  const std::string share_ = AddShare("s");
  const std::string docs_ = share_ + "/docs";
  const std::string queue_ = share_ + "/@eaDir/@fileindex/queue";
  const std::string socket_ = dir_.Join("var/run/fileindexd.sock");
  std::unique_ptr<IndexDaemon> daemon_;
};

}  // namespace indexd
}  // namespace orvex

#endif  // ORVEX_TESTS_INDEXD_INDEXD_TEST_ROOT_H_
