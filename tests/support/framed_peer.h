// FramedPeer: a stand-in for a daemon that speaks the platform's framed
// socket protocol (the search daemon kaloelasticd, the indexing daemon
// fileindexd) in tests. It listens on a Unix socket and, for each connection,
// reads one framed request (a 4-byte host-order length, then JSON text ending
// in a NUL byte), records it, and answers as its responder says: with a
// framed text, or by closing without an answer. Requests are recorded before
// the answer goes out, so once a client's call has returned its requests are
// visible. The responder runs on the peer's thread; set it before the client
// starts.
#ifndef ORVEX_TESTS_SUPPORT_FRAMED_PEER_H_
#define ORVEX_TESTS_SUPPORT_FRAMED_PEER_H_

#include <json/json.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <deque>
#include <filesystem>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "orvex/foundation/json.h"

namespace orvex {
namespace testing {

class FramedPeer {
 public:
  // The answer text (framed with a NUL), or nullopt to close unanswered.
  using Reply = std::optional<std::string>;
  using Responder = std::function<Reply(const Json::Value& request)>;

  static constexpr char kSuccess[] = R"({"success": true})";

  explicit FramedPeer(const std::string& socket_path) : path_(socket_path) {
    std::filesystem::create_directories(std::filesystem::path(path_).parent_path());
    listen_fd_ = ::socket(AF_UNIX, SOCK_STREAM, 0);
    struct sockaddr_un address;
    std::memset(&address, 0, sizeof(address));
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path_.c_str(), sizeof(address.sun_path) - 1);
    listening_ = listen_fd_ >= 0 &&
                 ::bind(listen_fd_, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0 &&
                 ::listen(listen_fd_, 8) == 0;
    if (listening_) thread_ = std::thread([this] { Serve(); });
  }
  FramedPeer(const FramedPeer&) = delete;
  FramedPeer& operator=(const FramedPeer&) = delete;
  ~FramedPeer() { Stop(); }

  // Stops listening and removes the socket: the daemon has gone away.
  void Stop() {
    if (listen_fd_ >= 0) ::shutdown(listen_fd_, SHUT_RDWR);  // wakes the blocked accept
    if (thread_.joinable()) thread_.join();
    if (listen_fd_ >= 0) ::close(listen_fd_);
    if (listening_) ::unlink(path_.c_str());
    listen_fd_ = -1;
    listening_ = false;
  }

  bool listening() const { return listening_; }

  // Answers the next connections in turn with these replies; once they are
  // used up, every request is answered kSuccess.
  void Script(std::vector<Reply> replies) {
    std::lock_guard<std::mutex> hold(mutex_);
    script_.assign(replies.begin(), replies.end());
  }

  // Replaces the script: every request is answered by responder.
  void SetResponder(Responder responder) {
    std::lock_guard<std::mutex> hold(mutex_);
    responder_ = std::move(responder);
  }

  // The parsed requests, in arrival order.
  std::vector<Json::Value> requests() const {
    std::lock_guard<std::mutex> hold(mutex_);
    return requests_;
  }

  // Framing faults seen (a length that disagrees with the body, a body
  // without its final NUL, text that is not JSON); empty when every request
  // was well formed.
  std::vector<std::string> faults() const {
    std::lock_guard<std::mutex> hold(mutex_);
    return faults_;
  }

 private:
  static bool ReadExact(int fd, void* buf, size_t size) {
    auto* p = static_cast<unsigned char*>(buf);
    while (size > 0) {
      const ssize_t n = ::read(fd, p, size);
      if (n < 0 && errno == EINTR) continue;
      if (n <= 0) return false;
      p += n;
      size -= static_cast<size_t>(n);
    }
    return true;
  }

  static void WriteExact(int fd, const void* buf, size_t size) {
    const auto* p = static_cast<const unsigned char*>(buf);
    while (size > 0) {
      const ssize_t n = ::send(fd, p, size, MSG_NOSIGNAL);
      if (n < 0 && errno == EINTR) continue;
      if (n <= 0) return;
      p += n;
      size -= static_cast<size_t>(n);
    }
  }

  void Serve() {
    for (;;) {
      const int fd = ::accept(listen_fd_, nullptr, nullptr);
      if (fd < 0) {
        if (errno == EINTR) continue;
        return;  // shut down
      }
      Handle(fd);
      ::close(fd);
    }
  }

  void Handle(int fd) {
    uint32_t length = 0;
    if (!ReadExact(fd, &length, sizeof(length)) || length == 0 || length > (64u << 20)) {
      return Fault("bad length word");
    }
    std::string body(length, '\0');
    if (!ReadExact(fd, &body[0], length)) return Fault("short body");
    if (body.back() != '\0') return Fault("body without its NUL: " + body);
    body.pop_back();
    Json::Value request;
    if (!fromString(request, body)) return Fault("not JSON: " + body);
    const Reply reply = Record(request);
    if (!reply) return;  // closed unanswered
    const uint32_t answer_length = static_cast<uint32_t>(reply->size() + 1);
    WriteExact(fd, &answer_length, sizeof(answer_length));
    WriteExact(fd, reply->c_str(), answer_length);
  }

  Reply Record(const Json::Value& request) {
    Responder responder;
    Reply scripted = std::string(kSuccess);
    {
      std::lock_guard<std::mutex> hold(mutex_);
      requests_.push_back(request);
      responder = responder_;
      if (!responder && !script_.empty()) {
        scripted = script_.front();
        script_.pop_front();
      }
    }
    return responder ? responder(request) : scripted;
  }

  void Fault(const std::string& what) {
    std::lock_guard<std::mutex> hold(mutex_);
    faults_.push_back(what);
  }

  std::string path_;
  int listen_fd_ = -1;
  bool listening_ = false;
  std::thread thread_;
  mutable std::mutex mutex_;
  std::deque<Reply> script_;
  Responder responder_;
  std::vector<Json::Value> requests_;
  std::vector<std::string> faults_;
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_SUPPORT_FRAMED_PEER_H_
