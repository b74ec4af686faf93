#include "kalo/kalo_share.h"

#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cstring>
#include <exception>
#include <new>
#include <string>
#include <vector>

#include "kalo/kalo_error.h"
#include "kalo_log.h"
#include "orvex/portable/share_registry.h"
#include "user_db.h"

namespace {

using orvex::portable::ShareRecord;

int PrivFromText(const std::string& text) {
  if (text == orvex::portable::kSharePrivReadWrite) return KALO_SHARE_PRIV_RW;
  if (text == orvex::portable::kSharePrivReadOnly) return KALO_SHARE_PRIV_RO;
  return KALO_SHARE_PRIV_NA;
}

void CopyText(char* out, size_t size, const std::string& text) {
  // The registry refuses names and paths that do not fit; cut defensively.
  size_t length = text.size() < size ? text.size() : size - 1;
  std::memcpy(out, text.data(), length);
  out[length] = '\0';
}

PKALOSHARE NewRecord(const ShareRecord& share) {
  PKALOSHARE record = new (std::nothrow) KALOSHARE();
  if (record == nullptr) return nullptr;
  CopyText(record->szName, sizeof(record->szName), share.name);
  CopyText(record->szPath, sizeof(record->szPath), share.path);
  record->nFTPPrivilege = share.ftp_privilege;
  record->blEncryption = share.encryption;
  record->blEncrypted = share.encrypted;
  record->blReadOnly = share.readonly;
  record->blRecycleBin = share.recycle_bin;
  record->blHideUnreadable = share.hide_unreadable;
  if (share.privileges.empty()) return record;
  record->pPrivileges = new (std::nothrow) KALOSHAREPRIV[share.privileges.size()]();
  if (record->pPrivileges == nullptr) {
    delete record;
    return nullptr;
  }
  for (const auto& entry : share.privileges) {
    KALOSHAREPRIV& priv = record->pPrivileges[record->cPrivileges++];
    CopyText(priv.szUser, sizeof(priv.szUser), entry.first);
    priv.priv = PrivFromText(entry.second);
  }
  return record;
}

int FlagGet(PKALOSHARE share, bool* value, bool KALOSHARE::*flag) {
  if (share == nullptr || value == nullptr) {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  *value = share->*flag;
  return 0;
}

const KALOSHAREPRIV* ListedPriv(PKALOSHARE share, const char* user_name) {
  for (size_t i = 0; i < share->cPrivileges; ++i) {
    if (std::strcmp(share->pPrivileges[i].szUser, user_name) == 0) return &share->pPrivileges[i];
  }
  return nullptr;
}

bool InGroup(const struct passwd& user, gid_t gid) {
  if (user.pw_gid == gid) return true;
  std::vector<gid_t> groups;
  if (!orvex::portable::GroupsOf(user, groups)) return false;
  for (gid_t member : groups) {
    if (member == gid) return true;
  }
  return false;
}

// The privilege that mode bits grant one class of users (rwx in bits 2..0):
// a directory is readable with r and x, writable with w and x.
int PrivFromBits(unsigned bits) {
  if ((bits & 01) == 0) return KALO_SHARE_PRIV_NA;
  int priv = KALO_SHARE_PRIV_NA;
  if (bits & 04) priv |= KALO_SHARE_PRIV_READ;
  if (bits & 02) priv |= KALO_SHARE_PRIV_WRITE;
  return priv;
}

int UnixPriv(const struct passwd& user, const struct stat& st) {
  if (user.pw_uid == 0) return KALO_SHARE_PRIV_RW;
  if (user.pw_uid == st.st_uid) return PrivFromBits((st.st_mode >> 6) & 07);
  if (InGroup(user, st.st_gid)) return PrivFromBits((st.st_mode >> 3) & 07);
  return PrivFromBits(st.st_mode & 07);
}

}  // namespace

int KALOShareGet(const char* share_name, PKALOSHARE* out) {
  if (out != nullptr) *out = nullptr;
  if (share_name == nullptr || share_name[0] == '\0' || out == nullptr) {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  ShareRecord share;
  try {
    if (!orvex::portable::FindShare(share_name, share)) {
      KLIBC_ERR_SET(KLIB_ERR_NO_SUCH_SHARE);
      return -1;
    }
  } catch (const std::bad_alloc&) {
    KLIBC_ERR_SET(KLIB_ERR_OUT_OF_MEMORY);
    return -1;
  } catch (const std::exception& e) {
    KALO_LOG(LOG_ERR, "KALOShareGet(%s) failed: %s", share_name, e.what());
    KLIBC_ERR_SET(KLIB_ERR_SHARE_REGISTRY);
    return -1;
  }
  *out = NewRecord(share);
  if (*out == nullptr) {
    KLIBC_ERR_SET(KLIB_ERR_OUT_OF_MEMORY);
    return -1;
  }
  return 0;
}

void KALOShareFree(PKALOSHARE share) {
  if (share == nullptr) return;
  delete[] share->pPrivileges;
  delete share;
}

int KLIBShareIsEncryptionGet(PKALOSHARE share, bool* value) {
  return FlagGet(share, value, &KALOSHARE::blEncryption);
}

int KLIBShareIsEncryptedGet(PKALOSHARE share, bool* value) {
  return FlagGet(share, value, &KALOSHARE::blEncrypted);
}

int KLIBShareIsReadOnlyGet(PKALOSHARE share, bool* value) {
  return FlagGet(share, value, &KALOSHARE::blReadOnly);
}

int KLIBShareRecycleStatusGet(PKALOSHARE share, bool* value) {
  return FlagGet(share, value, &KALOSHARE::blRecycleBin);
}

bool KLIBShareHideUnreadableGet(PKALOSHARE share) {
  bool value = false;
  return FlagGet(share, &value, &KALOSHARE::blHideUnreadable) == 0 && value;
}

int KALOShareUserPrivGet(const char* user_name, PKALOSHARE share) {
  if (user_name == nullptr || user_name[0] == '\0' || share == nullptr) {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return -1;
  }
  if (const KALOSHAREPRIV* listed = ListedPriv(share, user_name)) return listed->priv;
  orvex::portable::PasswdEntry user;
  if (!orvex::portable::LookUpUser(user_name, user)) {
    KLIBC_ERR_SET(KLIB_ERR_NO_SUCH_USER);
    return -1;
  }
  struct stat st;
  if (::stat(share->szPath, &st) != 0) {
    KLIBC_ERR_SET(KLIB_ERR_IO);
    return -1;
  }
  return UnixPriv(user.pw, st);
}
