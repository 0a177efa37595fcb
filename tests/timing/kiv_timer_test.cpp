#include "kivi/timing/kiv_timer.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cmath>
#include <future>
#include <limits>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "kivi/doubles/mock_kiv_ns_operation_queue.h"
#include "test_support.h"

namespace kivi {
namespace {

using testing::kQuiet;
using testing::kTimeout;
using testing::Signal;
using Log = std::vector<std::string>;

// A timer on a queue double that keeps what it is given and runs nothing: the
// test ends each countdown by hand, as its completion handler would.
class KivTimerOnScriptedQueue : public ::testing::Test {
 protected:
  void SetUp() override {
    queue_->addOperationBlock = [this](const OperationPtr& op) {
      record("queued");
      countdowns_.push_back(std::dynamic_pointer_cast<KivTimerOperation>(op));
    };
    queue_->cancelAllOperationsBlock = [this] {
      record("cancelAll");
      for (const auto& op : countdowns_) op->cancel();
    };
  }
  // A fresh timer; the one before is released and the log cleared.
  void make(KivTimerDisposition disposition, bool withCallback = true) {
    timer_.reset();
    countdowns_.clear();
    takeLog();
    timer_ = KivTimer::create(nullptr, 0.01, disposition);
    if (withCallback) timer_->setCompletionBlock([this] { record("fired"); });
    timer_->setOperationQueue(queue_);
  }
  void end(std::size_t countdown) { timer_->didCompleteTimerOperation(countdowns_.at(countdown)); }
  void record(const char* event) {
    std::lock_guard lock(mutex_);
    log_.emplace_back(event);
  }
  Log takeLog() {
    std::lock_guard lock(mutex_);
    return std::exchange(log_, {});
  }

  std::mutex mutex_;
  Log log_;
  std::shared_ptr<MockKivNSOperationQueue> queue_ = std::make_shared<MockKivNSOperationQueue>();
  std::vector<std::shared_ptr<KivTimerOperation>> countdowns_;
  std::shared_ptr<KivTimer> timer_;  // last: its release cancels through the queue double
};

TEST_F(KivTimerOnScriptedQueue, RepeatingQueuesTheNextCountdownBeforeEachCallback) {
  make(KivTimerDispositionRepeating);
  timer_->start();
  EXPECT_EQ(takeLog(), Log({"queued"}));
  end(0);
  end(1);
  EXPECT_EQ(takeLog(), Log({"queued", "fired", "queued", "fired"}));
  EXPECT_TRUE(timer_->isRunning());
  ASSERT_EQ(countdowns_.size(), 3u);
  EXPECT_EQ(countdowns_[2]->timerInterval(), 0.01);
}

TEST_F(KivTimerOnScriptedQueue, EveryOtherDispositionFiresOncePerStart) {
  for (KivTimerDisposition disposition : {KivTimerDispositionOneShot, KivTimerDisposition{2}}) {
    SCOPED_TRACE(disposition);
    make(disposition);
    timer_->start();
    timer_->start();  // a countdown is in progress: neither restarted nor duplicated
    EXPECT_EQ(takeLog(), Log({"queued"}));
    end(0);
    EXPECT_EQ(takeLog(), Log({"fired"}));
    EXPECT_FALSE(timer_->isRunning());
    timer_->start();  // may be started again after it fired
    end(1);
    EXPECT_EQ(takeLog(), Log({"queued", "fired"}));
  }
}

TEST_F(KivTimerOnScriptedQueue, CancelFromTheCallbackSilencesTheCountdownQueuedBeforeIt) {
  make(KivTimerDispositionRepeating, false);
  timer_->setCompletionBlock([this] {
    record("fired");
    timer_->cancel();  // re-enters the monitor
  });
  timer_->start();
  end(0);
  EXPECT_EQ(takeLog(), Log({"queued", "queued", "fired", "cancelAll"}));
  end(1);
  EXPECT_EQ(takeLog(), Log());
  EXPECT_TRUE(timer_->isCancelled());
  EXPECT_FALSE(timer_->isRunning());
}

TEST_F(KivTimerOnScriptedQueue, CancelThenStartLetsOnlyTheNewCountdownFire) {
  make(KivTimerDispositionOneShot);
  timer_->start();
  timer_->cancel();
  timer_->start();
  EXPECT_FALSE(timer_->isCancelled());
  end(0);  // cancelled by the queue: ends silently
  EXPECT_TRUE(timer_->isRunning());
  end(1);
  EXPECT_EQ(takeLog(), Log({"queued", "cancelAll", "queued", "fired"}));

  // A queue that could not cancel it (the host swapped queues, say): the
  // replaced countdown still must not run beside the new one.
  make(KivTimerDispositionRepeating);
  queue_->cancelAllOperationsBlock = nullptr;
  timer_->start();
  timer_->cancel();
  timer_->start();
  end(0);
  EXPECT_EQ(takeLog(), Log({"queued", "queued"}));
  end(1);
  EXPECT_EQ(takeLog(), Log({"queued", "fired"}));
}

TEST_F(KivTimerOnScriptedQueue, NullCallbackStillRearms) {
  make(KivTimerDispositionRepeating, false);
  timer_->start();
  end(0);
  end(1);
  EXPECT_EQ(takeLog(), Log({"queued", "queued", "queued"}));
}

TEST_F(KivTimerOnScriptedQueue, ReleasingTheLastReferenceCancels) {
  make(KivTimerDispositionRepeating);
  timer_->start();
  std::weak_ptr<KivTimer> weakTimer = timer_;
  std::weak_ptr<KivTimerOperation> weakCountdown = countdowns_[0];
  auto countdown = countdowns_[0];
  countdowns_.clear();  // the queue double does not cancel it now
  timer_.reset();       // the countdown's handler must not keep the timer alive
  EXPECT_TRUE(weakTimer.expired());
  EXPECT_EQ(takeLog(), Log({"queued", "cancelAll"}));
  // Its handler finds no timer; nothing fires.
  countdown->start();
  countdown.reset();
  EXPECT_TRUE(weakCountdown.expired());  // nor does it keep itself alive
  std::this_thread::sleep_for(kQuiet);
  EXPECT_EQ(takeLog(), Log());
}

TEST_F(KivTimerOnScriptedQueue, IntervalsWithoutALengthCountDownTheMinimum) {
  const double nan = std::nan(""), inf = std::numeric_limits<double>::infinity();
  make(KivTimerDispositionOneShot);
  for (double interval : {0.0, -1.0, nan}) {
    timer_->setTimeInterval(interval);
    timer_->start();
    end(countdowns_.size() - 1);
    EXPECT_EQ(countdowns_.back()->timerInterval(), KivTimerMinimumTimeInterval) << interval;
  }
  timer_->setTimeInterval(inf);
  timer_->start();
  EXPECT_EQ(countdowns_.back()->timerInterval(), inf);
  // The operation itself returns at once for these, and sleeps the rest.
  for (double interval : {0.0, -1.0, nan}) {
    EXPECT_TRUE(testing::returnsWithin([interval] { KivTimerOperation(interval).main(); }));
  }
  const auto before = std::chrono::steady_clock::now();
  KivTimerOperation(0.02).main();
  EXPECT_GE(std::chrono::steady_clock::now() - before, std::chrono::milliseconds(19));
}

// On its real queue: callbacks run one at a time, until cancel().
TEST(KivTimer, RepeatsWithoutOverlapUntilCancelled) {
  std::atomic<int> fired{0}, inside{0};
  std::atomic<bool> overlapped{false};
  Signal thirdFiring;
  auto timer = KivTimer::create(
      [&] {
        if (inside.fetch_add(1) != 0) overlapped = true;
        // Longer than the interval: the next countdown ends meanwhile.
        std::this_thread::sleep_for(std::chrono::milliseconds(15));
        inside.fetch_sub(1);
        if (++fired == 3) thirdFiring.notify();
      },
      0.01, KivTimerDispositionRepeating);
  timer->start();
  ASSERT_TRUE(thirdFiring.wait());
  timer->cancel();
  const int afterCancel = fired;
  std::this_thread::sleep_for(kQuiet);
  EXPECT_EQ(fired, afterCancel);
  EXPECT_FALSE(overlapped);
  EXPECT_FALSE(timer->isRunning());
}

TEST(KivTimer, CancelThenStartBeforeTheOldCountdownEndsFiresOnce) {
  std::atomic<int> fired{0};
  Signal firing;
  auto timer = KivTimer::create(
      [&] {
        ++fired;
        firing.notify();
      },
      0.03, KivTimerDispositionOneShot);
  timer->start();
  timer->cancel();
  timer->start();
  ASSERT_TRUE(firing.wait());
  EXPECT_FALSE(firing.wait(2, kQuiet));
  EXPECT_EQ(fired, 1);
  EXPECT_FALSE(timer->isRunning());
}

TEST(KivTimer, ZeroIntervalRepeatsAndStops) {
  Signal firing;
  auto timer = KivTimer::create([&] { firing.notify(); }, 0, KivTimerDispositionRepeating);
  timer->start();
  ASSERT_TRUE(firing.wait(20));
  timer->cancel();
}

TEST(KivTimer, CallsFromOtherThreadsWaitForTheCallback) {
  Signal entered;
  std::promise<void> gate;
  std::shared_future<void> opened = gate.get_future().share();
  auto timer = KivTimer::create(
      [&] {
        entered.notify();
        opened.wait_for(kTimeout);
      },
      0.01, KivTimerDispositionOneShot);
  timer->start();
  ASSERT_TRUE(entered.wait());

  // A cancelled countdown is turned away without the monitor.
  auto cancelled = std::make_shared<KivTimerOperation>(0.01);
  cancelled->cancel();
  EXPECT_TRUE(testing::returnsWithin([&] { timer->didCompleteTimerOperation(cancelled); }));

  Signal startReturned;
  std::thread other([&] {
    timer->start();
    startReturned.notify();
  });
  EXPECT_FALSE(startReturned.wait(1, kQuiet));
  gate.set_value();
  EXPECT_TRUE(startReturned.wait());
  other.join();
  EXPECT_TRUE(entered.wait(2));  // the one-shot started again fires again
  timer->cancel();
}

}  // namespace
}  // namespace kivi
