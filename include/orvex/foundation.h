// Foundation of libfileindex: the Error type and its codes, the log, the
// replaceable clock/sleep/random hooks, JSON helpers, locks and small
// file-system and string utilities.
#ifndef ORVEX_FOUNDATION_H_
#define ORVEX_FOUNDATION_H_

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/lock.h"
#include "orvex/foundation/log.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/foundation/util.h"

#endif  // ORVEX_FOUNDATION_H_
