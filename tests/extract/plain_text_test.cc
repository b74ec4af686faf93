// Plain text in the encodings users' files come in, converted to UTF-8; the
// text cap; files larger than one read block.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "extract/test_files.h"

namespace orvex {
namespace extract {
namespace {

using testing::Encode;
using testing::Extract;

using PlainTextTest = testing::ExtractTest;

// Long enough for an encoding guess to be sure of itself.
const std::string kFrench =
    "Le garçon a mangé une crème brûlée à la façon de Noël. "
    "Où est la bibliothèque? Déjà vu, élève, forêt, naïve, cœur.\n"
    "Die Größe der Straße ist übermäßig, sagte der Bäcker.\n";
const std::string kJapanese =
    "日本語のテキストファイルです。これは文字コードを判定するための文章です。"
    "東京都の天気は晴れのち曇り、明日は雨が降るでしょう。\n"
    "吾輩は猫である。名前はまだ無い。どこで生れたかとんと見当がつかぬ。\n";

TEST_F(PlainTextTest, ConvertsEveryCommonEncodingToUtf8) {
  struct Case {
    const char* name;
    std::string bytes;
    std::string expected;
  };
  const std::string both = kFrench + kJapanese;
  const std::vector<Case> cases = {
      {"utf8.txt", both, both},
      {"utf8-bom.txt", "\xEF\xBB\xBF" + both, both},
      {"utf16le-bom.txt", "\xFF\xFE" + Encode(both, "UTF-16LE"), both},
      {"utf16be-bom.txt", "\xFE\xFF" + Encode(both, "UTF-16BE"), both},
      {"latin1.txt", Encode(kFrench + kFrench, "WINDOWS-1252"), kFrench + kFrench},
      {"shift_jis.txt", Encode(kJapanese + kJapanese, "SHIFT_JIS"), kJapanese + kJapanese},
      {"ascii.csv", "id,name\n1,alpha\n2,beta\n", "id,name\n1,alpha\n2,beta"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const auto result = Extract(dir_.Write(c.name, c.bytes));
    EXPECT_TRUE(result.ok) << result.problem;
    std::string expected = c.expected;
    while (!expected.empty() && expected.back() == '\n') expected.pop_back();
    EXPECT_EQ(expected, result.out["KALOMDTextContent"].asString());
  }
}

TEST_F(PlainTextTest, CapCutsAtACharacterBoundary) {
  struct Case {
    std::string bytes;
    size_t cap;
    std::string expected;
  };
  const std::string yen = "日本語";  // 3 bytes a character
  const std::vector<Case> cases = {
      {yen, 7, "日本"},
      {yen, 6, "日本"},
      {yen, 5, "日"},
      {"\xFF\xFE" + Encode("añb", "UTF-16LE"), 2, "a"},
      {Encode("añb", "WINDOWS-1252") + Encode(kFrench, "WINDOWS-1252"), 3, "añ"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE("text '" + c.expected + "' cap " + std::to_string(c.cap));
    const auto result = Extract(dir_.Write("capped.txt", c.bytes), c.cap);
    EXPECT_TRUE(result.ok) << result.problem;
    EXPECT_EQ(c.expected, result.out["KALOMDTextContent"].asString());
  }
}

TEST_F(PlainTextTest, CharactersAcrossReadBlocksSurvive) {
  // An odd prefix shifts every character across the 64 KiB block edges.
  std::string utf8 = "x";
  while (utf8.size() < 300 * 1024) utf8 += "é😀日";
  for (const char* charset : {"UTF-8", "UTF-16LE"}) {
    SCOPED_TRACE(charset);
    const std::string bytes =
        std::string(charset) == "UTF-8" ? utf8 : "\xFF\xFE" + Encode(utf8, charset);
    const auto result = Extract(dir_.Write("long.txt", bytes), 1 << 20);
    EXPECT_TRUE(result.ok) << result.problem;
    EXPECT_EQ(utf8, result.out["KALOMDTextContent"].asString());
  }
}

TEST_F(PlainTextTest, StopsAtTheCapInAHugeFile) {
  std::string line = "The quick brown fox jumps over the lazy dog. ";
  std::string big;
  while (big.size() < 8 * 1024 * 1024) big += line;
  const auto result = Extract(dir_.Write("huge.log", big), 1000);
  EXPECT_TRUE(result.ok) << result.problem;
  EXPECT_EQ(big.substr(0, 999), result.out["KALOMDTextContent"].asString());  // trailing blank
}

TEST_F(PlainTextTest, EmptyAndBinaryFilesGiveNoText) {
  struct Case {
    const char* name;
    std::string bytes;
  };
  const std::vector<Case> cases = {
      {"empty.txt", ""},
      {"binary.txt", std::string("\x7F"
                                 "ELF\x02\x01\x01\0\0\0\0\0\0\0\0\0\x03\0>\0",
                                 20)},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const auto result = Extract(dir_.Write(c.name, c.bytes));
    EXPECT_TRUE(result.ok) << result.problem;
    EXPECT_FALSE(result.out.isMember("KALOMDTextContent")) << result.out.toStyledString();
  }
}

TEST_F(PlainTextTest, MissingFileIsAProblem) {
  const auto result = Extract(dir_.Join("absent.txt"));
  EXPECT_FALSE(result.ok);
  EXPECT_NE(std::string::npos, result.problem.find("absent.txt")) << result.problem;
}

TEST_F(PlainTextTest, UnknownExtensionsAreLeftAlone) {
  Json::Value out;
  out["KALOMDFSName"] = "a.xyz";
  ExtractLimits limits;
  std::string problem;
  EXPECT_TRUE(ExtractMetadata(dir_.Write("a.xyz", "text"), limits, out, &problem));
  EXPECT_EQ(1u, out.size()) << out.toStyledString();
}

}  // namespace
}  // namespace extract
}  // namespace orvex
