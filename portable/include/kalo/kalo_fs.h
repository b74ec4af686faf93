// The platform's access-permission and mount-point tests. On Linux the
// permissions are asked of the kernel with faccessat for the effective ids
// (so ACLs and root's privileges count as the kernel applies them), and a
// directory is a mount point when its device differs from its parent's.
// Thread-safe.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_FS_H_
#define KALO_KALO_FS_H_

// Permission bits reported by KALOACLPermGet.
constexpr unsigned int KALO_ACL_PERM_READ = 4;
constexpr unsigned int KALO_ACL_PERM_WRITE = 2;
constexpr unsigned int KALO_ACL_PERM_EXECUTE = 1;

// Stores in *perm the bits (read 4, write 2, execute 1) that the effective
// user and group are granted on path (symbolic links followed). Returns 0;
// -1 with errno set when path does not exist or cannot be reached (last error
// KLIB_ERR_IO), or for a null or empty path or null perm (errno EINVAL, last
// error KLIB_ERR_BAD_PARAMETER); *perm is then left as it was.
int KALOACLPermGet(const char* path, unsigned int* perm);

// Returns 1 when path is a directory on a different device than its parent
// directory, or the root of the file-system tree ("/", whose parent is
// itself); 0 for any other directory and for a path that is not a directory;
// -1 with errno set when path or its parent cannot be examined (last error
// KLIB_ERR_IO) or path is null or empty (KLIB_ERR_BAD_PARAMETER). A bind
// mount within one file system is not detected.
int KALOFSDirIsMntPoint(const char* path);

#endif  // KALO_KALO_FS_H_
