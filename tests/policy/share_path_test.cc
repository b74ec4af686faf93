// The file classes, the share path helpers and CanPathBeIndexed against a
// real share registry and real directories.
#include "orvex/policy/share_path.h"

#include <filesystem>
#include <string>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/policy/file_type.h"
#include "orvex/policy/indexability.h"
#include "platform/share_test_root.h"
#include "support/error_code.h"
#include "support/log_capture.h"

namespace orvex {
namespace fileindex {
namespace {

using testing::CodeOf;
using testing::LogCapture;
using testing::Options;

TEST(FileTypeTest, OnlyTheLastDotOfTheNameCountsInAnyCase) {
  const std::pair<const char*, FileType> cases[] = {
      {"/a/IMG_0001.JpG", kFileTypeImage},   {"/a/report.final.PDF", kFileTypeDocument},
      {"/a/x.M2TS", kFileTypeVideo},         {"/a/.opus", kFileTypeAudio},
      {"/a/archive.tar.gz", kFileTypeOther}, {"/a.pdf/readme", kFileTypeOther},
      {"/a/name.", kFileTypeOther},          {"/a/x.jpgx", kFileTypeOther}};
  for (const auto& [path, type] : cases) EXPECT_EQ(GetFileTypeByFullPath(path), type) << path;
  EXPECT_EQ(GetFileTypeByExtension("cr3"), kFileTypeImage);
  EXPECT_EQ(GetFileTypeByExtension("JPG"), kFileTypeOther);  // the lookup does not fold case
}

TEST(SharePathTextTest, ShareNameAndRecycleBinComponents) {
  EXPECT_EQ(GetShareNameByPath("/my share/a b"), "my share");
  EXPECT_EQ(GetShareNameByPath("/photo/"), "photo");
  LogCapture log;
  for (const std::string path : {"", "photo/x", "/", "//photo/x"}) {
    EXPECT_EQ(CodeOf([&] { GetShareNameByPath(path); }), kErrorBadArgument) << "[" << path << "]";
  }
  EXPECT_TRUE(IsRecyclePath("/volume1/s/#recycle/a/b"));
  EXPECT_TRUE(IsRecyclePath("#recycle"));
  EXPECT_FALSE(IsRecyclePath("/s/#recycled"));
  EXPECT_FALSE(IsRecyclePath("/s/x#recycle"));
}

class SharePathTest : public testing::ShareTestRoot {};

TEST_F(SharePathTest, FullPathsMapThroughTheRegistryToTheLongestWholeComponentRoot) {
  const std::string a = AddShare("a", Json::objectValue, "srv/a");
  AddShare("a b", Json::objectValue, "srv/ab");
  const std::string inner = AddShare("inner", Json::objectValue, "srv/a/inner");
  EXPECT_EQ(GetFullPath("/a/x"), a + "/x");
  EXPECT_EQ(GetFullPath("/a"), a);
  const auto found = [](const std::string& path) {
    std::string name, root;
    GetShareNamePathByFullPath(path, name, root);
    return name + " at " + root;
  };
  EXPECT_EQ("a at " + a, found(a + "/"));
  EXPECT_EQ("a at " + a, found(a + "/innerx"));
  EXPECT_EQ("inner at " + inner, found(inner + "/y"));
  LogCapture log;
  std::string reason;
  EXPECT_EQ(CodeOf([] { GetFullPath("/A/x"); }, &reason), kErrorNoShare);
  EXPECT_EQ(reason, "A");
  for (const std::string& path : {dir_.Join("srv"), dir_.Join("srv/abc/x")}) {
    std::string name = "untouched", root;
    EXPECT_EQ(CodeOf([&] { GetShareNamePathByFullPath(path, name, root); }, &reason),
              kErrorBadArgument);
    EXPECT_EQ(reason, "Cannot find share: " + path);
    EXPECT_EQ(name, "untouched") << path;
  }
  WriteRegistryText("[{\"name\": 1}]");
  std::string name, root;
  EXPECT_EQ(CodeOf([&] { GetShareNamePathByFullPath(a + "/x", name, root); }), kErrorSystem);
}

TEST_F(SharePathTest, ReplacePathShareOnShareRelativeAndFullPaths) {
  const std::string a = AddShare("a", Json::objectValue, "volume1/a");
  const std::string b = AddShare("b", Json::objectValue, "volume2/data/b");
  // The registry knows "new" only; "old" was renamed in place.
  const std::string renamed = AddShare("new", Json::objectValue, "volume1/new");
  const struct {
    std::string path;
    const char* share_to;
    const char* share_from;
    std::string expected;  // "": Error 120
  } cases[] = {{"/a/x/a/y", "b", "a", "/b/x/a/y"},
               {a + "/x/y", "b", "a", b + "/x/y"},
               {dir_.Join("volume1/old/x"), "new", "old", renamed + "/x"},
               {"/ab/x", "b", "a", ""},  // "a" is only a prefix of the share
               {b + "/x", "a", "c", ""},
               {dir_.Join("volume1/oldx/y"), "new", "old", ""},
               {"/a/x", "b/c", "a", ""}};
  LogCapture log;
  for (const auto& c : cases) {
    const std::string label = c.path + " " + c.share_from + "->" + c.share_to;
    if (c.expected.empty()) {
      EXPECT_EQ(CodeOf([&] { ReplacePathShare(c.path, c.share_to, c.share_from); }),
                kErrorBadArgument)
          << label;
    } else {
      EXPECT_EQ(ReplacePathShare(c.path, c.share_to, c.share_from), c.expected) << label;
    }
  }
  EXPECT_EQ(CodeOf([&] { ReplacePathShare(a + "/x", "ghost", "a"); }), kErrorNoShare);
}

TEST_F(SharePathTest, CanPathBeIndexed) {
  const std::string photo = AddShare("photo");
  // Every rejected name exists, so only the name can reject it.
  MakeDirs(photo, {"2024/@tmp", "2024/@eaDir", "@tmp", "#snapshot", "#recycle", "elsewhere"});
  dir_.Write("volume1/photo/file.txt", "text");
  std::filesystem::create_directory_symlink(photo + "/elsewhere", photo + "/linkdir");
  AddShare("ro", Options(R"({"readonly": true})"));
  AddShareAt("gone", dir_.Join("volume1/gone"));
  LogCapture log;
  // "@" names are reserved only directly under the share root.
  for (const char* path : {"/photo", "/photo/2024/@tmp", "/photo/linkdir"}) {
    EXPECT_TRUE(CanPathBeIndexed(path)) << path;
  }
  for (const char* path :
       {"/photo/@tmp", "/photo/2024/@eaDir", "/photo/#snapshot", "/photo/#recycle",
        "/photo/2024/..", "/photo//2024", "/photo/2024/", "/photo/missing", "/photo/file.txt",
        "photo/2024", "/Photo", "/gone", "/ro"}) {
    EXPECT_FALSE(CanPathBeIndexed(path)) << "[" << path << "]";
  }
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
