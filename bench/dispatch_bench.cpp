// The execution model against a minimal thread pool, and a service beside
// blocked threads.
//
//   BM_SerialQueueJobs            1,000,000 jobs submitted one by one to one
//                                 serial DispatchQueue, then one sync() that
//                                 waits for them
//   BM_GlobalQueueJobs            the same onto the concurrent global queue
//                                 (the worker pool), waited for with a latch
//   BM_MinimalPoolJobs/threads:2  the same onto the minimal pool of
//                                 operations_bench.cpp's baseline: N workers,
//                                 one mutex, one condition variable, a deque
//                                 of std::function
//   BM_ServiceBesideSleepers/0    10,000 trivial operations through a
//                                 KivAsyncService (limit 2)
//   BM_ServiceBesideSleepers/500  the same while 500 other operations sleep
//                                 on workers of the pool: announced sleeps
//                                 (a clock's sleep)
//   BM_ServiceBesideSilentSleepers/500
//                                 the same with 500 sleeps the pool is not
//                                 told of (a condition variable wait in host
//                                 code), found by the pool's monitor
//
// Ratios to read: BM_SerialQueueJobs and BM_GlobalQueueJobs over
// BM_MinimalPoolJobs/threads:2; BM_ServiceBesideSleepers/500 and
// BM_ServiceBesideSilentSleepers/500 over BM_ServiceBesideSleepers/0.
// scripts/bench_ratios.py prints them from a --benchmark_format=json run.
#include <benchmark/benchmark.h>

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>

#include "kivi/dispatch/dispatch_clock.h"
#include "kivi/dispatch/dispatch_queue.h"
#include "kivi/dispatch/operation_queue.h"
#include "kivi/dispatch/worker_pool.h"
#include "kivi/operations/kiv_async_operation.h"
#include "kivi/operations/kiv_async_service.h"
#include "minimal_pool.h"

namespace kivi {
namespace {

constexpr std::int64_t kJobs = 1'000'000;
constexpr std::int64_t kOperations = 10'000;

// Counts jobs down and wakes the waiter when the last one is done.
class Latch {
 public:
  void reset(std::int64_t count) { left_.store(count, std::memory_order_relaxed); }
  void countDown() {
    if (left_.fetch_sub(1, std::memory_order_acq_rel) == 1) {
      std::lock_guard lock(mutex_);
      cv_.notify_all();
    }
  }
  void wait() {
    std::unique_lock lock(mutex_);
    cv_.wait(lock, [this] { return left_.load(std::memory_order_acquire) == 0; });
  }

 private:
  std::atomic<std::int64_t> left_{0};
  std::mutex mutex_;
  std::condition_variable cv_;
};

using bench::MinimalPool;

void reportJobs(benchmark::State& state, std::int64_t perIteration) {
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()) * perIteration);
}

void BM_SerialQueueJobs(benchmark::State& state) {
  auto queue = DispatchQueue::create("kivi.bench.serial");
  std::int64_t sum = 0;  // touched only on the queue
  for (auto _ : state) {
    for (std::int64_t i = 0; i < kJobs; ++i) queue->async([&sum] { ++sum; });
    queue->sync([] {});
  }
  benchmark::DoNotOptimize(sum);
  reportJobs(state, kJobs);
}

void BM_GlobalQueueJobs(benchmark::State& state) {
  const auto& queue = DispatchQueue::global();
  Latch latch;
  for (auto _ : state) {
    latch.reset(kJobs);
    for (std::int64_t i = 0; i < kJobs; ++i) queue->async([&latch] { latch.countDown(); });
    latch.wait();
  }
  reportJobs(state, kJobs);
}

void BM_MinimalPoolJobs(benchmark::State& state) {
  Latch latch;  // outlives the pool
  MinimalPool pool(static_cast<int>(state.range(0)));
  for (auto _ : state) {
    latch.reset(kJobs);
    for (std::int64_t i = 0; i < kJobs; ++i) pool.submit([&latch] { latch.countDown(); });
    latch.wait();
  }
  reportJobs(state, kJobs);
}

class TrivialOperation : public KivAsyncOperation {
 public:
  void start() override {
    moveToExecutingState();
    coreCompleteOperation();
  }
};

// `count` operations that block on workers until the returned object goes:
// through a manual clock's sleep (announced) or a condition variable (silent).
class Sleepers {
 public:
  Sleepers(int count, bool announced) : queue_(std::make_shared<OperationQueue>()) {
    queue_->setMaxConcurrentOperationCount(count);
    for (int i = 0; i < count; ++i) {
      queue_->addOperation(std::make_shared<BlockOperation>([this, announced] {
        {
          std::lock_guard lock(mutex_);
          ++asleep_;
        }
        entered_.notify_all();
        if (announced) {
          clock_->sleepFor(std::chrono::hours(1));
        } else {
          std::unique_lock lock(mutex_);
          wake_.wait(lock, [this] { return awake_; });
        }
      }));
    }
    // All of them asleep before anything is measured.
    std::unique_lock lock(mutex_);
    entered_.wait(lock, [&] { return asleep_ == count; });
  }
  ~Sleepers() {
    clock_->advance(std::chrono::hours(1));
    {
      std::lock_guard lock(mutex_);
      awake_ = true;
    }
    wake_.notify_all();
    queue_->waitUntilAllOperationsAreFinished();
  }

 private:
  std::shared_ptr<ManualClock> clock_ = ManualClock::create();
  std::shared_ptr<OperationQueue> queue_;
  std::mutex mutex_;
  std::condition_variable entered_, wake_;
  int asleep_ = 0;
  bool awake_ = false;
};

void runService(benchmark::State& state) {
  KivAsyncService service("kivi.bench.service", 2);
  const auto queue = service.operationQueue();
  for (auto _ : state) {
    for (std::int64_t i = 0; i < kOperations; ++i) {
      queue->addOperation(std::make_shared<TrivialOperation>());
    }
    queue->waitUntilAllOperationsAreFinished();
  }
  reportJobs(state, kOperations);
}

void BM_ServiceBesideSleepers(benchmark::State& state) {
  Sleepers sleepers(static_cast<int>(state.range(0)), /*announced=*/true);
  runService(state);
}

void BM_ServiceBesideSilentSleepers(benchmark::State& state) {
  Sleepers sleepers(static_cast<int>(state.range(0)), /*announced=*/false);
  runService(state);
}

BENCHMARK(BM_SerialQueueJobs)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_GlobalQueueJobs)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_MinimalPoolJobs)
    ->ArgName("threads")
    ->Arg(2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ServiceBesideSleepers)->Arg(0)->Arg(500)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ServiceBesideSilentSleepers)->Arg(500)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace kivi
