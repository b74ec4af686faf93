// Plain text: the encoding is taken from a byte-order mark, else guessed by
// uchardet from the first block, and the file is converted to UTF-8 with ICU
// block by block, stopping as soon as the text cap is reached.
#include <uchardet/uchardet.h>
#include <unicode/ucnv.h>

#include <cctype>
#include <cerrno>
#include <cstring>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "extract_util.h"
#include "extractors.h"

namespace orvex {
namespace extract {
namespace {

constexpr size_t kBlock = 64 * 1024;

struct Encoding {
  std::string name;  // an ICU converter name; empty: not text
  size_t bom = 0;    // bytes of byte-order mark to skip
};

bool StartsWith(std::string_view data, std::string_view prefix) {
  return data.substr(0, prefix.size()) == prefix;
}

std::string GuessCharset(std::string_view block) {
  const std::unique_ptr<struct uchardet, void (*)(uchardet_t)> detector(uchardet_new(),
                                                                        uchardet_delete);
  if (!detector) return "";
  if (uchardet_handle_data(detector.get(), block.data(), block.size()) != 0) return "";
  uchardet_data_end(detector.get());
  return uchardet_get_charset(detector.get());
}

// The encoding of a file whose first block is given.
Encoding DetectEncoding(std::string_view block) {
  // Longest marks first: the UTF-32LE mark begins with the UTF-16LE one.
  if (StartsWith(block, std::string_view("\xFF\xFE\0\0", 4))) return {"UTF-32LE", 4};
  if (StartsWith(block, std::string_view("\0\0\xFE\xFF", 4))) return {"UTF-32BE", 4};
  if (StartsWith(block, "\xEF\xBB\xBF")) return {"UTF-8", 3};
  if (StartsWith(block, "\xFF\xFE")) return {"UTF-16LE", 2};
  if (StartsWith(block, "\xFE\xFF")) return {"UTF-16BE", 2};
  std::string guess = GuessCharset(block);
  for (char& c : guess) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
  const bool has_nul = block.find('\0') != std::string_view::npos;
  if (guess.empty()) {
    // Without a guess, bytes with NULs in them are not text; anything else
    // is read as UTF-8, with any stray bytes replaced.
    return {has_nul ? "" : "UTF-8", 0};
  }
  if (has_nul && guess.rfind("UTF-16", 0) != 0 && guess.rfind("UTF-32", 0) != 0) return {"", 0};
  // Pure ASCII is UTF-8; text called Latin-1 is in practice Windows-1252,
  // whose extra letters sit where Latin-1 has unused control codes.
  if (guess == "ASCII") return {"UTF-8", 0};
  if (guess == "ISO-8859-1") return {"windows-1252", 0};
  return {guess, 0};
}

using Converter = std::unique_ptr<UConverter, void (*)(UConverter*)>;

Converter OpenConverter(const std::string& name) {
  UErrorCode status = U_ZERO_ERROR;
  UConverter* converter = ucnv_open(name.c_str(), &status);
  if (U_FAILURE(status)) converter = nullptr;
  return Converter(converter, ucnv_close);
}

// Streams the file's bytes through ICU into the sink.
class Transcoder {
 public:
  Transcoder(UConverter* from, UConverter* to) : from_(from), to_(to) {}

  // Converts one block (flush on the last); false on a converter error.
  bool Feed(std::string_view block, bool flush, TextSink& sink) {
    const char* source = block.data();
    const char* const source_end = source + block.size();
    for (;;) {
      char* target = out_;
      UErrorCode status = U_ZERO_ERROR;
      ucnv_convertEx(to_, from_, &target, out_ + sizeof(out_), &source, source_end, pivot_,
                     &pivot_source_, &pivot_target_, pivot_ + kPivot, /*reset=*/first_, flush,
                     &status);
      first_ = false;
      sink.Append(std::string_view(out_, static_cast<size_t>(target - out_)));
      if (status == U_BUFFER_OVERFLOW_ERROR && !sink.full()) continue;
      return status == U_BUFFER_OVERFLOW_ERROR || U_SUCCESS(status);
    }
  }

 private:
  static constexpr size_t kPivot = 1024;
  UConverter* from_;
  UConverter* to_;
  UChar pivot_[kPivot];
  UChar* pivot_source_ = pivot_;
  UChar* pivot_target_ = pivot_;
  char out_[16 * 1024];
  bool first_ = true;
};

// Converts block, then the rest of file block by block, into sink until the
// file ends or the sink is full; false with *problem on a read or
// conversion error.
bool Transcode(const ExtractRequest& request, const std::string& encoding, InputFile& file,
               std::vector<char>& buffer, std::string_view block, Transcoder& transcoder,
               TextSink& sink) {
  for (;;) {
    if (!transcoder.Feed(block, /*flush=*/false, sink)) {
      return Fail(request.problem, "ICU: cannot convert from " + encoding);
    }
    if (sink.full()) return true;
    const ssize_t n = file.Read(buffer.data(), buffer.size());
    if (n < 0) return Fail(request.problem, "read " + request.path + ": " + std::strerror(errno));
    if (n == 0) {
      transcoder.Feed(std::string_view(), /*flush=*/true, sink);
      return true;
    }
    block = std::string_view(buffer.data(), static_cast<size_t>(n));
  }
}

}  // namespace

bool ExtractPlainText(const ExtractRequest& request) {
  InputFile file;
  if (!file.Open(request.path, request.problem)) return false;
  std::vector<char> buffer(kBlock);
  const ssize_t n = file.Read(buffer.data(), buffer.size());
  if (n < 0) return Fail(request.problem, "read " + request.path + ": " + std::strerror(errno));
  if (n == 0) return true;
  std::string_view block(buffer.data(), static_cast<size_t>(n));
  const Encoding encoding = DetectEncoding(block);
  if (encoding.name.empty()) return true;  // binary content under a text name
  Converter from = OpenConverter(encoding.name);
  if (!from) from = OpenConverter("UTF-8");
  Converter to = OpenConverter("UTF-8");
  if (!from || !to) return Fail(request.problem, "ICU: no converter for " + encoding.name);
  // Substitute rather than stop at bytes that are not in the encoding: a
  // stray byte should cost one character, not the rest of the file.
  UErrorCode status = U_ZERO_ERROR;
  ucnv_setToUCallBack(from.get(), UCNV_TO_U_CALLBACK_SUBSTITUTE, nullptr, nullptr, nullptr,
                      &status);
  block.remove_prefix(encoding.bom);
  TextSink sink(request.limits.max_text_bytes);
  const auto transcoder = std::make_unique<Transcoder>(from.get(), to.get());
  const bool ok = Transcode(request, encoding.name, file, buffer, block, *transcoder, sink);
  std::string text = sink.Take();
  if (!text.empty()) request.out["KALOMDTextContent"] = std::move(text);
  return ok;
}

}  // namespace extract
}  // namespace orvex
