// The requests of the single-document commands, built without being sent, so
// that IndexUpsert, IndexAttr and IndexDel and a DocumentBatch send the very
// same sub-requests.
#ifndef ORVEX_SRC_ELASTIC_DOCUMENT_REQUESTS_H_
#define ORVEX_SRC_ELASTIC_DOCUMENT_REQUESTS_H_

#include <json/json.h>

#include <string>

namespace orvex {
namespace fileindex {
namespace elastic {

// "document_upsert_by_id" with the document content extraction gives for
// full_path (need_meta: its metadata and text content too). Throws Error 914
// "Parse failed, path=<full_path>" when the item cannot be read or parsed.
Json::Value UpsertRequest(const std::string& share, const std::string& full_path, bool need_meta);

// "document_set_by_id" with the file-system attributes only. Throws as
// UpsertRequest.
Json::Value AttrRequest(const std::string& share, const std::string& full_path);

// "document_del_by_id".
Json::Value DelRequest(const std::string& share, const std::string& full_path);

}  // namespace elastic
}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_ELASTIC_DOCUMENT_REQUESTS_H_
