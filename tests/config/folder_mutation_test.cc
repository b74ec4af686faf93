// FolderMgr's changes and their reports of which file types change state in
// the folder's subtree.
#include <gtest/gtest.h>

#include "config/folder_test_root.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/error.h"

namespace orvex {
namespace testing {
namespace {

class FolderMutationTest : public FolderTestRoot {
 protected:
  void SetUp() override {
    AddShareAt("a", "/volume1/a");
    AddShareAt("b", "/volume1/b");
  }
  std::string Upsert(FolderMgr& mgr, const std::string& path, const std::string& flags) {
    FolderPtr change;
    mgr.Upsert(change, MakeFolder(path, flags, "new " + path));
    EXPECT_EQ(path, change->GetPath());
    EXPECT_EQ("new " + path, change->GetName());
    EXPECT_FALSE(change->IsPaused());
    return Flags(change);
  }
  std::string Delete(FolderMgr& mgr, const std::string& path) {
    FolderPtr change;
    mgr.Delete(change, path);
    return Flags(change);
  }
};

TEST_F(FolderMutationTest, UpsertReportsAgainstTheFolderThatGovernedBefore) {
  FolderMgr mgr;
  EXPECT_EQ("davp", Upsert(mgr, "/a", "dp"));    // new top-level folder: everything changes
  EXPECT_EQ("----", Upsert(mgr, "/a/x", "dp"));  // subfolder like its parent: nothing to do
  EXPECT_EQ("-a-p", Upsert(mgr, "/a/y", "da"));  // subfolder differing in two types
  EXPECT_EQ("---p", Upsert(mgr, "/a", "d"));     // turns only photo off
  EXPECT_EQ("----", Upsert(mgr, "/a", "d"));     // the same again: no change
  EXPECT_EQ((std::vector<std::string>{"/a/x", "/a/y", "/a"}), Paths(mgr.GetFolders()));
}

TEST_F(FolderMutationTest, UpsertOfAnExistingPathReplacesEveryCopyAndMovesItToTheEnd) {
  WriteFolders({FolderJson("/a/1", "d"), FolderJson("/a/2", "d", "old"), FolderJson("/a/3", "d"),
                FolderJson("/a/2", "v", "older duplicate")});
  FolderMgr mgr;
  EXPECT_EQ("---p", Upsert(mgr, "/a/2", "dp"));  // against the first copy
  EXPECT_EQ((std::vector<std::string>{"/a/1", "/a/3", "/a/2"}), Paths(mgr.GetFolders()));
  EXPECT_EQ("new /a/2", mgr.GetFolders().back()->GetName());
}

TEST_F(FolderMutationTest, DeleteReportsAgainstTheFolderThatGovernsFromNowOn) {
  WriteFolders({FolderJson("/a", "dp"), FolderJson("/a/same", "dp"), FolderJson("/a/diff", "av"),
                FolderJson("/b", "d")});
  FolderMgr mgr;
  EXPECT_EQ("----", Delete(mgr, "/a/same"));  // the parent indexes the same types
  EXPECT_EQ("/a", mgr.GetMostSuitableCfg("/volume1/a/same/x.jpg")->GetPath());
  EXPECT_EQ("davp", Delete(mgr, "/a/diff"));       // differs from the parent in all four
  EXPECT_EQ("----", Delete(mgr, "/a/inner/dir"));  // not a folder: nothing removed
  EXPECT_EQ((std::vector<std::string>{"/a", "/b"}), Paths(mgr.GetFolders()));
  EXPECT_EQ("davp", Delete(mgr, "/a"));  // top level: nothing governs any more
  EXPECT_EQ((std::vector<std::string>{"/b"}), Paths(mgr.GetFolders()));
}

TEST_F(FolderMutationTest, DeleteOfAPathNoFolderGovernsFailsWith902) {
  WriteFolders({FolderJson("/a/x", "d")});
  FolderMgr mgr;
  FolderPtr change;
  try {
    mgr.Delete(change, "/a/xy");
    FAIL() << "deleted /a/xy";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorNoFolder, e.code());
    EXPECT_EQ("/a/xy", e.reason());
  }
  EXPECT_FALSE(change);
  EXPECT_EQ(1u, mgr.GetFolders().size());
  EXPECT_THROW(mgr.Delete(change, "/unregistered/x"), Error);
}

TEST_F(FolderMutationTest, DeleteByShareKeepsTheOrderOfTheRest) {
  WriteFolders({FolderJson("/b/1", "d"), FolderJson("/a/1", "d"), FolderJson("/b/2", "d"),
                FolderJson("/a/2", "d"), FolderJson("/ab/1", "d")});
  FolderMgr mgr;
  mgr.DeleteByShare("a");
  EXPECT_EQ((std::vector<std::string>{"/b/1", "/b/2", "/ab/1"}), Paths(mgr.GetFolders()));
  mgr.DeleteByShare("A");
  EXPECT_EQ(3u, mgr.GetFolders().size());
}

TEST(FolderDiffTest, ReportIsFreshWithPausedFalse) {
  const FolderPtr subject = std::make_shared<Folder>("/s/x", "X", true, false, true, false, true);
  const FolderPtr other = std::make_shared<Folder>("/s", "S", true, true, false, false, true);
  const FolderPtr report = FolderMgr::DiffCfg(subject, other);
  EXPECT_NE(subject, report);
  EXPECT_EQ("-av-", Flags(report));
  EXPECT_EQ("/s/x", report->GetPath());
  EXPECT_FALSE(report->IsPaused());
  EXPECT_EQ("davp", Flags(FolderMgr::DiffCfg(subject, nullptr)));
}

}  // namespace
}  // namespace testing
}  // namespace orvex
