#include "orvex/policy/share_path.h"

#include <string>
#include <vector>

#include "orvex/foundation/error.h"
#include "platform/share_test_root.h"
#include "support/log_capture.h"

namespace orvex {
namespace fileindex {
namespace {

using orvex::testing::LogCapture;

// The Error code a call throws; 0 when it returns.
template <typename Call>
int CodeOf(Call call) {
  try {
    call();
  } catch (const Error& e) {
    return e.code();
  }
  return 0;
}

TEST(GetShareNameByPathTest, GoodAndBadPaths) {
  const std::vector<std::pair<std::string, std::string>> good = {
      {"/photo/2024/a.jpg", "photo"},
      {"/photo", "photo"},
      {"/photo/", "photo"},
      {"/my share/a b", "my share"},
      {"/Fotos é/x", "Fotos é"},
      {"/写真/a", "写真"},
      {"/a.b/c", "a.b"},
  };
  for (const auto& [path, share] : good) EXPECT_EQ(GetShareNameByPath(path), share) << path;
  LogCapture log;
  for (const std::string path : {"", "photo/x", "/", "//photo/x", "relative"}) {
    EXPECT_EQ(CodeOf([&] { GetShareNameByPath(path); }), kErrorBadArgument) << "[" << path << "]";
  }
}

TEST(IsRecyclePathTest, AnyComponentNamedRecycle) {
  const std::vector<std::pair<std::string, bool>> cases = {
      {"/s/#recycle", true},
      {"/volume1/s/#recycle/a/b", true},
      {"#recycle", true},
      {"/s/#recycle/", true},
      {"/s/#recycled", false},
      {"/s/x#recycle", false},
      {"/s/@eaDir/a", false},
      {"", false},
      {"/", false},
  };
  for (const auto& [path, expected] : cases) EXPECT_EQ(IsRecyclePath(path), expected) << path;
}

class SharePathTest : public orvex::testing::ShareTestRoot {};

TEST_F(SharePathTest, GetFullPathMapsThroughTheRegistry) {
  const std::string photo = AddShare("photo");
  const std::string photo2 = AddShare("photo2", Json::objectValue, "volume2/photo2");
  const std::string blank = AddShare("my share");
  const std::string cjk = AddShare("写真");
  const std::vector<std::pair<std::string, std::string>> good = {
      {"/photo/x", photo + "/x"},        {"/photo", photo},
      {"/photo2/y/z", photo2 + "/y/z"},  {"/my share/a b", blank + "/a b"},
      {"/写真/夏.jpg", cjk + "/夏.jpg"},
  };
  for (const auto& [path, full] : good) EXPECT_EQ(GetFullPath(path), full) << path;

  LogCapture log;
  for (const std::string path : {"/nope/x", "/Photo/x", "/phot/x"}) {
    try {
      GetFullPath(path);
      ADD_FAILURE() << path << " did not throw";
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorNoShare) << path;
      EXPECT_EQ(e.reason(), GetShareNameByPath(path)) << path;
    }
  }
  EXPECT_EQ(CodeOf([] { GetFullPath("photo/x"); }), kErrorBadArgument);
}

TEST_F(SharePathTest, FullPathFindsTheLongestWholeComponentRoot) {
  const std::string a = AddShare("a", Json::objectValue, "srv/a");
  const std::string ab = AddShare("a b", Json::objectValue, "srv/ab");
  const std::string inner = AddShare("inner", Json::objectValue, "srv/a/inner");
  const std::vector<std::pair<std::string, std::pair<std::string, std::string>>> good = {
      {a + "/x", {"a", a}},
      {a, {"a", a}},
      {a + "/", {"a", a}},
      {ab + "/x", {"a b", ab}},
      {inner + "/y", {"inner", inner}},
      {a + "/innerx", {"a", a}},
  };
  for (const auto& [path, expected] : good) {
    std::string name, root;
    GetShareNamePathByFullPath(path, name, root);
    EXPECT_EQ(name, expected.first) << path;
    EXPECT_EQ(root, expected.second) << path;
  }

  LogCapture log;
  for (const std::string& path : {dir_.Join("srv"), dir_.Join("srv/abc/x"), std::string(),
                                  std::string("srv/a/x"), std::string("/")}) {
    std::string name = "untouched", root;
    try {
      GetShareNamePathByFullPath(path, name, root);
      ADD_FAILURE() << path << " did not throw";
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorBadArgument) << path;
      EXPECT_EQ(e.reason(), "Cannot find share: " + path);
      EXPECT_EQ(name, "untouched") << path;
    }
  }
}

TEST_F(SharePathTest, MalformedRegistryIsASystemError) {
  WriteRegistryText("[{\"name\": 1}]");
  LogCapture log;
  std::string name, root;
  EXPECT_EQ(CodeOf([&] { GetShareNamePathByFullPath("/volume1/a/x", name, root); }), kErrorSystem);
}

TEST_F(SharePathTest, ReplacePathShareOnShareRelativePaths) {
  struct Case {
    const char* path;
    const char* share_to;
    const char* share_from;
    const char* expected;  // nullptr: Error 120
  };
  const Case cases[] = {
      {"/a/x", "b", "a", "/b/x"},
      {"/a", "b", "a", "/b"},
      {"/a/x/a/y", "b", "a", "/b/x/a/y"},
      {"/my share/x", "写真", "my share", "/写真/x"},
      {"/ab/x", "b", "a", nullptr},  // "a" is only a prefix of the share
      {"/b/x", "c", "a", nullptr},
      {"a/x", "b", "a", nullptr},
      {"", "b", "a", nullptr},
      {"/a/x", "", "a", nullptr},
      {"/a/x", "b/c", "a", nullptr},
  };
  LogCapture log;
  for (const Case& c : cases) {
    const std::string label = std::string(c.path) + " " + c.share_from + "->" + c.share_to;
    if (c.expected == nullptr) {
      EXPECT_EQ(CodeOf([&] { ReplacePathShare(c.path, c.share_to, c.share_from); }),
                kErrorBadArgument)
          << label;
    } else {
      EXPECT_EQ(ReplacePathShare(c.path, c.share_to, c.share_from), c.expected) << label;
    }
  }
}

TEST_F(SharePathTest, ReplacePathShareOnFullPathsSwapsRegisteredRoots) {
  const std::string a = AddShare("a", Json::objectValue, "volume1/a");
  const std::string b = AddShare("b", Json::objectValue, "volume2/data/b");
  EXPECT_EQ(ReplacePathShare(a + "/x/y", "b", "a"), b + "/x/y");
  EXPECT_EQ(ReplacePathShare(a, "b", "a"), b);
  LogCapture log;
  EXPECT_EQ(CodeOf([&] { ReplacePathShare(a + "/x", "ghost", "a"); }), kErrorNoShare);
  // A full path in another share is not in share_from.
  EXPECT_EQ(CodeOf([&] { ReplacePathShare(b + "/x", "a", "c"); }), kErrorBadArgument);
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

}  // namespace
}  // namespace fileindex
}  // namespace orvex
