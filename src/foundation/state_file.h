// What stands where a state file should be. The status and folders files are
// read as "no file yet" when absent; a symbolic link or a directory in their
// place must not read that way, or the record would start empty and the next
// save would put a plain file where the link was. Safe for concurrent use.
#ifndef ORVEX_SRC_FOUNDATION_STATE_FILE_H_
#define ORVEX_SRC_FOUNDATION_STATE_FILE_H_

#include <string>

namespace orvex {

// "" when path is a regular file or nothing at all; otherwise the end of a
// sentence that names it: " is a symbolic link", " is a directory" or
// " is not a regular file". The link itself is examined, never followed.
std::string NotARegularFile(const std::string& path);

}  // namespace orvex

#endif  // ORVEX_SRC_FOUNDATION_STATE_FILE_H_
