// folder_bench: what the folder list costs at its size limit. Prints, each
// measured in this run against a real share, folder file and queue in a
// temporary ORVEX_ROOT:
//  - GetMostSuitableCfg with 1000 folders: the first call (which fills every
//    folder's cached full path from the share registry) and the time per
//    call afterwards, the lookup the daemon makes once per indexed file;
//  - the web API's folder list of all 1000 folders sorted by path, without
//    the status section and with it, the status built as the list builds it
//    (GetDataWithAdditional(["status"]) per folder) while the share's queue
//    holds 100,000 lines, all below 10 of the folders;
//  - what one folder's status costs and where it goes: the folder file load
//    that each queue scan makes, and one full scan of the queue.
// Usage: folder_bench [QUEUE_LINES] (default 100000).
#include <stdlib.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "bench_timing.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/log.h"
#include "orvex/queue/queue_mgr.h"

namespace {

using orvex::bench::SecondsOf;
using orvex::fileindex::Folder;
using orvex::fileindex::FolderMgr;
using orvex::fileindex::QueueMgr;

constexpr int kGroups = 10;            // top-level folders
constexpr int kPerGroup = 99;          // subfolders of each
constexpr int kBusyFolders = 10;       // subfolders the queue's events lie below
constexpr int kLookups = 200000;       // GetMostSuitableCfg calls timed
constexpr int kPlainListRepeats = 20;  // lists without status timed
constexpr char kShare[] = "bench";

// A temporary ORVEX_ROOT holding the share, its folders, the folder file, a
// status file and the share's queue; removed at exit.
class BenchRoot {
 public:
  BenchRoot() {
    char pattern[] = "/tmp/orvex-folder-bench-XXXXXX";
    if (::mkdtemp(pattern) == nullptr) throw std::runtime_error("mkdtemp failed");
    path_ = pattern;
    ::setenv("ORVEX_ROOT", path_.c_str(), 1);
    share_root_ = path_ + "/volume1/" + kShare;
  }
  ~BenchRoot() { std::filesystem::remove_all(path_); }

  const std::string& share_root() const { return share_root_; }

  // 10 top-level folders with 99 subfolders each: 1000 folders, written to
  // the folder file in a shuffled order, each with a real directory.
  void MakeFolders() {
    Write("etc/orvex/shares.json",
          "[{\"name\": \"" + std::string(kShare) + "\", \"path\": \"" + share_root_ + "\"}]");
    Write("var/packages/Orvex/etc/fileindex.status", "{\"resume_time\": -1}");
    Json::Value folders(Json::arrayValue);
    for (int g = 0; g < kGroups; ++g) {
      const std::string group = "/" + std::string(kShare) + "/Group" + std::to_string(g);
      folders.append(Record(group, "Group " + std::to_string(g)));
      for (int f = 0; f < kPerGroup; ++f) {
        folders.append(Record(group + "/album" + std::to_string(f), "Album " + std::to_string(f)));
      }
    }
    std::vector<Json::Value> shuffled(folders.begin(), folders.end());
    std::shuffle(shuffled.begin(), shuffled.end(), std::mt19937(42));
    Json::Value list(Json::arrayValue);
    for (const Json::Value& folder : shuffled) {
      const std::string inside = folder["path"].asString().substr(1 + std::string(kShare).size());
      std::filesystem::create_directories(share_root_ + inside);
      list.append(folder);
    }
    Write("var/packages/Orvex/etc/fileindex.folders", orvex::toString(list));
  }

  // lines create events spread over files below the first kBusyFolders
  // subfolders of Group0.
  void MakeQueue(int lines) {
    std::filesystem::create_directories(share_root_ + "/@eaDir/@fileindex");
    std::ofstream queue(share_root_ + "/@eaDir/@fileindex/queue");
    for (int i = 0; i < lines; ++i) {
      queue << "{\"event\":64,\"is_dir\":false,\"path\":\"" << share_root_ << "/Group0/album"
            << i % kBusyFolders << "/IMG_" << i << ".JPG\"}\n";
    }
  }

 private:
  static Json::Value Record(const std::string& path, const std::string& name) {
    Json::Value folder(Json::objectValue);
    folder["path"] = path;
    folder["name"] = name;
    folder["document"] = true;
    folder["audio"] = false;
    folder["video"] = true;
    folder["photo"] = true;
    return folder;
  }
  void Write(const std::string& rel, const std::string& text) const {
    const std::string full = path_ + "/" + rel;
    std::filesystem::create_directories(std::filesystem::path(full).parent_path());
    std::ofstream(full) << text;
  }

  std::string path_;
  std::string share_root_;
};

// The daemon's lookup: files at several depths, inside and outside folders.
void BenchGoverningFolder(const BenchRoot& root) {
  std::vector<std::string> probes;
  for (int i = 0; i < 1000; ++i) {
    const std::string group = root.share_root() + "/Group" + std::to_string(i % kGroups);
    probes.push_back(group + "/album" + std::to_string(i % kPerGroup) + "/2024/IMG_" +
                     std::to_string(i) + ".JPG");
    probes.push_back(group + "/loose_" + std::to_string(i) + ".pdf");
    probes.push_back(root.share_root() + "/unindexed/" + std::to_string(i) + ".mp3");
  }
  const FolderMgr mgr;
  const double first = SecondsOf([&] { mgr.GetMostSuitableCfg(probes[0]); });
  size_t found = 0;
  const double loop = SecondsOf([&] {
    for (int i = 0; i < kLookups; ++i) {
      found += mgr.GetMostSuitableCfg(probes[i % probes.size()]) ? 1 : 0;
    }
  });
  std::printf(
      "GetMostSuitableCfg, %zu folders: first call %.1f ms (fills the full-path caches), "
      "then %.0f ns per call (%d calls, %zu governed)\n",
      mgr.GetFolders().size(), first * 1e3, loop / kLookups * 1e9, kLookups, found);
}

// FolderList as the web API builds it: load, List, one record per folder.
size_t ListAll(const Json::Value& additional, std::vector<std::string>* texts = nullptr) {
  const FolderMgr mgr;
  std::vector<std::shared_ptr<Folder>> page;
  unsigned int total = 0;
  mgr.List(page, total, 0, orvex::fileindex::kFileIndexFoldersMax, "path", "asc");
  Json::Value reply(Json::arrayValue);
  for (const auto& folder : page) {
    reply.append(folder->GetDataWithAdditional(additional));
    if (texts) texts->push_back(reply[reply.size() - 1]["additional"]["status"]["text"].asString());
  }
  return reply.size();
}

void BenchList(const BenchRoot& root, int queue_lines) {
  size_t listed = 0;
  const double plain = SecondsOf([&] {
    for (int i = 0; i < kPlainListRepeats; ++i) listed = ListAll(Json::Value(Json::arrayValue));
  });
  std::printf(
      "FolderList, %zu folders sorted by path, no status: %.1f ms per list "
      "(load, sort, records)\n",
      listed, plain / kPlainListRepeats * 1e3);

  std::vector<std::string> texts;
  Json::Value status(Json::arrayValue);
  status.append("status");
  const double with_status = SecondsOf([&] { ListAll(status, &texts); });
  const long processing = std::count(texts.begin(), texts.end(), "processing");
  const long finished = std::count(texts.begin(), texts.end(), "finished");
  std::printf(
      "FolderList, %zu folders sorted by path, with status, %d-line queue: %.2f s "
      "(%.1f ms per folder; %ld processing, %ld finished)\n",
      texts.size(), queue_lines, with_status, with_status / texts.size() * 1e3, processing,
      finished);

  // Best of three: single runs of these are at the mercy of other processes.
  double load = 1e9;
  double scan = 1e9;
  QueueMgr queue(root.share_root() + "/@eaDir/@fileindex/queue");
  for (int i = 0; i < 3; ++i) {
    load = std::min(load, SecondsOf([] { FolderMgr mgr; }));
    const std::string asked = root.share_root() + "/Group9";
    scan = std::min(scan, SecondsOf([&] { queue.IsFullPathProcessing(asked); }));
  }
  std::printf(
      "  where a finished folder's status goes: folder file load %.2f ms (once per "
      "queue question), full scan of the queue %.1f ms (%.2f us per line)\n",
      load * 1e3, (scan - load) * 1e3, (scan - load) / queue_lines * 1e6);
}

}  // namespace

int main(int argc, char** argv) {
  const int queue_lines = argc > 1 ? std::atoi(argv[1]) : 100000;
  if (queue_lines <= 0) {
    std::fprintf(stderr, "usage: folder_bench [QUEUE_LINES]\n");
    return 2;
  }
  // Failed checks would go to the system log; a benchmark keeps it clean.
  orvex::SetLogSink([](int, const std::string&) {});
  std::setvbuf(stdout, nullptr, _IOLBF, 0);
  BenchRoot root;
  root.MakeFolders();
  root.MakeQueue(queue_lines);
  BenchGoverningFolder(root);
  BenchList(root, queue_lines);
  return 0;
}
