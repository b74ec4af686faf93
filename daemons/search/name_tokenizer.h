// The tokenizer of the name index (the FTS5 table name_grams): every code
// point of a folded name starts one token, the three code points from there
// (fewer at the name's end). A fragment of three or more code points is the
// phrase of its trigrams; a shorter one is a prefix query ("ab"*): every
// place it occurs starts a token, the name's last two places included, which
// the plain trigram tokenizer leaves out. Names are folded before they are
// indexed, so the tokenizer keeps bytes as they are. Stateless: safe for
// concurrent use.
#ifndef ORVEX_SEARCH_NAME_TOKENIZER_H_
#define ORVEX_SEARCH_NAME_TOKENIZER_H_

#include <sqlite3.h>

namespace orvex {
namespace search {

// The name the schema gives it (tokenize='...').
inline constexpr char kNameTokenizer[] = "orvex_name_grams";

// Registers the tokenizer on the connection db: each connection that reads
// or writes name_grams needs it. Throws SearchError kStorage when SQLite has
// no FTS5.
void RegisterNameTokenizer(sqlite3* db);

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_NAME_TOKENIZER_H_
