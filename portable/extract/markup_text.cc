#include "markup_text.h"

namespace orvex {
namespace extract {
namespace {

// A property element is short; one that is not is cut here.
constexpr size_t kMaxPropertyBytes = 16 * 1024;
constexpr size_t kMaxPropertyValues = 64;
constexpr size_t kMaxTitleBytes = 4 * 1024;

}  // namespace

const TextRules& HtmlRules() {
  static const TextRules* const rules = new TextRules{
      /*text_elements=*/{},
      /*skip_elements=*/{"head", "script", "style", "noscript", "template", "svg"},
      /*break_elements=*/{"p",          "div",     "br",     "li",     "tr",         "h1",
                          "h2",         "h3",      "h4",     "h5",     "h6",         "table",
                          "ul",         "ol",      "dl",     "dd",     "dt",         "section",
                          "article",    "aside",   "header", "footer", "nav",        "main",
                          "blockquote", "pre",     "hr",     "figure", "figcaption", "address",
                          "form",       "caption", "title",  "body"},
      /*tab_elements=*/{"td", "th"},
      /*space_elements=*/{},
      /*title_element=*/"title"};
  return *rules;
}

void TextCollector::StartElement(std::string_view name, const Attributes& /*attributes*/) {
  if (rules_.skip_elements.count(name) != 0) ++skip_depth_;
  if (rules_.text_elements.count(name) != 0) ++text_depth_;
  if (!title_seen_ && !rules_.title_element.empty() && name == rules_.title_element) {
    in_title_ = true;
  }
  // A block starts a line as well as ending one: in "<i>a<div>b" the div
  // opens inside the unclosed i, and "a" and "b" are still two lines.
  if (skip_depth_ == 0 && rules_.break_elements.count(name) != 0) sink_->Break();
}

void TextCollector::EndElement(std::string_view name) {
  if (in_title_ && name == rules_.title_element) {
    in_title_ = false;
    title_seen_ = true;
  }
  if (rules_.skip_elements.count(name) != 0 && skip_depth_ > 0) {
    --skip_depth_;
    return;
  }
  if (rules_.text_elements.count(name) != 0 && text_depth_ > 0) --text_depth_;
  if (skip_depth_ > 0) return;
  if (rules_.break_elements.count(name) != 0) {
    sink_->Break();
  } else if (rules_.tab_elements.count(name) != 0) {
    sink_->Tab();
  } else if (rules_.space_elements.count(name) != 0) {
    sink_->AppendCollapsed(" ");
  }
}

void TextCollector::Characters(std::string_view text) {
  if (in_title_) {
    if (title_.size() < kMaxTitleBytes) title_.append(text.substr(0, kMaxTitleBytes));
    return;
  }
  if (skip_depth_ > 0) return;
  if (!rules_.text_elements.empty() && text_depth_ == 0) return;
  sink_->AppendCollapsed(text);
}

bool TextCollector::Done() const {
  return sink_->full() && (rules_.title_element.empty() || title_seen_);
}

void PropertyCollector::StartElement(std::string_view name, const Attributes& attributes) {
  if (on_element) on_element(name, attributes);
  if (depth_ > 0) {
    ++depth_;  // an element inside a property: its text belongs to the property
    return;
  }
  if (names_.count(name) != 0) {
    depth_ = 1;
    current_name_.assign(name);
    current_.clear();
  }
}

void PropertyCollector::EndElement(std::string_view /*name*/) {
  if (depth_ == 0 || --depth_ > 0) return;
  std::vector<std::string>& values = values_[current_name_];
  std::string clean = CleanValue(current_);
  if (!clean.empty() && values.size() < kMaxPropertyValues) values.push_back(std::move(clean));
}

void PropertyCollector::Characters(std::string_view text) {
  if (depth_ == 0 || current_.size() >= kMaxPropertyBytes) return;
  current_.append(text.substr(0, kMaxPropertyBytes - current_.size()));
}

std::vector<std::string> PropertyCollector::Values(std::string_view name) const {
  const auto it = values_.find(name);
  return it == values_.end() ? std::vector<std::string>() : it->second;
}

std::string PropertyCollector::First(std::string_view name) const {
  const auto it = values_.find(name);
  return it == values_.end() || it->second.empty() ? std::string() : it->second.front();
}

}  // namespace extract
}  // namespace orvex
