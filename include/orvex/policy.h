// Path policy and file classification: share path helpers, the indexability
// rules for folders, the classification of files by extension, and the
// library's own custom events and administrator notifications.
#ifndef ORVEX_POLICY_H_
#define ORVEX_POLICY_H_

#include "orvex/policy/custom_event.h"
#include "orvex/policy/file_type.h"
#include "orvex/policy/indexability.h"
#include "orvex/policy/share_path.h"

#endif  // ORVEX_POLICY_H_
