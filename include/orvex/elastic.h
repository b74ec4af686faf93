// The search-engine client: the commands that keep each indexed share's index
// in the search daemon kaloelasticd up to date. Each share has one index,
// named by GetFileIndexID and created with the schema of
// GetFileIndexMappings; the share index commands create, delete, pause,
// resume, rename and move it, and the document commands carry file changes
// into it. Every command is one request (IndexRename: three) over a fresh
// connection to the daemon's socket; a DocumentBatch sends many document
// changes as one.
//
// A daemon that answers busy (codes 1400, 1401) is waited out: the request
// is repeated every 15 to 19 minutes, without limit, and the administrators
// are told once per request, after the tenth retry, that the system lacks
// memory. A call may therefore block for a very long time.
//
// Safe for concurrent use: calls share no state (each opens its own
// connection); a DocumentBatch is one caller's.
#ifndef ORVEX_ELASTIC_H_
#define ORVEX_ELASTIC_H_

#include <json/json.h>

#include <cstddef>
#include <string>
#include <vector>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {
namespace elastic {

// The search daemon's socket; opened under ORVEX_ROOT when that is set.
inline constexpr char kElasticSockPath[] = "/var/run/kaloelasticd.sock";

// Every command below may throw Error 913 when the daemon cannot be reached
// or gives no proper answer ("Connect failed", "Send failed", "Recv failed,
// res=<answer>"), or the daemon's own error code with "Request failed,
// msg=<message>" when it refuses the request. A busy code is never thrown.

// "fileindex_" followed by share_name exactly as given.
ORVEX_EXPORT std::string GetFileIndexID(const std::string& share_name);

// The schema a share index is created with: "property_id" (the property that
// identifies a document, "KALOMDPath"), "default" (the settings of any
// property not listed) and "properties" (the 53 known KALOMD... properties,
// each overriding the default where it says so). Parsed anew on each call.
// Throws Error 502 only if the built-in text were not JSON.
ORVEX_EXPORT Json::Value GetFileIndexMappings();

// "index_create" with the share's database path, empty settings and the
// schema. Throws Error 800 (before sending anything) when the share does not
// exist, 502 when its database path cannot be composed.
ORVEX_EXPORT void ShareIndexCreate(const std::string& share);

// "index_delete", "index_pause", "index_resume" of the share's index.
// Whether the index exists is the daemon's to judge.
ORVEX_EXPORT void ShareIndexDelete(const std::string& share);
ORVEX_EXPORT void ShareIndexPause(const std::string& share);
ORVEX_EXPORT void ShareIndexResume(const std::string& share);

// "index_config_set": the index of share_from takes the identifier of
// share_to and the database path db_path (the share was renamed).
ORVEX_EXPORT void ShareIndexRename(const std::string& share_from, const std::string& share_to,
                                   const std::string& db_path);

// "index_config_set": the share's index moves to db_path (the share moved to
// another volume); its identifier stays.
ORVEX_EXPORT void ShareIndexMigrate(const std::string& share, const std::string& db_path);

// Adds or replaces the document of the item at full_path with the
// properties that content extraction gives (metadata and text content too
// when need_meta). Throws Error 914 "Parse failed, path=<full_path>" when
// the item cannot be read or parsed.
ORVEX_EXPORT void IndexUpsert(const std::string& share, const std::string& full_path,
                              bool need_meta);

// Refreshes only the file-system attributes of the document of full_path,
// keeping its metadata and text content. Throws as IndexUpsert.
ORVEX_EXPORT void IndexAttr(const std::string& share, const std::string& full_path);

// Deletes the document of full_path.
ORVEX_EXPORT void IndexDel(const std::string& share, const std::string& full_path);

// Deletes the documents of everything below the directory dir_path; the
// directory's own document and siblings that merely share its name's first
// letters stay.
ORVEX_EXPORT void IndexDelDir(const std::string& share, const std::string& dir_path);

// Moves the document of path_from, and those of all its descendants, to
// path_to. Documents keep their identifiers (the old paths); their path,
// parent and name properties change. Failed updates of single descendants
// are logged and tolerated. Throws Error 916 with the daemon's answer as the
// reason when the descendants cannot be listed.
ORVEX_EXPORT void IndexRename(const std::string& share, const std::string& path_from,
                              const std::string& path_to);

// A sub-request of a compound request that the daemon refused: its place in
// the request, the daemon's code and message.
struct DocumentFailure {
  size_t index = 0;
  int code = 0;
  std::string msg;
};

// Document commands for one share gathered and sent together as one compound
// request, one round trip for many documents. Each sub-request is the very
// request IndexUpsert, IndexAttr or IndexDel sends, built (the file's content
// extracted) when it is added. The daemon carries sub-requests out in order,
// so a caller that needs a change ordered after them (a rename, a delete of a
// subtree, a listing, a commit) flushes first. Not safe for concurrent use.
class ORVEX_EXPORT DocumentBatch {
 public:
  explicit DocumentBatch(std::string share);

  // Add the sub-request of IndexUpsert, IndexAttr, IndexDel. Upsert and Attr
  // throw Error 914 as those do, and the batch is then unchanged.
  void Upsert(const std::string& full_path, bool need_meta);
  void Attr(const std::string& full_path);
  void Del(const std::string& full_path);

  size_t size() const { return compound_.size(); }
  bool empty() const { return compound_.empty(); }
  // About the size of the request text so far, in bytes.
  size_t bytes() const { return bytes_; }

  // Sends what the batch holds as one compound request (nothing when it is
  // empty) and returns the refused sub-requests in order; a busy daemon is
  // waited out as for every command. The batch is empty afterwards, also
  // when it throws (Error 913 or the daemon's code for a refused request).
  std::vector<DocumentFailure> Flush();

  // Forgets what the batch holds without sending it.
  void Clear();

 private:
  void Add(Json::Value sub_request);

  std::string share_;
  Json::Value compound_{Json::arrayValue};
  size_t bytes_ = 0;
};

// Commits the share's index. When the commit fails and the share lacks free
// space, marks the share as needing a re-index (status flag NeedReindex) and
// throws Error 1003 "Share (<share>) space not enough"; otherwise throws the
// commit's own Error. Looking at the share may throw Error 800 (the share is
// gone) and marking it the status manager's errors.
ORVEX_EXPORT void IndexCommit(const std::string& share);

}  // namespace elastic
}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_ELASTIC_H_
