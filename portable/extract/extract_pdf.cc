// PDF with Poppler: the document information dictionary and the text of the
// pages in order, page by page until the text cap. Poppler reads the file
// through its own stream, on demand, not whole.
#include <poppler/cpp/poppler-document.h>
#include <poppler/cpp/poppler-global.h>
#include <poppler/cpp/poppler-page.h>

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "extract_util.h"
#include "extractors.h"

namespace orvex {
namespace extract {
namespace {

// Poppler reports every damaged object on stderr by default.
void Silent(const std::string& /*message*/, void* /*closure*/) {}

std::string Utf8(const poppler::ustring& text) {
  const poppler::byte_array bytes = text.to_utf8();
  return std::string(bytes.begin(), bytes.end());
}

void ReadInfo(const poppler::document& document, Json::Value& out) {
  SetText(out, "KALOMDTitle", Utf8(document.info_key("Title")));
  SetText(out, "KALOMDAuthors", Utf8(document.info_key("Author")));
  SetText(out, "KALOMDDescription", Utf8(document.info_key("Subject")));
  SetText(out, "KALOMDKeywords", Utf8(document.info_key("Keywords")));
  // The application that made the document; the PDF writer when none says.
  std::string creator = Utf8(document.info_key("Creator"));
  if (CleanValue(creator).empty()) creator = Utf8(document.info_key("Producer"));
  SetText(out, "KALOMDCreator", creator);
  // Poppler answers -1 for a missing or unreadable date.
  const time_t created = document.info_date_t("CreationDate");
  if (created > 0) SetInt(out, "KALOMDContentCreationDate", created);
  const time_t modified = document.info_date_t("ModDate");
  if (modified > 0) SetInt(out, "KALOMDContentModificationDate", modified);
}

void ReadText(const poppler::document& document, size_t max_bytes, Json::Value& out) {
  TextSink sink(max_bytes);
  const int pages = document.pages();
  for (int i = 0; i < pages && !sink.full(); ++i) {
    const std::unique_ptr<poppler::page> page(document.create_page(i));
    if (!page) continue;
    sink.Append(Utf8(page->text()));
    sink.Break();
  }
  std::string text = sink.Take();
  if (!text.empty()) out["KALOMDTextContent"] = std::move(text);
}

}  // namespace

bool ExtractPdf(const ExtractRequest& request) {
  static std::once_flag quiet;
  std::call_once(quiet, [] { poppler::set_debug_error_function(Silent, nullptr); });
  const std::unique_ptr<poppler::document> document(
      poppler::document::load_from_file(request.path));
  if (!document) return Fail(request.problem, "poppler: not a readable PDF");
  // A document locked with a user password shows neither its text nor its
  // information; it is a sound PDF all the same.
  if (document->is_locked()) return true;
  ReadInfo(*document, request.out);
  ReadText(*document, request.limits.max_text_bytes, request.out);
  return true;
}

}  // namespace extract
}  // namespace orvex
