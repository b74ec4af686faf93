#include "orvex/foundation/lock.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "foundation/fault_helpers.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/system_hooks.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace {

// A child process that tries once to take a LockFile and, when it got it,
// holds it until Release().
class LockHolder {
 public:
  LockHolder(const std::string& path, bool exclusive) {
    int ready[2];
    if (::pipe(ready) != 0) return;
    pid_ = ::fork();
    if (pid_ == 0) {
      SetSystemHooks(SystemHooks{nullptr, [](unsigned long) {}, nullptr});  // no waiting
      try {
        LockFile lock(path, exclusive);
        (void)!::write(ready[1], "1", 1);
        for (;;) ::pause();
      } catch (...) {
      }
      ::_exit(0);
    }
    ::close(ready[1]);
    char c = 0;
    held_ = ::read(ready[0], &c, 1) == 1;
    ::close(ready[0]);
  }
  ~LockHolder() { Release(); }

  bool held() const { return held_; }

  // Ends the child, which drops its lock with it.
  void Release() {
    if (pid_ <= 0) return;
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
    pid_ = -1;
  }

 private:
  pid_t pid_ = -1;
  bool held_ = false;
};

class LockFileTest : public ::testing::Test {
 protected:
  // Fake sleep and random: records each sleep, random returns 0, 1, 2, ...
  ScopedSystemHooks CountingHooks() {
    sleeps_.clear();
    random_calls_ = 0;
    SystemHooks hooks;
    hooks.sleep_for = [this](unsigned long micros) { sleeps_.push_back(micros); };
    hooks.random = [this] { return random_calls_++; };
    return ScopedSystemHooks(std::move(hooks));
  }

  // Takes the lock at once; fails the test if it had to wait.
  std::unique_ptr<LockFile> TakeFree(const std::string& path, bool exclusive) {
    ScopedSystemHooks hooks = CountingHooks();
    auto lock = std::make_unique<LockFile>(path, exclusive);
    EXPECT_TRUE(sleeps_.empty()) << path << " was not free";
    return lock;
  }

  // Expects a lock attempt on path_ to give up after the whole budget.
  void ExpectBudgetExhausted(bool exclusive) {
    ScopedSystemHooks hooks = CountingHooks();
    try {
      LockFile lock(path_, exclusive);
      ADD_FAILURE() << "lock taken while another holder conflicts";
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorLockFile);
      EXPECT_STREQ(e.what(), "Exceed max retry");
    }
    // One randomised sleep per failed flock attempt, the last one included.
    ASSERT_EQ(sleeps_.size(), 64u);
    EXPECT_EQ(random_calls_, 64);
    for (size_t i = 0; i < sleeps_.size(); ++i) EXPECT_EQ(sleeps_[i], 100000u * (i % 10)) << i;
  }

  testing::TempDir temp_;
  const std::string path_ = temp_.Join("cfg.lock");
  std::vector<unsigned long> sleeps_;
  int random_calls_ = 0;
};

TEST_F(LockFileTest, ExclusiveHolderInAnotherProcessExcludesAllUntilItReleases) {
  LockHolder holder(path_, /*exclusive=*/true);
  ASSERT_TRUE(holder.held());
  ExpectBudgetExhausted(/*exclusive=*/false);
  ExpectBudgetExhausted(/*exclusive=*/true);
  holder.Release();
  TakeFree(path_, /*exclusive=*/true);
}

TEST_F(LockFileTest, SharedHolderAdmitsSharedAndExcludesExclusive) {
  LockHolder holder(path_, /*exclusive=*/false);
  ASSERT_TRUE(holder.held());
  ExpectBudgetExhausted(/*exclusive=*/true);
  auto shared = TakeFree(path_, /*exclusive=*/false);
  EXPECT_TRUE(LockHolder(path_, /*exclusive=*/false).held()) << "a third sharer is admitted";
}

TEST_F(LockFileTest, TwoLockFilesInOneProcessExcludeEachOther) {
  const mode_t old_mask = ::umask(022);
  auto first = TakeFree(path_, /*exclusive=*/true);
  ::umask(old_mask);
  EXPECT_EQ(first->path(), path_);
  ExpectBudgetExhausted(/*exclusive=*/false);
  EXPECT_FALSE(LockHolder(path_, /*exclusive=*/false).held()) << "a child sees it too";
  first.reset();
  TakeFree(path_, /*exclusive=*/true);
  struct stat st;  // created with mode 0644 and left in place
  ASSERT_EQ(::lstat(path_.c_str(), &st), 0);
  EXPECT_TRUE(S_ISREG(st.st_mode));
  EXPECT_EQ(st.st_mode & 07777, 0644u);
}

TEST_F(LockFileTest, MovedLockStaysHeldUntilItsNewOwnerGoes) {
  const std::string other_path = temp_.Join("other.lock");
  auto original = TakeFree(path_, /*exclusive=*/true);
  {
    LockFile moved(std::move(*original));
    original.reset();  // a moved-from lock releases nothing
    ExpectBudgetExhausted(/*exclusive=*/true);
    LockFile target(other_path, /*exclusive=*/true);
    target = std::move(moved);  // drops other_path, takes over path_
    EXPECT_EQ(target.path(), path_);
    TakeFree(other_path, /*exclusive=*/true);
    ExpectBudgetExhausted(/*exclusive=*/true);
  }
  TakeFree(path_, /*exclusive=*/true);
}

TEST_F(LockFileTest, OpenFailureIsLoggedAndThrownWithoutRetry) {
  const std::vector<std::pair<std::string, std::string>> cases = {
      {temp_.Join("missing/dir/cfg.lock"), "No such file or directory"},
      {temp_.path(), "Is a directory"},
  };
  for (const auto& [path, system_text] : cases) {
    testing::LogCapture log;
    ScopedSystemHooks hooks = CountingHooks();
    try {
      LockFile lock(path, /*exclusive=*/true);
      ADD_FAILURE() << path;
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorLockFile);
      EXPECT_EQ(e.reason(), "open failed, reason=" + system_text);
    }
    EXPECT_EQ(errno, 0) << path;
    EXPECT_TRUE(sleeps_.empty()) << path;
    ASSERT_EQ(log.lines().size(), 1u) << path;
    EXPECT_EQ(
        testing::WithoutLineNumber(log.lines()[0]),
        testing::CheckLine("lock_file", "0 > (fd_ = open(path_.c_str(), O_RDWR | O_CREAT, 0644))",
                           "open failed, reason=" + system_text) +
            " [err: " + system_text + "]");
  }
}

TEST(MutexTest, LockMutexSerialisesThreadsAndTryLockFailsWhileHeld) {
  Mutex mutex;
  long counter = 0;
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < 20000; ++i) {
        LockMutex hold(mutex);
        long seen = counter;
        std::this_thread::yield();
        counter = seen + 1;
      }
    });
  }
  for (std::thread& t : threads) t.join();
  EXPECT_EQ(counter, 80000);

  auto try_from_other_thread = [&mutex] {
    bool locked = false;
    std::thread([&] { locked = mutex.TryLock() && mutex.Unlock(); }).join();
    return locked;
  };
  ASSERT_TRUE(mutex.Lock());
  EXPECT_FALSE(mutex.TryLock());  // not recursive
  EXPECT_FALSE(try_from_other_thread());
  ASSERT_TRUE(mutex.Unlock());
  EXPECT_TRUE(try_from_other_thread());
  {
    LockMutex hold(mutex);
    EXPECT_FALSE(try_from_other_thread());
  }
  EXPECT_TRUE(try_from_other_thread());
}

}  // namespace
}  // namespace orvex
