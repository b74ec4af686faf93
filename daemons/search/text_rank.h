// The relevance of a text match: BM25 over the words table as FTS5's own
// bm25() computes it, except that the number of documents holding each
// phrase comes from the caller. bm25() counts them by reading every match of
// every phrase when a query starts, which for a phrase of common words means
// checking the word positions of nearly every document; the caller counts
// them up to a bound and estimates beyond it (index_search.cc).
//
//   orvex_rank(words, holding_1, holding_2, ...)
//
// One count per phrase, in the order the phrases appear in the query; a
// negative count (an excluded phrase) or a missing one weighs nothing.
// Lower is better, as with bm25(), so that ascending order puts the best
// first.
#ifndef ORVEX_SEARCH_TEXT_RANK_H_
#define ORVEX_SEARCH_TEXT_RANK_H_

#include <sqlite3.h>

namespace orvex {
namespace search {

inline constexpr char kTextRank[] = "orvex_rank";

// Registers orvex_rank on the connection db. Throws SearchError kStorage
// when SQLite has no FTS5.
void RegisterTextRank(sqlite3* db);

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_TEXT_RANK_H_
