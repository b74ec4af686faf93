// Permission trimming of user searches: share privileges and
// hide_unreadable, for root naming a user and for a user asking itself.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include "search/search_error.h"
#include "searchd/searchd_fixture.h"

namespace orvex {
namespace testing {
namespace {

constexpr uid_t kNobody = 65534;

class ViewerTest : public SearchdLoopTest {
 protected:
  void SetUp() override {
    if (::geteuid() != 0) GTEST_SKIP() << "needs root to act as another user";
    std::filesystem::create_directories(root_.Join("etc/orvex"));
    root_.Write("etc/orvex/shares.json", R"([{"name": "open", "path": ")" + Share("open") + R"("},
                    {"name": "closed", "path": ")" +
                                             Share("closed") +
                                             R"(", "privileges": {"nobody": "na"}},
                    {"name": "private", "path": ")" +
                                             Share("private") + R"(", "hide_unreadable": true}])");
    for (const char* share : {"open", "closed", "private"}) {
      std::filesystem::create_directories(Share(share));
      CreateIndex(std::string("fileindex_") + share, share);
      AddFile(share, "notes.txt", 0644);
    }
    AddFile("private", "secret.txt", 0600);
    for (const char* share : {"open", "closed", "private"}) {
      Ok(Command("commit", std::string("fileindex_") + share));
    }
  }

  std::string Share(const std::string& name) const { return root_.Join("volume1/" + name); }

  void AddFile(const std::string& share, const std::string& name, mode_t mode) {
    const std::string path = Share(share) + "/" + name;
    root_.Write("volume1/" + share + "/" + name, "text");
    ASSERT_EQ(0, ::chmod(path.c_str(), mode));
    Ok(Upsert("fileindex_" + share, FileDoc(path)));
  }

  std::set<std::string> Names(const Json::Value& answer) {
    std::set<std::string> names;
    for (const Json::Value& hit : answer["data"]["hits"]) {
      names.insert(hit["id"].asString() + ":" + hit["name"].asString());
    }
    return names;
  }

  // The answer to request from a child process running as uid, read from a
  // pipe once the child has exited (answers here are far below a pipe's size).
  Json::Value AskAs(uid_t uid, const Json::Value& request) {
    int fds[2];
    EXPECT_EQ(0, ::pipe(fds));
    FileDescriptor read_end(fds[0]);
    FileDescriptor write_end(fds[1]);
    const pid_t pid = ::fork();
    if (pid == 0) {
      if (::setgid(kNobody) != 0 || ::setuid(uid) != 0) ::_exit(3);
      kalodaemon::DomainSockConnection connection(SocketPath());
      std::string answer;
      if (!connection.Connect() || !connection.Send(toString(request)) ||
          !connection.Recv(answer)) {
        ::_exit(4);
      }
      const bool written = ::write(write_end.get(), answer.data(), answer.size()) ==
                           static_cast<ssize_t>(answer.size());
      ::_exit(written ? 0 : 5);
    }
    write_end.reset();
    int status = -1;
    for (int round = 0; round < 1000 && ::waitpid(pid, &status, WNOHANG) == 0; ++round) {
      server_->RunOnce(/*timeout_ms=*/100);
    }
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
    std::string text;
    char chunk[4096];
    for (ssize_t n; (n = ::read(read_end.get(), chunk, sizeof(chunk))) > 0;) {
      text.append(chunk, static_cast<size_t>(n));
    }
    return ParseJson(text);
  }
};

TEST_F(ViewerTest, RootSeesEverythingAndWhatANamedUserWouldSee) {
  Json::Value q(Json::objectValue);
  EXPECT_EQ((std::set<std::string>{"fileindex_closed:notes.txt", "fileindex_open:notes.txt",
                                   "fileindex_private:notes.txt", "fileindex_private:secret.txt"}),
            Names(SearchFor(q)));
  q["user"] = "nobody";
  const Json::Value answer = SearchFor(q);
  EXPECT_EQ((std::set<std::string>{"fileindex_open:notes.txt", "fileindex_private:notes.txt"}),
            Names(answer));
  EXPECT_EQ(2, answer["data"]["total"].asInt());
  q["user"] = "no-such-user-here";
  Json::Value req;
  req["command"] = "search";
  req["data"] = q;
  EXPECT_EQ(search::kBadArgument, ErrorCode(req));
}

TEST_F(ViewerTest, AUserSeesOnlyItsOwnResultsAndCannotNameAnother) {
  ASSERT_EQ(0, ::chmod(root_.path().c_str(), 0755));  // the socket's directory, for nobody
  ASSERT_EQ(0, ::chmod(SocketPath().c_str(), 0666));
  Json::Value req;
  req["command"] = "search";
  req["data"] = Json::Value(Json::objectValue);
  EXPECT_EQ((std::set<std::string>{"fileindex_open:notes.txt", "fileindex_private:notes.txt"}),
            Names(AskAs(kNobody, req)));
  req["data"]["user"] = "root";
  EXPECT_EQ(search::kNotPermitted, AskAs(kNobody, req)["error"]["code"].asInt());
}

}  // namespace
}  // namespace testing
}  // namespace orvex
