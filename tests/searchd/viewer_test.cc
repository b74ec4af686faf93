// Permission trimming of user searches: share privileges and hide_unreadable
// (the entry's read bit and the search bit of every directory from the share
// root down), for root naming a user and for a user asking itself, checked
// against what each user can actually open.
#include "search/viewer.h"

#include <fcntl.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "orvex/portable/share_registry.h"
#include "search/search_error.h"
#include "searchd/searchd_fixture.h"

namespace orvex {
namespace testing {
namespace {

// A fake file system: path -> (mode with type, owner, group).
struct FakeEntry {
  mode_t mode;
  uid_t uid;
  gid_t gid;
};

TEST(ReadCheckTest, JudgesParentsLikeTheKernelAndLooksAtEachDirectoryOnce) {
  const std::map<std::string, FakeEntry> fs = {
      {"/s", {S_IFDIR | 0755, 0, 0}},
      {"/s/open", {S_IFDIR | 0755, 0, 0}},
      {"/s/open/deep", {S_IFDIR | 0711, 0, 0}},  // search only: its files still show
      {"/s/mine", {S_IFDIR | 0700, 7, 0}},       // the viewer's own
      {"/s/theirs", {S_IFDIR | 0077, 7, 8}},     // the owner class denies: no other is asked
      {"/s/group", {S_IFDIR | 0750, 0, 50}},     // through a supplementary group
      {"/s/shut", {S_IFDIR | 0700, 0, 0}},       // nothing below is looked at
      {"/s/shut/inner", {S_IFDIR | 0777, 0, 0}},
      {"/s/file", {S_IFREG | 0644, 0, 0}},  // a file where a directory should be
  };
  const struct {
    std::string path;
    bool readable;
  } cases[] = {
      {"/s/open/a", true},          {"/s/open/b", true},
      {"/s/open/deep", false},      {"/s/open/deep/c", true},
      {"/s/mine/d", true},          {"/s/theirs/e", false},
      {"/s/group/f", true},         {"/s/shut/g", false},
      {"/s/shut/inner/h", false},   {"/s/file/i", false},
      {"/s/missing/j", false},      {"/elsewhere/k", false},
      {"/s/open/../shut/g", false}, {"/s", true},
  };
  search::Viewer viewer;
  viewer.everything = false;
  viewer.uid = 7;
  viewer.groups = {8, 50};
  std::map<std::string, int> stats;
  search::ReadCheck check(viewer, "/s/", [&](const std::string& path, struct stat& st) {
    ++stats[path];
    if (path.find("/missing") != std::string::npos) return -1;
    // Entries not listed are files that anyone may read: the directories decide.
    const auto it = fs.find(path);
    const FakeEntry e = it == fs.end() ? FakeEntry{S_IFREG | 0644, 0, 0} : it->second;
    st = {};
    st.st_mode = e.mode;
    st.st_uid = e.uid;
    st.st_gid = e.gid;
    return 0;
  });
  for (int round = 0; round < 2; ++round) {
    for (const auto& c : cases) {
      EXPECT_EQ(c.readable, check.CanRead(c.path)) << c.path;
    }
  }
  // Directories are looked at once; entries (asked twice) once per question.
  std::set<std::string> asked;
  for (const auto& c : cases) asked.insert(c.path);
  for (const auto& [path, count] : stats) {
    if (fs.count(path) != 0 && asked.count(path) == 0) {
      EXPECT_EQ(1, count) << path;
    }
  }
  EXPECT_EQ(0u, stats.count("/s/shut/inner")) << "looked below a closed directory";
}

// Three users, six shares (each user "rw", "ro" or "na" in turn, with and
// without hide_unreadable), and in each share directories and files of
// varied modes, owners and groups.
class ViewerTest : public SearchdLoopTest {
 protected:
  struct Node {
    const char* path;  // relative to the share root
    mode_t mode;
    int owner;  // index into users_, -1 for root
    int group;  // index into users_ (their primary group), -1 for root's
  };
  static constexpr const char* kUserNames[] = {"daemon", "bin", "nobody"};
  static constexpr const char* kLevels[] = {"rw", "ro", "na"};
  static constexpr Node kTree[] = {
      {"open", 0755, 0, 1},         {"open/a600", 0600, 0, 1},
      {"open/b640", 0640, 2, 1},    {"open/c644", 0644, 1, 0},
      {"closed", 0700, 1, 1},       {"closed/d644", 0644, 0, 0},
      {"closed/inner", 0755, 2, 2}, {"closed/inner/e644", 0644, 2, 2},
      {"search", 0710, -1, 0},      {"search/f640", 0640, 1, 0},
      {"search/g600", 0600, 0, 2},  {"top644", 0644, 2, 2},
      {"top640", 0640, -1, 2},
  };

  void SetUp() override {
    if (::geteuid() != 0) GTEST_SKIP() << "needs root to act as other users";
    for (const char* name : kUserNames) {
      const struct passwd* pw = ::getpwnam(name);
      if (pw == nullptr) GTEST_SKIP() << "needs user " << name;
      uids_.push_back(pw->pw_uid);
      gids_.push_back(pw->pw_gid);
    }
    ASSERT_EQ(0, ::chmod(root_.path().c_str(), 0755));  // users reach the shares and the socket
    std::vector<portable::ShareRecord> shares;
    for (int k = 0; k < 6; ++k) {
      portable::ShareRecord share;
      share.name = (k < 3 ? "plain" : "hiding") + std::to_string(k % 3);
      share.path = root_.Join("volume1/" + share.name);
      share.hide_unreadable = k >= 3;
      for (int u = 0; u < 3; ++u) share.privileges[kUserNames[u]] = kLevels[(u + k) % 3];
      shares.push_back(share);
      MakeShare(share);
    }
    std::filesystem::create_directories(root_.Join("etc/orvex"));
    root_.Write("etc/orvex/shares.json", portable::FormatShareRegistry(shares));
    shares_ = shares;
  }

  void MakeShare(const portable::ShareRecord& share) {
    std::filesystem::create_directories(share.path);
    ASSERT_EQ(0, ::chmod(share.path.c_str(), 0755));
    const std::string id = "fileindex_" + share.name;
    CreateIndex(id, share.name);
    Json::Value compound;
    for (const Node& node : kTree) {
      const std::string path = share.path + "/" + node.path;
      const bool dir = std::string(node.path).find_last_of("0123456789") == std::string::npos;
      if (dir) {
        std::filesystem::create_directory(path);
      } else {
        root_.Write(path.substr(root_.path().size() + 1), "text");
      }
      ASSERT_EQ(0, ::chown(path.c_str(), node.owner < 0 ? 0 : uids_[node.owner],
                           node.group < 0 ? 0 : gids_[node.group]));
      ASSERT_EQ(0, ::chmod(path.c_str(), node.mode));
      Json::Value doc = FileDoc(path);
      doc["KALOMDIsDir"] = dir;
      compound["compound"].append(Upsert(id, doc));
    }
    Ok(compound);
    Ok(Command("commit", id));
  }

  // What user u can open, asked of the kernel by a child running as u with
  // u's groups: "share:relative path" of every entry, when the share shows
  // it to u at all.
  std::set<std::string> Openable(int u) {
    std::vector<std::string> keys;
    std::vector<std::string> paths;
    for (const portable::ShareRecord& share : shares_) {
      if (share.privileges.at(kUserNames[u]) == "na") continue;
      for (const Node& node : kTree) {
        keys.push_back(share.name + ":" + node.path);
        paths.push_back(share.path + "/" + node.path);
      }
    }
    const std::string opened = InChild(uids_[u], gids_[u], kUserNames[u], [&] {
      std::string marks;
      for (const std::string& path : paths) {
        const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
        marks += fd >= 0 ? '1' : '0';
        if (fd >= 0) ::close(fd);
      }
      return marks;
    });
    EXPECT_EQ(paths.size(), opened.size());
    std::set<std::string> out;
    for (size_t i = 0; i < keys.size() && i < opened.size(); ++i) {
      const bool hiding = keys[i].compare(0, 6, "hiding") == 0;
      if (!hiding || opened[i] == '1') out.insert(keys[i]);
    }
    return out;
  }

  // The text fn returns in a child process running as uid, with the groups
  // of user, read from a pipe once the child has exited.
  template <typename Fn>
  std::string InChild(uid_t uid, gid_t gid, const char* user, Fn fn) {
    int fds[2];
    EXPECT_EQ(0, ::pipe(fds));
    FileDescriptor read_end(fds[0]);
    FileDescriptor write_end(fds[1]);
    const pid_t pid = ::fork();
    if (pid == 0) {
      if (::initgroups(user, gid) != 0 || ::setgid(gid) != 0 || ::setuid(uid) != 0) ::_exit(3);
      const std::string text = fn();
      const bool written =
          ::write(write_end.get(), text.data(), text.size()) == static_cast<ssize_t>(text.size());
      ::_exit(written ? 0 : 5);
    }
    write_end.reset();
    std::string text;
    char chunk[4096];
    int status = -1;
    // The loop serves the child's requests while reading what it writes.
    for (int round = 0; round < 1000 && ::waitpid(pid, &status, WNOHANG) == 0; ++round) {
      server_->RunOnce(/*timeout_ms=*/10);
    }
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
    for (ssize_t n; (n = ::read(read_end.get(), chunk, sizeof(chunk))) > 0;) {
      text.append(chunk, static_cast<size_t>(n));
    }
    return text;
  }

  std::set<std::string> Keys(const Json::Value& answer) {
    std::set<std::string> keys;
    for (const Json::Value& hit : answer["data"]["hits"]) {
      const std::string share = hit["id"].asString().substr(10);
      const std::string root = root_.Join("volume1/" + share + "/");
      keys.insert(share + ":" + hit["path"].asString().substr(root.size()));
    }
    return keys;
  }

  static Json::Value SearchRequest(const Json::Value& data) {
    Json::Value req;
    req["command"] = "search";
    req["data"] = data;
    return req;
  }

  std::vector<uid_t> uids_;
  std::vector<gid_t> gids_;
  std::vector<portable::ShareRecord> shares_;
};

TEST_F(ViewerTest, EachUserSeesWhatItCanOpenAndCountsNothingElse) {
  Json::Value q(Json::objectValue);
  q["limit"] = 1000;
  EXPECT_EQ(6 * std::size(kTree), SearchFor(q)["data"]["hits"].size()) << "root sees all";
  for (int u = 0; u < 3; ++u) {
    const std::set<std::string> openable = Openable(u);
    q["user"] = kUserNames[u];
    q["limit"] = 1000;
    const Json::Value all = SearchFor(q);
    EXPECT_EQ(openable, Keys(all)) << kUserNames[u];
    EXPECT_EQ(openable.size(), all["data"]["total"].asUInt()) << kUserNames[u];
    EXPECT_TRUE(all["data"]["total_exact"].asBool());
    // A short page counts no hidden entry either.
    q["limit"] = 3;
    const Json::Value page = SearchFor(q);
    EXPECT_EQ(3u, page["data"]["hits"].size());
    EXPECT_LE(page["data"]["total"].asUInt(), openable.size()) << kUserNames[u];
    for (const std::string& key : Keys(page)) {
      EXPECT_EQ(1u, openable.count(key)) << key;
    }
  }
  q["user"] = "no-such-user-here";
  EXPECT_EQ(search::kBadArgument, ErrorCode(SearchRequest(q)));
}

TEST_F(ViewerTest, AUserAskingItselfGetsWhatRootNamingItGets) {
  ASSERT_EQ(0, ::chmod(SocketPath().c_str(), 0666));
  Json::Value q(Json::objectValue);
  q["limit"] = 1000;
  auto ask_as = [&](int u, const Json::Value& data) {
    return ParseJson(InChild(uids_[u], gids_[u], kUserNames[u], [&] {
      kalodaemon::DomainSockConnection connection(SocketPath());
      std::string answer;
      if (!connection.Connect() || !connection.Send(toString(SearchRequest(data))) ||
          !connection.Recv(answer)) {
        ::_exit(4);
      }
      return answer;
    }));
  };
  const Json::Value own = ask_as(0, q);
  q["user"] = kUserNames[0];
  EXPECT_EQ(Keys(SearchFor(q)), Keys(own));
  EXPECT_FALSE(own["data"]["hits"].empty());
  q["user"] = "root";
  EXPECT_EQ(search::kNotPermitted, ask_as(0, q)["error"]["code"].asInt());
}

}  // namespace
}  // namespace testing
}  // namespace orvex
