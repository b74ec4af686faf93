// Runs the built kalopmxnotify with argument lists like the library's and
// checks the notifications file it appends to and how it exits. The
// library's two full notices are checked end to end by the policy tests.
#include <filesystem>
#include <fstream>

#include "programs/program_test.h"

namespace orvex {
namespace testing {
namespace {

const std::string kLinkOpen =
    "<a data-kalo-app=\"KALO.Orvex.Application\" data-kalo-fn=\"preference\">";

class KalopmxnotifyTest : public ProgramTest {
 protected:
  KalopmxnotifyTest() : ProgramTest("kalopmxnotify") {}
  std::string NotesFile() const { return root_.Join("var/lib/orvex/notifications.jsonl"); }
  std::vector<Json::Value> Notes() const {
    std::vector<Json::Value> notes;
    std::ifstream in(NotesFile());
    for (std::string line; std::getline(in, line);) notes.push_back(Parse(line));
    return notes;
  }
};

TEST_F(KalopmxnotifyTest, RecordsEachNoticeAsOneAppendedJsonLine) {
  ProgramOutcome run = Run({"-c", "App", "-b", "true", "@users", "k:one", kLinkOpen, "</a>"});
  ASSERT_EQ(0, run.status) << run.err;
  run = Run({"-e", "true", "-c", "KALO.Orvex.Application", "@administrators", "app:displayname",
             "error:lack_of_memory"});
  ASSERT_EQ(0, run.status) << run.err;
  std::vector<Json::Value> notes = Notes();
  ASSERT_EQ(2u, notes.size());
  EXPECT_GT(notes[0]["time"].asInt64(), 1600000000);
  notes[0].removeMember("time");
  notes[1].removeMember("time");
  Json::Value expected = Parse(R"({"app": "App", "to": "@users", "keys": ["k:one"],
      "flags": {"b": true}, "link": {"close": "</a>"}})");
  expected["link"]["open"] = kLinkOpen;
  EXPECT_EQ(expected, notes[0]);
  EXPECT_EQ(Parse(R"({"app": "KALO.Orvex.Application", "to": "@administrators",
      "keys": ["app:displayname", "error:lack_of_memory"], "flags": {"e": true}, "link": null})"),
            notes[1]);
}

TEST_F(KalopmxnotifyTest, BadUsageExits2AndRecordsNothing) {
  const std::vector<std::vector<std::string>> cases = {
      {"@administrators", "app:displayname"},                // no -c
      {"-c", "App", "-b", "yes", "@a", "k:v"},               // not a bool
      {"-c", "App", "@a", "k:v", "</a>", kLinkOpen},         // tags swapped
      {"-c", "App", "@a", "k:v", kLinkOpen, "</a>", "k:w"},  // key after the link
  };
  for (size_t i = 0; i < cases.size(); ++i) {
    const ProgramOutcome run = Run(cases[i]);
    EXPECT_EQ(2, run.status) << "case " << i;
    EXPECT_NE(std::string::npos, (run.out + run.err).find("usage:")) << "case " << i;
  }
  EXPECT_FALSE(std::filesystem::exists(NotesFile()));
}

TEST_F(KalopmxnotifyTest, UnwritableFileExits1) {
  std::filesystem::create_directories(NotesFile());  // a directory in its place
  const ProgramOutcome run = Run({"-c", "App", "@a", "k:v"});
  EXPECT_EQ(1, run.status);
  EXPECT_NE(std::string::npos, (run.out + run.err).find("cannot record the notification"));
}

}  // namespace
}  // namespace testing
}  // namespace orvex
