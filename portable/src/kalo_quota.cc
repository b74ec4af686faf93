#include "kalo/kalo_quota.h"

#include <sys/statvfs.h>

#include "kalo/kalo_error.h"

int KALOQuotaIsEnough(uid_t /*uid*/, const char* path, unsigned long long bytes, int /*flags*/) {
  if (path == nullptr || path[0] == '\0') {
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return 0;
  }
  struct statvfs vfs;
  if (::statvfs(path, &vfs) != 0) {
    KLIBC_ERR_SET(KLIB_ERR_IO);
    return 0;
  }
  unsigned long long block = vfs.f_frsize != 0 ? vfs.f_frsize : vfs.f_bsize;
  if (block == 0) block = 1;
  // Compare in blocks: f_bavail * f_frsize may overflow on huge volumes.
  unsigned long long blocks_needed = bytes / block + (bytes % block != 0 ? 1 : 0);
  if (static_cast<unsigned long long>(vfs.f_bavail) >= blocks_needed) return 1;
  KLIBC_ERR_SET(KLIB_ERR_OUT_OF_SPACE);
  return 0;
}
