#include "search/search_server.h"

#include <poll.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <optional>
#include <system_error>
#include <vector>

#include "orvex/foundation/json.h"
#include "search/json_text.h"
#include "search/search_error.h"

namespace orvex {
namespace search {
namespace {

constexpr size_t kHeaderBytes = sizeof(uint32_t);
constexpr size_t kReadChunk = 64 << 10;
// How long the listening socket rests when the process is out of
// descriptors: the clients wait in the backlog meanwhile.
constexpr std::chrono::milliseconds kAcceptBackOff(200);

bool FillAddress(const std::string& path, struct sockaddr_un& address) {
  std::memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  if (path.empty() || path.size() >= sizeof(address.sun_path)) {
    errno = ENAMETOOLONG;
    return false;
  }
  std::memcpy(address.sun_path, path.data(), path.size());
  return true;
}

// Whether a live daemon answers on path: a crash leaves the socket file
// behind, and only a refused connection proves it stale.
bool SomeoneListens(const struct sockaddr_un& address) {
  FileDescriptor probe(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  return probe && ::connect(probe.get(), reinterpret_cast<const struct sockaddr*>(&address),
                            sizeof(address)) == 0;
}

std::string Frame(const std::string& text) {
  const uint32_t length = static_cast<uint32_t>(text.size() + 1);
  std::string frame(kHeaderBytes + length, '\0');
  std::memcpy(&frame[0], &length, kHeaderBytes);
  std::memcpy(&frame[kHeaderBytes], text.data(), text.size());
  return frame;
}

std::string ErrorText(int code, const std::string& msg) {
  return toString(SearchEngine::ErrorAnswer(code, msg));
}

}  // namespace

struct SearchServer::Connection {
  FileDescriptor fd;
  Caller caller;
  char header[kHeaderBytes] = {};
  size_t header_bytes = 0;
  uint32_t length = 0;  // of the frame being read; 0 while reading its header
  size_t reserved = 0;  // bytes of held_bytes_ counted for this frame
  size_t discard = 0;   // body bytes still to drop before answering busy
  std::string body;
  std::string out;  // the framed answer being written
  size_t written = 0;
  bool close_after = false;  // close once out is written
  bool closed = false;
  Clock::time_point last_activity;
};

SearchServer::SearchServer(const ServerOptions& options, SearchEngine& engine)
    : options_(options), engine_(engine) {}

SearchServer::~SearchServer() { Stop(); }

bool SearchServer::Start() {
  struct sockaddr_un address;
  if (!FillAddress(options_.socket_path, address)) return false;
  std::error_code ec;
  std::filesystem::create_directories(std::filesystem::path(options_.socket_path).parent_path(),
                                      ec);
  if (SomeoneListens(address)) {
    errno = EADDRINUSE;
    return false;
  }
  ::unlink(options_.socket_path.c_str());
  listen_.reset(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!listen_) return false;
  // The umask makes the socket 0660 from its first instant: no window in
  // which anyone else could connect.
  const mode_t old_mask = ::umask(0117);
  const int bound =
      ::bind(listen_.get(), reinterpret_cast<const struct sockaddr*>(&address), sizeof(address));
  ::umask(old_mask);
  if (bound != 0) return false;
  created_socket_ = true;
  if (::chmod(options_.socket_path.c_str(), 0660) != 0) return false;
  return ::listen(listen_.get(), 128) == 0;
}

void SearchServer::RequestStop() {
  stopping_ = true;
  listen_.reset();
  // Requests being read are dropped; answers being written are finished.
  for (Connection& c : connections_) {
    if (c.out.empty()) c.closed = true;
  }
}

void SearchServer::Stop() {
  RequestStop();
  for (Connection& c : connections_) Release(c);
  connections_.clear();
  if (created_socket_) ::unlink(options_.socket_path.c_str());
  created_socket_ = false;
}

void SearchServer::Release(Connection& c) {
  held_bytes_ -= c.reserved + c.out.size();
  c.reserved = 0;
  c.out = std::string();
}

void SearchServer::Accept() {
  while (connections_.size() < options_.max_connections) {
    FileDescriptor fd(::accept4(listen_.get(), nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC));
    if (!fd && (errno == EMFILE || errno == ENFILE)) {
      accept_paused_until_ = Now() + kAcceptBackOff;
      return;
    }
    if (!fd) return;  // EAGAIN, or a client gone before we got to it
    struct ucred cred;
    socklen_t size = sizeof(cred);
    if (::getsockopt(fd.get(), SOL_SOCKET, SO_PEERCRED, &cred, &size) != 0) continue;
    connections_.emplace_back();
    Connection& c = connections_.back();
    c.fd = std::move(fd);
    c.caller.uid = cred.uid;
    c.caller.gid = cred.gid;
    c.last_activity = Now();
  }
}

void SearchServer::Answer(Connection& c, const std::string& text, bool close_after) {
  std::string frame = Frame(text);
  if (frame.size() - kHeaderBytes > options_.max_frame) {
    frame = Frame(ErrorText(kAnswerTooLarge, "the answer of " + std::to_string(text.size()) +
                                                 " bytes is over the frame cap"));
  }
  held_bytes_ += frame.size();
  c.out = std::move(frame);
  c.written = 0;
  c.close_after = close_after;
}

void SearchServer::OnHeader(Connection& c) {
  std::memcpy(&c.length, c.header, kHeaderBytes);
  c.header_bytes = 0;
  if (c.length == 0 || c.length > options_.max_frame) {
    // The stream cannot be trusted past a bad length word: answer and close.
    Answer(c,
           ErrorText(kBadFrame, "bad frame length " + std::to_string(c.length) + " (1 to " +
                                    std::to_string(options_.max_frame) + ")"),
           /*close_after=*/true);
    c.length = 0;
    return;
  }
  if (held_bytes_ + c.length > options_.memory_bound) {
    // Drop the body as it comes, so the client can finish its send and read
    // the busy answer instead of a reset connection.
    c.discard = c.length;
    c.length = 0;
    return;
  }
  c.reserved = c.length;
  held_bytes_ += c.reserved;
  c.body.clear();
}

void SearchServer::OnFrame(Connection& c) {
  std::string body = std::move(c.body);
  c.body = std::string();
  Release(c);
  c.length = 0;
  // The NUL ends the text: one anywhere else means the sender framed
  // something other than a request.
  Json::Value answer;
  if (body.empty() || body.find('\0') != body.size() - 1) {
    answer =
        SearchEngine::ErrorAnswer(kBadJson, "the request must be JSON text ending in one NUL byte");
  } else {
    body.pop_back();
    if (std::optional<Json::Value> upserted = engine_.HandleCompound(body, c.caller)) {
      answer = std::move(*upserted);
    } else {
      Json::Value request;
      answer = fromString(request, body)
                   ? engine_.Handle(request, c.caller, body)
                   : SearchEngine::ErrorAnswer(kBadJson, "the request is not JSON text");
    }
  }
  Answer(c, JsonText(answer), /*close_after=*/false);
}

void SearchServer::OnReadable(Connection& c) {
  char chunk[kReadChunk];
  while (c.out.empty() && !c.closed) {
    size_t want = kReadChunk;
    if (c.discard > 0) {
      want = std::min(want, c.discard);
    } else if (c.length == 0) {
      want = kHeaderBytes - c.header_bytes;
    } else {
      want = std::min(want, c.length - c.body.size());
    }
    const ssize_t n = ::recv(c.fd.get(), chunk, want, 0);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) return;
    if (n <= 0) {
      const bool mid_frame = c.header_bytes > 0 || c.length > 0 || c.discard > 0;
      if (n == 0 && mid_frame) {
        // The client may have shut only its sending side: tell it why.
        const size_t got = c.length > 0 ? c.body.size() : c.header_bytes;
        Release(c);
        Answer(c,
               ErrorText(kBadFrame,
                         "the connection ended " + std::to_string(got) + " bytes into a frame"),
               /*close_after=*/true);
        c.length = 0;
        c.discard = 0;
        c.header_bytes = 0;
      } else {
        c.closed = true;
      }
      return;
    }
    c.last_activity = Now();
    const size_t got = static_cast<size_t>(n);
    if (c.discard > 0) {
      c.discard -= got;
      if (c.discard == 0) {
        Answer(c, ErrorText(kBusy, "kaloelasticd is busy: over its memory bound"),
               /*close_after=*/false);
      }
    } else if (c.length == 0) {
      std::memcpy(c.header + c.header_bytes, chunk, got);
      c.header_bytes += got;
      if (c.header_bytes == kHeaderBytes) OnHeader(c);
    } else {
      c.body.append(chunk, got);
      if (c.body.size() == c.length) OnFrame(c);
    }
  }
}

void SearchServer::OnWritable(Connection& c) {
  while (c.written < c.out.size()) {
    const ssize_t n =
        ::send(c.fd.get(), c.out.data() + c.written, c.out.size() - c.written, MSG_NOSIGNAL);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) return;
    if (n < 0) {
      c.closed = true;  // the client went away: its answer goes nowhere
      break;
    }
    c.written += static_cast<size_t>(n);
    c.last_activity = Now();
  }
  held_bytes_ -= c.out.size();
  c.out = std::string();
  c.written = 0;
  if (c.close_after || stopping_) c.closed = true;
}

int SearchServer::NextTimeoutMs(int timeout_ms) const {
  const auto now = Now();
  int64_t wait = timeout_ms;
  if (accept_paused_until_ > now) {
    wait = std::min<int64_t>(
        wait,
        std::chrono::duration_cast<std::chrono::milliseconds>(accept_paused_until_ - now).count() +
            1);
  }
  for (const Connection& c : connections_) {
    const auto due = c.last_activity + std::chrono::milliseconds(options_.idle_timeout_ms);
    const int64_t left =
        std::chrono::duration_cast<std::chrono::milliseconds>(due - now).count() + 1;
    wait = std::min<int64_t>(wait, std::max<int64_t>(left, 0));
  }
  return static_cast<int>(wait);
}

void SearchServer::CloseIdle() {
  const auto now = Now();
  for (Connection& c : connections_) {
    if (now - c.last_activity >= std::chrono::milliseconds(options_.idle_timeout_ms)) {
      c.closed = true;
    }
  }
}

bool SearchServer::AnswersPending() const {
  return std::any_of(connections_.begin(), connections_.end(),
                     [](const Connection& c) { return !c.out.empty() && !c.closed; });
}

void SearchServer::EraseClosed() {
  for (auto it = connections_.begin(); it != connections_.end();) {
    if (it->closed) {
      Release(*it);
      it = connections_.erase(it);
    } else {
      ++it;
    }
  }
}

bool SearchServer::RunOnce(int timeout_ms) {
  if (stopping_ && !AnswersPending()) {
    EraseClosed();
    return true;
  }
  std::vector<struct pollfd> fds;
  const bool wake = wake_fd_ >= 0;
  if (wake) fds.push_back({wake_fd_, POLLIN, 0});
  const bool listening = listen_.valid() && connections_.size() < options_.max_connections &&
                         Now() >= accept_paused_until_;
  if (listening) fds.push_back({listen_.get(), POLLIN, 0});
  const size_t first = fds.size();
  for (const Connection& c : connections_) {
    fds.push_back({c.fd.get(), static_cast<short>(c.out.empty() ? POLLIN : POLLOUT), 0});
  }
  const int ready = ::poll(fds.data(), fds.size(), NextTimeoutMs(timeout_ms));
  if (ready < 0 && errno != EINTR) return true;  // cannot wait: nothing more can be served
  if (ready > 0) {
    if (wake && fds[0].revents != 0) {
      struct signalfd_siginfo info;
      while (::read(wake_fd_, &info, sizeof(info)) > 0) {
      }
      RequestStop();
    }
    size_t i = first;
    for (Connection& c : connections_) {
      const short events = fds[i++].revents;
      if (c.closed || events == 0) continue;
      if (!c.out.empty()) {
        OnWritable(c);
      } else {
        OnReadable(c);
        if (!c.out.empty()) OnWritable(c);  // usually goes out at once
      }
    }
    if (listening && !stopping_ && (fds[wake ? 1 : 0].revents & POLLIN)) Accept();
  }
  CloseIdle();
  EraseClosed();
  return stopping_ && !AnswersPending();
}

}  // namespace search
}  // namespace orvex
