#include "search/index_store.h"

#include <sys/stat.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <system_error>

#include "orvex/foundation/json.h"
#include "orvex/policy/file_type.h"
#include "search/case_fold.h"
#include "search/json_text.h"
#include "search/name_tokenizer.h"
#include "search/search_error.h"
#include "search/text_rank.h"

namespace orvex {
namespace search {
namespace {

// Bounds the write-ahead log left on disk after a checkpoint: the log of a
// big commit would otherwise keep its peak size for good. It is the size at
// which the writer checkpoints itself, so that a load reuses the log's
// blocks from one cycle to the next: a log cut shorter is written into new
// blocks, which the file system first fills with zeros (a log's frames are
// not aligned to blocks), a tenth of a load's processor time.
constexpr int64_t kJournalSizeLimit = int64_t{WalCheckpointer::kLimitFrames} * 4096;

// The schema. Text content lives in its own table, apart from the properties
// that every listing reads. Both full-text tables are external-content
// tables: the text is stored once.
//
// A row enters its full-text table at commit, not when it is written: the
// triggers only note its id in unindexed_names / unindexed_words, and
// Commit() indexes the noted rows in one statement each. FTS5 writes a new
// segment whenever a savepoint opens on a table it has touched, and every
// command runs in its own savepoint: indexing row by row would write (and
// later merge) one segment per document. A row is in its full-text table
// exactly when it is not noted; a row removed or renamed before being
// indexed is simply no longer noted. The notes are empty between commits,
// and a rolled-back transaction takes its notes with it.
//
// A row's words are noted only where no note is: words rewritten twice in
// a transaction are written by an upsert (INSERT ... ON CONFLICT DO UPDATE),
// whose conflict handling overrides a trigger's own, so that an "INSERT OR
// IGNORE" of the second note would fail the command.
//
// New documents, the bulk of a load, are not noted one by one: a
// transaction numbers its new rows itself, from the id in unindexed_from
// up, so that "not yet in name_grams" is, for them, their id alone. Only
// older rows renamed in the transaction are noted in unindexed_names.
//
// Only the columns that searches filter or sort on are indexed: every other
// index would be written on each insert and never read. (The owner filter
// is not one: no command sets it, and where it is used it narrows a name or
// word match that is already small. Nor is the type: each of its six values
// holds a good share of a share's files, so that the name index read in
// order finds a page of one type about as soon, and an index on it would
// gather the whole type and sort it.)
constexpr char kSchema[] = R"sql(
CREATE TABLE IF NOT EXISTS meta(key TEXT PRIMARY KEY, value TEXT NOT NULL);
CREATE TABLE IF NOT EXISTS documents(
  id INTEGER PRIMARY KEY,
  path TEXT NOT NULL UNIQUE,
  parent TEXT NOT NULL,
  name TEXT NOT NULL,
  folded_name TEXT NOT NULL,
  type TEXT NOT NULL,
  extension TEXT NOT NULL,
  is_dir INTEGER NOT NULL,
  size INTEGER, mtime INTEGER, ctime INTEGER, crtime INTEGER,
  owner TEXT NOT NULL,
  body TEXT NOT NULL);
DROP INDEX IF EXISTS documents_parent;
DROP INDEX IF EXISTS documents_ctime;
DROP INDEX IF EXISTS documents_crtime;
DROP INDEX IF EXISTS documents_owner;
DROP INDEX IF EXISTS documents_type;
CREATE INDEX IF NOT EXISTS documents_extension ON documents(extension);
CREATE INDEX IF NOT EXISTS documents_size ON documents(size);
CREATE INDEX IF NOT EXISTS documents_mtime ON documents(mtime);
CREATE INDEX IF NOT EXISTS documents_folded_name ON documents(folded_name, path);
CREATE TABLE IF NOT EXISTS contents(id INTEGER PRIMARY KEY, text TEXT NOT NULL, props TEXT NOT NULL);
CREATE TABLE IF NOT EXISTS unindexed_names(id INTEGER PRIMARY KEY);
CREATE TABLE IF NOT EXISTS unindexed_from(id INTEGER NOT NULL);
CREATE TABLE IF NOT EXISTS unindexed_words(id INTEGER PRIMARY KEY);
CREATE VIRTUAL TABLE IF NOT EXISTS name_grams USING fts5(
  folded_name, content='documents', content_rowid='id', tokenize='orvex_name_grams',
  columnsize=0);
CREATE VIRTUAL TABLE IF NOT EXISTS words USING fts5(
  text, props, content='contents', content_rowid='id',
  tokenize='unicode61 remove_diacritics 2');
DROP TRIGGER IF EXISTS documents_ai;
DROP TRIGGER IF EXISTS documents_ad;
DROP TRIGGER IF EXISTS documents_au;
DROP TRIGGER IF EXISTS contents_ai;
DROP TRIGGER IF EXISTS contents_ad;
DROP TRIGGER IF EXISTS contents_au;
DROP TRIGGER IF EXISTS documents_added;
DROP TRIGGER IF EXISTS documents_removed;
DROP TRIGGER IF EXISTS documents_renamed;
CREATE TRIGGER IF NOT EXISTS documents_deleted AFTER DELETE ON documents BEGIN
  INSERT INTO name_grams(name_grams, rowid, folded_name)
    SELECT 'delete', old.id, old.folded_name
    WHERE old.id < ifnull((SELECT id FROM unindexed_from), old.id + 1)
      AND NOT EXISTS (SELECT 1 FROM unindexed_names WHERE id = old.id);
  DELETE FROM unindexed_names WHERE id = old.id;
  DELETE FROM contents WHERE id = old.id;
END;
CREATE TRIGGER IF NOT EXISTS documents_refolded AFTER UPDATE OF folded_name ON documents
WHEN old.folded_name IS NOT new.folded_name BEGIN
  INSERT INTO name_grams(name_grams, rowid, folded_name)
    SELECT 'delete', old.id, old.folded_name
    WHERE old.id < ifnull((SELECT id FROM unindexed_from), old.id + 1)
      AND NOT EXISTS (SELECT 1 FROM unindexed_names WHERE id = old.id);
  INSERT OR IGNORE INTO unindexed_names(id)
    SELECT new.id WHERE new.id < ifnull((SELECT id FROM unindexed_from), new.id + 1);
END;
CREATE TRIGGER IF NOT EXISTS contents_added AFTER INSERT ON contents BEGIN
  INSERT INTO unindexed_words(id) VALUES (new.id);
END;
CREATE TRIGGER IF NOT EXISTS contents_removed AFTER DELETE ON contents BEGIN
  INSERT INTO words(words, rowid, text, props)
    SELECT 'delete', old.id, old.text, old.props
    WHERE NOT EXISTS (SELECT 1 FROM unindexed_words WHERE id = old.id);
  DELETE FROM unindexed_words WHERE id = old.id;
END;
DROP TRIGGER IF EXISTS contents_changed;
CREATE TRIGGER IF NOT EXISTS contents_rewritten AFTER UPDATE ON contents BEGIN
  INSERT INTO words(words, rowid, text, props)
    SELECT 'delete', old.id, old.text, old.props
    WHERE NOT EXISTS (SELECT 1 FROM unindexed_words WHERE id = old.id);
  INSERT INTO unindexed_words(id)
    SELECT new.id WHERE NOT EXISTS (SELECT 1 FROM unindexed_words WHERE id = new.id);
END;
)sql";

constexpr char kColumns[] =
    "path, parent, name, folded_name, type, extension, is_dir, size, mtime, ctime, crtime, owner, "
    "body";

// Searched as words when no schema was given: the text properties that
// content extraction fills.
const char* const kDefaultTextProperties[] = {
    "KALOMDTitle",           "KALOMDAuthors",          "KALOMDAlbum",
    "KALOMDCreator",         "KALOMDMusicalGenre",     "KALOMDComposer",
    "KALOMDComment",         "KALOMDCodecs",           "KALOMDDescription",
    "KALOMDAcquisitionMake", "KALOMDAcquisitionModel", "KALOMDKeywords",
    "_KALOMDUserTags",       "KALOMDSpotlightBoost"};

std::string StringMember(const Json::Value& doc, const char* key) {
  const Json::Value& v = doc[key];
  return v.isString() ? v.asString() : std::string();
}

std::optional<int64_t> IntMember(const Json::Value& doc, const char* key) {
  const Json::Value& v = doc[key];
  if (v.isIntegral() || (v.isDouble() && v.isConvertibleTo(Json::intValue))) return v.asInt64();
  return std::nullopt;
}

std::string LowerAscii(std::string text) {
  for (char& c : text) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  return text;
}

std::string ExtensionOf(const std::string& name) {
  const size_t dot = name.rfind('.');
  if (dot == std::string::npos || dot == 0) return std::string();
  return LowerAscii(name.substr(dot + 1));
}

std::string TypeName(bool is_dir, const std::string& extension) {
  if (is_dir) return "dir";
  switch (fileindex::GetFileTypeByExtension(extension)) {
    case fileindex::kFileTypeDocument:
      return "document";
    case fileindex::kFileTypeAudio:
      return "audio";
    case fileindex::kFileTypeVideo:
      return "video";
    case fileindex::kFileTypeImage:
      return "image";
    case fileindex::kFileTypeOther:
      break;
  }
  return "other";
}

void AppendText(const Json::Value& value, std::string& out) {
  if (value.isString()) {
    if (!out.empty()) out += '\n';
    out += value.asString();
  } else if (value.isArray()) {
    for (const Json::Value& item : value) AppendText(item, out);
  }
}

bool TypeMatches(const std::string& type, const Json::Value& v) {
  if (v.isNull()) return true;
  if (type == "int") return v.isIntegral() || (v.isDouble() && v.isConvertibleTo(Json::intValue));
  if (type == "double") return v.isNumeric();
  if (type == "bool") return v.isBool();
  if (v.isString()) return true;
  if (!v.isArray()) return false;
  return std::all_of(v.begin(), v.end(), [](const Json::Value& item) { return item.isString(); });
}

bool FlatTypeMatches(const std::string& type, FlatDocument::Kind kind) {
  using Kind = FlatDocument::Kind;
  if (kind == Kind::kNull) return true;
  if (type == "int" || type == "double") return kind == Kind::kInt;
  if (type == "bool") return kind == Kind::kBool;
  return kind == Kind::kString;
}

// What a row is made of, read from a document's value tree...
class ValueFields {
 public:
  explicit ValueFields(const Json::Value& doc) : doc_(doc) {}

  bool IsString(const char* key) const { return doc_[key].isString(); }
  std::string String(const char* key) const { return StringMember(doc_, key); }
  bool True(const char* key) const { return doc_[key].isBool() && doc_[key].asBool(); }
  std::optional<int64_t> Int(const char* key) const { return IntMember(doc_, key); }
  std::string Owner() const {
    const Json::Value& owner = doc_["KALOMDOwnerUserID"];
    if (owner.isString()) return owner.asString();
    return owner.isIntegral() ? std::to_string(owner.asInt64()) : std::string();
  }
  void AppendWords(const std::string& key, std::string& out) const { AppendText(doc_[key], out); }

 private:
  const Json::Value& doc_;
};

// ... or from a flat document's properties (the last of a name wins, as in
// a value tree).
class FlatFields {
 public:
  using Kind = FlatDocument::Kind;
  explicit FlatFields(const FlatDocument& doc) : doc_(doc) {}

  bool IsString(const char* key) const { return Of(key, Kind::kString) != nullptr; }
  std::string String(const char* key) const {
    const FlatDocument::Property* p = Of(key, Kind::kString);
    return p != nullptr ? std::string(p->text) : std::string();
  }
  bool True(const char* key) const {
    const FlatDocument::Property* p = Of(key, Kind::kBool);
    return p != nullptr && p->flag;
  }
  std::optional<int64_t> Int(const char* key) const {
    const FlatDocument::Property* p = Of(key, Kind::kInt);
    if (p == nullptr) return std::nullopt;
    return p->number;
  }
  std::string Owner() const {
    const FlatDocument::Property* p = Of("KALOMDOwnerUserID", Kind::kInt);
    return p != nullptr ? std::to_string(p->number) : String("KALOMDOwnerUserID");
  }
  void AppendWords(const std::string& key, std::string& out) const {
    const FlatDocument::Property* p = Of(key.c_str(), Kind::kString);
    if (p == nullptr) return;
    if (!out.empty()) out += '\n';
    out += p->text;
  }

 private:
  // The property key names last, when it is of kind.
  const FlatDocument::Property* Of(std::string_view key, Kind kind) const {
    for (auto p = doc_.properties.rbegin(); p != doc_.properties.rend(); ++p) {
      if (p->name == key) return p->kind == kind ? &*p : nullptr;
    }
    return nullptr;
  }

  const FlatDocument& doc_;
};

void ExecPragmas(SqliteDb& db) {
  db.Exec("PRAGMA journal_mode=WAL");
  // NORMAL in WAL mode: a commit survives a crash of the daemon, and only a
  // power loss can take back the last commits, never corrupt the index.
  db.Exec("PRAGMA synchronous=NORMAL");
  db.Exec("PRAGMA journal_size_limit=" + std::to_string(kJournalSizeLimit));
  db.Exec("PRAGMA busy_timeout=5000");
  // The page cache holds the pages a transaction of 10,000 documents
  // dirties (at the default 2 MB they spill into the log before the commit
  // and are written twice), and the indexes' upper levels between commits.
  // A negative size is in KiB: 48 MiB at most, taken only as used (the
  // daemon's whole memory stays under 200 MB while it loads a million
  // documents).
  db.Exec("PRAGMA cache_size=-49152");
  // Each command's savepoint keeps the pages it first changes in a
  // statement journal so that a failed command can be undone; in memory it
  // costs a copy, in a temporary file a write.
  db.Exec("PRAGMA temp_store=MEMORY");
}

// Creates what is missing of the schema. A name index of an earlier layout
// (another tokenizer) is built again from the documents, in one transaction.
bool NameIndexOfAnotherLayout(SqliteDb& db) {
  Statement old(db, "SELECT sql FROM sqlite_master WHERE name = 'name_grams'");
  return old.Step() && old.Text(0).find(kNameTokenizer) == std::string::npos;
}

void CreateSchema(SqliteDb& db) {
  if (!NameIndexOfAnotherLayout(db)) {
    db.Exec(kSchema);
    return;
  }
  db.Exec("BEGIN IMMEDIATE; DROP TABLE name_grams;");
  db.Exec(kSchema);
  db.Exec("INSERT INTO name_grams(name_grams) VALUES ('rebuild'); COMMIT;");
}

}  // namespace

std::string PrefixUpperBound(const std::string& prefix) {
  std::string bound = prefix;
  while (!bound.empty() && static_cast<unsigned char>(bound.back()) == 0xFF) bound.pop_back();
  if (!bound.empty()) bound.back() = static_cast<char>(bound.back() + 1);
  return bound;
}

struct IndexStore::Row {
  std::string path, parent, name, folded_name, type, extension, owner, body, text, props;
  bool is_dir = false;
  std::optional<int64_t> size, mtime, ctime, crtime;

  // Most documents (names and attributes) have no words: they get no
  // contents row, which saves a row, its note and its full-text pass.
  bool HasWords() const { return !text.empty() || !props.empty(); }
};

struct IndexStore::Statements {
  explicit Statements(SqliteDb& w)
      : find(w, "SELECT id FROM documents WHERE path = ?1"),
        load(w,
             "SELECT d.id, d.body, c.text FROM documents d LEFT JOIN contents c ON c.id = d.id "
             "WHERE d.path = ?1"),
        insert(w, std::string("INSERT INTO documents(") + kColumns +
                      ", id) VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9, ?10, ?11, ?12, ?13, ?14)"),
        insert_new(w, std::string("INSERT INTO documents(") + kColumns +
                          ", id) VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9, ?10, ?11, ?12, ?13, "
                          "?14) ON CONFLICT(path) DO NOTHING"),
        update(w,
               "UPDATE documents SET path = ?1, parent = ?2, name = ?3, folded_name = ?4, "
               "type = ?5, extension = ?6, is_dir = ?7, size = ?8, mtime = ?9, ctime = ?10, "
               "crtime = ?11, owner = ?12, body = ?13 WHERE id = ?14"),
        insert_content(w, "INSERT INTO contents(id, text, props) VALUES (?1, ?2, ?3)"),
        update_content(w,
                       "INSERT INTO contents(id, text, props) VALUES (?1, ?2, ?3) "
                       "ON CONFLICT(id) DO UPDATE SET text = ?2, props = ?3 "
                       "WHERE text IS NOT ?2 OR props IS NOT ?3"),
        remove_content(w, "DELETE FROM contents WHERE id = ?1"),
        remove(w, "DELETE FROM documents WHERE id = ?1"),
        remove_prefix(w, "DELETE FROM documents WHERE path >= ?1 AND path < ?2"),
        get_prefix(w, "SELECT body FROM documents WHERE path >= ?1 AND path < ?2 ORDER BY path"),
        begin(w, "BEGIN IMMEDIATE"),
        last_id(w, "SELECT ifnull(max(id), 0) FROM documents"),
        mark_new(w, "INSERT INTO unindexed_from(id) VALUES (?1)"),
        savepoint(w, "SAVEPOINT command"),
        release(w, "RELEASE command"),
        rollback_to(w, "ROLLBACK TO command"),
        index_names(w,
                    "INSERT INTO name_grams(rowid, folded_name) "
                    "SELECT id, folded_name FROM ("
                    "SELECT d.id, d.folded_name FROM unindexed_names u CROSS JOIN documents d "
                    "ON d.id = u.id UNION ALL SELECT id, folded_name FROM documents "
                    "WHERE id >= (SELECT id FROM unindexed_from)) ORDER BY id"),
        forget_names(w, "DELETE FROM unindexed_names"),
        forget_new(w, "DELETE FROM unindexed_from"),
        index_words(w,
                    "INSERT INTO words(rowid, text, props) SELECT c.id, c.text, c.props "
                    "FROM unindexed_words u JOIN contents c ON c.id = u.id ORDER BY u.id"),
        forget_words(w, "DELETE FROM unindexed_words"),
        note_commit(w, "INSERT OR REPLACE INTO meta(key, value) VALUES ('last_commit', ?1)"),
        commit(w, "COMMIT"),
        rollback(w, "ROLLBACK") {}
  Statement find, load, insert, insert_new, update, insert_content, update_content, remove_content,
      remove, remove_prefix, get_prefix, begin, last_id, mark_new, savepoint, release, rollback_to,
      index_names, forget_names, forget_new, index_words, forget_words, note_commit, commit,
      rollback;
};

IndexStore::IndexStore(const std::string& path, bool create) : path_(path) {
  if (create) {
    std::error_code ec;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path(), ec);
    if (ec)
      throw SearchError(kStorage, "cannot create the directory of " + path + ": " + ec.message());
  }
  writer_ = std::make_unique<SqliteDb>(path, create);
  RegisterNameTokenizer(writer_->handle());
  ExecPragmas(*writer_);
  CreateSchema(*writer_);
  reader_ = std::make_unique<SqliteDb>(path, /*create=*/false);
  RegisterNameTokenizer(reader_->handle());
  RegisterTextRank(reader_->handle());
  reader_->Exec("PRAGMA busy_timeout=5000");
  st_ = std::make_unique<Statements>(*writer_);
  LoadMappings();
  checkpointer_ = std::make_unique<WalCheckpointer>(path);
  checkpointer_->Install(writer_->handle());
}

IndexStore::~IndexStore() {
  // A stop or a crash drops what was not committed: the indexer sends it
  // again from its queue, as after kill -9.
  if (writer_ && InTransaction()) {
    try {
      Rollback();
    } catch (const SearchError&) {
    }
  }
  StopCheckpoints();
  st_.reset();
}

void IndexStore::StopCheckpoints() {
  if (!checkpointer_) return;
  WalCheckpointer::Uninstall(writer_->handle());
  checkpointer_.reset();
}

void IndexStore::LoadMappings() {
  types_.clear();
  text_properties_.clear();
  Statement get(*writer_, "SELECT value FROM meta WHERE key = 'mappings'");
  Json::Value mappings;
  if (!get.Step() || !fromString(mappings, get.Text(0)) || !mappings.isObject()) {
    text_properties_.assign(std::begin(kDefaultTextProperties), std::end(kDefaultTextProperties));
    return;
  }
  const Json::Value& fallback = mappings["default"];
  const Json::Value& properties = mappings["properties"];
  if (!properties.isObject()) return;
  for (const std::string& name : properties.getMemberNames()) {
    const Json::Value& own = properties[name];
    auto member = [&](const char* key) {
      const Json::Value& v = own.isObject() && own.isMember(key) ? own[key] : fallback[key];
      return v.isString() ? v.asString() : std::string();
    };
    const std::string type = member("type").empty() ? "string" : member("type");
    types_[name] = type;
    const bool words = (type == "text" || type == "string") && member("analyzer") != "keyword";
    // Text content has its own column; the search name its own index.
    if (words && name != "KALOMDTextContent" && name != "KALOMDSearchFileName") {
      text_properties_.push_back(name);
    }
  }
}

void IndexStore::SetMappings(const Json::Value& mappings) {
  Begin();
  Statement put(*writer_, "INSERT OR REPLACE INTO meta(key, value) VALUES ('mappings', ?1)");
  put.Bind(1, toString(mappings)).Run();
  LoadMappings();
}

bool IndexStore::InTransaction() const { return sqlite3_get_autocommit(writer_->handle()) == 0; }

void IndexStore::Begin() {
  if (InTransaction()) return;
  st_->begin.Run();
  Statement& last = st_->last_id;
  last.Step();
  next_id_ = last.Int(0) + 1;
  last.Reset();
  st_->mark_new.Bind(1, next_id_).Run();
}

void IndexStore::Commit() {
  if (!InTransaction()) return;
  // The rows written since the last commit enter the full-text tables in
  // rowid order, in one pass each. (The notes lead the join: read in row id
  // order for the merge with the new rows, the documents would be scanned
  // whole at every commit.)
  st_->index_names.Run();
  st_->forget_names.Run();
  st_->forget_new.Run();
  st_->index_words.Run();
  st_->forget_words.Run();
  const auto now = std::chrono::system_clock::now().time_since_epoch();
  st_->note_commit.Bind(
      1, std::to_string(std::chrono::duration_cast<std::chrono::seconds>(now).count()));
  st_->note_commit.Run();
  st_->commit.Run();
}

void IndexStore::Rollback() {
  if (InTransaction()) st_->rollback.Run();
}

template <typename Change>
auto IndexStore::Atomically(Change change) {
  Begin();
  st_->savepoint.Run();
  try {
    auto result = change();
    st_->release.Run();
    return result;
  } catch (...) {
    if (InTransaction()) {
      st_->rollback_to.Run();
      st_->release.Run();
    }
    throw;
  }
}

void IndexStore::CheckTypes(const Json::Value& doc) const {
  for (auto member = doc.begin(); member != doc.end(); ++member) {
    const char* end = nullptr;
    const char* name = member.memberName(&end);
    const auto it = types_.find(std::string_view(name, static_cast<size_t>(end - name)));
    if (it != types_.end() && !TypeMatches(it->second, *member)) {
      throw SearchError(kBadArgument, "property " + member.name() + " must be of type " +
                                          it->second + ", not " + toString(*member));
    }
  }
  if (doc.isMember("KALOMDPath") && !doc["KALOMDPath"].isString()) {
    throw SearchError(kBadArgument, "property KALOMDPath must be a string");
  }
}

std::optional<int64_t> IndexStore::FindId(const std::string& path) {
  Statement& find = st_->find;
  find.Bind(1, path);
  std::optional<int64_t> id;
  if (find.Step()) id = find.Int(0);
  find.Reset();
  return id;
}

template <typename Fields>
IndexStore::Row IndexStore::RowOf(const std::string& doc_id, const Fields& doc) const {
  Row row;
  row.path = doc.IsString("KALOMDPath") ? doc.String("KALOMDPath") : doc_id;
  const size_t slash = row.path.rfind('/');
  row.name = doc.String("KALOMDFSName");
  if (row.name.empty())
    row.name = slash == std::string::npos ? row.path : row.path.substr(slash + 1);
  row.parent = doc.String("KALOMDParent");
  if (row.parent.empty() && slash != std::string::npos) row.parent = row.path.substr(0, slash);
  std::string search_name = doc.String("KALOMDSearchFileName");
  if (search_name.empty()) search_name = row.name;
  row.folded_name = FoldCase(search_name);
  row.extension = doc.IsString("KALOMDExtension") ? LowerAscii(doc.String("KALOMDExtension"))
                                                  : ExtensionOf(row.name);
  row.is_dir = doc.True("KALOMDIsDir");
  row.type = TypeName(row.is_dir, row.extension);
  row.size = doc.Int("KALOMDFSSize");
  row.mtime = doc.Int("KALOMDFSContentChangeDate");
  row.ctime = doc.Int("KALOMDAttributeChangeDate");
  row.crtime = doc.Int("KALOMDFSCreationDate");
  row.owner = doc.Owner();
  row.text = doc.String("KALOMDTextContent");
  for (const std::string& name : text_properties_) doc.AppendWords(name, row.props);
  return row;
}

IndexStore::Row IndexStore::MakeRow(const std::string& doc_id, const Json::Value& doc,
                                    std::string_view doc_text) const {
  Row row = RowOf(doc_id, ValueFields(doc));
  // The body is the document with its path and without its text content.
  // The indexer's documents of names and attributes already are: they are
  // kept as they came, or written out without a copy.
  const Json::Value* path = doc.find("KALOMDPath", "KALOMDPath" + 10);
  if (path != nullptr && path->isString() && !doc.isMember("KALOMDTextContent")) {
    row.body = doc_text.empty() ? JsonText(doc) : std::string(doc_text);
  } else {
    Json::Value body = doc;
    body["KALOMDPath"] = row.path;
    body.removeMember("KALOMDTextContent");
    row.body = JsonText(body);
  }
  return row;
}

namespace {

void BindOptional(Statement& s, int index, const std::optional<int64_t>& v) {
  if (v) {
    s.Bind(index, *v);
  } else {
    s.BindNull(index);
  }
}

// Binds a row's columns, in the order of kColumns, as ?1 to ?13.
template <typename Row>
void BindRow(Statement& s, const Row& row) {
  s.Bind(1, row.path).Bind(2, row.parent).Bind(3, row.name).Bind(4, row.folded_name);
  s.Bind(5, row.type).Bind(6, row.extension).Bind(7, int64_t{row.is_dir});
  BindOptional(s, 8, row.size);
  BindOptional(s, 9, row.mtime);
  BindOptional(s, 10, row.ctime);
  BindOptional(s, 11, row.crtime);
  s.Bind(12, row.owner).Bind(13, row.body);
}

}  // namespace

bool IndexStore::InsertNew(const Row& row) {
  Statement& s = st_->insert_new;
  BindRow(s, row);
  s.Bind(14, next_id_++).Run();
  return writer_->Changes() == 1;
}

void IndexStore::Insert(const Row& row) {
  Statement& s = st_->insert;
  BindRow(s, row);
  s.Bind(14, next_id_++).Run();
  if (!row.HasWords()) return;
  st_->insert_content.Bind(1, writer_->LastInsertRowid()).Bind(2, row.text).Bind(3, row.props);
  st_->insert_content.Run();
}

void IndexStore::Update(int64_t id, const Row& row) {
  Statement& s = st_->update;
  BindRow(s, row);
  s.Bind(14, id).Run();
  // Only when the words changed: a rename must not re-index a book's text.
  if (row.HasWords()) {
    st_->update_content.Bind(1, id).Bind(2, row.text).Bind(3, row.props).Run();
  } else {
    st_->remove_content.Bind(1, id).Run();
  }
}

void IndexStore::Upsert(const std::string& doc_id, const Json::Value& doc,
                        std::string_view doc_text) {
  CheckTypes(doc);
  Write(doc_id, MakeRow(doc_id, doc, doc_text));
}

bool IndexStore::UpsertFlat(const std::string& doc_id, const FlatDocument& doc) {
  bool has_path = false;
  for (const FlatDocument::Property& p : doc.properties) {
    // Text content makes the body differ from the document; a wrong type
    // needs its value for the error.
    if (p.name == "KALOMDTextContent") return false;
    if (p.name == "KALOMDPath") has_path = p.kind == FlatDocument::Kind::kString;
    const auto it = types_.find(p.name);
    if (it != types_.end() && !FlatTypeMatches(it->second, p.kind)) return false;
  }
  if (!has_path) return false;
  Row row = RowOf(doc_id, FlatFields(doc));
  row.body = doc.text;
  Write(doc_id, row);
  return true;
}

void IndexStore::Write(const std::string& doc_id, const Row& row) {
  Begin();
  // A new document without words is one statement, which SQLite makes whole
  // or undoes by itself: no savepoint around it. Sent at its own path, it
  // is simply inserted, unless the path is taken (the statement then does
  // nothing): the path index is searched once, not twice.
  if (!row.HasWords()) {
    if (row.path == doc_id) {
      if (InsertNew(row)) return;
    } else if (!FindId(doc_id) && !FindId(row.path)) {
      Insert(row);
      return;
    }
  }
  Atomically([&] {
    // A document sent again keeps its row, and its full-text entries when
    // its name and words did not change: re-indexing a share rewrites no
    // full-text index. A document moved onto the path of another replaces it.
    std::optional<int64_t> id = FindId(doc_id);
    if (row.path != doc_id) {
      if (const auto other = FindId(row.path)) {
        if (id) {
          st_->remove.Bind(1, *other).Run();
        } else {
          id = other;
        }
      }
    }
    if (id) {
      Update(*id, row);
    } else {
      Insert(row);
    }
    return true;
  });
}

void IndexStore::Set(const std::string& doc_id, const Json::Value& changes) {
  CheckTypes(changes);
  Atomically([&] {
    Statement& load = st_->load;
    load.Bind(1, doc_id);
    if (!load.Step()) {
      load.Reset();
      throw SearchError(kNoSuchDocument, "no document " + doc_id);
    }
    const int64_t id = load.Int(0);
    Json::Value doc;
    const bool parsed = fromString(doc, load.Text(1));
    const std::string text = load.Text(2);
    load.Reset();
    if (!parsed || !doc.isObject()) throw SearchError(kStorage, "unreadable document " + doc_id);
    if (!text.empty()) doc["KALOMDTextContent"] = text;
    for (const std::string& name : changes.getMemberNames()) doc[name] = changes[name];
    const Row row = MakeRow(doc_id, doc);
    if (row.path != doc_id) {
      if (const auto other = FindId(row.path)) st_->remove.Bind(1, *other).Run();
    }
    Update(id, row);
    return true;
  });
}

bool IndexStore::Delete(const std::string& doc_id) {
  Begin();
  const auto id = FindId(doc_id);
  if (id) st_->remove.Bind(1, *id).Run();
  return id.has_value();
}

int64_t IndexStore::DeleteByPrefix(const std::string& prefix) {
  Begin();
  st_->remove_prefix.Bind(1, prefix).Bind(2, PrefixUpperBound(prefix)).Run();
  return writer_->Changes();
}

Json::Value IndexStore::GetByPrefix(const std::string& prefix, const std::string& after,
                                    int64_t limit, bool* more) {
  Json::Value out(Json::arrayValue);
  // One lower bound only, the later of the two, so that each page is a seek
  // in the path index and a walk of many pages stays linear.
  const bool past = !after.empty() && after >= prefix;
  std::optional<Statement> paged;
  if (past || limit >= 0) {
    paged.emplace(*writer_, std::string("SELECT body FROM documents WHERE path ") +
                                (past ? ">" : ">=") + " ?1 AND path < ?2 ORDER BY path LIMIT ?3");
    // One row past the page tells whether more remain.
    paged->Bind(3, limit < 0 ? int64_t{-1} : limit + 1);
  }
  Statement& get = paged ? *paged : st_->get_prefix;
  get.Bind(1, past ? after : prefix).Bind(2, PrefixUpperBound(prefix));
  int64_t rows = 0;
  bool over = false;
  while (get.Step()) {
    if (limit >= 0 && rows++ == limit) {
      over = true;
      break;
    }
    Json::Value doc;
    if (fromString(doc, get.Text(0))) out.append(std::move(doc));
  }
  get.Reset();
  if (more != nullptr) *more = over;
  return out;
}

Json::Value IndexStore::Stats() {
  Json::Value out;
  Statement count(*reader_, "SELECT count(*) FROM documents");
  count.Step();
  out["documents"] = static_cast<Json::Int64>(count.Int(0));
  int64_t bytes = 0;
  for (const char* suffix : {"", "-wal"}) {
    struct stat st;
    if (::stat((path_ + suffix).c_str(), &st) == 0) bytes += st.st_size;
  }
  out["bytes"] = static_cast<Json::Int64>(bytes);
  out["uncommitted"] = InTransaction();
  Statement last(*reader_, "SELECT value FROM meta WHERE key = 'last_commit'");
  out["last_commit"] =
      last.Step() ? Json::Value(static_cast<Json::Int64>(last.Int(0))) : Json::Value();
  return out;
}

void IndexStore::Close() {
  Commit();
  StopCheckpoints();
  st_.reset();
  reader_.reset();
  writer_->Exec("PRAGMA wal_checkpoint(TRUNCATE)");
  writer_.reset();
}

}  // namespace search
}  // namespace orvex
