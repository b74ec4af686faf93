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
  std::string SocketPath() {
    std::filesystem::create_directories(root_.Join("var/run"));
    return root_.Join("var/run/fileindexd.sock");
  }
};

TEST_F(OrvexCliTest, HelpExitsZeroAndBadUsageExitsTwoChangingNothing) {
  for (const char* words :
       {"--help", "share --help", "share add --help", "share list --help", "share remove --help",
        "status --help", "pause --help", "resume --help", "folder --help"}) {
    const ProgramOutcome help = Run(Words(words));
    EXPECT_EQ(0, help.status) << words;
    EXPECT_EQ(0u, help.out.find("usage: orvex")) << words << ": " << help.out;
    EXPECT_EQ("", help.err) << words;
  }
  EXPECT_NE(std::string::npos, Run({"--help"}).out.find("\n  share "));

  for (const char* words :
       {"", "frobnicate", "share", "share add photo", "share add photo /srv/photo --colour",
        "share list extra", "status --verbose", "pause soon", "pause 1 2", "resume now",
        "folder list --limit", "folder list --offset -1", "folder list --limit 99999999999",
        "folder get", "folder rename"}) {
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
  EXPECT_EQ(0u, lines[0].find("NAME      PATH"));
  EXPECT_EQ(0u, lines[1].find("my photo  " + photo));
  EXPECT_EQ(0u, lines[2].find("video     /srv/data/video"));
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
  const ProgramOutcome again = Run({"share", "add", "photo", "/srv/other", "--readonly"});
  EXPECT_EQ(2, again.status);
  EXPECT_EQ(0u, again.err.find("orvex: ")) << again.err;
  EXPECT_NE(std::string::npos, again.err.find("photo")) << again.err;
  const ProgramOutcome unknown = Run({"share", "remove", "ghost"});
  EXPECT_EQ(2, unknown.status);
  EXPECT_EQ("orvex: error 800: ghost\n", unknown.err);
  ASSERT_EQ(0, Run({"share", "remove", "my photo"}).status);

  const Json::Value shares = RunJson({"share", "list", "--json"});
  ASSERT_EQ(2u, shares.size());
  EXPECT_EQ("video", shares[0]["name"].asString());
  EXPECT_TRUE(shares[0]["encryption"].asBool());
  EXPECT_TRUE(shares[0]["hide_unreadable"].asBool());
  EXPECT_FALSE(shares[0]["readonly"].asBool());
  EXPECT_EQ("photo", shares[1]["name"].asString());
  EXPECT_EQ(std::filesystem::canonical(photo).string(), shares[1]["path"].asString());
  EXPECT_FALSE(shares[1]["readonly"].asBool());
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
  const Json::Value doc = RunJson({"status", "--json"});
  EXPECT_EQ("paused", doc["state"].asString());
  EXPECT_EQ(0, doc["resume_time"].asInt64());
  EXPECT_EQ(1, doc["shares"]["photo"]["flags"].asInt());
  EXPECT_TRUE(doc["shares"]["photo"]["need_reindex"].asBool());
  EXPECT_FALSE(doc["shares"]["video"]["need_reindex"].asBool());

  WriteStatus(R"({"resume_time": 4102488000})");
  EXPECT_EQ("indexing: paused until 2100-01-01 12:00:00 UTC\n", Run({"status"}).out);
  WriteStatus(R"({"resume_time": 946728000})");
  EXPECT_EQ("indexing: paused until 2000-01-01 12:00:00 UTC (that time has passed)\n",
            Run({"status"}).out);
  WriteStatus("{ not json");
  const ProgramOutcome broken = Run({"status"});
  EXPECT_EQ(2, broken.status);
  EXPECT_EQ("orvex: error 504: Cannot load json: " + StatusPath() + "\n", broken.err);
}

TEST_F(OrvexCliTest, PauseSavesAndTellsTheDaemon) {
  FileindexdPeer daemon(SocketPath());
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

  const ProgramOutcome no_end = Run({"pause"});
  ASSERT_EQ(0, no_end.status) << no_end.err;
  EXPECT_EQ("indexing paused with no end\n", no_end.out);
  ASSERT_EQ(2u, daemon.requests().size());
  EXPECT_EQ(0, daemon.requests()[1]["data"]["resume_time"].asInt64());
  EXPECT_TRUE(daemon.faults().empty());
}

TEST_F(OrvexCliTest, WithoutADaemonTheChangeIsSavedAndTheFailureExplained) {
  WriteStatus(R"({"resume_time": 0, "share": {"photo": 1}})");
  // No socket at all: the channel waits out its five connection attempts.
  const ProgramOutcome resume = Run({"resume"});
  EXPECT_EQ(2, resume.status);
  EXPECT_EQ(0u, resume.err.find("orvex: indexing daemon not reachable (code 502: write failed, "
                                "reason="))
      << resume.err;
  EXPECT_NE(std::string::npos,
            resume.err.find("); the resume is saved and takes effect when it starts\n"))
      << resume.err;
  EXPECT_EQ(Parse(R"({"resume_time": -1, "share": {"photo": 1}})"), ReadStatus());

  // A socket file left behind by a daemon that died refuses at once.
  Write("var/run/fileindexd.sock", "");
  const ProgramOutcome pause = Run({"pause", "0"});
  EXPECT_EQ(2, pause.status);
  EXPECT_EQ(0u, pause.err.find("orvex: indexing daemon not reachable (code 502: ")) << pause.err;
  EXPECT_NE(std::string::npos, pause.err.find("the pause is saved")) << pause.err;
  EXPECT_EQ(0, ReadStatus()["resume_time"].asInt64());
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

TEST_F(OrvexFolderCliTest, JsonListIsTheWebApiReplyWithPagingSortAndStatus) {
  const Json::Value all = RunJson({"folder", "list", "--json"});  // by path, folding case
  EXPECT_EQ("/photo/2024", Column(all, "path").at(0));
  EXPECT_EQ(0u, all["offset"].asUInt());
  EXPECT_FALSE(all["folder"][0].isMember("additional"));
  const Json::Value page = RunJson(
      {"folder", "list", "--json", "--sort-by", "name", "--desc", "--offset=1", "--limit", "1"});
  EXPECT_EQ(3u, page["total"].asUInt());
  EXPECT_EQ(1u, page["offset"].asUInt());
  // Descending by folded name: "ärger" after "zeta" by code point, so Ärger, zeta, beta.
  EXPECT_EQ(std::vector<std::string>{"zeta"}, Column(page, "name"));

  const Json::Value status = RunJson({"folder", "list", "--json", "--status", "--sort-by", "name"});
  std::vector<std::string> texts;
  for (const Json::Value& folder : status["folder"]) {
    texts.push_back(folder["additional"]["status"]["text"].asString());
  }
  // beta (/photo/Alben): nothing queued; zeta (/photo/2024): one event;
  // Ärger (/photo/alben): no such directory.
  EXPECT_EQ((std::vector<std::string>{"finished", "processing", "error"}), texts);
  EXPECT_EQ("invalid_path", status["folder"][2]["additional"]["status"]["desc"].asString());

  EXPECT_EQ(0u, RunJson({"folder", "list", "--json", "--limit", "0"})["folder"].size());
}

TEST_F(OrvexFolderCliTest, TableListIsAlignedWithFlagsAndStatus) {
  const ProgramOutcome run = Run({"folder", "list", "--status", "--sort-by", "photo"});
  ASSERT_EQ(0, run.status) << run.err;
  const std::vector<std::string> rows = SplitLines(run.out);
  ASSERT_EQ(4u, rows.size()) << run.out;
  EXPECT_EQ(0u, rows[0].find("PATH"));
  // Photo off first; every column starts where its header does.
  EXPECT_EQ(0u, rows[1].find("/photo/alben  Ärger  yes       yes    yes    no     yes     error "
                             "(invalid_path)"))
      << run.out;
  const size_t status_column = rows[0].find("STATUS");
  for (size_t i = 2; i < rows.size(); ++i) {
    EXPECT_NE(std::string::npos, rows[i].find("no      ")) << rows[i];
    EXPECT_EQ(status_column, rows[i].find_first_of("fp", 40)) << rows[i];
  }
}

TEST_F(OrvexFolderCliTest, GetShowsOneFolderAndFailuresExitWithStatus2) {
  const Json::Value folder = RunJson({"folder", "get", "/photo/alben", "--json"});
  EXPECT_EQ("Ärger", folder["name"].asString());
  EXPECT_TRUE(folder["paused"].asBool());
  EXPECT_EQ("", folder["volume_to_be_clean"].asString());
  const ProgramOutcome text = Run({"folder", "get", "/photo/2024"});
  EXPECT_EQ(0, text.status);
  EXPECT_NE(std::string::npos, text.out.find("name:      zeta\n")) << text.out;
  EXPECT_NE(std::string::npos, text.out.find("photo:     yes\n")) << text.out;

  const ProgramOutcome absent = Run({"folder", "get", "/photo/ALBEN/"});
  EXPECT_EQ(2, absent.status);
  EXPECT_EQ("orvex: error 902: /photo/ALBEN/\n", absent.err);
  const std::string folders = Write("var/packages/Orvex/etc/fileindex.folders", "[{");
  const ProgramOutcome broken = Run({"folder", "list"});
  EXPECT_EQ(2, broken.status);
  EXPECT_EQ("orvex: error 504: Cannot load json: " + folders + "\n", broken.err);
}

}  // namespace
}  // namespace testing
}  // namespace orvex
