#include "platform/services.h"

#include "kalo/kalo_service.h"
#include "kalo/kalo_smb.h"

namespace orvex {
namespace sdk {

int ServiceStart(const std::string& name, bool wait) {
  return KLIBServiceStart(name.c_str(), wait ? TRUE : FALSE);
}

int ServiceStop(const std::string& name, bool wait) {
  return KLIBServiceStop(name.c_str(), wait ? TRUE : FALSE);
}

int ServiceRestart(const std::string& name) { return KLIBServiceRestart(name.c_str()); }

int UpstartServiceStart(const std::string& name) {
  return KLIBServicectlStart(name.c_str(), KLIB_SERVICECTL_UPSTART);
}

int UpstartServiceStop(const std::string& name) {
  return KLIBServicectlStop(name.c_str(), KLIB_SERVICECTL_UPSTART);
}

// An unreadable setting is "off": switching on then rewrites it whole.
bool IsSpotlightEnabled() { return KALOSMBIsEnableSpotlight() > 0; }

int SetSpotlight(bool on) { return KALOSMBSetSpotlight(on ? 1 : 0); }

}  // namespace sdk
}  // namespace orvex
