// The baseline the executors are measured against: the least a thread pool
// needs. N workers, one mutex, one condition variable, a deque of
// std::function.
#pragma once

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

namespace kivi::bench {

class MinimalPool {
 public:
  explicit MinimalPool(int threadCount) {
    workers_.reserve(static_cast<std::size_t>(threadCount));
    for (int i = 0; i < threadCount; ++i) workers_.emplace_back([this] { workerLoop(); });
  }

  ~MinimalPool() {
    {
      std::lock_guard lock(mutex_);
      stopping_ = true;
    }
    cv_.notify_all();
    for (auto& worker : workers_) worker.join();
  }

  MinimalPool(const MinimalPool&) = delete;
  MinimalPool& operator=(const MinimalPool&) = delete;

  void submit(std::function<void()> task) {
    {
      std::lock_guard lock(mutex_);
      tasks_.push_back(std::move(task));
    }
    cv_.notify_one();
  }

 private:
  void workerLoop() {
    for (;;) {
      std::function<void()> task;
      {
        std::unique_lock lock(mutex_);
        cv_.wait(lock, [this] { return stopping_ || !tasks_.empty(); });
        if (tasks_.empty()) return;
        task = std::move(tasks_.front());
        tasks_.pop_front();
      }
      task();
    }
  }

  std::mutex mutex_;
  std::condition_variable cv_;
  std::deque<std::function<void()>> tasks_;
  bool stopping_ = false;
  std::vector<std::thread> workers_;
};

}  // namespace kivi::bench
