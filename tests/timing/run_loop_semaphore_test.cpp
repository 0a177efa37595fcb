#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cmath>
#include <limits>
#include <memory>
#include <thread>

#include "kivi/dispatch/dispatch_queue.h"
#include "kivi/dispatch/run_loop.h"
#include "kivi/dispatch/thread.h"
#include "kivi/timing/kiv_main_thread_runner.h"
#include "kivi/timing/kiv_run_loop_semaphore.h"
#include "test_support.h"

namespace kivi {
namespace {

using Clock = std::chrono::steady_clock;
using testing::kTimeout;

double secondsSince(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

TEST(KivRunLoopSemaphoreTest, AMainThreadWaitKeepsMainQueueWorkFlowing) {
  ASSERT_TRUE(Thread::isMainThread());
  auto semaphore = std::make_shared<KivRunLoopSemaphore>();
  std::atomic<int> ranOnMain{0};
  std::thread worker([&] {
    for (int i = 0; i < 3; ++i) {
      KivMainThreadRunner::runBlockOnMainThread([&] {
        if (Thread::isMainThread()) ranOnMain.fetch_add(1);
      });
    }
    // The signal itself arrives as main-queue work.
    DispatchQueue::main()->async([semaphore] { semaphore->signal(); });
  });
  semaphore->waitUntilDone();
  worker.join();
  EXPECT_TRUE(semaphore->done());
  EXPECT_EQ(ranOnMain, 3);
}

TEST(KivRunLoopSemaphoreTest, TimeOutsAndStrategies) {
  const auto& strategy = KivRunLoopSemaphore::defaultWaitStrategy();
  EXPECT_DOUBLE_EQ(strategy(1.0), 0.1);
  EXPECT_DOUBLE_EQ(strategy(30.0), 2.0);
  EXPECT_DOUBLE_EQ(strategy(-5.0), 0.0);
  std::thread([] {
    const double nan = std::numeric_limits<double>::quiet_NaN();
    KivRunLoopSemaphore semaphore;
    // A time-out of 0 or NaN ends the wait at once, after the first check.
    auto start = Clock::now();
    EXPECT_FALSE(semaphore.waitWithTimeout(0));
    EXPECT_FALSE(semaphore.waitWithTimeout(nan));
    EXPECT_FALSE(semaphore.waitWithTimeout(-1));
    EXPECT_LT(secondsSince(start), 1.0);

    // Off the main thread a wait without a signal lasts its time-out (plus at
    // most one slice).
    start = Clock::now();
    EXPECT_FALSE(semaphore.waitWithTimeout(0.3));
    EXPECT_GE(secondsSince(start), 0.3);

    // A strategy answering a negative slice polls without pausing.
    int slices = 0;
    EXPECT_FALSE(semaphore.waitWithTimeout(0.05, [&](double) {
      ++slices;
      return -1.0;
    }));
    EXPECT_GT(slices, 10);
    // A signalled semaphore answers at once without turning its run loop.
    bool performed = false;
    RunLoop::currentRunLoop()->performBlock([&] { performed = true; });
    semaphore.signal();
    EXPECT_TRUE(semaphore.waitWithTimeout(std::numeric_limits<double>::infinity(), nullptr));
    EXPECT_FALSE(performed);
  }).join();
}

TEST(KivRunLoopSemaphoreTest, ASignalIsSeenAtTheEndOfItsSlice) {
  std::thread([] {
    KivRunLoopSemaphore semaphore;
    std::thread signaller([&] {
      std::this_thread::sleep_for(std::chrono::milliseconds(30));
      semaphore.signal();
    });
    const auto start = Clock::now();
    // Slices of 0.2 s: the signal at 30 ms is seen when the first one ends.
    EXPECT_TRUE(semaphore.waitWithTimeout(10, [](double) { return 0.2; }));
    EXPECT_GE(secondsSince(start), 0.19);
    EXPECT_LT(secondsSince(start), 5.0);
    signaller.join();
  }).join();
}

TEST(KivMainThreadRunnerTest, RunsInlineOnMainAndThroughTheMainQueueElsewhere) {
  ASSERT_TRUE(Thread::isMainThread());
  bool inline_ = false;
  KivMainThreadRunner::runBlockOnMainThread([&] { inline_ = true; });
  EXPECT_TRUE(inline_);
  KivMainThreadRunner::syncRunBlockOnMainThread([&] { inline_ = false; });
  EXPECT_FALSE(inline_);
  KivMainThreadRunner::runBlockOnMainThread(nullptr);

  std::atomic<bool> asyncRan{false};
  std::atomic<bool> syncReturned{false};
  std::atomic<bool> syncRanOnMain{false};
  std::thread worker([&] {
    KivMainThreadRunner::runBlockOnMainThread([&] { asyncRan = true; });
    KivMainThreadRunner::syncRunBlockOnMainThread([&] { syncRanOnMain = Thread::isMainThread(); });
    syncReturned = true;
  });
  auto loop = RunLoop::mainRunLoop();
  const auto deadline = Clock::now() + kTimeout;
  while (!syncReturned && Clock::now() < deadline) {
    loop->runMode(NSDefaultRunLoopMode, Date::now().addingTimeInterval(0.01));
  }
  worker.join();
  EXPECT_TRUE(asyncRan);
  EXPECT_TRUE(syncRanOnMain);
}

}  // namespace
}  // namespace kivi
