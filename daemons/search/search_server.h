// SearchServer: the search daemon's socket loop. Many clients at once on one
// thread: every socket is non-blocking and a poll() round (RunOnce) serves
// whatever is ready, so a client that sends half a frame, never reads its
// answer or never sends at all holds up nobody. Each connection carries one
// request at a time (a 4-byte host-order length, then that many bytes of JSON
// text ending in NUL) and gets its answer framed the same way. Memory is
// bounded: a frame cap, a connection cap, and a cap on the bytes held for all
// connections together, past which a request is answered busy (1400).
// One thread at a time.
#ifndef ORVEX_SEARCH_SEARCH_SERVER_H_
#define ORVEX_SEARCH_SEARCH_SERVER_H_

#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <list>
#include <string>

#include "orvex/portable/file_descriptor.h"
#include "search/search_engine.h"

namespace orvex {
namespace search {

// The search socket under ORVEX_ROOT.
inline constexpr char kSearchSocketPath[] = "/var/run/kaloelasticd.sock";

struct ServerOptions {
  std::string socket_path;                  // as given (already under ORVEX_ROOT)
  uint32_t max_frame = 64u << 20;           // the largest request or answer
  size_t max_connections = 256;             // more wait in the listen backlog
  size_t memory_bound = size_t{256} << 20;  // bytes held for all connections
  int idle_timeout_ms = 120000;             // a silent connection is closed after this
  // The clock of the idle timeout and of the accept back-off; steady_clock
  // when empty (tests step their own).
  std::function<std::chrono::steady_clock::time_point()> now;
};

class SearchServer {
 public:
  // engine must outlive the server.
  SearchServer(const ServerOptions& options, SearchEngine& engine);
  SearchServer(const SearchServer&) = delete;
  SearchServer& operator=(const SearchServer&) = delete;
  ~SearchServer();

  // Creates the socket (mode 0660), replacing a stale one left by a crash.
  // False with errno set when it cannot; EADDRINUSE when a live daemon
  // already answers on it.
  bool Start();

  // A descriptor whose readability means "stop" (a signalfd); it is read and
  // drained here. -1 for none.
  void set_wake_fd(int fd) { wake_fd_ = fd; }

  // Stops taking connections and requests; answers being written are finished.
  void RequestStop();

  // One round: waits up to timeout_ms for activity and serves all that is
  // ready. True once a stop was asked and every answer in progress is out:
  // the caller then ends.
  bool RunOnce(int timeout_ms);

  // Closes every connection and removes the socket.
  void Stop();

  size_t connection_count() const { return connections_.size(); }
  size_t held_bytes() const { return held_bytes_; }

 private:
  struct Connection;
  using Clock = std::chrono::steady_clock;

  Clock::time_point Now() const { return options_.now ? options_.now() : Clock::now(); }
  void Accept();
  void OnReadable(Connection& c);
  void OnWritable(Connection& c);
  void OnHeader(Connection& c);
  void OnFrame(Connection& c);
  void Answer(Connection& c, const std::string& text, bool close_after);
  void Release(Connection& c);
  int NextTimeoutMs(int timeout_ms) const;
  void CloseIdle();
  void EraseClosed();
  bool AnswersPending() const;

  ServerOptions options_;
  SearchEngine& engine_;
  FileDescriptor listen_;
  int wake_fd_ = -1;
  bool stopping_ = false;
  bool created_socket_ = false;
  // Out of descriptors: the listening socket is left alone until then, or
  // it would wake every round with a connection that cannot be taken.
  Clock::time_point accept_paused_until_;
  std::list<Connection> connections_;
  size_t held_bytes_ = 0;
};

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_SEARCH_SERVER_H_
