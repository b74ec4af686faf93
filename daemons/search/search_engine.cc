#include "search/search_engine.h"

#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <vector>

#include "search/search_error.h"
#include "search/store_files.h"
#include "search/viewer.h"

namespace orvex {
namespace search {
namespace {

constexpr int64_t kMaxLimit = 1000;
// How far one search reaches (offset + limit): every index gives that many
// hits before they are merged, so the bound is the answer's memory bound.
constexpr int64_t kMaxReach = 10000;

const Json::Value& Member(const Json::Value& data, const char* key) {
  if (!data.isMember(key)) throw SearchError(kBadArgument, std::string("missing \"") + key + "\"");
  return data[key];
}

// The part of text that value was parsed from; empty when value was not
// parsed from text (built by a caller) or its offsets do not fit.
std::string_view SourceText(const Json::Value& value, std::string_view text) {
  const auto start = static_cast<size_t>(value.getOffsetStart());
  const auto limit = static_cast<size_t>(value.getOffsetLimit());
  if (start >= limit || limit > text.size()) return std::string_view();
  const std::string_view part = text.substr(start, limit - start);
  return part.front() == '{' && part.back() == '}' ? part : std::string_view();
}

std::string StringArg(const Json::Value& data, const char* key) {
  const Json::Value& v = Member(data, key);
  if (!v.isString())
    throw SearchError(kBadArgument, std::string("\"") + key + "\" must be a string");
  return v.asString();
}

const Json::Value& ObjectArg(const Json::Value& data, const char* key) {
  const Json::Value& v = Member(data, key);
  if (!v.isObject())
    throw SearchError(kBadArgument, std::string("\"") + key + "\" must be an object");
  return v;
}

std::string AbsolutePathArg(const Json::Value& data, const char* key) {
  const std::string path = StringArg(data, key);
  if (path.empty() || path[0] != '/' || path.find('\0') != std::string::npos) {
    throw SearchError(kBadArgument, std::string("\"") + key + "\" must be an absolute path");
  }
  return path;
}

// A database path as the client composes it for a share P:
// P/@eaDir/@fileindex/db, in the share's metadata folder, without "." or ".."
// steps. The daemon creates, moves and removes files only at such paths,
// never over a file of the system.
std::string DatabasePathArg(const Json::Value& data, const char* key) {
  static constexpr char kTail[] = "/@eaDir/@fileindex/db";
  const std::string path = AbsolutePathArg(data, key);
  const size_t tail = path.size() - std::min(path.size(), sizeof(kTail) - 1);
  bool ok = tail > 0 && path.compare(tail, std::string::npos, kTail) == 0;
  for (const char* step : {"/./", "/../", "//"}) {
    ok = ok && (path + "/").find(step) == std::string::npos;
  }
  if (!ok) {
    throw SearchError(kBadArgument, std::string("\"") + key + "\" must be a share's index path " +
                                        "(/share/@eaDir/@fileindex/db), not " + path);
  }
  return path;
}

// {"qsl": {"prefix": {"KALOMDPath": prefix}}}: the one query the indexer sends.
std::string PrefixQueryArg(const Json::Value& data) {
  const Json::Value& query = ObjectArg(data, "query");
  const Json::Value& qsl = ObjectArg(query, "qsl");
  const Json::Value& prefix = ObjectArg(qsl, "prefix");
  const std::string path = StringArg(prefix, "KALOMDPath");
  // An empty prefix would reach every document of the index.
  if (path.empty()) throw SearchError(kBadArgument, "the prefix must not be empty");
  return path;
}

std::optional<int64_t> OptionalIntArg(const Json::Value& data, const char* key) {
  if (!data.isMember(key) || data[key].isNull()) return std::nullopt;
  if (!data[key].isInt64()) {
    throw SearchError(kBadArgument, std::string("\"") + key + "\" must be an integer");
  }
  return data[key].asInt64();
}

std::string OptionalStringArg(const Json::Value& data, const char* key) {
  if (!data.isMember(key) || data[key].isNull()) return std::string();
  return StringArg(data, key);
}

// "owner": a user id, or the name of a user the system knows, matched
// against the owner ids the documents carry (KALOMDOwnerUserID).
std::string OwnerArg(const Json::Value& data) {
  const Json::Value& owner = data["owner"];
  if (owner.isIntegral() && owner.isInt64()) return std::to_string(owner.asInt64());
  const std::string name = OptionalStringArg(data, "owner");
  const bool is_id =
      std::all_of(name.begin(), name.end(), [](char c) { return c >= '0' && c <= '9'; });
  if (is_id) return name;
  const struct passwd* pw = ::getpwnam(name.c_str());
  if (pw == nullptr) throw SearchError(kBadArgument, "\"owner\": no user \"" + name + "\"");
  return std::to_string(pw->pw_uid);
}

// Bounds on a search's strings. Each word of a text query is one more
// full-text lookup joined with the others (10,000 words take a second), and
// no file name is longer than 255 bytes, so no longer fragment can match.
constexpr size_t kMaxTextWords = 100;
constexpr size_t kMaxNameBytes = 1024;

// The words of a text query, phrases counted word by word.
size_t WordCount(const std::string& text) {
  size_t words = 0;
  bool in_word = false;
  for (const char c : text) {
    const bool separator = c == ' ' || c == '\t' || c == '"';
    if (!separator && !in_word) ++words;
    in_word = !separator;
  }
  return words;
}

SearchQuery ParseQuery(const Json::Value& data) {
  SearchQuery q;
  q.name = OptionalStringArg(data, "name");
  q.text = OptionalStringArg(data, "text");
  if (q.name.size() > kMaxNameBytes) {
    throw SearchError(kBadArgument,
                      "\"name\" is longer than " + std::to_string(kMaxNameBytes) + " bytes");
  }
  if (WordCount(q.text) > kMaxTextWords) {
    throw SearchError(kBadArgument,
                      "\"text\" has more than " + std::to_string(kMaxTextWords) + " words");
  }
  q.type = OptionalStringArg(data, "type");
  q.extension = OptionalStringArg(data, "extension");
  q.folder = OptionalStringArg(data, "folder");
  q.owner = OwnerArg(data);
  q.size_min = OptionalIntArg(data, "size_min");
  q.size_max = OptionalIntArg(data, "size_max");
  q.mtime_min = OptionalIntArg(data, "mtime_min");
  q.mtime_max = OptionalIntArg(data, "mtime_max");
  const std::string sort = OptionalStringArg(data, "sort");
  if (!sort.empty()) {
    static const char* const kSorts[] = {"name", "path", "size", "mtime", "relevance"};
    if (std::find(std::begin(kSorts), std::end(kSorts), sort) == std::end(kSorts)) {
      throw SearchError(kBadArgument, "unknown sort \"" + sort + "\"");
    }
    q.sort = sort;
  }
  const std::string order = OptionalStringArg(data, "order");
  if (!order.empty() && order != "asc" && order != "desc") {
    throw SearchError(kBadArgument, "\"order\" must be \"asc\" or \"desc\"");
  }
  q.descending = order == "desc";
  q.offset = OptionalIntArg(data, "offset").value_or(0);
  q.limit = OptionalIntArg(data, "limit").value_or(50);
  if (q.offset < 0 || q.limit < 0 || q.limit > kMaxLimit || q.offset > kMaxReach - q.limit) {
    throw SearchError(kBadArgument, "\"offset\" must be >= 0, \"limit\" 0 to " +
                                        std::to_string(kMaxLimit) + ", and their sum at most " +
                                        std::to_string(kMaxReach));
  }
  return q;
}

Json::Value HitJson(const SearchHit& hit, const std::string& id) {
  Json::Value out;
  out["id"] = id;
  out["path"] = hit.path;
  out["name"] = hit.name;
  out["type"] = hit.type;
  out["is_dir"] = hit.is_dir;
  auto put = [&](const char* key, const std::optional<int64_t>& v) {
    if (v) out[key] = static_cast<Json::Int64>(*v);
  };
  put("size", hit.size);
  put("mtime", hit.mtime);
  put("ctime", hit.ctime);
  put("crtime", hit.crtime);
  out["owner"] = hit.owner;
  if (!hit.snippet.empty()) out["snippet"] = hit.snippet;
  return out;
}

// Matches examined at most, per index, for a user of a share that hides
// unreadable entries: each costs a stat, and one search must not walk a
// whole share. Never below the reach, or a page could not be filled.
constexpr int64_t kMaxExamined = kMaxReach;

// The hits of store that viewer may read. Matches are examined in the
// query's order, in growing pages, until the page asked for is full or they
// run out; "total" counts only the readable matches among those examined, so
// that it tells nothing of the hidden ones, and exact says whether every
// match was examined.
SearchResult ReadableHits(IndexStore& store, const SearchQuery& q, const Viewer& viewer,
                          const std::string& share_root, bool& exact) {
  ReadCheck check(viewer, share_root);
  const int64_t need = q.offset + q.limit;
  SearchQuery page = q;
  page.offset = 0;
  // A quarter more than asked: a few hidden entries among the first do not
  // cost a second search.
  page.limit = std::min(need + need / 4 + 16, kMaxExamined);
  std::vector<bool> readable;  // of the matches examined so far, in order
  for (;;) {
    SearchResult result = store.Search(page);
    // A larger page starts with the same matches: only the new ones are checked.
    for (size_t i = readable.size(); i < result.hits.size(); ++i) {
      readable.push_back(check.CanRead(result.hits[i].path));
    }
    const int64_t fetched = static_cast<int64_t>(result.hits.size());
    const int64_t seen = std::count(readable.begin(), readable.end(), true);
    exact = fetched < page.limit || (result.exact && fetched >= result.total);
    if (exact || seen >= need || page.limit >= kMaxExamined) {
      size_t kept = 0;
      for (size_t i = 0; i < result.hits.size(); ++i) {
        if (!readable[i]) continue;
        if (kept != i) result.hits[kept] = std::move(result.hits[i]);
        ++kept;
      }
      result.hits.resize(kept);
      result.total = seen;
      return result;
    }
    page.limit = std::min(page.limit * 4, kMaxExamined);
  }
}

}  // namespace

std::string CheckIndexId(const Json::Value& id) {
  if (!id.isString()) throw SearchError(kBadArgument, "\"id\" must be a string");
  const std::string text = id.asString();
  if (text.empty() || text.find('/') != std::string::npos || text.find("..") != std::string::npos ||
      text.find('\0') != std::string::npos) {
    throw SearchError(kBadIndexId, "bad index id \"" + text + "\": empty, or holds / or ..");
  }
  return text;
}

SearchEngine::SearchEngine(const std::string& registry_file) : registry_(registry_file) {}

SearchEngine::~SearchEngine() = default;

Json::Value SearchEngine::ErrorAnswer(int code, const std::string& msg) {
  Json::Value answer;
  answer["success"] = false;
  answer["error"]["code"] = code;
  answer["error"]["msg"] = msg;
  return answer;
}

Json::Value SearchEngine::Handle(const Json::Value& request, const Caller& caller,
                                 std::string_view text) {
  try {
    if (!request.isObject()) throw SearchError(kBadJson, "the request is not a JSON object");
    if (request.isMember("compound")) return Compound(request["compound"], caller, text);
    return Dispatch(request, caller, text);
  } catch (const SearchError& e) {
    return ErrorAnswer(e.code(), e.what());
  } catch (const std::exception& e) {
    // jsoncpp's type errors and allocation failures: the daemon goes on.
    return ErrorAnswer(kStorage, e.what());
  }
}

Json::Value SearchEngine::CompoundAnswer() {
  Json::Value answer;
  answer["success"] = true;
  answer["has_fail"] = false;
  answer["data"] = Json::Value(Json::arrayValue);
  return answer;
}

void SearchEngine::AddResult(Json::Value& answer, Json::Value result) {
  if (!result["success"].asBool()) answer["has_fail"] = true;
  answer["data"].append(std::move(result));
}

Json::Value SearchEngine::CompoundItem(const Json::Value& item, const Caller& caller,
                                       std::string_view text) {
  if (item.isObject() && item.isMember("compound")) {
    return ErrorAnswer(kBadArgument, "a compound request cannot hold another");
  }
  return Handle(item, caller, text);
}

Json::Value SearchEngine::Compound(const Json::Value& items, const Caller& caller,
                                   std::string_view text) {
  if (!items.isArray()) throw SearchError(kBadArgument, "\"compound\" must be an array");
  Json::Value answer = CompoundAnswer();
  for (const Json::Value& item : items) AddResult(answer, CompoundItem(item, caller, text));
  return answer;
}

Json::Value SearchEngine::Dispatch(const Json::Value& request, const Caller& caller,
                                   std::string_view text) {
  const std::string command = StringArg(request, "command");
  const Json::Value& data = ObjectArg(request, "data");
  Json::Value answer;
  if (command == "index_create") {
    answer = IndexCreate(data);
  } else if (command == "index_delete") {
    answer = IndexDelete(data);
  } else if (command == "index_pause") {
    answer = IndexPause(data, /*paused=*/true);
  } else if (command == "index_resume") {
    answer = IndexPause(data, /*paused=*/false);
  } else if (command == "index_config_set") {
    answer = IndexConfigSet(data);
  } else if (command == "document_upsert_by_id") {
    answer = DocumentWrite(data, /*merge=*/false, text);
  } else if (command == "document_set_by_id") {
    answer = DocumentWrite(data, /*merge=*/true, text);
  } else if (command == "document_del_by_id") {
    answer = DocumentDelete(data);
  } else if (command == "document_del_by_query") {
    answer = DocumentQuery(data, /*remove=*/true);
  } else if (command == "document_get_by_query") {
    answer = DocumentQuery(data, /*remove=*/false);
  } else if (command == "commit") {
    answer = Commit(data);
  } else if (command == "search") {
    answer = Search(data, caller);
  } else if (command == "stats") {
    answer = Stats(data);
  } else {
    throw SearchError(kUnknownCommand, "unknown command \"" + command + "\"");
  }
  answer["success"] = true;
  return answer;
}

IndexStore& SearchEngine::WritableStore(const std::string& id) {
  const IndexRecord* record = registry_.Find(id);
  if (record != nullptr && record->paused) {
    throw SearchError(kIndexPaused,
                      "index \"" + id + "\" is paused: resume it to change documents");
  }
  return Store(id);
}

IndexStore& SearchEngine::Store(const std::string& id) {
  const auto it = open_.find(id);
  if (it != open_.end()) return *it->second;
  const IndexRecord* record = registry_.Find(id);
  if (record == nullptr) throw SearchError(kNoSuchIndex, "no index \"" + id + "\"");
  // create: a database lost from under a registered index (a volume
  // replaced) comes back empty and the indexer fills it again.
  auto store = std::make_unique<IndexStore>(record->path, /*create=*/true);
  return *(open_[id] = std::move(store));
}

void SearchEngine::CloseStore(const std::string& id) {
  const auto it = open_.find(id);
  if (it == open_.end()) return;
  it->second->Close();
  open_.erase(it);
}

Json::Value SearchEngine::IndexCreate(const Json::Value& data) {
  const std::string id = CheckIndexId(Member(data, "id"));
  const std::string path = DatabasePathArg(data, "path");
  if (data.isMember("mappings") && !data["mappings"].isObject()) {
    throw SearchError(kBadArgument, "\"mappings\" must be an object");
  }
  for (const auto& [other, record] : registry_.indexes()) {
    if (other == id && record.path != path) {
      throw SearchError(kIndexExists, "index \"" + id + "\" exists at " + record.path);
    }
    if (other != id && record.path == path) {
      throw SearchError(kIndexExists, path + " is the database of index \"" + other + "\"");
    }
  }
  if (registry_.Find(id) == nullptr) {
    // The database first: a registered index always has one.
    auto store = std::make_unique<IndexStore>(path, /*create=*/true);
    registry_.Put(id, {path, false});
    open_[id] = std::move(store);
  }
  if (data.isMember("mappings")) {
    IndexStore& store = Store(id);
    store.SetMappings(data["mappings"]);
    store.Commit();
  }
  return Json::Value(Json::objectValue);
}

Json::Value SearchEngine::IndexDelete(const Json::Value& data) {
  const std::string id = CheckIndexId(Member(data, "id"));
  const IndexRecord* record = registry_.Find(id);
  // Deleting what is not there is done: a repeated request must not fail.
  if (record == nullptr) return Json::Value(Json::objectValue);
  const std::string path = record->path;
  open_.erase(id);  // rolls back what was not committed
  registry_.Remove(id);
  RemoveStoreFiles(path);
  return Json::Value(Json::objectValue);
}

// A pause first makes durable what was sent before it: the index then holds
// still, with nothing pending, until the resume.
Json::Value SearchEngine::IndexPause(const Json::Value& data, bool paused) {
  const std::string id = CheckIndexId(Member(data, "id"));
  const IndexRecord* record = registry_.Find(id);
  if (record == nullptr) throw SearchError(kNoSuchIndex, "no index \"" + id + "\"");
  const auto open = open_.find(id);
  if (paused && open != open_.end()) open->second->Commit();
  if (record->paused != paused) registry_.Put(id, {record->path, paused});
  return Json::Value(Json::objectValue);
}

// A rename (new id and path) or a move (new path): the database moves whole,
// committed and with its log folded in, by one rename where the volume allows.
Json::Value SearchEngine::IndexConfigSet(const Json::Value& data) {
  const std::string id = CheckIndexId(Member(data, "id"));
  const Json::Value& change = ObjectArg(data, "data");
  const IndexRecord* record = registry_.Find(id);
  if (record == nullptr) throw SearchError(kNoSuchIndex, "no index \"" + id + "\"");
  const std::string new_id = change.isMember("id") ? CheckIndexId(change["id"]) : id;
  const std::string new_path =
      change.isMember("path") ? DatabasePathArg(change, "path") : record->path;
  if (new_id != id && registry_.Find(new_id) != nullptr) {
    throw SearchError(kIndexExists, "index \"" + new_id + "\" exists");
  }
  for (const auto& [other, other_record] : registry_.indexes()) {
    if (other != id && other_record.path == new_path) {
      throw SearchError(kIndexExists, new_path + " is the database of index \"" + other + "\"");
    }
  }
  const IndexRecord moved{new_path, record->paused};
  const std::string old_path = record->path;
  CloseStore(id);
  if (new_path != old_path) MoveStoreFile(old_path, new_path);
  try {
    registry_.Rename(id, new_id, moved);
  } catch (const SearchError&) {
    // The registry still names the old place: put the database back there.
    if (new_path != old_path) MoveStoreFile(new_path, old_path);
    throw;
  }
  return Json::Value(Json::objectValue);
}

Json::Value SearchEngine::DocumentWrite(const Json::Value& data, bool merge,
                                        std::string_view text) {
  const std::string id = CheckIndexId(Member(data, "id"));
  const std::string doc_id = StringArg(data, "doc_id");
  if (doc_id.empty()) throw SearchError(kBadArgument, "\"doc_id\" must not be empty");
  const Json::Value& doc = ObjectArg(data, "data");
  IndexStore& store = WritableStore(id);
  if (merge) {
    store.Set(doc_id, doc);
  } else {
    store.Upsert(doc_id, doc, SourceText(doc, text));
  }
  return Json::Value(Json::objectValue);
}

Json::Value SearchEngine::DocumentDelete(const Json::Value& data) {
  const std::string id = CheckIndexId(Member(data, "id"));
  const std::string doc_id = StringArg(data, "doc_id");
  Json::Value answer;
  answer["data"]["deleted"] = WritableStore(id).Delete(doc_id) ? 1 : 0;
  return answer;
}

Json::Value SearchEngine::DocumentQuery(const Json::Value& data, bool remove) {
  const std::string id = CheckIndexId(Member(data, "id"));
  const std::string prefix = PrefixQueryArg(data);
  Json::Value answer;
  if (remove) {
    answer["data"]["deleted"] = static_cast<Json::Int64>(WritableStore(id).DeleteByPrefix(prefix));
    return answer;
  }
  // A page ("limit" documents strictly after the path "after") keeps the
  // answer for a large subtree under the frame cap; "more" tells whether it
  // was the last. 10,000 stored documents are a few megabytes.
  constexpr int64_t kMaxPageDocuments = 10000;
  const std::optional<int64_t> limit = OptionalIntArg(data, "limit");
  if (limit && (*limit < 1 || *limit > kMaxPageDocuments)) {
    throw SearchError(kBadArgument, "\"limit\" must be 1 to " + std::to_string(kMaxPageDocuments));
  }
  const std::string after = OptionalStringArg(data, "after");
  bool more = false;
  answer["data"] = Store(id).GetByPrefix(prefix, after, limit.value_or(-1), &more);
  if (limit) answer["more"] = more;
  return answer;
}

Json::Value SearchEngine::Commit(const Json::Value& data) {
  Store(CheckIndexId(Member(data, "id"))).Commit();
  return Json::Value(Json::objectValue);
}

Json::Value SearchEngine::Search(const Json::Value& data, const Caller& caller) {
  SearchQuery q = ParseQuery(data);
  std::vector<std::string> ids;
  if (data.isMember("id")) {
    ids.push_back(CheckIndexId(data["id"]));
    if (registry_.Find(ids[0]) == nullptr)
      throw SearchError(kNoSuchIndex, "no index \"" + ids[0] + "\"");
  } else {
    for (const auto& entry : registry_.indexes()) ids.push_back(entry.first);
  }
  const Viewer viewer = ResolveViewer(data, caller);
  std::vector<std::pair<SearchHit, std::string>> hits;
  int64_t total = 0;
  bool exact = true;  // false when "total" counts only the matches examined
  for (const std::string& id : ids) {
    const IndexAccess access = IndexVisibility(id, viewer);
    if (access.visibility == Visibility::kNone) continue;
    bool index_exact = true;
    SearchResult result = access.visibility == Visibility::kAll
                              ? Store(id).Search(q)
                              : ReadableHits(Store(id), q, viewer, access.share_root, index_exact);
    if (access.visibility == Visibility::kAll) index_exact = result.exact;
    exact = exact && index_exact;
    total += result.total;
    for (SearchHit& hit : result.hits) hits.emplace_back(std::move(hit), id);
  }
  std::stable_sort(hits.begin(), hits.end(),
                   [&](const auto& a, const auto& b) { return HitBefore(a.first, b.first, q); });
  Json::Value answer;
  answer["data"]["total"] = static_cast<Json::Int64>(total);
  answer["data"]["total_exact"] = exact;
  answer["data"]["hits"] = Json::Value(Json::arrayValue);
  const size_t begin = std::min(hits.size(), static_cast<size_t>(q.offset));
  const size_t end = std::min(hits.size(), begin + static_cast<size_t>(q.limit));
  for (size_t i = begin; i < end; ++i) {
    answer["data"]["hits"].append(HitJson(hits[i].first, hits[i].second));
  }
  return answer;
}

Json::Value SearchEngine::Stats(const Json::Value& data) {
  Json::Value answer;
  answer["data"]["indexes"] = Json::Value(Json::arrayValue);
  const std::string only = data.isMember("id") ? CheckIndexId(data["id"]) : std::string();
  if (!only.empty() && registry_.Find(only) == nullptr) {
    throw SearchError(kNoSuchIndex, "no index \"" + only + "\"");
  }
  for (const auto& [id, record] : registry_.indexes()) {
    if (!only.empty() && id != only) continue;
    Json::Value entry = Store(id).Stats();
    entry["id"] = id;
    entry["path"] = record.path;
    entry["paused"] = record.paused;
    answer["data"]["indexes"].append(std::move(entry));
  }
  return answer;
}

}  // namespace search
}  // namespace orvex
