// Runs the built orvex tool's `folder list` and `folder get` against a
// folder configuration, share registry, status file and share queue
// written directly in each test's own ORVEX_ROOT.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "orvex/foundation/json.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace {

using orvex::testing::ReadFileText;
using orvex::testing::RunProgram;
using orvex::testing::TempDir;
using Outcome = orvex::testing::ProgramOutcome;

const std::string kOrvex = std::string(ORVEX_BUILD_DIR) + "/orvex";

class OrvexFolderCliTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(0, ::access(kOrvex.c_str(), X_OK)) << kOrvex << " is not built";
    share_root_ = root_.Join("volume1/photo");
    for (const char* dir : {"2024", "Alben", "@eaDir/@fileindex", "../../etc/orvex",
                            "../../var/packages/Orvex/etc"}) {
      std::filesystem::create_directories(share_root_ + "/" + dir);
    }
    root_.Write("etc/orvex/shares.json",
                R"([{"name": "photo", "path": ")" + share_root_ + R"("}])");
    root_.Write("var/packages/Orvex/etc/fileindex.folders", R"([
      {"path": "/photo/2024", "name": "zeta", "document": false, "audio": false,
       "video": true, "photo": true, "paused": false, "volume_to_be_clean": ""},
      {"path": "/photo/alben", "name": "Ärger", "document": true, "audio": true,
       "video": true, "photo": false, "paused": true},
      {"path": "/photo/Alben", "name": "beta", "document": true, "audio": false,
       "video": false, "photo": true}])");
    root_.Write("var/packages/Orvex/etc/fileindex.status", R"({"resume_time": -1})");
    root_.Write("volume1/photo/@eaDir/@fileindex/queue",
                R"({"event": 64, "is_dir": false, "path": ")" + share_root_ + "/2024/a.jpg\"}\n");
  }

  Outcome Run(const std::vector<std::string>& args) {
    return RunProgram(kOrvex, args, {"ORVEX_ROOT=" + root_.path()}, io_.path());
  }

  Json::Value RunJson(const std::vector<std::string>& args) {
    const Outcome run = Run(args);
    EXPECT_EQ(0, run.status) << run.err;
    Json::Value value;
    EXPECT_TRUE(orvex::fromString(value, run.out)) << run.out;
    return value;
  }

  TempDir root_;
  TempDir io_;
  std::string share_root_;
};

std::vector<std::string> Column(const Json::Value& reply, const std::string& key) {
  std::vector<std::string> values;
  for (const Json::Value& folder : reply["folder"]) values.push_back(folder[key].asString());
  return values;
}

TEST_F(OrvexFolderCliTest, JsonListIsTheWebApiReplyWithPagingSortAndStatus) {
  const Json::Value all = RunJson({"folder", "list", "--json"});
  EXPECT_EQ(3u, all["total"].asUInt());
  EXPECT_EQ(0u, all["offset"].asUInt());
  // By path, ignoring case: "/photo/alben" and "/photo/Alben" tie.
  ASSERT_EQ(3u, all["folder"].size());
  EXPECT_EQ("/photo/2024", all["folder"][0]["path"].asString());
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

  const Json::Value empty = RunJson({"folder", "list", "--json", "--limit", "0"});
  EXPECT_EQ(0u, empty["folder"].size());
  EXPECT_EQ(3u, empty["total"].asUInt());
}

TEST_F(OrvexFolderCliTest, TableListIsAlignedWithFlagsAndStatus) {
  const Outcome run = Run({"folder", "list", "--status", "--sort-by", "photo"});
  ASSERT_EQ(0, run.status) << run.err;
  std::istringstream lines(run.out);
  std::vector<std::string> rows;
  for (std::string line; std::getline(lines, line);) rows.push_back(line);
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

TEST_F(OrvexFolderCliTest, GetShowsOneFolderAndFailsWith902ForAnAbsentOne) {
  const Json::Value folder = RunJson({"folder", "get", "/photo/alben", "--json"});
  EXPECT_EQ("Ärger", folder["name"].asString());
  EXPECT_TRUE(folder["paused"].asBool());
  EXPECT_EQ("", folder["volume_to_be_clean"].asString());

  const Outcome text = Run({"folder", "get", "/photo/2024"});
  EXPECT_EQ(0, text.status);
  EXPECT_NE(std::string::npos, text.out.find("name:      zeta\n")) << text.out;
  EXPECT_NE(std::string::npos, text.out.find("photo:     yes\n")) << text.out;

  const Outcome absent = Run({"folder", "get", "/photo/ALBEN/"});
  EXPECT_EQ(2, absent.status);
  EXPECT_EQ("orvex: error 902: /photo/ALBEN/\n", absent.err);
}

TEST_F(OrvexFolderCliTest, BadUsageAndABrokenFolderFileExitWithStatus2) {
  for (const auto& args :
       std::vector<std::vector<std::string>>{{"folder", "list", "--limit"},
                                             {"folder", "list", "--offset", "-1"},
                                             {"folder", "list", "--limit", "99999999999"},
                                             {"folder", "get"},
                                             {"folder", "rename"}}) {
    const Outcome run = Run(args);
    EXPECT_EQ(2, run.status) << args.back();
    EXPECT_EQ(0u, run.err.find("orvex: ")) << run.err;
  }
  root_.Write("var/packages/Orvex/etc/fileindex.folders", "[{");
  const Outcome broken = Run({"folder", "list"});
  EXPECT_EQ(2, broken.status);
  EXPECT_EQ("orvex: error 504: Cannot load json: " +
                root_.Join("var/packages/Orvex/etc/fileindex.folders") + "\n",
            broken.err);
}

}  // namespace
