// Whole-file replacement that never leaves a half-written file: the data goes
// to a temporary file in the same directory, is flushed to disk and renamed
// over the target. Readers need no lock: they see the old or the new file.
// Safe for concurrent use (each call uses its own temporary name).
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef ORVEX_PORTABLE_ATOMIC_FILE_H_
#define ORVEX_PORTABLE_ATOMIC_FILE_H_

#include <sys/types.h>

#include <string>

namespace orvex {
namespace portable {

// Replaces path with data, mode `mode` (the umask does not apply: the mode is
// set explicitly). Returns false with errno set on any failure; the old file
// is then left as it was and no temporary file remains. A path that is a
// symbolic link fails with ELOOP and a directory with EISDIR, before anything
// is written: a save never replaces a link with a plain file.
bool WriteFileAtomic(const std::string& path, const std::string& data, mode_t mode = 0644);

// Creates dir and the directories above it that are missing (mode 0755, as
// "mkdir -p"), so that a file can be written under a fresh ORVEX_ROOT.
// Returns true when dir exists as a directory afterwards; false with errno
// set otherwise.
bool MakeDirectories(const std::string& dir);

// Reads the whole file into data. Returns false with errno set on failure;
// a directory fails with EISDIR.
bool ReadWholeFile(const std::string& path, std::string& data);

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_ATOMIC_FILE_H_
