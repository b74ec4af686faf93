// Runs the built kalopmxnotify with argument lists like the library's and
// checks the notifications file it appends to and how it exits. The
// library's two full notices are checked end to end by the policy tests.
#include <filesystem>
#include <fstream>
#include <iterator>

#include "orvex/version.h"
#include "support/program_test.h"

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

TEST_F(KalopmxnotifyTest, BadUsageExits2NamingTheProblemAndRecordsNothing) {
  const struct {
    std::vector<std::string> args;
    const char* problem;  // the first line of standard error
  } cases[] = {
      {{"@administrators", "app:displayname"}, "missing -c APP"},
      {{"-c", "App", "-b", "yes", "@a", "k:v"}, "option -b takes true or false, not \"yes\""},
      {{"-c", "App", "@a", "k:v", "</a>", kLinkOpen},
       "a link needs one opening and one closing tag, after the keys"},
      {{"-c", "App", "@a", "k:v", kLinkOpen, "</a>", "k:w"},
       "a link needs one opening and one closing tag, after the keys"},
      {{"-c", "App", "--bogus", "@a", "k:v"}, "unknown option --bogus"},
      {{"-x", "1", "-c", "App", "@a", "k:v"}, "unknown option -x"},
      {{"-c", "App", "-q"}, "unknown option -q"},  // not "needs a value"
      {{"-c", "App", "-b"}, "option -b needs a value"},
      {{"-c", "App", "--", "@a"}, "missing KEY"},
  };
  for (const auto& c : cases) {
    const ProgramOutcome run = Run(c.args);
    EXPECT_EQ(2, run.status) << c.problem;
    const std::vector<std::string> lines = SplitLines(run.err);
    ASSERT_LE(2u, lines.size()) << c.problem;
    EXPECT_EQ(std::string("kalopmxnotify: ") + c.problem, lines[0]);
    EXPECT_EQ(0u, lines[1].rfind("usage: kalopmxnotify", 0)) << lines[1];
  }
  EXPECT_FALSE(std::filesystem::exists(NotesFile()));
}

TEST_F(KalopmxnotifyTest, HelpVersionAndATargetAfterDoubleDash) {
  const ProgramOutcome version = Run({"--version"});
  EXPECT_EQ(0, version.status);
  EXPECT_EQ(std::string("kalopmxnotify ") + ORVEX_VERSION + "\n", version.out);
  const ProgramOutcome help = Run({"-c", "App", "--help"});
  EXPECT_EQ(0, help.status);
  EXPECT_EQ(0u, help.out.find("usage: kalopmxnotify")) << help.out;
  EXPECT_FALSE(std::filesystem::exists(NotesFile()));
  ASSERT_EQ(0, Run({"-c", "App", "--", "-odd-user", "k:v"}).status);
  ASSERT_EQ(1u, Notes().size());
  EXPECT_EQ("-odd-user", Notes()[0]["to"].asString());
}

// The notifications file stays UTF-8 whatever the arguments hold: each
// ill-formed sequence is recorded as one U+FFFD.
TEST_F(KalopmxnotifyTest, BytesThatAreNotUtf8AreRecordedAsReplacementCharacters) {
  const std::string r = "\xEF\xBF\xBD";  // U+FFFD
  const struct {
    std::string given;
    std::string recorded;
  } cases[] = {
      {"k:\xFF", "k:" + r},                                          // never a UTF-8 byte
      {"k:\xE6\x97", "k:" + r},                                      // a character cut short: one
      {"k:\xC0\xAF", "k:" + r + r},                                  // an overlong "/": two
      {"k:\xED\xA0\x80", "k:" + r + r + r},                          // a surrogate: three
      {"k:\xE5\x86\x99\xE7\x9C\x9F", "k:\xE5\x86\x99\xE7\x9C\x9F"},  // valid stays
  };
  std::vector<std::string> args = {"-c", "App\xFF", "@a\xFE"};
  for (const auto& c : cases) args.push_back(c.given);
  const ProgramOutcome run = Run(args);
  ASSERT_EQ(0, run.status) << run.err;
  const std::vector<Json::Value> notes = Notes();
  ASSERT_EQ(1u, notes.size());
  EXPECT_EQ("App" + r, notes[0]["app"].asString());
  EXPECT_EQ("@a" + r, notes[0]["to"].asString());
  ASSERT_EQ(std::size(cases), notes[0]["keys"].size());
  for (Json::ArrayIndex i = 0; i < notes[0]["keys"].size(); ++i) {
    EXPECT_EQ(cases[i].recorded, notes[0]["keys"][i].asString()) << i;
  }
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
