// kSanitized: whether this build runs under AddressSanitizer, whose runtime
// changes what some faults look like (its allocator dies on its own when
// memory is capped, crashes end with exit status 1) and opens descriptors
// of its own.
#ifndef ORVEX_TESTS_SUPPORT_SANITIZER_H_
#define ORVEX_TESTS_SUPPORT_SANITIZER_H_

namespace orvex {
namespace testing {

#if defined(__SANITIZE_ADDRESS__)
constexpr bool kSanitized = true;
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
constexpr bool kSanitized = true;
#else
constexpr bool kSanitized = false;
#endif
#else
constexpr bool kSanitized = false;
#endif

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_SUPPORT_SANITIZER_H_
