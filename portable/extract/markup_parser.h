// Streaming XML and HTML reading with libxml2's push parsers: the bytes come
// from a source block by block and the handler sees elements and text as
// they arrive, so a document is never held whole in memory and reading
// stops the moment the handler has enough. Entities are never expanded,
// nothing is fetched from the network. One thread at a time per handler.
#ifndef ORVEX_PORTABLE_EXTRACT_MARKUP_PARSER_H_
#define ORVEX_PORTABLE_EXTRACT_MARKUP_PARSER_H_

#include <sys/types.h>

#include <functional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace orvex {
namespace extract {

using Attributes = std::vector<std::pair<std::string_view, std::string_view>>;

class MarkupHandler {
 public:
  virtual ~MarkupHandler() = default;
  // name is the local name (no namespace prefix); HTML names are lower case.
  virtual void StartElement(std::string_view name, const Attributes& attributes) = 0;
  virtual void EndElement(std::string_view name) = 0;
  virtual void Characters(std::string_view text) = 0;
  // True once the handler wants nothing more: reading stops.
  virtual bool Done() const = 0;
};

// Fills buf with up to len bytes; returns how many, 0 at the end, -1 on error.
using ByteSource = std::function<ssize_t(char* buf, size_t len)>;

enum class Markup { kXml, kHtml };

// Reads the document from source into handler. Returns true when it was read
// to its end or until the handler was done; false with *error (libxml2's
// message, or "read error") otherwise. HTML is read leniently, as browsers
// do; XML stops at the first well-formedness error.
bool ParseMarkup(Markup kind, const ByteSource& source, MarkupHandler& handler, std::string* error);

// Returns the value of the attribute named name (local name), or "".
std::string_view FindAttribute(const Attributes& attributes, std::string_view name);

}  // namespace extract
}  // namespace orvex

#endif  // ORVEX_PORTABLE_EXTRACT_MARKUP_PARSER_H_
