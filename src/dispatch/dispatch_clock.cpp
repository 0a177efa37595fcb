#include "kivi/dispatch/dispatch_clock.h"

#include <algorithm>
#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <thread>
#include <vector>

#include "kivi/dispatch/detail/event_loop.h"
#include "kivi/dispatch/worker_pool.h"

namespace kivi {

namespace detail {

constexpr std::size_t kNotArmed = SIZE_MAX;

struct TimerState {
  TimerState(std::function<void()> h, std::weak_ptr<DispatchClock> c)
      : handler(std::move(h)), clock(std::move(c)) {}
  const std::function<void()> handler;
  const std::weak_ptr<DispatchClock> clock;
  // Guarded by the heap's mutex.
  DispatchTime deadline{};
  std::uint64_t sequence = 0;
  std::size_t index = kNotArmed;  // position in the heap
};

// A binary heap of armed timers that knows each timer's position, so that
// re-arming and cancelling a timer cost O(log n) and leave nothing behind.
struct TimerHeap {
  std::mutex mutex;
  std::vector<std::shared_ptr<TimerState>> entries;  // guarded by mutex
  std::uint64_t nextSequence = 0;                    // guarded by mutex

  static bool earlier(const TimerState& a, const TimerState& b) {
    return a.deadline != b.deadline ? a.deadline < b.deadline : a.sequence < b.sequence;
  }

  DispatchTime earliestLocked() const {
    return entries.empty() ? DispatchTime::max() : entries.front()->deadline;
  }

  void put(std::size_t i, std::shared_ptr<TimerState> state) {
    state->index = i;
    entries[i] = std::move(state);
  }

  void siftUp(std::size_t i) {
    auto moving = std::move(entries[i]);
    while (i > 0) {
      const std::size_t parent = (i - 1) / 2;
      if (!earlier(*moving, *entries[parent])) break;
      put(i, std::move(entries[parent]));
      i = parent;
    }
    put(i, std::move(moving));
  }

  void siftDown(std::size_t i) {
    auto moving = std::move(entries[i]);
    const std::size_t size = entries.size();
    for (;;) {
      std::size_t child = 2 * i + 1;
      if (child >= size) break;
      if (child + 1 < size && earlier(*entries[child + 1], *entries[child])) ++child;
      if (!earlier(*entries[child], *moving)) break;
      put(i, std::move(entries[child]));
      i = child;
    }
    put(i, std::move(moving));
  }

  void insertLocked(std::shared_ptr<TimerState> state, DispatchTime deadline) {
    state->deadline = deadline;
    state->sequence = nextSequence++;
    entries.push_back(nullptr);
    put(entries.size() - 1, std::move(state));
    siftUp(entries.size() - 1);
  }

  void removeLocked(TimerState& state) {
    const std::size_t i = state.index;
    state.index = kNotArmed;
    auto last = std::move(entries.back());
    entries.pop_back();
    if (i == entries.size()) return;  // it was the last one
    put(i, std::move(last));
    if (i > 0 && earlier(*entries[i], *entries[(i - 1) / 2])) {
      siftUp(i);
    } else {
      siftDown(i);
    }
  }
};

}  // namespace detail

// DispatchTimer

DispatchTimer::DispatchTimer(std::shared_ptr<detail::TimerState> state)
    : state_(std::move(state)) {}

DispatchTimer::~DispatchTimer() { cancel(); }

void DispatchTimer::schedule(DispatchTime deadline) {
  const auto clock = state_->clock.lock();
  if (!clock) return;
  detail::TimerHeap& heap = *clock->heap_;
  std::lock_guard lock(heap.mutex);
  const DispatchTime before = heap.earliestLocked();
  if (state_->index != detail::kNotArmed) heap.removeLocked(*state_);
  heap.insertLocked(state_, deadline);
  const DispatchTime after = heap.earliestLocked();
  if (after != before) clock->earliestDeadlineChanged(after);
}

bool DispatchTimer::cancel() {
  const auto clock = state_->clock.lock();
  if (!clock) return false;
  detail::TimerHeap& heap = *clock->heap_;
  std::lock_guard lock(heap.mutex);
  if (state_->index == detail::kNotArmed) return false;
  const DispatchTime before = heap.earliestLocked();
  heap.removeLocked(*state_);
  const DispatchTime after = heap.earliestLocked();
  if (after != before) clock->earliestDeadlineChanged(after);
  return true;
}

bool DispatchTimer::isScheduled() const {
  const auto clock = state_->clock.lock();
  if (!clock) return false;
  std::lock_guard lock(clock->heap_->mutex);
  return state_->index != detail::kNotArmed;
}

// DispatchClock

DispatchClock::DispatchClock() : heap_(std::make_shared<detail::TimerHeap>()) {}

DispatchClock::~DispatchClock() = default;

std::unique_ptr<DispatchTimer> DispatchClock::makeTimer(std::function<void()> handler) {
  return std::unique_ptr<DispatchTimer>(new DispatchTimer(
      std::make_shared<detail::TimerState>(std::move(handler), weak_from_this())));
}

void DispatchClock::callAt(DispatchTime deadline, std::function<void()> handler) {
  auto state = std::make_shared<detail::TimerState>(std::move(handler), weak_from_this());
  std::lock_guard lock(heap_->mutex);
  const DispatchTime before = heap_->earliestLocked();
  heap_->insertLocked(std::move(state), deadline);
  const DispatchTime after = heap_->earliestLocked();
  if (after != before) earliestDeadlineChanged(after);
}

void DispatchClock::fireDue(DispatchTime now, const std::function<void(DispatchTime)>& beforeEach) {
  for (;;) {
    std::shared_ptr<detail::TimerState> due;
    DispatchTime deadline;
    {
      std::lock_guard lock(heap_->mutex);
      if (heap_->entries.empty() || heap_->entries.front()->deadline > now) return;
      due = heap_->entries.front();
      deadline = due->deadline;
      heap_->removeLocked(*due);
      const DispatchTime after = heap_->earliestLocked();
      if (after != deadline) earliestDeadlineChanged(after);
    }
    if (beforeEach) beforeEach(deadline);
    due->handler();
  }
}

std::optional<DispatchTime> DispatchClock::earliestDeadline() const {
  std::lock_guard lock(heap_->mutex);
  if (heap_->entries.empty()) return std::nullopt;
  return heap_->entries.front()->deadline;
}

void DispatchClock::announceEarliestDeadline() {
  std::lock_guard lock(heap_->mutex);
  earliestDeadlineChanged(heap_->earliestLocked());
}

// The system clock

namespace {

class SystemClock final : public DispatchClock {
 public:
  DispatchTime now() const override { return std::chrono::steady_clock::now(); }

  void sleepUntil(DispatchTime deadline) override {
    WorkerPool::BlockingScope blocking;
    std::this_thread::sleep_until(deadline);
  }

  void fire() {
    fireDue(now());
    // The event thread's timer is spent: give it the next deadline even if
    // nothing changed.
    announceEarliestDeadline();
  }

 protected:
  void earliestDeadlineChanged(DispatchTime deadline) override {
    detail::EventLoop::shared().armClockAt(deadline);
  }
};

}  // namespace

const std::shared_ptr<DispatchClock>& DispatchClock::system() {
  // Never destroyed: timers may fire while the process exits.
  static auto* clock = new std::shared_ptr<DispatchClock>(std::make_shared<SystemClock>());
  return *clock;
}

void detail::fireSystemClock() { static_cast<SystemClock&>(*DispatchClock::system()).fire(); }

// ManualClock

struct ManualClock::State {
  std::mutex mutex;
  std::condition_variable moved;
  std::atomic<DispatchTime::rep> now{0};
};

ManualClock::ManualClock(DispatchTime start) : state_(std::make_shared<State>()) {
  state_->now.store(start.time_since_epoch().count());
}

std::shared_ptr<ManualClock> ManualClock::create() {
  return create(DispatchTime{} + std::chrono::hours(1));
}

std::shared_ptr<ManualClock> ManualClock::create(DispatchTime start) {
  return std::shared_ptr<ManualClock>(new ManualClock(start));
}

DispatchTime ManualClock::now() const { return DispatchTime(DispatchDuration(state_->now.load())); }

void ManualClock::advance(DispatchDuration duration) { advanceTo(now() + duration); }

void ManualClock::advanceTo(DispatchTime time) {
  auto moveTo = [this](DispatchTime t) {
    std::lock_guard lock(state_->mutex);
    if (t.time_since_epoch().count() > state_->now.load()) {
      state_->now.store(t.time_since_epoch().count());
      state_->moved.notify_all();
    }
  };
  fireDue(time, moveTo);
  moveTo(time);
}

void ManualClock::sleepUntil(DispatchTime deadline) {
  WorkerPool::BlockingScope blocking;
  std::unique_lock lock(state_->mutex);
  state_->moved.wait(lock, [&] { return now() >= deadline; });
}

}  // namespace kivi
