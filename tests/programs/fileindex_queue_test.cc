// Runs the built fileindex-queue program on queue files written here and
// checks what it prints and how it exits.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "../../bench/queue_generator.h"
#include "orvex/foundation/json.h"
#include "support/run_program.h"

namespace {

using orvex::testing::RunProgram;
using Result = orvex::testing::ProgramOutcome;
using orvex::testing::SplitLines;

const std::string kProgram = std::string(ORVEX_BUILD_DIR) + "/fileindex-queue";

// "[0k] /volume1/photo/..." with k a kind handed out for a share path (1-6).
bool IsShareOpLine(const std::string& line) {
  const std::string prefix = "/volume1/photo/";
  return line.size() > 5 + prefix.size() && line.compare(0, 2, "[0") == 0 && line[2] >= '1' &&
         line[2] <= '6' && line.compare(3, 2, "] ") == 0 &&
         line.compare(5, prefix.size(), prefix) == 0;
}

class FileindexQueueTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(0, ::access(kProgram.c_str(), X_OK)) << kProgram << " is not built";
    char tmpl[] = "/tmp/fileindex_queue_test.XXXXXX";
    ASSERT_NE(nullptr, ::mkdtemp(tmpl));
    dir_ = tmpl;
  }

  void TearDown() override {
    for (const auto& f : files_) ::unlink(f.c_str());
    ::rmdir(dir_.c_str());
  }

  std::string Path(const std::string& name) {
    files_.push_back(dir_ + "/" + name);
    return files_.back();
  }

  // Writes a queue file of the given lines, each ending in a newline.
  std::string Queue(const std::vector<std::string>& lines) {
    std::string path = Path("queue");
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    for (const auto& line : lines) out << line << '\n';
    return path;
  }

  // Runs the program with args, stdout and stderr captured in files.
  Result Run(const std::vector<std::string>& args) {
    Path("stdout");
    Path("stderr");
    return RunProgram(kProgram, args, {}, dir_);
  }

  std::string dir_;
  std::vector<std::string> files_;
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
  Result r = Run({Queue(kMixedQueue)});
  EXPECT_EQ(0, r.status) << r.err;
  EXPECT_EQ(
      "[02] /volume1/photo/a.jpg\n"
      "[01] /volume1/photo/b.jpg\n"
      "[05] /volume1/photo/c.jpg -> /volume1/photo/d.jpg\n"
      "[04] /volume1/photo/2024, "
      "data={\"audio\":false,\"document\":true,\"photo\":false,\"video\":true}\n"
      "lines read: 9, skipped as bad: 2, operations pending: 4, crashed: no\n",
      r.out);
  EXPECT_EQ("", r.err);
}

TEST_F(FileindexQueueTest, JsonOutputIsOneDocumentWithTheSameOperations) {
  Result r = Run({"--json", Queue(kMixedQueue)});
  ASSERT_EQ(0, r.status) << r.err;
  Json::Value doc;
  ASSERT_TRUE(orvex::fromString(doc, r.out)) << r.out;
  const Json::Value& ops = doc["operations"];
  ASSERT_EQ(4u, ops.size());
  EXPECT_EQ(2, ops[0]["op"].asInt());
  EXPECT_EQ("/volume1/photo/a.jpg", ops[0]["path"].asString());
  EXPECT_EQ(1, ops[1]["op"].asInt());
  EXPECT_EQ(5, ops[2]["op"].asInt());
  EXPECT_EQ("/volume1/photo/d.jpg", ops[2]["path"].asString());
  EXPECT_EQ("/volume1/photo/c.jpg", ops[2]["path_old"].asString());
  EXPECT_TRUE(ops[2]["data"].isNull());
  EXPECT_EQ(4, ops[3]["op"].asInt());
  EXPECT_TRUE(ops[3]["data"]["video"].asBool());
  EXPECT_FALSE(ops[3]["data"]["audio"].asBool());
  EXPECT_EQ(9u, doc["lines_read"].asUInt());
  EXPECT_EQ(2u, doc["lines_skipped"].asUInt());
  EXPECT_EQ(4u, doc["pending"].asUInt());
  EXPECT_FALSE(doc["crashed"].asBool());
}

TEST_F(FileindexQueueTest, CrashedQueueStopsReadingAndReportsOneWholeShareOperation) {
  const std::string queue = Queue({
      R"({"event": 64, "is_dir": false, "path": "/volume1/photo/a.jpg"})",
      R"({"event": 2, "is_dir": false, "path": "/volume1/photo/b.jpg"})",
      R"({"event": 512, "is_dir": false, "path": "/volume1/photo"})",
      R"({"event": 64, "is_dir": false, "path": "/volume1/photo/c.jpg"})",
  });
  Result text = Run({queue});
  EXPECT_EQ(0, text.status);
  EXPECT_EQ("[07] \nlines read: 3, skipped as bad: 0, operations pending: 1, crashed: yes\n",
            text.out);

  Result json = Run({"--json", queue});
  Json::Value doc;
  ASSERT_TRUE(orvex::fromString(doc, json.out)) << json.out;
  ASSERT_EQ(1u, doc["operations"].size());
  EXPECT_EQ(7, doc["operations"][0]["op"].asInt());
  EXPECT_EQ("", doc["operations"][0]["path"].asString());
  EXPECT_TRUE(doc["crashed"].asBool());
}

TEST_F(FileindexQueueTest, EmptyQueuePrintsOnlyTheSummary) {
  Result r = Run({Queue({})});
  EXPECT_EQ(0, r.status);
  EXPECT_EQ("lines read: 0, skipped as bad: 0, operations pending: 0, crashed: no\n", r.out);
}

TEST_F(FileindexQueueTest, GeneratedQueueSkipsExactlyItsMalformedLines) {
  orvex::bench::QueueShape shape;
  shape.seed = 7;
  orvex::bench::QueueGenerator generator(shape);
  const std::string queue = Path("generated");
  {
    std::ofstream out(queue, std::ios::binary);
    generator.Write(out, 2000);
  }
  const orvex::bench::QueueCounts& c = generator.counts();
  ASSERT_GT(c.malformed, 0u);

  Result r = Run({queue});
  ASSERT_EQ(0, r.status) << r.err;
  std::vector<std::string> lines = SplitLines(r.out);
  ASSERT_GE(lines.size(), 2u);
  const std::string summary = lines.back();
  lines.pop_back();
  EXPECT_EQ("lines read: " + std::to_string(c.lines) +
                ", skipped as bad: " + std::to_string(c.malformed) +
                ", operations pending: " + std::to_string(lines.size()) + ", crashed: no",
            summary);
  for (const auto& line : lines) EXPECT_TRUE(IsShareOpLine(line)) << line;
}

TEST_F(FileindexQueueTest, MissingQueueIsNamedOnStderrWithExitStatusTwo) {
  const std::string missing = dir_ + "/no-such-queue";
  Result r = Run({missing});
  EXPECT_EQ(2, r.status);
  EXPECT_EQ("", r.out);
  EXPECT_EQ("fileindex-queue: cannot read queue " + missing + ": No such file or directory\n",
            r.err);
}

TEST_F(FileindexQueueTest, DirectoryIsNotAQueue) {
  Result r = Run({dir_});
  EXPECT_EQ(2, r.status);
  EXPECT_EQ("", r.out);
  EXPECT_EQ("fileindex-queue: cannot read queue " + dir_ + ": Is a directory\n", r.err);
}

TEST_F(FileindexQueueTest, UnreadableQueueIsExitStatusTwo) {
  if (::geteuid() == 0) GTEST_SKIP() << "root reads any file";
  const std::string queue = Queue({R"({"event": 2, "path": "/v/s/a"})"});
  ASSERT_EQ(0, ::chmod(queue.c_str(), 0));
  Result r = Run({queue});
  EXPECT_EQ(2, r.status);
  EXPECT_EQ("fileindex-queue: cannot read queue " + queue + ": Permission denied\n", r.err);
}

TEST_F(FileindexQueueTest, BadUsageGoesToStderrWithExitStatusTwo) {
  const std::string queue = Queue({});
  for (const auto& args :
       std::vector<std::vector<std::string>>{{}, {"--bogus", queue}, {queue, queue}, {"--json"}}) {
    Result r = Run(args);
    std::string shown;
    for (const auto& a : args) shown += a + " ";
    EXPECT_EQ(2, r.status) << shown;
    EXPECT_EQ("", r.out) << shown;
    EXPECT_NE(std::string::npos, r.err.find("usage: fileindex-queue")) << shown;
  }
}

TEST_F(FileindexQueueTest, HelpGoesToStdout) {
  Result r = Run({"--help"});
  EXPECT_EQ(0, r.status);
  EXPECT_EQ(0u, r.out.find("usage: fileindex-queue [--json] [--trace] QUEUE_FILE\n"));
  EXPECT_EQ("", r.err);
}

}  // namespace
