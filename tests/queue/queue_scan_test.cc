#include "queue/queue_scan.h"

#include <gtest/gtest.h>

#include <string>

#include "orvex/foundation/error.h"
#include "queue/line_reader.h"
#include "support/error_code.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

const std::string kReindex = R"({"event":65536,"path":"/v/s"})";
const std::string kModify = R"({"event":2,"path":"/v/t"})";
const std::string kNulPath = R"({"event":65536,"path":"/v/s\u0000x"})";
const std::string kNulPathOld = R"({"event":256,"path":"/v/s/b","path_old":"/v/s/a\u0000"})";

// A line over the cap that is valid JSON and whose head alone would scan as
// a reindex: it must be refused for its length, not read by its head.
std::string LongReindex() { return kReindex + std::string(LineReader::kDefaultMaxLine, ' '); }

TEST(QueueScanTest, OverLongLinesAndNulPathsAreMalformedAndAPartialLastLineIsNotLookedAt) {
  const std::string long_line = LongReindex();
  const std::string long_head = long_line.substr(0, LineReader::kLongLineHead) + "...";
  const struct {
    const char* name;
    std::string text;
    int expected;        // 1 or 0 for the answer, else the Error code
    std::string logged;  // a text the one error log line must hold
  } cases[] = {
      {"over-long line before the match", long_line + "\n" + kReindex + "\n", kErrorMalformedEvent,
       "Failed [reader.last_line_too_long()], reason: Malformed event_raw of " +
           std::to_string(long_line.size()) + " bytes, longer than 1048576: " + long_head},
      {"match before the over-long line", kReindex + "\n" + long_line + "\n", 1, ""},
      {"over-long last line still being appended", kModify + "\n" + long_line, 0, ""},
      {"escaped NUL in path", kNulPath + "\n" + kReindex + "\n", kErrorMalformedEvent,
       "reason: Malformed event_raw: " + kNulPath},
      {"escaped NUL in path_old", kNulPathOld + "\n" + kReindex + "\n", kErrorMalformedEvent,
       "reason: Malformed event_raw: " + kNulPathOld},
      {"raw NUL in path", std::string("{\"event\":65536,\"path\":\"/v/\0s\"}\n", 31),
       kErrorMalformedEvent, "Malformed event_raw: "},
  };
  testing::TempDir dir;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    testing::LogCapture log;
    const std::string path = dir.Write("queue", c.text);
    bool answer = false;
    const int code = testing::CodeOf(
        [&] { answer = ScanQueue(path, [](const Event& e) { return e.event == EVENT_REINDEX; }); });
    EXPECT_EQ(code != 0 ? code : static_cast<int>(answer), c.expected);
    if (c.logged.empty()) {
      EXPECT_TRUE(log.lines().empty());
      continue;
    }
    ASSERT_EQ(log.lines().size(), 1u);
    EXPECT_NE(log.lines()[0].find(c.logged), std::string::npos) << log.lines()[0];
    // Never the whole line: a log line stays short whatever the queue holds.
    EXPECT_LT(log.lines()[0].size(), 600u);
  }
}

TEST(QueueScanTest, NoFileIsNoMatchAndAnUnreadableOneFailsWith502) {
  testing::TempDir dir;
  testing::LogCapture log;
  auto any = [](const Event&) { return true; };
  EXPECT_FALSE(ScanQueue(dir.Join("absent"), any));
  std::string reason;
  EXPECT_EQ(testing::CodeOf([&] { ScanQueue(dir.path(), any); }, &reason), kErrorSystem);
  EXPECT_EQ(reason, "Failed to open queue, reason=Is a directory");
  EXPECT_EQ(log.Matching("queue_mgr:").size(), 1u);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
