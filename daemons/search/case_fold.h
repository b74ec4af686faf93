// Case folding for file-name search: ICU's full case folding, so that
// "STRASSE", "straße" and "Straße" all fold to "strasse". Pure functions:
// safe for concurrent use.
#ifndef ORVEX_SEARCH_CASE_FOLD_H_
#define ORVEX_SEARCH_CASE_FOLD_H_

#include <cstddef>
#include <string>

namespace orvex {
namespace search {

// The full case folding of UTF-8 text. Invalid sequences become U+FFFD.
std::string FoldCase(const std::string& utf8);

// The number of code points in valid UTF-8 text (continuation bytes are not
// counted): the unit of the trigram index.
size_t CodePointCount(const std::string& utf8);

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_CASE_FOLD_H_
