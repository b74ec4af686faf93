#include "kalo/kalo_error.h"

#include <cstring>

namespace {

struct LastError {
  int code = KLIB_ERR_NONE;
  const char* file = "";
  int line = 0;
};

thread_local LastError last_error;

}  // namespace

int KLIBCErrGet() { return last_error.code; }

const char* KLIBCErrorGetFile() { return last_error.file; }

int KLIBCErrorGetLine() { return last_error.line; }

void KLIBCErrSet(int code, const char* file, int line) {
  const char* base = file == nullptr ? "" : file;
  // __FILE__ may carry the build's directory; the log wants the file name.
  const char* slash = std::strrchr(base, '/');
  last_error.code = code;
  last_error.file = slash == nullptr ? base : slash + 1;
  last_error.line = line;
}

void KLIBCErrClear() { last_error = LastError(); }
