// The platform layer: switching credentials and reading share records.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <unistd.h>

#include <memory>
#include <string>
#include <tuple>
#include <vector>

#include "foundation/fault_helpers.h"
#include "orvex/foundation/error.h"
#include "orvex/platform/sdk_credentials.h"
#include "orvex/platform/sdk_share.h"
#include "platform/program.h"
#include "platform/share_test_root.h"
#include "support/error_code.h"
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

TEST_F(SDKShareTest, FindAnswersNullForAMissingShareAndThrowsForAnUnreadableRegistry) {
  const std::string root = AddShare("photo");
  {
    testing::LogCapture log;
    EXPECT_EQ(SDKShare::Find("nosuch"), nullptr);
    EXPECT_TRUE(log.lines().empty()) << "a missing share is an answer, not a failure";
    const std::unique_ptr<SDKShare> found = SDKShare::Find("photo");
    ASSERT_NE(found, nullptr);
    EXPECT_EQ(found->GetPath(), root);
    EXPECT_EQ(found->GetName(), "photo");
  }
  WriteRegistryText("[{\"name\": \"photo\"}]");  // no path: the record cannot be read
  EXPECT_EQ(testing::CodeOf([] { SDKShare::Find("photo"); }), kErrorNoShare);
  EXPECT_EQ(testing::CodeOf([] { SDKShare::Find("other"); }), kErrorNoShare);
}

TEST_F(SDKShareTest, ListShareLocationsKeepsRegistryOrderAndNamesTheCauseOfAFailure) {
  EXPECT_TRUE(ListShareLocations().empty()) << "no registry file means no shares";
  const std::string b = AddShare("b");
  const std::string a = AddShare("a", Json::objectValue, "volume2/a");
  const std::vector<ShareLocation> shares = ListShareLocations();
  ASSERT_EQ(shares.size(), 2u);
  EXPECT_EQ(std::make_tuple(shares[0].name, shares[0].path, shares[1].name, shares[1].path),
            std::make_tuple("b", b, "a", a));
  WriteRegistryText("{not json");
  std::string reason;
  EXPECT_EQ(testing::CodeOf([] { ListShareLocations(); }, &reason), kErrorSystem);
  EXPECT_THAT(reason, ::testing::StartsWith("Cannot read shares: "));
  EXPECT_THAT(reason, ::testing::HasSubstr("shares.json"));
}

TEST(RunProgramTest, PassesEveryArgumentAndReportsTheExitStatus) {
  // sh -c SCRIPT NAME ARGS...: the script sees ARGS as $1..., and exits with
  // their count, so a lost or extra argument changes the status.
  const std::vector<std::string> fourteen = {"-c", "exit $#", "sh", "1", "2", "3",  "4",
                                             "5",  "6",       "7",  "8", "9", "10", ""};
  EXPECT_EQ(RunProgram("/bin/sh", fourteen), 11);
  EXPECT_EQ(RunProgram("/bin/sh", {"-c", "exit 7"}), 7);
  EXPECT_EQ(RunProgramShort("/bin/sh", {"-c", "exit 3"}), 3);
  EXPECT_EQ(RunProgram("/no/such/program", {}), -1);
  EXPECT_EQ(RunProgram("/bin/true", std::vector<std::string>(kMaxProgramArgs + 1, "x")), -1);
  EXPECT_EQ(RunProgramShort("/bin/true", {"1", "2", "3", "4", "5"}), -1);
}

}  // namespace
}  // namespace sdk
}  // namespace orvex
