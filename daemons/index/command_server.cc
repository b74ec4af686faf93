#include "index/command_server.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/util.h"

namespace orvex {
namespace indexd {

namespace {

constexpr size_t kLengthWord = sizeof(uint32_t);
// An answer is small; a client that does not read it within this long is
// dropped rather than allowed to hold the daemon's loop.
constexpr int kAnswerWriteMs = 1000;

bool FillAddress(const std::string& path, sockaddr_un& address) {
  std::memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof(address.sun_path)) return false;
  std::memcpy(address.sun_path, path.c_str(), path.size());
  return true;
}

// True when a process accepts connections on path: the socket is live and
// must not be taken over.
bool SomeoneListens(const std::string& path) {
  sockaddr_un address;
  if (!FillAddress(path, address)) return false;
  FileDescriptor fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!fd) return false;
  return ::connect(fd.get(), reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0;
}

std::string SystemWhy(const std::string& what, const std::string& path) {
  return what + " " + path + ": " + std::strerror(errno);
}

}  // namespace

Json::Value ErrorAnswer(int code, const std::string& msg) {
  Json::Value answer(Json::objectValue);
  answer["success"] = false;
  answer["error"]["code"] = code;
  answer["error"]["msg"] = msg;
  return answer;
}

Json::Value SuccessAnswer(const Json::Value& data) {
  Json::Value answer(Json::objectValue);
  answer["success"] = true;
  if (!data.isNull()) answer["data"] = data;
  return answer;
}

CommandServer::CommandServer(CommandServerOptions options) : options_(std::move(options)) {}

CommandServer::~CommandServer() {
  connections_.clear();
  listen_fd_.reset();
  if (made_socket_) ::unlink(options_.socket_path.c_str());
}

bool CommandServer::Listen(std::string& why) {
  const std::string& path = options_.socket_path;
  sockaddr_un address;
  if (!FillAddress(path, address)) {
    why = "socket path too long: " + path;
    return false;
  }
  MakeParentDirectories(path);
  if (SomeoneListens(path)) {
    why = "another fileindexd answers on " + path;
    return false;
  }
  ::unlink(path.c_str());  // a socket file left by a killed run
  listen_fd_.reset(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!listen_fd_) {
    why = SystemWhy("socket", path);
    return false;
  }
  // The socket is created with no access for others at all, then opened to
  // the group: there is no moment at which anyone else may connect.
  const mode_t old_mask = ::umask(0177);
  const int bound =
      ::bind(listen_fd_.get(), reinterpret_cast<sockaddr*>(&address), sizeof(address));
  ::umask(old_mask);
  if (bound != 0) {
    why = SystemWhy("bind", path);
    return false;
  }
  made_socket_ = true;
  if (::chmod(path.c_str(), 0660) != 0 || ::listen(listen_fd_.get(), 16) != 0) {
    why = SystemWhy("listen", path);
    return false;
  }
  return true;
}

bool CommandServer::Poll(int timeout_ms, int extra_fd, const Handler& handler) {
  std::vector<pollfd> fds;
  fds.push_back({listen_fd_.get(), POLLIN, 0});
  if (extra_fd >= 0) fds.push_back({extra_fd, POLLIN, 0});
  const size_t first_conn = fds.size();
  for (const auto& [fd, conn] : connections_) fds.push_back({fd, POLLIN, 0});
  // Idle connections must be found even when nothing else happens.
  if (!connections_.empty() && (timeout_ms < 0 || timeout_ms > 1000)) timeout_ms = 1000;
  const int ready = ::poll(fds.data(), fds.size(), timeout_ms);
  bool extra_ready = false;
  if (ready > 0) {
    if (extra_fd >= 0 && (fds[1].revents & (POLLIN | POLLHUP | POLLERR))) extra_ready = true;
    for (size_t i = first_conn; i < fds.size(); ++i) {
      if (fds[i].revents == 0) continue;
      auto it = connections_.find(fds[i].fd);
      if (it != connections_.end() && !Serve(it->second, handler)) connections_.erase(it);
    }
    if (fds[0].revents & POLLIN) Accept();
  }
  DropIdle();
  return extra_ready;
}

void CommandServer::Accept() {
  for (;;) {
    FileDescriptor fd(::accept4(listen_fd_.get(), nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC));
    if (!fd) return;  // EAGAIN: no more waiting
    // Past the cap the connection is closed at once: the client sees a
    // failed exchange instead of the daemon running out of descriptors.
    if (connections_.size() >= options_.max_connections) continue;
    const int key = fd.get();
    connections_[key] = Connection{std::move(fd), std::string(), std::chrono::steady_clock::now()};
  }
}

bool CommandServer::Serve(Connection& conn, const Handler& handler) {
  char buf[4096];
  for (;;) {
    const ssize_t n = ::read(conn.fd.get(), buf, sizeof(buf));
    if (n > 0) {
      conn.in.append(buf, static_cast<size_t>(n));
      if (conn.in.size() > kLengthWord + options_.max_frame) break;  // checked below
      continue;
    }
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) break;
    if (conn.in.empty()) return false;  // closed after its last exchange
    break;                              // closed mid-frame: serve what is complete, then drop
  }
  conn.last_active = std::chrono::steady_clock::now();
  while (conn.in.size() >= kLengthWord) {
    uint32_t length = 0;
    std::memcpy(&length, conn.in.data(), kLengthWord);
    if (length == 0 || length > options_.max_frame) {
      Answer(conn.fd.get(), ErrorAnswer(kErrorBadArgument, "bad frame length"));
      return false;
    }
    if (conn.in.size() < kLengthWord + length) return true;  // the rest is on its way
    std::string body = conn.in.substr(kLengthWord, length);
    conn.in.erase(0, kLengthWord + length);
    Json::Value request;
    if (body.back() != '\0') {
      Answer(conn.fd.get(), ErrorAnswer(kErrorBadArgument, "request without its NUL"));
      return false;
    }
    body.pop_back();
    const Json::Value answer = fromString(request, body) && request.isObject()
                                   ? handler(request)
                                   : ErrorAnswer(kErrorBadArgument, "request is not a JSON object");
    if (!Answer(conn.fd.get(), answer)) return false;
  }
  return true;
}

bool CommandServer::Answer(int fd, const Json::Value& answer) {
  const std::string text = toString(answer);
  const uint32_t length = static_cast<uint32_t>(text.size() + 1);
  std::string frame(reinterpret_cast<const char*>(&length), kLengthWord);
  frame.append(text.c_str(), text.size() + 1);
  size_t sent = 0;
  while (sent < frame.size()) {
    const ssize_t n = ::send(fd, frame.data() + sent, frame.size() - sent, MSG_NOSIGNAL);
    if (n > 0) {
      sent += static_cast<size_t>(n);
      continue;
    }
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) {
      pollfd out{fd, POLLOUT, 0};
      if (::poll(&out, 1, kAnswerWriteMs) > 0) continue;
    }
    return false;
  }
  return true;
}

void CommandServer::DropIdle() {
  const auto now = std::chrono::steady_clock::now();
  for (auto it = connections_.begin(); it != connections_.end();) {
    if (now - it->second.last_active > options_.idle_timeout) {
      it = connections_.erase(it);
    } else {
      ++it;
    }
  }
}

}  // namespace indexd
}  // namespace orvex
