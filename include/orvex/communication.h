// The command channel to the indexing daemon fileindexd: one JSON command per
// connection over its Unix socket, framed as a 4-byte host-order length and
// that many bytes in each direction, the request body NUL-terminated. Each
// call uses its own socket: safe for concurrent use.
#ifndef ORVEX_COMMUNICATION_H_
#define ORVEX_COMMUNICATION_H_

#include <json/json.h>

#include <string>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {

// The daemon's socket; opened under ORVEX_ROOT when that is set.
inline constexpr char kFileIndexDaemonSockPath[] = "/var/run/fileindexd.sock";

// Sends {"type": command, "data": data} (data may be null) to the daemon and
// waits, without a time limit, for its one framed answer, which is read and
// discarded. Retries the connection 5 times, 1 s apart, while the socket file
// does not exist yet. Sets the process's SIGPIPE disposition to ignore and
// leaves it so. Throws Error 502: "socket failed, reason=..." or "setsockopt
// failed, reason=..." (both logged), "write failed, reason=..." (also when the
// daemon could not be reached) or "read failed, reason=...".
ORVEX_EXPORT void SendCommandToDaemon(const std::string& command, const Json::Value& data);

// Reads exactly size bytes from fd into buf, at most 1024 bytes per read,
// retrying up to 10 interruptions (EINTR) in the whole call. End of stream is
// not an error: it reads again until the bytes arrive. Size 0 makes no system
// call. Throws Error 502 "read failed, reason=<system text>" on any other
// failure or an eleventh interruption. buf must hold size bytes.
ORVEX_EXPORT void BufferRead(int fd, unsigned int size, unsigned char* buf);

// Writes exactly size bytes of buf to fd, at most 1024 bytes per write, with
// the same interruption budget. Size 0 makes no system call. A write that
// returns 0 or fails otherwise throws Error 502 "write failed, reason=<system
// text>".
ORVEX_EXPORT void BufferWrite(int fd, unsigned int size, const unsigned char* buf);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_COMMUNICATION_H_
