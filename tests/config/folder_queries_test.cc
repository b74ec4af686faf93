// FolderMgr's queries: the governing folder at depth and at the "/"
// boundary, the metadata decision, the indexed tests and the paged listing.
#include <gtest/gtest.h>

#include "config/folder_test_root.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/error.h"
#include "support/log_capture.h"

namespace orvex {
namespace testing {
namespace {

class FolderQueriesTest : public FolderTestRoot {
 protected:
  void SetUp() override {
    AddShareAt("a", "/volume1/a");
    AddShareAt("m", "/volume2/m");
  }
  std::string Governing(const FolderMgr& mgr, const std::string& full_path) {
    const FolderPtr folder = mgr.GetMostSuitableCfg(full_path);
    return folder ? folder->GetName() : "(none)";
  }
};

TEST_F(FolderQueriesTest, DeepestContainingFolderGovernsOnWholeComponents) {
  // The subfolder is listed first and a duplicate of the parent follows:
  // depth wins over list order, list order wins between equals.
  WriteFolders({FolderJson("/a/b", "d", "sub"), FolderJson("/a", "d", "top"),
                FolderJson("/a", "dp", "top-duplicate")});
  const FolderMgr mgr;
  EXPECT_EQ("sub", Governing(mgr, "/volume1/a/b/c.txt"));
  EXPECT_EQ("sub", Governing(mgr, "/volume1/a/b"));
  EXPECT_EQ("top", Governing(mgr, "/volume1/a/bc.txt"));
  EXPECT_EQ("top", Governing(mgr, "/volume1/a"));
  EXPECT_EQ("(none)", Governing(mgr, "/volume1/ab"));
  EXPECT_EQ("(none)", Governing(mgr, "/volume1"));
  EXPECT_EQ("(none)", Governing(mgr, "/volume2/m/x"));
}

TEST_F(FolderQueriesTest, OwnConfigIsAnExactMatchWhileIndexedIsContainment) {
  WriteFolders({FolderJson("/a", "d"), FolderJson("/a/b", "")});
  const FolderMgr mgr;
  EXPECT_TRUE(mgr.IsFullPathHasOwnCfg("/volume1/a"));
  EXPECT_FALSE(mgr.IsFullPathHasOwnCfg("/volume1/a/"));
  EXPECT_TRUE(mgr.IsFullPathIndexed("/volume1/a/"));
  EXPECT_TRUE(mgr.IsFullPathHasOwnCfg("/volume1/a/b"));
  EXPECT_FALSE(mgr.IsFullPathHasOwnCfg("/volume1/a/c"));
  EXPECT_TRUE(mgr.IsFullPathIndexed("/volume1/a/c/d.txt"));  // any flags count
  EXPECT_FALSE(mgr.IsFullPathIndexed("/volume1/ab"));
  EXPECT_TRUE(mgr.IsShareIndexed("a"));
  EXPECT_FALSE(mgr.IsShareIndexed("A"));
  EXPECT_FALSE(mgr.IsShareIndexed("m"));
}

TEST_F(FolderQueriesTest, NeedMetaFollowsTheGoverningFolderFlagForTheFileClass) {
  WriteFolders({FolderJson("/m/d", "d"), FolderJson("/m/a", "a"), FolderJson("/m/v", "v"),
                FolderJson("/m/p", "p"), FolderJson("/m/all", "davp", "", /*paused=*/true)});
  const FolderMgr mgr;
  const char* files[] = {"x.PDF", "x.mp3", "x.mkv", "x.jpg", "x.zip", "README"};
  const struct {
    const char* folder;
    const char* expected;  // one letter per file above: y or n
  } cases[] = {
      {"d", "ynnnnn"}, {"a", "nynnnn"},   {"v", "nnynnn"},
      {"p", "nnnynn"}, {"all", "yyyynn"},  // paused does not matter; other classes never do
  };
  for (const auto& c : cases) {
    for (int i = 0; i < 6; ++i) {
      const std::string path = std::string("/volume2/m/") + c.folder + "/" + files[i];
      EXPECT_EQ(c.expected[i] == 'y', mgr.IsFullPathNeedMeta(path)) << path;
    }
  }
  EXPECT_FALSE(mgr.IsFullPathNeedMeta("/volume2/m/x.pdf"));  // no governing folder
}

TEST_F(FolderQueriesTest, GetFindsExactPathsAndFailsWith902) {
  WriteFolders({FolderJson("/a/x", "d", "first"), FolderJson("/a/x", "d", "second")});
  const FolderMgr mgr;
  FolderPtr found;
  mgr.Get(found, "/a/x");
  EXPECT_EQ("first", found->GetName());
  EXPECT_TRUE(mgr.HasFolder("/a/x"));
  EXPECT_FALSE(mgr.HasFolder("/a/x/"));
  LogCapture log;
  try {
    mgr.Get(found, "/a/X");
    FAIL() << "found /a/X";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorNoFolder, e.code());
    EXPECT_EQ("/a/X", e.reason());
  }
  EXPECT_EQ(1u, log.Matching("Failed [it == folders_.end()], reason: /a/X").size());
  EXPECT_EQ((std::set<std::string>{"a"}), mgr.GetIndexedShares());
}

class FolderListTest : public FolderTestRoot {
 protected:
  std::vector<std::string> Page(const FolderMgr& mgr, unsigned offset, unsigned limit,
                                const std::string& sort_by, const std::string& direction,
                                unsigned expected_total = 0) {
    std::vector<FolderPtr> out{MakeFolder("/stale", "")};
    unsigned total = 12345;
    mgr.List(out, total, offset, limit, sort_by, direction);
    EXPECT_EQ(expected_total ? expected_total : mgr.GetFolders().size(), total);
    return Paths(out);
  }
};

TEST_F(FolderListTest, FlagSortsPutFlagOffFirstAndDescReverses) {
  WriteFolders({FolderJson("/s/1", "p"), FolderJson("/s/2", "d"), FolderJson("/s/3", "dp"),
                FolderJson("/s/4", "")});
  const FolderMgr mgr;
  const std::vector<std::string> desc = Page(mgr, 0, 10, "photo", "desc");
  ASSERT_EQ(4u, desc.size());
  EXPECT_EQ((std::set<std::string>{"/s/1", "/s/3"}),
            std::set<std::string>(desc.begin(), desc.begin() + 2));
  const std::vector<std::string> asc = Page(mgr, 0, 10, "photo", "DESC");  // only "desc" reverses
  EXPECT_EQ((std::set<std::string>{"/s/2", "/s/4"}),
            std::set<std::string>(asc.begin(), asc.begin() + 2));
  const std::vector<std::string> doc = Page(mgr, 0, 10, "document", "asc");
  EXPECT_EQ((std::set<std::string>{"/s/2", "/s/3"}),
            std::set<std::string>(doc.begin() + 2, doc.end()));
}

TEST_F(FolderListTest, PathAndNameSortsFoldCaseIncludingNonAscii) {
  WriteFolders({FolderJson("/s/Zulu", "", "b"), FolderJson("/s/éa", "", "C"),
                FolderJson("/s/alpha", "", "é"), FolderJson("/s/Éb", "", "A"),
                FolderJson("/s/Bravo", "", "d")});
  const FolderMgr mgr;
  // Bytewise "/s/Éb" would come before "/s/éa"; folded, "éa" < "éb", both after "zulu".
  EXPECT_EQ((std::vector<std::string>{"/s/alpha", "/s/Bravo", "/s/Zulu", "/s/éa", "/s/Éb"}),
            Page(mgr, 0, 10, "path", ""));
  EXPECT_EQ((std::vector<std::string>{"/s/Éb", "/s/éa", "/s/Zulu", "/s/Bravo", "/s/alpha"}),
            Page(mgr, 0, 10, "path", "desc"));
  const std::vector<std::string> by_name{"/s/Éb", "/s/Zulu", "/s/éa", "/s/Bravo", "/s/alpha"};
  EXPECT_EQ(by_name, Page(mgr, 0, 10, "name", "asc"));
  EXPECT_EQ(by_name, Page(mgr, 0, 10, "size", "asc"));  // any other word sorts by name
}

TEST_F(FolderListTest, PagingDropsOffsetThenCutsToLimitWithTheFullTotal) {
  WriteFolders({FolderJson("/s/a", ""), FolderJson("/s/b", ""), FolderJson("/s/c", ""),
                FolderJson("/s/d", "")});
  const FolderMgr mgr;
  EXPECT_EQ((std::vector<std::string>{"/s/b", "/s/c"}), Page(mgr, 1, 2, "path", ""));
  EXPECT_EQ((std::vector<std::string>{"/s/d"}), Page(mgr, 3, 2, "path", ""));
  EXPECT_EQ((std::vector<std::string>{"/s/c", "/s/d"}), Page(mgr, 2, 2, "path", ""));
  EXPECT_EQ((std::vector<std::string>{"/s/c", "/s/b", "/s/a"}), Page(mgr, 1, 99, "path", "desc"));
  EXPECT_TRUE(Page(mgr, 4, 10, "path", "").empty());  // offset == total
  EXPECT_TRUE(Page(mgr, 9, 10, "path", "").empty());  // offset > total
  EXPECT_TRUE(Page(mgr, 0xFFFFFFFFu, 10, "path", "").empty());
  EXPECT_TRUE(Page(mgr, 0, 0, "path", "").empty());  // limit 0 is an empty page
  EXPECT_EQ(4u, Page(mgr, 0, 0xFFFFFFFFu, "path", "").size());
}

}  // namespace
}  // namespace testing
}  // namespace orvex
