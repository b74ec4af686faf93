// The platform library's last error. Every portable platform call that fails
// returns a negative value (or false, or a null record) and records an error
// code with the source file and line where it was detected; callers read them
// back with KLIBCErrGet, KLIBCErrorGetFile and KLIBCErrorGetLine, typically
// to log "err=[0x%04X %s:%d]". A successful call leaves the last error as it
// was. Thread-safe: the last error is kept per thread.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_ERROR_H_
#define KALO_KALO_ERROR_H_

// Error codes. The high byte names the condition; the low byte is always 0.
constexpr int KLIB_ERR_NONE = 0x0000;
// Out of memory while building a result.
constexpr int KLIB_ERR_OUT_OF_MEMORY = 0x0200;
// A file-system call on a given path failed (stat, statvfs, read).
constexpr int KLIB_ERR_IO = 0x0500;
// The caller's buffer cannot hold the result.
constexpr int KLIB_ERR_BUFFER_TOO_SMALL = 0x0A00;
// A null, empty or otherwise unusable argument.
constexpr int KLIB_ERR_BAD_PARAMETER = 0x0D00;
// A program could not be started or did not exit normally.
constexpr int KLIB_ERR_EXEC = 0x0E00;
// The process may not take the identity it was asked for.
constexpr int KLIB_ERR_PERMISSION = 0x0F00;
// No share of that name in the share registry.
constexpr int KLIB_ERR_NO_SUCH_SHARE = 0x1400;
// The share registry exists but cannot be read or is malformed.
constexpr int KLIB_ERR_SHARE_REGISTRY = 0x1500;
// No user of that name or id.
constexpr int KLIB_ERR_NO_SUCH_USER = 0x1D00;
// Not enough free space on the volume.
constexpr int KLIB_ERR_OUT_OF_SPACE = 0x2400;
// The user's disk quota would be exceeded.
constexpr int KLIB_ERR_QUOTA_EXCEEDED = 0x2900;

// The calling thread's last error code; KLIB_ERR_NONE when no call of this
// thread has failed yet (or after KLIBCErrClear).
int KLIBCErrGet();

// Base name of the source file that recorded the last error; "" when none.
// Never null. The string is static: it stays valid for the process's life.
const char* KLIBCErrorGetFile();

// Source line that recorded the last error; 0 when none.
int KLIBCErrorGetLine();

// Records code, file and line as the calling thread's last error. file must
// be a string with static storage (normally __FILE__); only its base name is
// kept. A null file is recorded as "".
void KLIBCErrSet(int code, const char* file, int line);

// Resets the calling thread's last error to KLIB_ERR_NONE, "" and 0.
void KLIBCErrClear();

// Records code with the caller's source position.
#define KLIBC_ERR_SET(code) KLIBCErrSet((code), __FILE__, __LINE__)

#endif  // KALO_KALO_ERROR_H_
