#include "kalo/kalo_user.h"

#include <grp.h>
#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstring>
#include <new>
#include <vector>

#include "kalo/kalo_error.h"
#include "kalo_log.h"
#include "user_db.h"

namespace {

using orvex::portable::GroupsOf;
using orvex::portable::LookUpUser;
using orvex::portable::PasswdEntry;

void NoteUnprivilegedOnce(const char* wanted) {
  static std::atomic<bool> noted{false};
  if (noted.exchange(true)) return;
  KALO_LOG(LOG_WARNING,
           "Not privileged to switch credentials: staying uid %u gid %u instead of user [%s]",
           static_cast<unsigned>(::geteuid()), static_cast<unsigned>(::getegid()), wanted);
}

// Takes root's effective uid back; only possible when the real or saved uid
// is 0.
bool RegainRoot() { return ::geteuid() == 0 || ::seteuid(0) == 0; }

// From effective root: groups, then gid, then uid (after seteuid the process
// could no longer change its groups or gid).
int SwitchFromRoot(const PasswdEntry& user) {
  std::vector<gid_t> groups;
  if (!GroupsOf(user.pw, groups) || ::setgroups(groups.size(), groups.data()) != 0 ||
      ::setegid(user.pw.pw_gid) != 0) {
    KLIBC_ERR_SET(KLIB_ERR_PERMISSION);
    return -1;
  }
  if (user.pw.pw_uid != 0 && ::seteuid(user.pw.pw_uid) != 0) {
    int saved = errno;
    // Back to root's group, so a failed switch leaves no mixed identity.
    if (::setegid(0) != 0) {
      // Nothing more to undo; the first failure is the one reported.
    }
    errno = saved;
    KLIBC_ERR_SET(KLIB_ERR_PERMISSION);
    return -1;
  }
  return 0;
}

}  // namespace

int KALOUserGetByUID(uid_t uid, PKALOUSER* out) {
  if (out == nullptr) {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  *out = nullptr;
  PasswdEntry entry;
  if (!LookUpUser(uid, entry)) {
    KLIBC_ERR_SET(KLIB_ERR_NO_SUCH_USER);
    return -1;
  }
  PKALOUSER user = new (std::nothrow) KALOUSER();
  if (user == nullptr) {
    KLIBC_ERR_SET(KLIB_ERR_OUT_OF_MEMORY);
    return -1;
  }
  std::strncpy(user->szName, entry.pw.pw_name, sizeof(user->szName) - 1);
  user->uid = entry.pw.pw_uid;
  user->gid = entry.pw.pw_gid;
  *out = user;
  return 0;
}

void KALOUserFree(PKALOUSER user) { delete user; }

int KALOCredResetByName(const char* user_name) {
  if (user_name == nullptr || user_name[0] == '\0') {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  PasswdEntry user;
  if (!LookUpUser(user_name, user)) {
    KLIBC_ERR_SET(KLIB_ERR_NO_SUCH_USER);
    return -1;
  }
  if (::geteuid() == user.pw.pw_uid && ::getegid() == user.pw.pw_gid) return 0;
  if (!RegainRoot()) {
    NoteUnprivilegedOnce(user_name);
    return 0;
  }
  return SwitchFromRoot(user);
}
