// Indexed-folder configuration: the folder record and the folder list,
// persisted in one JSON file shared by the indexing daemon and the web API.
#ifndef ORVEX_CONFIG_H_
#define ORVEX_CONFIG_H_

#include "orvex/config/folder.h"
#include "orvex/config/folder_mgr.h"

#endif  // ORVEX_CONFIG_H_
