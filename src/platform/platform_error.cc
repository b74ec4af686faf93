#include "platform/platform_error.h"

#include <cstdio>

#include "kalo/kalo_error.h"

namespace orvex {
namespace sdk {

std::string PlatformErrorText() {
  char text[128];
  std::snprintf(text, sizeof(text), "err=[0x%04X %s:%d]", KLIBCErrGet(), KLIBCErrorGetFile(),
                KLIBCErrorGetLine());
  return text;
}

int PlatformErrorCode() { return KLIBCErrGet(); }

void ClearPlatformError() { KLIBCErrClear(); }

}  // namespace sdk
}  // namespace orvex
