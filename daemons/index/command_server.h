// CommandServer: the indexing daemon's command socket. Each message, in both
// directions, is a 4-byte host-order length and that many bytes; a request is
// JSON text ending in one NUL byte (the library's SendCommandToDaemon writes
// exactly this). Every request gets one framed JSON answer, NUL-terminated.
// Bounded: a frame longer than the cap, a body without its NUL, a connection
// past the cap or one silent for too long is closed. Non-blocking except for
// the short write of an answer. One thread at a time.
#ifndef ORVEX_DAEMONS_INDEX_COMMAND_SERVER_H_
#define ORVEX_DAEMONS_INDEX_COMMAND_SERVER_H_

#include <json/json.h>

#include <chrono>
#include <cstddef>
#include <functional>
#include <map>
#include <string>

#include "orvex/portable/file_descriptor.h"

namespace orvex {
namespace indexd {

struct CommandServerOptions {
  std::string socket_path;       // as opened (ORVEX_ROOT already applied)
  size_t max_frame = 64 * 1024;  // bytes of one request body, NUL included
  size_t max_connections = 16;   // open connections at once
  std::chrono::seconds idle_timeout{10};
};

class CommandServer {
 public:
  // Turns one parsed request into its answer. Must not throw.
  using Handler = std::function<Json::Value(const Json::Value& request)>;

  explicit CommandServer(CommandServerOptions options);
  CommandServer(const CommandServer&) = delete;
  CommandServer& operator=(const CommandServer&) = delete;
  // Closes every connection and removes the socket file it made.
  ~CommandServer();

  // Creates the socket, mode 0660, replacing a stale socket file but never
  // one that a running daemon answers on. Returns false with why otherwise.
  bool Listen(std::string& why);

  // Waits up to timeout_ms for a connection, a request or extra_fd (when not
  // negative) to become readable, then serves every complete request with
  // handler. Returns true when extra_fd was readable.
  bool Poll(int timeout_ms, int extra_fd, const Handler& handler);

  size_t connection_count() const { return connections_.size(); }

 private:
  struct Connection {
    FileDescriptor fd;
    std::string in;
    std::chrono::steady_clock::time_point last_active;
  };

  void Accept();
  // Reads what is there and answers each complete frame; false when the
  // connection is to be closed.
  bool Serve(Connection& conn, const Handler& handler);
  bool Answer(int fd, const Json::Value& answer);
  void DropIdle();

  CommandServerOptions options_;
  FileDescriptor listen_fd_;
  bool made_socket_ = false;
  std::map<int, Connection> connections_;
};

// {"success": false, "error": {"code": code, "msg": msg}}.
Json::Value ErrorAnswer(int code, const std::string& msg);
// {"success": true} with "data" when data is not null.
Json::Value SuccessAnswer(const Json::Value& data);

}  // namespace indexd
}  // namespace orvex

#endif  // ORVEX_DAEMONS_INDEX_COMMAND_SERVER_H_
