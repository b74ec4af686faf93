// Content extraction: the document properties (the file index schema's
// KALOMD... properties) of one file or directory, as the platform's
// extraction library gives them. The library's door to that library.
// Safe for concurrent use.
#ifndef ORVEX_SRC_PLATFORM_CONTENT_EXTRACT_H_
#define ORVEX_SRC_PLATFORM_CONTENT_EXTRACT_H_

#include <json/json.h>

#include <string>

namespace orvex {
namespace sdk {

// Fills file_data with the properties of the item at full_path and returns
// true; false (errno set where the system gave a cause) when it cannot be
// read or parsed. cfg holds "need_meta" (bool): true asks for metadata and
// text content as well as the file-system attributes. Never throws.
bool ParseFile(const std::string& full_path, const Json::Value& cfg, Json::Value& file_data);

}  // namespace sdk
}  // namespace orvex

#endif  // ORVEX_SRC_PLATFORM_CONTENT_EXTRACT_H_
