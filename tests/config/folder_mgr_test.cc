// FolderMgr: loading and saving the folder configuration file, the folder
// limit, changes with their reports of which file types change state, the
// governing-folder queries and the paged listing.
#include "orvex/config/folder_mgr.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <set>

#include "config/folder_test_root.h"
#include "support/log_capture.h"

namespace orvex {
namespace testing {
namespace {

// Shares a, b and s on volume1 and m on volume2, whose roots need not exist.
class FolderMgrTest : public FolderTestRoot {
 protected:
  void SetUp() override {
    for (const char* share : {"a", "b", "s"}) AddShareAt(share, std::string("/volume1/") + share);
    AddShareAt("m", "/volume2/m");
  }
  std::string Governing(const FolderMgr& mgr, const std::string& full_path) {
    const FolderPtr folder = mgr.GetMostSuitableCfg(full_path);
    return folder ? folder->GetName() : "(none)";
  }
  unsigned FileMode() const {
    struct stat st;
    EXPECT_EQ(0, ::stat(FoldersFile().c_str(), &st));
    return st.st_mode & 07777;
  }
  // The change report of an upsert; the folder upserted is paused, the
  // report never is.
  std::string Upsert(FolderMgr& mgr, const std::string& path, const std::string& flags) {
    FolderPtr change;
    mgr.Upsert(change, MakeFolder(path, flags, "new " + path, /*paused=*/true));
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
  // One page of the listing; checks that total is the whole count.
  std::vector<std::string> Page(const FolderMgr& mgr, unsigned offset, unsigned limit,
                                const std::string& sort_by, const std::string& direction) {
    std::vector<FolderPtr> out{MakeFolder("/stale", "")};
    unsigned total = 12345;
    mgr.List(out, total, offset, limit, sort_by, direction);
    EXPECT_EQ(mgr.GetFolders().size(), total);
    return Paths(out);
  }
};

TEST_F(FolderMgrTest, LoadKeepsOrderAndDuplicatesAndSaveWritesWholeRecordsWithMode0644) {
  FolderMgr empty;
  EXPECT_TRUE(empty.GetFolders().empty());
  EXPECT_FALSE(std::filesystem::exists(FoldersFile()));
  empty.Save();  // the package's etc directory does not exist yet
  EXPECT_EQ(0644u, FileMode());
  EXPECT_EQ(Json::Value(Json::arrayValue), ReadFolders());

  Json::Value partial = FolderJson("/s/b", "a", "B");
  partial.removeMember("paused");
  partial.removeMember("volume_to_be_clean");
  const Json::Value first = FolderJson("/s/c", "dp", "C", /*paused=*/true);
  WriteFolders({first, partial, FolderJson("/s/c", "v")});
  ASSERT_EQ(0, ::chmod(FoldersFile().c_str(), 0600));
  FolderMgr mgr;
  EXPECT_EQ((std::vector<std::string>{"/s/c", "/s/b", "/s/c"}), Paths(mgr.GetFolders()));
  mgr.Save();
  Json::Value expected(Json::arrayValue);
  for (const Json::Value& f : {first, FolderJson("/s/b", "a", "B"), FolderJson("/s/c", "v")}) {
    expected.append(f);
  }
  EXPECT_EQ(expected, ReadFolders());
  EXPECT_EQ(0644u, FileMode());
}

TEST_F(FolderMgrTest, BadFilesFailTheWholeLoad) {
  const std::string not_json = "Cannot load json: " + FoldersFile();
  const std::string not_array = "Folder list is not a JSON array: " + FoldersFile();
  const struct {
    const char* text;
    ErrorCode code;
    std::string reason;  // the whole reason, or its start for a bad record
  } cases[] = {
      {"[{\"path\": \"/s/a\",", kErrorLoadJson, not_json},
      {R"({"path": "/s/a", "name": "a"})", kErrorLoadJson, not_array},
      {"null", kErrorLoadJson, not_array},
      {R"([{"path": "/s/a"}])", kErrorBadArgument, "Missing property: name"},
      {R"([["/s/a"]])", kErrorBadArgument, "Not an object"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.text);
    WriteEtc("fileindex.folders", c.text);
    LogCapture log;
    std::string reason;
    EXPECT_EQ(c.code, CodeOf([] { FolderMgr mgr; }, &reason));
    EXPECT_EQ(c.reason, c.code == kErrorLoadJson ? reason : reason.substr(0, c.reason.size()));
  }
  WriteEtc("fileindex.folders", "[");
  LogCapture log;
  CodeOf([] { FolderMgr mgr; });
  ASSERT_EQ(1u, log.lines().size());
  EXPECT_EQ(0u, log.lines()[0].rfind("folder_mgr:", 0)) << log.lines()[0];
  EXPECT_NE(std::string::npos,
            log.lines()[0].find("Failed [IsFileExist(kFileIndexFoldersCfgPath) && "
                                "!folders.fromFile(kFileIndexFoldersCfgPath)]"))
      << log.lines()[0];
}

TEST_F(FolderMgrTest, TheThousandAndFirstFolderIsRefusedAndNeverSaved) {
  std::vector<Json::Value> folders;
  for (int i = 0; i < 1000; ++i) folders.push_back(FolderJson("/s/f" + std::to_string(i), "d"));
  WriteFolders(folders);
  FolderMgr mgr;
  FolderPtr change;
  mgr.Upsert(change, MakeFolder("/s/f7", "dp"));  // replacing keeps the count
  EXPECT_EQ(1000u, mgr.GetFolders().size());
  LogCapture log;
  EXPECT_EQ(kErrorTooManyFolders, CodeOf([&] { mgr.Upsert(change, MakeFolder("/s/new", "d")); }));
  EXPECT_EQ(1u, log.Matching("Failed [folders_.size() > kFileIndexFoldersMax]").size());
  EXPECT_EQ(1001u, mgr.GetFolders().size());  // the appended entry counted
  EXPECT_EQ(1000u, FolderMgr().GetFolders().size());
}

// A save that runs out of room leaves the old file whole and no temporary
// file behind. The child process writes under a file-size limit.
TEST_F(FolderMgrTest, AFailedSaveNeverLeavesAHalfWrittenFile) {
  WriteFolders({FolderJson("/s/a", "d")});
  const Json::Value before = ReadFolders();
  const pid_t pid = fork();
  ASSERT_LE(0, pid);
  if (pid == 0) {
    signal(SIGXFSZ, SIG_IGN);
    const rlimit limit{512, 512};
    setrlimit(RLIMIT_FSIZE, &limit);
    const int code = CodeOf([] {
      FolderMgr mgr;
      FolderPtr change;
      for (int i = 0; i < 20; ++i) mgr.Upsert(change, MakeFolder("/s/f" + std::to_string(i), "d"));
      mgr.Save();  // about 3 KB against a limit of 512 bytes
    });
    _exit(code == kErrorSaveJson ? 0 : 2);
  }
  int status = 0;
  ASSERT_EQ(pid, waitpid(pid, &status, 0));
  ASSERT_TRUE(WIFEXITED(status));
  ASSERT_EQ(0, WEXITSTATUS(status)) << "expected the save to fail with 505";
  EXPECT_EQ(before, ReadFolders());
  size_t files = 0;
  for (const auto& entry :
       std::filesystem::directory_iterator(dir_.Join("var/packages/Orvex/etc"))) {
    EXPECT_EQ("fileindex.folders", entry.path().filename()) << "left behind";
    ++files;
  }
  EXPECT_EQ(1u, files);
}

TEST_F(FolderMgrTest, UpsertReportsAgainstTheFolderThatGovernedBefore) {
  WriteFolders({FolderJson("/a/2", "d", "old"), FolderJson("/a/3", "d"),
                FolderJson("/a/2", "v", "older duplicate")});
  FolderMgr mgr;
  EXPECT_EQ("---p", Upsert(mgr, "/a/2", "dp"));  // against the first copy; every copy goes
  EXPECT_EQ((std::vector<std::string>{"/a/3", "/a/2"}), Paths(mgr.GetFolders()));
  EXPECT_EQ("davp", Upsert(mgr, "/a", "dp"));    // new top-level folder: everything changes
  EXPECT_EQ("----", Upsert(mgr, "/a/x", "dp"));  // subfolder like its parent: nothing to do
  EXPECT_EQ("-a-p", Upsert(mgr, "/a/y", "da"));  // subfolder differing in two types
  EXPECT_EQ("---p", Upsert(mgr, "/a", "d"));     // turns only photo off
  EXPECT_EQ("----", Upsert(mgr, "/a", "d"));     // the same again: no change
  EXPECT_EQ((std::vector<std::string>{"/a/3", "/a/2", "/a/x", "/a/y", "/a"}),
            Paths(mgr.GetFolders()));
  EXPECT_EQ("new /a", mgr.GetFolders().back()->GetName());
}

TEST_F(FolderMgrTest, DeleteReportsAgainstTheFolderThatGovernsFromNowOn) {
  WriteFolders({FolderJson("/a", "dp"), FolderJson("/a/same", "dp"), FolderJson("/a/diff", "av"),
                FolderJson("/b", "d")});
  FolderMgr mgr;
  EXPECT_EQ("----", Delete(mgr, "/a/same"));  // the parent indexes the same types
  EXPECT_EQ("/a", mgr.GetMostSuitableCfg("/volume1/a/same/x.jpg")->GetPath());
  EXPECT_EQ("davp", Delete(mgr, "/a/diff"));       // differs from the parent in all four
  EXPECT_EQ("----", Delete(mgr, "/a/inner/dir"));  // not a folder: nothing removed
  EXPECT_EQ((std::vector<std::string>{"/a", "/b"}), Paths(mgr.GetFolders()));
  EXPECT_EQ("davp", Delete(mgr, "/a"));  // top level: nothing governs any more

  LogCapture log;
  FolderPtr change;
  std::string reason;
  EXPECT_EQ(kErrorNoShare, CodeOf([&] { mgr.Delete(change, "/unregistered/x"); }));
  EXPECT_EQ(kErrorNoFolder, CodeOf([&] { mgr.Delete(change, "/a/x"); }, &reason));
  EXPECT_EQ("/a/x", reason);
  EXPECT_FALSE(change);
  EXPECT_EQ((std::vector<std::string>{"/b"}), Paths(mgr.GetFolders()));
}

TEST_F(FolderMgrTest, DeleteByShareKeepsTheOrderOfTheRest) {
  WriteFolders({FolderJson("/b/1", "d"), FolderJson("/a/1", "d"), FolderJson("/b/2", "d"),
                FolderJson("/a/2", "d"), FolderJson("/ab/1", "d")});
  FolderMgr mgr;
  mgr.DeleteByShare("a");
  EXPECT_EQ((std::vector<std::string>{"/b/1", "/b/2", "/ab/1"}), Paths(mgr.GetFolders()));
  mgr.DeleteByShare("A");
  EXPECT_EQ(3u, mgr.GetFolders().size());
}

TEST_F(FolderMgrTest, QueriesMatchWholeComponentsAndTheDeepestFolderGoverns) {
  // Depth wins over list order, list order wins between equals.
  WriteFolders({FolderJson("/a/b", "", "sub"), FolderJson("/a", "d", "top"),
                FolderJson("/a", "dp", "top-duplicate")});
  const FolderMgr mgr;
  const std::vector<std::pair<std::string, std::string>> cases = {
      {"/volume1/a/b/c.txt", "sub"}, {"/volume1/a/b", "sub"},   {"/volume1/a/bc.txt", "top"},
      {"/volume1/a", "top"},         {"/volume1/ab", "(none)"}, {"/volume1", "(none)"},
      {"/volume2/m/x", "(none)"}};
  for (const auto& [path, name] : cases) EXPECT_EQ(name, Governing(mgr, path)) << path;
  EXPECT_TRUE(mgr.IsFullPathHasOwnCfg("/volume1/a"));
  EXPECT_FALSE(mgr.IsFullPathHasOwnCfg("/volume1/a/"));
  EXPECT_TRUE(mgr.IsFullPathHasOwnCfg("/volume1/a/b"));
  EXPECT_FALSE(mgr.IsFullPathHasOwnCfg("/volume1/a/c"));
  EXPECT_TRUE(mgr.IsFullPathIndexed("/volume1/a/"));
  EXPECT_TRUE(mgr.IsFullPathIndexed("/volume1/a/b/d.txt"));  // a folder without flags counts
  EXPECT_FALSE(mgr.IsFullPathIndexed("/volume1/ab"));
  EXPECT_TRUE(mgr.IsShareIndexed("a"));
  EXPECT_FALSE(mgr.IsShareIndexed("A"));
  EXPECT_FALSE(mgr.IsShareIndexed("m"));
  EXPECT_EQ((std::set<std::string>{"a"}), mgr.GetIndexedShares());
}

TEST_F(FolderMgrTest, NeedMetaFollowsTheGoverningFolderFlagForTheFileClass) {
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

TEST_F(FolderMgrTest, GetFindsExactPathsAndFailsWith902) {
  WriteFolders({FolderJson("/a/x", "d", "first"), FolderJson("/a/x", "d", "second")});
  const FolderMgr mgr;
  FolderPtr found;
  mgr.Get(found, "/a/x");
  EXPECT_EQ("first", found->GetName());
  EXPECT_TRUE(mgr.HasFolder("/a/x"));
  EXPECT_FALSE(mgr.HasFolder("/a/x/"));
  LogCapture log;
  std::string reason;
  EXPECT_EQ(kErrorNoFolder, CodeOf([&] { mgr.Get(found, "/a/X"); }, &reason));
  EXPECT_EQ("/a/X", reason);
  EXPECT_EQ(1u, log.Matching("Failed [it == folders_.end()], reason: /a/X").size());
}

TEST_F(FolderMgrTest, ListSortsFoldingCaseThenDropsOffsetAndCutsToLimit) {
  WriteFolders({FolderJson("/s/Zulu", "p", "b"), FolderJson("/s/éa", "d", "C"),
                FolderJson("/s/alpha", "dp", "é"), FolderJson("/s/Éb", "", "A"),
                FolderJson("/s/Bravo", "", "d")});
  const FolderMgr mgr;
  using Paths = std::vector<std::string>;
  using Set = std::set<std::string>;
  // Flags sort off first; only "desc" reverses.
  const Paths photo = Page(mgr, 0, 10, "photo", "desc");
  EXPECT_EQ((Set{"/s/Zulu", "/s/alpha"}), Set(photo.begin(), photo.begin() + 2));
  const Paths doc = Page(mgr, 0, 10, "document", "DESC");
  EXPECT_EQ((Set{"/s/alpha", "/s/éa"}), Set(doc.begin() + 3, doc.end()));
  // Bytewise "/s/Éb" would come before "/s/éa"; folded, "éa" < "éb", both after "zulu".
  EXPECT_EQ((Paths{"/s/alpha", "/s/Bravo", "/s/Zulu", "/s/éa", "/s/Éb"}),
            Page(mgr, 0, 10, "path", ""));
  EXPECT_EQ((Paths{"/s/Éb", "/s/éa", "/s/Zulu", "/s/Bravo", "/s/alpha"}),
            Page(mgr, 0, 10, "path", "desc"));
  const Paths by_name{"/s/Éb", "/s/Zulu", "/s/éa", "/s/Bravo", "/s/alpha"};
  EXPECT_EQ(by_name, Page(mgr, 0, 10, "name", "asc"));
  EXPECT_EQ(by_name, Page(mgr, 0, 10, "size", "asc"));  // any other word sorts by name

  EXPECT_EQ((Paths{"/s/Bravo", "/s/Zulu"}), Page(mgr, 1, 2, "path", ""));
  EXPECT_EQ((Paths{"/s/Éb"}), Page(mgr, 4, 2, "path", ""));
  EXPECT_EQ((Paths{"/s/éa", "/s/Zulu", "/s/Bravo", "/s/alpha"}), Page(mgr, 1, 99, "path", "desc"));
  EXPECT_TRUE(Page(mgr, 5, 10, "path", "").empty());  // offset == total
  EXPECT_TRUE(Page(mgr, 0xFFFFFFFFu, 10, "path", "").empty());
  EXPECT_TRUE(Page(mgr, 0, 0, "path", "").empty());  // limit 0 is an empty page
  EXPECT_EQ(5u, Page(mgr, 0, 0xFFFFFFFFu, "path", "").size());
}

}  // namespace
}  // namespace testing
}  // namespace orvex
