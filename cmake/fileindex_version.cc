// The shared library's own translation unit: the subsystems come in whole from
// their internal archives; this file only names the build.
#include "orvex/export.h"
#include "orvex/version.h"

extern "C" ORVEX_EXPORT const char* orvex_fileindex_version() { return ORVEX_VERSION; }
