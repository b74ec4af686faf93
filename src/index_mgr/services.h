// The dependent services: the file server's Spotlight support (with a
// restart of "samba" when it changes), the content-extraction service and
// the package's indexing daemon, switched on or off together. Safe for
// concurrent use as far as the platform's service control is.
#ifndef ORVEX_SRC_INDEX_MGR_SERVICES_H_
#define ORVEX_SRC_INDEX_MGR_SERVICES_H_

namespace orvex {
namespace fileindex {

// Switches the services on (enable) or off, in the same order both ways:
// Spotlight and samba, content extraction, the indexing daemon. Samba is
// restarted only when the Spotlight setting was changed. Never throws: every
// failure is logged and the next step still tried.
void SetServicesEnabled(bool enable);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_INDEX_MGR_SERVICES_H_
