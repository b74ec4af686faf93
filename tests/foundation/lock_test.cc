#include "orvex/foundation/lock.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

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
// holds it until the holder goes.
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
  ~LockHolder() {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
  }
  bool held() const { return held_; }

 private:
  pid_t pid_ = -1;
  bool held_ = false;
};

class LockFileTest : public ::testing::Test {
 protected:
  // Tries path_; true when taken. Fake sleeps are recorded, random returns
  // 0, 1, 2, ...
  bool TryLock(bool exclusive) {
    sleeps_.clear();
    int random_calls = 0;
    ScopedSystemHooks hooks(SystemHooks{nullptr,
                                        [this](unsigned long micros) { sleeps_.push_back(micros); },
                                        [&random_calls] { return random_calls++; }});
    try {
      LockFile lock(path_, exclusive);
      return true;
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorLockFile);
      EXPECT_STREQ(e.what(), "Exceed max retry");
    }
    // One randomised sleep per failed flock attempt, the last one included.
    EXPECT_EQ(sleeps_.size(), 64u);
    EXPECT_EQ(random_calls, 64);
    for (size_t i = 0; i < sleeps_.size(); ++i) EXPECT_EQ(sleeps_[i], 100000u * (i % 10)) << i;
    return false;
  }

  testing::TempDir temp_;
  const std::string path_ = temp_.Join("cfg.lock");
  std::vector<unsigned long> sleeps_;
};

TEST_F(LockFileTest, HolderInAnotherProcessExcludesConflictingLocksUntilItGoes) {
  {
    LockHolder holder(path_, /*exclusive=*/true);
    ASSERT_TRUE(holder.held());
    EXPECT_FALSE(TryLock(/*exclusive=*/false));
  }
  LockHolder sharer(path_, /*exclusive=*/false);
  ASSERT_TRUE(sharer.held());
  EXPECT_FALSE(TryLock(/*exclusive=*/true));
  EXPECT_TRUE(TryLock(/*exclusive=*/false));
  EXPECT_TRUE(sleeps_.empty());
}

TEST_F(LockFileTest, LocksInOneProcessExcludeEachOtherAndMovesKeepThemHeld) {
  const mode_t old_mask = ::umask(022);
  auto original = std::make_unique<LockFile>(path_, /*exclusive=*/true);
  ::umask(old_mask);
  EXPECT_FALSE(TryLock(/*exclusive=*/false));
  EXPECT_FALSE(LockHolder(path_, /*exclusive=*/false).held()) << "a child sees it too";
  {
    LockFile moved(std::move(*original));
    original.reset();  // a moved-from lock releases nothing
    EXPECT_FALSE(TryLock(/*exclusive=*/true));
  }
  EXPECT_TRUE(TryLock(/*exclusive=*/true));
  struct stat st;  // created with mode 0644 and left in place
  ASSERT_EQ(::lstat(path_.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
}

TEST_F(LockFileTest, OpenFailureIsLoggedAndThrownWithoutRetry) {
  testing::LogCapture log;
  ScopedSystemHooks hooks(
      SystemHooks{nullptr, [this](unsigned long micros) { sleeps_.push_back(micros); }, nullptr});
  try {
    LockFile lock(temp_.path(), /*exclusive=*/true);
    ADD_FAILURE() << "locked a directory";
  } catch (const Error& e) {
    EXPECT_EQ(e.code(), kErrorLockFile);
    EXPECT_EQ(e.reason(), "open failed, reason=Is a directory");
  }
  EXPECT_TRUE(sleeps_.empty());
  ASSERT_EQ(log.lines().size(), 1u);
  EXPECT_EQ(
      testing::WithoutLineNumber(log.lines()[0]),
      testing::CheckLine("lock_file", "0 > (fd_ = open(path_.c_str(), O_RDWR | O_CREAT, 0644))",
                         "open failed, reason=Is a directory") +
          " [err: Is a directory]");
}

TEST(MutexTest, LockMutexSerialisesThreadsAndIsNotRecursive) {
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
  {
    LockMutex hold(mutex);
    EXPECT_FALSE(mutex.TryLock());
  }
  EXPECT_TRUE(mutex.TryLock() && mutex.Unlock());
}

}  // namespace
}  // namespace orvex
