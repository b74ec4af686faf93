#include "platform/fixed_path.h"

#include "orvex/portable/root.h"

namespace orvex {
namespace sdk {

std::string FixedPath(const std::string& fixed_path) { return portable::RootPath(fixed_path); }

}  // namespace sdk
}  // namespace orvex
