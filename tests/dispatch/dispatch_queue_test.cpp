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

#include "kivi/dispatch/detail/main_queue.h"
#include "kivi/dispatch/detail/thread_start.h"
#include "kivi/dispatch/dispatch_clock.h"
#include "kivi/dispatch/dispatch_group.h"
#include "kivi/dispatch/dispatch_work_item.h"
#include "kivi/dispatch/thread.h"
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

// Barriers on a private concurrent queue, given from several threads at once
// (async, async with a barrier work item, sync with one): a barrier starts
// only after everything its thread gave before it has finished, runs with
// nothing else of the queue, and what its thread gives after it starts only
// once it is done. Ordinary work still runs side by side.
TEST(DispatchQueue, BarriersOnAConcurrentQueueRunAloneBetweenEarlierAndLaterWork) {
  auto queue = DispatchQueue::create("kivi.tests.barrier", DispatchQueue::Attributes::concurrent);
  constexpr int kThreads = 4, kItems = 400;
  struct Track {
    std::atomic<bool> started{false}, finished{false};
  };
  std::vector<std::vector<Track>> track(kThreads);
  for (auto& items : track) items = std::vector<Track>(kItems);
  std::atomic<int> ordinaryInside{0}, barriersInside{0}, faults{0}, ran{0};
  auto ordinary = [&](int t, int i) {
    return [&, t, i] {
      ordinaryInside.fetch_add(1);
      track[t][i].started = true;
      if (barriersInside.load() != 0 || !queue->isCurrent()) ++faults;
      for (int k = 0; k < 20; ++k) std::this_thread::yield();  // a little work
      ordinaryInside.fetch_sub(1);
      track[t][i].finished = true;
      ++ran;
    };
  };
  auto barrier = [&](int t, int i) {
    return [&, t, i] {
      if (barriersInside.fetch_add(1) != 0 || ordinaryInside.load() != 0) ++faults;
      track[t][i].started = true;
      for (int k = 0; k < kItems; ++k) {
        if (k < i && !track[t][k].finished) ++faults;
        if (k > i && track[t][k].started) ++faults;
      }
      barriersInside.fetch_sub(1);
      track[t][i].finished = true;
      ++ran;
    };
  };
  std::vector<std::thread> submitters;
  for (int t = 0; t < kThreads; ++t) {
    submitters.emplace_back([&, t] {
      for (int i = 0; i < kItems; ++i) {
        if (i % 37 != 36) {
          queue->async(ordinary(t, i));
        } else if (t == 0) {
          queue->sync(
              std::make_shared<DispatchWorkItem>(DispatchWorkItemFlags::barrier, barrier(t, i)));
          if (!track[t][i].finished) ++faults;
        } else if (t == 1) {
          queue->async(
              std::make_shared<DispatchWorkItem>(DispatchWorkItemFlags::barrier, barrier(t, i)));
        } else {
          queue->async(nullptr, {}, DispatchWorkItemFlags::barrier, barrier(t, i));
        }
      }
    });
  }
  for (auto& thread : submitters) thread.join();
  auto done = std::make_shared<Signal>();
  queue->async(DispatchWorkItemFlags::barrier, [done] { done->notify(); });
  ASSERT_TRUE(done->wait());
  EXPECT_EQ(ran, kThreads * kItems);  // with the final barrier, after everything
  EXPECT_EQ(faults, 0);

  // Between barriers, ordinary work overlaps; a released queue still runs
  // what it was given.
  auto both = std::make_shared<Signal>(), after = std::make_shared<Signal>();
  queue->async(DispatchWorkItemFlags::barrier, [] {});
  for (int i = 0; i < 2; ++i) {
    queue->async([both] {
      both->notify();
      EXPECT_TRUE(both->wait(2));
    });
  }
  queue->async(DispatchWorkItemFlags::barrier, [after] { after->notify(); });
  queue.reset();
  EXPECT_TRUE(after->wait());
}

// A group waits for many items on several queues, also from workers of the
// pool (which count as blocked meanwhile); notify() runs once, after all of
// them; a leave() without an enter() leaves the count alone.
TEST(DispatchGroup, WaitAndNotifyFollowEveryItemAndTimeOuts) {
  auto group = std::make_shared<DispatchGroup>();
  EXPECT_EQ(group->wait(DispatchTime::min()), DispatchTimeoutResult::success);  // empty
  auto gate = std::make_shared<Signal>();
  auto serial = DispatchQueue::create("kivi.tests.group");
  constexpr int kItems = 1000;
  std::atomic<int> ran{0};
  group->enter();
  DispatchQueue::global(DispatchQoS::QoSClass::utility)->async([group, gate, &ran] {
    EXPECT_TRUE(gate->wait());
    ++ran;
    group->leave();
  });
  for (int i = 1; i < kItems; ++i) {
    if (i % 2) {
      DispatchQueue::global()->async(group, [&ran] { ++ran; });
    } else {
      serial->async(group, std::make_shared<DispatchWorkItem>([&ran] { ++ran; }));
    }
  }
  auto notified = std::make_shared<Signal>();
  std::atomic<int> ranAtNotify{-1};
  group->notify(serial, [&] {
    ranAtNotify = ran.load();
    notified->notify();
  });
  const auto start = std::chrono::steady_clock::now();
  EXPECT_EQ(group->wait(start + milliseconds(30)), DispatchTimeoutResult::timedOut);
  EXPECT_GE(std::chrono::steady_clock::now() - start, milliseconds(30));
  const int waiters = static_cast<int>(WorkerPool::shared().width()) + 1;
  auto waited = std::make_shared<Signal>();
  for (int i = 0; i < waiters; ++i) {
    WorkerPool::shared().submit([group, waited] {
      group->wait();
      waited->notify();
    });
  }
  const auto deadline = std::chrono::steady_clock::now() + testing::kTimeout;
  while (WorkerPool::shared().statistics().blocked < static_cast<std::size_t>(waiters) &&
         std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(milliseconds(1));
  }
  EXPECT_GE(WorkerPool::shared().statistics().blocked, static_cast<std::size_t>(waiters));
  EXPECT_FALSE(notified->wait(1, testing::kQuiet));
  gate->notify();
  EXPECT_EQ(group->wait(std::chrono::steady_clock::now() + testing::kTimeout),
            DispatchTimeoutResult::success);
  EXPECT_TRUE(waited->wait(waiters));
  ASSERT_TRUE(notified->wait());
  EXPECT_EQ(ranAtNotify, kItems);
  serial->sync([] {});
  EXPECT_FALSE(notified->wait(2, testing::kQuiet));  // once

  group->leave();  // unmatched: ignored
  group->enter();
  auto second = std::make_shared<Signal>();
  group->notify(serial, [second] { second->notify(); });
  EXPECT_FALSE(second->wait(1, testing::kQuiet));
  group->leave();
  EXPECT_TRUE(second->wait());
  group->notify(serial, [second] { second->notify(); });  // empty: at once
  EXPECT_TRUE(second->wait(2));
  EXPECT_TRUE(poolSettles());
}

// A work item cancelled before its turn never runs, yet counts as done when
// the queue gets to it; notify() fires once, or at once after that.
TEST(DispatchWorkItem, CancelBeforeRunAndNotify) {
  auto queue = DispatchQueue::create("kivi.tests.item");
  auto gate = std::make_shared<Signal>();
  queue->async([gate] { EXPECT_TRUE(gate->wait()); });
  std::atomic<int> ran{0};
  auto cancelled = std::make_shared<DispatchWorkItem>([&ran] { ++ran; });
  auto kept = std::make_shared<DispatchWorkItem>(DispatchQoS::utility, DispatchWorkItemFlags{},
                                                 [&ran] { ran += 10; });
  EXPECT_EQ(kept->qos(), DispatchQoS::utility);
  auto notified = std::make_shared<Signal>();
  cancelled->notify(queue, [notified] { notified->notify(); });
  kept->notify(queue, [notified] { notified->notify(); });
  queue->async(cancelled);
  queue->asyncAfter(DispatchClock::system()->now() + milliseconds(1), kept);
  cancelled->cancel();
  EXPECT_TRUE(cancelled->isCancelled());
  EXPECT_EQ(cancelled->wait(std::chrono::steady_clock::now() + testing::kQuiet),
            DispatchTimeoutResult::timedOut);
  EXPECT_FALSE(notified->wait(1, testing::kQuiet));
  gate->notify();
  cancelled->wait();
  EXPECT_EQ(kept->wait(std::chrono::steady_clock::now() + testing::kTimeout),
            DispatchTimeoutResult::success);
  EXPECT_TRUE(notified->wait(2));
  EXPECT_EQ(ran, 10);
  kept->perform();  // runs again; its notify does not
  EXPECT_EQ(ran, 20);
  kept->notify(queue, [notified] { notified->notify(); });  // done: at once
  EXPECT_TRUE(notified->wait(3));
  queue->sync([] {});
  EXPECT_FALSE(notified->wait(4, testing::kQuiet));
}

// The main queue runs on the main thread when it is drained, in order; work
// added by a drain waits for the next. sync() onto it from the main thread
// runs at once, from a worker once the main thread has drained.
TEST(DispatchQueue, MainQueueRunsOnTheMainThreadWhenDrained) {
  ASSERT_TRUE(Thread::isMainThread());
  const auto& main = DispatchQueue::main();
  EXPECT_TRUE(main->isSerial());
  EXPECT_TRUE(main->isCurrent());
  while (detail::drainMainQueue()) {
  }
  std::vector<int> order;
  main->async([&] {
    order.push_back(1);
    main->async([&] { order.push_back(3); });
  });
  main->async([&] { order.push_back(2); });
  bool inline_ = false;
  main->sync([&] { inline_ = true; });
  EXPECT_TRUE(inline_);
  EXPECT_TRUE(order.empty());
  EXPECT_TRUE(detail::drainMainQueue());
  EXPECT_EQ(order, (std::vector<int>{1, 2}));
  EXPECT_TRUE(detail::drainMainQueue());
  EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
  EXPECT_FALSE(detail::drainMainQueue());

  std::atomic<bool> onMain{false}, returned{false};
  WorkerPool::shared().submit([&] {
    main->sync(std::make_shared<DispatchWorkItem>([&] { onMain = Thread::isMainThread(); }));
    returned = true;
  });
  std::thread([] { EXPECT_FALSE(detail::drainMainQueue()); }).join();  // not the main thread
  const auto deadline = std::chrono::steady_clock::now() + testing::kTimeout;
  while (!returned && std::chrono::steady_clock::now() < deadline) {
    detail::drainMainQueue();
    std::this_thread::yield();
  }
  EXPECT_TRUE(returned);
  EXPECT_TRUE(onMain);
}

// One global queue per class, reporting its class; an unspecified class is
// the default one.
TEST(DispatchQueue, GlobalQueuesByQualityOfService) {
  using QoSClass = DispatchQoS::QoSClass;
  const auto& user = DispatchQueue::global(QoSClass::userInteractive);
  EXPECT_EQ(user, DispatchQueue::global(QoSClass::userInteractive));
  EXPECT_NE(user, DispatchQueue::global(QoSClass::background));
  EXPECT_EQ(user->qos().qosClass, QoSClass::userInteractive);
  EXPECT_EQ(DispatchQueue::global(QoSClass::unspecified), DispatchQueue::global());
  EXPECT_EQ(DispatchQueue::global()->qos(), DispatchQoS::default_);
  EXPECT_EQ(KivDispatchQueueProtocol::global(QoSClass::utility),
            DispatchQueue::global(QoSClass::utility));
  EXPECT_FALSE(user->isSerial());
  EXPECT_EQ(DispatchQoS(QoSClass::utility, -40).relativePriority, -15);
  auto ran = std::make_shared<Signal>();
  user->async([ran, &user] {
    EXPECT_TRUE(user->isCurrent());
    EXPECT_FALSE(DispatchQueue::global(DispatchQoS::QoSClass::background)->isCurrent());
    ran->notify();
  });
  EXPECT_TRUE(ran->wait());
}

}  // namespace
}  // namespace kivi
