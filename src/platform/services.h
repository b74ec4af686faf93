// The system services the indexing depends on, and the file server's
// Spotlight search switch: the library's door to the platform's service
// control and SMB settings. Each call returns the platform's result and
// leaves its error for PlatformErrorText() (platform/platform_error.h).
// Safe for concurrent use (each service call runs its own child process).
#ifndef ORVEX_SRC_PLATFORM_SERVICES_H_
#define ORVEX_SRC_PLATFORM_SERVICES_H_

#include <string>

namespace orvex {
namespace sdk {

// Negative on failure, as the platform's service calls. wait: whether to
// wait for the service to have started or stopped.
int ServiceStart(const std::string& name, bool wait);
int ServiceStop(const std::string& name, bool wait);
int ServiceRestart(const std::string& name);
// The platform's upstart-controlled services (the package's own daemons).
int UpstartServiceStart(const std::string& name);
int UpstartServiceStop(const std::string& name);

// Whether the file server's Spotlight support is on; a setting that cannot
// be read counts as off. Never throws.
bool IsSpotlightEnabled();
// Switches Spotlight support; negative on failure. Never throws.
int SetSpotlight(bool on);

}  // namespace sdk
}  // namespace orvex

#endif  // ORVEX_SRC_PLATFORM_SERVICES_H_
