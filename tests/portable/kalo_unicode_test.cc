#include "kalo/kalo_unicode.h"

#include <gtest/gtest.h>

namespace {

int Sign(int v) { return (v > 0) - (v < 0); }

TEST(KaloUnicodeTest, ComparesByCaseFolding) {
  struct Case {
    const char* a;
    const char* b;
    int sign;
  };
  const Case cases[] = {
      {"Photo", "photo", 0},
      {"PHOTO", "photo", 0},
      {"apple", "Banana", -1},  // letter order, not byte order ('B' < 'a')
      {"Zebra", "apple", 1},
      {"photo", "photos", -1},
      {"", "", 0},
      {"", "a", -1},
      {"\xC3\xA9t\xC3\xA9", "\xC3\x89T\xC3\x89", 0},                // "été" / "ÉTÉ"
      {"stra\303\237e", "STRASSE", 0},                              // "straße" folds to "strasse"
      {"\xCE\xA3\xCE\x9F\xCE\xA6", "\xCF\x83\xCE\xBF\xCF\x86", 0},  // "ΣΟΦ" / "σοφ"
      {"\xD1\x84\xD0\xBE\xD1\x82\xD0\xBE", "\xD0\xA4\xD0\x9E\xD0\xA2\xD0\x9E", 0},  // фото
      {"e", "\xC3\xA9", -1},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(Sign(KLIBCUnicodeUTF8StrCaseCmp(c.a, c.b)), c.sign) << c.a << " vs " << c.b;
    EXPECT_EQ(Sign(KLIBCUnicodeUTF8StrCaseCmp(c.b, c.a)), -c.sign) << c.b << " vs " << c.a;
  }
}

TEST(KaloUnicodeTest, InvalidUtf8FallsBackToBytes) {
  const char bad[] = "A\xFF";
  const char overlong[] = "\xC0\xAF";
  EXPECT_EQ(KLIBCUnicodeUTF8StrCaseCmp(bad, bad), 0);
  EXPECT_LT(KLIBCUnicodeUTF8StrCaseCmp(bad, "a\xFF"), 0) << "bytes: 'A' < 'a', no folding";
  EXPECT_GT(KLIBCUnicodeUTF8StrCaseCmp("a", bad), 0);
  EXPECT_NE(KLIBCUnicodeUTF8StrCaseCmp(overlong, "/"), 0);
  EXPECT_LT(KLIBCUnicodeUTF8StrCaseCmp("\xE2\x82", "\xE2\x82\xAC"), 0);  // truncated sequence
}

TEST(KaloUnicodeTest, NullSortsFirst) {
  EXPECT_EQ(KLIBCUnicodeUTF8StrCaseCmp(nullptr, nullptr), 0);
  EXPECT_LT(KLIBCUnicodeUTF8StrCaseCmp(nullptr, ""), 0);
  EXPECT_GT(KLIBCUnicodeUTF8StrCaseCmp("", nullptr), 0);
}

}  // namespace
