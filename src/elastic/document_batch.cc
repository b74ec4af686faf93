// DocumentBatch: many document changes in one compound request, so that
// indexing a large tree costs a round trip per batch instead of per file.
#include <string>
#include <utility>
#include <vector>

#include "elastic/channel.h"
#include "elastic/document_requests.h"
#include "orvex/elastic.h"

namespace orvex {
namespace fileindex {
namespace elastic {
namespace {

// About the length of value's JSON text: every string and name with its
// quotes and separator, a number's worth for every other value. Cheaper than
// writing the text out, and near enough to bound the request's size.
size_t ApproxJsonBytes(const Json::Value& value) {
  constexpr size_t kScalarBytes = 8;
  if (value.isString()) {
    const char* begin = nullptr;
    const char* end = nullptr;
    value.getString(&begin, &end);
    return static_cast<size_t>(end - begin) + 3;
  }
  if (!value.isObject() && !value.isArray()) return kScalarBytes;
  size_t bytes = 2;
  for (auto it = value.begin(); it != value.end(); ++it) {
    if (value.isObject()) bytes += it.name().size() + 4;
    bytes += ApproxJsonBytes(*it);
  }
  return bytes;
}

}  // namespace

DocumentBatch::DocumentBatch(std::string share) : share_(std::move(share)) {}

void DocumentBatch::Upsert(const std::string& full_path, bool need_meta) {
  Add(UpsertRequest(share_, full_path, need_meta));
}

void DocumentBatch::Attr(const std::string& full_path) { Add(AttrRequest(share_, full_path)); }

void DocumentBatch::Del(const std::string& full_path) { Add(DelRequest(share_, full_path)); }

void DocumentBatch::Add(Json::Value sub_request) {
  bytes_ += ApproxJsonBytes(sub_request) + 1;
  compound_.append(std::move(sub_request));
}

std::vector<DocumentFailure> DocumentBatch::Flush() {
  if (empty()) return {};
  Json::Value request;
  request["compound"] = std::move(compound_);
  Clear();  // before sending: whatever happens, this batch has had its turn
  Json::Value response;
  SendWithRetry(response, request);
  return FailedSubRequests(response);
}

void DocumentBatch::Clear() {
  compound_ = Json::Value(Json::arrayValue);
  bytes_ = 0;
}

}  // namespace elastic
}  // namespace fileindex
}  // namespace orvex
