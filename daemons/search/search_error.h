// SearchError: the one error type of the search daemon's engine. Its code is
// what the answer's "error"."code" carries (the list is in
// doc/search_protocol.md); callers test the code, never the text. Plain
// value type: safe to copy between threads.
#ifndef ORVEX_SEARCH_SEARCH_ERROR_H_
#define ORVEX_SEARCH_SEARCH_ERROR_H_

#include <stdexcept>
#include <string>

namespace orvex {
namespace search {

// Codes of the daemon's answers. 1400 is the one the client retries: it is
// given only when taking a request would break the daemon's memory bound.
enum SearchCode : int {
  kBadFrame = 1100,        // length 0, above the cap, or cut short
  kBadJson = 1101,         // not a JSON object
  kUnknownCommand = 1102,  // "command" names nothing this daemon does
  kBadArgument = 1103,     // a member missing or of the wrong type
  kBadIndexId = 1104,      // an index id that is empty, or holds "/" or ".."
  kNoSuchIndex = 1105,     // no index with that id
  kIndexExists = 1106,     // the id (or new id) is taken by another index
  kNoSuchDocument = 1107,  // document_set_by_id of a document never upserted
  kStorage = 1108,         // SQLite or the file system failed
  kNotPermitted = 1109,    // a user asked to search as someone else
  kAnswerTooLarge = 1110,  // the answer would not fit one frame
  kIndexPaused = 1111,     // a document write to a paused index
  kBusy = 1400,            // over the memory bound: try again later
};

class SearchError : public std::runtime_error {
 public:
  SearchError(int code, const std::string& message) : std::runtime_error(message), code_(code) {}
  int code() const { return code_; }

 private:
  int code_;
};

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_SEARCH_ERROR_H_
