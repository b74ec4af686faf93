// The platform's free-space check. On Linux it asks the file system holding a
// path how many bytes an unprivileged user may still write there; per-user
// disk quotas are not consulted. Thread-safe.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_QUOTA_H_
#define KALO_KALO_QUOTA_H_

#include <sys/types.h>

// Whether bytes more fit on the file system that holds path (a share root).
// uid and flags are kept for the platform's signature and must be 0 (any
// value is accepted and ignored). Returns 1 when the space available to
// unprivileged users (statvfs f_bavail blocks of f_frsize bytes) is at least
// bytes. Returns 0 with last error KLIB_ERR_OUT_OF_SPACE when it is less; 0
// with KLIB_ERR_BAD_PARAMETER for a null or empty path and with KLIB_ERR_IO
// when statvfs fails. Callers that only stop for a definite lack of space
// test the last error for KLIB_ERR_OUT_OF_SPACE / KLIB_ERR_QUOTA_EXCEEDED.
int KALOQuotaIsEnough(uid_t uid, const char* path, unsigned long long bytes, int flags);

#endif  // KALO_KALO_QUOTA_H_
