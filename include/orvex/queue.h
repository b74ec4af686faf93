// Event queue and operation tree: queue lines parsed into events, folded into
// pending operations per path, handed out in arrival order; the queue
// manager that snapshots a share's live queue and scans it.
#ifndef ORVEX_QUEUE_H_
#define ORVEX_QUEUE_H_

#include "orvex/queue/event.h"
#include "orvex/queue/op.h"
#include "orvex/queue/op_tree.h"
#include "orvex/queue/queue_mgr.h"

#endif  // ORVEX_QUEUE_H_
