#include "orvex/platform/sdk_credentials.h"

#include <unistd.h>

#include <memory>

#include "foundation/check.h"
#include "kalo/kalo_error.h"
#include "kalo/kalo_user.h"

namespace orvex {
namespace sdk {
namespace {

constexpr char kLogSource[] = "credentials";

struct UserFree {
  void operator()(KALOUSER* user) const { KALOUserFree(user); }
};
using UserPtr = std::unique_ptr<KALOUSER, UserFree>;

std::string PlatformError() { return std::to_string(KLIBCErrGet()); }

// The name of the current effective user.
std::string EffectiveUserName() {
  PKALOUSER user = nullptr;
  ORVEX_CHECK(0 > KALOUserGetByUID(geteuid(), &user), kErrorCredentials,
              "KALOUserGetByUID failed, err=" + PlatformError());
  UserPtr owned(user);
  return owned->szName;
}

}  // namespace

SDKCredentials::SDKCredentials(const std::string& user_name) : previous_user_(EffectiveUserName()) {
  ORVEX_CHECK(0 > KALOCredResetByName(user_name.c_str()), kErrorCredentials,
              "KALOCredResetByName failed, user=" + user_name + ", err=" + PlatformError());
}

SDKCredentials::~SDKCredentials() {
  if (0 > KALOCredResetByName(previous_user_.c_str())) {
    // A destructor must not throw; the scope that follows runs as whoever
    // the platform left us, which the log line makes visible.
    internal::LogFailedCheck(
        kLogSource, __LINE__, "0 > KALOCredResetByName(previous_user_.c_str())",
        "KALOCredResetByName failed, user=" + previous_user_ + ", err=" + PlatformError());
  }
}

}  // namespace sdk
}  // namespace orvex
