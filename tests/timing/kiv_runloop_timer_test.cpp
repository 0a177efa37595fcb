#include "kivi/timing/kiv_runloop_timer.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "kivi/dispatch/run_loop.h"
#include "kivi/dispatch/thread.h"
#include "test_support.h"

namespace kivi {
namespace {

using testing::kTimeout;

Date in(double seconds) { return Date::now().addingTimeInterval(seconds); }

// Runs the main run loop in `mode` until `done` or the deadline.
template <typename Done>
bool runMainUntil(const RunLoopMode& mode, Done done) {
  auto loop = RunLoop::mainRunLoop();
  const Date deadline = in(std::chrono::duration<double>(kTimeout).count());
  while (!done() && Date::now() < deadline) loop->runMode(mode, in(0.005));
  return done();
}

struct Firings {
  std::atomic<int> count{0};
  std::atomic<int> running{0};
  std::atomic<bool> overlapped{false};
  std::atomic<bool> onMain{false};

  KivRunloopTimer::TimerBlock block(std::chrono::milliseconds work = {}) {
    return [this, work](const std::shared_ptr<KivRunloopTimer>&) {
      if (running.fetch_add(1) != 0) overlapped = true;
      if (Thread::isMainThread()) onMain = true;
      std::this_thread::sleep_for(work);
      running.fetch_sub(1);
      count.fetch_add(1);
    };
  }
};

TEST(KivRunloopTimerTest, FiresOnlyWhileTheMainRunLoopRunsItsMode) {
  ASSERT_TRUE(Thread::isMainThread());
  Firings firings;
  auto timer = KivRunloopTimer::create(0.005, "kivi.test.modal", KivTimerDispositionRepeating,
                                       firings.block());
  EXPECT_EQ(timer->operationQueue()->name(), "com.zorvik.KivRunloopTimer " + timer->description());
  EXPECT_EQ(timer->operationQueue()->maxConcurrentOperationCount(), 1);
  timer->start();
  // Several intervals in the default mode: nothing.
  RunLoop::mainRunLoop()->runUntilDate(in(0.05));
  timer->operationQueue()->waitUntilAllOperationsAreFinished();
  EXPECT_EQ(firings.count, 0);
  EXPECT_TRUE(runMainUntil("kivi.test.modal", [&] { return firings.count >= 3; }));
  // Without a queue the firings run nothing (and do not crash).
  const auto queue = timer->operationQueue();
  timer->setOperationQueue(nullptr);
  queue->waitUntilAllOperationsAreFinished();
  const int before = firings.count;
  RunLoop::mainRunLoop()->runMode("kivi.test.modal", in(0.05));
  EXPECT_EQ(firings.count, before);
  timer->setOperationQueue(queue);
  timer->cancel();
  EXPECT_EQ(timer->timer(), nullptr);
}

TEST(KivRunloopTimerTest, CallbacksRunOffTheMainThreadOneAtATime) {
  Firings firings;
  // Each callback takes longer than the interval: firings queue up behind it.
  auto timer = KivRunloopTimer::create(0.002, NSDefaultRunLoopMode, KivTimerDispositionRepeating,
                                       firings.block(std::chrono::milliseconds(5)));
  timer->start();
  EXPECT_TRUE(runMainUntil(NSDefaultRunLoopMode, [&] { return firings.count >= 6; }));
  timer->cancel();
  timer->operationQueue()->waitUntilAllOperationsAreFinished();
  EXPECT_FALSE(firings.overlapped);
  EXPECT_FALSE(firings.onMain);
}

TEST(KivRunloopTimerTest, StartRestartsAndAnArmedTimerKeepsItselfAlive) {
  Firings firings;
  std::weak_ptr<KivRunloopTimer> weak;
  TimerPtr first;
  {
    auto timer = KivRunloopTimer::create(3600, NSDefaultRunLoopMode, KivTimerDispositionRepeating,
                                         firings.block());
    weak = timer;
    timer->start();
    first = timer->timer();
    timer->setTimeInterval(0.002);
    timer->start();  // from now, with the new interval; the first never fires
    EXPECT_FALSE(first->isValid());
  }
  // Only the armed run-loop timer holds it now.
  ASSERT_FALSE(weak.expired());
  EXPECT_TRUE(runMainUntil(NSDefaultRunLoopMode, [&] { return firings.count >= 2; }));
  auto timer = weak.lock();
  ASSERT_NE(timer, nullptr);
  timer->cancel();
  auto queue = timer->operationQueue();
  timer.reset();
  queue->waitUntilAllOperationsAreFinished();
  EXPECT_TRUE(weak.expired()) << "a cancelled timer is released";
}

TEST(KivRunloopTimerTest, AnyDispositionButRepeatingFiresOnce) {
  for (KivTimerDisposition disposition : {KivTimerDispositionOneShot, KivTimerDisposition{2}}) {
    Firings firings;
    auto timer = KivRunloopTimer::create(0.001, NSDefaultRunLoopMode, disposition, firings.block());
    timer->start();
    EXPECT_TRUE(runMainUntil(NSDefaultRunLoopMode, [&] { return firings.count >= 1; }));
    RunLoop::mainRunLoop()->runUntilDate(in(0.02));
    timer->operationQueue()->waitUntilAllOperationsAreFinished();
    EXPECT_EQ(firings.count, 1) << disposition;
    EXPECT_FALSE(timer->timer()->isValid());
  }
}

}  // namespace
}  // namespace kivi
