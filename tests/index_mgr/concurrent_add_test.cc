// Two processes adding different folders at the same moment: the folder
// lock makes the second add load the first one's save, so neither folder is
// lost. The processes are this test program itself, run again with a filter
// that selects only the child's part below.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>

#include "index_mgr/index_mgr_test_root.h"

extern char** environ;

namespace orvex {
namespace fileindex {
namespace {

constexpr char kFolderEnv[] = "ORVEX_TEST_ADD_FOLDER";
constexpr char kStartEnv[] = "ORVEX_TEST_START_FIFO";
constexpr int kRounds = 30;

// The child's part, disabled in ordinary runs: waits at its FIFO until the
// parent lets both children go at once, then adds its folder.
TEST(IndexMgrChildProcess, DISABLED_AddsTheFolderNamedInTheEnvironment) {
  const char* folder = std::getenv(kFolderEnv);
  const char* start = std::getenv(kStartEnv);
  ASSERT_NE(folder, nullptr) << "run by ConcurrentAddTest only";
  ASSERT_NE(start, nullptr) << "run by ConcurrentAddTest only";
  const int fd = ::open(start, O_RDONLY);  // blocks until the parent opens it
  ASSERT_GE(fd, 0);
  char byte;
  while (::read(fd, &byte, 1) > 0) {
  }
  ::close(fd);
  // The lock's retry waits, shortened: 0 to 45 ms instead of 0 to 0.9 s.
  ScopedSystemHooks hooks(
      SystemHooks{nullptr, [](unsigned long micros) { ::usleep(micros / 20); }, nullptr});
  Json::Value record(Json::objectValue);
  record["path"] = folder;
  record["name"] = folder;
  for (const char* type : {"document", "audio", "video", "photo"}) record[type] = true;
  Json::Value request(Json::arrayValue);
  request.append(record);
  FolderAdd(request, false);
}

class ConcurrentAddTest : public testing::IndexMgrTestRoot {
 protected:
  pid_t Spawn(const std::string& folder, const std::string& fifo) {
    std::vector<std::string> env = {std::string(kFolderEnv) + "=" + folder,
                                    std::string(kStartEnv) + "=" + fifo};
    for (char** e = environ; *e != nullptr; ++e) env.push_back(*e);
    std::vector<char*> envp;
    for (std::string& entry : env) envp.push_back(entry.data());
    envp.push_back(nullptr);
    std::string program = "/proc/self/exe";
    std::string filter = "--gtest_filter=IndexMgrChildProcess.*";
    std::string disabled = "--gtest_also_run_disabled_tests";
    char* argv[] = {program.data(), filter.data(), disabled.data(), nullptr};
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    const std::string out = dir_.Join("child-" + std::to_string(children_++) + ".out");
    posix_spawn_file_actions_addopen(&actions, 1, out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    pid_t pid = -1;
    const int rc = posix_spawn(&pid, program.c_str(), &actions, nullptr, argv, envp.data());
    posix_spawn_file_actions_destroy(&actions);
    return rc == 0 ? pid : -1;
  }

  static int Wait(pid_t pid) {
    int status = 0;
    if (::waitpid(pid, &status, 0) != pid || !WIFEXITED(status)) return -1;
    return WEXITSTATUS(status);
  }

  int children_ = 0;
};

TEST_F(ConcurrentAddTest, TwoProcessesAddingAtOnceKeepBothFolders) {
  const std::string root = AddShareWithDirs("s1");
  std::set<std::string> expected;
  for (int round = 0; round < kRounds; ++round) {
    const std::string a = "/s1/r" + std::to_string(round) + "a";
    const std::string b = "/s1/r" + std::to_string(round) + "b";
    MakeDirs(root, {a.c_str() + 4, b.c_str() + 4});
    const std::string fifo_a = dir_.Join("start-a"), fifo_b = dir_.Join("start-b");
    std::filesystem::remove(fifo_a);
    std::filesystem::remove(fifo_b);
    ASSERT_EQ(::mkfifo(fifo_a.c_str(), 0600), 0);
    ASSERT_EQ(::mkfifo(fifo_b.c_str(), 0600), 0);
    const pid_t pid_a = Spawn(a, fifo_a);
    const pid_t pid_b = Spawn(b, fifo_b);
    ASSERT_GT(pid_a, 0);
    ASSERT_GT(pid_b, 0);
    // Each open returns once its child is waiting at the other end; closing
    // both releases the two children together.
    const int fd_a = ::open(fifo_a.c_str(), O_WRONLY);
    const int fd_b = ::open(fifo_b.c_str(), O_WRONLY);
    ::close(fd_a);
    ::close(fd_b);
    EXPECT_EQ(Wait(pid_a), 0) << "round " << round;
    EXPECT_EQ(Wait(pid_b), 0) << "round " << round;
    expected.insert(a);
    expected.insert(b);
    std::set<std::string> stored;
    for (const auto& [path, paused] : Folders()) stored.insert(path);
    ASSERT_EQ(stored, expected) << "round " << round;
  }
  EXPECT_EQ(Registered("s1").size(), 2u * kRounds);
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
