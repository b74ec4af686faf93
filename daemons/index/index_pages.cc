#include "index/index_pages.h"

#include <json/json.h>

#include <algorithm>
#include <utility>

#include "elastic/channel.h"
#include "orvex/elastic.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/util.h"

namespace orvex {
namespace indexd {

namespace el = fileindex::elastic;

IndexPages::IndexPages(std::string share, std::string prefix, size_t page_size)
    : share_(std::move(share)),
      prefix_(std::move(prefix)),
      page_size_(std::max<size_t>(1, page_size)) {}

const IndexPages::Doc* IndexPages::Peek() {
  while (next_ == page_.size() && more_) Fetch();
  return next_ < page_.size() ? &page_[next_] : nullptr;
}

void IndexPages::Fetch() {
  Json::Value request(Json::objectValue);
  request["command"] = "document_get_by_query";
  request["data"]["id"] = el::GetFileIndexID(share_);
  request["data"]["query"]["qsl"]["prefix"]["KALOMDPath"] = prefix_;
  request["data"]["limit"] = static_cast<Json::UInt64>(page_size_);
  if (!after_.empty()) request["data"]["after"] = after_;
  Json::Value answer;
  el::SendWithRetry(answer, request);
  if (!answer["data"].isArray()) {
    throw Error(kErrorSearchDaemon, "document_get_by_query answer without data: " + prefix_);
  }
  std::vector<Doc> page;
  page.reserve(answer["data"].size());
  const auto number = [](const Json::Value& v) { return v.isNumeric() ? v.asInt64() : -1; };
  for (const Json::Value& doc : answer["data"]) {
    const Json::Value& path = doc["KALOMDPath"];
    // The merge needs rising paths below the prefix; anything else would
    // make it delete or read again what it should not.
    if (!path.isString() || !StringStartWith(path.asString(), prefix_)) continue;
    const std::string& last = page.empty() ? after_ : page.back().path;
    if (!last.empty() && path.asString() <= last) continue;
    page.push_back({path.asString(), number(doc["KALOMDFSSize"]),
                    number(doc["KALOMDAttributeChangeDate"]),
                    number(doc["KALOMDFSContentChangeDate"])});
  }
  // An answer that says more but brings nothing new ends the listing rather
  // than asking for the same page forever.
  more_ = answer["more"].isBool() && answer["more"].asBool() && !page.empty();
  if (!page.empty()) after_ = page.back().path;
  page_ = std::move(page);
  next_ = 0;
}

}  // namespace indexd
}  // namespace orvex
