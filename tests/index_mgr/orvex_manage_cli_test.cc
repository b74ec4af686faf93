// The orvex tool's management commands reach the library's operations: the
// same requests arrive at the daemons as from the web API.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "index_mgr/index_mgr_test_root.h"

namespace orvex {
namespace fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

class OrvexManageCliTest : public testing::IndexMgrTestRoot {
 protected:
  void SetUp() override {
    s1_ = AddShareWithDirs("s1");
    std::filesystem::create_directories(dir_.Join("io"));
  }

  testing::ProgramOutcome Orvex(const std::vector<std::string>& args) {
    return testing::RunProgram(std::string(ORVEX_BUILD_DIR) + "/orvex", args, {}, dir_.Join("io"));
  }

  std::string s1_;
};

TEST_F(OrvexManageCliTest, FolderShareVolumeAndServicesCommandsCallTheOperations) {
  struct Step {
    std::vector<std::string> args;
    std::vector<std::string> requests;
  };
  const std::vector<Step> steps = {
      {{"folder", "add", "/s1/a", "Alpha", "--no-video"},
       {"elastic index_create fileindex_s1",
        R"(fileindexd notify_setting_changed {"is_upsert":true,"share_name":"s1"})"}},
      {{"folder", "set", "/s1/a", "Alpha", "--no-video", "--no-audio"},
       {R"(fileindexd notify_setting_changed {"is_upsert":true,"share_name":"s1"})"}},
      {{"folder", "reindex", "/s1/a/sub", "/s1/b"}, {}},
      {{"share", "pause", "s1"},
       {R"(fileindexd worker_delete {"share_name":"s1"})", "elastic index_pause fileindex_s1"}},
      {{"volume", "resume", dir_.Join("volume1")},
       {"elastic index_resume fileindex_s1", R"(fileindexd worker_create {"share_name":"s1"})"}},
      {{"share", "check-recycle", "s1"}, {}},
      {{"services", "prepare"}, {}},
      {{"folder", "delete", "/s1/a"},
       {R"(fileindexd notify_setting_changed {"is_upsert":false,"share_name":"s1"})",
        "elastic index_delete fileindex_s1"}},
  };
  for (const Step& step : steps) {
    timeline_.clear();
    const testing::ProgramOutcome outcome = Orvex(step.args);
    const std::string what = ::testing::PrintToString(step.args);
    EXPECT_EQ(outcome.status, 0) << what << ": " << outcome.err;
    EXPECT_EQ(Requests(), step.requests) << what;
  }
  EXPECT_TRUE(Folders().empty());
  EXPECT_THAT(Services(), ElementsAre("restart samba", "start kalocontentextractd",
                                      "start pkg-Orvex-fileindexd", "start kalocontentextractd",
                                      "start pkg-Orvex-fileindexd", "start kalocontentextractd",
                                      "start pkg-Orvex-fileindexd", "restart samba",
                                      "stop kalocontentextractd", "stop pkg-Orvex-fileindexd"));
}

TEST_F(OrvexManageCliTest, MistakesAreReportedWithTheLibrarysCodes) {
  struct Case {
    std::vector<std::string> args;
    std::string error;
  };
  const Case cases[] = {
      {{"share", "forget", "s1"}, "orvex: error 120: missing PATH"},
      {{"share", "migrate", "s1", "/a"}, "orvex: error 120: missing TO_PATH"},
      {{"volume", "pause"}, "orvex: error 120: missing MOUNT_POINT"},
      {{"folder", "add", "/s1/missing"}, "orvex: error 903: Path cannot index: /s1/missing"},
      {{"folder", "delete", "/s1/a"}, "orvex: error 902: /s1/a"},
      {{"services", "start"}, "orvex: error 120: unknown services subcommand"},
  };
  for (const Case& c : cases) {
    const testing::ProgramOutcome outcome = Orvex(c.args);
    const std::string what = ::testing::PrintToString(c.args);
    EXPECT_EQ(outcome.status, 2) << what;
    EXPECT_THAT(outcome.err, HasSubstr(c.error)) << what;
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
