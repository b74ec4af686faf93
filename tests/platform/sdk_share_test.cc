#include "orvex/platform/sdk_share.h"

#include <unistd.h>

#include <cerrno>
#include <string>

#include "orvex/foundation/error.h"
#include "platform/share_test_root.h"
#include "support/log_capture.h"

namespace orvex {
namespace sdk {
namespace {

using orvex::testing::LogCapture;
using orvex::testing::Options;

class SDKShareTest : public orvex::testing::ShareTestRoot {
 protected:
  // The code and reason of the Error that opening name throws.
  Error OpenFailure(const std::string& name) {
    try {
      SDKShare share(name);
    } catch (const Error& e) {
      return e;
    }
    ADD_FAILURE() << "opening [" << name << "] did not throw";
    return Error(kErrorInternal);
  }
};

TEST_F(SDKShareTest, ReportsTheRegisteredFlagsAndFields) {
  const std::string plain_root = AddShare("plain");
  const std::string full_root = AddShare("full", Options(R"({"encryption": true,
      "recycle_bin": true, "hide_unreadable": true, "ftp_privilege": 7})"));
  SDKShare plain("plain");
  SDKShare full("full");
  EXPECT_EQ(plain.GetName(), "plain");
  EXPECT_EQ(plain.GetPath(), plain_root);
  EXPECT_EQ(full.GetPath(), full_root);
  EXPECT_FALSE(plain.IsEncryption());
  EXPECT_TRUE(full.IsEncryption());
  EXPECT_FALSE(plain.IsEnableRecycleBin());
  EXPECT_TRUE(full.IsEnableRecycleBin());
  EXPECT_FALSE(plain.IsHideUnReadable());
  EXPECT_TRUE(full.IsHideUnReadable());
  EXPECT_EQ(plain.GetFTPPrivilege(), 0);
  EXPECT_EQ(full.GetFTPPrivilege(), 7);
}

TEST_F(SDKShareTest, QueueAndDatabaseLiveInTheSharesMetadataFolder) {
  const std::string root = AddShare("docs");
  SDKShare share("docs");
  EXPECT_EQ(share.GetQueuePath(), root + "/@eaDir/@fileindex/queue");
  EXPECT_EQ(share.GetDBPath(), root + "/@eaDir/@fileindex/db");
}

TEST_F(SDKShareTest, CanBeIndexedByNameEncryptionAndReadOnly) {
  struct Case {
    const char* name;
    const char* options;
    bool expected;
  };
  const Case cases[] = {
      {"plain", "{}", true},
      {"surveillance", "{}", false},
      {"NetBackup", "{}", false},
      // Letter case differs from the never-indexed names: the other rules decide.
      {"Surveillance", "{}", true},
      {"netbackup", "{}", true},
      {"SURVEILLANCE", R"({"readonly": true})", false},
      {"readonly", R"({"readonly": true})", false},
      // An encrypted share that is mounted can be indexed; a locked one not.
      {"mounted", R"({"encryption": true})", true},
      {"locked", R"({"encryption": true, "encrypted": true})", false},
  };
  for (const Case& c : cases) AddShare(c.name, Options(c.options));
  for (const Case& c : cases) {
    EXPECT_EQ(SDKShare(c.name).CanBeIndexed(), c.expected) << c.name << " " << c.options;
  }
}

TEST_F(SDKShareTest, UnknownShareThrows800AndLogsTheFailedCheck) {
  AddShare("photo");
  LogCapture log;
  errno = 0;
  const Error error = OpenFailure("ghost");
  EXPECT_EQ(error.code(), kErrorNoShare);
  EXPECT_EQ(error.reason(), "ghost");
  ASSERT_EQ(log.lines().size(), 1u);
  const std::string& line = log.lines()[0];
  EXPECT_EQ(line.rfind("share:", 0), 0u) << line;
  const std::string expected = " (" + std::to_string(getpid()) + ", " + std::to_string(geteuid()) +
                               ") Failed [0 > KALOShareGet(share_name.c_str(), &share_info_) || "
                               "!share_info_], reason: ghost";
  EXPECT_NE(line.find(expected), std::string::npos) << line;
  // Names are exact: the registered share in another letter case is unknown.
  EXPECT_EQ(OpenFailure("Photo").code(), kErrorNoShare);
  // The failed constructor left the process-wide mutex free.
  ASSERT_TRUE(SDKMutex().TryLock());
  SDKMutex().Unlock();
}

TEST_F(SDKShareTest, MalformedRegistryFailsEveryShareWith800) {
  WriteRegistryText(R"([{"name": "photo", "path": "/volume1/photo", "readonly": "yes"}])");
  LogCapture log;
  EXPECT_EQ(OpenFailure("photo").code(), kErrorNoShare);
}

TEST_F(SDKShareTest, SpaceIsEnoughOnTheTempDirAndWhenTheCheckCannotBeMade) {
  AddShare("roomy");
  // A root that does not exist: the quota check fails with an I/O error,
  // which must not stop indexing.
  AddShareAt("gone", dir_.Join("volume9/gone"));
  EXPECT_TRUE(SDKShare("roomy").IsSpaceEnough());
  EXPECT_TRUE(SDKShare("gone").IsSpaceEnough());
}

TEST_F(SDKShareTest, PrivilegesFollowTheShareList) {
  AddShare("team", Options(R"({"privileges": {"alice": "rw", "bob": "ro", "eve": "na"}})"));
  SDKShare share("team");
  EXPECT_EQ(share.GetPrivilege("alice"), 3);
  EXPECT_EQ(share.GetPrivilege("bob"), 1);
  EXPECT_EQ(share.GetPrivilege("eve"), 0);
  EXPECT_LT(share.GetPrivilege("no-such-user-orvex"), 0);
}

}  // namespace
}  // namespace sdk
}  // namespace orvex
