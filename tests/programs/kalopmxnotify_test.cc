// Runs the built kalopmxnotify with argument lists like the library's and
// checks the notifications file it appends to and how it exits.
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

using orvex::testing::ProgramOutcome;
using orvex::testing::RunProgram;
using orvex::testing::ScopedOrvexRoot;
using orvex::testing::TempDir;

const std::string kProgram = std::string(ORVEX_BUILD_DIR) + "/kalopmxnotify";
const std::string kLinkOpen =
    "<a data-kalo-app=\"KALO.Orvex.Application\" data-kalo-fn=\"preference\">";

class KalopmxnotifyTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(0, ::access(kProgram.c_str(), X_OK)) << kProgram << " is not built";
  }

  // Runs the program with args under this test's ORVEX_ROOT. Returns the
  // exit status, -1 when it did not exit; Output() is what it printed.
  int Run(const std::vector<std::string>& args) {
    last_ = RunProgram(kProgram, args, {"ORVEX_ROOT=" + dir_.path()}, dir_.path());
    return last_.status;
  }

  std::string Output() const { return last_.out + last_.err; }

  std::string NotificationsPath() const { return dir_.Join("var/lib/orvex/notifications.jsonl"); }

  std::vector<Json::Value> Notifications() const {
    std::vector<Json::Value> notes;
    std::ifstream in(NotificationsPath());
    for (std::string line; std::getline(in, line);) {
      Json::Value note;
      EXPECT_TRUE(orvex::fromString(note, line)) << line;
      notes.push_back(note);
    }
    return notes;
  }

  static Json::Value Parse(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(orvex::fromString(value, text)) << text;
    return value;
  }

  TempDir dir_;
  ScopedOrvexRoot root_{dir_.path()};
  ProgramOutcome last_;
};

TEST_F(KalopmxnotifyTest, RecordsFlagsKeysAndLinkAsOneJsonLine) {
  ASSERT_EQ(0, Run({"-c", "KALO.Orvex.Application", "-b", "true", "-e", "false", "@administrators",
                    "app:displayname", "error:index_no_space", kLinkOpen, "</a>"}))
      << Output();
  const std::vector<Json::Value> notes = Notifications();
  ASSERT_EQ(1u, notes.size());
  Json::Value note = notes[0];
  EXPECT_GT(note["time"].asInt64(), 1600000000);
  note.removeMember("time");
  Json::Value expected = Parse(R"({"app": "KALO.Orvex.Application", "to": "@administrators",
      "keys": ["app:displayname", "error:index_no_space"], "flags": {"b": true, "e": false}})");
  expected["link"]["open"] = kLinkOpen;
  expected["link"]["close"] = "</a>";
  EXPECT_EQ(expected, note);
}

TEST_F(KalopmxnotifyTest, ShortListHasNoLinkAndNoFlagsAndLaterNoticesAppend) {
  ASSERT_EQ(0, Run({"-c", "KALO.Orvex.Application", "@administrators", "app:displayname",
                    "error:lack_of_memory"}))
      << Output();
  ASSERT_EQ(0, Run({"-e", "true", "-c", "App", "@users", "k:one"})) << Output();
  const std::vector<Json::Value> notes = Notifications();
  ASSERT_EQ(2u, notes.size());
  EXPECT_TRUE(notes[0]["link"].isNull());
  EXPECT_EQ(Json::Value(Json::objectValue), notes[0]["flags"]);
  EXPECT_EQ(Parse(R"(["app:displayname", "error:lack_of_memory"])"), notes[0]["keys"]);
  EXPECT_EQ(Parse(R"({"e": true})"), notes[1]["flags"]);
  EXPECT_EQ("@users", notes[1]["to"].asString());
  EXPECT_EQ("App", notes[1]["app"].asString());
}

TEST_F(KalopmxnotifyTest, HelpPrintsUsage) {
  EXPECT_EQ(0, Run({"--help"}));
  EXPECT_EQ(0u, Output().rfind("usage: kalopmxnotify -c APP", 0)) << Output();
  EXPECT_FALSE(std::filesystem::exists(NotificationsPath()));
}

TEST_F(KalopmxnotifyTest, BadUsageExits2AndRecordsNothing) {
  const std::vector<std::vector<std::string>> cases = {
      {},
      {"@administrators", "app:displayname"},                // no -c
      {"-c"},                                                // -c without value
      {"-c", "", "@a", "k:v"},                               // empty app
      {"-c", "App", "-b", "yes", "@a", "k:v"},               // not a bool
      {"-c", "App", "-x", "1", "@a", "k:v"},                 // unknown option
      {"-c", "App"},                                         // no target
      {"-c", "App", "@a"},                                   // no key
      {"-c", "App", "@a", "k:v", kLinkOpen},                 // half a link
      {"-c", "App", "@a", "k:v", "</a>", kLinkOpen},         // tags swapped
      {"-c", "App", "@a", "k:v", kLinkOpen, "</a>", "k:w"},  // key after the link
      {"-c", "App", "@a", kLinkOpen, "</a>"},                // link without a key
  };
  for (size_t i = 0; i < cases.size(); ++i) {
    EXPECT_EQ(2, Run(cases[i])) << "case " << i;
    EXPECT_NE(std::string::npos, Output().find("usage:")) << "case " << i;
  }
  EXPECT_FALSE(std::filesystem::exists(NotificationsPath()));
}

TEST_F(KalopmxnotifyTest, UnwritableFileExits1) {
  std::filesystem::create_directories(NotificationsPath());  // a directory in its place
  EXPECT_EQ(1, Run({"-c", "App", "@a", "k:v"}));
  EXPECT_NE(std::string::npos, Output().find("cannot record the notification")) << Output();
}

}  // namespace
