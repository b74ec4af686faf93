// A raw client of a daemon that speaks the platform's framed socket protocol
// (a 4-byte host-order length, then the message): for tests that send
// framing faults, stall, leave mid-answer, or step the daemon on their own
// thread while they wait for its answer.
#ifndef ORVEX_TESTS_SUPPORT_FRAMED_CLIENT_H_
#define ORVEX_TESTS_SUPPORT_FRAMED_CLIENT_H_

#include <gtest/gtest.h>
#include <json/json.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "orvex/portable/file_descriptor.h"

namespace orvex {
namespace testing {

inline sockaddr_un UnixAddress(const std::string& path) {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof(address.sun_path) - 1);
  return address;
}

// A client socket connected to path.
inline FileDescriptor ConnectUnix(const std::string& path) {
  FileDescriptor fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const sockaddr_un address = UnixAddress(path);
  EXPECT_EQ(0, ::connect(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)))
      << path << ": " << std::strerror(errno);
  return fd;
}

inline std::string LengthWord(uint32_t length) {
  return std::string(reinterpret_cast<const char*>(&length), sizeof(length));
}

// text as one request: its length word, the text and the NUL that ends it.
inline std::string Framed(const std::string& text) {
  return LengthWord(static_cast<uint32_t>(text.size() + 1)) + text + std::string(1, '\0');
}

inline bool SendBytes(int fd, const std::string& bytes) {
  return ::send(fd, bytes.data(), bytes.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
}

// Reads exactly one framed message from fd (a following one stays unread)
// and returns its body, NUL included. step runs whenever there is nothing to
// read, so the daemon under test may run on this thread; without one, each
// wait is up to ten seconds. nullopt when the daemon closes fd first or the
// message does not come.
inline std::optional<std::string> ReadFrame(int fd, const std::function<void()>& step = {}) {
  std::string length_word;
  std::string body;
  size_t want = sizeof(uint32_t);
  for (int round = 0; round < 10000;) {
    std::string& into = length_word.size() < sizeof(uint32_t) ? length_word : body;
    pollfd readable = {fd, POLLIN, 0};
    if (::poll(&readable, 1, step ? 0 : 10000) != 1) {
      if (!step) return std::nullopt;
      step();
      ++round;
      continue;
    }
    char chunk[65536];
    const ssize_t n = ::recv(fd, chunk, std::min(sizeof(chunk), want - into.size()), MSG_DONTWAIT);
    if (n < 0 && (errno == EAGAIN || errno == EINTR)) continue;
    if (n <= 0) return std::nullopt;
    into.append(chunk, static_cast<size_t>(n));
    if (&into == &length_word && length_word.size() == sizeof(uint32_t)) {
      uint32_t length = 0;
      std::memcpy(&length, length_word.data(), sizeof(length));
      want = length;
    }
    if (length_word.size() == sizeof(uint32_t) && body.size() == want) return body;
  }
  return std::nullopt;
}

// A framed body's JSON text (up to its NUL; a text may follow it), parsed;
// null when there is no body.
inline Json::Value BodyJson(const std::optional<std::string>& body) {
  Json::Value value;
  if (!body) return value;
  const std::string text = body->substr(0, body->find('\0'));
  std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
  std::string errors;
  EXPECT_TRUE(reader->parse(text.data(), text.data() + text.size(), &value, &errors)) << text;
  return value;
}

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_SUPPORT_FRAMED_CLIENT_H_
