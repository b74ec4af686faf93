// DaemonConnection: one connection to a local daemon's Unix socket, carrying
// whole framed messages (the platform's daemon connection). The library's
// door to the platform's socket library, so that subsystems above the
// platform layer never see it. One thread at a time per object.
#ifndef ORVEX_SRC_PLATFORM_DAEMON_CONNECTION_H_
#define ORVEX_SRC_PLATFORM_DAEMON_CONNECTION_H_

#include <memory>
#include <string>

namespace kalodaemon {
class DomainSockConnection;
}  // namespace kalodaemon

namespace orvex {
namespace sdk {

class DaemonConnection {
 public:
  // A connection, not yet made, to the socket at the fixed system path
  // fixed_socket_path (opened under ORVEX_ROOT when that is set).
  explicit DaemonConnection(const std::string& fixed_socket_path);
  DaemonConnection(const DaemonConnection&) = delete;
  DaemonConnection& operator=(const DaemonConnection&) = delete;
  // Closes the connection if it was made.
  ~DaemonConnection();

  // Each returns false on failure, with errno giving the system's cause
  // where there is one; none throws. Send writes text as one message, Recv
  // reads one whole message into text.
  bool Connect();
  bool Send(const std::string& text);
  bool Recv(std::string& text);

 private:
  std::unique_ptr<kalodaemon::DomainSockConnection> conn_;
};

}  // namespace sdk
}  // namespace orvex

#endif  // ORVEX_SRC_PLATFORM_DAEMON_CONNECTION_H_
