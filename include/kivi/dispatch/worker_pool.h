// WorkerPool: the process-wide pool of worker threads under every queue of the
// library: operation queues start their operations on it, dispatch queues
// drain on it, and completion callbacks run on it.
//
// The pool aims to keep `width()` workers running (one per processor, at least
// two). It grows past that when workers block, so that work waiting behind a
// blocked worker still runs:
//   - at once, when a worker enters a blocking call of the library
//     (waitUntilFinished, waitUntilAllOperationsAreFinished, a dispatch
//     queue's sync, a clock's sleep) or a BlockingScope of the host's own;
//   - within about 10 ms, when work waits while every worker is busy and some
//     of them have been stuck in one job without running (the pool samples
//     their scheduler state): host code that sleeps, waits on a lock or does
//     blocking I/O is noticed this way.
// Threads beyond the width leave after 5 idle seconds. The pool never holds
// more than kMaxThreads threads; past that, work waits for a worker to free.
//
//   kivi::WorkerPool::shared().submit([] { ... });
//
//   // Host code about to block on a worker:
//   { kivi::WorkerPool::BlockingScope blocking; future.wait(); }
//
// Thread contract: submit() from any thread, including from inside a job; it
// never blocks on running jobs. Jobs start in submission order. A job that
// throws terminates the process. BlockingScope does nothing on a thread that
// is not one of the pool's workers.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>

#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT WorkerPool {
 public:
  // The pool of the process, started on first use.
  static WorkerPool& shared();

  // Runs `job` on a worker as soon as one is free; an empty `job` is ignored.
  void submit(std::function<void()> job);
  // For dispatch queues: the job runs as work of `queue`, which `keepAlive`
  // (if any) keeps alive until the job has run.
  void submit(std::function<void()> job, const void* queue, std::shared_ptr<const void> keepAlive);

  // Whether the calling thread is one of the pool's workers.
  static bool isWorkerThread() noexcept;

  // Marks the calling worker as blocked for the scope's lifetime: the pool
  // does not count it among its running workers meanwhile. Scopes nest.
  class BlockingScope {
   public:
    BlockingScope() noexcept;
    ~BlockingScope();
    BlockingScope(const BlockingScope&) = delete;
    BlockingScope& operator=(const BlockingScope&) = delete;

   private:
    bool counted_;
  };

  // How many workers the pool keeps running.
  std::size_t width() const noexcept;

  // What the pool is doing, as statistics() saw it.
  struct Statistics {
    std::size_t threads = 0;  // alive (or starting)
    std::size_t idle = 0;     // waiting for work
    std::size_t blocked = 0;  // inside a blocking call or BlockingScope
    std::size_t queued = 0;   // jobs not yet taken by a worker
  };
  // A snapshot, for diagnostics and tests; it may be out of date when read.
  Statistics statistics() const;

  // The most threads the pool will run at once.
  static constexpr std::size_t kMaxThreads = 1024;

 private:
  WorkerPool();
  struct State;
  State* state_;  // lives as long as the process
};

}  // namespace kivi
