// SearchEngine::HandleCompound: the bulk of an index's load, compounds of
// document upserts, read straight from the request's text into flat
// documents. Building and freeing a JSON value tree for them cost more than
// writing their rows. Every other sub-request (another command, a document
// with text content, arrays or fractions, a repeated key) is parsed on its
// own and goes to Handle(), so that both ways give the same answers and
// store the same rows.
#include <simdjson.h>

#include <algorithm>
#include <exception>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "orvex/foundation/json.h"
#include "orvex/portable/json_text.h"
#include "search/search_engine.h"
#include "search/search_error.h"

namespace orvex {
namespace search {
namespace {

// The parser keeps about 14 bytes for each byte of the largest text it has
// read: larger requests (text content, mostly) take the other path.
constexpr size_t kMaxText = size_t{1} << 20;
// An object of more members than this (a document, a request) is unusual:
// the other path.
constexpr size_t kMaxProperties = 64;
constexpr char kUpsert[] = "document_upsert_by_id";

using simdjson::dom::element_type;

// Whether object's keys differ, checked for small objects only (a request
// has a few): a large one counts as repeating them, which sends it to the
// other path, so that no request costs a quadratic check.
bool UniqueKeys(const simdjson::dom::object& object) {
  std::vector<std::string_view> keys;
  for (const auto field : object) {
    if (keys.size() == kMaxProperties) return false;
    if (std::find(keys.begin(), keys.end(), field.key) != keys.end()) return false;
    keys.push_back(field.key);
  }
  return true;
}

std::optional<std::string_view> StringField(const simdjson::dom::object& object,
                                            std::string_view key) {
  std::string_view text;
  if (object.at_key(key).get_string().get(text)) return std::nullopt;
  return text;
}

// One sub-request, checked to be an upsert with members of the right types.
struct Upsert {
  std::string_view id, doc_id;
  simdjson::dom::object doc;
};

std::optional<Upsert> UpsertOf(const simdjson::dom::element& item) {
  simdjson::dom::object request, data;
  Upsert upsert;
  if (item.get_object().get(request) || !UniqueKeys(request)) return std::nullopt;
  if (StringField(request, "command") != std::optional<std::string_view>(kUpsert)) {
    return std::nullopt;
  }
  if (request.at_key("compound").error() != simdjson::NO_SUCH_FIELD) return std::nullopt;
  if (request.at_key("data").get_object().get(data) || !UniqueKeys(data)) return std::nullopt;
  const auto id = StringField(data, "id");
  const auto doc_id = StringField(data, "doc_id");
  if (!id || !doc_id || data.at_key("data").get_object().get(upsert.doc)) return std::nullopt;
  upsert.id = *id;
  upsert.doc_id = *doc_id;
  return upsert;
}

// doc's properties when each is a string, a whole number that fits 64
// bits, a boolean or null; false otherwise. flat.text is left as it is.
bool Flatten(const simdjson::dom::object& doc, FlatDocument& flat) {
  using Kind = FlatDocument::Kind;
  flat.properties.clear();
  for (const auto field : doc) {
    if (flat.properties.size() == kMaxProperties) return false;
    FlatDocument::Property p;
    p.name = field.key;
    switch (field.value.type()) {
      case element_type::STRING:
        p.kind = Kind::kString;
        p.text = field.value.get_string().value_unsafe();
        break;
      case element_type::INT64:
        p.kind = Kind::kInt;
        p.number = field.value.get_int64().value_unsafe();
        break;
      case element_type::BOOL:
        p.kind = Kind::kBool;
        p.flag = field.value.get_bool().value_unsafe();
        break;
      case element_type::NULL_VALUE:
        break;
      default:
        return false;
    }
    flat.properties.push_back(p);
  }
  return true;
}

// flat's properties written out as compact JSON text: what simdjson's
// minify makes of the object they were read from (both escape quotes,
// backslashes and control characters only), at a fraction of its cost (it
// grows a vector a few bytes at a time).
void WriteText(FlatDocument& flat) {
  using Kind = FlatDocument::Kind;
  std::string& out = flat.text;
  out.assign(1, '{');
  for (const FlatDocument::Property& p : flat.properties) {
    if (out.size() > 1) out += ',';
    portable::AppendJsonString(p.name, out);
    out += ':';
    switch (p.kind) {
      case Kind::kString:
        portable::AppendJsonString(p.text, out);
        break;
      case Kind::kInt:
        out += std::to_string(p.number);
        break;
      case Kind::kBool:
        out += p.flag ? "true" : "false";
        break;
      case Kind::kNull:
        out += "null";
        break;
    }
  }
  out += '}';
}

// Writes upsert's document (its doc_id not empty) through store, flat when
// it can be.
void WriteFlat(IndexStore& store, const Upsert& upsert, FlatDocument& flat) {
  const std::string doc_id(upsert.doc_id);
  if (Flatten(upsert.doc, flat)) {
    WriteText(flat);
    if (store.UpsertFlat(doc_id, flat)) return;
  } else {
    flat.text = simdjson::minify(upsert.doc);
  }
  // The document's value after all: Upsert() of what Handle() parses.
  Json::Value doc;
  if (!fromString(doc, flat.text)) throw SearchError(kBadJson, "unreadable document");
  store.Upsert(doc_id, doc, flat.text);
}

}  // namespace

std::optional<Json::Value> SearchEngine::HandleCompound(std::string_view text,
                                                        const Caller& caller) {
  // Searches and the other single requests are parsed once, by Handle()'s
  // caller. (A key spelled with escapes goes that way too, and is read as
  // well there.)
  if (text.size() > kMaxText || text.find("\"compound\"") == std::string_view::npos) {
    return std::nullopt;
  }
  thread_local simdjson::dom::parser parser;
  simdjson::dom::object root;
  simdjson::dom::array items;
  if (parser.parse(text.data(), text.size()).get_object().get(root) || !UniqueKeys(root) ||
      root.at_key("compound").get_array().get(items)) {
    return std::nullopt;
  }
  Json::Value answer = CompoundAnswer();
  FlatDocument flat;
  for (const simdjson::dom::element item : items) {
    Json::Value result;
    if (const std::optional<Upsert> upsert = UpsertOf(item)) {
      try {
        // Checked in the order DocumentWrite() checks them.
        const std::string id = CheckIndexId(Json::Value(std::string(upsert->id)));
        if (upsert->doc_id.empty()) {
          throw SearchError(kBadArgument, "\"doc_id\" must not be empty");
        }
        WriteFlat(WritableStore(id), *upsert, flat);
        result["success"] = true;
      } catch (const SearchError& e) {
        result = ErrorAnswer(e.code(), e.what());
      } catch (const std::exception& e) {
        result = ErrorAnswer(kStorage, e.what());
      }
    } else {
      // Any other sub-request, parsed on its own as Compound() takes it.
      const std::string item_text = simdjson::minify(item);
      Json::Value request;
      result = fromString(request, item_text) ? CompoundItem(request, caller, item_text)
                                              : ErrorAnswer(kBadJson, "unreadable request");
    }
    AddResult(answer, std::move(result));
  }
  return answer;
}

}  // namespace search
}  // namespace orvex
