// The line scanner against the JSON parser: on every line the scanner takes,
// both must give the same fields; on every other line the event must be
// decided by the JSON parser alone.
#include <gtest/gtest.h>

#include <cstdint>
#include <random>
#include <string>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/queue/event.h"
#include "queue/event_parser.h"
#include "support/log_capture.h"

namespace orvex {
namespace fileindex {
namespace {

struct Outcome {
  bool ok = false;
  EventFields fields;
  int code = 0;
  std::string reason;
};

Outcome ViaJson(const std::string& line) {
  Outcome o;
  try {
    ParseEventJson(line, o.fields);
    o.ok = true;
  } catch (const Error& e) {
    o.code = static_cast<int>(e.code());
    o.reason = e.reason();
  }
  return o;
}

Outcome ViaEvent(const std::string& line) {
  Outcome o;
  try {
    Event ev(line);
    o.ok = true;
    o.fields.event = ev.event;
    o.fields.is_dir = ev.is_dir;
    o.fields.path = ev.path;
    o.fields.path_old = ev.path_old;
    o.fields.data = ev.data;
  } catch (const Error& e) {
    o.code = static_cast<int>(e.code());
    o.reason = e.reason();
  }
  return o;
}

// Returns whether the scanner took the line; fails the test when its fields
// differ from the JSON parser's or when the event differs from the JSON parse.
bool ExpectSameOutcome(const std::string& line) {
  std::vector<std::string> expected_log, actual_log;
  Outcome expected, actual;
  {
    testing::LogCapture log;
    expected = ViaJson(line);
    expected_log = log.lines();
  }
  {
    testing::LogCapture log;
    actual = ViaEvent(line);
    actual_log = log.lines();
  }
  EXPECT_EQ(actual_log, expected_log) << line;
  EventFields fast;
  const bool taken = ParseEventFast(line, fast);
  EXPECT_FALSE(taken && !expected.ok) << "scanner took a line the parser refuses: " << line;
  EXPECT_EQ(actual.ok, expected.ok) << line;
  EXPECT_EQ(actual.code, expected.code) << line;
  EXPECT_EQ(actual.reason, expected.reason) << line;
  if (expected.ok) {
    for (const EventFields* f : {&actual.fields, taken ? &fast : &actual.fields}) {
      EXPECT_EQ(f->event, expected.fields.event) << line;
      EXPECT_EQ(f->is_dir, expected.fields.is_dir) << line;
      EXPECT_EQ(f->path, expected.fields.path) << line;
      EXPECT_EQ(f->path_old, expected.fields.path_old) << line;
      EXPECT_EQ(f->data, expected.fields.data) << line;
    }
  }
  return taken;
}

TEST(EventFastPathTest, TakesTheLinesTheDaemonAndTheLibraryWrite) {
  const char* lines[] = {
      R"({"event": 64, "is_dir": false, "path": "/volume1/photo/a.jpg"})",
      R"({"event": 256, "is_dir": true, "path": "/v/s/new", "path_old": "/v/s/old"})",
      R"({"event":65536,"path":"/v/s/d","path_old":"","data":null})",
      "{\"event\":2,\"path\":\"/v/s/\xE7\x85\xA7\xE7\x89\x87.jpg\"}",
      " \t{\"event\":0,\"path\":\"\"}\r\n ",
      R"({"event":4294967295,"path":"/a","ts":12345,"x":null,"y":true,"z":"q"})",
  };
  for (const char* line : lines) EXPECT_TRUE(ExpectSameOutcome(line)) << line;
}

TEST(EventFastPathTest, LeavesEverythingElseToTheJsonParser) {
  const char* lines[] = {
      R"({"event":4294967296,"path":"/a"})",     // past 32 bits: a wrong type
      R"({"event":99999999999999999999,"path":"/a"})",
      R"({"event":-1,"path":"/a"})",
      R"({"event":64.0,"path":"/a"})",
      R"({"event":6.4e1,"path":"/a"})",
      R"({"event":064,"path":"/a"})",
      R"({"event":true,"path":"/a"})",            // converts to 1
      R"({"event":null,"path":"/a"})",            // converts to 0
      R"({"event":"64","path":"/a"})",
      R"({"event":64,"path":null})",
      R"({"event":64,"path":"/a","is_dir":1})",   // converts to true
      R"({"event":64,"path":"/a","is_dir":"x"})",
      R"({"event":64,"path":"/a","is_dir":null})",
      R"({"event":64,"path":"/a","path_old":null})",
      R"({"event":64,"path":"/a","data":{"photo":true}})",
      R"({"event":64,"path":"/a","data":[1]})",
      R"({"event":64,"path":"/a","path":"/b"})",  // the last one counts
      R"({"event":64,"event":2,"path":"/a"})",
      R"({"event":64,"path":"/a\/b"})",
      R"({"event":64,"path":"/a\u00e9"})",
      R"({"event":64,"path":"/a"} // note)",
      R"(/* c */{"event":64,"path":"/a"})",
      R"({"event":64,"path":"/a",})",
      R"({"event":64,"path":"/a"} x)",
      R"({"event":64,"path":"/a"}{})",
      R"({"event":64 "path":"/a"})",
      R"({'event':64,"path":"/a"})",
      R"({event:64,"path":"/a"})",
      "\xEF\xBB\xBF{\"event\":64,\"path\":\"/a\"}",
      "{\"event\":64,\"path\":\"/a\tb\"}",
      R"({"event":64})",
      R"({"path":"/a"})",
      "{}",
      "[]",
      "64",
      "",
      "{",
      R"({"event":64,"path":"/a")",
  };
  for (const char* line : lines) EXPECT_FALSE(ExpectSameOutcome(line)) << line;
  // A NUL inside the line, which the C string above cut short.
  EXPECT_FALSE(ExpectSameOutcome(std::string("{\"event\":64,\"path\":\"/a\0b\"}", 26)));
  EXPECT_FALSE(ExpectSameOutcome(std::string("{\"event\":64,\"path\":\"/a\"}\0", 25)));
}

// Lines built from the pieces above and then truncated, spliced and
// overwritten at random: whatever the scanner takes, it must read exactly as
// the JSON parser does.
TEST(EventFastPathTest, AgreesWithTheJsonParserOnMutatedLines) {
  const std::vector<std::string> keys = {"\"event\"", "\"path\"", "\"is_dir\"", "\"path_old\"",
                                         "\"data\"",  "\"ts\"",   "\"\"",       "\"évent\""};
  const std::vector<std::string> values = {
      "0", "64", "4294967295", "4294967296", "-1", "1.5", "1e3", "007", "true", "false",
      "null", "\"\"", "\"/v/s/a b.jpg\"", "\"/v/\xC3\xA9\"", "\"\\n\"", "{}", "[]",
      "{\"photo\":true}", "\"\xFF\xFE\""};
  const std::vector<std::string> blanks = {"", " ", "\t", "\r\n", "  "};
  const std::string noise = "{}[]\",:/\\ \t\r\n0123456789-+.eEtrufalsn\x01\x7F\xC3\xFF";
  std::mt19937 rng(20240601);
  auto pick = [&rng](size_t n) { return static_cast<size_t>(rng() % n); };
  int taken = 0;
  for (int i = 0; i < 20000; ++i) {
    std::string line = blanks[pick(blanks.size())] + "{";
    const size_t members = 2 + pick(4);
    for (size_t m = 0; m < members; ++m) {
      if (m > 0) line += ",";
      line += blanks[pick(blanks.size())];
      // Mostly the two required members with values of their usual types,
      // so that many lines stay within the scanner's ground.
      const size_t key = m < 2 && pick(4) != 0 ? m : pick(keys.size());
      line += keys[key];
      line += blanks[pick(blanks.size())] + ":" + blanks[pick(blanks.size())];
      if (key == 0 && pick(4) != 0) {
        line += values[pick(3)];
      } else if (key == 1 && pick(4) != 0) {
        line += values[11 + pick(3)];
      } else {
        line += values[pick(values.size())];
      }
    }
    line += "}" + blanks[pick(blanks.size())];
    switch (pick(6)) {  // half of the lines stay whole
      case 0:
        line.resize(pick(line.size() + 1));
        break;
      case 1:
        line[pick(line.size())] = noise[pick(noise.size())];
        break;
      case 2:
        line.insert(pick(line.size() + 1), 1, noise[pick(noise.size())]);
        break;
      default:
        break;
    }
    if (ExpectSameOutcome(line)) ++taken;
    if (::testing::Test::HasFailure()) return;
  }
  // The generator must reach the scanner's own ground, not only fallbacks.
  EXPECT_GT(taken, 1000);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
