#include "compact_json.h"

#include <memory>
#include <sstream>

namespace orvex {
namespace portable {

std::string CompactJsonText(const Json::Value& value) {
  thread_local const std::unique_ptr<Json::StreamWriter> writer([] {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["emitUTF8"] = true;
    return builder.newStreamWriter();
  }());
  std::ostringstream out;
  writer->write(value, &out);
  return out.str();
}

bool ParseCompactJson(const char* begin, const char* end, Json::Value& value) {
  thread_local const std::unique_ptr<Json::CharReader> reader(
      Json::CharReaderBuilder().newCharReader());
  std::string errors;
  return reader->parse(begin, end, &value, &errors);
}

bool ParseCompactJson(const std::string& text, Json::Value& value) {
  return ParseCompactJson(text.data(), text.data() + text.size(), value);
}

}  // namespace portable
}  // namespace orvex
