#include "content_extractor.h"

#include <algorithm>
#include <cctype>
#include <exception>
#include <new>

#include "extractors.h"

namespace orvex {
namespace extract {
namespace {

struct Family {
  ExtractorFn extract;
  const char* const* extensions;  // ends with nullptr
};

// The extensions each extractor reads. Kept here rather than shared with the
// library's file-type table: this code runs only in the worker, and an
// extension listed here is one a real parser stands behind.
constexpr const char* kText[] = {"txt", "text", "log",  "csv",  "tsv",  "md",  "markdown", "rst",
                                 "ini", "conf", "cfg",  "json", "yaml", "yml", "toml",     "xml",
                                 "srt", "vtt",  "nfo",  "tex",  "c",    "h",   "cc",       "cpp",
                                 "hpp", "cxx",  "java", "js",   "ts",   "py",  "rb",       "go",
                                 "rs",  "php",  "pl",   "sh",   "sql",  "css", nullptr};
constexpr const char* kPdf[] = {"pdf", nullptr};
constexpr const char* kOffice[] = {"docx", "docm", "dotx", "dotm", "xlsx", "xlsm", "xltx", "xltm",
                                   "pptx", "pptm", "ppsx", "ppsm", "potx", "potm", "odt",  "ott",
                                   "ods",  "ots",  "odp",  "otp",  "odg",  nullptr};
constexpr const char* kEpub[] = {"epub", nullptr};
constexpr const char* kHtml[] = {"html", "htm", "xhtml", "shtml", nullptr};
constexpr const char* kAudio[] = {"mp3",  "m4a",  "m4b", "aac", "flac", "ogg",
                                  "oga",  "opus", "spx", "wav", "wma",  "aif",
                                  "aiff", "ape",  "mpc", "wv",  "tta",  nullptr};
constexpr const char* kImage[] = {"jpg", "jpeg", "jpe", "tif", "tiff", "png",  "webp",
                                  "dng", "cr2",  "crw", "nef", "nrw",  "arw",  "srf",
                                  "sr2", "orf",  "rw2", "raf", "pef",  "mrw",  "3fr",
                                  "erf", "psd",  "gif", "bmp", "jp2",  nullptr};
constexpr const char* kVideo[] = {"mp4", "m4v",  "mov", "qt",  "mkv",  "webm", "avi",
                                  "wmv", "asf",  "flv", "mpg", "mpeg", "m2v",  "vob",
                                  "ts",  "m2ts", "mts", "3gp", "3g2",  "ogv",  nullptr};

constexpr Family kFamilies[] = {
    {ExtractPlainText, kText}, {ExtractPdf, kPdf},     {ExtractOffice, kOffice},
    {ExtractEpub, kEpub},      {ExtractHtml, kHtml},   {ExtractAudio, kAudio},
    {ExtractImage, kImage},    {ExtractVideo, kVideo},
};

std::string LowerExtension(const std::string& path) {
  const size_t slash = path.rfind('/');
  const size_t dot = path.rfind('.');
  if (dot == std::string::npos || (slash != std::string::npos && dot < slash)) return "";
  std::string ext = path.substr(dot + 1);
  for (char& c : ext) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  return ext;
}

ExtractorFn FindExtractor(const std::string& ext) {
  for (const Family& family : kFamilies) {
    for (const char* const* e = family.extensions; *e != nullptr; ++e) {
      if (ext == *e) return family.extract;
    }
  }
  return nullptr;
}

}  // namespace

bool ExtractMetadata(const std::string& path, const ExtractLimits& limits, Json::Value& out,
                     std::string* problem) {
  const std::string ext = LowerExtension(path);
  const ExtractorFn extract = FindExtractor(ext);
  if (extract == nullptr) return true;
  if (out.isNull()) out = Json::Value(Json::objectValue);
  if (!out.isObject()) {
    if (problem != nullptr) *problem = "the output is not a JSON object";
    return false;
  }
  const ExtractRequest request{path, ext, limits, out, problem};
  try {
    return extract(request);
  } catch (const std::bad_alloc&) {
    if (problem != nullptr) *problem = "out of memory while parsing " + ext;
  } catch (const std::exception& e) {
    if (problem != nullptr) *problem = ext + " parser: " + e.what();
  } catch (...) {
    if (problem != nullptr) *problem = ext + " parser: unknown exception";
  }
  return false;
}

}  // namespace extract
}  // namespace orvex
