#include "watch/registration.h"

#include <dirent.h>

#include <cerrno>
#include <cstring>
#include <memory>

#include "orvex/foundation/json.h"
#include "orvex/portable/atomic_file.h"

namespace orvex {
namespace watch {
namespace {

bool AbsolutePath(const Json::Value& v) {
  return v.isString() && !v.asString().empty() && v.asString()[0] == '/';
}

bool ParseFolder(const Json::Value& entry, WatchedFolder& folder, std::string& why) {
  if (!entry.isObject() || !AbsolutePath(entry["path"])) {
    why = "a \"config\" entry has no absolute \"path\"";
    return false;
  }
  const Json::Value& mask = entry["mask"];
  if (!mask.isIntegral() || mask.asLargestInt() < 0 || mask.asLargestInt() > 0xFFFFFFFFll) {
    why = "a \"config\" entry has no \"mask\" from 0 to 4294967295";
    return false;
  }
  folder.path = entry["path"].asString();
  // A trailing slash would make every "is it below" test miss.
  while (folder.path.size() > 1 && folder.path.back() == '/') folder.path.pop_back();
  folder.mask = static_cast<uint32_t>(mask.asLargestInt());
  for (const Json::Value& name : entry["ignore"]) {
    if (name.isString() && !name.asString().empty()) folder.ignore.insert(name.asString());
  }
  return true;
}

// Names in dir, without "." and "..". Empty when it cannot be read.
std::vector<std::string> List(const std::string& dir) {
  std::vector<std::string> names;
  std::unique_ptr<DIR, int (*)(DIR*)> d(::opendir(dir.c_str()), ::closedir);
  if (!d) return names;
  while (const struct dirent* e = ::readdir(d.get())) {
    const std::string name = e->d_name;
    if (name != "." && name != "..") names.push_back(name);
  }
  return names;
}

}  // namespace

bool ParseRegistration(const std::string& text, Registration& out, std::string& why) {
  Json::Value value;
  if (!fromString(value, text) || !value.isObject()) {
    why = "not a JSON object";
    return false;
  }
  if (!AbsolutePath(value["queue"])) {
    why = "no absolute \"queue\"";
    return false;
  }
  if (!value["config"].isArray()) {
    why = "\"config\" is not an array";
    return false;
  }
  Registration reg;
  reg.queue = value["queue"].asString();
  for (const Json::Value& entry : value["config"]) {
    WatchedFolder folder;
    if (!ParseFolder(entry, folder, why)) return false;
    reg.folders.push_back(std::move(folder));
  }
  out = std::move(reg);
  return true;
}

bool IsRegistrationFileName(const std::string& name) {
  static const std::string kSuffix = ".json";
  return name.size() > kSuffix.size() && name[0] != '.' &&
         name.compare(name.size() - kSuffix.size(), kSuffix.size(), kSuffix) == 0;
}

std::map<std::string, Registration> ReadRegistry(const std::string& registry_dir,
                                                 std::map<std::string, std::string>& bad) {
  std::map<std::string, Registration> regs;
  for (const std::string& app : List(registry_dir)) {
    const std::string app_dir = registry_dir + "/" + app;
    for (const std::string& name : List(app_dir)) {
      if (!IsRegistrationFileName(name)) continue;
      const std::string file = app_dir + "/" + name;
      std::string text;
      std::string why;
      Registration reg;
      if (!portable::ReadWholeFile(file, text)) {
        // Removed between the listing and the read: simply gone.
        if (errno != ENOENT) bad[file] = std::strerror(errno);
        continue;
      }
      if (!ParseRegistration(text, reg, why)) {
        bad[file] = why;
        continue;
      }
      regs[file] = std::move(reg);
    }
  }
  return regs;
}

}  // namespace watch
}  // namespace orvex
