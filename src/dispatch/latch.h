// A one-shot flag that threads can sleep on: set() once, wait() until set.
// It sleeps on a futex of its own and, unlike std::atomic::wait, never spins
// or yields first, and set() makes a system call only when someone sleeps.
#pragma once

#include <linux/futex.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <climits>
#include <cstdint>

namespace kivi::detail {

class Latch {
 public:
  bool isSet() const noexcept { return state_.load(std::memory_order_acquire) == kSet; }

  void wait() noexcept {
    std::uint32_t seen = state_.load(std::memory_order_acquire);
    while (seen != kSet) {
      if (seen == kClear &&
          !state_.compare_exchange_weak(seen, kWaited, std::memory_order_acquire)) {
        continue;  // set meanwhile, or a spurious failure: look again
      }
      ::syscall(SYS_futex, reinterpret_cast<std::uint32_t*>(&state_), FUTEX_WAIT_PRIVATE, kWaited,
                nullptr, nullptr, 0);
      seen = state_.load(std::memory_order_acquire);
    }
  }

  void set() noexcept {
    if (state_.exchange(kSet, std::memory_order_release) == kWaited) {
      ::syscall(SYS_futex, reinterpret_cast<std::uint32_t*>(&state_), FUTEX_WAKE_PRIVATE, INT_MAX,
                nullptr, nullptr, 0);
    }
  }

 private:
  static constexpr std::uint32_t kClear = 0, kSet = 1, kWaited = 2;
  std::atomic<std::uint32_t> state_{kClear};
};
static_assert(sizeof(std::atomic<std::uint32_t>) == sizeof(std::uint32_t));

}  // namespace kivi::detail
