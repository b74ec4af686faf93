#include "index_mgr/services.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "index_mgr/index_mgr_test_root.h"

namespace orvex {
namespace fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class ServicesTest : public testing::IndexMgrTestRoot {
 protected:
  void SetSpotlightFile(bool on) {
    std::filesystem::create_directories(dir_.Join("etc/orvex"));
    dir_.Write("etc/orvex/smb.json", on ? R"({"spotlight": true})" : R"({"spotlight": false})");
  }
  bool SpotlightOn() const {
    Json::Value v;
    EXPECT_TRUE(fromFile(v, dir_.Join("etc/orvex/smb.json")));
    return v["spotlight"].asBool();
  }
};

TEST_F(ServicesTest, SwitchingOnRestartsSambaOnlyWhenSpotlightChanges) {
  struct Case {
    bool spotlight_before;
    bool enable;
    std::vector<std::string> calls;
  };
  const Case cases[] = {
      {false, true, testing::kServicesOn},
      {true, true, {"start kalocontentextractd", "start pkg-Orvex-fileindexd"}},
      {true, false, testing::kServicesOff},
      {false, false, {"stop kalocontentextractd", "stop pkg-Orvex-fileindexd"}},
  };
  for (const Case& c : cases) {
    ForgetServices();
    SetSpotlightFile(c.spotlight_before);
    SetServicesEnabled(c.enable);
    EXPECT_EQ(Services(), c.calls) << "before " << c.spotlight_before << " enable " << c.enable;
    EXPECT_EQ(SpotlightOn(), c.enable);
  }
  EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(ServicesTest, FailuresAreLoggedAndEveryStepStillTried) {
  FailServices(3);
  SetServicesEnabled(true);
  EXPECT_EQ(Services(), testing::kServicesOn);
  EXPECT_EQ(Logged("index_mgr:"), 3u);
  SetServicesEnabled(false);
  // Samba is restarted (and fails) at each switch: spotlight changes both times.
  const std::pair<const char*, size_t> logged[] = {
      {"KLIBServiceRestart failed: err=[0x3100 kalo_service.cc:", 2},
      {"Failed [0 > KLIBServiceStart(\"kalocontentextractd\", TRUE)]", 1},
      {"Failed [0 > KLIBServicectlStart(\"pkg-Orvex-fileindexd\", KLIB_SERVICECTL_UPSTART)]", 1},
      {"Failed [0 > KLIBServiceStop(\"kalocontentextractd\", FALSE)]", 1},
      {"Failed [0 > KLIBServicectlStop(\"pkg-Orvex-fileindexd\", KLIB_SERVICECTL_UPSTART)]", 1}};
  for (const auto& [text, count] : logged) EXPECT_EQ(Logged(text), count) << text;
}

TEST_F(ServicesTest, AnUnwritableSpotlightSettingLeavesSambaAlone) {
  // A directory where the setting file belongs: it cannot be read or written.
  std::filesystem::create_directories(dir_.Join("etc/orvex/smb.json"));
  SetServicesEnabled(true);
  EXPECT_THAT(Services(), ElementsAre("start kalocontentextractd", "start pkg-Orvex-fileindexd"));
  EXPECT_EQ(Logged("KALOSMBSetSpotlight failed: err=[0x0500 kalo_smb.cc:"), 1u);
}

TEST_F(ServicesTest, PrepareServicesFollowsTheFolderList) {
  PrepareServices();
  EXPECT_THAT(Services(), ElementsAre("stop kalocontentextractd", "stop pkg-Orvex-fileindexd"));
  AddShareWithDirs("s1");
  FolderAdd(Array({FolderJson("/s1/a")}), true);
  ForgetServices();
  SetSpotlightFile(false);
  PrepareServices();
  EXPECT_EQ(Services(), testing::kServicesOn);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
