#include "orvex/queue/event.h"

#include <gtest/gtest.h>

#include <functional>
#include <random>
#include <string>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "queue/event_parser.h"
#include "support/log_capture.h"

namespace orvex {
namespace fileindex {
namespace {

TEST(EventTest, ParsesFieldsAndIgnoresWhatItDoesNotUse) {
  Event full(R"({"event":256,"is_dir":true,"path":"/v/s/new","path_old":"/v/s/old",)"
             R"("data":{"photo":true},"ts":12345})");
  EXPECT_EQ(full.event, 256u);
  EXPECT_TRUE(full.is_dir);
  EXPECT_EQ(full.path, "/v/s/new");
  EXPECT_EQ(full.path_old, "/v/s/old");
  EXPECT_EQ(toString(full.data), R"({"photo":true})");
}

TEST(EventTest, RejectsBadLinesWithTheirCodesAndLogsMalformedText) {
  const std::vector<std::pair<std::string, ErrorCode>> cases = {
      {"not json", kErrorMalformedEvent},
      {R"({"event":64,"path":"/a"} trailing)", kErrorMalformedEvent},
      {"[1,2]", kErrorBadArgument},
      {R"({"path":"/a"})", kErrorBadArgument},
      {R"({"event":"128","path":"/a"})", kErrorBadArgument},  // the mask must be a number
      {R"({"event":-1,"path":"/a"})", kErrorBadArgument},
      {R"({"event":64,"path":["/a"]})", kErrorBadArgument},
      // A path is cut at its first NUL byte by every file-system call.
      {R"({"event":64,"path":"/a\u0000b"})", kErrorMalformedEvent},
      {R"({"event":256,"path":"/b","path_old":"/a\u0000"})", kErrorMalformedEvent},
      {std::string("{\"event\":64,\"path\":\"/a\0b\"}", 26), kErrorMalformedEvent},
  };
  for (const auto& [text, code] : cases) {
    testing::LogCapture log;
    try {
      Event ev(text);
      ADD_FAILURE() << "accepted: " << text;
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), code) << text << ": " << e.reason();
      if (code != kErrorMalformedEvent) continue;
      EXPECT_EQ(e.reason(), "Malformed event_raw: " + text);
      ASSERT_EQ(log.lines().size(), 1u) << text;
      EXPECT_EQ(log.lines()[0].rfind("optree:", 0), 0u) << log.lines()[0];
      // The log stops at a NUL byte of the line.
      const std::string reason = e.reason().substr(0, e.reason().find('\0'));
      EXPECT_NE(log.lines()[0].find("], reason: " + reason), std::string::npos) << log.lines()[0];
    }
  }
}

// Whatever line the scanner takes it must read as the JSON parser does, and an
// Event must come out (or fail, logs included) as from the JSON parser alone.
// Returns whether the scanner took the line.
bool ExpectSameAsJson(const std::string& line) {
  struct Outcome {
    EventFields fields;
    std::string error;
    std::vector<std::string> log;
  };
  auto run = [](const std::function<void(EventFields&)>& parse) {
    Outcome o;
    testing::LogCapture log;
    try {
      parse(o.fields);
    } catch (const Error& e) {
      o.error = std::to_string(e.code()) + " " + e.reason();
    }
    o.log = log.lines();
    return o;
  };
  const Outcome json = run([&line](EventFields& f) { ParseEventJson(line, f); });
  const Outcome event = run([&line](EventFields& f) {
    Event ev(line);
    f = EventFields{ev.event, ev.is_dir, ev.path, ev.path_old, ev.data};
  });
  EventFields fast;
  const bool taken = ParseEventFast(line, fast);
  EXPECT_EQ(event.error, json.error) << line;
  EXPECT_EQ(event.log, json.log) << line;
  EXPECT_FALSE(taken && !json.error.empty()) << "scanner took a line the parser refuses: " << line;
  if (!json.error.empty()) return taken;
  // Whichever parser took it, no event leaves with a NUL byte in a path.
  EXPECT_EQ(json.fields.path.find('\0'), std::string::npos) << line;
  EXPECT_EQ(json.fields.path_old.find('\0'), std::string::npos) << line;
  for (const EventFields* f : {&event.fields, taken ? &fast : &event.fields}) {
    EXPECT_EQ(f->event, json.fields.event) << line;
    EXPECT_EQ(f->is_dir, json.fields.is_dir) << line;
    EXPECT_EQ(f->path, json.fields.path) << line;
    EXPECT_EQ(f->path_old, json.fields.path_old) << line;
    EXPECT_EQ(f->data, json.fields.data) << line;
  }
  return taken;
}

TEST(EventTest, ScannerTakesTheUsualLinesAndLeavesTheRestToTheJsonParser) {
  const char* taken[] = {
      R"({"event": 64, "is_dir": false, "path": "/volume1/photo/a.jpg"})",
      R"({"event": 256, "is_dir": true, "path": "/v/s/new", "path_old": "/v/s/old"})",
      "{\"event\":2,\"path\":\"/v/s/\xE7\x85\xA7\xE7\x89\x87.jpg\"}",
      " \t{\"event\":0,\"path\":\"\"}\r\n ",
      R"({"event":4294967295,"path":"/a","ts":12345,"x":null,"y":true,"z":"q"})",
      R"({"event":256,"path":"/v/Family \"best\"/a\\b\/c","path_old":"\b\f\n\r\t\"","z":"\\"})",
  };
  for (const char* line : taken) EXPECT_TRUE(ExpectSameAsJson(line)) << line;
  // What the mutated lines below rarely produce: long numbers, unicode and
  // bad escapes, escaped keys, comments, a byte order mark, NUL bytes.
  const std::string left[] = {
      R"({"event":99999999999999999999,"path":"/a"})",
      R"({"event":64,"path":"/a\u00e9"})",
      R"({"event":64,"path":"/a\x"})",
      R"({"event":64,"pa\th":"/a","path":"/b"})",
      R"({"event":64,"path":"/a"} // note)",
      "\xEF\xBB\xBF{\"event\":64,\"path\":\"/a\"}",
      std::string("{\"event\":64,\"path\":\"/a\0b\"}", 26),
      R"({"event":64,"path":"/a\u0000"})",
      R"({"event":256,"path":"/b","path_old":"\u0000/a"})",
  };
  for (const std::string& line : left) EXPECT_FALSE(ExpectSameAsJson(line)) << line;
}

// Lines built from usual pieces, then truncated, overwritten or spliced.
TEST(EventTest, ScannerAgreesWithTheJsonParserOnMutatedLines) {
  const std::vector<std::string> keys = {"\"event\"", "\"path\"", "\"is_dir\"", "\"path_old\"",
                                         "\"data\"",  "\"ts\"",   "\"\"",       "\"évent\""};
  // 0-2 usual masks, 11-15 usual paths.
  // One row per kind of value reads better than one value per line.
  // clang-format off
  const std::vector<std::string> values = {
      "0", "64", "4294967295", "4294967296", "-1", "1.5", "1e3", "007", "true", "false", "null",
      "\"\"", "\"/v/s/a b.jpg\"", "\"/v/\xC3\xA9\"", "\"\\n\"", "\"/v/a \\\"b\\\" \\\\ \\/c\"",
      "{}", "[]", "{\"photo\":true}", "\"\xFF\xFE\"", "\"/v/\\u0000\""};
  // clang-format on
  const std::vector<std::string> blanks = {"", " ", "\t", "\r\n", "  "};
  const std::string noise = "{}[]\",:/\\ \t\r\n0123456789-+.eEtrufalsn\x01\x7F\xC3\xFF";
  std::mt19937 rng(20240601);
  auto pick = [&rng](size_t n) { return static_cast<size_t>(rng() % n); };
  auto blank = [&] { return blanks[pick(blanks.size())]; };
  int taken = 0;
  for (int i = 0; i < 20000 && !::testing::Test::HasFailure(); ++i) {
    std::string line = blank() + "{";
    for (size_t m = 0, members = 2 + pick(4); m < members; ++m) {
      // Mostly the required members with usual values: the scanner's ground.
      const size_t key = m < 2 && pick(4) != 0 ? m : pick(keys.size());
      line += (m > 0 ? "," : "") + blank() + keys[key] + blank() + ":" + blank();
      if (key < 2 && pick(4) != 0) {
        line += values[key == 0 ? pick(3) : 11 + pick(5)];
      } else {
        line += values[pick(values.size())];
      }
    }
    line += "}" + blank();
    const size_t mutation = pick(6);  // half of the lines stay whole
    if (mutation == 0) line.resize(pick(line.size() + 1));
    if (mutation == 1) line[pick(line.size())] = noise[pick(noise.size())];
    if (mutation == 2) line.insert(pick(line.size() + 1), 1, noise[pick(noise.size())]);
    if (ExpectSameAsJson(line)) ++taken;
  }
  // The generator must reach the scanner's own ground, not only fallbacks.
  EXPECT_GT(taken, 1000);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
