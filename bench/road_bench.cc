// road_bench: the whole road, from files on disk to search answers, with the
// real programs (orvex up: kaloelasticd, kalocontentextractd, kalonotifyd,
// fileindexd) in a temporary ORVEX_ROOT, over a real tree given as argument
// (the Linux sources, say). Prints in one run, as ratios where another
// program does the same job on the same tree:
//
//   1. first index, names and attributes only (a folder with every file type's
//      metadata switched off): files/s, against plocate's `updatedb -l 0`;
//   2. first index with content (every file type on): files/s, against
//      `recollindex` with a private configuration whose topdirs is the tree,
//      and the peak memory (VmHWM) of our daemons together, the extraction
//      workers included, against recollindex's;
//   3. change to searchable, with the daemons of step 2 still running: p50
//      and p99 over single-file saves at idle (each file written, then a
//      name search polled until it finds it), a thousand files created at
//      once (until every one is found), and the rename of a directory of
//      100,000 files (until all are found below the new name), with the
//      extraction workers' read calls counted meanwhile (none: a rename
//      moves documents, it extracts nothing);
//   4. the resident memory (VmRSS) of fileindexd and kalonotifyd while idle
//      over a generated names-only tree of N files.
//
// The indexes live inside the tree (TREE/@eaDir, as for every share) and the
// test files in TREE/orvexroad-*; both are removed at the end, as are the
// daemons and the temporary directory, on every way out. The comparisons
// are skipped with a note when updatedb (plocate) or recollindex is not
// installed. Every figure is taken with a warm page cache.
#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "bench_timing.h"
#include "kalo/kalo_sock.h"
#include "orvex/foundation/json.h"
#include "orvex/portable/root.h"
#include "proc_stats.h"
#include "support/run_program.h"
#include "support/temp_dir.h"

namespace {

namespace fs = std::filesystem;
using orvex::bench::Children;
using orvex::bench::Clock;
using orvex::bench::KiBToMiB;
using orvex::bench::Percentile;
using orvex::bench::ProcessorSeconds;
using orvex::bench::ProcNumber;
using orvex::bench::Report;
using orvex::bench::Seconds;
using orvex::testing::ProgramOutcome;
using orvex::testing::RunProgram;
using orvex::testing::TempDir;

constexpr char kUsage[] =
    "usage: road_bench TREE [--saves N] [--burst N] [--rename-files N] [--idle-files N]\n"
    "                  [--no-baselines]\n"
    "Indexes TREE with the real daemons in a temporary ORVEX_ROOT and prints, each\n"
    "with its target and PASS or FAIL:\n"
    "  - the first index with names and attributes only, in files/s, against\n"
    "    plocate's `updatedb -l 0` over TREE;\n"
    "  - the first index with content, in files/s, against `recollindex` over TREE,\n"
    "    and the peak memory of our daemons together against recollindex's;\n"
    "  - change to searchable: p50 and p99 over N single-file saves at idle\n"
    "    (default 100; the full figure is 1000), N files created at once\n"
    "    (default 1000), and the rename of a directory of N files (default\n"
    "    100000), with the extraction workers' reads meanwhile;\n"
    "  - the resident memory of fileindexd and kalonotifyd idle over a generated\n"
    "    tree of N files, names only (default 100000; the full figure is 1000000).\n"
    "TREE gets its index (TREE/@eaDir) and test files (TREE/orvexroad-*) while\n"
    "the benchmark runs; both are removed at the end. A real tree: the Linux\n"
    "sources (apt-get install linux-source; tar xf /usr/src/linux-source-*.tar.xz\n"
    "-C /tmp). The comparisons need plocate and recoll (apt-get install plocate\n"
    "recoll) and are skipped with a note without them; --no-baselines skips them.\n"
    "Temporary files go to $TMPDIR (default /tmp).\n";

constexpr double kNamesRatioTarget = 0.5;
constexpr double kContentRatioTarget = 10;
constexpr double kSaveP99TargetS = 1;
constexpr double kBurstTargetS = 0.5;
constexpr double kRenameTargetS = 10;
constexpr double kIdleRssTargetMb = 64;
constexpr auto kPoll = std::chrono::milliseconds(5);
constexpr char kPrefix[] = "orvexroad";

// Set by SIGINT and SIGTERM: the next wait throws, so that the daemons are
// stopped and the tree cleaned on the way out.
volatile sig_atomic_t g_stop = 0;

void OnStopSignal(int) { g_stop = 1; }

void SleepPoll() {
  if (g_stop) throw std::runtime_error("interrupted");
  std::this_thread::sleep_for(kPoll);
}

struct Options {
  std::string tree;
  int saves = 100;
  int burst = 1000;
  int rename_files = 100000;
  int idle_files = 100000;
  bool baselines = true;
};

int PositiveArg(int argc, char** argv, int& i) {
  if (i + 1 >= argc) throw std::invalid_argument(std::string(argv[i]) + " needs a number");
  char* end = nullptr;
  const long n = std::strtol(argv[++i], &end, 10);
  if (*end != '\0' || n < 1 || n > 100000000) {
    throw std::invalid_argument(std::string("bad number ") + argv[i]);
  }
  return static_cast<int>(n);
}

Options ParseOptions(int argc, char** argv) {
  Options options;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--saves") {
      options.saves = PositiveArg(argc, argv, i);
    } else if (arg == "--burst") {
      options.burst = PositiveArg(argc, argv, i);
    } else if (arg == "--rename-files") {
      options.rename_files = PositiveArg(argc, argv, i);
    } else if (arg == "--idle-files") {
      options.idle_files = PositiveArg(argc, argv, i);
    } else if (arg == "--no-baselines") {
      options.baselines = false;
    } else if (arg.empty() || arg[0] == '-' || !options.tree.empty()) {
      throw std::invalid_argument("unexpected argument " + arg);
    } else {
      options.tree = arg;
    }
  }
  if (options.tree.empty()) throw std::invalid_argument("TREE is missing");
  return options;
}

// ---- Small helpers -------------------------------------------------------

void Note(const std::string& text) {
  std::printf("%s\n", text.c_str());
  std::fflush(stdout);
}

// Prints "<what>: <value><unit> (target >= <target>) PASS|FAIL"; true on PASS.
bool ReportAtLeast(const char* what, double value, const char* unit, double target) {
  const bool pass = value >= target;
  std::printf("%s: %.3f%s (target >= %g) %s\n", what, value, unit, target, pass ? "PASS" : "FAIL");
  std::fflush(stdout);
  return pass;
}

// The program's full path from PATH (with the sbin directories, where
// updatedb lives); empty when it is not installed.
std::string FindProgram(const std::string& name) {
  const char* path = std::getenv("PATH");
  std::string dirs = std::string(path != nullptr ? path : "") + ":/usr/sbin:/sbin:/usr/local/sbin";
  size_t start = 0;
  while (start <= dirs.size()) {
    size_t end = dirs.find(':', start);
    if (end == std::string::npos) end = dirs.size();
    const std::string candidate = dirs.substr(start, end - start) + "/" + name;
    if (end > start && ::access(candidate.c_str(), X_OK) == 0) return candidate;
    start = end + 1;
  }
  return "";
}

std::string ProgramDir() { return fs::read_symlink("/proc/self/exe").parent_path().string(); }

void WriteFile(const std::string& path, const std::string& text) {
  std::ofstream out(path, std::ios::binary);
  out << text;
  if (!out.flush()) throw std::runtime_error("cannot write " + path);
}

// ---- The tree ------------------------------------------------------------

struct TreeCount {
  long long files = 0;                                              // regular files
  long long dirs = 0;                                               // directories below the top
  long long other = 0;                                              // links and the rest
  long long Documents() const { return files + dirs + other + 1; }  // + the top itself
};

// Counts the tree as the indexing daemon sees it: metadata folders skipped,
// links not followed. Also warms the page cache for every program after.
void CountInto(const std::string& dir, TreeCount& count) {
  DIR* d = ::opendir(dir.c_str());
  if (d == nullptr) return;
  while (const dirent* entry = ::readdir(d)) {
    const std::string name = entry->d_name;
    if (name == "." || name == ".." || name == "@eaDir" || name == "#recycle" ||
        name == "#snapshot") {
      continue;
    }
    const std::string path = dir + "/" + name;
    struct stat st;
    if (::lstat(path.c_str(), &st) != 0) continue;
    if (S_ISDIR(st.st_mode)) {
      ++count.dirs;
      CountInto(path, count);
    } else if (S_ISREG(st.st_mode)) {
      ++count.files;
    } else {
      ++count.other;
    }
  }
  ::closedir(d);
}

// Writes n files named "<name_prefix><i>.<ext>", 1000 to a subdirectory
// when nested. text, when not empty, is written into every file whose index
// is a multiple of text_every.
void MakeFiles(const std::string& dir, int n, const std::string& name_prefix, bool nested,
               const std::string& text, int text_every) {
  fs::create_directories(dir);
  std::string sub = dir;
  for (int i = 0; i < n; ++i) {
    if (g_stop) throw std::runtime_error("interrupted");
    if (nested && i % 1000 == 0) {
      sub = dir + "/d" + std::to_string(i / 1000);
      fs::create_directories(sub);
    }
    const bool with_text = !text.empty() && i % text_every == 0;
    const std::string path =
        sub + "/" + name_prefix + std::to_string(i) + (with_text ? ".txt" : ".dat");
    const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    if (fd < 0) throw std::runtime_error("cannot create " + path + ": " + std::strerror(errno));
    const bool ok =
        !with_text || ::write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size());
    ::close(fd);
    if (!ok) throw std::runtime_error("cannot write " + path);
  }
}

// ---- The whole system in one temporary root ------------------------------

constexpr const char* kDaemonNames[] = {"kaloelasticd", "kalocontentextractd", "kalonotifyd",
                                        "fileindexd"};

// The four daemons, started by `orvex up` in root, stopped by `orvex down`
// when this object goes, whatever happened meanwhile.
class System {
 public:
  System(std::string program_dir, std::string root, std::string io_dir)
      : orvex_(program_dir + "/orvex"), root_(std::move(root)), io_dir_(std::move(io_dir)) {
    fs::create_directories(root_);
    ::setenv("ORVEX_ROOT", root_.c_str(), 1);
    Orvex({"up"});
    up_ = true;
  }
  System(const System&) = delete;
  System& operator=(const System&) = delete;
  ~System() {
    if (!up_) return;
    ::setenv("ORVEX_ROOT", root_.c_str(), 1);
    RunProgram(orvex_, {"down"}, {}, io_dir_);
  }

  // Registers the share name at path and adds its root as an indexed folder,
  // with every file type's metadata and text or none.
  void AddShareFolder(const std::string& name, const std::string& path, bool content) {
    Orvex({"share", "add", name, path});
    std::vector<std::string> args = {"folder", "add", "/" + name};
    if (!content) {
      for (const char* off : {"--no-document", "--no-audio", "--no-video", "--no-photo"}) {
        args.push_back(off);
      }
    }
    Orvex(args);
  }

  // Waits until the share's worker is idle with nothing queued and the
  // index holds documents documents (committed); throws after timeout_s.
  void WaitIndexed(const std::string& share, const std::string& share_root, long long documents,
                   double timeout_s) {
    const std::string queue = share_root + "/@eaDir/@fileindex/queue";
    const Clock::time_point start = Clock::now();
    long long last_count = -1;
    while (!Idle(share, queue) || (last_count = Documents(share)) != documents) {
      if (Seconds(start) > timeout_s) {
        throw std::runtime_error("share " + share + " not indexed after " +
                                 std::to_string(static_cast<int>(timeout_s)) +
                                 " s: " + std::to_string(last_count) + " of " +
                                 std::to_string(documents) + " documents");
      }
      SleepPoll();
    }
  }

  // The number of committed documents the search finds for query (its
  // "data" members: "name", "folder", ...).
  long long SearchTotal(const Json::Value& query) {
    Json::Value request(Json::objectValue);
    request["command"] = "search";
    request["data"] = query;
    request["data"]["limit"] = 1;
    const Json::Value answer = Ask("/var/run/kaloelasticd.sock", request);
    return answer["data"]["total"].asInt64();
  }

  pid_t Pid(const std::string& daemon) const {
    std::ifstream in(root_ + "/var/run/" + daemon + ".pid");
    long pid = 0;
    return (in >> pid) ? static_cast<pid_t>(pid) : 0;
  }

  // The daemons' peak resident memory together, the extraction workers
  // included (read while they run).
  double PeakMiB() const {
    long long kib = 0;
    for (const char* daemon : kDaemonNames) {
      const pid_t pid = Pid(daemon);
      kib += std::max(0LL, ProcNumber(pid, "status", "VmHWM"));
      for (pid_t child : Children(pid)) kib += std::max(0LL, ProcNumber(child, "status", "VmHWM"));
    }
    return KiBToMiB(kib);
  }

  // The read calls the extraction workers have made so far: each file
  // extracted is opened and read by one of them, and a request reaches a
  // worker through a read too.
  long long ExtractionReads() const {
    long long reads = 0;
    for (pid_t worker : Children(Pid("kalocontentextractd"))) {
      reads += std::max(0LL, ProcNumber(worker, "io", "syscr"));
    }
    return reads;
  }

  // Each daemon's processor seconds so far, the extraction workers counted
  // with their daemon, in kDaemonNames' order.
  std::vector<double> CpuEach() const {
    std::vector<double> seconds;
    for (const char* daemon : kDaemonNames) {
      const pid_t pid = Pid(daemon);
      seconds.push_back(ProcessorSeconds(pid));
      for (pid_t child : Children(pid)) seconds.back() += ProcessorSeconds(child);
    }
    return seconds;
  }

  // "name N.N s, ..." for each daemon's processor time since since (from
  // CpuEach; empty: since it started): where the time went.
  std::string CpuText(const std::vector<double>& since = {}) const {
    const std::vector<double> now = CpuEach();
    std::string text;
    for (size_t i = 0; i < now.size(); ++i) {
      char figure[64];
      std::snprintf(figure, sizeof(figure), "%s%s %.1f s", text.empty() ? "" : ", ",
                    kDaemonNames[i], now[i] - (i < since.size() ? since[i] : 0));
      text += figure;
    }
    return text;
  }

 private:
  void Orvex(const std::vector<std::string>& args) {
    const ProgramOutcome outcome = RunProgram(orvex_, args, {}, io_dir_);
    if (outcome.status != 0) {
      std::string command = "orvex";
      for (const auto& arg : args) command += " " + arg;
      throw std::runtime_error(command + " failed: " + outcome.out + outcome.err);
    }
  }

  Json::Value Ask(const std::string& socket, const Json::Value& request) const {
    kalodaemon::DomainSockConnection connection(root_ + socket);
    std::string text;
    if (!connection.Connect() || !connection.Send(orvex::toString(request)) ||
        !connection.Recv(text)) {
      throw std::runtime_error("no answer on " + socket + ": " + std::strerror(errno));
    }
    Json::Value answer;
    if (!orvex::fromString(answer, text) || !answer["success"].asBool()) {
      throw std::runtime_error("bad answer on " + socket + ": " + text);
    }
    return answer;
  }

  bool Idle(const std::string& share, const std::string& queue) const {
    Json::Value request(Json::objectValue);
    request["type"] = "status";
    request["data"] = Json::Value();
    const Json::Value worker = Ask("/var/run/fileindexd.sock", request)["data"]["shares"][share];
    struct stat st;
    const bool queued = (::stat(queue.c_str(), &st) == 0 && st.st_size > 0) ||
                        ::access((queue + ".tmp").c_str(), F_OK) == 0;
    return worker["state"].asString() == "idle" && worker["todo"].asInt64() == 0 && !queued;
  }

  long long Documents(const std::string& share) const {
    Json::Value request(Json::objectValue);
    request["command"] = "stats";
    request["data"]["id"] = "fileindex_" + share;
    const Json::Value indexes = Ask("/var/run/kaloelasticd.sock", request)["data"]["indexes"];
    return indexes.size() == 1 ? indexes[0]["documents"].asInt64() : -1;
  }

  std::string orvex_;
  std::string root_;
  std::string io_dir_;
  bool up_ = false;
};

// Removes what the benchmark put into the tree, on every way out.
class TreeCleanup {
 public:
  explicit TreeCleanup(std::string tree) : tree_(std::move(tree)) {}
  TreeCleanup(const TreeCleanup&) = delete;
  TreeCleanup& operator=(const TreeCleanup&) = delete;
  ~TreeCleanup() {
    std::error_code ignored;
    fs::remove_all(tree_ + "/@eaDir", ignored);
    for (const auto& entry : fs::directory_iterator(tree_, ignored)) {
      if (entry.path().filename().string().rfind(kPrefix, 0) == 0) {
        fs::remove_all(entry.path(), ignored);
      }
    }
  }

 private:
  std::string tree_;
};

// ---- The figures ---------------------------------------------------------

class RoadBench {
 public:
  RoadBench(Options options, const TreeCount& count)
      : options_(std::move(options)), count_(count), program_dir_(ProgramDir()) {}

  void Run() {
    const double updatedb_s = options_.baselines ? TimeUpdatedb() : -1;
    Recoll recoll = options_.baselines ? TimeRecoll() : Recoll{};
    FirstIndexNamesOnly(updatedb_s);
    FirstIndexWithContent(recoll);
    IdleMemory();
  }

 private:
  struct Recoll {
    double seconds = -1;
    double peak_mib = 0;
  };

  double FilesPerSecond(double seconds) const {
    return static_cast<double>(count_.files) / seconds;
  }

  std::unique_ptr<System> StartSystem(const std::string& name) {
    return std::make_unique<System>(program_dir_, work_.Join(name), work_.path());
  }

  // plocate's updatedb over the tree alone, no visibility checks and
  // nothing pruned; the fastest of three runs.
  double TimeUpdatedb() {
    const std::string updatedb = FindProgram("updatedb");
    const ProgramOutcome version =
        updatedb.empty() ? ProgramOutcome{} : RunProgram(updatedb, {"--version"}, {}, work_.path());
    if (version.out.find("plocate") == std::string::npos) {
      Note("skipped: updatedb from plocate is not installed (apt-get install plocate)");
      return -1;
    }
    const std::string db = work_.Join("plocate.db");
    const double seconds = orvex::bench::Fastest([&] {
      fs::remove(db);
      const Clock::time_point start = Clock::now();
      const ProgramOutcome run =
          RunProgram(updatedb,
                     {"-l", "0", "-U", options_.tree, "-o", db, "--prunepaths", "", "--prunenames",
                      "", "--prunefs", ""},
                     {}, work_.path());
      if (run.status != 0) throw std::runtime_error("updatedb failed: " + run.err);
      return Seconds(start);
    });
    std::printf("updatedb -l 0: %.2f s, %.0f files/s\n", seconds, FilesPerSecond(seconds));
    return seconds;
  }

  // recollindex with a private configuration whose only top directory is
  // the tree, at our priority (it lowers its own by default) and without
  // its spelling dictionary; one run, its peak memory the largest of its
  // processes.
  Recoll TimeRecoll() {
    const std::string recollindex = FindProgram("recollindex");
    if (recollindex.empty()) {
      Note("skipped: recollindex is not installed (apt-get install recoll)");
      return {};
    }
    const std::string config = work_.Join("recoll");
    fs::create_directories(config);
    WriteFile(config + "/recoll.conf",
              "topdirs = " + options_.tree + "\nnoaspell = 1\nloglevel = 1\nidxniceprio = 0\n");
    const Clock::time_point start = Clock::now();
    const ProgramOutcome run = RunProgram(recollindex, {"-c", config, "-z"}, {}, work_.path());
    Recoll recoll;
    recoll.seconds = Seconds(start);
    recoll.peak_mib = KiBToMiB(run.max_rss_kb);
    if (run.status != 0) throw std::runtime_error("recollindex failed: " + run.err);
    std::printf("recollindex: %.2f s, %.0f files/s, peak %.1f MiB\n", recoll.seconds,
                FilesPerSecond(recoll.seconds), recoll.peak_mib);
    fs::remove_all(config);
    return recoll;
  }

  // From `orvex folder add` to a committed index of every file, one run.
  double TimeFirstIndex(System& system, const std::string& share, bool content) {
    const Clock::time_point start = Clock::now();
    system.AddShareFolder(share, options_.tree, content);
    system.WaitIndexed(share, options_.tree, count_.Documents(), 3600);
    return Seconds(start);
  }

  void FirstIndexNamesOnly(double updatedb_s) {
    double seconds = 0;
    {
      const auto system = StartSystem("names");
      seconds = TimeFirstIndex(*system, "names", /*content=*/false);
      Note("  processor time: " + system->CpuText());
    }
    fs::remove_all(options_.tree + "/@eaDir");
    std::printf("first index, names only: %.2f s, %.0f files/s\n", seconds,
                FilesPerSecond(seconds));
    if (updatedb_s > 0) {
      ReportAtLeast("first index, names only, speed against updatedb", updatedb_s / seconds, "x",
                    kNamesRatioTarget);
    }
  }

  void FirstIndexWithContent(const Recoll& recoll) {
    const auto system = StartSystem("content");
    const double seconds = TimeFirstIndex(*system, "content", /*content=*/true);
    const double peak = system->PeakMiB();
    std::printf("first index, with content: %.2f s, %.0f files/s, daemons' peak %.1f MiB\n",
                seconds, FilesPerSecond(seconds), peak);
    Note("  processor time: " + system->CpuText());
    if (recoll.seconds > 0) {
      ReportAtLeast("first index, with content, speed against recollindex",
                    recoll.seconds / seconds, "x", kContentRatioTarget);
      Report("first index, with content, peak memory against recollindex", peak / recoll.peak_mib,
             "x", 1);
    }
    documents_ = count_.Documents();
    Saves(*system);
    Burst(*system);
    RenameDirectory(*system);
  }

  // Creates dir (and what it holds) and waits until the index has it all.
  void AddAndWait(System& system, const std::string& dir, long long added,
                  const std::function<void()>& make) {
    fs::create_directory(dir);
    if (make) make();
    documents_ += added;
    system.WaitIndexed("content", options_.tree, documents_, 600);
  }

  Json::Value NameQuery(const std::string& fragment) {
    Json::Value query(Json::objectValue);
    query["name"] = fragment;
    return query;
  }

  // Polls query until its total is wanted; the seconds since start.
  double UntilTotal(System& system, const Json::Value& query, long long wanted,
                    Clock::time_point start, double timeout_s) {
    while (system.SearchTotal(query) != wanted) {
      if (Seconds(start) > timeout_s) return -1;
      SleepPoll();
    }
    return Seconds(start);
  }

  void Saves(System& system) {
    const std::string dir = options_.tree + "/" + kPrefix + "-saves";
    AddAndWait(system, dir, 1, nullptr);
    std::vector<double> latencies;
    for (int i = 0; i < options_.saves; ++i) {
      const std::string name = std::string(kPrefix) + "-save-" + std::to_string(i) + "-note.txt";
      const Clock::time_point start = Clock::now();
      WriteFile(dir + "/" + name, "a note saved by the road benchmark\n");
      const double seconds = UntilTotal(system, NameQuery(name), 1, start, 60);
      if (seconds < 0) throw std::runtime_error(name + " not searchable after 60 s");
      latencies.push_back(seconds);
      // At idle: the next save waits until the batch is over.
      system.WaitIndexed("content", options_.tree, ++documents_, 60);
    }
    std::printf("single-file save to searchable, %d saves: p50 %.3f s\n", options_.saves,
                Percentile(latencies, 0.5));
    Report("single-file save to searchable, p99", Percentile(latencies, 0.99), " s",
           kSaveP99TargetS);
  }

  void Burst(System& system) {
    const std::string dir = options_.tree + "/" + kPrefix + "-burst";
    AddAndWait(system, dir, 1, nullptr);
    const std::string fragment = std::string(kPrefix) + "-burst-";
    const long long reads_before = system.ExtractionReads();
    const Clock::time_point start = Clock::now();
    MakeFiles(dir, options_.burst, fragment, /*nested=*/false, "burst\n", 1);
    const double written = Seconds(start);
    const double seconds = UntilTotal(system, NameQuery(fragment), options_.burst, start, 600);
    documents_ += options_.burst;
    // The text files are extracted: the count the rename below must not move.
    std::printf(
        "%d text files created at once (written in %.3f s): all searchable after %.3f s, "
        "extraction workers' read calls meanwhile: %lld\n",
        options_.burst, written, seconds, system.ExtractionReads() - reads_before);
    Report("files created at once to all searchable", seconds < 0 ? 600 : seconds, " s",
           kBurstTargetS);
    system.WaitIndexed("content", options_.tree, documents_, 600);
  }

  // One file in a hundred is a text file, extracted when it is created; the
  // rename itself must extract nothing.
  void RenameDirectory(System& system) {
    const std::string from = options_.tree + "/" + kPrefix + "-rename-from";
    const std::string to = options_.tree + "/" + kPrefix + "-rename-to";
    const int n = options_.rename_files;
    AddAndWait(system, from, 1 + n, [&] {
      MakeFiles(from, n, std::string(kPrefix) + "-moved-", false, "moved\n", 100);
    });
    const long long reads_before = system.ExtractionReads();
    const std::vector<double> cpu_before = system.CpuEach();
    Json::Value below_from(Json::objectValue), below_to(Json::objectValue);
    below_from["folder"] = from;
    below_to["folder"] = to;
    const Clock::time_point start = Clock::now();
    if (::rename(from.c_str(), to.c_str()) != 0) throw std::runtime_error("cannot rename " + from);
    // A search counts large totals only up to a bound, but the move is one
    // commit: searchable once nothing is left below the old path (a count
    // of 0 is exact) and something is below the new one.
    double seconds = -1;
    while (system.SearchTotal(below_from) != 0 || system.SearchTotal(below_to) == 0) {
      if (Seconds(start) > 600) break;
      SleepPoll();
    }
    if (Seconds(start) <= 600) seconds = Seconds(start);
    const long long reads = system.ExtractionReads() - reads_before;
    Note("  processor time: " + system.CpuText(cpu_before));
    std::printf(
        "rename of a directory of %d files: extraction workers' read calls meanwhile: %lld\n", n,
        reads);
    Report("rename of a directory to all searchable", seconds < 0 ? 600 : seconds, " s",
           kRenameTargetS);
    Report("rename of a directory, extraction workers' read calls", static_cast<double>(reads), "",
           0);
  }

  void IdleMemory() {
    const std::string tree = work_.Join("idle-tree");
    const Clock::time_point made = Clock::now();
    MakeFiles(tree, options_.idle_files, "f", /*nested=*/true, "", 1);
    std::printf("idle tree: %d files written in %.1f s\n", options_.idle_files, Seconds(made));
    const auto system = StartSystem("idle");
    const Clock::time_point start = Clock::now();
    system->AddShareFolder("idle", tree, /*content=*/false);
    const long long documents = options_.idle_files + (options_.idle_files + 999) / 1000 + 1;
    system->WaitIndexed("idle", tree, documents, 7200);
    std::printf("idle tree indexed, names only: %.1f s, %.0f files/s\n", Seconds(start),
                options_.idle_files / Seconds(start));
    // Idle: nothing changes for a few of the daemons' rounds.
    std::this_thread::sleep_for(std::chrono::seconds(5));
    const std::string what = " over " + std::to_string(options_.idle_files) + " files";
    for (const char* daemon : {"fileindexd", "kalonotifyd"}) {
      const double mib = KiBToMiB(ProcNumber(system->Pid(daemon), "status", "VmRSS"));
      Report((std::string(daemon) + " idle resident memory" + what).c_str(), mib, " MiB",
             kIdleRssTargetMb);
    }
  }

  Options options_;
  TreeCount count_;
  std::string program_dir_;
  TempDir work_;
  long long documents_ = 0;
};

int Main(int argc, char** argv) {
  Options options;
  try {
    options = ParseOptions(argc, argv);
  } catch (const std::invalid_argument& e) {
    const bool help =
        argc > 1 && (std::string(argv[1]) == "--help" || std::string(argv[1]) == "-h");
    if (!help) std::fprintf(stderr, "road_bench: %s\n", e.what());
    std::fputs(kUsage, help ? stdout : stderr);
    return help ? 0 : 2;
  }
  options.tree = fs::canonical(options.tree).string();
  if (fs::exists(options.tree + "/@eaDir")) {
    std::fprintf(stderr, "road_bench: %s/@eaDir exists: the tree is some share's already\n",
                 options.tree.c_str());
    return 2;
  }
  std::setvbuf(stdout, nullptr, _IOLBF, 0);
  ::signal(SIGPIPE, SIG_IGN);
  ::signal(SIGINT, OnStopSignal);
  ::signal(SIGTERM, OnStopSignal);
  const Clock::time_point start = Clock::now();
  TreeCount count;
  CountInto(options.tree, count);
  std::printf("tree %s: %lld files, %lld directories, %lld others\n", options.tree.c_str(),
              count.files, count.dirs, count.other);
  {
    TreeCleanup cleanup(options.tree);
    RoadBench(options, count).Run();
  }
  std::printf("road_bench took %.0f s\n", Seconds(start));
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  try {
    return Main(argc, argv);
  } catch (const std::exception& e) {
    std::fprintf(stderr, "road_bench: %s\n", e.what());
    return 1;
  }
}
