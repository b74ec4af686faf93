// Producers and the consumer of one share queue in separate processes: the
// library's own writer (AddCustomEvent) appends while the consumer rotates
// the live queue into its snapshot and drains it, as the indexing daemon does.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/policy/custom_event.h"
#include "orvex/queue/event.h"
#include "orvex/queue/queue_mgr.h"
#include "platform/share_test_root.h"
#include "support/run_program.h"

namespace orvex {
namespace fileindex {
namespace {

using Lines = std::vector<std::string>;
using QueueRotationTest = testing::ShareTestRoot;
using testing::ReadFileText;
using testing::SplitLines;

// Writer processes append through the real AddCustomEvent while a consumer
// process rotates and drains as the daemon does: every line comes out once, whole.
constexpr int kWriters = 4;
constexpr int kLinesPerWriter = 500;
constexpr size_t kPadBytes = 3000;  // every tenth line, so that a split write shows

// Runs body in a child (exit 0 when it returned); lock retries sleep 1/200 of their time.
pid_t Spawn(const std::function<void()>& body) {
  const pid_t pid = ::fork();
  if (pid != 0) return pid;
  int status = 0;
  try {
    SystemHooks hooks;
    hooks.sleep_for = [](unsigned long micros) { ::usleep(static_cast<useconds_t>(micros / 200)); };
    ScopedSystemHooks scoped(hooks);
    body();
  } catch (const std::exception& e) {
    std::fprintf(stderr, "child %d: %s\n", static_cast<int>(::getpid()), e.what());
    status = 1;
  }
  std::fflush(stderr);
  ::_exit(status);
}

int Wait(pid_t pid) {
  int status = 0;
  return ::waitpid(pid, &status, 0) == pid && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

TEST_F(QueueRotationTest, RotationStressEveryLineIsDrainedOnceAndWholeWhileWritersAppend) {
  const std::string share_root = AddShare("s");
  const std::string queue_path = sdk::SDKShare("s").GetQueuePath();
  const std::string drained = dir_.Join("drained"), stop = dir_.Join("stop");
  const std::string rounds_file = dir_.Join("rounds");
  auto path_of = [&share_root](int writer, int seq) {
    return share_root + "/w" + std::to_string(writer) + "/" + std::to_string(seq);
  };
  const pid_t drainer = Spawn([&] {
    std::ofstream out(drained, std::ios::binary | std::ios::app);
    int rounds = 0;
    for (bool last = false; !last;) {
      last = std::filesystem::exists(stop);
      QueueMgr queue(queue_path);
      if (!queue.PrepareTmpQueue()) {
        ::usleep(200);
        continue;
      }
      out << ReadFileText(queue.queue_path_tmp()) << std::flush;
      queue.DeleteTmp();
      ++rounds;
    }
    std::ofstream(rounds_file) << rounds;
  });
  std::vector<pid_t> writers;
  for (int w = 0; w < kWriters; ++w) {
    writers.push_back(Spawn([&path_of, w] {
      for (int seq = 0; seq < kLinesPerWriter; ++seq) {
        Json::Value data;
        if (seq % 10 == 0) data["pad"] = std::string(kPadBytes, static_cast<char>('a' + w));
        AddCustomEvent(EVENT_UPDATE_CFG, path_of(w, seq), "", data);
      }
    }));
  }
  for (pid_t pid : writers) EXPECT_EQ(0, Wait(pid)) << "writer " << pid;
  std::ofstream(stop).flush();
  ASSERT_EQ(0, Wait(drainer));

  Lines lines = SplitLines(ReadFileText(drained));
  for (const std::string& left : {queue_path + ".tmp", queue_path}) {
    for (const std::string& line : SplitLines(ReadFileText(left))) lines.push_back(line);
  }
  std::map<std::string, int> seen;
  for (const auto& line : lines) {
    Json::Value value;
    ASSERT_TRUE(fromString(value, line)) << "torn line: " << line.substr(0, 120);
    const Event event(line);
    EXPECT_EQ(EVENT_UPDATE_CFG, event.event);
    ++seen[event.path];
  }
  for (int w = 0; w < kWriters; ++w) {
    for (int seq = 0; seq < kLinesPerWriter; ++seq) EXPECT_EQ(1, seen[path_of(w, seq)]);
  }
  EXPECT_EQ(static_cast<size_t>(kWriters * kLinesPerWriter), lines.size());
  int rounds = 0;
  std::ifstream(rounds_file) >> rounds;
  EXPECT_GE(rounds, 2) << "the queue was never rotated while writers were appending";
  // No append failed: the share was never marked for a re-index.
  EXPECT_FALSE(std::filesystem::exists(dir_.Join("var/packages/Orvex/etc/fileindex.status")));
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
