// The capped text buffer behind KALOMDTextContent: character boundaries,
// invalid bytes, characters split across appends, markup white space.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "extract_util.h"

namespace orvex {
namespace extract {
namespace {

TEST(TextSinkTest, CapCutsAtACharacterBoundary) {
  struct Case {
    std::string input;
    size_t cap;
    std::string expected;
    bool full;
  };
  const std::vector<Case> cases = {
      {"abcdef", 4, "abcd", true},
      {"abcd", 4, "abcd", false},
      {"\xC3\xA9\xC3\xA9\xC3\xA9", 5, "\xC3\xA9\xC3\xA9", true},  // é x3, 2 bytes each
      {"\xE6\x97\xA5\xE6\x9C\xAC\xE8\xAA\x9E", 8, "\xE6\x97\xA5\xE6\x9C\xAC", true},  // 日本語
      {"a\xF0\x9F\x98\x80", 4, "a", true},                                            // a😀
      {"a\xF0\x9F\x98\x80", 5, "a\xF0\x9F\x98\x80", false},
      {"x", 0, "", true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE("input '" + c.input + "' cap " + std::to_string(c.cap));
    TextSink sink(c.cap);
    sink.Append(c.input);
    EXPECT_EQ(c.full, sink.full());
    EXPECT_EQ(c.expected, sink.Take());
  }
}

TEST(TextSinkTest, InvalidBytesBecomeReplacementCharacters) {
  const std::string kReplacement = "\xEF\xBF\xBD";
  struct Case {
    std::string input;
    std::string expected;
  };
  const std::vector<Case> cases = {
      {"a\xFF"
       "b",
       "a" + kReplacement + "b"},
      {"\xC0\xAF", kReplacement + kReplacement},                     // overlong "/"
      {"\xED\xA0\x80", kReplacement + kReplacement + kReplacement},  // a surrogate
      {"\xF4\x90\x80\x80x", kReplacement + kReplacement + kReplacement + kReplacement + "x"},
      {"tab\there\x01\x7F", "tab\there"},  // controls other than tab and newline go
      {"\xEF\xBB\xBFstart", "start"},      // a byte-order mark goes
      {"a\r\nb", "a\nb"},
      {"ends inside \xE6\x97", "ends inside " + kReplacement},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE("input '" + c.input + "'");
    TextSink sink(100);
    sink.Append(c.input);
    EXPECT_EQ(c.expected, sink.Take());
  }
}

TEST(TextSinkTest, JoinsACharacterSplitAcrossAppends) {
  const std::string text = "\xE6\x97\xA5\xE6\x9C\xAC";  // 日本
  for (size_t split = 0; split <= text.size(); ++split) {
    SCOPED_TRACE("split at " + std::to_string(split));
    TextSink sink(100);
    sink.Append(text.substr(0, split));
    sink.Append(text.substr(split));
    EXPECT_EQ(text, sink.Take());
  }
}

TEST(TextSinkTest, MarkupWhiteSpaceCollapsesAndLinesBreakOnce) {
  TextSink sink(100);
  sink.AppendCollapsed("  Hello \n\t ");
  sink.AppendCollapsed("  world ");
  sink.Break();
  sink.Break();
  sink.AppendCollapsed("  next");
  sink.Tab();
  sink.AppendCollapsed("cell  ");
  sink.Break();
  EXPECT_EQ("Hello world\nnext\tcell", sink.Take());
}

TEST(TextSinkTest, ParsesIsoDates) {
  struct Case {
    const char* text;
    bool ok;
    int64_t seconds;
  };
  const std::vector<Case> cases = {
      {"2024-03-01T10:20:30Z", true, 1709288430},
      {"2024-03-01T11:20:30+01:00", true, 1709288430},
      {"2024-03-01T05:20:30-0500", true, 1709288430},
      {"2024-03-01T10:20:30.123456", true, 1709288430},
      {"2024-03-01 10:20:30", true, 1709288430},
      {"2021-12-31", true, 1640908800},
      {" 2021-12-31 ", true, 1640908800},
      {"2024-13-01", false, 0},
      {"2024-03-01T10", false, 0},
      {"yesterday", false, 0},
      {"", false, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string("date '") + c.text + "'");
    int64_t seconds = 0;
    EXPECT_EQ(c.ok, ParseIsoDate(c.text, &seconds));
    if (c.ok) {
      EXPECT_EQ(c.seconds, seconds);
    }
  }
}

}  // namespace
}  // namespace extract
}  // namespace orvex
