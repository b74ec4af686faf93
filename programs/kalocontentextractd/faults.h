// The extractor the program hands to its workers: the parsers, behind a
// test facility. With ORVEX_EXTRACT_FAULTS=1 in the environment, a file
// whose name ends in ".crash" makes the worker crash (an invalid write),
// ".hang" makes it loop for ever, and ".hog" makes it allocate memory
// without end, before any parser sees the file. The tests use these to
// check isolation with real faults; nothing else sets the variable.
#ifndef ORVEX_PROGRAMS_KALOCONTENTEXTRACTD_FAULTS_H_
#define ORVEX_PROGRAMS_KALOCONTENTEXTRACTD_FAULTS_H_

#include "extract_service.h"

namespace kalocontentextractd {

// The extractor, with the faults of the test facility when its variable is
// set now.
orvex::portable::Extractor MakeExtractor();

}  // namespace kalocontentextractd

#endif  // ORVEX_PROGRAMS_KALOCONTENTEXTRACTD_FAULTS_H_
