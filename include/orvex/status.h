// Index status: global pause with a resume time and per-share status flags,
// persisted in one JSON file shared by the indexing daemon and the web API.
#ifndef ORVEX_STATUS_H_
#define ORVEX_STATUS_H_

#include "orvex/status/status_mgr.h"

#endif  // ORVEX_STATUS_H_
