#include "search/name_tokenizer.h"

#include <algorithm>
#include <string>
#include <vector>

#include "search/search_error.h"
#include "search/sqlite_db.h"

namespace orvex {
namespace search {
namespace {

constexpr int kGram = 3;

// FTS5 wants a tokenizer object; this one has no state.
Fts5Tokenizer* const kInstance =
    reinterpret_cast<Fts5Tokenizer*>(const_cast<char*>(kNameTokenizer));

int Create(void*, const char**, int, Fts5Tokenizer** out) {
  *out = kInstance;
  return SQLITE_OK;
}

void Delete(Fts5Tokenizer*) {}

using TokenFn = int (*)(void*, int, const char*, int, int, int);

int Tokenize(Fts5Tokenizer*, void* context, int flags, const char* text, int size, TokenFn token) {
  // The byte offset of every code point, and the end.
  std::vector<int> starts;
  starts.reserve(static_cast<size_t>(size) + 1);
  for (int i = 0; i < size; ++i) {
    if ((static_cast<unsigned char>(text[i]) & 0xC0) != 0x80) starts.push_back(i);
  }
  const int count = static_cast<int>(starts.size());
  starts.push_back(size);
  auto emit = [&](int first, int last) {
    return token(context, 0, text + starts[first], starts[last] - starts[first], starts[first],
                 starts[last]);
  };
  if ((flags & FTS5_TOKENIZE_QUERY) != 0) {
    // A short fragment is one token, matched as a prefix; a longer one the
    // phrase of its full trigrams.
    if (count == 0) return SQLITE_OK;
    if (count < kGram || (flags & FTS5_TOKENIZE_PREFIX) != 0) return emit(0, count);
    for (int i = 0; i + kGram <= count; ++i) {
      if (const int rc = emit(i, i + kGram); rc != SQLITE_OK) return rc;
    }
    return SQLITE_OK;
  }
  for (int i = 0; i < count; ++i) {
    if (const int rc = emit(i, std::min(i + kGram, count)); rc != SQLITE_OK) return rc;
  }
  return SQLITE_OK;
}

}  // namespace

void RegisterNameTokenizer(sqlite3* db) {
  fts5_api* api = Fts5Api(db);
  static fts5_tokenizer methods = {Create, Delete, Tokenize};
  if (api == nullptr ||
      api->xCreateTokenizer(api, kNameTokenizer, nullptr, &methods, nullptr) != SQLITE_OK) {
    throw SearchError(kStorage, std::string("cannot register the tokenizer ") + kNameTokenizer +
                                    ": " + sqlite3_errmsg(db));
  }
}

}  // namespace search
}  // namespace orvex
