// Dispatch groups and work items: both are waited for with a deadline and
// hand notify() blocks to queues once they are done.
#include "kivi/dispatch/dispatch_group.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <utility>
#include <vector>

#include "kivi/dispatch/dispatch_work_item.h"
#include "kivi/dispatch/kiv_dispatch_queue_protocol.h"
#include "kivi/dispatch/worker_pool.h"

namespace kivi {

namespace {

using Notification = std::pair<std::shared_ptr<KivDispatchQueueProtocol>, std::function<void()>>;

void fire(std::vector<Notification>& notifications) {
  for (auto& [queue, block] : notifications) queue->async(std::move(block));
}

// Waits on `cv` until `done()` or `deadline`. A deadline a century or more
// away waits for good (the platform's "forever"), which also keeps the
// condition variable's own arithmetic clear of overflow.
template <class Done>
DispatchTimeoutResult waitUntil(std::mutex& mutex, std::condition_variable& cv,
                                DispatchTime deadline, Done done) {
  constexpr auto kForever = std::chrono::hours(24 * 365 * 100);
  std::unique_lock lock(mutex);
  if (done()) return DispatchTimeoutResult::success;
  const auto now = std::chrono::steady_clock::now();
  if (deadline <= now) return DispatchTimeoutResult::timedOut;
  const bool forever = deadline - now >= kForever;
  lock.unlock();
  WorkerPool::BlockingScope blocking;
  lock.lock();
  if (forever) {
    cv.wait(lock, done);
    return DispatchTimeoutResult::success;
  }
  return cv.wait_until(lock, deadline, done) ? DispatchTimeoutResult::success
                                             : DispatchTimeoutResult::timedOut;
}

}  // namespace

// --- DispatchGroup ---

struct DispatchGroup::State {
  std::mutex mutex;
  std::condition_variable emptied;
  std::int64_t count = 0;                   // guarded by mutex
  std::uint64_t timesEmptied = 0;           // guarded by mutex
  std::vector<Notification> notifications;  // guarded by mutex
};

DispatchGroup::DispatchGroup() : state_(std::make_unique<State>()) {}

DispatchGroup::~DispatchGroup() = default;

void DispatchGroup::enter() {
  std::lock_guard lock(state_->mutex);
  ++state_->count;
}

void DispatchGroup::leave() {
  std::vector<Notification> due;
  {
    std::lock_guard lock(state_->mutex);
    if (state_->count == 0) return;  // a leave() without its enter()
    if (--state_->count != 0) return;
    ++state_->timesEmptied;
    due.swap(state_->notifications);
  }
  state_->emptied.notify_all();
  fire(due);
}

void DispatchGroup::wait() { wait(DispatchTime::max()); }

DispatchTimeoutResult DispatchGroup::wait(DispatchTime timeout) {
  State& s = *state_;
  std::uint64_t seen = 0;
  {
    std::lock_guard lock(s.mutex);
    if (s.count == 0) return DispatchTimeoutResult::success;
    seen = s.timesEmptied;
  }
  // Emptied at least once since the call began, even if entered again since.
  return waitUntil(s.mutex, s.emptied, timeout, [&] { return s.timesEmptied != seen; });
}

void DispatchGroup::notify(const std::shared_ptr<KivDispatchQueueProtocol>& queue,
                           std::function<void()> block) {
  if (!queue || !block) return;
  {
    std::lock_guard lock(state_->mutex);
    if (state_->count != 0) {
      state_->notifications.emplace_back(queue, std::move(block));
      return;
    }
  }
  queue->async(std::move(block));
}

// --- DispatchWorkItem ---

struct DispatchWorkItem::State {
  State(DispatchQoS q, DispatchWorkItemFlags f, std::function<void()> b)
      : qos(q), flags(f), block(std::move(b)) {}

  const DispatchQoS qos;
  const DispatchWorkItemFlags flags;
  const std::function<void()> block;
  std::atomic<bool> cancelled{false};
  std::mutex mutex;
  std::condition_variable finished;
  bool done = false;                        // guarded by mutex
  std::vector<Notification> notifications;  // guarded by mutex
};

DispatchWorkItem::DispatchWorkItem(std::function<void()> block)
    : DispatchWorkItem(DispatchQoS::unspecified, {}, std::move(block)) {}

DispatchWorkItem::DispatchWorkItem(DispatchWorkItemFlags flags, std::function<void()> block)
    : DispatchWorkItem(DispatchQoS::unspecified, flags, std::move(block)) {}

DispatchWorkItem::DispatchWorkItem(DispatchQoS qos, DispatchWorkItemFlags flags,
                                   std::function<void()> block)
    : state_(std::make_unique<State>(qos, flags, std::move(block))) {}

DispatchWorkItem::~DispatchWorkItem() = default;

void DispatchWorkItem::perform() {
  State& s = *state_;
  if (!s.cancelled.load(std::memory_order_acquire) && s.block) s.block();
  std::vector<Notification> due;
  {
    std::lock_guard lock(s.mutex);
    if (s.done) return;  // performed before
    s.done = true;
    due.swap(s.notifications);
  }
  s.finished.notify_all();
  fire(due);
}

void DispatchWorkItem::wait() { wait(DispatchTime::max()); }

DispatchTimeoutResult DispatchWorkItem::wait(DispatchTime timeout) {
  State& s = *state_;
  return waitUntil(s.mutex, s.finished, timeout, [&] { return s.done; });
}

void DispatchWorkItem::notify(const std::shared_ptr<KivDispatchQueueProtocol>& queue,
                              std::function<void()> block) {
  if (!queue || !block) return;
  {
    std::lock_guard lock(state_->mutex);
    if (!state_->done) {
      state_->notifications.emplace_back(queue, std::move(block));
      return;
    }
  }
  queue->async(std::move(block));
}

void DispatchWorkItem::cancel() noexcept {
  state_->cancelled.store(true, std::memory_order_release);
}

bool DispatchWorkItem::isCancelled() const noexcept {
  return state_->cancelled.load(std::memory_order_acquire);
}

DispatchQoS DispatchWorkItem::qos() const noexcept { return state_->qos; }

DispatchWorkItemFlags DispatchWorkItem::flags() const noexcept { return state_->flags; }

}  // namespace kivi
