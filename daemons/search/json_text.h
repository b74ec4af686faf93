// The daemon's JSON text: the platform's compact writer (see
// orvex/portable/json_text.h), strings written as received. It writes one
// for every document it stores and every answer it gives.
#ifndef ORVEX_SEARCH_JSON_TEXT_H_
#define ORVEX_SEARCH_JSON_TEXT_H_

#include "orvex/portable/json_text.h"

namespace orvex {
namespace search {

using portable::AppendJsonText;
using portable::JsonText;

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_JSON_TEXT_H_
