#include "kalo/kalo_service.h"

#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

#include "kalo/kalo_error.h"
#include "kalo/kalo_exec.h"
#include "kalo_log.h"
#include "orvex/portable/root.h"

namespace {

// systemctl lives in /bin on merged-/usr systems and in /usr/bin elsewhere;
// KLIBCExec does no PATH search.
constexpr const char* kSystemctlPaths[] = {"/bin/systemctl", "/usr/bin/systemctl"};

bool SystemdRuns() {
  struct stat st;
  return ::stat(orvex::portable::RootPath(kSystemdRunDir).c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

const char* Systemctl() {
  for (const char* path : kSystemctlPaths) {
    if (::access(path, X_OK) == 0) return path;
  }
  return kSystemctlPaths[1];
}

// Runs the action on the service through whichever manager this machine has.
int Control(const char* action, const char* name, bool wait) {
  if (name == nullptr || *name == '\0') {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  int status;
  if (SystemdRuns()) {
    status = wait ? KLIBCExec(Systemctl(), action, name)
                  : KLIBCExec(Systemctl(), "--no-block", action, name);
  } else {
    const char* ctl = std::getenv(kServiceCtlEnv);
    if (ctl == nullptr || *ctl == '\0') {
      KALO_LOG(LOG_ERR, "cannot %s %s: no systemd and %s is not set", action, name, kServiceCtlEnv);
      KLIBC_ERR_SET(KLIB_ERR_NO_SERVICE_MANAGER);
      return -1;
    }
    status = KLIBCExec(ctl, action, name);
  }
  if (status < 0) return -1;  // KLIBCExec recorded why
  if (status != 0) {
    KALO_LOG(LOG_ERR, "%s %s: control program exited with %d", action, name, status);
    KLIBC_ERR_SET(KLIB_ERR_SERVICE_CONTROL);
    return -1;
  }
  return 0;
}

int ControlUpstart(const char* action, const char* name, int type) {
  if (type != KLIB_SERVICECTL_UPSTART) {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  return Control(action, name, /*wait=*/true);
}

}  // namespace

int KLIBServiceStart(const char* name, int wait) { return Control("start", name, wait != 0); }

int KLIBServiceStop(const char* name, int wait) { return Control("stop", name, wait != 0); }

int KLIBServiceRestart(const char* name) { return Control("restart", name, /*wait=*/true); }

int KLIBServicectlStart(const char* name, int type) { return ControlUpstart("start", name, type); }

int KLIBServicectlStop(const char* name, int type) { return ControlUpstart("stop", name, type); }
