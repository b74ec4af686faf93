// The real kalonotifyd in its own root: it picks up a registration made
// after it started, and on SIGTERM writes every change the kernel reported
// before it exits, then leaves its status file saying it stopped. Its command
// line is tested with the other daemons' (programs/daemon_usage_test.cc).
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "kalo/kalo_notify.h"
#include "orvex/foundation/json.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace watch {
namespace {

namespace fs = std::filesystem;
using KALO::KALONOTIFYD::MonitorQueue;

const std::string kProgram = std::string(ORVEX_BUILD_DIR) + "/kalonotifyd";

class KalonotifydTest : public ::testing::Test {
 protected:
  void TearDown() override {
    if (pid_ > 0) {
      ::kill(pid_, SIGKILL);
      ::waitpid(pid_, nullptr, 0);
    }
  }

  void Start() {
    pid_ = ::fork();
    ASSERT_GE(pid_, 0);
    if (pid_ == 0) {
      ::execl(kProgram.c_str(), kProgram.c_str(), "--foreground", "--status-interval", "1",
              static_cast<char*>(nullptr));
      ::_exit(127);
    }
  }

  // Waits, without a fixed sleep, until pred holds on the queue's lines.
  template <typename Pred>
  bool WaitForQueue(Pred pred) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
    while (std::chrono::steady_clock::now() < deadline) {
      if (pred(testing::SplitLines(testing::ReadFileText(queue_)))) return true;
      std::this_thread::yield();
    }
    return false;
  }

  int Stop() {
    ::kill(pid_, SIGTERM);
    int status = 0;
    ::waitpid(pid_, &status, 0);
    pid_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  testing::TempDir dir_;
  testing::ScopedOrvexRoot orvex_root_{dir_.path()};
  const std::string share_ = dir_.Join("volume1/share");
  const std::string queue_ = share_ + "/@eaDir/@fileindex/queue";
  pid_t pid_ = -1;
};

TEST_F(KalonotifydTest, WritesEveryChangeBeforeItStops) {
  fs::create_directories(share_);
  Start();
  Json::Value desc(Json::objectValue);
  desc["queue"] = queue_;
  desc["config"][0]["path"] = share_;
  desc["config"][0]["mask"] = 65478;
  desc["config"][0]["ignore"].append("@eaDir");
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(desc), "fileindex",
                                   KALO::KALONOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION));
  // Probe until the daemon has the registration (it may still be starting).
  const std::string probe = share_ + "/probe";
  ASSERT_TRUE(WaitForQueue([&](const std::vector<std::string>& lines) {
    if (!lines.empty()) return true;
    std::ofstream(probe) << "p";
    return false;
  }));
  for (int i = 0; i < 500; ++i) std::ofstream(share_ + "/f" + std::to_string(i)) << i;
  EXPECT_EQ(0, Stop());
  size_t created = 0;
  for (const std::string& line : testing::SplitLines(testing::ReadFileText(queue_))) {
    Json::Value value;
    ASSERT_TRUE(fromString(value, line)) << line;
    if (value["event"].asUInt() == 64 && value["path"].asString() != probe) ++created;
  }
  EXPECT_EQ(500u, created);
  Json::Value status;
  ASSERT_TRUE(fromFile(status, dir_.Join("var/run/kalonotifyd.status.json")));
  EXPECT_FALSE(status["running"].asBool());
  EXPECT_EQ(share_, status["folders"][0]["path"].asString());
}

}  // namespace
}  // namespace watch
}  // namespace orvex
