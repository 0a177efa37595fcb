// Throughput of the operation services against a minimal thread pool.
//
// Every benchmark here does the same job per iteration: create 100,000
// trivial units of work one at a time on the benchmark thread, hand each to
// the executor as soon as it is made, then block until all of them have
// finished. A unit's work is only its life cycle (ready -> executing ->
// finished) on a small heap object, so what is measured is the executor's
// own overhead: allocation, queueing, hand-off to a worker, state changes and
// the final wait.
//
//   BM_KivAsyncService/limit:N       kivi::KivAsyncService with a concurrency
//                                    limit of N, KivAsyncOperation subclass
//   BM_KivAsyncServiceObjC/limit:1   kivi::KivAsyncServiceObjC (serial),
//                                    KivAsyncOperationObjC subclass
//   BM_MinimalPool/threads:N         N workers, one mutex, one condition
//                                    variable, a deque of std::function;
//                                    task objects made by the submitter
//   BM_MinimalPoolWorkerMadeTask/threads:N
//                                    the same pool, task objects made and
//                                    dropped on the worker (no heap block
//                                    crosses threads: a lower bound)
//
// Reading the results: compare rows with the same N. The overhead ratio is
//
//   Time(BM_KivAsyncService/limit:N) / Time(BM_MinimalPool/threads:N)
//
// (equivalently the inverse ratio of their ops/s columns). Both "ops" and
// "items_per_second" are operations completed per wall-clock second; times
// are wall-clock per 100,000 operations, since the work runs on other
// threads.
#include <benchmark/benchmark.h>

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "kivi/dispatch/operation_queue_protocol.h"
#include "kivi/operations/kiv_async_operation.h"
#include "kivi/operations/kiv_async_service.h"
#include "minimal_pool.h"

namespace kivi {
namespace {

constexpr std::int64_t kOperationsPerIteration = 100'000;

void reportThroughput(benchmark::State& state) {
  const auto total = static_cast<std::int64_t>(state.iterations()) * kOperationsPerIteration;
  state.SetItemsProcessed(total);
  state.counters["ops"] =
      benchmark::Counter(static_cast<double>(total), benchmark::Counter::kIsRate);
}

// An asynchronous operation whose work ends inside start(), for either
// variant of the base class.
template <class Base>
class TrivialOperation : public Base {
 public:
  void start() override {
    if (this->isCancelled()) {
      this->coreCompleteOperation();
      return;
    }
    this->moveToExecutingState();
    this->coreCompleteOperation();
  }
};

template <typename Service, typename Op>
void runServiceIterations(benchmark::State& state, Service& service) {
  const std::shared_ptr<OperationQueueProtocol> queue = service.operationQueue();
  for (auto _ : state) {
    for (std::int64_t i = 0; i < kOperationsPerIteration; ++i) {
      queue->addOperation(std::make_shared<Op>());
    }
    queue->waitUntilAllOperationsAreFinished();
  }
  reportThroughput(state);
}

void BM_KivAsyncService(benchmark::State& state) {
  KivAsyncService service("bench", state.range(0));
  runServiceIterations<KivAsyncService, TrivialOperation<KivAsyncOperation>>(state, service);
}

void BM_KivAsyncServiceObjC(benchmark::State& state) {
  KivAsyncServiceObjC service("bench");
  runServiceIterations<KivAsyncServiceObjC, TrivialOperation<KivAsyncOperationObjC>>(state,
                                                                                     service);
}

using bench::MinimalPool;

// The pool-side counterpart of a trivial operation.
struct PoolTask {
  enum class State : std::uint8_t { ready, executing, finished };
  std::atomic<State> state{State::ready};
  std::function<void()> completion;
};

// Counts finished tasks and wakes the benchmark thread when the last one of
// a batch is done.
class CompletionLatch {
 public:
  void reset(std::int64_t expected) {
    std::lock_guard lock(mutex_);
    expected_.store(expected, std::memory_order_relaxed);
    done_.store(0, std::memory_order_relaxed);
  }

  void countDown() {
    if (done_.fetch_add(1, std::memory_order_acq_rel) + 1 ==
        expected_.load(std::memory_order_relaxed)) {
      std::lock_guard lock(mutex_);
      cv_.notify_all();
    }
  }

  void wait() {
    std::unique_lock lock(mutex_);
    cv_.wait(lock, [this] {
      return done_.load(std::memory_order_acquire) == expected_.load(std::memory_order_relaxed);
    });
  }

 private:
  std::mutex mutex_;
  std::condition_variable cv_;
  std::atomic<std::int64_t> done_{0};
  std::atomic<std::int64_t> expected_{0};
};

void runTask(PoolTask& task) {
  task.state.store(PoolTask::State::executing, std::memory_order_release);
  task.state.store(PoolTask::State::finished, std::memory_order_release);
  task.completion();
}

// The same work as the services: each task object is made on the submitting
// thread, as a host makes its operations, and dies on a worker.
void BM_MinimalPool(benchmark::State& state) {
  CompletionLatch latch;  // outlives the pool: workers may still be in countDown()
  MinimalPool pool(static_cast<int>(state.range(0)));
  for (auto _ : state) {
    latch.reset(kOperationsPerIteration);
    for (std::int64_t i = 0; i < kOperationsPerIteration; ++i) {
      auto task = std::make_shared<PoolTask>();
      task->completion = [&latch] { latch.countDown(); };
      pool.submit([task = std::move(task)] { runTask(*task); });
    }
    latch.wait();
  }
  reportThroughput(state);
}

// A lower bound: the task object is made and dropped on the worker, so no
// heap block crosses threads.
void BM_MinimalPoolWorkerMadeTask(benchmark::State& state) {
  CompletionLatch latch;
  MinimalPool pool(static_cast<int>(state.range(0)));
  for (auto _ : state) {
    latch.reset(kOperationsPerIteration);
    for (std::int64_t i = 0; i < kOperationsPerIteration; ++i) {
      pool.submit([&latch] {
        auto task = std::make_shared<PoolTask>();
        task->completion = [&latch] { latch.countDown(); };
        runTask(*task);
      });
    }
    latch.wait();
  }
  reportThroughput(state);
}

BENCHMARK(BM_KivAsyncService)
    ->ArgName("limit")
    ->Arg(1)
    ->Arg(2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_MinimalPool)
    ->ArgName("threads")
    ->Arg(1)
    ->Arg(2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_MinimalPoolWorkerMadeTask)
    ->ArgName("threads")
    ->Arg(1)
    ->Arg(2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_KivAsyncServiceObjC)
    ->ArgName("limit")
    ->Arg(1)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace kivi
