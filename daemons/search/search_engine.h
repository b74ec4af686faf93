// SearchEngine: carries out the search daemon's commands. Takes one request
// (a parsed JSON value) and gives its answer; every failure becomes an answer
// with "success" false and the code of search_error.h. Owns the registry and
// the open indexes. One thread at a time.
#ifndef ORVEX_SEARCH_SEARCH_ENGINE_H_
#define ORVEX_SEARCH_SEARCH_ENGINE_H_

#include <json/json.h>
#include <sys/types.h>

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "search/index_registry.h"
#include "search/index_store.h"

namespace orvex {
namespace search {

// Who sent a request, from the socket's peer credentials.
struct Caller {
  uid_t uid = 0;
  gid_t gid = 0;
};

class SearchEngine {
 public:
  // registry_file as given (already under ORVEX_ROOT). Throws SearchError
  // when the registry cannot be read.
  explicit SearchEngine(const std::string& registry_file);
  ~SearchEngine();
  SearchEngine(const SearchEngine&) = delete;
  SearchEngine& operator=(const SearchEngine&) = delete;

  // The answer to request: {"success": true[, "data": ...]} or {"success":
  // false, "error": {"code", "msg"}}; a compound request gets one result per
  // sub-request in "data" and "has_fail". text, when not empty, is the JSON
  // text request was parsed from (its values' offsets point into it): the
  // documents written are stored as they came. Never throws.
  Json::Value Handle(const Json::Value& request, const Caller& caller,
                     std::string_view text = std::string_view());

  // The answer Handle() gives to the compound request in text, read without
  // a JSON value tree for its upserts (the bulk of an index's load); nullopt,
  // with nothing done, when text is not a compound request that it can read
  // whole: the caller then parses it and calls Handle(). Never throws.
  std::optional<Json::Value> HandleCompound(std::string_view text, const Caller& caller);

  // An answer with "success" false.
  static Json::Value ErrorAnswer(int code, const std::string& msg);

 private:
  Json::Value Dispatch(const Json::Value& request, const Caller& caller, std::string_view text);
  Json::Value Compound(const Json::Value& items, const Caller& caller, std::string_view text);
  // A compound's answer without results yet, one result added to it, and
  // the result of one of its sub-requests (which may not be a compound).
  static Json::Value CompoundAnswer();
  static void AddResult(Json::Value& answer, Json::Value result);
  Json::Value CompoundItem(const Json::Value& item, const Caller& caller, std::string_view text);

  Json::Value IndexCreate(const Json::Value& data);
  Json::Value IndexDelete(const Json::Value& data);
  Json::Value IndexPause(const Json::Value& data, bool paused);
  Json::Value IndexConfigSet(const Json::Value& data);
  Json::Value DocumentWrite(const Json::Value& data, bool merge, std::string_view text);
  Json::Value DocumentDelete(const Json::Value& data);
  Json::Value DocumentQuery(const Json::Value& data, bool remove);
  Json::Value Commit(const Json::Value& data);
  Json::Value Search(const Json::Value& data, const Caller& caller);
  Json::Value Stats(const Json::Value& data);

  // The open store of index id; throws kNoSuchIndex.
  IndexStore& Store(const std::string& id);
  // The same for a document write: throws kIndexPaused when it is paused.
  IndexStore& WritableStore(const std::string& id);
  void CloseStore(const std::string& id);

  IndexRegistry registry_;
  std::map<std::string, std::unique_ptr<IndexStore>> open_;
};

// An index id as a daemon will use it: a non-empty string without "/", ".."
// or NUL. Throws kBadIndexId (kBadArgument when it is not a string).
std::string CheckIndexId(const Json::Value& id);

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_SEARCH_ENGINE_H_
