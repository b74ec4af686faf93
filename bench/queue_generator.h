// QueueGenerator: writes realistic share event queues for the sample queue,
// the benchmarks and the tests. Lines look exactly as the notification daemon
// writes them ({"event": mask, "is_dir": bool, "path": ...} with "path_old"
// only on renames) and as the library writes its custom events (re-index and
// configuration change). The share is F files in D directories under a share
// root; files are created, written, touched, renamed, moved and deleted,
// directories are created, renamed and deleted, and a chosen fraction of the
// lines is malformed the ways a damaged queue is. Deterministic for a seed on
// every platform (its own random source, no std distributions). Header-only;
// one thread at a time.
#ifndef ORVEX_BENCH_QUEUE_GENERATOR_H_
#define ORVEX_BENCH_QUEUE_GENERATOR_H_

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <deque>
#include <ostream>
#include <string>
#include <vector>

namespace orvex {
namespace bench {

// The wire values of the event bits the generator writes.
constexpr uint32_t kMaskModify = 0x2;
constexpr uint32_t kMaskAttr = 0x4;
constexpr uint32_t kMaskCreate = 0x40;
constexpr uint32_t kMaskDelete = 0x80;
constexpr uint32_t kMaskRename = 0x100;
constexpr uint32_t kMaskReindex = 0x10000;
constexpr uint32_t kMaskUpdateCfg = 0x20000;

struct QueueShape {
  std::string share_root = "/volume1/photo";  // canonical, no trailing slash
  size_t files = 1000;
  size_t dirs = 50;          // at least 1
  double malformed = 0.01;   // fraction of lines that are malformed
  double dir_events = 0.01;  // fraction of events on directories, custom events included
  uint64_t seed = 1;
};

// What a generator wrote so far, by kind of line.
struct QueueCounts {
  size_t lines = 0;
  size_t malformed = 0;  // every one of them is skipped by the tree builder
  size_t creates = 0;    // file and directory creates
  size_t modifies = 0;
  size_t attrs = 0;
  size_t deletes = 0;  // file and directory deletes
  size_t renames = 0;  // file and directory renames, moves included
  size_t reindexes = 0;
  size_t configs = 0;
};

// JSON string literal of s: quotes, backslashes and control bytes escaped,
// other bytes (UTF-8 names) as they are, like the daemon's writer.
inline std::string JsonQuote(const std::string& s) {
  std::string out;
  out.reserve(s.size() + 2);
  out.push_back('"');
  for (unsigned char c : s) {
    if (c == '"' || c == '\\') {
      out.push_back('\\');
      out.push_back(static_cast<char>(c));
    } else if (c < 0x20) {
      char buf[8];
      std::snprintf(buf, sizeof(buf), "\\u%04x", c);
      out += buf;
    } else {
      out.push_back(static_cast<char>(c));
    }
  }
  out.push_back('"');
  return out;
}

// A line as the notification daemon writes it; path_old only when not empty.
inline std::string DaemonLine(uint32_t mask, bool is_dir, const std::string& path,
                              const std::string& path_old = std::string()) {
  std::string line = "{\"event\": " + std::to_string(mask) +
                     ", \"is_dir\": " + (is_dir ? "true" : "false") +
                     ", \"path\": " + JsonQuote(path);
  if (!path_old.empty()) line += ", \"path_old\": " + JsonQuote(path_old);
  line += "}";
  return line;
}

// A line as the library writes a custom event: compact, no "is_dir".
// data_json is JSON text ("null" or the file-type flags).
inline std::string CustomLine(uint32_t mask, const std::string& path,
                              const std::string& data_json = "null") {
  return "{\"event\":" + std::to_string(mask) + ",\"path\":" + JsonQuote(path) +
         ",\"path_old\":\"\",\"data\":" + data_json + "}";
}

// The file-type flags of a configuration change, as JSON text.
inline std::string FileTypeFlags(bool document, bool audio, bool video, bool photo) {
  auto b = [](bool v) { return v ? "true" : "false"; };
  return std::string("{\"document\":") + b(document) + ",\"audio\":" + b(audio) +
         ",\"video\":" + b(video) + ",\"photo\":" + b(photo) + "}";
}

class QueueGenerator {
 public:
  explicit QueueGenerator(const QueueShape& shape) : shape_(shape), state_(shape.seed) {
    if (shape_.dirs == 0) shape_.dirs = 1;
    MakeDirectories();
    MakeFiles();
  }

  // The next line, without its newline.
  std::string NextLine() {
    std::string line;
    if (!torn_tail_.empty()) {
      line.swap(torn_tail_);
    } else if (Chance(shape_.malformed * kMalformedTrigger)) {
      line = MalformedLine();
    } else {
      line = EventLine();
      ++counts_.lines;
      return line;
    }
    ++counts_.lines;
    ++counts_.malformed;
    return line;
  }

  // Writes `lines` lines, each followed by a newline. A torn line pair started
  // on the last line is finished, so the count can exceed lines by one.
  void Write(std::ostream& out, size_t lines) {
    for (size_t i = 0; i < lines || !torn_tail_.empty(); ++i) out << NextLine() << '\n';
  }

  const QueueCounts& counts() const { return counts_; }

  // The current full path of directory i (0 is the share root itself).
  std::string DirPath(size_t i) const {
    std::vector<size_t> chain;
    for (size_t d = i; d != 0; d = dirs_[d].parent) chain.push_back(d);
    std::string path = shape_.share_root;
    for (auto it = chain.rbegin(); it != chain.rend(); ++it) path += "/" + dirs_[*it].name;
    return path;
  }

 private:
  struct Dir {
    size_t parent;  // index in dirs_; the root (index 0) is its own parent
    std::string name;
  };
  struct File {
    size_t dir;
    std::string name;
  };

  // splitmix64: small, fast and the same everywhere.
  uint64_t Next() {
    uint64_t z = (state_ += 0x9e3779b97f4a7c15ULL);
    z = (z ^ (z >> 30)) * 0xbf58476d1ce4e5b9ULL;
    z = (z ^ (z >> 27)) * 0x94d049bb133111ebULL;
    return z ^ (z >> 31);
  }
  size_t Below(size_t n) { return n == 0 ? 0 : static_cast<size_t>(Next() % n); }
  bool Chance(double p) { return static_cast<double>(Next() >> 11) * 0x1.0p-53 < p; }

  // Years, then months inside some of them, then albums inside months or
  // other albums: the shape of a photo share, a few levels deep, most
  // directories being albums.
  void MakeDirectories() {
    static const char* const kAlbums[] = {
        "Holiday", "Birthday", "Garden",      "Wedding",         "Scans", "Café Central",
        "Hiking",  "Kids",     "Screenshots", "Family \"best\"", "東京",  "Raw exports"};
    dirs_.push_back(Dir{0, ""});  // the share root
    const size_t want = shape_.dirs + 1;
    for (int year = 2016; year <= 2024 && dirs_.size() < 2 + shape_.dirs / 10; ++year) {
      dirs_.push_back(Dir{0, std::to_string(year)});
    }
    const size_t years = dirs_.size() - 1;
    const size_t dated = dirs_.size() + shape_.dirs / 3;
    for (int month = 1; month <= 12 && dirs_.size() < dated; ++month) {
      for (size_t y = years; y >= 1 && dirs_.size() < dated; --y) {
        char name[16];
        std::snprintf(name, sizeof(name), "%02d", month);
        dirs_.push_back(Dir{y, name});
      }
    }
    first_album_ = dirs_.size();
    while (dirs_.size() < want) {
      size_t parent = 1 + Below(dirs_.size() - 1);
      if (parent <= years && first_album_ > years + 1) {
        parent = years + 1 + Below(first_album_ - years - 1);  // albums go in months
      }
      std::string name = std::string(kAlbums[Below(sizeof(kAlbums) / sizeof(kAlbums[0]))]) + " " +
                         std::to_string(dirs_.size());
      dirs_.push_back(Dir{parent, name});
    }
  }

  void MakeFiles() {
    static const char* const kPatterns[] = {"IMG_%05zu.JPG",  "DSC%05zu.ARW",   "clip %zu.mp4",
                                            "scan-%zu.pdf",   "notes %zu.txt",  "track %zu.flac",
                                            "IMG_%05zu.HEIC", "résumé %zu.docx"};
    files_.reserve(shape_.files);
    for (size_t i = 0; i < shape_.files; ++i) {
      char name[64];
      std::snprintf(name, sizeof(name), kPatterns[Below(sizeof(kPatterns) / sizeof(kPatterns[0]))],
                    i);
      files_.push_back(File{1 + Below(dirs_.size() - 1), name});
    }
    if (dirs_.size() == 1) {
      for (auto& f : files_) f.dir = 0;
    }
  }

  std::string FilePath(size_t i) const { return DirPath(files_[i].dir) + "/" + files_[i].name; }
  // Any directory but the share root (the root itself is never renamed).
  size_t SomeDir() { return dirs_.size() == 1 ? 0 : 1 + Below(dirs_.size() - 1); }

  enum Kind { kCreate, kModify, kAttr, kDelete, kRename, kReindex, kConfig };

  void Count(Kind kind) {
    size_t QueueCounts::*const kField[] = {
        &QueueCounts::creates, &QueueCounts::modifies,  &QueueCounts::attrs,  &QueueCounts::deletes,
        &QueueCounts::renames, &QueueCounts::reindexes, &QueueCounts::configs};
    ++(counts_.*kField[kind]);
  }

  std::string Emit(Kind kind, std::string line) {
    Count(kind);
    return line;
  }

  // A file copied in arrives as a create, a few writes and an attribute
  // change; other events interleave with them, as with several clients.
  std::string EventLine() {
    if (!follow_.empty() && Chance(0.6)) {
      Pending next = std::move(follow_.front());
      follow_.pop_front();
      return Emit(next.kind, std::move(next.line));
    }
    if (files_.empty() || Chance(shape_.dir_events)) return DirLine(Below(50));
    return FileLine(Below(1000));
  }

  std::string FileLine(size_t roll) {
    const size_t f = Below(files_.size());
    const std::string path = FilePath(f);
    if (roll < 260) {
      for (size_t k = Below(4); k > 0; --k) {
        follow_.push_back(Pending{kModify, DaemonLine(kMaskModify, false, path)});
      }
      if (Chance(0.5)) follow_.push_back(Pending{kAttr, DaemonLine(kMaskAttr, false, path)});
      return Emit(kCreate, DaemonLine(kMaskCreate, false, path));
    }
    if (roll < 580) return Emit(kModify, DaemonLine(kMaskModify, false, path));
    if (roll < 760) return Emit(kAttr, DaemonLine(kMaskAttr, false, path));
    if (roll < 900) return Emit(kDelete, DaemonLine(kMaskDelete, false, path));
    // Renamed in place, or moved to another album under a new name. Writes
    // still queued for a copy would name the old path: the copy has finished.
    follow_.clear();
    if (dirs_.size() > 1 && Chance(0.3)) files_[f].dir = 1 + Below(dirs_.size() - 1);
    files_[f].name = Renamed(files_[f].name);
    return Emit(kRename, DaemonLine(kMaskRename, false, FilePath(f), path));
  }

  // Directory events: creates and deletes (which the tree turns into
  // re-indexes), renames, and the library's own re-index and
  // configuration-change events.
  std::string DirLine(size_t roll) { return DirLine(roll, SomeDir()); }

  std::string DirLine(size_t roll, size_t d) {
    const std::string path = DirPath(d);
    if (roll < 15 || d == 0) return Emit(kCreate, DaemonLine(kMaskCreate, true, path));
    if (roll < 22) return Emit(kDelete, DaemonLine(kMaskDelete, true, path));
    if (roll < 32) {
      // People rename albums; a year or month folder is renamed rarely.
      if (first_album_ < dirs_.size() && d < first_album_ && !Chance(0.05)) {
        return DirLine(roll, first_album_ + Below(dirs_.size() - first_album_));
      }
      follow_.clear();
      dirs_[d].name = Renamed(dirs_[d].name);
      return Emit(kRename, DaemonLine(kMaskRename, true, DirPath(d), path));
    }
    if (roll < 41) return Emit(kReindex, CustomLine(kMaskReindex, path));
    return Emit(kConfig,
                CustomLine(kMaskUpdateCfg, path,
                           FileTypeFlags(Chance(0.5), Chance(0.5), Chance(0.5), Chance(0.5))));
  }

  // "name.ext" becomes "name (1).ext", then "name (2).ext"...
  std::string Renamed(const std::string& name) {
    const size_t dot = name.rfind('.');
    const std::string stem = dot == std::string::npos || dot == 0 ? name : name.substr(0, dot);
    const std::string ext = stem.size() == name.size() ? "" : name.substr(dot);
    return stem + " (" + std::to_string(++renamed_) + ")" + ext;
  }

  // One malformed kind in seven is a torn line, which makes two bad lines:
  // starting malformed lines at 7/8 of the wanted rate yields that rate.
  static constexpr double kMalformedTrigger = 7.0 / 8.0;

  // The ways a damaged queue goes wrong, each rejected by the event parser
  // or by the tree's path lookup.
  std::string MalformedLine() {
    const std::string path = files_.empty() ? DirPath(SomeDir()) : FilePath(Below(files_.size()));
    switch (Below(7)) {
      case 0:
        return "kalonotifyd: write error " + std::to_string(Next() % 1000);
      case 1:
        return "{\"is_dir\": false, \"path\": " + JsonQuote(path) + "}";
      case 2:
        return "{\"event\": \"128\", \"is_dir\": false, \"path\": " + JsonQuote(path) + "}";
      case 3:
        return DaemonLine(kMaskModify, false, "");
      case 4:
        return DaemonLine(kMaskCreate, true, "/");
      case 5:
        return DaemonLine(kMaskAttr, false, path + "/");
      default: {
        // A line cut in two by an interrupted write: both halves are bad.
        const std::string whole = DaemonLine(kMaskModify, false, path);
        const size_t cut = 1 + Below(whole.size() - 2);
        torn_tail_ = whole.substr(cut);
        return whole.substr(0, cut);
      }
    }
  }

  QueueShape shape_;
  uint64_t state_;
  std::vector<Dir> dirs_;
  std::vector<File> files_;
  struct Pending {
    Kind kind;
    std::string line;
  };
  std::deque<Pending> follow_;
  std::string torn_tail_;
  size_t renamed_ = 0;
  size_t first_album_ = 1;  // dirs_ from here on are albums
  QueueCounts counts_;
};

}  // namespace bench
}  // namespace orvex

#endif  // ORVEX_BENCH_QUEUE_GENERATOR_H_
