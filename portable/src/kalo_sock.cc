#include "kalo/kalo_sock.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <cerrno>
#include <cstring>
#include <limits>
#include <utility>

namespace kalodaemon {
namespace {

// Writes all of data. MSG_NOSIGNAL: a daemon that goes away mid-message must
// fail this call, not kill the calling process.
bool WriteAll(int fd, const char* data, size_t size) {
  while (size > 0) {
    const ssize_t n = ::send(fd, data, size, MSG_NOSIGNAL);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    data += n;
    size -= static_cast<size_t>(n);
  }
  return true;
}

// Reads exactly size bytes. An end of stream before that is a failure: the
// peer closed in the middle of a message.
bool ReadAll(int fd, char* data, size_t size) {
  while (size > 0) {
    const ssize_t n = ::recv(fd, data, size, 0);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return false;
    if (n == 0) {
      errno = ECONNRESET;
      return false;
    }
    data += n;
    size -= static_cast<size_t>(n);
  }
  return true;
}

}  // namespace

SockConnection::~SockConnection() = default;

bool SockConnection::Send(const std::string& message) {
  if (!fd_.valid()) {
    errno = ENOTCONN;
    return false;
  }
  if (message.size() >= std::numeric_limits<uint32_t>::max()) {
    errno = EMSGSIZE;
    return false;
  }
  // One buffer, one write in the common case: the length word and the body
  // with its NUL.
  const uint32_t length = static_cast<uint32_t>(message.size() + 1);
  std::string frame(sizeof(length) + length, '\0');
  std::memcpy(&frame[0], &length, sizeof(length));
  std::memcpy(&frame[sizeof(length)], message.data(), message.size());
  return WriteAll(fd_.get(), frame.data(), frame.size());
}

bool SockConnection::Recv(std::string& message) {
  if (!fd_.valid()) {
    errno = ENOTCONN;
    return false;
  }
  uint32_t length = 0;
  if (!ReadAll(fd_.get(), reinterpret_cast<char*>(&length), sizeof(length))) return false;
  if (length > kMaxMessageBytes) {
    errno = EMSGSIZE;
    return false;
  }
  message.assign(length, '\0');
  if (!ReadAll(fd_.get(), &message[0], length)) return false;
  if (!message.empty() && message.back() == '\0') message.pop_back();
  return true;
}

void SockConnection::Disconnect() { fd_.reset(); }

DomainSockConnection::DomainSockConnection(const std::string& socket_path) : path_(socket_path) {}

DomainSockConnection::~DomainSockConnection() = default;

bool DomainSockConnection::Connect() {
  Disconnect();
  struct sockaddr_un address;
  std::memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  if (path_.empty() || path_.size() >= sizeof(address.sun_path)) {
    errno = path_.empty() ? ENOENT : ENAMETOOLONG;
    return false;
  }
  std::memcpy(address.sun_path, path_.data(), path_.size());
  orvex::FileDescriptor fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!fd.valid()) return false;
  if (::connect(fd.get(), reinterpret_cast<const struct sockaddr*>(&address), sizeof(address)) !=
      0) {
    return false;  // fd's close keeps connect's errno
  }
  fd_ = std::move(fd);
  return true;
}

}  // namespace kalodaemon
