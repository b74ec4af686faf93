// The real kalonotifyd in its own root: it picks up a registration made
// after it started, and on SIGTERM writes every change the kernel reported
// before it exits, then leaves its status file saying it stopped. Its command
// line is tested with the other daemons' (programs/daemon_usage_test.cc).
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <string>

#include "kalo/kalo_notify.h"
#include "support/program_test.h"

namespace orvex {
namespace watch {
namespace {

using KALO::KALONOTIFYD::MonitorQueue;
using testing::ReadFileText;
using testing::SplitLines;

class KalonotifydTest : public testing::ProgramTest {
 protected:
  KalonotifydTest() : ProgramTest("kalonotifyd") {}

  const std::string share_ = root_.Join("volume1/share");
  const std::string queue_ = share_ + "/@eaDir/@fileindex/queue";
  testing::DaemonProcess daemon_;
};

TEST_F(KalonotifydTest, WritesEveryChangeBeforeItStops) {
  std::filesystem::create_directories(share_);
  ASSERT_TRUE(daemon_.Spawn(program_, {"--foreground", "--status-interval", "1"}));
  Json::Value desc = testing::Parse(R"({"config": [{"path": ")" + share_ +
                                    R"(", "mask": 65478, "ignore": ["@eaDir"]}]})");
  desc["queue"] = queue_;
  ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(desc), "fileindex",
                                   KALO::KALONOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION));
  // Probe until the daemon has the registration (it may still be starting).
  const std::string probe = share_ + "/probe";
  ASSERT_TRUE(testing::WaitUntil([&] {
    if (!ReadFileText(queue_).empty()) return true;
    std::ofstream(probe) << "p";
    return false;
  }));
  for (int i = 0; i < 500; ++i) std::ofstream(share_ + "/f" + std::to_string(i)) << i;
  EXPECT_EQ(0, daemon_.Stop());
  size_t created = 0;
  for (const std::string& line : SplitLines(ReadFileText(queue_))) {
    const Json::Value value = testing::Parse(line);
    if (value["event"].asUInt() == 64 && value["path"].asString() != probe) ++created;
  }
  EXPECT_EQ(500u, created);
  const Json::Value status =
      testing::Parse(ReadFileText(root_.Join("var/run/kalonotifyd.status.json")));
  EXPECT_FALSE(status["running"].asBool());
  EXPECT_EQ(share_, status["folders"][0]["path"].asString());
}

}  // namespace
}  // namespace watch
}  // namespace orvex
