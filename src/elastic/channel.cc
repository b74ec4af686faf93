#include "elastic/channel.h"

#include <unistd.h>

#include <string>
#include <utility>
#include <vector>

#include "foundation/check.h"
#include "orvex/elastic.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/log.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/policy/custom_event.h"
#include "platform/daemon_connection.h"

namespace orvex {
namespace fileindex {
namespace elastic {
namespace {

constexpr char kLogSource[] = "elastic_control";

// A daemon still busy after this many retries is short of memory: the
// administrators hear of it once per request.
constexpr unsigned int kRetriesBeforeNotice = 10;
// The busy wait: 900 s plus 60 s times one of 0..4, so that clients that
// were turned away together do not all come back at once.
constexpr unsigned long kBusyWaitBaseSeconds = 900;
constexpr unsigned long kBusyWaitStepSeconds = 60;
constexpr unsigned int kBusyWaitSteps = 5;
constexpr unsigned long kMicrosPerSecond = 1000000;

int Pid() { return static_cast<int>(::getpid()); }
unsigned Euid() { return static_cast<unsigned>(::geteuid()); }

bool IsBusyCode(int code) { return code == kElasticBusy || code == kElasticBusyQueue; }

// The text of a string member for the log; "" when it is absent (a compound
// request has no "command" or "data" of its own).
std::string TextOf(const Json::Value& value) { return value.isString() ? value.asString() : ""; }

// Reads "code" and "msg" of an answer's or sub-answer's "error" object.
void ReadDaemonError(const Json::Value& answer, int& code, std::string& msg) {
  const Json::Value& error = answer["error"];  // const: adds no member
  GetJsonValue(code, error, "code", /*required=*/true);
  GetJsonValue(msg, error, "msg", /*required=*/true);
}

bool SubRequestFailed(const Json::Value& element) {
  return element.isObject() && element["success"].isBool() && !element["success"].asBool();
}

// A busy sub-request fails the whole compound request, so that it is sent
// again whole; any other failed sub-request is only logged: the rest of the
// work is done and must not be repeated for one bad item.
void CheckCompoundAnswer(const Json::Value& res, const Json::Value& req) {
  if (!req.isMember("compound")) return;
  for (const DocumentFailure& failure : FailedSubRequests(res)) {
    if (IsBusyCode(failure.code)) throw Error(static_cast<ErrorCode>(failure.code), failure.msg);
    const auto index = static_cast<Json::ArrayIndex>(failure.index);
    LogErrno("%s:%d (%d, %u) Compound failed: %s (%d) %s", kLogSource, __LINE__, Pid(), Euid(),
             toString(req["compound"][index]).c_str(), failure.code, failure.msg.c_str());
  }
}

void LogBusyRetry(unsigned int retry, const Json::Value& req) {
  LogErrno("%s:%d (%d, %u) Retry[%u] since kaloelasticd is busy. Command: %s, db: %s", kLogSource,
           __LINE__, Pid(), Euid(), retry, TextOf(req["command"]).c_str(),
           TextOf(req["data"]["id"]).c_str());
}

unsigned long BusyWaitMicros() {
  const unsigned long step = static_cast<unsigned int>(Random()) % kBusyWaitSteps;
  return (kBusyWaitBaseSeconds + kBusyWaitStepSeconds * step) * kMicrosPerSecond;
}

}  // namespace

std::vector<DocumentFailure> FailedSubRequests(const Json::Value& res) {
  std::vector<DocumentFailure> failures;
  const Json::Value& has_fail = res["has_fail"];
  const Json::Value& data = res["data"];
  if (!has_fail.isBool() || !has_fail.asBool() || !data.isArray()) return failures;
  for (Json::ArrayIndex i = 0; i < data.size(); ++i) {
    if (!SubRequestFailed(data[i])) continue;
    DocumentFailure failure;
    failure.index = i;
    ReadDaemonError(data[i], failure.code, failure.msg);
    failures.push_back(std::move(failure));
  }
  return failures;
}

void SendOnce(Json::Value& res, const Json::Value& req) {
  sdk::DaemonConnection conn(kElasticSockPath);  // closed on every way out
  ORVEX_CHECK(!conn.Connect(), kErrorSearchDaemon, "Connect failed");
  ORVEX_CHECK_AS(!conn.Send(toString(req)), "!conn.Send(req.toString())", kErrorSearchDaemon,
                 "Send failed");
  std::string resp_raw;
  // The object test keeps isMember from throwing on an answer that is JSON
  // but not an object; the logged text is the check as operators know it.
  ORVEX_CHECK_AS(!conn.Recv(resp_raw) || !fromString(res, resp_raw) || !res.isObject() ||
                     !res.isMember("success") || !res["success"].isBool(),
                 "!conn.Recv(resp_raw) || !res.fromString(resp_raw) || !res.isMember(\"success\") "
                 "|| !res[\"success\"].isBool()",
                 kErrorSearchDaemon, "Recv failed, res=" + toString(res));
  if (!res["success"].asBool()) {
    int code = 0;
    std::string msg;
    ReadDaemonError(res, code, msg);
    throw Error(static_cast<ErrorCode>(code), "Request failed, msg=" + msg);
  }
  CheckCompoundAnswer(res, req);
}

void SendWithRetry(Json::Value& response, const Json::Value& request) {
  for (unsigned int n = 1;; ++n) {
    try {
      SendOnce(response, request);
      return;
    } catch (const Error& e) {
      if (!IsBusyCode(e.code())) throw;
    }
    LogBusyRetry(n - 1, request);
    // n only grows, so this is once per request, before the eleventh wait.
    if (n == kRetriesBeforeNotice + 1) NotifyLackOfMemory();
    SleepMicros(BusyWaitMicros());
  }
}

void Send(const Json::Value& request) {
  Json::Value response;
  SendWithRetry(response, request);
}

}  // namespace elastic
}  // namespace fileindex
}  // namespace orvex
