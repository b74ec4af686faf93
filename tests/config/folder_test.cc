// Folder and FolderMgr: the folder configuration file, the folder limit, the
// change reports of upserts and deletes, the governing-folder queries, the
// listing and a folder's status, against a real share registry, status file
// and share queue.
#include "orvex/config/folder.h"

#include <gtest/gtest.h>
#include <json/json.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>

#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "platform/share_test_root.h"
#include "support/error_code.h"
#include "support/log_capture.h"

namespace orvex {
namespace testing {
namespace {

using fileindex::Folder;
using fileindex::FolderMgr;
using FolderPtr = std::shared_ptr<Folder>;
using Paths = std::vector<std::string>;

// A folder record with its type flags as letters of "davp".
Json::Value FolderJson(const std::string& path, const std::string& flags,
                       const std::string& name = "", bool paused = false) {
  Json::Value folder(Json::objectValue);
  folder["path"] = path;
  folder["name"] = name.empty() ? path : name;
  const char* keys[] = {"document", "audio", "video", "photo"};
  for (int i = 0; i < 4; ++i) folder[keys[i]] = flags.find("davp"[i]) != std::string::npos;
  folder["paused"] = paused;
  folder["volume_to_be_clean"] = "";
  return folder;
}

FolderPtr MakeFolder(const std::string& path, const std::string& flags) {
  return std::make_shared<Folder>(FolderJson(path, flags, "new " + path, /*paused=*/true));
}

// The four type flags of a change report as "davp" letters, "-" for off.
std::string Flags(const FolderPtr& folder) {
  const bool on[] = {folder->IsDocument(), folder->IsAudio(), folder->IsVideo(), folder->IsPhoto()};
  std::string flags = "----";
  for (int i = 0; i < 4; ++i) flags[i] = on[i] ? "davp"[i] : '-';
  return flags;
}

Paths PathsOf(const std::vector<FolderPtr>& folders) {
  Paths paths;
  for (const FolderPtr& folder : folders) paths.push_back(folder->GetPath());
  return paths;
}

class FolderMgrTest : public ShareTestRoot {
 protected:
  void SetUp() override {
    for (const char* share : {"a", "b", "s"}) AddShareAt(share, std::string("/volume1/") + share);
  }
  std::string FoldersFile() const { return dir_.Join("var/packages/Orvex/etc/fileindex.folders"); }
  void WriteEtc(const std::string& name, const std::string& text) {
    std::filesystem::create_directories(dir_.Join("var/packages/Orvex/etc"));
    dir_.Write("var/packages/Orvex/etc/" + name, text);
  }
  void WriteFolders(const std::vector<Json::Value>& folders) {
    Json::Value list(Json::arrayValue);
    for (const Json::Value& folder : folders) list.append(folder);
    WriteEtc("fileindex.folders", toString(list));
  }
  Json::Value ReadFolders() const {
    Json::Value list;
    EXPECT_TRUE(fromFile(list, FoldersFile()));
    return list;
  }
  std::string Upsert(FolderMgr& mgr, const std::string& path, const std::string& flags) {
    FolderPtr change;
    mgr.Upsert(change, MakeFolder(path, flags));
    EXPECT_FALSE(change->IsPaused());
    return Flags(change);
  }
  std::string Delete(FolderMgr& mgr, const std::string& path) {
    FolderPtr change;
    mgr.Delete(change, path);
    return Flags(change);
  }
};

TEST_F(FolderMgrTest, LoadKeepsOrderAndDuplicatesAndSaveWritesWholeRecordsWithMode0644) {
  Json::Value partial = FolderJson("/s/b", "a", "B");
  partial.removeMember("paused");
  partial.removeMember("volume_to_be_clean");
  const Json::Value first = FolderJson("/s/c", "dp", "C", /*paused=*/true);
  WriteFolders({first, partial, FolderJson("/s/c", "v")});
  ASSERT_EQ(0, ::chmod(FoldersFile().c_str(), 0600));
  FolderMgr mgr;
  EXPECT_EQ((Paths{"/s/c", "/s/b", "/s/c"}), PathsOf(mgr.GetFolders()));
  mgr.Save();
  Json::Value expected(Json::arrayValue);
  for (const Json::Value& f : {first, FolderJson("/s/b", "a", "B"), FolderJson("/s/c", "v")}) {
    expected.append(f);
  }
  EXPECT_EQ(expected, ReadFolders());
  struct stat st;
  ASSERT_EQ(0, ::stat(FoldersFile().c_str(), &st));
  EXPECT_EQ(0644u, st.st_mode & 07777);
}

TEST_F(FolderMgrTest, BadFilesFailTheWholeLoad) {
  const struct {
    const char* text;
    ErrorCode code;
    std::string reason;  // the whole reason, or its start for a bad record
  } cases[] = {
      {"[{\"path\": \"/s/a\",", kErrorLoadJson, "Cannot load json: " + FoldersFile()},
      {"null", kErrorLoadJson, "Folder list is not a JSON array: " + FoldersFile()},
      {R"([{"path": "/s/a"}])", kErrorBadArgument, "Missing property: name"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.text);
    WriteEtc("fileindex.folders", c.text);
    LogCapture log;
    std::string reason;
    EXPECT_EQ(c.code, CodeOf([] { FolderMgr mgr; }, &reason));
    EXPECT_EQ(c.reason, c.code == kErrorLoadJson ? reason : reason.substr(0, c.reason.size()));
    if (c.code != kErrorLoadJson) continue;
    ASSERT_EQ(1u, log.lines().size());
    EXPECT_EQ(0u, log.lines()[0].rfind("folder_mgr:", 0)) << log.lines()[0];
  }
}

// A link or a directory where the folder list belongs is reported, never
// read as "no folders" and never replaced by a save.
TEST_F(FolderMgrTest, ALinkOrDirectoryInTheFilesPlaceIsReportedAndNeverReplaced) {
  WriteEtc("real.folders", "[]");
  const struct {
    const char* what;
    std::function<void()> make;
    std::string reason;
  } cases[] = {
      {"link to a good file",
       [&] { std::filesystem::create_symlink("real.folders", FoldersFile()); },
       "Cannot load json: " + FoldersFile() + " is a symbolic link"},
      {"dangling link", [&] { std::filesystem::create_symlink("gone", FoldersFile()); },
       "Cannot load json: " + FoldersFile() + " is a symbolic link"},
      {"directory", [&] { std::filesystem::create_directory(FoldersFile()); },
       "Cannot load json: " + FoldersFile() + " is a directory"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    std::filesystem::remove(FoldersFile());
    FolderMgr loaded_before;  // no file yet: an empty list
    c.make();
    std::string reason;
    EXPECT_EQ(kErrorLoadJson, CodeOf([] { FolderMgr mgr; }, &reason));
    EXPECT_EQ(c.reason, reason);
    EXPECT_EQ(kErrorSaveJson, CodeOf([&] { loaded_before.Save(); }));
    const auto status = std::filesystem::symlink_status(FoldersFile());
    EXPECT_NE(std::filesystem::file_type::regular, status.type()) << "replaced by the save";
  }
  Json::Value real;
  EXPECT_TRUE(fromFile(real, dir_.Join("var/packages/Orvex/etc/real.folders")));
  EXPECT_EQ(Json::Value(Json::arrayValue), real) << "the link's target must stay as it was";
}

TEST_F(FolderMgrTest, TheThousandAndFirstFolderIsRefusedAndNeverSaved) {
  std::vector<Json::Value> folders;
  for (int i = 0; i < 1000; ++i) folders.push_back(FolderJson("/s/f" + std::to_string(i), "d"));
  WriteFolders(folders);
  FolderMgr mgr;
  FolderPtr change;
  mgr.Upsert(change, MakeFolder("/s/f7", "dp"));  // replacing keeps the count
  LogCapture log;
  EXPECT_EQ(kErrorTooManyFolders, CodeOf([&] { mgr.Upsert(change, MakeFolder("/s/new", "d")); }));
  EXPECT_EQ(1u, log.Matching("Failed [folders_.size() > kFileIndexFoldersMax]").size());
  EXPECT_EQ(1000u, FolderMgr().GetFolders().size());
}

// A save that runs out of room (the child writes under a file-size limit)
// leaves the old file whole and no temporary file behind.
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
      mgr.Save();
    });
    _exit(code == kErrorSaveJson ? 0 : 2);
  }
  int status = 0;
  ASSERT_EQ(pid, waitpid(pid, &status, 0));
  ASSERT_TRUE(WIFEXITED(status));
  ASSERT_EQ(0, WEXITSTATUS(status)) << "expected the save to fail with 505";
  EXPECT_EQ(before, ReadFolders());
  const auto entries = std::filesystem::directory_iterator(dir_.Join("var/packages/Orvex/etc"));
  EXPECT_EQ(1, std::distance(begin(entries), end(entries))) << "temporary file left behind";
}

TEST_F(FolderMgrTest, ChangeReportsCompareWithTheGoverningFolder) {
  WriteFolders({FolderJson("/a/2", "d", "old"), FolderJson("/a/2", "v", "older duplicate")});
  FolderMgr mgr;
  EXPECT_EQ("---p", Upsert(mgr, "/a/2", "dp"));  // against the first copy; every copy goes
  EXPECT_EQ("davp", Upsert(mgr, "/a", "dp"));    // new top-level folder: everything changes
  EXPECT_EQ("----", Upsert(mgr, "/a/x", "dp"));  // subfolder like its parent
  EXPECT_EQ("-a-p", Upsert(mgr, "/a/y", "da"));
  EXPECT_EQ((Paths{"/a/2", "/a", "/a/x", "/a/y"}), PathsOf(mgr.GetFolders()));
  // A delete compares with the folder that governs from now on.
  EXPECT_EQ("----", Delete(mgr, "/a/x"));
  EXPECT_EQ("/a", mgr.GetMostSuitableCfg("/volume1/a/x/y.jpg")->GetPath());
  EXPECT_EQ("-a-p", Delete(mgr, "/a/y"));
  EXPECT_EQ("----", Delete(mgr, "/a/inner/dir"));  // not a folder: nothing removed
  EXPECT_EQ("davp", Delete(mgr, "/a"));
  LogCapture log;
  FolderPtr change;
  std::string reason;
  EXPECT_EQ(kErrorNoShare, CodeOf([&] { mgr.Delete(change, "/unregistered/x"); }));
  EXPECT_EQ(kErrorNoFolder, CodeOf([&] { mgr.Get(change, "/a/X"); }, &reason));
  EXPECT_EQ("/a/X", reason);
  EXPECT_EQ(1u, log.Matching("Failed [it == folders_.end()], reason: /a/X").size());
  mgr.DeleteByShare("a");
  EXPECT_TRUE(mgr.GetFolders().empty());
}

TEST_F(FolderMgrTest, QueriesMatchWholeComponentsAndTheDeepestFolderGoverns) {
  WriteFolders({FolderJson("/a/b", "", "sub"), FolderJson("/a", "d", "top"),
                FolderJson("/a", "dp", "top-duplicate")});
  const FolderMgr mgr;
  const std::pair<std::string, std::string> cases[] = {
      {"/volume1/a/b/c.txt", "sub"}, {"/volume1/a/bc.txt", "top"}, {"/volume1/ab", "(none)"}};
  for (const auto& [path, name] : cases) {
    const FolderPtr folder = mgr.GetMostSuitableCfg(path);
    EXPECT_EQ(name, folder ? folder->GetName() : "(none)") << path;
  }
  EXPECT_FALSE(mgr.IsFullPathHasOwnCfg("/volume1/a/"));
  EXPECT_TRUE(mgr.IsFullPathIndexed("/volume1/a/b/d.txt"));  // a folder without flags counts
  EXPECT_FALSE(mgr.IsShareIndexed("A"));
  EXPECT_TRUE(mgr.IsFullPathNeedMeta("/volume1/a/bc.PDF"));
  EXPECT_FALSE(mgr.IsFullPathNeedMeta("/volume1/a/bc.jpg"));  // the first "/a" has no photo
  EXPECT_FALSE(mgr.IsFullPathNeedMeta("/volume1/a/b/c.pdf"));
}

TEST_F(FolderMgrTest, ListSortsFoldingCaseThenDropsOffsetAndCutsToLimit) {
  WriteFolders({FolderJson("/s/Zulu", "p", "b"), FolderJson("/s/éa", "d", "C"),
                FolderJson("/s/alpha", "dp", "é"), FolderJson("/s/Éb", "", "A")});
  const FolderMgr mgr;
  const auto page = [&](unsigned offset, unsigned limit, const char* by, const char* direction) {
    std::vector<FolderPtr> out{MakeFolder("/stale", "")};
    unsigned total = 12345;
    mgr.List(out, total, offset, limit, by, direction);
    EXPECT_EQ(4u, total);
    return PathsOf(out);
  };
  // Bytewise "/s/Éb" would come before "/s/éa".
  EXPECT_EQ((Paths{"/s/alpha", "/s/Zulu", "/s/éa", "/s/Éb"}), page(0, 10, "path", ""));
  EXPECT_EQ((Paths{"/s/Éb", "/s/Zulu", "/s/éa", "/s/alpha"}), page(0, 10, "size", "asc"));
  EXPECT_EQ((Paths{"/s/éa", "/s/Zulu"}), page(1, 2, "path", "desc"));
  EXPECT_EQ((Paths{"/s/Zulu", "/s/éa"}), page(1, 2, "path", "DESC"));     // only "desc" reverses
  EXPECT_EQ((Paths{"/s/Zulu", "/s/alpha"}), page(2, 2, "photo", "asc"));  // off sorts first
  EXPECT_TRUE(page(0xFFFFFFFFu, 10, "path", "").empty());
  EXPECT_TRUE(page(0, 0, "path", "").empty());
}

// A real share with folder /photo/a and a fixed clock.
class FolderStatusTest : public FolderMgrTest {
 protected:
  void SetUp() override {
    root_ = AddShare("photo");
    MakeDirs(root_, {"a/sub", "ab"});
  }
  void WriteStatus(long long resume_time, unsigned flags = 0) {
    Json::Value status(Json::objectValue);
    status["resume_time"] = static_cast<Json::Int64>(resume_time);
    status["share"]["photo"] = flags;
    WriteEtc("fileindex.status", toString(status));
  }
  void QueueCreate(const std::string& path) {
    std::filesystem::create_directories(root_ + "/@eaDir/@fileindex");
    std::ofstream(root_ + "/@eaDir/@fileindex/queue", std::ios::app)
        << R"({"event": 64, "is_dir": false, "path": ")" << path << "\"}\n";
  }
  std::string Status(const std::string& path = "/photo/a") {
    Json::Value out(Json::objectValue);
    Folder(path, "A", true, true, true, true, false).GetStatus(out);
    return out.isMember("desc") ? out["text"].asString() + "/" + out["desc"].asString()
                                : out["text"].asString();
  }

  std::string root_;
  ScopedSystemHooks clock_{SystemHooks{[] { return time_t{1700000000}; }, nullptr, nullptr}};
};

TEST_F(FolderStatusTest, InvalidPathOutranksNeedReindexWhichOutranksPendingEvents) {
  WriteStatus(0);
  QueueCreate(root_ + "/ab/x.jpg");
  EXPECT_EQ("finished", Status());  // /photo/ab is not inside /photo/a
  QueueCreate(root_ + "/a/sub/x.jpg");
  const std::pair<long long, const char*> pauses[] = {
      {-1, "processing"}, {0, "paused"}, {1700000060, "paused"}, {1700000000, "processing"}};
  for (const auto& [resume_time, text] : pauses) {
    WriteStatus(resume_time);
    EXPECT_EQ(text, Status()) << "resume_time " << resume_time;
  }
  WriteStatus(-1, 4);  // flags other than need-reindex do not count
  EXPECT_EQ("processing", Status());
  WriteStatus(0, 1 | 4);
  EXPECT_EQ("need_reindex", Status());
  EXPECT_EQ("error/invalid_path", Status("/photo/@eaDir"));
  EXPECT_EQ("error/invalid_path", Status("/nosuchshare/a"));
}

TEST_F(FolderStatusTest, PendingEventsAreAskedWithTheFolderConfigurationLoaded) {
  WriteStatus(-1);
  QueueCreate(root_ + "/a/x.jpg");
  WriteEtc("fileindex.folders", "{broken");
  Json::Value out(Json::objectValue);
  EXPECT_EQ(kErrorLoadJson,
            CodeOf([&] { Folder("/photo/a", "A", true, true, true, true, false).GetStatus(out); }));
}

TEST_F(FolderStatusTest, AdditionalStatusSectionAndItsFailures) {
  WriteStatus(0);
  QueueCreate(root_ + "/a/x.jpg");
  const Folder folder("/photo/a", "A", true, false, false, false, false);
  Json::Value expected = folder.GetData();
  expected["additional"]["status"]["text"] = "paused";
  EXPECT_EQ(expected, folder.GetDataWithAdditional(Options(R"(["status", "status"])")));
  const struct {
    const char* text;
    const char* reason;
    const char* logged;  // "" when no log line is due
  } failures[] = {{"null", "null", "Failed [!addiitionals.isArray()], reason: null"},
                  {R"(["status", 5])", "5", "Failed [!it.isString()], reason: 5"},
                  {R"(["size"])", "Unknown additioal: size", ""}};
  for (const auto& f : failures) {
    SCOPED_TRACE(f.text);
    LogCapture log;
    std::string reason;
    EXPECT_EQ(kErrorBadArgument,
              CodeOf([&] { folder.GetDataWithAdditional(Options(f.text)); }, &reason));
    EXPECT_EQ(f.reason, reason);
    const std::string logged = log.lines().empty() ? "" : log.lines()[0];
    EXPECT_EQ(*f.logged ? 1u : 0u, log.lines().size());
    if (*f.logged) {
      EXPECT_EQ(0u, logged.rfind("folder:", 0)) << logged;
      EXPECT_NE(std::string::npos, logged.find(f.logged)) << logged;
    }
  }
}

}  // namespace
}  // namespace testing
}  // namespace orvex
