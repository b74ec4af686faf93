// The metadata and text of one file, read by the parsing libraries: tags of
// songs, camera settings of photos, durations and codecs of videos, text and
// document properties of PDFs, office documents, web pages and plain texts.
// The properties are those of the file index schema (KALOMD...), with its
// types: text as strings, dates as integer seconds since the epoch, bit
// rates in bits per second, KALOMDDurationSecond as a double.
//
//   plain text   KALOMDTextContent (any common encoding, converted to UTF-8)
//   PDF          KALOMDTitle, KALOMDAuthors, KALOMDDescription (subject),
//                KALOMDKeywords, KALOMDCreator (the application),
//                KALOMDContentCreationDate, KALOMDContentModificationDate,
//                KALOMDTextContent
//   office, EPUB the same from the package's core properties, and
//                KALOMDIdentifier (EPUB); text of the body in reading order
//   HTML         KALOMDTitle, KALOMDTextContent
//   audio        KALOMDTitle, KALOMDAuthors (artist), KALOMDAlbum,
//                KALOMDComposer, KALOMDMusicalGenre, KALOMDComment,
//                KALOMDRecordingYear, KALOMDAudioTrackNumber,
//                KALOMDDurationSecond, KALOMDAudioBitRate, KALOMDTotalBitRate,
//                KALOMDAudioSampleRate, KALOMDAudioChannelCount, KALOMDCodecs,
//                KALOMDMediaTypes ("Sound")
//   photos       KALOMDAcquisitionMake, KALOMDAcquisitionModel,
//                KALOMDExposureTimeString ("1/250"), KALOMDAperture (the
//                f-number, "2.8"), KALOMDISOSpeed, KALOMDResolutionWidthDPI,
//                KALOMDResolutionHeightDPI, KALOMDContentCreationDate (taken),
//                KALOMDAuthors, KALOMDDescription, KALOMDCreator (software),
//                KALOMDMediaTypes ("Image")
//   video        KALOMDDurationSecond, KALOMDTotalBitRate, KALOMDVideoBitRate,
//                KALOMDAudioBitRate, KALOMDAudioSampleRate,
//                KALOMDAudioChannelCount, KALOMDCodecs ("h264 aac"), the
//                container's title, artist, album, comment, genre, encoder
//                and creation time, KALOMDMediaTypes ("Video Sound")
//
// Facts the schema's table has no property for carry names of the same
// family and the schema's default type, string: KALOMDPixelWidth and
// KALOMDPixelHeight (photos, video), KALOMDOrientation (EXIF 1 to 8),
// KALOMDLensModel, KALOMDFocalLength (millimetres), KALOMDLatitude and
// KALOMDLongitude (signed degrees), KALOMDAltitude (metres).
//
// The parsers read untrusted files: a corrupt or hostile file may crash, hang
// or exhaust memory in here. Only the extraction worker (kalocontentextractd
// and its one-shot mode) links this code; the library never runs it in its
// own process. Thread-safe: no shared state between calls.
#ifndef ORVEX_PORTABLE_EXTRACT_CONTENT_EXTRACTOR_H_
#define ORVEX_PORTABLE_EXTRACT_CONTENT_EXTRACTOR_H_

#include <json/json.h>

#include <cstddef>
#include <string>

namespace orvex {
namespace extract {

struct ExtractLimits {
  // Most bytes of UTF-8 text kept in KALOMDTextContent, cut at a character
  // boundary.
  size_t max_text_bytes = 1 << 20;
};

// Adds to out the metadata and text properties of the regular file at path,
// chosen by its type (extension, then content where it matters). Members of
// out that the file does not provide are left alone. Returns true when the
// file was read as its type says (or its type has nothing to extract);
// false with *problem set (a short reason naming the parser) when the file is
// corrupt or unreadable: out then holds whatever was read before the fault.
// Never throws.
bool ExtractMetadata(const std::string& path, const ExtractLimits& limits, Json::Value& out,
                     std::string* problem);

}  // namespace extract
}  // namespace orvex

#endif  // ORVEX_PORTABLE_EXTRACT_CONTENT_EXTRACTOR_H_
