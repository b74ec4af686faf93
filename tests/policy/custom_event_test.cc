#include "orvex/policy/custom_event.h"

#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/queue/event.h"
#include "orvex/status/status_mgr.h"
#include "platform/share_test_root.h"
#include "support/log_capture.h"

namespace orvex {
namespace fileindex {
namespace {

using testing::LogCapture;

std::vector<std::string> ReadLines(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::vector<std::string> lines;
  for (std::string line; std::getline(in, line);) lines.push_back(line);
  return lines;
}

std::string ReadFile(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

// A share "s" registered under a private ORVEX_ROOT; its queue directory
// does not exist until the first event is written.
class CustomEventTest : public testing::ShareTestRoot {
 protected:
  void SetUp() override {
    root_ = AddShare("s");
    queue_ = sdk::SDKShare("s").GetQueuePath();
  }

  std::vector<std::string> Queue() const { return ReadLines(queue_); }

  int ShareStatus() const { return StatusMgr().GetShareStatus("s"); }

  std::string root_;
  std::string queue_;
};

TEST_F(CustomEventTest, WrittenLineParsesAsAnEventWithTheGivenFields) {
  const mode_t old_umask = ::umask(022);
  const Json::Value data = Parse(R"({"document": true, "audio": false})");
  AddCustomEvent(EVENT_RENAME, root_ + "/new name", root_ + "/old", data);
  ::umask(old_umask);

  // A fresh share gets its queue directory.
  struct stat st;
  ASSERT_EQ(0, ::stat((root_ + "/@eaDir/@fileindex").c_str(), &st));
  EXPECT_EQ(0755u, st.st_mode & 07777);
  const std::string text = ReadFile(queue_);
  ASSERT_FALSE(text.empty());
  EXPECT_EQ('\n', text.back());
  const std::vector<std::string> lines = Queue();
  ASSERT_EQ(1u, lines.size());
  const Event event(lines[0]);
  EXPECT_EQ(static_cast<uint32_t>(EVENT_RENAME), event.event);
  EXPECT_FALSE(event.is_dir);
  EXPECT_EQ(root_ + "/new name", event.path);
  EXPECT_EQ(root_ + "/old", event.path_old);
  EXPECT_EQ(data, event.data);
  // Exactly the four members: custom events carry no "is_dir".
  EXPECT_EQ((std::vector<std::string>{"data", "event", "path", "path_old"}),
            Parse(lines[0]).getMemberNames());

  AddCustomEvent(EVENT_REINDEX, root_, "", Json::Value());
  ASSERT_EQ(2u, Queue().size());
  EXPECT_TRUE(Event(Queue()[1]).data.isNull());
  EXPECT_EQ(0, ShareStatus());
}

TEST_F(CustomEventTest, WaitingReindexOfAnAncestorCoversEveryLaterEvent) {
  AddCustomEvent(EVENT_REINDEX, root_ + "/a", "", Json::Value());
  AddCustomEvent(EVENT_UPDATE_CFG, root_ + "/a/b", "", Parse(R"({"video": true})"));
  AddCustomEvent(EVENT_RENAME, root_ + "/a/b/c", root_ + "/a/x", Json::Value());
  AddCustomEvent(EVENT_REINDEX, root_ + "/a", "", Json::Value());
  ASSERT_EQ(1u, Queue().size());
  // Not a whole-component ancestor: written.
  AddCustomEvent(EVENT_REINDEX, root_ + "/ab", "", Json::Value());
  EXPECT_EQ(2u, Queue().size());
}

TEST_F(CustomEventTest, ReindexWaitingInTheSnapshotCoversToo) {
  AddCustomEvent(EVENT_REINDEX, root_ + "/a", "", Json::Value());
  std::filesystem::rename(queue_, queue_ + ".tmp");
  AddCustomEvent(EVENT_UPDATE_CFG, root_ + "/a/b", "", Json::Value());
  EXPECT_FALSE(std::filesystem::exists(queue_));
}

TEST_F(CustomEventTest, DeeperReindexDoesNotCoverThePath) {
  AddCustomEvent(EVENT_REINDEX, root_ + "/a/b/c", "", Json::Value());
  AddCustomEvent(EVENT_UPDATE_CFG, root_ + "/a/b", "", Parse(R"({"photo": true})"));
  const std::vector<std::string> lines = Queue();
  ASSERT_EQ(2u, lines.size());
  EXPECT_EQ(root_ + "/a/b", Event(lines[1]).path);
}

// Holds an exclusive flock on path in a child process until released.
class ForeignLock {
 public:
  explicit ForeignLock(const std::string& path) {
    int ready[2];
    EXPECT_EQ(0, ::pipe(ready));
    EXPECT_EQ(0, ::pipe(release_));
    pid_ = ::fork();
    if (pid_ == 0) {
      // Only the parent may hold the write end: closing it is the release.
      ::close(release_[1]);
      ::close(ready[0]);
      const int fd = ::open(path.c_str(), O_RDWR | O_CREAT, 0644);
      char byte = fd >= 0 && ::flock(fd, LOCK_EX) == 0 ? 'y' : 'n';
      ssize_t ignored = ::write(ready[1], &byte, 1);
      ignored = ::read(release_[0], &byte, 1);
      (void)ignored;
      ::_exit(0);
    }
    char byte = 0;
    EXPECT_EQ(1, ::read(ready[0], &byte, 1));
    EXPECT_EQ('y', byte);
    ::close(ready[0]);
    ::close(ready[1]);
  }
  ~ForeignLock() {
    ::close(release_[1]);
    ::close(release_[0]);
    int status = 0;
    ::waitpid(pid_, &status, 0);
  }

 private:
  int release_[2];
  pid_t pid_;
};

SystemHooks NoSleep() {
  SystemHooks hooks;
  hooks.sleep_for = [](unsigned long) {};
  return hooks;
}

TEST_F(CustomEventTest, LockExhaustionMarksTheShareAndRethrows506) {
  AddCustomEvent(EVENT_REINDEX, root_ + "/a", "", Json::Value());
  const std::string before = ReadFile(queue_);
  ForeignLock holder(queue_);
  ScopedSystemHooks hooks(NoSleep());
  LogCapture log;
  try {
    AddCustomEvent(EVENT_UPDATE_CFG, root_ + "/b", "", Json::Value());
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorLockFile, e.code());
    EXPECT_EQ("Exceed max retry", e.reason());
  }
  EXPECT_EQ(static_cast<int>(NeedReindex), ShareStatus());
  EXPECT_EQ(before, ReadFile(queue_));
  const std::vector<std::string> lines = log.Matching("AddCustomEvent failed");
  ASSERT_EQ(1u, lines.size());
  // "util:<line> (<pid>, <euid>) ..." with " [err: ...]" while errno is set.
  const std::string& line = lines[0];
  const size_t digits = line.find_first_not_of("0123456789", 5);
  ASSERT_EQ(0u, line.rfind("util:", 0)) << line;
  ASSERT_GT(digits, 5u) << line;
  const std::string rest = "(" + std::to_string(::getpid()) + ", " + std::to_string(::geteuid()) +
                           ") AddCustomEvent failed, code=506, reason=Exceed max retry. "
                           "Set [s] need reindex";
  EXPECT_EQ(" " + rest, line.substr(digits, rest.size() + 1)) << line;
  const std::string tail = line.substr(digits + rest.size() + 1);
  EXPECT_TRUE(tail.empty() || tail.rfind(" [err: ", 0) == 0) << line;
}

TEST_F(CustomEventTest, UnreadableQueueMarksTheShareAndRethrowsTheSameError) {
  MakeDirs(root_, {"@eaDir/@fileindex/queue.tmp"});
  LogCapture log;
  try {
    AddCustomEvent(EVENT_REINDEX, root_ + "/a", "", Json::Value());
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorSystem, e.code());
    EXPECT_EQ("Failed to open queue, reason=Is a directory", e.reason());
  }
  EXPECT_EQ(static_cast<int>(NeedReindex), ShareStatus());
  EXPECT_EQ(1u, log.Matching("code=502, reason=Failed to open queue, reason=Is a directory. "
                             "Set [s] need reindex")
                    .size());
}

TEST_F(CustomEventTest, PathOutsideEveryShareFailsWithoutMarkingAnything) {
  try {
    AddCustomEvent(EVENT_REINDEX, dir_.Join("elsewhere/x"), "", Json::Value());
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorBadArgument, e.code());
  }
  EXPECT_FALSE(std::filesystem::exists(dir_.Join("var/packages/Orvex/etc/fileindex.status")));
}

// The notifications go through the real tool, installed under ORVEX_ROOT as
// the library expects to find it.
class NotifyTest : public testing::ShareTestRoot {
 protected:
  void InstallTool() {
    const std::string built = std::string(ORVEX_BUILD_DIR) + "/kalopmxnotify";
    ASSERT_EQ(0, ::access(built.c_str(), X_OK)) << built << " is not built";
    std::filesystem::create_directories(dir_.Join("usr/kalo/bin"));
    std::filesystem::create_symlink(built, dir_.Join("usr/kalo/bin/kalopmxnotify"));
  }

  std::vector<std::string> Notifications() const {
    return ReadLines(dir_.Join("var/lib/orvex/notifications.jsonl"));
  }
};

TEST_F(NotifyTest, SendPMXNotifyRecordsTheNoSpaceNoticeWithItsLink) {
  InstallTool();
  SendPMXNotify();
  const std::vector<std::string> lines = Notifications();
  ASSERT_EQ(1u, lines.size());
  Json::Value note = Parse(lines[0]);
  EXPECT_TRUE(note["time"].isIntegral());
  note.removeMember("time");
  EXPECT_EQ(Parse(R"({"app": "KALO.Orvex.Application", "to": "@administrators",
                      "keys": ["app:displayname", "error:index_no_space"],
                      "link": {"open": "<a data-kalo-app=\"KALO.Orvex.Application\" data-kalo-fn=\"preference\">",
                               "close": "</a>"},
                      "flags": {"b": true, "e": false}})"),
            note);
}

TEST_F(NotifyTest, NotifyLackOfMemoryRecordsTheShortNotice) {
  InstallTool();
  NotifyLackOfMemory();
  const std::vector<std::string> lines = Notifications();
  ASSERT_EQ(1u, lines.size());
  Json::Value note = Parse(lines[0]);
  note.removeMember("time");
  EXPECT_EQ(Parse(R"({"app": "KALO.Orvex.Application", "to": "@administrators",
                      "keys": ["app:displayname", "error:lack_of_memory"],
                      "link": null, "flags": {}})"),
            note);
}

TEST_F(NotifyTest, MissingToolIsOnlyLogged) {
  LogCapture log;
  EXPECT_NO_THROW(SendPMXNotify());
  EXPECT_NO_THROW(NotifyLackOfMemory());
  EXPECT_EQ(2u, log.Matching("KLIBCExecl failed").size());
  EXPECT_TRUE(Notifications().empty());
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
