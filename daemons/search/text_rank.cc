#include "search/text_rank.h"

#include <cmath>
#include <string>
#include <vector>

#include "search/search_error.h"
#include "search/sqlite_db.h"

namespace orvex {
namespace search {
namespace {

// BM25's usual constants, those of FTS5's bm25().
constexpr double kK1 = 1.2;
constexpr double kB = 0.75;
// A phrase in more than half the documents still weighs a little, so that
// holding it beats not holding it.
constexpr double kLeastWeight = 1e-6;

double InverseDocumentFrequency(double documents, double holding) {
  const double idf = std::log((documents - holding + 0.5) / (holding + 0.5));
  return idf > 0 ? idf : kLeastWeight;
}

void Rank(const Fts5ExtensionApi* api, Fts5Context* fts, sqlite3_context* out, int argc,
          sqlite3_value** argv) {
  sqlite3_int64 rows = 0, all_tokens = 0;
  int row_tokens = 0, instances = 0;
  if (api->xRowCount(fts, &rows) != SQLITE_OK ||
      api->xColumnTotalSize(fts, -1, &all_tokens) != SQLITE_OK ||
      api->xColumnSize(fts, -1, &row_tokens) != SQLITE_OK ||
      api->xInstCount(fts, &instances) != SQLITE_OK) {
    sqlite3_result_error(out, "orvex_rank: cannot read the match", -1);
    return;
  }
  const int phrases = api->xPhraseCount(fts);
  std::vector<int> hits(static_cast<size_t>(phrases), 0);
  for (int i = 0; i < instances; ++i) {
    int phrase = 0, column = 0, offset = 0;
    if (api->xInst(fts, i, &phrase, &column, &offset) == SQLITE_OK && phrase >= 0 &&
        phrase < phrases) {
      ++hits[static_cast<size_t>(phrase)];
    }
  }
  const double average = rows > 0 && all_tokens > 0
                             ? static_cast<double>(all_tokens) / static_cast<double>(rows)
                             : 1.0;
  const double norm = kK1 * (1 - kB + kB * row_tokens / average);
  double score = 0;
  for (int p = 0; p < phrases && p < argc; ++p) {
    const double holding = sqlite3_value_double(argv[p]);
    const double f = hits[static_cast<size_t>(p)];
    if (holding < 0 || f == 0) continue;
    score +=
        InverseDocumentFrequency(static_cast<double>(rows), holding) * f * (kK1 + 1) / (f + norm);
  }
  sqlite3_result_double(out, -score);
}

}  // namespace

void RegisterTextRank(sqlite3* db) {
  fts5_api* api = Fts5Api(db);
  if (api == nullptr ||
      api->xCreateFunction(api, kTextRank, nullptr, &Rank, nullptr) != SQLITE_OK) {
    throw SearchError(kStorage, std::string("cannot register the function ") + kTextRank + ": " +
                                    sqlite3_errmsg(db));
  }
}

}  // namespace search
}  // namespace orvex
