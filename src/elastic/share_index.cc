// The per-share index commands. Each builds one request, "command" first and
// then "data" with the index's identifier, and sends it with the busy retry;
// the answer carries nothing the library needs.
#include <string>

#include "elastic/channel.h"
#include "orvex/elastic.h"
#include "orvex/platform/sdk_share.h"

namespace orvex {
namespace fileindex {
namespace elastic {
namespace {

Json::Value IndexRequest(const char* command, const std::string& share) {
  Json::Value req;
  req["command"] = command;
  req["data"]["id"] = GetFileIndexID(share);
  return req;
}

}  // namespace

void ShareIndexCreate(const std::string& share) {
  const sdk::SDKShare share_info(share);  // throws when there is no such share
  Json::Value req = IndexRequest("index_create", share);
  req["data"]["path"] = share_info.GetDBPath();
  req["data"]["settings"] = Json::Value(Json::objectValue);
  req["data"]["mappings"] = GetFileIndexMappings();
  Send(req);
}

void ShareIndexDelete(const std::string& share) { Send(IndexRequest("index_delete", share)); }

void ShareIndexPause(const std::string& share) { Send(IndexRequest("index_pause", share)); }

void ShareIndexResume(const std::string& share) { Send(IndexRequest("index_resume", share)); }

// Rename and migrate are one daemon command whose nested "data" names only
// the settings that change.
void ShareIndexRename(const std::string& share_from, const std::string& share_to,
                      const std::string& db_path) {
  Json::Value req = IndexRequest("index_config_set", share_from);
  req["data"]["data"]["id"] = GetFileIndexID(share_to);
  req["data"]["data"]["path"] = db_path;
  Send(req);
}

void ShareIndexMigrate(const std::string& share, const std::string& db_path) {
  Json::Value req = IndexRequest("index_config_set", share);
  req["data"]["data"]["path"] = db_path;
  Send(req);
}

}  // namespace elastic
}  // namespace fileindex
}  // namespace orvex
