#include "platform/text_compare.h"

#include "kalo/kalo_unicode.h"

namespace orvex {
namespace sdk {

int CompareIgnoringCase(const std::string& a, const std::string& b) {
  return KLIBCUnicodeUTF8StrCaseCmp(a.c_str(), b.c_str());
}

}  // namespace sdk
}  // namespace orvex
