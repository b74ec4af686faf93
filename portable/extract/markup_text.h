// Markup handlers that turn documents into what the index keeps: the text of
// a body (TextCollector, driven by per-format rules) and the values of named
// elements (PropertyCollector, for property parts such as docProps/core.xml).
// One thread at a time per object.
#ifndef ORVEX_PORTABLE_EXTRACT_MARKUP_TEXT_H_
#define ORVEX_PORTABLE_EXTRACT_MARKUP_TEXT_H_

#include <functional>
#include <map>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "extract_util.h"
#include "markup_parser.h"

namespace orvex {
namespace extract {

// How one format lays out its text. All names are local names.
struct TextRules {
  // When not empty, only character data inside these elements is text
  // (w:t of Word); otherwise all character data is.
  std::set<std::string, std::less<>> text_elements;
  // Character data inside these is never text (script, style, head).
  std::set<std::string, std::less<>> skip_elements;
  // These start and end a line (paragraphs, line breaks).
  std::set<std::string, std::less<>> break_elements;
  std::set<std::string, std::less<>> tab_elements;
  std::set<std::string, std::less<>> space_elements;
  // The text of the first such element becomes the title (HTML's "title").
  std::string title_element;
};

// The rules of HTML and XHTML: block elements end lines, table cells are
// separated by tabs, the head, scripts and styles are not text, and the
// "title" element gives the title.
const TextRules& HtmlRules();

class TextCollector : public MarkupHandler {
 public:
  // Writes into sink, which must outlive the collector.
  TextCollector(const TextRules& rules, TextSink* sink) : rules_(rules), sink_(sink) {}

  void StartElement(std::string_view name, const Attributes& attributes) override;
  void EndElement(std::string_view name) override;
  void Characters(std::string_view text) override;
  bool Done() const override;

  const std::string& title() const { return title_; }

 private:
  const TextRules& rules_;
  TextSink* sink_;
  int text_depth_ = 0;
  int skip_depth_ = 0;
  bool in_title_ = false;
  bool title_seen_ = false;
  std::string title_;
};

class PropertyCollector : public MarkupHandler {
 public:
  // Collects the text of every element whose local name is in names.
  explicit PropertyCollector(std::set<std::string, std::less<>> names) : names_(std::move(names)) {}

  void StartElement(std::string_view name, const Attributes& attributes) override;
  void EndElement(std::string_view name) override;
  void Characters(std::string_view text) override;
  bool Done() const override { return false; }

  // Called for every element with its attributes (for manifests and the
  // like); optional.
  std::function<void(std::string_view, const Attributes&)> on_element;

  // The values of name in document order, cleaned; empty values left out.
  std::vector<std::string> Values(std::string_view name) const;
  // The first value of name, or "".
  std::string First(std::string_view name) const;

 private:
  std::set<std::string, std::less<>> names_;
  std::map<std::string, std::vector<std::string>, std::less<>> values_;
  std::string current_name_;
  std::string current_;
  int depth_ = 0;
};

}  // namespace extract
}  // namespace orvex

#endif  // ORVEX_PORTABLE_EXTRACT_MARKUP_TEXT_H_
