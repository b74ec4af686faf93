// Asking one of the system's daemons a question on its socket (under
// ORVEX_ROOT): one framed JSON request, one framed JSON answer. Single
// thread, like the rest of the tool.
#ifndef ORVEX_PROGRAMS_ORVEX_DAEMON_CLIENT_H_
#define ORVEX_PROGRAMS_ORVEX_DAEMON_CLIENT_H_

#include <json/json.h>

#include <string>

namespace orvex_cli {

// Sends request to the daemon called name on the fixed socket path
// socket_path and returns the answer's "data" when "success" is true.
// Throws orvex::Error: 913 naming the socket, the cause and how to start the
// daemon when it does not answer or answers something that is not an
// answer; the daemon's own code and message when it refuses.
Json::Value AskDaemon(const std::string& socket_path, const std::string& name,
                      const Json::Value& request);

}  // namespace orvex_cli

#endif  // ORVEX_PROGRAMS_ORVEX_DAEMON_CLIENT_H_
