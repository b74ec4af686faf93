#include "office_package.h"

#include <algorithm>
#include <memory>

namespace orvex {
namespace extract {
namespace {

void SetDate(Json::Value& out, const char* name, const std::string& value) {
  int64_t seconds = 0;
  if (ParseIsoDate(value, &seconds)) SetInt(out, name, seconds);
}

}  // namespace

// Markup costs bytes: Word spends 10 to 20 bytes of XML per byte of text.
// The budget lets a document fill the text cap and little more.
uint64_t PackageBudget(const ExtractLimits& limits) {
  return 32 * static_cast<uint64_t>(limits.max_text_bytes) + (4 << 20);
}

void PartTexts::Add(int64_t order, TextSink& sink) {
  full_ = full_ || sink.full();
  std::string text = sink.Take();
  if (text.empty()) return;
  used_ += text.size() + 1;  // and the line break that joins it
  texts_.emplace(order, std::move(text));
}

std::string PartTexts::Join() const {
  TextSink all(cap_);
  for (const auto& part : texts_) {
    all.Append(part.second);
    all.Break();
  }
  return all.Take();
}

ByteSource FromString(const std::string& data) {
  auto offset = std::make_shared<size_t>(0);
  return [&data, offset](char* buf, size_t len) -> ssize_t {
    const size_t n = std::min(len, data.size() - *offset);
    std::copy_n(data.data() + *offset, n, buf);
    *offset += n;
    return static_cast<ssize_t>(n);
  };
}

ByteSource FromEntry(ZipReader& zip) {
  return [&zip](char* buf, size_t len) { return zip.Read(buf, len); };
}

bool ReadPropertyPart(ZipReader& zip, PropertyCollector& collector) {
  std::string data;
  if (!zip.ReadAll(kMaxPropertyPart, &data)) return false;
  return ParseMarkup(Markup::kXml, FromString(data), collector, nullptr);
}

void PackageProperties::WriteTo(Json::Value& out) const {
  SetText(out, "KALOMDTitle", title);
  SetTextList(out, "KALOMDAuthors", authors);
  SetText(out, "KALOMDDescription", description);
  SetTextList(out, "KALOMDKeywords", keywords);
  SetDate(out, "KALOMDContentCreationDate", created);
  SetDate(out, "KALOMDContentModificationDate", modified);
  SetText(out, "KALOMDCreator", application);
  SetText(out, "KALOMDIdentifier", identifier);
}

}  // namespace extract
}  // namespace orvex
