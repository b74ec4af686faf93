#include "orvex/foundation/error.h"

namespace orvex {
namespace {

std::string LongMessage(ErrorCode code, const std::string& reason) {
  std::string message = "Orvex error, code=" + std::to_string(static_cast<int32_t>(code));
  if (!reason.empty()) message += ", reason=[" + reason + "]";
  return message;
}

}  // namespace

Error::Error(ErrorCode code) : Error(code, std::string()) {}

Error::Error(ErrorCode code, const std::string& reason)
    : std::runtime_error(LongMessage(code, reason)), code_(code), reason_(reason) {}

Error::Error(const Error& other) = default;
Error& Error::operator=(const Error& other) = default;
Error::~Error() = default;

const char* Error::what() const noexcept { return reason_.c_str(); }

}  // namespace orvex
