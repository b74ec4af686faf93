#include "orvex/policy/indexability.h"

#include <unistd.h>

#include <filesystem>
#include <string>
#include <vector>

#include "platform/share_test_root.h"
#include "support/log_capture.h"

namespace orvex {
namespace fileindex {
namespace {

using orvex::testing::LogCapture;
using orvex::testing::Options;

class CanPathBeIndexedTest : public orvex::testing::ShareTestRoot {
 protected:
  void SetUp() override {
    const std::string photo = AddShare("photo");
    // Every rejected name exists, so only the name can reject it.
    MakeDirs(photo, {"2024/@tmp", "2024/@eaDir", "2024/#snapshot", "2024/x/@tmp", "@tmp", "@eaDir",
                     "#snapshot", "#recycle", "my dir/写真", "elsewhere"});
    dir_.Write("volume1/photo/file.txt", "text");
    std::filesystem::create_directory_symlink(photo + "/elsewhere", photo + "/linkdir");
    std::filesystem::create_symlink(photo + "/file.txt", photo + "/linkfile");
    for (const char* name : {"surveillance", "NetBackup", "Surveillance"}) AddShare(name);
    AddShare("ro", Options(R"({"readonly": true})"));
    AddShare("locked", Options(R"({"encryption": true, "encrypted": true})"));
    AddShare("mounted", Options(R"({"encryption": true})"));
    AddShareAt("gone", dir_.Join("volume1/gone"));
  }
};

TEST_F(CanPathBeIndexedTest, Table) {
  const std::vector<std::pair<std::string, bool>> cases = {
      {"/photo", true},
      {"/photo/2024", true},
      {"/photo/2024/@tmp", true},  // "@" names are reserved only under the root
      {"/photo/2024/x/@tmp", true},
      {"/photo/my dir/写真", true},
      {"/photo/linkdir", true},
      {"/photo/@tmp", false},
      {"/photo/@eaDir", false},
      {"/photo/2024/@eaDir", false},
      {"/photo/#snapshot", false},
      {"/photo/2024/#snapshot", false},
      {"/photo/#recycle", false},
      {"/photo/2024/..", false},
      {"/photo/2024/../2024", false},
      {"/photo/./2024", false},
      {"/photo//2024", false},
      {"/photo/2024/", false},
      {"/photo/missing", false},
      {"/photo/file.txt", false},
      {"/photo/linkfile", false},
      {"", false},
      {"/", false},
      {"photo/2024", false},
      {"/nope", false},
      {"/Photo", false},
      {"/gone", false},
      {"/ro", false},
      {"/locked", false},
      {"/mounted", true},
      {"/surveillance", false},
      {"/NetBackup", false},
      {"/Surveillance", true},
  };
  LogCapture log;
  for (const auto& [path, expected] : cases) {
    EXPECT_EQ(CanPathBeIndexed(path), expected) << "[" << path << "]";
  }
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
