// The document commands: file-system changes carried into a share's index.
// A document's identifier ("doc_id") is the full path the item had when it
// was first indexed; renames change its properties, never its identifier.
#include <string>
#include <utility>

#include "elastic/channel.h"
#include "elastic/document_requests.h"
#include "foundation/check.h"
#include "orvex/elastic.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/util.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/status/status_mgr.h"
#include "platform/content_extract.h"

namespace orvex {
namespace fileindex {
namespace elastic {
namespace {

using sdk::ParseFile;

constexpr char kLogSource[] = "elastic_control";

Json::Value DocumentRequest(const char* command, const std::string& share,
                            const std::string& doc_id) {
  Json::Value req;
  req["command"] = command;
  req["data"]["id"] = GetFileIndexID(share);
  req["data"]["doc_id"] = doc_id;
  return req;
}

// {"qsl": {"prefix": {"KALOMDPath": prefix}}}
Json::Value PathPrefixQuery(const std::string& prefix) {
  Json::Value query;
  query["qsl"]["prefix"]["KALOMDPath"] = prefix;
  return query;
}

// The properties content extraction gives for full_path, with the base name
// copied for the n-gram file-name search (null when extraction left the name
// out).
Json::Value ExtractDocument(const std::string& full_path, bool need_meta) {
  Json::Value cfg;
  cfg["need_meta"] = need_meta;
  Json::Value file_data;
  ORVEX_CHECK(!ParseFile(full_path, cfg, file_data), kErrorParseDocument,
              "Parse failed, path=" + full_path);
  // Read through a const reference: a missing name must not be added.
  Json::Value name = std::as_const(file_data)["KALOMDFSName"];
  file_data["KALOMDSearchFileName"] = std::move(name);
  return file_data;
}

Json::Value ExtractedRequest(const char* command, const std::string& share,
                             const std::string& full_path, bool need_meta) {
  Json::Value file_data = ExtractDocument(full_path, need_meta);
  Json::Value req = DocumentRequest(command, share, full_path);
  req["data"]["data"] = std::move(file_data);
  return req;
}

// The new naming properties of the moved item itself.
Json::Value MovedItemProperties(const std::string& path_to) {
  const std::string name = Basename(path_to);
  const std::string ext = GetFileExtension(path_to, /*lower=*/true);
  Json::Value data;
  data["KALOMDPath"] = path_to;
  data["KALOMDParent"] = Dirname(path_to);
  data["KALOMDFSName"] = name;
  data["KALOMDSearchFileName"] = name;
  data["KALOMDDisplayName"] = name;
  data["KALOMDKind"] = ext;
  data["KALOMDExtension"] = ext;
  return data;
}

// One sub-request moving descendant doc below path_to. The parent's first
// len(path_from) characters are replaced by position: the daemon matched the
// descendants by the prefix path_from + "/", so they are path_from.
Json::Value MoveDescendant(const Json::Value& doc, const std::string& share,
                           const std::string& path_from, const std::string& path_to) {
  std::string name;
  std::string parent;
  GetJsonValue(name, doc, "KALOMDFSName", /*required=*/true);
  GetJsonValue(parent, doc, "KALOMDParent", /*required=*/true);
  const std::string new_parent = parent.replace(0, path_from.size(), path_to);
  Json::Value sub;
  sub["command"] = "document_set_by_id";
  sub["data"]["id"] = GetFileIndexID(share);
  sub["data"]["doc_id"] = doc["KALOMDPath"];
  sub["data"]["data"]["KALOMDParent"] = new_parent;
  sub["data"]["data"]["KALOMDPath"] = new_parent + "/" + name;
  sub["data"]["data"]["KALOMDSearchFileName"] = name;
  return sub;
}

}  // namespace

Json::Value UpsertRequest(const std::string& share, const std::string& full_path, bool need_meta) {
  return ExtractedRequest("document_upsert_by_id", share, full_path, need_meta);
}

// A partial update: the metadata and text content already indexed stay.
Json::Value AttrRequest(const std::string& share, const std::string& full_path) {
  return ExtractedRequest("document_set_by_id", share, full_path, /*need_meta=*/false);
}

Json::Value DelRequest(const std::string& share, const std::string& full_path) {
  return DocumentRequest("document_del_by_id", share, full_path);
}

void IndexUpsert(const std::string& share, const std::string& full_path, bool need_meta) {
  Send(UpsertRequest(share, full_path, need_meta));
}

void IndexAttr(const std::string& share, const std::string& full_path) {
  Send(AttrRequest(share, full_path));
}

void IndexDel(const std::string& share, const std::string& full_path) {
  Send(DelRequest(share, full_path));
}

// The "/" keeps the directory's own document and its siblings /a/bc of /a/b
// out of the query.
void IndexDelDir(const std::string& share, const std::string& dir_path) {
  Json::Value req;
  req["command"] = "document_del_by_query";
  req["data"]["id"] = GetFileIndexID(share);
  req["data"]["query"] = PathPrefixQuery(dir_path + "/");
  Send(req);
}

// Three requests whatever the number of descendants: the moved item, the
// query for its descendants, and one compound request moving them all.
void IndexRename(const std::string& share, const std::string& path_from,
                 const std::string& path_to) {
  Json::Value req = DocumentRequest("document_set_by_id", share, path_from);
  req["data"]["data"] = MovedItemProperties(path_to);
  Json::Value moved;
  SendWithRetry(moved, req);
  // The same request goes out again as the query, its "doc_id" and "data"
  // still in it: the daemon reads only what the query command needs.
  req["command"] = "document_get_by_query";
  req["data"]["query"] = PathPrefixQuery(path_from + "/");
  Json::Value res;
  SendWithRetry(res, req);
  ORVEX_CHECK(!res.isMember("data") || !res["data"].isArray(), kErrorRenameDocuments,
              toString(res));
  Json::Value compound;
  compound["compound"] = Json::Value(Json::arrayValue);
  for (const Json::Value& doc : res["data"]) {
    compound["compound"].append(MoveDescendant(doc, share, path_from, path_to));
  }
  Send(compound);
}

void IndexCommit(const std::string& share) {
  Json::Value req;
  req["command"] = "commit";
  req["data"]["id"] = GetFileIndexID(share);
  try {
    Send(req);
  } catch (const Error&) {
    const sdk::SDKShare share_info(share);
    if (share_info.IsSpaceEnough()) throw;
    // The index has lost whatever this commit held: only a re-index of the
    // share brings it back once there is room again.
    StatusMgr().SetShareStatus(share, NeedReindex);
    ORVEX_CHECK_AS(true, "!share.IsSpaceEnough()", kErrorNoSpace,
                   "Share (" + share + ") space not enough");
  }
}

}  // namespace elastic
}  // namespace fileindex
}  // namespace orvex
