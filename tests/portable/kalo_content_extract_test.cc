// Content extraction's file-system attributes of real files, directories and
// links, and of items that are not there; and metadata through the isolated
// extraction program, with the daemon running and without it, for files that
// crash, hang or exhaust memory in the parser (the program's test facility).
#include "kalo/kalo_content_extract.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <functional>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "kalo/kalo_error.h"
#include "orvex/portable/extract_protocol.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace KALO {
namespace CONTENT_EXTRACT {
namespace {

constexpr time_t kModified = 1600000000;  // 2020-09-13

class ContentExtractTest : public ::testing::Test {
 protected:
  // Sets the content change time to kModified.
  static void SetModified(const std::string& path) {
    const struct timespec times[2] = {{kModified, 0}, {kModified, 0}};
    ASSERT_EQ(0, ::utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW));
  }

  static std::set<std::string> Keys(const Json::Value& doc) {
    const std::vector<std::string> names = doc.getMemberNames();
    return std::set<std::string>(names.begin(), names.end());
  }

  // Every property but the creation date, which needs the file system's help.
  static std::set<std::string> AlwaysGiven() {
    return {"KALOMDPath",
            "KALOMDFSName",
            "KALOMDParent",
            "KALOMDExtension",
            "KALOMDIsDir",
            "KALOMDFSSize",
            "KALOMDPhysicalSize",
            "KALOMDOwnerUserID",
            "KALOMDOwnerGroupID",
            "KALOMDPrivilege",
            "KALOMDFSContentChangeDate",
            "KALOMDAttributeChangeDate"};
  }

  orvex::testing::TempDir dir_;
  const time_t started_ = ::time(nullptr);
};

TEST_F(ContentExtractTest, DescribesFilesDirectoriesAndLinksAsThemselves) {
  struct Case {
    const char* name;
    std::function<void(const std::string&)> make;
    bool is_dir;
    const char* extension;
    const char* privilege;
  };
  const std::vector<Case> cases = {
      {"Annual Report.PDF",
       [&](const std::string& p) {
         dir_.Write("Annual Report.PDF", "hello");
         ::chmod(p.c_str(), 0640);
       },
       false, "pdf", "0640"},
      {"photos.2024",
       [](const std::string& p) {
         ::mkdir(p.c_str(), 0700);
         ::chmod(p.c_str(), 02750);
       },
       true, "2024", "2750"},
      {"README",
       [&](const std::string& p) {
         dir_.Write("README", "");
         ::chmod(p.c_str(), 04755);
       },
       false, "", "4755"},
      // A link to a directory is a link, not the directory it names.
      {"to-dir.lnk", [&](const std::string& p) { ::symlink(dir_.path().c_str(), p.c_str()); },
       false, "lnk", "0777"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const std::string path = dir_.Join(c.name);
    c.make(path);
    SetModified(path);
    struct stat st;
    ASSERT_EQ(0, ::lstat(path.c_str(), &st));
    for (const bool need_meta : {false, true}) {
      Json::Value cfg;
      cfg["need_meta"] = need_meta;
      Json::Value doc;
      ASSERT_TRUE(ParseFile(path, cfg, doc));
      EXPECT_EQ(path, doc["KALOMDPath"].asString());
      EXPECT_EQ(c.name, doc["KALOMDFSName"].asString());
      EXPECT_EQ(dir_.path(), doc["KALOMDParent"].asString());
      EXPECT_EQ(c.extension, doc["KALOMDExtension"].asString());
      EXPECT_EQ(Json::Value(c.is_dir), doc["KALOMDIsDir"]);
      EXPECT_EQ(Json::Value(static_cast<Json::Int64>(st.st_size)), doc["KALOMDFSSize"]);
      EXPECT_EQ(static_cast<Json::Int64>(st.st_blocks) * 512, doc["KALOMDPhysicalSize"].asInt64());
      EXPECT_EQ(Json::Value(static_cast<Json::Int64>(kModified)), doc["KALOMDFSContentChangeDate"]);
      EXPECT_EQ(static_cast<Json::Int64>(st.st_ctime), doc["KALOMDAttributeChangeDate"].asInt64());
      EXPECT_EQ(std::to_string(::geteuid()), doc["KALOMDOwnerUserID"].asString());
      EXPECT_EQ(std::to_string(st.st_gid), doc["KALOMDOwnerGroupID"].asString());
      EXPECT_EQ(c.privilege, doc["KALOMDPrivilege"].asString());
      std::set<std::string> expected_keys = AlwaysGiven();
      // Where the file system records a birth time, it is the creation date:
      // the item was made during this test.
      if (doc.isMember("KALOMDFSCreationDate")) {
        expected_keys.insert("KALOMDFSCreationDate");
        EXPECT_TRUE(doc["KALOMDFSCreationDate"].isIntegral());
        EXPECT_GE(doc["KALOMDFSCreationDate"].asInt64(), started_ - 1);
        EXPECT_LE(doc["KALOMDFSCreationDate"].asInt64(), ::time(nullptr) + 1);
      }
      EXPECT_EQ(expected_keys, Keys(doc));
    }
  }
}

TEST_F(ContentExtractTest, ItemThatCannotBeExaminedFailsAndLeavesTheOutputAlone) {
  dir_.Write("file", "x");
  struct Case {
    std::string path;
    int error;
    int last_error;
  };
  const std::vector<Case> cases = {
      {dir_.Join("missing.txt"), ENOENT, KLIB_ERR_IO},
      {dir_.Join("file/below"), ENOTDIR, KLIB_ERR_IO},
      {"", EINVAL, KLIB_ERR_BAD_PARAMETER},
  };
  for (const Case& c : cases) {
    Json::Value doc = "untouched";
    KLIBCErrClear();
    errno = 0;
    EXPECT_FALSE(ParseFile(c.path, Json::Value(), doc)) << c.path;
    EXPECT_EQ(c.error, errno) << c.path;
    EXPECT_EQ(c.last_error, KLIBCErrGet()) << c.path;
    EXPECT_EQ(Json::Value("untouched"), doc) << c.path;
  }
}

// ---- Metadata through the extraction program ----------------------------

const char kProgramBuilt[] = ORVEX_BUILD_DIR "/kalocontentextractd";

Json::Value ReadJson(const std::string& path) {
  Json::Value value;
  Json::CharReaderBuilder builder;
  std::string errors;
  std::ifstream in(path);
  if (!in || !Json::parseFromStream(builder, in, &value, &errors)) return Json::Value();
  return value;
}

// A fresh ORVEX_ROOT whose /usr/kalo/bin/kalocontentextractd is a wrapper
// noting each one-shot run in a calls file before running the real program,
// with the test facility's faults on and short settings.
class IsolatedExtractTest : public ::testing::TestWithParam<bool> {
 protected:
  void SetUp() override {
    ASSERT_EQ(0, ::access(kProgramBuilt, X_OK)) << kProgramBuilt << " is not built";
    std::filesystem::create_directories(root_.Join("usr/kalo/bin"));
    InstallProgram("echo \"$3\" >> '" + root_.Join("calls") + "'\nexec '" + kProgramBuilt +
                   "' \"$@\"\n");
    ::setenv("ORVEX_EXTRACT_FAULTS", "1", 1);
    if (WithDaemon()) StartDaemon();
  }
  void TearDown() override {
    if (daemon_pid_ > 0) StopDaemon();
    ::unsetenv("ORVEX_EXTRACT_FAULTS");
  }
  bool WithDaemon() const { return GetParam(); }

  void InstallProgram(const std::string& body) {
    const std::string path = root_.Join("usr/kalo/bin/kalocontentextractd");
    root_.Write("usr/kalo/bin/kalocontentextractd", "#!/bin/sh\n" + body);
    ASSERT_EQ(0, ::chmod(path.c_str(), 0755));
  }

  // The real daemon, detached: the program returns once its socket is ready.
  void StartDaemon() {
    const orvex::testing::ProgramOutcome started = orvex::testing::RunProgram(
        kProgramBuilt, {"--workers", "1", "--deadline-ms", "300", "--memory-mb", "64"},
        {"ORVEX_ROOT=" + root_.path()}, io_.path());  // and the faults, while set here
    ASSERT_EQ(0, started.status) << started.err;
    daemon_pid_ =
        std::stoi(orvex::testing::ReadFileText(root_.Join("var/run/kalocontentextractd.pid")));
  }

  // SIGTERM, then wait for the daemon (not our child) to be gone.
  void StopDaemon() {
    const int pidfd = static_cast<int>(::syscall(SYS_pidfd_open, daemon_pid_, 0));
    ASSERT_GE(pidfd, 0);
    ASSERT_EQ(0, ::kill(daemon_pid_, SIGTERM));
    struct pollfd pfd = {pidfd, POLLIN, 0};
    EXPECT_EQ(1, ::poll(&pfd, 1, 10000));
    ::close(pidfd);
    EXPECT_NE(0, ::access(root_.Join("var/run/kalocontentextractd.sock").c_str(), F_OK));
  }

  Json::Value Parse(const std::string& path) {
    Json::Value cfg;
    cfg["need_meta"] = true;
    cfg["deadline_ms"] = 300;
    cfg["memory_mb"] = 64;
    Json::Value doc;
    EXPECT_TRUE(ParseFile(path, cfg, doc)) << path;
    return doc;
  }

  // One-shot runs so far, each named by its file.
  std::vector<std::string> Calls() const {
    return orvex::testing::SplitLines(orvex::testing::ReadFileText(root_.Join("calls")));
  }
  Json::Value Record() const {
    return ReadJson(root_.Join("var/lib/orvex/extract_failures.json"))["files"];
  }
  ino_t RecordInode() const {
    struct stat st;
    return ::stat(root_.Join("var/lib/orvex/extract_failures.json").c_str(), &st) == 0 ? st.st_ino
                                                                                       : 0;
  }
  // One-shot runs expected by now: none at all while the daemon serves.
  size_t Runs(size_t one_shot) const { return WithDaemon() ? 0 : one_shot; }

  orvex::testing::TempDir root_;
  orvex::testing::TempDir files_;
  orvex::testing::TempDir io_;
  orvex::testing::ScopedOrvexRoot scoped_root_{root_.path()};
  pid_t daemon_pid_ = -1;
};

TEST_P(IsolatedExtractTest, EachFaultGivesAttributesIsRecordedAndIsNotRetried) {
  size_t runs = 0;
  for (const char* name : {"song.crash", "movie.hang", "photo.hog"}) {
    const std::string path = files_.Write(name, "payload");
    const auto started = std::chrono::steady_clock::now();
    const Json::Value doc = Parse(path);
    const auto took = std::chrono::steady_clock::now() - started;
    // Well inside the default deadline: the short setting was used.
    EXPECT_LT(took, std::chrono::milliseconds(orvex::portable::kDefaultExtractDeadlineMs)) << name;
    EXPECT_EQ(name, doc["KALOMDFSName"].asString());
    EXPECT_EQ(7, doc["KALOMDFSSize"].asInt64()) << name;
    const Json::Value entry = Record()[path];
    EXPECT_EQ(7u, entry["size"].asUInt64()) << name;
    EXPECT_FALSE(entry["reason"].asString().empty()) << name;
    EXPECT_EQ(Runs(++runs), Calls().size()) << name;

    const ino_t recorded = RecordInode();
    EXPECT_EQ(name, Parse(path)["KALOMDFSName"].asString());
    EXPECT_EQ(recorded, RecordInode()) << name << ": tried again";
    EXPECT_EQ(Runs(runs), Calls().size()) << name << ": tried again";
  }
  EXPECT_NE(std::string::npos,
            Record()[files_.Join("movie.hang")]["reason"].asString().find("deadline of 300 ms"));
}

TEST_P(IsolatedExtractTest, ChangedFileIsTriedAgainAndForgottenOnceItExtracts) {
  const std::string path = files_.Write("clip.crash", "abc");
  Parse(path);
  ASSERT_EQ(3u, Record()[path]["size"].asUInt64());
  files_.Write("clip.crash", "abcdef");
  Parse(path);
  EXPECT_EQ(6u, Record()[path]["size"].asUInt64());
  EXPECT_EQ(Runs(2), Calls().size());

  ::unsetenv("ORVEX_EXTRACT_FAULTS");  // the next version of the file is fine
  if (WithDaemon()) {
    StopDaemon();
    StartDaemon();
  }
  files_.Write("clip.crash", "abcdefgh");
  EXPECT_EQ(8, Parse(path)["KALOMDFSSize"].asInt64());
  EXPECT_FALSE(Record().isMember(path));
}

TEST_P(IsolatedExtractTest, NextNormalFileExtractsAfterEachFault) {
  for (const char* name : {"a.crash", "b.hang", "c.hog"}) {
    Parse(files_.Write(name, "x"));
    const std::string normal = files_.Write(std::string(name) + ".txt", "plain text\n");
    EXPECT_EQ(11, Parse(normal)["KALOMDFSSize"].asInt64());
    EXPECT_FALSE(Record().isMember(normal)) << normal;
  }
  EXPECT_EQ(3u, Record().size());
  EXPECT_EQ(Runs(6), Calls().size());
}

// The text reaches the caller byte for byte, whichever way it travels, and
// one request after another is answered.
TEST_P(IsolatedExtractTest, TextBeyondAsciiArrivesUnchanged) {
  const std::string words =
      "Gr\xc3\xb6\xc3\x9f"
      "e \"caf\xc3\xa9\" \xe4\xbc\x9a\xe8\xad\xb0 back\\slash";
  for (int i = 0; i < 3; ++i) {
    const std::string name = "note" + std::to_string(i) + ".txt";
    const Json::Value doc = Parse(files_.Write(name, words + "\n"));
    EXPECT_EQ(name, doc["KALOMDFSName"].asString());
    EXPECT_NE(std::string::npos, doc["KALOMDTextContent"].asString().find(words)) << doc;
  }
  EXPECT_EQ(Runs(3), Calls().size());
}

TEST_P(IsolatedExtractTest, FifoAndLinkToDevZeroGiveAttributesUnopened) {
  const std::string fifo = files_.Join("pipe.hang");
  ASSERT_EQ(0, ::mkfifo(fifo.c_str(), 0600));
  const std::string link = files_.Join("zero.hog");
  ASSERT_EQ(0, ::symlink("/dev/zero", link.c_str()));
  EXPECT_EQ("pipe.hang", Parse(fifo)["KALOMDFSName"].asString());
  EXPECT_EQ("zero.hog", Parse(link)["KALOMDFSName"].asString());
  EXPECT_EQ(0u, Calls().size());
  EXPECT_TRUE(Record().isNull());
}

INSTANTIATE_TEST_SUITE_P(DaemonOrOneShot, IsolatedExtractTest, ::testing::Bool(),
                         [](const ::testing::TestParamInfo<bool>& param) {
                           return param.param ? "WithDaemon" : "OneShot";
                         });

// The one-shot program's protocol, seen from the caller: its properties are
// merged under the attributes, which always win.
TEST_F(ContentExtractTest, MetadataIsMergedUnderTheAttributes) {
  orvex::testing::TempDir root;
  orvex::testing::ScopedOrvexRoot scoped(root.path());
  std::filesystem::create_directories(root.Join("usr/kalo/bin"));
  const std::string program =
      root.Write("usr/kalo/bin/kalocontentextractd",
                 "#!/bin/sh\necho '{\"KALOMDTitle\": \"Title\", \"KALOMDFSName\": \"forged\"}'\n");
  ASSERT_EQ(0, ::chmod(program.c_str(), 0755));
  const std::string path = dir_.Write("doc.pdf", "%PDF");
  Json::Value cfg;
  cfg["need_meta"] = true;
  Json::Value doc;
  ASSERT_TRUE(ParseFile(path, cfg, doc));
  EXPECT_EQ("Title", doc["KALOMDTitle"].asString());
  EXPECT_EQ("doc.pdf", doc["KALOMDFSName"].asString());
  cfg["need_meta"] = false;
  ASSERT_TRUE(ParseFile(path, cfg, doc));
  EXPECT_FALSE(doc.isMember("KALOMDTitle"));
}

TEST_F(ContentExtractTest, MissingProgramLeavesTheAttributesAndRecordsNothing) {
  orvex::testing::TempDir root;
  orvex::testing::ScopedOrvexRoot scoped(root.path());
  const std::string path = dir_.Write("song.mp3", "ID3");
  Json::Value cfg;
  cfg["need_meta"] = true;
  Json::Value doc;
  ASSERT_TRUE(ParseFile(path, cfg, doc));
  EXPECT_EQ("song.mp3", doc["KALOMDFSName"].asString());
  EXPECT_NE(0, ::access(root.Join("var/lib/orvex/extract_failures.json").c_str(), F_OK));
}

}  // namespace
}  // namespace CONTENT_EXTRACT
}  // namespace KALO
