#include "orvex/foundation/json.h"

#include <memory>
#include <sstream>

#include "orvex/portable/atomic_file.h"

namespace orvex {

template <>
bool isJsonType<std::string>(const Json::Value& v) {
  return v.isConvertibleTo(Json::stringValue);
}
template <>
std::string asJsonType<std::string>(const Json::Value& v) {
  return v.asString();
}
template <>
bool isJsonType<bool>(const Json::Value& v) {
  return v.isConvertibleTo(Json::booleanValue);
}
template <>
bool asJsonType<bool>(const Json::Value& v) {
  return v.asBool();
}
template <>
bool isJsonType<int>(const Json::Value& v) {
  return v.isConvertibleTo(Json::intValue);
}
template <>
int asJsonType<int>(const Json::Value& v) {
  return v.asInt();
}
template <>
bool isJsonType<unsigned int>(const Json::Value& v) {
  return v.isConvertibleTo(Json::uintValue);
}
template <>
unsigned int asJsonType<unsigned int>(const Json::Value& v) {
  return v.asUInt();
}
template <>
bool isJsonType<long long>(const Json::Value& v) {
  // An exact integer type test; an unsigned value past the signed range
  // cannot be converted and counts as the wrong type.
  return v.type() == Json::intValue || (v.type() == Json::uintValue && v.isInt64());
}
template <>
long long asJsonType<long long>(const Json::Value& v) {
  return static_cast<long long>(v.asInt64());
}
template <>
bool isJsonType<double>(const Json::Value& v) {
  return v.isConvertibleTo(Json::realValue);
}
template <>
double asJsonType<double>(const Json::Value& v) {
  return v.asDouble();
}
template <>
bool isJsonType<Json::Value>(const Json::Value&) {
  return true;
}
template <>
Json::Value asJsonType<Json::Value>(const Json::Value& v) {
  return v;
}

std::string AppendData(const Json::Value& obj) { return ", data=" + toString(obj); }

void JsonApplyChanges(Json::Value& target, const Json::Value& changes) {
  // A change made of members can only apply to an object: whatever else
  // stood there is replaced.
  if (changes.isObject() && !changes.empty() && !target.isObject()) {
    target = Json::Value(Json::objectValue);
  }
  for (auto it = changes.begin(); it != changes.end(); ++it) {
    const std::string key = it.name();
    const Json::Value& value = *it;
    if (value.isNull()) {
      if (target.isObject()) target.removeMember(key);
    } else if (value.isObject()) {
      JsonApplyChanges(target[key], value);
    } else {
      target[key] = value;
    }
  }
}

namespace {

// Building a reader or writer costs far more than a short line's parse; each
// thread keeps one of each.
Json::CharReader& Reader() {
  thread_local std::unique_ptr<Json::CharReader> reader = [] {
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    builder["failIfExtra"] = true;
    return std::unique_ptr<Json::CharReader>(builder.newCharReader());
  }();
  return *reader;
}

Json::StreamWriter& CompactWriter() {
  thread_local std::unique_ptr<Json::StreamWriter> writer = [] {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["commentStyle"] = "None";
    builder["emitUTF8"] = true;
    return std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter());
  }();
  return *writer;
}

}  // namespace

bool fromString(Json::Value& value, const char* begin, const char* end) {
  try {
    return Reader().parse(begin, end, &value, nullptr);
  } catch (const Json::Exception&) {
    return false;  // nesting past the reader's depth limit
  }
}

bool fromString(Json::Value& value, const std::string& text) {
  return fromString(value, text.data(), text.data() + text.size());
}

bool fromFile(Json::Value& value, const std::string& path) {
  std::string text;
  return portable::ReadWholeFile(path, text) && fromString(value, text);
}

bool toFile(const Json::Value& value, const std::string& path) {
  Json::StreamWriterBuilder builder;
  builder["commentStyle"] = "None";
  builder["emitUTF8"] = true;
  std::string text = Json::writeString(builder, value);
  text.push_back('\n');
  return portable::WriteFileAtomic(path, text, 0644);
}

std::string toString(const Json::Value& value) {
  std::ostringstream out;
  CompactWriter().write(value, &out);
  return out.str();
}

}  // namespace orvex
