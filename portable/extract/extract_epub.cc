// EPUB: a zip package whose META-INF/container.xml names the package
// document, which gives the book's properties and the reading order (the
// spine) of its XHTML content documents. Two passes over the archive: the
// small parts first, then the content documents, streamed like every other
// package part.
#include <cctype>
#include <cstdlib>
#include <map>
#include <string>
#include <string_view>
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

// A chapter's title is not the book's.
const TextRules& ContentRules() {
  static const TextRules rules = [] {
    TextRules html = HtmlRules();
    html.title_element.clear();
    return html;
  }();
  return rules;
}

bool EndsWith(const std::string& s, const char* suffix) {
  const size_t n = std::char_traits<char>::length(suffix);
  return s.size() >= n && s.compare(s.size() - n, n, suffix) == 0;
}

std::string PercentDecode(std::string_view s) {
  std::string out;
  for (size_t i = 0; i < s.size(); ++i) {
    if (s[i] == '%' && i + 2 < s.size() && std::isxdigit(static_cast<unsigned char>(s[i + 1])) &&
        std::isxdigit(static_cast<unsigned char>(s[i + 2]))) {
      out += static_cast<char>(std::strtol(std::string(s.substr(i + 1, 2)).c_str(), nullptr, 16));
      i += 2;
    } else {
      out += s[i];
    }
  }
  return out;
}

// The archive path of href, a link relative to the directory base_dir
// ("" or ending in "/").
std::string ResolvePath(const std::string& base_dir, std::string_view href) {
  href = href.substr(0, href.find_first_of("#?"));
  std::string joined =
      href.substr(0, 1) == "/" ? PercentDecode(href.substr(1)) : base_dir + PercentDecode(href);
  std::vector<std::string> parts;
  size_t start = 0;
  while (start <= joined.size()) {
    size_t slash = joined.find('/', start);
    if (slash == std::string::npos) slash = joined.size();
    const std::string part = joined.substr(start, slash - start);
    if (part == "..") {
      if (!parts.empty()) parts.pop_back();
    } else if (!part.empty() && part != ".") {
      parts.push_back(part);
    }
    start = slash + 1;
  }
  std::string path;
  for (const std::string& part : parts) path += (path.empty() ? "" : "/") + part;
  return path;
}

// What the EPUB's package document says: the book's properties and the
// reading order of its content documents (archive path to position).
struct EpubPackage {
  PackageProperties properties;
  std::map<std::string, int64_t> spine;
};

void ReadEpubPackageDocument(const std::string& opf_path, const std::string& opf,
                             EpubPackage* package) {
  std::map<std::string, std::string> manifest;  // id to href
  std::vector<std::string> spine_ids;
  PropertyCollector collector({"title", "creator", "description", "subject", "date", "identifier"});
  collector.on_element = [&](std::string_view name, const Attributes& attributes) {
    if (name == "item") {
      manifest.emplace(FindAttribute(attributes, "id"), FindAttribute(attributes, "href"));
    } else if (name == "itemref" && spine_ids.size() < 100000) {
      spine_ids.emplace_back(FindAttribute(attributes, "idref"));
    }
  };
  ParseMarkup(Markup::kXml, FromString(opf), collector, nullptr);
  PackageProperties& p = package->properties;
  p.title = collector.First("title");
  p.authors = collector.Values("creator");
  p.description = collector.First("description");
  p.keywords = collector.Values("subject");
  p.created = collector.First("date");
  p.identifier = collector.First("identifier");
  const size_t slash = opf_path.rfind('/');
  const std::string base_dir = slash == std::string::npos ? "" : opf_path.substr(0, slash + 1);
  for (size_t i = 0; i < spine_ids.size(); ++i) {
    const auto item = manifest.find(spine_ids[i]);
    if (item != manifest.end()) {
      package->spine.emplace(ResolvePath(base_dir, item->second), static_cast<int64_t>(i));
    }
  }
}

// First pass: META-INF/container.xml names the package document.
bool ReadEpubPackage(const ExtractRequest& request, EpubPackage* package) {
  ZipReader zip(PackageBudget(request.limits));
  if (!zip.Open(request.path, request.problem)) return false;
  std::string rootfile;
  std::map<std::string, std::string> package_documents;
  bool saw_container = false;
  std::string name;
  while (zip.Next(&name)) {
    if (name == "META-INF/container.xml" && !saw_container) {
      saw_container = true;
      PropertyCollector collector({});
      collector.on_element = [&](std::string_view element, const Attributes& attributes) {
        if (element == "rootfile" && rootfile.empty()) {
          rootfile.assign(FindAttribute(attributes, "full-path"));
        }
      };
      ReadPropertyPart(zip, collector);
    } else if (EndsWith(name, ".opf") && package_documents.size() < 4 &&
               package_documents.count(name) == 0) {
      std::string data;
      if (zip.ReadAll(kMaxPropertyPart, &data)) package_documents.emplace(name, std::move(data));
    }
  }
  if (!zip.error().empty()) return Fail(request.problem, zip.error());
  if (!saw_container) return Fail(request.problem, "no META-INF/container.xml in package");
  auto opf = package_documents.find(rootfile);
  if (opf == package_documents.end()) opf = package_documents.begin();
  if (opf != package_documents.end()) ReadEpubPackageDocument(opf->first, opf->second, package);
  return true;
}

}  // namespace

// Second pass: the content documents, in reading order (or, when the
// package names none, every XHTML document in archive order).
bool ExtractEpub(const ExtractRequest& request) {
  EpubPackage package;
  if (!ReadEpubPackage(request, &package)) return false;
  package.properties.WriteTo(request.out);
  ZipReader zip(PackageBudget(request.limits));
  if (!zip.Open(request.path, request.problem)) return false;
  PartTexts texts(request.limits.max_text_bytes);
  std::string name;
  int64_t index = 0;
  while (!texts.full() && !zip.exhausted() && zip.Next(&name)) {
    ++index;
    int64_t order = index;
    if (!package.spine.empty()) {
      const auto it = package.spine.find(name);
      if (it == package.spine.end()) continue;
      order = it->second;
    } else if (!EndsWith(name, ".xhtml") && !EndsWith(name, ".html") && !EndsWith(name, ".htm")) {
      continue;
    }
    TextSink sink(texts.remaining());
    TextCollector collector(ContentRules(), &sink);
    ParseMarkup(Markup::kHtml, FromEntry(zip), collector, nullptr);
    texts.Add(order, sink);
  }
  std::string text = texts.Join();
  if (!text.empty()) request.out["KALOMDTextContent"] = std::move(text);
  if (!zip.error().empty()) return Fail(request.problem, zip.error());
  return true;
}

}  // namespace extract
}  // namespace orvex
