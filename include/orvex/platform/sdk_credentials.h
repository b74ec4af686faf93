// SDKCredentials: makes a named user the process's effective user for a
// scope and switches back to the previous one when the scope ends. Credentials
// are process-wide: one thread at a time, and scopes must nest (the last one
// made is the first one dropped).
#ifndef ORVEX_PLATFORM_SDK_CREDENTIALS_H_
#define ORVEX_PLATFORM_SDK_CREDENTIALS_H_

#include <string>

#include "orvex/export.h"

namespace orvex {
namespace sdk {

class ORVEX_EXPORT SDKCredentials {
 public:
  // Remembers the current effective user's name, then makes user_name the
  // effective user (its uid, primary group and groups). A process that is not
  // privileged and cannot regain root keeps its own identity (the platform
  // notes it once in the log) and does not throw. Throws Error 503 when the
  // current effective user cannot be looked up ("KALOUserGetByUID failed,
  // err=<platform error>") or the switch fails (the reason names user_name);
  // nothing needs undoing then.
  explicit SDKCredentials(const std::string& user_name);
  SDKCredentials(const SDKCredentials&) = delete;
  SDKCredentials& operator=(const SDKCredentials&) = delete;
  SDKCredentials(SDKCredentials&&) = delete;
  SDKCredentials& operator=(SDKCredentials&&) = delete;
  // Switches back to the remembered user; a failure is only logged.
  ~SDKCredentials();

 private:
  std::string previous_user_;
};

}  // namespace sdk
}  // namespace orvex

#endif  // ORVEX_PLATFORM_SDK_CREDENTIALS_H_
