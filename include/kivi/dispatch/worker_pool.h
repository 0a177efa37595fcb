// WorkerPool: the process-wide pool of worker threads on which operation
// queues start their operations and run completion callbacks.
//
// Threads are made on demand when work arrives and no worker is idle, up to a
// cap; threads beyond the machine's core count leave after a few idle
// seconds. Jobs run in submission order as workers become free.
//
//   kivi::WorkerPool::shared().submit([] { ... });
//
// Thread contract: submit() from any thread, including from inside a job; it
// never blocks on running jobs. A job that throws terminates the process.
#pragma once

#include <cstddef>
#include <functional>

namespace kivi {

class WorkerPool {
 public:
  static WorkerPool& shared();

  void submit(std::function<void()> job);

  // Whether the calling thread is one of the pool's workers.
  static bool isWorkerThread() noexcept;

  // The most threads the pool will run at once.
  static constexpr std::size_t kMaxThreads = 64;

 private:
  WorkerPool();
  struct State;
  State* state_;  // lives as long as the process
};

}  // namespace kivi
