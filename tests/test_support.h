// Small waiting helpers for tests that involve other threads. Every wait has a
// deadline; callers assert on the result so that a hang becomes a failure.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <functional>
#include <memory>
#include <mutex>
#include <thread>

namespace kivi::testing {

inline constexpr std::chrono::seconds kDefaultTimeout{10};

// Polls `predicate` until it returns true or `timeout` passes. Use it only for
// state that has no notification of its own; returns the last result.
template <class Predicate>
bool waitFor(Predicate&& predicate, std::chrono::milliseconds timeout = kDefaultTimeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  while (!predicate()) {
    if (std::chrono::steady_clock::now() >= deadline) return predicate();
    std::this_thread::sleep_for(std::chrono::microseconds(200));
  }
  return true;
}

// A count-down latch whose wait gives up at a deadline.
class Latch {
 public:
  explicit Latch(std::size_t count = 1) : count_(count) {}

  void countDown() {
    std::lock_guard lock(mutex_);
    if (count_ > 0 && --count_ == 0) cv_.notify_all();
  }
  // True once the count has reached zero; false on timeout.
  bool wait(std::chrono::milliseconds timeout = kDefaultTimeout) {
    std::unique_lock lock(mutex_);
    return cv_.wait_for(lock, timeout, [&] { return count_ == 0; });
  }
  bool isOpen() {
    std::lock_guard lock(mutex_);
    return count_ == 0;
  }

 private:
  std::mutex mutex_;
  std::condition_variable cv_;
  std::size_t count_;
};

// Runs a blocking call on its own thread; false if it has not returned by the
// deadline (the thread is then abandoned and the test fails).
inline bool returnsWithin(std::function<void()> call,
                          std::chrono::milliseconds timeout = kDefaultTimeout) {
  auto returned = std::make_shared<Latch>();
  std::thread([call = std::move(call), returned] {
    call();
    returned->countDown();
  }).detach();
  return returned->wait(timeout);
}

}  // namespace kivi::testing
