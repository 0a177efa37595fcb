#include "kivi/dispatch/dispatch_queue.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <memory>
#include <mutex>
#include <optional>
#include <random>
#include <thread>
#include <vector>

#include "kivi/dispatch/detail/thread_start.h"
#include "kivi/dispatch/dispatch_clock.h"
#include "kivi/dispatch/worker_pool.h"
#include "test_support.h"

namespace kivi {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;
using testing::Signal;

// Waits until every thread of the pool is idle: none is left counted as busy
// or blocked once the work is done.
bool poolSettles() {
  const auto deadline = std::chrono::steady_clock::now() + testing::kTimeout;
  while (std::chrono::steady_clock::now() < deadline) {
    const auto s = WorkerPool::shared().statistics();
    if (s.queued == 0 && s.blocked == 0 && s.idle == s.threads) return true;
    std::this_thread::sleep_for(milliseconds(1));
  }
  return false;
}

// Workers blocked in a known blocking call do not count: work submitted while
// the pool's whole width is blocked runs at once. Host code that blocks
// without saying so is noticed by the pool's monitor.
TEST(WorkerPool, GrowsPastBlockedWorkersAndSettlesAfterwards) {
  auto& pool = WorkerPool::shared();
  for (const bool announced : {true, false}) {
    SCOPED_TRACE(announced ? "BlockingScope" : "silent");
    const int blockers = static_cast<int>(pool.width()) + 2;
    auto gate = std::make_shared<Signal>(), entered = std::make_shared<Signal>();
    for (int i = 0; i < blockers; ++i) {
      pool.submit([=] {
        std::optional<WorkerPool::BlockingScope> blocking;
        if (announced) blocking.emplace();
        entered->notify();
        EXPECT_TRUE(gate->wait());
      });
    }
    ASSERT_TRUE(entered->wait(blockers));
    if (announced) {
      EXPECT_GE(pool.statistics().blocked, static_cast<std::size_t>(blockers));
    }
    auto ran = std::make_shared<Signal>();
    pool.submit([ran] { ran->notify(); });
    EXPECT_TRUE(ran->wait(1, seconds(2)));
    gate->notify();
    EXPECT_TRUE(poolSettles());
  }
}

// A refused thread leaves no count behind, and the work still runs once
// threads can be had again.
TEST(WorkerPool, SurvivesRefusedThreads) {
  auto& pool = WorkerPool::shared();
  ASSERT_TRUE(poolSettles());
  const auto before = pool.statistics().threads;
  const int blockers = static_cast<int>(std::max(before, pool.width())) + 1;
  detail::failThreadStartsForTesting(3);
  auto gate = std::make_shared<Signal>(), done = std::make_shared<Signal>();
  for (int i = 0; i < blockers; ++i) {
    pool.submit([=] {
      WorkerPool::BlockingScope blocking;
      EXPECT_TRUE(gate->wait());
    });
  }
  pool.submit([done] { done->notify(); });
  EXPECT_TRUE(done->wait());
  detail::failThreadStartsForTesting(0);
  gate->notify();
  EXPECT_TRUE(poolSettles());
}

TEST(DispatchQueue, SerialQueueRunsOneItemAtATimeInSubmissionOrder) {
  auto queue = DispatchQueue::create("kivi.tests.serial");
  EXPECT_TRUE(queue->isSerial());
  EXPECT_EQ(queue->label(), "kivi.tests.serial");
  constexpr int kThreads = 4, kItems = 2000;
  std::vector<std::vector<int>> seen(kThreads);  // written only on the queue
  std::atomic<int> inside{0}, overlaps{0};
  std::vector<std::thread> submitters;
  for (int t = 0; t < kThreads; ++t) {
    submitters.emplace_back([&, t] {
      for (int i = 0; i < kItems; ++i) {
        queue->async([&, t, i] {
          if (inside.fetch_add(1) != 0) ++overlaps;
          if (!queue->isCurrent()) ++overlaps;
          seen[t].push_back(i);
          inside.fetch_sub(1);
        });
      }
    });
  }
  for (auto& thread : submitters) thread.join();
  queue->sync([] {});
  EXPECT_EQ(overlaps, 0);
  for (const auto& items : seen) {
    ASSERT_EQ(items.size(), static_cast<std::size_t>(kItems));
    EXPECT_TRUE(std::is_sorted(items.begin(), items.end()));
  }
  EXPECT_FALSE(queue->isCurrent());
}

// sync() waits for the earlier items, runs on the calling thread, and keeps
// the queue to itself meanwhile; sync() from the queue's own work does not
// wait for itself.
TEST(DispatchQueue, SyncRunsOnTheCallerAfterEarlierWork) {
  auto queue = DispatchQueue::create("kivi.tests.sync");
  auto gate = std::make_shared<Signal>();
  std::vector<int> order;  // written only while the queue is held
  queue->async([&order, gate] {
    EXPECT_TRUE(gate->wait());
    order.push_back(1);
  });
  queue->async([&order] { order.push_back(2); });
  std::thread releaser([gate] {
    std::this_thread::sleep_for(testing::kQuiet);
    gate->notify();
  });
  const auto caller = std::this_thread::get_id();
  bool nestedRan = false;
  queue->sync([&] {
    EXPECT_EQ(std::this_thread::get_id(), caller);
    EXPECT_TRUE(queue->isCurrent());
    order.push_back(3);
    queue->sync([&] { nestedRan = true; });
  });
  queue->async([&order] { order.push_back(4); });
  queue->sync([&order] { order.push_back(5); });
  releaser.join();
  EXPECT_TRUE(nestedRan);
  EXPECT_EQ(order, (std::vector<int>{1, 2, 3, 4, 5}));

  // Concurrent queues run sync work at once and async work side by side.
  auto concurrent =
      DispatchQueue::create("kivi.tests.concurrent", DispatchQueue::Attributes::concurrent);
  auto both = std::make_shared<Signal>();
  for (int i = 0; i < 2; ++i) {
    concurrent->async([both] {
      both->notify();
      EXPECT_TRUE(both->wait(2));
    });
  }
  EXPECT_TRUE(both->wait(2));
  bool ran = false;
  concurrent->sync([&] { ran = concurrent->isCurrent(); });
  EXPECT_TRUE(ran);
}

// Timers of a manual clock fire only when it is moved, each at its own time,
// in deadline order (equal deadlines in the order they were armed); re-armed
// timers fire once at their last deadline and cancelled or released ones
// never. Checked against a plain model over many random operations.
TEST(DispatchClock, ManualClockFiresTimersInDeadlineOrder) {
  auto clock = ManualClock::create();
  const DispatchTime start = clock->now();
  std::mt19937 random(7);
  struct Model {
    DispatchTime deadline;
    std::uint64_t armed;  // arming order
    bool scheduled = false;
  };
  std::vector<Model> model(300);
  std::vector<std::pair<int, DispatchTime>> fired;  // (timer, now() when it fired)
  std::vector<std::unique_ptr<DispatchTimer>> timers;
  for (int i = 0; i < 300; ++i) {
    timers.push_back(
        clock->makeTimer([&fired, &clock, i] { fired.emplace_back(i, clock->now()); }));
  }
  std::uint64_t armings = 0;
  for (int step = 0; step < 3000; ++step) {
    const int i = static_cast<int>(random() % timers.size());
    if (random() % 4 == 0) {
      EXPECT_EQ(timers[i]->cancel(), model[i].scheduled);
      model[i].scheduled = false;
    } else {
      const DispatchTime deadline = start + milliseconds(random() % 50);
      timers[i]->schedule(deadline);
      model[i] = {deadline, armings++, true};
    }
    EXPECT_EQ(timers[i]->isScheduled(), model[i].scheduled);
  }
  timers[0].reset();  // a released timer never fires
  model[0].scheduled = false;
  std::vector<int> expected;
  for (int i = 0; i < 300; ++i) {
    if (model[i].scheduled) expected.push_back(i);
  }
  std::sort(expected.begin(), expected.end(), [&](int a, int b) {
    return model[a].deadline != model[b].deadline ? model[a].deadline < model[b].deadline
                                                  : model[a].armed < model[b].armed;
  });
  EXPECT_TRUE(fired.empty());
  clock->advance(milliseconds(25));
  clock->advance(milliseconds(25));
  ASSERT_EQ(fired.size(), expected.size());
  for (std::size_t k = 0; k < fired.size(); ++k) {
    EXPECT_EQ(fired[k].first, expected[k]);
    EXPECT_EQ(fired[k].second, model[expected[k]].deadline);
  }
  EXPECT_EQ(clock->now(), start + milliseconds(50));
  EXPECT_FALSE(clock->nextDeadline());
}

// asyncAfter on a manual clock: nothing before the deadline, the work on the
// queue after it; a worker asleep on the clock wakes when it is moved.
TEST(DispatchClock, AsyncAfterAndSleepFollowTheInjectedClock) {
  auto clock = ManualClock::create();
  auto queue = DispatchQueue::create("kivi.tests.after");
  auto ran = std::make_shared<Signal>();
  queue->asyncAfter(*clock, clock->now() + seconds(30), [ran, queue] {
    EXPECT_TRUE(queue->isCurrent());
    ran->notify();
  });
  clock->advance(seconds(29));
  EXPECT_FALSE(ran->wait(1, testing::kQuiet));
  clock->advance(seconds(1));
  EXPECT_TRUE(ran->wait());

  auto woke = std::make_shared<Signal>();
  const DispatchTime wake = clock->now() + seconds(5);
  WorkerPool::shared().submit([clock, wake, woke] {
    clock->sleepUntil(wake);
    EXPECT_GE(clock->now(), wake);
    woke->notify();
  });
  EXPECT_FALSE(woke->wait(1, testing::kQuiet));
  clock->advance(seconds(5));
  EXPECT_TRUE(woke->wait());
}

// The system clock: work runs after its deadline, never before, also when
// many deadlines come due together.
TEST(DispatchClock, SystemClockRunsWorkAfterItsDeadline) {
  const auto& clock = DispatchClock::system();
  auto queue = DispatchQueue::create("kivi.tests.system");
  constexpr int kCount = 200;
  std::atomic<int> early{0};
  auto done = std::make_shared<Signal>();
  const DispatchTime base = clock->now();
  for (int i = 0; i < kCount; ++i) {
    const DispatchTime deadline = base + milliseconds(i % 20);
    queue->asyncAfter(deadline, [&early, done, deadline, &clock] {
      if (clock->now() < deadline) ++early;
      done->notify();
    });
  }
  EXPECT_TRUE(done->wait(kCount));
  EXPECT_EQ(early, 0);
}

}  // namespace
}  // namespace kivi
