// FolderMgr's store: loading the folder configuration file, saving it
// atomically with mode 0644, and the folder limit.
#include "orvex/config/folder_mgr.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>

#include "config/folder_test_root.h"
#include "orvex/foundation/error.h"
#include "support/log_capture.h"

namespace orvex {
namespace testing {
namespace {

class FolderMgrStoreTest : public FolderTestRoot {
 protected:
  // Expects the load to fail with code, and returns the reason.
  std::string LoadFailure(ErrorCode code) {
    try {
      FolderMgr mgr;
      ADD_FAILURE() << "loaded " << mgr.GetFolders().size() << " folders";
    } catch (const Error& e) {
      EXPECT_EQ(code, e.code()) << e.reason();
      return e.reason();
    }
    return "";
  }
  std::vector<std::string> FilesInEtc() const {
    std::vector<std::string> names;
    for (const auto& entry :
         std::filesystem::directory_iterator(dir_.Join("var/packages/Orvex/etc"))) {
      names.push_back(entry.path().filename().string());
    }
    return names;
  }
};

TEST_F(FolderMgrStoreTest, NoFileIsAnEmptyListAndSaveCreatesItWithMode0644) {
  FolderMgr mgr;
  EXPECT_TRUE(mgr.GetFolders().empty());
  EXPECT_FALSE(std::filesystem::exists(FoldersFile()));
  mgr.Save();  // the package's etc directory does not exist yet
  struct stat st;
  ASSERT_EQ(0, ::stat(FoldersFile().c_str(), &st));
  EXPECT_EQ(0644u, st.st_mode & 07777);
  EXPECT_EQ(Json::Value(Json::arrayValue), ReadFolders());
}

TEST_F(FolderMgrStoreTest, LoadKeepsFileOrderAndDuplicatesAndSaveWritesThemBack) {
  Json::Value partial = FolderJson("/s/b", "a", "B");
  partial.removeMember("paused");
  partial.removeMember("volume_to_be_clean");
  WriteFolders({FolderJson("/s/c", "dp", "C", /*paused=*/true), partial, FolderJson("/s/c", "v")});
  FolderMgr mgr;
  EXPECT_EQ((std::vector<std::string>{"/s/c", "/s/b", "/s/c"}), Paths(mgr.GetFolders()));
  mgr.Save();
  const Json::Value saved = ReadFolders();
  ASSERT_EQ(3u, saved.size());
  EXPECT_EQ(FolderJson("/s/c", "dp", "C", true), saved[0]);
  EXPECT_EQ(FolderJson("/s/b", "a", "B"), saved[1]);
  EXPECT_EQ(FolderJson("/s/c", "v"), saved[2]);
  chmod(FoldersFile().c_str(), 0600);
  mgr.Save();
  struct stat st;
  ASSERT_EQ(0, ::stat(FoldersFile().c_str(), &st));
  EXPECT_EQ(0644u, st.st_mode & 07777);
}

TEST_F(FolderMgrStoreTest, TextThatIsNotJsonFailsWith504AndTheConditionLogged) {
  WriteFoldersText("[{\"path\": \"/s/a\",");
  LogCapture log;
  EXPECT_EQ("Cannot load json: " + FoldersFile(), LoadFailure(kErrorLoadJson));
  ASSERT_EQ(1u, log.lines().size());
  EXPECT_NE(std::string::npos,
            log.lines()[0].find("Failed [IsFileExist(kFileIndexFoldersCfgPath) && "
                                "!folders.fromFile(kFileIndexFoldersCfgPath)]"))
      << log.lines()[0];
  EXPECT_EQ(0u, log.lines()[0].rfind("folder_mgr:", 0)) << log.lines()[0];
  WriteFoldersText("");
  EXPECT_EQ("Cannot load json: " + FoldersFile(), LoadFailure(kErrorLoadJson));
}

TEST_F(FolderMgrStoreTest, JsonThatIsNotAnArrayFailsWith504) {
  for (const char* text : {R"({"path": "/s/a", "name": "a"})", "null", "7", R"("/s/a")"}) {
    WriteFoldersText(text);
    EXPECT_EQ("Folder list is not a JSON array: " + FoldersFile(), LoadFailure(kErrorLoadJson))
        << text;
  }
}

TEST_F(FolderMgrStoreTest, ARecordOfTheWrongTypesFailsTheWholeLoadWith120) {
  Json::Value bad = FolderJson("/s/b", "d");
  bad["video"] = "yes";
  WriteFolders({FolderJson("/s/a", "d"), bad});
  EXPECT_NE(std::string::npos, LoadFailure(kErrorBadArgument).find("\"video\":\"yes\""));
  WriteFoldersText(R"([{"path": "/s/a"}])");
  EXPECT_EQ(0u, LoadFailure(kErrorBadArgument).rfind("Missing property: name", 0));
  WriteFoldersText(R"([["/s/a"]])");
  EXPECT_EQ(0u, LoadFailure(kErrorBadArgument).rfind("Not an object", 0));
}

TEST_F(FolderMgrStoreTest, TheThousandAndFirstFolderIsRefusedAndNeverSaved) {
  AddShareAt("s", "/volume1/s");
  std::vector<Json::Value> folders;
  for (int i = 0; i < 1000; ++i) folders.push_back(FolderJson("/s/f" + std::to_string(i), "d"));
  WriteFolders(folders);
  FolderMgr mgr;
  ASSERT_EQ(1000u, mgr.GetFolders().size());
  FolderPtr change;
  mgr.Upsert(change, MakeFolder("/s/f7", "dp"));  // replacing keeps the count
  EXPECT_EQ(1000u, mgr.GetFolders().size());
  LogCapture log;
  try {
    mgr.Upsert(change, MakeFolder("/s/new", "d"));
    FAIL() << "the 1001st folder was accepted";
  } catch (const Error& e) {
    EXPECT_EQ(kErrorTooManyFolders, e.code());
  }
  ASSERT_EQ(1u, log.Matching("Failed [folders_.size() > kFileIndexFoldersMax]").size());
  EXPECT_EQ(1001u, mgr.GetFolders().size());  // the appended entry counted
  EXPECT_EQ(1000u, ReadFolders().size());
  EXPECT_EQ(1000u, FolderMgr().GetFolders().size());
}

// A save that runs out of room leaves the old file whole and no temporary
// file behind. The child process writes under a file-size limit.
TEST_F(FolderMgrStoreTest, AFailedSaveNeverLeavesAHalfWrittenFile) {
  AddShareAt("s", "/volume1/s");
  WriteFolders({FolderJson("/s/a", "d")});
  const std::string before = ReadFolders().toStyledString();
  const pid_t pid = fork();
  ASSERT_LE(0, pid);
  if (pid == 0) {
    signal(SIGXFSZ, SIG_IGN);
    const rlimit limit{512, 512};
    setrlimit(RLIMIT_FSIZE, &limit);
    int status = 1;
    try {
      FolderMgr mgr;
      FolderPtr change;
      for (int i = 0; i < 20; ++i) mgr.Upsert(change, MakeFolder("/s/f" + std::to_string(i), "d"));
      mgr.Save();  // about 3 KB against a limit of 512 bytes
      status = 3;
    } catch (const Error& e) {
      status = e.code() == kErrorSaveJson ? 0 : 2;
    }
    _exit(status);
  }
  int status = 0;
  ASSERT_EQ(pid, waitpid(pid, &status, 0));
  ASSERT_TRUE(WIFEXITED(status));
  ASSERT_EQ(0, WEXITSTATUS(status)) << "expected the save to fail with 505";
  EXPECT_EQ(before, ReadFolders().toStyledString());
  EXPECT_EQ(std::vector<std::string>{"fileindex.folders"}, FilesInEtc());
}

}  // namespace
}  // namespace testing
}  // namespace orvex
