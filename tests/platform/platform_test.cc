// The platform layer: switching credentials and reading share records.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <unistd.h>

#include <string>
#include <tuple>
#include <vector>

#include "foundation/fault_helpers.h"
#include "orvex/foundation/error.h"
#include "orvex/platform/sdk_credentials.h"
#include "orvex/platform/sdk_share.h"
#include "platform/share_test_root.h"
#include "support/log_capture.h"

namespace orvex {
namespace sdk {
namespace {

using orvex::testing::Options;
using SDKShareTest = orvex::testing::ShareTestRoot;

TEST(SDKCredentialsTest, NestedScopesReturnToTheUserBeforeAndUnknownUserThrows503) {
  if (geteuid() != 0) GTEST_SKIP() << "switching credentials needs root";
  const passwd* nobody = getpwnam("nobody");
  ASSERT_NE(nobody, nullptr);
  const uid_t nobody_uid = nobody->pw_uid;
  {
    SDKCredentials outer("nobody");
    EXPECT_EQ(geteuid(), nobody_uid);
    {
      SDKCredentials inner("root");
      EXPECT_EQ(geteuid(), 0u);
    }
    EXPECT_EQ(geteuid(), nobody_uid);
  }
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

TEST_F(SDKShareTest, ReportsTheRegisteredRecordAndWhetherItCanBeIndexed) {
  const std::string root = AddShare("enc", Options(R"({"encryption": true, "ftp_privilege": 7,
      "privileges": {"alice": "rw", "bob": "ro", "eve": "na"}})"));
  SDKShare share("enc");
  EXPECT_EQ(share.GetPath(), root);
  EXPECT_EQ(share.GetDBPath(), root + "/@eaDir/@fileindex/db");
  EXPECT_TRUE(share.IsEncryption() && !share.IsEnableRecycleBin() && !share.IsHideUnReadable());
  EXPECT_EQ(share.GetFTPPrivilege(), 7);
  EXPECT_EQ(std::make_tuple(share.GetPrivilege("alice"), share.GetPrivilege("bob"),
                            share.GetPrivilege("eve")),
            std::make_tuple(3, 1, 0));
  EXPECT_TRUE(share.IsSpaceEnough());
  const std::vector<std::tuple<std::string, std::string, bool>> cases = {
      {"surveillance", "{}", false},
      {"Surveillance", "{}", true},  // letter case differs from the never-indexed names
      {"ro", R"({"readonly": true})", false},
      {"locked", R"({"encryption": true, "encrypted": true})", false},
  };
  for (const auto& [name, options, expected] : cases) AddShare(name, Options(options));
  EXPECT_TRUE(share.CanBeIndexed()) << "a mounted encrypted share";
  for (const auto& [name, options, expected] : cases) {
    EXPECT_EQ(SDKShare(name).CanBeIndexed(), expected) << name;
  }
  // A quota check that cannot be made must not stop indexing.
  AddShareAt("gone", dir_.Join("volume9/gone"));
  EXPECT_TRUE(SDKShare("gone").IsSpaceEnough());
}

TEST_F(SDKShareTest, UnknownShareThrows800AndLogsTheFailedCheck) {
  AddShare("photo");
  testing::LogCapture log;
  errno = 0;
  try {
    SDKShare share("Photo");
    FAIL() << "names are exact";
  } catch (const Error& e) {
    EXPECT_EQ(e.code(), kErrorNoShare);
    EXPECT_EQ(e.reason(), "Photo");
  }
  ASSERT_EQ(log.lines().size(), 1u);
  EXPECT_EQ(
      testing::WithoutLineNumber(log.lines()[0]),
      testing::CheckLine(
          "share", "0 > KALOShareGet(share_name.c_str(), &share_info_) || !share_info_", "Photo"));
  // The failed constructor left the process-wide mutex free.
  ASSERT_TRUE(SDKMutex().TryLock());
  SDKMutex().Unlock();
}

}  // namespace
}  // namespace sdk
}  // namespace orvex
