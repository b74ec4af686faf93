// IndexStore::Search: user searches over the committed state of one index.
#include <string>
#include <vector>

#include "search/case_fold.h"
#include "search/index_store.h"
#include "search/search_error.h"

namespace orvex {
namespace search {
namespace {

// Fragments shorter than this cannot use the trigram index: they scan the
// stored folded names instead.
constexpr size_t kTrigram = 3;
// Above this many name matches, hits in name order are found by walking the
// name index and keeping the matches (it stops at the page's end); below
// it, fetching the matches and sorting them is cheaper.
constexpr int64_t kWalkNameIndexAbove = 1000;

std::string Quoted(const std::string& text) {
  std::string out = "\"";
  for (const char c : text) {
    out += c;
    if (c == '"') out += '"';
  }
  return out + "\"";
}

// The user's words, "phrases" and prefix* as an FTS5 expression: every term
// quoted, so that no user text is read as FTS5 syntax (AND, NEAR, column
// filters). Terms are ANDed.
std::string TextMatch(const std::string& query) {
  std::vector<std::string> terms;
  size_t i = 0;
  while (i < query.size()) {
    if (query[i] == ' ' || query[i] == '\t') {
      ++i;
    } else if (query[i] == '"') {
      const size_t end = query.find('"', i + 1);
      const std::string phrase =
          query.substr(i + 1, end == std::string::npos ? std::string::npos : end - i - 1);
      if (!phrase.empty()) terms.push_back(Quoted(phrase));
      i = end == std::string::npos ? query.size() : end + 1;
    } else {
      size_t end = query.find_first_of(" \t\"", i);
      if (end == std::string::npos) end = query.size();
      std::string word = query.substr(i, end - i);
      const bool prefix = word.size() > 1 && word.back() == '*';
      if (prefix) word.pop_back();
      if (!word.empty() && word != "*") terms.push_back(Quoted(word) + (prefix ? "*" : ""));
      i = end;
    }
  }
  if (terms.empty()) throw SearchError(kBadArgument, "the text query has no words");
  std::string match;
  for (const std::string& term : terms) match += (match.empty() ? "" : " ") + term;
  return match;
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
};

Filter BuildFilter(const SearchQuery& q, const std::string& folded_name) {
  Filter f;
  auto text = [&](const std::string& clause, const std::string& arg) {
    f.where += " AND " + clause;
    f.text_args.push_back(arg);
  };
  if (!q.text.empty()) text("words MATCH ?", TextMatch(q.text));
  if (!folded_name.empty()) {
    if (CodePointCount(folded_name) >= kTrigram) {
      text("d.id IN (SELECT rowid FROM name_grams WHERE name_grams MATCH ?)", Quoted(folded_name));
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

}  // namespace

SearchResult IndexStore::Search(const SearchQuery& q) {
  const bool has_text = !q.text.empty();
  const std::string folded = FoldCase(q.name);
  const Filter f = BuildFilter(q, folded);
  const bool by_trigram = CodePointCount(folded) >= kTrigram;
  // The name alone: the trigram index counts its matches without visiting
  // a single document.
  const bool name_only = by_trigram && f.int_args.empty() && f.text_args.size() == 1;
  std::string from = has_text ? " FROM words JOIN documents d ON d.id = words.rowid WHERE 1"
                              : " FROM documents d WHERE 1";
  SearchResult result;
  Statement count(*reader_, name_only ? "SELECT count(*) FROM name_grams WHERE name_grams MATCH ?"
                                      : "SELECT count(*)" + from + f.where);
  Bind(count, f);
  count.Step();
  result.total = count.Int(0);
  count.Reset();
  if (by_trigram && !has_text && q.sort == "name" && result.total > kWalkNameIndexAbove) {
    from = " FROM documents d INDEXED BY documents_folded_name WHERE 1";
  }
  const std::string snippet = has_text ? "snippet(words, -1, '[', ']', '...', 12), rank" : "'', 0";
  Statement rows(*reader_,
                 "SELECT d.path, d.name, d.type, d.is_dir, d.size, d.mtime, d.ctime, d.crtime, "
                 "d.owner, d.folded_name, " +
                     snippet + from + f.where + OrderBy(q, has_text) + " LIMIT ?");
  const int next = Bind(rows, f);
  rows.Bind(next, q.offset + q.limit);
  while (rows.Step()) {
    SearchHit hit;
    hit.path = rows.Text(0);
    hit.name = rows.Text(1);
    hit.type = rows.Text(2);
    hit.is_dir = rows.Int(3) != 0;
    hit.size = OptionalInt(rows, 4);
    hit.mtime = OptionalInt(rows, 5);
    hit.ctime = OptionalInt(rows, 6);
    hit.crtime = OptionalInt(rows, 7);
    hit.owner = rows.Text(8);
    hit.folded_name = rows.Text(9);
    hit.snippet = rows.Text(10);
    hit.rank = rows.Double(11);
    result.hits.push_back(std::move(hit));
  }
  return result;
}

}  // namespace search
}  // namespace orvex
