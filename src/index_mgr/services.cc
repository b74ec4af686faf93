#include "index_mgr/services.h"

#include "index_mgr/log_util.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/log.h"
#include "orvex/index_mgr.h"
#include "platform/platform_error.h"
#include "platform/services.h"

namespace orvex {
namespace fileindex {
namespace {

// Logs a failed platform call the way the platform's failures are logged:
// the call's name, then the platform's error code, file and line.
void LogPlatformFailure(int line, const char* call) {
  LogErrno("%s:%d (%d, %u) %s failed: %s", kLogSource, line, Pid(), Euid(), call,
           sdk::PlatformErrorText().c_str());
}

// A failed service step names the call as written, without a reason.
void LogFailedStep(int line, const char* condition) {
  LogErrno("%s:%d (%d, %u) Failed [%s]", kLogSource, line, Pid(), Euid(), condition);
}

// Network clients search the index through the file server, so Spotlight
// follows the indexing; the server reads the setting only when it starts.
void SwitchSpotlight(bool enable) {
  if (sdk::IsSpotlightEnabled() == enable) return;  // samba left alone
  if (0 > sdk::SetSpotlight(enable)) {
    LogPlatformFailure(__LINE__, "KALOSMBSetSpotlight");
    return;
  }
  if (0 > sdk::ServiceRestart(kSambaService)) {
    LogPlatformFailure(__LINE__, "KLIBServiceRestart");
  }
}

}  // namespace

void SetServicesEnabled(bool enable) {
  SwitchSpotlight(enable);
  if (enable) {
    if (0 > sdk::ServiceStart(kContentExtractService, /*wait=*/true)) {
      LogFailedStep(__LINE__, "0 > KLIBServiceStart(\"kalocontentextractd\", TRUE)");
    }
    if (0 > sdk::UpstartServiceStart(kFileIndexDaemonService)) {
      LogFailedStep(__LINE__,
                    "0 > KLIBServicectlStart(\"pkg-Orvex-fileindexd\", KLIB_SERVICECTL_UPSTART)");
    }
    return;
  }
  // Stopping does not wait: the caller is done with indexing either way.
  if (0 > sdk::ServiceStop(kContentExtractService, /*wait=*/false)) {
    LogFailedStep(__LINE__, "0 > KLIBServiceStop(\"kalocontentextractd\", FALSE)");
  }
  if (0 > sdk::UpstartServiceStop(kFileIndexDaemonService)) {
    LogFailedStep(__LINE__,
                  "0 > KLIBServicectlStop(\"pkg-Orvex-fileindexd\", KLIB_SERVICECTL_UPSTART)");
  }
}

void PrepareServices() {
  const FolderMgr folder_mgr;
  SetServicesEnabled(!folder_mgr.GetFolders().empty());
}

}  // namespace fileindex
}  // namespace orvex
