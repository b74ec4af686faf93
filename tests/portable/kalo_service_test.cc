#include "kalo/kalo_service.h"

#include <gtest/gtest.h>
#include <json/json.h>
#include <sys/stat.h>

#include <cstdlib>
#include <filesystem>
#include <functional>
#include <sstream>
#include <string>
#include <vector>

#include "kalo/kalo_error.h"
#include "kalo/kalo_smb.h"
#include "platform/share_test_root.h"

namespace orvex {
namespace testing {
namespace {

class KaloServiceTest : public ShareTestRoot {
 protected:
  KaloServiceTest() {
    ctl_ = dir_.Write("ctl", "#!/bin/sh\necho \"$#:$1:$2\" >> \"" + dir_.Join("calls") +
                                 "\"\nexit $(cat \"" + dir_.Join("status") +
                                 "\" 2>/dev/null || echo 0)\n");
    ::chmod(ctl_.c_str(), 0755);
    ::setenv(kServiceCtlEnv, ctl_.c_str(), 1);
  }
  ~KaloServiceTest() override { ::unsetenv(kServiceCtlEnv); }

  std::vector<std::string> Calls() const { return SplitLines(ReadFileText(dir_.Join("calls"))); }

  std::string ctl_;
};

TEST_F(KaloServiceTest, WithoutSystemdTheStandInRunsEachActionWithTheName) {
  EXPECT_EQ(KLIBServiceStart("kalocontentextractd", TRUE), 0);
  EXPECT_EQ(KLIBServiceStop("kalocontentextractd", FALSE), 0);
  EXPECT_EQ(KLIBServiceRestart("samba"), 0);
  EXPECT_EQ(KLIBServicectlStart("pkg-Orvex-fileindexd", KLIB_SERVICECTL_UPSTART), 0);
  EXPECT_EQ(KLIBServicectlStop("pkg-Orvex-fileindexd", KLIB_SERVICECTL_UPSTART), 0);
  EXPECT_EQ(Calls(),
            (std::vector<std::string>{"2:start:kalocontentextractd", "2:stop:kalocontentextractd",
                                      "2:restart:samba", "2:start:pkg-Orvex-fileindexd",
                                      "2:stop:pkg-Orvex-fileindexd"}));
}

TEST_F(KaloServiceTest, FailuresReturnNegativeWithTheirError) {
  struct Case {
    const char* what;
    std::function<int()> call;
    int error;
  };
  const Case cases[] = {
      {"null name", [] { return KLIBServiceStart(nullptr, TRUE); }, KLIB_ERR_BAD_PARAMETER},
      {"empty name", [] { return KLIBServiceRestart(""); }, KLIB_ERR_BAD_PARAMETER},
      {"unknown ctl type", [] { return KLIBServicectlStart("x", 7); }, KLIB_ERR_BAD_PARAMETER},
      {"refused",
       [this] {
         dir_.Write("status", "4");
         return KLIBServiceStop("x", TRUE);
       },
       KLIB_ERR_SERVICE_CONTROL},
      {"no control program",
       [this] {
         ::setenv(kServiceCtlEnv, dir_.Join("missing").c_str(), 1);
         return KLIBServicectlStop("x", KLIB_SERVICECTL_UPSTART);
       },
       KLIB_ERR_EXEC},
      {"no service manager",
       [] {
         ::unsetenv(kServiceCtlEnv);
         return KLIBServiceStart("x", TRUE);
       },
       KLIB_ERR_NO_SERVICE_MANAGER},
  };
  for (const Case& c : cases) {
    KLIBCErrClear();
    EXPECT_EQ(c.call(), -1) << c.what;
    EXPECT_EQ(KLIBCErrGet(), c.error) << c.what;
    // Recorded where it was detected: the exec call for a program that
    // cannot run, the service call otherwise.
    EXPECT_STREQ(KLIBCErrorGetFile(), c.error == KLIB_ERR_EXEC ? "kalo_exec.cc" : "kalo_service.cc")
        << c.what;
  }
}

TEST_F(KaloServiceTest, UnderSystemdTheStandInIsNotUsed) {
  std::filesystem::create_directories(dir_.Join("run/systemd/system"));
  // No such unit anywhere: systemctl refuses it, whether or not systemd
  // really runs here.
  EXPECT_EQ(KLIBServiceStart("orvex-test-no-such-unit", FALSE), -1);
  EXPECT_TRUE(KLIBCErrGet() == KLIB_ERR_SERVICE_CONTROL || KLIBCErrGet() == KLIB_ERR_EXEC)
      << KLIBCErrGet();
  EXPECT_TRUE(Calls().empty());
}

class KaloSmbTest : public ShareTestRoot {
 protected:
  std::string SettingsPath() const { return dir_.Join("etc/orvex/smb.json"); }
};

TEST_F(KaloSmbTest, SpotlightIsOffUntilSwitchedAndKeepsOtherSettings) {
  EXPECT_EQ(KALOSMBIsEnableSpotlight(), 0);
  EXPECT_FALSE(std::filesystem::exists(SettingsPath())) << "asking writes nothing";
  EXPECT_EQ(KALOSMBSetSpotlight(1), 0);
  EXPECT_EQ(KALOSMBIsEnableSpotlight(), 1);
  struct stat st;
  ASSERT_EQ(::stat(SettingsPath().c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 0777, 0644u);
  dir_.Write("etc/orvex/smb.json", R"({"workgroup": "HOME", "spotlight": true})");
  EXPECT_EQ(KALOSMBSetSpotlight(0), 0);
  EXPECT_EQ(KALOSMBIsEnableSpotlight(), 0);
  Json::Value stored;
  std::istringstream in(ReadFileText(SettingsPath()));
  std::string errors;
  ASSERT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), in, &stored, &errors)) << errors;
  EXPECT_EQ(stored["workgroup"].asString(), "HOME");
  EXPECT_FALSE(stored["spotlight"].asBool());
}

TEST_F(KaloSmbTest, ABrokenSettingFileIsReportedAndLeftAlone) {
  const char* const texts[] = {"not json", "[1]", R"({"spotlight": "yes"})"};
  for (const char* text : texts) {
    std::filesystem::create_directories(dir_.Join("etc/orvex"));
    dir_.Write("etc/orvex/smb.json", text);
    KLIBCErrClear();
    EXPECT_EQ(KALOSMBIsEnableSpotlight(), -1) << text;
    EXPECT_EQ(KLIBCErrGet(), KLIB_ERR_IO) << text;
  }
  dir_.Write("etc/orvex/smb.json", "[1]");
  EXPECT_EQ(KALOSMBSetSpotlight(1), -1);
  EXPECT_EQ(ReadFileText(SettingsPath()), "[1]");
}

}  // namespace
}  // namespace testing
}  // namespace orvex
