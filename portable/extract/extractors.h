// The extractors of each family of file types, one file each, that
// ExtractMetadata chooses among by extension. Each has the contract of
// ExtractMetadata: it adds what it reads to out, returns true when the file
// was read as its type says, false with *problem (naming the parser) when it
// is corrupt or unreadable. They may throw (the libraries do); the dispatch
// catches. Thread-safe: no shared state beyond the libraries' one-time
// settings.
#ifndef ORVEX_PORTABLE_EXTRACT_EXTRACTORS_H_
#define ORVEX_PORTABLE_EXTRACT_EXTRACTORS_H_

#include <json/json.h>

#include <string>

#include "content_extractor.h"

namespace orvex {
namespace extract {

// What one extractor is given: the file, its lower-case extension (which
// some families use to choose a flavour), the limits and where to write.
struct ExtractRequest {
  const std::string& path;
  const std::string& extension;
  const ExtractLimits& limits;
  Json::Value& out;
  std::string* problem;
};

using ExtractorFn = bool (*)(const ExtractRequest& request);

// Plain text in any common encoding: KALOMDTextContent.
bool ExtractPlainText(const ExtractRequest& request);
// PDF: document information and text.
bool ExtractPdf(const ExtractRequest& request);
// Office Open XML and OpenDocument: document properties and text.
bool ExtractOffice(const ExtractRequest& request);
// EPUB: the book's properties and its text in reading order.
bool ExtractEpub(const ExtractRequest& request);
// HTML: title and text.
bool ExtractHtml(const ExtractRequest& request);
// Audio: tags and stream properties.
bool ExtractAudio(const ExtractRequest& request);
// Photos: EXIF camera settings, date taken, dimensions, GPS.
bool ExtractImage(const ExtractRequest& request);
// Video (and other containers): duration, codecs, bit rates, resolution.
bool ExtractVideo(const ExtractRequest& request);

}  // namespace extract
}  // namespace orvex

#endif  // ORVEX_PORTABLE_EXTRACT_EXTRACTORS_H_
