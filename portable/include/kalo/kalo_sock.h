// The platform's daemon connections: one stream socket to a local daemon,
// carrying whole messages. Each message travels as a 4-byte length in host
// byte order followed by that many bytes, in each direction. A message sent
// is the caller's text followed by one NUL byte, the NUL counted in the
// length; a message received has one trailing NUL removed when it carries
// one. Failures return false with errno set where the system gave a cause.
// One thread at a time per object; separate objects are independent.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_SOCK_H_
#define KALO_KALO_SOCK_H_

#include <cstddef>
#include <cstdint>
#include <string>

#include "orvex/portable/file_descriptor.h"

namespace kalodaemon {

// The largest message Recv accepts: a peer announcing more is refused
// before anything is allocated for it.
constexpr uint32_t kMaxMessageBytes = 64u << 20;

// A connection whose transport a subclass opens. Not copyable; the
// descriptor is closed by Disconnect or at destruction.
class SockConnection {
 public:
  SockConnection(const SockConnection&) = delete;
  SockConnection& operator=(const SockConnection&) = delete;
  virtual ~SockConnection();

  // Opens the connection, dropping any earlier one first. False (errno set)
  // when it cannot be made.
  virtual bool Connect() = 0;

  // Writes message and its NUL as one framed message. False when not
  // connected (errno ENOTCONN), when the message is too long for the frame
  // (EMSGSIZE) or when a write fails (EPIPE once the peer has closed: the
  // process does not receive SIGPIPE). Interrupted writes are resumed.
  bool Send(const std::string& message);

  // Reads one framed message into message, replacing its content. False when
  // not connected (ENOTCONN), when the peer announces more than
  // kMaxMessageBytes (EMSGSIZE), when it closes before the whole message has
  // arrived (ECONNRESET) or when a read fails; message is then unspecified.
  // Interrupted and short reads are resumed.
  bool Recv(std::string& message);

  // Closes the connection; harmless when there is none.
  void Disconnect();

  bool IsConnected() const { return fd_.valid(); }

 protected:
  SockConnection() = default;

  orvex::FileDescriptor fd_;  // -1 until connected
};

// A connection to a Unix-domain stream socket. The path is used exactly as
// given: callers resolve fixed system paths (under ORVEX_ROOT) themselves.
class DomainSockConnection : public SockConnection {
 public:
  explicit DomainSockConnection(const std::string& socket_path);
  ~DomainSockConnection() override;

  // False with ENAMETOOLONG when the path does not fit a socket address
  // (ENOENT when it is empty), else with the cause from socket or connect:
  // ENOENT when no daemon has created the socket, ECONNREFUSED when none
  // listens on it.
  bool Connect() override;

  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

}  // namespace kalodaemon

#endif  // KALO_KALO_SOCK_H_
