// The share path helpers and CanPathBeIndexed against a real share registry
// and real directories.
#include "orvex/policy/share_path.h"

#include <filesystem>
#include <string>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/policy/indexability.h"
#include "platform/share_test_root.h"
#include "support/error_code.h"
#include "support/log_capture.h"

namespace orvex {
namespace fileindex {
namespace {

using testing::LogCapture;
using testing::Options;

using testing::CodeOf;

TEST(SharePathTextTest, ShareNameAndRecycleBinComponents) {
  const std::vector<std::pair<std::string, std::string>> names = {
      {"/photo/2024/a.jpg", "photo"}, {"/photo", "photo"}, {"/photo/", "photo"},
      {"/my share/a b", "my share"},  {"/写真/a", "写真"}, {"/a.b/c", "a.b"}};
  for (const auto& [path, share] : names) EXPECT_EQ(GetShareNameByPath(path), share) << path;
  LogCapture log;
  for (const std::string path : {"", "photo/x", "/", "//photo/x", "relative"}) {
    EXPECT_EQ(CodeOf([&] { GetShareNameByPath(path); }), kErrorBadArgument) << "[" << path << "]";
  }
  for (const char* path : {"/s/#recycle", "/volume1/s/#recycle/a/b", "#recycle", "/s/#recycle/"}) {
    EXPECT_TRUE(IsRecyclePath(path)) << path;
  }
  for (const char* path : {"/s/#recycled", "/s/x#recycle", "/s/@eaDir/a", "", "/"}) {
    EXPECT_FALSE(IsRecyclePath(path)) << path;
  }
}

class SharePathTest : public testing::ShareTestRoot {};

TEST_F(SharePathTest, GetFullPathMapsThroughTheRegistry) {
  const std::string photo = AddShare("photo");
  const std::string photo2 = AddShare("photo2", Json::objectValue, "volume2/photo2");
  const std::string cjk = AddShare("写真");
  EXPECT_EQ(GetFullPath("/photo/x"), photo + "/x");
  EXPECT_EQ(GetFullPath("/photo"), photo);
  EXPECT_EQ(GetFullPath("/photo2/y/z"), photo2 + "/y/z");
  EXPECT_EQ(GetFullPath("/写真/夏.jpg"), cjk + "/夏.jpg");
  LogCapture log;
  for (const std::string path : {"/nope/x", "/Photo/x", "/phot/x"}) {
    std::string reason;
    EXPECT_EQ(CodeOf([&] { GetFullPath(path); }, &reason), kErrorNoShare) << path;
    EXPECT_EQ(reason, GetShareNameByPath(path));
  }
  EXPECT_EQ(CodeOf([] { GetFullPath("photo/x"); }), kErrorBadArgument);
}

TEST_F(SharePathTest, FullPathFindsTheLongestWholeComponentRoot) {
  const std::string a = AddShare("a", Json::objectValue, "srv/a");
  const std::string ab = AddShare("a b", Json::objectValue, "srv/ab");
  const std::string inner = AddShare("inner", Json::objectValue, "srv/a/inner");
  const auto found = [](const std::string& path) {
    std::string name, root;
    GetShareNamePathByFullPath(path, name, root);
    return name + " at " + root;
  };
  EXPECT_EQ("a at " + a, found(a + "/x"));
  EXPECT_EQ("a at " + a, found(a));
  EXPECT_EQ("a at " + a, found(a + "/"));
  EXPECT_EQ("a at " + a, found(a + "/innerx"));
  EXPECT_EQ("a b at " + ab, found(ab + "/x"));
  EXPECT_EQ("inner at " + inner, found(inner + "/y"));
  LogCapture log;
  for (const std::string& path : {dir_.Join("srv"), dir_.Join("srv/abc/x"), std::string(),
                                  std::string("srv/a/x"), std::string("/")}) {
    std::string name = "untouched", root, reason;
    EXPECT_EQ(CodeOf([&] { GetShareNamePathByFullPath(path, name, root); }, &reason),
              kErrorBadArgument)
        << path;
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
  const struct {
    std::string path;
    const char* share_to;
    const char* share_from;
    std::string expected;  // "": Error 120
  } cases[] = {{"/a/x", "b", "a", "/b/x"},
               {"/a", "b", "a", "/b"},
               {"/a/x/a/y", "b", "a", "/b/x/a/y"},
               {"/my share/x", "写真", "my share", "/写真/x"},
               {a + "/x/y", "b", "a", b + "/x/y"},
               {a, "b", "a", b},
               {"/ab/x", "b", "a", ""},  // "a" is only a prefix of the share
               {"/b/x", "c", "a", ""},
               {b + "/x", "a", "c", ""},  // a full path in another share is not in share_from
               {"a/x", "b", "a", ""},
               {"", "b", "a", ""},
               {"/a/x", "", "a", ""},
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

TEST_F(SharePathTest, ReplacePathShareAfterARenameInPlace) {
  // The registry already knows the share by its new name only.
  const std::string renamed = AddShare("new", Json::objectValue, "volume1/new");
  const std::string old_root = dir_.Join("volume1/old");
  EXPECT_EQ(ReplacePathShare(old_root + "/x", "new", "old"), renamed + "/x");
  EXPECT_EQ(ReplacePathShare(old_root, "new", "old"), renamed);
  EXPECT_EQ(ReplacePathShare("/old/x", "new", "old"), "/new/x");
  LogCapture log;
  EXPECT_EQ(CodeOf([&] { ReplacePathShare(old_root + "x/y", "new", "old"); }), kErrorBadArgument);
  EXPECT_EQ(CodeOf([&] { ReplacePathShare(dir_.Join("volume2/old/y"), "new", "old"); }),
            kErrorBadArgument);
}

TEST_F(SharePathTest, CanPathBeIndexed) {
  const std::string photo = AddShare("photo");
  // Every rejected name exists, so only the name can reject it.
  MakeDirs(photo, {"2024/@tmp", "2024/@eaDir", "2024/#snapshot", "@tmp", "@eaDir", "#snapshot",
                   "#recycle", "my dir/写真", "elsewhere"});
  dir_.Write("volume1/photo/file.txt", "text");
  std::filesystem::create_directory_symlink(photo + "/elsewhere", photo + "/linkdir");
  std::filesystem::create_symlink(photo + "/file.txt", photo + "/linkfile");
  AddShare("ro", Options(R"({"readonly": true})"));  // the share's own rules: one is enough
  AddShareAt("gone", dir_.Join("volume1/gone"));
  LogCapture log;
  // "@" names are reserved only directly under the share root.
  for (const char* path :
       {"/photo", "/photo/2024", "/photo/2024/@tmp", "/photo/my dir/写真", "/photo/linkdir"}) {
    EXPECT_TRUE(CanPathBeIndexed(path)) << path;
  }
  for (const char* path : {"/photo/@tmp",
                           "/photo/@eaDir",
                           "/photo/2024/@eaDir",
                           "/photo/#snapshot",
                           "/photo/2024/#snapshot",
                           "/photo/#recycle",
                           "/photo/2024/..",
                           "/photo/2024/../2024",
                           "/photo/./2024",
                           "/photo//2024",
                           "/photo/2024/",
                           "/photo/missing",
                           "/photo/file.txt",
                           "/photo/linkfile",
                           "",
                           "/",
                           "photo/2024",
                           "/nope",
                           "/Photo",
                           "/gone",
                           "/ro"}) {
    EXPECT_FALSE(CanPathBeIndexed(path)) << "[" << path << "]";
  }
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
