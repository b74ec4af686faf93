// Custom events appended to a real share queue, the share marked for a
// re-index when that fails, and the notices sent through the real
// notification tool.
#include "orvex/policy/custom_event.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "foundation/fault_helpers.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/queue/event.h"
#include "orvex/status/status_mgr.h"
#include "platform/share_test_root.h"
#include "support/error_code.h"
#include "support/log_capture.h"
#include "support/run_program.h"

namespace orvex {
namespace fileindex {
namespace {

using testing::CodeOf;
using testing::LogCapture;
using testing::Options;
using testing::ReadFileText;
using testing::SplitLines;

// A share "s" whose queue directory does not exist until the first event.
class CustomEventTest : public testing::ShareTestRoot {
 protected:
  void SetUp() override {
    root_ = AddShare("s");
    queue_ = sdk::SDKShare("s").GetQueuePath();
  }
  std::vector<std::string> Queue() const { return SplitLines(ReadFileText(queue_)); }
  int ShareStatus() const { return StatusMgr().GetShareStatus("s"); }
  // Expects AddCustomEvent on path to fail with code and reason, leaving the
  // share marked for a re-index; returns the one log line about it.
  std::string ExpectFailure(const std::string& path, ErrorCode code, const std::string& reason) {
    LogCapture log;
    std::string got;
    EXPECT_EQ(code, CodeOf([&] { AddCustomEvent(EVENT_REINDEX, path, "", Json::Value()); }, &got));
    EXPECT_EQ(reason, got);
    EXPECT_EQ(static_cast<int>(NeedReindex), ShareStatus());
    const std::vector<std::string> lines = log.Matching("AddCustomEvent failed");
    EXPECT_EQ(1u, lines.size());
    return lines.empty() ? "" : lines[0];
  }

  std::string root_;
  std::string queue_;
};

TEST_F(CustomEventTest, AppendsOneCompactLineWithoutIsDirCreatingTheQueueDirectory) {
  const mode_t old_umask = ::umask(022);
  AddCustomEvent(EVENT_RENAME, root_ + "/new name", root_ + "/old", Options(R"({"video": true})"));
  ::umask(old_umask);
  struct stat st;
  ASSERT_EQ(0, ::stat((root_ + "/@eaDir/@fileindex").c_str(), &st));
  EXPECT_EQ(0755u, st.st_mode & 07777);
  Json::Value expected = Options(R"({"event": 256, "data": {"video": true}})");
  expected["path"] = root_ + "/new name";
  expected["path_old"] = root_ + "/old";
  const std::string text = ReadFileText(queue_);
  ASSERT_EQ(1u, Queue().size());
  EXPECT_EQ('\n', text.back());
  EXPECT_EQ(expected, Options(text));
  EXPECT_EQ(0, ShareStatus());
}

TEST_F(CustomEventTest, WaitingReindexOfAnAncestorCoversEveryLaterEvent) {
  AddCustomEvent(EVENT_REINDEX, root_ + "/a/b/c", "", Json::Value());  // deeper: covers nothing
  AddCustomEvent(EVENT_REINDEX, root_ + "/a", "", Json::Value());
  AddCustomEvent(EVENT_UPDATE_CFG, root_ + "/a/b", "", Options(R"({"video": true})"));
  AddCustomEvent(EVENT_RENAME, root_ + "/a/b/c", root_ + "/x", Json::Value());
  AddCustomEvent(EVENT_REINDEX, root_ + "/a", "", Json::Value());
  AddCustomEvent(EVENT_REINDEX, root_ + "/ab", "", Json::Value());
  const std::vector<std::string> lines = Queue();
  ASSERT_EQ(3u, lines.size());
  EXPECT_EQ(root_ + "/ab", Event(lines[2]).path);
}

TEST_F(CustomEventTest, LockExhaustionMarksTheShareAndRethrows506) {
  AddCustomEvent(EVENT_REINDEX, root_ + "/a", "", Json::Value());
  const std::string before = ReadFileText(queue_);
  // flock locks of separate opens conflict even within one process.
  const int holder = ::open(queue_.c_str(), O_RDWR);
  ASSERT_EQ(0, ::flock(holder, LOCK_EX));
  SystemHooks no_sleep;
  no_sleep.sleep_for = [](unsigned long) {};
  ScopedSystemHooks hooks(no_sleep);
  const std::string logged = ExpectFailure(root_ + "/b", kErrorLockFile, "Exceed max retry");
  ::close(holder);
  EXPECT_EQ(before, ReadFileText(queue_));
  EXPECT_TRUE(testing::IsLogLine(
      logged, "util",
      "AddCustomEvent failed, code=506, reason=Exceed max retry. Set [s] need reindex"));
}

TEST_F(CustomEventTest, UnreadableQueueMarksTheShareAndRethrowsTheSameError) {
  MakeDirs(root_, {"@eaDir/@fileindex/queue.tmp"});
  ExpectFailure(root_ + "/a", kErrorSystem, "Failed to open queue, reason=Is a directory");
}

// The notices go through the real tool, installed under ORVEX_ROOT where
// the library looks for it.
class NotifyTest : public testing::ShareTestRoot {
 protected:
  std::vector<std::string> Notes() const {
    return SplitLines(ReadFileText(dir_.Join("var/lib/orvex/notifications.jsonl")));
  }
};

TEST_F(NotifyTest, EachNoticeIsRecordedWithItsKeysLinkAndFlags) {
  const std::string built = std::string(ORVEX_BUILD_DIR) + "/kalopmxnotify";
  ASSERT_EQ(0, ::access(built.c_str(), X_OK)) << built << " is not built";
  std::filesystem::create_directories(dir_.Join("usr/kalo/bin"));
  std::filesystem::create_symlink(built, dir_.Join("usr/kalo/bin/kalopmxnotify"));
  SendPMXNotify();
  NotifyLackOfMemory();
  const std::vector<std::string> lines = Notes();
  ASSERT_EQ(2u, lines.size());
  const char* expected[] = {
      R"({"app": "KALO.Orvex.Application", "to": "@administrators",
          "keys": ["app:displayname", "error:index_no_space"],
          "link": {"open": "<a data-kalo-app=\"KALO.Orvex.Application\" data-kalo-fn=\"preference\">",
                   "close": "</a>"},
          "flags": {"b": true, "e": false}})",
      R"({"app": "KALO.Orvex.Application", "to": "@administrators",
          "keys": ["app:displayname", "error:lack_of_memory"], "link": null, "flags": {}})"};
  for (size_t i = 0; i < 2; ++i) {
    Json::Value note = Options(lines[i]);
    EXPECT_TRUE(note["time"].isIntegral()) << lines[i];
    note.removeMember("time");
    EXPECT_EQ(Options(expected[i]), note);
  }
}

TEST_F(NotifyTest, MissingToolIsOnlyLogged) {
  LogCapture log;
  EXPECT_NO_THROW(SendPMXNotify());
  EXPECT_EQ(1u, log.Matching("KLIBCExecl failed").size());
  EXPECT_TRUE(Notes().empty());
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
