#include "orvex/policy/file_type.h"

#include <algorithm>
#include <iterator>
#include <string_view>

#include "orvex/foundation/util.h"

namespace orvex {
namespace fileindex {
namespace {

struct ExtensionType {
  std::string_view extension;  // lower case, without the dot
  FileType type;
};

// The one table of known extensions, sorted by extension (byte order) so
// that a lookup is a binary search; the order is checked at compile time.
constexpr ExtensionType kExtensionTypes[] = {
    {"3fr", kFileTypeImage},     {"3g2", kFileTypeVideo},         {"3gp", kFileTypeVideo},
    {"aac", kFileTypeAudio},     {"ac3", kFileTypeAudio},         {"aif", kFileTypeAudio},
    {"aifc", kFileTypeAudio},    {"aiff", kFileTypeAudio},        {"alac", kFileTypeAudio},
    {"amr", kFileTypeAudio},     {"ape", kFileTypeAudio},         {"arw", kFileTypeImage},
    {"asf", kFileTypeVideo},     {"avi", kFileTypeVideo},         {"avif", kFileTypeImage},
    {"bmp", kFileTypeImage},     {"cr2", kFileTypeImage},         {"cr3", kFileTypeImage},
    {"crw", kFileTypeImage},     {"csv", kFileTypeDocument},      {"dcr", kFileTypeImage},
    {"dff", kFileTypeAudio},     {"divx", kFileTypeVideo},        {"dng", kFileTypeImage},
    {"doc", kFileTypeDocument},  {"docm", kFileTypeDocument},     {"docx", kFileTypeDocument},
    {"dot", kFileTypeDocument},  {"dotx", kFileTypeDocument},     {"dsf", kFileTypeAudio},
    {"dv", kFileTypeVideo},      {"epub", kFileTypeDocument},     {"erf", kFileTypeImage},
    {"f4v", kFileTypeVideo},     {"flac", kFileTypeAudio},        {"flv", kFileTypeVideo},
    {"gif", kFileTypeImage},     {"heic", kFileTypeImage},        {"heif", kFileTypeImage},
    {"htm", kFileTypeDocument},  {"html", kFileTypeDocument},     {"iiq", kFileTypeImage},
    {"jpe", kFileTypeImage},     {"jpeg", kFileTypeImage},        {"jpg", kFileTypeImage},
    {"json", kFileTypeDocument}, {"kdc", kFileTypeImage},         {"m2ts", kFileTypeVideo},
    {"m2v", kFileTypeVideo},     {"m4a", kFileTypeAudio},         {"m4b", kFileTypeAudio},
    {"m4v", kFileTypeVideo},     {"markdown", kFileTypeDocument}, {"md", kFileTypeDocument},
    {"mef", kFileTypeImage},     {"mka", kFileTypeAudio},         {"mkv", kFileTypeVideo},
    {"mobi", kFileTypeDocument}, {"mos", kFileTypeImage},         {"mov", kFileTypeVideo},
    {"mp2", kFileTypeAudio},     {"mp3", kFileTypeAudio},         {"mp4", kFileTypeVideo},
    {"mpc", kFileTypeAudio},     {"mpe", kFileTypeVideo},         {"mpeg", kFileTypeVideo},
    {"mpg", kFileTypeVideo},     {"mrw", kFileTypeImage},         {"mts", kFileTypeVideo},
    {"nef", kFileTypeImage},     {"nrw", kFileTypeImage},         {"numbers", kFileTypeDocument},
    {"odp", kFileTypeDocument},  {"ods", kFileTypeDocument},      {"odt", kFileTypeDocument},
    {"oga", kFileTypeAudio},     {"ogg", kFileTypeAudio},         {"ogv", kFileTypeVideo},
    {"opus", kFileTypeAudio},    {"orf", kFileTypeImage},         {"otp", kFileTypeDocument},
    {"ots", kFileTypeDocument},  {"ott", kFileTypeDocument},      {"pages", kFileTypeDocument},
    {"pdf", kFileTypeDocument},  {"pef", kFileTypeImage},         {"png", kFileTypeImage},
    {"pot", kFileTypeDocument},  {"potx", kFileTypeDocument},     {"pps", kFileTypeDocument},
    {"ppsx", kFileTypeDocument}, {"ppt", kFileTypeDocument},      {"pptm", kFileTypeDocument},
    {"pptx", kFileTypeDocument}, {"raf", kFileTypeImage},         {"raw", kFileTypeImage},
    {"rm", kFileTypeVideo},      {"rmvb", kFileTypeVideo},        {"rst", kFileTypeDocument},
    {"rtf", kFileTypeDocument},  {"rw2", kFileTypeImage},         {"sr2", kFileTypeImage},
    {"srf", kFileTypeImage},     {"srw", kFileTypeImage},         {"svg", kFileTypeImage},
    {"tex", kFileTypeDocument},  {"tif", kFileTypeImage},         {"tiff", kFileTypeImage},
    {"ts", kFileTypeVideo},      {"tsv", kFileTypeDocument},      {"txt", kFileTypeDocument},
    {"vob", kFileTypeVideo},     {"wav", kFileTypeAudio},         {"webm", kFileTypeVideo},
    {"webp", kFileTypeImage},    {"wma", kFileTypeAudio},         {"wmv", kFileTypeVideo},
    {"wv", kFileTypeAudio},      {"x3f", kFileTypeImage},         {"xhtml", kFileTypeDocument},
    {"xls", kFileTypeDocument},  {"xlsm", kFileTypeDocument},     {"xlsx", kFileTypeDocument},
    {"xlt", kFileTypeDocument},  {"xltx", kFileTypeDocument},     {"xml", kFileTypeDocument},
};

constexpr bool IsStrictlySorted() {
  for (size_t i = 1; i < std::size(kExtensionTypes); ++i) {
    if (!(kExtensionTypes[i - 1].extension < kExtensionTypes[i].extension)) return false;
  }
  return true;
}
static_assert(IsStrictlySorted(), "kExtensionTypes must be sorted and free of duplicates");

}  // namespace

FileType GetFileTypeByExtension(const std::string& lower_extension) {
  const std::string_view wanted(lower_extension);
  const ExtensionType* end = std::end(kExtensionTypes);
  const ExtensionType* found = std::lower_bound(
      std::begin(kExtensionTypes), end, wanted,
      [](const ExtensionType& entry, std::string_view key) { return entry.extension < key; });
  if (found == end || found->extension != wanted) return kFileTypeOther;
  return found->type;
}

FileType GetFileTypeByFullPath(const std::string& full_path) {
  return GetFileTypeByExtension(GetFileExtension(full_path, /*lower=*/true));
}

}  // namespace fileindex
}  // namespace orvex
