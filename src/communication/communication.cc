#include "orvex/communication.h"

#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <vector>

#include "foundation/check.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/portable/file_descriptor.h"
#include "platform/fixed_path.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "communication";

constexpr unsigned int kChunkBytes = 1024;
constexpr int kMaxInterrupts = 10;
// The daemon creates its socket shortly after it starts: give it 4 s.
constexpr int kConnectAttempts = 5;
constexpr unsigned long kConnectRetryMicros = 1000000;
// Answers are discarded; they are read through this much memory at a time
// rather than trusting the peer's length with one allocation.
constexpr unsigned int kDiscardBytes = 64 * 1024;

std::string SystemReason(const char* what) {
  return std::string(what) + " failed, reason=" + std::strerror(errno);
}

// The result is deliberately not reported: a connection that could not be
// made shows up as the first write failing, with that write's reason.
void ConnectWithRetry(int fd_socket, const std::string& path) {
  struct sockaddr_un address;
  std::memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof(address.sun_path)) return;  // unreachable: never connected
  std::memcpy(address.sun_path, path.data(), path.size());
  for (int attempt = 1; attempt <= kConnectAttempts; ++attempt) {
    if (::connect(fd_socket, reinterpret_cast<struct sockaddr*>(&address), sizeof(address)) == 0) {
      return;
    }
    if (errno != ENOENT || attempt == kConnectAttempts) return;
    SleepMicros(kConnectRetryMicros);
  }
}

void SetSendTimeout(int fd_socket) {
  struct timeval timeout;
  timeout.tv_sec = 1;
  timeout.tv_usec = 0;
  ORVEX_CHECK_AS(
      0 > ::setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof(timeout)),
      "0 > setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, (char *)&timeout, sizeof(timeout))",
      kErrorSystem, SystemReason("setsockopt"));
}

void WriteRequest(int fd_socket, const std::string& command, const Json::Value& data) {
  Json::Value request(Json::objectValue);
  request["type"] = command;
  request["data"] = data;
  const std::string text = toString(request);
  // The body is a C string: its NUL travels with it and is counted.
  const uint32_t length = static_cast<uint32_t>(text.size() + 1);
  BufferWrite(fd_socket, sizeof(length), reinterpret_cast<const unsigned char*>(&length));
  BufferWrite(fd_socket, length, reinterpret_cast<const unsigned char*>(text.c_str()));
}

void ReadAndDiscardAnswer(int fd_socket) {
  uint32_t length = 0;
  BufferRead(fd_socket, sizeof(length), reinterpret_cast<unsigned char*>(&length));
  std::vector<unsigned char> buffer(std::min(length, kDiscardBytes));
  while (length > 0) {
    const uint32_t part = std::min(length, kDiscardBytes);
    BufferRead(fd_socket, part, buffer.data());
    length -= part;
  }
}

}  // namespace

void SendCommandToDaemon(const std::string& command, const Json::Value& data) {
  // A daemon that goes away mid-write must fail the write, not kill the web
  // API's process.
  ::signal(SIGPIPE, SIG_IGN);
  int fd_socket = -1;
  ORVEX_CHECK_AS(0 > (fd_socket = ::socket(PF_UNIX, SOCK_STREAM, 0)),
                 "0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))", kErrorSystem,
                 SystemReason("socket"));
  const FileDescriptor socket_fd(fd_socket);  // closed on every way out
  ConnectWithRetry(fd_socket, sdk::FixedPath(kFileIndexDaemonSockPath));
  SetSendTimeout(fd_socket);
  WriteRequest(fd_socket, command, data);
  ReadAndDiscardAnswer(fd_socket);
}

void BufferRead(int fd, unsigned int size, unsigned char* buf) {
  int interrupts = 0;
  unsigned int done = 0;
  while (done < size) {
    const ssize_t n = ::read(fd, buf + done, std::min(kChunkBytes, size - done));
    if (n < 0) {
      if (errno == EINTR && ++interrupts <= kMaxInterrupts) continue;
      throw Error(kErrorSystem, SystemReason("read"));
    }
    // A read of 0 (end of stream) simply reads again: the daemon is trusted
    // to send the whole message it announced.
    done += static_cast<unsigned int>(n);
  }
}

void BufferWrite(int fd, unsigned int size, const unsigned char* buf) {
  int interrupts = 0;
  unsigned int done = 0;
  while (done < size) {
    const ssize_t n = ::write(fd, buf + done, std::min(kChunkBytes, size - done));
    if (n < 1) {
      if (n < 0 && errno == EINTR && ++interrupts <= kMaxInterrupts) continue;
      throw Error(kErrorSystem, SystemReason("write"));
    }
    done += static_cast<unsigned int>(n);
  }
}

}  // namespace fileindex
}  // namespace orvex
