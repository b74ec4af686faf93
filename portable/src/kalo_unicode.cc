#include "kalo/kalo_unicode.h"

#include <unicode/uchar.h>
#include <unicode/ustring.h>
#include <unicode/utypes.h>

#include <cstring>
#include <vector>

namespace {

int Sign(int value) { return (value > 0) - (value < 0); }

// UTF-8 to UTF-16; false for invalid UTF-8 (no substitution: the caller
// then falls back to bytes rather than compare replacement characters).
bool ToUtf16(const char* text, std::vector<UChar>& out) {
  UErrorCode status = U_ZERO_ERROR;
  int32_t length = 0;
  u_strFromUTF8(nullptr, 0, &length, text, -1, &status);
  if (status != U_BUFFER_OVERFLOW_ERROR && U_FAILURE(status)) return false;
  out.assign(static_cast<size_t>(length) + 1, 0);
  status = U_ZERO_ERROR;
  u_strFromUTF8(out.data(), length + 1, nullptr, text, -1, &status);
  return U_SUCCESS(status);
}

}  // namespace

int KLIBCUnicodeUTF8StrCaseCmp(const char* a, const char* b) {
  if (a == nullptr || b == nullptr) return (a != nullptr) - (b != nullptr);
  std::vector<UChar> wide_a;
  std::vector<UChar> wide_b;
  if (!ToUtf16(a, wide_a) || !ToUtf16(b, wide_b)) return Sign(std::strcmp(a, b));
  UErrorCode status = U_ZERO_ERROR;
  int32_t result = u_strCaseCompare(wide_a.data(), -1, wide_b.data(), -1,
                                    U_FOLD_CASE_DEFAULT | U_COMPARE_CODE_POINT_ORDER, &status);
  if (U_FAILURE(status)) return Sign(std::strcmp(a, b));
  return Sign(result);
}
