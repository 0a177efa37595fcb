#include "kivi/dispatch/worker_pool.h"

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <deque>
#include <mutex>
#include <thread>

namespace kivi {

namespace {
thread_local bool tIsWorker = false;
constexpr auto kIdleTimeout = std::chrono::seconds(5);
}  // namespace

struct WorkerPool::State {
  std::mutex mutex;
  std::condition_variable wake;
  std::deque<std::function<void()>> jobs;  // guarded by mutex
  std::size_t threads = 0;                 // guarded by mutex
  std::size_t idle = 0;                    // guarded by mutex
  std::size_t keep = 0;                    // threads that never time out

  void run() {
    tIsWorker = true;
    std::unique_lock lock(mutex);
    for (;;) {
      while (jobs.empty()) {
        ++idle;
        const bool woke = wake.wait_for(lock, kIdleTimeout, [&] { return !jobs.empty(); });
        --idle;
        if (!woke && threads > keep) {
          --threads;
          return;
        }
      }
      auto job = std::move(jobs.front());
      jobs.pop_front();
      lock.unlock();
      job();
      job = nullptr;  // release captures outside the lock
      lock.lock();
    }
  }
};

WorkerPool::WorkerPool() : state_(new State) {
  state_->keep = std::max(2u, std::thread::hardware_concurrency());
}

WorkerPool& WorkerPool::shared() {
  // Never destroyed: workers may still be waiting when the process exits.
  static WorkerPool* pool = new WorkerPool;
  return *pool;
}

bool WorkerPool::isWorkerThread() noexcept { return tIsWorker; }

void WorkerPool::submit(std::function<void()> job) {
  State& s = *state_;
  bool spawn = false, wake = false;
  {
    std::lock_guard lock(s.mutex);
    s.jobs.push_back(std::move(job));
    // Wake an idle worker while there are at least as many idle workers as
    // queued jobs; otherwise make a new thread.
    if (s.jobs.size() <= s.idle) {
      wake = true;
    } else if (s.threads < kMaxThreads) {
      ++s.threads;
      spawn = true;
    }
  }
  // Woken after the unlock, the worker does not run straight into our lock.
  if (wake) s.wake.notify_one();
  if (spawn) std::thread([&s] { s.run(); }).detach();
}

}  // namespace kivi
