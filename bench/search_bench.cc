// search_bench: the search daemon's engine on a generated share. Prints the
// load rate (documents per second, committing every 1,000, as the indexer
// does), the database size, and the time of name-fragment searches (top 50)
// of 2, 3 and 8 characters, each checked against a naive scan's match count.
//
//   build/search_bench [DOCUMENTS [--keep]]   (default 100000; --keep leaves the
//   database in place and prints its path, for a closer look)
#include <json/json.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <random>
#include <string>
#include <vector>

#include "bench_timing.h"
#include "search/case_fold.h"
#include "search/index_store.h"

namespace {

using orvex::bench::Clock;
using orvex::bench::Seconds;

const char* const kWords[] = {"holiday", "Report", "IMG",    "draft", "Straße", "final", "scan",
                              "invoice", "Café",   "backup", "notes", "track",  "video", "2024"};
const char* const kExtensions[] = {"jpg", "pdf", "mp3", "txt", "mkv", "docx"};

std::string Name(std::mt19937& random, int i) {
  std::string name = kWords[random() % 14];
  name += "_";
  name += kWords[random() % 14];
  return name + "_" + std::to_string(i) + "." + kExtensions[random() % 6];
}

Json::Value Document(const std::string& path, const std::string& name, int i) {
  Json::Value doc;
  doc["KALOMDPath"] = path;
  doc["KALOMDFSName"] = name;
  doc["KALOMDSearchFileName"] = name;
  doc["KALOMDParent"] = path.substr(0, path.rfind('/'));
  doc["KALOMDIsDir"] = false;
  doc["KALOMDFSSize"] = i * 37;
  doc["KALOMDFSContentChangeDate"] = 1700000000 + i;
  doc["KALOMDOwnerUserID"] = "1000";
  return doc;
}

}  // namespace

int main(int argc, char** argv) {
  const int count = argc > 1 ? std::atoi(argv[1]) : 100000;
  char dir_template[] = "/tmp/search-bench-XXXXXX";
  if (::mkdtemp(dir_template) == nullptr) return 1;
  const std::string dir = dir_template;
  const std::string db = dir + "/db";
  std::mt19937 random(42);
  std::vector<std::string> names;
  {
    orvex::search::IndexStore store(db, /*create=*/true);
    const Clock::time_point start = Clock::now();
    for (int i = 0; i < count; ++i) {
      names.push_back(Name(random, i));
      const std::string path = "/volume1/share/d" + std::to_string(i % 300) + "/" + names.back();
      store.Upsert(path, Document(path, names.back(), i));
      if (i % 1000 == 999) store.Commit();
    }
    store.Commit();
    const double seconds = Seconds(start);
    std::printf("load: %d documents in %.2f s: %.0f documents/s (commit every 1000)\n", count,
                seconds, count / seconds);
    store.Close();
  }
  std::printf("database: %.1f MB\n",
              static_cast<double>(std::filesystem::file_size(db)) / (1 << 20));
  orvex::search::IndexStore store(db, /*create=*/false);
  for (const std::string fragment : {"ss", "str", "voice_b", "stRASSe_c", "é_"}) {
    const std::string folded = orvex::search::FoldCase(fragment);
    long naive = 0;
    for (const std::string& name : names) {
      naive += orvex::search::FoldCase(name).find(folded) != std::string::npos;
    }
    orvex::search::SearchQuery q;
    q.name = fragment;
    q.limit = 50;
    const int rounds = 20;
    orvex::search::SearchResult result;
    const double best = orvex::bench::Fastest([&] {
      return orvex::bench::SecondsOf([&] {
        for (int r = 0; r < rounds; ++r) result = store.Search(q);
      });
    });
    std::printf("name \"%s\": %lld matches (naive scan %ld, %s), top 50 in %.3f ms\n",
                fragment.c_str(), static_cast<long long>(result.total), naive,
                result.total == naive ? "same" : "DIFFERENT", best / rounds * 1000);
  }
  if (argc > 2 && std::string(argv[2]) == "--keep") {
    std::printf("kept: %s\n", db.c_str());
  } else {
    std::filesystem::remove_all(dir);
  }
  return 0;
}
