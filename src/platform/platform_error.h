// The platform's last error as the library's log lines show it. Reads the
// calling thread's last platform error: call it right after the failed call.
#ifndef ORVEX_SRC_PLATFORM_PLATFORM_ERROR_H_
#define ORVEX_SRC_PLATFORM_PLATFORM_ERROR_H_

#include <string>

namespace orvex {
namespace sdk {

// "err=[0x%04X %s:%d]": the platform's error code with the file and line
// where the platform detected it.
std::string PlatformErrorText();

// The platform's error code alone (0 when no platform call has failed).
int PlatformErrorCode();

// Forgets the calling thread's last platform error, so that the next check
// reads the error of the call that follows, not a stale one.
void ClearPlatformError();

}  // namespace sdk
}  // namespace orvex

#endif  // ORVEX_SRC_PLATFORM_PLATFORM_ERROR_H_
