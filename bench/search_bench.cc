// search_bench: the search daemon (kaloelasticd, run as a child process) on
// a generated share, every figure against its target in one run:
// - the load rate of names and attributes through the socket, as the indexer
//   sends them (compound requests of 1,000 upserts, a commit every 10,000),
//   then of text documents (one in ten, 2-20 KB of text each) in MB/s;
// - the database's size per document;
// - name-fragment searches (top 50), fragments of 1 to 12 characters, common
//   and rare: p50 and p99, each answer checked against a naive scan (the
//   page itself, and the total when it says it is exact);
// - text searches (top 20 by relevance, with snippets): p50 and p99;
// - the same name searches for a user of a share that hides unreadable
//   entries (one file in ten is), as a ratio to root's;
// - the daemon's peak resident memory;
// - where installed, plocate on the same names (its database built by
//   updatedb over the same tree) and recollq on the same words, as ratios.
//
//   build/search_bench [DOCUMENTS] [--commit-every N] [--keep] [--load-only]
//   (1,000,000 documents by default; the daemon is the kaloelasticd built
//   beside this program; --keep leaves the share and index in place;
//   --load-only stops after the loads, for profiles of the write path)
#include <fcntl.h>
#include <json/json.h>
#include <pwd.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <memory>
#include <random>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "bench_timing.h"
#include "kalo/kalo_sock.h"
#include "orvex/elastic.h"
#include "orvex/foundation/json.h"
#include "orvex/portable/share_registry.h"
#include "proc_stats.h"
#include "search/case_fold.h"

namespace fs = std::filesystem;

namespace {

using orvex::bench::Clock;
using orvex::bench::Percentile;
using orvex::bench::Seconds;
using orvex::bench::StatusKiB;

constexpr double kTargetDocsPerSecond = 50000;
constexpr double kTargetNameP50Ms = 5, kTargetNameP99Ms = 20;
constexpr double kTargetTextP50Ms = 50, kTargetTextP99Ms = 200;
constexpr double kTargetTrimRatio = 2;
constexpr double kTargetPeakMb = 200;
constexpr int kCompoundSize = 1000;
constexpr int kTextEvery = 10;    // one document in ten has text
constexpr int kHiddenEvery = 10;  // one file in ten is unreadable to others
constexpr int kFolders = 1000;
constexpr int kRounds = 10;  // of each query
constexpr char kShare[] = "bench";
constexpr char kIndexId[] = "fileindex_bench";
constexpr char kUser[] = "nobody";

const char* const kWords[] = {"holiday", "Report", "IMG",    "draft", "Straße", "final", "scan",
                              "invoice", "Café",   "backup", "notes", "track",  "video", "2024"};
const char* const kExtensions[] = {"jpg", "pdf", "mp3", "txt", "mkv", "docx"};
const char* const kTextWords[] = {"the",    "quarterly", "report",  "shows",   "revenue",
                                  "growth", "in",        "all",     "regions", "Müller",
                                  "signed", "contract",  "budget",  "meeting", "notes",
                                  "draft",  "review",    "approved"};

// Fragments of 1 to 12 characters: common ones (parts of the frequent
// words), rare ones (a document's own number, letters no name holds).
const char* const kFragments[] = {
    "e",          "q",          "ss",          "qz",         "img",          "_4711.",
    "scan",       "é_2",        "final",       "_31337",     "_draft",       "_777777",
    "backup_",    "_9990001",   "invoice_",    "_123456.p",  "holiday_s",    "_4242424.j",
    "report_dra", "strasse_ca", "straße_café", "_99999.mkv", "notes_video_", "qqqqqqqqqqqq"};
// Common and rare words (each document also holds its own "ref<n>"), a
// phrase and a prefix.
const char* const kTextQueries[] = {"the",   "report",   "müller contract", "\"signed contract\"",
                                    "budg*", "ref77777", "ref4242 the",     "approved review"};

std::string Name(std::mt19937& random, int i) {
  std::string name = kWords[random() % 14];
  name += "_";
  name += kWords[random() % 14];
  return name + "_" + std::to_string(i) + "." + kExtensions[random() % 6];
}

struct Share {
  std::string root;  // the share's directory
  std::vector<std::string> names, paths;
};

// The generated files, for the permission check and for plocate: empty,
// mode 0644, one in kHiddenEvery 0600 (root's own).
void MakeTree(const Share& share) {
  for (int f = 0; f < kFolders; ++f) fs::create_directories(share.root + "/d" + std::to_string(f));
  for (size_t i = 0; i < share.paths.size(); ++i) {
    const int fd = ::open(share.paths[i].c_str(), O_WRONLY | O_CREAT | O_CLOEXEC,
                          i % kHiddenEvery == 1 ? 0600 : 0644);
    if (fd < 0) throw std::runtime_error("cannot create " + share.paths[i]);
    ::close(fd);
  }
}

// Generated ASCII and UTF-8 without quotes or backslashes: written as it is.
void AppendQuoted(std::string& out, const std::string& text) {
  out += '"';
  out += text;
  out += '"';
}

// One upsert as the indexer sends it, straight as JSON text: the client's
// own cost stays small beside the daemon's.
void AppendUpsert(std::string& out, const std::string& path, const std::string& name, int i,
                  const std::string* text) {
  out += R"({"command":"document_upsert_by_id","data":{"id":")";
  out += kIndexId;
  out += R"(","doc_id":)";
  AppendQuoted(out, path);
  out += R"(,"data":{"KALOMDPath":)";
  AppendQuoted(out, path);
  out += R"(,"KALOMDFSName":)";
  AppendQuoted(out, name);
  out += R"(,"KALOMDSearchFileName":)";
  AppendQuoted(out, name);
  out += R"(,"KALOMDParent":)";
  AppendQuoted(out, path.substr(0, path.rfind('/')));
  out += R"(,"KALOMDIsDir":false,"KALOMDFSSize":)" + std::to_string(int64_t{i} * 37);
  out += R"(,"KALOMDFSContentChangeDate":)" + std::to_string(1700000000 + i);
  out += R"(,"KALOMDOwnerUserID":"0","KALOMDOwnerGroupID":"0")";
  if (text != nullptr) {
    out += R"(,"KALOMDTitle":"Report )" + std::to_string(i) + R"(","KALOMDTextContent":)";
    AppendQuoted(out, *text);
  }
  out += "}}}";
}

// kaloelasticd --foreground under ORVEX_ROOT=root, stopped with SIGTERM.
class Daemon {
 public:
  explicit Daemon(const std::string& root) : socket_(root + "/var/run/kaloelasticd.sock") {
    const std::string program =
        (fs::read_symlink("/proc/self/exe").parent_path() / "kaloelasticd").string();
    std::fflush(stdout);
    pid_ = ::fork();
    if (pid_ < 0) throw std::runtime_error("fork failed");
    if (pid_ == 0) {
      ::prctl(PR_SET_PDEATHSIG, SIGTERM);  // a benchmark that dies takes it along
      ::setenv("ORVEX_ROOT", root.c_str(), 1);
      ::execl(program.c_str(), program.c_str(), "--foreground", static_cast<char*>(nullptr));
      std::fprintf(stderr, "cannot run %s: %s\n", program.c_str(), std::strerror(errno));
      std::_Exit(127);
    }
    for (int i = 0; i < 500 && !fs::exists(socket_); ++i) {
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
  }
  ~Daemon() {
    ::kill(pid_, SIGTERM);
    int status = 0;
    ::waitpid(pid_, &status, 0);
  }

  pid_t pid() const { return pid_; }

  // One request on a fresh connection, as the library's client sends it.
  Json::Value Ask(const std::string& request) { return Await(Send(request)); }
  Json::Value Ask(const Json::Value& request) { return Ask(orvex::toString(request)); }

  // Ask() in two halves, for a client that prepares its next request while
  // the daemon carries out this one.
  std::unique_ptr<kalodaemon::DomainSockConnection> Send(const std::string& request) {
    auto connection = std::make_unique<kalodaemon::DomainSockConnection>(socket_);
    if (!connection->Connect() || !connection->Send(request)) {
      throw std::runtime_error("cannot send a request: " + std::string(std::strerror(errno)));
    }
    return connection;
  }
  static Json::Value Await(std::unique_ptr<kalodaemon::DomainSockConnection> connection) {
    std::string answer_text;
    Json::Value answer;
    if (!connection->Recv(answer_text) || !orvex::fromString(answer, answer_text) ||
        !answer["success"].asBool() || answer["has_fail"].asBool()) {
      throw std::runtime_error("request failed: " + answer_text.substr(0, 500));
    }
    return answer;
  }

 private:
  std::string socket_;
  pid_t pid_ = -1;
};

Json::Value Command(const char* command) {
  Json::Value req;
  req["command"] = command;
  req["data"]["id"] = kIndexId;
  return req;
}

// Sends the documents i of indexes in compounds of kCompoundSize, with a
// commit every commit_every; the seconds taken.
template <typename Text>
double Load(Daemon& daemon, const Share& share, const std::vector<int>& indexes, int commit_every,
            Text text_of) {
  const std::string commit = orvex::toString(Command("commit"));
  const Clock::time_point start = Clock::now();
  int since_commit = 0;
  // The indexer has its next batch at hand when an answer comes: the next
  // compound is written while the daemon carries out this one.
  std::string request, next;
  auto write_compound = [&](size_t first, std::string& out) {
    out = R"({"compound":[)";
    const size_t end = std::min(indexes.size(), first + kCompoundSize);
    for (size_t k = first; k < end; ++k) {
      if (k != first) out += ',';
      const int i = indexes[k];
      AppendUpsert(out, share.paths[i], share.names[i], i, text_of(i));
    }
    out += "]}";
  };
  if (!indexes.empty()) write_compound(0, next);
  for (size_t first = 0; first < indexes.size(); first += kCompoundSize) {
    const size_t end = std::min(indexes.size(), first + kCompoundSize);
    request.swap(next);
    auto in_flight = daemon.Send(request);
    if (end < indexes.size()) write_compound(end, next);
    Daemon::Await(std::move(in_flight));
    since_commit += static_cast<int>(end - first);
    if (since_commit >= commit_every) {
      daemon.Ask(commit);
      since_commit = 0;
    }
  }
  daemon.Ask(commit);
  return Seconds(start);
}

bool Report(const char* what, double value, const char* unit, double target) {
  const bool pass = value <= target;
  std::printf("  %s: %.2f%s (target <= %g) %s\n", what, value, unit, target,
              pass ? "PASS" : "FAIL");
  return pass;
}

// Milliseconds of each of kRounds runs of every query; prints each query's
// median.
template <typename Ask>
std::vector<double> Latencies(const char* const* queries, size_t count, Ask ask) {
  std::vector<double> ms;
  std::vector<std::vector<double>> per_query(count);
  for (int r = 0; r < kRounds; ++r) {
    for (size_t q = 0; q < count; ++q) {
      const Clock::time_point start = Clock::now();
      ask(q);
      ms.push_back(Seconds(start) * 1000);
      per_query[q].push_back(ms.back());
    }
  }
  std::printf("  p50 of each, ms:");
  for (size_t q = 0; q < count; ++q) {
    std::printf(" %s %.1f%s", queries[q], Percentile(per_query[q], 0.5),
                q + 1 < count ? "," : "\n");
  }
  return ms;
}

Json::Value NameQuery(const std::string& fragment, const char* user) {
  Json::Value req;
  req["command"] = "search";
  req["data"]["id"] = kIndexId;
  req["data"]["name"] = fragment;
  req["data"]["limit"] = 50;
  if (user != nullptr) req["data"]["user"] = user;
  return req;
}

// The naive scan's answer: the first 50 matches in name order, and the count.
bool CheckName(const Share& share, const std::string& fragment, const Json::Value& answer) {
  const std::string folded = orvex::search::FoldCase(fragment);
  std::vector<std::pair<std::string, std::string>> matches;
  for (size_t i = 0; i < share.names.size(); ++i) {
    std::string name = orvex::search::FoldCase(share.names[i]);
    if (name.find(folded) != std::string::npos) matches.emplace_back(name, share.paths[i]);
  }
  const size_t page = std::min<size_t>(50, matches.size());
  std::partial_sort(matches.begin(), matches.begin() + static_cast<long>(page), matches.end());
  const Json::Value& data = answer["data"];
  bool same = data["hits"].size() == page;
  for (size_t i = 0; same && i < page; ++i) {
    same = data["hits"][static_cast<int>(i)]["path"].asString() == matches[i].second;
  }
  const int64_t total = data["total"].asInt64();
  const int64_t naive = static_cast<int64_t>(matches.size());
  const bool exact = data["total_exact"].asBool();
  same = same && (exact ? total == naive : (total >= static_cast<int64_t>(page) && total <= naive));
  std::printf("  \"%s\": %lld matches, total %lld%s, first page %s\n", fragment.c_str(),
              static_cast<long long>(naive), static_cast<long long>(total), exact ? "" : "+",
              same ? "same as a naive scan" : "DIFFERENT from a naive scan");
  return same;
}

bool Installed(const char* program) {
  const std::string command = std::string("command -v ") + program + " >/dev/null 2>&1";
  return std::system(command.c_str()) == 0;
}

// Milliseconds of one run of a shell command, output dropped.
double CommandMs(const std::string& command) {
  const Clock::time_point start = Clock::now();
  if (std::system((command + " >/dev/null 2>&1").c_str()) < 0) return -1;
  return Seconds(start) * 1000;
}

void ComparePlocate(const Share& share, const std::string& dir, double our_p50) {
  if (!Installed("plocate") || !Installed("updatedb")) {
    std::printf("plocate: skipped (plocate or updatedb not installed)\n");
    return;
  }
  const std::string db = dir + "/plocate.db";
  const double build = CommandMs("updatedb -l 0 -U '" + share.root + "' -o '" + db + "'");
  std::vector<double> ms;
  for (int r = 0; r < kRounds; ++r) {
    for (const char* fragment : kFragments) {
      // -i: case-insensitive; plocate matches the whole path, not the name.
      ms.push_back(CommandMs("plocate -d '" + db + "' -i -l 50 '" + fragment + "'"));
    }
  }
  const double p50 = Percentile(ms, 0.5);
  std::printf(
      "plocate (updatedb over the same tree in %.1f s; a process per query, whole paths): name "
      "p50 %.2f ms, p99 %.2f ms; kaloelasticd p50 / plocate p50 = %.2f\n",
      build / 1000, p50, Percentile(ms, 0.99), our_p50 / p50);
}

void CompareRecoll(const std::string& dir, const std::vector<std::string>& texts, double our_p50) {
  if (!Installed("recollq") || !Installed("recollindex")) {
    std::printf("recoll: skipped (recollq or recollindex not installed)\n");
    return;
  }
  // The text documents as files, indexed by recollindex in a private
  // configuration.
  const std::string docs = dir + "/recoll-docs", conf = dir + "/recoll-conf";
  fs::create_directories(docs);
  fs::create_directories(conf);
  for (size_t i = 0; i < texts.size(); ++i) {
    std::ofstream(docs + "/report_" + std::to_string(i) + ".txt") << texts[i];
  }
  std::ofstream(conf + "/recoll.conf") << "topdirs = " << docs << "\n";
  const double build = CommandMs("recollindex -c '" + conf + "'");
  std::vector<double> ms;
  for (int r = 0; r < kRounds; ++r) {
    for (const char* words : kTextQueries) {
      ms.push_back(CommandMs("recollq -c '" + conf + "' -n 20 -A '" + std::string(words) + "'"));
    }
  }
  const double p50 = Percentile(ms, 0.5);
  std::printf(
      "recoll (%zu text files indexed in %.1f s; a process per query, with abstracts): text p50 "
      "%.2f ms, p99 %.2f ms; kaloelasticd p50 / recollq p50 = %.2f\n",
      texts.size(), build / 1000, p50, Percentile(ms, 0.99), our_p50 / p50);
}

// A rare word of document i, so that some queries match one document.
std::string TextOf(int i, std::mt19937& random) {
  std::string text = "ref" + std::to_string(i) + " ";
  const size_t bytes = 2048 + random() % (18 * 1024);
  while (text.size() < bytes) {
    text += kTextWords[random() % 18];
    text += (random() % 12 == 0) ? ". " : " ";
  }
  return text;
}

struct Options {
  int count = 1000000;
  int commit_every = 10000;
  bool keep = false;
  bool load_only = false;
};

// Removes the share and index, or with keep says where they are.
void Leave(const std::string& dir, bool keep) {
  if (keep) {
    std::printf("kept: %s\n", dir.c_str());
  } else {
    fs::remove_all(dir);
  }
}

int Run(const Options& options) {
  const int count = options.count, commit_every = options.commit_every;
  char dir_template[] = "/tmp/search-bench-XXXXXX";
  if (::mkdtemp(dir_template) == nullptr) return 1;
  const std::string dir = dir_template;
  ::chmod(dir.c_str(), 0755);  // the user of the permission check reaches the share
  Share share;
  share.root = dir + "/volume1/" + kShare;
  std::mt19937 random(42);
  for (int i = 0; i < count; ++i) {
    share.names.push_back(Name(random, i));
    // Folder by folder, as the indexer's crawl sends them.
    const int64_t folder = int64_t{i} * kFolders / count;
    share.paths.push_back(share.root + "/d" + std::to_string(folder) + "/" + share.names.back());
  }
  const double tree_seconds = orvex::bench::SecondsOf([&] { MakeTree(share); });
  std::printf("share: %d files in %d folders under %s, made in %.1f s\n", count, kFolders,
              share.root.c_str(), tree_seconds);
  orvex::portable::ShareRecord record;
  record.name = kShare;
  record.path = share.root;
  record.hide_unreadable = true;
  record.privileges[kUser] = orvex::portable::kSharePrivReadOnly;
  fs::create_directories(dir + "/etc/orvex");
  std::ofstream(dir + "/etc/orvex/shares.json") << orvex::portable::FormatShareRegistry({record});

  bool pass = true;
  Daemon daemon(dir);
  Json::Value create = Command("index_create");
  create["data"]["path"] = share.root + "/@eaDir/@fileindex/db";
  create["data"]["settings"] = Json::Value(Json::objectValue);
  create["data"]["mappings"] = orvex::fileindex::elastic::GetFileIndexMappings();
  daemon.Ask(create);

  std::vector<int> plain, with_text;
  for (int i = 0; i < count; ++i) (i % kTextEvery == 0 ? with_text : plain).push_back(i);
  const std::clock_t cpu_start = std::clock();
  const double daemon_cpu_start = orvex::bench::ProcessorSeconds(daemon.pid());
  const double seconds =
      Load(daemon, share, plain, commit_every, [](int) -> const std::string* { return nullptr; });
  const double client_cpu = static_cast<double>(std::clock() - cpu_start) / CLOCKS_PER_SEC;
  const double daemon_cpu = orvex::bench::ProcessorSeconds(daemon.pid()) - daemon_cpu_start;
  const double rate = static_cast<double>(plain.size()) / seconds;
  const bool load_pass = rate >= kTargetDocsPerSecond;
  pass &= load_pass;
  std::printf(
      "load names and attributes: %zu documents in %.2f s (client %.2f s of processor time, "
      "daemon %.2f s: %.0f documents per daemon processor second): %.0f documents/s (compounds "
      "of %d, commit every %d; target >= %.0f) %s\n",
      plain.size(), seconds, client_cpu, daemon_cpu,
      static_cast<double>(plain.size()) / std::max(daemon_cpu, 0.01), rate, kCompoundSize,
      commit_every, kTargetDocsPerSecond, load_pass ? "PASS" : "FAIL");
  std::fflush(stdout);

  std::mt19937 text_random(7);
  std::string text;
  double text_bytes = 0;
  std::vector<std::string> recoll_texts;  // a sample, for recoll
  const double text_seconds = Load(daemon, share, with_text, commit_every, [&](int i) {
    text = TextOf(i, text_random);
    text_bytes += static_cast<double>(text.size());
    if (recoll_texts.size() < 2000) recoll_texts.push_back(text);
    return &text;
  });
  std::printf(
      "load text documents: %zu documents, %.1f MB of text in %.2f s: %.1f MB/s, %.0f "
      "documents/s\n",
      with_text.size(), text_bytes / (1 << 20), text_seconds, text_bytes / (1 << 20) / text_seconds,
      static_cast<double>(with_text.size()) / text_seconds);
  const Json::Value stats = daemon.Ask(Command("stats"));
  const double bytes = stats["data"]["indexes"][0]["bytes"].asDouble();
  std::printf("database: %.1f MB, %.0f bytes per document (%d documents)\n", bytes / (1 << 20),
              bytes / count, count);
  std::fflush(stdout);
  std::printf("daemon peak resident memory after the loads: %.1f MB\n",
              static_cast<double>(StatusKiB(daemon.pid(), "VmHWM")) / 1024);
  if (options.load_only) {
    Leave(dir, options.keep);
    return pass ? 0 : 1;
  }

  std::printf("name fragments (top 50), checked:\n");
  bool same = true;
  for (const char* fragment : kFragments) {
    same &= CheckName(share, fragment, daemon.Ask(NameQuery(fragment, nullptr)));
  }
  const size_t fragments = std::size(kFragments);
  const std::vector<double> name_ms = Latencies(
      kFragments, fragments, [&](size_t q) { daemon.Ask(NameQuery(kFragments[q], nullptr)); });
  std::printf("name fragments: %zu queries x %d rounds through the socket:\n", fragments, kRounds);
  const double name_p50 = Percentile(name_ms, 0.5);
  pass &= Report("p50", name_p50, " ms", kTargetNameP50Ms);
  pass &= Report("p99", Percentile(name_ms, 0.99), " ms", kTargetNameP99Ms);
  pass &= same;

  const size_t texts = std::size(kTextQueries);
  const std::vector<double> text_ms = Latencies(kTextQueries, texts, [&](size_t q) {
    Json::Value req;
    req["command"] = "search";
    req["data"]["id"] = kIndexId;
    req["data"]["text"] = kTextQueries[q];
    req["data"]["sort"] = "relevance";
    req["data"]["limit"] = 20;
    const Json::Value answer = daemon.Ask(req);
    if (answer["data"]["hits"].size() > 0 && answer["data"]["hits"][0]["snippet"].empty()) {
      throw std::runtime_error(std::string("no snippet for ") + kTextQueries[q]);
    }
  });
  std::printf("text queries (top 20 by relevance, with snippets): %zu queries x %d rounds:\n",
              texts, kRounds);
  const double text_p50 = Percentile(text_ms, 0.5);
  pass &= Report("p50", text_p50, " ms", kTargetTextP50Ms);
  pass &= Report("p99", Percentile(text_ms, 0.99), " ms", kTargetTextP99Ms);

  if (::getpwnam(kUser) == nullptr || ::geteuid() != 0) {
    std::printf("permission trimming: skipped (needs root and user %s)\n", kUser);
  } else {
    const std::vector<double> user_ms = Latencies(
        kFragments, fragments, [&](size_t q) { daemon.Ask(NameQuery(kFragments[q], kUser)); });
    const double user_p50 = Percentile(user_ms, 0.5);
    std::printf(
        "name fragments as user %s (share hides unreadable entries, 1 file in %d): p50 "
        "%.2f ms, p99 %.2f ms\n",
        kUser, kHiddenEvery, user_p50, Percentile(user_ms, 0.99));
    pass &= Report("trimmed p50 / root p50", user_p50 / name_p50, "", kTargetTrimRatio);
  }
  const double peak_mb = static_cast<double>(StatusKiB(daemon.pid(), "VmHWM")) / 1024;
  pass &= Report("daemon peak resident memory", peak_mb, " MB", kTargetPeakMb);
  std::fflush(stdout);

  ComparePlocate(share, dir, name_p50);
  CompareRecoll(dir, recoll_texts, text_p50);
  Leave(dir, options.keep);
  return pass ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
  Options options;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--commit-every" && i + 1 < argc) {
      options.commit_every = std::atoi(argv[++i]);
    } else if (arg == "--keep") {
      options.keep = true;
    } else if (arg == "--load-only") {
      options.load_only = true;
    } else if (!arg.empty() && std::isdigit(static_cast<unsigned char>(arg[0]))) {
      options.count = std::atoi(arg.c_str());
    } else {
      std::fprintf(stderr,
                   "usage: search_bench [DOCUMENTS] [--commit-every N] [--keep] [--load-only]\n");
      return 2;
    }
  }
  if (options.count < kTextEvery || options.commit_every <= 0) return 2;
  try {
    return Run(options);
  } catch (const std::exception& e) {
    std::fprintf(stderr, "search_bench: %s\n", e.what());
    return 1;
  }
}
