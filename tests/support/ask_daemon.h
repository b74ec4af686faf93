// One framed request to a daemon's socket and its whole answer, for tests
// that read what the library's own clients drop or do not ask.
#ifndef ORVEX_TESTS_SUPPORT_ASK_DAEMON_H_
#define ORVEX_TESTS_SUPPORT_ASK_DAEMON_H_

#include <json/json.h>

#include <string>

#include "kalo/kalo_sock.h"
#include "orvex/foundation/json.h"

namespace orvex {
namespace testing {

// The parsed answer; null when the daemon does not answer with JSON.
inline Json::Value AskDaemon(const std::string& socket_path, const Json::Value& request) {
  kalodaemon::DomainSockConnection connection(socket_path);
  std::string text;
  Json::Value answer;
  if (!connection.Connect() || !connection.Send(toString(request)) || !connection.Recv(text) ||
      !fromString(answer, text)) {
    return Json::Value();
  }
  return answer;
}

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_SUPPORT_ASK_DAEMON_H_
