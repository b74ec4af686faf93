// What the zip-package extractors (Office Open XML, OpenDocument, EPUB)
// share: the budget of a package, the texts of its parts joined in reading
// order under the cap, reading small property parts whole, and the document
// properties every flavour has. One thread at a time per object.
#ifndef ORVEX_PORTABLE_EXTRACT_OFFICE_PACKAGE_H_
#define ORVEX_PORTABLE_EXTRACT_OFFICE_PACKAGE_H_

#include <json/json.h>

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "content_extractor.h"
#include "extract_util.h"
#include "markup_parser.h"
#include "markup_text.h"
#include "zip_reader.h"

namespace orvex {
namespace extract {

// Property parts (core.xml, meta.xml, the EPUB package file) are small; one
// larger than this is not read.
constexpr size_t kMaxPropertyPart = 1 << 20;

// The uncompressed bytes a package's text parts may cost.
uint64_t PackageBudget(const ExtractLimits& limits);

// The texts of the parts, joined in reading order under one cap.
class PartTexts {
 public:
  explicit PartTexts(size_t cap) : cap_(cap) {}
  // What a further part may still add.
  size_t remaining() const { return used_ >= cap_ ? 0 : cap_ - used_; }
  bool full() const { return full_; }
  // Takes the text of the part read into sink; order ranks it.
  void Add(int64_t order, TextSink& sink);
  // The parts in order, one line break between two, within the cap.
  std::string Join() const;

 private:
  size_t cap_;
  size_t used_ = 0;
  bool full_ = false;
  std::multimap<int64_t, std::string> texts_;
};

// Sources for ParseMarkup: a string that must outlive the source, and the
// current entry of zip (charged to its budget).
ByteSource FromString(const std::string& data);
ByteSource FromEntry(ZipReader& zip);

// Reads the current entry (a small XML part) whole into collector; false
// when it is larger than kMaxPropertyPart, damaged or not well-formed.
bool ReadPropertyPart(ZipReader& zip, PropertyCollector& collector);

// The document properties of a package, whichever flavour, as read.
struct PackageProperties {
  std::string title;
  std::vector<std::string> authors;
  std::string description;
  std::vector<std::string> keywords;
  std::string created;   // ISO 8601
  std::string modified;  // ISO 8601
  std::string application;
  std::string identifier;

  // KALOMDTitle, KALOMDAuthors, KALOMDDescription, KALOMDKeywords, the
  // content creation and modification dates, KALOMDCreator (the
  // application) and KALOMDIdentifier; empty ones are left out.
  void WriteTo(Json::Value& out) const;
};

}  // namespace extract
}  // namespace orvex

#endif  // ORVEX_PORTABLE_EXTRACT_OFFICE_PACKAGE_H_
