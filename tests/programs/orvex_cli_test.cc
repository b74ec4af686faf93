// Runs the built orvex tool, each test with its own ORVEX_ROOT, and checks
// what it prints, how it exits and what it leaves in the share registry, the
// status file and the folder configuration.
#include <stdlib.h>

#include <ctime>
#include <filesystem>
#include <sstream>

#include "programs/program_test.h"
#include "status/fileindexd_peer.h"

namespace orvex {
namespace testing {
namespace {

// The words of text, split at spaces.
std::vector<std::string> Words(const std::string& text) {
  std::vector<std::string> words;
  std::istringstream in(text);
  for (std::string word; in >> word;) words.push_back(word);
  return words;
}

class OrvexCliTest : public ProgramTest {
 protected:
  OrvexCliTest() : ProgramTest("orvex") {}
  void SetUp() override {
    ProgramTest::SetUp();
    std::filesystem::create_directories(root_.Join("srv/photo"));
  }
  std::string StatusPath() const { return root_.Join("var/packages/Orvex/etc/fileindex.status"); }
  void WriteStatus(const std::string& text) {
    Write("var/packages/Orvex/etc/fileindex.status", text);
  }
  Json::Value ReadStatus() const { return Parse(ReadFileText(StatusPath())); }
};

TEST_F(OrvexCliTest, HelpExitsZeroAndBadUsageExitsTwoChangingNothing) {
  const ProgramOutcome help = Run({"--help"});
  EXPECT_EQ(0, help.status);
  EXPECT_EQ(0u, help.out.find("usage: orvex")) << help.out;
  EXPECT_NE(std::string::npos, help.out.find("\n  share "));
  for (const char* words : {"", "frobnicate", "share add photo", "pause 1 2",
                            "folder list --offset -1", "folder list --limit 99999999999"}) {
    const ProgramOutcome outcome = Run(Words(words));
    EXPECT_EQ(2, outcome.status) << words;
    EXPECT_EQ(0u, outcome.err.find("orvex: ")) << words << ": " << outcome.err;
    EXPECT_NE(std::string::npos, outcome.err.find("usage: orvex")) << words;
  }
  const ProgramOutcome pause = Run({"pause", "-2"});
  EXPECT_EQ(2, pause.status);
  EXPECT_EQ("orvex: error 120: Pause length should NOT be negative\n", pause.err);
  EXPECT_FALSE(std::filesystem::exists(StatusPath()));
}

TEST_F(OrvexCliTest, ShareCommandsManageTheRegistry) {
  const std::string photo = root_.Join("srv/photo");
  ProgramOutcome add = Run({"share", "add", "my photo", photo, "--recycle-bin", "--readonly"});
  ASSERT_EQ(0, add.status) << add.err;
  add = Run({"share", "add", "video", "/srv/data/video", "--hide-unreadable", "--encryption"});
  ASSERT_EQ(0, add.status) << add.err;
  const std::vector<std::string> lines = SplitLines(Run({"share", "list"}).out);
  ASSERT_EQ(3u, lines.size());
  EXPECT_EQ(0u, lines[1].find("my photo  " + photo));
  // Columns line up: the settings start at the same offset on every line.
  const size_t settings = lines[0].find("SETTINGS");
  EXPECT_EQ("readonly,recycle-bin", lines[1].substr(settings));
  EXPECT_EQ("encryption,hide-unreadable", lines[2].substr(settings));

  // A relative path is made absolute; a second share of a name is refused.
  const std::filesystem::path previous = std::filesystem::current_path();
  std::filesystem::current_path(root_.Join("srv"));
  add = Run({"share", "add", "photo", "photo"});
  std::filesystem::current_path(previous);
  ASSERT_EQ(0, add.status) << add.err;
  EXPECT_EQ(2, Run({"share", "add", "photo", "/srv/other"}).status);
  EXPECT_EQ("orvex: error 800: ghost\n", Run({"share", "remove", "ghost"}).err);
  ASSERT_EQ(0, Run({"share", "remove", "my photo"}).status);
  const Json::Value shares = RunJson({"share", "list", "--json"});
  ASSERT_EQ(2u, shares.size());
  EXPECT_TRUE(shares[0]["hide_unreadable"].asBool());
  EXPECT_EQ(std::filesystem::canonical(photo).string(), shares[1]["path"].asString());
}

TEST_F(OrvexCliTest, StatusShowsThePauseAndEachSharesFlags) {
  EXPECT_EQ("indexing: running\n", Run({"status"}).out);
  EXPECT_EQ(Parse(R"({"state": "running", "resume_time": -1, "shares": {}})"),
            RunJson({"status", "--json"}));
  EXPECT_FALSE(std::filesystem::exists(StatusPath())) << "status must not create the file";

  WriteStatus(R"({"resume_time": 0, "share": {"photo": 1, "video": 0}})");
  const ProgramOutcome status = Run({"status"});
  EXPECT_EQ(0, status.status) << status.err;
  EXPECT_EQ("indexing: paused with no end\nphoto:    needs re-index\nvideo:    ok\n", status.out);
  EXPECT_TRUE(RunJson({"status", "--json"})["shares"]["photo"]["need_reindex"].asBool());
  WriteStatus(R"({"resume_time": 946728000})");
  EXPECT_EQ("indexing: paused until 2000-01-01 12:00:00 UTC (that time has passed)\n",
            Run({"status"}).out);
  WriteStatus("{ not json");
  const ProgramOutcome broken = Run({"status"});
  EXPECT_EQ(2, broken.status);
  EXPECT_EQ("orvex: error 504: Cannot load json: " + StatusPath() + "\n", broken.err);
}

TEST_F(OrvexCliTest, PauseSavesAndTellsTheDaemon) {
  std::filesystem::create_directories(root_.Join("var/run"));
  FileindexdPeer daemon(root_.Join("var/run/fileindexd.sock"));
  ASSERT_TRUE(daemon.listening());
  const int64_t earliest = static_cast<int64_t>(::time(nullptr)) + 3 * 3600;
  const ProgramOutcome pause = Run({"pause", "3"});
  const int64_t latest = static_cast<int64_t>(::time(nullptr)) + 3 * 3600;
  ASSERT_EQ(0, pause.status) << pause.err;
  EXPECT_EQ(0u, pause.out.find("indexing paused until ")) << pause.out;
  const int64_t stored = ReadStatus()["resume_time"].asInt64();
  EXPECT_LE(earliest, stored);
  EXPECT_GE(latest, stored);
  ASSERT_EQ(1u, daemon.requests().size());
  EXPECT_EQ("pause", daemon.requests()[0]["type"].asString());
  EXPECT_EQ(stored, daemon.requests()[0]["data"]["resume_time"].asInt64());
  EXPECT_TRUE(daemon.faults().empty());
}

// A socket file left behind by a daemon that died refuses at once.
TEST_F(OrvexCliTest, WithoutADaemonTheChangeIsSavedAndTheFailureExplained) {
  WriteStatus(R"({"resume_time": 0, "share": {"photo": 1}})");
  Write("var/run/fileindexd.sock", "");
  const ProgramOutcome resume = Run({"resume"});
  EXPECT_EQ(2, resume.status);
  EXPECT_EQ(0u, resume.err.find("orvex: indexing daemon not reachable (code 502: ")) << resume.err;
  EXPECT_NE(std::string::npos,
            resume.err.find("); the resume is saved and takes effect when it starts\n"))
      << resume.err;
  EXPECT_EQ(Parse(R"({"resume_time": -1, "share": {"photo": 1}})"), ReadStatus());
}

// `folder list` and `folder get` against a folder configuration, share
// registry, status file and share queue written directly.
class OrvexFolderCliTest : public OrvexCliTest {
 protected:
  void SetUp() override {
    OrvexCliTest::SetUp();
    const std::string share = root_.Join("volume1/photo");
    std::filesystem::create_directories(share + "/2024");
    std::filesystem::create_directories(share + "/Alben");
    Write("etc/orvex/shares.json", R"([{"name": "photo", "path": ")" + share + R"("}])");
    Write("var/packages/Orvex/etc/fileindex.folders", R"([
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

TEST_F(OrvexFolderCliTest, GetShowsOneFolderAndFailuresExitWithStatus2) {
  const ProgramOutcome text = Run({"folder", "get", "/photo/2024"});
  EXPECT_EQ(0, text.status);
  EXPECT_NE(std::string::npos, text.out.find("name:      zeta\n")) << text.out;
  EXPECT_NE(std::string::npos, text.out.find("photo:     yes\n")) << text.out;
  EXPECT_EQ("orvex: error 902: /photo/ALBEN/\n", Run({"folder", "get", "/photo/ALBEN/"}).err);
  const std::string folders = Write("var/packages/Orvex/etc/fileindex.folders", "[{");
  const ProgramOutcome broken = Run({"folder", "list"});
  EXPECT_EQ(2, broken.status);
  EXPECT_EQ("orvex: error 504: Cannot load json: " + folders + "\n", broken.err);
}

}  // namespace
}  // namespace testing
}  // namespace orvex
