#include "kivi/dispatch/distributed_lock.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <climits>
#include <filesystem>
#include <fstream>
#include <limits>

#include "kivi/dispatch/detail/distributed_lock_attempts.h"

namespace kivi {
namespace {

namespace fs = std::filesystem;

class DistributedLockTest : public ::testing::Test {
 protected:
  void SetUp() override {
    std::string pattern = ::testing::TempDir() + "kivi_lock_XXXXXX";
    ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
    dir_ = pattern;
    path_ = dir_ + "/the.lock";
    a_ = NSDistributedLock::lockWithPath(path_);
    b_ = NSDistributedLock::lockWithPath(path_);
    countAttempts();
  }
  void TearDown() override {
    detail::setDistributedLockAttemptObserverForTesting({});
    fs::remove_all(dir_, ignored_);
  }
  // Counts attempts in attempts_; `after(n)` runs after the n-th.
  void countAttempts(std::function<void(int)> after = [](int) {}) {
    attempts_ = 0;
    detail::setDistributedLockAttemptObserverForTesting(
        [this, after](const std::string&, bool) { after(++attempts_); });
  }
  template <typename F>
  static double secondsTaken(F&& call) {
    const auto start = std::chrono::steady_clock::now();
    call();
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  }

  std::string dir_, path_;
  std::shared_ptr<NSDistributedLock> a_, b_;  // two holders of one path
  std::atomic<int> attempts_{0};
  std::error_code ignored_;
};

TEST_F(DistributedLockTest, HolderExcludesOthersUntilItUnlocks) {
  EXPECT_FALSE(a_->lockDate());
  const double before = Date::now().timeIntervalSince1970;
  ASSERT_TRUE(a_->tryLock());
  EXPECT_FALSE(b_->tryLock());
  EXPECT_FALSE(a_->tryLock()) << "not re-entrant";
  EXPECT_NEAR(b_->lockDate()->timeIntervalSince1970, before, 1);
  b_->unlock();  // not b's to release
  EXPECT_FALSE(b_->tryLock());
  a_->unlock();
  EXPECT_FALSE(fs::exists(path_));
  EXPECT_TRUE(b_->tryLock());
  a_->unlock();  // no longer a's
  EXPECT_TRUE(fs::exists(path_));
}

TEST_F(DistributedLockTest, BreakFreesAHeldLockAndTheOldHolderCannotReleaseTheNewOne) {
  ASSERT_TRUE(a_->tryLock());
  // Age it as a lock left behind an hour ago would be.
  const timespec times[2] = {{0, UTIME_OMIT}, {::time(nullptr) - 3600, 0}};
  ASSERT_EQ(::utimensat(AT_FDCWD, path_.c_str(), times, 0), 0);
  EXPECT_NEAR(b_->lockDate()->timeIntervalSinceNow(), -3600, 60);
  b_->breakLock();
  ASSERT_TRUE(b_->tryLock());
  a_->unlock();
  EXPECT_TRUE(fs::exists(path_)) << "the broken holder removed its successor's lock";
  b_->breakLock();
  EXPECT_TRUE(a_->tryLock());
}

TEST_F(DistributedLockTest, PathsThatCannotHoldALockAnswerFalseAndAreLeftAlone) {
  EXPECT_FALSE(NSDistributedLock::lockWithPath(""));
  EXPECT_FALSE(NSDistributedLock::lockWithPath(std::string(PATH_MAX + 1, 'a')));
  EXPECT_FALSE(NSDistributedLock::lockWithPath(std::string("a\0b", 3)));
  ASSERT_EQ(::mkdir((dir_ + "/ro").c_str(), 0555), 0);
  std::ofstream(dir_ + "/file") << "x";
  // Root writes into read-only directories; sysfs refuses even root.
  for (const std::string& path :
       {dir_ + "/missing/l", ::geteuid() == 0 ? "/sys/kivi_lock_test" : dir_ + "/ro/l",
        dir_ + "/" + std::string(NAME_MAX + 1, 'n'), std::string(PATH_MAX, 'a'), dir_ + "/file"}) {
    auto lock = NSDistributedLock::lockWithPath(path);
    ASSERT_TRUE(lock);
    EXPECT_FALSE(lock->tryLock(0.1, 0.05)) << path.substr(0, 100);
    bool told = true;
    lock->tryLock(0.0, [&](bool taken) { told = taken; });
    EXPECT_FALSE(told);
    lock->breakLock();
  }
  EXPECT_TRUE(fs::is_regular_file(dir_ + "/file"));
}

TEST_F(DistributedLockTest, WaitingPollsAtTheResolutionAndNeverSleepsPastTheTimeOut) {
  ASSERT_TRUE(a_->tryLock());
  constexpr double kInf = std::numeric_limits<double>::infinity(),
                   kNaN = std::numeric_limits<double>::quiet_NaN();
  const struct {
    double timeout, resolution;
    int fewest, most;                        // attempts
    double shortest, longest;                // seconds, generous for a loaded machine
  } rows[] = {{1.05, 0.3, 4, 4, 0.85, 2.5},  // attempts at 0, 0.3, 0.6 and 0.9 s
                                             // One attempt and no sleep (a sleep would take 2 s).
              {0, 2, 1, 1, 0, 1},
              {-1, 2, 1, 1, 0, 1},
              {kNaN, 2, 1, 1, 0, 1},
              {kInf, kInf, 1, 1, 0, 1},
              // Unusable resolutions poll every 0.1 s; the shortest is 1 ms: no spinning.
              {0.35, 0, 2, 4, 0.15, 2},
              {0.35, -1, 2, 4, 0.15, 2},
              {0.35, kNaN, 2, 4, 0.15, 2},
              {0.05, 1e-9, 2, 51, 0.03, 2}};
  for (const auto& row : rows) {
    SCOPED_TRACE(::testing::Message() << row.timeout << " s every " << row.resolution << " s");
    countAttempts();
    bool taken = true;
    const double seconds = secondsTaken([&] { taken = b_->tryLock(row.timeout, row.resolution); });
    EXPECT_FALSE(taken);
    EXPECT_GE(attempts_.load(), row.fewest);
    EXPECT_LE(attempts_.load(), row.most);
    EXPECT_GE(seconds, row.shortest);
    EXPECT_LE(seconds, row.longest);
  }
}

TEST_F(DistributedLockTest, ALockFreedDuringTheWaitIsTakenAtTheNextPoll) {
  ASSERT_TRUE(a_->tryLock());
  countAttempts([&](int n) {
    if (n == 1) a_->unlock();
  });
  bool taken = false;
  const double seconds = secondsTaken([&] { taken = b_->tryLock(10, 0.5); });
  EXPECT_TRUE(taken);
  EXPECT_EQ(attempts_.load(), 2);
  EXPECT_GE(seconds, 0.4);
  b_->unlock();
  countAttempts();
  EXPECT_LE(secondsTaken([&] { taken = a_->tryLock(10.0); }), 1) << "a free lock waits";
  EXPECT_TRUE(taken);
  EXPECT_EQ(attempts_.load(), 1);
}

TEST_F(DistributedLockTest, ProtectedFormsReportTheResultAndNeverRelease) {
  std::vector<bool> told;
  a_->tryLock([&](bool taken) { told.push_back(taken); });
  b_->tryLock(0.2, [&](bool taken) { told.push_back(taken); });
  EXPECT_EQ(told, (std::vector<bool>{true, false}));
  EXPECT_FALSE(b_->tryLock()) << "the lock was released";
  a_->unlock();
  b_->tryLock(0.0, nullptr);  // a null block: the lock is still taken
  EXPECT_FALSE(a_->tryLock());
}

}  // namespace
}  // namespace kivi
