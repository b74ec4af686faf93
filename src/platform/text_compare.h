// Comparing names as people read them: UTF-8 text without regard to letter
// case, by full Unicode case folding ("é" equals "É", "ß" equals "SS").
// Safe for concurrent use.
#ifndef ORVEX_SRC_PLATFORM_TEXT_COMPARE_H_
#define ORVEX_SRC_PLATFORM_TEXT_COMPARE_H_

#include <string>

namespace orvex {
namespace sdk {

// Negative, 0 or positive as a sorts before, equal to or after b once both
// are case-folded; text that is not valid UTF-8 compares byte by byte.
// Never throws.
int CompareIgnoringCase(const std::string& a, const std::string& b);

}  // namespace sdk
}  // namespace orvex

#endif  // ORVEX_SRC_PLATFORM_TEXT_COMPARE_H_
