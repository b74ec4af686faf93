// parse_file_bench: what ParseFile (the platform's content extraction) costs.
// Prints, each with its target and PASS or FAIL, measured as ratios within
// this run (each timing the fastest of three passes):
//  - attributes only: ParseFile without need_meta over a directory tree
//    (the first argument, or a generated one) in files/s, against a bare
//    walk of the same tree that calls statx on each entry;
//  - metadata and text: ParseFile with need_meta over a generated
//    mixed-media corpus (texts in several encodings, HTML, PDF, docx, WAV,
//    MP3, JPEG with EXIF) through a running kalocontentextractd, in files/s
//    and MB/s, against the same corpus extracted in this process
//    (ExtractMetadata called directly, plus the statx attributes);
//  - the peak resident memory of this process (the caller) and of each of
//    the daemon's workers (their VmHWM, read before the daemon stops).
// The corpus is written by a child process, so that the libraries writing
// it do not count in the caller's peak. Everything lives in a temporary
// directory that is also ORVEX_ROOT, with the built daemon linked at its
// fixed place there.
#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iostream>
#include <map>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "bench_timing.h"
#include "content_extractor.h"
#include "extract/test_files.h"
#include "extract_service.h"
#include "extract_worker.h"
#include "kalo/kalo_content_extract.h"
#include "orvex/portable/extract_protocol.h"
#include "orvex/portable/root.h"
#include "proc_stats.h"

namespace {

namespace fs = std::filesystem;
using orvex::bench::Children;
using orvex::bench::Report;
using orvex::bench::SecondsOf;
using orvex::bench::StatusKiB;
namespace gen = orvex::extract::testing;

constexpr char kUsage[] =
    "usage: parse_file_bench [DIR] [--files N] [--daemon PATH]\n"
    "Times ParseFile, the platform's content extraction, and prints each figure\n"
    "with its target and PASS or FAIL:\n"
    "  - attributes only over DIR (default: a generated tree of 40 x N entries),\n"
    "    in files/s, against a bare recursive walk calling statx on each entry;\n"
    "  - metadata and text over a generated corpus of N mixed-media files\n"
    "    (default 400) through the extraction daemon, against the same parsers\n"
    "    called in this process;\n"
    "  - peak resident memory of this process and of the daemon's workers.\n"
    "It takes under a minute by default; --files N scales the generated files.\n"
    "  --daemon PATH  the kalocontentextractd to run (default: the one built\n"
    "                 beside this program)\n"
    "A real corpus for the attributes figure, e.g. the Linux sources from\n"
    "Debian's linux-source package:\n"
    "  apt-get install linux-source\n"
    "  mkdir /tmp/linux && tar -xf /usr/src/linux-source-*.tar.xz -C /tmp/linux\n"
    "  parse_file_bench /tmp/linux/linux-source-*\n";

constexpr double kMiB = 1024.0 * 1024.0;

class UsageError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

struct Options {
  bool help = false;
  std::string tree;    // empty: a generated one
  int files = 400;     // the corpus; the generated tree has 40 times as many
  std::string daemon;  // empty: beside this program
};

Options ParseArgs(int argc, char** argv) {
  Options opt;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--help") {
      opt.help = true;
    } else if (arg == "--files" || arg == "--daemon") {
      if (i + 1 == argc) throw UsageError(arg + " needs a value");
      const std::string value = argv[++i];
      if (arg == "--daemon") {
        opt.daemon = value;
        continue;
      }
      char* end = nullptr;
      const long n = std::strtol(value.c_str(), &end, 10);
      if (value.empty() || *end != '\0' || n < 20 || n > 1000000) {
        throw UsageError("--files takes a number from 20 to 1000000, not \"" + value + "\"");
      }
      opt.files = static_cast<int>(n);
    } else if (!arg.empty() && arg[0] != '-' && opt.tree.empty()) {
      opt.tree = arg;
    } else {
      throw UsageError("unknown argument " + arg);
    }
  }
  return opt;
}

std::runtime_error SystemError(const std::string& what) {
  return std::runtime_error(what + ": " + std::strerror(errno));
}

class TempDir {
 public:
  TempDir() {
    char pattern[] = "/tmp/orvex-parse-file-bench-XXXXXX";
    if (::mkdtemp(pattern) == nullptr) throw SystemError("mkdtemp");
    path_ = pattern;
  }
  ~TempDir() {
    std::error_code ignored;
    fs::remove_all(path_, ignored);
  }
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

// ---- The trees ---------------------------------------------------------

void WriteFile(const std::string& path, const std::string& bytes) {
  std::ofstream file(path, std::ios::binary);
  file << bytes;
  if (!file.flush()) throw std::runtime_error("cannot write " + path);
}

// entries small files in directories of 100, two levels deep, as a share's
// folders of documents look to a walk.
void WriteTree(const std::string& root, int entries) {
  for (int i = 0; i < entries; ++i) {
    const std::string dir = root + "/d" + std::to_string(i / 1000) + "/e" + std::to_string(i / 100);
    if (i % 100 == 0) fs::create_directories(dir);
    WriteFile(dir + "/file" + std::to_string(i) + ".txt", std::to_string(i) + "\n");
  }
}

// Prose of about `bytes` in several scripts, so that each encoding below
// has text of its own to carry.
std::string Prose(const std::string& sentence, size_t bytes) {
  std::string text;
  while (text.size() < bytes) text += sentence;
  return text;
}

std::string CorePropertiesXml(int i) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>"
         "<cp:coreProperties "
         "xmlns:cp=\"http://schemas.openxmlformats.org/package/2006/metadata/core-properties\" "
         "xmlns:dc=\"http://purl.org/dc/elements/1.1/\">"
         "<dc:title>Report " +
         std::to_string(i) +
         "</dc:title><dc:creator>Orvex Bench</dc:creator>"
         "<dc:subject>Quarterly figures</dc:subject></cp:coreProperties>";
}

void WriteDocx(const std::string& path, int i, size_t text_bytes) {
  std::string body;
  const std::string sentence = "The quarterly figures for the northern region improved again. ";
  while (body.size() < text_bytes) {
    body += "<w:p><w:r><w:t>" + Prose(sentence, 400) + "</w:t></w:r></w:p>";
  }
  const std::string document =
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?><w:document "
      "xmlns:w=\"http://schemas.openxmlformats.org/wordprocessingml/2006/main\"><w:body>" +
      body + "</w:body></w:document>";
  const std::string types =
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>"
      "<Types xmlns=\"http://schemas.openxmlformats.org/package/2006/content-types\">"
      "<Override PartName=\"/word/document.xml\" ContentType=\"application/"
      "vnd.openxmlformats-officedocument.wordprocessingml.document.main+xml\"/></Types>";
  gen::WriteZip(path, {{"[Content_Types].xml", types},
                       {"docProps/core.xml", CorePropertiesXml(i)},
                       {"word/document.xml", document}});
}

std::string Html(int i, size_t bytes) {
  std::string body;
  while (body.size() < bytes) {
    body +=
        "<p>Visitors to the <b>old harbour</b> can take the ferry at nine. "
        "<a href=\"/timetable\">Timetable</a> &amp; prices &eacute;t&eacute;.</p>\n";
  }
  return "<!DOCTYPE html><html><head><meta charset=\"utf-8\"><title>Harbour guide " +
         std::to_string(i) + "</title><style>p{margin:0}</style></head><body>" + body +
         "</body></html>";
}

// A JPEG the size of a photo: headers, EXIF by Exiv2, and a long scan whose
// bytes metadata readers never need to read.
void WriteJpeg(const std::string& path, size_t scan_bytes) {
  std::string jpeg = gen::MinimalJpeg(4000, 3000);
  jpeg.insert(jpeg.size() - 2, std::string(scan_bytes, '\x5a'));
  WriteFile(path, jpeg);
  gen::WriteExif(path);
}

std::string Mp3(int i, int frames) {
  const std::string latin = std::string(1, '\0');  // ID3 text encoding: ISO-8859-1
  return gen::Id3v23({{"TIT2", latin + "Track " + std::to_string(i)},
                      {"TPE1", latin + "The Orvex Ensemble"},
                      {"TALB", latin + "Benchmarks"},
                      {"TRCK", latin + std::to_string(i % 12 + 1)}}) +
         gen::Mp3Frames(frames);
}

// Text of a kind chosen by k, in an encoding of its own.
std::pair<std::string, std::string> Text(int k, size_t bytes) {
  switch (k % 5) {
    case 0:
      return {"txt", Prose("Minutes of the meeting: the budget was approved. ", bytes)};
    case 1:
      return {"txt", gen::Encode(Prose("Größe, Straße, café crème, naïve façade. ", bytes),
                                 "WINDOWS-1252")};
    case 2:
      return {"txt",
              gen::Encode(Prose("会議の議事録：予算は承認されました。", bytes), "SHIFT_JIS")};
    case 3:
      return {"txt", gen::Encode(Prose("Протокол собрания: бюджет утверждён. ", bytes), "KOI8-R")};
    default:
      return {"md",
              gen::Encode(Prose("# Notes\nUTF-16 text with a byte order mark. ", bytes), "UTF-16")};
  }
}

// One file of the corpus: the kind cycles through a mix of twenty that
// weighs photos and songs as a share does, with documents of varied size.
void WriteCorpusFile(const std::string& dir, int i) {
  const std::string base = dir + "/f" + std::to_string(i);
  const size_t vary = static_cast<size_t>(i * 7919 % 97);  // 0 to 96, spread
  switch (i % 20) {
    case 0:
    case 1:
    case 2:
    case 3:
    case 4: {
      const auto text = Text(i, (8 + vary * 4) << 10);  // 8 KiB to 392 KiB
      WriteFile(base + "." + text.first, text.second);
      break;
    }
    case 5:
    case 6:
      WriteFile(base + ".html", Html(i, (4 + vary) << 10));
      break;
    case 7:
      WriteFile(base + ".pdf",
                gen::MinimalPdf("/Title (Invoice " + std::to_string(i) + ") /Author (Orvex)",
                                "Invoice total 1234.56"));
      break;
    case 8:
    case 9:
      WriteDocx(base + ".docx", i, (16 + vary * 2) << 10);
      break;
    case 10:
    case 11:
      WriteFile(base + ".wav", gen::PcmWav(44100, 2, 1 + static_cast<uint32_t>(vary % 3)));
      break;
    case 12:
    case 13:
    case 14:
    case 15:
      WriteFile(base + ".mp3", Mp3(i, 2000 + static_cast<int>(vary) * 40));  // 0.8 to 2.4 MB
      break;
    default:
      WriteJpeg(base + ".jpg", (1 + vary % 4) << 20);
      break;
  }
}

// Runs write() in a child, so that what it allocates never counts in this
// process's peak memory.
void InChild(const std::function<void()>& write) {
  std::cout.flush();
  const pid_t pid = ::fork();
  if (pid < 0) throw SystemError("fork");
  if (pid == 0) {
    int status = 0;
    try {
      write();
    } catch (const std::exception& e) {
      std::fprintf(stderr, "parse_file_bench: writing the files failed: %s\n", e.what());
      status = 1;
    }
    std::_Exit(status);
  }
  int status = 0;
  while (::waitpid(pid, &status, 0) < 0 && errno == EINTR) {
  }
  if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) {
    throw std::runtime_error("the child writing the files failed");
  }
}

// ---- Walking -----------------------------------------------------------

// Calls visit on every entry below dir (depth first), descending where
// visit says the entry is a directory. Unreadable directories are skipped.
void Walk(const std::string& dir, const std::function<bool(const std::string&)>& visit) {
  DIR* stream = ::opendir(dir.c_str());
  if (stream == nullptr) return;
  std::vector<std::string> subdirs;
  while (const struct dirent* entry = ::readdir(stream)) {
    const char* name = entry->d_name;
    if (std::strcmp(name, ".") == 0 || std::strcmp(name, "..") == 0) continue;
    std::string path = dir + "/" + name;
    if (visit(path)) subdirs.push_back(std::move(path));
  }
  ::closedir(stream);
  for (const std::string& sub : subdirs) Walk(sub, visit);
}

// The statx call ParseFile makes, alone.
bool StatxIsDir(const std::string& path, struct statx& st) {
  if (::statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW | AT_STATX_SYNC_AS_STAT,
              STATX_BASIC_STATS | STATX_BTIME, &st) != 0) {
    return false;
  }
  return S_ISDIR(st.stx_mode);
}

struct WalkTimes {
  size_t entries = 0;
  int rounds = 1;   // walks in each timed pass
  double bare = 0;  // seconds per walk
  double parse = 0;
};

constexpr double kMinPassSeconds = 0.25;

// Seconds per walk of tree that calls visit on each entry, over `rounds`
// walks.
double WalkSeconds(const std::string& tree, int rounds,
                   const std::function<bool(const std::string&)>& visit) {
  return SecondsOf([&] {
           for (int i = 0; i < rounds; ++i) Walk(tree, visit);
         }) /
         rounds;
}

// The two walks alternate, three passes each, so that a slow spell of the
// shared machine falls on both; a small tree is walked several times per
// pass so that each pass lasts long enough to time.
WalkTimes TimeWalks(const std::string& tree) {
  WalkTimes times;
  const auto bare = [&](const std::string& path) {
    ++times.entries;
    struct statx st;
    return StatxIsDir(path, st);
  };
  const Json::Value cfg(Json::objectValue);
  const auto parse = [&](const std::string& path) {
    Json::Value out;
    return KALO::CONTENT_EXTRACT::ParseFile(path, cfg, out) && out["KALOMDIsDir"].asBool();
  };
  const double first = WalkSeconds(tree, 1, bare);
  if (times.entries == 0) throw std::runtime_error(tree + " has no entries to walk");
  const size_t entries = times.entries;
  times.rounds = static_cast<int>(std::min(1000.0, std::ceil(kMinPassSeconds / first)));
  for (int pass = 0; pass < 3; ++pass) {
    const double b = WalkSeconds(tree, times.rounds, bare);
    const double p = WalkSeconds(tree, times.rounds, parse);
    times.bare = pass == 0 ? b : std::min(times.bare, b);
    times.parse = pass == 0 ? p : std::min(times.parse, p);
  }
  times.entries = entries;
  return times;
}

// ---- The daemon --------------------------------------------------------

// The daemon's program: the one given, or the one built beside this one.
std::string DaemonProgram(const std::string& given) {
  if (!given.empty()) return fs::absolute(given).string();
  return (fs::read_symlink("/proc/self/exe").parent_path() / "kalocontentextractd").string();
}

bool SocketAnswers(const std::string& socket_path) {
  const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) return false;
  struct sockaddr_un addr = {};
  addr.sun_family = AF_UNIX;
  std::strncpy(addr.sun_path, socket_path.c_str(), sizeof(addr.sun_path) - 1);
  const bool ok = ::connect(fd, reinterpret_cast<struct sockaddr*>(&addr), sizeof(addr)) == 0;
  ::close(fd);
  return ok;
}

// kalocontentextractd --foreground, run as a child under ORVEX_ROOT, and
// stopped with SIGTERM as its service manager would.
class Daemon {
 public:
  explicit Daemon(const std::string& program) {
    std::cout.flush();
    pid_ = ::fork();
    if (pid_ < 0) throw SystemError("fork");
    if (pid_ == 0) {
      // A benchmark that dies (a closed pipe, ^C) takes its daemon along.
      ::prctl(PR_SET_PDEATHSIG, SIGTERM);
      ::execl(program.c_str(), program.c_str(), "--foreground", static_cast<char*>(nullptr));
      std::fprintf(stderr, "parse_file_bench: cannot run %s: %s\n", program.c_str(),
                   std::strerror(errno));
      std::_Exit(127);
    }
    WaitForSocket();
  }
  Daemon(const Daemon&) = delete;
  Daemon& operator=(const Daemon&) = delete;
  ~Daemon() { Stop(); }

  pid_t pid() const { return pid_; }
  bool Running() {
    if (pid_ < 0) return false;
    int status = 0;
    return ::waitpid(pid_, &status, WNOHANG) == 0;
  }
  void Stop() {
    if (pid_ < 0) return;
    ::kill(pid_, SIGTERM);
    int status = 0;
    while (::waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
    }
    pid_ = -1;
  }

 private:
  void WaitForSocket() {
    const std::string socket_path = orvex::portable::RootPath(orvex::portable::kExtractSocketPath);
    for (int i = 0; i < 1000; ++i) {
      if (SocketAnswers(socket_path)) return;
      if (!Running()) {
        pid_ = -1;
        throw std::runtime_error("kalocontentextractd exited at start");
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    throw std::runtime_error("kalocontentextractd did not listen on " + socket_path);
  }

  pid_t pid_ = -1;
};

// ---- Extraction --------------------------------------------------------

struct Corpus {
  std::vector<std::string> paths;
  double bytes = 0;
};

Corpus ListCorpus(const std::string& dir) {
  Corpus corpus;
  for (const fs::directory_entry& entry : fs::directory_iterator(dir)) {
    corpus.paths.push_back(entry.path().string());
    corpus.bytes += static_cast<double>(entry.file_size());
  }
  return corpus;
}

// What one pass produced, to check that both paths read the same.
struct Tally {
  size_t members = 0;
  size_t with_text = 0;
  size_t failed = 0;
  std::map<std::string, double> seconds_by_kind;  // not compared
  bool operator==(const Tally& o) const {
    return members == o.members && with_text == o.with_text && failed == o.failed;
  }
};

void Count(const Json::Value& doc, Tally& tally) {
  tally.members += doc.size();
  if (doc.isMember("KALOMDTextContent")) ++tally.with_text;
}

// ParseFile's document built in this process: the names and attributes
// from statx (as ParseFile writes them), then the parsers' metadata where
// the attributes left room.
bool InProcess(const std::string& path, Json::Value& doc) {
  struct statx st;
  StatxIsDir(path, st);
  if (!S_ISREG(st.stx_mode)) return false;
  const size_t slash = path.rfind('/');
  const std::string name = path.substr(slash + 1);
  const size_t dot = name.rfind('.');
  doc = Json::Value(Json::objectValue);
  doc["KALOMDPath"] = path;
  doc["KALOMDFSName"] = name;
  doc["KALOMDParent"] = path.substr(0, slash);
  doc["KALOMDExtension"] = dot == std::string::npos ? "" : name.substr(dot + 1);
  doc["KALOMDIsDir"] = false;
  doc["KALOMDFSSize"] = static_cast<Json::Int64>(st.stx_size);
  doc["KALOMDPhysicalSize"] = static_cast<Json::Int64>(st.stx_blocks * 512);
  doc["KALOMDFSContentChangeDate"] = static_cast<Json::Int64>(st.stx_mtime.tv_sec);
  doc["KALOMDAttributeChangeDate"] = static_cast<Json::Int64>(st.stx_ctime.tv_sec);
  if (st.stx_mask & STATX_BTIME) {
    doc["KALOMDFSCreationDate"] = static_cast<Json::Int64>(st.stx_btime.tv_sec);
  }
  doc["KALOMDOwnerUserID"] = std::to_string(st.stx_uid);
  doc["KALOMDOwnerGroupID"] = std::to_string(st.stx_gid);
  char mode[16];
  std::snprintf(mode, sizeof(mode), "%04o", st.stx_mode & 07777);
  doc["KALOMDPrivilege"] = mode;
  Json::Value meta(Json::objectValue);
  std::string problem;
  orvex::extract::ExtractMetadata(path, orvex::extract::ExtractLimits(), meta, &problem);
  for (const std::string& member : meta.getMemberNames()) {
    if (!doc.isMember(member)) doc[member] = meta[member];
  }
  return true;
}

// The extension of path, the corpus's kind of file.
std::string Kind(const std::string& path) { return path.substr(path.rfind('.') + 1); }

// The fastest of three passes of parse over the corpus, its tally and the
// seconds it spent on each kind of file.
double TimeCorpus(const Corpus& corpus,
                  const std::function<bool(const std::string&, Json::Value&)>& parse,
                  Tally& tally) {
  double best = 0;
  for (int pass = 0; pass < 3; ++pass) {
    Tally this_pass;
    const double seconds = SecondsOf([&] {
      for (const std::string& path : corpus.paths) {
        const auto start = orvex::bench::Clock::now();
        Json::Value doc;
        if (parse(path, doc)) {
          Count(doc, this_pass);
        } else {
          ++this_pass.failed;
        }
        this_pass.seconds_by_kind[Kind(path)] += orvex::bench::Seconds(start);
      }
    });
    if (pass == 0 || seconds < best) {
      best = seconds;
      tally = this_pass;
    }
  }
  return best;
}

// Milliseconds per file of each kind, on both paths.
void PrintKinds(const Corpus& corpus, const Tally& isolated, const Tally& local) {
  std::map<std::string, int> files;
  for (const std::string& path : corpus.paths) ++files[Kind(path)];
  std::printf("ms per file    isolated  in process\n");
  for (const auto& [kind, n] : files) {
    std::printf("  %-4s (%4d)  %8.3f  %10.3f\n", kind.c_str(), n,
                1000 * isolated.seconds_by_kind.at(kind) / n,
                1000 * local.seconds_by_kind.at(kind) / n);
  }
}

long PeakKiB() {
  struct rusage usage = {};
  ::getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss;
}

void PrintRate(const char* what, const Corpus& corpus, double seconds) {
  std::printf("%s: %.0f files/s, %.1f MB/s (%.3fs for %zu files, %.1f MB)\n", what,
              static_cast<double>(corpus.paths.size()) / seconds, corpus.bytes / 1e6 / seconds,
              seconds, corpus.paths.size(), corpus.bytes / 1e6);
}

// ---- The figures -------------------------------------------------------

bool AttributesFigure(const std::string& tree) {
  const WalkTimes t = TimeWalks(tree);
  const double entries = static_cast<double>(t.entries);
  std::printf("tree %s: %zu entries, walked %d times per pass\n", tree.c_str(), t.entries,
              t.rounds);
  std::printf("bare statx walk: %.0f files/s; ParseFile without need_meta: %.0f files/s\n",
              entries / t.bare, entries / t.parse);
  return Report("attributes only, ParseFile against a bare statx walk (time)", t.parse / t.bare,
                "x", 2.0);
}

struct DaemonFigures {
  double seconds = 0;
  Tally tally;
  long caller_peak_kib = 0;
  bool workers_pass = true;
};

// The isolated path, then the memory of the caller and of the workers
// before the daemon stops.
DaemonFigures DaemonPath(const Corpus& corpus, const std::string& program) {
  Daemon daemon(program);
  const Json::Value cfg = [] {
    Json::Value c(Json::objectValue);
    c["need_meta"] = true;
    return c;
  }();
  DaemonFigures figures;
  figures.seconds = TimeCorpus(
      corpus,
      [&](const std::string& path, Json::Value& doc) {
        return KALO::CONTENT_EXTRACT::ParseFile(path, cfg, doc);
      },
      figures.tally);
  figures.caller_peak_kib = PeakKiB();
  if (!daemon.Running()) throw std::runtime_error("kalocontentextractd stopped during the run");
  std::printf("daemon %d: peak resident %.1f MiB\n", static_cast<int>(daemon.pid()),
              static_cast<double>(StatusKiB(daemon.pid(), "VmHWM")) / 1024);
  const std::vector<pid_t> workers = Children(daemon.pid());
  if (workers.empty()) {
    std::printf("FAIL: no worker of the daemon found in /proc\n");
    figures.workers_pass = false;
  }
  for (const pid_t worker : workers) {
    const std::string what = "worker " + std::to_string(worker) + " peak resident memory";
    figures.workers_pass &=
        Report(what.c_str(), static_cast<double>(StatusKiB(worker, "VmHWM")) / 1024, " MiB",
               orvex::portable::kDefaultExtractMemoryMb);
  }
  daemon.Stop();
  return figures;
}

// The parsers in this process, with the worker's answer message built (its
// JSON text, the text behind it) and read back as the caller reads it: what
// the isolated path adds before any process boundary.
bool WithAnswerText(const std::string& path, Json::Value& doc) {
  const std::string message = orvex::portable::AnswerMessage(orvex::portable::ExtractInWorker(
      path, [](const std::string& p, Json::Value& out, std::string* problem) {
        return orvex::extract::ExtractMetadata(p, orvex::extract::ExtractLimits(), out, problem);
      }));
  const size_t nul = std::min(message.find('\0'), message.size());
  Json::CharReaderBuilder reader;
  std::string errors;
  const std::unique_ptr<Json::CharReader> parser(reader.newCharReader());
  if (!parser->parse(message.data(), message.data() + nul, &doc, &errors)) return false;
  if (nul < message.size()) {
    doc["data"][orvex::portable::kExtractTextMember] =
        Json::Value(message.data() + nul + 1, message.data() + message.size());
  }
  return true;
}

bool ExtractionFigures(const std::string& corpus_dir, const std::string& program) {
  const Corpus corpus = ListCorpus(corpus_dir);
  const DaemonFigures isolated = DaemonPath(corpus, program);
  Tally local_tally;
  const double local = TimeCorpus(corpus, InProcess, local_tally);
  Tally answer_tally;
  const double answer = TimeCorpus(corpus, WithAnswerText, answer_tally);
  PrintRate("with metadata, ParseFile through kalocontentextractd", corpus, isolated.seconds);
  PrintRate("with metadata, parsers in process", corpus, local);
  PrintRate("parsers in process, answer message written and read (no process boundary)", corpus,
            answer);
  PrintKinds(corpus, isolated.tally, local_tally);
  bool pass = isolated.workers_pass;
  if (!(isolated.tally == local_tally)) {
    std::printf(
        "FAIL: the two paths read different results (members %zu against %zu, "
        "with text %zu against %zu, failed %zu against %zu)\n",
        isolated.tally.members, local_tally.members, isolated.tally.with_text,
        local_tally.with_text, isolated.tally.failed, local_tally.failed);
    pass = false;
  }
  pass &= Report("metadata and text, isolated against in process (time)", isolated.seconds / local,
                 "x", 1.15);
  pass &= Report("caller peak resident memory after the isolated path",
                 static_cast<double>(isolated.caller_peak_kib) / 1024, " MiB", 64);
  std::printf("caller peak resident memory after the parsers ran in process: %.1f MiB\n",
              static_cast<double>(PeakKiB()) / 1024);
  return pass;
}

// ORVEX_ROOT is the temporary directory: the daemon's socket, its program
// (a link to the built one) and the failure record all live there.
void PrepareRoot(const std::string& root, const std::string& program) {
  if (::access(program.c_str(), X_OK) != 0) {
    throw std::runtime_error("no kalocontentextractd at " + program +
                             " (build it, or name it with --daemon)");
  }
  if (::setenv("ORVEX_ROOT", root.c_str(), 1) != 0) throw SystemError("setenv");
  const std::string link = orvex::portable::RootPath(orvex::portable::kExtractProgramPath);
  fs::create_directories(fs::path(link).parent_path());
  fs::create_symlink(program, link);
}

int Run(const Options& opt) {
  if (!opt.tree.empty() && !fs::is_directory(opt.tree)) {
    throw std::runtime_error(opt.tree + " is not a directory");
  }
  // Output cut short (| head) must not leave the daemon and the files.
  ::signal(SIGPIPE, SIG_IGN);
  TempDir root;
  const std::string program = DaemonProgram(opt.daemon);
  PrepareRoot(root.path(), program);
  const std::string corpus_dir = root.path() + "/corpus";
  const std::string tree = opt.tree.empty() ? root.path() + "/tree" : opt.tree;
  const auto started = orvex::bench::Clock::now();
  InChild([&] {
    fs::create_directories(corpus_dir);
    for (int i = 0; i < opt.files; ++i) WriteCorpusFile(corpus_dir, i);
    if (opt.tree.empty()) WriteTree(tree, 40 * opt.files);
  });
  std::printf("files written in %.1fs\n", orvex::bench::Seconds(started));
  bool pass = AttributesFigure(tree);
  pass &= ExtractionFigures(corpus_dir, program);
  const std::string failures = orvex::portable::RootPath(orvex::portable::kExtractFailuresPath);
  if (fs::exists(failures)) {
    std::printf("FAIL: extractions failed and were recorded in %s\n", failures.c_str());
    pass = false;
  }
  return pass ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
  Options opt;
  try {
    opt = ParseArgs(argc, argv);
  } catch (const UsageError& e) {
    std::cerr << "parse_file_bench: " << e.what() << "\n" << kUsage;
    return 2;
  }
  if (opt.help) {
    std::cout << kUsage;
    return 0;
  }
  try {
    return Run(opt);
  } catch (const std::exception& e) {
    std::cerr << "parse_file_bench: " << e.what() << "\n";
    return 2;
  }
}
