// orvex::Error: the one exception type of the library. Every operation reports
// failure by throwing it; callers test code(), never the text.
// Immutable after construction: safe for concurrent use.
#ifndef ORVEX_FOUNDATION_ERROR_H_
#define ORVEX_FOUNDATION_ERROR_H_

#include <cstdint>
#include <stdexcept>
#include <string>

#include "orvex/export.h"

namespace orvex {

// Codes thrown by the library. A code that callers forward unchanged (the
// search daemon's own, such as 1400) keeps its number, so any int32 value may
// appear in an Error.
enum ErrorCode : int32_t {
  kErrorBadArgument = 120,      // bad or missing argument
  kErrorSystem = 502,           // a system or platform call failed
  kErrorCredentials = 503,      // switching the effective user failed
  kErrorLoadJson = 504,         // a JSON state file could not be loaded
  kErrorSaveJson = 505,         // a JSON state file could not be saved
  kErrorLockFile = 506,         // a lock file could not be opened or locked
  kErrorNoShare = 800,          // the named share does not exist
  kErrorTooManyFolders = 900,   // too many indexed folders
  kErrorFolderExists = 901,     // the folder is already indexed
  kErrorNoFolder = 902,         // no such indexed folder
  kErrorPathCannotIndex = 903,  // the path may not be indexed
  kErrorMalformedEvent = 906,   // a queued event line could not be parsed
  kErrorSearchDaemon = 913,     // talking to the search daemon failed
  kErrorParseDocument = 914,    // a document to be indexed could not be parsed
  kErrorRenameDocuments = 916,  // a rename of indexed documents failed
  kErrorNoSpace = 1003,         // not enough free space on the share
  kErrorInternal = 9999,        // a node expected in the operation tree is missing
};

class ORVEX_EXPORT Error : public std::runtime_error {
 public:
  explicit Error(ErrorCode code);
  Error(ErrorCode code, const std::string& reason);
  Error(const Error& other);
  Error& operator=(const Error& other);
  ~Error() override;

  // The reason text, not the long message: an Error made without a reason
  // has an empty what().
  const char* what() const noexcept override;

  ErrorCode code() const { return code_; }
  const std::string& reason() const { return reason_; }
  // "Orvex error, code=<code>[, reason=[<reason>]]", as held by the base.
  const char* message() const noexcept { return std::runtime_error::what(); }

 private:
  ErrorCode code_;
  std::string reason_;
};

}  // namespace orvex

#endif  // ORVEX_FOUNDATION_ERROR_H_
