// Runs the built orvex tool, each test with its own ORVEX_ROOT, and checks
// what it prints, how it exits and what it leaves in the registry and the
// status file.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <ctime>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "orvex/foundation/json.h"
#include "status/fileindexd_peer.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace {

using orvex::testing::FileindexdPeer;
using orvex::testing::ReadFileText;
using orvex::testing::RunProgram;
using orvex::testing::SplitLines;
using orvex::testing::TempDir;
using Outcome = orvex::testing::ProgramOutcome;

const std::string kOrvex = std::string(ORVEX_BUILD_DIR) + "/orvex";

Json::Value ParseJson(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(orvex::fromString(value, text)) << text;
  return value;
}

class OrvexCliTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(0, ::access(kOrvex.c_str(), X_OK)) << kOrvex << " is not built";
    ASSERT_EQ(0, ::mkdir(root_.Join("srv").c_str(), 0755));
    ASSERT_EQ(0, ::mkdir(root_.Join("srv/photo").c_str(), 0755));
  }

  // Runs orvex with args under this test's root, in UTC.
  Outcome Run(const std::vector<std::string>& args) {
    return RunProgram(kOrvex, args, {"ORVEX_ROOT=" + root_.path(), "TZ=UTC"}, io_.path());
  }

  std::string StatusPath() const { return root_.Join("var/packages/Orvex/etc/fileindex.status"); }

  void WriteStatus(const std::string& text) {
    ASSERT_EQ(0, std::system(("mkdir -p '" + root_.Join("var/packages/Orvex/etc") + "'").c_str()));
    root_.Write("var/packages/Orvex/etc/fileindex.status", text);
  }

  Json::Value ReadStatus() const { return ParseJson(ReadFileText(StatusPath())); }

  std::string SocketPath() {
    EXPECT_EQ(0, std::system(("mkdir -p '" + root_.Join("var/run") + "'").c_str()));
    return root_.Join("var/run/fileindexd.sock");
  }

  Json::Value ListJson() {
    const Outcome list = Run({"share", "list", "--json"});
    EXPECT_EQ(0, list.status) << list.err;
    return ParseJson(list.out);
  }

  TempDir root_;
  TempDir io_;
};

TEST_F(OrvexCliTest, HelpOnTheToolAndEveryCommandExitsZero) {
  const std::vector<std::vector<std::string>> helps = {{"--help"},
                                                       {"share", "--help"},
                                                       {"share", "add", "--help"},
                                                       {"share", "list", "--help"},
                                                       {"share", "remove", "--help"},
                                                       {"status", "--help"},
                                                       {"pause", "--help"},
                                                       {"resume", "--help"}};
  for (const auto& args : helps) {
    const Outcome help = Run(args);
    const std::string shown = args.size() > 1 ? args[0] + " " + args[1] : args[0];
    EXPECT_EQ(0, help.status) << shown;
    EXPECT_EQ(0u, help.out.find("usage: orvex")) << shown << ": " << help.out;
    EXPECT_EQ("", help.err) << shown;
  }
  EXPECT_NE(std::string::npos, Run({"--help"}).out.find("\n  share "));
}

TEST_F(OrvexCliTest, ShareAddListRemoveRoundTrip) {
  const std::string photo = root_.Join("srv/photo");
  Outcome add = Run({"share", "add", "my photo", photo, "--recycle-bin", "--readonly"});
  ASSERT_EQ(0, add.status) << add.err;
  add = Run({"share", "add", "video", "/srv/data/video", "--hide-unreadable", "--encryption"});
  ASSERT_EQ(0, add.status) << add.err;

  const Outcome list = Run({"share", "list"});
  ASSERT_EQ(0, list.status) << list.err;
  const std::vector<std::string> lines = SplitLines(list.out);
  ASSERT_EQ(3u, lines.size()) << list.out;
  EXPECT_EQ(0u, lines[0].find("NAME      PATH"));
  EXPECT_EQ(0u, lines[1].find("my photo  " + photo));
  EXPECT_EQ(0u, lines[2].find("video     /srv/data/video"));
  // Columns line up: the settings start at the same offset on every line.
  const size_t settings = lines[0].find("SETTINGS");
  EXPECT_EQ("readonly,recycle-bin", lines[1].substr(settings));
  EXPECT_EQ("encryption,hide-unreadable", lines[2].substr(settings));

  Json::Value shares = ListJson();
  ASSERT_EQ(2u, shares.size());
  EXPECT_EQ("my photo", shares[0]["name"].asString());
  EXPECT_EQ(photo, shares[0]["path"].asString());
  EXPECT_TRUE(shares[0]["readonly"].asBool());
  EXPECT_TRUE(shares[0]["recycle_bin"].asBool());
  EXPECT_FALSE(shares[0]["hide_unreadable"].asBool());
  EXPECT_TRUE(shares[1]["encryption"].asBool());

  const Outcome remove = Run({"share", "remove", "my photo"});
  ASSERT_EQ(0, remove.status) << remove.err;
  shares = ListJson();
  ASSERT_EQ(1u, shares.size());
  EXPECT_EQ("video", shares[0]["name"].asString());
}

TEST_F(OrvexCliTest, RelativeSharePathIsMadeAbsolute) {
  char* cwd = ::getcwd(nullptr, 0);
  ASSERT_NE(nullptr, cwd);
  const std::string previous_cwd = cwd;
  std::free(cwd);
  ASSERT_EQ(0, ::chdir(root_.Join("srv").c_str()));
  const Outcome add = Run({"share", "add", "photo", "photo"});
  ASSERT_EQ(0, ::chdir(previous_cwd.c_str()));
  ASSERT_EQ(0, add.status) << add.err;
  char* real = ::realpath(root_.Join("srv/photo").c_str(), nullptr);
  ASSERT_NE(nullptr, real);
  EXPECT_EQ(std::string(real), ListJson()[0]["path"].asString());
  std::free(real);
}

TEST_F(OrvexCliTest, DuplicateAddFailsAndKeepsTheRegistry) {
  ASSERT_EQ(0, Run({"share", "add", "photo", root_.Join("srv/photo")}).status);
  const Outcome again = Run({"share", "add", "photo", "/srv/other", "--readonly"});
  EXPECT_EQ(2, again.status);
  EXPECT_EQ(0u, again.err.find("orvex: ")) << again.err;
  EXPECT_NE(std::string::npos, again.err.find("photo")) << again.err;
  const Json::Value shares = ListJson();
  ASSERT_EQ(1u, shares.size());
  EXPECT_EQ(root_.Join("srv/photo"), shares[0]["path"].asString());
  EXPECT_FALSE(shares[0]["readonly"].asBool());
}

TEST_F(OrvexCliTest, RemovingAnUnknownShareFailsWithError800) {
  const Outcome remove = Run({"share", "remove", "photo"});
  EXPECT_EQ(2, remove.status);
  EXPECT_EQ("orvex: error 800: photo\n", remove.err);
  EXPECT_EQ("", remove.out);
}

TEST_F(OrvexCliTest, BadUsageExitsTwoWithAMessage) {
  const std::vector<std::vector<std::string>> bad = {
      {},
      {"frobnicate"},
      {"share"},
      {"share", "add", "photo"},
      {"share", "add", "photo", "/srv/photo", "--colour"},
      {"share", "list", "extra"},
      {"status", "--verbose"},
      {"pause", "soon"},
      {"pause", "1", "2"},
      {"resume", "now"}};
  for (const auto& args : bad) {
    std::string shown;
    for (const auto& a : args) shown += a + " ";
    const Outcome outcome = Run(args);
    EXPECT_EQ(2, outcome.status) << shown;
    EXPECT_EQ(0u, outcome.err.find("orvex: ")) << shown << ": " << outcome.err;
    EXPECT_NE(std::string::npos, outcome.err.find("usage: orvex")) << shown;
  }
  EXPECT_NE(0, ::access(StatusPath().c_str(), F_OK)) << "bad usage must change nothing";
}

TEST_F(OrvexCliTest, NegativePauseIsRefusedByTheLibrary) {
  const Outcome pause = Run({"pause", "-2"});
  EXPECT_EQ(2, pause.status);
  EXPECT_EQ("orvex: error 120: Pause length should NOT be negative\n", pause.err);
  EXPECT_NE(0, ::access(StatusPath().c_str(), F_OK));
}

TEST_F(OrvexCliTest, StatusOnAFreshRootShowsIndexingRunning) {
  const Outcome status = Run({"status"});
  EXPECT_EQ(0, status.status) << status.err;
  EXPECT_EQ("indexing: running\n", status.out);
  const Outcome json = Run({"status", "--json"});
  ASSERT_EQ(0, json.status) << json.err;
  const Json::Value doc = ParseJson(json.out);
  EXPECT_EQ("running", doc["state"].asString());
  EXPECT_EQ(-1, doc["resume_time"].asInt64());
  EXPECT_TRUE(doc["shares"].isObject());
  EXPECT_EQ(0u, doc["shares"].size());
  EXPECT_NE(0, ::access(StatusPath().c_str(), F_OK)) << "status must not create the file";
}

TEST_F(OrvexCliTest, StatusShowsThePauseAndEachSharesFlags) {
  WriteStatus(R"({"resume_time": 0, "share": {"photo": 1, "video": 0}})");
  Outcome status = Run({"status"});
  EXPECT_EQ(0, status.status) << status.err;
  EXPECT_EQ(
      "indexing: paused with no end\n"
      "photo:    needs re-index\n"
      "video:    ok\n",
      status.out);
  const Json::Value doc = ParseJson(Run({"status", "--json"}).out);
  EXPECT_EQ("paused", doc["state"].asString());
  EXPECT_EQ(0, doc["resume_time"].asInt64());
  EXPECT_EQ(1, doc["shares"]["photo"]["flags"].asInt());
  EXPECT_TRUE(doc["shares"]["photo"]["need_reindex"].asBool());
  EXPECT_FALSE(doc["shares"]["video"]["need_reindex"].asBool());

  WriteStatus(R"({"resume_time": 4102488000})");
  status = Run({"status"});
  EXPECT_EQ("indexing: paused until 2100-01-01 12:00:00 UTC\n", status.out);
  WriteStatus(R"({"resume_time": 946728000})");
  status = Run({"status"});
  EXPECT_EQ("indexing: paused until 2000-01-01 12:00:00 UTC (that time has passed)\n", status.out);
}

TEST_F(OrvexCliTest, BrokenStatusFileFailsWithError504) {
  WriteStatus("{ not json");
  const Outcome status = Run({"status"});
  EXPECT_EQ(2, status.status);
  EXPECT_EQ("orvex: error 504: Cannot load json: " + StatusPath() + "\n", status.err);
}

TEST_F(OrvexCliTest, PauseSavesAndTellsTheDaemon) {
  FileindexdPeer daemon(SocketPath());
  ASSERT_TRUE(daemon.listening());
  const int64_t earliest = static_cast<int64_t>(::time(nullptr)) + 3 * 3600;
  const Outcome pause = Run({"pause", "3"});
  const int64_t latest = static_cast<int64_t>(::time(nullptr)) + 3 * 3600;
  ASSERT_EQ(0, pause.status) << pause.err;
  EXPECT_EQ(0u, pause.out.find("indexing paused until ")) << pause.out;

  const int64_t stored = ReadStatus()["resume_time"].asInt64();
  EXPECT_LE(earliest, stored);
  EXPECT_GE(latest, stored);
  ASSERT_EQ(1u, daemon.requests().size());
  const Json::Value request = daemon.requests()[0];
  EXPECT_EQ("pause", request["type"].asString());
  EXPECT_EQ(stored, request["data"]["resume_time"].asInt64());
  EXPECT_TRUE(daemon.faults().empty());

  const Outcome no_end = Run({"pause"});
  ASSERT_EQ(0, no_end.status) << no_end.err;
  EXPECT_EQ("indexing paused with no end\n", no_end.out);
  ASSERT_EQ(2u, daemon.requests().size());
  EXPECT_EQ(0, daemon.requests()[1]["data"]["resume_time"].asInt64());
}

TEST_F(OrvexCliTest, ResumeWithoutADaemonSavesAndFailsClearly) {
  WriteStatus(R"({"resume_time": 0, "share": {"photo": 1}})");
  // No socket at all: the channel waits out its five connection attempts.
  const Outcome resume = Run({"resume"});
  EXPECT_EQ(2, resume.status);
  EXPECT_EQ(0u, resume.err.find("orvex: indexing daemon not reachable (code 502: write failed, "
                                "reason="))
      << resume.err;
  EXPECT_NE(std::string::npos,
            resume.err.find("); the resume is saved and takes effect when it starts\n"))
      << resume.err;
  const Json::Value saved = ReadStatus();
  EXPECT_EQ(-1, saved["resume_time"].asInt64());
  EXPECT_EQ(1u, saved["share"]["photo"].asUInt());
}

TEST_F(OrvexCliTest, PauseWithAStaleSocketSavesAndFailsClearly) {
  // A socket file left behind by a daemon that died refuses at once.
  const std::string socket = SocketPath();
  std::ofstream(socket) << "";
  const Outcome pause = Run({"pause", "0"});
  EXPECT_EQ(2, pause.status);
  EXPECT_EQ(0u, pause.err.find("orvex: indexing daemon not reachable (code 502: ")) << pause.err;
  EXPECT_NE(std::string::npos, pause.err.find("the pause is saved")) << pause.err;
  EXPECT_EQ(0, ReadStatus()["resume_time"].asInt64());
}

}  // namespace
