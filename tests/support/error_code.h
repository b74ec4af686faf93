// CodeOf: the Error code a call throws, for tests that tabulate outcomes.
#ifndef ORVEX_TESTS_SUPPORT_ERROR_CODE_H_
#define ORVEX_TESTS_SUPPORT_ERROR_CODE_H_

#include <string>

#include "orvex/foundation/error.h"

namespace orvex {
namespace testing {

// The Error code call throws (its reason in *reason); 0 when it returns.
template <typename Call>
int CodeOf(Call call, std::string* reason = nullptr) {
  try {
    call();
  } catch (const Error& e) {
    if (reason != nullptr) *reason = e.reason();
    return e.code();
  }
  return 0;
}

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_SUPPORT_ERROR_CODE_H_
