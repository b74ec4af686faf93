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
      {false, true, {"restart samba", "start kalocontentextractd", "start pkg-Orvex-fileindexd"}},
      {true, true, {"start kalocontentextractd", "start pkg-Orvex-fileindexd"}},
      {true, false, {"restart samba", "stop kalocontentextractd", "stop pkg-Orvex-fileindexd"}},
      {false, false, {"stop kalocontentextractd", "stop pkg-Orvex-fileindexd"}},
  };
  for (const Case& c : cases) {
    std::filesystem::remove(ServicesLogPath());
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
  EXPECT_THAT(Services(), ElementsAre("restart samba", "start kalocontentextractd",
                                      "start pkg-Orvex-fileindexd"));
  EXPECT_EQ(log_.Matching("index_mgr:").size(), 3u);
  EXPECT_EQ(log_.Matching("KLIBServiceRestart failed: err=[0x3100 kalo_service.cc:").size(), 1u);
  EXPECT_EQ(log_.Matching("Failed [0 > KLIBServiceStart(\"kalocontentextractd\", TRUE)]").size(),
            1u);
  EXPECT_EQ(log_.Matching("Failed [0 > KLIBServicectlStart(\"pkg-Orvex-fileindexd\", "
                          "KLIB_SERVICECTL_UPSTART)]")
                .size(),
            1u);
  SetServicesEnabled(false);
  EXPECT_EQ(log_.Matching("Failed [0 > KLIBServiceStop(\"kalocontentextractd\", FALSE)]").size(),
            1u);
  EXPECT_EQ(log_.Matching("Failed [0 > KLIBServicectlStop(\"pkg-Orvex-fileindexd\", "
                          "KLIB_SERVICECTL_UPSTART)]")
                .size(),
            1u);
}

TEST_F(ServicesTest, AnUnwritableSpotlightSettingLeavesSambaAlone) {
  // A directory where the setting file belongs: it cannot be read or written.
  std::filesystem::create_directories(dir_.Join("etc/orvex/smb.json"));
  SetServicesEnabled(true);
  EXPECT_THAT(Services(), ElementsAre("start kalocontentextractd", "start pkg-Orvex-fileindexd"));
  EXPECT_EQ(log_.Matching("KALOSMBSetSpotlight failed: err=[0x0500 kalo_smb.cc:").size(), 1u);
}

TEST_F(ServicesTest, PrepareServicesFollowsTheFolderList) {
  PrepareServices();
  EXPECT_THAT(Services(), ElementsAre("stop kalocontentextractd", "stop pkg-Orvex-fileindexd"));
  AddShareWithDirs("s1");
  FolderAdd(Array({FolderJson("/s1/a")}), true);
  std::filesystem::remove(ServicesLogPath());
  SetSpotlightFile(false);
  PrepareServices();
  EXPECT_THAT(Services(), ElementsAre("restart samba", "start kalocontentextractd",
                                      "start pkg-Orvex-fileindexd"));
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
