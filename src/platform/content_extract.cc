#include "platform/content_extract.h"

#include "kalo/kalo_content_extract.h"

namespace orvex {
namespace sdk {

bool ParseFile(const std::string& full_path, const Json::Value& cfg, Json::Value& file_data) {
  return KALO::CONTENT_EXTRACT::ParseFile(full_path, cfg, file_data);
}

}  // namespace sdk
}  // namespace orvex
