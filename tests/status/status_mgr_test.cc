#include "orvex/status/status_mgr.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "foundation/fault_helpers.h"
#include "orvex/communication.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/lock.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/portable/root.h"
#include "status/fileindexd_peer.h"
#include "support/log_capture.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

using ::orvex::testing::LogCapture;
using ::testing::HasSubstr;
using ::testing::StartsWith;

constexpr time_t kNow = 1700000000;

class StatusMgrTest : public ::testing::Test {
 protected:
  void WriteStatus(const std::string& text) {
    std::filesystem::create_directories(root_.Join("var/packages/Orvex/etc"));
    root_.Write("var/packages/Orvex/etc/fileindex.status", text);
  }

  Json::Value ReadStatus() const {
    Json::Value value;
    EXPECT_TRUE(fromFile(value, status_path_)) << status_path_;
    return value;
  }

  // Starts a stand-in daemon on the daemon's socket under the root.
  std::unique_ptr<testing::FileindexdPeer> StartDaemon() {
    std::filesystem::create_directories(root_.Join("var/run"));
    auto peer =
        std::make_unique<testing::FileindexdPeer>(portable::RootPath(kFileIndexDaemonSockPath));
    EXPECT_TRUE(peer->listening());
    return peer;
  }

  static Json::Value Command(const std::string& type, Json::Int64 resume_time) {
    Json::Value command(Json::objectValue);
    command["type"] = type;
    command["data"]["resume_time"] = resume_time;
    return command;
  }

  template <typename Call>
  static Error ErrorOf(Call call) {
    try {
      call();
    } catch (const Error& e) {
      return e;
    }
    ADD_FAILURE() << "no error";
    return Error(kErrorInternal);
  }

  testing::TempDir root_;
  testing::ScopedOrvexRoot root_guard_{root_.path()};
  const std::string status_path_ = portable::RootPath(kFileIndexStatusCfgPath);
  const std::string lock_path_ = portable::RootPath(kFileIndexStatusLockPath);
  time_t now_ = kNow;
  std::vector<unsigned long> sleeps_;
  ScopedSystemHooks hooks_{SystemHooks{[this] { return now_; },
                                       [this](unsigned long micros) { sleeps_.push_back(micros); },
                                       [] { return 0; }}};
};

TEST_F(StatusMgrTest, MissingFileReadsAsRunningWithoutShares) {
  StatusMgr mgr;
  EXPECT_EQ(mgr.GetPauseInfo(), -1);
  EXPECT_EQ(mgr.GetShareStatus("photo"), 0);
  EXPECT_TRUE(mgr.GetAllShareStatus().empty());
  EXPECT_FALSE(std::filesystem::exists(status_path_)) << "reading must not create the file";
}

TEST_F(StatusMgrTest, PauseStoresAndSendsItsEndAndResumeStoresRunning) {
  // The NAS adds in 32 bits: a pause ending after January 2038 wraps to a
  // negative time, and that is what is stored and sent.
  const std::vector<std::vector<int64_t>> cases = {
      // now, hours, resume time
      {kNow, 0, 0},
      {kNow, 2, kNow + 7200},
      {2147483000, 1, int64_t{2147483000} + 3600 - (int64_t{1} << 32)},
  };
  auto daemon = StartDaemon();
  for (size_t k = 0; k < cases.size(); ++k) {
    now_ = cases[k][0];
    StatusMgr().Pause(static_cast<int>(cases[k][1]));
    EXPECT_EQ(StatusMgr().GetPauseInfo(), cases[k][2]);
    EXPECT_EQ(ReadStatus()["resume_time"].asInt64(), cases[k][2]);
    ASSERT_EQ(daemon->requests().size(), k + 1);
    EXPECT_EQ(daemon->requests()[k], Command("pause", cases[k][2]));
  }
  StatusMgr().Resume();
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1);
  EXPECT_EQ(ReadStatus()["resume_time"].asInt64(), -1) << "running is stored, not removed";
  ASSERT_EQ(daemon->requests().size(), 4u);
  Json::Value resume = Command("resume", 0);
  resume["data"] = Json::Value();  // "data": null, not left out
  EXPECT_EQ(daemon->requests()[3], resume);
  EXPECT_TRUE(daemon->faults().empty());
}

TEST_F(StatusMgrTest, NegativePauseThrows120ChangesNothingAndReleasesTheLock) {
  auto daemon = StartDaemon();
  LogCapture log;
  const Error error = ErrorOf([] { StatusMgr().Pause(-1); });
  EXPECT_EQ(error.code(), kErrorBadArgument);
  EXPECT_EQ(error.reason(), "Pause length should NOT be negative");
  ASSERT_EQ(log.lines().size(), 1u);
  // The constructor's look-up of the missing file leaves errno set: an
  // " [err: ...]" suffix may follow.
  EXPECT_THAT(testing::WithoutLineNumber(log.lines()[0]),
              StartsWith(testing::CheckLine("status_mgr", "0 > hours", error.reason())));
  EXPECT_FALSE(std::filesystem::exists(status_path_));
  EXPECT_TRUE(daemon->requests().empty());
  LockFile lock(lock_path_, /*exclusive=*/true);
  EXPECT_TRUE(sleeps_.empty()) << "the lock was still held";
}

TEST_F(StatusMgrTest, PauseWithoutDaemonSavesTheFileThenThrows502) {
  const Error error = ErrorOf([] { StatusMgr().Pause(3); });
  EXPECT_EQ(error.code(), kErrorSystem);
  EXPECT_EQ(error.reason().rfind("write failed, reason=", 0), 0u) << error.reason();
  EXPECT_EQ(StatusMgr().GetPauseInfo(), kNow + 3 * 3600);
}

TEST_F(StatusMgrTest, PauseWhileTheLockIsHeldElsewhereChangesNothing) {
  auto daemon = StartDaemon();
  StatusMgr mgr;
  std::filesystem::create_directories(root_.Join("tmp"));
  LockFile other(lock_path_, /*exclusive=*/true);
  const Error error = ErrorOf([&mgr] { mgr.Pause(1); });
  EXPECT_EQ(error.code(), kErrorLockFile);
  EXPECT_EQ(error.reason(), "Exceed max retry");
  EXPECT_EQ(sleeps_.size(), 64u);
  EXPECT_FALSE(std::filesystem::exists(status_path_));
  EXPECT_TRUE(daemon->requests().empty());
}

TEST_F(StatusMgrTest, ShareFlagsAreABitSetAndAZeroEntryStaysUntilCleared) {
  const auto kOther = static_cast<ShareStatus>(4);
  // The first save creates the missing directories and a mode 0644 file.
  const mode_t old_mask = ::umask(077);
  StatusMgr().SetShareStatus("photo", NeedReindex);
  ::umask(old_mask);
  struct stat st;
  ASSERT_EQ(::stat(status_path_.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  EXPECT_TRUE(std::filesystem::exists(lock_path_));

  StatusMgr().SetShareStatus("photo", NeedReindex);
  StatusMgr().SetShareStatus("photo", kOther);
  StatusMgr().SetShareStatus("music", NeedReindex);
  StatusMgr().UnsetShareStatus("video", NeedReindex);
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 5);
  StatusMgr().UnsetShareStatus("photo", NeedReindex);
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 4);
  StatusMgr().UnsetShareStatus("photo", kOther);
  EXPECT_EQ(toString(ReadStatus()["share"]), R"({"music":1,"photo":0,"video":0})");
  StatusMgr().ClearShareStatus("photo");
  StatusMgr().ClearShareStatus("never-there");
  EXPECT_EQ(StatusMgr().GetAllShareStatus(),
            (std::map<std::string, int>{{"music", 1}, {"video", 0}}));
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1) << "flags must not touch the pause state";
}

TEST_F(StatusMgrTest, OfTwoInstancesLoadedTogetherTheLastSaveWins) {
  StatusMgr first;
  StatusMgr second;
  first.SetShareStatus("photo", NeedReindex);
  second.SetShareStatus("video", NeedReindex);
  StatusMgr after;
  EXPECT_EQ(after.GetShareStatus("photo"), 0) << "lost: the second instance never saw it";
  EXPECT_EQ(after.GetShareStatus("video"), 1);
}

TEST_F(StatusMgrTest, FileThatIsNotARecordMakesEveryConstructorThrow504) {
  const std::string kParse =
      "IsFileExist(kFileIndexStatusCfgPath) && !data_.fromFile(kFileIndexStatusCfgPath)";
  const std::vector<std::pair<std::string, std::string>> cases = {
      {"{\"resume_time\": 0", kParse}, {"not json", kParse}, {"[1, 2]", ""}, {"42", ""}};
  for (const auto& [text, condition] : cases) {
    WriteStatus(text);
    for (int attempt = 0; attempt < 2; ++attempt) {
      LogCapture log;
      const Error error = ErrorOf([] { StatusMgr(); });
      EXPECT_EQ(error.code(), kErrorLoadJson) << text;
      EXPECT_EQ(error.reason(), "Cannot load json: " + status_path_) << text;
      ASSERT_EQ(log.lines().size(), 1u) << text;
      EXPECT_THAT(log.lines()[0], HasSubstr("], reason: " + error.reason()));
      if (!condition.empty()) {
        EXPECT_THAT(testing::WithoutLineNumber(log.lines()[0]),
                    StartsWith(testing::CheckLine("status_mgr", condition, error.reason())));
      }
    }
    EXPECT_EQ(testing::ReadFileText(status_path_), text) << "a failed load leaves the file alone";
  }
  std::filesystem::remove(status_path_);
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1) << "a removed file reads as running again";
}

TEST_F(StatusMgrTest, FailedSaveThrows505AndLeavesTheOldFileWhole) {
  const std::string before = "{\"resume_time\": 0, \"share\": {\"photo\": 1}}";
  WriteStatus(before);
  StatusMgr mgr;
  LogCapture log;
  Error error(kErrorInternal);
  {
    testing::ScopedRlimit full_disk(RLIMIT_FSIZE, 8);
    ASSERT_TRUE(full_disk.ok());
    error = ErrorOf([&mgr] { mgr.SetShareStatus("video", NeedReindex); });
  }
  EXPECT_EQ(error.code(), kErrorSaveJson);
  EXPECT_EQ(error.reason(), "Failed to save json: " + status_path_);
  EXPECT_EQ(log.Matching("Failed [!data_.toFile(kFileIndexStatusCfgPath)]").size(), 1u);
  EXPECT_EQ(testing::ReadFileText(status_path_), before);
  EXPECT_EQ(
      std::distance(std::filesystem::directory_iterator(root_.Join("var/packages/Orvex/etc")), {}),
      1)
      << "no temporary file may be left behind";
}

TEST_F(StatusMgrTest, ReadersRejectMembersOfTheWrongType) {
  WriteStatus("{\"resume_time\": \"soon\", \"share\": {\"photo\": -1}}");
  StatusMgr mgr;
  EXPECT_THROW(mgr.GetPauseInfo(), Error);
  EXPECT_EQ(ErrorOf([&mgr] { mgr.SetShareStatus("photo", NeedReindex); }).code(),
            kErrorBadArgument);
  EXPECT_EQ(ReadStatus()["share"]["photo"].asInt(), -1) << "the file must stay as it was";
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
