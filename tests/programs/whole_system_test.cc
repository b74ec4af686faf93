// The whole road with the real programs in a temporary root: orvex up starts
// the four daemons, orvex index makes a directory searchable, a file written
// afterwards becomes searchable through the watcher and the indexing daemon,
// and orvex down stops everything. Waits are on the system's own answers.
#include <gtest/gtest.h>
#include <signal.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <string>

#include "support/program_test.h"

namespace orvex {
namespace testing {
namespace {

class WholeSystemTest : public ProgramTest {
 protected:
  WholeSystemTest() : ProgramTest("orvex") {}

  void TearDown() override {
    // Never leave daemons behind, whatever the test did.
    Run({"down"});
  }

  // The output of `orvex search --name FRAGMENT`, once it contains wanted (or the
  // last output after a minute): the index follows the disk within moments.
  std::string SearchUntil(const std::string& fragment, const std::string& wanted) {
    ProgramOutcome outcome;
    WaitUntil(
        [&] {
          outcome = Run({"search", "--name", fragment});
          return outcome.out.find(wanted) != std::string::npos;
        },
        std::chrono::seconds(60), std::chrono::milliseconds(100));
    return outcome.out + outcome.err;
  }

  std::string MakeTree() {
    const std::string dir = io_.Join("library");
    std::filesystem::create_directories(dir + "/notes/@eaDir");
    std::ofstream(dir + "/notes/Straße.txt") << "a walk along the riverside\npromenade\n";
    std::ofstream(dir + "/notes/@eaDir/hidden.txt") << "metadata, never a document\n";
    std::ofstream(dir + "/readme.md") << "# Library\nnothing about rivers here\n";
    return dir;
  }
};

TEST_F(WholeSystemTest, IndexedDirectoryIsSearchableByNameAndTextAndFollowsChanges) {
  const ProgramOutcome up = Run({"up"});
  ASSERT_EQ(0, up.status) << up.out << up.err;
  for (const char* daemon : {"kaloelasticd", "kalocontentextractd", "kalonotifyd", "fileindexd"}) {
    EXPECT_NE(std::string::npos, up.out.find(std::string(daemon) + ": started")) << up.out;
  }
  EXPECT_NE(std::string::npos, Run({"up"}).out.find("fileindexd: already running"));

  const std::string dir = MakeTree();
  const ProgramOutcome index = Run({"index", dir, "--timeout", "60"});
  ASSERT_EQ(0, index.status) << index.out << index.err;
  EXPECT_NE(std::string::npos, index.out.find("registered share library at " + dir)) << index.out;
  EXPECT_NE(std::string::npos, index.out.find("is searchable")) << index.out;

  // The folder, notes/, Straße.txt and readme.md: nothing under @eaDir.
  const std::string status = Run({"status"}).out;
  EXPECT_NE(std::string::npos, status.find("fileindexd: running (pid ")) << status;
  EXPECT_NE(std::string::npos, status.find("share library: idle, 4 documents indexed")) << status;

  // Full case folding: "STRASSE" finds "Straße".
  const std::string by_name = Run({"search", "--name", "STRASSE"}).out;
  EXPECT_NE(std::string::npos, by_name.find(dir + "/notes/Straße.txt")) << by_name;
  // One line per hit, the matched word marked, the file's line break gone.
  const std::string by_text = Run({"search", "riverside"}).out;
  EXPECT_NE(std::string::npos, by_text.find("Straße.txt\ta walk along the [riverside] promenade\n"))
      << by_text;
  EXPECT_EQ(std::string::npos, by_text.find("readme.md")) << by_text;
  EXPECT_EQ(std::string::npos, Run({"search", "--name", "hidden"}).out.find("hidden.txt"));

  // A change after the first index reaches the search through the watcher.
  std::ofstream(dir + "/notes/zebra-crossing.txt") << "stripes\n";
  EXPECT_NE(std::string::npos,
            SearchUntil("zebra", "zebra-crossing.txt").find(dir + "/notes/zebra-crossing.txt"));
  std::filesystem::remove(dir + "/readme.md");
  EXPECT_NE(std::string::npos, SearchUntil("readme", "0 of 0 hits").find("0 of 0 hits"));

  const ProgramOutcome down = Run({"down"});
  EXPECT_EQ(0, down.status) << down.err;
  EXPECT_NE(std::string::npos, down.out.find("kaloelasticd: stopped")) << down.out;
  const ProgramOutcome after = Run({"search", "--name", "zebra"});
  EXPECT_EQ(2, after.status);
  EXPECT_NE(std::string::npos, after.err.find("start the daemons: orvex up")) << after.err;
}

TEST_F(WholeSystemTest, IndexWithoutDaemonsSaysToStartThemAndChangesNothing) {
  const std::string dir = MakeTree();
  const ProgramOutcome index = Run({"index", dir});
  EXPECT_EQ(2, index.status);
  EXPECT_NE(std::string::npos, index.err.find("fileindexd does not answer")) << index.err;
  EXPECT_NE(std::string::npos, index.err.find("orvex up")) << index.err;
  EXPECT_FALSE(std::filesystem::exists(root_.Join("etc/orvex/shares.json")));
}

}  // namespace
}  // namespace testing
}  // namespace orvex
