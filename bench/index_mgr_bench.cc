// index_mgr_bench: what the web API's folder list with the status section
// costs at scale. In a temporary ORVEX_ROOT it registers 20 shares with 50
// indexed folders each (1,000 in all) and fills each share's live queue with
// QUEUE_LINES lines (default 100,000), all below the first folder of the
// share: every other folder is "finished", which only a scan of the whole
// queue can tell. Prints, fastest of three runs:
//  - FolderList of all 1,000 folders with ["status"] (target <= 0.5 s);
//  - the same page built as it was before, each folder's
//    GetDataWithAdditional(["status"]) on its own (each one reloading the
//    folder file and rescanning its share's queue), measured over the first
//    SAMPLE folders (default 40) and scaled to 1,000, and the ratio;
//  - whether both give the same page (compared on the sampled folders).
// Usage: index_mgr_bench [QUEUE_LINES] [SAMPLE]
#include <stdlib.h>
#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "bench_timing.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/log.h"
#include "orvex/index_mgr.h"

namespace {

using orvex::bench::Fastest;
using orvex::bench::Report;
using orvex::bench::SecondsOf;
using orvex::fileindex::FolderMgr;

constexpr int kShares = 20;
constexpr int kFoldersPerShare = 50;

std::string MakeRoot() {
  char pattern[] = "/tmp/orvex-index-mgr-bench-XXXXXX";
  if (::mkdtemp(pattern) == nullptr) {
    std::perror("mkdtemp");
    std::exit(1);
  }
  return pattern;
}

void WriteFile(const std::string& path, const std::string& text) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
}

// Shares, folders (written as the folder file stores them) and queues.
void Populate(const std::string& root, long queue_lines) {
  Json::Value shares(Json::arrayValue);
  Json::Value folders(Json::arrayValue);
  for (int s = 0; s < kShares; ++s) {
    const std::string name = "share" + std::to_string(s);
    const std::string share_root = root + "/volume1/" + name;
    Json::Value share(Json::objectValue);
    share["name"] = name;
    share["path"] = share_root;
    shares.append(share);
    for (int f = 0; f < kFoldersPerShare; ++f) {
      const std::string dir = "folder" + std::to_string(f);
      std::filesystem::create_directories(share_root + "/" + dir);
      Json::Value folder(Json::objectValue);
      folder["path"] = "/" + name + "/" + dir;
      folder["name"] = name + " " + dir;
      for (const char* type : {"document", "audio", "video", "photo"}) folder[type] = true;
      folder["paused"] = false;
      folder["volume_to_be_clean"] = "";
      folders.append(folder);
    }
    std::string queue;
    queue.reserve(static_cast<size_t>(queue_lines) * 90);
    for (long i = 0; i < queue_lines; ++i) {
      queue += "{\"event\":2,\"is_dir\":false,\"path\":\"" + share_root + "/folder0/sub" +
               std::to_string(i % 97) + "/file" + std::to_string(i) + ".txt\"}\n";
    }
    WriteFile(share_root + "/@eaDir/@fileindex/queue", queue);
  }
  WriteFile(root + "/etc/orvex/shares.json", orvex::toString(shares));
  WriteFile(root + "/var/packages/Orvex/etc/fileindex.folders", orvex::toString(folders));
}

Json::Value StatusOnly() {
  Json::Value additional(Json::arrayValue);
  additional.append("status");
  return additional;
}

}  // namespace

int main(int argc, char** argv) {
  const long queue_lines = argc > 1 ? std::atol(argv[1]) : 100000;
  const size_t sample = argc > 2 ? static_cast<size_t>(std::atol(argv[2])) : 40;
  const std::string root = MakeRoot();
  ::setenv("ORVEX_ROOT", root.c_str(), 1);
  orvex::SetLogSink([](int, const std::string&) {});
  Populate(root, queue_lines);
  std::printf("%d shares x %d folders, %ld queue lines per share\n", kShares, kFoldersPerShare,
              queue_lines);

  const Json::Value additional = StatusOnly();
  Json::Value page;
  const double fast = Fastest([&] {
    return SecondsOf(
        [&] { orvex::fileindex::FolderList(page, 0, 1000, "name", "asc", additional); });
  });
  const bool pass = Report("FolderList of 1000 folders with status", fast, " s", 0.5);

  // The page as each record builds it on its own, over the first folders.
  std::vector<FolderMgr::FolderPtr> folders;
  unsigned total = 0;
  FolderMgr().List(folders, total, 0, 1000, "name", "asc");
  folders.resize(std::min(sample, folders.size()));
  Json::Value naive(Json::arrayValue);
  const double naive_sample = SecondsOf([&] {
    for (const auto& folder : folders) naive.append(folder->GetDataWithAdditional(additional));
  });
  const double naive_total = naive_sample * static_cast<double>(total) / folders.size();
  std::printf("each folder on its own: %.3f s for %zu folders, about %.1f s for %u\n", naive_sample,
              folders.size(), naive_total, total);
  std::printf("speed-up: %.0fx\n", naive_total / fast);
  bool same = true;
  for (Json::ArrayIndex i = 0; i < naive.size(); ++i) {
    same = same && orvex::toString(naive[i]) == orvex::toString(page["folder"][i]);
  }
  std::printf("same page as each folder on its own: %s\n", same ? "yes" : "NO");

  std::filesystem::remove_all(root);
  return pass && same ? 0 : 1;
}
