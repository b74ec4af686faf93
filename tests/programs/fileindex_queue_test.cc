// Runs the built fileindex-queue program on queue files written here and
// checks what it prints and how it exits.
#include "programs/program_test.h"

namespace orvex {
namespace testing {
namespace {

class FileindexQueueTest : public ProgramTest {
 protected:
  FileindexQueueTest() : ProgramTest("fileindex-queue") {}
  // Writes a queue file of the given lines and returns its path.
  std::string Queue(const std::vector<std::string>& lines) {
    std::string text;
    for (const auto& line : lines) text += line + "\n";
    return Write("queue", text);
  }
};

// Nine lines for four operations: two lines are bad and skipped.
const std::vector<std::string> kMixedQueue = {
    R"({"event": 64, "is_dir": false, "path": "/volume1/photo/a.jpg"})",
    R"({"event": 2, "is_dir": false, "path": "/volume1/photo/a.jpg"})",
    R"({"event": 4, "is_dir": false, "path": "/volume1/photo/a.jpg"})",
    R"({"event": 64, "is_dir": false, "path": "/volume1/photo/b.jpg"})",
    "not json at all",
    R"({"event": 128, "is_dir": false, "path": "/volume1/photo/b.jpg"})",
    R"({"event": 256, "is_dir": false, "path": "/volume1/photo/d.jpg", "path_old": "/volume1/photo/c.jpg"})",
    R"({"event": 64, "is_dir": true, "path": "/"})",
    R"({"event":131072,"path":"/volume1/photo/2024","path_old":"","data":{"document":true,"audio":false,"video":true,"photo":false}})",
};

TEST_F(FileindexQueueTest, PrintsCoalescedOperationsInProcessingOrderThenSummary) {
  const ProgramOutcome text = Run({Queue(kMixedQueue)});
  EXPECT_EQ(0, text.status) << text.err;
  EXPECT_EQ(
      "[02] /volume1/photo/a.jpg\n"
      "[01] /volume1/photo/b.jpg\n"
      "[05] /volume1/photo/c.jpg -> /volume1/photo/d.jpg\n"
      "[04] /volume1/photo/2024, "
      "data={\"audio\":false,\"document\":true,\"photo\":false,\"video\":true}\n"
      "lines read: 9, skipped as bad: 2, operations pending: 4, crashed: no\n",
      text.out);
  EXPECT_EQ("", text.err);

  const Json::Value json = Parse(Run({"--json", Queue(kMixedQueue)}).out);
  EXPECT_EQ(Parse(R"({"op": 5, "path": "/volume1/photo/d.jpg",
      "path_old": "/volume1/photo/c.jpg", "data": null})"),
            json["operations"][2]);
  EXPECT_EQ(4u, json["operations"].size());
  EXPECT_EQ(2, json["lines_skipped"].asInt());
}

TEST_F(FileindexQueueTest, CrashedQueueStopsReadingAndReportsOneWholeShareOperation) {
  const std::string queue = Queue({
      R"({"event": 64, "is_dir": false, "path": "/volume1/photo/a.jpg"})",
      R"({"event": 2, "is_dir": false, "path": "/volume1/photo/b.jpg"})",
      R"({"event": 512, "is_dir": false, "path": "/volume1/photo"})",
      R"({"event": 64, "is_dir": false, "path": "/volume1/photo/c.jpg"})",
  });
  const ProgramOutcome text = Run({queue});
  EXPECT_EQ(0, text.status);
  EXPECT_EQ("[07] \nlines read: 3, skipped as bad: 0, operations pending: 1, crashed: yes\n",
            text.out);
}

TEST_F(FileindexQueueTest, ExitStatusAndOutputOfEveryOutcome) {
  const std::string empty = Queue({});
  const std::string missing = root_.Join("no-such-queue");
  const std::string cannot_read = "fileindex-queue: cannot read queue ";
  const struct {
    std::string arg;
    int status;
    std::string out;
    std::string err;
  } cases[] = {
      {empty, 0, "lines read: 0, skipped as bad: 0, operations pending: 0, crashed: no\n", ""},
      {missing, 2, "", cannot_read + missing + ": No such file or directory\n"},
      {root_.path(), 2, "", cannot_read + root_.path() + ": Is a directory\n"}};
  for (const auto& c : cases) {
    const ProgramOutcome r = Run({c.arg});
    EXPECT_EQ(c.status, r.status) << c.arg;
    EXPECT_EQ(c.out, r.out) << c.arg;
    EXPECT_EQ(c.err, r.err) << c.arg;
  }
  for (const std::vector<std::string>& args : {std::vector<std::string>{}, {empty, empty}}) {
    const ProgramOutcome r = Run(args);
    EXPECT_EQ(2, r.status) << args.size();
    EXPECT_NE(std::string::npos, r.err.find("usage: fileindex-queue")) << r.err;
  }
}

}  // namespace
}  // namespace testing
}  // namespace orvex
