#include "platform/daemon_connection.h"

#include "kalo/kalo_sock.h"
#include "platform/fixed_path.h"

namespace orvex {
namespace sdk {

DaemonConnection::DaemonConnection(const std::string& fixed_socket_path)
    : conn_(std::make_unique<kalodaemon::DomainSockConnection>(FixedPath(fixed_socket_path))) {}

DaemonConnection::~DaemonConnection() = default;

bool DaemonConnection::Connect() { return conn_->Connect(); }

bool DaemonConnection::Send(const std::string& text) { return conn_->Send(text); }

bool DaemonConnection::Recv(std::string& text) { return conn_->Recv(text); }

}  // namespace sdk
}  // namespace orvex
