// Platform share and credential wrappers: a share's properties as the
// platform knows them (SDKShare, under the process-wide SDKMutex) and a scoped
// switch of the effective user (SDKCredentials).
#ifndef ORVEX_PLATFORM_H_
#define ORVEX_PLATFORM_H_

#include "orvex/platform/sdk_credentials.h"
#include "orvex/platform/sdk_share.h"

#endif  // ORVEX_PLATFORM_H_
