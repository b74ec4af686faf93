// Composition of the file-index paths of a share. Both live in the share's
// metadata folder, so they move with the share when it is renamed or moved to
// another volume. Thread-safe (pure functions).
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_PATH_H_
#define KALO_KALO_PATH_H_

#include <cstddef>

// Writes "<share_path>/@eaDir/@fileindex/queue", the share's live event
// queue, into buf (size bytes, NUL included). Trailing slashes of share_path
// are dropped first. Returns 0; -1 with KLIB_ERR_BAD_PARAMETER for a null,
// empty or relative share_path or a null buf, and with
// KLIB_ERR_BUFFER_TOO_SMALL when the result does not fit (buf is then left
// holding an empty string when size > 0).
int FILEIDXQueuePathCompose(const char* share_path, char* buf, size_t size);

// The same for "<share_path>/@eaDir/@fileindex/db", the share's index
// database.
int FILEIDXDBPathCompose(const char* share_path, char* buf, size_t size);

#endif  // KALO_KALO_PATH_H_
