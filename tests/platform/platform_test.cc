// The platform layer: switching credentials and reading share records.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <tuple>
#include <vector>

#include "foundation/fault_helpers.h"
#include "orvex/foundation/error.h"
#include "orvex/platform/sdk_credentials.h"
#include "orvex/platform/sdk_share.h"
#include "platform/share_test_root.h"
#include "portable/kalo_test_root.h"
#include "support/log_capture.h"

namespace orvex {
namespace sdk {
namespace {

using orvex::testing::Options;
using SDKShareTest = orvex::testing::ShareTestRoot;

class SDKCredentialsTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (geteuid() != 0) GTEST_SKIP() << "switching credentials needs root";
    const passwd* nobody = getpwnam("nobody");
    ASSERT_NE(nobody, nullptr);
    nobody_uid_ = nobody->pw_uid;
  }

  uid_t nobody_uid_ = 0;
};

TEST_F(SDKCredentialsTest, NestedScopesEachReturnToTheUserBefore) {
  {
    SDKCredentials outer("nobody");
    EXPECT_EQ(geteuid(), nobody_uid_);
    EXPECT_EQ(getuid(), 0u);
    {
      SDKCredentials inner("root");
      EXPECT_EQ(geteuid(), 0u);
    }
    EXPECT_EQ(geteuid(), nobody_uid_);
  }
  EXPECT_EQ(geteuid(), 0u);
  EXPECT_EQ(getegid(), 0u);
}

TEST_F(SDKCredentialsTest, UnknownUserThrows503NamingTheUserAndKeepsRoot) {
  testing::LogCapture log;
  try {
    SDKCredentials creds("no-such-user-orvex");
    FAIL() << "no error";
  } catch (const Error& e) {
    EXPECT_EQ(e.code(), kErrorCredentials);
    EXPECT_NE(e.reason().find("no-such-user-orvex"), std::string::npos) << e.reason();
    ASSERT_EQ(log.lines().size(), 1u);
    EXPECT_THAT(testing::WithoutLineNumber(log.lines()[0]),
                ::testing::StartsWith(testing::CheckLine(
                    "credentials", "0 > KALOCredResetByName(user_name.c_str())", e.reason())));
  }
  EXPECT_EQ(geteuid(), 0u);
}

TEST_F(SDKCredentialsTest, UnknownEffectiveUserThrows503FromTheLookUp) {
  // Root may take an effective uid without a user entry; the child does it
  // so the test process stays root.
  constexpr uid_t kUnknownUid = 54321;
  ASSERT_EQ(getpwuid(kUnknownUid), nullptr);
  const int status = testing::InChild([] {
    if (seteuid(kUnknownUid) != 0) return 2;
    testing::LogCapture log;
    try {
      SDKCredentials creds("root");
    } catch (const Error& e) {
      const bool logged = log.Matching("reason: KALOUserGetByUID failed, err=").size() == 1;
      return e.code() == kErrorCredentials &&
                     e.reason().rfind("KALOUserGetByUID failed, err=", 0) == 0 && logged &&
                     geteuid() == kUnknownUid
                 ? 0
                 : 3;
    }
    return 4;
  });
  EXPECT_EQ(status, 0);
}

TEST_F(SDKShareTest, ReportsTheRegisteredRecord) {
  struct Case {
    std::string name;
    std::string options;
    std::vector<bool> flags;  // encryption, recycle bin, hide unreadable
  };
  const std::vector<Case> cases = {
      {"plain", "{}", {false, false, false}},
      {"enc", R"({"encryption": true, "ftp_privilege": 7})", {true, false, false}},
      {"bin", R"({"recycle_bin": true})", {false, true, false}},
      {"hide", R"({"hide_unreadable": true})", {false, false, true}},
  };
  for (const Case& c : cases) {
    const std::string root = AddShare(c.name, Options(c.options));
    SDKShare share(c.name);
    EXPECT_EQ(share.GetName(), c.name);
    EXPECT_EQ(share.GetPath(), root);
    EXPECT_EQ(share.GetQueuePath(), root + "/@eaDir/@fileindex/queue");
    EXPECT_EQ(share.GetDBPath(), root + "/@eaDir/@fileindex/db");
    EXPECT_EQ((std::vector<bool>{share.IsEncryption(), share.IsEnableRecycleBin(),
                                 share.IsHideUnReadable()}),
              c.flags)
        << c.name;
    EXPECT_EQ(share.GetFTPPrivilege(), c.name == "enc" ? 7 : 0);
  }
  AddShare("team", Options(R"({"privileges": {"alice": "rw", "bob": "ro", "eve": "na"}})"));
  SDKShare team("team");
  EXPECT_EQ(std::make_tuple(team.GetPrivilege("alice"), team.GetPrivilege("bob"),
                            team.GetPrivilege("eve")),
            std::make_tuple(3, 1, 0));
  EXPECT_LT(team.GetPrivilege("no-such-user-orvex"), 0);
}

TEST_F(SDKShareTest, CanBeIndexedByNameEncryptionAndReadOnly) {
  const std::vector<std::tuple<std::string, std::string, bool>> cases = {
      {"plain", "{}", true},
      {"surveillance", "{}", false},
      {"NetBackup", "{}", false},
      // Letter case differs from the never-indexed names: the other rules decide.
      {"Surveillance", "{}", true},
      {"netbackup", "{}", true},
      {"SURVEILLANCE", R"({"readonly": true})", false},
      // An encrypted share that is mounted can be indexed; a locked one not.
      {"mounted", R"({"encryption": true})", true},
      {"locked", R"({"encryption": true, "encrypted": true})", false},
  };
  for (const auto& [name, options, expected] : cases) AddShare(name, Options(options));
  for (const auto& [name, options, expected] : cases) {
    EXPECT_EQ(SDKShare(name).CanBeIndexed(), expected) << name << " " << options;
  }
}

// The Error that opening name throws.
Error OpenFailure(const std::string& name) {
  try {
    SDKShare share(name);
  } catch (const Error& e) {
    return e;
  }
  ADD_FAILURE() << "opening [" << name << "] did not throw";
  return Error(kErrorInternal);
}

TEST_F(SDKShareTest, UnknownShareOrBadRegistryThrows800AndLogsTheFailedCheck) {
  AddShare("photo");
  testing::LogCapture log;
  errno = 0;
  EXPECT_EQ(OpenFailure("ghost").reason(), "ghost");
  ASSERT_EQ(log.lines().size(), 1u);
  EXPECT_EQ(
      testing::WithoutLineNumber(log.lines()[0]),
      testing::CheckLine(
          "share", "0 > KALOShareGet(share_name.c_str(), &share_info_) || !share_info_", "ghost"));
  // The failed constructor left the process-wide mutex free.
  ASSERT_TRUE(SDKMutex().TryLock());
  SDKMutex().Unlock();
  EXPECT_EQ(OpenFailure("ghost").code(), kErrorNoShare);
  EXPECT_EQ(OpenFailure("Photo").code(), kErrorNoShare) << "names are exact";
  WriteRegistryText(R"([{"name": "photo", "path": "/volume1/photo", "readonly": "yes"}])");
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

}  // namespace
}  // namespace sdk
}  // namespace orvex
