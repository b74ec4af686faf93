// The compact JSON writer's strings: what is escaped, and how bytes that are
// not UTF-8 are written in each mode. (That every kind of value reads back
// equal is tested with the search daemon, its main user.)
#include "orvex/portable/json_text.h"

#include <gtest/gtest.h>

#include <string>

namespace orvex {
namespace portable {
namespace {

TEST(JsonTextTest, StringsInBothModes) {
  const struct {
    const char* what;
    std::string bytes;
    std::string as_is;             // the text with NonUtf8Bytes::kAsIs
    std::string surrogate_escape;  // with kSurrogateEscape, when it differs
  } cases[] = {
      {"plain", "a b/c", R"("a b/c")", ""},
      {"quote and backslash", "\"\\", R"("\"\\")", ""},
      {"named controls", "\b\f\n\r\t", R"("\b\f\n\r\t")", ""},
      {"other controls and NUL", std::string("\x01\x1f\0", 3), R"("\u0001\u001f\u0000")", ""},
      {"DEL and UTF-8 as themselves", "\x7f\xc3\xa9\xe6\x97\xa5\xf0\x9f\x98\x80",
       "\"\x7f\xc3\xa9\xe6\x97\xa5\xf0\x9f\x98\x80\"", ""},
      {"stray bytes", "a\xff\xfe", "\"a\xff\xfe\"", R"("a\udcff\udcfe")"},
      {"overlong slash", "\xc0\xaf", "\"\xc0\xaf\"", R"("\udcc0\udcaf")"},
      {"encoded surrogate", "\xed\xa0\x80", "\"\xed\xa0\x80\"", R"("\udced\udca0\udc80")"},
      {"past U+10FFFF", "\xf4\x90\x80\x80", "\"\xf4\x90\x80\x80\"",
       R"("\udcf4\udc90\udc80\udc80")"},
      {"cut short at the end", "\xe6\x97", "\"\xe6\x97\"", R"("\udce6\udc97")"},
      {"cut short before ASCII", "\xe6\x97\"x\xc3\xa9", "\"\xe6\x97\\\"x\xc3\xa9\"",
       "\"\\udce6\\udc97\\\"x\xc3\xa9\""},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    std::string as_is = "[";
    AppendJsonString(c.bytes, as_is);
    EXPECT_EQ("[" + c.as_is, as_is);
    std::string escaped;
    AppendJsonString(c.bytes, escaped, NonUtf8Bytes::kSurrogateEscape);
    EXPECT_EQ(c.surrogate_escape.empty() ? c.as_is : c.surrogate_escape, escaped);
  }
}

TEST(JsonTextTest, MemberNamesAreStringsLikeAnyOther) {
  Json::Value value;
  value["p\xff"]["n"] = Json::Value(Json::arrayValue);
  value["p\xff"]["n"].append(-1);
  value["p\xff"]["n"].append(0.5);
  value["p\xff"]["n"].append(Json::Value());
  EXPECT_EQ(R"({"p\udcff":{"n":[-1,0.5,null]}})", JsonText(value, NonUtf8Bytes::kSurrogateEscape));
}

}  // namespace
}  // namespace portable
}  // namespace orvex
