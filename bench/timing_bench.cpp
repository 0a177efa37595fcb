// Timers, the main run loop and the run-loop semaphore.
//
//   BM_TimerfdLateness              1,000 firings of a 10 ms periodic timerfd
//                                   read by a thread of its own: the floor
//   BM_RunloopTimerLateness         1,000 firings of a 10 ms repeating
//                                   KivRunloopTimer while the main thread runs
//                                   the main run loop; measured in its
//                                   callback (on its private queue)
//   BM_KivTimerLateness             1,000 firings of a 10 ms repeating KivTimer
//   BM_ServiceBesideKivTimers/0     10,000 trivial operations through a
//                                   KivAsyncService (limit 2)
//   BM_ServiceBesideKivTimers/500   the same while 500 KivTimers count down;
//                                   every one of them must fire afterwards
//   BM_MainQueueRoundTrip           10,000 round trips worker → main queue (the
//                                   main thread sits in its run loop) → worker
//   BM_ConditionVariablePingPong    10,000 round trips between the same two
//                                   threads over two condition variables
//   BM_SemaphoreWakeLatency         a main-thread KivRunLoopSemaphore wait with
//                                   the default strategy, signalled from a
//                                   worker 50 ms into the wait
//
// Lateness is the time a firing runs minus the time it was due: for the
// timerfd and the KivRunloopTimer the schedule is start + k × interval; a
// KivTimer's next countdown starts when the previous one ends, so its firing
// is due one interval after the previous firing. The lateness rows report
// median_us, p99_us and skipped (firings missed) as counters.
//
// Ratios to read: BM_ServiceBesideKivTimers/500 over /0;
// BM_MainQueueRoundTrip over BM_ConditionVariablePingPong.
#include <benchmark/benchmark.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "kivi/dispatch/dispatch_queue.h"
#include "kivi/dispatch/operation_queue.h"
#include "kivi/dispatch/run_loop.h"
#include "kivi/dispatch/worker_pool.h"
#include "kivi/operations/kiv_async_operation.h"
#include "kivi/operations/kiv_async_service.h"
#include "kivi/timing/kiv_run_loop_semaphore.h"
#include "kivi/timing/kiv_runloop_timer.h"
#include "kivi/timing/kiv_timer.h"

namespace kivi {
namespace {

using Clock = std::chrono::steady_clock;
constexpr int kFirings = 1000;
constexpr auto kInterval = std::chrono::milliseconds(10);
constexpr int kRoundTrips = 10'000;

double micros(Clock::duration d) { return std::chrono::duration<double, std::micro>(d).count(); }

void reportLateness(benchmark::State& state, std::vector<double> lateness, int skipped) {
  std::sort(lateness.begin(), lateness.end());
  if (lateness.empty()) return;
  state.counters["median_us"] = lateness[lateness.size() / 2];
  state.counters["p99_us"] = lateness[lateness.size() * 99 / 100];
  state.counters["skipped"] = skipped;
}

void BM_TimerfdLateness(benchmark::State& state) {
  std::vector<double> lateness;
  int skipped = 0;
  for (auto _ : state) {
    lateness.clear();
    const int fd = ::timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC);
    const auto start = Clock::now();
    itimerspec spec{};
    spec.it_interval.tv_nsec = std::chrono::nanoseconds(kInterval).count();
    spec.it_value = spec.it_interval;
    ::timerfd_settime(fd, 0, &spec, nullptr);
    std::uint64_t due = 0;
    while (due < static_cast<std::uint64_t>(kFirings)) {
      std::uint64_t expirations = 0;
      if (::read(fd, &expirations, sizeof expirations) != sizeof expirations) break;
      due += expirations;
      skipped += static_cast<int>(expirations - 1);
      lateness.push_back(micros(Clock::now() - (start + due * kInterval)));
    }
    ::close(fd);
  }
  reportLateness(state, lateness, skipped);
}

void BM_RunloopTimerLateness(benchmark::State& state) {
  std::vector<double> lateness;
  int skipped = 0;
  for (auto _ : state) {
    std::mutex mutex;
    std::vector<Clock::time_point> firings;
    firings.reserve(kFirings);
    std::atomic<bool> done{false};
    const double interval = std::chrono::duration<double>(kInterval).count();
    auto timer =
        KivRunloopTimer::create(interval, NSDefaultRunLoopMode, KivTimerDispositionRepeating,
                                [&](const std::shared_ptr<KivRunloopTimer>&) {
                                  std::lock_guard lock(mutex);
                                  firings.push_back(Clock::now());
                                  if (firings.size() == kFirings) done = true;
                                });
    const auto start = Clock::now();
    timer->start();
    auto loop = RunLoop::mainRunLoop();
    while (!done) loop->runMode(NSDefaultRunLoopMode, Date::now().addingTimeInterval(0.05));
    timer->cancel();
    timer->operationQueue()->waitUntilAllOperationsAreFinished();
    lateness.clear();
    std::int64_t previousStep = 0;
    for (const auto& at : firings) {
      // Due at the latest schedule point at or before the firing.
      const auto sinceStart = at - start;
      const std::int64_t step = sinceStart / kInterval;
      skipped += static_cast<int>(std::max<std::int64_t>(0, step - previousStep - 1));
      previousStep = step;
      lateness.push_back(micros(sinceStart - step * kInterval));
    }
  }
  reportLateness(state, lateness, skipped);
}

void BM_KivTimerLateness(benchmark::State& state) {
  std::vector<double> lateness;
  for (auto _ : state) {
    std::mutex mutex;
    std::condition_variable finished;
    std::vector<Clock::time_point> firings;
    firings.reserve(kFirings + 1);
    const double interval = std::chrono::duration<double>(kInterval).count();
    const auto start = Clock::now();
    auto timer = KivTimer::create(
        [&] {
          std::lock_guard lock(mutex);
          firings.push_back(Clock::now());
          if (firings.size() == kFirings) finished.notify_all();
        },
        interval, KivTimerDispositionRepeating);
    timer->start();
    {
      std::unique_lock lock(mutex);
      finished.wait(lock, [&] { return firings.size() >= kFirings; });
    }
    timer->cancel();
    lateness.clear();
    std::lock_guard lock(mutex);
    auto previous = start;
    for (std::size_t i = 0; i < kFirings; ++i) {
      lateness.push_back(micros(firings[i] - previous - kInterval));
      previous = firings[i];
    }
  }
  reportLateness(state, lateness, 0);
}

class TrivialOperation : public KivAsyncOperation {
 public:
  void start() override {
    moveToExecutingState();
    coreCompleteOperation();
  }
};

void BM_ServiceBesideKivTimers(benchmark::State& state) {
  const int timers = static_cast<int>(state.range(0));
  KivAsyncService service("kivi.bench.service", 2);
  const auto queue = service.operationQueue();
  std::atomic<int> fired{0};
  for (auto _ : state) {
    state.PauseTiming();
    fired = 0;
    std::vector<std::shared_ptr<KivTimer>> running;
    for (int i = 0; i < timers; ++i) {
      running.push_back(KivTimer::create([&] { ++fired; }, 1.0, KivTimerDispositionOneShot));
      running.back()->start();
    }
    // Every countdown asleep on a worker before the service starts.
    while (WorkerPool::shared().statistics().blocked < static_cast<std::size_t>(timers)) {
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    state.ResumeTiming();
    for (int i = 0; i < 10'000; ++i) queue->addOperation(std::make_shared<TrivialOperation>());
    queue->waitUntilAllOperationsAreFinished();
    state.PauseTiming();
    while (fired < timers) std::this_thread::sleep_for(std::chrono::milliseconds(5));
    state.ResumeTiming();
  }
  state.counters["timers_fired"] = fired.load();
}

void BM_MainQueueRoundTrip(benchmark::State& state) {
  for (auto _ : state) {
    std::mutex mutex;
    std::condition_variable answered;
    bool answer = false;
    std::atomic<bool> done{false};
    std::thread worker([&] {
      const auto& main = DispatchQueue::main();
      for (int i = 0; i < kRoundTrips; ++i) {
        main->async([&] {
          std::lock_guard lock(mutex);
          answer = true;
          answered.notify_one();
        });
        std::unique_lock lock(mutex);
        answered.wait(lock, [&] { return answer; });
        answer = false;
      }
      done = true;
      DispatchQueue::main()->async([] {});  // ends the run below
    });
    auto loop = RunLoop::mainRunLoop();
    while (!done) loop->runMode(NSDefaultRunLoopMode, Date::distantFuture());
    worker.join();
  }
  state.SetItemsProcessed(state.iterations() * kRoundTrips);
}

void BM_ConditionVariablePingPong(benchmark::State& state) {
  for (auto _ : state) {
    std::mutex mutex;
    std::condition_variable toMain, toWorker;
    int turn = 0;  // 0: worker's, 1: main's
    std::thread worker([&] {
      for (int i = 0; i < kRoundTrips; ++i) {
        std::unique_lock lock(mutex);
        turn = 1;
        toMain.notify_one();
        toWorker.wait(lock, [&] { return turn == 0; });
      }
    });
    for (int i = 0; i < kRoundTrips; ++i) {
      std::unique_lock lock(mutex);
      toMain.wait(lock, [&] { return turn == 1; });
      turn = 0;
      toWorker.notify_one();
    }
    worker.join();
  }
  state.SetItemsProcessed(state.iterations() * kRoundTrips);
}

void BM_SemaphoreWakeLatency(benchmark::State& state) {
  std::vector<double> latency;
  for (auto _ : state) {
    auto semaphore = std::make_shared<KivRunLoopSemaphore>();
    Clock::time_point signalledAt;
    std::thread signaller([&] {
      std::this_thread::sleep_for(std::chrono::milliseconds(50));
      signalledAt = Clock::now();
      semaphore->signal();
    });
    semaphore->waitWithTimeout(10);
    const auto returnedAt = Clock::now();
    signaller.join();
    latency.push_back(micros(returnedAt - signalledAt));
  }
  reportLateness(state, latency, 0);
}

BENCHMARK(BM_TimerfdLateness)->Iterations(1)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_RunloopTimerLateness)->Iterations(1)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_KivTimerLateness)->Iterations(1)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ServiceBesideKivTimers)
    ->Arg(0)
    ->Arg(500)
    ->Iterations(5)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_MainQueueRoundTrip)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ConditionVariablePingPong)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_SemaphoreWakeLatency)->Iterations(10)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace kivi
