// HTML with libxml2's HTML parser, as lenient as a browser: the title and the
// text of the body, streamed from the file block by block until the text cap
// (the title comes first, in the head).
#include <cerrno>
#include <cstring>
#include <string>
#include <string_view>

#include "extract_util.h"
#include "extractors.h"
#include "markup_parser.h"
#include "markup_text.h"

namespace orvex {
namespace extract {

bool ExtractHtml(const ExtractRequest& request) {
  InputFile file;
  if (!file.Open(request.path, request.problem)) return false;
  TextSink sink(request.limits.max_text_bytes);
  TextCollector collector(HtmlRules(), &sink);
  int read_errno = 0;
  bool first = true;
  bool binary = false;
  const ByteSource source = [&](char* buf, size_t len) {
    const ssize_t n = file.Read(buf, len);
    if (n < 0) read_errno = errno;
    if (first && n > 0) {
      first = false;
      // Pages in UTF-16 or UTF-32 start with a byte-order mark; a page that
      // has NULs without one is some binary file under an HTML name.
      const std::string_view block(buf, static_cast<size_t>(n));
      const bool marked = block.rfind("\xFF\xFE", 0) == 0 || block.rfind("\xFE\xFF", 0) == 0 ||
                          block.rfind(std::string_view("\0\0\xFE\xFF", 4), 0) == 0;
      if (!marked && block.find('\0') != std::string_view::npos) {
        binary = true;
        return ssize_t{-1};
      }
    }
    return n;
  };
  std::string error;
  const bool ok = ParseMarkup(Markup::kHtml, source, collector, &error);
  SetText(request.out, "KALOMDTitle", collector.title());
  std::string text = sink.Take();
  if (!text.empty()) request.out["KALOMDTextContent"] = std::move(text);
  if (ok) return true;
  if (binary) error = "libxml2: binary content, not HTML";
  if (read_errno != 0) error = "read " + request.path + ": " + std::strerror(read_errno);
  return Fail(request.problem, error);
}

}  // namespace extract
}  // namespace orvex
