// extract_bench: what content extraction costs where files are large or
// hostile. Prints, each with its target and PASS or FAIL, measured in this
// run on files written to a temporary directory:
//  - a docx zip bomb of 1 GiB of markup without text: the time and the
//    peak memory growth until the package budget (32 bytes of markup per
//    byte of cap, and 4 MiB) stops it;
//  - a 256 MiB plain text file: the time to fill a 1 MiB text cap (reading
//    stops at the cap, so the size of the file must not matter) against the
//    time on a 2 MiB file;
//  - the same for a docx whose document.xml inflates to 256 MiB;
//  - plain text conversion throughput (Windows-1252 to UTF-8) with the cap
//    above the file's size.
// Usage: extract_bench
#include <archive.h>
#include <archive_entry.h>
#include <stdlib.h>
#include <sys/resource.h>

#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <functional>
#include <stdexcept>
#include <string>

#include "bench_timing.h"
#include "content_extractor.h"

namespace {

using orvex::bench::Fastest;
using orvex::bench::Report;
using orvex::bench::SecondsOf;
using orvex::extract::ExtractLimits;
using orvex::extract::ExtractMetadata;

constexpr int64_t kMiB = int64_t{1} << 20;

class BenchDir {
 public:
  BenchDir() {
    char pattern[] = "/tmp/orvex-extract-bench-XXXXXX";
    if (::mkdtemp(pattern) == nullptr) throw std::runtime_error("mkdtemp failed");
    path_ = pattern;
  }
  ~BenchDir() { std::filesystem::remove_all(path_); }
  std::string Join(const std::string& name) const { return path_ + "/" + name; }

 private:
  std::string path_;
};

// Writes `bytes` of unit repeated (whole units) to out.
void Repeat(const std::string& unit, int64_t bytes,
            const std::function<void(const std::string&)>& out) {
  std::string block;
  while (block.size() < 64 * 1024) block += unit;
  int64_t left = bytes / static_cast<int64_t>(unit.size());
  const int64_t per_block = static_cast<int64_t>(block.size() / unit.size());
  for (; left >= per_block; left -= per_block) out(block);
  for (; left > 0; --left) out(unit);
}

void WriteText(const std::string& path, const std::string& unit, int64_t bytes) {
  std::ofstream file(path, std::ios::binary);
  Repeat(unit, bytes, [&](const std::string& s) { file << s; });
}

// A docx whose word/document.xml is head, `bytes` of unit, and its end.
void WriteDocx(const std::string& path, const std::string& unit, int64_t bytes) {
  const std::string head =
      "<w:document xmlns:w=\"http://schemas.openxmlformats.org/wordprocessingml/2006/main\">"
      "<w:body>";
  const std::string tail = "</w:body></w:document>";
  const int64_t body =
      bytes / static_cast<int64_t>(unit.size()) * static_cast<int64_t>(unit.size());
  struct archive* zip = archive_write_new();
  archive_write_set_format_zip(zip);
  archive_write_open_filename(zip, path.c_str());
  struct archive_entry* entry = archive_entry_new();
  archive_entry_set_pathname(entry, "word/document.xml");
  archive_entry_set_filetype(entry, AE_IFREG);
  archive_entry_set_perm(entry, 0644);
  archive_entry_set_size(entry, static_cast<int64_t>(head.size() + tail.size()) + body);
  archive_write_header(zip, entry);
  const auto write = [&](const std::string& s) { archive_write_data(zip, s.data(), s.size()); };
  write(head);
  Repeat(unit, body, write);
  write(tail);
  archive_entry_free(entry);
  archive_write_close(zip);
  archive_write_free(zip);
}

// Seconds to extract path with the cap, the fastest of three runs.
double ExtractSeconds(const std::string& path, size_t cap) {
  return Fastest([&] {
    ExtractLimits limits;
    limits.max_text_bytes = cap;
    return SecondsOf([&] {
      Json::Value out;
      std::string problem;
      if (!ExtractMetadata(path, limits, out, &problem))
        std::fprintf(stderr, "%s\n", problem.c_str());
    });
  });
}

int64_t PeakKiB() {
  struct rusage usage = {};
  ::getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss;
}

}  // namespace

int main() {
  BenchDir dir;
  bool pass = true;
  const std::string sentence = "The quick brown fox jumps over the lazy dog. ";

  // First, while the process is small: its peak memory is what the bomb
  // costs.
  WriteDocx(dir.Join("bomb.docx"), "<w:p><w:r><w:rPr><w:b/></w:rPr></w:r></w:p>", 1024 * kMiB);
  const int64_t before = PeakKiB();
  const double bomb = ExtractSeconds(dir.Join("bomb.docx"), 1 << 20);
  pass &= Report("docx bomb of 1 GiB markup, time", bomb, "s", 2.0);
  pass &= Report("docx bomb of 1 GiB markup, peak memory growth",
                 static_cast<double>(PeakKiB() - before) / 1024, " MiB", 64);

  WriteText(dir.Join("small.txt"), sentence, 2 * kMiB);
  WriteText(dir.Join("big.txt"), sentence, 256 * kMiB);
  const double small_text = ExtractSeconds(dir.Join("small.txt"), 1 << 20);
  const double big_text = ExtractSeconds(dir.Join("big.txt"), 1 << 20);
  std::printf("text to a 1 MiB cap: 2 MiB file %.4fs, 256 MiB file %.4fs\n", small_text, big_text);
  pass &= Report("text, 256 MiB file against 2 MiB file", big_text / small_text, "x", 2.0);

  const std::string paragraph = "<w:p><w:r><w:t>" + sentence + "</w:t></w:r></w:p>";
  WriteDocx(dir.Join("small.docx"), paragraph, 2 * kMiB);
  WriteDocx(dir.Join("big.docx"), paragraph, 256 * kMiB);
  const double small_docx = ExtractSeconds(dir.Join("small.docx"), 1 << 20);
  const double big_docx = ExtractSeconds(dir.Join("big.docx"), 1 << 20);
  std::printf("docx to a 1 MiB cap: 2 MiB part %.4fs, 256 MiB part %.4fs\n", small_docx, big_docx);
  pass &= Report("docx, 256 MiB part against 2 MiB part", big_docx / small_docx, "x", 2.0);

  WriteText(dir.Join("latin1.txt"),
            "Gr\xF6\xDF"
            "e, Stra\xDF"
            "e, caf\xE9 cr\xE8me. ",
            64 * kMiB);
  const double convert = ExtractSeconds(dir.Join("latin1.txt"), size_t{128} << 20);
  std::printf("Windows-1252 text converted: %.0f MiB/s\n", 64 / convert);
  pass &= Report("64 MiB of Windows-1252 text converted, time", convert, "s", 2.0);
  return pass ? 0 : 1;
}
