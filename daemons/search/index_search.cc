// IndexStore::Search: user searches over the committed state of one index.
//
// Each query takes the plan that reads the least for its page:
// - a name fragment alone, in name order (the usual search): a fragment that
//   matches many names is found by walking the folded-name index in order
//   and keeping the matches, which stops at the page's end; one that matches
//   few is looked up in name_grams and its matches sorted. Which one: a
//   sample of the names spread over the index tells first; for three code
//   points or more name_grams then counts the matches up to a bound (a
//   short fragment is a prefix query there, which gathers every match
//   before its first row). Names that begin with the fragment (the way most people search) lie
//   together in the folded-name index: when they are most of the matches,
//   their page is read there, and only the others are sorted.
// - words: the matches are ordered by their keys alone (the best-ranked of a
//   bounded set for "relevance"), and only the page's hits get a snippet.
// - anything else: one SQL query over the filters.
// Counting is bounded too: "total" is exact below the bound, and otherwise a
// lower bound (SearchResult::exact).
#include <algorithm>
#include <cmath>
#include <iterator>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "search/case_fold.h"
#include "search/index_store.h"
#include "search/search_error.h"
#include "search/text_rank.h"

namespace orvex {
namespace search {
namespace {

// Fragments shorter than this are prefix queries on name_grams, or a scan.
constexpr size_t kTrigram = 3;
// Matches are counted at least this far before "total" becomes a bound.
constexpr int64_t kCountBound = 1000;
// ... and at most this far, however deep the page.
constexpr int64_t kMaxCountBound = 50000;
// A walk of the name index reads at least this many times the count
// bound's worth of entries before it gives up for a sort.
constexpr int64_t kShortWalkFactor = 4;
// A fragment estimated to match this many times the count bound is taken
// to be common.
constexpr int64_t kCommonFactor = 2;
// A short fragment's share of the names is estimated on this many stretches
// of this many documents, spread over the row ids (the order they came in,
// which is not the name order: the walk's own start says little of the rest).
constexpr int64_t kSampleStretches = 8;
constexpr int64_t kSampleStretch = 250;
// A text query sorted by relevance ranks at most this many matches (more
// than the page asks): bm25 over every document holding a common word would
// cost a pass over all of them.
constexpr int64_t kRankedSet = 2000;
// A phrase's documents are counted this far for its weight in the ranking,
// and estimated beyond.
constexpr int64_t kPhraseCountBound = 2000;

constexpr char kHitColumns[] =
    "d.path, d.name, d.type, d.is_dir, d.size, d.mtime, d.ctime, d.crtime, d.owner, "
    "d.folded_name";
constexpr int kHitColumnCount = 10;

std::string Quoted(const std::string& text) {
  std::string out = "\"";
  for (const char c : text) {
    out += c;
    if (c == '"') out += '"';
  }
  return out + "\"";
}

// A folded fragment as a name_grams query: the phrase of its trigrams, or
// a prefix of one token when it is shorter (see name_tokenizer.h).
std::string NameMatch(const std::string& folded) {
  return Quoted(folded) + (CodePointCount(folded) < kTrigram ? "*" : "");
}

// One term of a text query as the user wrote it: a word, a word* or a
// "phrase", each quoted for FTS5 so that no user text is read as FTS5
// syntax (AND, NEAR, column filters); a leading "-" excludes it.
struct TextTerm {
  std::string match;  // empty: nothing searchable ("*", "", "-")
  bool excluded = false;
  bool is_or = false;  // the bare word OR
};

TextTerm NextTextTerm(const std::string& query, size_t& i) {
  TextTerm term;
  if (query[i] == '-') {
    term.excluded = true;
    ++i;
  }
  if (i < query.size() && query[i] == '"') {
    const size_t end = query.find('"', i + 1);
    const std::string phrase =
        query.substr(i + 1, end == std::string::npos ? std::string::npos : end - i - 1);
    if (!phrase.empty()) term.match = Quoted(phrase);
    i = end == std::string::npos ? query.size() : end + 1;
    return term;
  }
  size_t end = query.find_first_of(" \t\"", i);
  if (end == std::string::npos) end = query.size();
  std::string word = query.substr(i, end - i);
  i = end;
  term.is_or = !term.excluded && word == "OR";
  const bool prefix = word.size() > 1 && word.back() == '*';
  if (prefix) word.pop_back();
  if (!word.empty() && word != "*") term.match = Quoted(word) + (prefix ? "*" : "");
  return term;
}

// A text query as FTS5 takes it: the expression, and its phrases in the
// order FTS5 numbers them, the excluded ones last.
struct TextExpression {
  std::string match;
  std::vector<std::string> phrases;
  size_t excluded = 0;  // how many phrases at the end are excluded
};

// The user's query as an FTS5 expression: terms are ANDed, "a OR b" is
// either, and excluded terms are taken out of the rest. ("cat OR dog food
// -fish" is ((cat OR dog) AND food) NOT fish.)
TextExpression TextMatch(const std::string& query) {
  std::vector<std::vector<std::string>> all_of;  // each holds its alternatives
  std::vector<std::string> excluded;
  bool or_next = false;
  size_t i = 0;
  while (i < query.size()) {
    if (query[i] == ' ' || query[i] == '\t') {
      ++i;
      continue;
    }
    const TextTerm term = NextTextTerm(query, i);
    if (term.is_or && !all_of.empty()) {
      or_next = true;
    } else if (term.match.empty()) {
      continue;
    } else if (term.excluded) {
      excluded.push_back(term.match);
    } else if (or_next) {
      all_of.back().push_back(term.match);
    } else {
      all_of.push_back({term.match});
    }
    if (!term.is_or) or_next = false;
  }
  if (all_of.empty()) throw SearchError(kBadArgument, "the text query has no words to find");
  TextExpression e;
  for (const std::vector<std::string>& either : all_of) {
    std::string group;
    for (const std::string& term : either) {
      group += (group.empty() ? "" : " OR ") + term;
      e.phrases.push_back(term);
    }
    if (either.size() > 1) group = "(" + group + ")";
    e.match += (e.match.empty() ? "" : " AND ") + group;
  }
  for (const std::string& term : excluded) {
    e.match = "(" + e.match + ") NOT " + term;
    e.phrases.push_back(term);
  }
  e.excluded = excluded.size();
  return e;
}

// Ties go by path in the same direction, so that a descending name order is
// the name index read backwards.
std::string OrderBy(const SearchQuery& q, bool has_text) {
  const std::string dir = q.descending ? " DESC" : "";
  const std::string tie = ", d.path" + dir;
  if (q.sort == "relevance" && has_text) return " ORDER BY rank" + dir + tie;
  if (q.sort == "path") return " ORDER BY d.path" + dir;
  if (q.sort == "size") return " ORDER BY d.size" + dir + tie;
  if (q.sort == "mtime") return " ORDER BY d.mtime" + dir + tie;
  return " ORDER BY d.folded_name" + dir + tie;
}

// The filter part of the query and its bindings, in order.
struct Filter {
  std::string where;
  std::vector<std::string> text_args;  // bound first, as text
  std::vector<int64_t> int_args;       // bound after the text arguments
  TextExpression text;                 // of the "text" query, when there is one
};

Filter BuildFilter(const SearchQuery& q, const std::string& folded_name) {
  Filter f;
  auto text = [&](const std::string& clause, const std::string& arg) {
    f.where += " AND " + clause;
    f.text_args.push_back(arg);
  };
  if (!q.text.empty()) {
    f.text = TextMatch(q.text);
    text("words MATCH ?", f.text.match);
  }
  if (!folded_name.empty()) {
    // With other filters a short fragment scans: a prefix query for one
    // common letter would first gather every name holding it.
    if (CodePointCount(folded_name) >= kTrigram) {
      text("d.id IN (SELECT rowid FROM name_grams WHERE name_grams MATCH ?)",
           NameMatch(folded_name));
    } else {
      text("instr(d.folded_name, ?) > 0", folded_name);
    }
  }
  if (!q.type.empty()) text("d.type = ?", q.type);
  if (!q.extension.empty()) text("d.extension = ?", FoldCase(q.extension));
  if (!q.owner.empty()) text("d.owner = ?", q.owner);
  if (!q.folder.empty()) {
    std::string prefix = q.folder;
    if (prefix.back() != '/') prefix += '/';
    text("d.path >= ?", prefix);
    text("d.path < ?", PrefixUpperBound(prefix));
  }
  auto number = [&](const char* clause, const std::optional<int64_t>& v) {
    if (!v) return;
    f.where += std::string(" AND ") + clause;
    f.int_args.push_back(*v);
  };
  number("d.size >= ?", q.size_min);
  number("d.size <= ?", q.size_max);
  number("d.mtime >= ?", q.mtime_min);
  number("d.mtime <= ?", q.mtime_max);
  return f;
}

int Bind(Statement& s, const Filter& f) {
  int i = 1;
  for (const std::string& arg : f.text_args) s.Bind(i++, arg);
  for (const int64_t arg : f.int_args) s.Bind(i++, arg);
  return i;
}

std::optional<int64_t> OptionalInt(const Statement& s, int column) {
  if (s.IsNull(column)) return std::nullopt;
  return s.Int(column);
}

// A hit from the kHitColumns at the start of a row.
SearchHit ReadHit(const Statement& s) {
  SearchHit hit;
  hit.path = s.Text(0);
  hit.name = s.Text(1);
  hit.type = s.Text(2);
  hit.is_dir = s.Int(3) != 0;
  hit.size = OptionalInt(s, 4);
  hit.mtime = OptionalInt(s, 5);
  hit.ctime = OptionalInt(s, 6);
  hit.crtime = OptionalInt(s, 7);
  hit.owner = s.Text(8);
  hit.folded_name = s.Text(9);
  return hit;
}

// The matches of "SELECT 1 <from_where>", counted up to bound.
int64_t CountUpTo(SqliteDb& db, const std::string& from_where, const Filter& f, int64_t bound) {
  Statement count(db, "SELECT count(*) FROM (SELECT 1" + from_where + " LIMIT ?)");
  count.Bind(Bind(count, f), bound);
  count.Step();
  return count.Int(0);
}

// The names that name_grams finds for phrase (a NameMatch), counted up to
// bound.
int64_t CountNameMatches(SqliteDb& db, const std::string& phrase, int64_t bound) {
  Filter by_name;
  by_name.text_args.push_back(phrase);
  return CountUpTo(db, " FROM name_grams WHERE name_grams MATCH ?", by_name, bound);
}

int64_t LastId(SqliteDb& db) {
  Statement last(db, "SELECT max(id) FROM documents");  // the row count, near enough
  last.Step();
  return std::max<int64_t>(last.Int(0), 1);
}

// The count bound for a page ending at need. It is also where walking the
// name index in order and sorting the matches cost the same: a walk reads
// about need * documents / matches entries of the index, a sort every
// match, so they meet at sqrt(need * documents) matches.
int64_t CountBound(SqliteDb& db, int64_t need) {
  const double documents = static_cast<double>(LastId(db));
  const auto even = static_cast<int64_t>(std::sqrt(static_cast<double>(need) * documents));
  return std::clamp(std::max(even, need), kCountBound, std::max(kMaxCountBound, need));
}

// The rows of ids, in that order.
std::vector<SearchHit> HitsOf(SqliteDb& db, const std::vector<int64_t>& ids) {
  std::vector<SearchHit> hits;
  Statement get(db, std::string("SELECT ") + kHitColumns + " FROM documents d WHERE d.id = ?1");
  for (const int64_t id : ids) {
    get.Bind(1, id);
    if (get.Step()) hits.push_back(ReadHit(get));
    get.Reset();
  }
  return hits;
}

// The names that hold a fragment, as a sample of them tells.
struct Sample {
  int64_t estimate = 0;  // of the matches in the whole index
  int64_t matches = 0;   // in the sample
  int64_t starting = 0;  // of those, the names that begin with the fragment
  std::string names;     // when kept: the names read, each ended by a NUL (no name holds one)

  bool AllStart() const { return matches > 0 && starting == matches; }
  // How many of the names read hold part.
  int64_t Holding(std::string_view part) const {
    int64_t count = 0;
    size_t next_name = 0;  // a name is counted once, however often it holds part
    for (size_t at = names.find(part); at != std::string::npos; at = names.find(part, at + 1)) {
      if (at < next_name) continue;
      ++count;
      next_name = names.find('\0', at) + 1;
    }
    return count;
  }
};

// keep_names keeps the names read, for ProbeFor().
Sample SampleNames(SqliteDb& db, const std::string& folded, bool keep_names) {
  const int64_t last = LastId(db);
  Statement stretch(db, "SELECT folded_name FROM documents WHERE id >= ?1 ORDER BY id LIMIT ?2");
  int64_t read = 0;
  Sample sample;
  for (int64_t k = 0; k < kSampleStretches; ++k) {
    stretch.Bind(1, last / kSampleStretches * k).Bind(2, kSampleStretch);
    while (stretch.Step()) {
      ++read;
      const std::string_view name = stretch.TextView(0);
      if (keep_names) sample.names.append(name).push_back('\0');
      const size_t at = name.find(folded);
      sample.matches += at != std::string_view::npos;
      sample.starting += at == 0;
    }
    stretch.Reset();
  }
  if (read > 0) sample.estimate = sample.matches * last / read;
  return sample;
}

// The folded-name index read in the query's order, keeping the names that
// hold folded: at most budget entries, or fewer when the page is full and
// count_to matches are counted.
struct Walk {
  std::vector<int64_t> page;  // the ids of the hits up to the page's end
  int64_t matches = 0;        // among the entries read
  bool reached_end = false;   // every entry was read: matches is the total
  int64_t need = 0;

  bool PageFull() const { return matches >= need || reached_end; }
};

Walk WalkNameIndex(SqliteDb& db, const SearchQuery& q, const std::string& folded, int64_t budget,
                   int64_t count_to) {
  const std::string dir = q.descending ? " DESC" : "";
  Statement walk(db,
                 "SELECT id, folded_name FROM documents INDEXED BY documents_folded_name "
                 "ORDER BY folded_name" +
                     dir + ", path" + dir);
  const int64_t need = q.offset + q.limit;
  Walk w;
  w.need = need;
  for (int64_t read = 1;; ++read) {
    if (!walk.Step()) {
      w.reached_end = true;
      break;
    }
    if (walk.TextView(1).find(folded) != std::string_view::npos && ++w.matches <= need) {
      w.page.push_back(walk.Int(0));
    }
    // Past the budget with the page still short: the matches lie further on
    // in name order, and sorting them is the cheaper way.
    if (read >= budget && w.matches < need) break;
    if (w.matches >= need && (w.matches >= count_to || read >= budget)) break;
  }
  return w;
}

// The page of a fragment's matches found through name_grams, sorted.
std::vector<SearchHit> SortedNameMatches(SqliteDb& db, const SearchQuery& q,
                                         const std::string& match) {
  const std::string dir = q.descending ? " DESC" : "";
  Statement rows(db, std::string("SELECT ") + kHitColumns +
                         " FROM name_grams CROSS JOIN documents d ON d.id = name_grams.rowid "
                         "WHERE name_grams MATCH ?1 ORDER BY d.folded_name" +
                         dir + ", d.path" + dir + " LIMIT ?2");
  rows.Bind(1, match).Bind(2, q.offset + q.limit);
  std::vector<SearchHit> hits;
  while (rows.Step()) hits.push_back(ReadHit(rows));
  return hits;
}

// The names that begin with folded: one stretch of the folded-name index.
int64_t CountStarting(SqliteDb& db, const std::string& folded, int64_t bound) {
  Statement count(db,
                  "SELECT count(*) FROM (SELECT 1 FROM documents INDEXED BY documents_folded_name "
                  "WHERE folded_name >= ?1 AND folded_name < ?2 LIMIT ?3)");
  count.Bind(1, folded).Bind(2, PrefixUpperBound(folded)).Bind(3, bound);
  count.Step();
  return count.Int(0);
}

std::vector<SearchHit> StartingPage(SqliteDb& db, const SearchQuery& q, const std::string& folded) {
  const std::string dir = q.descending ? " DESC" : "";
  Statement rows(db, std::string("SELECT ") + kHitColumns +
                         " FROM documents d INDEXED BY documents_folded_name "
                         "WHERE d.folded_name >= ?1 AND d.folded_name < ?2 ORDER BY d.folded_name" +
                         dir + ", d.path" + dir + " LIMIT ?3");
  rows.Bind(1, folded).Bind(2, PrefixUpperBound(folded)).Bind(3, q.offset + q.limit);
  std::vector<SearchHit> hits;
  while (rows.Step()) hits.push_back(ReadHit(rows));
  return hits;
}

// A part of folded, three or four code points long, that the sampled names
// hold no more often than folded itself: names holding folded are among
// those holding the part, so when name_grams finds no more of those than
// names that begin with folded, no name holds it further in. A short part
// reads one or two trigrams' entries, the whole fragment all of them.
// Empty when no part looks like that.
std::string ProbeFor(const Sample& sample, const std::string& folded) {
  std::vector<size_t> starts;  // of folded's code points, and its end
  for (size_t i = 0; i < folded.size(); ++i) {
    if ((static_cast<unsigned char>(folded[i]) & 0xC0) != 0x80) starts.push_back(i);
  }
  starts.push_back(folded.size());
  const size_t code_points = starts.size() - 1;
  for (size_t length = kTrigram; length <= kTrigram + 1 && length < code_points; ++length) {
    for (size_t first = code_points - length + 1; first-- > 0;) {
      const std::string part = folded.substr(starts[first], starts[first + length] - starts[first]);
      if (sample.Holding(part) <= sample.matches) return part;
    }
  }
  return std::string();
}

// The page of a fragment of three code points or more read as two parts:
// the names that begin with it, from their stretch of the name index, and
// the names that hold it further in, from name_grams ("^" anchors a phrase
// at a name's first code point), sorted. Worth it when the first part is
// most of the matches: nullopt when it is not. matches is the fragment's
// count when it is known exactly, or nullopt when it passed the bound.
std::optional<SearchResult> ByStart(SqliteDb& db, const SearchQuery& q, const std::string& folded,
                                    std::optional<int64_t> matches, const Sample& sample) {
  const int64_t starting = CountStarting(db, folded, matches ? *matches : kMaxCountBound + 1);
  const std::string match = NameMatch(folded);
  int64_t inside = 0;
  if (matches) {
    inside = *matches - starting;
  } else {
    // Counting the matches on past the starting ones tells how many lie
    // further in; when many do, the walk finds them sooner.
    if (starting > kMaxCountBound) return std::nullopt;
    const std::string probe = ProbeFor(sample, folded);
    if (probe.empty() || CountNameMatches(db, NameMatch(probe), starting + 1) > starting) {
      inside = CountNameMatches(db, match, starting + kCountBound) - starting;
      if (inside >= kCountBound) return std::nullopt;
    }
  }
  if (starting < inside) return std::nullopt;
  SearchResult result;
  result.total = starting + inside;
  result.hits = StartingPage(db, q, folded);
  if (inside == 0) return result;
  const std::vector<SearchHit> further = SortedNameMatches(db, q, match + " NOT ^" + match);
  std::vector<SearchHit> merged;
  std::merge(std::make_move_iterator(result.hits.begin()),
             std::make_move_iterator(result.hits.end()), further.begin(), further.end(),
             std::back_inserter(merged),
             [&q](const SearchHit& a, const SearchHit& b) { return HitBefore(a, b, q); });
  merged.resize(std::min<size_t>(merged.size(), static_cast<size_t>(q.offset + q.limit)));
  result.hits = std::move(merged);
  return result;
}

// How many entries of the name index a walk may read before sorting the
// matches instead: sorting costs about one entry's read per match, so as
// many as there are matches (estimated), and never less than a few bounds.
int64_t WalkBudget(int64_t estimated_matches, int64_t bound) {
  return std::max(kShortWalkFactor * bound, estimated_matches);
}

SearchResult NameInOrder(SqliteDb& db, const SearchQuery& q, const std::string& folded) {
  const int64_t bound = CountBound(db, q.offset + q.limit);
  const std::string match = NameMatch(folded);
  SearchResult result;
  if (CodePointCount(folded) >= kTrigram) {
    const Sample sample = SampleNames(db, folded, /*keep_names=*/true);
    if (sample.AllStart()) {
      if (auto split = ByStart(db, q, folded, std::nullopt, sample)) return *split;
    }
    // A fragment the sample finds in many names goes to the walk: its total
    // is a bound either way, and counting it to the walk's bound would cost
    // about as much as the walk.
    const bool common = sample.estimate >= kCommonFactor * bound;
    const int64_t count_to = common ? std::max(kCountBound, q.offset + q.limit) : bound;
    result.total = CountNameMatches(db, match, count_to);
    if (result.total < count_to) {
      if (auto split = ByStart(db, q, folded, result.total, sample)) return *split;
      result.hits = SortedNameMatches(db, q, match);
      return result;
    }
    const Walk w = WalkNameIndex(db, q, folded, WalkBudget(sample.estimate, bound), 0);
    result.hits = w.PageFull() ? HitsOf(db, w.page) : SortedNameMatches(db, q, match);
    result.exact = false;
    return result;
  }
  // A prefix query gathers every match before its first row: only for
  // fragments that look rare, or whose matches the walk did not reach.
  if (const int64_t estimate = SampleNames(db, folded, /*keep_names=*/false).estimate;
      estimate >= bound) {
    // Counting on once the page is full reads entries for the total alone:
    // a short fragment is common, and its total is a bound anyway.
    const int64_t count_to = std::max(kCountBound, q.offset + q.limit);
    const Walk w = WalkNameIndex(db, q, folded, WalkBudget(estimate, bound), count_to);
    if (w.PageFull()) {
      result.hits = HitsOf(db, w.page);
      result.total = w.matches;
      result.exact = w.reached_end;
      return result;
    }
  }
  result.total = CountNameMatches(db, match, bound);
  result.exact = result.total < bound;
  result.hits = SortedNameMatches(db, q, match);
  return result;
}

// The page's hits, each with its snippet, in the page's order. FTS5 finds
// one document of a query by its rowid cheaply, except for a prefix term,
// whose matching words it gathers afresh each time the query starts: then
// one pass over the matches makes every snippet of the page.
std::vector<SearchHit> Snippets(SqliteDb& db, const TextExpression& text,
                                const std::vector<std::pair<int64_t, double>>& page) {
  if (page.empty()) return {};
  const std::string select = std::string("SELECT ") + kHitColumns +
                             ", snippet(words, -1, '[', ']', '...', 12), words.rowid FROM words "
                             "CROSS JOIN documents d ON d.id = words.rowid WHERE words MATCH ?1";
  std::map<int64_t, SearchHit> found;
  auto take = [&found](Statement& s) {
    SearchHit hit = ReadHit(s);
    hit.snippet = s.Text(kHitColumnCount);
    found.emplace(s.Int(kHitColumnCount + 1), std::move(hit));
  };
  const bool prefix = std::any_of(text.phrases.begin(), text.phrases.end(),
                                  [](const std::string& p) { return p.back() == '*'; });
  if (prefix) {
    std::string ids;
    for (const auto& entry : page) ids += (ids.empty() ? "" : ",") + std::to_string(entry.first);
    // The unary + keeps the rowids from FTS5, which would seek (and gather)
    // once per id.
    Statement all(db, select + " AND +words.rowid IN (" + ids + ")");
    all.Bind(1, text.match);
    while (all.Step()) take(all);
  } else {
    Statement one(db, select + " AND words.rowid = ?2");
    for (const auto& entry : page) {
      one.Bind(1, text.match).Bind(2, entry.first);
      if (one.Step()) take(one);
      one.Reset();
    }
  }
  std::vector<SearchHit> hits;
  for (const auto& [id, rank] : page) {
    const auto it = found.find(id);
    if (it == found.end()) continue;
    hits.push_back(std::move(it->second));
    hits.back().rank = rank;
  }
  return hits;
}

// How many text documents hold each wanted phrase: counted up to
// kPhraseCountBound, and beyond it estimated from how far into the ids that
// count was reached (text documents come in the order their folders are
// walked, which spreads a common phrase about evenly over the ids).
class PhraseCounter {
 public:
  explicit PhraseCounter(SqliteDb& db)
      : db_(db),
        count_(db,
               "SELECT count(*), max(rowid) FROM "
               "(SELECT rowid FROM words WHERE words MATCH ?1 LIMIT ?2)") {}

  double DocumentsHolding(const std::string& phrase) {
    count_.Bind(1, phrase).Bind(2, kPhraseCountBound);
    count_.Step();
    const int64_t holding = count_.Int(0), reached = count_.Int(1);
    count_.Reset();
    if (holding < kPhraseCountBound) return static_cast<double>(holding);
    if (!first_id_) ReadIdRange();
    return static_cast<double>(holding) * static_cast<double>(last_id_ - *first_id_ + 1) /
           static_cast<double>(reached - *first_id_ + 1);
  }

 private:
  // Read once per query, and only for a phrase past the bound.
  void ReadIdRange() {
    Statement range(db_, "SELECT (SELECT min(id) FROM contents), (SELECT max(id) FROM contents)");
    range.Step();
    first_id_ = range.Int(0);
    last_id_ = range.Int(1);
  }

  SqliteDb& db_;
  Statement count_;
  std::optional<int64_t> first_id_;
  int64_t last_id_ = 0;
};

// The relevance of each match (see text_rank.h), with each phrase's share
// of the documents estimated cheaply.
std::string RankOf(SqliteDb& db, const TextExpression& e) {
  PhraseCounter counter(db);
  std::string rank = std::string(kTextRank) + "(words";
  const size_t wanted = e.phrases.size() - e.excluded;
  for (size_t p = 0; p < e.phrases.size(); ++p) {
    rank +=
        ", " + (p < wanted ? std::to_string(std::llround(counter.DocumentsHolding(e.phrases[p])))
                           : std::string("-1"));
  }
  return rank + ")";
}

// Words: the page's ids by the query's order first, then the snippets of
// the page's hits alone.
SearchResult ByWords(SqliteDb& db, const SearchQuery& q, const Filter& f) {
  const int64_t need = q.offset + q.limit;
  const std::string from = " FROM words CROSS JOIN documents d ON d.id = words.rowid WHERE 1";
  SearchResult result;
  const int64_t bound = std::max(kCountBound, need);
  result.total = CountUpTo(db, from + f.where, f, bound);
  result.exact = result.total < bound;
  const std::string dir = q.descending ? " DESC" : "";
  Statement order(db, q.sort == "relevance"
                          ? "SELECT id, r FROM (SELECT d.id AS id, d.path AS path, " +
                                RankOf(db, f.text) + " AS r" + from + f.where +
                                " LIMIT ?) ORDER BY r" + dir + ", path" + dir + " LIMIT ?"
                          : "SELECT d.id, 0" + from + f.where + OrderBy(q, true) + " LIMIT ?");
  int next = Bind(order, f);
  if (q.sort == "relevance") order.Bind(next++, std::max(kRankedSet, need));
  order.Bind(next, need);
  std::vector<std::pair<int64_t, double>> page;
  while (order.Step()) page.emplace_back(order.Int(0), order.Double(1));
  result.hits = Snippets(db, f.text, page);
  return result;
}

bool NameAlone(const SearchQuery& q, const std::string& folded) {
  return !folded.empty() && q.text.empty() && q.type.empty() && q.extension.empty() &&
         q.owner.empty() && q.folder.empty() && !q.size_min && !q.size_max && !q.mtime_min &&
         !q.mtime_max && q.sort == "name";
}

}  // namespace

bool HitBefore(const SearchHit& a, const SearchHit& b, const SearchQuery& q) {
  auto by = [&](auto key_a, auto key_b) {
    if (key_a != key_b) return q.descending ? key_b < key_a : key_a < key_b;
    return q.descending ? b.path < a.path : a.path < b.path;
  };
  if (q.sort == "relevance" && !q.text.empty()) return by(a.rank, b.rank);
  if (q.sort == "path") return by(a.path, b.path);
  if (q.sort == "size") return by(a.size.value_or(-1), b.size.value_or(-1));
  if (q.sort == "mtime") return by(a.mtime.value_or(-1), b.mtime.value_or(-1));
  return by(a.folded_name, b.folded_name);
}

SearchResult IndexStore::Search(const SearchQuery& q) {
  const std::string folded = FoldCase(q.name);
  if (NameAlone(q, folded)) return NameInOrder(*reader_, q, folded);
  const Filter f = BuildFilter(q, folded);
  if (!q.text.empty()) return ByWords(*reader_, q, f);
  const int64_t need = q.offset + q.limit;
  const int64_t bound = CountBound(*reader_, need);
  std::string from = " FROM documents d WHERE 1";
  SearchResult result;
  result.total = CountUpTo(*reader_, from + f.where, f, bound);
  result.exact = result.total < bound;
  // Many matches in name order: the name index read in order stops at the
  // page's end.
  if (CodePointCount(folded) >= kTrigram && q.sort == "name" && !result.exact) {
    from = " FROM documents d INDEXED BY documents_folded_name WHERE 1";
  }
  Statement rows(*reader_, std::string("SELECT ") + kHitColumns + from + f.where +
                               OrderBy(q, false) + " LIMIT ?");
  rows.Bind(Bind(rows, f), need);
  while (rows.Step()) result.hits.push_back(ReadHit(rows));
  return result;
}

}  // namespace search
}  // namespace orvex
