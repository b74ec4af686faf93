#include "daemon_client.h"

#include <cerrno>
#include <cstring>

#include "kalo/kalo_sock.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/portable/root.h"

namespace orvex_cli {

Json::Value AskDaemon(const std::string& socket_path, const std::string& name,
                      const Json::Value& request) {
  const std::string socket = orvex::portable::RootPath(socket_path);
  kalodaemon::DomainSockConnection connection(socket);
  std::string text;
  if (!connection.Connect() || !connection.Send(orvex::toString(request)) ||
      !connection.Recv(text)) {
    throw orvex::Error(orvex::kErrorSearchDaemon, name + " does not answer on " + socket + ": " +
                                                      std::strerror(errno) +
                                                      "; start the daemons: orvex up");
  }
  Json::Value answer;
  if (!orvex::fromString(answer, text) || !answer.isObject() || !answer["success"].isBool()) {
    throw orvex::Error(orvex::kErrorSearchDaemon, name + " gave a bad answer: " + text);
  }
  if (!answer["success"].asBool()) {
    const Json::Value& error = answer["error"];
    throw orvex::Error(static_cast<orvex::ErrorCode>(error["code"].asInt()),
                       name + ": " + error["msg"].asString());
  }
  return answer["data"];
}

}  // namespace orvex_cli
