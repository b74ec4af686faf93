#include "kalo/kalo_notify.h"

#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <memory>
#include <sstream>
#include <string>

#include "kalo_log.h"
#include "orvex/portable/atomic_file.h"
#include "orvex/portable/root.h"

namespace KALO {
namespace KALONOTIFYD {
namespace {

constexpr size_t kMaxAppName = 64;
// NAME_MAX is 255; the escaped form, the hash and ".json" stay well below it.
constexpr size_t kMaxPlainName = 200;
constexpr size_t kHashedPrefix = 180;
constexpr unsigned long long kMaxMask = 0xFFFFFFFFull;

bool IsNameByte(unsigned char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '.' ||
         c == '_' || c == '-';
}

uint64_t Fnv1a64(const std::string& text) {
  uint64_t hash = 0xcbf29ce484222325ull;
  for (unsigned char c : text) {
    hash ^= c;
    hash *= 0x100000001b3ull;
  }
  return hash;
}

std::string EscapeQueuePath(const std::string& queue_path) {
  static const char kHex[] = "0123456789ABCDEF";
  std::string out;
  for (unsigned char c : queue_path) {
    if (IsNameByte(c) || c == '@') {
      out.push_back(static_cast<char>(c));
    } else {
      out.push_back('%');
      out.push_back(kHex[c >> 4]);
      out.push_back(kHex[c & 0xF]);
    }
  }
  if (out.size() <= kMaxPlainName) return out;
  char hash[17];
  std::snprintf(hash, sizeof(hash), "%016llx",
                static_cast<unsigned long long>(Fnv1a64(queue_path)));
  return out.substr(0, kHashedPrefix) + "~" + hash;
}

std::string AppDir(const std::string& app_name) {
  return orvex::portable::RootPath(kMonitorRegistryDir) + "/" + app_name;
}

bool IsAbsolute(const Json::Value& v) {
  return v.isString() && !v.asString().empty() && v.asString()[0] == '/';
}

bool IsIgnoreName(const Json::Value& v) {
  if (!v.isString() || v.asString().empty()) return false;
  return v.asString().find('/') == std::string::npos;
}

// The description as it is stored: exactly the members the daemon reads,
// with "ignore" always present. Returns false for anything malformed.
bool Normalise(const Json::Value& in, Json::Value& out, std::string& why) {
  if (!in.isObject()) return (why = "description is not an object", false);
  if (!IsAbsolute(in["queue"])) return (why = "\"queue\" is not an absolute path", false);
  const Json::Value& config = in["config"];
  if (!config.isArray()) return (why = "\"config\" is not an array", false);
  out = Json::Value(Json::objectValue);
  out["queue"] = in["queue"];
  out["config"] = Json::Value(Json::arrayValue);
  for (Json::ArrayIndex i = 0; i < config.size(); ++i) {
    const Json::Value& entry = config[i];
    const std::string at = "\"config\"[" + std::to_string(i) + "]";
    if (!entry.isObject()) return (why = at + " is not an object", false);
    if (!IsAbsolute(entry["path"])) return (why = at + ".path is not an absolute path", false);
    const Json::Value& mask = entry["mask"];
    if (!mask.isIntegral() || mask.asLargestInt() < 0 ||
        static_cast<unsigned long long>(mask.asLargestInt()) > kMaxMask) {
      return (why = at + ".mask is not a number from 0 to 4294967295", false);
    }
    Json::Value ignore(Json::arrayValue);
    if (entry.isMember("ignore")) {
      if (!entry["ignore"].isArray()) return (why = at + ".ignore is not an array", false);
      for (const Json::Value& name : entry["ignore"]) {
        if (!IsIgnoreName(name)) return (why = at + ".ignore holds a bad name", false);
        ignore.append(name);
      }
    }
    Json::Value stored(Json::objectValue);
    stored["path"] = entry["path"];
    stored["mask"] = static_cast<Json::UInt>(mask.asLargestInt());
    stored["ignore"] = ignore;
    out["config"].append(stored);
  }
  return true;
}

std::string Text(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "  ";
  builder["emitUTF8"] = true;
  std::ostringstream out;
  std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter())->write(value, &out);
  out << "\n";
  return out.str();
}

// The queue named by the registration file at path, or "" when the file is
// missing or unreadable (then it is ours to replace or to remove).
std::string StoredQueue(const std::string& path) {
  std::string text;
  if (!orvex::portable::ReadWholeFile(path, text)) return "";
  Json::Value value;
  Json::CharReaderBuilder builder;
  std::string errors;
  std::istringstream in(text);
  if (!Json::parseFromStream(builder, in, &value, &errors) || !value.isObject()) return "";
  return value["queue"].isString() ? value["queue"].asString() : "";
}

bool Refuse(int error, const char* call, const std::string& why) {
  KALO_LOG(LOG_ERR, "MonitorQueue::%s failed: %s", call, why.c_str());
  errno = error;
  return false;
}

// The registration file of queue_path, or false (logged) when the type or
// the application name is bad or the file belongs to another queue.
bool RegistrationFile(const char* call, const std::string& queue_path, const std::string& app_name,
                      MONITOR_QUEUE_TYPE type, std::string& path) {
  if (type != MONITOR_QUEUE_TYPE_APPLICATION) {
    return Refuse(EINVAL, call, "unknown queue type " + std::to_string(type));
  }
  path = MonitorRegistrationPath(queue_path, app_name);
  if (path.empty()) return Refuse(EINVAL, call, "bad application name \"" + app_name + "\"");
  const std::string stored = StoredQueue(path);
  if (!stored.empty() && stored != queue_path) {
    return Refuse(EEXIST, call, path + " holds another queue, " + stored);
  }
  return true;
}

}  // namespace

bool IsValidMonitorAppName(const std::string& name) {
  if (name.empty() || name.size() > kMaxAppName || name == "." || name == "..") return false;
  for (unsigned char c : name) {
    if (!IsNameByte(c)) return false;
  }
  return true;
}

std::string MonitorRegistrationPath(const std::string& queue_path, const std::string& app_name) {
  if (!IsValidMonitorAppName(app_name)) return "";
  return AppDir(app_name) + "/" + EscapeQueuePath(queue_path) + ".json";
}

MonitorQueue::MonitorQueue(const Json::Value& description) : description_(description) {}

bool MonitorQueue::Upsert(const MonitorQueue& queue, const std::string& app_name,
                          MONITOR_QUEUE_TYPE type) {
  Json::Value stored;
  std::string why;
  if (!Normalise(queue.description(), stored, why)) return Refuse(EINVAL, "Upsert", why);
  std::string path;
  if (!RegistrationFile("Upsert", stored["queue"].asString(), app_name, type, path)) return false;
  if (!orvex::portable::MakeDirectories(AppDir(app_name)) ||
      !orvex::portable::WriteFileAtomic(path, Text(stored))) {
    const int error = errno;
    return Refuse(error, "Upsert", path + ": " + std::strerror(error));
  }
  return true;
}

bool MonitorQueue::Delete(const std::string& queue_path, const std::string& app_name,
                          MONITOR_QUEUE_TYPE type) {
  if (queue_path.empty() || queue_path[0] != '/') {
    return Refuse(EINVAL, "Delete", "queue path \"" + queue_path + "\" is not absolute");
  }
  std::string path;
  if (!RegistrationFile("Delete", queue_path, app_name, type, path)) return false;
  if (::unlink(path.c_str()) != 0 && errno != ENOENT) {
    const int error = errno;
    return Refuse(error, "Delete", path + ": " + std::strerror(error));
  }
  errno = 0;
  return true;
}

}  // namespace KALONOTIFYD
}  // namespace KALO
