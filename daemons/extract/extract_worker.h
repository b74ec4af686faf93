// Internals shared by the daemon and its workers: the worker's end of its
// channel and the worker's request loop. The channel carries the platform's
// framing (kalo_sock.h): a 4-byte host-order length, then JSON text and a NUL
// (an answer's text may follow that NUL: see AnswerMessage).
// One thread at a time per object.
#ifndef ORVEX_PORTABLE_SRC_EXTRACT_WORKER_H_
#define ORVEX_PORTABLE_SRC_EXTRACT_WORKER_H_

#include <cerrno>
#include <cstdint>
#include <string>
#include <utility>

#include "extract_service.h"
#include "kalo/kalo_sock.h"
#include "orvex/portable/file_descriptor.h"

namespace orvex {
namespace portable {

// A connection over a descriptor that is already open (one end of a
// socketpair), with the blocking Send and Recv of SockConnection.
class WorkerChannel : public kalodaemon::SockConnection {
 public:
  explicit WorkerChannel(FileDescriptor fd) { fd_ = std::move(fd); }
  bool Connect() override {
    errno = EISCONN;
    return IsConnected();
  }
  // Sends AnswerMessage(answer) as one framed message, written from its
  // parts where they lie. False (errno set) when the write fails.
  bool SendAnswer(Json::Value answer);
};

// An answer split for sending: its JSON text (with "text_bytes" when a
// text was taken out), and the text (a string value), or null.
struct AnswerParts {
  std::string json;
  Json::Value text;
};
AnswerParts SplitAnswer(Json::Value answer);

// The framing for the daemon's non-blocking side. Frame gives text with its
// NUL behind the length word. TakeFrame removes one whole message from the
// front of buffer into body (its trailing NUL dropped) and returns true;
// false while the message is incomplete, or when its length exceeds
// max_bytes (*too_large set: the stream cannot be followed any further).
std::string Frame(const std::string& text);
bool TakeFrame(std::string& buffer, uint32_t max_bytes, std::string& body, bool* too_large);

// The message a worker sends for answer (ExtractInWorker's object): its JSON
// text, or, when the data holds a text content, that text moved out of the
// JSON, the member "text_bytes" added and the text's bytes placed after the
// JSON text's NUL (doc/content_extraction.md). The bulk of an answer so
// crosses the daemon and reaches the caller without being escaped, parsed
// or re-written on the way.
std::string AnswerMessage(Json::Value answer);

// The worker's life after fork: caps its memory, then answers one request
// ({"path": ...}) after another on channel until the daemon closes it, and
// exits. Never returns.
[[noreturn]] void ServeWorker(FileDescriptor channel, int memory_mb, const Extractor& extractor);

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_SRC_EXTRACT_WORKER_H_
