#include "search/index_registry.h"

#include <json/json.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <system_error>

#include "orvex/foundation/json.h"
#include "orvex/portable/atomic_file.h"
#include "search/search_error.h"

namespace orvex {
namespace search {

IndexRegistry::IndexRegistry(const std::string& file) : file_(file) {
  std::string text;
  if (!portable::ReadWholeFile(file, text)) {
    if (errno == ENOENT) return;  // no index created yet
    throw SearchError(kStorage, "cannot read " + file + ": " + std::strerror(errno));
  }
  Json::Value root;
  if (!fromString(root, text) || !root.isObject() || !root["indexes"].isArray()) {
    throw SearchError(kStorage, file + " is not an index registry");
  }
  for (const Json::Value& entry : root["indexes"]) {
    if (!entry["id"].isString() || !entry["path"].isString()) {
      throw SearchError(kStorage, file + " has an entry without id or path: " + toString(entry));
    }
    indexes_[entry["id"].asString()] = {entry["path"].asString(),
                                        entry["paused"].isBool() && entry["paused"].asBool()};
  }
}

const IndexRecord* IndexRegistry::Find(const std::string& id) const {
  const auto it = indexes_.find(id);
  return it == indexes_.end() ? nullptr : &it->second;
}

void IndexRegistry::Put(const std::string& id, const IndexRecord& record) {
  auto next = indexes_;
  next[id] = record;
  Save(next);
  indexes_ = std::move(next);
}

void IndexRegistry::Remove(const std::string& id) {
  auto next = indexes_;
  if (next.erase(id) == 0) return;
  Save(next);
  indexes_ = std::move(next);
}

void IndexRegistry::Rename(const std::string& id, const std::string& new_id,
                           const IndexRecord& record) {
  auto next = indexes_;
  next.erase(id);
  next[new_id] = record;
  Save(next);
  indexes_ = std::move(next);
}

void IndexRegistry::Save(const std::map<std::string, IndexRecord>& next) {
  Json::Value root;
  root["indexes"] = Json::Value(Json::arrayValue);
  for (const auto& [id, record] : next) {
    Json::Value entry;
    entry["id"] = id;
    entry["path"] = record.path;
    entry["paused"] = record.paused;
    root["indexes"].append(entry);
  }
  std::error_code ec;
  std::filesystem::create_directories(std::filesystem::path(file_).parent_path(), ec);
  if (!portable::WriteFileAtomic(file_, toString(root) + "\n")) {
    throw SearchError(kStorage, "cannot write " + file_ + ": " + std::strerror(errno));
  }
}

}  // namespace search
}  // namespace orvex
