#include "kivi/dispatch/run_loop.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdint>
#include <deque>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "kivi/dispatch/detail/main_queue.h"
#include "kivi/dispatch/thread.h"
#include "run_loop_internals.h"

namespace kivi {

namespace {

bool isCommonMode(std::string_view mode) { return mode == NSDefaultRunLoopMode; }

struct PendingBlock {
  std::vector<RunLoopMode> modes;
  std::function<void()> block;

  bool belongsTo(std::string_view mode) const {
    for (const auto& own : modes) {
      if (own == mode || (own == NSRunLoopCommonModes && isCommonMode(mode))) return true;
    }
    return false;
  }
};

}  // namespace

struct RunLoop::Core : std::enable_shared_from_this<RunLoop::Core> {
  explicit Core(bool main) : isMain(main) {}
  ~Core() {
    if (fd >= 0) ::close(fd);
  }

  const bool isMain;
  const int fd = ::eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);
  // Whether fd has been written since it was last read: posters write only
  // when it had not, so a burst of work costs one write.
  std::atomic<bool> fdSignalled{false};

  std::mutex mutex;
  std::map<RunLoopMode, std::vector<TimerPtr>, std::less<>> timers;  // guarded by mutex
  std::deque<PendingBlock> blocks;                                   // guarded by mutex
  std::vector<RunLoopMode> modeStack;                                // guarded by mutex
  std::thread::id runner;                     // the thread that runs the loop; guarded by mutex
  std::unique_ptr<DispatchTimer> wake;        // guarded by mutex
  DispatchTime wakeAt = DispatchTime::max();  // guarded by mutex

  void signal() {
    if (fdSignalled.exchange(true, std::memory_order_acq_rel)) return;
    const std::uint64_t one = 1;
    while (::write(fd, &one, sizeof one) < 0 && errno == EINTR) {
    }
  }

  // Empties the descriptor before the work is looked at, then clears the
  // flag: a poster that still saw it set skipped its write, and its work
  // (added before) is seen by the caller's look that follows; a poster that
  // sees it cleared writes again. The read is unconditional, so a write that
  // lands after an earlier clear never leaves the descriptor readable for
  // good.
  void clearSignal() {
    std::uint64_t value;
    while (::read(fd, &value, sizeof value) < 0 && errno == EINTR) {
    }
    fdSignalled.exchange(false, std::memory_order_acq_rel);
  }

  // The mode whose timers decide when the loop next wakes: the innermost
  // run's, or between runs the default mode (what runPendingWork() runs).
  std::string_view armedModeLocked() const {
    return modeStack.empty() ? std::string_view(NSDefaultRunLoopMode)
                             : std::string_view(modeStack.back());
  }

  template <typename Visit>
  void forEachTimerLocked(std::string_view mode, Visit&& visit) const {
    if (const auto it = timers.find(mode); it != timers.end()) {
      for (const auto& timer : it->second) visit(timer);
    }
    if (isCommonMode(mode)) {
      if (const auto it = timers.find(std::string_view(NSRunLoopCommonModes)); it != timers.end()) {
        for (const auto& timer : it->second) visit(timer);
      }
    }
  }

  bool isEmptyLocked(std::string_view mode) const {
    if (isMain && isCommonMode(mode)) return false;
    for (const auto& pending : blocks) {
      if (pending.belongsTo(mode)) return false;
    }
    bool anyTimer = false;
    forEachTimerLocked(mode, [&](const TimerPtr&) { anyTimer = true; });
    return !anyTimer;
  }

  // Arms the wake-up for the earliest timer of the armed mode.
  void rearmLocked() {
    DispatchTime earliest = DispatchTime::max();
    forEachTimerLocked(armedModeLocked(), [&](const TimerPtr& timer) {
      auto& core = *timer->core();
      std::lock_guard timerLock(core.mutex);
      if (core.valid) earliest = std::min(earliest, core.due);
    });
    if (earliest == wakeAt) return;
    wakeAt = earliest;
    if (earliest == DispatchTime::max()) {
      if (wake) wake->cancel();
      return;
    }
    if (!wake) {
      std::weak_ptr<Core> weak = weak_from_this();
      wake = DispatchClock::system()->makeTimer([weak] {
        if (auto core = weak.lock()) core->wakeFired();
      });
    }
    wake->schedule(earliest);
  }

  void wakeFired() {
    {
      std::lock_guard lock(mutex);
      wakeAt = DispatchTime::max();
    }
    signal();
  }

  void addTimer(const TimerPtr& timer, const RunLoopMode& mode) {
    auto& core = *timer->core();
    {
      std::lock_guard timerLock(core.mutex);
      if (!core.valid) return;
      const auto self = weak_from_this();
      // A timer belongs to one run loop (in as many of its modes as asked).
      for (const auto& loop : core.loops) {
        const bool same = !loop.owner_before(self) && !self.owner_before(loop);
        if (!same && !loop.expired()) return;
      }
      if (core.loops.empty() || core.loops.front().expired()) core.loops.assign(1, self);
    }
    std::lock_guard lock(mutex);
    auto& list = timers[mode];
    if (std::find(list.begin(), list.end(), timer) == list.end()) list.push_back(timer);
    rearmLocked();
  }

  void forgetTimer(const Timer* timer) {
    std::vector<TimerPtr> released;  // dropped outside the lock
    bool running = false;
    {
      std::lock_guard lock(mutex);
      for (auto it = timers.begin(); it != timers.end();) {
        auto& list = it->second;
        for (auto t = list.begin(); t != list.end();) {
          if (t->get() == timer) {
            released.push_back(std::move(*t));
            t = list.erase(t);
          } else {
            ++t;
          }
        }
        it = list.empty() ? timers.erase(it) : std::next(it);
      }
      rearmLocked();
      running = !modeStack.empty() && runner != std::this_thread::get_id();
    }
    // Wake a run (on another thread) that may now have nothing left to wait
    // for.
    if (running) signal();
  }

  // Runs what is due in `mode`. True when main-queue work ran.
  bool pass(std::string_view mode) {
    clearSignal();
    runBlocks(mode);
    bool handled = false;
    if (isMain && isCommonMode(mode)) handled = detail::drainMainQueue();
    fireTimers(mode);
    return handled;
  }

  void runBlocks(std::string_view mode) {
    std::vector<std::function<void()>> due;
    {
      std::lock_guard lock(mutex);
      for (auto it = blocks.begin(); it != blocks.end();) {
        if (it->belongsTo(mode)) {
          due.push_back(std::move(it->block));
          it = blocks.erase(it);
        } else {
          ++it;
        }
      }
    }
    for (auto& block : due) {
      if (block) block();
    }
  }

  void fireTimers(std::string_view mode) {
    const DispatchTime now = DispatchClock::system()->now();
    std::vector<std::pair<DispatchTime, TimerPtr>> due;
    {
      std::lock_guard lock(mutex);
      forEachTimerLocked(mode, [&](const TimerPtr& timer) {
        auto& core = *timer->core();
        std::lock_guard timerLock(core.mutex);
        if (core.valid && core.due <= now) due.emplace_back(core.due, timer);
      });
    }
    std::stable_sort(due.begin(), due.end(),
                     [](const auto& a, const auto& b) { return a.first < b.first; });
    for (std::size_t i = 0; i < due.size(); ++i) {
      const TimerPtr& timer = due[i].second;
      // A timer listed for the mode and for the common modes is fired once.
      bool seen = false;
      for (std::size_t j = 0; j < i; ++j) seen = seen || due[j].second == timer;
      if (!seen) fire(*timer, now);
    }
    std::lock_guard lock(mutex);
    rearmLocked();
  }

  static void fire(Timer& timer, DispatchTime now) {
    auto& core = *timer.core();
    Timer::Block block;
    {
      std::lock_guard timerLock(core.mutex);
      if (!core.valid || core.due > now) return;  // invalidated or moved meanwhile
      if (core.repeats) {
        // The next firing is due one interval after this one was; firings
        // missed meanwhile are skipped.
        auto next = core.due + core.interval;
        if (next <= now) next += ((now - next) / core.interval + 1) * core.interval;
        core.due = next;
      } else {
        // Spent before its block runs: a run nested in the block must not
        // fire it again.
        core.due = DispatchTime::max();
      }
      block = core.block;
    }
    const auto self = std::static_pointer_cast<Timer>(timer.shared_from_this());
    if (block) block(self);
    if (!core.repeats) timer.invalidate();
  }

  // Waits until the descriptor is readable or `deadline` passes.
  void waitUntil(DispatchTime deadline) {
    const auto now = DispatchClock::system()->now();
    if (deadline <= now) return;
    const auto remaining = deadline - now;
    const auto secs = std::chrono::duration_cast<std::chrono::seconds>(remaining);
    const auto nanos = std::chrono::duration_cast<std::chrono::nanoseconds>(remaining - secs);
    timespec timeout{static_cast<time_t>(secs.count()), static_cast<long>(nanos.count())};
    pollfd entry{fd, POLLIN, 0};
    ::ppoll(&entry, 1, &timeout, nullptr);
  }

  bool runMode(const RunLoopMode& mode, Date limitDate) {
    if (mode.empty() || fd < 0) return false;
    const DispatchTime deadline = detail::deadlineForDate(limitDate);
    {
      std::lock_guard lock(mutex);
      if (isEmptyLocked(mode)) return false;
      modeStack.push_back(mode);
      runner = std::this_thread::get_id();
      rearmLocked();
    }
    for (;;) {
      if (pass(mode)) break;
      {
        std::lock_guard lock(mutex);
        if (isEmptyLocked(mode)) break;
      }
      if (DispatchClock::system()->now() >= deadline) break;
      waitUntil(deadline);
    }
    bool lookAgain = false;
    {
      std::lock_guard lock(mutex);
      modeStack.pop_back();
      rearmLocked();
      // This run may have taken the descriptor's wake-up for work of the
      // mode that resumes now (an outer run's, or the host's default mode):
      // main-queue work it did not run, or blocks of that mode.
      lookAgain = !modeStack.empty() || (isMain && !isCommonMode(mode));
    }
    if (lookAgain) signal();
    return true;
  }
};

namespace detail {

void runLoopForgetTimer(RunLoop::Core& loop, const Timer* timer) { loop.forgetTimer(timer); }

void runLoopTimerMoved(RunLoop::Core& loop) {
  {
    std::lock_guard lock(loop.mutex);
    loop.rearmLocked();
  }
  loop.signal();
}

void mainQueueHasWork() { RunLoop::mainRunLoop()->core().signal(); }

}  // namespace detail

RunLoop::RunLoop(bool isMain) : core_(std::make_shared<Core>(isMain)) {}

RunLoop::~RunLoop() {
  // Timers still listed here forget this loop when they are invalidated;
  // until then they hold only a weak reference to it.
}

RunLoopPtr RunLoop::mainRunLoop() {
  // Lives as long as the process: main-queue work and host loops may reach
  // it until the very end.
  static const RunLoopPtr* const main = new RunLoopPtr(std::make_shared<RunLoop>(true));
  return *main;
}

RunLoopPtr RunLoop::currentRunLoop() {
  if (Thread::isMainThread()) return mainRunLoop();
  thread_local RunLoopPtr current;
  if (!current) current = std::make_shared<RunLoop>(false);
  return current;
}

std::optional<RunLoopMode> RunLoop::currentMode() const {
  std::lock_guard lock(core_->mutex);
  if (core_->modeStack.empty()) return std::nullopt;
  return core_->modeStack.back();
}

void RunLoop::run() {
  while (core_->runMode(NSDefaultRunLoopMode, Date::distantFuture())) {
  }
}

void RunLoop::run(Date limitDate) {
  while (core_->runMode(NSDefaultRunLoopMode, limitDate) && limitDate.timeIntervalSinceNow() > 0) {
  }
}

bool RunLoop::run(const RunLoopMode& mode, Date limitDate) {
  return core_->runMode(mode, limitDate);
}

void RunLoop::perform(const std::vector<RunLoopMode>& modes, std::function<void()> block) {
  PendingBlock pending;
  for (const auto& mode : modes) {
    if (!mode.empty()) pending.modes.push_back(mode);
  }
  if (pending.modes.empty() || !block) return;
  pending.block = std::move(block);
  {
    std::lock_guard lock(core_->mutex);
    core_->blocks.push_back(std::move(pending));
  }
  core_->signal();
}

void RunLoop::perform(std::function<void()> block) {
  perform({NSRunLoopCommonModes}, std::move(block));
}

void RunLoop::addTimer(const TimerPtr& timer, const RunLoopMode& mode) {
  if (!timer || mode.empty()) return;
  core_->addTimer(timer, mode);
}

int RunLoop::pollDescriptor() const noexcept { return core_->fd; }

void RunLoop::runPendingWork() {
  {
    std::lock_guard lock(core_->mutex);
    core_->modeStack.push_back(NSDefaultRunLoopMode);
    core_->runner = std::this_thread::get_id();
  }
  core_->pass(NSDefaultRunLoopMode);
  bool nested = false;
  {
    std::lock_guard lock(core_->mutex);
    core_->modeStack.pop_back();
    core_->rearmLocked();
    nested = !core_->modeStack.empty();
  }
  if (nested) core_->signal();
}

std::string RunLoop::className() const { return "NSRunLoop"; }

}  // namespace kivi
