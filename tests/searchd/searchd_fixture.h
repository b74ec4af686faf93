// Fixtures for the search daemon's tests. SearchdLoopTest runs the engine and
// its socket loop in this process, in a temporary ORVEX_ROOT, and drives the
// loop with RunOnce() until the client's answer is there: no threads, no
// sleeps. Requests travel over the real socket in the real framing.
// One test at a time (ORVEX_ROOT is process-wide).
#ifndef ORVEX_TESTS_SEARCHD_SEARCHD_FIXTURE_H_
#define ORVEX_TESTS_SEARCHD_SEARCHD_FIXTURE_H_

#include <gtest/gtest.h>
#include <json/json.h>
#include <sys/socket.h>

#include <cstring>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "kalo/kalo_sock.h"
#include "orvex/foundation/json.h"
#include "orvex/portable/file_descriptor.h"
#include "orvex/portable/root.h"
#include "search/index_registry.h"
#include "search/search_engine.h"
#include "search/search_server.h"
#include "support/framed_client.h"
#include "support/temp_dir.h"

namespace orvex {
namespace testing {

inline Json::Value ParseJson(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
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

// A file's document with the further properties of the JSON text extra.
inline Json::Value DocWith(const std::string& path, const std::string& extra) {
  Json::Value doc = FileDoc(path);
  const Json::Value more = ParseJson(extra);
  for (const std::string& name : more.getMemberNames()) doc[name] = more[name];
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

inline Json::Value DelById(const std::string& id, const std::string& doc_id) {
  Json::Value req = Command("document_del_by_id", id);
  req["data"]["doc_id"] = doc_id;
  return req;
}

// A request of command whose data is the JSON text data.
inline Json::Value Request(const std::string& command, const std::string& data = "{}") {
  Json::Value req;
  req["command"] = command;
  req["data"] = ParseJson(data);
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

  // Reads one framed answer from fd, serving meanwhile.
  Json::Value ReadAnswer(int fd) {
    const std::optional<std::string> body = ReadFrame(fd, [this] { server_->RunOnce(1000); });
    if (!body) {
      ADD_FAILURE() << "connection closed without a whole answer";
    } else {
      EXPECT_EQ('\0', body->back()) << "answer without its NUL";
    }
    return BodyJson(body);
  }

  // Whether the daemon has closed fd (serving until it has, within bounds).
  bool ClosedByDaemon(int fd) {
    char byte;
    return !ReadFrame(fd, [this] { server_->RunOnce(1000); }) &&
           ::recv(fd, &byte, 1, MSG_DONTWAIT) == 0;
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
    FileDescriptor fd = ConnectUnix(SocketPath());
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
  // The paths a search of the JSON text data finds.
  std::vector<std::string> Found(const std::string& data) {
    return HitPaths(SearchFor(ParseJson(data)));
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
