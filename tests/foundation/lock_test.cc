#include "orvex/foundation/lock.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "orvex/foundation/error.h"
#include "orvex/foundation/system_hooks.h"
#include "support/log_capture.h"
#include "support/temp_dir.h"

namespace orvex {
namespace {

// Everything after "<source>:<line>" of a log line, or "" when the line does
// not start that way: line numbers are free, the rest is exact.
std::string AfterSourceLine(const std::string& line, const std::string& source) {
  if (line.compare(0, source.size() + 1, source + ":") != 0) return "";
  size_t i = source.size() + 1;
  const size_t digits = i;
  while (i < line.size() && isdigit(static_cast<unsigned char>(line[i]))) ++i;
  return i == digits ? "" : line.substr(i);
}

// A child process that takes a LockFile and holds it until Release().
class LockHolder {
 public:
  LockHolder(const std::string& path, bool exclusive) {
    if (::pipe(ready_) != 0 || ::pipe(release_) != 0) ADD_FAILURE() << "pipe";
    pid_ = ::fork();
    if (pid_ == 0) RunChild(path, exclusive);
    ::close(ready_[1]);
    ::close(release_[0]);
    char c = 0;
    held_ = ::read(ready_[0], &c, 1) == 1 && c == '1';
    ::close(ready_[0]);
  }
  LockHolder(const LockHolder&) = delete;
  LockHolder& operator=(const LockHolder&) = delete;
  ~LockHolder() { Release(); }

  bool held() const { return held_; }

  // Lets the child drop its lock and waits until it has exited.
  void Release() {
    if (pid_ <= 0) return;
    ::close(release_[1]);
    int status = 0;
    ::waitpid(pid_, &status, 0);
    pid_ = -1;
  }

 private:
  [[noreturn]] void RunChild(const std::string& path, bool exclusive) {
    ::close(ready_[0]);
    ::close(release_[1]);
    // A child that meets contention gives up at once instead of sleeping.
    SystemHooks no_sleep;
    no_sleep.sleep_for = [](unsigned long) {};
    SetSystemHooks(std::move(no_sleep));
    char c = '0';
    try {
      LockFile lock(path, exclusive);
      c = '1';
      (void)!::write(ready_[1], &c, 1);
      (void)!::read(release_[0], &c, 1);  // returns when the parent closes its end
    } catch (...) {
      (void)!::write(ready_[1], &c, 1);
    }
    ::_exit(0);
  }

  int ready_[2] = {-1, -1};
  int release_[2] = {-1, -1};
  pid_t pid_ = -1;
  bool held_ = false;
};

class LockFileTest : public ::testing::Test {
 protected:
  LockFileTest() : dir_(temp_.path()), path_(temp_.Join("cfg.lock")) {}

  // Fake sleep and random: records each sleep, random returns 0, 1, 2, ...
  SystemHooks CountingHooks() {
    SystemHooks hooks;
    hooks.sleep_for = [this](unsigned long micros) { sleeps_.push_back(micros); };
    hooks.random = [this] { return random_calls_++; };
    return hooks;
  }

  // Expects a lock attempt on path_ to give up after the whole budget.
  void ExpectBudgetExhausted(bool exclusive) {
    sleeps_.clear();
    random_calls_ = 0;
    ScopedSystemHooks hooks(CountingHooks());
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
  const std::string dir_;
  const std::string path_;
  std::vector<unsigned long> sleeps_;
  int random_calls_ = 0;
};

TEST_F(LockFileTest, CreatesMissingLockFileWithMode0644) {
  const mode_t old_mask = ::umask(022);
  {
    ScopedSystemHooks hooks(CountingHooks());
    LockFile lock(path_, /*exclusive=*/true);
    EXPECT_EQ(lock.path(), path_);
  }
  ::umask(old_mask);
  struct stat st;
  ASSERT_EQ(::lstat(path_.c_str(), &st), 0);  // never removed on release
  EXPECT_TRUE(S_ISREG(st.st_mode));
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  EXPECT_TRUE(sleeps_.empty());
}

TEST_F(LockFileTest, ExclusiveHolderInAnotherProcessExhaustsTheBudget) {
  LockHolder holder(path_, /*exclusive=*/true);
  ASSERT_TRUE(holder.held());
  ExpectBudgetExhausted(/*exclusive=*/false);
  ExpectBudgetExhausted(/*exclusive=*/true);
}

TEST_F(LockFileTest, SharedHolderAdmitsSharedAndExcludesExclusive) {
  LockHolder holder(path_, /*exclusive=*/false);
  ASSERT_TRUE(holder.held());
  ExpectBudgetExhausted(/*exclusive=*/true);
  sleeps_.clear();
  ScopedSystemHooks hooks(CountingHooks());
  LockFile shared(path_, /*exclusive=*/false);
  EXPECT_TRUE(sleeps_.empty());
  // A third process may share too while both hold it.
  LockHolder other(path_, /*exclusive=*/false);
  EXPECT_TRUE(other.held());
}

TEST_F(LockFileTest, LockIsFreeOnceTheHolderReleases) {
  LockHolder holder(path_, /*exclusive=*/true);
  ASSERT_TRUE(holder.held());
  holder.Release();
  ScopedSystemHooks hooks(CountingHooks());
  LockFile lock(path_, /*exclusive=*/true);
  EXPECT_TRUE(sleeps_.empty());
}

TEST_F(LockFileTest, TwoLockFilesInOneProcessExcludeEachOther) {
  {
    LockFile first(path_, /*exclusive=*/true);
    ExpectBudgetExhausted(/*exclusive=*/false);
    // The child sees the in-process holder as well.
    LockHolder child(path_, /*exclusive=*/false);
    EXPECT_FALSE(child.held());
  }
  sleeps_.clear();
  ScopedSystemHooks hooks(CountingHooks());
  LockFile again(path_, /*exclusive=*/true);  // the destructor released it
  EXPECT_TRUE(sleeps_.empty());
}

TEST_F(LockFileTest, MovedLockStaysHeldUntilItsNewOwnerGoes) {
  const std::string other_path = dir_ + "/other.lock";
  auto original = std::make_unique<LockFile>(path_, /*exclusive=*/true);
  {
    LockFile moved(std::move(*original));
    original.reset();  // a moved-from lock releases nothing
    ExpectBudgetExhausted(/*exclusive=*/true);

    LockFile target(other_path, /*exclusive=*/true);
    target = std::move(moved);  // drops other_path, takes over path_
    EXPECT_EQ(target.path(), path_);
    {
      ScopedSystemHooks hooks(CountingHooks());
      LockFile free_now(other_path, /*exclusive=*/true);
    }
    ExpectBudgetExhausted(/*exclusive=*/true);
  }
  sleeps_.clear();
  ScopedSystemHooks hooks(CountingHooks());
  LockFile free_again(path_, /*exclusive=*/true);
  EXPECT_TRUE(sleeps_.empty());
}

TEST_F(LockFileTest, OpenFailureIsLoggedAndThrownWithoutRetry) {
  struct Case {
    std::string path;
    std::string system_text;
  };
  const std::vector<Case> cases = {
      {dir_ + "/missing/dir/cfg.lock", "No such file or directory"},
      {dir_, "Is a directory"},
  };
  for (const Case& c : cases) {
    testing::LogCapture log;
    sleeps_.clear();
    ScopedSystemHooks hooks(CountingHooks());
    try {
      LockFile lock(c.path, /*exclusive=*/true);
      ADD_FAILURE() << c.path;
    } catch (const Error& e) {
      EXPECT_EQ(e.code(), kErrorLockFile);
      EXPECT_EQ(e.reason(), "open failed, reason=" + c.system_text);
    }
    EXPECT_EQ(errno, 0) << c.path;
    const std::vector<std::string>& lines = log.lines();
    EXPECT_TRUE(sleeps_.empty()) << c.path;
    ASSERT_EQ(lines.size(), 1u) << c.path;
    EXPECT_EQ(AfterSourceLine(lines[0], "lock_file"),
              " (" + std::to_string(::getpid()) + ", " + std::to_string(::geteuid()) +
                  ") Failed [0 > (fd_ = open(path_.c_str(), O_RDWR | O_CREAT, 0644))], "
                  "reason: open failed, reason=" +
                  c.system_text + " [err: " + c.system_text + "]")
        << lines[0];
  }
}

TEST(MutexTest, LockMutexSerialisesThreads) {
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
}

TEST(MutexTest, TryLockFailsWhileHeldAndSucceedsAfterRelease) {
  Mutex mutex;
  auto try_from_other_thread = [&mutex] {
    bool locked = false;
    std::thread([&] {
      locked = mutex.TryLock();
      if (locked) {
        EXPECT_TRUE(mutex.Unlock());
      }
    }).join();
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
