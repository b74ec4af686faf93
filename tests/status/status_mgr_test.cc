#include "orvex/status/status_mgr.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <map>
#include <string>

#include "foundation/fault_helpers.h"
#include "orvex/communication.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/lock.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/portable/root.h"
#include "support/framed_peer.h"
#include "support/log_capture.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

using ::testing::StartsWith;

template <typename Call>
Error ErrorOf(Call call) {
  try {
    call();
  } catch (const Error& e) {
    return e;
  }
  ADD_FAILURE() << "no error";
  return Error(kErrorInternal);
}

class StatusMgrTest : public ::testing::Test {
 protected:
  StatusMgrTest() {
    std::filesystem::create_directories(root_.Join("var/run"));
    std::filesystem::create_directories(root_.Join("tmp"));
  }

  testing::TempDir root_;
  testing::ScopedOrvexRoot root_guard_{root_.path()};
  const std::string status_path_ = portable::RootPath(kFileIndexStatusCfgPath);
  time_t now_ = 2147483000;
  std::vector<unsigned long> sleeps_;
  ScopedSystemHooks hooks_{SystemHooks{[this] { return now_; },
                                       [this](unsigned long micros) { sleeps_.push_back(micros); },
                                       [] { return 0; }}};
};

TEST_F(StatusMgrTest, PauseStoresAndSendsItsEndAndResumeStoresRunning) {
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1);
  EXPECT_FALSE(std::filesystem::exists(status_path_)) << "reading must not create the file";
  testing::FramedPeer daemon(portable::RootPath(kFileIndexDaemonSockPath));
  // The NAS adds in 32 bits: a pause ending after January 2038 wraps to a
  // negative time, and that is what is stored and sent.
  const Json::Int64 wrapped = Json::Int64{2147483000} + 3600 - (Json::Int64{1} << 32);
  StatusMgr().Pause(1);
  EXPECT_EQ(StatusMgr().GetPauseInfo(), wrapped);
  StatusMgr().Resume();
  Json::Value stored;
  ASSERT_TRUE(fromFile(stored, status_path_));
  EXPECT_EQ(stored["resume_time"].asInt64(), -1) << "running is stored, not removed";
  ASSERT_EQ(daemon.requests().size(), 2u);
  EXPECT_EQ(toString(daemon.requests()[0]),
            R"({"data":{"resume_time":)" + std::to_string(wrapped) + R"(},"type":"pause"})");
  EXPECT_EQ(toString(daemon.requests()[1]), R"({"data":null,"type":"resume"})");
}

TEST_F(StatusMgrTest, FailedPauseChangesNothing) {
  testing::FramedPeer daemon(portable::RootPath(kFileIndexDaemonSockPath));
  testing::LogCapture log;
  Error error = ErrorOf([] { StatusMgr().Pause(-1); });
  EXPECT_EQ(error.code(), kErrorBadArgument);
  EXPECT_EQ(error.reason(), "Pause length should NOT be negative");
  ASSERT_EQ(log.lines().size(), 1u);
  EXPECT_THAT(testing::WithoutLineNumber(log.lines()[0]),
              StartsWith(testing::CheckLine("status_mgr", "0 > hours", error.reason())));
  {
    LockFile other(portable::RootPath(kFileIndexStatusLockPath), /*exclusive=*/true);
    EXPECT_TRUE(sleeps_.empty()) << "the failed pause still held the lock";
    error = ErrorOf([] { StatusMgr().Pause(1); });
  }
  EXPECT_EQ(error.code(), kErrorLockFile);
  EXPECT_FALSE(std::filesystem::exists(status_path_));
  EXPECT_TRUE(daemon.requests().empty());
}

TEST_F(StatusMgrTest, ShareFlagsAreABitSetAndAZeroEntryStaysUntilCleared) {
  const auto kOther = static_cast<ShareStatus>(4);
  StatusMgr().SetShareStatus("photo", NeedReindex);
  StatusMgr().SetShareStatus("photo", kOther);
  StatusMgr().SetShareStatus("music", NeedReindex);
  StatusMgr().UnsetShareStatus("video", NeedReindex);
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 5);
  StatusMgr().UnsetShareStatus("photo", NeedReindex);
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 4);
  StatusMgr().UnsetShareStatus("photo", kOther);
  EXPECT_EQ(StatusMgr().GetAllShareStatus().count("photo"), 1u) << "a zero entry stays";
  StatusMgr().ClearShareStatus("photo");
  EXPECT_EQ(StatusMgr().GetAllShareStatus(),
            (std::map<std::string, int>{{"music", 1}, {"video", 0}}));
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1) << "flags must not touch the pause state";
}

TEST_F(StatusMgrTest, BadFileThrows504AndFailedSaveThrows505LeavingTheFileWhole) {
  std::filesystem::create_directories(std::filesystem::path(status_path_).parent_path());
  for (const std::string text : {"{\"resume_time\": 0", "[1, 2]"}) {
    root_.Write("var/packages/Orvex/etc/fileindex.status", text);
    testing::LogCapture log;
    const Error error = ErrorOf([] { StatusMgr(); });
    EXPECT_EQ(error.code(), kErrorLoadJson) << text;
    EXPECT_EQ(error.reason(), "Cannot load json: " + status_path_) << text;
    EXPECT_EQ(log.Matching("], reason: " + error.reason()).size(), 1u) << text;
    EXPECT_EQ(testing::ReadFileText(status_path_), text) << "a failed load leaves the file alone";
  }
  const std::string before = "{\"resume_time\": 0, \"share\": {\"photo\": 1}}";
  root_.Write("var/packages/Orvex/etc/fileindex.status", before);
  StatusMgr mgr;
  testing::LogCapture log;
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
  EXPECT_EQ(std::distance(std::filesystem::directory_iterator(
                              std::filesystem::path(status_path_).parent_path()),
                          {}),
            1)
      << "no temporary file may be left behind";
}

// A link or a directory where the status file belongs is reported, never
// read as "running, no flags" and never replaced by a save.
TEST_F(StatusMgrTest, ALinkOrDirectoryInTheFilesPlaceIsReportedAndNeverReplaced) {
  const std::filesystem::path etc = std::filesystem::path(status_path_).parent_path();
  std::filesystem::create_directories(etc);
  root_.Write("var/packages/Orvex/etc/real.status", "{\"resume_time\": 0}");
  const struct {
    const char* what;
    bool directory;
    const char* link_target;
    const char* ends;
  } cases[] = {
      {"link to a good file", false, "real.status", " is a symbolic link"},
      {"dangling link", false, "gone", " is a symbolic link"},
      {"directory", true, nullptr, " is a directory"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    std::filesystem::remove(status_path_);
    StatusMgr loaded_before;  // no file yet: running, no flags
    if (c.directory) {
      std::filesystem::create_directory(status_path_);
    } else {
      std::filesystem::create_symlink(c.link_target, status_path_);
    }
    const Error load = ErrorOf([] { StatusMgr(); });
    EXPECT_EQ(load.code(), kErrorLoadJson);
    EXPECT_EQ(load.reason(), "Cannot load json: " + status_path_ + c.ends);
    const Error save = ErrorOf([&] { loaded_before.SetShareStatus("photo", NeedReindex); });
    EXPECT_EQ(save.code(), kErrorSaveJson);
    EXPECT_EQ(save.reason(), "Failed to save json: " + status_path_);
    EXPECT_NE(std::filesystem::symlink_status(status_path_).type(),
              std::filesystem::file_type::regular)
        << "replaced by the save";
  }
  EXPECT_EQ(testing::ReadFileText((etc / "real.status").string()), "{\"resume_time\": 0}");
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
