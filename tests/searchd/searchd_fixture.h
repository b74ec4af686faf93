// Fixtures for the search daemon's tests. SearchdLoopTest runs the engine and
// its socket loop in this process, in a temporary ORVEX_ROOT, and drives the
// loop with RunOnce() until the client's answer is there: no threads, no
// sleeps. Requests travel over the real socket in the real framing.
// One test at a time (ORVEX_ROOT is process-wide).
#ifndef ORVEX_TESTS_SEARCHD_SEARCHD_FIXTURE_H_
#define ORVEX_TESTS_SEARCHD_SEARCHD_FIXTURE_H_

#include <gtest/gtest.h>
#include <json/json.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "kalo/kalo_sock.h"
#include "orvex/foundation/json.h"
#include "orvex/portable/file_descriptor.h"
#include "orvex/portable/root.h"
#include "search/index_registry.h"
#include "search/search_engine.h"
#include "search/search_server.h"
#include "support/temp_dir.h"

namespace orvex {
namespace testing {

inline Json::Value ParseJson(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

// A raw client socket, connected, for framing faults and slow clients.
inline FileDescriptor ConnectRaw(const std::string& socket_path) {
  FileDescriptor fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  struct sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, socket_path.c_str(), sizeof(address.sun_path) - 1);
  EXPECT_EQ(0, ::connect(fd.get(), reinterpret_cast<struct sockaddr*>(&address), sizeof(address)))
      << socket_path << ": " << std::strerror(errno);
  return fd;
}

inline std::string LengthWord(uint32_t length) {
  return std::string(reinterpret_cast<const char*>(&length), sizeof(length));
}

inline std::string Framed(const std::string& text) {
  return LengthWord(static_cast<uint32_t>(text.size() + 1)) + text + std::string(1, '\0');
}

inline bool SendBytes(int fd, const std::string& bytes) {
  return ::send(fd, bytes.data(), bytes.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
}

// The commands the indexer sends, as the library's client builds them.
inline Json::Value Command(const std::string& command, const std::string& id) {
  Json::Value req;
  req["command"] = command;
  req["data"]["id"] = id;
  return req;
}

inline Json::Value PrefixQuery(const std::string& command, const std::string& id,
                               const std::string& prefix) {
  Json::Value req = Command(command, id);
  req["data"]["query"]["qsl"]["prefix"]["KALOMDPath"] = prefix;
  return req;
}

// A file's document as content extraction gives it.
inline Json::Value FileDoc(const std::string& path, int64_t size = 10) {
  const size_t slash = path.rfind('/');
  Json::Value doc;
  doc["KALOMDPath"] = path;
  doc["KALOMDFSName"] = path.substr(slash + 1);
  doc["KALOMDSearchFileName"] = path.substr(slash + 1);
  doc["KALOMDParent"] = path.substr(0, slash);
  doc["KALOMDIsDir"] = false;
  doc["KALOMDFSSize"] = static_cast<Json::Int64>(size);
  doc["KALOMDFSContentChangeDate"] = static_cast<Json::Int64>(1700000000);
  return doc;
}

inline Json::Value Upsert(const std::string& id, const Json::Value& doc) {
  Json::Value req = Command("document_upsert_by_id", id);
  req["data"]["doc_id"] = doc["KALOMDPath"];
  req["data"]["data"] = doc;
  return req;
}

inline Json::Value SetById(const std::string& id, const std::string& doc_id,
                           const Json::Value& changes) {
  Json::Value req = Command("document_set_by_id", id);
  req["data"]["doc_id"] = doc_id;
  req["data"]["data"] = changes;
  return req;
}

// The paths of a search answer's hits, in order.
inline std::vector<std::string> HitPaths(const Json::Value& answer) {
  std::vector<std::string> paths;
  for (const Json::Value& hit : answer["data"]["hits"]) paths.push_back(hit["path"].asString());
  return paths;
}

inline std::vector<std::string> DocPaths(const Json::Value& answer) {
  std::vector<std::string> paths;
  for (const Json::Value& doc : answer["data"]) paths.push_back(doc["KALOMDPath"].asString());
  return paths;
}

class SearchdLoopTest : public ::testing::Test {
 protected:
  static constexpr char kId[] = "fileindex_s";

  SearchdLoopTest() { Restart(); }

  // A new engine and server on the same root: what a daemon restart sees.
  void Restart(const search::ServerOptions* options = nullptr) {
    server_.reset();
    engine_.reset();
    engine_ =
        std::make_unique<search::SearchEngine>(portable::RootPath(search::kIndexRegistryPath));
    search::ServerOptions o = options ? *options : search::ServerOptions();
    o.socket_path = SocketPath();
    server_ = std::make_unique<search::SearchServer>(o, *engine_);
    ASSERT_TRUE(server_->Start()) << std::strerror(errno);
  }

  std::string SocketPath() const { return portable::RootPath(search::kSearchSocketPath); }
  std::string DbPath(const std::string& share = "s") const {
    return root_.Join("volume1/" + share + "/@eaDir/@fileindex/db");
  }

  // Serves until fd has something to read (or is closed by the daemon).
  void PumpUntilReadable(int fd) {
    for (int round = 0; round < 10000; ++round) {
      struct pollfd p = {fd, POLLIN, 0};
      if (::poll(&p, 1, 0) == 1) return;
      server_->RunOnce(/*timeout_ms=*/1000);
    }
    ADD_FAILURE() << "no answer";
  }

  // Reads one framed answer from fd, serving meanwhile.
  Json::Value ReadAnswer(int fd) {
    std::string bytes;
    uint32_t length = 0;
    for (;;) {
      PumpUntilReadable(fd);
      char chunk[65536];
      const ssize_t n = ::recv(fd, chunk, sizeof(chunk), MSG_DONTWAIT);
      if (n <= 0) break;
      bytes.append(chunk, static_cast<size_t>(n));
      if (bytes.size() >= 4) {
        std::memcpy(&length, bytes.data(), 4);
        if (bytes.size() >= 4 + length) break;
      }
    }
    if (bytes.size() < 4 || bytes.size() < 4 + length) {
      ADD_FAILURE() << "connection closed without a whole answer (" << bytes.size() << " bytes)";
      return Json::Value();
    }
    std::string body = bytes.substr(4, length);
    EXPECT_EQ('\0', body.back()) << "answer without its NUL";
    body.pop_back();
    return ParseJson(body);
  }

  // Whether the daemon has closed fd (serving until it has, within bounds).
  bool ClosedByDaemon(int fd) {
    PumpUntilReadable(fd);
    char byte;
    return ::recv(fd, &byte, 1, MSG_DONTWAIT) == 0;
  }

  // Sends all of bytes, serving while the socket is full: the loop runs on
  // this thread, so a blocking send of a big request would wait forever.
  bool SendServing(int fd, const std::string& bytes) {
    size_t done = 0;
    for (int round = 0; done < bytes.size() && round < 100000; ++round) {
      const ssize_t n =
          ::send(fd, bytes.data() + done, bytes.size() - done, MSG_DONTWAIT | MSG_NOSIGNAL);
      if (n > 0) {
        done += static_cast<size_t>(n);
      } else if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) {
        server_->RunOnce(/*timeout_ms=*/100);
      } else {
        return false;
      }
    }
    return done == bytes.size();
  }

  Json::Value Ask(const Json::Value& request) {
    FileDescriptor fd = ConnectRaw(SocketPath());
    EXPECT_TRUE(SendServing(fd.get(), Framed(toString(request))));
    return ReadAnswer(fd.get());
  }

  // Asks and expects success; the answer.
  Json::Value Ok(const Json::Value& request) {
    const Json::Value answer = Ask(request);
    EXPECT_TRUE(answer["success"].asBool()) << toString(request) << " -> " << toString(answer);
    return answer;
  }

  // Asks and returns the error code (0 on success).
  int ErrorCode(const Json::Value& request) {
    const Json::Value answer = Ask(request);
    if (answer["success"].asBool()) return 0;
    return answer["error"]["code"].asInt();
  }

  void CreateIndex(const std::string& id = kId, const std::string& share = "s") {
    Json::Value req = Command("index_create", id);
    req["data"]["path"] = DbPath(share);
    req["data"]["settings"] = Json::Value(Json::objectValue);
    req["data"]["mappings"] = ParseJson(
        R"({"property_id": "KALOMDPath", "default": {"type": "string", "analyzer": "kalostandard"},
            "properties": {"KALOMDPath": {"analyzer": "keyword"}, "KALOMDFSSize": {"type": "int"},
                           "KALOMDIsDir": {"type": "bool"}, "KALOMDTitle": {"type": "text"},
                           "KALOMDDurationSecond": {"type": "double"},
                           "KALOMDTextContent": {"type": "text"}}})");
    Ok(req);
  }

  Json::Value SearchFor(Json::Value data) {
    Json::Value req;
    req["command"] = "search";
    req["data"] = std::move(data);
    return Ok(req);
  }

  Json::Value SearchName(const std::string& fragment, int limit = 1000) {
    Json::Value data;
    data["name"] = fragment;
    data["limit"] = limit;
    return SearchFor(data);
  }

  TempDir root_;
  ScopedOrvexRoot scoped_root_{root_.path()};
  std::unique_ptr<search::SearchEngine> engine_;
  std::unique_ptr<search::SearchServer> server_;
};

}  // namespace testing
}  // namespace orvex

#endif  // ORVEX_TESTS_SEARCHD_SEARCHD_FIXTURE_H_
