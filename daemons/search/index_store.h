// IndexStore: one search index, kept in one SQLite database (layout in
// doc/search_protocol.md). Documents are identified by their KALOMDPath. Two
// connections: the writer holds one open transaction from the first change
// to Commit(), and the reader, used for user searches, sees only what was
// committed. One thread at a time.
#ifndef ORVEX_SEARCH_INDEX_STORE_H_
#define ORVEX_SEARCH_INDEX_STORE_H_

#include <json/json.h>

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "search/sqlite_db.h"
#include "search/wal_checkpointer.h"

namespace orvex {
namespace search {

// What a user search asks for. Empty strings and unset bounds do not filter.
struct SearchQuery {
  std::string name;       // a fragment of the file name, any case
  std::string text;       // words, "phrases" and prefix* over text and text properties
  std::string type;       // "dir", "document", "audio", "video", "image" or "other"
  std::string extension;  // without its dot, any case
  std::optional<int64_t> size_min, size_max;
  std::optional<int64_t> mtime_min, mtime_max;  // KALOMDFSContentChangeDate
  std::string folder;                           // only documents below this full path
  std::string owner;                            // only documents of this owner's user id
  std::string sort = "name";                    // "name", "path", "size", "mtime" or "relevance"
  bool descending = false;
  int64_t offset = 0;
  int64_t limit = 50;
};

struct SearchHit {
  std::string path, name, type;
  std::string folded_name;  // the name order's key, for merging indexes
  bool is_dir = false;
  std::optional<int64_t> size, mtime, ctime, crtime;
  std::string owner;
  std::string snippet;  // text around the matched words; empty without a text query
  double rank = 0;      // lower is better (FTS5's bm25)
};

struct SearchResult {
  // The matches, counted up to a bound: when exact is false there are at
  // least this many (a search stops counting where more would cost more
  // than finding the page).
  int64_t total = 0;
  bool exact = true;
  std::vector<SearchHit> hits;
};

// A document whose properties are all strings, integers, booleans or null,
// as the indexer sends names and attributes: read from a request's text
// without a JSON value tree. The views point into the text it was read from.
struct FlatDocument {
  enum class Kind { kNull, kString, kInt, kBool };
  struct Property {
    std::string_view name;
    Kind kind = Kind::kNull;
    std::string_view text;  // kString
    int64_t number = 0;     // kInt
    bool flag = false;      // kBool
  };
  std::vector<Property> properties;  // in the order of the text, repeats included
  std::string text;                  // the document as JSON text
};

class IndexStore {
 public:
  // Opens the database at path, creating it (and its directory) when create
  // is true. Throws SearchError: kStorage when it cannot.
  IndexStore(const std::string& path, bool create);
  IndexStore(const IndexStore&) = delete;
  IndexStore& operator=(const IndexStore&) = delete;
  ~IndexStore();

  // Keeps the schema sent with "index_create": its property types are then
  // checked on every write. Part of the next commit.
  void SetMappings(const Json::Value& mappings);

  // Replaces (or adds) the document doc_id with doc. doc_text, when not
  // empty, is the JSON text doc was parsed from: stored as it is when it
  // needs no change, instead of being written out again. Throws
  // kBadArgument when a property has the wrong type.
  void Upsert(const std::string& doc_id, const Json::Value& doc,
              std::string_view doc_text = std::string_view());
  // Upsert() of a flat document, without its value tree. False, with nothing
  // done, when it needs the value (text content, a property of the wrong
  // type, no KALOMDPath string): the caller then calls Upsert().
  bool UpsertFlat(const std::string& doc_id, const FlatDocument& doc);
  // Sets the members of changes in document doc_id, keeping the others; a new
  // KALOMDPath moves the document (replacing any other at that path). Throws
  // kNoSuchDocument when there is no such document.
  void Set(const std::string& doc_id, const Json::Value& changes);
  // False when there was no such document.
  bool Delete(const std::string& doc_id);
  // Deletes every document whose KALOMDPath begins with prefix; their count.
  int64_t DeleteByPrefix(const std::string& prefix);
  // The documents whose KALOMDPath begins with prefix, in path order (bytes),
  // as stored (without their text content). A non-empty after keeps only
  // the paths strictly after it; limit >= 0 returns at most that many, and
  // more (when given) tells whether further ones remain. Sees uncommitted
  // changes.
  Json::Value GetByPrefix(const std::string& prefix, const std::string& after = std::string(),
                          int64_t limit = -1, bool* more = nullptr);

  // Makes every change since the last commit durable and visible to searches.
  void Commit();
  // Drops the changes since the last commit.
  void Rollback();
  // Asked of SQLite itself: a failed COMMIT (a full disk) may have ended the
  // transaction, and the next change must then open a new one.
  bool InTransaction() const;

  // Up to offset + limit best hits by the query's order (the caller slices:
  // hits of several indexes are merged first), and the count of matches,
  // exact or a lower bound. Only committed documents.
  SearchResult Search(const SearchQuery& query);

  // Document count, committed, the database's size in bytes, and when the
  // last commit that changed it ended (Unix seconds, null before the first).
  Json::Value Stats();

  // Commits, then folds the write-ahead log into the database file and
  // closes: afterwards the one file at path() is the whole index.
  void Close();

  const std::string& path() const { return path_; }

 private:
  struct Row;
  struct Statements;

  void Begin();
  // Runs change as one unit inside the open transaction: when it throws,
  // whatever part of it was done is undone and the earlier changes stay.
  template <typename Change>
  auto Atomically(Change change);
  void CheckTypes(const Json::Value& doc) const;
  std::optional<int64_t> FindId(const std::string& path);
  // A row of what doc's fields (ValueFields or FlatFields) say, without its body.
  template <typename Fields>
  Row RowOf(const std::string& doc_id, const Fields& doc) const;
  Row MakeRow(const std::string& doc_id, const Json::Value& doc,
              std::string_view doc_text = std::string_view()) const;
  // Writes row as the document doc_id: new, or over the one it replaces.
  void Write(const std::string& doc_id, const Row& row);
  void Insert(const Row& row);
  // Inserts row unless its path is taken; false when it was.
  bool InsertNew(const Row& row);
  void Update(int64_t id, const Row& row);
  void LoadMappings();
  void StopCheckpoints();

  std::string path_;
  std::unique_ptr<SqliteDb> writer_;
  std::unique_ptr<SqliteDb> reader_;
  std::unique_ptr<Statements> st_;
  std::unique_ptr<WalCheckpointer> checkpointer_;
  // The id of the next new row: new rows of a transaction are numbered from
  // the one kept in unindexed_from, above every row before it.
  int64_t next_id_ = 1;
  // property -> "int", "double", "bool", "string", "text"
  std::map<std::string, std::string, std::less<>> types_;
  std::vector<std::string> text_properties_;  // those searched as words
};

// Whether a comes before b in q's order, ties by path in the same
// direction: the order of an index's hits, and of hits merged from several.
bool HitBefore(const SearchHit& a, const SearchHit& b, const SearchQuery& q);

// The smallest string greater than every string that begins with prefix,
// for range scans on the path index; empty when there is none.
std::string PrefixUpperBound(const std::string& prefix);

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_INDEX_STORE_H_
