// FileindexdPeer: a stand-in for the indexing daemon fileindexd in tests. It
// listens on a Unix socket, reads each connection's one framed request (a
// 4-byte host-order length, then JSON text ending in a NUL byte), records it,
// answers with one framed message and closes. Requests are recorded before
// the answer is sent, so once a client's call has returned its request is
// visible. Used by the status and the command-line tool tests.
#ifndef ORVEX_TESTS_STATUS_FILEINDEXD_PEER_H_
#define ORVEX_TESTS_STATUS_FILEINDEXD_PEER_H_

#include <json/json.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "orvex/foundation/json.h"

namespace orvex {
namespace testing {

class FileindexdPeer {
 public:
  explicit FileindexdPeer(const std::string& socket_path) : path_(socket_path) {
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
  FileindexdPeer(const FileindexdPeer&) = delete;
  FileindexdPeer& operator=(const FileindexdPeer&) = delete;
  ~FileindexdPeer() {
    if (listen_fd_ >= 0) ::shutdown(listen_fd_, SHUT_RDWR);  // wakes the blocked accept
    if (thread_.joinable()) thread_.join();
    if (listen_fd_ >= 0) ::close(listen_fd_);
    if (listening_) ::unlink(path_.c_str());
  }

  bool listening() const { return listening_; }

  // The parsed requests, in arrival order.
  std::vector<Json::Value> requests() const {
    std::lock_guard<std::mutex> hold(mutex_);
    return requests_;
  }

  // Framing faults seen (a body without its final NUL, text that is not
  // JSON, a short read); empty when every request was well formed.
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

  static bool WriteExact(int fd, const void* buf, size_t size) {
    const auto* p = static_cast<const unsigned char*>(buf);
    while (size > 0) {
      const ssize_t n = ::write(fd, p, size);
      if (n < 0 && errno == EINTR) continue;
      if (n <= 0) return false;
      p += n;
      size -= static_cast<size_t>(n);
    }
    return true;
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
    std::string body;
    if (!ReadExact(fd, &length, sizeof(length)) || length == 0 || length > (1u << 20)) {
      return Fault("bad length word");
    }
    body.resize(length);
    if (!ReadExact(fd, &body[0], length)) return Fault("short body");
    if (body.back() != '\0') return Fault("body without its NUL: " + body);
    body.pop_back();
    Json::Value request;
    if (!fromString(request, body)) return Fault("not JSON: " + body);
    {
      std::lock_guard<std::mutex> hold(mutex_);
      requests_.push_back(request);
    }
    static const char kAnswer[] = "{\"success\":true}";
    const uint32_t answer_length = sizeof(kAnswer);  // with its NUL
    WriteExact(fd, &answer_length, sizeof(answer_length));
    WriteExact(fd, kAnswer, answer_length);
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
  std::vector<Json::Value> requests_;
  std::vector<std::string> faults_;
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_STATUS_FILEINDEXD_PEER_H_
