// Office documents are zip packages of XML parts: Office Open XML (docx,
// xlsx, pptx) and OpenDocument (odt, ods, odp). One pass over the archive:
// each text part is streamed out of it into libxml2's push parser, so
// neither the package nor a part is ever held whole; the archive's
// uncompressed bytes are budgeted (ZipReader) and text stops at the cap.
#include <algorithm>
#include <cctype>
#include <cstdlib>
#include <map>
#include <string>
#include <vector>

#include "extract_util.h"
#include "extractors.h"
#include "markup_parser.h"
#include "markup_text.h"
#include "office_package.h"
#include "zip_reader.h"

namespace orvex {
namespace extract {
namespace {

enum class Flavor { kWord, kSheet, kSlides, kOpenDocument };

Flavor FlavorOf(const std::string& ext) {
  if (ext[0] == 'o') return Flavor::kOpenDocument;
  if (ext[0] == 'x') return Flavor::kSheet;
  if (ext[0] == 'p') return Flavor::kSlides;
  return Flavor::kWord;
}

// The part every package of the flavour has: without it the file is not one.
const char* MainPart(Flavor flavor) {
  switch (flavor) {
    case Flavor::kWord:
      return "word/document.xml";
    case Flavor::kSheet:
      return "xl/workbook.xml";
    case Flavor::kSlides:
      return "ppt/presentation.xml";
    case Flavor::kOpenDocument:
      return "content.xml";
  }
  return "";
}

const TextRules& RulesOf(Flavor flavor) {
  static const TextRules word{/*text_elements=*/{"t"},
                              /*skip_elements=*/{"pPr", "rPr", "instrText"},
                              /*break_elements=*/{"p", "br", "cr"},
                              /*tab_elements=*/{"tab"},
                              /*space_elements=*/{},
                              /*title_element=*/""};
  // Shared strings are "si" items, inline ones "is"; "rPh" holds phonetic
  // readings, not text.
  static const TextRules sheet{{"t"}, {"rPh"}, {"si", "is"}, {}, {}, ""};
  static const TextRules slides{{"t"}, {}, {"p", "br"}, {"tab"}, {}, ""};
  static const TextRules open_document{
      {}, {"tracked-changes", "scripts", "forms"}, {"p", "h", "line-break"}, {"tab"}, {"s"}, ""};
  switch (flavor) {
    case Flavor::kWord:
      return word;
    case Flavor::kSheet:
      return sheet;
    case Flavor::kSlides:
      return slides;
    case Flavor::kOpenDocument:
      return open_document;
  }
  return word;
}

// N when name is prefix + N + ".xml" (N at most nine digits), else -1.
int64_t PartNumber(const std::string& name, const std::string& prefix) {
  if (name.size() <= prefix.size() + 4 || name.compare(0, prefix.size(), prefix) != 0 ||
      name.compare(name.size() - 4, 4, ".xml") != 0) {
    return -1;
  }
  const std::string number = name.substr(prefix.size(), name.size() - prefix.size() - 4);
  if (number.size() > 9 || !std::all_of(number.begin(), number.end(), ::isdigit)) return -1;
  return std::atol(number.c_str());
}

// Ranks of the parts that follow a document's body, numbered parts in
// number order within their kind.
constexpr int64_t kAfterBody = int64_t{1} << 32;

// The reading order of a text part, or false when name is not one: the
// body first (slides by number), then notes, headers and footers.
bool TextPartOrder(Flavor flavor, const std::string& name, int64_t* order) {
  struct Part {
    const char* prefix;  // a fixed name when numbered is false
    bool numbered;
    int64_t rank;
  };
  static const Part kWord[] = {{"word/document.xml", false, 0},
                               {"word/footnotes.xml", false, 1 * kAfterBody},
                               {"word/endnotes.xml", false, 2 * kAfterBody},
                               {"word/comments.xml", false, 3 * kAfterBody},
                               {"word/header", true, 4 * kAfterBody},
                               {"word/footer", true, 5 * kAfterBody}};
  // Worksheets hold the strings typed inline rather than shared.
  static const Part kSheet[] = {{"xl/sharedStrings.xml", false, 0},
                                {"xl/worksheets/sheet", true, kAfterBody}};
  static const Part kSlides[] = {{"ppt/slides/slide", true, 0},
                                 {"ppt/notesSlides/notesSlide", true, kAfterBody}};
  static const Part kOpenDocument[] = {{"content.xml", false, 0}};
  const auto find = [&](const auto& parts) {
    for (const Part& part : parts) {
      const int64_t number = part.numbered ? PartNumber(name, part.prefix) : 0;
      if ((part.numbered && number >= 0) || (!part.numbered && name == part.prefix)) {
        *order = part.rank + number;
        return true;
      }
    }
    return false;
  };
  switch (flavor) {
    case Flavor::kWord:
      return find(kWord);
    case Flavor::kSheet:
      return find(kSheet);
    case Flavor::kSlides:
      return find(kSlides);
    case Flavor::kOpenDocument:
      return find(kOpenDocument);
  }
  return false;
}

PropertyCollector CoreCollector() {
  return PropertyCollector({"title", "creator", "subject", "description", "keywords", "created",
                            "modified", "Application", "initial-creator", "keyword",
                            "creation-date", "date", "generator", "identifier"});
}

// docProps/core.xml and app.xml (Office Open XML) or meta.xml (OpenDocument).
void ReadPackageProperties(const PropertyCollector& c, PackageProperties* p) {
  if (!c.First("title").empty()) p->title = c.First("title");
  // OpenDocument's dc:creator is who saved last; its initial creator is the
  // author. Office Open XML's dc:creator is the author.
  std::vector<std::string> authors = c.Values("initial-creator");
  if (authors.empty()) authors = c.Values("creator");
  if (!authors.empty()) p->authors = authors;
  const std::string description =
      c.First("description").empty() ? c.First("subject") : c.First("description");
  if (!description.empty()) p->description = description;
  for (const char* name : {"keywords", "keyword"}) {
    for (const std::string& value : c.Values(name)) p->keywords.push_back(value);
  }
  for (const char* name : {"created", "creation-date"}) {
    if (!c.First(name).empty()) p->created = c.First(name);
  }
  for (const char* name : {"modified", "date"}) {
    if (!c.First(name).empty()) p->modified = c.First(name);
  }
  for (const char* name : {"Application", "generator"}) {
    if (!c.First(name).empty()) p->application = c.First(name);
  }
}

bool IsPropertyPart(Flavor flavor, const std::string& name) {
  if (flavor == Flavor::kOpenDocument) return name == "meta.xml";
  return name == "docProps/core.xml" || name == "docProps/app.xml";
}

// Office Open XML and OpenDocument: one pass over the package.
bool ExtractPackage(const ExtractRequest& request, Flavor flavor) {
  ZipReader zip(PackageBudget(request.limits));
  if (!zip.Open(request.path, request.problem)) return false;
  PartTexts texts(request.limits.max_text_bytes);
  PackageProperties properties;
  std::map<std::string, bool> property_parts_read;
  bool saw_main = false;
  std::string fault;
  std::string name;
  while (zip.Next(&name)) {
    saw_main = saw_main || name == MainPart(flavor);
    int64_t order = 0;
    if (IsPropertyPart(flavor, name) && !property_parts_read[name]) {
      // Read each property part once: a package repeating one must not
      // cost its size again and again.
      property_parts_read[name] = true;
      PropertyCollector collector = CoreCollector();
      if (ReadPropertyPart(zip, collector)) ReadPackageProperties(collector, &properties);
    } else if (TextPartOrder(flavor, name, &order) && !texts.full() && !zip.exhausted()) {
      TextSink sink(texts.remaining());
      TextCollector collector(RulesOf(flavor), &sink);
      std::string error;
      // A part cut by the budget ends early; that is the budget, not a fault.
      if (!ParseMarkup(Markup::kXml, FromEntry(zip), collector, &error) && !zip.exhausted() &&
          fault.empty()) {
        fault = name + ": " + error;
      }
      texts.Add(order, sink);
    }
  }
  if (fault.empty() && !zip.error().empty()) fault = zip.error();
  properties.WriteTo(request.out);
  std::string text = texts.Join();
  if (!text.empty()) request.out["KALOMDTextContent"] = std::move(text);
  if (!fault.empty()) return Fail(request.problem, fault);
  if (!saw_main) {
    return Fail(request.problem, std::string("no ") + MainPart(flavor) + " in package");
  }
  return true;
}

}  // namespace

bool ExtractOffice(const ExtractRequest& request) {
  return ExtractPackage(request, FlavorOf(request.extension));
}

}  // namespace extract
}  // namespace orvex
