// The request channel to the search daemon: one JSON request over a fresh
// connection, one JSON answer back. Transport faults and refusals become
// Errors, per-item failures of compound requests are unpacked, and a busy
// daemon is waited out. Safe for concurrent use: no shared state.
#ifndef ORVEX_SRC_ELASTIC_CHANNEL_H_
#define ORVEX_SRC_ELASTIC_CHANNEL_H_

#include <json/json.h>

#include <vector>

#include "orvex/elastic.h"

namespace orvex {
namespace fileindex {
namespace elastic {

// The daemon's answers meaning "busy, try later"; every other code is a real
// failure.
constexpr int kElasticBusy = 1400;
constexpr int kElasticBusyQueue = 1401;

// The failed sub-requests of the answer to a compound request, in order
// (none unless the answer has "has_fail" true and a "data" array). Throws as
// the JSON helpers do for a failed element without "error" "code" and "msg".
std::vector<DocumentFailure> FailedSubRequests(const Json::Value& response);

// One attempt. request holds "command", "data" (with the index in "data"
// "id") and, for a compound request, "compound". On return response holds
// the parsed answer. Throws Error 913 (logged) "Connect failed", "Send
// failed" or "Recv failed, res=<what was parsed>" for an answer that is
// missing, not JSON, or without a boolean "success"; the daemon's code with
// "Request failed, msg=<msg>" for "success" false (not logged); and, for a
// compound request whose answer has "has_fail", the code and message of the
// first busy sub-request. Other failed sub-requests are logged ("Compound
// failed") and tolerated.
void SendOnce(Json::Value& response, const Json::Value& request);

// SendOnce until it succeeds or throws a code that is not busy, which is
// thrown on. Each busy answer is logged and waited out for 900 + 60 * (rand()
// mod 5) seconds; after the tenth retry the lack-of-memory notice goes out,
// once. There is no limit on the number of retries.
void SendWithRetry(Json::Value& response, const Json::Value& request);

// SendWithRetry with the answer dropped.
void Send(const Json::Value& request);

}  // namespace elastic
}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_ELASTIC_CHANNEL_H_
