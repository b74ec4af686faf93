// System users and the process's effective identity. User records come from
// the system's user database (getpwuid_r, getpwnam_r). The credential reset
// changes the EFFECTIVE user and group ids of the whole process (and its
// supplementary groups), keeping the real and saved ids, so a process started
// as root can always return to root. One thread at a time: credentials are
// process-wide state; callers serialise switches themselves.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_USER_H_
#define KALO_KALO_USER_H_

#include <sys/types.h>

#include <cstddef>

constexpr size_t KALO_USER_RECORD_NAME_SIZE = 256;

// A system user. Allocated by KALOUserGetByUID, released by KALOUserFree.
struct KALOUSER {
  char szName[KALO_USER_RECORD_NAME_SIZE];
  uid_t uid;
  gid_t gid;  // primary group
};
typedef KALOUSER* PKALOUSER;

// Looks uid up and stores a newly allocated record in *out, which the caller
// frees with KALOUserFree. Returns 0. On failure returns -1, sets *out to
// null (when out is not null) and the last error: KLIB_ERR_BAD_PARAMETER
// (null out), KLIB_ERR_NO_SUCH_USER (uid unknown, or the user database could
// not be read) or KLIB_ERR_OUT_OF_MEMORY.
int KALOUserGetByUID(uid_t uid, PKALOUSER* out);

// Releases a record from KALOUserGetByUID. A null record is ignored.
void KALOUserFree(PKALOUSER user);

// Makes user_name the process's effective user: its uid, its primary group as
// effective gid and its groups as supplementary groups. To leave root it sets
// the groups, then setegid, then seteuid; to reach root it calls seteuid(0)
// first and then sets the groups and setegid. Asking for the identity the
// process already has is a successful no-op. A process that cannot regain
// root (neither real nor saved uid is 0) keeps its own identity when asked
// for another user and still returns 0; it says so once per process in the
// system log. Returns 0 on success; -1 with KLIB_ERR_BAD_PARAMETER (null or
// empty name), KLIB_ERR_NO_SUCH_USER, or KLIB_ERR_PERMISSION when a switch
// that root may make fails (the effective uid then stays 0).
int KALOCredResetByName(const char* user_name);

#endif  // KALO_KALO_USER_H_
