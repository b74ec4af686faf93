#include "orvex/status/status_mgr.h"

#include <dirent.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <csignal>
#include <cstdint>
#include <fstream>
#include <iterator>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "orvex/communication.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/lock.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/foundation/util.h"
#include "orvex/portable/root.h"
#include "status/fileindexd_peer.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

using ::orvex::testing::FileindexdPeer;
using ::orvex::testing::LogCapture;
using ::orvex::testing::ScopedOrvexRoot;
using ::orvex::testing::TempDir;

constexpr time_t kNow = 1700000000;

// Makes writes past `bytes` fail with EFBIG (instead of SIGXFSZ) for a scope:
// a full disk in miniature, which also works for root.
class ScopedFileSizeLimit {
 public:
  explicit ScopedFileSizeLimit(rlim_t bytes) {
    previous_handler_ = std::signal(SIGXFSZ, SIG_IGN);
    ::getrlimit(RLIMIT_FSIZE, &previous_);
    struct rlimit limit = previous_;
    limit.rlim_cur = bytes;
    ::setrlimit(RLIMIT_FSIZE, &limit);
  }
  ScopedFileSizeLimit(const ScopedFileSizeLimit&) = delete;
  ScopedFileSizeLimit& operator=(const ScopedFileSizeLimit&) = delete;
  ~ScopedFileSizeLimit() {
    ::setrlimit(RLIMIT_FSIZE, &previous_);
    std::signal(SIGXFSZ, previous_handler_);
  }

 private:
  struct rlimit previous_;
  void (*previous_handler_)(int);
};

class StatusMgrTest : public ::testing::Test {
 protected:
  StatusMgrTest()
      : root_guard_(root_.path()),
        hooks_(SystemHooks{[this] { return now_; },
                           [this](unsigned long micros) { sleeps_.push_back(micros); },
                           [] { return 0; }}) {}

  std::string StatusPath() const { return portable::RootPath(kFileIndexStatusCfgPath); }
  std::string StatusDir() const { return root_.Join("var/packages/Orvex/etc"); }
  std::string LockPath() const { return portable::RootPath(kFileIndexStatusLockPath); }

  void WriteStatus(const std::string& text) {
    ASSERT_EQ(0, std::system(("mkdir -p '" + StatusDir() + "'").c_str()));
    root_.Write("var/packages/Orvex/etc/fileindex.status", text);
  }

  Json::Value ReadStatus() const {
    Json::Value value;
    EXPECT_TRUE(fromFile(value, StatusPath())) << StatusPath();
    return value;
  }

  std::string ReadStatusText() const {
    std::string text;
    std::ifstream in(StatusPath(), std::ios::binary);
    text.assign(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
    return text;
  }

  // Starts a stand-in daemon on the daemon's socket under the root.
  std::unique_ptr<FileindexdPeer> StartDaemon() {
    EXPECT_EQ(0, ::mkdir(root_.Join("var").c_str(), 0755));
    EXPECT_EQ(0, ::mkdir(root_.Join("var/run").c_str(), 0755));
    auto peer = std::make_unique<FileindexdPeer>(portable::RootPath(kFileIndexDaemonSockPath));
    EXPECT_TRUE(peer->listening());
    return peer;
  }

  static Json::Value Command(const std::string& type, const Json::Value& data) {
    Json::Value command(Json::objectValue);
    command["type"] = type;
    command["data"] = data;
    return command;
  }

  static Json::Value PauseCommand(Json::Int64 resume_time) {
    Json::Value data(Json::objectValue);
    data["resume_time"] = resume_time;
    return Command("pause", data);
  }

  TempDir root_;
  ScopedOrvexRoot root_guard_;
  time_t now_ = kNow;
  std::vector<unsigned long> sleeps_;
  ScopedSystemHooks hooks_;
};

TEST_F(StatusMgrTest, MissingFileReadsAsRunningWithoutShares) {
  StatusMgr mgr;
  EXPECT_EQ(-1, mgr.GetPauseInfo());
  EXPECT_EQ(0, mgr.GetShareStatus("photo"));
  EXPECT_TRUE(mgr.GetAllShareStatus().empty());
  EXPECT_FALSE(IsFileExist(StatusPath())) << "reading must not create the file";
}

TEST_F(StatusMgrTest, PauseWithoutEndStoresAndSendsZero) {
  auto daemon = StartDaemon();
  StatusMgr().Pause(0);
  EXPECT_EQ(0, StatusMgr().GetPauseInfo());
  EXPECT_EQ(0, ReadStatus()["resume_time"].asInt64());
  ASSERT_EQ(1u, daemon->requests().size());
  EXPECT_EQ(PauseCommand(0), daemon->requests()[0]);
  EXPECT_TRUE(daemon->faults().empty());
}

TEST_F(StatusMgrTest, PauseForHoursStoresNowPlusHoursAndSendsIt) {
  auto daemon = StartDaemon();
  StatusMgr().Pause(2);
  EXPECT_EQ(kNow + 7200, StatusMgr().GetPauseInfo());
  ASSERT_EQ(1u, daemon->requests().size());
  EXPECT_EQ(PauseCommand(kNow + 7200), daemon->requests()[0]);
}

// The NAS adds in 32 bits: a pause ending after January 2038 wraps to a
// negative time, and that is what is stored and sent.
TEST_F(StatusMgrTest, PauseEndPast2038WrapsInThirtyTwoBits) {
  now_ = 2147483000;
  const int64_t wrapped = int64_t{2147483000} + 3600 - (int64_t{1} << 32);
  EXPECT_EQ(wrapped, StatusMgr::ResumeTimeFor(1, now_));
  auto daemon = StartDaemon();
  StatusMgr().Pause(1);
  EXPECT_EQ(wrapped, StatusMgr().GetPauseInfo());
  ASSERT_EQ(1u, daemon->requests().size());
  EXPECT_EQ(PauseCommand(wrapped), daemon->requests()[0]);
}

TEST_F(StatusMgrTest, NegativePauseThrows120ChangesNothingAndReleasesTheLock) {
  auto daemon = StartDaemon();
  LogCapture log;
  try {
    StatusMgr().Pause(-1);
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorBadArgument, e.code());
    EXPECT_STREQ("Pause length should NOT be negative", e.what());
  }
  ASSERT_EQ(1u, log.lines().size());
  EXPECT_EQ(0u, log.lines()[0].find("status_mgr:"));
  EXPECT_NE(std::string::npos,
            log.lines()[0].find("Failed [0 > hours], reason: Pause length should NOT be negative"));
  EXPECT_FALSE(IsFileExist(StatusPath()));
  EXPECT_TRUE(daemon->requests().empty());
  LockFile lock(LockPath(), /*exclusive=*/true);
  EXPECT_TRUE(sleeps_.empty()) << "the lock was still held";
}

TEST_F(StatusMgrTest, ResumeStoresRunningAndSendsNullData) {
  auto daemon = StartDaemon();
  StatusMgr().Pause(5);
  StatusMgr().Resume();
  EXPECT_EQ(-1, StatusMgr().GetPauseInfo());
  EXPECT_EQ(-1, ReadStatus()["resume_time"].asInt64()) << "running is stored, not removed";
  ASSERT_EQ(2u, daemon->requests().size());
  const Json::Value resume = daemon->requests()[1];
  EXPECT_EQ(Command("resume", Json::Value()), resume);
  EXPECT_TRUE(resume.isMember("data"));
}

TEST_F(StatusMgrTest, PauseWithoutDaemonSavesTheFileThenThrows502) {
  try {
    StatusMgr().Pause(3);
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorSystem, e.code());
    EXPECT_EQ(0u, std::string(e.what()).find("write failed, reason=")) << e.what();
  }
  EXPECT_EQ(kNow + 3 * 3600, StatusMgr().GetPauseInfo());
  // Four 1 s waits between five connection attempts to a missing socket.
  EXPECT_EQ(std::vector<unsigned long>(4, 1000000), sleeps_);
}

TEST_F(StatusMgrTest, PauseWhileTheLockIsHeldElsewhereChangesNothing) {
  auto daemon = StartDaemon();
  StatusMgr mgr;
  ASSERT_EQ(0, ::mkdir(root_.Join("tmp").c_str(), 0755));
  LockFile other(LockPath(), /*exclusive=*/true);
  try {
    mgr.Pause(1);
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorLockFile, e.code());
    EXPECT_STREQ("Exceed max retry", e.what());
  }
  EXPECT_EQ(64u, sleeps_.size());
  EXPECT_FALSE(IsFileExist(StatusPath()));
  EXPECT_TRUE(daemon->requests().empty());
}

TEST_F(StatusMgrTest, ShareFlagsAreABitSetAndAZeroEntryStaysUntilCleared) {
  const auto kOther = static_cast<ShareStatus>(4);
  StatusMgr().SetShareStatus("photo", NeedReindex);
  StatusMgr().SetShareStatus("photo", NeedReindex);
  StatusMgr().SetShareStatus("photo", kOther);
  StatusMgr().SetShareStatus("music", NeedReindex);
  EXPECT_EQ(5, StatusMgr().GetShareStatus("photo"));

  StatusMgr().UnsetShareStatus("photo", NeedReindex);
  EXPECT_EQ(4, StatusMgr().GetShareStatus("photo"));
  StatusMgr().UnsetShareStatus("photo", kOther);
  EXPECT_EQ(0, StatusMgr().GetShareStatus("photo"));
  Json::Value shares = ReadStatus()["share"];
  ASSERT_TRUE(shares.isMember("photo")) << toString(shares);
  EXPECT_TRUE(shares["photo"].isUInt());
  EXPECT_EQ(0u, shares["photo"].asUInt());
  EXPECT_EQ((std::map<std::string, int>{{"music", 1}, {"photo", 0}}),
            StatusMgr().GetAllShareStatus());

  StatusMgr().ClearShareStatus("photo");
  StatusMgr().ClearShareStatus("never-there");
  shares = ReadStatus()["share"];
  EXPECT_FALSE(shares.isMember("photo"));
  EXPECT_EQ(1u, shares["music"].asUInt());
  EXPECT_EQ(-1, StatusMgr().GetPauseInfo()) << "flags must not touch the pause state";
}

TEST_F(StatusMgrTest, UnsetOnAShareWithoutEntryCreatesAZeroEntry) {
  StatusMgr().UnsetShareStatus("video", NeedReindex);
  EXPECT_EQ(0u, ReadStatus()["share"]["video"].asUInt());
}

TEST_F(StatusMgrTest, OfTwoInstancesLoadedTogetherTheLastSaveWins) {
  StatusMgr first;
  StatusMgr second;
  first.SetShareStatus("photo", NeedReindex);
  second.SetShareStatus("video", NeedReindex);
  StatusMgr after;
  EXPECT_EQ(0, after.GetShareStatus("photo")) << "lost: the second instance never saw it";
  EXPECT_EQ(1, after.GetShareStatus("video"));
  // An instance made after a save sees it.
  after.SetShareStatus("photo", NeedReindex);
  EXPECT_EQ((std::map<std::string, int>{{"photo", 1}, {"video", 1}}),
            StatusMgr().GetAllShareStatus());
}

TEST_F(StatusMgrTest, SaveCreatesMissingDirectoriesAndWritesMode0644) {
  ASSERT_FALSE(IsDirExist(root_.Join("var"), false));
  ASSERT_FALSE(IsDirExist(root_.Join("tmp"), false));
  const mode_t old_mask = ::umask(077);
  StatusMgr().SetShareStatus("photo", NeedReindex);
  ::umask(old_mask);
  struct stat st;
  ASSERT_EQ(0, ::stat(StatusPath().c_str(), &st));
  EXPECT_EQ(0644u, st.st_mode & 07777);
  EXPECT_TRUE(IsFileExist(LockPath()));
}

TEST_F(StatusMgrTest, FileThatIsNotARecordMakesEveryConstructorThrow504) {
  const std::vector<std::string> bad = {"{\"resume_time\": 0", "not json", "[1, 2]", "42"};
  for (const std::string& text : bad) {
    WriteStatus(text);
    for (int attempt = 0; attempt < 2; ++attempt) {
      LogCapture log;
      try {
        StatusMgr mgr;
        ADD_FAILURE() << "loaded: " << text;
      } catch (const Error& e) {
        EXPECT_EQ(kErrorLoadJson, e.code()) << text;
        EXPECT_EQ("Cannot load json: " + StatusPath(), e.what()) << text;
      }
      ASSERT_EQ(1u, log.lines().size()) << text;
      EXPECT_EQ(0u, log.lines()[0].find("status_mgr:")) << log.lines()[0];
      EXPECT_NE(std::string::npos,
                log.lines()[0].find("reason: Cannot load json: " + StatusPath()));
    }
    EXPECT_EQ(text, ReadStatusText()) << "a failed load must leave the file alone";
  }
  WriteStatus("{\"resume_time\": 0");
  LogCapture log;
  EXPECT_THROW(StatusMgr(), Error);
  EXPECT_NE(std::string::npos,
            log.lines()[0].find("Failed [IsFileExist(kFileIndexStatusCfgPath) && "
                                "!data_.fromFile(kFileIndexStatusCfgPath)]"));
  ASSERT_EQ(0, ::unlink(StatusPath().c_str()));
  EXPECT_EQ(-1, StatusMgr().GetPauseInfo()) << "a removed file reads as running again";
}

TEST_F(StatusMgrTest, FailedSaveThrows505AndLeavesTheOldFileWhole) {
  WriteStatus("{\"resume_time\": 0, \"share\": {\"photo\": 1}}");
  const std::string before = ReadStatusText();
  StatusMgr mgr;
  {
    ScopedFileSizeLimit full_disk(8);
    LogCapture log;
    try {
      mgr.SetShareStatus("video", NeedReindex);
      FAIL() << "no error";
    } catch (const Error& e) {
      EXPECT_EQ(kErrorSaveJson, e.code());
      EXPECT_EQ("Failed to save json: " + StatusPath(), e.what());
    }
    ASSERT_EQ(1u, log.Matching("Failed [!data_.toFile(kFileIndexStatusCfgPath)]").size());
  }
  EXPECT_EQ(before, ReadStatusText());
  std::set<std::string> entries;
  DIR* dir = ::opendir(StatusDir().c_str());
  ASSERT_NE(nullptr, dir);
  while (dirent* entry = ::readdir(dir)) entries.insert(entry->d_name);
  ::closedir(dir);
  EXPECT_EQ((std::set<std::string>{".", "..", "fileindex.status"}), entries)
      << "no temporary file may be left behind";
  EXPECT_EQ(0, StatusMgr().GetShareStatus("video"));
}

TEST_F(StatusMgrTest, ReadersRejectMembersOfTheWrongType) {
  WriteStatus("{\"resume_time\": \"soon\", \"share\": {\"photo\": -1}}");
  StatusMgr mgr;
  EXPECT_THROW(mgr.GetPauseInfo(), Error);
  try {
    mgr.SetShareStatus("photo", NeedReindex);
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorBadArgument, e.code());
  }
  EXPECT_EQ(-1, ReadStatus()["share"]["photo"].asInt()) << "the file must stay as it was";
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
