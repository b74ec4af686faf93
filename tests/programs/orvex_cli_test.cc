// Runs the built orvex tool, each test with its own ORVEX_ROOT, and checks
// what it prints, how it exits and what it leaves in the share registry, the
// status file and the folder configuration.
#include <gmock/gmock.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <climits>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <sstream>

#include "orvex/version.h"
#include "support/framed_client.h"
#include "support/framed_peer.h"
#include "support/program_test.h"

namespace orvex {
namespace testing {
namespace {

namespace fs = std::filesystem;

constexpr char kStatusRel[] = "var/packages/Orvex/etc/fileindex.status";
constexpr char kFoldersRel[] = "var/packages/Orvex/etc/fileindex.folders";
constexpr char kRegistryRel[] = "etc/orvex/shares.json";
constexpr char kSocketRel[] = "var/run/fileindexd.sock";
constexpr char kLinkStep[] =
    "; put the file itself in place of the link (every save replaces the file whole and would "
    "cut the link)";
constexpr char kOverlapStep[] =
    "; shares may not overlap: pick a directory outside every other share";

// text with every "{root}" replaced by root.
std::string WithRoot(std::string text, const std::string& root) {
  for (size_t at; (at = text.find("{root}")) != std::string::npos;) text.replace(at, 6, root);
  return text;
}

class OrvexCliTest : public ProgramTest {
 protected:
  OrvexCliTest() : ProgramTest("orvex") {}
  void SetUp() override {
    ProgramTest::SetUp();
    fs::create_directories(root_.Join("srv/photo/2024"));
  }
  std::string Path(const std::string& rel) const { return root_.Join(rel); }
  std::string StatusPath() const { return Path(kStatusRel); }
  void WriteStatus(const std::string& text) { Write(kStatusRel, text); }
  Json::Value ReadStatus() const { return Parse(ReadFileText(StatusPath())); }
  // Runs args with "{root}" in them and in expected_err replaced; checks the
  // exit status and standard error, and that nothing went to standard output.
  void ExpectFailure(const std::vector<std::string>& args, const std::string& expected_err) {
    std::vector<std::string> rooted;
    std::string shown;
    for (const std::string& arg : args) {
      rooted.push_back(WithRoot(arg, root_.path()));
      shown += " [" + arg + "]";
    }
    const ProgramOutcome outcome = Run(rooted);
    EXPECT_EQ(2, outcome.status) << shown;
    EXPECT_EQ(WithRoot(expected_err, root_.path()), outcome.err) << shown;
    EXPECT_EQ("", outcome.out) << shown;
  }
  // A socket file that nothing listens on, as a daemon that died leaves it.
  void MakeStaleSocket(const std::string& path) {
    fs::create_directories(fs::path(path).parent_path());
    const FileDescriptor fd(::socket(AF_UNIX, SOCK_STREAM, 0));
    const sockaddr_un address = UnixAddress(path);
    EXPECT_EQ(0, ::bind(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)));
  }
};

// Bad usage ends with the usage of the command at fault.
TEST_F(OrvexCliTest, EveryBadCommandLineGetsItsOwnMessageAndStatus2ChangingNothing) {
  ASSERT_EQ(0, Run({"share", "add", "photo", Path("srv/photo")}).status);
  Write("srv/file", "not a directory");
  fs::create_directory_symlink(Path("srv/photo"), Path("srv/link"));
  const std::string registry = ReadFileText(Path(kRegistryRel));
  const struct {
    std::vector<std::string> args;
    std::string message;  // after "orvex: error "
    const char* usage;    // the usage's first line when it follows, else nullptr
  } cases[] = {
      {{}, "120: missing command", "usage: orvex COMMAND"},
      {{"frobnicate"}, "120: unknown command \"frobnicate\"", "usage: orvex COMMAND"},
      {{"--bogus"}, "120: unknown option \"--bogus\"", "usage: orvex COMMAND"},
      {{"share"},
       "120: missing share subcommand (add, list, remove, pause, resume, forget, rename, migrate "
       "or check-recycle)",
       "usage: orvex share add"},
      {{"share", "move"},
       "120: unknown share subcommand \"move\" (add, list, remove, pause, resume, forget, "
       "rename, migrate or check-recycle)",
       "usage: orvex share add"},
      {{"share", "add", "music"}, "120: missing PATH", "usage: orvex share add"},
      {{"share", "add", "music", "{root}/srv", "--ro"},
       "120: unknown option \"--ro\"",
       "usage: orvex share add"},
      {{"share", "add",
        "a\x01"
        "b",
        "{root}/srv/x"},
       "120: share \"a\\x01b\": the name contains the control character U+0001",
       nullptr},
      {{"share", "add",
        "a\xFF"
        "b",
        "{root}/srv/x"},
       "120: share \"a\\xFFb\": the name is not valid UTF-8 (byte 0xFF at offset 1)",
       nullptr},
      {{"share", "add", "a/b", "{root}/srv/x"},
       "120: share \"a/b\": the name contains \"/\"",
       nullptr},
      {{"share", "add", "music", "{root}/srv/none"},
       "120: share path {root}/srv/none does not exist; create the directory first, or give the "
       "share's existing root",
       nullptr},
      {{"share", "add", "music", "{root}/srv/file/music"},
       "120: share path {root}/srv/file/music does not exist (a component of it is not a "
       "directory); create the directory first, or give the share's existing root",
       nullptr},
      {{"share", "add", "music", "{root}/srv/file"},
       "120: share path {root}/srv/file is not a directory; a share's root is a directory",
       nullptr},
      {{"share", "add", "photo", "{root}/srv"},
       "120: share \"photo\" exists already, at {root}/srv/photo; pick another name, or remove "
       "it first: orvex share remove photo",
       nullptr},
      {{"share", "add", "again", "{root}/srv/photo/"},
       "120: share path {root}/srv/photo is already the path of share \"photo\" "
       "({root}/srv/photo)" +
           std::string(kOverlapStep),
       nullptr},
      {{"share", "add", "year", "{root}/srv/photo/2024"},
       "120: share path {root}/srv/photo/2024 lies inside share \"photo\" ({root}/srv/photo)" +
           std::string(kOverlapStep),
       nullptr},
      {{"share", "add", "all", "{root}/srv"},
       "120: share path {root}/srv contains share \"photo\" ({root}/srv/photo)" +
           std::string(kOverlapStep),
       nullptr},
      {{"share", "add", "linked", "{root}/srv/link"},
       "120: share path {root}/srv/link is already the path of share \"photo\" "
       "({root}/srv/photo) once symbolic links are followed" +
           std::string(kOverlapStep),
       nullptr},
      {{"share", "remove", "ghost"},
       "800: no share is called \"ghost\" in {root}/etc/orvex/shares.json; see the registered "
       "shares: orvex share list",
       nullptr},
      {{"share", "list", "extra"}, "120: unexpected argument \"extra\"", "usage: orvex share list"},
      {{"status", "--all"}, "120: unknown option \"--all\"", "usage: orvex status"},
      {{"pause", "1", "2"}, "120: unexpected argument \"2\"", "usage: orvex pause"},
      {{"pause", "soon"},
       "120: HOURS must be a whole number of hours, not \"soon\"",
       "usage: orvex pause"},
      {{"pause", "-2"},
       "120: Pause length should NOT be negative; give HOURS as 0 (no end) or more",
       nullptr},
      {{"resume", "now"}, "120: unexpected argument \"now\"", "usage: orvex resume"},
      {{"folder", "list", "--sort-by", "size"},
       "120: unknown sort key \"size\"; use one of: path, name, document, audio, video, photo",
       "usage: orvex folder list"},
      {{"folder", "list", "--sort-by"},
       "120: missing value after --sort-by",
       "usage: orvex folder list"},
      {{"folder", "list", "--offset", "-1"},
       "120: --offset must be a whole number from 0 to 4294967295, not \"-1\"",
       "usage: orvex folder list"},
      {{"folder", "list", "--limit", "99999999999"},
       "120: --limit must be a whole number from 0 to 4294967295, not \"99999999999\"",
       "usage: orvex folder list"},
      {{"folder", "get"}, "120: missing PATH", "usage: orvex folder get"},
      {{"folder", "get", "/photo/x"},
       "902: /photo/x is not an indexed folder (the path must match exactly, letter case and "
       "slashes included); see them all: orvex folder list",
       nullptr},
  };
  for (const auto& c : cases) {
    if (c.usage == nullptr) {
      ExpectFailure(c.args, "orvex: error " + c.message + "\n");
      continue;
    }
    const ProgramOutcome outcome = Run(c.args);
    const std::vector<std::string> lines = SplitLines(outcome.err);
    EXPECT_EQ(2, outcome.status) << c.message;
    ASSERT_LE(2u, lines.size()) << c.message;
    EXPECT_EQ("orvex: error " + c.message, lines[0]);
    EXPECT_EQ(0u, lines[1].rfind(c.usage, 0)) << c.message << ": " << lines[1];
  }
  EXPECT_EQ(registry, ReadFileText(Path(kRegistryRel)));
  EXPECT_FALSE(fs::exists(StatusPath()));
  EXPECT_FALSE(fs::exists(Path(kFoldersRel)));
}

TEST_F(OrvexCliTest, EveryCommandHasHelpAndTheToolAVersion) {
  for (const std::string line :
       {"--help", "share --help", "share add --help", "share list --help", "share remove --help",
        "status --help", "pause --help", "resume --help", "folder --help", "folder list --help",
        "folder get --help", "pause 5 --help"}) {
    std::vector<std::string> args;
    std::istringstream words(line);
    for (std::string word; words >> word;) args.push_back(word);
    const ProgramOutcome help = Run(args);
    EXPECT_EQ(0, help.status) << line;
    EXPECT_EQ(0u, help.out.find("usage: orvex " + (args[0] == "--help" ? "" : args[0])))
        << help.out;
    EXPECT_EQ("", help.err);
  }
  EXPECT_NE(std::string::npos, Run({"pause", "--help"}).out.find("exits with status 0"));
  const ProgramOutcome version = Run({"--version"});
  EXPECT_EQ(0, version.status);
  EXPECT_EQ(std::string("orvex ") + ORVEX_VERSION + "\n", version.out);
  EXPECT_FALSE(fs::exists(StatusPath()));
}

TEST_F(OrvexCliTest, ShareCommandsManageTheRegistryAlignedByDisplayWidth) {
  fs::create_directories(Path("srv/music"));
  fs::create_directories(Path("srv/photos"));  // beside srv/photo, not inside it
  ProgramOutcome add =
      Run({"share", "add", "写真", Path("srv/photo"), "--recycle-bin", "--readonly"});
  ASSERT_EQ(0, add.status) << add.err;
  EXPECT_EQ("added share 写真 at " + Path("srv/photo") +
                "\nnote: 写真 is read-only, and read-only shares are never indexed\n",
            add.out);
  add = Run({"share", "add", "Musik", Path("srv/music/"), "--hide-unreadable", "--encryption"});
  ASSERT_EQ(0, add.status) << add.err;
  EXPECT_EQ("added share Musik at " + Path("srv/music") + "\n", add.out);
  // A relative path is made absolute from the current directory.
  const fs::path previous = fs::current_path();
  fs::current_path(Path("srv"));
  add = Run({"share", "add", "photos", "photos"});
  fs::current_path(previous);
  ASSERT_EQ(0, add.status) << add.err;

  // "写真" takes four columns (in six bytes), as many as "NAME".
  const std::string gap(Path("srv/photos").size() - 4, ' ');
  EXPECT_EQ("NAME    PATH" + gap + "  SETTINGS\n" + "写真    " + Path("srv/photo") +
                "   readonly,recycle-bin\n" + "Musik   " + Path("srv/music") +
                "   encryption,hide-unreadable\n" + "photos  " +
                fs::canonical(Path("srv/photos")).string() + "  -\n",
            Run({"share", "list"}).out);
  ASSERT_EQ(0, Run({"share", "remove", "写真"}).status);
  const Json::Value shares = RunJson({"share", "list", "--json"});
  ASSERT_EQ(2u, shares.size());
  EXPECT_TRUE(shares[0]["hide_unreadable"].asBool());
  EXPECT_EQ(Path("srv/music"), shares[0]["path"].asString());
}

TEST_F(OrvexCliTest, StatusShowsThePauseAndEachSharesFlags) {
  EXPECT_EQ("indexing: running\ndaemons: none running (start them: orvex up)\n",
            Run({"status"}).out);
  EXPECT_EQ(Parse(R"({"state": "running", "resume_time": -1, "shares": {}})"),
            RunJson({"status", "--json"}));
  EXPECT_FALSE(fs::exists(StatusPath())) << "status must not create the file";

  WriteStatus(R"({"resume_time": 0, "share": {"photo": 1, "写真": 0}})");
  const ProgramOutcome status = Run({"status"});
  EXPECT_EQ(0, status.status) << status.err;
  EXPECT_EQ(
      "indexing: paused with no end\nphoto:    needs re-index\n写真:     ok\ndaemons: none running "
      "(start them: orvex up)\n",
      status.out);
  EXPECT_TRUE(RunJson({"status", "--json"})["shares"]["photo"]["need_reindex"].asBool());
  WriteStatus(R"({"resume_time": 946728000})");
  EXPECT_EQ(
      "indexing: paused until 2000-01-01 12:00:00 UTC (that time has passed)\ndaemons: none "
      "running (start them: orvex up)\n",
      Run({"status"}).out);
}

TEST_F(OrvexCliTest, BrokenStateFilesAreNamedWithTheCauseAndTheNextStep) {
  const struct {
    const char* rel;
    const char* text;
    std::vector<std::string> args;
    std::string message;  // after "orvex: error "
  } cases[] = {
      {kStatusRel,
       "{ not json",
       {"status"},
       "504: Cannot load json: {root}/var/packages/Orvex/etc/fileindex.status is not valid JSON; "
       "repair it, or move it away: indexing then counts as running, with no share flags"},
      {kStatusRel,
       "[1]",
       {"pause"},
       "504: Cannot load json: {root}/var/packages/Orvex/etc/fileindex.status holds JSON that is "
       "not an object; repair it, or move it away: indexing then counts as running, with no "
       "share flags"},
      {kStatusRel,
       R"({"resume_time": "soon"})",
       {"status"},
       "120: Not a string, data={\"resume_time\":\"soon\"} (in the status file "
       "{root}/var/packages/Orvex/etc/fileindex.status); repair it: \"resume_time\" holds an "
       "integer and \"share\" an object of unsigned integers"},
      {kFoldersRel,
       "[{",
       {"folder", "list"},
       "504: Cannot load json: {root}/var/packages/Orvex/etc/fileindex.folders is not valid "
       "JSON; repair it (moving it away would leave no folder indexed)"},
      {kRegistryRel,
       R"([{"name": "a"}])",
       {"share", "list"},
       "504: share registry: {root}/etc/orvex/shares.json: share [0]: key \"path\" is missing; "
       "correct the file by hand (its format is described in doc/share_registry.md)"},
  };
  for (const auto& c : cases) {
    Write(c.rel, c.text);
    ExpectFailure(c.args, "orvex: error " + c.message + "\n");
    EXPECT_EQ(c.text, ReadFileText(Path(c.rel)));
    fs::remove(Path(c.rel));
  }
}

// A link or a directory where a state or registry file belongs is named as
// such by the commands that read it and by those that would save it, and is
// left in place.
TEST_F(OrvexCliTest, LinkedOrDirectoryStateFilesAreReportedAndKept) {
  Write("elsewhere/real", "{}");
  const struct {
    const char* rel;
    std::vector<std::vector<std::string>> commands;
    std::string prefix;  // of the reason, before the file's path
  } files[] = {
      {kStatusRel, {{"status"}, {"pause", "2"}, {"resume"}}, "504: Cannot load json: "},
      {kFoldersRel, {{"folder", "list"}, {"folder", "get", "/photo"}}, "504: Cannot load json: "},
      {kRegistryRel,
       {{"share", "list"}, {"share", "add", "photo", "{root}/srv/photo"}},
       "504: share registry: "},
  };
  for (const auto& file : files) {
    const std::string path = Path(file.rel);
    fs::create_directories(fs::path(path).parent_path());
    for (const bool directory : {false, true}) {
      if (directory) {
        fs::create_directory(path);
      } else {
        fs::create_symlink(Path("elsewhere/real"), path);
      }
      const std::string what = directory ? " is a directory; move the directory out of the way"
                                         : std::string(" is a symbolic link") + kLinkStep;
      for (const auto& args : file.commands) {
        ExpectFailure(args, "orvex: error " + file.prefix + path + what + "\n");
      }
      EXPECT_EQ(directory ? fs::file_type::directory : fs::file_type::symlink,
                fs::symlink_status(path).type());
      fs::remove(path);
    }
  }
  EXPECT_EQ("{}", ReadFileText(Path("elsewhere/real")));
}

TEST_F(OrvexCliTest, PauseSavesAndTellsTheDaemon) {
  fs::create_directories(Path("var/run"));
  FramedPeer daemon(Path(kSocketRel));
  ASSERT_TRUE(daemon.listening());
  const int64_t earliest = static_cast<int64_t>(::time(nullptr)) + 3 * 3600;
  const ProgramOutcome pause = Run({"pause", "3"});
  const int64_t latest = static_cast<int64_t>(::time(nullptr)) + 3 * 3600;
  ASSERT_EQ(0, pause.status) << pause.err;
  EXPECT_EQ(0u, pause.out.find("indexing paused until ")) << pause.out;
  EXPECT_EQ(std::string::npos, pause.out.find("not running")) << pause.out;
  const int64_t stored = ReadStatus()["resume_time"].asInt64();
  EXPECT_LE(earliest, stored);
  EXPECT_GE(latest, stored);
  ASSERT_EQ(1u, daemon.requests().size());
  EXPECT_EQ("pause", daemon.requests()[0]["type"].asString());
  EXPECT_EQ(stored, daemon.requests()[0]["data"]["resume_time"].asInt64());
  EXPECT_TRUE(daemon.faults().empty());
}

// No socket, a file that is not one, or a socket nobody listens on: the
// change is saved and the command says the daemon is not running.
TEST_F(OrvexCliTest, WithoutADaemonTheChangeIsSavedAndSaidSo) {
  const std::string socket = Path(kSocketRel);
  const struct {
    const char* setup;
    std::string why;
  } cases[] = {
      {"none", "no socket at " + socket},
      {"file", socket + " is not a socket"},
      {"stale", "nothing listens on " + socket},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.setup);
    fs::remove(socket);
    if (std::string(c.setup) == "file") Write(kSocketRel, "");
    if (std::string(c.setup) == "stale") MakeStaleSocket(socket);
    WriteStatus(R"({"resume_time": -1, "share": {"photo": 1}})");
    const ProgramOutcome pause = Run({"pause"});
    EXPECT_EQ(0, pause.status) << pause.err;
    EXPECT_EQ("indexing paused with no end\nthe indexing daemon is not running (" + c.why +
                  "); the pause is saved and takes effect when it starts\n",
              pause.out);
    EXPECT_EQ("", pause.err);
    EXPECT_EQ(Parse(R"({"resume_time": 0, "share": {"photo": 1}})"), ReadStatus());
    const ProgramOutcome resume = Run({"resume"});
    EXPECT_EQ(0, resume.status) << resume.err;
    EXPECT_EQ("indexing running\nthe indexing daemon is not running (" + c.why +
                  "); the resume is saved and takes effect when it starts\n",
              resume.out);
    EXPECT_EQ(Parse(R"({"resume_time": -1, "share": {"photo": 1}})"), ReadStatus());
  }
}

// The status file keeps the end of a pause in 32 bits. The longest pause
// the tool offers must be stored as it is, past now, and one hour more
// must be refused before anything is saved.
TEST_F(OrvexCliTest, APauseEndingPast2038IsRefusedAndTheLongestOfferedFits) {
  for (const std::string hours : {"1000000", "99999999999999999999"}) {
    const ProgramOutcome refused = Run({"pause", hours});
    EXPECT_EQ(2, refused.status);
    const std::string start = "orvex: error 120: a pause of " + hours +
                              " hours would end after 2038-01-19 03:14:07 UTC, the latest end of "
                              "a pause the status file can hold; pause for at most ";
    EXPECT_EQ(0u, refused.err.find(start)) << refused.err;
    EXPECT_NE(std::string::npos, refused.err.find(" hours, or with no end: orvex pause 0\n"));
  }
  EXPECT_FALSE(fs::exists(StatusPath()));
  long long offered = 0;
  const std::string err = Run({"pause", "1000000"}).err;
  ASSERT_EQ(1, std::sscanf(err.c_str() + err.find("at most ") + 8, "%lld", &offered)) << err;
  const ProgramOutcome over = Run({"pause", std::to_string(offered + 1)});
  EXPECT_EQ(2, over.status) << over.out;
  EXPECT_FALSE(fs::exists(StatusPath()));
  // The offer may shrink by an hour while the test runs, never by two.
  const int64_t now = static_cast<int64_t>(::time(nullptr));
  const ProgramOutcome longest = Run({"pause", std::to_string(offered - 1)});
  ASSERT_EQ(0, longest.status) << longest.err;
  const int64_t stored = ReadStatus()["resume_time"].asInt64();
  EXPECT_GE(stored, now + (offered - 1) * 3600);
  EXPECT_LE(stored, static_cast<int64_t>(INT32_MAX));
}

// `folder list` and `folder get` against a folder configuration, share
// registry, status file and share queue written directly.
class OrvexFolderCliTest : public OrvexCliTest {
 protected:
  void SetUp() override {
    OrvexCliTest::SetUp();
    const std::string share = Path("volume1/photo");
    fs::create_directories(share + "/2024");
    fs::create_directories(share + "/Alben");
    Write(kRegistryRel, R"([{"name": "photo", "path": ")" + share + R"("}])");
    Write(kFoldersRel, R"([
      {"path": "/photo/2024", "name": "zeta", "document": false, "audio": false,
       "video": true, "photo": true, "paused": false, "volume_to_be_clean": ""},
      {"path": "/photo/alben", "name": "Ärger", "document": true, "audio": true,
       "video": true, "photo": false, "paused": true},
      {"path": "/photo/Alben", "name": "beta", "document": true, "audio": false,
       "video": false, "photo": true}])");
    WriteStatus(R"({"resume_time": -1})");
    Write("volume1/photo/@eaDir/@fileindex/queue",
          R"({"event": 64, "is_dir": false, "path": ")" + share + "/2024/a.jpg\"}\n");
  }
  static std::vector<std::string> Column(const Json::Value& reply, const std::string& key) {
    std::vector<std::string> values;
    for (const Json::Value& folder : reply["folder"]) values.push_back(folder[key].asString());
    return values;
  }
};

TEST_F(OrvexFolderCliTest, ListIsTheWebApiReplyWithPagingSortAndStatus) {
  const Json::Value page = RunJson(
      {"folder", "list", "--json", "--sort-by", "name", "--desc", "--offset=1", "--limit", "1"});
  EXPECT_EQ(3u, page["total"].asUInt());
  EXPECT_EQ(1u, page["offset"].asUInt());
  // Descending by folded name: "ärger" after "zeta" by code point, so Ärger, zeta, beta.
  EXPECT_EQ(std::vector<std::string>{"zeta"}, Column(page, "name"));
  EXPECT_FALSE(page["folder"][0].isMember("additional"));

  const Json::Value status = RunJson({"folder", "list", "--json", "--status", "--sort-by", "name"});
  std::vector<std::string> texts;
  for (const Json::Value& folder : status["folder"]) {
    texts.push_back(folder["additional"]["status"]["text"].asString());
  }
  // beta: nothing queued; zeta (/photo/2024): one event; Ärger: no such directory.
  EXPECT_EQ((std::vector<std::string>{"finished", "processing", "error"}), texts);

  const ProgramOutcome run = Run({"folder", "list", "--status", "--sort-by", "photo"});
  ASSERT_EQ(0, run.status) << run.err;
  const std::vector<std::string> rows = SplitLines(run.out);
  ASSERT_EQ(4u, rows.size()) << run.out;
  // Photo off first; every column starts where its header does.
  EXPECT_EQ(0u, rows[1].find("/photo/alben  Ärger  yes       yes    yes    no     yes     error "
                             "(invalid_path)"))
      << run.out;
  EXPECT_EQ(rows[0].find("STATUS"), rows[2].find_first_of("fp", 40)) << rows[2];
}

// Wide CJK characters take two columns and combining marks none, so the
// columns after them start where their headers do on the screen.
TEST_F(OrvexFolderCliTest, ColumnsAlignByDisplayWidth) {
  Write(kFoldersRel, R"([
    {"path": "/photo/アルバム", "name": "写真", "document": false, "audio": false,
     "video": false, "photo": true, "paused": true},
    {"path": "/photo/a", "name": "A\u0308rger", "document": true, "audio": false,
     "video": false, "photo": false, "paused": false},
    {"path": "/photo/b", "name": "beta", "document": false, "audio": true,
     "video": false, "photo": false, "paused": false}])");
  const ProgramOutcome run = Run({"folder", "list"});
  ASSERT_EQ(0, run.status) << run.err;
  EXPECT_EQ(
      "PATH             NAME   DOCUMENT  AUDIO  VIDEO  PHOTO  PAUSED\n"
      "/photo/a         A\u0308rger  yes       no     no     no     no\n"
      "/photo/b         beta   no        yes    no     no     no\n"
      "/photo/アルバム  写真   no        no     no     yes    yes\n",
      run.out);
}

TEST_F(OrvexFolderCliTest, GetShowsOneFolder) {
  const ProgramOutcome text = Run({"folder", "get", "/photo/2024"});
  EXPECT_EQ(0, text.status);
  EXPECT_NE(std::string::npos, text.out.find("name:      zeta\n")) << text.out;
  EXPECT_NE(std::string::npos, text.out.find("photo:     yes\n")) << text.out;
  EXPECT_EQ(Parse(R"({"path": "/photo/2024", "name": "zeta", "document": false, "audio": false,
      "video": true, "photo": true, "paused": false, "volume_to_be_clean": ""})"),
            RunJson({"folder", "get", "/photo/2024", "--json"}));
}

}  // namespace
}  // namespace testing
}  // namespace orvex
