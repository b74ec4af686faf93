// The platform's share record and the queries made on it. On Linux the record
// is read from the share registry (/etc/orvex/shares.json under ORVEX_ROOT,
// see orvex/portable/share_registry.h); every KALOShareGet reads the file
// anew, so a record reflects the registry at the time of the call. Failures
// return a negative value (or false) and set the last error (kalo_error.h).
// Thread-safe: calls share no state beyond the registry file; one record may
// be queried from several threads but freed only once.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_SHARE_H_
#define KALO_KALO_SHARE_H_

#include <cstddef>

// Sizes of the fixed text fields, terminating NUL included.
constexpr size_t KALO_SHARE_NAME_SIZE = 256;
constexpr size_t KALO_SHARE_PATH_SIZE = 4096;
constexpr size_t KALO_USER_NAME_SIZE = 256;

// A user's privilege on a share: bit 0 grants reading, bit 1 writing.
constexpr int KALO_SHARE_PRIV_NA = 0x0;  // no access
constexpr int KALO_SHARE_PRIV_RO = 0x1;  // read only
constexpr int KALO_SHARE_PRIV_RW = 0x3;  // read and write
constexpr int KALO_SHARE_PRIV_READ = 0x1;
constexpr int KALO_SHARE_PRIV_WRITE = 0x2;

// One entry of the share's explicit privilege list.
struct KALOSHAREPRIV {
  char szUser[KALO_USER_NAME_SIZE];
  int priv;  // KALO_SHARE_PRIV_NA, _RO or _RW
};

// One share as the registry describes it. Allocated by KALOShareGet and
// released with KALOShareFree, which also frees pPrivileges.
struct KALOSHARE {
  char szName[KALO_SHARE_NAME_SIZE];
  char szPath[KALO_SHARE_PATH_SIZE];  // absolute root, no trailing slash
  int nFTPPrivilege;                  // the record's FTP privilege field
  bool blEncryption;                  // the share is of the encrypted kind
  bool blEncrypted;                   // the encrypted share is locked
  bool blReadOnly;
  bool blRecycleBin;  // keeps "<szPath>/#recycle"
  bool blHideUnreadable;
  size_t cPrivileges;          // entries in pPrivileges
  KALOSHAREPRIV* pPrivileges;  // owned by the record
};
typedef KALOSHARE* PKALOSHARE;

// Looks share_name up (exact case) and stores a newly allocated record in
// *out; the caller frees it with KALOShareFree. Returns 0. On failure returns
// -1, sets *out to null (when out is not null) and the last error:
// KLIB_ERR_BAD_PARAMETER (null or empty argument), KLIB_ERR_NO_SUCH_SHARE,
// KLIB_ERR_SHARE_REGISTRY (registry unreadable or malformed; the reason is
// written to syslog) or KLIB_ERR_OUT_OF_MEMORY.
int KALOShareGet(const char* share_name, PKALOSHARE* out);

// Releases a record from KALOShareGet. A null record is ignored.
void KALOShareFree(PKALOSHARE share);

// Each stores one flag of the record in *value and returns 0; with a null
// share or value, returns -1 with KLIB_ERR_BAD_PARAMETER.
int KLIBShareIsEncryptionGet(PKALOSHARE share, bool* value);
int KLIBShareIsEncryptedGet(PKALOSHARE share, bool* value);
int KLIBShareIsReadOnlyGet(PKALOSHARE share, bool* value);
int KLIBShareRecycleStatusGet(PKALOSHARE share, bool* value);

// The hide-unreadable setting; false (with KLIB_ERR_BAD_PARAMETER) for a null
// share.
bool KLIBShareHideUnreadableGet(PKALOSHARE share);

// The privilege of user_name on the share (KALO_SHARE_PRIV_*). An entry of
// the share's privilege list decides when present, even for names the system
// does not know. Otherwise the share directory's Unix permissions decide for
// the system user of that name: uid 0 gets KALO_SHARE_PRIV_RW; others get
// the owner, group (primary or supplementary) or other class of the mode,
// where reading needs r and x and writing needs w and x. Returns -1 with
// KLIB_ERR_BAD_PARAMETER (null argument or empty name), KLIB_ERR_NO_SUCH_USER
// (unlisted and unknown to the system) or KLIB_ERR_IO (the share directory
// cannot be examined).
int KALOShareUserPrivGet(const char* user_name, PKALOSHARE share);

#endif  // KALO_KALO_SHARE_H_
